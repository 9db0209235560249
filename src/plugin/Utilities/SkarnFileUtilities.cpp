#include "SkarnFileUtilities.h"

#include "FileSystem.h"

#include <sys/stat.h>

std::optional<std::string> SkarnUtilities_CaseInsensitiveFileExistsInDirectory(
    const std::optional<std::string>& name, const std::optional<std::string>& folderPath) {
    if (!name || !folderPath) return std::nullopt;
    if (!FileSystem::isDirectory(*folderPath)) return std::nullopt;
    int error = 0;
    auto entries = FileSystem::contentsOfDirectory(*folderPath, &error);
    if (!entries || error != 0) return std::nullopt;
    for (const std::string& entry : *entries)
        if (FileSystem::caseInsensitiveEqual(entry, *name)) return entry;
    return std::nullopt;
}

std::optional<std::string> SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath(
    const std::optional<std::string>& name, const std::optional<std::string>& folderPath) {
    auto entry = SkarnUtilities_CaseInsensitiveFileExistsInDirectory(name, folderPath);
    if (!entry) return std::nullopt;
    return FileSystem::stringByAppendingPathComponent(*folderPath, *entry);
}

bool SkarnUtilities_DeleteFileAtPathIfExists(const std::optional<std::string>& path) {
    if (!path) return true;
    struct stat st;
    // lstat: a dangling link still exists as an item to remove.
    if (::lstat(path->c_str(), &st) != 0) return true;
    FileSystem::setImmutable(*path, false);
    return FileSystem::removeItem(*path);
}
