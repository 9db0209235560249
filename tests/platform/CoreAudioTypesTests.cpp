#include "CoreAudioTypes.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <memory>

TEST(CoreAudioTypes, FourCharCodesPackTheFirstCharacterHigh) {
    EXPECT_EQ(kAudioFormatLinearPCM, 0x6c70636du);
    EXPECT_EQ(FourCC("dvc "), 0x64766320u);
    EXPECT_EQ(FourCCDescription(FourCC("sowt")), "'sowt'");
    EXPECT_EQ(FourCCDescription(1), "0x00000001");
    EXPECT_EQ(kAudioChannelLabel_Discrete_3, 0x10003u);
    EXPECT_EQ(AudioChannelLayoutTag_GetNumberOfChannels(kAudioChannelLayoutTag_Stereo), 2u);
    EXPECT_EQ(AudioChannelLayoutTag_GetNumberOfChannels(kAudioChannelLayoutTag_DiscreteInOrder | 8), 8u);
}

// The variable-length records are used the C way: allocated for n elements and
// indexed past the declared one. That has to stay clean under the sanitizers.
TEST(CoreAudioTypes, VariableLengthRecordsHoldTheirElementsInTheComputedSize) {
    constexpr UInt32 kBuffers = 4;
    std::unique_ptr<AudioBufferList, decltype(&std::free)> list(
        static_cast<AudioBufferList*>(std::calloc(1, AudioBufferListByteSize(kBuffers))), &std::free);
    ASSERT_TRUE(list);
    list->mNumberBuffers = kBuffers;
    for (UInt32 i = 0; i < kBuffers; ++i) list->mBuffers[i] = AudioBuffer{1, 100 * i, nullptr};
    auto* raw = reinterpret_cast<const uint8_t*>(list.get());
    UInt32 lastSize = 0;
    std::memcpy(&lastSize, raw + 8 + 3 * 16 + 4, 4);
    EXPECT_EQ(lastSize, 300u);
    EXPECT_EQ(AudioBufferListByteSize(0), sizeof(AudioBufferList));

    constexpr UInt32 kDescriptions = 3;
    std::unique_ptr<AudioChannelLayout, decltype(&std::free)> layout(
        static_cast<AudioChannelLayout*>(std::calloc(1, AudioChannelLayoutByteSize(kDescriptions))), &std::free);
    ASSERT_TRUE(layout);
    layout->mChannelLayoutTag = kAudioChannelLayoutTag_UseChannelDescriptions;
    layout->mNumberChannelDescriptions = kDescriptions;
    for (UInt32 i = 0; i < kDescriptions; ++i)
        layout->mChannelDescriptions[i] = {kAudioChannelLabel_Discrete_0 + i, kAudioChannelFlags_AllOff, {0, 0, 0}};
    UInt32 lastLabel = 0;
    std::memcpy(&lastLabel, reinterpret_cast<const uint8_t*>(layout.get()) + 12 + 2 * 20, 4);
    EXPECT_EQ(lastLabel, kAudioChannelLabel_Discrete_2);
    EXPECT_EQ(AudioChannelLayoutByteSize(0), 12u);
}
