// Where diagnostic log lines go: stderr unless a host or test installs a sink.
#pragma once

#include <functional>
#include <string>

using LogSinkFunction = std::function<void(const std::string& line)>;

// Installs a sink and answers the previous one; an empty function restores stderr.
LogSinkFunction setLogSink(LogSinkFunction sink);
// Writes one line (a newline is added when missing). Thread-safe.
void logLine(const std::string& line);
