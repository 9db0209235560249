// SkarnClip's files on the card: where its video, audio, icon, proxy and
// voice files are, the spanned clips it belongs to, the files handed to hosts
// (clipURLs, ingestSourceFiles), and deleting the clip.
#include "SkarnClip.h"

#include "FileSystem.h"
#include "SkarnCardFolderCache.h"
#include "SkarnClipInternal.h"
#include "SkarnFileUtilities.h"

#include <algorithm>
#include <cstdio>
#include <unistd.h>

using namespace SkarnClipInternal;

std::string SkarnClip::baseName() const {
    return FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(_clipXMLPath));
}

std::string SkarnClip::contentsFolder() const {
    return FileSystem::stringByDeletingLastPathComponent(FileSystem::stringByDeletingLastPathComponent(_clipXMLPath));
}

std::optional<std::string> SkarnClip::cardFile(const char* folder, const char* extension) const {
    auto dir = SkarnCardFolderCache::pathInFolder(folder, contentsFolder());
    if (!dir) return std::nullopt;
    return SkarnCardFolderCache::pathInFolder(
        FileSystem::stringByAppendingPathExtension(baseName(), extension), dir);
}

std::optional<std::string> SkarnClip::companionClipXMLPath() const { return cardFile("CLIP", "XML"); }

std::optional<std::string> SkarnClip::videoFilePath() const {
    if (_memo && _memo->videoFilePath) return *_memo->videoFilePath;
    auto path = cardFile(_isMXFOp1bFormat ? "AVCLIP" : "VIDEO", "MXF");
    if (_memo) _memo->videoFilePath = path;
    return path;
}

std::optional<std::string> SkarnClip::audioFolderPath() const {
    if (_isMXFOp1bFormat) return _clipXMLPath;
    return SkarnCardFolderCache::pathInFolder("AUDIO", contentsFolder());
}

std::optional<std::vector<std::string>> SkarnClip::audioFilePaths() {
    const uint32_t channels = numberOfAudioChannels();
    if (channels == 0) return std::nullopt;
    if (_isMXFOp1bFormat) return std::vector<std::string>{_clipXMLPath};
    std::vector<std::string> paths;
    auto folder = audioFolderPath();
    if (!folder) return paths;
    auto listing = SkarnCardFolderCache::listing(*folder);
    if (!listing) return paths;
    const std::string base = baseName();
    char suffix[16];
    if (channels <= listing->entries().size() + 100) {
        for (uint32_t i = 0; i < channels; ++i) {
            std::snprintf(suffix, sizeof suffix, "%.2u.MXF", i);
            if (const std::string* entry = listing->entryNamed(base + suffix))
                paths.push_back(FileSystem::stringByAppendingPathComponent(*folder, *entry));
        }
        return paths;
    }
    // More channels claimed than the folder could hold: each entry is tried as
    // a channel file instead, which finds the same files without a loop over
    // every channel a hostile count names.
    std::vector<std::pair<uint32_t, std::string>> found;
    for (const std::string& entry : listing->entries()) {
        if (entry.size() <= base.size() + 4) continue;
        const std::string digits = entry.substr(base.size(), entry.size() - base.size() - 4);
        if (digits.empty() || digits.size() > 10 || digits.find_first_not_of("0123456789") != std::string::npos)
            continue;
        const uint64_t channel = std::stoull(digits);
        if (channel >= channels) continue;
        std::snprintf(suffix, sizeof suffix, "%.2u.MXF", unsigned(channel));
        const std::string* first = listing->entryNamed(base + suffix);
        if (first == &entry) found.emplace_back(uint32_t(channel), entry);
    }
    std::sort(found.begin(), found.end());
    for (auto& [channel, entry] : found) paths.push_back(FileSystem::stringByAppendingPathComponent(*folder, entry));
    return paths;
}

std::optional<std::string> SkarnClip::iconFilePath() const { return cardFile("ICON", "BMP"); }

std::optional<std::string> SkarnClip::proxyFilePath() const {
    auto mp4 = cardFile("PROXY", "MP4");
    return mp4 ? mp4 : cardFile("PROXY", "MOV");
}

std::optional<std::string> SkarnClip::proxyBinFilePath() const { return cardFile("PROXY", "BIN"); }

std::optional<std::string> SkarnClip::voiceFilePath() const { return cardFile("VOICE", "WAV"); }

