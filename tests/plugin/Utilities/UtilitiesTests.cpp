#include "FileSystem.h"
#include "Preferences.h"
#include "SkarnFileUtilities.h"
#include "SkarnGenericUserDefaults.h"
#include "SkarnLog.h"
#include "ThreadSafeFileManager.h"

#include "AssertionHandler.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

TEST(CaseInsensitiveLookup, ResolvesAnySpellingToTheOneOnDisk) {
    TempDir dir;
    makeDirs(dir / "contents/clip");
    auto contents = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("CONTENTS", dir.path());
    ASSERT_TRUE(contents);
    EXPECT_EQ(*contents, dir / "contents");
    EXPECT_EQ(SkarnUtilities_CaseInsensitiveFileExistsInDirectory("CLIP", contents), "clip");
    EXPECT_EQ(SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("Clip", contents),
              dir / "contents/clip");
    // Whole names only: no extension or prefix matching.
    EXPECT_FALSE(SkarnUtilities_CaseInsensitiveFileExistsInDirectory("CLI", contents));
    EXPECT_FALSE(SkarnUtilities_CaseInsensitiveFileExistsInDirectory("CLIP.XML", contents));
}

TEST(CaseInsensitiveLookup, MissingFoldersFilesAndNilGiveNil) {
    TempDir dir;
    writeTextFile(dir / "plain.txt", "x");
    EXPECT_FALSE(SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("a", dir / "nowhere"));
    EXPECT_FALSE(SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("a", dir / "plain.txt"));
    EXPECT_FALSE(SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("a", std::nullopt));
    EXPECT_FALSE(SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath(std::nullopt, dir.path()));
}

TEST(CaseInsensitiveLookup, FirstOfTwoCaseTwinsInListingOrderWins) {
    TempDir dir;
    writeTextFile(dir / "A001.XML", "upper");
    writeTextFile(dir / "a001.xml", "lower");
    auto listing = FileSystem::contentsOfDirectory(dir.path());
    ASSERT_TRUE(listing);
    std::string first;
    for (const auto& n : *listing)
        if (FileSystem::caseInsensitiveEqual(n, "A001.xml")) {
            first = n;
            break;
        }
    EXPECT_EQ(SkarnUtilities_CaseInsensitiveFileExistsInDirectory("A001.Xml", dir.path()), first);
}

TEST(CaseInsensitiveLookup, UnreadableFolderGivesNil) {
    if (::geteuid() == 0) GTEST_SKIP() << "root reads every folder";
    TempDir dir;
    makeDirs(dir / "locked");
    writeTextFile(dir / "locked/CLIP", "x");
    ::chmod((dir / "locked").c_str(), 0);
    EXPECT_FALSE(SkarnUtilities_CaseInsensitiveFileExistsInDirectory("CLIP", dir / "locked"));
    ::chmod((dir / "locked").c_str(), 0755);
}

TEST(ThreadSafeFileManager, SortsCaseInsensitivelyAndKeepsDotEntries) {
    TempDir dir;
    for (const char* n : {"b", "C", "a"}) writeTextFile(dir / n, "x");
    auto names = ThreadSafeFileManager::fileManager()->directoryContentsAtPath(dir.path());
    ASSERT_TRUE(names);
    EXPECT_EQ(*names, (std::vector<std::string>{".", "..", "a", "b", "C"}));
    EXPECT_FALSE(ThreadSafeFileManager::fileManager()->directoryContentsAtPath(dir / "missing"));
    EXPECT_FALSE(ThreadSafeFileManager::fileManager()->directoryContentsAtPath(std::nullopt));
}

TEST(ThreadSafeFileManager, ListsFromManyThreadsAtOnce) {
    TempDir dir;
    for (int i = 0; i < 50; ++i) writeTextFile(dir / ("f" + std::to_string(i)), "x");
    Ref<ThreadSafeFileManager> fm = ThreadSafeFileManager::fileManager();
    std::vector<std::thread> threads;
    std::atomic<int> good{0};
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < 50; ++i)
                if (auto n = fm->directoryContentsAtPath(dir.path()); n && n->size() == 52) ++good;
        });
    for (auto& t : threads) t.join();
    EXPECT_EQ(good.load(), 200);
}

