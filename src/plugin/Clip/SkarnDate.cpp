#include "SkarnDate.h"

#include <cstdio>
#include <cstdlib>

namespace {

bool digits(const std::string& s, size_t at, size_t n, int& out) {
    if (at + n > s.size()) return false;
    int v = 0;
    for (size_t i = at; i < at + n; ++i) {
        if (s[i] < '0' || s[i] > '9') return false;
        v = v * 10 + (s[i] - '0');
    }
    out = v;
    return true;
}

// Days from 1970-01-01 to a civil date (proleptic Gregorian).
int64_t daysFromCivil(int64_t y, unsigned m, unsigned d) {
    y -= m <= 2;
    const int64_t era = (y >= 0 ? y : y - 399) / 400;
    const unsigned yoe = unsigned(y - era * 400);
    const unsigned doy = (153 * (m + (m > 2 ? -3 : 9)) + 2) / 5 + d - 1;
    const unsigned doe = yoe * 365 + yoe / 4 - yoe / 100 + doy;
    return era * 146097 + int64_t(doe) - 719468;
}

void civilFromDays(int64_t z, int& y, unsigned& m, unsigned& d) {
    z += 719468;
    const int64_t era = (z >= 0 ? z : z - 146096) / 146097;
    const unsigned doe = unsigned(z - era * 146097);
    const unsigned yoe = (doe - doe / 1460 + doe / 36524 - doe / 146096) / 365;
    const unsigned doy = doe - (365 * yoe + yoe / 4 - yoe / 100);
    const unsigned mp = (5 * doy + 2) / 153;
    d = doy - (153 * mp + 2) / 5 + 1;
    m = mp < 10 ? mp + 3 : mp - 9;
    y = int(int64_t(yoe) + era * 400 + (m <= 2));
}

bool isLeap(int y) { return (y % 4 == 0 && y % 100 != 0) || y % 400 == 0; }

}  // namespace

Ref<SkarnDate> SkarnDate::dateFromString(const std::string& s) {
    // "YYYY-MM-DD hh:mm:ss +hhmm": 25 characters exactly.
    if (s.size() != 25 || s[4] != '-' || s[7] != '-' || s[10] != ' ' || s[13] != ':' || s[16] != ':' ||
        s[19] != ' ' || (s[20] != '+' && s[20] != '-'))
        return nullptr;
    int year, month, day, hour, minute, second, zh, zm;
    if (!digits(s, 0, 4, year) || !digits(s, 5, 2, month) || !digits(s, 8, 2, day) || !digits(s, 11, 2, hour) ||
        !digits(s, 14, 2, minute) || !digits(s, 17, 2, second) || !digits(s, 21, 2, zh) || !digits(s, 23, 2, zm))
        return nullptr;
    static const int kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
    if (month < 1 || month > 12) return nullptr;
    int maxDay = kDays[month - 1] + (month == 2 && isLeap(year) ? 1 : 0);
    if (day < 1 || day > maxDay || hour > 23 || minute > 59 || second > 59 || zh > 18 || zm > 59) return nullptr;
    const int32_t offset = (s[20] == '-' ? -1 : 1) * (zh * 3600 + zm * 60);
    const int64_t local = daysFromCivil(year, unsigned(month), unsigned(day)) * 86400 + hour * 3600 + minute * 60 + second;
    return Ref<SkarnDate>(new SkarnDate(s, local - offset, offset));
}

Ref<SkarnTimeZone> SkarnTimeZone::timeZoneForSecondsFromGMT(int64_t seconds) {
    if (seconds > 18 * 3600 || seconds < -18 * 3600) return nullptr;
    return Ref<SkarnTimeZone>(new SkarnTimeZone(int32_t(seconds)));
}

std::string SkarnTimeZone::name() const {
    const int32_t a = std::abs(_secondsFromGMT);
    char buf[16];
    std::snprintf(buf, sizeof buf, "GMT%c%02d%02d", _secondsFromGMT < 0 ? '-' : '+', a / 3600, (a % 3600) / 60);
    return buf;
}

Ref<SkarnDateFormatter> SkarnDateFormatter::shortDateFormatter() {
    return Ref<SkarnDateFormatter>(new SkarnDateFormatter(ShortStyle));
}

std::optional<std::string> SkarnDateFormatter::stringForObjectValue(const Value& value) const {
    auto* date = dynamic_cast<const SkarnDate*>(value.object().get());
    if (!date) return std::nullopt;
    int y;
    unsigned m, d;
    const int64_t local = date->secondsSince1970() + date->secondsFromGMT();
    int64_t days = local >= 0 ? local / 86400 : -((-local + 86399) / 86400);
    civilFromDays(days, y, m, d);
    char buf[32];
    std::snprintf(buf, sizeof buf, "%u/%u/%02d", m, d, ((y % 100) + 100) % 100);
    return std::string(buf);
}
