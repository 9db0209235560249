// The MXF reader's hard assertions. They name the source file the card reader
// has always reported, whichever of our files they sit in, so that a failure
// reads the same wherever the check lives now.
#pragma once

#include "AssertionHandler.h"

#define MXF_ASSERT(cond, text) SKARN_HARD_ASSERT_TEXT(cond, text, kMXFAssertSource)

// Also the file named in soft reports to the assertion handler.
inline constexpr const char* kMXFAssertSource = "MXF/SkarnMXFMetadata";
