#include "CFData.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>

TEST(CFData, CreateCopiesAndRefusesImpossibleArguments) {
    uint8_t bytes[] = {1, 2, 3};
    CFDataRef data = CFDataCreate(kCFAllocatorDefault, bytes, 3);
    ASSERT_TRUE(data);
    bytes[0] = 9;
    EXPECT_EQ(CFDataGetLength(data), 3);
    EXPECT_EQ(CFDataGetBytePtr(data)[0], 1);
    EXPECT_NE(CFDataGetBytePtr(data), bytes);
    EXPECT_NE(data->description().find("length = 3, bytes = 0x010203"), std::string::npos);

    CFDataRef empty = CFDataCreate(kCFAllocatorDefault, nullptr, 0);
    ASSERT_TRUE(empty);
    EXPECT_NE(CFDataGetBytePtr(empty), nullptr);
    EXPECT_EQ(CFDataGetLength(empty), 0);

    EXPECT_FALSE(CFDataCreate(kCFAllocatorDefault, nullptr, 4));
    EXPECT_FALSE(CFDataCreate(kCFAllocatorDefault, bytes, -1));
    EXPECT_EQ(CFDataGetBytePtr(nullptr), nullptr);
    EXPECT_EQ(CFDataGetLength(nullptr), 0);
}

// Ownership mistakes show up as leaks or double frees in the sanitizer build.
TEST(CFData, NoCopyAdoptsMallocMemoryUnlessTheDeallocatorIsNull) {
    auto* owned = static_cast<uint8_t*>(std::malloc(16));
    std::memset(owned, 7, 16);
    {
        CFDataRef data = CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, owned, 16, kCFAllocatorDefault);
        ASSERT_TRUE(data);
        EXPECT_EQ(CFDataGetBytePtr(data), owned);
        EXPECT_EQ(data->bytes().size(), 16u);
    }
    auto* mallocOwned = static_cast<uint8_t*>(std::malloc(4));
    EXPECT_TRUE(CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, mallocOwned, 4, kCFAllocatorMalloc));

    uint8_t onStack[4] = {4, 3, 2, 1};
    {
        CFDataRef borrowed = CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, onStack, 4, kCFAllocatorNull);
        ASSERT_TRUE(borrowed);
        EXPECT_EQ(CFDataGetBytePtr(borrowed), onStack);
    }
    // Refused: the caller keeps the memory.
    auto* kept = static_cast<uint8_t*>(std::malloc(4));
    EXPECT_FALSE(CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, kept, -4, kCFAllocatorDefault));
    std::free(kept);
}

TEST(CFData, ValueDataBytesReadsInlineDataAndDataObjects) {
    Value inlineData(Value::DataType{1, 2});
    EXPECT_EQ(valueDataBytes(inlineData).size(), 2u);
    const uint8_t bytes[] = {5, 6, 7};
    Value object(CFDataCreate(nullptr, bytes, 3));
    ASSERT_EQ(valueDataBytes(object).size(), 3u);
    EXPECT_EQ(valueDataBytes(object)[2], 7);
    EXPECT_TRUE(valueDataBytes(Value("text")).empty());
    EXPECT_TRUE(valueDataBytes(Value()).empty());
}
