// Parses arbitrary bytes into a document; whatever parses must serialise to
// text that parses again into the same tree, serialises to the same text, and
// copies into a fragment that is the same tree too.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "kshxmlxp.h"
#include "ras1/ras1.h"

namespace {

[[noreturn]] void mismatch(const char* what, const std::string& detail) {
    fprintf(stderr, "round trip mismatch: %s: %s\n", what, detail.c_str());
    abort();
}

std::string show(const char* s, size_t n) { return s ? "\"" + std::string(s, n) + "\"" : "(null)"; }

std::vector<KSH_DOMNode*> childrenOf(KSH_DOMNode* n) {
    std::vector<KSH_DOMNode*> out;
    for (KSH_DOMNode* c = n->getFirstChild(); c != nullptr; c = n->getNextChild()) out.push_back(c);
    return out;
}

std::vector<std::pair<std::string, std::string>> attributesOf(KSH_DOMNode* n) {
    std::vector<std::pair<std::string, std::string>> out;
    n->resetAttributeListIter();
    char* name;
    char* value;
    while (n->getNextAttribute(&name, &value) == 0) out.emplace_back(name, value);
    return out;
}

// Compares two trees node by node with an explicit stack (documents nest as
// deep as the parser allows).
void sameTree(KSH_DOMNode* a, KSH_DOMNode* b) {
    std::vector<std::pair<KSH_DOMNode*, KSH_DOMNode*>> todo{{a, b}};
    while (!todo.empty()) {
        auto [x, y] = todo.back();
        todo.pop_back();
        if (x == nullptr || y == nullptr) mismatch("node", x ? "missing copy" : "extra copy");
        if (strcmp(x->getName(), y->getName()) != 0) mismatch("name", std::string(x->getName()) + " vs " + y->getName());
        if (x->getNameLength() != y->getNameLength()) mismatch("name length", x->getName());
        if (x->getValueLength() != y->getValueLength() ||
            (x->getValueLength() && memcmp(x->getValue(), y->getValue(), x->getValueLength()) != 0))
            mismatch("value of", std::string(x->getName()) + ": " + show(x->getValue(), x->getValueLength()) +
                                     " vs " + show(y->getValue(), y->getValueLength()));
        if (attributesOf(x) != attributesOf(y)) mismatch("attributes of", x->getName());
        std::vector<KSH_DOMNode*> cx = childrenOf(x);
        std::vector<KSH_DOMNode*> cy = childrenOf(y);
        if (cx.size() != cy.size() || x->getNumChildren() != cx.size())
            mismatch("children of", x->getName());
        for (size_t i = cx.size(); i-- > 0;) {
            if (cx[i]->getParent() != x || cy[i]->getParent() != y) mismatch("parent of", cx[i]->getName());
            todo.emplace_back(cx[i], cy[i]);
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    // Parse errors are always traced; keep them out of the fuzzer's output.
    RAS1_Configure("NONE", "/dev/null");
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    KSH_XML doc;
    if (doc.parseMessage(reinterpret_cast<const char*>(data), (unsigned)size) != 0) return 0;
    if (doc.getRoot() == nullptr) return 0;  // a prolog without an element

    char* text = nullptr;
    unsigned length = 0;
    if (doc.extractDocumentXML(&text, &length) != 0) mismatch("serialise", "failed");
    if (strlen(text) != length) mismatch("serialised length", std::to_string(length));
    std::string first(text, length);

    KSH_XML again;
    if (again.parseMessage(first.data(), (unsigned)first.size()) != 0)
        mismatch("reparse", std::string(again.getParseError() ? again.getParseError() : "?") + " in " + first);
    sameTree(doc.getRoot(), again.getRoot());
    if (std::string(doc.getRootName()) != again.getRootName()) mismatch("root name", first);

    char* second = nullptr;
    unsigned secondLength = 0;
    if (again.extractDocumentXML(&second, &secondLength) != 0 || first != std::string(second, secondLength))
        mismatch("second serialisation", first);

    KSH_XML* fragment = doc.createFragment(doc.getRoot());
    if (fragment == nullptr) mismatch("fragment", "not made");
    sameTree(doc.getRoot(), fragment->getRoot());
    return 0;
}
