// Directory listing that keeps no shared state, safe from any thread.
#pragma once

#include "Object.h"

#include <optional>
#include <string>
#include <vector>

class ThreadSafeFileManager : public Object {
public:
    static Ref<ThreadSafeFileManager> fileManager() { return makeRef<ThreadSafeFileManager>(); }

    // Entry names sorted case-insensitively, "." and ".." included; nullopt for a
    // nil path, an unreadable folder, a failed read or a folder with no entry.
    std::optional<std::vector<std::string>> directoryContentsAtPath(const std::optional<std::string>& path) const;
};
