// aff1: the affinity table of the platform.
//
// An affinity entry ties the affinity strings of a monitored product (a
// static one, naming the product, and a dynamic one, naming what a running
// agent of it reports) to the product code, a readable text and a resource
// identifier. The gateway answers its affinity requests from this table.
//
// The table is read from a text file on first use (and again after
// AFF1_SetTableFile). The file is found, first that applies:
//   1. the file given to AFF1_SetTableFile;
//   2. the environment variable AFF1_TABLE (a file name);
//   3. "affinity/affinity.tbl" in the folder above the attribute directory
//      (CT_ATTRLIB, else ATTRLIB): the attribute files live in HOME/attrlib,
//      the table in HOME/affinity/affinity.tbl (data/affinity/ in the source
//      tree, beside data/attrlib/);
//   4. "affinity/affinity.tbl" in the current directory.
//
// File format: one entry per line, five fields separated by '|':
//     STATIC|DYNAMIC|PRODUCT|TEXT|RESID
// Blanks around a field are dropped. Empty lines and lines whose first
// non-blank character is '#' are comments. A field longer than its width
// (32, 64, 32, 256, 32 characters), a line with another number of fields, a
// line longer than 1023 characters, or an affinity string that is not an
// affinity id (below) makes the line count as malformed: it is skipped and
// traced, and the rest of the file still loads. An entry needs a product or
// a text.
//
// Affinity ids. An affinity string is a bit set written in hexadecimal
// digits (0-9, A-F, either case), four bits a digit, the first digit holding
// the first four bits. Missing digits at the end are 0, so "A" and "A000" are
// the same id. A key given to the look-ups below may be at most 64 digits.
//   - exact match: the key and the entry's static or dynamic affinity are the
//     same bit set;
//   - subset match: every bit of the key is also set in the entry's static
//     or dynamic affinity (the key names a part of the entry's id: a key with
//     one family bit finds every product of the family). A key without any
//     bit set matches nothing.
// Products, texts and resource ids are compared without regard to case.
//
// Results: 0 found; 2 bad argument (null pointer, unknown kind, empty key);
// 5 nothing matches, or the key is longer than the field it is compared
// with; 6 the key is not an affinity id; 7 no memory; 8 the table file
// cannot be read.
//
// Thread safety: every call may be made from any thread; the table is read
// under a lock and entries are copied out.
#pragma once

#include <cstddef>
#include <cstdint>

enum : int {
    AFF1_OK = 0,
    AFF1_BADARG = 2,
    AFF1_NOTFOUND = 5,
    AFF1_BADKEY = 6,
    AFF1_NOMEM = 7,
    AFF1_NOTABLE = 8,
};

// Look-up kinds.
enum : int {
    AFF1_BY_TEXT = 0,        // the first entry whose text equals the key
    AFF1_BY_PRODUCT = 1,     // the entries of a product
    AFF1_BY_RESID = 2,       // the first entry whose resource id equals the key
    AFF1_BY_AFFINITY = 1000, // by affinity id: GetEntry exact, GetEntries subset
};

// Field widths, the terminator included.
enum : size_t {
    AFF1_STATIC_SIZE = 33,
    AFF1_DYNAMIC_SIZE = 65,
    AFF1_PRODUCT_SIZE = 33,
    AFF1_TEXT_SIZE = 257,
    AFF1_RESID_SIZE = 33,
};

// One entry: fixed-width fields, each zero-terminated within its width.
struct AFF1_Entry {
    char staticAffinity[AFF1_STATIC_SIZE];
    char dynamicAffinity[AFF1_DYNAMIC_SIZE];
    char product[AFF1_PRODUCT_SIZE];
    char text[AFF1_TEXT_SIZE];
    char resid[AFF1_RESID_SIZE];
};
static_assert(sizeof(AFF1_Entry) == 421, "an affinity entry is 421 bytes");

// An entry array: a signed 16-bit count followed directly by that many
// entries (reach them with AFF1_EntryAt). Made by AFF1_GetEntries, released
// with AFF1_FreeEntryArray.
struct AFF1_EntryArray {
    int16_t count;
};
inline AFF1_Entry* AFF1_EntryAt(AFF1_EntryArray* array, int index) {
    return reinterpret_cast<AFF1_Entry*>(reinterpret_cast<char*>(array) + sizeof(int16_t)) + index;
}

// Fills *entry with the first entry that matches `key` (`keyLength` bytes,
// not necessarily terminated). Kinds: AFF1_BY_TEXT, AFF1_BY_RESID,
// AFF1_BY_AFFINITY (exact match), AFF1_BY_PRODUCT (the first of the
// product's entries).
[[nodiscard]] int AFF1_GetEntry(int kind, const char* key, size_t keyLength, AFF1_Entry* entry);

// *array receives a new array of every matching entry, in file order (0
// with a count of 0 when nothing matches: an array is always made on
// success). Kinds: AFF1_BY_PRODUCT, AFF1_BY_AFFINITY (subset match),
// AFF1_BY_TEXT and AFF1_BY_RESID (every entry with that text or id). At
// most 32767 entries are returned. The caller releases the array with
// AFF1_FreeEntryArray.
[[nodiscard]] int AFF1_GetEntries(int kind, const char* key, size_t keyLength, AFF1_EntryArray** array);
void AFF1_FreeEntryArray(AFF1_EntryArray* array);

// Uses `path` as the table file from now on (null: the search above again)
// and forgets the table read so far; the next look-up reads the file.
void AFF1_SetTableFile(const char* path);

// Reads the table now (the same as the first look-up does). 0 or 8; with
// `entries` / `malformed` given, the number of entries loaded and of lines
// skipped as malformed.
int AFF1_Load(int* entries, int* malformed);
