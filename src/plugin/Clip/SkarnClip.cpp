#include "SkarnClip.h"

#include "DVFrameData.h"
#include "FileSystem.h"
#include "SkarnCardFolderCache.h"
#include "SkarnFileUtilities.h"
#include "SkarnLog.h"
#include "SkarnMXFHeaderXML.h"
#include "SkarnMXFMetadata.h"

#include <algorithm>
#include <atomic>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <limits>
#include <memory>
#include <mutex>
#include <unistd.h>

namespace {

// Decremented by every clip that goes; nothing counts clips up or reads it.
std::atomic<int64_t> gClipCount{0};

void bundleAnchor() {}

std::mutex gBundleMutex;
Ref<Bundle> gDefaultBundle;
bool gDefaultBundleLooked = false;

Ref<Bundle> defaultBundle() {
    std::lock_guard lock(gBundleMutex);
    if (!gDefaultBundleLooked) {
        gDefaultBundle = Bundle::bundleForAddress(reinterpret_cast<const void*>(&bundleAnchor));
        gDefaultBundleLooked = true;
    }
    return gDefaultBundle;
}

using FileSystem::caseInsensitiveEqual;
using FileSystem::hasPrefix;
using FileSystem::hasSuffix;

constexpr FourCharCode fourCC(const char (&s)[5]) {
    return FourCharCode(uint8_t(s[0])) << 24 | FourCharCode(uint8_t(s[1])) << 16 | FourCharCode(uint8_t(s[2])) << 8 |
           FourCharCode(uint8_t(s[3]));
}

// The platform's doubleValue of a text: a leading decimal number, 0 when there
// is none. Spellings the platform does not read as numbers (inf, nan, hex) and
// values too large for a double count as none.
double numberValue(std::string_view s) {
    size_t i = 0;
    while (i < s.size() && std::isspace(static_cast<unsigned char>(s[i]))) ++i;
    size_t j = i;
    if (j < s.size() && (s[j] == '+' || s[j] == '-')) ++j;
    if (j >= s.size() || !(std::isdigit(static_cast<unsigned char>(s[j])) || s[j] == '.')) return 0.0;
    if (s[j] == '0' && j + 1 < s.size() && (s[j + 1] == 'x' || s[j + 1] == 'X')) return 0.0;
    double d = stringDoubleValue(s.substr(i));
    return std::isfinite(d) ? d : 0.0;
}
double numberValueOrZero(const std::optional<std::string>& s) { return s ? numberValue(*s) : 0.0; }

// The platform's intValue: 32-bit, clamped.
int32_t intValue(std::string_view s) {
    int64_t v = stringIntegerValue(s);
    return int32_t(std::clamp<int64_t>(v, std::numeric_limits<int32_t>::min(), std::numeric_limits<int32_t>::max()));
}
int32_t intValueOrZero(const std::optional<std::string>& s) { return s ? intValue(*s) : 0; }

// A double as a 64-bit integer, truncated and saturated (NaN is 0).
int64_t saturatingInt64(double d) {
    if (std::isnan(d)) return 0;
    if (d >= 9.2e18) return std::numeric_limits<int64_t>::max();
    if (d <= -9.2e18) return std::numeric_limits<int64_t>::min();
    return int64_t(d);
}

std::vector<std::string> split(const std::string& s, char sep) {
    std::vector<std::string> parts;
    size_t start = 0;
    for (;;) {
        size_t at = s.find(sep, start);
        parts.push_back(s.substr(start, at == std::string::npos ? std::string::npos : at - start));
        if (at == std::string::npos) break;
        start = at + 1;
    }
    return parts;
}

bool ciEquals(const std::optional<std::string>& s, const char* what) { return s && caseInsensitiveEqual(*s, what); }

std::string upperCased(std::string s) {
    for (char& c : s) c = char(std::toupper(static_cast<unsigned char>(c)));
    return s;
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

// The 27 card metadata keys (after "com.corvane.professionalplugin.skarn.")
// and the accessors whose values they publish, in entry order.
struct CardMetadataRow {
    const char* keySuffix;
    const char* accessor;
};
constexpr CardMetadataRow kCardMetadataMap[] = {
    {"essencelist.video.startbinarygroup", "corvane_Skarn_startBinaryGroup"},
    {"clipmetadata.userclipname", "corvane_Skarn_userClipName"},
    {"clipmetadata.memo.person", "corvane_Skarn_memo_person"},
    {"clipmetadata.memo.text", "corvane_Skarn_memo_text"},
    {"clipmetadata.datasource", "corvane_Skarn_dataSource"},
    {"clipmetadata.shotmark", "corvane_Skarn_shotMark"},
    {"clipmetadata.access.lastupdateperson", "corvane_Skarn_lastChangedBy"},
    {"clipmetadata.shoot.shooter", "corvane_Skarn_shooter"},
    {"clipmetadata.shoot.startdate", "corvane_Skarn_shootingStartDateString"},
    {"clipmetadata.shoot.enddate", "corvane_Skarn_shootingEndDateString"},
    {"clipmetadata.shoot.location.altitude", "corvane_Skarn_shootingAltitude"},
    {"clipmetadata.shoot.location.longitude", "corvane_Skarn_shootingLongitude"},
    {"clipmetadata.shoot.location.latitude", "corvane_Skarn_shootingLatitude"},
    {"clipmetadata.shoot.location.source", "corvane_Skarn_shootingLocationSource"},
    {"clipmetadata.shoot.location.placename", "corvane_Skarn_shootingLocationName"},
    {"clipmetadata.scenario.programname", "corvane_Skarn_programName"},
    {"clipmetadata.news.reporter", "corvane_Skarn_reporter"},
    {"clipmetadata.news.purpose", "corvane_Skarn_purpose"},
    {"clipmetadata.news.object", "corvane_Skarn_object"},
    {"clipmetadata.scenario.sceneno", "scene"},
    {"clipmetadata.scenario.takeno", "shot"},
    {"clipmetadata.access.creator", "creator"},
    {"clipmetadata.access.creationdate", "creationDateString"},
    {"clipmetadata.access.lastupdatedate", "lastChangeDateString"},
    {"clipmetadata.device.manufacturer", "deviceManufacturer"},
    {"clipmetadata.device.serialno", "deviceSerialNumber"},
    {"clipmetadata.device.modelname", "deviceModelName"},
};

struct ExtendedPropertyRow {
    const char* identifier;
    const char* label;
};
constexpr ExtendedPropertyRow kExtendedProperties[] = {
    {"corvane_Skarn_dataSource", "Data Source"},
    {"corvane_Skarn_shootingLongitude", "Longitude"},
    {"corvane_Skarn_shootingLatitude", "Latitude"},
    {"corvane_Skarn_shooter", "Shot By"},
    {"corvane_Skarn_shootingStartDate", "Shooting Start Date"},
    {"corvane_Skarn_shootingEndDate", "Shooting End Date"},
    {"corvane_Skarn_shootingLocationSource", "Location Source"},
    {"corvane_Skarn_shootingLocationName", "Location Name"},
    {"corvane_Skarn_programName", "Program Name"},
    {"corvane_Skarn_reporter", "Reporter"},
    {"corvane_Skarn_purpose", "Purpose"},
    {"corvane_Skarn_object", "Object"},
    {"corvane_Skarn_lastChangedBy", "Modified By"},
    {"corvane_Skarn_startBinaryGroup", "User Information"},
    {"corvane_Skarn_memo_text", "Memo"},
    {"corvane_Skarn_memo_person", "Memo Created By"},
};

// The platform's truncate-middle line break mode.
constexpr int kLineBreakByTruncatingMiddle = 4;

}  // namespace

// ---------------------------------------------------------------------------
// Construction

struct SkarnClip::ConstructionMemo {
    // Keyed by the address of the XPath literal: the few dozen paths a clip
    // reads are all literals, and comparing addresses costs less than hashing
    // the paths would save. Two spellings of one path at different addresses
    // only cost a second evaluation.
    std::vector<std::pair<const char*, std::optional<std::string>>> texts;
    std::optional<std::optional<std::string>> videoFilePath;
};

SkarnClip::~SkarnClip() { gClipCount.fetch_sub(1, std::memory_order_relaxed); }

void SkarnClip::setDefaultBundle(Ref<Bundle> bundle) {
    std::lock_guard lock(gBundleMutex);
    gDefaultBundle = std::move(bundle);
    gDefaultBundleLooked = gDefaultBundle != nullptr;
}

Ref<SkarnClip> SkarnClip::initWithSkarnClip(const std::optional<std::string>& path) {
    if (!path) return nullptr;
    Ref<XMLDocument> document;
    bool isMXFOp1b = false;
    if (hasSuffix(*path, "XML") || hasSuffix(*path, "xml")) {
        document = XMLDocument::documentWithContentsOfFile(*path);
        if (!document) return nullptr;
    } else if (hasSuffix(*path, "MXF") || hasSuffix(*path, "mxf")) {
        // One error slot for both loads, deliberately: a companion XML that is
        // there but broken sinks the clip even when the header XML would parse.
        std::string error;
        const std::string contents =
            FileSystem::stringByDeletingLastPathComponent(FileSystem::stringByDeletingLastPathComponent(*path));
        const std::string base = FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(*path));
        auto clipFolder = SkarnCardFolderCache::pathInFolder("CLIP", contents);
        auto companion = SkarnCardFolderCache::pathInFolder(
            FileSystem::stringByAppendingPathExtension(base, "XML"), clipFolder);
        if (companion) document = XMLDocument::documentWithContentsOfFile(*companion, &error);
        if (!document || !error.empty()) {
            document = nullptr;
            if (auto xml = SkarnMXF_XMLStringForClip(*path)) {
                std::string parseError;
                document = XMLDocument::documentWithXMLString(*xml, &parseError);
                if (!parseError.empty()) error = parseError;
            }
        }
        isMXFOp1b = true;
        if (!document || !error.empty()) return nullptr;
    } else {
        return nullptr;
    }

