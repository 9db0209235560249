// Dates of the clip metadata. A clip date is the moment a normalised text
// "YYYY-MM-DD hh:mm:ss +hhmm" names, kept with that text; its time zone is a
// separate object because the clip builds it from the original text by its own
// (slightly different) rule.
#pragma once

#include "Object.h"
#include "Value.h"

#include <cstdint>
#include <optional>
#include <string>

class SkarnDate : public Object {
public:
    // The date "YYYY-MM-DD hh:mm:ss +hhmm" names (fields range-checked); nil
    // when the text is not of that form.
    static Ref<SkarnDate> dateFromString(const std::string& text);

    const std::string& text() const { return _text; }
    int64_t secondsSince1970() const { return _secondsSince1970; }
    // The offset the text itself states.
    int32_t secondsFromGMT() const { return _secondsFromGMT; }
    std::string description() const override { return _text; }

private:
    SkarnDate(std::string text, int64_t seconds, int32_t offset)
        : _text(std::move(text)), _secondsSince1970(seconds), _secondsFromGMT(offset) {}
    std::string _text;
    int64_t _secondsSince1970;
    int32_t _secondsFromGMT;
};

class SkarnTimeZone : public Object {
public:
    // Nil beyond eighteen hours either way, as the platform refuses those.
    static Ref<SkarnTimeZone> timeZoneForSecondsFromGMT(int64_t seconds);
    int32_t secondsFromGMT() const { return _secondsFromGMT; }
    // "GMT+0530" style.
    std::string name() const;
    std::string description() const override { return name(); }

private:
    explicit SkarnTimeZone(int32_t seconds) : _secondsFromGMT(seconds) {}
    int32_t _secondsFromGMT;
};

// The formatter the clip hands the host for date properties: the platform's
// short date style ("M/D/YY"), in the date's own zone.
class SkarnDateFormatter : public Object {
public:
    enum Style : int32_t { NoStyle = 0, ShortStyle = 1 };
    static Ref<SkarnDateFormatter> shortDateFormatter();
    Style dateStyle() const { return _dateStyle; }
    Style timeStyle() const { return NoStyle; }
    // Nil for anything but a SkarnDate.
    std::optional<std::string> stringForObjectValue(const Value& value) const;

private:
    explicit SkarnDateFormatter(Style s) : _dateStyle(s) {}
    Style _dateStyle;
};
