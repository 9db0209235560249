// One track of a clip as the host's format-reader model sees it: the video
// track, the timecode track that shares its timing, or one audio channel.
//
// A passive record: the format reader fills every property while it builds
// the track, and from then on the track answers the host's questions from
// them, hands out sample cursors and turns times into MXF offset records. It
// does no file I/O of its own. The host may read it from several threads:
// the atomic properties are copied whole (AtomicProperty), never torn.
#pragma once

#include "AtomicProperty.h"
#include "CMFormatDescription.h"
#include "CMTime.h"
#include "VestaKilnProtocols.h"
#include "mxfDataObject.h"
#include "mxfEssenseOffsets.h"

#include <atomic>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>

class SkarnFormatReader;
class SkarnSampleCursor;

class SkarnTrackReader : public VestaKilnTrackReaderProtocol {
public:
    static Ref<SkarnTrackReader> trackReaderWithFormatReader(SkarnFormatReader* formatReader);
    static Ref<SkarnTrackReader> initWithFormatReader(SkarnFormatReader* formatReader);
    ~SkarnTrackReader() override;

    void retain() const override;
    void release() const override;
    std::string description() const override;
    // copyWithZone: leaves the format description, the follow-on drop
    // sequence and the audio channel index at their initial values.
    Ref<SkarnTrackReader> copyWithZone() const;
    // The cadence a host may ask for by name: "pulldownPattern" (one 1 or 0
    // per frame of the pattern: kept or dropped), "patternLength" and
    // "patternIndex"; nil for a track without pulldown and for other keys.
    Value valueForKey(const std::string& key) override;

    // ---- Properties
    SkarnFormatReader* formatReader() const { return _formatReader; }
    void setFormatReader(SkarnFormatReader* reader) { _formatReader = reader; }
    std::optional<std::string> url() override;
    void setUrl(const std::optional<std::string>& url);
    int64_t dataOffset() const { return _dataOffset.load(); }
    void setDataOffset(int64_t v) { _dataOffset.store(v); }
    int64_t dataLength() const { return _dataLength.load(); }
    void setDataLength(int64_t v) { _dataLength.store(v); }
    int64_t sampleSize() const { return _sampleSize.load(); }
    void setSampleSize(int64_t v) { _sampleSize.store(v); }
    int64_t uneditedNumDataBytes() override { return _uneditedNumDataBytes; }
    void setUneditedNumDataBytes(int64_t v) { _uneditedNumDataBytes = v; }
    double sampleRate() const { return _sampleRate.load(); }
    void setSampleRate(double v) { _sampleRate.store(v); }
    CMTime trackDuration() const { return _trackDuration.load(); }
    void setTrackDuration(CMTime v) { _trackDuration.store(v); }
    CMTime frameDuration() const { return _frameDuration.load(); }
    void setFrameDuration(CMTime v) { _frameDuration.store(v); }
    FourCharCode mediaType() override { return _mediaType; }
    FourCharCode mediaTypeValue() const { return _mediaType; }
    void setMediaType(FourCharCode v) { _mediaType = v; }
    FourCharCode codec() const { return _codec.load(); }
    void setCodec(FourCharCode v) { _codec.store(v); }
    bool anamorphic() const { return _anamorphic.load(); }
    void setAnamorphic(bool v) { _anamorphic.store(v); }
    CMTime minpts() const { return _minpts.load(); }
    void setMinpts(CMTime v) { _minpts.store(v); }
    CMTime maxpts() const { return _maxpts.load(); }
    void setMaxpts(CMTime v) { _maxpts.store(v); }
    uint64_t frameQuanta() const { return _frameQuanta.load(); }
    void setFrameQuanta(uint64_t v) { _frameQuanta.store(v); }
    bool isDropFrame() const { return _isDropFrame.load(); }
    void setIsDropFrame(bool v) { _isDropFrame.store(v); }
    int64_t timecodeStart() const { return _timecodeStart.load(); }
    void setTimecodeStart(int64_t v) { _timecodeStart.store(v); }
    int64_t samplesPerChunk() const { return _samplesPerChunk.load(); }
    void setSamplesPerChunk(int64_t v) { _samplesPerChunk.store(v); }
    int64_t chunkSize() const { return _chunkSize.load(); }
    void setChunkSize(int64_t v) { _chunkSize.store(v); }
    CMTimeMapping trackEdit() const { return _trackEdit.load(); }
    void setTrackEdit(CMTimeMapping v) { _trackEdit.store(v); }
    CMFormatDescription* formatDesc() const { return _formatDesc.get(); }
    void setFormatDesc(CMFormatDescriptionRef desc);
    // Static keep/drop tables: never owned, never freed.
    const uint8_t* pulldownPattern() const { return _pulldownPattern.load(); }
    void setPulldownPattern(const uint8_t* v) { _pulldownPattern.store(v); }
    const uint8_t* followonDropSequence() const { return _followonDropSequence.load(); }
    void setFollowonDropSequence(const uint8_t* v) { _followonDropSequence.store(v); }
    uint64_t patternLength() const { return _patternLength.load(); }
    void setPatternLength(uint64_t v) { _patternLength.store(v); }
    uint64_t patternIndex() const { return _patternIndex.load(); }
    void setPatternIndex(uint64_t v) { _patternIndex.store(v); }
    uint64_t timingOffset() const { return _timingOffset.load(); }
    void setTimingOffset(uint64_t v) { _timingOffset.store(v); }
    uint64_t numActiveFramesInPattern() const { return _numActiveFramesInPattern.load(); }
    void setNumActiveFramesInPattern(uint64_t v) { _numActiveFramesInPattern.store(v); }
    uint64_t sampleOffset() const { return _sampleOffset.load(); }
    void setSampleOffset(uint64_t v) { _sampleOffset.store(v); }
    uint64_t audioChannelIndex() const { return _audioChannelIndex.load(); }
    void setAudioChannelIndex(uint64_t v) { _audioChannelIndex.store(v); }
    bool useTimingOffset() const { return _useTimingOffset.load(); }
    void setUseTimingOffset(bool v) { _useTimingOffset.store(v); }
    // Not retained: the format reader keeps the MXF object alive.
    mxfDataObject* mxfDataAccess() const { return _mxfDataAccess.load(); }
    void setMxfDataAccess(mxfDataObject* v) { _mxfDataAccess.store(v); }