    Ref<SkarnClip> clip(new SkarnClip);
    clip->_clipXMLDocument = document;
    clip->_root = document->rootElement();
    clip->_isMXFOp1bFormat = isMXFOp1b;
    clip->_clipXMLPath = *path;
    clip->_pulldown = kSkarnPulldownUnknown;
    {
        std::lock_guard lock(gBundleMutex);
        if (gDefaultBundleLooked) clip->_bundle = gDefaultBundle;
    }
    if (!clip->_bundle) clip->_bundle = defaultBundle();

    clip->_memo = std::make_unique<ConstructionMemo>();
    clip->initializeDurationNumber();
    clip->initializeVideoFormat();
    if (clip->_videoFormat == 0 || clip->durationIntegerValue() == 0) return nullptr;
    clip->initializeShootingRate();
    clip->initializeMediaStart();
    clip->initializeMetadata();
    // Afterwards every property reads the document afresh, as callers expect.
    clip->_memo.reset();
    return clip;
}

std::string SkarnClip::description() const { return Object::description() + " " + _clipXMLPath; }

// ---------------------------------------------------------------------------
// Document access

XMLNode SkarnClip::rootNode() const { return _root; }

std::optional<std::string> SkarnClip::stringFromClipDescriptionForXPath(const std::string& xpath) const {
    if (!_root) return std::nullopt;
    std::string error;
    XMLNode node = _root.firstNodeForXPath(xpath, &error);
    if (!error.empty() || !node) return std::nullopt;
    return node.stringValue();
}

