#include "FileSystem.h"

#include "TestSupport.h"

#include <gtest/gtest.h>

#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

TEST(FileSystem, RemoveItemNeverFollowsSymbolicLinks) {
    TempDir dir;
    writeTextFile(dir / "keep/precious.txt", "x");
    writeTextFile(dir / "victim/file.txt", "y");
    ASSERT_EQ(::symlink((dir / "keep").c_str(), (dir / "victim/link").c_str()), 0);
    EXPECT_TRUE(FileSystem::removeItem(dir / "victim"));
    EXPECT_FALSE(FileSystem::fileExists(dir / "victim"));
    EXPECT_TRUE(FileSystem::fileExists(dir / "keep/precious.txt"));
}

TEST(FileSystem, LockedFilesAreNotDeletable) {
    TempDir dir;
    if (!immutableFlagSupported(dir.path())) GTEST_SKIP() << "no immutable flag on this file system";
    writeTextFile(dir / "a.MXF", "x");
    EXPECT_TRUE(FileSystem::isDeletableFile(dir / "a.MXF"));
    ASSERT_TRUE(FileSystem::setImmutable(dir / "a.MXF", true));
    EXPECT_EQ(FileSystem::isImmutable(dir / "a.MXF"), true);
    EXPECT_FALSE(FileSystem::isDeletableFile(dir / "a.MXF"));
    EXPECT_FALSE(FileSystem::removeItem(dir / "a.MXF"));
    ASSERT_TRUE(FileSystem::setImmutable(dir / "a.MXF", false));
    EXPECT_TRUE(FileSystem::removeItem(dir / "a.MXF"));
    EXPECT_FALSE(FileSystem::isDeletableFile(dir / "a.MXF"));  // absent
}

// The lock tests look at the items of a card's folders; a FIFO or device there
// is never opened (an open can release a waiting writer, or act on a device).
TEST(FileSystem, LockTestsDoNotOpenFIFOs) {
    TempDir dir;
    const std::string fifo = dir / "A00100.MXF";
    ASSERT_EQ(::mkfifo(fifo.c_str(), 0644), 0);
    const int watch = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    ASSERT_GE(watch, 0);
    ASSERT_GE(::inotify_add_watch(watch, fifo.c_str(), IN_OPEN), 0);
    EXPECT_EQ(FileSystem::isImmutable(fifo), std::nullopt);
    EXPECT_FALSE(FileSystem::setImmutable(fifo, true));
    FileSystem::isDeletableFile(fifo);
    char events[4096];
    EXPECT_LT(::read(watch, events, sizeof events), 0) << "the FIFO was opened";
    ::close(watch);
}

TEST(FileSystem, PathHelpersFollowThePlatformStringRules) {
    using namespace FileSystem;
    EXPECT_EQ(lastPathComponent("/a/b/C.XML"), "C.XML");
    EXPECT_EQ(lastPathComponent("/a/b/"), "b");
    EXPECT_EQ(stringByDeletingLastPathComponent("/a/b/C.XML"), "/a/b");
    EXPECT_EQ(stringByDeletingLastPathComponent("/a"), "/");
    EXPECT_EQ(pathExtension("/a/b.c/C.XML"), "XML");
    EXPECT_EQ(pathExtension("/a/b.c/noext"), "");
    EXPECT_EQ(pathExtension("/a/.hidden"), "");
    EXPECT_EQ(stringByDeletingPathExtension("/x/A001.MXF"), "/x/A001");
    EXPECT_EQ(stringByAppendingPathComponent("/x/", "y"), "/x/y");
    EXPECT_EQ(caseInsensitiveCompare("abc", "ABD"), -1);
    EXPECT_TRUE(caseInsensitiveEqual("Contents", "CONTENTS"));
    EXPECT_FALSE(caseInsensitiveEqual("CONTENT", "CONTENTS"));
}

TEST(FileSystem, EnumerateSkipsHiddenNamesAndDoesNotFollowLinkedFolders) {
    TempDir dir;
    writeTextFile(dir / "a/b/file", "1");
    writeTextFile(dir / "a/.hidden/file", "2");
    writeTextFile(dir / "outside/file", "3");
    ASSERT_EQ(::symlink((dir / "outside").c_str(), (dir / "a/link").c_str()), 0);
    std::vector<std::string> seen;
    FileSystem::enumerate(dir / "a", true, [&](const std::string& rel, const std::string&, bool) {
        seen.push_back(rel);
        return true;
    });
    std::sort(seen.begin(), seen.end());
    EXPECT_EQ(seen, (std::vector<std::string>{"b", "b/file", "link"}));
}

TEST(FileSystem, AtomicWritesLeaveNoTemporaryFile) {
    TempDir dir;
    std::string path = dir / "prefs.json";
    ASSERT_TRUE(FileSystem::writeFileAtomically(path, "{}", 2));
    ASSERT_TRUE(FileSystem::writeFileAtomically(path, "{\"a\":1}", 7));
    auto names = FileSystem::contentsOfDirectory(dir.path());
    ASSERT_TRUE(names);
    EXPECT_EQ(*names, std::vector<std::string>{"prefs.json"});
    EXPECT_EQ(FileSystem::fileSize(path), 7u);
}

TEST(FileSystem, ReadFileIsBoundedByTheCallersLimit) {
    TempDir dir;
    writeTextFile(dir / "f", std::string(1000, 'x'));
    EXPECT_EQ(FileSystem::readFile(dir / "f", 10)->size(), 10u);
    EXPECT_FALSE(FileSystem::readFile(dir / "missing"));
    EXPECT_FALSE(FileSystem::readFile(dir.path()));  // a folder is no file
}
