// kshxmlxp: the XML document model (see include/kshxmlxp.h).
//
// Building: the parser's events append nodes to the document's `elements`
// list and link them under the innermost open element. Nothing here recurses
// over the tree: copies and serialisations walk it with each node's own child
// iterator as the position stack and the parent pointers to climb back, so
// any nesting depth the parser accepts is safe.
//
// Lists have no lock (a document is used by one thread at a time); a node's
// children and attribute lists are made on first use, since most elements
// are leaves without attributes.
#include "kshxmlxp.h"

#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define KSHXMLXP_ASAN 1
#endif
#elif defined(__SANITIZE_ADDRESS__)
#define KSHXMLXP_ASAN 1
#endif
#ifdef KSHXMLXP_ASAN
#include <sanitizer/asan_interface.h>
#define KSHXMLXP_POISON(p, n) ASAN_POISON_MEMORY_REGION((p), (n))
#define KSHXMLXP_UNPOISON(p, n) ASAN_UNPOISON_MEMORY_REGION((p), (n))
#else
#define KSHXMLXP_POISON(p, n) ((void)(p), (void)(n))
#define KSHXMLXP_UNPOISON(p, n) ((void)(p), (void)(n))
#endif

#include "bss1/bss1.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"
#include "xml1/xml1.h"

RAS1_UNIT("kshxmlxp");

