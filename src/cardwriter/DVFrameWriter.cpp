#include "DVFrameWriter.h"

#include <cstring>

size_t dvFrameSize(DVFamily family) {
    switch (family) {
    case DVFamily::DV25_411_525: return 120000;
    case DVFamily::DV25_420_625:
    case DVFamily::DVCPRO_411_625: return 144000;
    case DVFamily::DV50_525:
    case DVFamily::DV100_720_5994: return 240000;
    case DVFamily::DV50_625:
    case DVFamily::DV100_720_50: return 288000;
    case DVFamily::DV100_1080_5994: return 480000;
    case DVFamily::DV100_1080_50: return 576000;
    }
    return 0;
}

void DVFrameWriter::writeFrame(uint64_t, uint8_t* out) const { std::memset(out, 0, frameSize()); }

std::vector<uint8_t> DVFrameWriter::frame(uint64_t index) const {
    std::vector<uint8_t> f(frameSize());
    writeFrame(index, f.data());
    return f;
}
