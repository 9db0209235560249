// Writes Skarn cards: the CONTENTS folder tree with clip XML, MXF essence,
// icons, voice memos and proxies, or self-contained AVCLIP files.
#pragma once

#include "AVClipWriter.h"
#include "CardFamily.h"
#include "DVFrameWriter.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

struct ClipMemo {
    std::string person;
    std::string text;
};

// Card metadata under ClipContent/ClipMetadata; absent fields are left out.
struct ClipMetadataSpec {
    std::optional<std::string> userClipName, dataSource, shotMark;
    std::optional<std::string> creator, creationDate, lastUpdateDate, lastUpdatePerson;
    std::optional<std::string> manufacturer, serialNo, modelName;
    std::optional<std::string> shooter, startDate, endDate;
    std::optional<std::string> altitude, longitude, latitude, locationSource, placeName;
    std::optional<std::string> programName, sceneNo, takeNo;
    std::optional<std::string> reporter, purpose, object;
    std::vector<ClipMemo> memos;
};

struct ClipSpec {
    const CardFamily* family = nullptr;
    std::string name;                     // clip identifier (file base name), e.g. "A001"
    uint64_t frames = 60;
    uint32_t audioChannels = 2;
    uint32_t bitsPerSample = 16;          // 16 or 24
    uint32_t sampleRate = 48000;
    std::string startTimecode = "00:00:00:00";
    std::optional<bool> dropFrame;        // default: drop-frame for the 29.97-family rates
    std::optional<std::string> globalClipID;  // default: derived from the name
    std::optional<std::string> pulldown;  // EssenceList/Video/Pulldown ("2:3", "2:2", "OTHER", ...)
    std::optional<std::string> vfrRatio;  // e.g. "60/24"
    std::string vfrState = "variable";
    std::optional<std::string> startBinaryGroup;
    std::optional<std::string> spanTop, spanNext, spanPrevious;  // Relation/Connection global clip IDs
    ClipMetadataSpec metadata;
    bool icon = true;
    bool voice = false;
    bool proxy = false;
    bool sparse = false;                  // leave essence after the first frames as holes
    std::optional<DVStreamSpec> dv;       // DV stream options (family, drop and start are filled in)
    std::string essenceFile;              // DV frames to use instead of synthetic ones
};

struct CardSpec {
    std::string root;                     // the volume root (created)
    bool lowerCaseFolders = false;        // spell contents/clip/... in lower case
    bool lastClipFile = true;             // LASTCLIP.TXT at the root
    std::vector<ClipSpec> clips;
};

struct WrittenClip {
    std::string name;
    std::string family;
    std::string clipPath;                 // the CLIP XML or AVCLIP MXF the plug-in reads
    std::vector<std::string> files;       // every file written for the clip
    AVClipLayout avclipLayout;            // where a self-contained clip's essence went
};

// Writes the card; answers false with a one-line reason in error.
bool writeCard(const CardSpec& card, std::vector<WrittenClip>* written = nullptr, std::string* error = nullptr);

// The clip XML document for a clip (what CONTENTS/CLIP holds), with the byte
// offsets of the essence given.
std::string clipXMLText(const ClipSpec& clip, uint64_t videoStartByteOffset, const std::vector<uint64_t>& audioStartByteOffsets);
// The smaller XML a self-contained clip carries in its header.
std::string avclipHeaderXMLText(const ClipSpec& clip);

// A clip with every family default filled in; name "A001" style by index.
ClipSpec defaultClip(const CardFamily& family, unsigned index);
// A 64-hex-digit global clip identifier derived from a name.
std::string globalClipIDFor(const std::string& name);
// Frame count of a timecode label at an integer rate (drop-frame for ";" or drop).
uint64_t timecodeLabelToFrames(const std::string& label, unsigned rate, bool drop);
// Audio samples a clip of `frames` frames holds at the sample rate.
uint64_t audioSamplesFor(const ClipSpec& clip);
