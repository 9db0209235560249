#include "CMSampleBuffer.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <vector>

namespace {

// A block of n bytes 0, 1, 2, ..., starting offset bytes into its memory.
CMBlockBufferRef countingBlock(size_t n, size_t offset = 0) {
    auto* memory = static_cast<uint8_t*>(std::malloc(n + offset));
    for (size_t i = 0; i < n + offset; ++i) memory[i] = uint8_t(i - offset);
    CMBlockBufferRef block;
    EXPECT_EQ(CMBlockBufferCreateWithMemoryBlock(nullptr, memory, n + offset, kCFAllocatorDefault, nullptr, offset, n,
                                                 0, &block),
              kCMBlockBufferNoErr);
    return block;
}

CMFormatDescriptionRef pcmFormat(UInt32 channels, bool nonInterleaved) {
    UInt32 frame = nonInterleaved ? 2 : 2 * channels;
    AudioStreamBasicDescription asbd{48000,
                                     kAudioFormatLinearPCM,
                                     kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsPacked |
                                         (nonInterleaved ? UInt32(kAudioFormatFlagIsNonInterleaved) : 0u),
                                     frame,
                                     1,
                                     frame,
                                     channels,
                                     16,
                                     0};
    CMFormatDescriptionRef desc;
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &asbd, 0, nullptr, 0, nullptr, nullptr, &desc), noErr);
    return desc;
}

// frames of audio at 48 kHz from 1000/48000 on, as the ingest reader builds them:
// one timing entry and one size entry for the whole chunk.
CMSampleBufferRef audioBuffer(const CMFormatDescriptionRef& format, const CMBlockBufferRef& data, CMItemCount frames,
                              size_t bytesPerFrame) {
    CMSampleTimingInfo timing{CMTimeMake(1, 48000), CMTimeMake(1000, 48000), kCMTimeInvalid};
    CMSampleBufferRef sbuf;
    EXPECT_EQ(CMSampleBufferCreate(nullptr, data, true, nullptr, nullptr, format, frames, 1, &timing, 1,
                                   &bytesPerFrame, &sbuf),
              noErr);
    return sbuf;
}

std::vector<uint8_t> listBytes(const AudioBufferList* list, UInt32 i) {
    auto* p = static_cast<const uint8_t*>(list->mBuffers[i].mData);
    return {p, p + list->mBuffers[i].mDataByteSize};
}

}  // namespace

TEST(CMSampleBuffer, CreationChecksEntryCountsArraysAndSizes) {
    CMBlockBufferRef data = countingBlock(100);
    CMSampleTimingInfo timing[3] = {};
    size_t sizes[3] = {10, 20, 30};
    CMSampleBufferRef sbuf;
    auto create = [&](CMItemCount samples, CMItemCount timingCount, const CMSampleTimingInfo* t, CMItemCount sizeCount,
                      const size_t* s, const CMBlockBufferRef& block) {
        return CMSampleBufferCreate(nullptr, block, true, nullptr, nullptr, nullptr, samples, timingCount, t, sizeCount,
                                    s, &sbuf);
    };
    EXPECT_EQ(create(3, 3, timing, 3, sizes, data), noErr);
    EXPECT_EQ(create(3, 1, timing, 1, sizes, data), noErr);
    EXPECT_EQ(create(3, 0, nullptr, 0, nullptr, data), noErr);
    EXPECT_EQ(create(3, 2, timing, 0, nullptr, data), kCMSampleBufferError_InvalidEntryCount);
    EXPECT_EQ(create(3, 0, nullptr, 2, sizes, data), kCMSampleBufferError_InvalidEntryCount);
    EXPECT_EQ(create(-1, 0, nullptr, 0, nullptr, data), kCMSampleBufferError_InvalidEntryCount);
    EXPECT_EQ(create(3, 1, nullptr, 0, nullptr, data), kCMSampleBufferError_RequiredParameterMissing);
    EXPECT_EQ(create(3, 0, nullptr, 3, nullptr, data), kCMSampleBufferError_RequiredParameterMissing);
    // 10 + 20 + 30 fits 100 bytes; 3 x 40 does not, nor does an overflowing sum.
    size_t forty = 40;
    EXPECT_EQ(create(3, 0, nullptr, 1, &forty, data), kCMSampleBufferError_InvalidEntryCount);
    size_t huge[3] = {std::numeric_limits<size_t>::max(), 2, 0};
    EXPECT_EQ(create(3, 0, nullptr, 3, huge, data), kCMSampleBufferError_InvalidEntryCount);
    size_t half = std::numeric_limits<size_t>::max() / 2;
    EXPECT_EQ(create(3, 0, nullptr, 1, &half, nullptr), kCMSampleBufferError_InvalidEntryCount);
    EXPECT_FALSE(sbuf);
    // Without data, sizes are taken as they are.
    EXPECT_EQ(create(3, 0, nullptr, 1, &forty, nullptr), noErr);
    EXPECT_EQ(CMSampleBufferGetTotalSampleSize(sbuf), 120u);
    EXPECT_EQ(CMSampleBufferCreate(nullptr, data, true, nullptr, nullptr, nullptr, 0, 0, nullptr, 0, nullptr, nullptr),
              kCMSampleBufferError_RequiredParameterMissing);
}

