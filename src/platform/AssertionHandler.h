// Hard and soft assertions.
//
// Hard assertions mark programming errors that must stop the process: they
// report the failed expression and the source name, then call the installed
// failure handler (which aborts unless a host or test installs one that throws).
// Soft assertions go through the AssertionHandler, which by default logs and
// throws AssertionFailure; a handler that returns lets the caller go on.
#pragma once

#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

struct HardAssertionFailure : std::runtime_error {
    HardAssertionFailure(std::string expression, std::string source, int line);
    std::string expression;
    std::string source;
    int line;
};

struct AssertionFailure : std::runtime_error {
    AssertionFailure(std::string method, std::string file, int line, std::string description);
    std::string method;
    std::string file;
    int line;
    std::string description;
};

using HardAssertionFailureHandler = std::function<void(const char* expression, const char* source, int line)>;

// Installs a handler and returns the previous one. An empty handler restores the
// default (print "Assertion failed: (EXPR), source SOURCE, line N." and abort).
HardAssertionFailureHandler setHardAssertionFailureHandler(HardAssertionFailureHandler handler);
// A handler that throws HardAssertionFailure, for hosts and tests.
void throwingHardAssertionFailureHandler(const char* expression, const char* source, int line);

// Called by SKARN_HARD_ASSERT. Never returns normally: if an installed handler
// returns, the process is aborted all the same.
[[noreturn]] void hardAssertionFailed(const char* expression, const char* source, int line);

#define SKARN_HARD_ASSERT(expr, source) \
    ((expr) ? (void)0 : ::hardAssertionFailed(#expr, (source), __LINE__))
// For the cases where the reported text is not the C++ expression itself.
#define SKARN_HARD_ASSERT_TEXT(expr, text, source) \
    ((expr) ? (void)0 : ::hardAssertionFailed((text), (source), __LINE__))

class AssertionHandler {
public:
    virtual ~AssertionHandler() = default;
    // The handler of the calling thread (the process-wide one unless replaced).
    static AssertionHandler& currentHandler();
    // Replaces the process-wide handler; nullptr restores the default. Returns the old one.
    static AssertionHandler* setCurrentHandler(AssertionHandler* handler);

    // Default: log "*** Assertion failure in METHOD, FILE:LINE" and the description
    // to stderr, then throw AssertionFailure.
    virtual void handleFailureInMethod(const std::string& method, const std::string& file, int line,
                                       const std::string& description);
    virtual void handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                         const std::string& description);
};

// A handler that records failures and returns, for tests of the "handler returns" paths.
class RecordingAssertionHandler : public AssertionHandler {
public:
    struct Failure {
        std::string method, file, description;
        int line;
    };
    void handleFailureInMethod(const std::string& method, const std::string& file, int line,
                               const std::string& description) override;
    void handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                 const std::string& description) override;
    std::vector<Failure> failures;
};

// Installs a handler for the lifetime of the guard.
class ScopedAssertionHandler {
public:
    explicit ScopedAssertionHandler(AssertionHandler* h) : _previous(AssertionHandler::setCurrentHandler(h)) {}
    ~ScopedAssertionHandler() { AssertionHandler::setCurrentHandler(_previous); }
    ScopedAssertionHandler(const ScopedAssertionHandler&) = delete;
    ScopedAssertionHandler& operator=(const ScopedAssertionHandler&) = delete;

private:
    AssertionHandler* _previous;
};
