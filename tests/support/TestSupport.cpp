#include "TestSupport.h"

#include "FileSystem.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

TempDir::TempDir() {
    const char* base = std::getenv("TMPDIR");
    std::string tmpl = std::string(base && *base ? base : "/tmp") + "/skarn-test-XXXXXX";
    std::vector<char> buf(tmpl.begin(), tmpl.end());
    buf.push_back(0);
    if (!::mkdtemp(buf.data())) throw std::runtime_error("mkdtemp failed");
    _path = buf.data();
}

TempDir::~TempDir() {
    // Clear any locks tests left, then remove.
    FileSystem::enumerate(_path, false, [](const std::string&, const std::string& full, bool) {
        FileSystem::setImmutable(full, false);
        return true;
    });
    FileSystem::removeItem(_path);
}

void makeDirs(const std::string& path) {
    std::string acc;
    size_t pos = 0;
    while (pos != std::string::npos) {
        pos = path.find('/', pos + 1);
        acc = path.substr(0, pos);
        if (!acc.empty()) ::mkdir(acc.c_str(), 0755);
    }
}

void writeTextFile(const std::string& path, const std::string& text) {
    makeDirs(FileSystem::stringByDeletingLastPathComponent(path));
    std::ofstream f(path, std::ios::binary);
    f << text;
}

void writeBytes(const std::string& path, const std::vector<uint8_t>& bytes) {
    makeDirs(FileSystem::stringByDeletingLastPathComponent(path));
    std::ofstream f(path, std::ios::binary);
    f.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
}

std::string buildDir() {
    const char* d = std::getenv("SKARN_TEST_BINARY_DIR");
    char* real = ::realpath(d ? d : ".", nullptr);
    std::string path = real ? real : (d ? d : ".");
    std::free(real);
    return path;
}

int runCommand(const std::string& command, std::string* output) {
    FILE* p = ::popen(command.c_str(), "r");
    if (!p) return -1;
    char buf[4096];
    size_t n;
    while ((n = std::fread(buf, 1, sizeof buf, p)) > 0)
        if (output) output->append(buf, n);
    int status = ::pclose(p);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

bool immutableFlagSupported(const std::string& folder) {
    std::string probe = folder + "/.immutable-probe";
    writeTextFile(probe, "x");
    bool ok = FileSystem::setImmutable(probe, true);
    if (ok) FileSystem::setImmutable(probe, false);
    ::unlink(probe.c_str());
    return ok;
}
