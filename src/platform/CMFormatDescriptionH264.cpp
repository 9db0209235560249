// H.264 format descriptions: the sequence parameter set read for the picture
// geometry, and the avcC record (ISO/IEC 14496-15) written and read back.
#include "ByteReader.h"
#include "CFData.h"
#include "CMFormatDescription.h"

#include <array>
#include <new>
#include <vector>

namespace {

constexpr uint8_t kNALTypeSPS = 7;
constexpr uint8_t kNALTypePPS = 8;

// Fixed-width and exp-Golomb fields, most significant bit first. Like
// ByteReader, a read past the end answers 0 and the failure sticks.
class BitReader {
public:
    explicit BitReader(std::span<const uint8_t> bytes) : _bytes(bytes) {}
    bool ok() const { return !_failed; }
    void fail() { _failed = true; }

    uint32_t bits(unsigned n) {
        uint64_t v = 0;
        for (unsigned i = 0; i < n; ++i) v = v << 1 | bit();
        return uint32_t(v);
    }
    bool flag() { return bit() != 0; }
    // 31 leading zeros at most (values up to 2^32 - 2); more is no valid field.
    uint32_t ue() {
        unsigned zeros = 0;
        while (bit() == 0) {
            if (!ok() || ++zeros > 31) {
                fail();
                return 0;
            }
        }
        return uint32_t((uint64_t(1) << zeros) - 1 + bits(zeros));
    }
    int32_t se() {
        uint32_t k = ue();
        return (k & 1) ? int32_t((uint64_t(k) + 1) / 2) : -int32_t(k / 2);
    }

private:
    uint32_t bit() {
        if (_bitsLeft == 0) {
            _current = _bytes.u8();
            if (!_bytes.ok()) {
                fail();
                return 0;
            }
            _bitsLeft = 8;
        }
        --_bitsLeft;
        return (_current >> _bitsLeft) & 1;
    }

