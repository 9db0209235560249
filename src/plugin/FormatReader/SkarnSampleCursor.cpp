// Sample cursors: creation, placement, stepping and comparison.
#include "SkarnSampleCursor.h"

#include "AssertionHandler.h"

#include "LogSink.h"
#include "SkarnLog.h"
#include "SkarnSampleCursorInternal.h"

#include <algorithm>

using namespace SkarnCursorDetail;

namespace {

constexpr uint32_t kBadDecodeIndex = 0xFFFFFFFFu;

void softAssert(const char* method, const char* description) {
    AssertionHandler::currentHandler().handleFailureInMethod(method, "FormatReader/SkarnSampleCursor", __LINE__,
                                                             description);
}

}  // namespace

// ---------------------------------------------------------------------------
// Creation

Ref<SkarnSampleCursor> SkarnSampleCursor::sampleCursorWithTrackReader(SkarnTrackReader* trackReader, CMTime pts,
                                                                      bool* beforeStart, bool* afterEnd) {
    if (!trackReader) return nullptr;
    CMTime converted =
        CMTimeConvertScale(pts, int32_t(trackReader->timescale()), kCMTimeRoundingMethod_RoundHalfAwayFromZero);
    return initWithTrackReader(trackReader, converted, beforeStart, afterEnd);
}

Ref<SkarnSampleCursor> SkarnSampleCursor::initWithTrackReader(SkarnTrackReader* trackReader, CMTime pts,
                                                              bool* beforeStart, bool* afterEnd) {
    if (!trackReader) return nullptr;
    Ref<SkarnSampleCursor> cursor(new SkarnSampleCursor);
    SkarnLog(8, "\t\t%@ init", cursor->Object::description());
    cursor->setTrackReader(trackReader);
    SkarnTrackReader* track = trackReader;
    bool before = false, after = false;
    CMTime minpts = track->minpts(), maxpts = track->maxpts();

    switch (cursor->kind()) {
    case TrackKind::ByteLayout: {
        if (CMTimeCompare(pts, minpts) < 0) {
            pts = minpts;
            before = true;
        } else if (CMTimeCompare(pts, maxpts) > 0) {
            pts = maxpts;
            after = true;
        }
        CMTime fd = track->frameDuration();
        if (track->mediaTypeValue() == kCMMediaType_Video && fd.value > 0 && CMTIME_IS_NUMERIC(pts)) {
            pts.value = (pts.value / fd.value) * fd.value;
            pts.timescale = fd.timescale;
        }
        break;
    }
    case TrackKind::MXFVideo: {
        before = CMTimeCompare(pts, minpts) < 0;
        after = CMTimeCompare(pts, maxpts) > 0;
        CMTime result = kCMTimeInvalid;
        int32_t status = 0;
        uint32_t index = cursor->currentVideoMXFDecodeIndexFromPTS(pts, &result, &status);
        cursor->setCurrentMXFIndex(index);
        pts = result;
        break;
    }
    case TrackKind::MXFAudio: {
        int64_t chunk = audioChunkAt(pts, track->sampleSize(), track->chunkSize());
        int64_t lastChunk = safeDivide(maxpts.value, track->samplesPerChunk());
        if (chunk > lastChunk) {
            pts = maxpts;
            cursor->setCurrentMXFIndex(uint32_t(lastChunk));
            after = true;
        } else if (chunk < 0) {
            pts = minpts;
            cursor->setCurrentMXFIndex(0);
            before = true;
        } else {
            cursor->setCurrentMXFIndex(uint32_t(chunk));
        }
        // The cursor stands on the first sample of the block that holds the time.
        if (auto record = track->mxfAudioSampleOffsetForChannel(track->audioChannelIndex(), uint64_t(pts.value)))
            pts = CMTimeMake(int64_t(record->decodeOrder()), int32_t(track->sampleRate()));
        break;
    }
    case TrackKind::MXFOther:
        break;
    }

    cursor->setCurrentPTS(pts);
    if (beforeStart) *beforeStart = before;
    if (afterEnd) *afterEnd = after;
    SkarnLog(2, "new %@: pts: %lld/%d", cursor, pts.value, pts.timescale);
    return cursor;
}

