// Ingest object: lifecycle, readers and the cadence reading.
// Delivery is in SkarnIngestObjectDelivery.cpp.
#include "SkarnIngestObject.h"

#include "SkarnClip.h"
#include "SkarnLog.h"
#include "SkarnPulldown.h"

#include <cmath>

Ref<SkarnIngestObject> SkarnIngestObject::initWithClip(SkarnClip* clip) {
    Ref<SkarnIngestObject> ingest(new SkarnIngestObject);
    ingest->_clip = clip;
    ingest->_keepMediaRate = false;
    ingest->_useTimingOffset = true;
    // A reader made only to learn the clip's length.
    Ref<SkarnFormatReader> reader = clip ? SkarnFormatReader::formatReaderWithClip(clip, false, false) : nullptr;
    CMTime duration = reader ? reader->duration() : kCMTimeZero;
    if (!CMTIME_IS_NUMERIC(duration)) duration = kCMTimeZero;
    ingest->_durationDict = CMTimeCopyAsDictionary(duration);
    ingest->_startTime = CMTimeMake(0, duration.timescale);
    ingest->_fakeStartTime = ingest->_startTime;
    return ingest;
}

SkarnIngestObject::~SkarnIngestObject() = default;

int32_t SkarnIngestObject::initialize(void*) {
    _firstFrame = true;
    _videoReader = nullptr;
    _audioReaders.clear();
    // One manager for the object's life: a host may still hold media from
    // before a reset (a seek does not wait for the frames in flight) and give
    // it back later through the manager that came with it. A manager replaced
    // here would free that media under the host and take those disposals into
    // freed memory. What the host never gives back goes at cleanup.
    if (!_bufferManager) _bufferManager = SkarnBufferManager::bufferManager();
    _formatReader = nullptr;
    _videoEndOfData = _audioEndOfData = false;
    _cadenceReading = SkarnCadenceReading{};
    if (!_clip) return 0;
    _formatReader = SkarnFormatReader::formatReaderWithClip(_clip, true, _keepMediaRate);
    if (!_formatReader) return 0;

    std::vector<Ref<SkarnTrackReader>> tracks = _formatReader->trackList();
    for (const auto& track : tracks) {
        if (track->mediaTypeValue() != kCMMediaType_TimeCode) continue;
        _timecodeCounter = track->timecodeStart();
        _frameDuration = track->frameDuration();
        _frameQuanta = int64_t(track->frameQuanta());
        _isDropFrame = track->isDropFrame();
    }
    for (const auto& track : tracks) {
        if (track->mediaTypeValue() != kCMMediaType_Video) continue;
        // The start snaps to a real frame.
        if (Ref<SkarnSampleCursor> cursor =
                SkarnSampleCursor::sampleCursorWithTrackReader(track.get(), _startTime, nullptr, nullptr))
            _startTime = cursor->presentationTimeStamp();
    }
    int64_t shootingRate = int64_t(std::max(0.0, std::min(_clip->shootingRate(), 1000.0)));
    uint32_t trackNumber = 0;
    for (const auto& track : tracks) {
        FourCharCode type = track->mediaTypeValue();
        uint32_t number = trackNumber++;
        if (type != kCMMediaType_Video && type != kCMMediaType_Audio) continue;
        Ref<SkarnMediaReader> reader =
            SkarnMediaReader::mediaReaderWithFormatReader(_formatReader.get(), track.get(), _timecodeCounter,
                                                          _frameDuration, _frameQuanta, _isDropFrame, shootingRate);
        if (!reader) continue;
        reader->setTrackID(number);
        if (CMTIME_IS_VALID(_startTime)) reader->setStartTime(_startTime);
        if (CMTIME_IS_VALID(_fakeStartTime)) reader->setFakeStartTime(_fakeStartTime);
        reader->setKeepMediaRate(_keepMediaRate);
        reader->setUseTimingOffset(_useTimingOffset);
        if (type == kCMMediaType_Audio) {
            CMTime perPull = CMTimeConvertScale(_frameDuration, int32_t(track->timescale()),
                                                kCMTimeRoundingMethod_RoundHalfAwayFromZero);
            reader->setSamplesPerPull(CMTIME_IS_NUMERIC(perPull) && perPull.value > 0 ? uint64_t(perPull.value) : 1);
            _audioReaders.push_back(reader);
        } else {
            _videoReader = reader;
            if (_clip->videoFormat() == 4) reader->setReplaceAVC1StartCode(true);
        }
    }
    if (_videoReader && !_keepMediaRate) determineCadence();
    if (_videoReader) _videoReader->reset();
    for (const auto& reader : _audioReaders) reader->reset();
    return 0;
}

int32_t SkarnIngestObject::reset(void* refCon) {
    initialize(refCon);
    return 0;
}

int32_t SkarnIngestObject::teardown(void*) {
    _formatReader = nullptr;
    return 0;
}