TEST(CMSampleBuffer, OneTimingEntryStandsForEverySample) {
    auto format = pcmFormat(2, false);
    auto sbuf = audioBuffer(format, countingBlock(16), 4, 4);
    EXPECT_EQ(CMSampleBufferGetNumSamples(sbuf), 4);
    EXPECT_EQ(CMSampleBufferGetFormatDescription(sbuf), format);
    EXPECT_EQ(CMTimeCompare(CMSampleBufferGetPresentationTimeStamp(sbuf), CMTimeMake(1000, 48000)), 0);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMSampleBufferGetDecodeTimeStamp(sbuf)));
    EXPECT_EQ(CMTimeCompare(CMSampleBufferGetDuration(sbuf), CMTimeMake(4, 48000)), 0);
    CMSampleTimingInfo t;
    ASSERT_EQ(CMSampleBufferGetSampleTimingInfo(sbuf, 3, &t), noErr);
    EXPECT_EQ(t.presentationTimeStamp.value, 1003);
    EXPECT_EQ(t.duration.value, 1);
    EXPECT_TRUE(CMTIME_IS_INVALID(t.decodeTimeStamp));
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfo(sbuf, 4, &t), kCMSampleBufferError_SampleIndexOutOfRange);
    EXPECT_TRUE(CMTIME_IS_INVALID(t.presentationTimeStamp));
    EXPECT_EQ(CMSampleBufferGetSampleSize(sbuf, 3), 4u);
    EXPECT_EQ(CMSampleBufferGetSampleSize(sbuf, 4), 0u);
    EXPECT_EQ(CMSampleBufferGetTotalSampleSize(sbuf), 16u);

    // The arrays come back as stored: one entry each.
    CMItemCount needed = 0;
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfoArray(sbuf, 0, nullptr, &needed), noErr);
    EXPECT_EQ(needed, 1);
    CMSampleTimingInfo entries[2];
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfoArray(sbuf, 0, entries, &needed), kCMSampleBufferError_ArrayTooSmall);
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfoArray(sbuf, 2, entries, nullptr), noErr);
    EXPECT_EQ(entries[0].presentationTimeStamp.value, 1000);
    size_t sizes[1] = {};
    EXPECT_EQ(CMSampleBufferGetSampleSizeArray(sbuf, 1, sizes, &needed), noErr);
    EXPECT_EQ(sizes[0], 4u);
    std::string text = sbuf->description();
    EXPECT_NE(text.find("4 samples"), std::string::npos) << text;
    EXPECT_NE(text.find("'lpcm'"), std::string::npos) << text;
}

