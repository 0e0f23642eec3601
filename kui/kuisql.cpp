// kuisql: the bounded statement composer and the send helpers.
#include "kuisql.h"

#include <cstdlib>
#include <cstring>

#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuisql");

namespace {
const char kCdataOpen[] = "<![CDATA[";
const char kCdataClose[] = "]]>";
// "]]>" inside a section: the first two brackets end one section, the ">"
// starts the next.
const char kCdataSplit[] = "]]]]><![CDATA[>";
}  // namespace

KUI_Statement::KUI_Statement(char* b) : buf(b) {
    if (buf) buf[0] = '\0';
    else overflow = true;
}

void KUI_Statement::append(const char* s, size_t n) {
    if (overflow) return;
    if (len + n >= KUI_MSGBUF_SIZE) {
        overflow = true;
        return;
    }
    memcpy(buf + len, s, n);
    len += n;
    buf[len] = '\0';
}

KUI_Statement& KUI_Statement::add(const char* s) {
    s = kuiText(s);
    append(s, strlen(s));
    return *this;
}

KUI_Statement& KUI_Statement::addInCdata(const char* value) {
    const char* p = kuiText(value);
    for (const char* at; (at = strstr(p, kCdataClose)) != nullptr; p = at + 3) {
        append(p, (size_t)(at - p));
        append(kCdataSplit, strlen(kCdataSplit));
    }
    return add(p);
}

KUI_Statement& KUI_Statement::addOutsideCdata(const char* value) {
    const char* v = kuiText(value);
    if (!strstr(v, kCdataOpen)) return add(v);
    add(kCdataOpen);
    addInCdata(v);
    return add(kCdataClose);
}

KUI_Statement& KUI_Statement::addQuotedOutsideCdata(const char* value) {
    char* copy = kuiDup(value);
    escapeDoubleQuotes(&copy, 0);
    addOutsideCdata(copy);
    delete[] copy;
    return *this;
}

KUI_Statement& KUI_Statement::addSingleQuotedInCdata(const char* value) {
    const char* v = kuiText(value);
    size_t n = strlen(v);
    char* doubled = new char[2 * n + 1];
    size_t k = 0;
    for (size_t i = 0; i < n; i++) {
        doubled[k++] = v[i];
        if (v[i] == '\'') doubled[k++] = '\'';
    }
    doubled[k] = '\0';
    addInCdata(doubled);
    delete[] doubled;
    return *this;
}

int kuiSend(void* ctx, const KUI_Statement& st, char** reply) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    *reply = nullptr;
    int rc = KUIR_OK;
    if (!st.fits()) {
        errCode = KUIE_INTERNAL;
        KUI_TRACE_ERROR(ras,
                    "Internal error occurred while composing a statement: it does not fit the message buffer of %zu bytes",
                    (size_t)KUI_MSGBUF_SIZE);
        rc = KUIR_INTERNAL;
    }
    int length = 0;
    if (rc == KUIR_OK && (issueSoapRequest(ctx, st.text(), 0, reply, &length) != 0 || !*reply)) {
        free(*reply);
        *reply = nullptr;
        rc = KUIR_COMM;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int kuiSendUpdate(void* ctx, const KUI_Statement& st) {
    char* reply = nullptr;
    int rc = kuiSend(ctx, st, &reply);
    if (rc == KUIR_OK && !strstr(reply, "</TABLE>")) rc = KUIR_SERVER;
    free(reply);
    return rc;
}
