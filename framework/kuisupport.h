// kuisupport: the support library of the command-line framework. A command
// module (the createsit command) reaches the server only through these calls.
//
// Conventions shared by every call below:
//   ctx   the server context the framework handed to the command (an
//         OPCLI_Context, see opclictx.h); opaque to the command.
//   buf   the command's message buffer: KUI_MSGBUF_SIZE bytes, owned by the
//         framework. The look-ups compose their SQL in it and leave it
//         holding the last statement; the caller empties it when it needs to.
//   slot  the response slot of the command entry, passed through unchanged.
//         The look-ups never store into it: each releases its own replies.
// Results 4, 7 and 8 always mean communication error, server exception and
// internal error (KUI_COMM, KUI_SERVER, KUI_INTERNAL).
//
// Texts handed back are owned by the caller unless said otherwise; each call
// says which allocator releases them.
#pragma once

#include <cstddef>

class LinkedList;

#define KUI_API __attribute__((visibility("default")))

// Size of the message buffer the framework hands to a command. It must hold
// the longest SQL statement the command composes: a situation row with four
// national-text columns of up to 2047 UTF-8 bytes each (doubled in the worst
// case by quote escaping) and the columns an export file brings. A statement
// that would not fit is refused by its composer, never cut.
enum : size_t { KUI_MSGBUF_SIZE = 131072 };

// Capacity of the short-name buffers the look-ups fill (31 characters + NUL).
enum : size_t { KUI_SHORTNAME_SIZE = 32 };

// Size of a getUUID buffer (16 characters + NUL).
enum : size_t { KUI_UUID_SIZE = 17 };

// Results.
enum : int {
    KUI_OK = 0,        // done, found
    KUI_COMM = 4,      // communication error: transfer failed, HTTP error, no reply
    KUI_BADINPUT = 6,  // refused input (UADVISOR base); malformed reply
    KUI_SERVER = 7,    // server exception: the server answered, but not with a table
    KUI_INTERNAL = 8,  // internal error: reply not parseable, statement does not fit
    KUI_ABSENT = 9,    // no such row; event integration facility disabled
};

// Posts `sql` as a SOAP CT_SQL request to the server of `ctx`, with the
// session's user id and password and the table the statement names (the name
// after its first FROM or INTO). Text outside CDATA sections is escaped for
// XML; CDATA sections travel as they are, so the server receives exactly the
// statement composed. One connection is kept per context and reused.
// 0: *reply holds the whole reply body, NUL-terminated, released by the
// caller with free(); *replyLength (may be null) its length. A reply that
// carries a SOAP fault is returned like any other (it holds no "</TABLE>").
// 4: the transfer failed or timed out, the HTTP status was an error without
// a SOAP fault, or there is no server to talk to (*reply stays null).
// `flags` is reserved and must be 0.
[[nodiscard]] KUI_API int issueSoapRequest(void* ctx, const char* sql, int flags, char** reply, int* replyLength);

// Parses a reply into an array of texts: for each ROW of the reply's table,
// the values of its first `columns` elements, row after row (an element
// without a value gives ""). 0: *values holds *count entries (count may be
// null), released with releaseSoapResponseArray; 5: no row; 6: the reply is
// not well-formed XML; 7: allocation failure.
[[nodiscard]] KUI_API int parseSoapResponseIntoArray(const char* reply, int* count, int columns, char*** values);
// Releases an array of parseSoapResponseIntoArray (null is accepted).
KUI_API void releaseSoapResponseArray(char** values, int count);

// Looks `fullName` up as a long name in O4SRV.TNAME. 0: found, `shortName`
// (KUI_SHORTNAME_SIZE bytes, emptied on entry) holds its short name (ID);
// 9: not found; 4, 7, 8.
[[nodiscard]] KUI_API int getSitNamefromTNAME(void* ctx, char* buf, char** slot, const char* fullName, char* shortName);

// 0: a O4SRV.TSITDESC row named `shortName` exists; 9: none; 4, 7, 8.
[[nodiscard]] KUI_API int checkSitExistsinTSITDESC(void* ctx, char* buf, char** slot, const char* shortName);

