// SkarnClip::ingestObject lives with the ingest object it makes, so that the
// clip library does not depend on the libraries built on top of it.
#include "SkarnClip.h"
#include "SkarnIngestObject.h"

Ref<VestaKilnIngestObject> SkarnClip::ingestObject() {
    // Made on first request and kept: the host asks from one thread.
    if (!_ingestObject) _ingestObject = SkarnIngestObject::initWithClip(this);
    return _ingestObject;
}
