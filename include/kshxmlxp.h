// kshxmlxp: a small XML document object model over the platform's streaming
// parser, with stateful navigation and serialisation.
//
// A KSH_XML parses one text into a tree of KSH_DOMNode elements, each with its
// attributes (KSH_XMLAttribute) and its accumulated character data. The
// document owns every node; pointers to nodes, names, values and the parse
// error stay valid until the document is destroyed. The text of the last
// serialisation stays valid until the next serialisation on the same document.
//
// Navigation is stateful: a current node (`current`), a walk over one node's
// children (`childParent`), and a selected array of same-named siblings that
// nextNode() advances. A document and its cursors are used by one thread at a
// time.
//
// Character data goes to the element started last. A piece that is only
// white space (space, tab, line feed, carriage return) is dropped, except
// when it stands between two other pieces of the same element's text (a line
// break inside a value): then it is kept. Serialisation writes well-formed
// XML that parses back into the same tree: special characters become
// character references (where blanks at an end of a value touch one, that
// character and those blanks are written as a CDATA section, so that the
// blanks survive).
//
// Results: 0 found or done; 5 not found, no value, end of walk; 6 parse error
// or element left open; 7 allocation failure or no room (a document holds at
// most 65535 elements, an element at most 65535 attributes); 8 no parent.
#pragma once

#include <cstddef>
#include <cstdint>
#include <new>

#include "kshlst.h"

struct XML1_ParserStruct;
class KSH_DOMNode;

// Room for a document's nodes, names and first value pieces, handed out from
// large chunks and released all at once with the document. Internal.
class KSH_Arena {
public:
    KSH_Arena() = default;
    ~KSH_Arena();
    KSH_Arena(const KSH_Arena&) = delete;
    KSH_Arena& operator=(const KSH_Arena&) = delete;
    // `n` bytes aligned for any object, or null (memory short, or a piece
    // too large to be worth keeping here: the caller then uses malloc).
    void* alloc(size_t n);

private:
    void* chunks = nullptr;  // chained through their first word
    char* next = nullptr;
    size_t left = 0;
};

// The `parent` argument of getElementValue that stands for any parent.
#define KSH_ANY_PARENT (reinterpret_cast<KSH_DOMNode*>(~static_cast<uintptr_t>(0)))

// One attribute: owned copies of its name and value.
class KSH_XMLAttribute {
public:
    KSH_XMLAttribute(const char* name, const char* value);
    virtual ~KSH_XMLAttribute();
    KSH_XMLAttribute(const KSH_XMLAttribute&) = delete;
    KSH_XMLAttribute& operator=(const KSH_XMLAttribute&) = delete;

    // Null when the copy could not be made.
    char* getName() const { return name; }
    char* getValue() const { return value; }

private:
    char* name;   // one allocation holds the name and, after its NUL, the value
    char* value;
};

// One element. Owned by its document's `elements` list; a node does not own
// its children.
class KSH_DOMNode {
public:
    // `atts`: name and value alternating, ended by a null entry (may be null).
    KSH_DOMNode(const char* name, const char** atts);
    // Attributes copied from a list of KSH_XMLAttribute (another node's).
    KSH_DOMNode(const char* name, LinkedList* attrs);
    virtual ~KSH_DOMNode();
    KSH_DOMNode(const KSH_DOMNode&) = delete;
    KSH_DOMNode& operator=(const KSH_DOMNode&) = delete;

    // Nodes live in C allocator memory; delete releases it with free.
    static void* operator new(size_t size) noexcept(false);
    static void* operator new(size_t size, const std::nothrow_t&) noexcept;
    static void operator delete(void* p) noexcept;
    // A node with its name in the same room, taken from `arena` (then the
    // node is destroyed with destroy(), its room going with the arena) or,
    // with a null arena, from malloc (delete it). Null when memory is short.
    static KSH_DOMNode* create(const char* name, const char** atts, KSH_Arena* arena);
    // Deletes a node made anywhere: runs the destructor and frees its room
    // unless that belongs to an arena.
    static void destroy(KSH_DOMNode* node);

    // False when the name or an attribute could not be copied.
    bool valid() const { return name != nullptr && !attributeFailed; }