    // ---- VestaKilnTrackReaderProtocol
    bool isEnabled() override { return true; }
    CMFormatDescription* formatDescription() override { return formatDesc(); }
    int64_t timescale() override;
    CMTime uneditedDuration() override { return trackDuration(); }
    int64_t locationOffset() override { return dataOffset(); }
    int64_t locationSize() override;
    int64_t trackEditCount() override;
    CMTimeMapping trackEditWithIndex(int64_t index) override { return trackEdit(); }
    int64_t trackEditIndexWithTrackTime(CMTime time) override;
    Value propertyForKey(const std::string& key) override { return Value(); }
    Ref<VestaKilnSampleCursorProtocol> cursorAtPresentationTimeStamp(CMTime pts, bool* beforeStart,
                                                                     bool* afterEnd) override;
    Ref<VestaKilnSampleCursorProtocol> cursorNearPresentationTimeStamp(CMTime pts, bool afterOK, bool* beforeStart,
                                                                       bool* afterEnd) override;
    Ref<VestaKilnSampleCursorProtocol> cursorAtFirstSampleInDecodeOrder() override;
    Ref<VestaKilnSampleCursorProtocol> cursorAtLastSampleInDecodeOrder() override;
    bool respondsToSelector(std::string_view selector) const override;

    // ---- MXF offset lookups (times in the track's own timescale)
    Ref<mxfEssenseOffsets> mxfVideoSampleOffsetAtPresentationTime(CMTime time) const;
    Ref<mxfEssenseOffsets> mxfVideoSampleOffsetAtDecodeTime(CMTime time) const;
    Ref<mxfEssenseOffsets> mxfAudioSampleOffsetForChannel(uint64_t channel, uint64_t sample) const;

    // The MXF video tables' consistency with the track (first sample at time
    // zero, last at maxpts) does not change once the track is built, so
    // cursors check it once per track.
    bool mxfVideoTablesChecked() const { return _mxfVideoTablesChecked.load(std::memory_order_acquire); }
    void setMxfVideoTablesChecked() { _mxfVideoTablesChecked.store(true, std::memory_order_release); }

private:
    SkarnTrackReader() = default;

    SkarnFormatReader* _formatReader = nullptr;
    mutable std::mutex _urlLock;
    std::optional<std::string> _url;
    AtomicProperty<int64_t> _dataOffset;
    AtomicProperty<int64_t> _dataLength;
    AtomicProperty<int64_t> _sampleSize;
    int64_t _uneditedNumDataBytes = 0;
    AtomicProperty<double> _sampleRate;
    AtomicProperty<CMTime> _trackDuration{kCMTimeInvalid};
    AtomicProperty<CMTime> _frameDuration{kCMTimeInvalid};
    FourCharCode _mediaType = 0;
    AtomicProperty<FourCharCode> _codec;
    AtomicProperty<bool> _anamorphic;
    AtomicProperty<CMTime> _minpts{kCMTimeInvalid};
    AtomicProperty<CMTime> _maxpts{kCMTimeInvalid};
    AtomicProperty<uint64_t> _frameQuanta;
    AtomicProperty<bool> _isDropFrame;
    AtomicProperty<int64_t> _timecodeStart;
    AtomicProperty<int64_t> _samplesPerChunk;
    AtomicProperty<int64_t> _chunkSize;
    AtomicProperty<CMTimeMapping> _trackEdit{CMTimeMapping{kCMTimeRangeInvalid, kCMTimeRangeInvalid}};
    CMFormatDescriptionRef _formatDesc;
    AtomicProperty<const uint8_t*> _pulldownPattern;
    AtomicProperty<const uint8_t*> _followonDropSequence;
    AtomicProperty<uint64_t> _patternLength;
    AtomicProperty<uint64_t> _patternIndex;
    AtomicProperty<uint64_t> _timingOffset;
    AtomicProperty<uint64_t> _numActiveFramesInPattern;
    AtomicProperty<uint64_t> _sampleOffset;
    AtomicProperty<uint64_t> _audioChannelIndex;
    AtomicProperty<bool> _useTimingOffset;
    AtomicProperty<mxfDataObject*> _mxfDataAccess;
    std::atomic<bool> _mxfVideoTablesChecked{false};
};
