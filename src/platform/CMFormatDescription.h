// Format descriptions: what kind of media a track or sample buffer holds.
//
// One class serves every kind (video, audio, timecode) where the frameworks
// have a family of opaque types; the aliases below keep the kinds' names.
// A description is immutable once made, so pointers it answers (the stream
// description, the channel layout, extension values) stay valid while it lives
// and may be read from any thread.
//
// Extensions are a Dictionary with the frameworks' key strings, so that hosts
// reading them by key (the pixel aspect ratio, field and clean-aperture
// entries that the format reader builds, the avcC record) find them where they
// expect. H.264 descriptions are made from parameter sets as the frameworks do:
// the sequence parameter set is parsed (bounded, never read past its end) for
// the dimensions, and the avcC record is stored among the extension atoms.
#pragma once

#include "CFBase.h"
#include "CMTime.h"
#include "CoreAudioTypes.h"
#include "Object.h"
#include "Value.h"

#include <optional>
#include <span>
#include <vector>

using CMMediaType = FourCharCode;
using CMVideoCodecType = FourCharCode;
using CMTimeCodeFormatType = FourCharCode;

enum : CMMediaType {
    kCMMediaType_Video = FourCC("vide"),
    kCMMediaType_Audio = FourCC("soun"),
    kCMMediaType_Muxed = FourCC("muxx"),
    kCMMediaType_Text = FourCC("text"),
    kCMMediaType_ClosedCaption = FourCC("clcp"),
    kCMMediaType_Subtitle = FourCC("sbtl"),
    kCMMediaType_TimeCode = FourCC("tmcd"),
    kCMMediaType_Metadata = FourCC("meta"),
};

// The frameworks' names for the codecs a card can carry. The AVC-Intra and
// long-GOP H.264 variants have no framework names; their codes live with the
// clip, which chooses them.
enum : CMVideoCodecType {
    kCMVideoCodecType_H264 = FourCC("avc1"),
    kCMVideoCodecType_DVCNTSC = FourCC("dvc "),
    kCMVideoCodecType_DVCPAL = FourCC("dvcp"),
    kCMVideoCodecType_DVCProPAL = FourCC("dvpp"),
    kCMVideoCodecType_DVCPro50NTSC = FourCC("dv5n"),
    kCMVideoCodecType_DVCPro50PAL = FourCC("dv5p"),
    kCMVideoCodecType_DVCPROHD720p60 = FourCC("dvhp"),
    kCMVideoCodecType_DVCPROHD720p50 = FourCC("dvhq"),
    kCMVideoCodecType_DVCPROHD1080i60 = FourCC("dvh6"),
    kCMVideoCodecType_DVCPROHD1080i50 = FourCC("dvh5"),
    kCMVideoCodecType_DVCPROHD1080p30 = FourCC("dvh3"),
    kCMVideoCodecType_DVCPROHD1080p25 = FourCC("dvh2"),
};

enum : CMTimeCodeFormatType {
    kCMTimeCodeFormatType_TimeCode32 = FourCC("tmcd"),
    kCMTimeCodeFormatType_TimeCode64 = FourCC("tc64"),
    kCMTimeCodeFormatType_Counter32 = FourCC("cn32"),
    kCMTimeCodeFormatType_Counter64 = FourCC("cn64"),
};

enum : uint32_t {
    kCMTimeCodeFlag_DropFrame = 1u << 0,
    kCMTimeCodeFlag_24HourMax = 1u << 1,
    kCMTimeCodeFlag_NegTimesOK = 1u << 2,
};

enum : OSStatus {
    kCMFormatDescriptionError_InvalidParameter = -12710,
    kCMFormatDescriptionError_AllocationFailed = -12711,
    kCMFormatDescriptionError_ValueNotAvailable = -12718,
};

// Extension keys and values, with the frameworks' strings (several are the
// image-buffer attachment names, hence the "CV" prefix in the text).
inline constexpr const char* kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms =
    "SampleDescriptionExtensionAtoms";
