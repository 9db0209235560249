#include "SkarnPulldown.h"

#include "DVFrameData.h"

#include <atomic>

const std::array<SkarnCadence, 12> kSkarnCadenceTable = {{
    {0x1b, "keep-keep-drop-keep-keep", 5, SkarnCadenceRecording::TwentyFourInThirty, 0, 0.0},
    {0x17, "keep-drop-keep-keep-keep", 5, SkarnCadenceRecording::TwentyFourInThirty, 1, 0.25},
    {0x0f, "drop-keep-keep-keep-keep", 5, SkarnCadenceRecording::TwentyFourInThirty, 2, 0.5},
    {0x1e, "keep-keep-keep-keep-drop", 5, SkarnCadenceRecording::TwentyFourInThirty, 3, -0.5},
    {0x1d, "keep-keep-keep-drop-keep", 5, SkarnCadenceRecording::TwentyFourInThirty, 4, -0.25},
    {0x14, "keep-drop-keep-drop-drop", 5, SkarnCadenceRecording::TwentyFourInSixty, 0, 0.0},
    {0x09, "drop-keep-drop-drop-keep", 5, SkarnCadenceRecording::TwentyFourInSixty, 1, 1.5},
    {0x12, "keep-drop-drop-keep-drop", 5, SkarnCadenceRecording::TwentyFourInSixty, 2, 0.5},
    {0x05, "drop-drop-keep-drop-keep", 5, SkarnCadenceRecording::TwentyFourInSixty, 3, 2.0},
    {0x0a, "drop-keep-drop-keep-drop", 5, SkarnCadenceRecording::TwentyFourInSixty, 4, 1.0},
    {0x2, "keep-drop", 2, SkarnCadenceRecording::HalfRate, 0, 0.0},
    {0x1, "drop-keep", 2, SkarnCadenceRecording::HalfRate, 1, 1.0},
}};

const uint8_t kSkarnHalfRateDropSequence[2] = {1, 0};
const uint8_t kSkarnTwentyFourInSixtyDropSequence[5] = {1, 0, 2, 1, 0};
const uint8_t kSkarnTwentyFourInThirtyDropSequence[5] = {0, 1, 0, 0, 0};

const SkarnCadence* SkarnCadenceLookup(uint8_t pattern, uint8_t length) {
    for (const auto& row : kSkarnCadenceTable)
        if (row.pattern == pattern && row.length == length) return &row;
    return nullptr;
}

double SkarnCadenceFrameShift(uint8_t pattern, uint8_t length) {
    const SkarnCadence* row = SkarnCadenceLookup(pattern, length);
    return row ? row->frameShift : 0.0;
}

std::span<const uint8_t> SkarnCadenceDropSequence(SkarnCadenceRecording recording) {
    switch (recording) {
    case SkarnCadenceRecording::TwentyFourInThirty: return kSkarnTwentyFourInThirtyDropSequence;
    case SkarnCadenceRecording::TwentyFourInSixty: return kSkarnTwentyFourInSixtyDropSequence;
    case SkarnCadenceRecording::HalfRate: return kSkarnHalfRateDropSequence;
    }
    return {};
}

const uint8_t kSkarnHalfRateKeepDrop[2] = {1, 0};
const uint8_t kSkarnTwentyFourInSixtyKeepDrop[5] = {1, 0, 1, 0, 0};
const uint8_t kSkarnTwentyFourInThirtyKeepDrop[5] = {1, 1, 0, 1, 1};

std::span<const uint8_t> SkarnCadenceKeepDrop(SkarnCadenceRecording recording) {
    switch (recording) {
    case SkarnCadenceRecording::TwentyFourInThirty: return kSkarnTwentyFourInThirtyKeepDrop;
    case SkarnCadenceRecording::TwentyFourInSixty: return kSkarnTwentyFourInSixtyKeepDrop;
    case SkarnCadenceRecording::HalfRate: return kSkarnHalfRateKeepDrop;
    }
    return {};
}

namespace {

// Process-wide, false at load and never cleared: one marked frame anywhere makes
// every later unmarked 720p frame a repeat.
std::atomic<bool> gRepeatMarkSeen{false};

// The DV subtypes that carry pulldown information, with their frame types.
int32_t analysedFrameType(FourCharCode subtype) {
    switch (subtype) {
    case DVFourCC("dvc "): return 2;
    case DVFourCC("dv5n"): return 4;
    case DVFourCC("dvhp"): return 8;
    case DVFourCC("dvhq"): return 9;
    case DVFourCC("dvh6"): return 10;
    case DVFourCC("dvh3"): return 12;
    case DVFourCC("dvh2"): return 13;
    default: return 0;
    }
}

}  // namespace

