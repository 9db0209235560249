// SkarnClip: construction from a CLIP XML or AVCLIP MXF file, access to the
// clip document by XPath, and the objects the clip hands out. The rest of the
// class is split by concern: SkarnClipFormat.cpp (format detection, sizes),
// SkarnClipTiming.cpp (rates, pulldown, timecode, duration),
// SkarnClipMetadata.cpp (card metadata, dates, memos), SkarnClipFiles.cpp (the
// clip's files on the card) and SkarnClipProperties.cpp (properties by name).
#include "SkarnClip.h"

#include "FileSystem.h"
#include "SkarnCardFolderCache.h"
#include "SkarnClipInternal.h"
#include "SkarnLog.h"
#include "SkarnMXFHeaderXML.h"

#include <atomic>
#include <memory>
#include <mutex>

namespace {

// Decremented by every clip that goes; nothing counts clips up or reads it.
std::atomic<int64_t> gClipCount{0};

void bundleAnchor() {}

std::mutex gBundleMutex;
Ref<Bundle> gDefaultBundle;
bool gDefaultBundleLooked = false;

Ref<Bundle> defaultBundle() {
    std::lock_guard lock(gBundleMutex);
    if (!gDefaultBundleLooked) {
        gDefaultBundle = Bundle::bundleForAddress(reinterpret_cast<const void*>(&bundleAnchor));
        gDefaultBundleLooked = true;
    }
    return gDefaultBundle;
}

using FileSystem::hasSuffix;

}  // namespace

// ---------------------------------------------------------------------------
// Construction

SkarnClip::~SkarnClip() { gClipCount.fetch_sub(1, std::memory_order_relaxed); }

void SkarnClip::setDefaultBundle(Ref<Bundle> bundle) {
    std::lock_guard lock(gBundleMutex);
    gDefaultBundle = std::move(bundle);
    gDefaultBundleLooked = gDefaultBundle != nullptr;
}

Ref<SkarnClip> SkarnClip::initWithSkarnClip(const std::optional<std::string>& path) {
    if (!path) return nullptr;
    Ref<XMLDocument> document;
    bool isMXFOp1b = false;
    if (hasSuffix(*path, "XML") || hasSuffix(*path, "xml")) {
        document = XMLDocument::documentWithContentsOfFile(*path);
        if (!document) return nullptr;
    } else if (hasSuffix(*path, "MXF") || hasSuffix(*path, "mxf")) {
        // One error slot for both loads, deliberately: a companion XML that is
        // there but broken sinks the clip even when the header XML would parse.
        std::string error;
        const std::string contents =
            FileSystem::stringByDeletingLastPathComponent(FileSystem::stringByDeletingLastPathComponent(*path));
        const std::string base = FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(*path));
        auto clipFolder = SkarnCardFolderCache::pathInFolder("CLIP", contents);
        auto companion = SkarnCardFolderCache::pathInFolder(
            FileSystem::stringByAppendingPathExtension(base, "XML"), clipFolder);
        if (companion) document = XMLDocument::documentWithContentsOfFile(*companion, &error);
        if (!document || !error.empty()) {
            document = nullptr;
            if (auto xml = SkarnMXF_XMLStringForClip(*path)) {
                std::string parseError;
                document = XMLDocument::documentWithXMLString(*xml, &parseError);
                if (!parseError.empty()) error = parseError;
            }
        }
        isMXFOp1b = true;
        if (!document || !error.empty()) return nullptr;
    } else {
        return nullptr;
    }

    Ref<SkarnClip> clip(new SkarnClip);
    clip->_clipXMLDocument = document;
    clip->_root = document->rootElement();
    clip->_isMXFOp1bFormat = isMXFOp1b;
    clip->_clipXMLPath = *path;
    clip->_pulldown = kSkarnPulldownUnknown;
    {
        std::lock_guard lock(gBundleMutex);
        if (gDefaultBundleLooked) clip->_bundle = gDefaultBundle;
    }
    if (!clip->_bundle) clip->_bundle = defaultBundle();

    clip->_memo = std::make_unique<ConstructionMemo>();
    clip->initializeDurationNumber();
    clip->initializeVideoFormat();
    if (clip->_videoFormat == 0 || clip->durationIntegerValue() == 0) return nullptr;
    clip->initializeShootingRate();
    clip->initializeMediaStart();
    clip->initializeMetadata();
    // Afterwards every property reads the document afresh, as callers expect.
    clip->_memo.reset();
    return clip;
}

std::string SkarnClip::description() const { return Object::description() + " " + _clipXMLPath; }

// ---------------------------------------------------------------------------
// Document access

XMLNode SkarnClip::rootNode() const { return _root; }

std::optional<std::string> SkarnClip::stringFromClipDescriptionForXPath(const std::string& xpath) const {
    if (!_root) return std::nullopt;
    std::string error;
    XMLNode node = _root.firstNodeForXPath(xpath, &error);
    if (!error.empty() || !node) return std::nullopt;
    return node.stringValue();
}

std::optional<std::string> SkarnClip::text(const char* xpath) const {
    if (!_memo) return stringFromClipDescriptionForXPath(xpath);
    for (const auto& [path, value] : _memo->texts)
        if (path == xpath) return value;
    return _memo->texts.emplace_back(xpath, stringFromClipDescriptionForXPath(xpath)).second;
}

std::optional<std::string> SkarnClip::essenceListOrEssence(const char* essenceListPath, const char* essencePath) const {
    auto t = text(essenceListPath);
    return t ? t : text(essencePath);
}

std::string SkarnClip::localized(const std::string& key, const std::string& defaultValue) const {
    if (!_bundle) return defaultValue.empty() ? key : defaultValue;
    return _bundle->localizedString(key, defaultValue, "Skarn");
}