TEST(CMSampleBuffer, PerSampleTimingGivesEarliestStampFirstDecodeStampAndSummedDuration) {
    // Three frames in decode order I P B, presented I B P.
    CMTime d = CMTimeMake(1001, 30000);
    CMSampleTimingInfo timing[3] = {
        {d, CMTimeMake(1001, 30000), CMTimeMake(0, 30000)},
        {d, CMTimeMake(3003, 30000), CMTimeMake(1001, 30000)},
        {d, CMTimeMake(2002, 30000), CMTimeMake(2002, 30000)},
    };
    CMSampleBufferRef sbuf;
    ASSERT_EQ(CMSampleBufferCreateReady(nullptr, nullptr, nullptr, 3, 3, timing, 0, nullptr, &sbuf), noErr);
    EXPECT_EQ(CMSampleBufferGetPresentationTimeStamp(sbuf).value, 1001);
    EXPECT_EQ(CMSampleBufferGetDecodeTimeStamp(sbuf).value, 0);
    EXPECT_EQ(CMTimeCompare(CMSampleBufferGetDuration(sbuf), CMTimeMake(3003, 30000)), 0);
    CMSampleTimingInfo t;
    ASSERT_EQ(CMSampleBufferGetSampleTimingInfo(sbuf, 1, &t), noErr);
    EXPECT_EQ(t.presentationTimeStamp.value, 3003);
    EXPECT_EQ(CMSampleBufferGetSampleSizeArray(sbuf, 0, nullptr, nullptr), kCMSampleBufferError_BufferHasNoSampleSizes);
    EXPECT_EQ(CMSampleBufferGetSampleSize(sbuf, 0), 0u);

    CMSampleBufferRef untimed;
    ASSERT_EQ(CMSampleBufferCreateReady(nullptr, nullptr, nullptr, 1, 0, nullptr, 0, nullptr, &untimed), noErr);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMSampleBufferGetPresentationTimeStamp(untimed)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMSampleBufferGetDuration(untimed)));
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfo(untimed, 0, &t), kCMSampleBufferError_BufferHasNoSampleTimingInfo);
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfoArray(untimed, 1, &t, nullptr),
              kCMSampleBufferError_BufferHasNoSampleTimingInfo);
}

TEST(CMSampleBuffer, NullBuffersAnswerDefaultsAndErrors) {
    CMSampleTimingInfo t;
    EXPECT_EQ(CMSampleBufferGetNumSamples(nullptr), 0);
    EXPECT_FALSE(CMSampleBufferGetDataBuffer(nullptr));
    EXPECT_FALSE(CMSampleBufferGetFormatDescription(nullptr));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMSampleBufferGetPresentationTimeStamp(nullptr)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMSampleBufferGetDecodeTimeStamp(nullptr)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMSampleBufferGetDuration(nullptr)));
    EXPECT_EQ(CMSampleBufferGetSampleTimingInfo(nullptr, 0, &t), kCMSampleBufferError_RequiredParameterMissing);
    EXPECT_EQ(CMSampleBufferGetTotalSampleSize(nullptr), 0u);
    EXPECT_EQ(CMSampleBufferGetSampleAttachmentsArray(nullptr, true), nullptr);
    EXPECT_FALSE(CMSampleBufferDataIsReady(nullptr));
    EXPECT_FALSE(CMSampleBufferIsValid(nullptr));
    EXPECT_EQ(CMSampleBufferMakeDataReady(nullptr), kCMSampleBufferError_RequiredParameterMissing);
    size_t needed = 9;
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(nullptr, &needed, nullptr, 0, nullptr, nullptr,
                                                                      0, nullptr),
              kCMSampleBufferError_RequiredParameterMissing);
    EXPECT_EQ(needed, 0u);
}

TEST(CMSampleBuffer, DataBecomesReadyThroughTheCallbackOnce) {
    struct Counter {
        int calls = 0;
        OSStatus answer = noErr;
    } counter;
    auto callback = [](const CMSampleBufferRef& sbuf, void* refcon) -> OSStatus {
        EXPECT_TRUE(sbuf);
        auto* c = static_cast<Counter*>(refcon);
        ++c->calls;
        return c->answer;
    };
    CMSampleBufferRef sbuf;
    ASSERT_EQ(CMSampleBufferCreate(nullptr, countingBlock(4), false, callback, &counter, nullptr, 1, 0, nullptr, 0,
                                   nullptr, &sbuf),
              noErr);
    EXPECT_FALSE(CMSampleBufferDataIsReady(sbuf));
    counter.answer = -1;
    EXPECT_EQ(CMSampleBufferMakeDataReady(sbuf), -1);
    EXPECT_FALSE(CMSampleBufferDataIsReady(sbuf));
    counter.answer = noErr;
    EXPECT_EQ(CMSampleBufferMakeDataReady(sbuf), noErr);
    EXPECT_EQ(CMSampleBufferMakeDataReady(sbuf), noErr);
    EXPECT_EQ(counter.calls, 2);
    EXPECT_TRUE(CMSampleBufferDataIsReady(sbuf));

    CMSampleBufferRef noCallback;
    ASSERT_EQ(CMSampleBufferCreate(nullptr, nullptr, false, nullptr, nullptr, nullptr, 0, 0, nullptr, 0, nullptr,
                                   &noCallback),
              noErr);
    EXPECT_EQ(CMSampleBufferMakeDataReady(noCallback), kCMSampleBufferError_BufferNotReady);
    EXPECT_EQ(CMSampleBufferSetDataReady(noCallback), noErr);
    EXPECT_TRUE(CMSampleBufferDataIsReady(noCallback));
    EXPECT_TRUE(CMSampleBufferIsValid(noCallback));
    EXPECT_EQ(CMSampleBufferInvalidate(noCallback), noErr);
    EXPECT_FALSE(CMSampleBufferIsValid(noCallback));
}