    ByteReader _bytes;
    uint8_t _current = 0;
    unsigned _bitsLeft = 0;
    bool _failed = false;
};

// The payload without its emulation-prevention bytes (the 03 in 00 00 03).
std::vector<uint8_t> rbspFromNAL(std::span<const uint8_t> payload) {
    std::vector<uint8_t> out;
    out.reserve(payload.size());
    ByteReader r(payload);
    int zeros = 0;
    while (!r.atEnd()) {
        uint8_t b = r.u8();
        if (zeros >= 2 && b == 3) {
            zeros = 0;
            continue;
        }
        out.push_back(b);
        zeros = b == 0 ? zeros + 1 : 0;
    }
    return out;
}

// Profiles whose sequence parameter set carries chroma format, bit depths and
// scaling matrices (H.264 7.3.2.1.1); the avcC record repeats the first three.
bool isHighProfile(uint8_t profile) {
    switch (profile) {
    case 100: case 110: case 122: case 244: case 44: case 83: case 86:
    case 118: case 128: case 138: case 139: case 134: case 135: return true;
    default: return false;
    }
}

struct SequenceParameterSet {
    uint8_t profile = 0;
    uint8_t compatibility = 0;
    uint8_t level = 0;
    uint32_t chromaFormat = 1;  // 4:2:0 unless a high profile says otherwise
    uint32_t bitDepthLumaMinus8 = 0;
    uint32_t bitDepthChromaMinus8 = 0;
    int32_t width = 0;
    int32_t height = 0;
    bool frameMBsOnly = true;
    uint32_t sarWidth = 0;  // 0: not given
    uint32_t sarHeight = 0;
    std::optional<bool> fullRange;
};

bool skipScalingList(BitReader& r, int size) {
    int last = 8, next = 8;
    for (int j = 0; j < size && r.ok(); ++j) {
        if (next != 0) {
            int32_t delta = r.se();
            if (delta < -128 || delta > 127) return false;
            next = (last + delta + 256) % 256;
        }
        last = next == 0 ? last : next;
    }
    return r.ok();
}

// The start of the VUI (H.264 E.1.1): only the sample aspect ratio and the
// video range are wanted, and both come before anything of variable length.
bool readVUIStart(BitReader& r, SequenceParameterSet& sps) {
    static constexpr std::array<std::array<uint16_t, 2>, 17> kAspectRatios{{
        {0, 0}, {1, 1}, {12, 11}, {10, 11}, {16, 11}, {40, 33}, {24, 11}, {20, 11}, {32, 11},
        {80, 33}, {18, 11}, {15, 11}, {64, 33}, {160, 99}, {4, 3}, {3, 2}, {2, 1},
    }};
    constexpr uint32_t kExtendedSAR = 255;
    if (r.flag()) {
        uint32_t idc = r.bits(8);
        if (idc == kExtendedSAR) {
            sps.sarWidth = r.bits(16);
            sps.sarHeight = r.bits(16);
        } else if (idc < kAspectRatios.size()) {
            sps.sarWidth = kAspectRatios[idc][0];
            sps.sarHeight = kAspectRatios[idc][1];
        }
        if (sps.sarWidth == 0 || sps.sarHeight == 0) sps.sarWidth = sps.sarHeight = 0;
    }
    if (r.flag()) r.flag();  // overscan_appropriate_flag
    if (r.flag()) {
        r.bits(3);  // video_format
        sps.fullRange = r.flag();
    }
    return r.ok();
}

std::optional<SequenceParameterSet> parseSPS(std::span<const uint8_t> nal) {
    // Header byte, profile, constraint flags and level at the least.
    if (nal.size() < 4 || (nal[0] & 0x80) || (nal[0] & 0x1F) != kNALTypeSPS) return std::nullopt;
    std::vector<uint8_t> rbsp = rbspFromNAL(nal.subspan(1));
    BitReader r(rbsp);
    SequenceParameterSet sps;
    sps.profile = uint8_t(r.bits(8));
    sps.compatibility = uint8_t(r.bits(8));
    sps.level = uint8_t(r.bits(8));
    if (r.ue() > 31) return std::nullopt;  // seq_parameter_set_id
    bool separateColourPlanes = false;
    if (isHighProfile(sps.profile)) {
        sps.chromaFormat = r.ue();
        if (sps.chromaFormat > 3) return std::nullopt;
        if (sps.chromaFormat == 3) separateColourPlanes = r.flag();
        sps.bitDepthLumaMinus8 = r.ue();
        sps.bitDepthChromaMinus8 = r.ue();
        if (sps.bitDepthLumaMinus8 > 6 || sps.bitDepthChromaMinus8 > 6) return std::nullopt;
        r.flag();  // qpprime_y_zero_transform_bypass_flag
        if (r.flag()) {
            int lists = sps.chromaFormat != 3 ? 8 : 12;
            for (int i = 0; i < lists; ++i)
                if (r.flag() && !skipScalingList(r, i < 6 ? 16 : 64)) return std::nullopt;
        }
    }
    if (r.ue() > 12) return std::nullopt;  // log2_max_frame_num_minus4
    uint32_t pocType = r.ue();
    if (pocType == 0) {
        if (r.ue() > 12) return std::nullopt;  // log2_max_pic_order_cnt_lsb_minus4
    } else if (pocType == 1) {
        r.flag();
        r.se();
        r.se();
        uint32_t cycle = r.ue();
        if (cycle > 255) return std::nullopt;
        for (uint32_t i = 0; i < cycle && r.ok(); ++i) r.se();
    } else if (pocType > 2) {
        return std::nullopt;
    }
    r.ue();    // max_num_ref_frames
    r.flag();  // gaps_in_frame_num_value_allowed_flag
    uint32_t widthMBsMinus1 = r.ue();
    uint32_t heightMapUnitsMinus1 = r.ue();
    // 4096 macroblocks is 65536 pixels, past any level's limit.
    if (widthMBsMinus1 >= 4096 || heightMapUnitsMinus1 >= 4096) return std::nullopt;
    sps.frameMBsOnly = r.flag();
    if (!sps.frameMBsOnly) r.flag();  // mb_adaptive_frame_field_flag
    r.flag();                          // direct_8x8_inference_flag
    uint64_t cropLeft = 0, cropRight = 0, cropTop = 0, cropBottom = 0;
    if (r.flag()) {
        cropLeft = r.ue();
        cropRight = r.ue();
        cropTop = r.ue();
        cropBottom = r.ue();
    }
    if (r.flag() && !readVUIStart(r, sps)) return std::nullopt;
    if (!r.ok()) return std::nullopt;

    // Crop units (H.264 7.4.2.1.1): chroma samples, doubled vertically for field coding.
    uint32_t chromaArrayType = separateColourPlanes ? 0 : sps.chromaFormat;
    uint64_t fieldFactor = sps.frameMBsOnly ? 1 : 2;
    uint64_t cropUnitX = chromaArrayType == 0 || chromaArrayType == 3 ? 1 : 2;
    uint64_t cropUnitY = (chromaArrayType == 1 ? 2 : 1) * fieldFactor;
    uint64_t codedWidth = (uint64_t(widthMBsMinus1) + 1) * 16;
    uint64_t codedHeight = (uint64_t(heightMapUnitsMinus1) + 1) * 16 * fieldFactor;
    uint64_t cropX = (cropLeft + cropRight) * cropUnitX;
    uint64_t cropY = (cropTop + cropBottom) * cropUnitY;
    if (cropX >= codedWidth || cropY >= codedHeight) return std::nullopt;
    sps.width = int32_t(codedWidth - cropX);
    sps.height = int32_t(codedHeight - cropY);
    return sps;
}

std::vector<uint8_t> makeAVCC(const SequenceParameterSet& first, int nalUnitHeaderLength,
                              const std::vector<std::span<const uint8_t>>& spsList,
                              const std::vector<std::span<const uint8_t>>& ppsList) {
    std::vector<uint8_t> out;
    auto u16 = [&](size_t v) {
        out.push_back(uint8_t(v >> 8));
        out.push_back(uint8_t(v));
    };
    out.push_back(1);  // configurationVersion
    out.push_back(first.profile);
    out.push_back(first.compatibility);
    out.push_back(first.level);
    out.push_back(uint8_t(0xFC | (nalUnitHeaderLength - 1)));
    out.push_back(uint8_t(0xE0 | spsList.size()));
    for (auto s : spsList) {
        u16(s.size());
        out.insert(out.end(), s.begin(), s.end());
    }
    out.push_back(uint8_t(ppsList.size()));
    for (auto p : ppsList) {
        u16(p.size());
        out.insert(out.end(), p.begin(), p.end());
    }
    if (isHighProfile(first.profile)) {
        out.push_back(uint8_t(0xFC | first.chromaFormat));
        out.push_back(uint8_t(0xF8 | first.bitDepthLumaMinus8));
        out.push_back(uint8_t(0xF8 | first.bitDepthChromaMinus8));
        out.push_back(0);  // numOfSequenceParameterSetExt
    }
    return out;
}

struct AVCCContents {
    int nalUnitLength = 0;
    std::vector<std::span<const uint8_t>> parameterSets;  // sequence sets, then picture sets
};

std::optional<AVCCContents> readAVCC(std::span<const uint8_t> avcC) {
    ByteReader r(avcC);
    if (r.u8() != 1) return std::nullopt;
    r.skip(3);
    AVCCContents contents;
    contents.nalUnitLength = (r.u8() & 3) + 1;
    for (int list = 0; list < 2; ++list) {
        unsigned count = list == 0 ? (r.u8() & 0x1F) : r.u8();
        for (unsigned i = 0; i < count && r.ok(); ++i) {
            auto set = r.take(r.u16());
            if (r.ok()) contents.parameterSets.push_back(set);
        }
    }
    if (!r.ok()) return std::nullopt;
    return contents;
}

}  // namespace

