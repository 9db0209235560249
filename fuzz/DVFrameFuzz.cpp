// Hostile DV frames through every pack reader and the pulldown classification.
#include "CMBlockBuffer.h"
#include "DVFrameData.h"
#include "SkarnPulldown.h"

#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

// The fuzzer's bytes become a frame in one of three ways: as they are (any
// size), tiled over a whole DV frame, or laid over the first blocks (header,
// subcode, VAUX) of every sequence of a frame that is otherwise 0xFF.
std::vector<uint8_t> makeFrame(const uint8_t* data, size_t size) {
    if (size < 2) return std::vector<uint8_t>(data, data + size);
    const uint8_t mode = data[0] % 3;
    const size_t frameSize = size_t(kDVFrameTypeTable[data[1] % kDVFrameTypeTable.size()].bytesPerFrame);
    data += 2;
    size -= 2;
    if (mode == 0 || size == 0) return std::vector<uint8_t>(data, data + size);
    std::vector<uint8_t> frame(frameSize, 0xFF);
    if (mode == 1) {
        for (size_t i = 0; i < frameSize; ++i) frame[i] = data[i % size];
    } else {
        for (size_t seq = 0; seq < frameSize / kDVDIFSequenceSize; ++seq)
            std::memcpy(frame.data() + seq * kDVDIFSequenceSize, data, std::min(size, size_t(6 * kDVDIFBlockSize)));
    }
    return frame;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    std::vector<uint8_t> frame = makeFrame(data, size);
    const uint32_t seq = size > 2 ? data[2] % 52 : 1;
    const uint8_t replacement[5] = {0x13, 0, 0, 0, 0};

    int32_t v[6];
    uint8_t df = 0;
    for (int32_t rate : {0, 24, 25, 30, 50, 60, -7, 2147483647}) {
        DVExtractTimeCodeFromFrame(frame, seq, 1, rate, nullptr, &v[0], &v[1], &v[2], &v[3], &v[4], &df);
    }
    DVExtractTimeCodeFromFrame(frame, seq, 1, 30, replacement, &v[0], &v[1], &v[2], &v[3], &v[4], &df);
    DVExtractShootingRateFromFrame(frame, seq, 0, 0, nullptr, &v[0], &v[1], &v[2]);
    DVExtractShootingRateFromFrame(frame, 0xFFFFFFFFu, 0, 0, nullptr, &v[0], &v[1], &v[2]);
    DVExtractVFRInfoFromFrame(frame, seq, 0, 0, nullptr, &v[0], &v[1], &v[2], &v[3]);

    for (int32_t type = 1; type <= 14; ++type) {
        for (int32_t element = 0; element <= 8; ++element) {
            OwnedRecord record;
            DVCUExtractDataElementFromFrame(type, 0, frame, element, &record, 0);
            OwnedRecord supplied = OwnedRecord::newPtrClear(element == 7 ? 28 : 20);
            DVCUExtractDataElementFromFrame(type, 0, frame, element, &supplied, 3);
        }
    }

    if (!frame.empty()) {
        void* memory = std::malloc(frame.size());
        std::memcpy(memory, frame.data(), frame.size());
        CMBlockBufferRef buffer;
        if (CMBlockBufferCreateWithMemoryBlock(nullptr, memory, frame.size(), nullptr, nullptr, 0, frame.size(), 0,
                                               &buffer) != 0) {
            std::free(memory);
            return 0;
        }
        for (const char* subtype : {"dvc ", "dv5n", "dvhp", "dvhq", "dvh6", "dvh3", "dvh2"}) {
            char code[5];
            std::memcpy(code, subtype, 5);
            uint8_t dropped;
            uint32_t sequence;
            for (int32_t shootingRate : {24, 25, 30}) {
                SkarnAnalyzePulldown(buffer, DVFourCC(code), nullptr, shootingRate, &dropped, &sequence);
            }
        }
    }
    return 0;
}
