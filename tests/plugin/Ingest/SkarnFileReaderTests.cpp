#include "SkarnFileReader.h"
#include "SkarnFileSource.h"

#include "FileReaderModel.h"
#include "FileSystem.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <fcntl.h>
#include <future>
#include <iterator>
#include <memory>
#include <random>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

constexpr uint64_t kFileSize = 300000;

uint8_t patternByte(uint64_t i) {
    uint32_t x = uint32_t(i) * 2654435761u;
    return uint8_t((x ^ (x >> 15)) >> 7);
}

std::vector<uint8_t> patternBytes(uint64_t size) {
    std::vector<uint8_t> bytes(size);
    for (uint64_t i = 0; i < size; ++i) bytes[i] = patternByte(i);
    return bytes;
}

std::vector<uint8_t> fileBytes(uint64_t from, uint64_t count) {
    std::vector<uint8_t> bytes(count);
    for (uint64_t i = 0; i < count; ++i) bytes[i] = patternByte(from + i);
    return bytes;
}

// One pattern file shared by every test here: byte i of the file is patternByte(i).
class FileReaderTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        dir = std::make_unique<TempDir>();
        path = *dir / "A001.MXF";
        writeBytes(path, patternBytes(kFileSize));
    }
    static void TearDownTestSuite() { dir.reset(); }
    void SetUp() override {
        if (FileSystem::pageSize() != 4096) GTEST_SKIP() << "the worked examples assume 4096-byte pages";
    }

    static std::vector<uint8_t> readFrom(SkarnFileReader& reader, uint64_t count) {
        std::vector<uint8_t> out(count);
        out.resize(reader.read(count, out.data()));
        return out;
    }

    static inline std::unique_ptr<TempDir> dir;
    static inline std::string path;
};

using FileSource = FileReaderTest;

TEST_F(FileSource, ReadsItsRangeRelativeToItsStartAndStopsAtItsEnd) {
    auto source = SkarnFileSource::initWithURL(path, 1000, 5001);
    EXPECT_EQ(source->startOffset(), 1000u);
    EXPECT_EQ(source->absoluteOffset(), 0);
    std::vector<uint8_t> bytes(8000);
    ASSERT_EQ(source->read(bytes.data(), 100), 100);
    bytes.resize(100);
    EXPECT_EQ(bytes, fileBytes(1000, 100));
    EXPECT_EQ(source->absoluteOffset(), 100);
    EXPECT_EQ(source->remaining(), 4901u);

    bytes.resize(8000);
    EXPECT_EQ(source->read(bytes.data(), 8000), 4901);
    EXPECT_TRUE(source->endOfStream());
    EXPECT_EQ(source->read(bytes.data(), 8000), 0);
    EXPECT_EQ(source->read(bytes.data(), 0), 0);
    EXPECT_EQ(source->read(bytes.data(), -1), 0) << "a negative count must not become a huge one";
}

TEST_F(FileSource, SeekToOrBeyondTheLengthLandsExactlyAtTheEnd) {
    auto source = SkarnFileSource::initWithURL(path, 777, 12345);
    for (int64_t target : {int64_t(12345), int64_t(12346), int64_t(1) << 40, INT64_MAX}) {
        source->seek(10);
        EXPECT_EQ(source->seek(target), 12345) << target;
        EXPECT_EQ(source->remaining(), 0u);
        EXPECT_TRUE(source->endOfStream());
    }
    EXPECT_EQ(source->seek(12344), 12344);
    uint8_t byte = 0;
    ASSERT_EQ(source->read(&byte, 10), 1);
    EXPECT_EQ(byte, patternByte(777 + 12344));
}

TEST_F(FileSource, SeekBeforeTheRangeReachesTheFileButNotBeforeItsStart) {
    auto source = SkarnFileSource::initWithURL(path, 8192, 100);
    EXPECT_EQ(source->seek(-100), -100);
    EXPECT_EQ(source->remaining(), 200u);
    uint8_t bytes[4];
    ASSERT_EQ(source->read(bytes, 4), 4);
    EXPECT_EQ(std::vector<uint8_t>(bytes, bytes + 4), fileBytes(8092, 4));
    EXPECT_EQ(source->seek(-9000), -96) << "a position before the file's start leaves the descriptor where it was";
}