OSStatus CMVideoFormatDescriptionCreateFromH264ParameterSets(CFAllocatorRef allocator, size_t parameterSetCount,
                                                             const uint8_t* const* parameterSetPointers,
                                                             const size_t* parameterSetSizes,
                                                             int NALUnitHeaderLength,
                                                             CMFormatDescriptionRef* formatDescriptionOut) {
    if (!formatDescriptionOut) return kCMFormatDescriptionError_InvalidParameter;
    *formatDescriptionOut = nullptr;
    if (parameterSetCount < 2 || !parameterSetPointers || !parameterSetSizes)
        return kCMFormatDescriptionError_InvalidParameter;
    if (NALUnitHeaderLength != 1 && NALUnitHeaderLength != 2 && NALUnitHeaderLength != 4)
        return kCMFormatDescriptionError_InvalidParameter;
    // The record counts sequence sets in 5 bits and picture sets in 8.
    if (parameterSetCount > 31 + 255) return kCMFormatDescriptionError_InvalidParameter;

    try {
        std::vector<std::span<const uint8_t>> spsList, ppsList;
        for (size_t i = 0; i < parameterSetCount; ++i) {
            const uint8_t* p = parameterSetPointers[i];
            size_t size = parameterSetSizes[i];
            if (!p || size == 0 || size > 0xFFFF) return kCMFormatDescriptionError_InvalidParameter;
            uint8_t type = p[0] & 0x1F;
            if (type == kNALTypeSPS)
                spsList.emplace_back(p, size);
            else if (type == kNALTypePPS && size >= 2)
                ppsList.emplace_back(p, size);
            else
                return kCMFormatDescriptionError_InvalidParameter;
        }
        if (spsList.empty() || ppsList.empty() || spsList.size() > 31 || ppsList.size() > 255)
            return kCMFormatDescriptionError_InvalidParameter;
        auto sps = parseSPS(spsList.front());
        if (!sps) return kCMFormatDescriptionError_InvalidParameter;

        Dictionary extensions;
        extensions.set(kCMFormatDescriptionExtension_FormatName, "H.264");
        extensions.set(kCMFormatDescriptionExtension_FieldCount, sps->frameMBsOnly ? 1 : 2);
        if (sps->sarWidth)
            extensions.set(kCMFormatDescriptionExtension_PixelAspectRatio,
                           Dictionary{{kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing, sps->sarWidth},
                                      {kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing, sps->sarHeight}});
        if (sps->fullRange) extensions.set(kCMFormatDescriptionExtension_FullRangeVideo, *sps->fullRange);
        extensions.set(kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms,
                       Dictionary{{"avcC", Value(makeAVCC(*sps, NALUnitHeaderLength, spsList, ppsList))}});
        return CMVideoFormatDescriptionCreate(allocator, kCMVideoCodecType_H264, sps->width, sps->height,
                                              &extensions, formatDescriptionOut);
    } catch (const std::bad_alloc&) {
        return kCMFormatDescriptionError_AllocationFailed;
    }
}

