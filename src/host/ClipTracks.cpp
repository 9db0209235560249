#include "ClipTracks.h"

#include "FileSystem.h"

bool ClipTracks::open(HostSession& host, const std::string& clipArg) {
    _clipArg = clipArg;
    _clip = host.findClip(clipArg);
    if (!_clip) return false;
    if (!_clip->respondsToSelector("formatReader")) {
        error("the plug-in offers no format reader for this clip");
        return false;
    }
    _formatReader = _clip->formatReader();
    if (!_formatReader) {
        error("the plug-in could not build a format reader for this clip");
        return false;
    }
    _tracks = _formatReader->trackReaders();
    if (_tracks.empty()) {
        error("the clip's format reader has no tracks");
        return false;
    }
    // A self-contained clip's tracks locate samples by the MXF index tables,
    // which give absolute file offsets; a clip-XML clip's tracks count from
    // the essence start its XML gives (locationOffset). The clip says which it
    // is: locationSize equal to the file size would tell too, but a clip-XML
    // clip whose essence fills its whole file answers the same.
    _selfContained = _clip->valueForKey("isMXFOp1bFormat").boolValue().value_or(false);
    std::optional<std::string> video = _tracks[0]->url();
    if (!video)
        video = _clip->valueForKey("videoFilePath").isString()
                    ? std::optional<std::string>(_clip->valueForKey("videoFilePath").string())
                    : std::nullopt;
    if (!video) {
        error("its video file is missing (the plug-in finds none for the clip)");
        return false;
    }
    if (!FileSystem::fileExists(*video)) {
        error("its video file " + *video + " is missing");
        return false;
    }
    return true;
}

void ClipTracks::error(const std::string& text) const {
    hostError(_clipArg + ": " + text);
}