TEST_F(FileSource, PathsAreStandardisedBeforeOpening) {
    const std::string name = FileSystem::lastPathComponent(path);
    for (const std::string& spelling :
         {dir->path() + "//./" + name, dir->path() + "/" + name + "/", dir->path() + "/gone/../" + name}) {
        auto source = SkarnFileSource::initWithURL(spelling, 10, 10);
        uint8_t byte = 0;
        EXPECT_EQ(source->read(&byte, 1), 1) << spelling;
        EXPECT_EQ(byte, patternByte(10)) << spelling;
    }
}

TEST(FileSourceOpen, NilMissingAndNegativeOffsetReadNothingAndCloseNothing) {
    TempDir dir;
    const int stdinFlags = ::fcntl(0, F_GETFD);
    for (auto source : {SkarnFileSource::initWithURL(std::nullopt, 0, 100),
                        SkarnFileSource::initWithURL(dir / "missing.MXF", 0, 100),
                        SkarnFileSource::initWithURL(dir / "missing.MXF", 4096, 100)}) {
        uint8_t byte = 0;
        EXPECT_TRUE(source->endOfStream());
        EXPECT_EQ(source->read(&byte, 1), 0);
        EXPECT_EQ(source->seek(50), 0);
    }
    writeBytes(dir / "short.MXF", {1, 2, 3});
    auto negative = SkarnFileSource::initWithURL(dir / "short.MXF", -1, 3);
    uint8_t byte = 0;
    EXPECT_EQ(negative->read(&byte, 1), 0);
    negative = nullptr;
    EXPECT_EQ(::fcntl(0, F_GETFD), stdinFlags) << "descriptor 0 belongs to someone else";

    auto reader = SkarnFileReader::initWithURL(dir / "missing.MXF", 0, 100000);
    ASSERT_TRUE(reader);
    std::vector<uint8_t> bytes(100000);
    EXPECT_EQ(reader->read(bytes.size(), bytes.data()), 0u);
    EXPECT_EQ(reader->seek(5000), 0);
    EXPECT_EQ(reader->read(10, bytes.data()), 0u);
}

// A FIFO or a device where a clip's file should be must be refused when it is
// opened, before anything waits on it. The open runs on its own thread so that
// a blocking one fails the test instead of hanging it.
TEST(FileSourceOpen, RefusesFifosDevicesAndFoldersWithoutBlocking) {
    TempDir dir;
    const std::string fifo = dir / "A001.MXF";
    ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
    auto readFifo = std::async(std::launch::async, [&] {
        auto reader = SkarnFileReader::initWithURL(fifo, 0, 1000);
        uint8_t bytes[100];
        return reader->read(sizeof bytes, bytes);
    });
    if (readFifo.wait_for(std::chrono::seconds(5)) != std::future_status::ready) {
        // A writer releases an open that waits for one; then the test can end.
        const int writer = ::open(fifo.c_str(), O_WRONLY | O_NONBLOCK);
        if (writer >= 0) ::close(writer);
        readFifo.wait();
        FAIL() << "opening a FIFO blocked";
    }
    EXPECT_EQ(readFifo.get(), 0u);

    // With a writer holding data a read would deliver it; it must not.
    const int holder = ::open(fifo.c_str(), O_RDWR | O_NONBLOCK);
    ASSERT_GE(holder, 0);
    ASSERT_EQ(::write(holder, "0123456789", 10), 10);
    auto source = SkarnFileSource::initWithURL(fifo, 0, 10);
    uint8_t bytes[10];
    EXPECT_EQ(source->read(bytes, 10), 0);
    ::close(holder);

    for (const std::string& notAFile : {std::string("/dev/zero"), dir.path()}) {
        auto other = SkarnFileSource::initWithURL(notAFile, 0, 1u << 30);
        EXPECT_TRUE(other->endOfStream()) << notAFile;
        EXPECT_EQ(other->read(bytes, 10), 0) << notAFile;
    }
}

