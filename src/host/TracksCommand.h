// skarn tracks: a clip's tracks as its format reader presents them to a host.
#pragma once

#include "HostSession.h"

#include <CLI/CLI.hpp>

#include <string>

class TracksCommand {
public:
    CLI::App* addTo(CLI::App& app);
    int run(HostSession& host);

private:
    std::string _clip;
    bool _asJSON = false;
};