inline constexpr const char* kCMFormatDescriptionExtension_FormatName = "FormatName";
inline constexpr const char* kCMFormatDescriptionExtension_Depth = "Depth";
inline constexpr const char* kCMFormatDescriptionExtension_Version = "Version";
inline constexpr const char* kCMFormatDescriptionExtension_RevisionLevel = "RevisionLevel";
inline constexpr const char* kCMFormatDescriptionExtension_Vendor = "Vendor";
inline constexpr const char* kCMFormatDescriptionExtension_TemporalQuality = "TemporalQuality";
inline constexpr const char* kCMFormatDescriptionExtension_SpatialQuality = "SpatialQuality";
inline constexpr const char* kCMFormatDescriptionExtension_FullRangeVideo = "FullRangeVideo";
inline constexpr const char* kCMFormatDescriptionExtension_FieldCount = "CVFieldCount";
inline constexpr const char* kCMFormatDescriptionExtension_FieldDetail = "CVFieldDetail";
inline constexpr const char* kCMFormatDescriptionFieldDetail_TemporalTopFirst = "TemporalTopFirst";
inline constexpr const char* kCMFormatDescriptionFieldDetail_TemporalBottomFirst = "TemporalBottomFirst";
inline constexpr const char* kCMFormatDescriptionFieldDetail_SpatialFirstLineEarly = "SpatialFirstLineEarly";
inline constexpr const char* kCMFormatDescriptionFieldDetail_SpatialFirstLineLate = "SpatialFirstLineLate";
inline constexpr const char* kCMFormatDescriptionExtension_PixelAspectRatio = "CVPixelAspectRatio";
inline constexpr const char* kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing = "HorizontalSpacing";
inline constexpr const char* kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing = "VerticalSpacing";
inline constexpr const char* kCMFormatDescriptionExtension_CleanAperture = "CVCleanAperture";
inline constexpr const char* kCMFormatDescriptionKey_CleanApertureWidth = "Width";
inline constexpr const char* kCMFormatDescriptionKey_CleanApertureHeight = "Height";
inline constexpr const char* kCMFormatDescriptionKey_CleanApertureHorizontalOffset = "HorizontalOffset";
inline constexpr const char* kCMFormatDescriptionKey_CleanApertureVerticalOffset = "VerticalOffset";

struct CMVideoDimensions {
    int32_t width;
    int32_t height;
};

class CMFormatDescription : public Object {
public:
    // Media type, subtype, the kind's own data and the extensions, on one line.
    std::string description() const override;

    CMMediaType mediaType() const { return _mediaType; }
    FourCharCode mediaSubType() const { return _mediaSubType; }
    const Dictionary& extensions() const { return _extensions; }
    // Same kind, subtype, kind data and extensions.
    bool isEqual(const CMFormatDescription& other) const;

    // Video.
    CMVideoDimensions dimensions() const { return _dimensions; }
    // Audio: nullptr for other kinds; the layout and cookie are empty when absent.
    const AudioStreamBasicDescription* streamBasicDescription() const { return _asbd ? &*_asbd : nullptr; }
    std::span<const uint8_t> channelLayoutBytes() const { return _channelLayout; }
    std::span<const uint8_t> magicCookie() const { return _magicCookie; }
    // Timecode.
    CMTime frameDuration() const { return _frameDuration; }
    uint32_t frameQuanta() const { return _frameQuanta; }
    uint32_t timeCodeFlags() const { return _timeCodeFlags; }

private:
    CMFormatDescription(CMMediaType mediaType, FourCharCode mediaSubType, const Dictionary* extensions)
        : _mediaType(mediaType), _mediaSubType(mediaSubType), _extensions(extensions ? *extensions : Dictionary()) {}
    friend class CMFormatDescriptionFactory;

    CMMediaType _mediaType;
    FourCharCode _mediaSubType;
    Dictionary _extensions;
    CMVideoDimensions _dimensions{0, 0};
    std::optional<AudioStreamBasicDescription> _asbd;
    std::vector<uint8_t> _channelLayout;
    std::vector<uint8_t> _magicCookie;
    CMTime _frameDuration = kCMTimeInvalid;
    uint32_t _frameQuanta = 0;
    uint32_t _timeCodeFlags = 0;
};

using CMFormatDescriptionRef = Ref<CMFormatDescription>;
using CMVideoFormatDescriptionRef = CMFormatDescriptionRef;
using CMAudioFormatDescriptionRef = CMFormatDescriptionRef;
using CMTimeCodeFormatDescriptionRef = CMFormatDescriptionRef;

// Every call accepts a null description: getters answer 0, null or an empty
// result; creators answer kCMFormatDescriptionError_InvalidParameter.
CMMediaType CMFormatDescriptionGetMediaType(const CMFormatDescriptionRef& desc);
FourCharCode CMFormatDescriptionGetMediaSubType(const CMFormatDescriptionRef& desc);
// nullptr when the description has no extensions.
const Dictionary* CMFormatDescriptionGetExtensions(const CMFormatDescriptionRef& desc);
// A Null value when absent.
const Value& CMFormatDescriptionGetExtension(const CMFormatDescriptionRef& desc, const std::string& extensionKey);
// False when either is null.
Boolean CMFormatDescriptionEqual(const CMFormatDescriptionRef& desc1, const CMFormatDescriptionRef& desc2);