TEST_F(FileReaderTest, ZeroLengthRangeIsAtItsEndAtOnce) {
    auto reader = SkarnFileReader::initWithURL(path, 5000, 0);
    EXPECT_TRUE(reader->source()->endOfStream());
    EXPECT_EQ(reader->remaining(), 0u);
    std::vector<uint8_t> bytes(100000);
    for (uint64_t count : {uint64_t(1), uint64_t(4096), uint64_t(100000)}) EXPECT_EQ(reader->read(count, bytes.data()), 0u);
    EXPECT_EQ(reader->seek(100), 0);
    EXPECT_EQ(reader->skip(100), 0);
    EXPECT_EQ(reader->position(), 0);
}

TEST_F(FileReaderTest, LargeReadGoesDirectInWholePagesAndItsTailThroughTheBuffer) {
    auto reader = SkarnFileReader::initWithURL(path, 0, kFileSize);
    EXPECT_EQ(reader->bufferSize(), 32768u);
    EXPECT_EQ(reader->maxBufferSize(), 4194304u);
    EXPECT_EQ(reader->alignedBytes(100000), 98304u);

    EXPECT_EQ(readFrom(*reader, 100000), fileBytes(0, 100000));
    // 98,304 bytes (24 pages) in one direct read, then one 32,768-byte refill
    // of which the last 1,696 bytes were taken.
    EXPECT_EQ(reader->source()->readCalls(), 2u);
    EXPECT_EQ(reader->source()->absoluteOffset(), 98304 + 32768);
    EXPECT_EQ(reader->bufferData(), 32768u);
    EXPECT_EQ(reader->bufferPos(), 1696u);
    EXPECT_EQ(reader->position(), 100000);
    EXPECT_EQ(reader->bufferRemaining(), 32768u - 1696u);
}

TEST_F(FileReaderTest, SeekStandsTheSourceOnThePageBelowAndSkipsTheRestFromTheRefill) {
    auto reader = SkarnFileReader::initWithURL(path, 0, kFileSize);
    EXPECT_EQ(reader->seek(5000), 5000);
    EXPECT_EQ(reader->source()->absoluteOffset(), 4096);
    EXPECT_EQ(reader->bufferPos(), 904u);
    EXPECT_EQ(reader->bufferData(), 0u);
    EXPECT_EQ(reader->position(), 5000);
    EXPECT_EQ(readFrom(*reader, 10), fileBytes(5000, 10));
    EXPECT_EQ(reader->bufferData(), 32768u);
    EXPECT_EQ(reader->bufferPos(), 914u);

    // Inside the buffer, but not at its first byte: no new read.
    const uint64_t calls = reader->source()->readCalls();
    EXPECT_EQ(reader->seek(4097), 4097);
    EXPECT_EQ(reader->bufferPos(), 1u);
    EXPECT_EQ(readFrom(*reader, 3), fileBytes(4097, 3));
    EXPECT_EQ(reader->source()->readCalls(), calls);
    // The buffer's first byte goes through a new aligned seek and refill.
    EXPECT_EQ(reader->seek(4096), 4096);
    EXPECT_EQ(reader->bufferData(), 0u);
    EXPECT_EQ(readFrom(*reader, 1), fileBytes(4096, 1));
    EXPECT_EQ(reader->source()->readCalls(), calls + 1);
    // Its end is served from it, leaving it empty.
    EXPECT_EQ(reader->seek(4096 + 32768), 4096 + 32768);
    EXPECT_EQ(reader->bufferData(), 0u);
    EXPECT_EQ(reader->bufferPos(), 0u);
    EXPECT_EQ(reader->source()->readCalls(), calls + 1);
}

