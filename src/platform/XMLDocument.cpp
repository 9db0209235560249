#include "XMLDocument.h"

#include "FileSystem.h"

#include <pugixml.hpp>

#include <memory>
#include <optional>
#include <mutex>
#include <shared_mutex>
#include <unordered_map>

struct XMLNode::Impl {
    pugi::xpath_node node;
};

namespace {

struct CompiledXPath {
    std::unique_ptr<pugi::xpath_query> query;
    std::string error;  // non-empty when the XPath did not compile or selects no nodes
};

std::shared_mutex gXPathMutex;
std::unordered_map<std::string, std::shared_ptr<const CompiledXPath>> gXPathCache;
// The plug-in asks a few dozen distinct XPaths; a host may ask any. Past this
// many, new ones are compiled for the one query and not kept.
constexpr size_t kMaxCachedXPaths = 4096;

std::shared_ptr<const CompiledXPath> compile(const std::string& xpath) {
    auto compiled = std::make_shared<CompiledXPath>();
    try {
        compiled->query = std::make_unique<pugi::xpath_query>(xpath.c_str());
        if (!*compiled->query) {
            compiled->error = compiled->query->result().description();
            compiled->query.reset();
        } else if (compiled->query->return_type() != pugi::xpath_type_node_set) {
            // count(), string(), comparisons: a number, string or boolean, not
            // the nodes every caller here asks for.
            compiled->error = "the expression does not select nodes";
            compiled->query.reset();
        }
    } catch (const std::exception& e) {
        compiled->query.reset();
        compiled->error = e.what();
    }
    return compiled;
}

// Each distinct XPath is compiled once; compiled queries are immutable and safe
// to evaluate from several threads at once.
std::shared_ptr<const CompiledXPath> compiledXPath(const std::string& xpath) {
    {
        std::shared_lock lock(gXPathMutex);
        auto it = gXPathCache.find(xpath);
        if (it != gXPathCache.end()) return it->second;
    }
    std::shared_ptr<const CompiledXPath> compiled = compile(xpath);
    std::unique_lock lock(gXPathMutex);
    if (gXPathCache.size() >= kMaxCachedXPaths) return compiled;
    auto [it, inserted] = gXPathCache.emplace(xpath, std::move(compiled));
    return it->second;
}

// The node set, or nullopt with the error; never throws.
std::optional<pugi::xpath_node_set> evaluate(const CompiledXPath& compiled, const pugi::xpath_node& node,
                                             std::string* error) {
    try {
        pugi::xpath_node_set set = compiled.query->evaluate_node_set(node);
        if (compiled.query->result().error) {
            if (error) *error = compiled.query->result().description();
            return std::nullopt;
        }
        return set;
    } catch (const std::exception& e) {
        if (error) *error = e.what();
        return std::nullopt;
    }
}

}  // namespace

size_t XMLCompiledXPathCount() {
    std::shared_lock lock(gXPathMutex);
    return gXPathCache.size();
}

XMLNode::XMLNode() : _impl(new Impl) {}
XMLNode::~XMLNode() { delete _impl; }
XMLNode::XMLNode(const XMLNode& o) : _doc(o._doc), _impl(new Impl(*o._impl)) {}
XMLNode& XMLNode::operator=(const XMLNode& o) {
    if (this != &o) {
        _doc = o._doc;
        *_impl = *o._impl;
    }
    return *this;
}
XMLNode::XMLNode(Ref<const XMLDocument> doc, const pugi::xpath_node& n) : _doc(std::move(doc)), _impl(new Impl{n}) {}

XMLNode::operator bool() const { return bool(_impl->node); }

bool XMLNode::isAttribute() const { return bool(_impl->node.attribute()); }

bool XMLNode::isElement() const {
    return !_impl->node.attribute() && _impl->node.node().type() == pugi::node_element;
}

std::string XMLNode::name() const {
    if (_impl->node.attribute()) return _impl->node.attribute().name();
    return _impl->node.node().name();
}

static void appendText(const pugi::xml_node& n, std::string& out) {
    for (pugi::xml_node c = n.first_child(); c; c = c.next_sibling()) {
        switch (c.type()) {
        case pugi::node_pcdata:
        case pugi::node_cdata: out += c.value(); break;
        case pugi::node_element: appendText(c, out); break;
        default: break;
        }
    }
}

