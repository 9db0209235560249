// SkarnClip's format: the video format code detected from the codec, frame
// size and rate at construction, and what follows from it (source and pixel
// formats, display format, picture size, bitrate); the clip's identity; and the
// sizes and layout of its video and audio essence.
#include "SkarnClip.h"

#include "FileSystem.h"
#include "SkarnClipInternal.h"

#include <algorithm>
#include <cmath>
#include <iterator>

using namespace SkarnClipInternal;

namespace {

constexpr FourCharCode fourCC(const char (&s)[5]) {
    return FourCharCode(uint8_t(s[0])) << 24 | FourCharCode(uint8_t(s[1])) << 16 | FourCharCode(uint8_t(s[2])) << 8 |
           FourCharCode(uint8_t(s[3]));
}

// Length in UTF-16 units, as the platform counts string lengths.
size_t utf16Length(const std::string& s) {
    size_t n = 0;
    for (unsigned char c : s) {
        if ((c & 0xC0) != 0x80) ++n;    // a character starts
        if ((c & 0xF8) == 0xF0) ++n;    // beyond the basic plane: a surrogate pair
    }
    return n;
}

}  // namespace

void SkarnClip::initializeVideoFormat() {
    _videoFormat = 0;
    auto codec = text("ClipContent/EssenceList/Video/Codec");
    if (!codec) {
        // Only the header XML of a self-contained clip lacks the EssenceList
        // codec, and those clips are always taken as AVC-Intra 1080i60, whatever
        // their own codec says.
        (void)text("ClipContent/Essence/Video/Codec");
        _videoFormat = 26;
        return;
    }
    const double duration = _durationNumber.value_or(0.0);
    const double size = videoDataSize();
    int64_t bytesPerFrame = 0;
    if (duration >= 1) bytesPerFrame = saturatingInt64(std::floor(size / duration));

    struct DVRow {
        int64_t bytes;
        const char* codec;
        int32_t code;
    };
    static constexpr DVRow kDVRows[] = {
        {144000, "DV25_411", 8},           {144000, "DV25_420", 2},         {120000, "DV25_411", 1},
        {240000, "DV50_422", 9},           {288000, "DV50_422", 10},        {240000, "DV100_720/59.94p", 11},
        {288000, "DV100_720/50p", 12},     {480000, "DV100_1080/59.94i", 13}, {576000, "DV100_1080/50i", 14},
    };
    for (const DVRow& row : kDVRows) {
        if (bytesPerFrame == row.bytes && caseInsensitiveEqual(*codec, row.codec)) {
            _videoFormat = row.code;
            return;
        }
    }
    // A DV codec whose frame size fits none of its rows falls through to here
    // and ends unknown.
    auto is = [&](const char* name) { return caseInsensitiveEqual(*codec, name); };
    if (is("AVC-I_720/50p")) {
        _videoFormat = frameRate() < 30 ? 16 : 18;
    } else if (is("AVC-I_720/59.94p")) {
        const double r = frameRate();
        _videoFormat = r < 25 ? 15 : r < 50 ? 17 : 19;
    } else if (is("AVC-I_1080/25p")) {
        _videoFormat = frameRate() > 25 ? 23 : 21;
    } else if (is("AVC-I_1080/29.97p")) {
        const double r = frameRate();
        _videoFormat = r < 25 ? 20 : r > 30 ? 24 : 22;
    } else if (is("AVC-I_1080/50i")) {
        _videoFormat = 25;
    } else if (is("AVC-I_1080/59.94i")) {
        _videoFormat = 26;
    } else if (is("AVC-Strand420")) {
        _videoFormat = 4;
    } else if (is("AVC-Strand422")) {
        _videoFormat = 5;
    } else if (is("AVC-Intra2K_444") || is("AVC-Intra4K_444") || is("AVC-Intra_444")) {
        _videoFormat = 7;
    } else if (is("AVC-Intra2K_422") || is("AVC-Intra4K_422")) {
        _videoFormat = 6;
    }
}

