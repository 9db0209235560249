// SkarnClip::formatReader lives with the format reader it makes, so that the
// clip library does not depend on the libraries built on top of it; the
// plug-in's final link joins them.
#include "SkarnClip.h"
#include "SkarnFormatReader.h"
#include "SkarnLog.h"

Ref<VestaKilnFormatReaderProtocol> SkarnClip::formatReader() {
    Ref<SkarnFormatReader> reader = SkarnFormatReader::formatReaderWithClip(this, false, false);
    if (reader)
        SkarnLog(2, "%@: formatReader %@ successfully instantiated.", this, reader);
    else
        SkarnLog(2, "%@: formatReader instantiation UNSUCCESSFUL.", this);
    return reader;
}