std::optional<std::string> SkarnClip::spannedClipID() const {
    return text("ClipContent/Relation/Connection/Top/GlobalClipID");
}
std::optional<std::string> SkarnClip::nextClipIDInSpannedClip() const {
    return text("ClipContent/Relation/Connection/Next/GlobalClipID");
}
std::optional<std::string> SkarnClip::previousClipIDInSpannedClip() const {
    return text("ClipContent/Relation/Connection/Previous/GlobalClipID");
}

std::vector<std::string> SkarnClip::clipURLs() {
    std::vector<std::string> urls;
    auto add = [&](const std::optional<std::string>& p) {
        if (p) urls.push_back(*p);
    };
    if (_isMXFOp1bFormat) add(companionClipXMLPath());
    else if (FileSystem::fileExists(_clipXMLPath)) urls.push_back(_clipXMLPath);
    add(videoFilePath());
    add(voiceFilePath());
    add(iconFilePath());
    add(proxyFilePath());
    add(proxyBinFilePath());
    if (auto audio = audioFilePaths())
        for (const std::string& p : *audio) urls.push_back(p);
    return urls;
}

Value SkarnClip::ingestSourceFiles() {
    Array mediaSet;
    if (auto video = videoFilePath()) mediaSet.push_back(Value(Dictionary{{"MediaSetPath", Value(*video)}}));
    if (auto audio = audioFilePaths())
        for (const std::string& p : *audio) mediaSet.push_back(Value(Dictionary{{"MediaSetPath", Value(p)}}));
    // Moved in, not listed in an initialiser: a list's elements are copied.
    Array outer;
    outer.push_back(Value(std::move(mediaSet)));
    return Value(std::move(outer));
}

namespace {
// The clip's own files are unlocked by the deletion itself before they are
// removed, so their lock does not count against them; everything else (the
// folder, and other clips' files) must pass the platform's test as it stands.
bool deletableOnceUnlocked(const std::string& path) {
    if (FileSystem::isDeletableFile(path)) return true;
    if (!FileSystem::isImmutable(path).value_or(false)) return false;
    std::string parent = FileSystem::stringByDeletingLastPathComponent(path);
    if (parent.empty()) parent = ".";
    return ::access(parent.c_str(), W_OK | X_OK) == 0 && !FileSystem::isImmutable(parent).value_or(false);
}
}  // namespace

bool SkarnClip::isDeletable() {
    // A file the clip does not have (no voice memo, no icon) is nil here and
    // passes: a clip without a voice memo must still be deletable.
    for (const std::optional<std::string>& p :
         {std::optional<std::string>(_clipXMLPath), videoFilePath(), voiceFilePath(), iconFilePath()}) {
        if (p && !deletableOnceUnlocked(*p)) return false;
    }
    // Deliberately every item of the audio folder, not only this clip's: a
    // locked file of another clip blocks the deletion. Items are tested at the
    // paths the walk finds them.
    auto folder = audioFolderPath();
    if (!folder || !FileSystem::isDirectory(*folder)) return true;
    const std::string base = baseName();
    bool ok = true;
    FileSystem::enumerate(*folder, false, [&](const std::string& relative, const std::string& full, bool) {
        const bool own = hasPrefix(relative, base);
        if (ok && !(own ? deletableOnceUnlocked(full) : FileSystem::isDeletableFile(full))) ok = false;
        return ok;
    });
    return ok;
}

bool SkarnClip::deleteClip() {
    if (!isDeletable()) return false;
    const std::vector<std::optional<std::string>> files = {_clipXMLPath, videoFilePath(), voiceFilePath(),
                                                           iconFilePath()};
    for (const auto& p : files)
        if (!SkarnUtilities_DeleteFileAtPathIfExists(p)) return false;
    auto folder = audioFolderPath();
    if (!folder || !FileSystem::isDirectory(*folder)) return true;
    // The proxies stay on the card, and so does an AVCLIP clip's companion XML.
    const std::string base = baseName();
    std::vector<std::string> doomed;
    FileSystem::enumerate(*folder, false, [&](const std::string& relative, const std::string& full, bool) {
        if (hasPrefix(relative, base)) {
            doomed.push_back(full);
            return false;  // the whole item goes; nothing below it to visit
        }
        return true;
    });
    for (const std::string& p : doomed)
        if (!SkarnUtilities_DeleteFileAtPathIfExists(p)) return false;
    return true;
}

// Cards carry no poster frame of their own; the clip's icon is the picture
// a browser shows for it.
Ref<Image> SkarnClip::posterFrame() {
    auto icon = iconFilePath();
    return icon ? Image::imageWithContentsOfFile(*icon) : nullptr;
}
