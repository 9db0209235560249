#include "HostText.h"

std::string fourCharText(FourCharCode code) {
    if (code == 0) return "-";
    char chars[4] = {char(code >> 24), char(code >> 16), char(code >> 8), char(code)};
    for (char c : chars)
        if (c < 0x20 || c >= 0x7f) {
            char hex[16];
            std::snprintf(hex, sizeof hex, "0x%08x", code);
            return hex;
        }
    return std::string(chars, 4);
}

std::string timeText(CMTime time) {
    if (!CMTIME_IS_NUMERIC(time)) return "-";
    return std::to_string(time.value) + "/" + std::to_string(time.timescale);
}

nlohmann::ordered_json timeJSON(CMTime time) {
    if (!CMTIME_IS_NUMERIC(time)) return nullptr;
    return nlohmann::ordered_json::array({time.value, time.timescale});
}

void writeTimeJSON(OutputBuffer& out, CMTime time) {
    if (!CMTIME_IS_NUMERIC(time)) {
        out << std::string_view("null");
        return;
    }
    out << '[' << int64_t(time.value) << ',' << int64_t(time.timescale) << ']';
}
