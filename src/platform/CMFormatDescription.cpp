#include "CMFormatDescription.h"

#include <bit>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <new>

class CMFormatDescriptionFactory {
public:
    static CMFormatDescriptionRef make(CMMediaType mediaType, FourCharCode mediaSubType, const Dictionary* extensions) {
        try {
            return CMFormatDescriptionRef(new CMFormatDescription(mediaType, mediaSubType, extensions));
        } catch (const std::bad_alloc&) {
            return nullptr;
        }
    }
    static CMVideoDimensions& dimensions(CMFormatDescription& d) { return d._dimensions; }
    static std::optional<AudioStreamBasicDescription>& asbd(CMFormatDescription& d) { return d._asbd; }
    static std::vector<uint8_t>& channelLayout(CMFormatDescription& d) { return d._channelLayout; }
    static std::vector<uint8_t>& magicCookie(CMFormatDescription& d) { return d._magicCookie; }
    static void setTimeCode(CMFormatDescription& d, CMTime frameDuration, uint32_t frameQuanta, uint32_t flags) {
        d._frameDuration = frameDuration;
        d._frameQuanta = frameQuanta;
        d._timeCodeFlags = flags;
    }
};

namespace {

const Value kNullValue;

bool sameTime(CMTime a, CMTime b) {
    return a.value == b.value && a.timescale == b.timescale && a.flags == b.flags && a.epoch == b.epoch;
}

bool sameASBD(const std::optional<AudioStreamBasicDescription>& a,
              const std::optional<AudioStreamBasicDescription>& b) {
    if (!a || !b) return !a && !b;
    return std::memcmp(&*a, &*b, sizeof(AudioStreamBasicDescription)) == 0;
}

// Channels the layout names, or nullopt when its tag does not say.
std::optional<UInt32> layoutChannelCount(const AudioChannelLayout& layout) {
    switch (layout.mChannelLayoutTag) {
    case kAudioChannelLayoutTag_UseChannelDescriptions: return layout.mNumberChannelDescriptions;
    case kAudioChannelLayoutTag_UseChannelBitmap: return UInt32(std::popcount(layout.mChannelBitmap));
    default: {
        UInt32 n = AudioChannelLayoutTag_GetNumberOfChannels(layout.mChannelLayoutTag);
        return n ? std::optional<UInt32>(n) : std::nullopt;
    }
    }
}

bool plausibleLinearPCM(const AudioStreamBasicDescription& asbd) {
    if (asbd.mFramesPerPacket != 1 || asbd.mBytesPerFrame == 0 || asbd.mBytesPerPacket != asbd.mBytesPerFrame)
        return false;
    if (asbd.mBitsPerChannel == 0) return false;
    uint64_t channelsPerBuffer = (asbd.mFormatFlags & kAudioFormatFlagIsNonInterleaved) ? 1 : asbd.mChannelsPerFrame;
    return uint64_t(asbd.mBitsPerChannel) * channelsPerBuffer <= uint64_t(asbd.mBytesPerFrame) * 8;
}

}  // namespace

bool CMFormatDescription::isEqual(const CMFormatDescription& o) const {
    return _mediaType == o._mediaType && _mediaSubType == o._mediaSubType && _extensions == o._extensions &&
           _dimensions.width == o._dimensions.width && _dimensions.height == o._dimensions.height &&
           sameASBD(_asbd, o._asbd) && _channelLayout == o._channelLayout && _magicCookie == o._magicCookie &&
           sameTime(_frameDuration, o._frameDuration) && _frameQuanta == o._frameQuanta &&
           _timeCodeFlags == o._timeCodeFlags;
}

