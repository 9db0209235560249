#include "SkarnVolume.h"

#include "FileSystem.h"
#include "SkarnFileUtilities.h"

Ref<SkarnVolume> SkarnVolume::initWithPath(const std::optional<std::string>& path, Ref<Image> icon) {
    if (!path) return nullptr;
    Ref<SkarnVolume> v(new SkarnVolume);
    v->_path = *path;
    v->_icon = std::move(icon);
    return v;
}

Ref<SkarnVolume> SkarnVolume::copyWithZone() const { return initWithPath(_path, _icon); }

std::optional<std::string> SkarnVolume::name() const { return FileSystem::lastPathComponent(_path); }

std::optional<std::string> SkarnVolume::CONTENTSPath() const {
    return SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("CONTENTS", _path);
}

std::vector<std::string> SkarnVolume::volumeClipURLs() const {
    std::vector<std::string> urls;
    if (auto last = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("LASTCLIP.TXT", _path))
        urls.push_back(*last);
    auto contents = CONTENTSPath();
    if (!contents) return urls;
    // Only essence and thumbnail files: clip XML, proxies and voice memos are
    // deliberately not listed.
    FileSystem::enumerate(*contents, /*skipHidden=*/true, [&](const std::string&, const std::string& full, bool isDir) {
        if (!isDir) {
            std::string ext = FileSystem::pathExtension(full);
            if (FileSystem::caseInsensitiveEqual(ext, "mxf") || FileSystem::caseInsensitiveEqual(ext, "bmp"))
                urls.push_back(full);
        }
        return true;
    });
    return urls;
}

bool SkarnVolume::respondsToSelector(std::string_view s) const {
    return s == "icon" || s == "CONTENTSPath" || s == "volumeClipURLs" || s == "willUnmount" || s == "didUnmount";
}

std::string SkarnVolume::description() const { return "<SkarnVolume: " + _path + ">"; }
