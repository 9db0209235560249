// The host's handle on one sample of one track.
//
// Three kinds of track behave differently, and every operation branches on
// them:
// - MXF video (the track has an MXF object, media type 'vide'): samples may be
//   reordered (long-GOP H.264), so the cursor keeps the presentation time and
//   the sample's decode index, looked up in the MXF index tables;
// - MXF audio ('soun' with an MXF object): the index counts chunks;
// - tracks laid out by byte offsets alone (clip-XML clips): presentation time
//   only, decode order is presentation order.
// A timecode track copied from an MXF video track is "another MXF track" and
// mostly stands still.
//
// Running off either end is not an error: the cursor stays on the first or
// last sample and the step answers kVestaKilnSampleCursorNoMoreSamples.
#pragma once

#include "AtomicProperty.h"
#include "CMTime.h"
#include "SkarnTrackReader.h"
#include "VestaKilnProtocols.h"

#include <atomic>
#include <cstdint>

class SkarnSampleCursor : public VestaKilnSampleCursorProtocol {
public:
    // The time is converted into the track's timescale (half away from zero).
    static Ref<SkarnSampleCursor> sampleCursorWithTrackReader(SkarnTrackReader* trackReader, CMTime pts,
                                                              bool* beforeStart, bool* afterEnd);
    static Ref<SkarnSampleCursor> initWithTrackReader(SkarnTrackReader* trackReader, CMTime pts, bool* beforeStart,
                                                      bool* afterEnd);
    // For tracks with an MXF object; pts must be the track's minpts (maxpts).
    static Ref<SkarnSampleCursor> sampleCursorAtFirstSampleInDecodeOrder(SkarnTrackReader* trackReader, CMTime pts);
    static Ref<SkarnSampleCursor> sampleCursorAtLastSampleInDecodeOrder(SkarnTrackReader* trackReader, CMTime pts);
    ~SkarnSampleCursor() override;

    void retain() const override;
    void release() const override;

    // ---- Properties
    // Not retained: the format reader keeps its tracks alive.
    SkarnTrackReader* trackReader() const { return _trackReader.load(); }
    void setTrackReader(SkarnTrackReader* track);
    CMTime currentPTS() const { return _currentPTS.load(); }
    void setCurrentPTS(CMTime pts) { _currentPTS.store(pts); }
    uint32_t currentMXFIndex() const { return _currentMXFIndex.load(); }
    void setCurrentMXFIndex(uint32_t index) { _currentMXFIndex.store(index); }

    // MXF video: the decode index of the sample presented at (or around)
    // wantedPTS, clamped to the first or last sample; resultPTS receives that
    // sample's presentation time and error the step status.
    uint32_t currentVideoMXFDecodeIndexFromPTS(CMTime wantedPTS, CMTime* resultPTS, int32_t* error);

    // ---- Positioning and stepping
    Ref<VestaKilnSampleCursorProtocol> copy() override { return copyWithZone(); }
    Ref<SkarnSampleCursor> copyWithZone() const;
    int32_t stepInDecodeOrder(int64_t stepCount) override;
    int32_t stepInPresentationOrder(int64_t stepCount) override;
    int32_t stepByPresentationTime(CMTime delta) override;
    int32_t stepByDecodeTime(CMTime delta) override;
    int32_t compareInDecodeOrder(VestaKilnSampleCursorProtocol* other) override;
    CMTime presentationTimeStamp() override;
    CMTime decodeTimeStamp() override;

    // ---- Queries about the sample under the cursor
    CMFormatDescription* formatDescription() override;
    CMTime duration() override;
    CMTime playableHorizon() override;
    int64_t followonDropCount() override;
    int64_t timecodeCounter() override;
    Value propertyForKey(const std::string& key) override { return Value(); }
    void sampleLocationWithArraySizes(int64_t arrayCapacity, int64_t* sectionCountOut,
                                      int64_t* sectionOffsetArrayInOut, int64_t* sectionLengthArrayInOut,
                                      Ref<Object>* dataSourceOut) override;
    void chunkDetails(Ref<Object>* storageOut, int64_t* chunkOffsetOut, int64_t* chunkSizeOut,
                      int64_t* sampleCountOut, int64_t* sampleIndexOut, bool* allSameSizeOut,
                      bool* allSameDurationOut, bool* allSameFormatDescriptionOut) override;
    Value sampleDependencyAttributes() override;
    void dependencyInfoWithFullSync(bool* fullSyncOut, bool* partialSyncOut, double* partialSyncThresholdOut,
                                    bool* droppableOut) override;
    bool respondsToSelector(std::string_view selector) const override;

private:
    SkarnSampleCursor() = default;

    enum class TrackKind : uint8_t { MXFVideo, MXFAudio, MXFOther, ByteLayout };
    // A track's kind is fixed once it is built; the cursor keeps its track's.
    TrackKind kind() const { return _kind.load(std::memory_order_relaxed); }
    static TrackKind kindOf(SkarnTrackReader* track);
    // currentPTS in whole samples of the track (0 when the frame duration is unknown).
    int64_t frameIndex() const;
    // Soft check of the MXF video invariant: the record presented at
    // currentPTS is the one at currentMXFIndex in decode order.
    void checkDecodeIndexInvariant() const;
    // Byte-layout frame index -> physical frame in the essence.
    bool physicalFrame(int64_t frameIndex, int64_t* frameOut) const;
    // MXF video: the offset record presented at pts, or null. Every query
    // about the sample under the cursor asks for it again, so the last one
    // found is kept. Records belong to the MXF object's tables, which the
    // format reader keeps alive, and never change once found: the pointer is
    // not retained.
    mxfEssenseOffsets* videoRecordAt(CMTime pts) const;

    struct CachedVideoRecord {
        const mxfDataObject* mxf;
        int64_t ptsValue;
        int64_t frameValue;
        int32_t ptsTimescale;
        int32_t frameTimescale;
        mxfEssenseOffsets* record;
    };

    AtomicProperty<SkarnTrackReader*> _trackReader;
    AtomicProperty<CMTime> _currentPTS{kCMTimeInvalid};
    AtomicProperty<uint32_t> _currentMXFIndex;
    // Not a property: only the cursor's caller (one at a time) reads and
    // writes it, so it takes no lock.
    mutable CachedVideoRecord _videoRecordCache{};
    std::atomic<TrackKind> _kind{TrackKind::ByteLayout};
};
