// Self-contained clips (CONTENTS/AVCLIP): one MXF file carrying video, ancillary
// data, every audio channel and the clip XML.
#pragma once

#include <cstdint>
#include <string>

struct AVClipSpec {
    std::string clipXML;  // carried in the header, in the XML carrier KLV at 32768
    enum class Coding { AVCIntra, AVCLongGOP } coding = Coding::AVCIntra;
    int32_t editRateNum = 30000, editRateDen = 1001;
    uint64_t frames = 30;
    uint32_t audioChannels = 2;
    uint32_t bitsPerSample = 24;
    uint32_t sampleRate = 48000;
    uint32_t frameBytes = 4096;  // bytes per coded picture (synthetic essence)
    uint64_t startTimecodeFrames = 0;
    bool dropFrame = false;
    bool sparse = false;         // leave essence bytes as holes (long clips)
    std::string seed = "avclip"; // identifiers are derived from it
};

// Writes the file; false with a one-line reason in error.
bool writeAVClip(const std::string& path, const AVClipSpec& spec, std::string* error = nullptr);

// Offset at which the XML carrier KLV starts.
inline constexpr uint64_t kAVClipXMLCarrierOffset = 32768;
// Bytes of the carrier's value ahead of the text (with a 4-byte length field).
inline constexpr size_t kAVClipXMLCarrierPrefix = 29;