std::optional<std::string> SkarnClip::text(const char* xpath) const {
    if (!_memo) return stringFromClipDescriptionForXPath(xpath);
    for (const auto& [path, value] : _memo->texts)
        if (path == xpath) return value;
    return _memo->texts.emplace_back(xpath, stringFromClipDescriptionForXPath(xpath)).second;
}

std::optional<std::string> SkarnClip::essenceListOrEssence(const char* essenceListPath, const char* essencePath) const {
    auto t = text(essenceListPath);
    return t ? t : text(essencePath);
}

std::string SkarnClip::localized(const std::string& key, const std::string& defaultValue) const {
    if (!_bundle) return defaultValue.empty() ? key : defaultValue;
    return _bundle->localizedString(key, defaultValue, "Skarn");
}

int64_t SkarnClip::durationIntegerValue() const { return _durationNumber ? saturatingInt64(*_durationNumber) : 0; }

// ---------------------------------------------------------------------------
// Format

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

std::string SkarnClip::baseName() const {
    return FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(_clipXMLPath));
}

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

// ---------------------------------------------------------------------------
// Timing

namespace {
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
        int fd = path ? FileSystem::openReadOnly(*path) : -1;
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

std::optional<std::string> SkarnClip::dateFromDateString(const std::optional<std::string>& text,
                                                         Ref<SkarnDate>* outDate, Ref<SkarnTimeZone>* outTimeZone) {
    if (outDate) *outDate = nullptr;
    if (outTimeZone) *outTimeZone = nullptr;
    // Shorter texts cannot hold date, time and zone at the fixed positions read below.
    if (!text || text->size() < 23) return std::nullopt;
    const std::string& s = *text;
    const std::string zone = s.substr(19);
    std::string composed = s.substr(0, 10) + " " + s.substr(11, 8) + " " + zone.substr(0, 3) + zone.substr(4);
    if (outDate) *outDate = SkarnDate::dateFromString(composed);
    // The minutes are added whatever the sign of the hours, so -05:30 comes
    // out as -04:30 (-16200 s); kept, as clips have always been read so.
    const int64_t seconds = int64_t(intValue(zone.substr(0, 3))) * 3600 + int64_t(intValue(zone.substr(4))) * 60;
    if (outTimeZone) *outTimeZone = SkarnTimeZone::timeZoneForSecondsFromGMT(seconds);
    return composed;
}

// ---------------------------------------------------------------------------
// Card metadata

std::optional<std::string> SkarnClip::corvane_Skarn_startBinaryGroup() const {
    return text("ClipContent/EssenceList/Video/StartBinaryGroup");
}
std::optional<std::string> SkarnClip::corvane_Skarn_userClipName() const {
    return text("ClipContent/ClipMetadata/UserClipName");
}
std::optional<std::string> SkarnClip::corvane_Skarn_dataSource() const { return text("ClipContent/ClipMetadata/DataSource"); }
std::optional<std::string> SkarnClip::corvane_Skarn_lastChangedBy() const {
    return text("ClipContent/ClipMetadata/Access/LastUpdatePerson");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shooter() const { return text("ClipContent/ClipMetadata/Shoot/Shooter"); }
std::optional<std::string> SkarnClip::corvane_Skarn_shootingAltitude() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Altitude");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLongitude() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Longitude");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLatitude() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Latitude");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLocationSource() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/Source");
}
std::optional<std::string> SkarnClip::corvane_Skarn_shootingLocationName() const {
    return text("ClipContent/ClipMetadata/Shoot/Location/PlaceName");
}
std::optional<std::string> SkarnClip::corvane_Skarn_programName() const {
    return text("ClipContent/ClipMetadata/Scenario/ProgramName");
}
std::optional<std::string> SkarnClip::corvane_Skarn_reporter() const { return text("ClipContent/ClipMetadata/News/Reporter"); }
std::optional<std::string> SkarnClip::corvane_Skarn_purpose() const { return text("ClipContent/ClipMetadata/News/Purpose"); }
std::optional<std::string> SkarnClip::corvane_Skarn_object() const { return text("ClipContent/ClipMetadata/News/Object"); }
std::optional<std::string> SkarnClip::scene() const { return text("ClipContent/ClipMetadata/Scenario/SceneNo."); }
std::optional<std::string> SkarnClip::shot() const { return text("ClipContent/ClipMetadata/Scenario/TakeNo."); }
std::optional<std::string> SkarnClip::creator() const { return text("ClipContent/ClipMetadata/Access/Creator"); }
std::optional<std::string> SkarnClip::deviceManufacturer() const {
    return text("ClipContent/ClipMetadata/Device/Manufacturer");
}
std::optional<std::string> SkarnClip::deviceSerialNumber() const { return text("ClipContent/ClipMetadata/Device/SerialNo."); }
std::optional<std::string> SkarnClip::deviceModelName() const { return text("ClipContent/ClipMetadata/Device/ModelName"); }