namespace {

// The most elements one document holds: its element list counts in 16 bits.
constexpr unsigned kMaxElements = 0xFFFF;
constexpr size_t kErrorTextSize = 512;
const char kMasked[] = "xxxxxxx";

bool isBlank(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

bool allBlank(const char* s, int len) {
    for (int i = 0; i < len; ++i)
        if (!isBlank(s[i])) return false;
    return true;
}

// True when `name` holds "password" in any case ("password", "PASSWORD",
// "ns:newPassword"): such elements and attributes never reach the trace.
bool namesPassword(const char* name) {
    static const char word[] = "password";
    const size_t n = sizeof word - 1;
    for (const char* p = name; *p; ++p) {
        size_t i = 0;
        while (i < n && p[i] && (p[i] | 0x20) == word[i]) ++i;
        if (i == n) return true;
    }
    return false;
}

// Character references for serialisation. Text: & < > and CR (a literal CR
// would come back as LF). Attribute values: & < " and TAB LF CR (literal
// ones would come back as blanks).
struct EscapeTable {
    const char* text[256];
    const char* attr[256];
    unsigned char textLen[256];
    unsigned char attrLen[256];
};

constexpr EscapeTable makeEscapes() {
    EscapeTable t{};
    for (int i = 0; i < 256; ++i) {
        t.text[i] = t.attr[i] = nullptr;
        t.textLen[i] = t.attrLen[i] = 1;
    }
    auto set = [&t](unsigned char c, const char* rep, bool text, bool attr) {
        unsigned char len = 0;
        while (rep[len]) ++len;
        if (text) t.text[c] = rep, t.textLen[c] = len;
        if (attr) t.attr[c] = rep, t.attrLen[c] = len;
    };
    set('&', "&amp;", true, true);
    set('<', "&lt;", true, true);
    set('>', "&gt;", true, false);
    set('"', "&quot;", false, true);
    set('\r', "&#13;", true, true);
    set('\n', "&#10;", false, true);
    set('\t', "&#9;", false, true);
    return t;
}
constexpr EscapeTable kEscapes = makeEscapes();

size_t escapedLength(const char* s, size_t len, bool attr) {
    const unsigned char* lens = attr ? kEscapes.attrLen : kEscapes.textLen;
    size_t n = 0;
    for (size_t i = 0; i < len; ++i) n += lens[(unsigned char)s[i]];
    return n;
}

// Copies `len` bytes of `s` to `out` with references for special characters.
char* writeEscaped(char* out, const char* s, size_t len, bool attr) {
    const char* const* reps = attr ? kEscapes.attr : kEscapes.text;
    const unsigned char* lens = attr ? kEscapes.attrLen : kEscapes.textLen;
    size_t run = 0;  // start of the pending run of plain characters
    for (size_t i = 0; i < len; ++i) {
        unsigned char c = (unsigned char)s[i];
        if (reps[c] == nullptr) continue;
        memcpy(out, s + run, i - run);
        out += i - run;
        memcpy(out, reps[c], lens[c]);
        out += lens[c];
        run = i + 1;
    }
    memcpy(out, s + run, len - run);
    return out + (len - run);
}

// Output of one serialisation pass: counting bytes, or writing them.
struct MeasureSink {
    size_t n = 0;
    void put(const char* s, size_t len) { n += len; }
    void putEscaped(const char* s, size_t len, bool attr) { n += escapedLength(s, len, attr); }
};

struct WriteSink {
    char* p;
    void put(const char* s, size_t len) {
        memcpy(p, s, len);
        p += len;
    }
    void putEscaped(const char* s, size_t len, bool attr) { p = writeEscaped(p, s, len, attr); }
};

// Character references start pieces of character data of their own when the
// text is parsed again, and a piece of blanks alone is dropped. So where the
// blanks at either end of a value touch a character that is written as a
// reference, those blanks and that character go into a small CDATA section
// instead, which the parser delivers as one piece: the blanks survive. (Only
// spaces and tabs can sit at the ends of a parsed value; the sections hold no
// ']' and no CR, which the parser would treat apart.)
bool edgeBlank(char c) { return c == ' ' || c == '\t'; }
bool escapedInText(char c) { return kEscapes.text[(unsigned char)c] != nullptr && c != '\r'; }

template <class Sink>
void putCdata(Sink& sink, const char* s, size_t len) {
    sink.put("<![CDATA[", 9);
    sink.put(s, len);
    sink.put("]]>", 3);
}

template <class Sink>
void putText(Sink& sink, const char* s, size_t len) {
    size_t lead = 0;
    while (lead < len && edgeBlank(s[lead])) ++lead;
    if (lead == len) {
        sink.putEscaped(s, len, false);
        return;
    }
    size_t trail = 0;
    while (edgeBlank(s[len - 1 - trail])) ++trail;
    size_t first = lead;
    size_t last = len - 1 - trail;
    bool leadSection = lead > 0 && escapedInText(s[first]);
    bool trailSection = trail > 0 && escapedInText(s[last]);
    if (leadSection && trailSection && first == last) {
        putCdata(sink, s, len);
        return;
    }
    size_t from = 0;
    size_t to = len;
    if (leadSection) {
        putCdata(sink, s, first + 1);
        from = first + 1;
    }
    if (trailSection) to = last;
    if (to > from) sink.putEscaped(s + from, to - from, false);
    if (trailSection) putCdata(sink, s + last, len - last);
}

template <class Sink>
void writeValue(Sink& sink, KSH_DOMNode* node, bool mask) {
    if (node->getValueLength() == 0) return;
    if (mask && namesPassword(node->getName()))
        sink.put(kMasked, sizeof kMasked - 1);
    else
        putText(sink, node->getValue(), node->getValueLength());
}

// "<name a=\"v\" ...>" and the node's value; restarts the node's child walk.
template <class Sink>
void openTag(Sink& sink, KSH_DOMNode* node, bool mask) {
    sink.put("<", 1);
    sink.put(node->getName(), node->fullNameLength());
    node->resetAttributeListIter();
    char* an;
    char* av;
    while (node->getNextAttribute(&an, &av) == WSQL_OK) {
        sink.put(" ", 1);
        sink.put(an, strlen(an));
        sink.put("=\"", 2);
        if (mask && namesPassword(an))
            sink.put(kMasked, sizeof kMasked - 1);
        else
            sink.putEscaped(av, strlen(av), true);
        sink.put("\"", 1);
    }
    sink.put(">", 1);
    writeValue(sink, node, mask);
    node->resetChildIter();
}

template <class Sink>
void closeTag(Sink& sink, KSH_DOMNode* node) {
    sink.put("</", 2);
    sink.put(node->getName(), node->fullNameLength());
    sink.put(">", 1);
}

// Writes the subtree of `top` in document order: each node's start tag, its
// value, its children, its end tag. `mask` hides password values.
template <class Sink>
void serialise(Sink& sink, KSH_DOMNode* top, bool mask) {
    KSH_DOMNode* node = top;
    openTag(sink, node, mask);
    for (;;) {
        KSH_DOMNode* child = node->getNextChild();
        if (child != nullptr) {
            openTag(sink, child, mask);
            node = child;
            continue;
        }
        closeTag(sink, node);
        if (node == top || node->getParent() == nullptr) return;
        node = node->getParent();
    }
}

}  // namespace

// ---------------------------------------------------------------- KSH_Arena

namespace {
// Chunks of 64 KiB; pieces above 2 KiB go to malloc instead (a chunk would
// waste too much of itself on them). Under ASan, room not handed out stays
// poisoned and each piece is followed by a poisoned gap, so overruns are
// still caught.
constexpr size_t kChunkSize = 64 * 1024;
constexpr size_t kLargestPiece = 2 * 1024;
constexpr size_t kAlign = alignof(std::max_align_t);
#ifdef KSHXMLXP_ASAN
constexpr size_t kGap = kAlign;
#else
constexpr size_t kGap = 0;
#endif
struct alignas(std::max_align_t) ChunkHeader {
    void* next;
};

// Chunks of finished documents, kept for the next ones (up to 4 MiB): the C
// allocator would otherwise hand the pages back to the system and the next
// document would fault them in again.
constexpr size_t kCachedChunks = 64;
struct ChunkCache {
    BSS1_Lock lock;
    void* chunks = nullptr;  // GUARDED_BY(lock)
    size_t count = 0;        // GUARDED_BY(lock)
    ChunkCache() { BSS1_InitializeLock(&lock); }
};

// Never destroyed: documents may be released by static destructors at exit.
ChunkCache& chunkCache() {
    static ChunkCache* cache = new ChunkCache();
    return *cache;
}

void* takeChunk() {
    ChunkCache& cache = chunkCache();
    BSS1_GetLock(&cache.lock);
    void* chunk = cache.chunks;
    if (chunk != nullptr) {
        KSHXMLXP_UNPOISON(chunk, sizeof(ChunkHeader));
        cache.chunks = static_cast<ChunkHeader*>(chunk)->next;
        cache.count--;
    }
    BSS1_ReleaseLock(&cache.lock);
    return chunk != nullptr ? chunk : malloc(kChunkSize);
}

// Returns a document's chain of chunks: cached while there is room, else freed.
void giveChunks(void* chain) {
    ChunkCache& cache = chunkCache();
    BSS1_GetLock(&cache.lock);
    while (chain != nullptr && cache.count < kCachedChunks) {
        void* chunk = chain;
        KSHXMLXP_UNPOISON(chunk, kChunkSize);
        chain = static_cast<ChunkHeader*>(chunk)->next;
        static_cast<ChunkHeader*>(chunk)->next = cache.chunks;
        KSHXMLXP_POISON(static_cast<char*>(chunk) + sizeof(ChunkHeader), kChunkSize - sizeof(ChunkHeader));
        cache.chunks = chunk;
        cache.count++;
    }
    BSS1_ReleaseLock(&cache.lock);
    while (chain != nullptr) {
        void* chunk = chain;
        KSHXMLXP_UNPOISON(chunk, kChunkSize);
        chain = static_cast<ChunkHeader*>(chunk)->next;
        free(chunk);
    }
}
}  // namespace

void* KSH_Arena::alloc(size_t n) {
    if (n == 0 || n > kLargestPiece) return nullptr;
    size_t room = (n + kGap + kAlign - 1) & ~(kAlign - 1);
    if (room > left) {
        void* chunk = takeChunk();
        if (chunk == nullptr) return nullptr;
        static_cast<ChunkHeader*>(chunk)->next = chunks;
        chunks = chunk;
        next = static_cast<char*>(chunk) + sizeof(ChunkHeader);
        left = kChunkSize - sizeof(ChunkHeader);
        KSHXMLXP_POISON(next, left);
    }
    char* p = next;
    next += room;
    left -= room;
    KSHXMLXP_UNPOISON(p, n);
    return p;
}

KSH_Arena::~KSH_Arena() { giveChunks(chunks); }

// --------------------------------------------------------- KSH_XMLAttribute

KSH_XMLAttribute::KSH_XMLAttribute(const char* n, const char* v) : name(nullptr), value(nullptr) {
    if (n == nullptr || v == nullptr) return;
    size_t nl = strlen(n);
    size_t vl = strlen(v);
    char* block = static_cast<char*>(malloc(nl + vl + 2));
    if (block == nullptr) return;
    memcpy(block, n, nl + 1);
    memcpy(block + nl + 1, v, vl + 1);
    name = block;
    value = block + nl + 1;
}

KSH_XMLAttribute::~KSH_XMLAttribute() { free(name); }

// -------------------------------------------------------------- KSH_DOMNode

void* KSH_DOMNode::operator new(size_t size) noexcept(false) {
    void* p = malloc(size);
    if (p == nullptr) throw std::bad_alloc();
    return p;
}

void* KSH_DOMNode::operator new(size_t size, const std::nothrow_t&) noexcept { return malloc(size); }

void KSH_DOMNode::operator delete(void* p) noexcept { free(p); }

KSH_DOMNode* KSH_DOMNode::create(const char* n, const char** atts, KSH_Arena* arena) {
    if (n == nullptr) return nullptr;
    size_t len = strlen(n);
    size_t bytes = sizeof(KSH_DOMNode) + len + 1;
    void* block = arena ? arena->alloc(bytes) : nullptr;
    bool fromArena = block != nullptr;
    if (block == nullptr) block = malloc(bytes);
    if (block == nullptr) return nullptr;
    char* inlineName = static_cast<char*>(block) + sizeof(KSH_DOMNode);
    memcpy(inlineName, n, len + 1);
    return ::new (block) KSH_DOMNode(inlineName, len, atts, fromArena, InlineName{});
}

void KSH_DOMNode::destroy(KSH_DOMNode* node) {
    if (node == nullptr) return;
    if (node->inArena)
        node->~KSH_DOMNode();
    else
        delete node;
}

KSH_DOMNode::KSH_DOMNode(char* n, size_t length, const char** atts, bool fromArena, InlineName)
    : name(n), ownsName(false), inArena(fromArena) {
    setNameLength(length);
    addAttributes(atts);
}

KSH_DOMNode::KSH_DOMNode(const char* n, const char** atts) : name(WSQL_Strdup(n)) {
    if (name == nullptr) return;
    setNameLength(strlen(name));
    addAttributes(atts);
}

KSH_DOMNode::KSH_DOMNode(const char* n, LinkedList* attrs) : name(WSQL_Strdup(n)) {
    if (name == nullptr) return;
    setNameLength(strlen(name));
    if (attrs == nullptr) return;
    LinkedListIter it(attrs);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        auto* a = static_cast<KSH_XMLAttribute*>(v);
        if (addAttribute(a->getName(), a->getValue()) != WSQL_OK) break;
    }
}

