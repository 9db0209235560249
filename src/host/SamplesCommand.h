// skarn samples: walks one track's sample cursor in decode order and lists
// where each sample lies, as an application reading the media would.
#pragma once

#include "HostSession.h"

#include <CLI/CLI.hpp>

#include <cstdint>
#include <string>

class ClipTracks;
class OutputBuffer;

class SamplesCommand {
public:
    CLI::App* addTo(CLI::App& app);
    int run(HostSession& host);

private:
    // Where the walk starts, from --from; false with a printed line when the
    // text is not a time or lies past the track's end.
    bool startTime(ClipTracks& clip, CMTime* pts);
    int walk(ClipTracks& clip, OutputBuffer& out);

    std::string _clip;
    int64_t _track = 0;
    std::string _from;
    int64_t _count = -1;
    bool _asJSON = false;
};
