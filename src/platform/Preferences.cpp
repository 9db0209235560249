#include "Preferences.h"

#include "FileSystem.h"

#include <cstdlib>
#include <map>
#include <mutex>
#include <sys/stat.h>

namespace {

struct Domain {
    Dictionary values;
    bool dirty = false;
};

std::mutex gMutex;
std::map<std::string, Domain> gDomains;

std::string configHome() {
    const char* xdg = std::getenv("XDG_CONFIG_HOME");
    if (xdg && *xdg == '/') return xdg;
    const char* home = std::getenv("HOME");
    return std::string(home && *home ? home : "/tmp") + "/.config";
}

// Domain names become file names: keep them to a safe alphabet.
std::string fileNameFor(const std::string& appID) {
    std::string name;
    for (char c : appID) {
        bool ok = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' ||
                  c == '-' || c == '_';
        name += ok ? c : '_';
    }
    if (name.empty() || name[0] == '.') name.insert(0, "_");
    return name + ".json";
}

Domain& domainLocked(const std::string& appID) {
    auto it = gDomains.find(appID);
    if (it != gDomains.end()) return it->second;
    Domain d;
    auto bytes = FileSystem::readFile(CFPreferencesPathForApplication(appID), 64u << 20);
    if (bytes) {
        Value v = Value::fromJSONText(std::string_view(reinterpret_cast<const char*>(bytes->data()), bytes->size()));
        if (v.isDictionary()) d.values = std::move(v.dictionary());
    }
    return gDomains.emplace(appID, std::move(d)).first->second;
}

}  // namespace

std::string CFPreferencesPathForApplication(const std::string& applicationID) {
    return configHome() + "/" + fileNameFor(applicationID);
}

Value CFPreferencesCopyAppValue(const std::string& key, const std::string& applicationID) {
    std::lock_guard<std::mutex> lock(gMutex);
    const Value* v = domainLocked(applicationID).values.find(key);
    return v ? *v : Value();
}

void CFPreferencesSetAppValue(const std::string& key, const Value& value, const std::string& applicationID) {
    std::lock_guard<std::mutex> lock(gMutex);
    Domain& d = domainLocked(applicationID);
    if (value.isNull())
        d.dirty = d.values.remove(key) || d.dirty;
    else {
        d.values.set(key, value);
        d.dirty = true;
    }
}

bool CFPreferencesAppSynchronize(const std::string& applicationID) {
    std::lock_guard<std::mutex> lock(gMutex);
    Domain& d = domainLocked(applicationID);
    if (!d.dirty) return true;
    std::string dir = configHome();
    ::mkdir(dir.c_str(), 0700);
    std::string text = Value(d.values).jsonText(2) + "\n";
    if (!FileSystem::writeFileAtomically(CFPreferencesPathForApplication(applicationID), text.data(), text.size()))
        return false;
    d.dirty = false;
    return true;
}

void CFPreferencesResetCache() {
    std::lock_guard<std::mutex> lock(gMutex);
    gDomains.clear();
}