// Decides whether a base situation may be copied. 6: the base is one of the
// server's internal data-collection situations (its short name or its given
// name begins with "UADVISOR"), checked before any query; 9: no O4SRV.TSITDESC
// row of that short name; 0: it may be used; 4, 7, 8.
[[nodiscard]] KUI_API int checkUADVISORSituation(void* ctx, char* buf, char** slot, const char* baseShortName,
                                                 const char* baseName);

// Reads the server's version ("VV.RR", e.g. "06.30"). 0: *version points to
// the text, owned by the context (valid until the context is destroyed, not
// released by the caller); 4, 7, 8.
[[nodiscard]] KUI_API int getVemsVersion(void* ctx, char* buf, char** slot, char** version);

// Reads the server's event destinations into `list` (appended, one malloc'ed
// text per destination id; create the list with a destroy callback that
// calls free). 0: done; 9: the server's event integration facility is
// disabled (nothing appended); 4, 7; 8 and others: internal error.
[[nodiscard]] KUI_API int GetEventID(LinkedList* list, void* ctx);

// Checks and normalises a SITINFO text, ";"-separated KEY=VALUE items:
//   SEV    one of Fatal, Critical, Minor, Warning, Harmless, Informational,
//          Unknown (any letter case; written in that spelling)        else 1
//   TFWD   Y or N (any case; written upper-case)                      else 2
//   TDST   comma list of destination ids, each one of `destinations`;
//          blanks around ids and empty ids are dropped. With an empty
//          destination list (the facility is disabled) the item is dropped
//          altogether                                                 else 3
//   ATOM   an attribute name: a letter, then letters, digits or "_",
//          optionally qualified once as TABLE.ATTRIBUTE                else 4
//   COUNT  a positive decimal number of at most 9 digits (leading
//          zeros dropped)                                             else 5
//   other  an item without "=", with an empty key or a key given
//          twice                                                      else 6
// Keys and values are trimmed of blanks; known keys are matched in any case
// and written upper-case; items with other keys are kept; empty items (";;")
// are dropped. A valid text is written to *out normalised, each item followed
// by ";" (never longer than the input plus one); an invalid one is written
// unchanged. *out is a caller buffer of at least strlen(sitinfo) + 3 bytes.
// Returns 0 when valid, else the code of the first refused item.
[[nodiscard]] KUI_API int validateVEC(const char* sitinfo, LinkedList* destinations, char** out);

// Non-zero when the UTF-8 `name` has a character outside Latin-1 or more than
// 31 characters (counted as characters, not bytes).
KUI_API int isLongName(const char* name);
// Non-zero when the UTF-8 `text` has a character outside Latin-1.
KUI_API int hasNonLatin(const char* text);

// Fills `buf` (KUI_UUID_SIZE bytes) with 16 characters of 0-9 and A-Z that no
// other call returns: seconds of the clock, the process id and a counter
// started at a random value, in base 36.
KUI_API void getUUID(char* buf);

// UTF-8 copy of `text` (read in the process's default code page), allocated
// with new[] and released by the caller with delete[]; null for null input.
KUI_API char* convertToUTF8(const char* text);

// Trims blanks (space, tab, line ends) from both ends of *text in place: the
// pointer moves past leading blanks and a NUL ends the text after its last
// non-blank.
KUI_API void trimTheString(char** text);

// Replaces *text, which must have been allocated with new[], by a new[] copy
// in which every double quote is doubled (fit for a double-quoted SQL
// literal); the old text is released with delete[]. `flags` must be 0.
KUI_API void escapeDoubleQuotes(char** text, int flags);

// Shows message `id` (e.g. "098W") of the message file `file` at once,
// rendered as the framework renders result messages. The remaining
// arguments are kept for the caller's convention and not read.
KUI_API void displayMsg(const char* id, int a2, const char* file, int a4, int a5, int a6);

// Non-zero ('Y') when the framework holds a login to a server, else 0.
KUI_API char getUserAuthorization();