    char* getName() const { return name; }
    unsigned getNameLength() const { return nameLength; }
    // The element's text, or null when it has none.
    char* getValue() const { return value; }
    unsigned getValueLength() const { return valueLength; }
    KSH_DOMNode* getParent() const { return parent; }
    void setParent(KSH_DOMNode* p) { parent = p; }
    unsigned getNumChildren() const { return children ? children->NumEntries() : 0; }
    unsigned getAttributeCount() const { return attributes ? attributes->NumEntries() : 0; }
    // The attribute list (KSH_XMLAttribute values, owned by the node), or null.
    LinkedList* getAttributes() const { return attributes; }

    // Appends a child (not owned). 0, or 7.
    int addChild(KSH_DOMNode* child);
    // Append character data (white-space rule above). 0, or 7 when memory is
    // short (the piece is then dropped and the old value stays).
    int setValue(const char* s, int len) { return appendValue(s, len, nullptr); }
    int setNativeValue(const char* s, int len) { return setValue(s, len); }
    // setValue, taking a first piece's room from `arena` when one is given.
    int appendValue(const char* s, int len, KSH_Arena* arena);
    // Forgets white space held back for the next piece (at element events).
    void dropPending() { pendingLength = 0; }

    // The child walk: getFirstChild restarts it; getNextChild gives null at
    // the end and then starts again at the first child.
    KSH_DOMNode* getFirstChild();
    KSH_DOMNode* getNextChild();
    void resetChildIter();

    // The first attribute named exactly `name` (its own walk). 0, or 5.
    int getAttribute(const char* name, char** value);
    // The attribute walk. 0 with both outputs set, or 5 at the end.
    int getNextAttribute(char** name, char** value);
    void resetAttributeListIter();

    static void xmlAttributeDestructor(void* attribute);

    // Length of the name even beyond the 16-bit `nameLength`.
    size_t fullNameLength() const;

private:
    struct InlineName {};
    KSH_DOMNode(char* name, size_t length, const char** atts, bool inArena, InlineName);
    void setNameLength(size_t length);
    void addAttributes(const char** atts);
    int addAttribute(const char* n, const char* v);
    bool ensureValueRoom(size_t bytes, KSH_Arena* arena);

    char* name;
    uint16_t nameLength = 0;       // saturates at 65535 (see fullNameLength)
    char* value = nullptr;         // NUL at value[valueLength]
    uint32_t valueLength = 0;
    uint32_t valueCapacity = 0;    // bytes allocated at `value`
    uint32_t pendingLength = 0;    // held-back white space, after the value's NUL
    KSH_DOMNode* parent = nullptr;
    LinkedList* children = nullptr;       // not owning; made on the first child
    LinkedList* attributes = nullptr;     // owning; made on the first attribute
    LinkedListIter* childIter = nullptr;      // made on the first walk
    LinkedListIter* attributeIter = nullptr;  // made on the first walk
    bool attributeFailed = false;
    bool ownsName = true;          // false when the name shares the node's room
    bool inArena = false;          // the node's room belongs to an arena
    bool valueInArena = false;     // `value` belongs to an arena (not freed, not grown in place)
};

class KSH_XML {
public:
    KSH_XML();
    virtual ~KSH_XML();
    KSH_XML(const KSH_XML&) = delete;
    KSH_XML& operator=(const KSH_XML&) = delete;

    // Class-wide start and end hooks; both return 0.
    static int initializeXML();
    static int terminateXML();

    // Parses `length` bytes of `text` into the tree (once per document).
    // 0; 6 malformed or an element left open (getParseError says why; the
    // elements built before stay); 7 memory short or too many elements.
    [[nodiscard]] int parseMessage(const char* text, unsigned length);
    // The last parse error text, or null. Owned by the document.
    const char* getParseError() const { return parseError; }
    const char* getRootName() const { return rootName; }
    void setRootName(const char* name);
    void setXMLLength(int length) { xmlLength = length; }
    KSH_DOMNode* getRoot() const { return root; }
    KSH_DOMNode* getCurrent() const { return current; }

    // Parser callbacks; `doc` is the document.
    static void startXMLElement(void* doc, const char* name, const char** atts);
    static void endXMLElement(void* doc, const char* name);
    static void XMLCharDataHandler(void* doc, const char* s, int len);
    // The same for copying a subtree (no parser, no start trace).
    static void startXMLElement(void* doc, const char* name, LinkedList* attrs);
    static void XMLNativeCharDataHandler(void* doc, const char* s, int len);

