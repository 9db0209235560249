// XML documents with XPath queries, over pugixml.
//
// Clip XML files put a default namespace on their root element. pugixml keeps
// element names as written and does not apply namespaces, so the plain XPaths
// the plug-in uses ("ClipContent/GlobalClipID") match elements in a default
// namespace as they stand; prefixed names would have to be written with their
// prefix.
#pragma once

#include "Object.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace pugi {
class xml_document;
class xpath_node;
class xml_node;
class xml_attribute;
}

class XMLDocument;

// One node of a document (element, attribute, text). Holds its document alive.
class XMLNode {
public:
    XMLNode();
    ~XMLNode();
    XMLNode(const XMLNode&);
    XMLNode& operator=(const XMLNode&);

    explicit operator bool() const;
    // Element or attribute name; "" for text nodes.
    std::string name() const;
    // The node's string value: an attribute's value, a text node's text, or the
    // concatenated text of an element's descendants.
    std::string stringValue() const;
    bool isElement() const;
    bool isAttribute() const;

    // Nodes the XPath selects relative to this node. A malformed XPath answers
    // nullopt and fills error when given.
    std::optional<std::vector<XMLNode>> nodesForXPath(const std::string& xpath, std::string* error = nullptr) const;
    // The first selected node, or a null node.
    XMLNode firstNodeForXPath(const std::string& xpath, std::string* error = nullptr) const;
    // Child elements in document order.
    std::vector<XMLNode> childElements() const;

private:
    friend class XMLDocument;
    struct Impl;
    XMLNode(Ref<const XMLDocument> doc, const pugi::xpath_node& n);
    Ref<const XMLDocument> _doc;
    Impl* _impl;  // pugi::xpath_node, kept out of this header
};

class XMLDocument : public Object {
public:
    static constexpr uint64_t kMaxDocumentBytes = 32u << 20;

    ~XMLDocument() override;

    // nullptr when the file cannot be read, is not a regular file, is larger
    // than kMaxDocumentBytes or is not well-formed; error receives "path: reason".
    static Ref<XMLDocument> documentWithContentsOfFile(const std::string& path, std::string* error = nullptr);
    static Ref<XMLDocument> documentWithXMLString(const std::string& text, std::string* error = nullptr);

    // The root element (null node for a document without one).
    XMLNode rootElement() const;

private:
    XMLDocument();
    pugi::xml_document* _doc;
};

// Number of distinct XPaths compiled so far (each is compiled once per process).
size_t XMLCompiledXPathCount();
