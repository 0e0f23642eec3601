// aff1: the affinity table, read from its text file (see aff1.h).
#include "aff1/aff1.h"

#include <strings.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <vector>

#include "bss1/bss1.h"
#include "ras1/ras1.h"

RAS1_UNIT("aff1");

namespace {

constexpr size_t kMaxIdDigits = 64;
constexpr size_t kLineSize = 1024;
constexpr int kMaxArrayEntries = 32767;

// The table and where it came from. Guarded by Table::mu.
struct Table {
    std::mutex mu;
    std::string file;                // set by AFF1_SetTableFile; empty: search
    bool loaded = false;             // GUARDED_BY(mu)
    std::vector<AFF1_Entry> entries; // GUARDED_BY(mu)
    int malformed = 0;               // GUARDED_BY(mu)
};

Table& table() {
    static Table t;
    return t;
}

// The bits of an affinity id, one nibble a digit, padded to kMaxIdDigits.
struct Bits {
    unsigned char nibble[kMaxIdDigits] = {};
};

int hexValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// False when `text` (`n` bytes) is not an affinity id of at most 64 digits.
bool toBits(const char* text, size_t n, Bits* out) {
    if (n > kMaxIdDigits) return false;
    *out = Bits{};
    for (size_t i = 0; i < n; i++) {
        int v = hexValue(text[i]);
        if (v < 0) return false;
        out->nibble[i] = static_cast<unsigned char>(v);
    }
    return true;
}

bool sameBits(const Bits& a, const Bits& b) { return memcmp(a.nibble, b.nibble, kMaxIdDigits) == 0; }

// Every bit of `part` is set in `whole`, and `part` has at least one.
bool subsetOf(const Bits& part, const Bits& whole) {
    bool any = false;
    for (size_t i = 0; i < kMaxIdDigits; i++) {
        if ((part.nibble[i] & whole.nibble[i]) != part.nibble[i]) return false;
        any = any || part.nibble[i] != 0;
    }
    return any;
}

// The file to read, by the order of aff1.h.
std::string tableFile(const Table& t) {
    if (!t.file.empty()) return t.file;
    const char* env = BSS1_GetEnv("AFF1_TABLE", nullptr);
    if (env != nullptr) return env;
    const char* attr = BSS1_GetEnv("CT_ATTRLIB", BSS1_GetEnv("ATTRLIB", nullptr));
    if (attr != nullptr) return std::string(attr) + "/../affinity/affinity.tbl";
    return "affinity/affinity.tbl";
}

// `s` without blanks at both ends, as [begin, end).
void trim(const char** begin, const char** end) {
    while (*begin < *end && isspace(static_cast<unsigned char>(**begin))) ++*begin;
    while (*end > *begin && isspace(static_cast<unsigned char>((*end)[-1]))) --*end;
}

// The fields of an entry in file order, with their widths.
struct FieldSpec {
    size_t offset;
    size_t size;
    bool affinity;  // must be an affinity id
};
const FieldSpec kFields[] = {
    {offsetof(AFF1_Entry, staticAffinity), AFF1_STATIC_SIZE, true},
    {offsetof(AFF1_Entry, dynamicAffinity), AFF1_DYNAMIC_SIZE, true},
    {offsetof(AFF1_Entry, product), AFF1_PRODUCT_SIZE, false},
    {offsetof(AFF1_Entry, text), AFF1_TEXT_SIZE, false},
    {offsetof(AFF1_Entry, resid), AFF1_RESID_SIZE, false},
};
constexpr size_t kFieldCount = sizeof kFields / sizeof kFields[0];

// Parses one data line into *e. False when it is malformed.
bool parseLine(const char* line, AFF1_Entry* e) {
    *e = AFF1_Entry{};
    const char* p = line;
    for (size_t f = 0; f < kFieldCount; f++) {
        const char* bar = strchr(p, '|');
        const char* end = bar != nullptr ? bar : p + strlen(p);
        if ((bar == nullptr) != (f == kFieldCount - 1)) return false;  // too few or too many fields
        const char* b = p;
        trim(&b, &end);
        size_t n = static_cast<size_t>(end - b);
        if (n >= kFields[f].size) return false;
        Bits bits;
        if (kFields[f].affinity && !toBits(b, n, &bits)) return false;
        memcpy(reinterpret_cast<char*>(e) + kFields[f].offset, b, n);
        if (bar != nullptr) p = bar + 1;
    }
    return e->product[0] != '\0' || e->text[0] != '\0';
}

// Reads the table file. REQUIRES: t.mu held.
int loadLocked(Table& t) {
    int ras = RAS1_Sync(RAS1_THIS);
    std::string name = tableFile(t);
    FILE* f = fopen(name.c_str(), "r");
    if (f == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open affinity table \"%s\" - %d", name.c_str(), errno);
        return AFF1_NOTABLE;
    }
    t.entries.clear();
    t.malformed = 0;
    char line[kLineSize];
    int number = 0;
    bool skippingLongLine = false;
    while (fgets(line, sizeof line, f) != nullptr) {
        size_t n = strlen(line);
        bool complete = n > 0 && line[n - 1] == '\n';
        if (skippingLongLine) {  // the rest of a line that did not fit
            skippingLongLine = !complete;
            continue;
        }
        number++;
        if (!complete && !feof(f)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Affinity table line %d too long", number);
            t.malformed++;
            skippingLongLine = true;
            continue;
        }
        while (n > 0 && (line[n - 1] == '\n' || line[n - 1] == '\r')) line[--n] = '\0';
        const char* b = line;
        const char* e = line + n;
        trim(&b, &e);
        if (b == e || *b == '#') continue;
        AFF1_Entry entry;
        if (!parseLine(line, &entry)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Affinity table line %d malformed", number);
            t.malformed++;
            continue;
        }
        t.entries.push_back(entry);
    }
    bool readError = ferror(f) != 0;
    fclose(f);
    if (readError) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error reading affinity table \"%s\"", name.c_str());
        t.entries.clear();
        return AFF1_NOTABLE;
    }
    t.loaded = true;
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Affinity table \"%s\": %d entries, %d malformed lines", name.c_str(),
                    static_cast<int>(t.entries.size()), t.malformed);
    return AFF1_OK;
}

