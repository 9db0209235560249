// The kinds of clip the card writer can put on a card, and what each one
// records: codec name, frame size, rates and raster as the clip XML states them.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

struct CardFamily {
    std::string name;          // command-line name, e.g. "dvcprohd-1080i60"
    int videoFormat;           // the plug-in's video format code this family must be read as
    std::string codec;         // ClipContent/EssenceList/Video/Codec
    uint32_t frameBytes;       // bytes per frame in the essence
    std::string frameRate;     // FrameRate text, e.g. "59.94i", "23.98p"
    int32_t editRateNum, editRateDen;  // EditUnit is editRateDen/editRateNum seconds
    uint32_t activeLines;
    uint32_t activePixels;
    std::string aspectRatio;   // "4:3" or "16:9"
    bool dv;                   // DV-family essence
    bool avclip;               // self-contained clip in CONTENTS/AVCLIP
    bool longGOP;              // AVC-Strand
    bool companionXML;         // an AVCLIP clip that also has a CLIP XML
    int codecClass;            // Codec@Class (megabits), 0 to leave it out
};

const std::vector<CardFamily>& cardFamilies();
const CardFamily* cardFamilyNamed(const std::string& name);
