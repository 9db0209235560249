// Pulldown: which DV frames of a slow shooting rate recorded inside a faster
// recording rate are repeats, and the table of the cadences that can occur.
#pragma once

#include "CMBlockBuffer.h"

#include <array>
#include <cstdint>
#include <span>

// One DV frame: is it a repeated ("drop") frame, and where does it sit in its
// cadence? Only "dvc ", "dv5n", "dvhp", "dvhq", "dvh6", "dvh3" and "dvh2"
// frames are looked at; anything else is answered not dropped, sequence 0,
// status 0. fileName is not used. Either out pointer may be null. The status is
// 0 unless the block buffer or the pack reading failed.
//
// The answer deliberately depends on the subtype in uneven ways: 720p frames
// ("dvhp", "dvhq") are judged by their variable-frame-rate pack alone when they
// have one; once any frame of the process has carried a keep mark, an unmarked
// "dvhp" frame counts as dropped; and with a shooting rate of 24 every unmarked
// DVCPRO HD frame is dropped.
int32_t SkarnAnalyzePulldown(const CMBlockBufferRef& frameData, FourCharCode mediaSubtype, const char* fileName,
                             int32_t shootingRate, uint8_t* dropped, uint32_t* sequenceNumber);

// Whether any frame analysed in this process has carried a pulldown mark. Set by
// SkarnAnalyzePulldown and never cleared.
bool SkarnPulldownRepeatMarkSeen();

// ---------------------------------------------------------------------------
// Cadences. A pattern reads keep (1) and drop (0) frames in order, the first
// frame in the highest of `length` bits.

enum class SkarnCadenceRecording : uint8_t {
    TwentyFourInThirty,
    TwentyFourInSixty,
    HalfRate,  // the recording rate is twice the shooting rate
};

struct SkarnCadence {
    uint8_t pattern;
    const char* name;
    uint8_t length;
    SkarnCadenceRecording recording;
    uint8_t index;      // position in the cadence of the first frame read
    double frameShift;  // in frames; negative shifts move the audio, positive the video
};

extern const std::array<SkarnCadence, 12> kSkarnCadenceTable;

// The row of a pattern of the given length, or nullptr.
const SkarnCadence* SkarnCadenceLookup(uint8_t pattern, uint8_t length);
// The row's frame shift; 0 for any pattern not in the table.
double SkarnCadenceFrameShift(uint8_t pattern, uint8_t length);

// Follow-on drop sequences, one count per cadence position. The media readers
// keep pointers to these arrays, so they are shared constants, never copies.
extern const uint8_t kSkarnHalfRateDropSequence[2];        // {1, 0}
extern const uint8_t kSkarnTwentyFourInSixtyDropSequence[5];  // {1, 0, 2, 1, 0}
extern const uint8_t kSkarnTwentyFourInThirtyDropSequence[5]; // {0, 1, 0, 0, 0}
std::span<const uint8_t> SkarnCadenceDropSequence(SkarnCadenceRecording recording);

// The cadence of a recording as keep (1) and drop (0) bytes, one per frame,
// from the position of cadence index 0; a row's index is where its first
// frame falls in it. Shared constants too: tracks point at them.
extern const uint8_t kSkarnHalfRateKeepDrop[2];           // {1, 0}
extern const uint8_t kSkarnTwentyFourInSixtyKeepDrop[5];  // {1, 0, 1, 0, 0}
extern const uint8_t kSkarnTwentyFourInThirtyKeepDrop[5]; // {1, 1, 0, 1, 1}
std::span<const uint8_t> SkarnCadenceKeepDrop(SkarnCadenceRecording recording);
