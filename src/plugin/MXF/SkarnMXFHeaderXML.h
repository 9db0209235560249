// The clip XML a self-contained clip carries in its header.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>

// The XML text of the clip file at path, or nullopt when the file cannot be
// read or holds no XML carrier within the window searched.
std::optional<std::string> SkarnMXF_XMLStringForClip(const std::optional<std::string>& path);
// The same from the whole file's bytes in memory.
std::optional<std::string> SkarnMXF_XMLStringForBytes(std::span<const uint8_t> fileBytes);
