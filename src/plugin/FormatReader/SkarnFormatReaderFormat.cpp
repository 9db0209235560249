// The video track's format description: codec type, encoded size and the
// picture extensions, per codec family.
#include "FileSystem.h"
#include "SkarnClip.h"
#include "SkarnFormatReader.h"
#include "SkarnFormatReaderInternal.h"
#include "SkarnLog.h"

#include <algorithm>

namespace SkarnFormatReaderDetail {

namespace {

const FrameRateRow kFrameRates[] = {
    {"23.98", 0, 1001, 24000, 24, true},
    {"24", 0, 100, 2400, 24, true},
    {"25", 0, 100, 2500, 25, true},
    {"29.97", 0, 1001, 30000, 30, true},
    {"50", 'i', 100, 2500, 25, false},
    {"59.94", 'i', 1001, 30000, 30, false},
    {"50", 'p', 100, 5000, 50, false},
    {"60", 0, 100, 6000, 60, false},
    {"59.94", 'p', 1001, 60000, 60, false},
};

enum class Fields { Progressive, TopFirst, BottomFirst };

struct CodecRow {
    FourCharCode codec;
    int32_t width, height;
    // Pixel aspect ratio of the 4:3 picture, and of the 16:9 one where the
    // same raster carries both (standard definition).
    int32_t parH, parV, wideParH, wideParV;
    Fields fields;
    int32_t cleanWidth, cleanHeight;
};

// Standard definition DV is bottom field first; the HD rasters are top
// field first, and 720p DVCPRO HD is progressive at 960 of its 1280 pixels.
const CodecRow kCodecs[] = {
    {FourCC("dvc "), 720, 480, 10, 11, 40, 33, Fields::BottomFirst, 704, 480},
    {FourCC("dv5n"), 720, 480, 10, 11, 40, 33, Fields::BottomFirst, 704, 480},
    {FourCC("dvcp"), 720, 576, 59, 54, 118, 81, Fields::BottomFirst, 704, 576},
    {FourCC("dvpp"), 720, 576, 59, 54, 118, 81, Fields::BottomFirst, 704, 576},
    {FourCC("dv5p"), 720, 576, 59, 54, 118, 81, Fields::BottomFirst, 704, 576},
    {FourCC("dvhp"), 960, 720, 4, 3, 4, 3, Fields::Progressive, 960, 720},
    {FourCC("dvhq"), 960, 720, 4, 3, 4, 3, Fields::Progressive, 960, 720},
    {FourCC("dvh6"), 1280, 1080, 3, 2, 3, 2, Fields::TopFirst, 1280, 1080},
    {FourCC("dvh5"), 1440, 1080, 4, 3, 4, 3, Fields::TopFirst, 1440, 1080},
};

bool isAVCIntraCode(FourCharCode code) {
    // 'ai' + class digit (1 for 100, 2 for 200, 5 for 50) + raster letter or digit.
    return (code >> 16) == ((FourCharCode('a') << 8) | 'i') && ((code >> 8) & 0xff) != 0;
}

std::optional<int64_t> integerAt(SkarnClip* clip, const char* xpath) {
    auto text = clip->stringFromClipDescriptionForXPath(xpath);
    if (!text || text->empty()) return std::nullopt;
    int64_t v = stringIntegerValue(*text);
    if (v <= 0 || v > 16384) return std::nullopt;
    return v;
}

Dictionary pixelAspect(int32_t h, int32_t v) {
    Dictionary d;
    d.set(kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing, h);
    d.set(kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing, v);
    return d;
}

Dictionary cleanAperture(double width, double height) {
    Dictionary d;
    d.set(kCMFormatDescriptionKey_CleanApertureWidth, width);
    d.set(kCMFormatDescriptionKey_CleanApertureHeight, height);
    d.set(kCMFormatDescriptionKey_CleanApertureHorizontalOffset, 0.0);
    d.set(kCMFormatDescriptionKey_CleanApertureVerticalOffset, 0.0);
    return d;
}

void setFields(Dictionary& extensions, Fields fields) {
    extensions.set(kCMFormatDescriptionExtension_FieldCount, fields == Fields::Progressive ? 1 : 2);
    if (fields == Fields::TopFirst)
        extensions.set(kCMFormatDescriptionExtension_FieldDetail, kCMFormatDescriptionFieldDetail_TemporalTopFirst);
    else if (fields == Fields::BottomFirst)
        extensions.set(kCMFormatDescriptionExtension_FieldDetail, kCMFormatDescriptionFieldDetail_TemporalBottomFirst);
}

}  // namespace

const FrameRateRow* frameRateRowForText(const std::string& text) {
    for (const FrameRateRow& row : kFrameRates) {
        if (!FileSystem::hasPrefix(text, row.prefix)) continue;
        if (row.suffix && (text.empty() || text.back() != row.suffix)) continue;
        return &row;
    }
    return nullptr;
}

int64_t regularFileSize(const std::optional<std::string>& path) {
    if (!path) return 0;
    auto size = FileSystem::fileSize(*path);
    return size ? int64_t(std::min<uint64_t>(*size, INT64_MAX)) : 0;
}

FormatDescriptionChoice chooseVideoFormatDescription(SkarnFormatReader* reader, SkarnClip* clip,
                                                     SkarnTrackReader* video,
                                                     const std::optional<std::string>& frameRateText) {
    FormatDescriptionChoice choice;
    FourCharCode codec = video->codec();
    choice.codecType = codec;
    bool interlaced = frameRateText && !frameRateText->empty() && frameRateText->back() == 'i';
    std::optional<int64_t> activeLine = integerAt(clip, "ClipContent/EssenceList/Video/ActiveLine");
    std::optional<int64_t> activePixel = integerAt(clip, "ClipContent/EssenceList/Video/ActivePixel");
    int32_t format = clip->videoFormat();

    const CodecRow* row = nullptr;
    for (const CodecRow& r : kCodecs)
        if (r.codec == codec) row = &r;

    if (row) {
        choice.width = row->width;
        choice.height = row->height;
        bool wide = video->anamorphic();
        choice.extensions.set(kCMFormatDescriptionExtension_PixelAspectRatio,
                              wide ? pixelAspect(row->wideParH, row->wideParV) : pixelAspect(row->parH, row->parV));
        setFields(choice.extensions, row->fields);
        choice.extensions.set(kCMFormatDescriptionExtension_CleanAperture,
                              cleanAperture(row->cleanWidth, row->cleanHeight));
    } else if (isAVCIntraCode(codec) || codec == FourCC("avc1") || codec == FourCC("avlg")) {
        // AVC-Intra 50 codes its HD rasters horizontally squeezed by 3:4;
        // AVC-Intra 100 and 200, 2K, 4K and long GOP code every pixel.
        bool classFifty = isAVCIntraCode(codec) && ((codec >> 8) & 0xff) == '5';
        bool progressiveGroup = (format >= 15 && format <= 24) || format == 11 || format == 12;
        bool is720 = format >= 15 && format <= 19;
        int32_t height = is720 ? 720 : 1080;
        int32_t width = is720 ? 1280 : 1920;
        if (codec == FourCC("ai42") || codec == FourCC("ai44") || codec == FourCC("avc1") || codec == FourCC("avlg")) {
            if (activeLine) height = int32_t(*activeLine);
            if (activePixel) width = int32_t(*activePixel);
        }
        int32_t parH = 1, parV = 1;
        if (classFifty) {
            width = width * 3 / 4;
            parH = 4;
            parV = 3;
        }
        choice.width = width;
        choice.height = height;
        choice.extensions.set(kCMFormatDescriptionExtension_PixelAspectRatio, pixelAspect(parH, parV));
        setFields(choice.extensions, progressiveGroup || !interlaced ? Fields::Progressive : Fields::TopFirst);
        choice.extensions.set(kCMFormatDescriptionExtension_CleanAperture, cleanAperture(width, height));
    } else {
        SkarnLog(2, "Unknown codec. Format description will be most lilely incorrect.");
        choice.width = activePixel ? int32_t(*activePixel) : int32_t(clip->videoWidth());
        choice.height = activeLine ? int32_t(*activeLine) : int32_t(clip->videoHeight());
        setFields(choice.extensions, interlaced ? Fields::TopFirst : Fields::Progressive);
    }
    if (choice.width <= 0 || choice.height <= 0) {
        SkarnLog(2, "Unknown width and height (%lu x %lu)", uint64_t(std::max(choice.width, 0)),
                 uint64_t(std::max(choice.height, 0)));
        choice.width = choice.height = 0;
    }
    (void)reader;
    return choice;
}

}  // namespace SkarnFormatReaderDetail
