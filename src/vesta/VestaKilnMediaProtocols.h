// The host framework's media-delivery protocols: a clip as tracks read through
// sample cursors (the format reader model), and the older pull-model ingest
// object with the buffer managers that take delivered memory back.
//
// Optional operations have default implementations; respondsToSelector() says
// whether an object really answers them, by the host's selector names
// ("decodeTimeStamp", "chunkDetails:chunkOffset:chunkSize:sampleCount:...").
#pragma once

#include "CMFormatDescription.h"
#include "CMTime.h"
#include "Object.h"
#include "Value.h"
#include "VestaKilnMediaRecords.h"
#include "VestaKilnProtocols.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

class VestaKilnTrackReaderProtocol;
class VestaKilnSampleCursorProtocol;

// The step operations' answer when a cursor was stopped at the first or last
// sample of its track.
inline constexpr int32_t kVestaKilnSampleCursorNoMoreSamples = -12840;

class VestaKilnFormatReaderProtocol : public VestaKilnProtocolObject {
public:
    virtual std::vector<Ref<VestaKilnTrackReaderProtocol>> trackReaders() = 0;
    virtual CMTime duration() = 0;
    virtual CMTime estimatedDuration() = 0;
    virtual bool accurateDurationIsKnown() = 0;
    virtual bool sampleCursorTimeAccuracyIsExact() = 0;
    virtual int64_t timescale() = 0;
    virtual int64_t locationOffset() = 0;
    virtual int64_t locationSize() = 0;
    virtual Value propertyForKey(const std::string& key) = 0;
    // copyWithZone: a +1 object.
    virtual Ref<VestaKilnFormatReaderProtocol> copy() = 0;
};

class VestaKilnTrackReaderProtocol : public VestaKilnProtocolObject {
public:
    virtual bool isEnabled() = 0;
    virtual FourCharCode mediaType() = 0;
    // The file holding the track's essence, as a path; nil when unknown.
    virtual std::optional<std::string> url() = 0;
    // Not retained for the caller: valid while the track lives.
    virtual CMFormatDescription* formatDescription() = 0;
    virtual int64_t timescale() = 0;
    virtual CMTime uneditedDuration() = 0;
    virtual int64_t uneditedNumDataBytes() = 0;
    virtual int64_t locationOffset() = 0;
    virtual int64_t locationSize() = 0;
    virtual int64_t trackEditCount() = 0;
    virtual CMTimeMapping trackEditWithIndex(int64_t index) = 0;
    virtual int64_t trackEditIndexWithTrackTime(CMTime time) = 0;
    virtual Value propertyForKey(const std::string& key) = 0;

    // Flag pointers may be null.
    virtual Ref<VestaKilnSampleCursorProtocol> cursorAtPresentationTimeStamp(CMTime pts, bool* beforeStart,
                                                                             bool* afterEnd) = 0;
    virtual Ref<VestaKilnSampleCursorProtocol> cursorNearPresentationTimeStamp(CMTime pts, bool afterOK,
                                                                               bool* beforeStart, bool* afterEnd) = 0;
    virtual Ref<VestaKilnSampleCursorProtocol> cursorAtFirstSampleInDecodeOrder() = 0;
    virtual Ref<VestaKilnSampleCursorProtocol> cursorAtLastSampleInDecodeOrder() = 0;

    // Optional: "estimatedDataRate", "nominalFrameRate", "volume",
    // "frameReorderingRequired", "dimensions", "excludeFromAutoSelection",
    // "isSelfContained".
    virtual double estimatedDataRate() { return 0; }
    virtual double nominalFrameRate() { return 0; }
    virtual double volume() { return 0; }
    virtual bool frameReorderingRequired() { return false; }
    virtual CMVideoDimensions dimensions() { return {0, 0}; }
    virtual bool excludeFromAutoSelection() { return false; }
    virtual bool isSelfContained() { return false; }
};

class VestaKilnSampleCursorProtocol : public VestaKilnProtocolObject {
public:
    // copyWithZone: a +1 object.
    virtual Ref<VestaKilnSampleCursorProtocol> copy() = 0;

    // Each answers 0 when it moved the whole way and
    // kVestaKilnSampleCursorNoMoreSamples when it stopped at an end.
    virtual int32_t stepInDecodeOrder(int64_t stepCount) = 0;
    virtual int32_t stepInPresentationOrder(int64_t stepCount) = 0;
    virtual int32_t stepByPresentationTime(CMTime delta) = 0;
    virtual int32_t stepByDecodeTime(CMTime delta) = 0;
    // -1, 0 or 1.
    virtual int32_t compareInDecodeOrder(VestaKilnSampleCursorProtocol* other) = 0;
    virtual CMTime presentationTimeStamp() = 0;

