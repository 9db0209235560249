#include "MediaTimeIndex.h"

#include "TolvoArithmetic.h"

#include <cmath>
#include <cstdint>
#include <type_traits>

namespace Tolvo {

namespace {

// One step of the folding is `step` interpolation frames, worth `gain` native
// frames. Folding one step at a time, toward zero, stops at the first offset
// that is not a multiple of the step; a multiple stays a multiple after every
// step, so the offset either folds wholly or not at all and the loop reduces to
// one division.
void fold(long& iOffset, long& framecount, int32_t rate, int32_t interpRate, long g) {
    if (iOffset == 0 || g == 0) return;
    const long step = interpRate / g;
    const long gain = rate / g;
    // Rates below one frame per second leave no whole step to fold.
    if (step == 0) return;
    if (iOffset % step != 0) return;
    framecount = detail::satAdd(framecount, detail::satMul(iOffset / step, gain));
    iOffset = 0;
}

// The two wrap loops: add days while negative, then subtract while at least a
// day. A count many days away is first brought within one day by a remainder
// (the loops' result is the same), and a day that is not positive leaves the
// count alone rather than looping for ever.
template <class T>
void wrapIntoDay(T& count, T day) {
    if (!(day > 0)) return;
    if constexpr (std::is_floating_point_v<T>) {
        if (!std::isfinite(count)) return;
        if (count >= 4 * day || count <= -4 * day) count = std::fmod(count, day);
    } else {
        if (count >= 4 * day || count <= -4 * day) count = count % day;
    }
    while (count < 0) count += day;
    while (count >= day) count -= day;
}

}  // namespace

MediaTimeIndex::MediaTimeIndex()
    : framecount(0), iOffset(0), framerate(0.0), interpFramerate(0.0), useInterpRate(false) {}

MediaTimeIndex::MediaTimeIndex(long framecount, double framerate, double interpFramerate, long iOffset)
    : framecount(framecount), iOffset(iOffset), framerate(framerate), interpFramerate(interpFramerate),
      useInterpRate(false) {}

MediaTimeIndex::~MediaTimeIndex() = default;

void MediaTimeIndex::updateIOffset() {
    const int32_t r = detail::truncInt(framerate);
    const int32_t i = detail::truncInt(interpFramerate);
    fold(iOffset, framecount, r, i, gcd(r, i));
}

int MediaTimeIndex::scaleIOffset(long& offset, long& count, double rate, double interpRate) const {
    const int32_t r = detail::truncInt(rate);
    const int32_t i = detail::truncInt(interpRate);
    fold(offset, count, r, i, gcd(i, r));
    return 0;
}

long MediaTimeIndex::gcd(long a, long b) const {
    while (b != 0) {
        // The only quotient that overflows; its remainder is 0 anyway.
        const long t = (b == -1) ? 0 : a % b;
        a = b;
        b = t;
    }
    return a;
}

long MediaTimeIndex::rolloverFramecount(long& count, double rate, bool drop) const {
    // The day is a 32-bit product, and a drop-frame day loses 2592 labels at
    // 60 frames just as at 30, though 60 drops twice as many.
    const int32_t perSecond = detail::truncInt(rate);
    long day = static_cast<int32_t>(static_cast<uint32_t>(perSecond) * 86400u);
    if (drop) day -= 2592;
    wrapIntoDay(count, day);
    return day;
}

double MediaTimeIndex::rolloverFramecount(double& count, double rate, bool drop) const {
    // For a fractional rate the day is one second short of whole-rate seconds
    // plus one second at the real rate: 29 * 86399 + 29.97 frames at 29.97.
    double day = static_cast<double>(detail::truncLong(rate)) * 86399.0 + rate;
    if (drop) day -= 2592.0;
    wrapIntoDay(count, day);
    return day;
}

}  // namespace Tolvo