KSH_DOMNode::~KSH_DOMNode() {
    delete childIter;
    delete attributeIter;
    delete attributes;
    delete children;
    if (ownsName) free(name);
    if (!valueInArena) free(value);
}

void KSH_DOMNode::setNameLength(size_t length) { nameLength = (uint16_t)(length < 0xFFFF ? length : 0xFFFF); }

void KSH_DOMNode::addAttributes(const char** atts) {
    for (int i = 0; atts != nullptr && atts[i] != nullptr && atts[i + 1] != nullptr; i += 2)
        if (addAttribute(atts[i], atts[i + 1]) != WSQL_OK) break;
}

size_t KSH_DOMNode::fullNameLength() const { return nameLength < 0xFFFF ? nameLength : strlen(name); }

int KSH_DOMNode::addAttribute(const char* n, const char* v) {
    if (attributes == nullptr) attributes = new (std::nothrow) LinkedList(nullptr, xmlAttributeDestructor);
    auto* a = new (std::nothrow) KSH_XMLAttribute(n, v);
    if (attributes == nullptr || a == nullptr || a->getName() == nullptr || attributes->AppendEntry(a) != WSQL_OK) {
        delete a;
        attributeFailed = true;
        return WSQL_NOMEM;
    }
    return WSQL_OK;
}

