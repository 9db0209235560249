#include "CMFormatDescriptionBridge.h"

#include "ByteReader.h"
#include "CFData.h"

#include <bit>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <new>
#include <optional>
#include <string_view>
#include <vector>

namespace {

constexpr size_t kHeaderSize = sizeof(ImageDescription);
constexpr int32_t kResolution72dpi = 72 << 16;
constexpr int16_t kDefaultDepth = 24;
constexpr size_t kMaxNameBytes = 31;

// QuickTime 'fiel' detail codes for two-field frames.
struct FieldDetailCode {
    const char* detail;
    uint8_t code;
};
constexpr FieldDetailCode kFieldDetailCodes[] = {
    {kCMFormatDescriptionFieldDetail_TemporalTopFirst, 1},
    {kCMFormatDescriptionFieldDetail_TemporalBottomFirst, 6},
    {kCMFormatDescriptionFieldDetail_SpatialFirstLineEarly, 9},
    {kCMFormatDescriptionFieldDetail_SpatialFirstLineLate, 14},
};

struct Rational {
    int32_t numerator;
    uint32_t denominator;
};

// Extension numbers may be doubles (a half-line clean-aperture offset); atoms
// want 32-bit fractions. The continued-fraction convergents give the closest
// fraction whose terms still fit.
std::optional<Rational> rationalFor(double v) {
    if (!std::isfinite(v) || std::fabs(v) > double(std::numeric_limits<int32_t>::max())) return std::nullopt;
    double x = std::fabs(v);
    int64_t h0 = 0, h1 = 1, k0 = 1, k1 = 0;
    for (int i = 0; i < 40; ++i) {
        double a = std::floor(x);
        if (a > double(std::numeric_limits<int32_t>::max())) break;
        int64_t h2 = int64_t(a) * h1 + h0, k2 = int64_t(a) * k1 + k0;
        if (h2 > std::numeric_limits<int32_t>::max() || k2 > int64_t(std::numeric_limits<int32_t>::max())) break;
        h0 = h1, h1 = h2, k0 = k1, k1 = k2;
        double frac = x - a;
        if (frac < 1e-12 || std::fabs(double(h1) / double(k1) - std::fabs(v)) < 1e-12) break;
        x = 1 / frac;
    }
    if (k1 == 0) return std::nullopt;
    return Rational{int32_t(v < 0 ? -h1 : h1), uint32_t(k1)};
}

class AtomWriter {
public:
    void atom(FourCharCode type, std::span<const uint8_t> payload) {
        u32(uint32_t(8 + payload.size()));
        u32(type);
        _bytes.insert(_bytes.end(), payload.begin(), payload.end());
    }
    void u32(uint32_t v) {
        uint8_t b[4];
        storeBE32(b, v);
        _bytes.insert(_bytes.end(), b, b + 4);
    }
    std::vector<uint8_t>& bytes() { return _bytes; }

private:
    std::vector<uint8_t> _bytes;
};

std::optional<FourCharCode> fourCharKey(const std::string& key) {
    if (key.size() != 4) return std::nullopt;
    return FourCharCode(uint8_t(key[0])) << 24 | FourCharCode(uint8_t(key[1])) << 16 |
           FourCharCode(uint8_t(key[2])) << 8 | FourCharCode(uint8_t(key[3]));
}

std::optional<std::vector<uint8_t>> fielPayload(const Value& count, const Value& detail) {
    int64_t fields = count.integerValue();
    if (fields != 1 && fields != 2) return std::nullopt;
    uint8_t code = 0;
    if (fields == 2 && detail.isString())
        for (const auto& d : kFieldDetailCodes)
            if (detail.string() == d.detail) code = d.code;
    return std::vector<uint8_t>{uint8_t(fields), code};
}

std::optional<std::vector<uint8_t>> paspPayload(const Value& ratio) {
    double h = ratio[kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing].doubleValue();
    double v = ratio[kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing].doubleValue();
    if (!(h > 0) || !(v > 0)) return std::nullopt;
    // Whole spacings are kept as given (10:11 stays 10:11); others become the
    // nearest fraction of their ratio.
    uint32_t hs, vs;
    if (h == std::floor(h) && v == std::floor(v) && h <= UINT32_MAX && v <= UINT32_MAX) {
        hs = uint32_t(h), vs = uint32_t(v);
    } else {
        auto r = rationalFor(h / v);
        if (!r || r->numerator <= 0) return std::nullopt;
        hs = uint32_t(r->numerator), vs = r->denominator;
    }
    std::vector<uint8_t> out(8);
    storeBE32(out.data(), hs);
    storeBE32(out.data() + 4, vs);
    return out;
}

std::optional<std::vector<uint8_t>> clapPayload(const Value& aperture) {
    const char* keys[] = {kCMFormatDescriptionKey_CleanApertureWidth, kCMFormatDescriptionKey_CleanApertureHeight,
                          kCMFormatDescriptionKey_CleanApertureHorizontalOffset,
                          kCMFormatDescriptionKey_CleanApertureVerticalOffset};
    std::vector<uint8_t> out(32);
    for (int i = 0; i < 4; ++i) {
        const Value& v = aperture[keys[i]];
        if (!v.isNumber()) return std::nullopt;
        auto r = rationalFor(v.doubleValue());
        if (!r || (i < 2 && r->numerator <= 0)) return std::nullopt;
        storeBE32(out.data() + 8 * i, uint32_t(r->numerator));
        storeBE32(out.data() + 8 * i + 4, r->denominator);
    }
    return out;
}

uint32_t vendorCode(const Value& v) {
    if (v.isString()) {
        auto code = fourCharKey(v.string());
        return code ? *code : 0;
    }
    return uint32_t(v.integerValue());
}

// At most 31 bytes of the name, not ending inside a UTF-8 sequence.
std::string_view pascalName(const std::string& name) {
    if (name.size() <= kMaxNameBytes) return name;
    size_t n = kMaxNameBytes;
    while (n > 0 && (uint8_t(name[n]) & 0xC0) == 0x80) --n;
    return std::string_view(name).substr(0, n);
}

void swapHeader(uint8_t* d) {
    if constexpr (std::endian::native == std::endian::big) return;
    auto swap16 = [&](size_t at) { std::swap(d[at], d[at + 1]); };
    auto swap32 = [&](size_t at) {
        std::swap(d[at], d[at + 3]);
        std::swap(d[at + 1], d[at + 2]);
    };
    for (size_t at : {offsetof(ImageDescription, idSize), offsetof(ImageDescription, cType),
                      offsetof(ImageDescription, resvd1), offsetof(ImageDescription, vendor),
                      offsetof(ImageDescription, temporalQuality), offsetof(ImageDescription, spatialQuality),
                      offsetof(ImageDescription, hRes), offsetof(ImageDescription, vRes),
                      offsetof(ImageDescription, dataSize)})
        swap32(at);
    for (size_t at : {offsetof(ImageDescription, resvd2), offsetof(ImageDescription, dataRefIndex),
                      offsetof(ImageDescription, version), offsetof(ImageDescription, revisionLevel),
                      offsetof(ImageDescription, width), offsetof(ImageDescription, height),
                      offsetof(ImageDescription, frameCount), offsetof(ImageDescription, depth),
                      offsetof(ImageDescription, clutID)})
        swap16(at);
}

}  // namespace

