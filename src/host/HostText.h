// How the host writes codes and times, in text and in JSON.
#pragma once

#include "CFBase.h"
#include "CMTime.h"
#include "OutputBuffer.h"

#include <nlohmann/json.hpp>

#include <string>

// A media type or codec as its four characters; a code that is not printable
// as hex ("0x0000abcd"), and 0 as "-".
std::string fourCharText(FourCharCode code);
// "value/timescale", or "-" for a time that is not numeric.
std::string timeText(CMTime time);
// [value, timescale], or null for a time that is not numeric.
nlohmann::ordered_json timeJSON(CMTime time);
void writeTimeJSON(OutputBuffer& out, CMTime time);