void KSH_DOMNode::xmlAttributeDestructor(void* attribute) { delete static_cast<KSH_XMLAttribute*>(attribute); }

int KSH_DOMNode::addChild(KSH_DOMNode* child) {
    if (children == nullptr) children = new (std::nothrow) LinkedList(nullptr, nullptr);
    if (children == nullptr || children->AppendEntry(child) != WSQL_OK) return WSQL_NOMEM;
    return WSQL_OK;
}

// The value buffer grows by doubling (a value that arrives in one piece is
// allocated exactly); held-back white space lives after the value's NUL.
bool KSH_DOMNode::ensureValueRoom(size_t bytes, KSH_Arena* arena) {
    if (bytes <= valueCapacity) return true;
    if (bytes > UINT32_MAX) return false;
    size_t grown = valueCapacity == 0 ? bytes : (size_t)valueCapacity * 2;
    if (grown < bytes) grown = bytes;
    if (grown > UINT32_MAX) grown = UINT32_MAX;
    char* p;
    if (valueInArena) {
        // Arena room cannot grow in place: move the value (and held-back
        // white space) to new room, in the arena while it is small.
        p = arena ? static_cast<char*>(arena->alloc(grown)) : nullptr;
        if (p == nullptr) {
            p = static_cast<char*>(malloc(grown));
            if (p == nullptr) return false;
            valueInArena = false;
        }
        memcpy(p, value, valueCapacity);
    } else {
        p = static_cast<char*>(realloc(value, grown));
        if (p == nullptr) return false;
    }
    value = p;
    valueCapacity = (uint32_t)grown;
    return true;
}

int KSH_DOMNode::appendValue(const char* s, int len, KSH_Arena* arena) {
    if (s == nullptr || len <= 0) return WSQL_OK;
    size_t n = (size_t)len;
    if (allBlank(s, len)) {
        // Only white space between two pieces of text is kept: hold it back
        // until a piece with text follows.
        if (valueLength == 0) return WSQL_OK;
        if (!ensureValueRoom((size_t)valueLength + 1 + pendingLength + n, arena)) return WSQL_NOMEM;
        memcpy(value + valueLength + 1 + pendingLength, s, n);
        pendingLength += (uint32_t)n;
        return WSQL_OK;
    }
    if (value == nullptr && arena != nullptr && (value = static_cast<char*>(arena->alloc(n + 1))) != nullptr) {
        valueInArena = true;
        valueCapacity = (uint32_t)(n + 1);
    }
    if (!ensureValueRoom((size_t)valueLength + pendingLength + n + 1, arena)) return WSQL_NOMEM;
    if (pendingLength != 0) {
        memmove(value + valueLength, value + valueLength + 1, pendingLength);
        valueLength += pendingLength;
        pendingLength = 0;
    }
    memcpy(value + valueLength, s, n);
    valueLength += (uint32_t)n;
    value[valueLength] = '\0';

    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) {
        if (namesPassword(name))
            RAS1_Printf(RAS1_THIS, __LINE__, "\"%s\" set to \"xxxxxxx\" ", name);
        else
            RAS1_Printf(RAS1_THIS, __LINE__, "\"%s\" set to \"%s\"", name, value);
    }
    return WSQL_OK;
}

KSH_DOMNode* KSH_DOMNode::getFirstChild() {
    resetChildIter();
    return getNextChild();
}

KSH_DOMNode* KSH_DOMNode::getNextChild() {
    if (children == nullptr) return nullptr;
    if (childIter == nullptr) childIter = new (std::nothrow) LinkedListIter(children);
    if (childIter == nullptr) return nullptr;
    return static_cast<KSH_DOMNode*>(childIter->Next());
}