std::optional<std::string> SkarnClip::corvane_Skarn_shotMark() const {
    auto t = text("ClipContent/ClipMetadata/ShotMark");
    if (!t) return std::nullopt;
    return upperCased(*t);
}

bool SkarnClip::isGood() const { return ciEquals(text("ClipContent/ClipMetadata/ShotMark"), "true"); }

std::optional<std::string> SkarnClip::memoList(const char* child) const {
    if (!_root) return std::nullopt;
    std::string error;
    auto memos = _root.nodesForXPath("ClipContent/ClipMetadata/MemoList/Memo", &error);
    if (!memos || memos->empty()) return std::nullopt;
    std::optional<std::string> result;
    for (const XMLNode& memo : *memos) {
        auto items = memo.nodesForXPath(child, &error);
        if (!items) break;
        if (items->empty()) continue;
        std::string t = items->front().stringValue();
        if (!result) result = std::move(t);
        else if (!t.empty()) *result += "/ " + t;
    }
    return result;
}

std::optional<std::string> SkarnClip::corvane_Skarn_memo_text() const { return memoList("Text"); }
std::optional<std::string> SkarnClip::corvane_Skarn_memo_person() const { return memoList("Person"); }

std::optional<std::string> SkarnClip::dateString(const char* xpath) const {
    return dateFromDateString(text(xpath), nullptr, nullptr);
}
Ref<SkarnDate> SkarnClip::date(const char* xpath) const {
    Ref<SkarnDate> d;
    dateFromDateString(text(xpath), &d, nullptr);
    return d;
}
Ref<SkarnTimeZone> SkarnClip::timeZone(const char* xpath) const {
    Ref<SkarnTimeZone> z;
    dateFromDateString(text(xpath), nullptr, &z);
    return z;
}

