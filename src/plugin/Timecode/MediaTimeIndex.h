// A frame position: whole frames at a native rate plus an offset counted at a
// second, interpolation rate, with the rules that fold the offset into whole
// native frames and that wrap a count into one day.
#pragma once

namespace Tolvo {

class MediaTimeIndex {
public:
    MediaTimeIndex();
    MediaTimeIndex(long framecount, double framerate, double interpFramerate, long iOffset);
    MediaTimeIndex(const MediaTimeIndex&) = default;
    MediaTimeIndex& operator=(const MediaTimeIndex&) = default;
    virtual ~MediaTimeIndex();

    // Folds iOffset into framecount, but only when it is a whole number of
    // interpolation groups; any other offset stays entirely in iOffset.
    void updateIOffset();
    // The same folding on the caller's values. Answers 0.
    int scaleIOffset(long& iOffset, long& framecount, double framerate, double interpFramerate) const;
    long gcd(long a, long b) const;
    // Wrap a count into [0, day); answers the day length used.
    long rolloverFramecount(long& count, double framerate, bool drop) const;
    double rolloverFramecount(double& count, double framerate, bool drop) const;

    void setUseInterpRate(bool use) { useInterpRate = use; }
    bool getUseInterpRate() const { return useInterpRate; }

    long framecount;
    long iOffset;
    double framerate;
    double interpFramerate;
    bool useInterpRate;
};

}  // namespace Tolvo
