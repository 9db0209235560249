// Produces the sample buffers of one track (the video track or one audio
// channel) for the ingest object: a sample cursor over the track, a buffered
// reader over the track's file, and a queue of scheduled sample buffers.
// Scheduling reads the sample (or audio chunk) at the cursor into a new
// sample buffer and queues it; getNextMedia dequeues one and writes it into
// the host's media record. The video reader also carries the pulldown
// cadence the ingest object found.
#pragma once

#include "CMBufferQueue.h"
#include "CMSampleBuffer.h"
#include "CMTime.h"
#include "Object.h"
#include "SkarnBlockPool.h"
#include "SkarnFileReader.h"
#include "SkarnFormatReader.h"
#include "SkarnSampleCursor.h"
#include "SkarnTrackReader.h"
#include "VestaKilnMediaRecords.h"

#include <cstdint>
#include <optional>
#include <string>

// Names for watchers of a reader's queue level; nothing in the ingest posts them.
extern const char* const SkarnMediaReaderHighWaterNotification;
extern const char* const SkarnMediaReaderLowWaterNotification;

// The pipeline's own statuses.
enum : int32_t {
    kSkarnMediaReaderReadFailed = -19,          // a sample's bytes could not be read whole
    kSkarnMediaReaderUnsupportedMediaType = -206,
    kSkarnMediaReaderEndOfData = -12742,        // a pull after the last sample
    kSkarnMediaReaderSampleOrderBroken = -12743,  // a step led back to a sample already read
};

class SkarnMediaReader : public Object {
public:
    // Nil when either reader is nil.
    static Ref<SkarnMediaReader> mediaReaderWithFormatReader(SkarnFormatReader* formatReader,
                                                             SkarnTrackReader* trackReader, int64_t timeCodeCounter,
                                                             CMTime frameDuration, int64_t frameQuanta,
                                                             bool isDropFrame, int64_t shootingRate);
    static Ref<SkarnMediaReader> initWithFormatReader(SkarnFormatReader* formatReader, SkarnTrackReader* trackReader,
                                                      int64_t timeCodeCounter, CMTime frameDuration,
                                                      int64_t frameQuanta, bool isDropFrame, int64_t shootingRate);
    ~SkarnMediaReader() override;

    // Places a new cursor at the start time (or the first sample), empties
    // the queue and its end-of-data mark, and switches to bulk reads.
    void reset();
    int32_t scheduleBuffers();
    // Schedules exactly one sample, whatever the count.
    int32_t scheduleSamples(int64_t count);
    int32_t createSampleBufferFromSampleCursor(CMSampleBufferRef* sampleBufferOut);
    // One step of cadence analysis: schedules and dequeues one frame and
    // classifies it. The buffer is handed out only when it is not a repeat.
    int32_t pullFrame(CMSampleBufferRef* sampleBufferOut, bool* dropped, uint64_t* sequenceNumber);
    int32_t getNextMedia(VestaKilnPlugInMediaSpecifier_Deprecated* media);
    bool hasData() const;
    bool canSchedule() const;
    int32_t start() { return 0; }
    int32_t stop() { return 0; }

