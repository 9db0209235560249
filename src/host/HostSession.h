// The reference host's session: the loaded bundle, the plug-in, and the way an
// editing application reaches cards and clips through the Kiln protocols.
#pragma once

#include "ClipIngestModule.h"
#include "VestaBundleLoader.h"

#include <exception>
#include <optional>
#include <string>
#include <vector>

class HostSession {
public:
    // Loads the bundle (--bundle, else $SKARN_BUNDLE, else beside the program,
    // else the build tree's) and starts the plug-in. false with a printed error.
    bool open(const std::string& bundleOption);

    VestaKilnPlugin& plugin() { return *_plugin; }

    // The card folder that holds a clip file (CARD/CONTENTS/<folder>/<file>).
    static std::optional<std::string> cardForClipFile(const std::string& clipFile);

    // The clips of a card; nullopt (with a printed error) when the plug-in lists none.
    std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>> clipsOfCard(const std::string& card);

    // A clip named by the path of its clip file, or CARD:NAME (base name or clip
    // identifier). nullptr with a printed error.
    Ref<VestaKilnClipDataSourceProtocol> findClip(const std::string& clipArg);

    // The module that writes movies (see ClipIngestModule.h), loaded on first
    // use from beside the program, else the build tree's. nullptr with a
    // printed error.
    static ClipIngestModule* movieModule();
    // Mounted volumes under /media, /run/media and /mnt.
    static std::vector<std::string> mountedVolumes();

private:
    Ref<VestaBundleLoader> _loader;
    Ref<VestaKilnPlugin> _plugin;
};

// One line to stderr: "skarn: " + text.
void hostError(const std::string& text);

// What the plug-in is reading (a card, a clip): its log lines reach stderr as
// "skarn: SUBJECT: LINE", each line once per subject.
void setLogSubject(const std::string& subject);

// A failure the plug-in raised, as one line: a hard check it stopped on, a
// soft assertion it reported, or any other exception.
std::string failureText(const std::exception& e);
