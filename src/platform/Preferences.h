// Per-application preference domains: CFPreferencesCopyAppValue and friends.
//
// A domain (an application identifier) is one JSON file,
// $XDG_CONFIG_HOME/<domain>.json (default ~/.config). Values are read into
// memory on first use; Set changes memory only; Synchronize writes the file
// atomically. All calls are thread-safe.
#pragma once

#include "Value.h"

#include <optional>
#include <string>

// Null when the key is not set.
Value CFPreferencesCopyAppValue(const std::string& key, const std::string& applicationID);
// A Null value removes the key.
void CFPreferencesSetAppValue(const std::string& key, const Value& value, const std::string& applicationID);
// Writes the domain out when it changed; answers whether that succeeded.
bool CFPreferencesAppSynchronize(const std::string& applicationID);

// The file that holds a domain.
std::string CFPreferencesPathForApplication(const std::string& applicationID);
// Drops every cached domain, so the next read goes to the files (for tests that
// change XDG_CONFIG_HOME).
void CFPreferencesResetCache();
