// The clip XML a self-contained clip carries in its header.
#pragma once

#include <optional>
#include <string>

// The XML text of the clip file at path, or nullopt when the file cannot be
// read or holds no XML carrier within the window searched.
std::optional<std::string> SkarnMXF_XMLStringForClip(const std::optional<std::string>& path);
