#include "IngestCommand.h"

#include "AssertionHandler.h"
#include "ClipIngest.h"
#include "FileSystem.h"
#include "Progress.h"
#include "ValueJSON.h"

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using json = nlohmann::ordered_json;

// Soft assertions of the plug-in end the clip, with the one error line the
// host prints, instead of a report of their own.
class QuietAssertionHandler : public AssertionHandler {
public:
    void handleFailureInMethod(const std::string& method, const std::string& file, int line,
                               const std::string& description) override {
        throw AssertionFailure(method, file, line, description);
    }
    void handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                 const std::string& description) override {
        throw AssertionFailure(function, file, line, description);
    }
};

struct Job {
    Ref<VestaKilnClipDataSourceProtocol> clip;
    std::string name;  // the clip file's base name, which names the movie
    std::string card;
    std::string output;
};

void onInterrupt(int) { ClipIngest::requestStop(); }

std::string realPath(const std::string& p) {
    char* r = ::realpath(p.c_str(), nullptr);
    if (!r) return p;
    std::string s = r;
    std::free(r);
    return s;
}

bool makeDirectories(const std::string& path) {
    if (path.empty() || FileSystem::isDirectory(path)) return true;
    std::string parent = FileSystem::stringByDeletingLastPathComponent(path);
    if (parent != path && !makeDirectories(parent)) return false;
    return ::mkdir(path.c_str(), 0755) == 0 || errno == EEXIST;
}

bool isInside(const std::string& path, const std::string& folder) {
    std::string f = realPath(folder);
    return path == f || path.rfind(f + "/", 0) == 0;
}

std::string clipBaseName(VestaKilnClipDataSourceProtocol& clip) {
    std::string path = clip.valueForKey("path").string();
    std::string base = FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(path));
    return base.empty() ? clip.clipID().value_or("clip") : base;
}

std::string megabytes(uint64_t bytes) {
    char text[32];
    std::snprintf(text, sizeof text, "%.1f MB", double(bytes) / 1e6);
    return text;
}

}  // namespace

IngestCommand::IngestCommand(CLI::App& app) {
    _command = app.add_subcommand("ingest", "Write clips as QuickTime movies (the card's codec, timecode and audio)");
    _command->add_option("CLIP", _inputs,
                         "Clips (CONTENTS/CLIP/NAME.XML, CONTENTS/AVCLIP/NAME.MXF or CARD:NAME) or whole cards")
        ->required();
    _command->add_option("-o,--output", _output, "The movie (one clip) or the folder for the movies")->required();
    _command->add_option("--in", _inPoint, "Start at this timecode of the clip (HH:MM:SS:FF)");
    _command->add_option("--out", _outPoint, "End before this timecode of the clip");
    _command->add_option("--audio", _audio, "One mono track per channel, or one multichannel track")
        ->check(CLI::IsMember({"mono", "multi"}))
        ->capture_default_str();
    _command->add_flag("--force", _force, "Overwrite existing movies");
    _command->add_flag("--json", _json, "Print a JSON array, one entry per clip");
}

bool IngestCommand::chosen() const { return _command && _command->parsed(); }