// A look-up: the key prepared once, then tested against each entry.
struct Matcher {
    int kind;
    bool subset;
    std::string key;
    Bits bits;

    bool matches(const AFF1_Entry& e) const {
        switch (kind) {
        case AFF1_BY_TEXT:
            return strcasecmp(e.text, key.c_str()) == 0;
        case AFF1_BY_PRODUCT:
            return strcasecmp(e.product, key.c_str()) == 0;
        case AFF1_BY_RESID:
            return strcasecmp(e.resid, key.c_str()) == 0;
        default:
            return affinityMatches(e.staticAffinity) || affinityMatches(e.dynamicAffinity);
        }
    }
    bool affinityMatches(const char* id) const {
        if (*id == '\0') return false;
        Bits other;
        if (!toBits(id, strlen(id), &other)) return false;
        return subset ? subsetOf(bits, other) : sameBits(bits, other);
    }
};

// The width of the field the kind compares with, terminator excluded.
size_t keyLimit(int kind) {
    switch (kind) {
    case AFF1_BY_TEXT:
        return AFF1_TEXT_SIZE - 1;
    case AFF1_BY_PRODUCT:
        return AFF1_PRODUCT_SIZE - 1;
    case AFF1_BY_RESID:
        return AFF1_RESID_SIZE - 1;
    default:
        return kMaxIdDigits;
    }
}

int prepare(int kind, bool subset, const char* key, size_t keyLength, Matcher* m) {
    if (key == nullptr || keyLength == 0) return AFF1_BADARG;
    if (kind != AFF1_BY_TEXT && kind != AFF1_BY_PRODUCT && kind != AFF1_BY_RESID && kind != AFF1_BY_AFFINITY)
        return AFF1_BADARG;
    m->kind = kind;
    m->subset = subset;
    m->key.assign(key, strnlen(key, keyLength));
    if (kind == AFF1_BY_AFFINITY) {
        if (m->key.size() > kMaxIdDigits) return AFF1_NOTFOUND;
        if (!toBits(m->key.data(), m->key.size(), &m->bits)) return AFF1_BADKEY;
    } else if (m->key.size() > keyLimit(kind)) {
        return AFF1_NOTFOUND;
    }
    return AFF1_OK;
}

}  // namespace

int AFF1_Load(int* entries, int* malformed) {
    Table& t = table();
    std::lock_guard<std::mutex> g(t.mu);
    int rc = loadLocked(t);
    if (entries != nullptr) *entries = static_cast<int>(t.entries.size());
    if (malformed != nullptr) *malformed = t.malformed;
    return rc;
}

void AFF1_SetTableFile(const char* path) {
    Table& t = table();
    std::lock_guard<std::mutex> g(t.mu);
    t.file = path != nullptr ? path : "";
    t.loaded = false;
    t.entries.clear();
}

int AFF1_GetEntry(int kind, const char* key, size_t keyLength, AFF1_Entry* entry) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    Matcher m;
    int rc = entry != nullptr ? prepare(kind, false, key, keyLength, &m) : AFF1_BADARG;
    if (rc == AFF1_OK) {
        Table& t = table();
        std::lock_guard<std::mutex> g(t.mu);
        if (!t.loaded) rc = loadLocked(t);
        if (rc == AFF1_OK) {
            rc = AFF1_NOTFOUND;
            for (const AFF1_Entry& e : t.entries) {
                if (!m.matches(e)) continue;
                *entry = e;
                rc = AFF1_OK;
                break;
            }
        }
    }
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "entry kind %d key \"%s\": %d", kind, m.key.c_str(), rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int AFF1_GetEntries(int kind, const char* key, size_t keyLength, AFF1_EntryArray** array) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    Matcher m;
    int rc = AFF1_BADARG;
    if (array != nullptr) {
        *array = nullptr;
        rc = prepare(kind, kind == AFF1_BY_AFFINITY, key, keyLength, &m);
    }
    std::vector<AFF1_Entry> found;
    if (rc == AFF1_OK) {
        Table& t = table();
        std::lock_guard<std::mutex> g(t.mu);
        if (!t.loaded) rc = loadLocked(t);
        for (size_t i = 0; rc == AFF1_OK && i < t.entries.size() && found.size() < kMaxArrayEntries; i++)
            if (m.matches(t.entries[i])) found.push_back(t.entries[i]);
    }
    if (rc == AFF1_OK) {
        void* room = malloc(sizeof(int16_t) + found.size() * sizeof(AFF1_Entry));
        if (room == nullptr) {
            rc = AFF1_NOMEM;
        } else {
            *array = static_cast<AFF1_EntryArray*>(room);
            (*array)->count = static_cast<int16_t>(found.size());
            if (!found.empty()) memcpy(AFF1_EntryAt(*array, 0), found.data(), found.size() * sizeof(AFF1_Entry));
        }
    }
    if (ras & RAS1_DETAIL)
        RAS1_Printf(RAS1_THIS, __LINE__, "entries kind %d key \"%s\": %d, %d found", kind, m.key.c_str(), rc,
                    static_cast<int>(found.size()));
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void AFF1_FreeEntryArray(AFF1_EntryArray* array) { free(array); }
