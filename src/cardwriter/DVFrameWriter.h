// Synthetic DV-family frames (DIF sequences) for the card writer.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

// The DV families a card can hold; the values are the plug-in's video format codes.
enum class DVFamily : int {
    DV25_411_525 = 1,     // DV/DVCPRO 525 lines, 120000 bytes
    DV25_420_625 = 2,     // DV 625 lines, 144000 bytes
    DVCPRO_411_625 = 8,   // DVCPRO 625 lines, 144000 bytes
    DV50_525 = 9,         // 240000 bytes
    DV50_625 = 10,        // 288000 bytes
    DV100_720_5994 = 11,  // 240000 bytes
    DV100_720_50 = 12,    // 288000 bytes
    DV100_1080_5994 = 13, // 480000 bytes
    DV100_1080_50 = 14,   // 576000 bytes
};

size_t dvFrameSize(DVFamily family);

struct DVStreamSpec {
    DVFamily family = DVFamily::DV25_411_525;
    bool dropFrame = false;
    uint64_t startTimecodeFrames = 0;  // timecode of frame 0, as a frame count
};

class DVFrameWriter {
public:
    explicit DVFrameWriter(DVStreamSpec spec) : _spec(spec) {}
    size_t frameSize() const { return dvFrameSize(_spec.family); }
    // Writes frame `index` of the stream into out (frameSize() bytes).
    void writeFrame(uint64_t index, uint8_t* out) const;
    std::vector<uint8_t> frame(uint64_t index) const;
    const DVStreamSpec& spec() const { return _spec; }

private:
    DVStreamSpec _spec;
};
