#include "HostSession.h"

#include "AssertionHandler.h"
#include "FileSystem.h"
#include "LogSink.h"

#include <cstdio>
#include <cstdlib>
#include <dlfcn.h>
#include <mutex>
#include <set>
#include <unistd.h>

namespace {

std::string programFolder() {
    char buf[4096];
    ssize_t n = ::readlink("/proc/self/exe", buf, sizeof buf - 1);
    if (n <= 0) return ".";
    buf[n] = 0;
    return FileSystem::stringByDeletingLastPathComponent(buf);
}

std::string findBundle(const std::string& option) {
    if (!option.empty()) return option;
    if (const char* env = std::getenv("SKARN_BUNDLE"); env && *env) return env;
    for (const std::string& candidate :
         {programFolder() + "/Skarn.kilnplugin", programFolder() + "/../lib/skarn/Skarn.kilnplugin"})
        if (FileSystem::isDirectory(candidate)) return candidate;
    return SKARN_BUILD_BUNDLE_DIR;
}

ClipIngestModule* loadMovieModule() {
    std::string tried;
    for (const std::string& candidate : {programFolder() + "/SkarnMovie.so",
                                         programFolder() + "/../lib/skarn/SkarnMovie.so",
                                         std::string(SKARN_BUILD_MOVIE_MODULE)}) {
        if (!FileSystem::fileExists(candidate)) continue;
        void* handle = ::dlopen(candidate.c_str(), RTLD_NOW | RTLD_LOCAL);
        if (!handle) {
            const char* why = ::dlerror();
            hostError(candidate + ": cannot load the movie module: " + (why ? why : "unknown error"));
            return nullptr;
        }
        auto entry = reinterpret_cast<ClipIngestModule* (*)()>(::dlsym(handle, kSkarnMovieModuleSymbol));
        if (!entry) {
            hostError(candidate + ": not a movie module (no " + kSkarnMovieModuleSymbol + ")");
            return nullptr;
        }
        return entry();
    }
    hostError(std::string("SkarnMovie.so: the movie module is missing beside the program (") + programFolder() + ")");
    return nullptr;
}

std::string realPath(const std::string& p) {
    char* r = ::realpath(p.c_str(), nullptr);
    if (!r) return p;
    std::string s = r;
    std::free(r);
    return s;
}

}  // namespace

void hostError(const std::string& text) { std::fprintf(stderr, "skarn: %s\n", text.c_str()); }

namespace {

// A damaged index makes the plug-in note the same fault for every sample it
// touches, hundreds of thousands of times: each line is said once per
// subject. Past the bound (only reached with the plug-in's debug levels on)
// lines pass unfiltered rather than growing the set.
constexpr size_t kMaxRememberedLogLines = 4096;

struct LogState {
    std::mutex lock;
    std::string subject = "plug-in";
    std::set<std::string> said;
};

LogState& logState() {
    static LogState* state = new LogState;  // outlives threads still logging at exit
    return *state;
}

void writeLogLine(const std::string& line) {
    LogState& s = logState();
    std::lock_guard<std::mutex> guard(s.lock);
    std::string text = line;
    while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
    if (s.said.size() < kMaxRememberedLogLines) {
        if (!s.said.insert(text).second) return;
    } else if (s.said.count(text)) {
        return;
    }
    std::fprintf(stderr, "skarn: %s: %s\n", s.subject.c_str(), text.c_str());
}

}  // namespace

ClipIngestModule* HostSession::movieModule() {
    static ClipIngestModule* module = loadMovieModule();
    return module;
}

void setLogSubject(const std::string& subject) {
    LogState& s = logState();
    std::lock_guard<std::mutex> guard(s.lock);
    if (s.subject == subject) return;
    s.subject = subject;
    s.said.clear();
}

bool HostSession::open(const std::string& bundleOption) {
    setLogSink(writeLogLine);
    std::string path = findBundle(bundleOption);
    std::string error;
    _loader = VestaBundleLoader::loadBundle(path, &error);
    if (!_loader) {
        hostError(error);
        return false;
    }
    _plugin = _loader->firstPlugin();
    if (!_plugin) {
        hostError(path + ": the bundle hands out no plug-in for its identifier");
        return false;
    }
    _plugin->initialize();
    _plugin->setNotificationCenter(NotificationCenter::notificationCenter());
    _plugin->activate();
    return true;
}

