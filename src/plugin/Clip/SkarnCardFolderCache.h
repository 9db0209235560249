// Case-insensitive lookups in card folders, answered from listings kept
// across clips.
//
// Every clip resolves its files in the card's VIDEO, AUDIO, ICON... folders;
// listing a folder of hundreds of entries for every file of every clip made
// card scans quadratic. A folder's listing is kept and used again while the
// folder's identity and change times stay as they were, and only once those
// times lie safely in the past when it was listed (a change within the same
// clock tick as the listing could otherwise go unseen). Answers are those of
// SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath: the first
// entry, in listing order, equal to the name case-insensitively.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace SkarnCardFolderCache {

// One folder's listing.
class Listing {
public:
    Listing(std::vector<std::string> entries);
    // Entries in listing order.
    const std::vector<std::string>& entries() const { return _entries; }
    // The on-disk spelling of the first entry equal to name case-insensitively.
    const std::string* entryNamed(const std::string& name) const;

private:
    std::vector<std::string> _entries;
    std::unordered_map<std::string, size_t> _index;  // folded name -> first entry
};

// nullptr when the folder is no readable folder.
std::shared_ptr<const Listing> listing(const std::string& folder);

// folder joined with the on-disk spelling of name, or nullopt.
std::optional<std::string> pathInFolder(const std::string& name, const std::optional<std::string>& folder);

// Forgets every listing (for tests).
void clear();

}  // namespace SkarnCardFolderCache
