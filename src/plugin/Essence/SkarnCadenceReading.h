// Reading a clip's pulldown cadence from its first frames: which frames are
// repeats, and where in the cadence the clip's first frame falls. Both the
// format reader (probing the essence file) and the ingest object (pulling
// through its video reader) read a cadence this way; they differ only in how
// a frame is pulled and in the log category.
#pragma once

#include "SkarnPulldown.h"

#include <cstdint>
#include <functional>

struct SkarnCadenceReading {
    bool attempted = false;  // the rates call for a reading (half rate, 24 in 30 or 60)
    bool pullFailed = false; // a pull failed before the reading was complete
    uint8_t pattern = 0;     // keep (1) / drop (0) bits read or concluded, first frame highest
    uint8_t length = 0;      // 2 or 5 when attempted
    uint8_t index = 0;
    uint32_t framesClassified = 0;
    // The table row concluded; nullptr when nothing known was read (a failed
    // pull, an unknown sequence number, five frames of no known cadence).
    const SkarnCadence* cadence = nullptr;
};

// One frame. 0 with *delivered set (a kept frame came), *dropped set (a repeat
// came) or neither (no frame this time, try the next); any other status ends
// the reading. *sequence is the frame's place in a 24-in-30 cadence.
using SkarnCadencePull = std::function<int32_t(bool* delivered, bool* dropped, uint32_t* sequence)>;

// frameQuanta: the recording rate as an integer (24, 25, 30, 50, 60);
// shootingRate: the whole shooting rate; sourceFormat: the clip's codec code
// (720p DVCPRO HD reads its cadence from keep marks, not sequence numbers).
// Logs every step under logMask. Never pulls more than a bounded number of
// frames, whatever the pull answers.
SkarnCadenceReading SkarnReadCadence(uint32_t frameQuanta, uint32_t shootingRate, FourCharCode sourceFormat,
                                     uint32_t logMask, const SkarnCadencePull& pull);