    // ---- Properties
    bool isVideo() const { return _mediaType == kCMMediaType_Video; }
    double timingOffset() const { return _timingOffset; }
    void setTimingOffset(double v) { _timingOffset = v; }
    double adjustedVideoTimescale() const { return _adjustedVideoTimescale; }
    void setAdjustedVideoTimescale(double v) { _adjustedVideoTimescale = v; }
    int64_t cadenceLength() const { return _cadenceLength; }
    void setCadenceLength(int64_t v) { _cadenceLength = v; }
    int64_t cadenceIndex() const { return _cadenceIndex; }
    void setCadenceIndex(int64_t v) { _cadenceIndex = v; }
    bool keepMediaRate() const { return _keepMediaRate; }
    void setKeepMediaRate(bool v) { _keepMediaRate = v; }
    uint64_t samplesPerPull() const { return _samplesPerPull; }
    void setSamplesPerPull(uint64_t v) { _samplesPerPull = v; }
    bool useTimingOffset() const { return _useTimingOffset; }
    void setUseTimingOffset(bool v) { _useTimingOffset = v; }
    // A shared constant of the cadence table; never owned.
    const uint8_t* pulldownCadenceDropSequence() const { return _pulldownCadenceDropSequence; }
    void setPulldownCadenceDropSequence(const uint8_t* v) { _pulldownCadenceDropSequence = v; }
    CMBufferQueueRef bufferQueue() const { return _bufferQueue; }
    FourCharCode mediaType() const { return _mediaType; }
    uint32_t trackID() const { return _trackID; }
    void setTrackID(uint32_t v) { _trackID = v; }
    int64_t timecodeCounter() const { return _timecodeCounter; }
    int64_t frameQuanta() const { return _frameQuanta; }
    CMTime frameDuration() const { return _frameDuration; }
    bool isDropFrame() const { return _isDropFrame; }
    const std::string& filename() const { return _filename; }
    void setFakeStartTime(CMTime t) { _fakeStartTime = t; }
    void setStartTime(CMTime t) { _startTime = t; }
    void setReplaceAVC1StartCode(bool v) { _replaceAVC1StartCode = v; }
    SkarnTrackReader* trackReader() const { return _trackReader.get(); }
    SkarnSampleCursor* sampleCursor() const { return _sampleCursor.get(); }
    SkarnFileReader* fileReader() const { return _fileReader.get(); }

    std::string description() const override;

private:
    SkarnMediaReader() = default;

    // Ends the track: one bad sample, or none left.
    int32_t markEndOfData(int32_t status);
    int32_t createAudioChunkBuffer(CMSampleBufferRef* out);
    int32_t createSingleSampleBuffer(CMSampleBufferRef* out);
    int32_t readInto(uint8_t* dest, int64_t offset, int64_t length);
    // Bytes of the file range the reader reads from.
    uint64_t rangeLength() const;
    void deliverVideo(const CMSampleBufferRef& buffer, VestaKilnPlugInMediaSpecifier_Deprecated* media);
    void deliverAudio(const CMSampleBufferRef& buffer, VestaKilnPlugInMediaSpecifier_Deprecated* media);
    const char* kindLetter() const { return isVideo() ? "v" : "a"; }

    uint32_t _trackID = 0;
    FourCharCode _mediaType = 0;
    Ref<SkarnTrackReader> _trackReader;
    CMBufferQueueRef _bufferQueue;
    CMTime _startTime = kCMTimeZero;
    CMTime _fakeStartTime = kCMTimeInvalid;
    CMTime _lastScheduledTime = kCMTimeInvalid;  // decode time of the last sample queued since the reset
    int64_t _timecodeCounter = 0;
    CMTime _frameDuration = kCMTimeInvalid;
    int64_t _frameQuanta = 0;
    bool _isDropFrame = false;
    double _timingOffset = 0;
    double _adjustedVideoTimescale = 0;
    const uint8_t* _pulldownCadenceDropSequence = nullptr;
    int64_t _cadenceLength = 0;
    int64_t _cadenceIndex = 0;
    bool _keepMediaRate = true;
    int64_t _shootingRate = 0;
    uint64_t _samplesPerPull = 1;
    int64_t _frameCounter = 0;
    bool _useTimingOffset = false;
    bool _isFirstFrame = true;
    Ref<SkarnSampleCursor> _sampleCursor;
    std::string _filename;
    Ref<SkarnFileReader> _fileReader;
    // Where every sample's memory comes from, and goes back to.
    Ref<SkarnBlockPool> _blockPool;
    CMFormatDescriptionRef _avc1FormatDesc;
    // The image description handed with every frame: made once per format.
    CMFormatDescriptionRef _imageDescriptionFormat;
    CMBlockBufferRef _imageDescription;
    bool _replaceAVC1StartCode = false;
};