TEST(DeleteFileAtPathIfExists, AbsentPathsSucceedLockedFilesAreUnlockedFirst) {
    TempDir dir;
    EXPECT_TRUE(SkarnUtilities_DeleteFileAtPathIfExists(dir / "absent"));
    writeTextFile(dir / "folder/inner/file", "x");
    EXPECT_TRUE(SkarnUtilities_DeleteFileAtPathIfExists(dir / "folder"));
    EXPECT_FALSE(FileSystem::fileExists(dir / "folder"));
    // A dangling link is still an item to remove.
    ASSERT_EQ(::symlink((dir / "nothing").c_str(), (dir / "dangling").c_str()), 0);
    EXPECT_TRUE(SkarnUtilities_DeleteFileAtPathIfExists(dir / "dangling"));
    struct stat st;
    EXPECT_NE(::lstat((dir / "dangling").c_str(), &st), 0);
    if (!immutableFlagSupported(dir.path())) GTEST_SKIP() << "no immutable flag on this file system";
    writeTextFile(dir / "locked.MXF", "x");
    ASSERT_TRUE(FileSystem::setImmutable(dir / "locked.MXF", true));
    EXPECT_TRUE(SkarnUtilities_DeleteFileAtPathIfExists(dir / "locked.MXF"));
    EXPECT_FALSE(FileSystem::fileExists(dir / "locked.MXF"));
}

TEST(SkarnGenericUserDefaults, StoresInTheApplicationsDomain) {
    TempDir dir;
    const char* old = std::getenv("XDG_CONFIG_HOME");
    std::string saved = old ? old : "";
    ::setenv("XDG_CONFIG_HOME", dir.path().c_str(), 1);
    CFPreferencesResetCache();
    Ref<SkarnGenericUserDefaults> d = SkarnGenericUserDefaults::genericUserDefaultsForApplicationId("com.example.app");
    EXPECT_FALSE(d->hasKey("k"));
    EXPECT_FALSE(d->boolForKey("k"));
    d->setBool(true, "k");
    d->setObject(Value("v"), "s");
    EXPECT_TRUE(d->synchronize());
    CFPreferencesResetCache();
    EXPECT_TRUE(d->boolForKey("k"));
    EXPECT_EQ(d->objectForKey("s").string(), "v");
    d->removeObjectForKey("s");
    EXPECT_FALSE(d->hasKey("s"));
    CFPreferencesResetCache();
    if (old) ::setenv("XDG_CONFIG_HOME", saved.c_str(), 1);
    else ::unsetenv("XDG_CONFIG_HOME");
}

TEST(SkarnGenericUserDefaults, NilIdentifierIsReportedThenGoesOnWithNoDomain) {
    RecordingAssertionHandler recorder;
    ScopedAssertionHandler scope(&recorder);
    Ref<SkarnGenericUserDefaults> d = SkarnGenericUserDefaults::initWithApplicationId(std::nullopt);
    ASSERT_EQ(recorder.failures.size(), 1u);
    EXPECT_EQ(recorder.failures[0].file, "Utilities/VestaGenericUserDefaults");
    EXPECT_EQ(recorder.failures[0].line, 16);
    EXPECT_EQ(recorder.failures[0].description, "Invalid parameter not satisfying: nil != anApplicationId");
    ASSERT_TRUE(d);
    EXPECT_TRUE(d->objectForKey("anything").isNull());
}

TEST(SkarnLog, FormatsObjectsAndPrintfPlaceholders) {
    struct Named : Object {
        std::string description() const override { return "<clip A001>"; }
    };
    Ref<Named> clip = makeRef<Named>();
    EXPECT_EQ(SkarnLogFormat("%@: duration: %lld/%d", clip, int64_t(300), 30), "<clip A001>: duration: 300/30");
    EXPECT_EQ(SkarnLogFormat("bad frame rate: %f", 0.0), "bad frame rate: 0.000000");
    EXPECT_EQ(SkarnLogFormat("%@ retain %d", std::string("x"), 2), "x retain 2");
    EXPECT_EQ(SkarnLogFormat("%s|%5.2f|%x|%%|%@", "a", 3.14159, 255u, std::optional<std::string>()),
              "a| 3.14|ff|%|(null)");
    // Too few arguments never reads past them.
    EXPECT_EQ(SkarnLogFormat("%d %d", 1), "1 (missing)");
}

TEST(SkarnLog, ShippingBuildDoesNotEvaluateArguments) {
#if !(defined(SKARN_DIAGNOSTIC_LOG) && SKARN_DIAGNOSTIC_LOG)
    int evaluated = 0;
    auto touch = [&] { return ++evaluated; };
    SkarnLog(1, "%d", touch());
    EXPECT_EQ(evaluated, 0);
#else
    GTEST_SKIP() << "diagnostic build";
#endif
}
