// The reference host on damaged cards: every command on every card the card
// writer's hostile set holds ends by itself, without a crash or a sanitizer
// report, says what is wrong in one line per problem naming the file or clip,
// leaves no partial output and never writes to the card. Deleting a clip
// removes its own items only, links included, never what links point to.
#include "CardWriter.h"
#include "FileSystem.h"
#include "HostileCards.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <algorithm>
#include <atomic>
#include <fstream>
#include <map>
#include <mutex>
#include <set>
#include <sstream>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

namespace {

std::string skarn() { return buildDir() + "/src/host/skarn"; }
std::string mkcard() { return buildDir() + "/src/cardwriter/skarn-mkcard"; }

std::string quoted(const std::string& s) {
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

std::string readText(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    std::stringstream s;
    s << f.rdbuf();
    return s.str();
}

std::vector<std::string> lines(const std::string& text) {
    std::vector<std::string> out;
    std::stringstream s(text);
    for (std::string line; std::getline(s, line);) out.push_back(line);
    return out;
}

// What the card holds, item by item, without following links: kind, mode,
// size, modification time and link target.
using Snapshot = std::map<std::string, std::string>;

Snapshot snapshot(const std::string& root) {
    Snapshot items;
    FileSystem::enumerate(root, false, [&](const std::string& relative, const std::string& full, bool) {
        struct stat st;
        if (::lstat(full.c_str(), &st) != 0) return true;
        std::ostringstream s;
        s << std::oct << st.st_mode << std::dec << " " << st.st_size << " " << st.st_mtim.tv_sec << "."
          << st.st_mtim.tv_nsec;
        if (S_ISLNK(st.st_mode)) {
            char target[4096];
            const ssize_t n = ::readlink(full.c_str(), target, sizeof target);
            if (n > 0) s << " -> " << std::string(target, size_t(n));
        }
        items[relative] = s.str();
        return true;
    });
    return items;
}

bool anyPartial(const std::string& folder) {
    bool found = false;
    FileSystem::enumerate(folder, false, [&](const std::string& relative, const std::string&, bool) {
        found = found || relative.find(".partial") != std::string::npos;
        return true;
    });
    return found;
}

// The host's commands as `skarn --help` lists them: the media ones are run
// only where this build has them.
std::vector<std::string> hostCommands() {
    std::string help;
    runCommand(skarn() + " --help", &help);
    std::vector<std::string> names;
    bool inList = false;
    for (const std::string& line : lines(help)) {
        if (line.rfind("Subcommands:", 0) == 0 || line.rfind("SUBCOMMANDS:", 0) == 0) {
            inList = true;
            continue;
        }
        if (!inList || line.size() < 3 || line[0] != ' ') continue;
        std::stringstream s(line);
        std::string name;
        s >> name;
        names.push_back(name);
    }
    return names;
}

struct Card {
    std::string fault, root;
    std::vector<std::pair<std::string, std::string>> clips;  // name, clip file
};

struct Outcome {
    int status = 0;
    std::string stderrText;
};

// One run: at most 20 seconds (and a kill 5 later), stdout dropped.
Outcome runHost(const std::string& args, const std::string& errFile) {
    Outcome o;
    o.status = runCommand("timeout -k 5 20 " + skarn() + " " + args + " >/dev/null 2>" + quoted(errFile));
    o.stderrText = readText(errFile);
    return o;
}

// The set is run in shards, each writing only its own cards (every
// kShards-th of the set), so that each is a test of its own size.
constexpr int kShards = 8;

class HostileCards : public ::testing::TestWithParam<int> {
protected:
    void SetUp() override {
        std::vector<HostileCard> written;
        std::string error;
        const size_t shard = size_t(GetParam());
        auto mine = [shard](size_t index, const std::string&) { return index % kShards == shard; };
        ASSERT_TRUE(writeHostileCards(dir / "cards", mine, &written, &error)) << error;
        for (const HostileCard& c : written) {
            Card card{c.fault, c.root, {}};
            for (const HostileClip& clip : c.clips) card.clips.emplace_back(clip.name, clip.clipPath);
            cards.push_back(card);
        }
        ASSERT_FALSE(cards.empty());
    }

    TempDir dir;
    std::vector<Card> cards;
};

TEST(HostileCardSet, CoversEveryKindOfFaultAndTheToolWritesIt) {
    TempDir dir;
    std::map<std::string, int> kinds;
    std::set<std::string> names;
    auto none = [&](size_t, const std::string& fault) {
        ++kinds[fault.substr(0, fault.find('-'))];
        EXPECT_TRUE(names.insert(fault).second) << "two faults named " << fault;
        return false;
    };
    ASSERT_TRUE(writeHostileCards(dir / "none", none, nullptr));
    EXPECT_GT(names.size(), 150u);
    for (const char* kind : {"intact", "truncated", "empty", "klv", "index", "partition", "rip", "xml", "fifo", "dev",
                             "unreadable", "symlink", "folder", "dangling", "essence"})
        EXPECT_GT(kinds[kind], 0) << kind;

    std::string out;
    ASSERT_EQ(runCommand(mkcard() + " --hostile " + quoted(dir / "cards") + " --hostile-only intact- --json", &out), 0);
    const auto j = nlohmann::json::parse(out);
    ASSERT_EQ(j.size(), 4u);
    for (const auto& c : j) {
        EXPECT_EQ(c["root"], dir / ("cards/" + c["fault"].get<std::string>()));
        EXPECT_TRUE(FileSystem::fileExists(c["clips"][0]["clipPath"])) << c;
        EXPECT_TRUE(c["damaged"].empty());
    }
}

INSTANTIATE_TEST_SUITE_P(Shards, HostileCards, ::testing::Range(0, kShards));

TEST_P(HostileCards, EveryCommandEndsCleanlyAndLeavesTheCardAlone) {
    const std::vector<std::string> available = hostCommands();
    auto has = [&](const char* name) { return std::find(available.begin(), available.end(), name) != available.end(); };
    ASSERT_TRUE(has("info") && has("clips"));
    const bool root = ::geteuid() == 0;

    std::mutex lock;
    std::vector<std::string> failures;
    std::atomic<size_t> next{0};
    auto worker = [&](int id) {
        const std::string errFile = dir / ("stderr-" + std::to_string(id));
        for (size_t k; (k = next++) < cards.size();) {
            const Card& card = cards[k];
            const bool intact = card.fault.rfind("intact-", 0) == 0;
            std::vector<std::string> problems;
            // A clip the command cannot use must make it fail and say why; `find`
            // and `cards` answer no by their exit status alone.
            auto check = [&](const std::string& args, size_t allowedLines, bool mustExplainFailure) {
                const Outcome o = runHost(args, errFile);
                const std::string what = "skarn " + args + ": ";
                if (o.status == 124 || o.status == 137) problems.push_back(what + "did not end within 20 s");
                else if (o.status > 128) problems.push_back(what + "killed by signal " + std::to_string(o.status - 128));
                for (const char* text : {"Sanitizer", "runtime error:", "==ERROR", "terminate called"})
                    if (o.stderrText.find(text) != std::string::npos)
                        problems.push_back(what + "stderr holds \"" + text + "\": " + o.stderrText.substr(0, 2000));
                const std::vector<std::string> errLines = lines(o.stderrText);
                if (intact && ((mustExplainFailure && o.status != 0) || !errLines.empty()))
                    problems.push_back(what + "failed on an intact card (" + std::to_string(o.status) + "): " + o.stderrText.substr(0, 600));
                if (mustExplainFailure && o.status != 0 && errLines.empty())
                    problems.push_back(what + "failed (" + std::to_string(o.status) + ") without saying why");
                // A flood of lines is one problem, shown by its first lines.
                std::set<std::string> seen;
                std::string unclear;
                for (const std::string& line : errLines) {
                    bool names = line.find(card.root) != std::string::npos;
                    for (const auto& [name, path] : card.clips) names = names || line.find(name) != std::string::npos;
                    if ((line.rfind("skarn: ", 0) != 0 || !names || !seen.insert(line).second) && unclear.empty())
                        unclear = line;
                }
                if (!unclear.empty() || errLines.size() > allowedLines)
                    problems.push_back(what + std::to_string(errLines.size()) + " stderr line(s), each should start \"skarn: \", "
                                       "name a file or clip and be said once (at most " + std::to_string(allowedLines) +
                                       "); " + (unclear.empty() ? "" : "first unclear: \"" + unclear + "\"; ") +
                                       "stderr: " + o.stderrText.substr(0, 600));
                return o;
            };

            const Snapshot before = snapshot(card.root);
            const std::string r = quoted(card.root);
            const size_t many = card.clips.size() + 1;
            check("cards " + r, 1, false);
            check("clips " + r, many, true);
            check("clips --json " + r, many, true);
            check("find " + r + " " + globalClipIDFor(card.clips[0].first), 1, false);
            check("info " + quoted(card.clips[0].second), 1, true);
            const std::string out = dir / ("out/" + card.fault);
            for (const auto& [name, path] : card.clips) {
                const std::string clip = quoted(card.root + ":" + name);
                const Outcome info = check("info --json " + clip, 1, true);
                // A clip document that cannot be read as one is refused.
                const bool unreadable = card.fault == "unreadable-clip-xml" || card.fault == "unreadable-avclip-mxf";
                for (const char* refused : {"fifo-as-clip-xml", "dev-zero-as-clip-xml", "fifo-as-avclip-mxf",
                                            "dev-zero-as-avclip-mxf", "xml-huge-200mb", "empty-clip-xml",
                                            "unreadable-clip-xml", "unreadable-avclip-mxf", "folder-as-clip-xml"})
                    // Permission bits do not stop root from reading.
                    if (card.fault == refused && !(unreadable && root) && info.status == 0)
                        problems.push_back("skarn info " + clip + ": answered for an unreadable clip document");
                // The media commands may meet one problem per track.
                const size_t perTrack = 4;
                if (has("tracks")) check("tracks " + clip, perTrack, true);
                if (has("samples")) {
                    check("samples " + clip, perTrack, true);
                    check("samples --track 2 " + clip, perTrack, true);
                }
                if (has("ingest")) {
                    check("ingest " + clip + " -o " + quoted(out + "/"), perTrack, true);
                    if (anyPartial(out)) problems.push_back("skarn ingest " + clip + ": left a partial movie behind");
                }
            }
            FileSystem::removeItem(out);
            const Snapshot after = snapshot(card.root);
            if (after != before) {
                std::string changed;
                for (const auto& [item, state] : before)
                    if (!after.count(item) || after.at(item) != state) changed += " " + item;
                for (const auto& [item, state] : after)
                    if (!before.count(item)) changed += " +" + item;
                problems.push_back("the card changed:" + changed);
            }
            std::lock_guard<std::mutex> guard(lock);
            for (const std::string& p : problems) failures.push_back(card.fault + ": " + p);
        }
    };
    // The runs are mostly waiting on the child processes.
    std::vector<std::thread> workers;
    for (int i = 0; i < 3; ++i) workers.emplace_back(worker, i);
    for (auto& t : workers) t.join();

    for (size_t i = 0; i < failures.size() && i < 100; ++i) ADD_FAILURE() << failures[i];
    EXPECT_EQ(failures.size(), 0u);
    if (root) GTEST_LOG_(INFO) << "running as root: unreadable files were read, as root may";
}

// ---- Deletion and links ----------------------------------------------------

class DeletionAndLinks : public ::testing::Test {
protected:
    void SetUp() override {
        card.root = dir / "card";
        for (unsigned i = 1; i <= 2; ++i) {
            ClipSpec c = defaultClip(*cardFamilyNamed("dv-ntsc"), i);
            c.frames = 2;
            card.clips.push_back(c);
        }
        ASSERT_TRUE(writeCard(card));
        outside = dir / "outside";
        makeDirs(outside);
        // Files named like the clip's own, outside the card.
        for (const char* name : {"A00100.MXF", "A00101.MXF", "A001.MXF", "A001.BMP", "keep.txt"})
            writeTextFile(outside + "/" + name, "not the card's");
    }
    std::string contents(const std::string& rel) const { return card.root + "/CONTENTS/" + rel; }
    void link(const std::string& target, const std::string& at) {
        FileSystem::removeItem(at);
        ASSERT_EQ(::symlink(target.c_str(), at.c_str()), 0) << at;
    }
    static bool exists(const std::string& path) {
        struct stat st;
        return ::lstat(path.c_str(), &st) == 0;
    }
    void deleteA001() {
        std::string out;
        EXPECT_EQ(runCommand(skarn() + " delete --yes " + quoted(card.root + ":A001") + " 2>&1", &out), 0) << out;
    }
    void expectOutsideUntouched() {
        for (const char* name : {"A00100.MXF", "A00101.MXF", "A001.MXF", "A001.BMP", "keep.txt"})
            EXPECT_EQ(readText(outside + "/" + name), "not the card's") << name;
    }
    void expectOtherClipUntouched() {
        for (const char* rel : {"CLIP/A002.XML", "VIDEO/A002.MXF", "AUDIO/A00200.MXF", "AUDIO/A00201.MXF", "ICON/A002.BMP"})
            EXPECT_TRUE(FileSystem::fileExists(contents(rel))) << rel;
    }

    TempDir dir;
    CardSpec card;
    std::string outside;
};

TEST_F(DeletionAndLinks, LinksInTheClipsFoldersAreRemovedNotFollowed) {
    link(outside + "/A00100.MXF", contents("AUDIO/A00100.MXF"));  // the clip's file is a link
    link(outside, contents("AUDIO/A001EXTRA"));                    // an item of the clip's name, a folder link
    link(outside, contents("AUDIO/SHARED"));                       // another item, a folder link
    link(outside + "/A001.MXF", contents("VIDEO/A001.MXF"));
    link(outside, contents("ICON/A001.BMP"));
    deleteA001();
    for (const char* rel : {"AUDIO/A00100.MXF", "AUDIO/A00101.MXF", "AUDIO/A001EXTRA", "VIDEO/A001.MXF",
                            "ICON/A001.BMP", "CLIP/A001.XML"})
        EXPECT_FALSE(exists(contents(rel))) << rel;
    EXPECT_TRUE(exists(contents("AUDIO/SHARED")));
    expectOutsideUntouched();
    expectOtherClipUntouched();
}

TEST_F(DeletionAndLinks, AnAudioFolderThatIsALinkKeepsWhatIsNotTheClips) {
    // AUDIO lives outside the card: the clip's channels and another clip's
    // are there, beside a link named like the clip and a folder.
    const std::string audio = dir / "audio-elsewhere";
    makeDirs(audio);
    ASSERT_EQ(::rename(contents("AUDIO").c_str(), (audio + "/moved").c_str()), 0);
    for (const char* name : {"A00100.MXF", "A00101.MXF", "A00200.MXF", "A00201.MXF"})
        ASSERT_EQ(::rename((audio + "/moved/" + name).c_str(), (audio + "/" + name).c_str()), 0);
    link(outside, audio + "/A001LINK");
    link(audio, contents("AUDIO"));
    deleteA001();
    // The folder link and the folder stay; another clip's file stays; what the
    // link inside points to stays.
    struct stat st;
    ASSERT_EQ(::lstat(contents("AUDIO").c_str(), &st), 0);
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    EXPECT_TRUE(FileSystem::isDirectory(audio));
    EXPECT_TRUE(exists(audio + "/A00200.MXF"));
    EXPECT_TRUE(exists(audio + "/moved"));
    EXPECT_FALSE(exists(audio + "/A001LINK"));
    expectOutsideUntouched();
    EXPECT_FALSE(exists(contents("VIDEO/A001.MXF")));
    EXPECT_TRUE(exists(contents("VIDEO/A002.MXF")));
}

}  // namespace
