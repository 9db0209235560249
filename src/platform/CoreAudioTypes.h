// Audio stream descriptions, channel layouts and buffer lists.
//
// These records cross the plug-in boundary by address (the ingest object writes
// pointers to them, and their sizes, into the host's media record), so their
// layouts are the frameworks' byte for byte and pinned by the static_asserts
// below. The variable-length records (a layout with n channel descriptions, a
// list with n buffers) are declared with one trailing element, as in C; the
// size helpers say how many bytes n elements take.
#pragma once

#include "CFBase.h"

#include <cstddef>

using AudioFormatID = UInt32;
using AudioFormatFlags = UInt32;

struct AudioStreamBasicDescription {
    Float64 mSampleRate;
    AudioFormatID mFormatID;
    AudioFormatFlags mFormatFlags;
    UInt32 mBytesPerPacket;
    UInt32 mFramesPerPacket;
    UInt32 mBytesPerFrame;
    UInt32 mChannelsPerFrame;
    UInt32 mBitsPerChannel;
    UInt32 mReserved;
};

inline constexpr AudioFormatID kAudioFormatLinearPCM = FourCC("lpcm");

enum : AudioFormatFlags {
    kAudioFormatFlagIsFloat = 1u << 0,
    kAudioFormatFlagIsBigEndian = 1u << 1,
    kAudioFormatFlagIsSignedInteger = 1u << 2,
    kAudioFormatFlagIsPacked = 1u << 3,
    kAudioFormatFlagIsAlignedHigh = 1u << 4,
    kAudioFormatFlagIsNonInterleaved = 1u << 5,
    kAudioFormatFlagIsNonMixable = 1u << 6,
    kAudioFormatFlagsAreAllClear = 0x80000000u,

    kLinearPCMFormatFlagIsFloat = kAudioFormatFlagIsFloat,
    kLinearPCMFormatFlagIsBigEndian = kAudioFormatFlagIsBigEndian,
    kLinearPCMFormatFlagIsSignedInteger = kAudioFormatFlagIsSignedInteger,
    kLinearPCMFormatFlagIsPacked = kAudioFormatFlagIsPacked,
    kLinearPCMFormatFlagIsAlignedHigh = kAudioFormatFlagIsAlignedHigh,
    kLinearPCMFormatFlagIsNonInterleaved = kAudioFormatFlagIsNonInterleaved,
    kLinearPCMFormatFlagIsNonMixable = kAudioFormatFlagIsNonMixable,
    kLinearPCMFormatFlagsSampleFractionShift = 7,
    kLinearPCMFormatFlagsSampleFractionMask = 0x3Fu << kLinearPCMFormatFlagsSampleFractionShift,
    kLinearPCMFormatFlagsAreAllClear = kAudioFormatFlagsAreAllClear,

    // Every supported host is little-endian.
    kAudioFormatFlagsNativeEndian = 0,
};

using AudioChannelLabel = UInt32;
using AudioChannelLayoutTag = UInt32;
using AudioChannelFlags = UInt32;
using AudioChannelBitmap = UInt32;

enum : AudioChannelLabel {
    kAudioChannelLabel_Unknown = 0xFFFFFFFFu,
    kAudioChannelLabel_Unused = 0,
    kAudioChannelLabel_UseCoordinates = 100,
    kAudioChannelLabel_Left = 1,
    kAudioChannelLabel_Right = 2,
    kAudioChannelLabel_Center = 3,
    kAudioChannelLabel_LFEScreen = 4,
    kAudioChannelLabel_LeftSurround = 5,
    kAudioChannelLabel_RightSurround = 6,
    kAudioChannelLabel_Mono = 42,
    kAudioChannelLabel_Discrete = 400,
    // Discrete channel n is (1 << 16) | n.
    kAudioChannelLabel_Discrete_0 = (1u << 16) | 0,
    kAudioChannelLabel_Discrete_1 = (1u << 16) | 1,
    kAudioChannelLabel_Discrete_2 = (1u << 16) | 2,
    kAudioChannelLabel_Discrete_3 = (1u << 16) | 3,
    kAudioChannelLabel_Discrete_4 = (1u << 16) | 4,
    kAudioChannelLabel_Discrete_5 = (1u << 16) | 5,
    kAudioChannelLabel_Discrete_6 = (1u << 16) | 6,
    kAudioChannelLabel_Discrete_7 = (1u << 16) | 7,
    kAudioChannelLabel_Discrete_8 = (1u << 16) | 8,
    kAudioChannelLabel_Discrete_9 = (1u << 16) | 9,
    kAudioChannelLabel_Discrete_10 = (1u << 16) | 10,
    kAudioChannelLabel_Discrete_11 = (1u << 16) | 11,
    kAudioChannelLabel_Discrete_12 = (1u << 16) | 12,
    kAudioChannelLabel_Discrete_13 = (1u << 16) | 13,
    kAudioChannelLabel_Discrete_14 = (1u << 16) | 14,
    kAudioChannelLabel_Discrete_15 = (1u << 16) | 15,
    kAudioChannelLabel_Discrete_65535 = (1u << 16) | 65535,
};