OSStatus CMVideoFormatDescriptionGetH264ParameterSetAtIndex(const CMFormatDescriptionRef& videoDesc,
                                                            size_t parameterSetIndex,
                                                            const uint8_t** parameterSetPointerOut,
                                                            size_t* parameterSetSizeOut,
                                                            size_t* parameterSetCountOut,
                                                            int* NALUnitHeaderLengthOut) {
    if (parameterSetPointerOut) *parameterSetPointerOut = nullptr;
    if (parameterSetSizeOut) *parameterSetSizeOut = 0;
    if (parameterSetCountOut) *parameterSetCountOut = 0;
    if (NALUnitHeaderLengthOut) *NALUnitHeaderLengthOut = 0;
    if (CMFormatDescriptionGetMediaType(videoDesc) != kCMMediaType_Video)
        return kCMFormatDescriptionError_InvalidParameter;
    const Value& atoms =
        CMFormatDescriptionGetExtension(videoDesc, kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms);
    auto contents = readAVCC(valueDataBytes(atoms["avcC"]));
    if (!contents) return kCMFormatDescriptionError_InvalidParameter;
    if (parameterSetCountOut) *parameterSetCountOut = contents->parameterSets.size();
    if (NALUnitHeaderLengthOut) *NALUnitHeaderLengthOut = contents->nalUnitLength;
    if (parameterSetIndex >= contents->parameterSets.size()) return kCMFormatDescriptionError_InvalidParameter;
    auto set = contents->parameterSets[parameterSetIndex];
    if (parameterSetPointerOut) *parameterSetPointerOut = set.data();
    if (parameterSetSizeOut) *parameterSetSizeOut = set.size();
    return noErr;
}
