// Property-list values as nlohmann JSON, for the programs that build JSON
// documents of their own (the reference host, the tools). Kept out of Value.h
// so the many sources that only hold values do not parse the JSON library.
#pragma once

#include "Value.h"

#include <nlohmann/json.hpp>

#include <string>

// Data becomes hex text, objects their description, non-finite reals null.
nlohmann::ordered_json toJSON(const Value& value);
Value valueFromJSON(const nlohmann::ordered_json& j);
// Bytes that are not UTF-8 become U+FFFD instead of failing; indent < 0 gives one line.
std::string jsonText(const nlohmann::ordered_json& j, int indent = -1);
