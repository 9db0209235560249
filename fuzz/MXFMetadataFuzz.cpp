// The two readers that take descriptive facts straight from an MXF file's
// header: the metadata sets (SkarnMXFMetadataForBytes, and the local-set
// decoder on the raw bytes) and the clip XML an AVCLIP header carries
// (SkarnMXF_XMLStringForBytes), both reading the input as a whole file in
// memory. Arbitrary files must end in a dictionary or nil, never in a stray
// access, a hang or a huge allocation.
//
// Seeds: fuzz/corpus/MXFMetadataFuzz (the first KiB of card-writer MXF files).
#include "FuzzSupport.h"
#include "SkarnMXFHeaderXML.h"
#include "SkarnMXFMetadata.h"

#include <span>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzzThrowOnHardAssertions();
    const std::span<const uint8_t> file(data, size);

    RecordingAssertionHandler recorder;
    ScopedAssertionHandler scoped(&recorder);
    try {
        (void)Value(SkarnMXFMetadataForBytes(file)).description();
        (void)SkarnMXF_XMLStringForBytes(file);
        (void)Value(SkarnMXFDecodeLocalSet(file, "package.source")).description();
    } catch (const HardAssertionFailure&) {
    }
    return 0;
}