void KSH_DOMNode::resetChildIter() {
    if (childIter) childIter->Reset();
}

int KSH_DOMNode::getAttribute(const char* n, char** v) {
    if (attributes == nullptr || n == nullptr) return WSQL_NOTFOUND;
    LinkedListIter it(attributes);
    for (void* p = it.Next(); p != nullptr; p = it.Next()) {
        auto* a = static_cast<KSH_XMLAttribute*>(p);
        if (strcmp(a->getName(), n) != 0) continue;
        if (v) *v = a->getValue();
        return WSQL_OK;
    }
    return WSQL_NOTFOUND;
}

int KSH_DOMNode::getNextAttribute(char** n, char** v) {
    if (attributes == nullptr) return WSQL_NOTFOUND;
    if (attributeIter == nullptr) attributeIter = new (std::nothrow) LinkedListIter(attributes);
    if (attributeIter == nullptr) return WSQL_NOTFOUND;
    auto* a = static_cast<KSH_XMLAttribute*>(attributeIter->Next());
    if (a == nullptr) return WSQL_NOTFOUND;
    if (n) *n = a->getName();
    if (v) *v = a->getValue();
    return WSQL_OK;
}

void KSH_DOMNode::resetAttributeListIter() {
    if (attributeIter) attributeIter->Reset();
}

// ------------------------------------------------------------------ KSH_XML

// A document and its cursors are used by one thread at a time, so its lists
// take no lock (a lock per append and per step costs more than the rest of
// building a leaf element).
KSH_XML::KSH_XML()
    : elements(new (std::nothrow) LinkedList(nullptr, xmlElementDestructor)),
      fragments(new (std::nothrow) LinkedList(nullptr, xmlFragmentDestructor)),
      arrayList(new (std::nothrow) LinkedList(nullptr, nullptr)) {
    if (arrayList) arrayIter = new (std::nothrow) LinkedListIter(arrayList);
}

KSH_XML::~KSH_XML() {
    delete arrayIter;
    delete elements;
    delete fragments;
    delete arrayList;
    free(rootName);
    free(xmlBuffer);
    free(parseError);
}

int KSH_XML::initializeXML() { return WSQL_OK; }
int KSH_XML::terminateXML() { return WSQL_OK; }

void KSH_XML::setRootName(const char* name) {
    if (name == nullptr) return;
    char* copy = WSQL_Strdup(name);
    if (copy == nullptr) return;
    free(rootName);
    rootName = copy;
}

void KSH_XML::xmlElementDestructor(void* node) { KSH_DOMNode::destroy(static_cast<KSH_DOMNode*>(node)); }
void KSH_XML::xmlFragmentDestructor(void* doc) { delete static_cast<KSH_XML*>(doc); }

void KSH_XML::failBuild(int rc, const char* why) {
    if (buildRc == 0) {
        buildRc = rc;
        buildWhy = why;
        RAS1_Printf(RAS1_THIS, __LINE__, "document not built: %s", why);
    }
    if (parser != nullptr) XML1_StopParser(parser);
}

int KSH_XML::parseMessage(const char* text, unsigned length) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_OK;
    xmlLength = (int)(length <= (unsigned)INT32_MAX ? length : INT32_MAX);
    XML1_Parser p = nullptr;
    void* buf = nullptr;
    if (elements == nullptr || fragments == nullptr || arrayList == nullptr) {
        failBuild(WSQL_NOMEM, "no memory for the document");
    } else if (length >= (unsigned)INT32_MAX) {
        failBuild(WSQL_NOMEM, "text too long to parse");
    } else if ((p = XML1_ParserCreate(nullptr)) == nullptr) {
        failBuild(WSQL_NOMEM, "no parser");
    } else if ((buf = XML1_GetBuffer(p, (int)length + 1)) == nullptr) {
        failBuild(WSQL_NOMEM, "no parser buffer");
    } else {
        XML1_SetElementHandler(p, static_cast<XML1_StartElementHandler>(&KSH_XML::startXMLElement), endXMLElement);
        XML1_SetCharacterDataHandler(p, XMLCharDataHandler);
        XML1_SetUserData(p, this);
        if (length != 0) memcpy(buf, text, length);
        static_cast<char*>(buf)[length] = '\0';
        parser = p;
        int status = XML1_ParseBuffer(p, (int)length, length == 0 ? 1 : 0);
        parser = nullptr;
        // A failure while building takes precedence: the parser would only
        // report that it was stopped.
        if (buildRc == 0 && status != XML1_STATUS_OK) {
            reportXMLParserError(p);
            rc = WSQL_BADINPUT;
        } else if (buildRc == 0 && cursor != nullptr) {
            reportXMLIncompleteError(p, cursor->getName());
            rc = WSQL_BADINPUT;
        }
    }
    if (buildRc != 0) {
        rc = buildRc;
        free(parseError);
        parseError = WSQL_Strdup(buildWhy);
    }
    XML1_ParserFree(p);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void KSH_XML::reportXMLParserError(XML1_ParserStruct* p) {
    int code = XML1_GetErrorCode(p);
    const char* message = XML1_ErrorString(code);
    free(parseError);
    parseError = nullptr;
    if (message == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "(unknown message %d)\n", code);
        return;
    }
    char buf[kErrorTextSize];
    snprintf(buf, sizeof buf, "%d:%d: %s\n", (int)XML1_GetCurrentLineNumber(p), (int)XML1_GetCurrentColumnNumber(p),
             message);
    parseError = WSQL_Strdup(buf);
    RAS1_Printf(RAS1_THIS, __LINE__, "%s", buf);
}