    int addElement(const char* name, const char** atts);
    int addElement(const char* name, LinkedList* attrs);
    void closeElement();
    int setElementValue(const char* s, int len);
    int setNativeElementValue(const char* s, int len) { return setElementValue(s, len); }
    void reportXMLParserError(XML1_ParserStruct* parser);
    void reportXMLIncompleteError(XML1_ParserStruct* parser, const char* tagName);

    static void xmlElementDestructor(void* node);
    static void xmlFragmentDestructor(void* doc);

    // ---- navigation
    // With a current node: walk its children (the first child becomes
    // current; none: null and current stays). Without: the root.
    KSH_DOMNode* getFirstChild();
    // Next child of the walked node, made current (null at the end).
    KSH_DOMNode* getNextChild();
    // Next entry of the selected array becomes current. 0, or 5 at the end
    // (current null); the call after that starts again at the first entry.
    int nextNode();
    // Selects the same-named siblings of the first element named `name`; the
    // first becomes current. 0, 5 none, 7. `count` gets the number of entries.
    int getArray(const char* name, unsigned* count);
    // Selects the children of `parent` (current when null) named `name`.
    int getArrayImmediate(const char* name, unsigned* count, void* parent);
    // Finds the first element named `name` whose parent is `parent`
    // (KSH_ANY_PARENT: any). With `value` null: 0 and current moved. Otherwise
    // 0 only when it has a value (value, length set, current moved); an empty
    // element gives 5 and the search does not go on. `tagName` gets the name.
    int getElementValue(const char* name, char** value, unsigned* length, char** tagName = nullptr,
                        KSH_DOMNode* parent = KSH_ANY_PARENT);
    int testElement(const char* name);
    int testElementImmediate(const char* name);
    int getNodeValue(KSH_DOMNode* node, char** value, unsigned* length);
    int getNodeValue(char** value, unsigned* length);
    int getNodeTagname(char** name);
    int getAttribute(const char* name, char** value);
    int getAttributeList();
    int getNextAttribute(char** name, char** value);
    void resetCurrentNode() { current = nullptr; }
    // Move the parse cursor to its next child (0, or 7) or its parent (0, or
    // 8); the cursor becomes null when they fail.
    int getChild();
    int getParent();

    // ---- fragments and serialisation
    // Copies the subtree of `node` (current when null) into a new document
    // owned by this one (destroyed with it; never delete it). Null on failure.
    KSH_XML* createFragment(KSH_DOMNode* node);
    KSH_XML* createChildFragment();
    // Copies `node`'s subtree into `target`. 0, or 7.
    int dupTree(KSH_XML* target, KSH_DOMNode* node);
    // Writes the subtree of `node` as XML into the document's buffer; `text`
    // and `length` receive it. 0, 5 null node, 7.
    int extractMessage(KSH_DOMNode* node, char** text, unsigned* length);
    int extractDocumentXML(char** text, unsigned* length);
    int extractChildNodeXML(char** text, unsigned* length);

    // The serialisation steps: each writes at *out and advances *out. The
    // caller provides room for measureXML(node) bytes (buildXML) or for the
    // escaped name or value.
    static size_t measureXML(KSH_DOMNode* node);
    static void buildXML(KSH_DOMNode* node, char** out);
    static void insertTagname(KSH_DOMNode* node, char** out);
    static void insertNodeValue(KSH_DOMNode* node, char** out, bool leadingBlank);

private:
    int insertNode(KSH_DOMNode* node);
    // Records the first failure of building the tree and stops the parse.
    void failBuild(int rc, const char* why);

    KSH_DOMNode* root = nullptr;
    KSH_DOMNode* newest = nullptr;       // element started last: character data goes here
    KSH_DOMNode* cursor = nullptr;       // innermost open element while parsing
    KSH_DOMNode* current = nullptr;      // navigation's current node
    KSH_DOMNode* arrayParent = nullptr;  // parent of the selected array
    KSH_DOMNode* childParent = nullptr;  // node whose children getNextChild walks
    char* rootName = nullptr;
    LinkedList* elements;                // owning, start-tag order
    LinkedList* fragments;               // owning
    LinkedList* arrayList;               // not owning
    LinkedListIter* arrayIter = nullptr;
    char* xmlBuffer = nullptr;
    char* parseError = nullptr;
    int xmlLength = 0;
    int buildRc = 0;                     // first failure while building, 0 if none
    const char* buildWhy = nullptr;      // its text (static)
    XML1_ParserStruct* parser = nullptr; // the parser while parseMessage runs
    KSH_Arena arena;                     // room of the nodes; outlives `elements`
};
