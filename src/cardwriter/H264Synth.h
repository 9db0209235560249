// Small, valid H.264 access units for card essence: a grey picture coded with
// the fewest bits (intra 16x16 DC blocks, arithmetic-coded so that a 1080
// picture takes some 450 bytes, or skipped blocks for P and B), padded to the
// exact frame size with a filler-data NAL unit. Decoders accept them, so
// essence checks with real tools stay clean.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

struct H264SynthParams {
    uint32_t width = 1920;
    uint32_t height = 1080;
    enum class Picture { I, P, B } picture = Picture::I;
    uint32_t frameNum = 0;          // frame_num of the picture (reference pictures count up)
    uint32_t pocLsb = 0;            // picture order count (presentation order x 2), mod 256
    bool idr = true;                // an I picture that starts a sequence
    bool parameterSets = true;      // SPS and PPS ahead of the slice
    uint32_t idrPicID = 0;
};

// The access unit, with four-byte start codes, padded to exactly `size` bytes
// (or left at its natural size when that is larger).
std::vector<uint8_t> makeH264AccessUnit(const H264SynthParams& params, size_t size);