FourCharCode SkarnClip::sourceFormat() {
    if (!_durationNumber || durationIntegerValue() < 1) return 0;
    const int64_t bytes = saturatingInt64(videoDataSize() / *_durationNumber);
    auto codec = text("ClipContent/EssenceList/Video/Codec");
    auto is = [&](const char* name) { return codec && caseInsensitiveEqual(*codec, name); };
    switch (bytes) {
    case 120000:
        if (is("DV25_411")) return fourCC("dvc ");
        break;
    case 144000:
        if (is("DV25_411")) return fourCC("dvpp");
        if (is("DV25_420")) return fourCC("dvcp");
        break;
    case 240000:
        if (is("DV50_422")) return fourCC("dv5n");
        if (is("DV100_720/59.94p")) return fourCC("dvhp");
        break;
    case 288000:
        if (is("DV50_422")) return fourCC("dv5p");
        if (is("DV100_720/50p")) return fourCC("dvhq");
        break;
    case 480000:
        if (is("DV100_1080/59.94i")) return fourCC("dvh6");
        break;
    case 576000:
        if (is("DV100_1080/50i")) return fourCC("dvh5");
        break;
    default: break;
    }
    if (is("AVC-Strand420") || is("AVC-Strand422")) return fourCC("avlg");
    if (is("AVC-Intra4K_422") || is("AVC-Intra2K_422")) return fourCC("ai42");
    if (is("AVC-Intra4K_444") || is("AVC-Intra2K_444") || is("AVC-Intra_444")) return fourCC("ai44");

    const int32_t rate = videoBitrate();
    auto pick = [&](FourCharCode c100, FourCharCode c200, FourCharCode other) {
        return rate == 100 ? c100 : rate == 200 ? c200 : other;
    };
    switch (_videoFormat) {
    case 15: case 17: case 19: return pick(fourCC("ai1p"), fourCC("ai2p"), fourCC("ai5p"));
    case 16: case 18: return pick(fourCC("ai1q"), fourCC("ai2q"), fourCC("ai5q"));
    case 20: case 22: case 24: return pick(fourCC("ai13"), fourCC("ai23"), fourCC("ai53"));
    case 21: case 23: return pick(fourCC("ai12"), fourCC("ai22"), fourCC("ai52"));
    case 25: return pick(fourCC("ai15"), fourCC("ai25"), fourCC("ai55"));
    case 26: return pick(fourCC("ai16"), fourCC("ai26"), fourCC("ai56"));
    default: return 0;
    }
}

std::optional<std::string> SkarnClip::sourceFormatName() {
    if (!isAVCI()) return std::nullopt;
    return localized("Skarn AVC-Intra", "");
}

FourCharCode SkarnClip::decodePixelFormat() const { return isAVCI() ? fourCC("v216") : 0; }

std::string SkarnClip::format() {
    static const char* const kNames[] = {
        "Unknown",            "DV/DVCPRO - NTSC",    "DV - PAL",            "HDV",
        "AVC-Strand 4:2:0",   "AVC-Strand 4:2:2",    "AVC-Intra 4:2:2",     "AVC-Intra 4:4:4",
        "DVCPRO - PAL",       "DVCPRO50 - NTSC",     "DVCPRO50 - PAL",      "DVCPRO HD (720p60)",
        "DVCPRO HD (720p50)", "DVCPRO HD (1080i60)", "DVCPRO HD (1080i50)", "AVC-Intra (720p24)",
        "AVC-Intra (720p25)", "AVC-Intra (720p30)",  "AVC-Intra (720p50)",  "AVC-Intra (720p60)",
        "AVC-Intra (1080p24)", "AVC-Intra (1080p25)", "AVC-Intra (1080p30)", "AVC-Intra (1080p50)",
        "AVC-Intra (1080p60)", "AVC-Intra (1080i50)", "AVC-Intra (1080i60)",
    };
    if (_videoFormat == -1) return localized("", "");
    const char* name = (_videoFormat >= 0 && _videoFormat <= 26) ? kNames[_videoFormat] : "Unknown";
    return localized(name, name);
}