// A tag name too long for the 512-byte text is cut at a character boundary
// and marked with "...".
void KSH_XML::reportXMLIncompleteError(XML1_ParserStruct*, const char* tagName) {
    static const char fixed[] = "no ending tag for tag name \"\"";
    const size_t room = kErrorTextSize - 1 - (sizeof fixed - 1) - 3;
    char buf[kErrorTextSize];
    size_t n = tagName ? strlen(tagName) : 0;
    if (n <= room) {
        snprintf(buf, sizeof buf, "no ending tag for tag name \"%s\"", tagName ? tagName : "");
    } else {
        n = room;
        while (n > 0 && ((unsigned char)tagName[n] & 0xC0) == 0x80) --n;
        snprintf(buf, sizeof buf, "no ending tag for tag name \"%.*s...\"", (int)n, tagName);
    }
    free(parseError);
    parseError = WSQL_Strdup(buf);
    RAS1_Printf(RAS1_THIS, __LINE__, "%s", buf);
}

void KSH_XML::startXMLElement(void* doc, const char* name, const char** atts) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Nodename: \"%s\" (\"%s\")", name, name);
    static_cast<KSH_XML*>(doc)->addElement(name, atts);
}

void KSH_XML::startXMLElement(void* doc, const char* name, LinkedList* attrs) {
    static_cast<KSH_XML*>(doc)->addElement(name, attrs);
}

void KSH_XML::endXMLElement(void* doc, const char*) { static_cast<KSH_XML*>(doc)->closeElement(); }

void KSH_XML::XMLCharDataHandler(void* doc, const char* s, int len) {
    static_cast<KSH_XML*>(doc)->setElementValue(s, len);
}

void KSH_XML::XMLNativeCharDataHandler(void* doc, const char* s, int len) {
    static_cast<KSH_XML*>(doc)->setNativeElementValue(s, len);
}

int KSH_XML::addElement(const char* name, const char** atts) {
    if (buildRc != 0) return buildRc;
    return insertNode(KSH_DOMNode::create(name, atts, &arena));
}

int KSH_XML::addElement(const char* name, LinkedList* attrs) {
    if (buildRc != 0) return buildRc;
    return insertNode(new (std::nothrow) KSH_DOMNode(name, attrs));
}

int KSH_XML::insertNode(KSH_DOMNode* node) {
    if (node == nullptr || !node->valid() || elements == nullptr) {
        const char* why = node && node->getName() ? "too many attributes or no memory for one"
                                                  : "no memory for an element";
        KSH_DOMNode::destroy(node);
        failBuild(WSQL_NOMEM, why);
        return WSQL_NOMEM;
    }
    if (elements->NumEntries() >= kMaxElements || elements->AppendEntry(node) != WSQL_OK) {
        bool full = elements->NumEntries() >= kMaxElements;
        KSH_DOMNode::destroy(node);
        failBuild(WSQL_NOMEM, full ? "more than 65535 elements" : "no memory for an element");
        return WSQL_NOMEM;
    }
    if (rootName == nullptr && (rootName = WSQL_Strdup(node->getName())) == nullptr) {
        failBuild(WSQL_NOMEM, "no memory for the root name");
        return WSQL_NOMEM;
    }
    if (newest) newest->dropPending();
    newest = node;
    if (root == nullptr) root = node;
    if (cursor != nullptr) {
        if (cursor->addChild(node) != WSQL_OK) {
            failBuild(WSQL_NOMEM, "no memory for a child");
            return WSQL_NOMEM;
        }
        node->setParent(cursor);
    }
    cursor = node;
    return WSQL_OK;
}

void KSH_XML::closeElement() {
    if (newest) newest->dropPending();
    if (cursor != nullptr) cursor = cursor->getParent();
}

int KSH_XML::setElementValue(const char* s, int len) {
    if (newest == nullptr || buildRc != 0) return WSQL_OK;
    int rc = newest->appendValue(s, len, &arena);
    if (rc != WSQL_OK) failBuild(rc, "no memory for a value");
    return rc;
}

// --------------------------------------------------------------- navigation

KSH_DOMNode* KSH_XML::getFirstChild() {
    if (current == nullptr) {
        childParent = nullptr;
        current = root;
        return root;
    }
    childParent = current;
    KSH_DOMNode* child = current->getFirstChild();
    if (child != nullptr) current = child;
    return child;
}

KSH_DOMNode* KSH_XML::getNextChild() {
    current = childParent ? childParent->getNextChild() : nullptr;
    return current;
}