static Ref<SkarnSampleCursor> cursorAtEnd(SkarnTrackReader* trackReader, CMTime pts, bool first) {
    if (!trackReader) return nullptr;
    if (first)
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(pts, trackReader->minpts()) == 0,
                               "CMTIME_COMPARE_INLINE(pts,==,trackReader.minpts)", kSource);
    else
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(pts, trackReader->maxpts()) == 0,
                               "CMTIME_COMPARE_INLINE(pts,==,trackReader.maxpts)", kSource);
    Ref<SkarnSampleCursor> cursor = SkarnSampleCursor::initWithTrackReader(trackReader, pts, nullptr, nullptr);
    if (trackReader->mxfDataAccess() && trackReader->mediaTypeValue() == kCMMediaType_Video &&
        CMTIME_IS_NUMERIC(trackReader->maxpts())) {
        // The time is taken as a decode time: the first (last) sample to decode.
        Ref<mxfEssenseOffsets> record = trackReader->mxfVideoSampleOffsetAtDecodeTime(pts);
        cursor->setCurrentMXFIndex(decodeOrderOf(record));
        cursor->setCurrentPTS(timeTimes(trackReader->frameDuration(), presentationOrderOf(record)));
    } else {
        cursor->setCurrentMXFIndex(uint32_t(safeDivide(pts.value, trackReader->samplesPerChunk())));
        cursor->setCurrentPTS(pts);
    }
    return cursor;
}

Ref<SkarnSampleCursor> SkarnSampleCursor::sampleCursorAtFirstSampleInDecodeOrder(SkarnTrackReader* trackReader,
                                                                                 CMTime pts) {
    return cursorAtEnd(trackReader, pts, true);
}

Ref<SkarnSampleCursor> SkarnSampleCursor::sampleCursorAtLastSampleInDecodeOrder(SkarnTrackReader* trackReader,
                                                                                CMTime pts) {
    return cursorAtEnd(trackReader, pts, false);
}

Ref<SkarnSampleCursor> SkarnSampleCursor::copyWithZone() const {
    SkarnTrackReader* track = trackReader();
    CMTime pts = currentPTS();
    Ref<SkarnSampleCursor> copy = initWithTrackReader(track, pts, nullptr, nullptr);
    if (!copy) return nullptr;
    // Placement may snap differently (an audio block start, a reordered
    // frame); a copy stands exactly where this cursor stands.
    copy->setCurrentPTS(pts);
    copy->setCurrentMXFIndex(currentMXFIndex());
    return copy;
}

SkarnSampleCursor::~SkarnSampleCursor() { SkarnLog(8, "\t\t%@ dealloc", Object::description()); }

void SkarnSampleCursor::retain() const {
    int32_t count = incrementRetainCount();
    SkarnLog(4, "\t\t%@ retain %d", Object::description(), count);
    (void)count;
}

void SkarnSampleCursor::release() const {
    SkarnLog(4, "\t\t%@ release %d", Object::description(), retainCount() - 1);
    if (decrementRetainCount() == 0) delete this;
}

void SkarnSampleCursor::setTrackReader(SkarnTrackReader* track) {
    _trackReader.store(track);
    _kind.store(track ? kindOf(track) : TrackKind::ByteLayout, std::memory_order_relaxed);
}

SkarnSampleCursor::TrackKind SkarnSampleCursor::kindOf(SkarnTrackReader* track) {
    // A track without samples has nothing to look up in the index tables: it
    // answers as an empty track laid out by offsets does.
    if (!track->mxfDataAccess() || !CMTIME_IS_NUMERIC(track->maxpts())) return TrackKind::ByteLayout;
    FourCharCode type = track->mediaTypeValue();
    if (type == kCMMediaType_Video) return TrackKind::MXFVideo;
    if (type == kCMMediaType_Audio) return TrackKind::MXFAudio;
    return TrackKind::MXFOther;
}

