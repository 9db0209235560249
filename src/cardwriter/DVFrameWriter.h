// DV-family frames for the card writer: real DIF structure (header, subcode,
// VAUX, audio and video blocks with their IDs) carrying the packs the plug-in
// reads: timecode, binary group / variable frame rate, shooting rate, video
// source and control, audio source. Pulldown streams (24 in 30, 24 in 60, half
// rate) carry their cadence in those packs from any starting phase.
//
// The header block (DSF, APT) and the video source and control packs declare
// the family the way DV readers tell the rasters and samplings apart. By default
// the sound is silent and the picture one flat colour, coded as real DV video
// (DC-only blocks), so any DV decoder shows it. With essenceFile, the frames of
// a raw DV file of the same family (for example one made by ffmpeg) are used in
// turn and only the packs (and, at 720p, the frame-pair bit of the block IDs)
// are rewritten, so the frames stay decodable.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
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

enum class DVCadence {
    None,
    // 24p in a 525-line (29.97) DV25 or DV50 stream: the shooting-rate pack's
    // mode counts the cadence position 0-4, and position 2 is the repeat.
    TwentyFourInThirty,
    // 24p in 720p59.94: frames keep-drop-keep-drop-drop from position 0, marked
    // in the variable-frame-rate pack.
    TwentyFourInSixty,
    // 30p in 720p59.94 or 25p in 720p50: keep-drop from position 0.
    HalfRate,
};

struct DVStreamSpec {
    DVFamily family = DVFamily::DV25_411_525;
    bool dropFrame = false;
    uint64_t startTimecodeFrames = 0;  // timecode of frame 0, as a frame count at timecodeRate()
    DVCadence cadence = DVCadence::None;
    // Cadence position of frame 0; equals the cadence table's index of the
    // pattern that the first frames read as (0-4, or 0-1 for half rate).
    unsigned cadencePhase = 0;
    // Rate written in the shooting-rate pack (0x64). 0: 24 for the 24p cadences,
    // half the frame rate for half rate, and no pack at all without a cadence.
    int shootingRate = 0;
    // Raw DV file whose frames (cycled) carry the picture; empty for placeholders.
    std::string essenceFile;
};

class DVFrameWriter {
public:
    // The flat colour of the default picture (a light steel blue), as 8-bit Y,
    // Cb and Cr levels.
    static constexpr uint8_t kPictureY = 160, kPictureCb = 144, kPictureCr = 112;

    // Throws std::invalid_argument for a cadence the family cannot carry and
    // std::runtime_error for an unreadable or mismatched essence file.
    explicit DVFrameWriter(DVStreamSpec params);

    size_t frameSize() const { return dvFrameSize(_shape.family); }
    // Writes frame `index` of the stream into out (frameSize() bytes).
    void writeFrame(uint64_t index, uint8_t* out) const;
    std::vector<uint8_t> frame(uint64_t index) const;
    const DVStreamSpec& params() const { return _shape; }

    // Frames per second the timecode counts: 30, 25, 60 (720p59.94) or 50.
    int timecodeRate() const;
    unsigned sequenceCount() const;  // DIF sequences per frame
    unsigned channelCount() const;   // 1, 2 or 4
    int shootingRate() const;        // as written, 0 for none
    // Position of frame `index` in the cadence (0 without one).
    unsigned cadencePosition(uint64_t index) const;
    // Whether frame `index` repeats an earlier picture (a drop frame of the cadence).
    bool isRepeatFrame(uint64_t index) const;
    // Frames of the essence file in use (0 without one).
    size_t essenceFrameCount() const { return _essenceFrames; }

private:
    bool isRepeatFrameSigned(int64_t index) const;
    void writePlaceholder(uint64_t index, uint8_t* out) const;
    void writePacks(uint64_t index, uint8_t* out, bool ownsWholeFrame) const;

    DVStreamSpec _shape;
    std::shared_ptr<const std::vector<uint8_t>> _essence;
    size_t _essenceFrames = 0;
};
