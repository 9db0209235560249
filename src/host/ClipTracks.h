// A clip's tracks as a host holds them while it reads media: the clip, the
// format reader the clip hands out, its track readers, and how the tracks'
// sample locations become positions in files.
#pragma once

#include "CMTime.h"
#include "HostSession.h"

#include <cstdint>
#include <string>
#include <vector>

class ClipTracks {
public:
    // Finds the clip and builds its format reader. false (with one printed
    // line naming the clip) when the clip is not found, hands out no reader,
    // the reader has no tracks, or the video file is not there.
    bool open(HostSession& host, const std::string& clipArg);

    // The clip as the user named it, for messages.
    const std::string& clipName() const { return _clipArg; }
    VestaKilnClipDataSourceProtocol& clip() { return *_clip; }
    VestaKilnFormatReaderProtocol& formatReader() { return *_formatReader; }
    const std::vector<Ref<VestaKilnTrackReaderProtocol>>& tracks() const { return _tracks; }
    bool selfContained() const { return _selfContained; }

    // A location a cursor of `track` answered, as a position in the track's file.
    // Saturates rather than wrap on numbers no file has.
    int64_t filePosition(VestaKilnTrackReaderProtocol& track, int64_t location) const {
        return _selfContained ? location : saturatingAdd(track.locationOffset(), location);
    }
    static int64_t saturatingAdd(int64_t a, int64_t b) {
        int64_t sum = 0;
        if (__builtin_add_overflow(a, b, &sum)) return a < 0 ? INT64_MIN : INT64_MAX;
        return sum;
    }

    // "CLIP: text" on stderr.
    void error(const std::string& text) const;

private:
    std::string _clipArg;
    Ref<VestaKilnClipDataSourceProtocol> _clip;
    Ref<VestaKilnFormatReaderProtocol> _formatReader;
    std::vector<Ref<VestaKilnTrackReaderProtocol>> _tracks;
    bool _selfContained = false;
};
