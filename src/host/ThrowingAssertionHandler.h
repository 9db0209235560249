// The host's soft-assertion handler: a failure the plug-in reports becomes an
// AssertionFailure for the command to catch and print as one line, instead of
// the default handler's multi-line report to stderr before it throws.
#pragma once

#include "AssertionHandler.h"

class ThrowingAssertionHandler : public AssertionHandler {
public:
    void handleFailureInMethod(const std::string& method, const std::string& file, int line,
                               const std::string& description) override {
        throw AssertionFailure(method, file, line, description);
    }
    void handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                 const std::string& description) override {
        throw AssertionFailure(function, file, line, description);
    }
};
