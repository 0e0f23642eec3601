// khdmail: KHD_SendMail, a MIME message over SMTP with libcurl (see khd.h).
#include <curl/curl.h>
#include <strings.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <mutex>
#include <string>
#include <vector>

#include "bss1/bss1.h"
#include "khd/khd.h"
#include "ras1/ras1.h"

RAS1_UNIT("khdmail");

namespace {

constexpr size_t kMaxReceivers = 100;
constexpr long kLowSpeedBytes = 1;
constexpr long kLowSpeedSeconds = 30;

long secondsFromEnv(const char* name, long dflt) {
    const char* v = BSS1_GetEnv(name, nullptr);
    if (v == nullptr) return dflt;
    char* end = nullptr;
    long n = strtol(v, &end, 10);
    return end != v && *end == '\0' && n > 0 ? n : dflt;
}

bool hasLineBreak(const char* s) { return s != nullptr && strpbrk(s, "\r\n") != nullptr; }

std::string trimmed(const std::string& s) {
    size_t b = s.find_first_not_of(" \t");
    if (b == std::string::npos) return "";
    size_t e = s.find_last_not_of(" \t");
    return s.substr(b, e - b + 1);
}

// The address inside optional angle brackets; empty when it is not usable
// (blank, control character, bracket or nothing left).
std::string bareAddress(const std::string& given) {
    std::string a = trimmed(given);
    if (a.size() >= 2 && a.front() == '<' && a.back() == '>') a = a.substr(1, a.size() - 2);
    if (a.empty()) return "";
    for (unsigned char c : a)
        if (c <= ' ' || c == '<' || c == '>' || c == 0x7F || c == ',' || c == ';') return "";
    return a;
}

// The receivers of a ','/';' separated list; false when one is unusable.
bool splitReceivers(const char* list, std::vector<std::string>* out) {
    std::string item;
    for (const char* p = list;; ++p) {
        if (*p == ',' || *p == ';' || *p == '\0') {
            if (!trimmed(item).empty()) {
                std::string a = bareAddress(item);
                if (a.empty() || out->size() >= kMaxReceivers) return false;
                out->push_back(a);
            }
            item.clear();
            if (*p == '\0') break;
        } else {
            item += *p;
        }
    }
    return !out->empty();
}

std::string base64(const std::string& in) {
    static const char k[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string out;
    size_t i = 0;
    for (; i + 2 < in.size(); i += 3) {
        unsigned v = (unsigned char)in[i] << 16 | (unsigned char)in[i + 1] << 8 | (unsigned char)in[i + 2];
        out += k[v >> 18];
        out += k[(v >> 12) & 63];
        out += k[(v >> 6) & 63];
        out += k[v & 63];
    }
    if (i < in.size()) {
        unsigned v = (unsigned char)in[i] << 16 | (i + 1 < in.size() ? (unsigned char)in[i + 1] << 8 : 0);
        out += k[v >> 18];
        out += k[(v >> 12) & 63];
        out += i + 1 < in.size() ? k[(v >> 6) & 63] : '=';
        out += '=';
    }
    return out;
}

// A header value: ASCII as it is, other text as an encoded word.
std::string headerText(const char* s) {
    for (const char* p = s; *p; ++p)
        if (static_cast<unsigned char>(*p) >= 0x80) return "=?UTF-8?B?" + base64(s) + "?=";
    return s;
}

// "Date:" value in the form mail wants, independent of the locale.
std::string dateHeader() {
    static const char* const kDays[] = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
    static const char* const kMonths[] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                          "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
    time_t now = BSS1_Time();
    struct tm t;
    gmtime_r(&now, &t);
    char buf[64];
    snprintf(buf, sizeof buf, "Date: %s, %02d %s %04d %02d:%02d:%02d +0000", kDays[t.tm_wday % 7], t.tm_mday,
             kMonths[t.tm_mon % 12], t.tm_year + 1900, t.tm_hour, t.tm_min, t.tm_sec);
    return buf;
}

// The attachment's file name: quotes and backslashes become '_'.
std::string fileName(const char* title) {
    std::string n = title != nullptr && *title != '\0' ? title : "output.xml";
    for (char& c : n)
        if (c == '"' || c == '\\') c = '_';
    return n;
}

// The URL of the mail server.
bool serverUrl(const char* server, std::string* url) {
    std::string s = trimmed(server);
    if (s.empty()) return false;
    if (s.find("://") == std::string::npos) {
        for (unsigned char c : s)
            if (c <= ' ' || c == '/' || c == '@') return false;
        *url = "smtp://" + s;
        return true;
    }
    if (strncasecmp(s.c_str(), "smtp://", 7) != 0 && strncasecmp(s.c_str(), "smtps://", 8) != 0) return false;
    *url = s;
    return true;
}

struct Mail {
    std::string url;
    std::string from;
    std::vector<std::string> to;
    std::string toHeader;
};

int resultOf(CURLcode cc) {
    switch (cc) {
    case CURLE_OK:
        return KHD_OK;
    case CURLE_COULDNT_RESOLVE_HOST:
    case CURLE_COULDNT_CONNECT:
    case CURLE_OPERATION_TIMEDOUT:
        return KHD_UNREACHABLE;
    case CURLE_OUT_OF_MEMORY:
        return KHD_NOMEM;
    case CURLE_URL_MALFORMAT:
    case CURLE_UNSUPPORTED_PROTOCOL:
        return KHD_BADARG;
    default:
        return KHD_FAILED;
    }
}

// Builds the message on `c` and sends it.
int send(CURL* c, const Mail& m, const char* subject, const char* message, const char* title, const char* data,
         size_t dataLength) {
    struct curl_slist* rcpt = nullptr;
    struct curl_slist* headers = nullptr;
    curl_mime* mime = curl_mime_init(c);
    bool ok = mime != nullptr;
    for (const std::string& r : m.to)
        if (ok) ok = (rcpt = curl_slist_append(rcpt, ("<" + r + ">").c_str())) != nullptr;
    std::vector<std::string> lines = {dateHeader(), "From: <" + m.from + ">", "To: " + m.toHeader};
    if (subject != nullptr && *subject != '\0') lines.push_back("Subject: " + headerText(subject));
    for (const std::string& l : lines)
        if (ok) ok = (headers = curl_slist_append(headers, l.c_str())) != nullptr;
    if (ok && message != nullptr && *message != '\0') {
        curl_mimepart* text = curl_mime_addpart(mime);
        ok = text != nullptr && curl_mime_data(text, message, CURL_ZERO_TERMINATED) == CURLE_OK &&
             curl_mime_type(text, "text/plain; charset=utf-8") == CURLE_OK &&
             curl_mime_encoder(text, "quoted-printable") == CURLE_OK;
    }
    if (ok) {
        curl_mimepart* att = curl_mime_addpart(mime);
        ok = att != nullptr && curl_mime_data(att, data != nullptr ? data : "", data != nullptr ? dataLength : 0) == CURLE_OK &&
             curl_mime_type(att, "text/xml") == CURLE_OK && curl_mime_filename(att, fileName(title).c_str()) == CURLE_OK &&
             curl_mime_encoder(att, "base64") == CURLE_OK;
    }
    int rc = KHD_NOMEM;
    if (ok) {
        curl_easy_setopt(c, CURLOPT_URL, m.url.c_str());
        curl_easy_setopt(c, CURLOPT_PROTOCOLS_STR, "smtp,smtps");
        curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
        curl_easy_setopt(c, CURLOPT_CONNECTTIMEOUT, secondsFromEnv("KHD_CONNECT_TIMEOUT", 5));
        curl_easy_setopt(c, CURLOPT_TIMEOUT, secondsFromEnv("KHD_TIMEOUT", 60));
        curl_easy_setopt(c, CURLOPT_LOW_SPEED_LIMIT, kLowSpeedBytes);
        curl_easy_setopt(c, CURLOPT_LOW_SPEED_TIME, kLowSpeedSeconds);
        curl_easy_setopt(c, CURLOPT_MAIL_FROM, ("<" + m.from + ">").c_str());
        curl_easy_setopt(c, CURLOPT_MAIL_RCPT, rcpt);
        curl_easy_setopt(c, CURLOPT_HTTPHEADER, headers);
        curl_easy_setopt(c, CURLOPT_MIMEPOST, mime);
        CURLcode cc = curl_easy_perform(c);
        rc = resultOf(cc);
        if (rc != KHD_OK)
            RAS1_Printf(RAS1_THIS, __LINE__, "Mail to \"%s\" through \"%s\" failed: %s", m.toHeader.c_str(),
                        m.url.c_str(), curl_easy_strerror(cc));
    }
    curl_mime_free(mime);
    curl_slist_free_all(headers);
    curl_slist_free_all(rcpt);
    return rc;
}

}  // namespace

int KHD_SendMail(int flags, const char* server, const char* receiver, const char* sender, const char* subject,
                 const char* message, const char* title, const char* data, size_t dataLength) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    Mail m;
    int rc = KHD_OK;
    if (flags != 0 || server == nullptr || receiver == nullptr || sender == nullptr || hasLineBreak(subject) ||
        hasLineBreak(title) || !serverUrl(server, &m.url) || !splitReceivers(receiver, &m.to) ||
        (m.from = bareAddress(sender)).empty()) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Mail refused: missing or malformed server, sender, receiver or header text");
        rc = KHD_BADARG;
    }
    for (const std::string& r : m.to) m.toHeader += (m.toHeader.empty() ? "<" : ", <") + r + ">";
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    CURL* c = rc == KHD_OK ? curl_easy_init() : nullptr;
    if (rc == KHD_OK && c == nullptr) rc = KHD_NOMEM;
    if (rc == KHD_OK) {
        if (ras & RAS1_STATE)
            RAS1_Printf(RAS1_THIS, __LINE__, "Mail of %zu bytes to \"%s\" through \"%s\"", dataLength,
                        m.toHeader.c_str(), m.url.c_str());
        rc = send(c, m, subject, message, title, data, dataLength);
    }
    if (c != nullptr) curl_easy_cleanup(c);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