std::optional<std::string> HostSession::cardForClipFile(const std::string& clipFile) {
    std::string folder = FileSystem::stringByDeletingLastPathComponent(realPath(clipFile));  // CLIP or AVCLIP
    std::string contents = FileSystem::stringByDeletingLastPathComponent(folder);
    if (!FileSystem::caseInsensitiveEqual(FileSystem::lastPathComponent(contents), "CONTENTS")) return std::nullopt;
    return FileSystem::stringByDeletingLastPathComponent(contents);
}

std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>> HostSession::clipsOfCard(const std::string& card) {
    setLogSubject(card);
    if (!FileSystem::isDirectory(card)) {
        hostError(card + ": no such folder");
        return std::nullopt;
    }
    if (!_plugin->pathIsValidVolume(card)) {
        hostError(card + ": not a Skarn card (no CONTENTS folder with CLIP, VIDEO, AUDIO and ICON, or AVCLIP)");
        return std::nullopt;
    }
    Value error;
    Ref<VestaKilnVolumeDataSourceProtocol> volume = _plugin->volumeWithPath(card, &error);
    if (!volume) {
        hostError(card + ": the plug-in made no volume for it");
        return std::nullopt;
    }
    auto clips = _plugin->clipsForVolume(volume.get());
    if (!clips) {
        hostError(card + ": no clip could be read from the card");
        return std::nullopt;
    }
    return clips;
}

Ref<VestaKilnClipDataSourceProtocol> HostSession::findClip(const std::string& clipArg) {
    setLogSubject(clipArg);
    std::string card, wanted, wantedPath;
    size_t colon = clipArg.rfind(':');
    if (colon != std::string::npos && colon > 0 && !FileSystem::fileExists(clipArg)) {
        card = clipArg.substr(0, colon);
        wanted = clipArg.substr(colon + 1);
    } else {
        if (!FileSystem::fileExists(clipArg)) {
            hostError(clipArg + ": no such clip file (give CONTENTS/CLIP/NAME.XML, CONTENTS/AVCLIP/NAME.MXF or CARD:NAME)");
            return nullptr;
        }
        auto c = cardForClipFile(clipArg);
        if (!c) {
            hostError(clipArg + ": not inside a card's CONTENTS folder");
            return nullptr;
        }
        card = *c;
        wantedPath = realPath(clipArg);
    }
    auto clips = clipsOfCard(card);
    if (!clips) return nullptr;
    setLogSubject(clipArg);
    for (const auto& clip : *clips) {
        std::string path = clip->valueForKey("path").string();
        if (!wantedPath.empty()) {
            if (!path.empty() && realPath(path) == wantedPath) return clip;
            continue;
        }
        std::string base = FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(path));
        if (base == wanted || clip->clipID() == wanted) return clip;
    }
    hostError(clipArg + ": no such clip on the card");
    return nullptr;
}

std::vector<std::string> HostSession::mountedVolumes() {
    std::vector<std::string> roots;
    for (const char* base : {"/media", "/run/media", "/mnt"}) {
        FileSystem::enumerate(base, true, [&](const std::string& rel, const std::string& full, bool isDir) {
            if (isDir) roots.push_back(full);
            // /media/CARD and /media/USER/CARD
            return rel.find('/') == std::string::npos;
        });
    }
    return roots;
}

std::string failureText(const std::exception& e) {
    if (auto* hard = dynamic_cast<const HardAssertionFailure*>(&e))
        return "the plug-in stopped on a failed check (" + hard->expression + ", " + hard->source + ")";
    if (auto* soft = dynamic_cast<const AssertionFailure*>(&e)) {
        std::string text = soft->description;
        while (!text.empty() && (text.back() == '\n' || text.back() == ' ')) text.pop_back();
        return "the plug-in reported a failed assertion in " + soft->method + ": " + text;
    }
    return e.what();
}
