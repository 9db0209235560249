#include "AssertionHandler.h"
#include "ByteReader.h"

#include <gtest/gtest.h>

TEST(AssertionHandler, HardAssertionsAbortWithTheExpressionAndSource) {
    EXPECT_DEATH(SKARN_HARD_ASSERT_TEXT(false, "readBytes != -1", "MXF/SkarnMXFMetadata"),
                 "readBytes != -1.*MXF/SkarnMXFMetadata");
}

TEST(AssertionHandler, AnInstalledHandlerCanThrowInstead) {
    auto previous = setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);
    try {
        int readBytes = -1;
        SKARN_HARD_ASSERT(readBytes != -1, "MXF/SkarnMXFMetadata");
        FAIL() << "no throw";
    } catch (const HardAssertionFailure& e) {
        EXPECT_EQ(e.expression, "readBytes != -1");
        EXPECT_EQ(e.source, "MXF/SkarnMXFMetadata");
    }
    setHardAssertionFailureHandler(previous);
}

TEST(AssertionHandler, SoftFailuresThrowByDefaultAndCanBeRecorded) {
    EXPECT_THROW(AssertionHandler::currentHandler().handleFailureInMethod("m", "f", 1, "Invalid thing\n"),
                 AssertionFailure);
    RecordingAssertionHandler recorder;
    {
        ScopedAssertionHandler scope(&recorder);
        AssertionHandler::currentHandler().handleFailureInMethod("scan", "MXF/x", 7, "Expect audio blockAlign is 2 or 3.");
    }
    ASSERT_EQ(recorder.failures.size(), 1u);
    EXPECT_EQ(recorder.failures[0].description, "Expect audio blockAlign is 2 or 3.");
    EXPECT_EQ(&AssertionHandler::currentHandler() == &recorder, false);
}

TEST(ByteReader, ReadsPastTheEndFailWithoutTouchingMemory) {
    const uint8_t bytes[] = {0x00, 0x01, 0x02, 0x03, 0x04, 0x05};
    ByteReader r(bytes, sizeof bytes);
    EXPECT_EQ(r.u16(), 0x0001);
    EXPECT_EQ(r.u32(), 0x02030405u);
    EXPECT_TRUE(r.ok());
    EXPECT_EQ(r.u8(), 0);
    EXPECT_FALSE(r.ok());
    ByteReader r2(bytes, sizeof bytes);
    EXPECT_TRUE(r2.take(7).empty());
    EXPECT_FALSE(r2.ok());
    ByteReader r3(bytes, sizeof bytes);
    EXPECT_EQ(r3.uN(3), 0x000102u);
    EXPECT_FALSE(r3.seek(7));
    EXPECT_EQ(r3.uN(9), 0u);  // wider than 8 bytes is refused
}
