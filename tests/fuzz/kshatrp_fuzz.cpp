// Fuzz target: arbitrary bytes read as one attribute file into a fresh
// catalog. Besides crashes, leaks and undefined behaviour, aborts when a
// stored name breaks the limits the parser promises.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "kshatrp.h"
#include "kshcat.h"
#include "kshcol.h"
#include "kshlst.h"
#include "kshtab.h"
#include "ras1/ras1.h"

namespace {

// Reads the fuzz input through the parser's own line reader.
class MemoryParser : public WSQL_AttrParser {
public:
    MemoryParser(WSQL_Catalog* cat, const uint8_t* data, size_t size) : WSQL_AttrParser(cat), data_(data), size_(size) {}
    int openFile(const char*) override {
        if (file_) closeFile();
        // fmemopen refuses a zero-length buffer; an empty file is a file
        // that ends at once.
        static char empty[1];
        file_ = size_ ? fmemopen(const_cast<uint8_t*>(data_), size_, "r") : fmemopen(empty, 1, "r");
        if (file_ && size_ == 0) fgetc(file_);
        return file_ ? 0 : 8;
    }

private:
    const uint8_t* data_;
    size_t size_;
};

void check(bool ok, const char* what, const char* value) {
    if (ok) return;
    fprintf(stderr, "invariant broken: %s [%s]\n", what, value);
    abort();
}

bool upperOrOther(const char* s) {
    for (; *s; s++)
        if (*s >= 'a' && *s <= 'z') return false;
    return true;
}

void checkAttrName(const char* a) {
    check(strlen(a) > 0 && strlen(a) <= WSQL_ATR_NAME_MAX, "attribute length", a);
    check((a[0] >= 'A' && a[0] <= 'Z') || (a[0] >= 'a' && a[0] <= 'z'), "attribute starts with a letter", a);
    for (const char* p = a; *p; p++) {
        bool ok = (*p >= 'A' && *p <= 'Z') || (*p >= 'a' && *p <= 'z') || (*p >= '0' && *p <= '9') || *p == '_';
        check(ok, "attribute characters", a);
    }
}

void checkTable(WSQL_Table* t) {
    const char* name = t->TableName();
    check(strlen(name) <= WSQL_ATR_APPL_MAX + 1 + WSQL_ATR_TABLE_MAX, "table name length", name);
    check(strchr(name, '.') != nullptr && upperOrOther(name), "qualified upper-case name", name);
    check(strlen(t->UnqualifiedTableName()) > 0, "table part present", name);
    check(strlen(t->ObjectName()) <= WSQL_ATR_NAME_MAX, "object length", t->ObjectName());
    WSQL_Table copy(*t);
    check(copy.Columns()->NumEntries() == t->Columns()->NumEntries(), "copy keeps columns", name);
    LinkedListIter it(t->Columns());
    while (auto* c = static_cast<WSQL_Column*>(it.Next())) {
        const char* col = c->ColName();
        check(strlen(col) > 0 && strlen(col) <= WSQL_ATR_TABLE_MAX && upperOrOther(col), "column name", col);
        checkAttrName(c->AttrName());
        check(t->GetColumn(col) != nullptr && t->GetAttr(c->AttrName()) != nullptr, "column found again", col);
        check(!c->Hidden() || strcmp(col, "ORIGINNODE") == 0, "only the node column hides", col);
        if (!c->Enumerated()) continue;
        LinkedListIter en(c->Enums());
        while (auto* e = static_cast<WSQL_Enum*>(en.Next())) {
            // The half that began the pair is never empty; the completing
            // half may be (an empty stored value can have a display text).
            check(e->Vale()[0] || e->Vali()[0], "a pair holds a text", e->Vali());
            check(strlen(e->Vale()) <= WSQL_ENUM_MAX && strlen(e->Vali()) <= WSQL_ENUM_MAX, "pair length", e->Vali());
            (void)c->GetEnumeration(e->Vali());
        }
    }
}

}  // namespace

// Every trace class on, written nowhere: the trace formatting runs too,
// without flooding the fuzzer's output.
extern "C" int LLVMFuzzerInitialize(int*, char***) {
    RAS1_Configure("ALL", "/dev/null");
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    WSQL_Catalog cat;
    {
        MemoryParser parser(&cat, data, size);
        if (parser.parseFile("/fuzz", "input.atr") != 0) abort();  // opening memory never fails
    }
    // Walk the tables by name: each found by its own qualified name.
    size_t seen = 0;
    WSQL_Table* t = nullptr;
    std::string after;
    while ((t = cat.NextTable(seen ? after.c_str() : nullptr)) != nullptr) {
        check(cat.GetTable(t->TableName()) == t, "table found by name", t->TableName());
        checkTable(t);
        after = t->TableName();
        seen++;
    }
    check(seen == cat.NumTables(), "walk sees every table", "");
    return 0;
}