TEST_F(FileReaderTest, SkipMovesInsideTheBufferOnlyWhileItHoldsMore) {
    auto reader = SkarnFileReader::initWithURL(path, 0, kFileSize);
    readFrom(*reader, 100);
    EXPECT_EQ(reader->skip(1000), 1000);
    EXPECT_EQ(reader->bufferPos(), 1100u);
    EXPECT_EQ(reader->skip(-600), -600);
    EXPECT_EQ(reader->bufferPos(), 500u);

    // Exactly what is buffered: through seek, buffer emptied.
    EXPECT_EQ(reader->skip(reader->bufferRemaining()), 32768 - 500);
    EXPECT_EQ(reader->bufferData(), 0u);
    EXPECT_EQ(reader->bufferPos(), 0u);
    EXPECT_EQ(reader->position(), 32768);
    EXPECT_EQ(readFrom(*reader, 4), fileBytes(32768, 4));

    // Backwards past the index: through seek, not a wrapped index.
    EXPECT_EQ(reader->seek(200000), 200000);
    EXPECT_EQ(reader->bufferPos(), 3392u);
    EXPECT_EQ(reader->skip(-5000), -5000);
    EXPECT_EQ(reader->position(), 195000);
    EXPECT_EQ(readFrom(*reader, 8), fileBytes(195000, 8));

    EXPECT_EQ(reader->skip(int64_t(kFileSize)), int64_t(kFileSize) - 195008) << "stops at the end";
    reader->seek(1000);
    reader->discard();
    EXPECT_EQ(reader->position(), int64_t(kFileSize));
    EXPECT_EQ(reader->remaining(), 0u);
}

TEST_F(FileReaderTest, SetBufferSizeDropsTheBufferOnlyOnAChangeAndKeepsThePosition) {
    auto reader = SkarnFileReader::initWithURL(path, 0, kFileSize);
    reader->seek(5000);
    readFrom(*reader, 10);
    reader->setBufferSize(32768);
    EXPECT_EQ(reader->bufferData(), 32768u) << "same size: nothing happens";
    EXPECT_EQ(reader->bufferPos(), 914u);

    reader->setBufferSize(5u << 20);
    EXPECT_EQ(reader->bufferSize(), 4194304u);
    EXPECT_EQ(reader->bufferData(), 0u);
    EXPECT_EQ(reader->position(), 5010);
    EXPECT_EQ(readFrom(*reader, 10), fileBytes(5010, 10));
    EXPECT_EQ(reader->bufferData(), kFileSize - 4096) << "refilled at the new size, cut at the range's end";

    reader->setBufferSize(65536);
    EXPECT_EQ(reader->bufferSize(), 65536u);
    EXPECT_EQ(reader->position(), 5020);
    EXPECT_EQ(readFrom(*reader, 10), fileBytes(5020, 10));
}

TEST_F(FileReaderTest, ReadsAtAndAcrossTheRangeEnd) {
    // Through the buffer: the bytes up to the end.
    auto reader = SkarnFileReader::initWithURL(path, 1001, 10001);
    reader->seek(9990);
    EXPECT_EQ(readFrom(*reader, 500), fileBytes(1001 + 9990, 11));
    EXPECT_EQ(reader->remaining(), 0u);
    EXPECT_EQ(readFrom(*reader, 500).size(), 0u);

    // A direct read cut by the range's end is a short read: it counts none of
    // its bytes, though it has moved to the end.
    reader = SkarnFileReader::initWithURL(path, 1001, 10001);
    EXPECT_EQ(readFrom(*reader, 100000).size(), 0u);
    EXPECT_EQ(reader->position(), 10001);
    EXPECT_EQ(reader->remaining(), 0u);

    // Exactly to the end, directly in whole pages and then through the buffer.
    reader = SkarnFileReader::initWithURL(path, 1001, 3 * 4096 + 7);
    reader->setBufferSize(4096);
    EXPECT_EQ(readFrom(*reader, 3 * 4096 + 7), fileBytes(1001, 3 * 4096 + 7));
    EXPECT_EQ(reader->source()->readCalls(), 2u);
}

TEST_F(FileReaderTest, RangeLongerThanTheFileEndsInShortReadsThatKeepThePosition) {
    // The file ends 992 bytes into the page at 299,008.
    auto reader = SkarnFileReader::initWithURL(path, 0, 400000);
    std::vector<uint8_t> bytes(200000);
    reader->seek(49 * 4096);
    EXPECT_EQ(reader->read(bytes.size(), bytes.data()), 0u) << "short direct read";
    EXPECT_EQ(reader->position(), int64_t(kFileSize));

    EXPECT_EQ(reader->seek(301008), 301008);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(reader->read(10, bytes.data()), 0u);
        EXPECT_EQ(reader->position(), 301008) << "a short refill must not move the position";
        EXPECT_EQ(reader->remaining(), 400000u - 301008u);
    }
    // A short refill ends the read with what came before it; its bytes come
    // with the next read.
    EXPECT_EQ(reader->seek(299990), 299990);
    EXPECT_EQ(readFrom(*reader, 100).size(), 0u);
    EXPECT_EQ(readFrom(*reader, 100), fileBytes(299990, 10));
}

