#include "Value.h"

#include <gtest/gtest.h>

TEST(Value, DictionaryKeepsInsertionOrderAndReplacesInPlace) {
    Dictionary d;
    d.set("zeta", 1);
    d.set("alpha", 2);
    d.set("mid", 3);
    d.set("alpha", 20);
    EXPECT_EQ(d.keys(), (std::vector<std::string>{"zeta", "alpha", "mid"}));
    EXPECT_EQ(d.find("alpha")->integerValue(), 20);
    EXPECT_TRUE(d.remove("zeta"));
    EXPECT_FALSE(d.remove("zeta"));
    EXPECT_EQ(Value(d).jsonText(), R"({"alpha":20,"mid":3})");
}

TEST(Value, NumbersFromStringsReadTheLeadingNumber) {
    EXPECT_EQ(Value("  42abc").integerValue(), 42);
    EXPECT_EQ(Value("-7").integerValue(), -7);
    EXPECT_EQ(Value("abc").integerValue(), 0);
    EXPECT_EQ(Value("99999999999999999999999").integerValue(), INT64_MAX);
    EXPECT_DOUBLE_EQ(Value("59.94i").doubleValue(), 59.94);
    EXPECT_DOUBLE_EQ(Value("").doubleValue(), 0.0);
    EXPECT_EQ(Value(3.9).integerValue(), 3);
}

TEST(Value, BoolValueFollowsThePlatformRules) {
    EXPECT_EQ(Value("YES").boolValue(), true);
    EXPECT_EQ(Value("yes").boolValue(), true);
    EXPECT_EQ(Value("true").boolValue(), true);
    EXPECT_EQ(Value(" 001").boolValue(), true);
    EXPECT_EQ(Value("0").boolValue(), false);
    EXPECT_EQ(Value("NO").boolValue(), false);
    EXPECT_EQ(Value("").boolValue(), false);
    EXPECT_EQ(Value(0.0).boolValue(), false);
    EXPECT_EQ(Value(2).boolValue(), true);
    // Collections have no boolean value at all.
    EXPECT_EQ(Value::array({1}).boolValue(), std::nullopt);
    EXPECT_EQ(Value(Dictionary{}).boolValue(), std::nullopt);
}

TEST(Value, MissingKeysAndIndexesAnswerNull) {
    Value v(Dictionary{{"a", Value::array({1, "two"})}});
    EXPECT_TRUE(v["missing"].isNull());
    EXPECT_TRUE(v["a"][size_t(5)].isNull());
    EXPECT_EQ(v["a"][size_t(1)].string(), "two");
    EXPECT_TRUE(Value(42)["a"].isNull());
    EXPECT_EQ(v["a"].count(), 2u);
}

TEST(Value, JSONRoundTripKeepsTypesAndOrder) {
    const char* text = R"({"b":[1,2.5,"x",true,null],"a":{"z":1,"y":2}})";
    Value v = Value::fromJSONText(text);
    EXPECT_TRUE(v["b"][size_t(0)].isInteger());
    EXPECT_TRUE(v["b"][size_t(1)].isReal());
    EXPECT_TRUE(v["b"][size_t(3)].isBoolean());
    EXPECT_EQ(v.jsonText(), text);
    EXPECT_TRUE(Value::fromJSONText("{\"unterminated\": ").isNull());
}

TEST(Value, NilOptionalStringsAndNullObjectsBecomeNull) {
    EXPECT_TRUE(Value(std::optional<std::string>()).isNull());
    EXPECT_EQ(Value(std::optional<std::string>("x")).string(), "x");
    EXPECT_TRUE(Value(Ref<Object>()).isNull());
}

TEST(Value, IntegersAndRealsCompareNumerically) {
    EXPECT_EQ(Value(2), Value(2.0));
    EXPECT_FALSE(Value(2) == Value("2"));
    EXPECT_FALSE(Value(true) == Value(1));
}

TEST(Object, RefCountsAndDescriptions) {
    struct Probe : Object {
        explicit Probe(bool* gone) : gone(gone) {}
        ~Probe() override { *gone = true; }
        bool* gone;
    };
    bool gone = false;
    {
        Ref<Probe> a = makeRef<Probe>(&gone);
        EXPECT_EQ(a->retainCount(), 1);
        Ref<Object> b = a;
        EXPECT_EQ(a->retainCount(), 2);
        Value held(b);
        EXPECT_EQ(a->retainCount(), 3);
        EXPECT_NE(a->description().find("Probe"), std::string::npos);
    }
    EXPECT_TRUE(gone);
    EXPECT_EQ(describe(static_cast<Object*>(nullptr)), "(null)");
}

TEST(Value, TextOfBytesThatAreNotUTF8NeverThrows) {
    // Clip XML may carry Latin-1 bytes through to metadata values.
    Value v(Dictionary{{"name", Value(std::string("caf\xe9"))}});
    std::string text;
    EXPECT_NO_THROW(text = v.description());
    EXPECT_NE(text.find("caf"), std::string::npos);
    EXPECT_EQ(Value(std::string("caf\xe9")).description(), "caf\xe9");
}
