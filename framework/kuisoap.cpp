// kuisoap: the SOAP CT_SQL request and the server look-ups built on it.
//
// Wire form of a request (one HTTP POST to the session's server URL):
//
//   <?xml version="1.0" encoding="UTF-8"?>
//   <SOAP-ENV:Envelope xmlns:SOAP-ENV="..." SOAP-ENV:encodingStyle="...">
//   <SOAP-ENV:Body><CT_SQL><userid>U</userid><password>P</password>
//   <table>O4SRV.TSITDESC</table><sql>STATEMENT</sql></CT_SQL>
//   </SOAP-ENV:Body></SOAP-ENV:Envelope>
//
// The statement's CDATA sections are copied as they are; everything else of
// it, and the user id, password and table, is escaped for XML. The reply body
// is handed back whole; callers judge it by "</TABLE>" (the server answered
// with a table) and "ROW" (the table has rows).
#include <curl/curl.h>

#include <cstdlib>
#include <cstring>
#include <string>

#include "kshlst.h"
#include "kuisupport.h"
#include "opclictx.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuisoap");

namespace {

const char kEnvelopeHead[] =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\" "
    "SOAP-ENV:encodingStyle=\"http://schemas.xmlsoap.org/soap/encoding/\">"
    "<SOAP-ENV:Body><CT_SQL>";
const char kEnvelopeTail[] = "</CT_SQL></SOAP-ENV:Body></SOAP-ENV:Envelope>\n";
const char kCdataOpen[] = "<![CDATA[";
const char kCdataClose[] = "]]>";

// A reply larger than this is refused: the server never answers one of the
// command's statements with more than a few rows.
constexpr size_t kMaxReply = 64u << 20;
constexpr long kLowSpeedSeconds = 30;

void appendEscaped(std::string& out, const char* s, size_t n) {
    for (size_t i = 0; i < n; i++) {
        switch (s[i]) {
            case '&': out += "&amp;"; break;
            case '<': out += "&lt;"; break;
            case '>': out += "&gt;"; break;
            case '"': out += "&quot;"; break;
            case '\'': out += "&apos;"; break;
            default: out += s[i];
        }
    }
}

// Copies `sql`, keeping its CDATA sections and escaping the text between
// them. An opening without its close is plain text and escaped with the rest.
void appendStatement(std::string& out, const char* sql) {
    const char* p = sql;
    for (;;) {
        const char* open = strstr(p, kCdataOpen);
        const char* close = open ? strstr(open + strlen(kCdataOpen), kCdataClose) : nullptr;
        if (!close) {
            appendEscaped(out, p, strlen(p));
            return;
        }
        appendEscaped(out, p, (size_t)(open - p));
        close += strlen(kCdataClose);
        out.append(open, (size_t)(close - open));
        p = close;
    }
}

void appendElement(std::string& out, const char* tag, const std::string& value) {
    out += "<";
    out += tag;
    out += ">";
    appendEscaped(out, value.data(), value.size());
    out += "</";
    out += tag;
    out += ">";
}

// The table a statement names: the word after its first FROM or INTO.
std::string tableOf(const char* sql) {
    static const char* const keys[] = {"FROM ", "INTO "};
    const char* best = nullptr;
    for (const char* k : keys) {
        const char* at = strcasestr(sql, k);
        if (at && (!best || at < best)) best = at + strlen(k);
    }
    std::string table;
    if (!best) return table;
    while (*best == ' ') best++;
    while (*best && (isalnum((unsigned char)*best) || *best == '_' || *best == '.' || *best == '*')) table += *best++;
    return table;
}

size_t collectBody(char* data, size_t size, size_t count, void* user) {
    std::string* body = static_cast<std::string*>(user);
    size_t n = size * count;
    if (body->size() + n > kMaxReply) return 0;  // ends the transfer with an error
    body->append(data, n);
    return n;
}

// Posts `envelope`; 0 with *body and *status, or 4.
int post(OPCLI_Context* ctx, const std::string& envelope, std::string* body, long* status) {
    int ras = RAS1_Sync(RAS1_THIS);
    CURL* curl = static_cast<CURL*>(ctx->httpHandle());
    if (!curl) return KUI_COMM;
    curl_easy_reset(curl);  // keeps the connection cache: the connection is reused
    struct curl_slist* headers = curl_slist_append(nullptr, "Content-Type: text/xml; charset=utf-8");
    headers = curl_slist_append(headers, "SOAPAction: \"CT_SQL\"");
    curl_easy_setopt(curl, CURLOPT_URL, ctx->serverUrl.c_str());
    curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl, CURLOPT_HTTPHEADER, headers);
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, envelope.data());
    curl_easy_setopt(curl, CURLOPT_POSTFIELDSIZE_LARGE, (curl_off_t)envelope.size());
    curl_easy_setopt(curl, CURLOPT_CONNECTTIMEOUT_MS, ctx->connectTimeoutMs);
    curl_easy_setopt(curl, CURLOPT_TIMEOUT_MS, ctx->totalTimeoutMs);
    curl_easy_setopt(curl, CURLOPT_LOW_SPEED_LIMIT, 1L);
    curl_easy_setopt(curl, CURLOPT_LOW_SPEED_TIME, kLowSpeedSeconds);
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, collectBody);
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, body);
    CURLcode cc = curl_easy_perform(curl);
    curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, status);
    curl_slist_free_all(headers);
    if (cc != CURLE_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "SOAP request to %s failed: %s", ctx->serverUrl.c_str(), curl_easy_strerror(cc));
        return KUI_COMM;
    }
    RAS1_TRACE_IF(ras, RAS1_STATE, "SOAP reply status %ld, %zu bytes", *status, body->size());
    return KUI_OK;
}

