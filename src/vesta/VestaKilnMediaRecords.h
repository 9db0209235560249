// The records an ingest object fills for the host, with their exact byte
// layouts: hosts built against the framework read them by offset, so every
// field's place is checked below.
#pragma once

#include <cstddef>
#include <cstdint>

class CMSampleBuffer;
class VestaKilnVideoBufferManager;
class VestaKilnAudioBufferManager;
struct AudioBufferList;
struct AudioStreamBasicDescription;
struct AudioChannelLayout;

// The current protocol's record: finished sample buffers. Plug-ins that serve
// media through the older record leave it alone.
struct VestaKilnPlugInMediaSpecifier {
    uint32_t mediaFlags;
    CMSampleBuffer* videoSampleBuffer;
    CMSampleBuffer* audioSampleBuffer;
    uint32_t videoCount;
    uint32_t audioCount;
    uint8_t endOfMedia;
    uint8_t videoEndOfMedia;
    uint8_t audioEndOfMedia;
};

static_assert(offsetof(VestaKilnPlugInMediaSpecifier, videoSampleBuffer) == 8);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier, audioSampleBuffer) == 16);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier, videoCount) == 24);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier, audioCount) == 28);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier, endOfMedia) == 32);
static_assert(sizeof(VestaKilnPlugInMediaSpecifier) == 40);

// The older record: one video frame and one block of every audio channel per
// call, as raw pointers into memory the plug-in keeps until the host hands it
// back through the buffer managers (the video keeper and audio keeper pointers
// travel as the dispose calls' refCon2). Times are CMTime parts: value and
// timescale kept apart.
struct VestaKilnPlugInMediaSpecifier_Deprecated {
    uint32_t state;                     // 0: set to 99 by every call
    uint32_t reserved4;
    uint8_t* videoData;                 // 8: the frame's bytes; null when no frame came
    uint32_t videoDataSize;             // 16
    uint32_t reserved20;
    int64_t videoPresentationTime;      // 24
    int64_t videoDecodeTime;            // 32: -1 for formats without reordering
    int64_t videoDuration;              // 40
    int32_t videoTimescale;             // 48
    uint32_t reserved52;
    uint8_t* videoImageDescription;     // 56: QuickTime image description, host byte order
    uint32_t videoSampleFlags;          // 64: media sample flags (reordered formats only)
    uint32_t reserved68;
    VestaKilnVideoBufferManager* videoBufferManager;  // 72
    void* videoMediaDisposeRefCon2;     // 80: the plug-in's keeper of this frame
    AudioBufferList* audioBufferList;   // 88: one buffer per channel; null when no audio came
    uint32_t audioSampleCount;          // 96
    uint32_t reserved100;
    int64_t audioDataOffset;            // 104
    int64_t audioPresentationTime;      // 112
    int64_t audioDecodeTime;            // 120: -1, audio is never reordered
    int64_t audioDuration;              // 128
    int32_t audioTimescale;             // 136
    uint32_t reserved140;
    AudioStreamBasicDescription* audioStreamDescription;  // 144
    uint64_t audioStreamDescriptionSize;                   // 152
    AudioChannelLayout* audioChannelLayout;                // 160
    uint64_t audioChannelLayoutSize;                       // 168
    uint64_t reserved176;
    uint64_t reserved184;
    VestaKilnAudioBufferManager* audioBufferManager;  // 192
    void* audioMediaDisposeRefCon2;     // 200: the plug-in's keeper of this block
    uint32_t timecodeFrame;             // 208: the frame's timecode as a frame count
    uint32_t timecodeFrameQuanta;       // 212
    uint8_t timecodeIsDropFrame;        // 216
    uint8_t videoTimingValid;           // 217: the video times above belong to this call
    uint8_t endOfMedia;                 // 218
    uint8_t reserved219;
    uint32_t videoImageDescriptionSize; // 220
    const void* videoFrameAttachments;  // 224: a Dictionary of per-frame entries, or null
};

static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoData) == 8);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoDataSize) == 16);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoPresentationTime) == 24);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoDecodeTime) == 32);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoDuration) == 40);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoTimescale) == 48);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoImageDescription) == 56);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoSampleFlags) == 64);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoBufferManager) == 72);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoMediaDisposeRefCon2) == 80);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioBufferList) == 88);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioSampleCount) == 96);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioDataOffset) == 104);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioPresentationTime) == 112);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioDecodeTime) == 120);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioDuration) == 128);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioTimescale) == 136);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioStreamDescription) == 144);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioStreamDescriptionSize) == 152);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioChannelLayout) == 160);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioChannelLayoutSize) == 168);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, reserved176) == 176);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, reserved184) == 184);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioBufferManager) == 192);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, audioMediaDisposeRefCon2) == 200);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, timecodeFrame) == 208);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, timecodeFrameQuanta) == 212);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, timecodeIsDropFrame) == 216);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoTimingValid) == 217);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, endOfMedia) == 218);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoImageDescriptionSize) == 220);
static_assert(offsetof(VestaKilnPlugInMediaSpecifier_Deprecated, videoFrameAttachments) == 224);
static_assert(sizeof(VestaKilnPlugInMediaSpecifier_Deprecated) == 232);
