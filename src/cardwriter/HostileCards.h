// Damaged cards for robustness tests: each one a card the card writer wrote,
// with one fault put into it afterwards (truncated or bit-flipped MXF, offsets
// past the end, hostile clip XML values, FIFOs, devices, symbolic link loops,
// unreadable and empty files), in a folder named after the fault.
#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

struct HostileClip {
    std::string name;      // the clip's file base name
    std::string clipPath;  // the CLIP XML or AVCLIP MXF a host opens
};

struct HostileCard {
    std::string fault;        // also the card's folder name
    std::string description;  // what was done to the card, one line
    std::string root;
    std::vector<HostileClip> clips;
    std::vector<std::string> damaged;  // the files or folders the fault is in
};

// Which cards to write, by their place in the set (the same in every run) and
// fault name; a filter that answers false for all lists the set cheaply.
using HostileCardFilter = std::function<bool(size_t index, const std::string& fault)>;

// Writes the hostile cards the filter takes below dir, which is created.
// Answers false with a one-line reason.
bool writeHostileCards(const std::string& dir, const HostileCardFilter& filter, std::vector<HostileCard>* written,
                       std::string* error = nullptr);
// The cards whose fault names begin with `prefix` (all of them when empty).
bool writeHostileCards(const std::string& dir, std::vector<HostileCard>* written = nullptr,
                       std::string* error = nullptr, const std::string& prefix = "");