mxfEssenseOffsets* SkarnSampleCursor::videoRecordAt(CMTime pts) const {
    SkarnTrackReader* track = trackReader();
    mxfDataObject* mxf = track->mxfDataAccess();
    CMTime fd = track->frameDuration();
    const CachedVideoRecord& cached = _videoRecordCache;
    if (cached.record && cached.mxf == mxf && cached.ptsValue == pts.value && cached.ptsTimescale == pts.timescale &&
        cached.frameValue == fd.value && cached.frameTimescale == fd.timescale)
        return cached.record;
    Ref<mxfEssenseOffsets> record = track->mxfVideoSampleOffsetAtPresentationTime(pts);
    if (record) _videoRecordCache = {mxf, pts.value, fd.value, pts.timescale, fd.timescale, record.get()};
    return record.get();
}

int64_t SkarnSampleCursor::frameIndex() const {
    return safeDivide(currentPTS().value, trackReader()->frameDuration().value);
}

// ---------------------------------------------------------------------------
// MXF video: presentation time -> decode index

uint32_t SkarnSampleCursor::currentVideoMXFDecodeIndexFromPTS(CMTime wantedPTS, CMTime* resultPTS, int32_t* error) {
    SkarnTrackReader* track = trackReader();
    CMTime frameDuration = track->frameDuration();
    CMTime minpts = track->minpts(), maxpts = track->maxpts();
    // Times beyond the 64-bit range (a host's step of any size, an infinite
    // time) are past the last sample or before the first, not programming errors.
    if (!CMTIME_IS_NUMERIC(wantedPTS) && frameDuration.value > 0)
        wantedPTS = CMTIME_IS_POSITIVE_INFINITY(wantedPTS)
                        ? CMTimeAdd(maxpts, frameDuration)
                        : CMTimeMake(-frameDuration.value, frameDuration.timescale);
    wantedPTS = CMTimeConvertScale(wantedPTS, frameDuration.timescale, kCMTimeRoundingMethod_RoundHalfAwayFromZero);
    if (!CMTIME_IS_NUMERIC(wantedPTS) && frameDuration.value > 0)
        wantedPTS = CMTIME_IS_POSITIVE_INFINITY(wantedPTS)
                        ? CMTimeAdd(maxpts, frameDuration)
                        : CMTimeMake(-frameDuration.value, frameDuration.timescale);
    SKARN_HARD_ASSERT_TEXT(wantedPTS.timescale == frameDuration.timescale,
                           "wantedPTS.timescale == frameDuration.timescale", kSource);
    SKARN_HARD_ASSERT_TEXT(maxpts.timescale == frameDuration.timescale,
                           "self.trackReader.maxpts.timescale == frameDuration.timescale", kSource);
    SKARN_HARD_ASSERT_TEXT(frameDuration.value > 0, "_frameDuration.value>0", kSource);

    if (!track->mxfVideoTablesChecked()) {
        mxfEssenseOffsets* firstTemporalSample = videoRecordAt(kCMTimeZero);
        SKARN_HARD_ASSERT_TEXT(presentationOrderOf(firstTemporalSample) == 0,
                               "[firstTemporalSample presentationOrder] == 0", kSource);
        CMTime firstPTS = timeTimes(frameDuration, presentationOrderOf(firstTemporalSample));
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(firstPTS, kCMTimeZero) == 0,
                               "CMTIME_COMPARE_INLINE(firstPTS,==,kCMTimeZero)==true", kSource);
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(firstPTS, minpts) == 0,
                               "CMTIME_COMPARE_INLINE(minpts, == ,_trackReader.minpts)", kSource);
        uint32_t frameCount = 0;
        track->mxfDataAccess()->getVideoFrameCount(&frameCount);
        CMTime lastPTS = timeTimes(frameDuration, int64_t(frameCount) - 1);
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(lastPTS, maxpts) == 0,
                               "CMTIME_COMPARE_INLINE(maxpts,==,_trackReader.maxpts)", kSource);
        track->setMxfVideoTablesChecked();
    }

    int64_t wantedIndex = wantedPTS.value / frameDuration.value;
    int64_t maxIndex = maxpts.value / frameDuration.value;
    mxfEssenseOffsets* foundEssense = videoRecordAt(wantedPTS);
    int32_t status = 0;
    if (wantedIndex < 0) {
        SKARN_HARD_ASSERT_TEXT(!foundEssense, "foundEssense == nil", kSource);
        foundEssense = videoRecordAt(minpts);
        status = kVestaKilnSampleCursorNoMoreSamples;
    } else if (wantedIndex <= maxIndex) {
        SKARN_HARD_ASSERT_TEXT(foundEssense, "foundEssense != nil", kSource);
        CMTime result = timeTimes(frameDuration, presentationOrderOf(foundEssense));
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(wantedPTS, result) >= 0 &&
                                   CMTimeCompare(wantedPTS, CMTimeAdd(result, frameDuration)) < 0,
                               "CMTIME_COMPARE_INLINE(wantedPTS, >=, result) && CMTIME_COMPARE_INLINE(wantedPTS, <, "
                               "CMTimeAdd(result, frameDuration))",
                               kSource);
    } else {
        SKARN_HARD_ASSERT_TEXT(!foundEssense, "foundEssense == nil", kSource);
        foundEssense = videoRecordAt(maxpts);
        status = kVestaKilnSampleCursorNoMoreSamples;
    }
    uint32_t decodeIndex = decodeOrderOf(foundEssense);
    SKARN_HARD_ASSERT_TEXT(decodeIndex != kBadDecodeIndex, "decodeIndex != BAD_DECODE_INDEX", kSource);
    if (error) *error = status;
    if (resultPTS) *resultPTS = timeTimes(frameDuration, presentationOrderOf(foundEssense));
    return decodeIndex;
}