#define SKARN_DATE_PATH_CREATION "ClipContent/ClipMetadata/Access/CreationDate"
#define SKARN_DATE_PATH_LASTUPDATE "ClipContent/ClipMetadata/Access/LastUpdateDate"
#define SKARN_DATE_PATH_START "ClipContent/ClipMetadata/Shoot/StartDate"
#define SKARN_DATE_PATH_END "ClipContent/ClipMetadata/Shoot/EndDate"

Ref<SkarnDate> SkarnClip::creationDate() const { return date(SKARN_DATE_PATH_CREATION); }
Ref<SkarnTimeZone> SkarnClip::creationDateTimeZone() const { return timeZone(SKARN_DATE_PATH_CREATION); }
std::optional<std::string> SkarnClip::creationDateString() const { return dateString(SKARN_DATE_PATH_CREATION); }
Ref<SkarnDate> SkarnClip::lastChangeDate() const { return date(SKARN_DATE_PATH_LASTUPDATE); }
Ref<SkarnTimeZone> SkarnClip::lastChangeDateTimeZone() const { return timeZone(SKARN_DATE_PATH_LASTUPDATE); }
std::optional<std::string> SkarnClip::lastChangeDateString() const { return dateString(SKARN_DATE_PATH_LASTUPDATE); }
Ref<SkarnDate> SkarnClip::corvane_Skarn_shootingStartDate() const { return date(SKARN_DATE_PATH_START); }
std::optional<std::string> SkarnClip::corvane_Skarn_shootingStartDateString() const {
    return dateString(SKARN_DATE_PATH_START);
}
Ref<SkarnDate> SkarnClip::corvane_Skarn_shootingEndDate() const { return date(SKARN_DATE_PATH_END); }
std::optional<std::string> SkarnClip::corvane_Skarn_shootingEndDateString() const {
    return dateString(SKARN_DATE_PATH_END);
}