int KSH_XML::nextNode() {
    current = arrayIter ? static_cast<KSH_DOMNode*>(arrayIter->Next()) : nullptr;
    return current ? WSQL_OK : WSQL_NOTFOUND;
}

namespace {
// Appends to `list` the children of `parent` named `name`; the first found.
KSH_DOMNode* collectNamedChildren(KSH_DOMNode* parent, const char* name, LinkedList* list, int* rc) {
    KSH_DOMNode* first = nullptr;
    for (KSH_DOMNode* c = parent->getFirstChild(); c != nullptr; c = parent->getNextChild()) {
        if (strcmp(c->getName(), name) != 0) continue;
        if (list->AppendEntry(c) != WSQL_OK) {
            *rc = WSQL_NOMEM;
            continue;
        }
        if (first == nullptr) first = c;
    }
    return first;
}
}  // namespace

int KSH_XML::getArray(const char* name, unsigned* count) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_NOTFOUND;
    delete arrayIter;
    arrayIter = nullptr;
    arrayParent = nullptr;
    if (arrayList) arrayList->Clear();
    if (arrayList) arrayIter = new (std::nothrow) LinkedListIter(arrayList);
    if (arrayIter == nullptr) {
        rc = WSQL_NOMEM;
    } else if (name != nullptr && elements != nullptr) {
        KSH_DOMNode* first = nullptr;
        LinkedListIter it(elements);
        for (void* v = it.Next(); v != nullptr && first == nullptr; v = it.Next())
            if (strcmp(static_cast<KSH_DOMNode*>(v)->getName(), name) == 0) first = static_cast<KSH_DOMNode*>(v);
        if (first != nullptr) {
            rc = WSQL_OK;
            current = nullptr;
            arrayParent = first->getParent();
            if (arrayParent != nullptr) {
                current = collectNamedChildren(arrayParent, name, arrayList, &rc);
            } else if (arrayList->AppendEntry(first) == WSQL_OK) {
                current = first;  // the root: an array of itself alone
            } else {
                rc = WSQL_NOMEM;
            }
        }
        arrayIter->Next();
    }
    unsigned n = arrayList ? arrayList->NumEntries() : 0;
    if (count) *count = n;
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "array \"%s\": %u entries", name ? name : "", n);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int KSH_XML::getArrayImmediate(const char* name, unsigned* count, void* parent) {
    int rc = WSQL_NOTFOUND;
    delete arrayIter;
    arrayIter = nullptr;
    arrayParent = nullptr;
    if (arrayList) arrayList->Clear();
    if (arrayList) arrayIter = new (std::nothrow) LinkedListIter(arrayList);
    if (arrayIter == nullptr) {
        rc = WSQL_NOMEM;
    } else {
        arrayParent = parent ? static_cast<KSH_DOMNode*>(parent) : current;
        current = nullptr;
        if (arrayParent != nullptr && name != nullptr) {
            int growRc = WSQL_OK;
            current = collectNamedChildren(arrayParent, name, arrayList, &growRc);
            rc = growRc != WSQL_OK ? growRc : current ? WSQL_OK : WSQL_NOTFOUND;
        }
        arrayIter->Next();
    }
    if (count) *count = arrayList ? arrayList->NumEntries() : 0;
    return rc;
}

int KSH_XML::getElementValue(const char* name, char** value, unsigned* length, char** tagName,
                             KSH_DOMNode* parent) {
    if (name == nullptr || elements == nullptr) return WSQL_NOTFOUND;
    KSH_DOMNode* found = nullptr;
    {
        LinkedListIter it(elements);
        for (void* v = it.Next(); v != nullptr; v = it.Next()) {
            auto* e = static_cast<KSH_DOMNode*>(v);
            if (parent != KSH_ANY_PARENT && e->getParent() != parent) continue;
            if (strcmp(e->getName(), name) == 0) {
                found = e;
                break;
            }
        }
    }
    if (found == nullptr) return WSQL_NOTFOUND;
    int rc = WSQL_NOTFOUND;
    if (value == nullptr) {
        rc = WSQL_OK;
        current = found;
    } else if (found->getValueLength() != 0) {
        rc = WSQL_OK;
        current = found;
        *value = found->getValue();
        if (length) *length = found->getValueLength();
    }
    if (tagName) *tagName = found->getName();
    return rc;
}

int KSH_XML::testElement(const char* name) { return getElementValue(name, nullptr, nullptr, nullptr, KSH_ANY_PARENT); }

int KSH_XML::testElementImmediate(const char* name) {
    return getElementValue(name, nullptr, nullptr, nullptr, current ? current : root);
}

int KSH_XML::getNodeValue(KSH_DOMNode* node, char** value, unsigned* length) {
    if (node == nullptr) return WSQL_NOTFOUND;
    if (value) *value = node->getValue();
    if (length) *length = node->getValueLength();
    return node->getValue() != nullptr && node->getValueLength() != 0 ? WSQL_OK : WSQL_NOTFOUND;
}

