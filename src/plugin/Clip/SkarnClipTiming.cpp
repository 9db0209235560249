// SkarnClip's timing: frame and transport rates, pulldown, the shooting rate
// (from the clip XML or the first DV frame's packs), the timecode format and
// start timecode, and the duration, all fixed at construction.
#include "SkarnClip.h"

#include "DVFrameData.h"
#include "FileSystem.h"
#include "SkarnClipInternal.h"
#include "SkarnLog.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <memory>
#include <span>
#include <unistd.h>

using namespace SkarnClipInternal;

namespace {

struct RateRow {
    const char* prefix;
    double nominal;
    double transport;
};
constexpr RateRow kRateRows[] = {
    {"59.94", 60, 59.94}, {"29.97", 30, 29.97}, {"23.98", 24, 23.98}, {"25", 25, 25}, {"50", 50, 50},
};

// Far beyond any DV frame (the largest is 576000 bytes); the packs read come
// from the first DIF sequence anyway, so a DataSize that claims more changes
// no answer, only what would be allocated.
constexpr uint64_t kMaxDVFrameRead = 4u << 20;

bool isDVFamily(int32_t f) { return (f >= 1 && f <= 2) || (f >= 8 && f <= 14); }

std::optional<double> rateFromText(const std::optional<std::string>& t, bool transport) {
    if (!t) return std::nullopt;
    double v = 0;
    bool matched = false;
    for (const RateRow& row : kRateRows) {
        if (hasPrefix(*t, row.prefix)) {
            v = transport ? row.transport : row.nominal;
            matched = true;
            break;
        }
    }
    if (!matched) v = numberValue(*t);
    // A field rate: interlaced frames come at half of it.
    if (hasSuffix(*t, "i")) v *= 0.5;
    return v;
}

}  // namespace

double SkarnClip::frameRate() const {
    auto v = rateFromText(
        essenceListOrEssence("ClipContent/EssenceList/Video/FrameRate", "ClipContent/Essence/Video/FrameRate"), false);
    if (!v || *v == 0) {
        SkarnLog(1, "bad frame rate: %f", v.value_or(0.0));
        return 0;
    }
    return *v;
}

double SkarnClip::transportRate() {
    auto v = rateFromText(
        essenceListOrEssence("ClipContent/EssenceList/Video/FrameRate", "ClipContent/Essence/Video/FrameRate"), true);
    if (!v || *v == 0) {
        SkarnLog(1, "bad transportRate: %f", v.value_or(0.0));
        return 0;
    }
    return *v;
}

int32_t SkarnClip::pulldown() {
    if (_pulldown == kSkarnPulldownUnknown) {
        _pulldown = kSkarnPulldownNone;
        auto p = text("ClipContent/EssenceList/Video/Pulldown");
        if (ciEquals(p, "2:3:3:2")) _pulldown = kSkarnPulldown2332;
        else if (ciEquals(p, "2:3")) _pulldown = kSkarnPulldown23;
        else if (ciEquals(p, "2:2")) _pulldown = kSkarnPulldown22;
    }
    return _pulldown;
}

void SkarnClip::initializeShootingRate() {
    const std::optional<std::string> d = displayFormat();
    const double nominal = frameRate();
    double rate = nominal;
    const double dataSize = numberValueOrZero(text("ClipContent/EssenceList/Video/VideoIndex/DataSize"));
    const int64_t offset = saturatingInt64(startByteOffset());
    if (!_durationNumber || *_durationNumber < 1) return;

    auto ratio = text("ClipContent/EssenceList/Video/VFRRatio");
    auto state = text("ClipContent/EssenceList/Video/VFRRatio/@VRFRState");
    if (ratio && state && (ciEquals(state, "constant") || ciEquals(state, "variable"))) {
        auto parts = split(*ratio, '/');
        if (parts.size() == 2) {
            rate = numberValue(parts[1]);
            // 50/25 is a 50-frame recording, not a 25-frame one.
            if (rate == 25 && intValue(parts[0]) == 50) rate = 50;
        }
    } else if (d && hasPrefix(*d, "1080p")) {
        if (hasSuffix(*d, "24")) rate = 24;
        else if (hasSuffix(*d, "25")) rate = 25;
    } else if (isDVFamily(_videoFormat)) {
        // The first frame's packs say what the camera shot at.
        const double frameBytes = dataSize / *_durationNumber;
        size_t frameSize = frameBytes > 0 ? size_t(std::min(frameBytes, 1e15)) : 0;
        int32_t shoot = -1;
        auto path = videoFilePath();
        int fd = path ? FileSystem::openRegularFileReadOnly(*path) : -1;
        if (fd >= 0) {
            if (!FileSystem::disableCaching(fd)) SkarnLog(1, "unable to disable caching on source file.");
            // Never more than the file holds after the offset, whatever DataSize claims.
            const auto fileSize = FileSystem::fileSize(*path).value_or(0);
            const uint64_t available = offset >= 0 && uint64_t(offset) < fileSize ? fileSize - uint64_t(offset)
                                       : offset < 0                               ? fileSize
                                                                                  : 0;
            frameSize = size_t(std::min<uint64_t>({uint64_t(frameSize), available, kMaxDVFrameRead}));
            // A failed seek (negative offset) leaves the read at the file's start.
            (void)::lseek(fd, off_t(offset), SEEK_SET);
            std::unique_ptr<uint8_t[]> buffer(new uint8_t[frameSize ? frameSize : 1]);
            const int64_t got = frameSize ? FileSystem::readFully(fd, buffer.get(), frameSize) : 0;
            const uint8_t drop = timecodeFormat() == kSkarnTimecodeFormatDrop;
            const int32_t roundedRate = int32_t(std::ceil(std::clamp(nominal, 0.0, 1000.0)));
            if (got > 0) {
                std::span<uint8_t> frame(buffer.get(), size_t(got));
                if (d && hasPrefix(*d, "720p")) {
                    int32_t v = -1, s = -1;
                    DVExtractVFRInfoFromFrame(frame, 1, drop, roundedRate, nullptr, &v, nullptr, nullptr, nullptr);
                    DVExtractShootingRateFromFrame(frame, 1, drop, roundedRate, nullptr, &s, nullptr, nullptr);
                    shoot = s >= 0 ? s : v;
                } else {
                    int32_t flags = 0;
                    DVExtractShootingRateFromFrame(frame, 1, drop, roundedRate, nullptr, &shoot, nullptr, &flags);
                    // A rate counted in fields, not frames.
                    if (!(flags & 1) && (shoot == 50 || shoot == 60)) shoot /= 2;
                }
            }
            ::close(fd);
        }
        if (shoot > 0) rate = shoot;
    }

    if (ciEquals(text("ClipContent/EssenceList/Video/Pulldown"), "OTHER")) {
        const int64_t s = saturatingInt64(std::round(rate));
        const int64_t f = saturatingInt64(std::round(nominal));
        if (s == 24 && f == 60) _pulldown = kSkarnPulldown23;
        else if ((s == 30 && f == 60) || (s == 25 && f == 50) || (s == 30 && f == 30)) _pulldown = kSkarnPulldown22;
        else if (s == 24 && f == 30) _pulldown = kSkarnPulldown2332;
    }
    _shootingRate = rate;
}

