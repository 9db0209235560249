// Timecode labels as cards write them ("HH:MM:SS:FF", with ";" before the
// frames when the count is drop-frame) and their frame counts at the
// timecode's integer base (30 for 29.97, 60 for 59.94, 24, 25, 50).
#pragma once

#include <cstdint>
#include <optional>
#include <string>

class TimecodeLabel {
public:
    // nullopt for text that is not a label, a field out of range, or a
    // drop-frame label that names a dropped frame number. The separator before
    // the frames may be ":" or ";" either way: the clip decides the counting.
    static std::optional<int64_t> frames(const std::string& label, unsigned base, bool dropFrame);
    // Counts past 24 hours wrap.
    static std::string label(int64_t frames, unsigned base, bool dropFrame);
    // Frames in 24 hours at the base.
    static int64_t framesPerDay(unsigned base, bool dropFrame);
};
