// "skarn ingest": clips of a card into QuickTime movies, one per clip, with
// the card's codec, timecode and every audio channel.
#pragma once

#include "HostSession.h"

#include <string>
#include <vector>

namespace CLI {
class App;
}

class IngestCommand {
public:
    // Registers the subcommand.
    explicit IngestCommand(CLI::App& app);
    bool chosen() const;
    // 0 when every clip became a movie.
    int run(HostSession& host);

private:
    CLI::App* _command = nullptr;
    std::vector<std::string> _inputs;
    std::string _output;
    std::string _inPoint, _outPoint;
    std::string _audio = "mono";
    bool _force = false;
    bool _json = false;
};