void SkarnSampleCursor::checkDecodeIndexInvariant() const {
    mxfEssenseOffsets* record = videoRecordAt(currentPTS());
    if (decodeOrderOf(record) != currentMXFIndex())
        softAssert("-[SkarnSampleCursor checkDecodeIndex]", "currentMXFIndex not equaling decodeOrder");
}

// ---------------------------------------------------------------------------
// Stepping

int32_t SkarnSampleCursor::stepInDecodeOrder(int64_t stepCount) {
    SkarnTrackReader* track = trackReader();
    switch (kind()) {
    case TrackKind::ByteLayout:
        return stepInPresentationOrder(stepCount);
    case TrackKind::MXFVideo: {
        checkDecodeIndexInvariant();
        CMTime frameDuration = track->frameDuration(), maxpts = track->maxpts();
        if (frameDuration.timescale != maxpts.timescale) softAssert("-[SkarnSampleCursor stepInDecodeOrder:]", "timescale error");
        int64_t maxDTSIndex = safeDivide(maxpts.value, frameDuration.value);
        // A step of any size ends one past either end: the lookups there answer
        // the first or last sample as they would for the next index.
        int64_t wanted = 0;
        if (__builtin_add_overflow(int64_t(currentMXFIndex()), stepCount, &wanted)) wanted = stepCount < 0 ? -1 : INT64_MAX;
        wanted = std::clamp<int64_t>(wanted, -1, std::max<int64_t>(maxDTSIndex, -1) + 1);
        CMTime wantedDTS = timeTimes(frameDuration, wanted);
        Ref<mxfEssenseOffsets> record = track->mxfVideoSampleOffsetAtDecodeTime(wantedDTS);
        // Set before any clamping below, deliberately: the decode lookup already
        // answered the first or last sample.
        setCurrentPTS(timeTimes(frameDuration, presentationOrderOf(record)));
        if (wanted >= 0 && wanted <= maxDTSIndex) {
            setCurrentMXFIndex(uint32_t(wanted));
            return 0;
        }
        if (wanted < 0) {
            setCurrentMXFIndex(0);
            setCurrentPTS(track->minpts());
            return kVestaKilnSampleCursorNoMoreSamples;
        }
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(wantedDTS, track->trackDuration()) >= 0,
                               "CMTIME_COMPARE_INLINE(wantedDTS, >=, self.trackReader.trackDuration)", kSource);
        setCurrentMXFIndex(decodeOrderOf(record));
        SKARN_HARD_ASSERT_TEXT(int64_t(currentMXFIndex()) == maxDTSIndex, "self.currentMXFIndex == maxDTSIndex",
                               kSource);
        return kVestaKilnSampleCursorNoMoreSamples;
    }
    case TrackKind::MXFAudio: {
        // The count's absolute value: a backward step moves forward too. Hosts
        // only step audio forward, and it has always been so.
        int64_t magnitude = stepCount == INT64_MIN ? INT64_MAX : stepCount < 0 ? -stepCount : stepCount;
        CMTime pts = CMTimeAdd(currentPTS(), timeTimes(track->frameDuration(), magnitude));
        // Beyond the 64-bit range the time stays just past the end, still a number.
        if (!CMTIME_IS_NUMERIC(pts) && CMTIME_IS_NUMERIC(track->trackDuration())) pts = track->trackDuration();
        setCurrentPTS(pts);
        int64_t chunk = audioChunkAt(pts, track->sampleSize(), track->chunkSize());
        int64_t lastChunk = safeDivide(track->maxpts().value, track->samplesPerChunk());
        if (chunk >= 0 && chunk <= lastChunk) {
            setCurrentMXFIndex(uint32_t(chunk));
            return 0;
        }
        setCurrentMXFIndex(chunk < 0 ? 0 : uint32_t(lastChunk));
        return kVestaKilnSampleCursorNoMoreSamples;
    }
    case TrackKind::MXFOther:
        return 0;
    }
    return 0;
}

