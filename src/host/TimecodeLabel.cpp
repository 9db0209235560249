#include "TimecodeLabel.h"

#include <cstdio>

namespace {

// Drop-frame counting skips this many frame numbers at the start of every
// minute except each tenth: 2 at 30, 4 at 60.
int64_t droppedPerMinute(unsigned base) { return base / 15; }

bool dropCapable(unsigned base, bool dropFrame) { return dropFrame && base % 30 == 0 && base > 0; }

}  // namespace

int64_t TimecodeLabel::framesPerDay(unsigned base, bool dropFrame) {
    int64_t nominal = int64_t(base) * 86400;
    if (!dropCapable(base, dropFrame)) return nominal;
    return nominal - droppedPerMinute(base) * (24 * 60 - 24 * 6);
}

std::optional<int64_t> TimecodeLabel::frames(const std::string& label, unsigned base, bool dropFrame) {
    if (base == 0 || base > 255) return std::nullopt;
    unsigned field[4] = {0, 0, 0, 0};
    size_t at = 0;
    for (int i = 0; i < 4; ++i) {
        if (i > 0) {
            if (at >= label.size() || (label[at] != ':' && label[at] != ';' && label[at] != '.')) return std::nullopt;
            ++at;
        }
        size_t digits = 0;
        while (at < label.size() && label[at] >= '0' && label[at] <= '9' && digits < 3) {
            field[i] = field[i] * 10 + unsigned(label[at] - '0');
            ++at;
            ++digits;
        }
        if (digits == 0 || digits > 2) return std::nullopt;
    }
    if (at != label.size()) return std::nullopt;
    const unsigned hh = field[0], mm = field[1], ss = field[2], ff = field[3];
    if (hh > 23 || mm > 59 || ss > 59 || ff >= base) return std::nullopt;
    int64_t count = (int64_t(hh) * 3600 + int64_t(mm) * 60 + ss) * base + ff;
    if (dropCapable(base, dropFrame)) {
        const int64_t d = droppedPerMinute(base);
        if (ss == 0 && mm % 10 != 0 && ff < d) return std::nullopt;
        const int64_t minutes = int64_t(hh) * 60 + mm;
        count -= d * (minutes - minutes / 10);
    }
    return count;
}

std::string TimecodeLabel::label(int64_t frames, unsigned base, bool dropFrame) {
    if (base == 0) return "00:00:00:00";
    const bool drop = dropCapable(base, dropFrame);
    const int64_t day = framesPerDay(base, dropFrame);
    frames %= day;
    if (frames < 0) frames += day;
    if (drop) {
        const int64_t d = droppedPerMinute(base);
        const int64_t perTen = int64_t(base) * 600 - 9 * d;
        const int64_t perMinute = int64_t(base) * 60 - d;
        const int64_t tens = frames / perTen, rest = frames % perTen;
        frames += 9 * d * tens + (rest > d ? d * ((rest - d) / perMinute) : 0);
    }
    const int64_t ff = frames % base, seconds = frames / base;
    char text[64];
    std::snprintf(text, sizeof text, "%02lld:%02lld:%02lld%c%02lld", (long long)(seconds / 3600),
                  (long long)(seconds / 60 % 60), (long long)(seconds % 60), drop ? ';' : ':', (long long)ff);
    return text;
}
