#include "SkarnCadenceReading.h"

#include "DVFrameData.h"
#include "SkarnLog.h"

namespace {

// A stream that keeps answering "no frame" is given up on after this many
// pulls, so that a reading always ends.
constexpr uint32_t kMaxPulls = 64;

struct EarlyStop {
    uint32_t frames;
    uint8_t bits;
    const char* message;
    uint8_t pattern;
};

// 24 in 60: a few frames already fix the cadence.
constexpr EarlyStop kTwentyFourInSixtyStops[] = {
    {2, 0b00, "read drop-drop... must be drop-drop-keep-drop-keep", 0x05},
    {3, 0b100, "read keep-drop-drop... must be keep-drop-drop-keep-drop", 0x12},
    {3, 0b101, "read keep-drop-keep... must be keep-drop-keep-drop-drop", 0x14},
    {4, 0b0100, "read drop-keep-drop-drop... must be drop-keep-drop-drop-keep", 0x09},
    {4, 0b0101, "read drop-keep-drop-keep... must be drop-keep-drop-keep-drop", 0x0a},
};

// 24 in 30 on 720p DVCPRO HD, read from keep marks.
constexpr EarlyStop kKeepMarkStops[] = {
    {1, 0b0, "read drop... must be drop-keep-keep-keep-keep", 0x0f},
    {2, 0b10, "read keep-drop... must be keep-drop-keep-keep-keep", 0x17},
    {3, 0b110, "read keep-keep-drop... must be keep-keep-drop-keep-keep", 0x1b},
    {4, 0b1110, "read keep-keep-keep-drop... must be keep-keep-keep-drop-keep", 0x1d},
    {4, 0b1111, "read keep-keep-keep-keep... must be keep-keep-keep-keep-drop", 0x1e},
};

// 24 in 30 on DV25/DV50: the first kept frame's sequence number places it.
constexpr uint8_t kSequencePatterns[] = {0x1b, 0x17, 0x0f, 0x1e, 0x1d};

void conclude(SkarnCadenceReading& r, uint8_t pattern) {
    r.pattern = pattern;
    r.cadence = SkarnCadenceLookup(pattern, r.length);
    if (r.cadence) r.index = r.cadence->index;
}

void failed(SkarnCadenceReading& r, uint32_t logMask) {
    SkarnLog(logMask, "could not read enough frames (%d) to determine cadence", r.framesClassified);
    r.pullFailed = true;
}

// Pulls until one frame is classified. false when the pull failed.
bool pullOne(SkarnCadenceReading& r, uint32_t logMask, const SkarnCadencePull& pull, uint32_t& pulls, bool& delivered,
             bool& dropped, uint32_t& sequence) {
    while (pulls < kMaxPulls) {
        ++pulls;
        delivered = dropped = false;
        sequence = 0;
        if (pull(&delivered, &dropped, &sequence) != 0) return false;
        if (delivered || dropped) return true;
        SkarnLog(logMask, "no video frame");
    }
    return false;
}

template <size_t N>
void readBits(SkarnCadenceReading& r, uint32_t logMask, const SkarnCadencePull& pull, const EarlyStop (&stops)[N]) {
    uint32_t pulls = 0;
    uint8_t bits = 0;
    while (r.framesClassified < 5) {
        bool delivered = false, dropped = false;
        uint32_t sequence = 0;
        if (!pullOne(r, logMask, pull, pulls, delivered, dropped, sequence)) {
            failed(r, logMask);
            return;
        }
        SkarnLog(logMask, delivered ? "got a video frame" : "dropped a video frame");
        bits = uint8_t(bits << 1 | (delivered ? 1 : 0));
        ++r.framesClassified;
        for (const EarlyStop& stop : stops) {
            if (stop.frames == r.framesClassified && stop.bits == bits) {
                SkarnLog(logMask, "%s", stop.message);
                conclude(r, stop.pattern);
                return;
            }
        }
    }
    conclude(r, bits);
}

}  // namespace

SkarnCadenceReading SkarnReadCadence(uint32_t frameQuanta, uint32_t shootingRate, FourCharCode sourceFormat,
                                     uint32_t logMask, const SkarnCadencePull& pull) {
    SkarnCadenceReading r;
    if (frameQuanta == 0 || shootingRate == 0) return r;
    uint32_t pulls = 0;
    bool delivered = false, dropped = false;
    uint32_t sequence = 0;

    if (frameQuanta == 2 * shootingRate) {
        r.attempted = true;
        r.length = 2;
        SkarnLog(logMask, "attempting to read %d frames to determine cadence of length %d", 1, 2);
        if (!pullOne(r, logMask, pull, pulls, delivered, dropped, sequence)) {
            failed(r, logMask);
            return r;
        }
        r.framesClassified = 1;
        if (delivered) {
            SkarnLog(logMask, "got a video frame, must be keep-drop");
            conclude(r, 0x2);
        } else {
            SkarnLog(logMask, "dropped a video frame, must be drop-keep");
            conclude(r, 0x1);
        }
        return r;
    }
    if (shootingRate != 24 || (frameQuanta != 30 && frameQuanta != 60)) return r;
    r.attempted = true;
    r.length = 5;

    if (frameQuanta == 60) {
        SkarnLog(logMask, "attempting to read %d frames to determine cadence of length %d", 5, 5);
        readBits(r, logMask, pull, kTwentyFourInSixtyStops);
        return r;
    }
    // "dvhp" and "dvhq" differ only in the lowest bit.
    if ((sourceFormat & ~1u) == (DVFourCC("dvhp") & ~1u)) {
        SkarnLog(logMask, "attempting to read up to %d frames to determine cadence", 5);
        readBits(r, logMask, pull, kKeepMarkStops);
        return r;
    }
    SkarnLog(logMask, "attempting to read %d frames to determine cadence of length %d", 1, 5);
    if (!pullOne(r, logMask, pull, pulls, delivered, dropped, sequence)) {
        failed(r, logMask);
        return r;
    }
    r.framesClassified = 1;
    if (dropped) {
        SkarnLog(logMask, "read drop... must be drop-keep-keep-keep-keep");
        conclude(r, 0x0f);
    } else {
        SkarnLog(logMask, "got a video frame of sequence %d", sequence);
        if (sequence < std::size(kSequencePatterns))
            conclude(r, kSequencePatterns[sequence]);
        else
            SkarnLog(logMask, "unknown cadence");
    }
    return r;
}
