// Self-contained clips (CONTENTS/AVCLIP): one MXF file carrying video, ancillary
// data, every audio channel and the clip XML.
//
// Layout: header partition pack, header metadata, the clip XML carrier at
// 32768; then repeating chunks, each made of the video essence partition
// (BodySID 1, one picture element per frame) and the partition holding its
// index table segment, the same pair for ancillary data (BodySID 2) and for
// every audio channel (BodySID 3 + channel, one sound element per chunk); then
// a footer partition pack followed directly by the random index pack.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

struct AVClipSpec {
    std::string clipXML;  // carried in the header, in the XML carrier KLV at 32768
    enum class Coding { AVCIntra, AVCLongGOP } coding = Coding::AVCIntra;
    int32_t editRateNum = 30000, editRateDen = 1001;
    uint64_t frames = 30;
    uint32_t audioChannels = 2;
    uint32_t bitsPerSample = 24;
    uint32_t sampleRate = 48000;
    uint32_t frameBytes = 4096;  // bytes per coded picture (I pictures; P take half, B a quarter)
    uint64_t startTimecodeFrames = 0;
    bool dropFrame = false;
    bool sparse = false;         // leave essence bytes as holes (long clips)
    std::string seed = "avclip"; // identifiers are derived from it
    uint32_t width = 1920, height = 1080;
    // Frames per chunk; 0 takes the nominal frame rate (about a second). Every
    // chunk but the last must hold a whole number of audio samples.
    uint32_t framesPerChunk = 0;
    // Long GOP: frames per GOP, a multiple of 3 (stored I B B P B B P ...).
    uint32_t gopLength = 12;
};

// Where the writer put things, for tests and tools that check a reader.
struct AVClipLayout {
    struct Frame {
        uint64_t offset = 0;        // of the picture element's value
        uint32_t size = 0;
        uint32_t presentation = 0;  // presentation index of this stored frame
        uint8_t flags = 0;          // index entry Flags
        int8_t temporalOffset = 0;  // index entry TemporalOffset
    };
    struct Chunk {
        uint64_t videoPartition = 0, videoIndexPartition = 0;
        uint64_t ancPartition = 0, ancIndexPartition = 0;
        std::vector<uint64_t> audioPartition, audioIndexPartition;
        std::vector<uint64_t> audioBlock;  // offset of each channel's sound element value
        uint64_t firstFrame = 0;
        uint32_t frameCount = 0;
        uint64_t firstSample = 0;
        uint32_t sampleCount = 0;
    };
    std::vector<Frame> frames;  // decode (stored) order
    std::vector<Chunk> chunks;
    uint32_t framesPerChunk = 0;
    uint32_t samplesPerChunk = 0;
    uint64_t audioSamples = 0;  // per channel
    uint32_t blockAlign = 0;
    uint64_t footerPartition = 0;
    uint64_t fileSize = 0;
};

// Writes the file; false with a one-line reason in error.
bool writeAVClip(const std::string& path, const AVClipSpec& params, std::string* error = nullptr,
                 AVClipLayout* layout = nullptr);

// Offset at which the XML carrier KLV starts.
inline constexpr uint64_t kAVClipXMLCarrierOffset = 32768;
// Bytes of the carrier's value ahead of the text (with a 4-byte length field).
inline constexpr size_t kAVClipXMLCarrierPrefix = 29;