// Negative dimensions are refused; 0 x 0 stands for "not known".
OSStatus CMVideoFormatDescriptionCreate(CFAllocatorRef allocator, CMVideoCodecType codecType, int32_t width,
                                        int32_t height, const Dictionary* extensions,
                                        CMVideoFormatDescriptionRef* formatDescriptionOut);
// {0, 0} for anything but a video description.
CMVideoDimensions CMVideoFormatDescriptionGetDimensions(const CMVideoFormatDescriptionRef& videoDesc);

// An 'avc1' description from at least one sequence (NAL type 7) and one picture
// (type 8) parameter set, in any order, each given without its start code.
// The first sequence parameter set gives the dimensions (cropped), the field
// count, the pixel aspect ratio and the video range; all sets go into the avcC
// record with the NAL length size (1, 2 or 4). Anything malformed answers
// kCMFormatDescriptionError_InvalidParameter.
OSStatus CMVideoFormatDescriptionCreateFromH264ParameterSets(CFAllocatorRef allocator, size_t parameterSetCount,
                                                             const uint8_t* const* parameterSetPointers,
                                                             const size_t* parameterSetSizes,
                                                             int NALUnitHeaderLength,
                                                             CMFormatDescriptionRef* formatDescriptionOut);
// Reads the description's avcC record: sequence parameter sets first, then
// picture parameter sets. Any out pointer may be null; an index past the end
// still answers the count and NAL length size, with
// kCMFormatDescriptionError_InvalidParameter. A description without an avcC
// record answers kCMFormatDescriptionError_InvalidParameter.
OSStatus CMVideoFormatDescriptionGetH264ParameterSetAtIndex(const CMFormatDescriptionRef& videoDesc,
                                                            size_t parameterSetIndex,
                                                            const uint8_t** parameterSetPointerOut,
                                                            size_t* parameterSetSizeOut,
                                                            size_t* parameterSetCountOut,
                                                            int* NALUnitHeaderLengthOut);

// The stream description is copied and must describe at least one channel at a
// positive sample rate; linear PCM must also be one frame per packet with its
// bits fitting the frame. A layout (layoutSize bytes, at least what its
// declared descriptions take) must describe as many channels as the stream;
// the layout and cookie bytes are copied. The media subtype is mFormatID.
OSStatus CMAudioFormatDescriptionCreate(CFAllocatorRef allocator, const AudioStreamBasicDescription* asbd,
                                        size_t layoutSize, const AudioChannelLayout* layout, size_t magicCookieSize,
                                        const void* magicCookie, const Dictionary* extensions,
                                        CMAudioFormatDescriptionRef* formatDescriptionOut);
// nullptr for anything but an audio description.
const AudioStreamBasicDescription* CMAudioFormatDescriptionGetStreamBasicDescription(
    const CMAudioFormatDescriptionRef& desc);
// nullptr (and a size of 0) when the description has no layout.
const AudioChannelLayout* CMAudioFormatDescriptionGetChannelLayout(const CMAudioFormatDescriptionRef& desc,
                                                                   size_t* sizeOut);
const void* CMAudioFormatDescriptionGetMagicCookie(const CMAudioFormatDescriptionRef& desc, size_t* sizeOut);

// The format type must be one of the four timecode types. The frame duration
// is kept as given: a track whose rate is unknown still gets a description.
OSStatus CMTimeCodeFormatDescriptionCreate(CFAllocatorRef allocator, CMTimeCodeFormatType timeCodeFormatType,
                                           CMTime frameDuration, uint32_t frameQuanta, uint32_t flags,
                                           const Dictionary* extensions,
                                           CMTimeCodeFormatDescriptionRef* formatDescriptionOut);
// kCMTimeInvalid / 0 for anything but a timecode description.
CMTime CMTimeCodeFormatDescriptionGetFrameDuration(const CMTimeCodeFormatDescriptionRef& timeCodeFormatDescription);
uint32_t CMTimeCodeFormatDescriptionGetFrameQuanta(const CMTimeCodeFormatDescriptionRef& timeCodeFormatDescription);
uint32_t CMTimeCodeFormatDescriptionGetTimeCodeFlags(const CMTimeCodeFormatDescriptionRef& desc);