int32_t SkarnSampleCursor::stepInPresentationOrder(int64_t stepCount) {
    SkarnTrackReader* track = trackReader();
    CMTime pts = currentPTS();
    CMTime wanted = CMTimeAdd(pts, timeTimes(track->frameDuration(), stepCount));
    int32_t status = 0;
    if (kind() == TrackKind::ByteLayout) {
        CMTime minpts = track->minpts(), maxpts = track->maxpts();
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(pts, minpts) >= 0, "CMTIME_COMPARE_INLINE(pts, >=, minpts)", kSource);
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(pts, maxpts) <= 0, "CMTIME_COMPARE_INLINE(pts, <=, maxpts)", kSource);
        if (!CMTIME_IS_NUMERIC(pts) || CMTIME_IS_INVALID(wanted) || CMTIME_IS_INDEFINITE(wanted)) {
            // An empty track, or one whose frame duration is unknown: nowhere to go.
            status = kVestaKilnSampleCursorNoMoreSamples;
        } else if (CMTimeCompare(wanted, minpts) < 0) {
            setCurrentPTS(minpts);
            status = kVestaKilnSampleCursorNoMoreSamples;
        } else if (CMTimeCompare(wanted, maxpts) > 0) {
            setCurrentPTS(maxpts);
            status = kVestaKilnSampleCursorNoMoreSamples;
        } else {
            setCurrentPTS(wanted);
        }
    } else {
        if (track->mediaTypeValue() != kCMMediaType_Video)
            softAssert("-[SkarnSampleCursor stepInPresentationOrder:]", "Must be Video");
        CMTime result = kCMTimeInvalid;
        uint32_t index = currentVideoMXFDecodeIndexFromPTS(wanted, &result, &status);
        setCurrentMXFIndex(index);
        setCurrentPTS(result);
    }
    SkarnLog(2, "%@: stepInPresentationOrder: step: %d pts: %lld/%d", this, stepCount, wanted.value,
             wanted.timescale);
    return status;
}