    virtual CMFormatDescription* formatDescription() = 0;
    virtual CMTime playableHorizon() = 0;
    virtual Value propertyForKey(const std::string& key) = 0;

    // The sample's bytes as sections of the track's file. Writes the number of
    // sections, and as many (offset, length) pairs as arrayCapacity allows;
    // each pointer may be null. dataSourceOut names another file (left
    // untouched when the track's own file holds the sample).
    virtual void sampleLocationWithArraySizes(int64_t arrayCapacity, int64_t* sectionCountOut,
                                              int64_t* sectionOffsetArrayInOut, int64_t* sectionLengthArrayInOut,
                                              Ref<Object>* dataSourceOut) = 0;

    // Optional: "decodeTimeStamp", "duration", "followonDropCount",
    // "timecodeCounter", "chunkDetails:chunkOffset:chunkSize:sampleCount:
    // sampleIndex:allSameSize:allSameDuration:allSameFormatDescription:",
    // "sampleDependencyAttributes",
    // "dependencyInfoWithFullSync:partialSync:partialSyncThreshold:droppable:",
    // "mpeg2FrameType:brokenLink:", "testReorderingBoundaryWithCursor:boundaryType:",
    // "createSampleBuffer:", "playableThroughEndOfTrack".
    virtual CMTime decodeTimeStamp() { return kCMTimeInvalid; }
    virtual CMTime duration() { return kCMTimeInvalid; }
    virtual int64_t followonDropCount() { return 0; }
    virtual int64_t timecodeCounter() { return 0; }
    // Out pointers may be null; a cursor may write none of them.
    virtual void chunkDetails(Ref<Object>* storageOut, int64_t* chunkOffsetOut, int64_t* chunkSizeOut,
                              int64_t* sampleCountOut, int64_t* sampleIndexOut, bool* allSameSizeOut,
                              bool* allSameDurationOut, bool* allSameFormatDescriptionOut) {}
    // A dictionary of sample attachment keys, or Null.
    virtual Value sampleDependencyAttributes() { return Value(); }
    virtual void dependencyInfoWithFullSync(bool* fullSyncOut, bool* partialSyncOut, double* partialSyncThresholdOut,
                                            bool* droppableOut) {}
    virtual bool playableThroughEndOfTrack() { return false; }
};

// Memory the ingest object hands out comes back through these, from any
// thread, once the host is done with it. They are interfaces of the object
// that owns the memory (not objects of their own): the record carries a
// pointer to them.
class VestaKilnVideoBufferManager {
public:
    virtual void disposeVideoMedia(uint8_t* media, uint64_t size, void* videoMediaDisposeRefCon2) = 0;

protected:
    ~VestaKilnVideoBufferManager() = default;
};

class VestaKilnAudioBufferManager {
public:
    virtual void disposeAudioMedia(uint8_t* media, uint64_t size, void* audioMediaDisposeRefCon2) = 0;

protected:
    ~VestaKilnAudioBufferManager() = default;
};

// The pull-model ingest object. The host drives it: initialize, start, then
// getNextMedia_Deprecated until the record's end-of-media flag is set, handing
// each delivered buffer back through the buffer managers, then stop, cleanup,
// teardown. refCon is the clip's ingestObjectRefCon.
class VestaKilnIngestObject : public VestaKilnProtocolObject {
public:
    virtual int32_t initialize(void* refCon) = 0;
    virtual int32_t reset(void* refCon) = 0;
    virtual int32_t teardown(void* refCon) = 0;
    virtual int32_t start(void* refCon) = 0;
    virtual int32_t stop(void* refCon) = 0;
    virtual int32_t cleanup(void* refCon) = 0;
    // pathSet: the clip's ingest source files, as the host chose them.
    virtual int32_t setPathSet(const Value& pathSet, void* refCon) = 0;
    virtual int32_t setInPoint(CMTime inPoint, void* refCon) = 0;
    virtual int32_t setOutPoint(CMTime outPoint, void* refCon) = 0;
    virtual int32_t setKeepMediaVideoRate(bool keepMediaRate, void* refCon) = 0;
    virtual int32_t getNextMedia(VestaKilnPlugInMediaSpecifier* media, void* refCon) = 0;
    virtual int32_t getNextMedia_Deprecated(VestaKilnPlugInMediaSpecifier_Deprecated* media, void* refCon) = 0;
    // Whether the times in the records are CoreMedia times.
    virtual bool usesCMTime() = 0;
};
