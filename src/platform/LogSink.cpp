#include "LogSink.h"

#include <cstdio>
#include <mutex>
#include <utility>

namespace {
std::mutex gMutex;
LogSinkFunction gSink;
}

LogSinkFunction setLogSink(LogSinkFunction sink) {
    std::lock_guard<std::mutex> lock(gMutex);
    return std::exchange(gSink, std::move(sink));
}

void logLine(const std::string& line) {
    std::lock_guard<std::mutex> lock(gMutex);
    if (gSink) {
        gSink(line);
        return;
    }
    std::fwrite(line.data(), 1, line.size(), stderr);
    if (line.empty() || line.back() != '\n') std::fputc('\n', stderr);
}