int IngestCommand::run(HostSession& host) {
    QuietAssertionHandler quiet;
    AssertionHandler* previousHandler = AssertionHandler::setCurrentHandler(&quiet);
    struct Restore {
        AssertionHandler* handler;
        ~Restore() { AssertionHandler::setCurrentHandler(handler); }
    } restore{previousHandler};

    int failures = 0;
    std::vector<Job> jobs;
    bool anyCard = false;
    for (const std::string& input : _inputs) {
        if (FileSystem::isDirectory(input)) {
            anyCard = true;
            auto clips = host.clipsOfCard(input);
            if (!clips) {
                ++failures;
                continue;
            }
            std::vector<Job> ofCard;
            for (const auto& clip : *clips) ofCard.push_back({clip, clipBaseName(*clip), input, ""});
            std::sort(ofCard.begin(), ofCard.end(), [](const Job& a, const Job& b) { return a.name < b.name; });
            jobs.insert(jobs.end(), ofCard.begin(), ofCard.end());
            continue;
        }
        Ref<VestaKilnClipDataSourceProtocol> clip = host.findClip(input);
        if (!clip) {
            ++failures;
            continue;
        }
        auto card = HostSession::cardForClipFile(clip->valueForKey("path").string());
        jobs.push_back({clip, clipBaseName(*clip), card.value_or(""), ""});
    }

    // One movie: the output names it, unless it is a folder.
    const bool toFolder = jobs.size() + size_t(failures) > 1 || anyCard || FileSystem::isDirectory(_output) ||
                          (!_output.empty() && _output.back() == '/');
    if (toFolder && !makeDirectories(_output)) {
        hostError(_output + ": cannot create the folder: " + std::strerror(errno));
        return 1;
    }
    std::set<std::string> taken;
    for (Job& job : jobs) {
        job.output = toFolder ? FileSystem::stringByAppendingPathComponent(_output, job.name + ".mov") : _output;
        if (job.output.size() > 1 && job.output.back() == '/') job.output.pop_back();
    }

    ClipIngest::Options options;
    if (!_inPoint.empty()) options.inPoint = _inPoint;
    if (!_outPoint.empty()) options.outPoint = _outPoint;
    options.multichannelAudio = _audio == "multi";

    auto previousInterrupt = std::signal(SIGINT, onInterrupt);
    Progress progress(::isatty(STDERR_FILENO) != 0);
    json out = json::array();
    std::vector<ClipIngest::Report> reports;
    for (const Job& job : jobs) {
        ClipIngest::Report report;
        report.clip = job.name;
        report.output = job.output;
        const std::string folder = realPath(FileSystem::stringByDeletingLastPathComponent(
            job.output.find('/') == std::string::npos ? "./" + job.output : job.output));
        if (!job.card.empty() && isInside(folder, job.card)) {
            report.error = job.output + " lies on the card, which is only ever read";
        } else if (!taken.insert(folder + "/" + FileSystem::lastPathComponent(job.output)).second) {
            report.error = job.output + " is the movie of another clip of this run";
        } else if (FileSystem::isDirectory(job.output)) {
            report.error = job.output + " is a folder";
        } else if (FileSystem::fileExists(job.output) && !_force) {
            report.error = job.output + " exists (--force overwrites it)";
        } else {
            ClipIngest ingest(*job.clip, job.name, options);
            progress.begin(job.name);
            report = ingest.run(job.output, [&](int64_t done, int64_t total, uint64_t bytes) {
                progress.update(done, total, bytes);
            });
            progress.end();
        }
        if (!report.ok) {
            ++failures;
            hostError(job.name + ": " + report.error);
        }
        if (_json) {
            json j;
            j["clip"] = report.clip;
            j["output"] = report.output;
            if (!report.ok) {
                j["error"] = report.error;
            } else {
                j["frames"] = report.frames;
                j["audioChannels"] = report.audioChannels;
                j["audioSamples"] = report.audioSamples;
                j["bytes"] = report.bytes;
                j["seconds"] = report.seconds;
                j["startTimecode"] = report.startTimecode;
                j["frameRate"] = report.frameRate;
                j["cadence"] = report.cadence;
            }
            out.push_back(j);
        }
        reports.push_back(report);
        if (ClipIngest::stopRequested()) break;
    }
    std::signal(SIGINT, previousInterrupt);

    if (_json) {
        std::cout << jsonText(out, 2) << "\n";
    } else if (std::any_of(reports.begin(), reports.end(), [](const auto& r) { return r.ok; })) {
        std::printf("%-10s %-12s %7s %-14s %10s %8s  %-12s %-11s %s\n", "CLIP", "START", "FRAMES", "AUDIO", "SIZE",
                    "TIME", "RATE", "CADENCE", "MOVIE");
        for (const auto& r : reports) {
            if (!r.ok) {
                std::printf("%-10s %-12s %7s %-14s %10s %8s  %-12s %-11s %s\n", r.clip.c_str(), "-", "-", "-", "-",
                            "-", "-", "-", "FAILED");
                continue;
            }
            std::string audio = r.audioChannels ? std::to_string(r.audioChannels) + " x " +
                                                      std::to_string(r.audioSamples)
                                                : "none";
            char seconds[32];
            std::snprintf(seconds, sizeof seconds, "%.2fs", r.seconds);
            std::printf("%-10s %-12s %7lld %-14s %10s %8s  %-12s %-11s %s\n", r.clip.c_str(), r.startTimecode.c_str(),
                        (long long)r.frames, audio.c_str(), megabytes(r.bytes).c_str(), seconds, r.frameRate.c_str(),
                        r.cadence.c_str(), r.output.c_str());
        }
    }
    if (ClipIngest::stopRequested()) return 130;
    return failures > 0 ? 1 : 0;
}
