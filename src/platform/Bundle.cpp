#include "Bundle.h"

#include "FileSystem.h"

#include <dlfcn.h>

#include <algorithm>
#include <cstdlib>

Bundle::Bundle(std::string path) : _path(std::move(path)) {
    auto bytes = FileSystem::readFile(FileSystem::stringByAppendingPathComponent(_path, "Info.json"), 1u << 20);
    if (bytes) {
        _info = Value::fromJSONText(std::string_view(reinterpret_cast<const char*>(bytes->data()), bytes->size()));
    }
}

Ref<Bundle> Bundle::bundleWithPath(const std::string& path) {
    if (!FileSystem::isDirectory(path)) return nullptr;
    return Ref<Bundle>(new Bundle(path));
}

Ref<Bundle> Bundle::bundleForAddress(const void* address) {
    Dl_info info{};
    if (!::dladdr(address, &info) || !info.dli_fname) return nullptr;
    std::string lib = info.dli_fname;
    char* real = ::realpath(lib.c_str(), nullptr);
    if (real) {
        lib = real;
        std::free(real);
    }
    std::string folder = FileSystem::stringByDeletingLastPathComponent(lib);
    if (!FileSystem::fileExists(FileSystem::stringByAppendingPathComponent(folder, "Info.json"))) return nullptr;
    return bundleWithPath(folder);
}

std::string Bundle::resourcePath() const { return FileSystem::stringByAppendingPathComponent(_path, "Resources"); }

std::optional<std::string> Bundle::executablePath() const {
    const Value& exe = _info["BundleExecutable"];
    if (!exe.isString()) return std::nullopt;
    return FileSystem::stringByAppendingPathComponent(_path, exe.string());
}

std::optional<std::string> Bundle::principalClassName() const {
    const Value& cls = _info["PrincipalClass"];
    if (!cls.isString()) return std::nullopt;
    return cls.string();
}

std::vector<std::string> Bundle::preferredLanguages() {
    std::vector<std::string> langs;
    for (const char* var : {"LC_ALL", "LC_MESSAGES", "LANG"}) {
        const char* v = std::getenv(var);
        if (!v || !*v) continue;
        std::string s = v;
        if (s == "C" || s == "POSIX" || s.rfind("C.", 0) == 0) break;
        size_t cut = s.find_first_of("_.@");
        std::string lang = s.substr(0, cut);
        if (!lang.empty()) langs.push_back(lang);
        break;
    }
    if (std::find(langs.begin(), langs.end(), "en") == langs.end()) langs.push_back("en");
    return langs;
}

std::unordered_map<std::string, std::string> Bundle::parseStringsTable(const std::string& text) {
    std::unordered_map<std::string, std::string> table;
    auto unescape = [](const std::string& s) {
        std::string out;
        for (size_t i = 0; i < s.size(); ++i) {
            if (s[i] == '\\' && i + 1 < s.size()) {
                char c = s[++i];
                out += c == 'n' ? '\n' : c == 't' ? '\t' : c;
            } else {
                out += s[i];
            }
        }
        return out;
    };
    size_t pos = 0;
    while (pos < text.size()) {
        size_t eol = text.find('\n', pos);
        if (eol == std::string::npos) eol = text.size();
        std::string line = text.substr(pos, eol - pos);
        pos = eol + 1;
        if (!line.empty() && line.back() == '\r') line.pop_back();
        size_t first = line.find_first_not_of(" \t");
        if (first == std::string::npos || line[first] == '#') continue;
        // Keys may hold spaces, so the separator is " = " (first occurrence).
        size_t sep = line.find(" = ");
        if (sep == std::string::npos) continue;
        table[unescape(line.substr(first, sep - first))] = unescape(line.substr(sep + 3));
    }
    return table;
}

const std::unordered_map<std::string, std::string>* Bundle::table(const std::string& lang,
                                                                 const std::string& name) const {
    std::string key = lang + "/" + name;
    std::lock_guard<std::mutex> lock(_tablesMutex);
    auto it = _tables.find(key);
    if (it == _tables.end()) {
        std::string file = resourcePath() + "/" + lang + ".lproj/" + name + ".strings";
        auto bytes = FileSystem::readFile(file, 16u << 20);
        std::optional<std::unordered_map<std::string, std::string>> parsed;
        if (bytes) parsed = parseStringsTable(std::string(bytes->begin(), bytes->end()));
        it = _tables.emplace(key, std::move(parsed)).first;
    }
    return it->second ? &*it->second : nullptr;
}

std::string Bundle::localizedString(const std::string& key, const std::optional<std::string>& defaultValue,
                                    const std::string& tableName) const {
    for (const std::string& lang : preferredLanguages()) {
        if (const auto* t = table(lang, tableName)) {
            auto it = t->find(key);
            if (it != t->end()) return it->second;
        }
    }
    if (defaultValue && !defaultValue->empty()) return *defaultValue;
    return key;
}

std::optional<std::string> Bundle::pathForResource(const std::string& name, const std::string& extension) const {
    std::string p = resourcePath() + "/" + name + (extension.empty() ? "" : "." + extension);
    if (FileSystem::fileExists(p)) return p;
    return std::nullopt;
}

Ref<Image> Bundle::imageForResource(const std::string& name) const {
    for (const char* ext : {"png", "tiff", "icns", "bmp"}) {
        if (auto p = pathForResource(name, ext)) return Image::imageWithContentsOfFile(*p);
    }
    return nullptr;
}

std::string Bundle::description() const { return "Bundle <" + _path + ">"; }
