#include "AssertionHandler.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <utility>

HardAssertionFailure::HardAssertionFailure(std::string expr, std::string src, int ln)
    : std::runtime_error("Assertion failed: (" + expr + "), source " + src + ", line " + std::to_string(ln) + "."),
      expression(std::move(expr)), source(std::move(src)), line(ln) {}

AssertionFailure::AssertionFailure(std::string m, std::string f, int ln, std::string d)
    : std::runtime_error(d), method(std::move(m)), file(std::move(f)), line(ln), description(std::move(d)) {}

namespace {
std::mutex gHardMutex;
HardAssertionFailureHandler gHardHandler;

void defaultHardHandler(const char* expression, const char* source, int line) {
    std::fprintf(stderr, "Assertion failed: (%s), source %s, line %d.\n", expression, source, line);
    std::fflush(stderr);
    std::abort();
}

AssertionHandler gDefaultHandler;
std::atomic<AssertionHandler*> gCurrentHandler{nullptr};
}

HardAssertionFailureHandler setHardAssertionFailureHandler(HardAssertionFailureHandler handler) {
    std::lock_guard<std::mutex> lock(gHardMutex);
    return std::exchange(gHardHandler, std::move(handler));
}

void throwingHardAssertionFailureHandler(const char* expression, const char* source, int line) {
    throw HardAssertionFailure(expression, source, line);
}

void hardAssertionFailed(const char* expression, const char* source, int line) {
    HardAssertionFailureHandler handler;
    {
        std::lock_guard<std::mutex> lock(gHardMutex);
        handler = gHardHandler;
    }
    if (handler) handler(expression, source, line);
    defaultHardHandler(expression, source, line);
    std::abort();
}

AssertionHandler& AssertionHandler::currentHandler() {
    AssertionHandler* h = gCurrentHandler.load(std::memory_order_acquire);
    return h ? *h : gDefaultHandler;
}

AssertionHandler* AssertionHandler::setCurrentHandler(AssertionHandler* handler) {
    return gCurrentHandler.exchange(handler, std::memory_order_acq_rel);
}

void AssertionHandler::handleFailureInMethod(const std::string& method, const std::string& file, int line,
                                             const std::string& description) {
    std::fprintf(stderr, "*** Assertion failure in %s, %s:%d\n%s", method.c_str(), file.c_str(), line,
                 description.c_str());
    if (description.empty() || description.back() != '\n') std::fputc('\n', stderr);
    throw AssertionFailure(method, file, line, description);
}

void AssertionHandler::handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                               const std::string& description) {
    handleFailureInMethod(function, file, line, description);
}

void RecordingAssertionHandler::handleFailureInMethod(const std::string& method, const std::string& file, int line,
                                                      const std::string& description) {
    failures.push_back({method, file, description, line});
}

void RecordingAssertionHandler::handleFailureInFunction(const std::string& function, const std::string& file,
                                                        int line, const std::string& description) {
    failures.push_back({function, file, description, line});
}
