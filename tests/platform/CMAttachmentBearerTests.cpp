#include "CMAttachmentBearer.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>

namespace {
class Bearer : public CMAttachmentBearer {};
}  // namespace

TEST(CMAttachmentBearer, AttachmentsKeepOneModePerKeyAndPropagateOnlyTheirOwn) {
    Ref<Bearer> source = makeRef<Bearer>(), destination = makeRef<Bearer>();
    CMSetAttachment(source, "CMIOPulldownCadenceInfo", Value(Value::DataType{1, 2}), kCMAttachmentMode_ShouldPropagate);
    CMSetAttachment(source, "local", 7, kCMAttachmentMode_ShouldNotPropagate);
    CMAttachmentMode mode = 99;
    EXPECT_EQ(CMGetAttachment(source, "CMIOPulldownCadenceInfo", &mode).data().size(), 2u);
    EXPECT_EQ(mode, kCMAttachmentMode_ShouldPropagate);
    EXPECT_EQ(CMGetAttachment(source, "local", &mode).integerValue(), 7);
    EXPECT_EQ(mode, kCMAttachmentMode_ShouldNotPropagate);

    mode = 99;
    EXPECT_TRUE(CMGetAttachment(source, "absent", &mode).isNull());
    EXPECT_EQ(mode, 99u);

    CMPropagateAttachments(source, destination);
    EXPECT_FALSE(CMGetAttachment(destination, "CMIOPulldownCadenceInfo", nullptr).isNull());
    EXPECT_TRUE(CMGetAttachment(destination, "local", nullptr).isNull());

    // Setting a key again with the other mode moves it.
    CMSetAttachment(source, "local", 8, kCMAttachmentMode_ShouldPropagate);
    EXPECT_EQ(CMCopyDictionaryOfAttachments(nullptr, source, kCMAttachmentMode_ShouldNotPropagate).size(), 0u);
    EXPECT_EQ(CMCopyDictionaryOfAttachments(nullptr, source, kCMAttachmentMode_ShouldPropagate).keys(),
              (std::vector<std::string>{"CMIOPulldownCadenceInfo", "local"}));

    CMSetAttachment(source, "local", Value(), kCMAttachmentMode_ShouldPropagate);
    EXPECT_TRUE(CMGetAttachment(source, "local", nullptr).isNull());
    CMSetAttachment(source, "odd mode", 1, 7);
    EXPECT_TRUE(CMGetAttachment(source, "odd mode", nullptr).isNull());
    CMRemoveAttachment(source, "CMIOPulldownCadenceInfo");
    EXPECT_TRUE(CMCopyDictionaryOfAttachments(nullptr, source, kCMAttachmentMode_ShouldPropagate).empty());
    CMSetAttachments(destination, Dictionary{{"a", 1}, {"b", 2}}, kCMAttachmentMode_ShouldNotPropagate);
    CMRemoveAllAttachments(destination);
    EXPECT_TRUE(CMCopyDictionaryOfAttachments(nullptr, destination, kCMAttachmentMode_ShouldNotPropagate).empty());

    CMSetAttachment(nullptr, "k", 1, kCMAttachmentMode_ShouldPropagate);
    EXPECT_TRUE(CMGetAttachment(nullptr, "k", nullptr).isNull());
    CMPropagateAttachments(nullptr, destination);
}

// Run under the thread sanitizer: a reader and a writer on one object.
TEST(CMAttachmentBearer, ConcurrentSettersAndGettersAreSafe) {
    Ref<Bearer> bearer = makeRef<Bearer>();
    std::thread writer([&] {
        for (int i = 0; i < 2000; ++i)
            CMSetAttachment(bearer, "k" + std::to_string(i % 16), i, CMAttachmentMode(i % 2));
    });
    for (int i = 0; i < 2000; ++i) {
        Value v = CMGetAttachment(bearer, "k" + std::to_string(i % 16), nullptr);
        if (!v.isNull()) {
            EXPECT_EQ(v.integerValue() % 16, i % 16);
        }
    }
    writer.join();
    EXPECT_EQ(CMCopyDictionaryOfAttachments(nullptr, bearer, kCMAttachmentMode_ShouldPropagate).size() +
                  CMCopyDictionaryOfAttachments(nullptr, bearer, kCMAttachmentMode_ShouldNotPropagate).size(),
              16u);
}