OSStatus CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(
    CFAllocatorRef allocator, const CMVideoFormatDescriptionRef& desc, CFStringEncoding, const char* flavor,
    CMBlockBufferRef* blockBufferOut) {
    if (!blockBufferOut) return kCMFormatDescriptionBridgeError_InvalidParameter;
    *blockBufferOut = nullptr;
    if (!desc) return kCMFormatDescriptionBridgeError_InvalidParameter;
    if (desc->mediaType() != kCMMediaType_Video) return kCMFormatDescriptionBridgeError_InvalidFormatDescription;
    if (flavor && std::strcmp(flavor, kCMImageDescriptionFlavor_QuickTimeMovie) != 0 &&
        std::strcmp(flavor, kCMImageDescriptionFlavor_ISOFamily) != 0 &&
        std::strcmp(flavor, kCMImageDescriptionFlavor_3GPFamily) != 0)
        return kCMFormatDescriptionBridgeError_UnsupportedSampleDescriptionFlavor;
    CMVideoDimensions dims = desc->dimensions();
    if (dims.width > 0xFFFF || dims.height > 0xFFFF) return kCMFormatDescriptionBridgeError_IncompatibleFormatDescription;

    const Dictionary& ext = desc->extensions();
    auto extension = [&](const char* key) -> const Value& {
        return CMFormatDescriptionGetExtension(desc, key);
    };
    uint8_t* memory = nullptr;
    size_t total = 0;
    try {
        std::optional<std::vector<uint8_t>> fiel, pasp, clap;
        if (ext.contains(kCMFormatDescriptionExtension_FieldCount))
            fiel = fielPayload(extension(kCMFormatDescriptionExtension_FieldCount),
                               extension(kCMFormatDescriptionExtension_FieldDetail));
        if (ext.contains(kCMFormatDescriptionExtension_PixelAspectRatio))
            pasp = paspPayload(extension(kCMFormatDescriptionExtension_PixelAspectRatio));
        if (ext.contains(kCMFormatDescriptionExtension_CleanAperture))
            clap = clapPayload(extension(kCMFormatDescriptionExtension_CleanAperture));

        AtomWriter atoms;
        const Value& given = extension(kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms);
        if (given.isDictionary()) {
            for (const auto& [key, value] : given.dictionary()) {
                auto type = fourCharKey(key);
                if (!type) continue;
                if ((*type == FourCC("fiel") && fiel) || (*type == FourCC("pasp") && pasp) ||
                    (*type == FourCC("clap") && clap))
                    continue;
                auto write = [&](const Value& v) {
                    auto bytes = valueDataBytes(v);
                    if ((!bytes.empty() || v.isData()) && bytes.size() <= UINT32_MAX - 8) atoms.atom(*type, bytes);
                };
                if (value.isArray())
                    for (const auto& v : value.arrayValue()) write(v);
                else
                    write(value);
            }
        }
        if (fiel) atoms.atom(FourCC("fiel"), *fiel);
        if (pasp) atoms.atom(FourCC("pasp"), *pasp);
        if (clap) atoms.atom(FourCC("clap"), *clap);

        total = kHeaderSize + atoms.bytes().size();
        if (total > size_t(std::numeric_limits<int32_t>::max()))
            return kCMFormatDescriptionBridgeError_IncompatibleFormatDescription;
        memory = static_cast<uint8_t*>(std::calloc(1, total));
        if (!memory) return kCMFormatDescriptionBridgeError_AllocationFailed;

        uint8_t* d = memory;
        storeBE32(d + offsetof(ImageDescription, idSize), uint32_t(total));
        storeBE32(d + offsetof(ImageDescription, cType), desc->mediaSubType());
        storeBE16(d + offsetof(ImageDescription, version),
                  uint16_t(extension(kCMFormatDescriptionExtension_Version).integerValue()));
        storeBE16(d + offsetof(ImageDescription, revisionLevel),
                  uint16_t(extension(kCMFormatDescriptionExtension_RevisionLevel).integerValue()));
        storeBE32(d + offsetof(ImageDescription, vendor), vendorCode(extension(kCMFormatDescriptionExtension_Vendor)));
        storeBE32(d + offsetof(ImageDescription, temporalQuality),
                  uint32_t(extension(kCMFormatDescriptionExtension_TemporalQuality).integerValue()));
        storeBE32(d + offsetof(ImageDescription, spatialQuality),
                  uint32_t(extension(kCMFormatDescriptionExtension_SpatialQuality).integerValue()));
        storeBE16(d + offsetof(ImageDescription, width), uint16_t(dims.width));
        storeBE16(d + offsetof(ImageDescription, height), uint16_t(dims.height));
        storeBE32(d + offsetof(ImageDescription, hRes), uint32_t(kResolution72dpi));
        storeBE32(d + offsetof(ImageDescription, vRes), uint32_t(kResolution72dpi));
        storeBE16(d + offsetof(ImageDescription, frameCount), 1);
        const Value& name = extension(kCMFormatDescriptionExtension_FormatName);
        if (name.isString()) {
            std::string_view n = pascalName(name.string());
            d[offsetof(ImageDescription, name)] = uint8_t(n.size());
            std::memcpy(d + offsetof(ImageDescription, name) + 1, n.data(), n.size());
        }
        const Value& depth = extension(kCMFormatDescriptionExtension_Depth);
        storeBE16(d + offsetof(ImageDescription, depth),
                  uint16_t(depth.isNumber() ? int16_t(depth.integerValue()) : kDefaultDepth));
        storeBE16(d + offsetof(ImageDescription, clutID), 0xFFFF);
        if (!atoms.bytes().empty()) std::memcpy(d + kHeaderSize, atoms.bytes().data(), atoms.bytes().size());
    } catch (const std::bad_alloc&) {
        std::free(memory);
        return kCMFormatDescriptionBridgeError_AllocationFailed;
    }

    OSStatus status = CMBlockBufferCreateWithMemoryBlock(allocator, memory, total, kCFAllocatorDefault, nullptr, 0,
                                                         total, 0, blockBufferOut);
    if (status != kCMBlockBufferNoErr) {
        std::free(memory);
        return kCMFormatDescriptionBridgeError_AllocationFailed;
    }
    return noErr;
}

