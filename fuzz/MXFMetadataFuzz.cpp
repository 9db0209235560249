// The two readers that take descriptive facts straight from an MXF file's
// header: the metadata sets (SkarnMXFMetadataForFile, and the local-set decoder
// on the raw bytes) and the clip XML an AVCLIP header carries
// (SkarnMXF_XMLStringForClip). Arbitrary files must end in a dictionary or nil,
// never in a stray access, a hang or a huge allocation.
//
// Seeds: fuzz/corpus/MXFMetadataFuzz (the first KiB of card-writer MXF files).
#include "FuzzSupport.h"
#include "SkarnMXFHeaderXML.h"
#include "SkarnMXFMetadata.h"

#include <cstdio>
#include <cstdlib>
#include <string>
#include <unistd.h>

namespace {


}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzzThrowOnHardAssertions();
    static const std::string path = fuzzScratchPath("mxfmeta", ".MXF");

    if (!fuzzWriteInput(path, data, size)) return 0;

    RecordingAssertionHandler recorder;
    ScopedAssertionHandler scoped(&recorder);
    try {
        (void)Value(SkarnMXFMetadataForFile(path)).description();
        (void)SkarnMXF_XMLStringForClip(path);
        (void)Value(SkarnMXFDecodeLocalSet(std::span<const uint8_t>(data, size), "package.source")).description();
    } catch (const HardAssertionFailure&) {
    }
    return 0;
}
