#include "SkarnTrackReader.h"

#include "AssertionHandler.h"
#include "SkarnFormatReader.h"
#include "SkarnLog.h"
#include "SkarnSampleCursor.h"

#include <algorithm>

Ref<SkarnTrackReader> SkarnTrackReader::trackReaderWithFormatReader(SkarnFormatReader* formatReader) {
    return initWithFormatReader(formatReader);
}

Ref<SkarnTrackReader> SkarnTrackReader::initWithFormatReader(SkarnFormatReader* formatReader) {
    Ref<SkarnTrackReader> track(new SkarnTrackReader);
    SkarnLog(8, "\t%@ init", track->Object::description());
    track->_formatReader = formatReader;
    track->setUseTimingOffset(true);
    return track;
}

SkarnTrackReader::~SkarnTrackReader() {
    SkarnLog(8, "\t%@ dealloc", Object::description());
    setUrl(std::nullopt);
    setFormatDesc(nullptr);
    setMxfDataAccess(nullptr);
}

void SkarnTrackReader::retain() const {
    int32_t count = incrementRetainCount();
    SkarnLog(4, "\t%@ retain %d", Object::description(), count);
    (void)count;
}

void SkarnTrackReader::release() const {
    SkarnLog(4, "\t%@ release %d", Object::description(), retainCount() - 1);
    if (decrementRetainCount() == 0) delete this;
}

std::string SkarnTrackReader::description() const {
    CMTime fd = frameDuration(), td = trackDuration();
    std::optional<std::string> path;
    {
        std::lock_guard<std::mutex> lock(_urlLock);
        path = _url;
    }
    return SkarnLogFormat("%@: url: %@ | fd: %lld/%d | td: %lld/%d", Object::description(), path, fd.value,
                          fd.timescale, td.value, td.timescale);
}

Value SkarnTrackReader::valueForKey(const std::string& key) {
    const uint8_t* pattern = pulldownPattern();
    if (!pattern) return Value();
    if (key == "patternLength") return Value(patternLength());
    if (key == "patternIndex") return Value(patternIndex());
    if (key != "pulldownPattern") return Value();
    // The tables are the static keep/drop rows of the cadence reader, five
    // frames at most; the bound only guards against a length never set.
    Value::ArrayType keeps;
    const uint64_t length = std::min<uint64_t>(patternLength(), 64);
    keeps.reserve(length);
    for (uint64_t i = 0; i < length; ++i) keeps.emplace_back(int(pattern[i] != 0));
    return Value(std::move(keeps));
}

Ref<SkarnTrackReader> SkarnTrackReader::copyWithZone() const {
    Ref<SkarnTrackReader> copy = initWithFormatReader(_formatReader);
    {
        std::lock_guard<std::mutex> lock(_urlLock);
        copy->setUrl(_url);
    }
    copy->setDataOffset(dataOffset());
    copy->setDataLength(dataLength());
    copy->setSampleSize(sampleSize());
    copy->setUneditedNumDataBytes(_uneditedNumDataBytes);
    copy->setSampleRate(sampleRate());
    copy->setTrackDuration(trackDuration());
    copy->setFrameDuration(frameDuration());
    copy->setMediaType(_mediaType);
    copy->setCodec(codec());
    copy->setAnamorphic(anamorphic());
    copy->setMinpts(minpts());
    copy->setMaxpts(maxpts());
    copy->setFrameQuanta(frameQuanta());
    copy->setIsDropFrame(isDropFrame());
    copy->setTimecodeStart(timecodeStart());
    copy->setSamplesPerChunk(samplesPerChunk());
    copy->setChunkSize(chunkSize());
    copy->setTrackEdit(trackEdit());
    copy->setPulldownPattern(pulldownPattern());
    copy->setPatternLength(patternLength());
    copy->setPatternIndex(patternIndex());
    copy->setTimingOffset(timingOffset());
    copy->setNumActiveFramesInPattern(numActiveFramesInPattern());
    copy->setSampleOffset(sampleOffset());
    copy->setUseTimingOffset(useTimingOffset());
    copy->setMxfDataAccess(mxfDataAccess());
    return copy;
}

std::optional<std::string> SkarnTrackReader::url() {
    std::lock_guard<std::mutex> lock(_urlLock);
    return _url;
}

void SkarnTrackReader::setUrl(const std::optional<std::string>& url) {
    std::lock_guard<std::mutex> lock(_urlLock);
    _url = url;
}

