#include "SkarnCardFolderCache.h"

#include "FileSystem.h"

#include <cctype>
#include <ctime>
#include <list>
#include <mutex>
#include <sys/stat.h>
#include <unordered_map>

namespace SkarnCardFolderCache {
namespace {

// Listings are trusted again only for folders unchanged for this long before
// they were listed.
constexpr int64_t kSettleNanoseconds = 2'000'000'000;
constexpr size_t kMaxFolders = 32;

int64_t nanoseconds(const timespec& t) { return int64_t(t.tv_sec) * 1'000'000'000 + t.tv_nsec; }

std::string folded(const std::string& s) {
    std::string out(s);
    // The same byte-wise folding FileSystem::caseInsensitiveEqual applies.
    for (char& c : out) c = char(std::tolower(static_cast<unsigned char>(c)));
    return out;
}

struct CachedListing {
    std::string folder;
    dev_t dev = 0;
    ino_t ino = 0;
    int64_t mtime = 0, ctime = 0;
    bool settled = false;
    std::shared_ptr<const Listing> listing;
};

std::mutex gMutex;
std::list<CachedListing> gListings;  // most recently used first

}  // namespace

Listing::Listing(std::vector<std::string> entries) : _entries(std::move(entries)) {
    _index.reserve(_entries.size());
    for (size_t i = 0; i < _entries.size(); ++i) _index.emplace(folded(_entries[i]), i);
}

const std::string* Listing::entryNamed(const std::string& name) const {
    auto it = _index.find(folded(name));
    return it == _index.end() ? nullptr : &_entries[it->second];
}

std::shared_ptr<const Listing> listing(const std::string& folder) {
    struct stat st;
    if (::stat(folder.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) return nullptr;
    const int64_t mtime = nanoseconds(st.st_mtim), ctime = nanoseconds(st.st_ctim);
    {
        std::lock_guard lock(gMutex);
        for (auto it = gListings.begin(); it != gListings.end(); ++it) {
            if (it->folder != folder) continue;
            if (it->settled && it->dev == st.st_dev && it->ino == st.st_ino && it->mtime == mtime &&
                it->ctime == ctime) {
                gListings.splice(gListings.begin(), gListings, it);
                return it->listing;
            }
            gListings.erase(it);
            break;
        }
    }
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    int error = 0;
    auto names = FileSystem::contentsOfDirectory(folder, &error);
    if (!names || error != 0) return nullptr;
    auto result = std::make_shared<const Listing>(std::move(*names));

    CachedListing l;
    l.folder = folder;
    l.dev = st.st_dev;
    l.ino = st.st_ino;
    l.mtime = mtime;
    l.ctime = ctime;
    l.settled = std::max(mtime, ctime) + kSettleNanoseconds < nanoseconds(now);
    l.listing = result;
    if (l.settled) {
        std::lock_guard lock(gMutex);
        gListings.push_front(std::move(l));
        if (gListings.size() > kMaxFolders) gListings.pop_back();
    }
    return result;
}

std::optional<std::string> pathInFolder(const std::string& name, const std::optional<std::string>& folder) {
    if (!folder) return std::nullopt;
    auto l = listing(*folder);
    const std::string* entry = l ? l->entryNamed(name) : nullptr;
    if (!entry) return std::nullopt;
    return FileSystem::stringByAppendingPathComponent(*folder, *entry);
}

void clear() {
    std::lock_guard lock(gMutex);
    gListings.clear();
}

}  // namespace SkarnCardFolderCache
