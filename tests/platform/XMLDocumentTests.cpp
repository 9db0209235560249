#include "XMLDocument.h"

#include "TestSupport.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace {
const char* kClipXML = R"(<?xml version="1.0" encoding="UTF-8"?>
<SkarnClip xmlns="urn:schemas-corvane-com:skarn:clip:1.0">
  <ClipContent>
    <GlobalClipID>0123ABCD</GlobalClipID>
    <EssenceList>
      <Video><Codec Class="100">DV100_1080/59.94i</Codec></Video>
      <Audio><SamplingRate>48000</SamplingRate></Audio>
      <Audio><SamplingRate>44100</SamplingRate></Audio>
    </EssenceList>
    <ClipMetadata><Scenario><SceneNo.>12</SceneNo.></Scenario><Empty/></ClipMetadata>
  </ClipContent>
</SkarnClip>)";
}

TEST(XMLDocument, PlainXPathsMatchThroughADefaultNamespace) {
    Ref<XMLDocument> doc = XMLDocument::documentWithXMLString(kClipXML);
    ASSERT_TRUE(doc);
    XMLNode root = doc->rootElement();
    EXPECT_EQ(root.firstNodeForXPath("ClipContent/GlobalClipID").stringValue(), "0123ABCD");
    EXPECT_EQ(root.firstNodeForXPath("ClipContent/EssenceList/Video/Codec/@Class").stringValue(), "100");
    EXPECT_EQ(root.firstNodeForXPath("ClipContent/EssenceList/Audio[2]/SamplingRate").stringValue(), "44100");
    EXPECT_EQ(root.firstNodeForXPath("ClipContent/ClipMetadata/Scenario/SceneNo.").stringValue(), "12");
    EXPECT_EQ(root.nodesForXPath("ClipContent/EssenceList/Audio")->size(), 2u);
}

TEST(XMLDocument, NilVersusEmptyResults) {
    Ref<XMLDocument> doc = XMLDocument::documentWithXMLString(kClipXML);
    XMLNode root = doc->rootElement();
    // An absent node is a null node; a present empty element is an empty string.
    EXPECT_FALSE(root.firstNodeForXPath("ClipContent/Missing"));
    XMLNode empty = root.firstNodeForXPath("ClipContent/ClipMetadata/Empty");
    EXPECT_TRUE(empty);
    EXPECT_EQ(empty.stringValue(), "");
    auto none = root.nodesForXPath("ClipContent/Nothing");
    ASSERT_TRUE(none.has_value());
    EXPECT_TRUE(none->empty());
    std::string error;
    EXPECT_FALSE(root.nodesForXPath("ClipContent/[", &error).has_value());
    EXPECT_FALSE(error.empty());
}

// Every XPath entry point answers for any string: expressions whose result is
// not a node set, malformed ones and hostile ones give nil with a reason.
TEST(XMLDocument, NonNodeSetAndMalformedXPathsAnswerNil) {
    Ref<XMLDocument> doc = XMLDocument::documentWithXMLString(kClipXML);
    XMLNode root = doc->rootElement();
    const std::string queries[] = {
        "count(//Video)", "string(ClipContent)", "1 = 1", "ClipContent/Duration + 1", "true()", "", "[", "ClipContent/[",
        "//*[", "ClipContent/Duration]", std::string(5000, '('), "@@",
    };
    for (const std::string& q : queries) {
        std::string error;
        EXPECT_FALSE(root.firstNodeForXPath(q, &error)) << q.substr(0, 40);
        auto nodes = root.nodesForXPath(q, &error);
        EXPECT_TRUE(!nodes || nodes->empty()) << q.substr(0, 40);
    }
    std::string error;
    EXPECT_FALSE(root.nodesForXPath("count(//Video)", &error).has_value());
    EXPECT_FALSE(error.empty());
}

TEST(XMLDocument, EachDistinctXPathIsCompiledOnce) {
    Ref<XMLDocument> doc = XMLDocument::documentWithXMLString(kClipXML);
    XMLNode root = doc->rootElement();
    root.firstNodeForXPath("ClipContent/EssenceList/Audio[1]/SamplingRate");
    size_t before = XMLCompiledXPathCount();
    for (int i = 0; i < 10; ++i) root.firstNodeForXPath("ClipContent/EssenceList/Audio[1]/SamplingRate");
    EXPECT_EQ(XMLCompiledXPathCount(), before);
}

TEST(XMLDocument, MalformedAndMissingFilesGiveNilWithAReason) {
    std::string error;
    EXPECT_FALSE(XMLDocument::documentWithXMLString("<a><b></a>", &error));
    EXPECT_FALSE(error.empty());
    EXPECT_FALSE(XMLDocument::documentWithXMLString(""));
    TempDir dir;
    error.clear();
    EXPECT_FALSE(XMLDocument::documentWithContentsOfFile(dir / "nope.xml", &error));
    EXPECT_NE(error.find("nope.xml"), std::string::npos);
}

TEST(XMLDocument, NodesKeepTheirDocumentAlive) {
    XMLNode node;
    {
        Ref<XMLDocument> doc = XMLDocument::documentWithXMLString(kClipXML);
        node = doc->rootElement().firstNodeForXPath("ClipContent/GlobalClipID");
    }
    EXPECT_EQ(node.stringValue(), "0123ABCD");
}

TEST(XMLDocument, ConcurrentQueriesOnOneDocument) {
    // Clips answer properties from host threads at once; the XPath cache and the
    // read-only document must take that.
    Ref<XMLDocument> doc = XMLDocument::documentWithXMLString(kClipXML);
    std::atomic<int> good{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < 200; ++i) {
                std::string path = "ClipContent/EssenceList/Audio[" + std::to_string(1 + (i + t) % 2) + "]/SamplingRate";
                std::string v = doc->rootElement().firstNodeForXPath(path).stringValue();
                if (v == "48000" || v == "44100") ++good;
            }
        });
    for (auto& th : threads) th.join();
    EXPECT_EQ(good.load(), 800);
}
