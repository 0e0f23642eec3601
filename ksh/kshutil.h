// kshutil: the gateway's small string and date-time helpers, and the access
// point to the process-wide attribute catalog.
//
// All functions work on NUL-terminated single-byte strings, are reentrant and
// keep no state (the catalog access excepted).
#pragma once

#include <cstddef>
#include <cstdint>

// Compares `a` and `b` character by character after upper-casing both; the
// difference of the first differing pair, or 0 when both end together. A null
// string sorts before any other and equals another null.
int WSQL_CaseCompare(const char* a, const char* b);
// The same over at most `n` characters; `n` = 0 gives 0.
int WSQL_NCaseCompare(const char* a, const char* b, size_t n);

// A new copy of `s`, allocated with malloc (the caller frees it with free), or
// null when `s` is null or memory is short. `n` = 0 copies the whole string;
// otherwise exactly `n` bytes of `s` (which must be readable) are copied and a
// NUL is appended.
char* WSQL_Strdup(const char* s, size_t n = 0);

// Drops trailing blanks (spaces only) from the first `len` characters of `src`
// (`len` = 0: all of it; a shorter `src` ends at its NUL). With a `dst` (which
// holds at least `len` + 1 bytes, or strlen(src) + 1 when `len` is 0) the kept
// characters are copied there and `dst` is returned, `src` untouched; with a
// null `dst`, `src` itself is cut and returned.
char* WSQL_CopyUnpad(char* dst, char* src, size_t len);

// The attribute catalog, built on first use. Both live in kshcat.cpp.
class WSQL_Catalog;
WSQL_Catalog* WSQL_GetCatalog();
void WSQL_InitCatalog(void*);

// A date/time stamp variable: a run of two-character tokens between two
// dollar signs, as in exp$yymmdd$.xml. Token kinds, in `kinds`:
//   1 yy  year in the century     4 hh  hour 00-23
//   2 mo  month (or mm after yy)  5 mi  minute (or mm after hh)
//   3 dd  day of the month        6 ss  second
//   0     any other pair: counted, written out as its own two characters
struct dateTimeVariableParms {
    int16_t count;     // tokens read, 0 to 6
    int16_t start;     // offset of the opening '$'; -1 when there is no variable
    int16_t end;       // offset just after the closing '$'
    uint8_t kinds[6];  // kind of each token in order
};

// Describes the first variable of `text` in `parms`. 0 found, 5 no variable
// (start -1), 6 malformed ("mm" not after yy or hh, the text ends inside the
// variable, or the variable lies beyond the reach of 16-bit offsets).
unsigned parseDateTimeVariable(const char* text, dateTimeVariableParms* parms);

// Writes `src` into `dst` with the variable that `parms` describes replaced by
// the current local date and time (BSS1_Time). `dst` holds at least
// strlen(src) + 1 bytes. Returns 0.
unsigned insertDateTimeValue(const char* src, char* dst, const dateTimeVariableParms* parms);

// Writes the current local time as the 16-character timestamp CYYMMDDHHMMSSmmm
// (C the century digit, 1 for 2000-2099; mmm always 000) into `buf`, which
// holds at least 17 bytes.
void genTimeStamp(char* buf);
