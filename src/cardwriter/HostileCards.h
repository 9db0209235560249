// Damaged cards for robustness tests: each one a card the card writer wrote,
// with one fault put into it afterwards (truncated or bit-flipped MXF, offsets
// past the end, hostile clip XML values, FIFOs, devices, symbolic link loops,
// unreadable and empty files), in a folder named after the fault.
#pragma once

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

// Writes every hostile card whose fault name contains `only` (all of them when
// empty) below dir, which is created. Answers false with a one-line reason.
bool writeHostileCards(const std::string& dir, std::vector<HostileCard>* written = nullptr,
                       std::string* error = nullptr, const std::string& only = "");