std::optional<std::string> SkarnClip::displayFormat() {
    const int32_t p = pulldown();
    switch (_videoFormat) {
    case 1:
    case 9:
        return p == 4 ? "480p30" : p == 3 ? "480pA24" : p == 2 ? "480p24" : "480i60";
    case 2:
    case 8:
    case 10:
        return p == 4 ? "576p25" : "576i50";
    case 4:
    case 5:
    case 6:
    case 7: {
        auto lines = text("ClipContent/EssenceList/Video/ActiveLine");
        auto rate = text("ClipContent/EssenceList/Video/FrameRate");
        if (!lines) return std::nullopt;
        auto rateStarts = [&](const char* a) { return rate && hasPrefix(*rate, a); };
        const bool interlaced = rate && hasSuffix(*rate, "i");
        if (hasPrefix(*lines, "720")) {
            if (rateStarts("59.9") || rateStarts("60")) return "720p60";
            if (rateStarts("50")) return "720p50";
            return std::nullopt;
        }
        if (hasPrefix(*lines, "1080")) {
            if (rateStarts("59.9") || rateStarts("60")) return interlaced ? "1080i30" : "1080p60";
            if (rateStarts("29.9") || rateStarts("30")) return interlaced ? "1080i30" : "1080p30";
            if (rateStarts("23.9") || rateStarts("24")) return "1080p24";
            if (rateStarts("50")) return interlaced ? "1080i25" : "1080p50";
            if (rateStarts("25")) return interlaced ? "1080i25" : "1080p25";
            return std::nullopt;
        }
        if (hasPrefix(*lines, "2160")) return "4k";
        return std::nullopt;
    }
    case 11:
    case 12: {
        auto ratio = text("ClipContent/EssenceList/Video/VFRRatio");
        auto state = text("ClipContent/EssenceList/Video/VFRRatio/@VRFRState");
        if (ratio && state && (ciEquals(state, "constant") || ciEquals(state, "variable"))) {
            auto parts = split(*ratio, '/');
            if (parts.size() == 2) return "720pN" + parts[0];
        }
        const double r = frameRate();
        if (_videoFormat == 11) {
            if (r != 60 && r != 59.94) {
                if (r == 30 || r == 29.97) return "720pN30";
                if (r == 24 || r == 23.98) return "720pN24";
                return std::nullopt;
            }
            return p == 2 ? "720p24" : p == 4 ? "720p30" : "720p60";
        }
        if (r == 50) return p == 4 ? "720p25" : "720p50";
        if (r == 25) return "720pN25";
        return "720p25";
    }
    case 13:
        return p == 4 ? "1080p30" : p == 3 ? "1080pA24" : p == 2 ? "1080p24" : "1080i60";
    case 14:
        return p == 4 ? "1080p25" : "1080i50";
    case 15: return "720p24";
    case 16: return "720p25";
    case 17: return "720p30";
    case 18: return "720p50";
    case 19: return "720p60";
    case 20: return "1080p24";
    case 21: return "1080p25";
    case 22: return "1080p30";
    case 23: return "1080p50";
    case 24: return "1080p60";
    case 25: return "1080i50";
    case 26: return "1080i60";
    default: return std::nullopt;
    }
}

uint32_t SkarnClip::videoHeight() {
    auto d = displayFormat();
    if (!d) return 0;
    if (hasPrefix(*d, "480")) return 480;
    if (hasPrefix(*d, "576")) return 576;
    if (hasPrefix(*d, "720")) return 720;
    if (hasPrefix(*d, "1080")) return 1080;
    return 0;
}

uint32_t SkarnClip::videoWidth() {
    const uint32_t h = videoHeight();
    auto a = aspectRatio();
    return a && hasPrefix(*a, "16") ? h / 9 * 16 : h / 3 * 4;
}

std::optional<std::string> SkarnClip::aspectRatio() const { return text("ClipContent/EssenceList/Video/AspectRatio"); }

bool SkarnClip::anamorphic() const {
    auto a = aspectRatio();
    if (!a || !hasPrefix(*a, "16")) return false;
    switch (_videoFormat) {
    case 1: case 2: case 8: case 9: case 10: return true;
    default: return false;
    }
}

int32_t SkarnClip::videoBitrate() {
    int32_t rate;
    if (auto c = text("ClipContent/EssenceList/Video/Codec/@Class")) {
        rate = intValue(*c);
    } else {
        const int32_t f = _videoFormat;
        rate = (f == 1 || f == 2 || f == 8) ? 25
               : (f == 9 || f == 10)        ? 50
               : (f >= 11 && f <= 14)       ? 100
               : (f >= 15 && f <= 17)       ? 50
               : (f >= 18 && f <= 26)       ? 100
                                            : 0;
    }
    if (_videoFormat == 11 || _videoFormat == 12) {
        auto d = displayFormat();
        if (d == "720pN30" || d == "720pN25") return 50;
        if (d == "720pN24") return 40;
        return 100;
    }
    return rate;
}

bool SkarnClip::recognizedVideoSampleSize(int64_t size) {
    static constexpr int64_t kSizes[] = {116224, 120000, 140288, 144000, 232448, 236032, 240000, 280576, 284160,
                                         288000, 472064, 476160, 480000, 568320, 571904, 576000, 952320, 1143808};
    return std::find(std::begin(kSizes), std::end(kSizes), size) != std::end(kSizes);
}

std::optional<std::string> SkarnClip::clipID() { return text("ClipContent/GlobalClipID"); }