// Sends `sql` and judges the reply: 0 with *reply holding a table (released
// by the caller with free), 7 when the server answered without one, 4.
int query(void* ctx, const char* sql, char** reply) {
    *reply = nullptr;
    int rc = issueSoapRequest(ctx, sql, 0, reply, nullptr);
    if (rc != KUI_OK || !*reply) return KUI_COMM;
    if (!strstr(*reply, "</TABLE>")) {
        free(*reply);
        *reply = nullptr;
        return KUI_SERVER;
    }
    return KUI_OK;
}

// Composes "<![CDATA[" head, the value as the content of a double-quoted
// literal, tail "]]>" in buf. Quotes in the value are doubled and a "]]>" in
// it is split over two CDATA sections, so the value can neither end the
// literal nor the section. False when the statement does not fit.
bool composeLookup(char* buf, size_t bufSize, const char* head, const char* value, const char* tail) {
    std::string s = kCdataOpen;
    s += head;
    for (const char* p = value; *p; p++) {
        if (*p == '"') s += "\"\"";
        else if (strncmp(p, kCdataClose, 3) == 0) {
            s += "]]]]><![CDATA[>";
            p += 2;
        } else s += *p;
    }
    s += tail;
    s += kCdataClose;
    if (s.size() >= bufSize) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Statement of %zu bytes does not fit the message buffer", s.size());
        return false;
    }
    memcpy(buf, s.c_str(), s.size() + 1);
    return true;
}

// Runs a one-column query and copies the first value (at most size-1 bytes)
// into out. 0 found, 9 no row, 4, 7, 8.
int firstValue(void* ctx, char* buf, size_t bufSize, const char* head, const char* value, const char* tail, char* out,
               size_t size) {
    if (out && size) out[0] = '\0';
    if (!buf || !composeLookup(buf, bufSize, head, value, tail)) return KUI_INTERNAL;
    char* reply = nullptr;
    int rc = query(ctx, buf, &reply);
    if (rc != KUI_OK) return rc;
    if (!strstr(reply, "ROW")) rc = KUI_ABSENT;
    char** values = nullptr;
    int count = 0;
    if (rc == KUI_OK) {
        int prc = parseSoapResponseIntoArray(reply, &count, 1, &values);
        rc = prc == 0 ? KUI_OK : prc == 5 ? KUI_ABSENT : KUI_INTERNAL;
    }
    if (rc == KUI_OK && out && size) snprintf(out, size, "%s", values[0]);
    releaseSoapResponseArray(values, count);
    free(reply);
    return rc;
}

OPCLI_Context* contextOf(void* ctx) { return static_cast<OPCLI_Context*>(ctx); }

}  // namespace