std::string CMFormatDescription::description() const {
    char buf[320];
    std::snprintf(buf, sizeof buf, "<CMFormatDescription %p>{mediaType:%s mediaSubType:%s",
                  static_cast<const void*>(this), FourCCDescription(_mediaType).c_str(),
                  FourCCDescription(_mediaSubType).c_str());
    std::string s = buf;
    switch (_mediaType) {
    case kCMMediaType_Video:
        std::snprintf(buf, sizeof buf, " dimensions:%d x %d", _dimensions.width, _dimensions.height);
        s += buf;
        break;
    case kCMMediaType_Audio:
        if (_asbd) {
            std::snprintf(buf, sizeof buf,
                          " ASBD:{sampleRate:%g formatID:%s flags:0x%x bytesPerPacket:%u framesPerPacket:%u "
                          "bytesPerFrame:%u channelsPerFrame:%u bitsPerChannel:%u} layout:%zu bytes cookie:%zu bytes",
                          _asbd->mSampleRate, FourCCDescription(_asbd->mFormatID).c_str(), _asbd->mFormatFlags,
                          _asbd->mBytesPerPacket, _asbd->mFramesPerPacket, _asbd->mBytesPerFrame,
                          _asbd->mChannelsPerFrame, _asbd->mBitsPerChannel, _channelLayout.size(), _magicCookie.size());
            s += buf;
        }
        break;
    case kCMMediaType_TimeCode:
        s += " frameDuration:" + CMTimeCopyDescription(_frameDuration);
        std::snprintf(buf, sizeof buf, " frameQuanta:%u flags:0x%x", _frameQuanta, _timeCodeFlags);
        s += buf;
        break;
    default: break;
    }
    if (!_extensions.empty()) s += " extensions:" + Value(_extensions).description();
    return s + "}";
}

CMMediaType CMFormatDescriptionGetMediaType(const CMFormatDescriptionRef& desc) { return desc ? desc->mediaType() : 0; }

FourCharCode CMFormatDescriptionGetMediaSubType(const CMFormatDescriptionRef& desc) {
    return desc ? desc->mediaSubType() : 0;
}

const Dictionary* CMFormatDescriptionGetExtensions(const CMFormatDescriptionRef& desc) {
    return desc && !desc->extensions().empty() ? &desc->extensions() : nullptr;
}

const Value& CMFormatDescriptionGetExtension(const CMFormatDescriptionRef& desc, const std::string& extensionKey) {
    if (!desc) return kNullValue;
    const Value* v = desc->extensions().find(extensionKey);
    return v ? *v : kNullValue;
}

Boolean CMFormatDescriptionEqual(const CMFormatDescriptionRef& desc1, const CMFormatDescriptionRef& desc2) {
    if (!desc1 || !desc2) return false;
    return desc1 == desc2 || desc1->isEqual(*desc2);
}

OSStatus CMVideoFormatDescriptionCreate(CFAllocatorRef, CMVideoCodecType codecType, int32_t width, int32_t height,
                                        const Dictionary* extensions,
                                        CMVideoFormatDescriptionRef* formatDescriptionOut) {
    if (!formatDescriptionOut) return kCMFormatDescriptionError_InvalidParameter;
    *formatDescriptionOut = nullptr;
    if (width < 0 || height < 0) return kCMFormatDescriptionError_InvalidParameter;
    auto desc = CMFormatDescriptionFactory::make(kCMMediaType_Video, codecType, extensions);
    if (!desc) return kCMFormatDescriptionError_AllocationFailed;
    CMFormatDescriptionFactory::dimensions(*desc) = {width, height};
    *formatDescriptionOut = std::move(desc);
    return noErr;
}

CMVideoDimensions CMVideoFormatDescriptionGetDimensions(const CMVideoFormatDescriptionRef& videoDesc) {
    if (!videoDesc || videoDesc->mediaType() != kCMMediaType_Video) return {0, 0};
    return videoDesc->dimensions();
}

OSStatus CMAudioFormatDescriptionCreate(CFAllocatorRef, const AudioStreamBasicDescription* asbd, size_t layoutSize,
                                        const AudioChannelLayout* layout, size_t magicCookieSize,
                                        const void* magicCookie, const Dictionary* extensions,
                                        CMAudioFormatDescriptionRef* formatDescriptionOut) {
    if (!formatDescriptionOut) return kCMFormatDescriptionError_InvalidParameter;
    *formatDescriptionOut = nullptr;
    if (!asbd || !(asbd->mSampleRate > 0) || !std::isfinite(asbd->mSampleRate) || asbd->mChannelsPerFrame == 0)
        return kCMFormatDescriptionError_InvalidParameter;
    if (asbd->mFormatID == kAudioFormatLinearPCM && !plausibleLinearPCM(*asbd))
        return kCMFormatDescriptionError_InvalidParameter;
    if ((layoutSize > 0) != (layout != nullptr)) return kCMFormatDescriptionError_InvalidParameter;
    if (layout) {
        if (layoutSize < AudioChannelLayoutByteSize(0) ||
            layoutSize < AudioChannelLayoutByteSize(layout->mNumberChannelDescriptions))
            return kCMFormatDescriptionError_InvalidParameter;
        auto channels = layoutChannelCount(*layout);
        if (channels && *channels != asbd->mChannelsPerFrame) return kCMFormatDescriptionError_InvalidParameter;
    }
    if (magicCookieSize > 0 && !magicCookie) return kCMFormatDescriptionError_InvalidParameter;

    auto desc = CMFormatDescriptionFactory::make(kCMMediaType_Audio, asbd->mFormatID, extensions);
    if (!desc) return kCMFormatDescriptionError_AllocationFailed;
    try {
        CMFormatDescriptionFactory::asbd(*desc) = *asbd;
        if (layout) {
            auto* bytes = reinterpret_cast<const uint8_t*>(layout);
            CMFormatDescriptionFactory::channelLayout(*desc).assign(bytes, bytes + layoutSize);
        }
        if (magicCookieSize > 0) {
            auto* bytes = static_cast<const uint8_t*>(magicCookie);
            CMFormatDescriptionFactory::magicCookie(*desc).assign(bytes, bytes + magicCookieSize);
        }
    } catch (const std::bad_alloc&) {
        return kCMFormatDescriptionError_AllocationFailed;
    }
    *formatDescriptionOut = std::move(desc);
    return noErr;
}