TEST(CMSampleBuffer, SampleAttachmentsArrayIsMadeOnRequestAndStaysPut) {
    CMSampleBufferRef sbuf;
    ASSERT_EQ(CMSampleBufferCreateReady(nullptr, nullptr, nullptr, 3, 0, nullptr, 0, nullptr, &sbuf), noErr);
    EXPECT_EQ(CMSampleBufferGetSampleAttachmentsArray(sbuf, false), nullptr);
    std::vector<Dictionary>* attachments = CMSampleBufferGetSampleAttachmentsArray(sbuf, true);
    ASSERT_NE(attachments, nullptr);
    ASSERT_EQ(attachments->size(), 3u);
    (*attachments)[0].set(kCMSampleAttachmentKey_NotSync, true);
    (*attachments)[0].set(kCMSampleAttachmentKey_DependsOnOthers, true);
    EXPECT_EQ(CMSampleBufferGetSampleAttachmentsArray(sbuf, false), attachments);
    EXPECT_EQ(CMSampleBufferGetSampleAttachmentsArray(sbuf, true), attachments);
    EXPECT_EQ((*CMSampleBufferGetSampleAttachmentsArray(sbuf, false))[0].find("NotSync")->boolValue(), true);
    EXPECT_TRUE((*attachments)[1].empty());

    // Buffer attachments are separate from the per-sample ones.
    CMSetAttachment(sbuf, "CMIOPulldownCadenceInfo", 1, kCMAttachmentMode_ShouldPropagate);
    EXPECT_EQ(CMGetAttachment(sbuf, "CMIOPulldownCadenceInfo", nullptr).integerValue(), 1);
    EXPECT_FALSE((*attachments)[0].contains("CMIOPulldownCadenceInfo"));
}

TEST(CMSampleBuffer, InterleavedAudioIsOneBufferOverTheData) {
    CMBlockBufferRef data = countingBlock(16);
    auto sbuf = audioBuffer(pcmFormat(2, false), data, 4, 4);
    size_t needed = 0;
    ASSERT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(sbuf, &needed, nullptr, 0, nullptr, nullptr, 0,
                                                                      nullptr),
              noErr);
    EXPECT_EQ(needed, sizeof(AudioBufferList));

    AudioBufferList list{};
    CMBlockBufferRef block;
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(sbuf, nullptr, &list, needed - 1, nullptr,
                                                                      nullptr, 0, &block),
              kCMSampleBufferError_ArrayTooSmall);
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(sbuf, nullptr, &list, needed, nullptr, nullptr,
                                                                      0, nullptr),
              kCMSampleBufferError_RequiredParameterMissing);
    ASSERT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(sbuf, nullptr, &list, needed, nullptr, nullptr, 0,
                                                                      &block),
              noErr);
    EXPECT_EQ(block, data);
    EXPECT_EQ(list.mNumberBuffers, 1u);
    EXPECT_EQ(list.mBuffers[0].mNumberChannels, 2u);
    EXPECT_EQ(list.mBuffers[0].mDataByteSize, 16u);
    char* dataPointer = nullptr;
    ASSERT_EQ(CMBlockBufferGetDataPointer(data, 0, nullptr, nullptr, &dataPointer), kCMBlockBufferNoErr);
    EXPECT_EQ(list.mBuffers[0].mData, dataPointer);
}