OSStatus CMSwapBigEndianImageDescriptionToHost(uint8_t* imageDescriptionData, size_t imageDescriptionSize) {
    if (!imageDescriptionData || imageDescriptionSize < kHeaderSize) return kCMFormatDescriptionBridgeError_InvalidParameter;
    swapHeader(imageDescriptionData);
    return noErr;
}

OSStatus CMSwapHostImageDescriptionToBigEndian(uint8_t* imageDescriptionData, size_t imageDescriptionSize) {
    // Byte reversal is its own inverse.
    return CMSwapBigEndianImageDescriptionToHost(imageDescriptionData, imageDescriptionSize);
}

std::span<const uint8_t> CMImageDescriptionFindExtensionAtom(const uint8_t* imageDescriptionData,
                                                             size_t imageDescriptionSize, FourCharCode atomType,
                                                             Boolean headerInHostOrder) {
    if (!imageDescriptionData || imageDescriptionSize < kHeaderSize) return {};
    uint32_t idSize = loadBE32(imageDescriptionData);
    if (headerInHostOrder) std::memcpy(&idSize, imageDescriptionData, sizeof idSize);
    if (idSize < kHeaderSize) return {};
    size_t limit = std::min<size_t>(idSize, imageDescriptionSize);
    ByteReader atoms(imageDescriptionData + kHeaderSize, limit - kHeaderSize);
    while (atoms.remaining() >= 8) {
        uint32_t size = atoms.u32();
        FourCharCode type = atoms.u32();
        // A size of 0 is QuickTime's terminator; anything under a header is no atom.
        if (size < 8) break;
        auto payload = atoms.take(size - 8);
        if (!atoms.ok()) break;
        if (type == atomType) return payload;
    }
    return {};
}
