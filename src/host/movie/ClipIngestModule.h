// `skarn ingest` writes movies through the FFmpeg libraries, whose loading
// (well over a hundred shared libraries) costs more than most commands take
// to run. So the movie half of the host is a module of its own, SkarnMovie.so
// beside the program, loaded only when a clip is ingested.
#pragma once

#include "VestaKilnProtocols.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

struct ClipIngestOptions {
    std::optional<std::string> inPoint, outPoint;  // timecode labels of the clip
    bool multichannelAudio = false;
};

struct ClipIngestReport {
    std::string clip, output;
    bool ok = false;
    std::string error;  // "frame N (TIMECODE): cause" when not ok
    int64_t frames = 0;
    unsigned audioChannels = 0;
    int64_t audioSamples = 0;  // per channel
    uint64_t bytes = 0;
    double seconds = 0;
    std::string startTimecode;
    std::string frameRate;  // "30000/1001"
    std::string cadence;    // "24 in 29.97" when one was removed, else "none"
};

// Frames of the clip done so far and in all, and bytes written.
using ClipIngestProgress = std::function<void(int64_t done, int64_t total, uint64_t bytes)>;

class ClipIngestModule {
public:
    // One clip into the movie DESTINATION (see ClipIngest).
    virtual ClipIngestReport ingest(VestaKilnClipDataSourceProtocol& clip, const std::string& name,
                                    const ClipIngestOptions& options, const std::string& destination,
                                    const ClipIngestProgress& progress) = 0;
    // Asks every running ingest to stop at its next media request; safe in a
    // signal handler.
    virtual void requestStop() = 0;
    virtual bool stopRequested() = 0;

protected:
    ~ClipIngestModule() = default;
};

// The module's one exported symbol: its ingest, alive as long as the process.
extern "C" ClipIngestModule* SkarnMovieModule();
inline constexpr const char* kSkarnMovieModuleSymbol = "SkarnMovieModule";
