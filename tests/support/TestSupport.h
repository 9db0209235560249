// Helpers shared by the unit tests.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

// A fresh folder under the test temporary directory, removed (locks cleared)
// when the object goes.
class TempDir {
public:
    TempDir();
    ~TempDir();
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    const std::string& path() const { return _path; }
    std::string operator/(const std::string& rel) const { return _path + "/" + rel; }

private:
    std::string _path;
};

void writeTextFile(const std::string& path, const std::string& text);
void writeBytes(const std::string& path, const std::vector<uint8_t>& bytes);
void makeDirs(const std::string& path);
// Root of the build tree (for the bundle and tools).
std::string buildDir();
// Runs a shell command; answers its exit status and fills output with stdout.
int runCommand(const std::string& command, std::string* output = nullptr);
// Whether this file system supports the immutable flag (and we may set it).
bool immutableFlagSupported(const std::string& folder);