int32_t SkarnClip::timecodeFormat() const {
    std::optional<std::string> flag = text("ClipContent/EssenceList/Video/FrameRate/@DropFrameFlag");
    if (!flag) flag = text("ClipContent/Essence/Video/FrameRate/@DropFrameFlag");
    if (!flag) flag = text("ClipContent/EssenceList/Video/TimecodeType");
    if (!flag) return kSkarnTimecodeFormatNonDrop;
    // 720p at 50 frames has no drop-frame timecode, whatever the flag says.
    if (ciEquals(flag, "TRUE") && _videoFormat != 12 && _videoFormat != 18) return kSkarnTimecodeFormatDrop;
    if (!ciEquals(flag, "DROP")) return kSkarnTimecodeFormatNonDrop;
    return (_videoFormat >= 4 && _videoFormat <= 7) ? kSkarnTimecodeFormatDrop : kSkarnTimecodeFormatNonDrop;
}

void SkarnClip::initializeMediaStart() {
    auto t = essenceListOrEssence("ClipContent/EssenceList/Video/StartTimecode", "ClipContent/Essence/Video/StartTimecode");
    const double f = frameRate();
    const int32_t fmt = timecodeFormat();
    // AVC-Strand 4:2:0 (4) is deliberately not among these.
    if (t && fmt == kSkarnTimecodeFormatDrop && (_videoFormat == 5 || _videoFormat == 6 || _videoFormat == 7)) {
        for (size_t i = 7; i < 9 && i < t->size(); ++i)
            if ((*t)[i] == ':') (*t)[i] = ';';
    }
    if (!t || f == 0) return;
    Ref<SkarnVestaTimecode> start;
    static constexpr int32_t kFramePairFormats[] = {11, 12, 5, 4, 7, 6, 23, 24, 19, 18};
    if ((f == 50 || f == 60) && std::find(std::begin(kFramePairFormats), std::end(kFramePairFormats), _videoFormat) !=
                                    std::end(kFramePairFormats)) {
        // These formats count frame pairs in their timecode labels.
        Ref<SkarnVestaTimecode> pairs = SkarnVestaTimecode::timecodeWithString(t, f * 0.5, 0, fmt);
        const double count = pairs ? pairs->nativeFramecountWithDropAdjust(false, true) : 0;
        start = SkarnVestaTimecode::timecodeWithFramecount(saturatingInt64(count) * 2, f, shootingRate(), 0, fmt);
    }
    if (!start) start = SkarnVestaTimecode::timecodeWithString(t, f, shootingRate(), fmt);
    if (start) start->setUseInterpRate(false);
    _mediaStartTC = start;
}

Value SkarnClip::mediaStart() {
    if (!_mediaStartTC) return Value();
    return Value(_mediaStartTC->stringValue());
}

void SkarnClip::initializeDurationNumber() {
    auto t = text("ClipContent/Duration");
    if (!t) return;
    double n = numberValue(*t);
    if (std::round(n) > 0 && videoDataSize() <= 0) {
        // Without a video size the length is taken in seconds of edit units, a
        // fallback kept as it has always been.
        if (auto eu = text("ClipContent/EditUnit")) {
            auto parts = split(*eu, '/');
            if (parts.size() >= 2) {
                const int64_t a = intValue(parts[0]);
                const int64_t b = intValue(parts[1]);
                if (b != 0) n = n * double(a) / double(b);
            }
        }
    }
    _durationNumber = n;
}

Value SkarnClip::mediaDuration() {
    if (!_durationNumber) return Value();
    const double d = *_durationNumber;
    if (d == std::trunc(d) && std::fabs(d) < 9e15) return Value(int64_t(d));
    return Value(d);
}

int64_t SkarnClip::durationIntegerValue() const { return _durationNumber ? saturatingInt64(*_durationNumber) : 0; }