TEST(CMSampleBuffer, NonInterleavedAudioIsOneBufferPerChannelAlignedOnRequest) {
    // Three channels of four 16-bit frames, channel after channel, one byte
    // into the block so that the data is not aligned.
    CMBlockBufferRef data = countingBlock(24, 1);
    auto sbuf = audioBuffer(pcmFormat(3, true), data, 4, 2);
    size_t needed = 0;
    ASSERT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(sbuf, &needed, nullptr, 0, nullptr, nullptr, 0,
                                                                      nullptr),
              noErr);
    ASSERT_EQ(needed, AudioBufferListByteSize(3));
    std::unique_ptr<AudioBufferList, decltype(&std::free)> list(static_cast<AudioBufferList*>(std::calloc(1, needed)),
                                                                &std::free);
    CMBlockBufferRef block;
    ASSERT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(sbuf, nullptr, list.get(), needed, nullptr,
                                                                      nullptr, 0, &block),
              noErr);
    EXPECT_EQ(block, data);
    ASSERT_EQ(list->mNumberBuffers, 3u);
    for (UInt32 i = 0; i < 3; ++i) {
        EXPECT_EQ(list->mBuffers[i].mNumberChannels, 1u);
        EXPECT_EQ(list->mBuffers[i].mDataByteSize, 8u);
        EXPECT_EQ(listBytes(list.get(), i)[0], 8 * i);
    }
    EXPECT_EQ(static_cast<char*>(list->mBuffers[1].mData) - static_cast<char*>(list->mBuffers[0].mData), 8);

    CMBlockBufferRef alignedBlock;
    ASSERT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(
                  sbuf, nullptr, list.get(), needed, nullptr, nullptr,
                  kCMSampleBufferFlag_AudioBufferList_Assure16ByteAlignment, &alignedBlock),
              noErr);
    EXPECT_NE(alignedBlock, data);
    for (UInt32 i = 0; i < 3; ++i) {
        EXPECT_EQ(reinterpret_cast<uintptr_t>(list->mBuffers[i].mData) % 16, 0u) << i;
        std::vector<uint8_t> expected(8);
        for (int b = 0; b < 8; ++b) expected[b] = uint8_t(8 * i + b);
        EXPECT_EQ(listBytes(list.get(), i), expected) << i;
    }
}

TEST(CMSampleBuffer, AudioBufferListRefusesOtherMediaAndShortData) {
    size_t needed = 0;
    AudioBufferList list{};
    CMBlockBufferRef block;
    CMSampleBufferRef video;
    ASSERT_EQ(CMSampleBufferCreateReady(nullptr, countingBlock(4), nullptr, 1, 0, nullptr, 0, nullptr, &video), noErr);
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(video, &needed, &list, sizeof list, nullptr,
                                                                      nullptr, 0, &block),
              kCMSampleBufferError_InvalidMediaTypeForOperation);

    AudioStreamBasicDescription compressed{48000, FourCC("aac "), 0, 0, 1024, 0, 2, 0, 0};
    CMFormatDescriptionRef aac;
    ASSERT_EQ(CMAudioFormatDescriptionCreate(nullptr, &compressed, 0, nullptr, 0, nullptr, nullptr, &aac), noErr);
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(audioBuffer(aac, countingBlock(4), 1, 4), &needed,
                                                                      &list, sizeof list, nullptr, nullptr, 0, &block),
              kCMSampleBufferError_InvalidMediaFormat);

    // Four stereo frames claimed over 12 bytes of data, sizes not given.
    CMSampleTimingInfo timing{CMTimeMake(1, 48000), kCMTimeZero, kCMTimeInvalid};
    CMSampleBufferRef shortData;
    ASSERT_EQ(CMSampleBufferCreateReady(nullptr, countingBlock(12), pcmFormat(2, false), 4, 1, &timing, 0, nullptr,
                                        &shortData),
              noErr);
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(shortData, &needed, &list, sizeof list, nullptr,
                                                                      nullptr, 0, &block),
              kCMSampleBufferError_InvalidEntryCount);
    EXPECT_FALSE(block);

    CMSampleBufferRef notReady;
    ASSERT_EQ(CMSampleBufferCreate(nullptr, countingBlock(16), false, nullptr, nullptr, pcmFormat(2, false), 4, 1,
                                   &timing, 0, nullptr, &notReady),
              noErr);
    EXPECT_EQ(CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(notReady, &needed, &list, sizeof list, nullptr,
                                                                      nullptr, 0, &block),
              kCMSampleBufferError_BufferNotReady);
}