void SkarnTrackReader::setFormatDesc(CMFormatDescriptionRef desc) { _formatDesc = std::move(desc); }

int64_t SkarnTrackReader::timescale() {
    CMTime fd = frameDuration();
    SkarnLog(2, "%@: timescale: %lld/%d", this, fd.value, fd.timescale);
    return int64_t(fd.timescale);
}

int64_t SkarnTrackReader::locationSize() { return mxfDataAccess() ? _uneditedNumDataBytes : dataLength(); }

int64_t SkarnTrackReader::trackEditCount() {
    SkarnLog(2, "%@: trackEditCount", this);
    return 1;
}

int64_t SkarnTrackReader::trackEditIndexWithTrackTime(CMTime time) {
    SkarnLog(2, "%@: trackEditIndexWithTrackTime: %@", this, CMTimeCopyDescription(time));
    // Every time maps to the one edit: the range test only mirrors the host's
    // own bookkeeping and cannot change the answer.
    (void)CMTimeRangeContainsTime(trackEdit().target, time);
    return 0;
}

Ref<VestaKilnSampleCursorProtocol> SkarnTrackReader::cursorAtPresentationTimeStamp(CMTime pts, bool* beforeStart,
                                                                                   bool* afterEnd) {
    return SkarnSampleCursor::sampleCursorWithTrackReader(this, pts, beforeStart, afterEnd);
}

Ref<VestaKilnSampleCursorProtocol> SkarnTrackReader::cursorNearPresentationTimeStamp(CMTime pts, bool afterOK,
                                                                                     bool* beforeStart,
                                                                                     bool* afterEnd) {
    return SkarnSampleCursor::sampleCursorWithTrackReader(this, pts, beforeStart, afterEnd);
}

Ref<VestaKilnSampleCursorProtocol> SkarnTrackReader::cursorAtFirstSampleInDecodeOrder() {
    if (mxfDataAccess()) return SkarnSampleCursor::sampleCursorAtFirstSampleInDecodeOrder(this, minpts());
    return SkarnSampleCursor::sampleCursorWithTrackReader(this, minpts(), nullptr, nullptr);
}

Ref<VestaKilnSampleCursorProtocol> SkarnTrackReader::cursorAtLastSampleInDecodeOrder() {
    if (mxfDataAccess()) return SkarnSampleCursor::sampleCursorAtLastSampleInDecodeOrder(this, maxpts());
    return SkarnSampleCursor::sampleCursorWithTrackReader(this, maxpts(), nullptr, nullptr);
}

bool SkarnTrackReader::respondsToSelector(std::string_view selector) const {
    // Every optional operation of the protocol is left to the host's defaults.
    return false;
}

Ref<mxfEssenseOffsets> SkarnTrackReader::mxfVideoSampleOffsetAtPresentationTime(CMTime time) const {
    mxfDataObject* mxf = mxfDataAccess();
    // Tracks laid out by byte offsets have no index records to look up.
    if (!mxf) return nullptr;
    CMTime fd = frameDuration();
    SKARN_HARD_ASSERT_TEXT(fd.value > 0, "_frameDuration.value>0", "SkarnFormatReader");
    SKARN_HARD_ASSERT_TEXT(fd.timescale > 0, "_frameDuration.timescale>0", "SkarnFormatReader");
    return mxf->getVideoOffsetForPTS(time.value / fd.value);
}

Ref<mxfEssenseOffsets> SkarnTrackReader::mxfVideoSampleOffsetAtDecodeTime(CMTime time) const {
    mxfDataObject* mxf = mxfDataAccess();
    if (!mxf) return nullptr;
    CMTime fd = frameDuration();
    SKARN_HARD_ASSERT_TEXT(fd.value > 0, "_frameDuration.value>0", "SkarnFormatReader");
    SKARN_HARD_ASSERT_TEXT(fd.timescale > 0, "_frameDuration.timescale>0", "SkarnFormatReader");
    return mxf->getVideoOffsetForDTS(time.value / fd.value);
}

Ref<mxfEssenseOffsets> SkarnTrackReader::mxfAudioSampleOffsetForChannel(uint64_t channel, uint64_t sample) const {
    mxfDataObject* mxf = mxfDataAccess();
    if (!mxf) return nullptr;
    return mxf->getAudioOffsetForChannel(size_t(channel), sample);
}
