#include "CardFamily.h"

const std::vector<CardFamily>& cardFamilies() {
    // Field rates carry "i": the clip's nominal rate halves them (59.94i is 30 frames).
    static const std::vector<CardFamily> families = {
        {"dv-ntsc", 1, "DV25_411", 120000, "59.94i", 30000, 1001, 480, 720, "4:3", true, false, false, false, 25},
        {"dv-pal", 2, "DV25_420", 144000, "50i", 25, 1, 576, 720, "4:3", true, false, false, false, 25},
        {"dvcpro-pal", 8, "DV25_411", 144000, "50i", 25, 1, 576, 720, "4:3", true, false, false, false, 25},
        {"dvcpro50-ntsc", 9, "DV50_422", 240000, "59.94i", 30000, 1001, 480, 720, "16:9", true, false, false, false, 50},
        {"dvcpro50-pal", 10, "DV50_422", 288000, "50i", 25, 1, 576, 720, "4:3", true, false, false, false, 50},
        {"dvcprohd-720p60", 11, "DV100_720/59.94p", 240000, "59.94p", 60000, 1001, 720, 1280, "16:9", true, false, false, false, 100},
        {"dvcprohd-720p50", 12, "DV100_720/50p", 288000, "50p", 50, 1, 720, 1280, "16:9", true, false, false, false, 100},
        {"dvcprohd-1080i60", 13, "DV100_1080/59.94i", 480000, "59.94i", 30000, 1001, 1080, 1920, "16:9", true, false, false, false, 100},
        {"dvcprohd-1080i50", 14, "DV100_1080/50i", 576000, "50i", 25, 1, 1080, 1920, "16:9", true, false, false, false, 100},
        {"avci-720p24", 15, "AVC-I_720/59.94p", 236032, "23.98p", 24000, 1001, 720, 1280, "16:9", false, false, false, false, 100},
        {"avci-720p25", 16, "AVC-I_720/50p", 284160, "25p", 25, 1, 720, 1280, "16:9", false, false, false, false, 100},
        {"avci-720p30", 17, "AVC-I_720/59.94p", 236032, "29.97p", 30000, 1001, 720, 1280, "16:9", false, false, false, false, 100},
        {"avci-720p50", 18, "AVC-I_720/50p", 284160, "50p", 50, 1, 720, 1280, "16:9", false, false, false, false, 100},
        {"avci-720p60", 19, "AVC-I_720/59.94p", 236032, "59.94p", 60000, 1001, 720, 1280, "16:9", false, false, false, false, 100},
        {"avci-1080p24", 20, "AVC-I_1080/29.97p", 472064, "23.98p", 24000, 1001, 1080, 1920, "16:9", false, false, false, false, 100},
        {"avci-1080p25", 21, "AVC-I_1080/25p", 568320, "25p", 25, 1, 1080, 1920, "16:9", false, false, false, false, 100},
        {"avci-1080p30", 22, "AVC-I_1080/29.97p", 472064, "29.97p", 30000, 1001, 1080, 1920, "16:9", false, false, false, false, 100},
        {"avci-1080p50", 23, "AVC-I_1080/25p", 568320, "50p", 50, 1, 1080, 1920, "16:9", false, false, false, false, 100},
        {"avci-1080p60", 24, "AVC-I_1080/29.97p", 472064, "59.94p", 60000, 1001, 1080, 1920, "16:9", false, false, false, false, 100},
        {"avci-1080i50", 25, "AVC-I_1080/50i", 568320, "50i", 25, 1, 1080, 1920, "16:9", false, false, false, false, 100},
        {"avci-1080i60", 26, "AVC-I_1080/59.94i", 472064, "59.94i", 30000, 1001, 1080, 1920, "16:9", false, false, false, false, 100},
        // Self-contained clips. Their header XML has no EssenceList codec, so a
        // reader takes them as AVC-Intra 1080i60 unless a CLIP XML says more.
        {"avclip-intra", 26, "AVC-I_1080/59.94i", 472064, "59.94i", 30000, 1001, 1080, 1920, "16:9", false, true, false, false, 100},
        {"avclip-strand422", 5, "AVC-Strand422", 200000, "59.94i", 30000, 1001, 1080, 1920, "16:9", false, true, true, true, 0},
        {"avclip-strand420", 4, "AVC-Strand420", 200000, "59.94i", 30000, 1001, 1080, 1920, "16:9", false, true, true, true, 0},
    };
    return families;
}

const CardFamily* cardFamilyNamed(const std::string& name) {
    for (const auto& f : cardFamilies())
        if (f.name == name) return &f;
    return nullptr;
}
