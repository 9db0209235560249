#include "ThreadSafeFileManager.h"

#include "FileSystem.h"

#include <algorithm>
#include <cerrno>
#include <dirent.h>

std::optional<std::vector<std::string>> ThreadSafeFileManager::directoryContentsAtPath(
    const std::optional<std::string>& path) const {
    if (!path) return std::nullopt;
    // Each call has its own directory stream; readdir on a private stream is
    // re-entrant on Linux.
    DIR* dir = ::opendir(path->c_str());
    if (!dir) return std::nullopt;
    std::optional<std::vector<std::string>> names;
    for (;;) {
        errno = 0;
        struct dirent* entry = ::readdir(dir);
        if (!entry) {
            if (errno != 0) {
                ::closedir(dir);
                return std::nullopt;  // partial results are dropped
            }
            break;
        }
        if (!names) names.emplace();
        names->emplace_back(entry->d_name);
    }
    ::closedir(dir);
    if (!names) return std::nullopt;
    std::sort(names->begin(), names->end(), [](const std::string& a, const std::string& b) {
        return FileSystem::caseInsensitiveCompare(a, b) < 0;
    });
    return names;
}