// A layout tag carries its channel count in the low 16 bits.
enum : AudioChannelLayoutTag {
    kAudioChannelLayoutTag_UseChannelDescriptions = (0u << 16) | 0,
    kAudioChannelLayoutTag_UseChannelBitmap = (1u << 16) | 0,
    kAudioChannelLayoutTag_Mono = (100u << 16) | 1,
    kAudioChannelLayoutTag_Stereo = (101u << 16) | 2,
    kAudioChannelLayoutTag_DiscreteInOrder = (147u << 16) | 0,
    kAudioChannelLayoutTag_Unknown = 0xFFFF0000u,
};

enum : AudioChannelFlags {
    kAudioChannelFlags_AllOff = 0,
    kAudioChannelFlags_RectangularCoordinates = 1u << 0,
    kAudioChannelFlags_SphericalCoordinates = 1u << 1,
    kAudioChannelFlags_Meters = 1u << 2,
};

constexpr UInt32 AudioChannelLayoutTag_GetNumberOfChannels(AudioChannelLayoutTag tag) { return tag & 0x0000FFFFu; }

struct AudioChannelDescription {
    AudioChannelLabel mChannelLabel;
    AudioChannelFlags mChannelFlags;
    Float32 mCoordinates[3];
};

struct AudioChannelLayout {
    AudioChannelLayoutTag mChannelLayoutTag;
    AudioChannelBitmap mChannelBitmap;
    UInt32 mNumberChannelDescriptions;
    AudioChannelDescription mChannelDescriptions[1];
};

struct AudioBuffer {
    UInt32 mNumberChannels;
    UInt32 mDataByteSize;
    void* mData;
};

struct AudioBufferList {
    UInt32 mNumberBuffers;
    AudioBuffer mBuffers[1];
};

// Bytes taken by a layout with n channel descriptions: the header and n
// descriptions, never less than the 12-byte header. n = 1 gives sizeof(AudioChannelLayout).
constexpr size_t AudioChannelLayoutByteSize(UInt32 numberChannelDescriptions) {
    return offsetof(AudioChannelLayout, mChannelDescriptions) +
           size_t(numberChannelDescriptions) * sizeof(AudioChannelDescription);
}
// Bytes taken by a list of n buffers, at least sizeof(AudioBufferList) as the
// frameworks compute it ((n - 1) more buffers than the declared one).
constexpr size_t AudioBufferListByteSize(UInt32 numberBuffers) {
    return sizeof(AudioBufferList) + (numberBuffers > 1 ? size_t(numberBuffers - 1) * sizeof(AudioBuffer) : 0);
}

static_assert(sizeof(AudioStreamBasicDescription) == 40);
static_assert(offsetof(AudioStreamBasicDescription, mSampleRate) == 0);
static_assert(offsetof(AudioStreamBasicDescription, mFormatID) == 8);
static_assert(offsetof(AudioStreamBasicDescription, mFormatFlags) == 12);
static_assert(offsetof(AudioStreamBasicDescription, mBytesPerPacket) == 16);
static_assert(offsetof(AudioStreamBasicDescription, mFramesPerPacket) == 20);
static_assert(offsetof(AudioStreamBasicDescription, mBytesPerFrame) == 24);
static_assert(offsetof(AudioStreamBasicDescription, mChannelsPerFrame) == 28);
static_assert(offsetof(AudioStreamBasicDescription, mBitsPerChannel) == 32);
static_assert(offsetof(AudioStreamBasicDescription, mReserved) == 36);

static_assert(sizeof(AudioChannelDescription) == 20);
static_assert(offsetof(AudioChannelDescription, mCoordinates) == 8);
static_assert(sizeof(AudioChannelLayout) == 32);
static_assert(offsetof(AudioChannelLayout, mChannelBitmap) == 4);
static_assert(offsetof(AudioChannelLayout, mNumberChannelDescriptions) == 8);
static_assert(offsetof(AudioChannelLayout, mChannelDescriptions) == 12);
static_assert(AudioChannelLayoutByteSize(1) == sizeof(AudioChannelLayout));
static_assert(AudioChannelLayoutByteSize(3) == 2 * 20 + 32);

static_assert(sizeof(AudioBuffer) == 16);
static_assert(offsetof(AudioBuffer, mDataByteSize) == 4);
static_assert(offsetof(AudioBuffer, mData) == 8);
static_assert(sizeof(AudioBufferList) == 24);
static_assert(offsetof(AudioBufferList, mBuffers) == 8);
static_assert(AudioBufferListByteSize(1) == sizeof(AudioBufferList));
static_assert(AudioBufferListByteSize(4) == 3 * 16 + 24);