namespace {
// {"reverseDNSName": key, "value": value}, built by moves: an initialiser list
// would copy every value twice, for each of a card's hundreds of entries.
Value metadataEntry(std::string key, Value value) {
    Dictionary d;
    d.set("reverseDNSName", Value(std::move(key)));
    d.set("value", std::move(value));
    return Value(std::move(d));
}
}  // namespace

Value SkarnUtilities_unpackageMetadataDictionary(const Value& dictionary) {
    if (!dictionary.isDictionary()) return Value();
    Array entries;
    entries.reserve(dictionary.dictionary().size());
    for (const auto& [key, value] : dictionary.dictionary()) entries.push_back(metadataEntry(key, value));
    return Value(std::move(entries));
}

void SkarnClip::initializeMetadata() {
    Value m = SkarnMXFMetadataForClip(this);
    if (!m.isArray()) {
        _metadata = Value();
        return;
    }
    Array cardEntries;
    for (const CardMetadataRow& row : kCardMetadataMap) {
        if (!respondsToSelector(row.accessor)) continue;
        Value v = valueForKey(row.accessor);
        if (v.isNull()) continue;
        cardEntries.push_back(
            metadataEntry(std::string("com.corvane.professionalplugin.skarn.") + row.keySuffix, Value(v.description())));
    }
    if (m.count() == 0) {
        _metadata = Value();
        return;
    }
    const Value& d0 = m[size_t(0)];
    const Value& identifications = d0["identifications"];
    const Value& materials = d0["materialPackages"];
    Array movie;
    auto append = [&](const Value& dictionary) {
        Value entries = SkarnUtilities_unpackageMetadataDictionary(dictionary);
        for (const Value& e : entries.arrayValue()) movie.push_back(e);
    };
    if (identifications.count() > 0) append(identifications[identifications.count() - 1]);
    if (materials.count() > 0) append(materials[size_t(0)]);
    for (Value& e : cardEntries) movie.push_back(std::move(e));

    Dictionary metadata;
    metadata.set("movie", Value(std::move(movie)));
    for (size_t i = 0; i < m.count(); ++i) {
        const Value& d = m[i];
        if (!d.isDictionary() || d.dictionary().empty()) continue;
        const Value& sources = d["sourcePackages"];
        // A file without a source package has nothing to say about its track.
        if (sources.count() == 0) continue;
        char key[32];
        std::snprintf(key, sizeof key, "track%zu", i);
        metadata.set(key, SkarnUtilities_unpackageMetadataDictionary(sources[sources.count() - 1]));
    }
    _metadata = Value(std::move(metadata));
}

Value SkarnClip::extendedProperties() {
    Array out;
    for (const ExtendedPropertyRow& row : kExtendedProperties) {
        Dictionary d;
        d.set("identifier", Value(row.identifier));
        d.set("name", Value(localized(row.label, "")));
        if (hasSuffix(row.identifier, "Date")) {
            d.set("formatter", Value(SkarnDateFormatter::shortDateFormatter()));
            d.set("NSLineBreakMode", Value(kLineBreakByTruncatingMiddle));
        }
        out.push_back(Value(std::move(d)));
    }
    return Value(std::move(out));
}

// ---------------------------------------------------------------------------
// Files

std::string SkarnClip::contentsFolder() const {
    return FileSystem::stringByDeletingLastPathComponent(FileSystem::stringByDeletingLastPathComponent(_clipXMLPath));
}

std::optional<std::string> SkarnClip::cardFile(const char* folder, const char* extension) const {
    auto dir = SkarnCardFolderCache::pathInFolder(folder, contentsFolder());
    if (!dir) return std::nullopt;
    return SkarnCardFolderCache::pathInFolder(
        FileSystem::stringByAppendingPathExtension(baseName(), extension), dir);
}