TEST_F(FileReaderTest, RefillSizesBelowOnePageNeverStall) {
    for (uint64_t size : {uint64_t(0), uint64_t(1), uint64_t(100), uint64_t(4095)}) {
        auto reader = SkarnFileReader::initWithURL(path, 3, 100000);
        reader->setBufferSize(size);
        EXPECT_EQ(reader->seek(5000), 5000);
        EXPECT_EQ(readFrom(*reader, 3000), fileBytes(5003, 3000)) << size;
        EXPECT_EQ(readFrom(*reader, 10000), fileBytes(8003, 10000)) << size;
        EXPECT_EQ(readFrom(*reader, 1), fileBytes(18003, 1)) << size;
    }
}

// Any sequence of operations must deliver the same bytes, answers and
// positions as the plain model, over ranges at odd offsets and lengths, some
// running past the file's end.
TEST_F(FileReaderTest, RandomOperationsMatchThePlainModel) {
    const std::vector<uint8_t> file = patternBytes(kFileSize);
    const uint64_t sizes[] = {0, 1, 100, 4095, 4096, 4097, 32768, 65536, 4194304, 5u << 20};
    for (uint32_t seed = 1; seed <= 60; ++seed) {
        std::mt19937_64 rng(seed);
        auto below = [&](uint64_t n) { return n ? rng() % n : 0; };
        const int64_t start = int64_t(below(3) == 0 ? below(8) * 4096 : below(40000));
        const int64_t length = int64_t(below(4) == 0 ? below(kFileSize) + kFileSize - start : below(kFileSize - start) | 1);
        auto reader = SkarnFileReader::initWithURL(path, start, uint64_t(length));
        FileReaderModel model(file, start, length, 4096);
        SCOPED_TRACE("seed " + std::to_string(seed) + " range " + std::to_string(start) + "+" + std::to_string(length));

        for (int step = 0; step < 300; ++step) {
            const uint64_t count = below(4) == 0 ? below(200000) : below(9000);
            switch (below(6)) {
            case 0: {
                std::vector<uint8_t> got(count);
                got.resize(reader->read(count, got.data()));
                std::vector<uint8_t> want;
                model.read(count, want);
                ASSERT_EQ(got, want) << "read " << count << " at step " << step;
                break;
            }
            case 1: {
                int64_t target = int64_t(below(uint64_t(length) + 10000)) - int64_t(below(4) == 0 ? start : 0);
                if (below(4) == 0)  // next to the first or last buffered byte
                    target = model.sourcePosition() - int64_t(below(2) * model.bufferedBytes()) + int64_t(below(5)) - 2;
                ASSERT_EQ(reader->seek(target), model.seek(target)) << "seek " << target;
                break;
            }
            case 2: {
                const int64_t by = int64_t(count) - (below(3) == 0 ? std::min<int64_t>(reader->position(), 9000) : 0);
                ASSERT_EQ(reader->skip(by), model.skip(by)) << "skip " << by;
                break;
            }
            case 3: {
                const uint64_t size = below(3) == 0 ? below(100000) : sizes[below(std::size(sizes))];
                reader->setBufferSize(size);
                model.setBufferSize(size);
                break;
            }
            case 4:
                reader->discard();
                model.discard();
                break;
            default:
                break;
            }
            ASSERT_EQ(reader->position(), model.position()) << "step " << step;
            ASSERT_EQ(reader->remaining(), model.remaining()) << "step " << step;
            ASSERT_EQ(reader->source()->absoluteOffset(), model.sourcePosition()) << "step " << step;
            ASSERT_EQ(reader->bufferData(), model.bufferedBytes()) << "step " << step;
        }
    }
}

}  // namespace