int issueSoapRequest(void* ctx, const char* sql, int, char** reply, int* replyLength) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = KUI_OK;
    OPCLI_Context* c = contextOf(ctx);
    if (reply) *reply = nullptr;
    if (replyLength) *replyLength = 0;
    if (!c || !sql || !reply || c->serverUrl.empty()) rc = KUI_COMM;
    std::string body;
    long status = 0;
    if (rc == KUI_OK) {
        RAS1_TRACE_IF(ras, RAS1_STATE, "CT_SQL to %s: %s", c->serverUrl.c_str(), sql);
        std::string envelope = kEnvelopeHead;
        appendElement(envelope, "userid", c->user);
        appendElement(envelope, "password", c->password);
        std::string table = tableOf(sql);
        if (!table.empty()) appendElement(envelope, "table", table);
        envelope += "<sql>";
        appendStatement(envelope, sql);
        envelope += "</sql>";
        envelope += kEnvelopeTail;
        rc = post(c, envelope, &body, &status);
    }
    // An HTTP error is a communication error, unless the server explains it
    // with a SOAP fault: that is its answer, judged by the caller.
    if (rc == KUI_OK && status >= 400 && body.find("Fault>") == std::string::npos) {
        RAS1_Printf(RAS1_THIS, __LINE__, "SOAP request to %s answered with HTTP status %ld", c->serverUrl.c_str(), status);
        rc = KUI_COMM;
    }
    if (rc == KUI_OK) {
        char* copy = static_cast<char*>(malloc(body.size() + 1));
        if (!copy) rc = KUI_COMM;
        else {
            memcpy(copy, body.c_str(), body.size() + 1);
            *reply = copy;
            if (replyLength) *replyLength = (int)(body.size() > 0x7FFFFFFF ? 0x7FFFFFFF : body.size());
            RAS1_TRACE_IF(ras, RAS1_DETAIL, "Reply: %s", copy);
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// SELECT ID FROM O4SRV.TNAME WHERE FULLNAME = N"<full name>"
int getSitNamefromTNAME(void* ctx, char* buf, char**, const char* fullName, char* shortName) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = firstValue(ctx, buf, KUI_MSGBUF_SIZE, "SELECT ID FROM O4SRV.TNAME WHERE FULLNAME = N\"", fullName ? fullName : "", "\"",
                        shortName, KUI_SHORTNAME_SIZE);
    if (rc == KUI_OK && shortName[0] == '\0') rc = KUI_ABSENT;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = "<short name>"
int checkSitExistsinTSITDESC(void* ctx, char* buf, char**, const char* shortName) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = firstValue(ctx, buf, KUI_MSGBUF_SIZE, "SELECT SITNAME FROM O4SRV.TSITDESC WHERE SITNAME = \"", shortName ? shortName : "",
                        "\"", nullptr, 0);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// The prefix test, then the existence query of checkSitExistsinTSITDESC.
int checkUADVISORSituation(void* ctx, char* buf, char** slot, const char* baseShortName, const char* baseName) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    static const char kInternal[] = "UADVISOR";
    int rc = KUI_OK;
    if ((baseShortName && strncmp(baseShortName, kInternal, strlen(kInternal)) == 0) ||
        (baseName && strncmp(baseName, kInternal, strlen(kInternal)) == 0)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Base situation [%s] is an internal data-collection situation",
                    baseName ? baseName : baseShortName);
        rc = KUI_BADINPUT;
    }
    if (rc == KUI_OK) rc = checkSitExistsinTSITDESC(ctx, buf, slot, baseShortName ? baseShortName : "");
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = "VERSION"
int getVemsVersion(void* ctx, char* buf, char**, char** version) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char text[64];
    int rc = firstValue(ctx, buf, KUI_MSGBUF_SIZE, "SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = \"", "VERSION", "\"", text,
                        sizeof text);
    if (rc == KUI_ABSENT) rc = KUI_SERVER;  // the server would not tell its version
    if (rc == KUI_OK && version) {
        contextOf(ctx)->version = text;
        *version = &contextOf(ctx)->version[0];
    }
    RAS1_TRACE_IF(ras, RAS1_STATE, "Server version [%s] rc %d", rc == KUI_OK ? text : "", rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = "EIF" (Y: enabled), then
// SELECT DESTID FROM O4SRV.TEVTDEST
int GetEventID(LinkedList* list, void* ctx) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char buf[256];  // both statements are short and fixed
    char eif[8];
    int rc = list ? KUI_OK : KUI_INTERNAL;
    if (rc == KUI_OK)
        rc = firstValue(ctx, buf, sizeof buf, "SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = \"", "EIF", "\"", eif, sizeof eif);
    if (rc == KUI_ABSENT || (rc == KUI_OK && eif[0] != 'Y' && eif[0] != 'y')) rc = KUI_ABSENT;
    char* reply = nullptr;
    if (rc == KUI_OK) rc = query(ctx, "SELECT DESTID FROM O4SRV.TEVTDEST", &reply);
    char** ids = nullptr;
    int count = 0;
    if (rc == KUI_OK && strstr(reply, "ROW")) {
        int prc = parseSoapResponseIntoArray(reply, &count, 1, &ids);
        if (prc != 0 && prc != 5) rc = KUI_INTERNAL;
    }
    for (int i = 0; rc == KUI_OK && i < count; i++) {
        char* id = strdup(ids[i]);
        if (!id || list->AppendEntry(id) != 0) {
            free(id);
            rc = KUI_INTERNAL;
        }
    }
    releaseSoapResponseArray(ids, count);
    free(reply);
    RAS1_TRACE_IF(ras, RAS1_STATE, "Event destinations: %d, rc %d", count, rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

char getUserAuthorization() {
    OPCLI_Context* c = OPCLI_Context::active();
    return (c && c->loggedIn) ? 'Y' : 0;
}