std::optional<std::string> SkarnClip::companionClipXMLPath() const { return cardFile("CLIP", "XML"); }

std::optional<std::string> SkarnClip::videoFilePath() const {
    if (_memo && _memo->videoFilePath) return *_memo->videoFilePath;
    auto path = cardFile(_isMXFOp1bFormat ? "AVCLIP" : "VIDEO", "MXF");
    if (_memo) _memo->videoFilePath = path;
    return path;
}

std::optional<std::string> SkarnClip::audioFolderPath() const {
    if (_isMXFOp1bFormat) return _clipXMLPath;
    return SkarnCardFolderCache::pathInFolder("AUDIO", contentsFolder());
}

std::optional<std::vector<std::string>> SkarnClip::audioFilePaths() {
    const uint32_t channels = numberOfAudioChannels();
    if (channels == 0) return std::nullopt;
    if (_isMXFOp1bFormat) return std::vector<std::string>{_clipXMLPath};
    std::vector<std::string> paths;
    auto folder = audioFolderPath();
    if (!folder) return paths;
    auto listing = SkarnCardFolderCache::listing(*folder);
    if (!listing) return paths;
    const std::string base = baseName();
    char suffix[16];
    if (channels <= listing->entries().size() + 100) {
        for (uint32_t i = 0; i < channels; ++i) {
            std::snprintf(suffix, sizeof suffix, "%.2u.MXF", i);
            if (const std::string* entry = listing->entryNamed(base + suffix))
                paths.push_back(FileSystem::stringByAppendingPathComponent(*folder, *entry));
        }
        return paths;
    }
    // More channels claimed than the folder could hold: each entry is tried as
    // a channel file instead, which finds the same files without a loop over
    // every channel a hostile count names.
    std::vector<std::pair<uint32_t, std::string>> found;
    for (const std::string& entry : listing->entries()) {
        if (entry.size() <= base.size() + 4) continue;
        const std::string digits = entry.substr(base.size(), entry.size() - base.size() - 4);
        if (digits.empty() || digits.size() > 10 || digits.find_first_not_of("0123456789") != std::string::npos)
            continue;
        const uint64_t channel = std::stoull(digits);
        if (channel >= channels) continue;
        std::snprintf(suffix, sizeof suffix, "%.2u.MXF", unsigned(channel));
        const std::string* first = listing->entryNamed(base + suffix);
        if (first == &entry) found.emplace_back(uint32_t(channel), entry);
    }
    std::sort(found.begin(), found.end());
    for (auto& [channel, entry] : found) paths.push_back(FileSystem::stringByAppendingPathComponent(*folder, entry));
    return paths;
}

std::optional<std::string> SkarnClip::iconFilePath() const { return cardFile("ICON", "BMP"); }

std::optional<std::string> SkarnClip::proxyFilePath() const {
    auto mp4 = cardFile("PROXY", "MP4");
    return mp4 ? mp4 : cardFile("PROXY", "MOV");
}

std::optional<std::string> SkarnClip::proxyBinFilePath() const { return cardFile("PROXY", "BIN"); }

std::optional<std::string> SkarnClip::voiceFilePath() const { return cardFile("VOICE", "WAV"); }

std::optional<std::string> SkarnClip::spannedClipID() const {
    return text("ClipContent/Relation/Connection/Top/GlobalClipID");
}
std::optional<std::string> SkarnClip::nextClipIDInSpannedClip() const {
    return text("ClipContent/Relation/Connection/Next/GlobalClipID");
}
std::optional<std::string> SkarnClip::previousClipIDInSpannedClip() const {
    return text("ClipContent/Relation/Connection/Previous/GlobalClipID");
}