int32_t SkarnIngestObject::start(void*) {
    if (_videoReader) _videoReader->start();
    for (const auto& reader : _audioReaders) reader->start();
    return 0;
}

int32_t SkarnIngestObject::stop(void*) {
    if (_videoReader) _videoReader->stop();
    for (const auto& reader : _audioReaders) reader->stop();
    return 0;
}

int32_t SkarnIngestObject::cleanup(void*) {
    _videoReader = nullptr;
    _audioReaders.clear();
    if (_bufferManager) _bufferManager->reset();
    return 0;
}

int32_t SkarnIngestObject::setInPoint(CMTime inPoint, void*) {
    // Delivery starts there from the next initialize or reset on.
    CMTime duration = CMTimeMakeFromDictionary(_durationDict);
    int32_t timescale = CMTIME_IS_NUMERIC(duration) ? duration.timescale : inPoint.timescale;
    _startTime = CMTimeConvertScale(inPoint, timescale, kCMTimeRoundingMethod_RoundHalfAwayFromZero);
    return 0;
}

int32_t SkarnIngestObject::setKeepMediaVideoRate(bool keepMediaRate, void*) {
    _keepMediaRate = keepMediaRate;
    return 0;
}

// ---------------------------------------------------------------------------
// Cadence

void SkarnIngestObject::determineCadence() {
    _videoReader->reset();
    uint32_t quanta = uint32_t(std::max<int64_t>(0, _frameQuanta));
    uint32_t shooting = uint32_t(std::max(0.0, std::min(_clip->shootingRate(), 1000.0)));
    if (quanta == 0 || shooting == 0) return;

    SkarnMediaReader* video = _videoReader.get();
    auto pull = [video](bool* delivered, bool* dropped, uint32_t* sequence) -> int32_t {
        // A clip may end before the reading is complete.
        if (!video->hasData()) return kSkarnMediaReaderEndOfData;
        CMSampleBufferRef frame;
        bool isDropped = false;
        uint64_t number = 0;
        int32_t status = video->pullFrame(&frame, &isDropped, &number);
        if (status != 0) return status;
        *delivered = frame != nullptr;
        *dropped = isDropped;
        *sequence = uint32_t(number);
        return 0;
    };
    _cadenceReading = SkarnReadCadence(quanta, shooting, _clip->sourceFormat(), 512, pull);
    // Nothing is dropped on a guess: only a cadence of the table changes the timing.
    if (_cadenceReading.cadence) {
        const SkarnCadence& row = *_cadenceReading.cadence;
        double frameSeconds = CMTimeGetSeconds(_frameDuration);
        if (!std::isfinite(frameSeconds)) frameSeconds = 0;
        double audioOffset = 0, videoOffset = 0;
        if (row.frameShift < 0) {
            audioOffset = -(frameSeconds * row.frameShift);
            for (const auto& reader : _audioReaders) reader->setTimingOffset(audioOffset);
        } else if (row.frameShift > 0) {
            videoOffset = frameSeconds * row.frameShift;
            video->setTimingOffset(videoOffset);
        }
        SkarnLog(512, "cadence = 0x%x, video frame shift = %lf, audio timing offset = %lf, video timing offset = %lf",
                 row.pattern, row.frameShift, audioOffset, videoOffset);

        double timescale = 0;
        if (shooting == 24) {
            timescale = _frameDuration.timescale == 6000 ? 2400.0 : 24000.0;
            SkarnLog(512, "TS Sample Rate now = %lf because 24 FPS", timescale);
        } else if (shooting == 25 && quanta == 50) {
            timescale = 2500.0;
            SkarnLog(512, "TS Sample Rate now = %lf because 25 FPS shot at 50 FPS", timescale);
        } else if (shooting == 30 && quanta == 60) {
            timescale = 30000.0;
            SkarnLog(512, "TS Sample Rate now = %lf because 30 FPS shot at 60 FPS", timescale);
        }
        // Other half-rate recordings (15 in 30, 12 in 24) keep the stream's
        // own timescale: a timescale of 0 would leave the frames without times.
        if (timescale == 0) timescale = double(_frameDuration.timescale);

        std::span<const uint8_t> dropSequence = SkarnCadenceDropSequence(row.recording);
        CMTime perPull = CMTimeConvertScale(CMTimeMake(_frameDuration.value, int32_t(timescale)), 48000,
                                            kCMTimeRoundingMethod_QuickTime);
        for (const auto& reader : _audioReaders) {
            if (CMTIME_IS_NUMERIC(perPull) && perPull.value > 0) reader->setSamplesPerPull(uint64_t(perPull.value));
            reader->setPulldownCadenceDropSequence(dropSequence.data());
        }
        video->setAdjustedVideoTimescale(timescale);
        video->setPulldownCadenceDropSequence(dropSequence.data());
        video->setCadenceLength(row.length);
        video->setCadenceIndex(row.index);
    }
    video->reset();
}
