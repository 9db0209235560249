// Pieces of building a format reader that live in their own sources: the
// frame-rate table and the per-codec video format descriptions.
#pragma once

#include "CMFormatDescription.h"
#include "Value.h"

#include <cstdint>
#include <optional>
#include <string>

class SkarnClip;
class SkarnFormatReader;
class SkarnTrackReader;

namespace SkarnFormatReaderDetail {

struct FrameRateRow {
    const char* prefix;
    char suffix;  // 'i', 'p', or 0 for any
    int64_t value;
    int32_t timescale;
    uint64_t frameQuanta;
    // Rows whose clips may have a cadence for the reader itself to remove;
    // field and high-rate recordings leave that to the ingest object.
    bool readsCadence;
};

// The row a clip XML FrameRate text matches (by prefix, and by the suffix
// for the field and high rates); nullptr for any other text.
const FrameRateRow* frameRateRowForText(const std::string& text);

struct FormatDescriptionChoice {
    CMVideoCodecType codecType = 0;
    int32_t width = 0;
    int32_t height = 0;
    Dictionary extensions;
};

// Codec type, encoded size and picture extensions (pixel aspect, fields,
// clean aperture) for the clip's codec; logs what it cannot work out.
FormatDescriptionChoice chooseVideoFormatDescription(SkarnFormatReader* reader, SkarnClip* clip,
                                                     SkarnTrackReader* video,
                                                     const std::optional<std::string>& frameRateText);

// Size of a regular file, 0 for anything else (missing, a folder, a FIFO, a device).
int64_t regularFileSize(const std::optional<std::string>& path);

}  // namespace SkarnFormatReaderDetail
