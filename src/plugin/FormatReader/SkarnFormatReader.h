// A clip presented to the host as tracks: the video track first (index 0,
// which every duration, timescale and location question reads), then a
// timecode track sharing its timing, then one audio track per channel.
//
// All work happens when it is built: the clip's properties are read, the
// self-contained clip's MXF file is opened, the first frames are probed for
// a pulldown cadence to remove, and every track gets its timing and format
// description. Afterwards the reader only answers from its track list.
#pragma once

#include "SkarnTrackReader.h"
#include "VestaKilnProtocols.h"
#include "mxfDataObject.h"

#include <cstdint>
#include <mutex>
#include <vector>

class SkarnClip;

class SkarnFormatReader : public VestaKilnFormatReaderProtocol {
public:
    // Never nil for a clip: what cannot be worked out is logged and the
    // tracks are built with what is known.
    static Ref<SkarnFormatReader> formatReaderWithClip(SkarnClip* clip, bool feedOriginalFrames,
                                                       bool keepingMediaRate);
    static Ref<SkarnFormatReader> initWithClip(SkarnClip* clip, bool feedOriginalFrames, bool keepingMediaRate);
    ~SkarnFormatReader() override;

    void retain() const override;
    void release() const override;

    // ---- Properties
    std::vector<Ref<SkarnTrackReader>> trackList() const;
    void setTrackList(std::vector<Ref<SkarnTrackReader>> tracks);

    // ---- VestaKilnFormatReaderProtocol
    std::vector<Ref<VestaKilnTrackReaderProtocol>> trackReaders() override;
    CMTime duration() override;
    CMTime estimatedDuration() override { return duration(); }
    bool accurateDurationIsKnown() override { return true; }
    bool sampleCursorTimeAccuracyIsExact() override { return true; }
    int64_t timescale() override;
    int64_t locationOffset() override;
    int64_t locationSize() override;
    Value propertyForKey(const std::string& key) override { return Value(); }
    Ref<VestaKilnFormatReaderProtocol> copy() override { return copyWithZone(); }
    Ref<SkarnFormatReader> copyWithZone() const;

private:
    SkarnFormatReader() = default;
    struct Builder;

    SkarnTrackReader* videoTrack() const;

    mutable std::mutex _trackListLock;
    std::vector<Ref<SkarnTrackReader>> _trackList;
    // The tracks keep only a pointer to the MXF object they share; the
    // reader keeps it alive for them.
    Ref<mxfDataObject> _mxfDataObject;
};
