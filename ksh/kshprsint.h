// kshprsint: helpers shared by the request parser's sources (kshprs*.cpp):
// bounded text storage in the defaults buffer, SQL literal quoting, name
// checks and appending to the arrays of a WSQL_Request_t. Internal to the
// parser and its tests.
#pragma once

#include <cstddef>
#include <cstdint>

#include "kshreqt.h"

class WSQL_HttpServer;

// Texts of one request laid one after another into a caller's fixed buffer
// (the 4096-byte defaults buffer). Every text is NUL-terminated; a text that
// does not fit whole is not stored (null is returned and nothing is
// written past the buffer). The arena does not own the buffer.
class WSQL_TextArena {
public:
    WSQL_TextArena(char* buffer, size_t size) : base(buffer), size(size), used(0) {}
    WSQL_TextArena(const WSQL_TextArena&) = delete;
    WSQL_TextArena& operator=(const WSQL_TextArena&) = delete;

    // Zero-fills the buffer and forgets every text.
    void clear();
    // A copy of `n` bytes of `text` (n = SIZE_MAX: up to its NUL), or null.
    char* copy(const char* text, size_t n = SIZE_MAX);
    // A formatted text, or null when it does not fit.
    char* format(const char* fmt, ...) __attribute__((format(printf, 2, 3)));
    // `text` with every double quote doubled, so that it can stand between
    // double quotes in an SQL literal; null when it does not fit.
    char* sqlQuoted(const char* text);
    // The same as one piece of a text being built (see begin()).
    bool appendSqlQuoted(const char* text);
    // `text` with the XML special characters replaced by entity references
    // (for values inside an XML command text); null when it does not fit.
    char* xmlEscaped(const char* text);

    // Incremental building of one text: begin(), then append() pieces, then
    // end() gives the text, or null when any piece did not fit (the arena
    // then holds nothing of it).
    void begin();
    bool append(const char* text, size_t n = SIZE_MAX);
    bool appendf(const char* fmt, ...) __attribute__((format(printf, 2, 3)));
    char* end();

    size_t remaining() const { return size - used; }

private:
    char* base;
    size_t size;
    size_t used;
    size_t start = 0;      // offset of the text being built
    bool failed = false;   // a piece of the text being built did not fit
};

// Length of a 16-byte credential field (not terminated when full).
size_t WSQL_CredentialLength(const char* field);

// Appends to the record; 0, or 7 when the array is full (nothing changes).
int WSQL_AddColumnValue(WSQL_Request_t* req, char* column, char* value);
int WSQL_AddParma(WSQL_Request_t* req, char* name, char* value);
int WSQL_AddFilter(WSQL_Request_t* req, char* column, char* oper, char* value, unsigned char isAfilter);
// Index of the first column named `name` (ignoring case), or -1.
int WSQL_FindColumn(const WSQL_Request_t* req, const char* name);
// Index of the first filter whose column is `name` (ignoring case), or -1.
int WSQL_FindFilter(const WSQL_Request_t* req, const char* name);

// Splits `text` in place at its first `count` semicolons into `parts`
// (count + 1 entries). False when it has fewer semicolons (nothing changes).
bool WSQL_SplitAtSemicolons(char* text, int count, char** parts);

// The "user" of a record: its userid when a "userid" element was given,
// else the client host; terminated, at most 16 characters, into `out`
// (17 bytes).
void WSQL_RecordUser(const WSQL_Request_t* req, char* out);

// A static text handed out as a record string. Record strings are char*,
// but nobody writes into the texts the parser supplies itself.
inline char* WSQL_Literal(const char* text) { return const_cast<char*>(text); }
