// File-system helpers with the platform semantics the plug-in relies on.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace FileSystem {

bool fileExists(const std::string& path);  // follows symbolic links, like the platform's test
bool fileExists(const std::string& path, bool& isDirectory);
bool isDirectory(const std::string& path);

// Entry names of a folder, not recursive, "." and ".." left out, in the order
// the file system gives them. nullopt with error (errno text) on failure.
std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path, int* errorCode = nullptr);

// Recursive walk below a folder. The callback gets the path relative to the
// root, the full path and whether it is a directory (symbolic links are not
// followed); returning false from it skips a directory's contents. Hidden names
// (leading ".") are skipped, with their contents, when skipHidden is set.
void enumerate(const std::string& root, bool skipHidden,
               const std::function<bool(const std::string& relative, const std::string& full, bool isDir)>& fn);

// Removes a file, link or folder tree. Symbolic links are removed, never followed.
bool removeItem(const std::string& path);

// The "locked" attribute, kept as the file system's immutable flag. answers
// false (and nullopt for the query) where the file system has no such flag.
std::optional<bool> isImmutable(const std::string& path);
bool setImmutable(const std::string& path, bool immutable);

// Whether the item can be removed by this process: it exists, is not locked and
// its folder is writable and not locked.
bool isDeletableFile(const std::string& path);

// Opens read-only and close-on-exec; -1 on failure.
int openReadOnly(const std::string& path);
// The same for a file that must be a regular file: a FIFO, socket or device
// (where a card file should be) is refused before anything is read, and
// without blocking; -1 then.
int openRegularFileReadOnly(const std::string& path);
// Tells the kernel this descriptor's reads will not be reused, the nearest
// equivalent of a no-cache file: what is cached already stays cached.
// Answers false when refused.
bool disableCaching(int fd);
// Reads up to n bytes at the current position, retrying short reads and EINTR.
// Answers the bytes read, or -1 on error.
int64_t readFully(int fd, void* buf, size_t n);
int64_t preadFully(int fd, void* buf, size_t n, int64_t offset);
// Size of a regular file, or nullopt.
std::optional<uint64_t> fileSize(const std::string& path);
std::optional<std::vector<uint8_t>> readFile(const std::string& path, size_t maxBytes = SIZE_MAX);
// Writes via a temporary file in the same folder, fsync, rename.
bool writeFileAtomically(const std::string& path, const void* data, size_t size);

size_t pageSize();

// Path helpers with the platform's string semantics.
std::string lastPathComponent(const std::string& path);
std::string stringByDeletingLastPathComponent(const std::string& path);
std::string stringByAppendingPathComponent(const std::string& path, const std::string& component);
std::string pathExtension(const std::string& path);
std::string stringByDeletingPathExtension(const std::string& path);
std::string stringByAppendingPathExtension(const std::string& path, const std::string& ext);

// Case-insensitive (ASCII and Latin-1-insensitive ordering is enough for card
// names) comparison used for listings and lookups.
int caseInsensitiveCompare(const std::string& a, const std::string& b);
bool caseInsensitiveEqual(const std::string& a, const std::string& b);
bool hasSuffix(const std::string& s, const std::string& suffix);
bool hasPrefix(const std::string& s, const std::string& prefix);

}  // namespace FileSystem
