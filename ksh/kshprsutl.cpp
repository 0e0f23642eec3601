// kshprsutl: bounded text storage, quoting, name checks and record helpers
// of the request parser.
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "kshprsint.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshprsutl");

// ------------------------------------------------------------ text arena

void WSQL_TextArena::clear() {
    if (base != nullptr && size != 0) memset(base, 0, size);
    used = 0;
    start = 0;
    failed = false;
}

char* WSQL_TextArena::copy(const char* text, size_t n) {
    if (text == nullptr) text = "";
    if (n == SIZE_MAX) n = strlen(text);
    if (base == nullptr || n >= size - used) return nullptr;
    char* out = base + used;
    memcpy(out, text, n);
    out[n] = '\0';
    used += n + 1;
    return out;
}

char* WSQL_TextArena::format(const char* fmt, ...) {
    if (base == nullptr || used >= size) return nullptr;
    va_list ap;
    va_start(ap, fmt);
    int n = vsnprintf(base + used, size - used, fmt, ap);
    va_end(ap);
    if (n < 0 || static_cast<size_t>(n) >= size - used) {
        base[used] = '\0';
        return nullptr;
    }
    char* out = base + used;
    used += static_cast<size_t>(n) + 1;
    return out;
}

void WSQL_TextArena::begin() {
    start = used;
    failed = base == nullptr || used >= size;
    if (!failed) base[used] = '\0';
}

bool WSQL_TextArena::append(const char* text, size_t n) {
    if (failed) return false;
    if (text == nullptr) text = "";
    if (n == SIZE_MAX) n = strlen(text);
    // One byte stays free for the text's terminator.
    if (n >= size - used) {
        failed = true;
        return false;
    }
    memcpy(base + used, text, n);
    used += n;
    base[used] = '\0';
    return true;
}

bool WSQL_TextArena::appendf(const char* fmt, ...) {
    if (failed) return false;
    va_list ap;
    va_start(ap, fmt);
    int n = vsnprintf(base + used, size - used, fmt, ap);
    va_end(ap);
    if (n < 0 || static_cast<size_t>(n) >= size - used) {
        base[used] = '\0';
        failed = true;
        return false;
    }
    used += static_cast<size_t>(n);
    return true;
}

char* WSQL_TextArena::end() {
    if (failed) {
        int ras = RAS1_Sync(RAS1_THIS);
        if (ras & RAS1_DETAIL)
            RAS1_Printf(RAS1_THIS, __LINE__, "text did not fit: %zu of %zu bytes in use", used, size);
        // Give back what the failed text took.
        if (base != nullptr && start < size) memset(base + start, 0, used - start);
        used = start;
        failed = false;
        return nullptr;
    }
    char* out = base + start;
    used += 1;  // the terminator append() left in place
    return out;
}

char* WSQL_TextArena::sqlQuoted(const char* text) {
    begin();
    appendSqlQuoted(text);
    return end();
}

bool WSQL_TextArena::appendSqlQuoted(const char* text) {
    for (const char* p = text ? text : ""; *p != '\0'; ++p) {
        const char* q = strchr(p, '"');
        size_t run = q ? static_cast<size_t>(q - p) : strlen(p);
        append(p, run);
        if (q == nullptr) break;
        append("\"\"", 2);
        p = q;
    }
    return !failed;
}

char* WSQL_TextArena::xmlEscaped(const char* text) {
    // Table of the characters replaced and their references.
    static const struct {
        char c;
        const char* ref;
    } kRefs[] = {{'"', "&quot;"}, {'&', "&amp;"}, {'\'', "&apos;"}, {'<', "&lt;"}, {'>', "&gt;"}};
    begin();
    for (const char* p = text ? text : ""; *p != '\0'; ++p) {
        const char* ref = nullptr;
        for (const auto& r : kRefs)
            if (r.c == *p) ref = r.ref;
        if (ref != nullptr)
            append(ref);
        else
            append(p, 1);
    }
    return end();
}

// ------------------------------------------------------------ record

size_t WSQL_CredentialLength(const char* field) { return strnlen(field, WSQL_CREDENTIAL_SIZE); }

void WSQL_RecordUser(const WSQL_Request_t* req, char* out) {
    const char* field = (req->elements & WSQL_ELEM_USERID) ? req->userid : req->clientHost;
    size_t n = WSQL_CredentialLength(field);
    memcpy(out, field, n);
    out[n] = '\0';
}

// ------------------------------------------------------------ record arrays

int WSQL_AddColumnValue(WSQL_Request_t* req, char* column, char* value) {
    if (req->numColumns >= WSQL_MAX_COLUMNS || req->numValues >= WSQL_MAX_COLUMNS) return WSQL_NOMEM;
    req->columns[req->numColumns++] = column;
    req->values[req->numValues++] = value;
    return WSQL_OK;
}

int WSQL_AddParma(WSQL_Request_t* req, char* name, char* value) {
    if (req->numParma >= WSQL_MAX_PARMA) return WSQL_NOMEM;
    req->parma[req->numParma].name = name;
    req->parma[req->numParma].value = value;
    req->numParma++;
    return WSQL_OK;
}

int WSQL_AddFilter(WSQL_Request_t* req, char* column, char* oper, char* value, unsigned char isAfilter) {
    if (req->numFilters >= WSQL_MAX_FILTERS) return WSQL_NOMEM;
    WSQL_Filter_t& f = req->filters[req->numFilters++];
    f.column = column;
    f.oper = oper;
    f.value = value;
    f.isAfilter = isAfilter;
    return WSQL_OK;
}

int WSQL_FindColumn(const WSQL_Request_t* req, const char* name) {
    for (int i = 0; i < req->numColumns && i < WSQL_MAX_COLUMNS; ++i)
        if (req->columns[i] != nullptr && WSQL_CaseCompare(req->columns[i], name) == 0) return i;
    return -1;
}

int WSQL_FindFilter(const WSQL_Request_t* req, const char* name) {
    for (int i = 0; i < req->numFilters && i < WSQL_MAX_FILTERS; ++i)
        if (req->filters[i].column != nullptr && WSQL_CaseCompare(req->filters[i].column, name) == 0) return i;
    return -1;
}

bool WSQL_SplitAtSemicolons(char* text, int count, char** parts) {
    if (text == nullptr) return false;
    char* cuts[2] = {nullptr, nullptr};
    char* p = text;
    for (int i = 0; i < count && i < 2; ++i) {
        cuts[i] = strchr(p, ';');
        if (cuts[i] == nullptr) return false;
        p = cuts[i] + 1;
    }
    parts[0] = text;
    for (int i = 0; i < count && i < 2; ++i) {
        *cuts[i] = '\0';
        parts[i + 1] = cuts[i] + 1;
    }
    return true;
}