std::vector<std::string> SkarnClip::clipURLs() {
    std::vector<std::string> urls;
    auto add = [&](const std::optional<std::string>& p) {
        if (p) urls.push_back(*p);
    };
    if (_isMXFOp1bFormat) add(companionClipXMLPath());
    else if (FileSystem::fileExists(_clipXMLPath)) urls.push_back(_clipXMLPath);
    add(videoFilePath());
    add(voiceFilePath());
    add(iconFilePath());
    add(proxyFilePath());
    add(proxyBinFilePath());
    if (auto audio = audioFilePaths())
        for (const std::string& p : *audio) urls.push_back(p);
    return urls;
}

Value SkarnClip::ingestSourceFiles() {
    Array mediaSet;
    if (auto video = videoFilePath()) mediaSet.push_back(Value(Dictionary{{"MediaSetPath", Value(*video)}}));
    if (auto audio = audioFilePaths())
        for (const std::string& p : *audio) mediaSet.push_back(Value(Dictionary{{"MediaSetPath", Value(p)}}));
    // Moved in, not listed in an initialiser: a list's elements are copied.
    Array outer;
    outer.push_back(Value(std::move(mediaSet)));
    return Value(std::move(outer));
}

namespace {
// The clip's own files are unlocked by the deletion itself before they are
// removed, so their lock does not count against them; everything else (the
// folder, and other clips' files) must pass the platform's test as it stands.
bool deletableOnceUnlocked(const std::string& path) {
    if (FileSystem::isDeletableFile(path)) return true;
    if (!FileSystem::isImmutable(path).value_or(false)) return false;
    std::string parent = FileSystem::stringByDeletingLastPathComponent(path);
    if (parent.empty()) parent = ".";
    return ::access(parent.c_str(), W_OK | X_OK) == 0 && !FileSystem::isImmutable(parent).value_or(false);
}
}  // namespace

bool SkarnClip::isDeletable() {
    // A file the clip does not have (no voice memo, no icon) is nil here and
    // passes: a clip without a voice memo must still be deletable.
    for (const std::optional<std::string>& p :
         {std::optional<std::string>(_clipXMLPath), videoFilePath(), voiceFilePath(), iconFilePath()}) {
        if (p && !deletableOnceUnlocked(*p)) return false;
    }
    // Deliberately every item of the audio folder, not only this clip's: a
    // locked file of another clip blocks the deletion. Items are tested at the
    // paths the walk finds them.
    auto folder = audioFolderPath();
    if (!folder || !FileSystem::isDirectory(*folder)) return true;
    const std::string base = baseName();
    bool ok = true;
    FileSystem::enumerate(*folder, false, [&](const std::string& relative, const std::string& full, bool) {
        const bool own = hasPrefix(relative, base);
        if (ok && !(own ? deletableOnceUnlocked(full) : FileSystem::isDeletableFile(full))) ok = false;
        return ok;
    });
    return ok;
}

bool SkarnClip::deleteClip() {
    if (!isDeletable()) return false;
    const std::vector<std::optional<std::string>> files = {_clipXMLPath, videoFilePath(), voiceFilePath(),
                                                           iconFilePath()};
    for (const auto& p : files)
        if (!SkarnUtilities_DeleteFileAtPathIfExists(p)) return false;
    auto folder = audioFolderPath();
    if (!folder || !FileSystem::isDirectory(*folder)) return true;
    // The proxies stay on the card, and so does an AVCLIP clip's companion XML.
    const std::string base = baseName();
    std::vector<std::string> doomed;
    FileSystem::enumerate(*folder, false, [&](const std::string& relative, const std::string& full, bool) {
        if (hasPrefix(relative, base)) {
            doomed.push_back(full);
            return false;  // the whole item goes; nothing below it to visit
        }
        return true;
    });
    for (const std::string& p : doomed)
        if (!SkarnUtilities_DeleteFileAtPathIfExists(p)) return false;
    return true;
}

Ref<VestaKilnIngestObject> SkarnClip::ingestObject() { return _ingestObject; }

Ref<Image> SkarnClip::posterFrame() {
    auto icon = iconFilePath();
    return icon ? Image::imageWithContentsOfFile(*icon) : nullptr;
}