const AudioStreamBasicDescription* CMAudioFormatDescriptionGetStreamBasicDescription(
    const CMAudioFormatDescriptionRef& desc) {
    return desc ? desc->streamBasicDescription() : nullptr;
}

const AudioChannelLayout* CMAudioFormatDescriptionGetChannelLayout(const CMAudioFormatDescriptionRef& desc,
                                                                   size_t* sizeOut) {
    auto bytes = desc ? desc->channelLayoutBytes() : std::span<const uint8_t>();
    if (sizeOut) *sizeOut = bytes.size();
    return bytes.empty() ? nullptr : reinterpret_cast<const AudioChannelLayout*>(bytes.data());
}

const void* CMAudioFormatDescriptionGetMagicCookie(const CMAudioFormatDescriptionRef& desc, size_t* sizeOut) {
    auto bytes = desc ? desc->magicCookie() : std::span<const uint8_t>();
    if (sizeOut) *sizeOut = bytes.size();
    return bytes.empty() ? nullptr : bytes.data();
}

OSStatus CMTimeCodeFormatDescriptionCreate(CFAllocatorRef, CMTimeCodeFormatType timeCodeFormatType,
                                           CMTime frameDuration, uint32_t frameQuanta, uint32_t flags,
                                           const Dictionary* extensions,
                                           CMTimeCodeFormatDescriptionRef* formatDescriptionOut) {
    if (!formatDescriptionOut) return kCMFormatDescriptionError_InvalidParameter;
    *formatDescriptionOut = nullptr;
    switch (timeCodeFormatType) {
    case kCMTimeCodeFormatType_TimeCode32:
    case kCMTimeCodeFormatType_TimeCode64:
    case kCMTimeCodeFormatType_Counter32:
    case kCMTimeCodeFormatType_Counter64: break;
    default: return kCMFormatDescriptionError_InvalidParameter;
    }
    auto desc = CMFormatDescriptionFactory::make(kCMMediaType_TimeCode, timeCodeFormatType, extensions);
    if (!desc) return kCMFormatDescriptionError_AllocationFailed;
    CMFormatDescriptionFactory::setTimeCode(*desc, frameDuration, frameQuanta, flags);
    *formatDescriptionOut = std::move(desc);
    return noErr;
}

CMTime CMTimeCodeFormatDescriptionGetFrameDuration(const CMTimeCodeFormatDescriptionRef& timeCodeFormatDescription) {
    if (!timeCodeFormatDescription || timeCodeFormatDescription->mediaType() != kCMMediaType_TimeCode)
        return kCMTimeInvalid;
    return timeCodeFormatDescription->frameDuration();
}

uint32_t CMTimeCodeFormatDescriptionGetFrameQuanta(const CMTimeCodeFormatDescriptionRef& timeCodeFormatDescription) {
    if (!timeCodeFormatDescription || timeCodeFormatDescription->mediaType() != kCMMediaType_TimeCode) return 0;
    return timeCodeFormatDescription->frameQuanta();
}

uint32_t CMTimeCodeFormatDescriptionGetTimeCodeFlags(const CMTimeCodeFormatDescriptionRef& desc) {
    if (!desc || desc->mediaType() != kCMMediaType_TimeCode) return 0;
    return desc->timeCodeFlags();
}