std::string XMLNode::stringValue() const {
    if (_impl->node.attribute()) return _impl->node.attribute().value();
    pugi::xml_node n = _impl->node.node();
    if (!n) return {};
    if (n.type() == pugi::node_pcdata || n.type() == pugi::node_cdata) return n.value();
    std::string out;
    appendText(n, out);
    return out;
}

std::optional<std::vector<XMLNode>> XMLNode::nodesForXPath(const std::string& xpath, std::string* error) const {
    std::shared_ptr<const CompiledXPath> compiled = compiledXPath(xpath);
    if (!compiled->query) {
        if (error) *error = compiled->error;
        return std::nullopt;
    }
    std::vector<XMLNode> result;
    if (!_impl->node) return result;
    std::optional<pugi::xpath_node_set> set = evaluate(*compiled, _impl->node, error);
    if (!set) return std::nullopt;
    result.reserve(set->size());
    for (const pugi::xpath_node& n : *set) result.push_back(XMLNode(_doc, n));
    return result;
}

XMLNode XMLNode::firstNodeForXPath(const std::string& xpath, std::string* error) const {
    std::shared_ptr<const CompiledXPath> compiled = compiledXPath(xpath);
    if (!compiled->query) {
        if (error) *error = compiled->error;
        return XMLNode();
    }
    if (!_impl->node) return XMLNode();
    std::optional<pugi::xpath_node_set> set = evaluate(*compiled, _impl->node, error);
    if (!set || set->empty()) return XMLNode();
    set->sort();
    return XMLNode(_doc, set->first());
}

std::vector<XMLNode> XMLNode::childElements() const {
    std::vector<XMLNode> out;
    if (_impl->node.attribute()) return out;
    for (pugi::xml_node c = _impl->node.node().first_child(); c; c = c.next_sibling())
        if (c.type() == pugi::node_element) out.push_back(XMLNode(_doc, pugi::xpath_node(c)));
    return out;
}

XMLDocument::XMLDocument() : _doc(new pugi::xml_document) {}
XMLDocument::~XMLDocument() { delete _doc; }

Ref<XMLDocument> XMLDocument::documentWithContentsOfFile(const std::string& path, std::string* error) {
    // Only regular files are read (a FIFO or device where a document should
    // be must not block or stream forever), and only up to a size no clip
    // document comes near.
    std::optional<uint64_t> size = FileSystem::fileSize(path);
    if (size && *size > kMaxDocumentBytes) {
        if (error) *error = path + ": file too large for an XML document";
        return nullptr;
    }
    std::optional<std::vector<uint8_t>> bytes = FileSystem::readFile(path, kMaxDocumentBytes + 1);
    if (!bytes) {
        if (error) *error = path + ": " + (size ? "could not be read" : "not a readable regular file");
        return nullptr;
    }
    if (bytes->size() > kMaxDocumentBytes) {
        if (error) *error = path + ": file too large for an XML document";
        return nullptr;
    }
    Ref<XMLDocument> d(new XMLDocument);
    pugi::xml_parse_result r = bytes->empty()
                                   ? d->_doc->load_string("")
                                   : d->_doc->load_buffer(bytes->data(), bytes->size(), pugi::parse_default,
                                                          pugi::encoding_auto);
    if (!r) {
        if (error) *error = path + ": " + r.description();
        return nullptr;
    }
    if (!d->_doc->document_element()) {
        if (error) *error = path + ": no root element";
        return nullptr;
    }
    return d;
}

Ref<XMLDocument> XMLDocument::documentWithXMLString(const std::string& text, std::string* error) {
    Ref<XMLDocument> d(new XMLDocument);
    pugi::xml_parse_result r = d->_doc->load_buffer(text.data(), text.size(), pugi::parse_default, pugi::encoding_auto);
    if (!r) {
        if (error) *error = r.description();
        return nullptr;
    }
    if (!d->_doc->document_element()) {
        if (error) *error = "no root element";
        return nullptr;
    }
    return d;
}

XMLNode XMLDocument::rootElement() const {
    pugi::xml_node root = _doc->document_element();
    if (!root) return XMLNode();
    return XMLNode(Ref<const XMLDocument>(this), pugi::xpath_node(root));
}
