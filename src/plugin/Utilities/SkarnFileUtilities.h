// Case-insensitive file lookup and deletion on a card.
//
// Card file systems may store names in any letter case, so every card path is
// resolved against the real directory listing and the on-disk spelling is used.
#pragma once

#include <optional>
#include <string>

// The entry of folderPath whose name equals name case-insensitively (the first
// in listing order), as spelled on disk; nullopt when there is none or the
// folder cannot be listed.
std::optional<std::string> SkarnUtilities_CaseInsensitiveFileExistsInDirectory(
    const std::optional<std::string>& name, const std::optional<std::string>& folderPath);

// folderPath joined with that entry's on-disk spelling, or nullopt.
std::optional<std::string> SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath(
    const std::optional<std::string>& name, const std::optional<std::string>& folderPath);

// True when nothing exists at path or it was removed (after clearing its locked
// attribute); false when removal failed.
bool SkarnUtilities_DeleteFileAtPathIfExists(const std::optional<std::string>& path);