int32_t SkarnSampleCursor::stepByPresentationTime(CMTime delta) {
    SkarnTrackReader* track = trackReader();
    CMTime pts = currentPTS();
    CMTime step = CMTimeConvertScale(delta, pts.timescale, kCMTimeRoundingMethod_RoundHalfAwayFromZero);
    CMTime wanted = CMTimeAdd(pts, step);
    CMTime minpts = track->minpts(), maxpts = track->maxpts();
    int32_t status = 0;
    bool clamped = false;
    if (!CMTIME_IS_NUMERIC(wanted) && CMTIME_IS_NUMERIC(pts) && (CMTIME_IS_POSITIVE_INFINITY(wanted) ||
                                                                 CMTIME_IS_NEGATIVE_INFINITY(wanted))) {
        // A delta beyond the 64-bit range: to the end it points at.
        wanted = CMTIME_IS_POSITIVE_INFINITY(wanted) ? maxpts : minpts;
        status = kVestaKilnSampleCursorNoMoreSamples;
        clamped = true;
    } else if (!CMTIME_IS_NUMERIC(wanted)) {
        wanted = pts;
        status = kVestaKilnSampleCursorNoMoreSamples;
    } else if (CMTimeCompare(wanted, minpts) < 0) {
        wanted = minpts;
        status = kVestaKilnSampleCursorNoMoreSamples;
        clamped = true;
    } else if (CMTimeCompare(wanted, maxpts) > 0) {
        wanted = maxpts;
        status = kVestaKilnSampleCursorNoMoreSamples;
        clamped = true;
    }
    SkarnLog(2, "%@: step by presentation time: step: %lld/%d pts: %lld/%d", this, step.value, step.timescale,
             wanted.value, wanted.timescale);
    switch (kind()) {
    case TrackKind::MXFVideo: {
        // The lookup finds the clamped time inside the track and answers 0 for
        // it: a step that was stopped at an end must still say so.
        CMTime result = kCMTimeInvalid;
        uint32_t index = currentVideoMXFDecodeIndexFromPTS(wanted, &result, &status);
        setCurrentMXFIndex(index);
        wanted = result;
        if (clamped) status = kVestaKilnSampleCursorNoMoreSamples;
        break;
    }
    case TrackKind::MXFAudio:
    case TrackKind::MXFOther:
        if (auto record = track->mxfAudioSampleOffsetForChannel(track->audioChannelIndex(), uint64_t(wanted.value)))
            setCurrentMXFIndex(record->decodeOrder());
        if (clamped) status = kVestaKilnSampleCursorNoMoreSamples;
        break;
    case TrackKind::ByteLayout:
        break;
    }
    setCurrentPTS(wanted);
    return status;
}

