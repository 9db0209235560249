// Descriptive facts read straight from a clip's MXF files: the identification,
// material package and source package sets of each file's header metadata, as
// dictionaries of "org.smpte.mxf..." keys.
#pragma once

#include "Value.h"
#include "VestaKilnProtocols.h"

#include <cstdint>
#include <span>

// One dictionary per file of the clip's ingestSourceFiles (video first, then
// audio), each holding some of "identifications", "materialPackages" and
// "sourcePackages" (arrays of one dictionary). An unreadable file gives an empty
// dictionary. Null when the clip names no media set.
Value SkarnMXFMetadataForClip(VestaKilnClipDataSourceProtocol* clip);
// The same from an ingestSourceFiles value.
Value SkarnMXFMetadataForSourceFiles(const Value& ingestSourceFiles);
// The same for one file.
Dictionary SkarnMXFMetadataForFile(const std::string& path);
// The same from one file's bytes in memory.
Dictionary SkarnMXFMetadataForBytes(std::span<const uint8_t> fileBytes);

// Decodes the local items of one set value into "org.smpte.mxf.<prefix>.<name>"
// pairs (prefix "identification", "package.material" or "package.source").
Dictionary SkarnMXFDecodeLocalSet(std::span<const uint8_t> setValue, const std::string& prefix);