std::optional<std::string> SkarnClip::name() {
    const std::string base = baseName();
    auto user = corvane_Skarn_userClipName();
    auto gid = clipID();
    if (!user || !gid) return base;
    if (caseInsensitiveEqual(*user, *gid) || caseInsensitiveEqual(*user, base)) return base;
    // A user name that is itself a hexadecimal identifier says nothing.
    if (user->find_first_not_of("1234567890ABCDEFabcdef") == std::string::npos) return base;
    if (utf16Length(*user) > 63) return base;
    if (auto top = spannedClipID(); top && caseInsensitiveEqual(*user, *top)) return base;
    return *user + " " + base;
}

double SkarnClip::videoDataSize() {
    const double n = numberValueOrZero(text("ClipContent/EssenceList/Video/VideoIndex/DataSize"));
    if (n != 0) {
        // AVC-Intra essence starts with a 512-byte header that is not picture data.
        auto codec = text("ClipContent/EssenceList/Video/Codec");
        return codec && hasPrefix(*codec, "AVC-I") ? n - 512 : n;
    }
    // Without a DataSize the size of the clip's own file stands in, less the
    // audio: a rough fallback that is kept as the card reader has always had it.
    double size = double(FileSystem::fileSize(_clipXMLPath).value_or(0));
    if (!_isMXFOp1bFormat && size > 0) {
        const uint32_t channels = numberOfAudioChannels();
        auto nodes = _root ? _root.nodesForXPath("ClipContent/EssenceList/Audio/AudioIndex/DataSize") : std::nullopt;
        const uint32_t listed = nodes ? uint32_t(std::min<size_t>(nodes->size(), channels)) : 0;
        uint32_t i = 0;
        for (; i < listed; ++i) size -= dataSizeForAudioChannelIndex(i);
        // Channels past the listed ones all have the same computed size; a
        // hostile channel count must not turn this into billions of steps.
        const uint32_t rest = channels - i;
        if (rest > 0) {
            const double each = dataSizeForAudioChannelIndex(i);
            if (rest <= 1024) {
                for (uint32_t k = 0; k < rest; ++k) size -= each;
            } else {
                size -= each * double(rest);
            }
        }
    }
    return size;
}

double SkarnClip::startByteOffset() {
    double n = numberValueOrZero(text("ClipContent/EssenceList/Video/VideoIndex/StartByteOffset"));
    if (isAVCI()) n += 512;
    return n;
}

double SkarnClip::dataSize() {
    double total = videoDataSize();
    if (!_root) return total;
    if (auto nodes = _root.nodesForXPath("ClipContent/EssenceList/Audio/AudioIndex/DataSize")) {
        for (const XMLNode& n : *nodes) {
            const double v = numberValue(n.stringValue());
            if (v > 0) total += v;
        }
    }
    return total;
}

double SkarnClip::dataSizeForAudioChannelIndex(uint32_t index) {
    if (!_root) return 0;
    auto nodes = _root.nodesForXPath("ClipContent/EssenceList/Audio/AudioIndex/DataSize");
    if (nodes && nodes->size() >= size_t(index) + 1) return numberValue((*nodes)[index].stringValue());
    auto duration = text("ClipContent/Duration");
    auto editUnit = text("ClipContent/EditUnit");
    if (!duration || !editUnit) return 0;
    auto parts = split(*editUnit, '/');
    const double num = numberValue(parts[0]);
    const double den = parts.size() > 1 ? numberValue(parts[1]) : 0;
    const double seconds = den == 0 ? 1 : numberValue(*duration) * num / den;
    auto rate = text("ClipContent/EssenceList/Audio/SamplingRate");
    if (!rate) return 0;
    auto bits = text("ClipContent/EssenceList/Audio/BitsPerSample");
    if (!bits) return 0;
    return seconds * numberValue(*rate) * numberValue(*bits) * 0.125;
}

int32_t SkarnClip::sampleRate() const { return intValueOrZero(text("ClipContent/EssenceList/Audio/SamplingRate")); }

int32_t SkarnClip::bitsPerSample() const { return intValueOrZero(text("ClipContent/EssenceList/Audio/BitsPerSample")); }

uint32_t SkarnClip::numberOfAudioChannels() {
    if (!_root) return 0;
    // A negative count would read as billions of channels; it counts as none.
    auto count = [](int64_t v) { return uint32_t(std::max<int64_t>(v, 0)); };
    if (auto c = text("ClipContent/EssenceList/Audio/Channel")) return count(intValue(*c));
    if (auto c = text("ClipContent/Essence/Audio/ChannelNum")) return count(intValue(*c));
    auto list = _root.nodesForXPath("ClipContent/EssenceList/Audio");
    if (!list) return 0;
    if (!list->empty()) return uint32_t(list->size());
    auto essence = _root.nodesForXPath("ClipContent/Essence/Audio");
    return essence ? uint32_t(essence->size()) : 0;
}
