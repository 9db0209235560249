// Video format descriptions as QuickTime image descriptions, and back to fields.
//
// The ingest object hands the host each frame's format as an image description
// (the 86-byte header followed by extension atoms such as 'avcC', 'fiel',
// 'pasp' and 'clap'); the reference host writes it into QuickTime movies. The
// header's numbers are big-endian as made and may be swapped to host order in
// place; the atoms always stay big-endian, as their readers expect. The atom
// walk for readers checks every size against the bytes actually there.
#pragma once

#include "CFBase.h"
#include "CMBlockBuffer.h"
#include "CMFormatDescription.h"

#include <cstddef>
#include <span>

enum : OSStatus {
    kCMFormatDescriptionBridgeError_InvalidParameter = -12712,
    kCMFormatDescriptionBridgeError_AllocationFailed = -12713,
    kCMFormatDescriptionBridgeError_InvalidSerializedSampleDescription = -12714,
    kCMFormatDescriptionBridgeError_InvalidFormatDescription = -12715,
    kCMFormatDescriptionBridgeError_IncompatibleFormatDescription = -12716,
    kCMFormatDescriptionBridgeError_UnsupportedSampleDescriptionFlavor = -12717,
    kCMFormatDescriptionBridgeError_InvalidSlice = -12719,
};

using CFStringEncoding = UInt32;
inline constexpr CFStringEncoding kCFStringEncodingMacRoman = 0;
inline constexpr CFStringEncoding kCFStringEncodingUTF8 = 0x08000100;

// Null means the QuickTime movie flavour. The families differ in what they
// accept in other sample descriptions, not in image descriptions.
inline constexpr const char* kCMImageDescriptionFlavor_QuickTimeMovie = "QuickTimeMovie";
inline constexpr const char* kCMImageDescriptionFlavor_ISOFamily = "ISOFamily";
inline constexpr const char* kCMImageDescriptionFlavor_3GPFamily = "3GPFamily";

// The header as QuickTime lays it out (two-byte packing); name is a Pascal
// string. Its numbers are big-endian unless swapped to host order.
#pragma pack(push, 2)
struct ImageDescription {
    int32_t idSize;  // header and atoms
    uint32_t cType;
    int32_t resvd1;
    int16_t resvd2;
    int16_t dataRefIndex;
    int16_t version;
    int16_t revisionLevel;
    uint32_t vendor;
    uint32_t temporalQuality;
    uint32_t spatialQuality;
    int16_t width;
    int16_t height;
    int32_t hRes;  // 16.16 fixed point
    int32_t vRes;
    int32_t dataSize;
    int16_t frameCount;
    uint8_t name[32];
    int16_t depth;
    int16_t clutID;
};
#pragma pack(pop)

static_assert(sizeof(ImageDescription) == 86);
static_assert(offsetof(ImageDescription, vendor) == 20);
static_assert(offsetof(ImageDescription, width) == 32);
static_assert(offsetof(ImageDescription, hRes) == 36);
static_assert(offsetof(ImageDescription, frameCount) == 48);
static_assert(offsetof(ImageDescription, name) == 50);
static_assert(offsetof(ImageDescription, depth) == 82);

// A big-endian image description of a video description, in a new block
// buffer. Header fields come from the Version, RevisionLevel, Vendor (a number
// or four characters), TemporalQuality, SpatialQuality, FormatName (the first
// 31 bytes, cut at a character boundary) and Depth (24 when absent) extensions;
// resolution is 72 dpi, the frame count 1, no colour table. Then come the
// SampleDescriptionExtensionAtoms entries (data, or arrays of data, under
// four-character keys), and atoms made from the FieldCount/FieldDetail
// ('fiel'), PixelAspectRatio ('pasp') and CleanAperture ('clap') extensions,
// which replace same-named entries. stringEncoding is accepted for the
// frameworks' signature; names are written as their bytes.
OSStatus CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(
    CFAllocatorRef allocator, const CMVideoFormatDescriptionRef& videoFormatDescription,
    CFStringEncoding stringEncoding, const char* flavor, CMBlockBufferRef* blockBufferOut);

// Swap the header's numbers (not the name, not the atoms) in place. Fewer than
// 86 bytes answer kCMFormatDescriptionBridgeError_InvalidParameter untouched.
OSStatus CMSwapBigEndianImageDescriptionToHost(uint8_t* imageDescriptionData, size_t imageDescriptionSize);
OSStatus CMSwapHostImageDescriptionToBigEndian(uint8_t* imageDescriptionData, size_t imageDescriptionSize);

// The payload of the first extension atom of the given type, read within both
// size and the header's idSize (itself in host order when headerInHostOrder).
// Empty when absent, when the atoms are malformed before it, or when the atom
// is empty.
std::span<const uint8_t> CMImageDescriptionFindExtensionAtom(const uint8_t* imageDescriptionData,
                                                             size_t imageDescriptionSize, FourCharCode atomType,
                                                             Boolean headerInHostOrder);
