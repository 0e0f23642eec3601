// kshutil: string and date-time helpers (see kshutil.h).
#include "kshutil.h"

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "bss1/bss1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshutil");

namespace {

int upper(char c) { return toupper((unsigned char)c); }

// The two-character tokens in the order they are tried; "mm" is resolved by
// the token before it.
struct TokenKind {
    const char* token;
    uint8_t kind;
};
constexpr TokenKind kTokens[] = {
    {"yy", 1}, {"mm", 0xFF}, {"dd", 3}, {"hh", 4}, {"ss", 6}, {"mo", 2}, {"mi", 5},
};
constexpr uint8_t kAmbiguousMM = 0xFF;

// Kind of the pair at `p` (both characters readable) given the kind of the
// token before it; -1 for an "mm" that neither a year nor an hour precedes.
int tokenKind(const char* p, int previous) {
    for (const TokenKind& t : kTokens) {
        if (upper(p[0]) != upper(t.token[0]) || upper(p[1]) != upper(t.token[1])) continue;
        if (t.kind != kAmbiguousMM) return t.kind;
        if (previous == 1) return 2;
        if (previous == 4) return 5;
        return -1;
    }
    return 0;
}

}  // namespace

int WSQL_CaseCompare(const char* a, const char* b) {
    if (a == nullptr || b == nullptr) return (a != nullptr) - (b != nullptr);
    for (;; ++a, ++b) {
        int d = upper(*a) - upper(*b);
        if (d != 0 || *a == '\0') return d;
    }
}

int WSQL_NCaseCompare(const char* a, const char* b, size_t n) {
    if (n == 0) return 0;
    if (a == nullptr || b == nullptr) return (a != nullptr) - (b != nullptr);
    for (size_t i = 0; i < n; ++i) {
        int d = upper(a[i]) - upper(b[i]);
        if (d != 0 || a[i] == '\0') return d;
    }
    return 0;
}

char* WSQL_Strdup(const char* s, size_t n) {
    if (s == nullptr) return nullptr;
    if (n == 0) n = strlen(s);
    char* copy = static_cast<char*>(malloc(n + 1));
    if (copy == nullptr) return nullptr;
    memcpy(copy, s, n);
    copy[n] = '\0';
    return copy;
}

char* WSQL_CopyUnpad(char* dst, char* src, size_t len) {
    if (src == nullptr) return nullptr;
    size_t n = len == 0 ? strlen(src) : strnlen(src, len);
    while (n > 0 && src[n - 1] == ' ') --n;
    if (dst == nullptr) {
        src[n] = '\0';
        return src;
    }
    memcpy(dst, src, n);
    dst[n] = '\0';
    return dst;
}

unsigned parseDateTimeVariable(const char* text, dateTimeVariableParms* parms) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    memset(parms, 0, sizeof *parms);
    parms->start = -1;
    const char* open = text ? strchr(text, '$') : nullptr;
    const char* close = open ? strchr(open + 1, '$') : nullptr;
    if (close == nullptr) {
        RAS1_EXIT_RC(ras, WSQL_NOTFOUND);
        return WSQL_NOTFOUND;
    }
    // Offsets are 16-bit; a variable further in cannot be described.
    if (close - text + 1 > INT16_MAX) {
        RAS1_EXIT_RC(ras, WSQL_BADINPUT);
        return WSQL_BADINPUT;
    }
    parms->start = (int16_t)(open - text);
    parms->end = (int16_t)(close - text + 1);

    unsigned rc = WSQL_OK;
    const char* p = open + 1;
    for (int pos = 0;; ++pos, p += 2) {
        if (pos == 6) {
            // Six tokens that ran past the '$' taken as the end would make the
            // replacement longer than the text: such a variable is malformed.
            if (p - text > parms->end) rc = WSQL_BADINPUT;
            break;
        }
        if (p[0] == '$') {
            parms->end = (int16_t)(p - text + 1);
            break;
        }
        // A text ending inside a token (either character) is malformed; the
        // second test also keeps the reading within the string.
        if (p[0] == '\0' || p[1] == '\0' || p + 2 - text > INT16_MAX) {
            rc = WSQL_BADINPUT;
            break;
        }
        int kind = tokenKind(p, pos > 0 ? parms->kinds[pos - 1] : 0);
        if (kind < 0) {
            rc = WSQL_BADINPUT;
            break;
        }
        parms->kinds[pos] = (uint8_t)kind;
        parms->count++;
    }
    if (ras & RAS1_DETAIL)
        RAS1_Printf(RAS1_THIS, __LINE__, "variable in \"%s\": rc %u count %d start %d end %d", text, rc,
                    parms->count, parms->start, parms->end);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

unsigned insertDateTimeValue(const char* src, char* dst, const dateTimeVariableParms* parms) {
    size_t len = strlen(src);
    // Anything but a variable parseDateTimeVariable found leaves the text as
    // it is: the replacement must never grow past strlen(src).
    bool usable = parms->start >= 0 && parms->count >= 0 && parms->count <= 6 &&
                  (size_t)parms->end <= len && parms->start + 1 + 2 * parms->count <= parms->end;
    if (!usable) {
        memcpy(dst, src, len + 1);
        return WSQL_OK;
    }
    struct tm now;
    BSS1_LocalTime(BSS1_Time(), &now);
    const int values[7] = {0, now.tm_year % 100, now.tm_mon + 1, now.tm_mday, now.tm_hour, now.tm_min, now.tm_sec};

    char* out = dst;
    memcpy(out, src, (size_t)parms->start);
    out += parms->start;
    const char* token = src + parms->start + 1;
    for (int i = 0; i < parms->count; ++i, token += 2, out += 2) {
        int kind = parms->kinds[i];
        if (kind >= 1 && kind <= 6) {
            char two[3];
            snprintf(two, sizeof two, "%02d", values[kind] % 100);
            memcpy(out, two, 2);
        } else {
            memcpy(out, token, 2);  // an unrecognised pair keeps its own characters
        }
    }
    memcpy(out, src + parms->end, len - (size_t)parms->end + 1);
    return WSQL_OK;
}

void genTimeStamp(char* buf) {
    struct tm now;
    BSS1_LocalTime(BSS1_Time(), &now);
    snprintf(buf, 17, "%1d%02d%02d%02d%02d%02d%02d000", (now.tm_year / 100) % 10, now.tm_year % 100, now.tm_mon + 1,
             now.tm_mday, now.tm_hour, now.tm_min, now.tm_sec);
}