bool SkarnPulldownRepeatMarkSeen() { return gRepeatMarkSeen.load(std::memory_order_relaxed); }

int32_t SkarnAnalyzePulldown(const CMBlockBufferRef& frameData, FourCharCode mediaSubtype, const char*,
                             int32_t shootingRate, uint8_t* droppedOut, uint32_t* sequenceOut) {
    bool dropped = false;
    uint32_t sequence = 0;
    auto answer = [&](int32_t status) {
        if (droppedOut) *droppedOut = dropped ? 1 : 0;
        if (sequenceOut) *sequenceOut = sequence;
        return status;
    };

    if (!frameData) return answer(0);
    char* data = nullptr;
    size_t contiguous = 0;
    OSStatus status = CMBlockBufferGetDataPointer(frameData, 0, &contiguous, nullptr, &data);
    if (status != kCMBlockBufferNoErr) return answer(status);
    const std::span<const uint8_t> frame(reinterpret_cast<const uint8_t*>(data), contiguous);

    const int32_t type = analysedFrameType(mediaSubtype);
    if (type == 0) return answer(0);
    const bool vfrSubtype = type == 8 || type == 9;  // "dvhp", "dvhq"
    const bool isDvhp = type == 8;
    const bool isDvh6 = type == 10;

    OwnedRecord r5 = OwnedRecord::newPtrClear(kDVDefaultRecordSize);
    OwnedRecord r7 = OwnedRecord::newPtrClear(kDVDefaultRecordSize);
    if (!r5 || !r7) return answer(kDVErrNoMemory);
    constexpr uint32_t kFlags = 3;  // caller-supplied record

    enum class Step { Mark, Classify, RateRule };
    Step next = Step::Mark;
    bool classify = true;  // the classification switch of the Classify step
    bool readR5 = false;
    int32_t r5Status = 0;

    bool haveR7 = false;
    if (vfrSubtype) haveR7 = DVCUExtractDataElementFromFrame(type, 0, frame, kDVElementVFR, &r7, kFlags) == 0;
    if (!haveR7) {
        readR5 = true;
        r5Status = DVCUExtractDataElementFromFrame(type, 0, frame, kDVElementShootingRate, &r5, kFlags);
        if (r5Status != 0) {
            if (vfrSubtype || isDvh6) {
                next = Step::RateRule;
            } else {
                next = Step::Classify;
                classify = false;
            }
        }
    }

    auto R5 = [&] { return DVCURecordRead<DVShootingRateRecord>(r5.bytes()); };
    auto R7 = [&] { return DVCURecordRead<DVVFRRecord>(r7.bytes()); };

    if (next == Step::Mark) {
        const DVShootingRateRecord s = R5();
        if ((R7().flags & kDVVFRFlagKeep) || (s.rate == 24 && (s.flags & kDVShootingRateFlagRepeatMark))) {
            gRepeatMarkSeen.store(true, std::memory_order_relaxed);
            next = Step::Classify;
            classify = true;
        } else if (vfrSubtype || isDvh6) {
            next = Step::RateRule;
        } else {
            next = Step::Classify;
            classify = true;
        }
    }

    if (next == Step::RateRule) {
        if (shootingRate == 24) {
            dropped = true;
            sequence = 0;
        } else if (isDvhp) {
            dropped = SkarnPulldownRepeatMarkSeen();
            sequence = 0;
        } else {
            next = Step::Classify;  // "dvhq", "dvh6": frame type above 7, never dropped below
        }
    }

    if (next == Step::Classify) {
        dropped = false;
        sequence = 0;
        const DVShootingRateRecord s = R5();
        // Only DV25 and DV50 frames number their place in the cadence.
        if (type <= 7 && classify && s.tag == DVElementTag(kDVElementShootingRate) &&
            !(s.flags & kDVShootingRateFlagRepeatMark) && s.rate == 24 && (s.flags & kDVShootingRateFlagFrames) &&
            (s.flags & (kDVShootingRateFlag2332 | kDVShootingRateFlag23))) {
            sequence = uint32_t(s.mode);
            dropped = s.mode == 2;
        }
    }

    if (!readR5 || r5Status == 0) return answer(0);
    if (!vfrSubtype) return answer(r5Status);
    const int32_t r7Status = DVCUExtractDataElementFromFrame(type, 0, frame, kDVElementVFR, &r7, kFlags);
    if (r7Status != 0) return answer(r7Status);
    if (!(R7().flags & kDVVFRFlagKeep)) dropped = true;
    return answer(0);
}