int32_t SkarnSampleCursor::stepByDecodeTime(CMTime delta) {
    if (kind() != TrackKind::MXFVideo) return stepByPresentationTime(delta);
    SkarnTrackReader* track = trackReader();
    CMTime frameDuration = track->frameDuration();
    SKARN_HARD_ASSERT_TEXT(frameDuration.timescale == currentPTS().timescale,
                           "self.trackReader.frameDuration.timescale == self.currentPTS.timescale", kSource);
    SKARN_HARD_ASSERT_TEXT(frameDuration.value > 0, "_frameDuration.value>0", kSource);
    CMTime step = CMTimeConvertScale(delta, frameDuration.timescale, kCMTimeRoundingMethod_QuickTime);
    int64_t frames = step.value / frameDuration.value;
    if (!CMTIME_IS_NUMERIC(step)) frames = CMTIME_IS_POSITIVE_INFINITY(step) ? INT64_MAX : CMTIME_IS_NEGATIVE_INFINITY(step) ? INT64_MIN : 0;
    mxfEssenseOffsets* current = videoRecordAt(currentPTS());
    int64_t maxIndex = track->maxpts().value / frameDuration.value;
    // Any distance ends one past either end.
    int64_t wanted = 0;
    if (__builtin_add_overflow(int64_t(decodeOrderOf(current)), frames, &wanted)) wanted = frames < 0 ? -1 : INT64_MAX;
    wanted = std::clamp<int64_t>(wanted, -1, std::max<int64_t>(maxIndex, -1) + 1);
    CMTime dtsTime = timeTimes(frameDuration, wanted);
    // Before the first sample the cursor goes to the first sample to decode; a
    // negative decode time, taken unsigned by the tables, would find the last.
    Ref<mxfEssenseOffsets> record = track->mxfVideoSampleOffsetAtDecodeTime(wanted < 0 ? kCMTimeZero : dtsTime);
    int32_t status = 0;
    if (wanted >= maxIndex + 1) {
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(dtsTime, track->trackDuration()) >= 0,
                               "CMTIME_COMPARE_INLINE(dtsTime, >=, self.trackReader.trackDuration)", kSource);
        setCurrentMXFIndex(uint32_t(maxIndex));
        status = kVestaKilnSampleCursorNoMoreSamples;
    } else if (wanted >= 0) {
        // Tables that end before the track does (its length comes from
        // elsewhere in the file) hold no sample there, and the lookup's
        // answer would take the cursor back to the start: a forward step that
        // does not move forward is the end, or a reader stepping through
        // would go round for ever. The cursor stays on its sample.
        if (frames > 0 && (!record || decodeOrderOf(record) <= decodeOrderOf(current)))
            return kVestaKilnSampleCursorNoMoreSamples;
        setCurrentMXFIndex(decodeOrderOf(record));
    } else {
        setCurrentMXFIndex(0);
        status = kVestaKilnSampleCursorNoMoreSamples;
    }
    setCurrentPTS(timeTimes(frameDuration, presentationOrderOf(record)));
    return status;
}

int32_t SkarnSampleCursor::compareInDecodeOrder(VestaKilnSampleCursorProtocol* other) {
    auto* that = dynamic_cast<SkarnSampleCursor*>(other);
    if (!that) return 1;
    if (kind() == TrackKind::MXFVideo) {
        checkDecodeIndexInvariant();
        that->checkDecodeIndexInvariant();
        CMTime frameDuration = trackReader()->frameDuration();
        CMTime mine = timeTimes(frameDuration, currentMXFIndex());
        CMTime theirs = timeTimes(that->trackReader()->frameDuration(), that->currentMXFIndex());
        return CMTimeCompare(mine, theirs);
    }
    return CMTimeCompare(currentPTS(), that->currentPTS());
}

CMTime SkarnSampleCursor::presentationTimeStamp() {
    CMTime pts = currentPTS();
    if (kind() == TrackKind::MXFVideo) {
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(pts, kCMTimeZero) >= 0, "CMTIME_COMPARE_INLINE(wantedPTS, >=, kCMTimeZero)",
                               kSource);
        mxfEssenseOffsets* record = videoRecordAt(pts);
        CMTime time = timeTimes(trackReader()->frameDuration(), presentationOrderOf(record));
        SKARN_HARD_ASSERT_TEXT(CMTimeCompare(pts, time) == 0, "CMTIME_COMPARE_INLINE(wantedPTS, ==, time)", kSource);
    }
    SkarnLog(2, "%@: pts: %lld/%d", this, pts.value, pts.timescale);
    return pts;
}

CMTime SkarnSampleCursor::decodeTimeStamp() {
    if (kind() != TrackKind::MXFVideo) return currentPTS();
    SkarnTrackReader* track = trackReader();
    uint32_t index = currentMXFIndex();
    mxfEssenseOffsets* record = videoRecordAt(currentPTS());
    // Only noted: a host asking for the stamp must still get one.
    if (decodeOrderOf(record) != index) logLine("currentMXFIndex not equaling decodeOrder");
    return timeTimes(track->frameDuration(), index);
}
