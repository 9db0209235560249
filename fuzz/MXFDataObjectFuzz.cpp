// mxfDataObject over arbitrary files: opening, every chunk scan and the three
// lookups must end in a result or one of the reader's assertions (installed
// here to throw), never in a stray access, a hang or a huge allocation.
//
// The input is taken as a whole MXF file, read from memory: the same reader,
// block cache included, as over a file, without a file system call per input.
// To reach the chunk scans quickly, a seed corpus of small card-writer clips
// helps (skarn-mkcard or the tests' clips); the harness itself needs none.
#include "AssertionHandler.h"
#include "mxfDataObject.h"

#include <algorithm>
#include <string>

namespace {

class QuietHandler : public AssertionHandler {
public:
    void handleFailureInMethod(const std::string&, const std::string&, int, const std::string&) override {}
    void handleFailureInFunction(const std::string&, const std::string&, int, const std::string&) override {}
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static QuietHandler quiet;
    static bool installed = [] {
        AssertionHandler::setCurrentHandler(&quiet);
        setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);
        return true;
    }();
    (void)installed;

    try {
        Ref<mxfDataObject> mxf = mxfDataObject::initWithBytes(std::span<const uint8_t>(data, size));
        uint32_t frames = 0;
        mxf->getVideoFrameCount(&frames);
        const int64_t last = std::min<int64_t>(int64_t(frames) + 1, 64);
        for (int64_t i = -1; i <= last; ++i) {
            try {
                mxf->getVideoOffsetForPTS(i);
            } catch (const HardAssertionFailure&) {
            }
            try {
                mxf->getVideoOffsetForDTS(i);
            } catch (const HardAssertionFailure&) {
            }
        }
        uint64_t chunkSize = 0, dataLength = 0;
        mxf->getAudioChunkSize(&chunkSize, &dataLength);
        for (uint64_t sample : {uint64_t(0), uint64_t(1), chunkSize / 2, chunkSize, dataLength})
            for (size_t channel = 0; channel < 2; ++channel) try {
                    mxf->getAudioOffsetForChannel(channel, sample);
                } catch (const HardAssertionFailure&) {
                }
        for (size_t i = 0; i < std::min<size_t>(mxf->chunkCount(), 8); ++i) (void)mxf->chunkAtIndex(i)->description();
    } catch (const HardAssertionFailure&) {
    }
    return 0;
}