int KSH_XML::getNodeValue(char** value, unsigned* length) { return getNodeValue(current, value, length); }

int KSH_XML::getNodeTagname(char** name) {
    if (current == nullptr) return WSQL_NOTFOUND;
    if (name) *name = current->getName();
    return WSQL_OK;
}

int KSH_XML::getAttribute(const char* name, char** value) {
    return current ? current->getAttribute(name, value) : WSQL_NOTFOUND;
}

int KSH_XML::getAttributeList() {
    if (current == nullptr || current->getAttributeCount() == 0) return WSQL_NOTFOUND;
    current->resetAttributeListIter();
    return WSQL_OK;
}

int KSH_XML::getNextAttribute(char** name, char** value) {
    return current ? current->getNextAttribute(name, value) : WSQL_NOTFOUND;
}

int KSH_XML::getChild() {
    cursor = cursor ? cursor->getNextChild() : nullptr;
    return cursor ? WSQL_OK : WSQL_NOMEM;
}

int KSH_XML::getParent() {
    cursor = cursor ? cursor->getParent() : nullptr;
    return cursor ? WSQL_OK : WSQL_FAULT;
}

// ------------------------------------------------- fragments, serialisation

KSH_XML* KSH_XML::createFragment(KSH_DOMNode* node) {
    if (node == nullptr) node = current;
    if (node == nullptr || fragments == nullptr) return nullptr;
    auto* fragment = new (std::nothrow) KSH_XML();
    if (fragment == nullptr) return nullptr;
    fragment->setXMLLength(xmlLength);
    if (fragments->AppendEntry(fragment) != WSQL_OK) {
        delete fragment;
        return nullptr;
    }
    return dupTree(fragment, node) == WSQL_OK ? fragment : nullptr;
}

KSH_XML* KSH_XML::createChildFragment() { return createFragment(getFirstChild()); }

int KSH_XML::dupTree(KSH_XML* target, KSH_DOMNode* top) {
    if (target == nullptr || top == nullptr) return WSQL_NOTFOUND;
    auto open = [target](KSH_DOMNode* n) {
        startXMLElement(target, n->getName(), n->getAttributes());
        if (n->getValueLength() != 0) XMLNativeCharDataHandler(target, n->getValue(), (int)n->getValueLength());
        n->resetChildIter();
    };
    KSH_DOMNode* node = top;
    open(node);
    while (target->buildRc == 0) {
        KSH_DOMNode* child = node->getNextChild();
        if (child != nullptr) {
            open(child);
            node = child;
            continue;
        }
        endXMLElement(target, node->getName());
        if (node == top || node->getParent() == nullptr) break;
        node = node->getParent();
    }
    return target->buildRc;
}

size_t KSH_XML::measureXML(KSH_DOMNode* node) {
    if (node == nullptr) return 0;
    MeasureSink sink;
    serialise(sink, node, false);
    return sink.n;
}

void KSH_XML::buildXML(KSH_DOMNode* node, char** out) {
    if (node == nullptr) return;
    WriteSink sink{*out};
    serialise(sink, node, false);
    *out = sink.p;
}

void KSH_XML::insertTagname(KSH_DOMNode* node, char** out) {
    size_t n = node->fullNameLength();
    memcpy(*out, node->getName(), n);
    *out += n;
}

void KSH_XML::insertNodeValue(KSH_DOMNode* node, char** out, bool leadingBlank) {
    if (node->getValueLength() == 0) return;
    if (leadingBlank) *(*out)++ = ' ';
    WriteSink sink{*out};
    putText(sink, node->getValue(), node->getValueLength());
    *out = sink.p;
}

int KSH_XML::extractMessage(KSH_DOMNode* node, char** text, unsigned* length) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    free(xmlBuffer);
    xmlBuffer = nullptr;
    int rc = WSQL_OK;
    size_t size = node ? measureXML(node) : 0;
    if (node == nullptr) {
        rc = WSQL_NOTFOUND;
    } else if (size >= UINT32_MAX || (xmlBuffer = static_cast<char*>(malloc(size + 1))) == nullptr) {
        rc = WSQL_NOMEM;
    } else {
        char* out = xmlBuffer;
        buildXML(node, &out);
        *out = '\0';
        if (text) *text = xmlBuffer;
        if (length) *length = (unsigned)size;
        if (ras & RAS1_STATE) {
            // The trace gets a copy with password values hidden.
            MeasureSink m;
            serialise(m, node, true);
            char* shown = static_cast<char*>(malloc(m.n + 1));
            if (shown != nullptr) {
                WriteSink w{shown};
                serialise(w, node, true);
                *w.p = '\0';
                RAS1_Printf(RAS1_THIS, __LINE__, "XML:");
                RAS1_Printf(RAS1_THIS, __LINE__, "\"%s\"", shown);
                free(shown);
            }
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int KSH_XML::extractDocumentXML(char** text, unsigned* length) { return extractMessage(root, text, length); }

int KSH_XML::extractChildNodeXML(char** text, unsigned* length) {
    getFirstChild();
    return extractMessage(current, text, length);
}
