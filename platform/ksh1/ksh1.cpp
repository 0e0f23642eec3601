// ksh1: SOAP posts over libcurl (see ksh1.h).
#include "ksh1/ksh1.h"

#include <curl/curl.h>
#include <strings.h>

#include <cstdlib>
#include <cstring>
#include <mutex>

#include "bss1/bss1.h"
#include "ras1/ras1.h"

RAS1_UNIT("ksh1");

namespace {

constexpr size_t kMaxResponse = 64u * 1024u * 1024u;
constexpr long kLowSpeedBytes = 1;
constexpr long kLowSpeedSeconds = 30;

// One easy handle per thread, kept between calls so that its connection
// stays open; cleaned up when the thread ends.
struct ThreadHandle {
    CURL* curl = nullptr;
    long lastStatus = 0;
    ~ThreadHandle() {
        if (curl != nullptr) curl_easy_cleanup(curl);
    }
};
thread_local ThreadHandle tHandle;

CURL* threadCurl() {
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    if (tHandle.curl == nullptr) tHandle.curl = curl_easy_init();
    else curl_easy_reset(tHandle.curl);
    return tHandle.curl;
}

long secondsFromEnv(const char* name, long dflt) {
    const char* v = BSS1_GetEnv(name, nullptr);
    if (v == nullptr) return dflt;
    char* end = nullptr;
    long n = strtol(v, &end, 10);
    return end != v && *end == '\0' && n > 0 ? n : dflt;
}

// The answer being collected.
struct Sink {
    char* data = nullptr;
    size_t length = 0;
    size_t capacity = 0;
    bool tooLarge = false;
    bool noMemory = false;
};

size_t collect(char* bytes, size_t size, size_t count, void* user) {
    auto* s = static_cast<Sink*>(user);
    size_t n = size * count;
    if (s->length + n > kMaxResponse) {
        s->tooLarge = true;
        return 0;  // makes the transfer fail
    }
    if (s->length + n + 1 > s->capacity) {
        size_t want = s->capacity ? s->capacity : 4096;
        while (want < s->length + n + 1) want *= 2;
        char* grown = static_cast<char*>(realloc(s->data, want));
        if (grown == nullptr) {
            s->noMemory = true;
            return 0;
        }
        s->data = grown;
        s->capacity = want;
    }
    memcpy(s->data + s->length, bytes, n);
    s->length += n;
    s->data[s->length] = '\0';
    return n;
}

bool httpUrl(const char* endpoint) {
    return strncasecmp(endpoint, "http://", 7) == 0 || strncasecmp(endpoint, "https://", 8) == 0;
}

// The layer's result for a finished transfer.
int resultOf(CURLcode cc, long status, const Sink& sink) {
    if (sink.noMemory || sink.tooLarge) return KSH1_NOMEM;
    switch (cc) {
    case CURLE_OK:
        return status >= 400 ? KSH1_HTTPERROR : KSH1_OK;
    case CURLE_COULDNT_RESOLVE_HOST:
    case CURLE_COULDNT_RESOLVE_PROXY:
    case CURLE_COULDNT_CONNECT:
    case CURLE_OPERATION_TIMEDOUT:
        return KSH1_UNREACHABLE;
    case CURLE_UNSUPPORTED_PROTOCOL:
    case CURLE_URL_MALFORMAT:
        return KSH1_HTTPERROR;
    case CURLE_OUT_OF_MEMORY:
        return KSH1_NOMEM;
    default:
        return KSH1_FAILED;
    }
}

int post(CURL* c, const char* endpoint, const char* text, unsigned long length, unsigned options, Sink* sink,
         long* status) {
    struct curl_slist* headers = nullptr;
    const bool soap = (options & KSH1_SOAP11) != 0;
    headers = curl_slist_append(headers, soap ? "Content-Type: text/xml; charset=utf-8" : "Content-Type: application/xml");
    if (headers != nullptr && soap) headers = curl_slist_append(headers, "SOAPAction: \"\"");
    if (headers == nullptr) return KSH1_NOMEM;
    curl_easy_setopt(c, CURLOPT_URL, endpoint);
    curl_easy_setopt(c, CURLOPT_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(c, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(c, CURLOPT_FOLLOWLOCATION, 0L);
    curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(c, CURLOPT_CONNECTTIMEOUT, secondsFromEnv("KSH1_CONNECT_TIMEOUT", 5));
    curl_easy_setopt(c, CURLOPT_TIMEOUT, secondsFromEnv("KSH1_TIMEOUT", 60));
    curl_easy_setopt(c, CURLOPT_LOW_SPEED_LIMIT, kLowSpeedBytes);
    curl_easy_setopt(c, CURLOPT_LOW_SPEED_TIME, kLowSpeedSeconds);
    curl_easy_setopt(c, CURLOPT_POST, 1L);
    curl_easy_setopt(c, CURLOPT_POSTFIELDS, text);
    curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(length));
    curl_easy_setopt(c, CURLOPT_HTTPHEADER, headers);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, sink);
    CURLcode cc = curl_easy_perform(c);
    curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, status);
    curl_easy_setopt(c, CURLOPT_HTTPHEADER, nullptr);
    curl_slist_free_all(headers);
    int rc = resultOf(cc, *status, *sink);
    if (rc != KSH1_OK)
        RAS1_Printf(RAS1_THIS, __LINE__, "SOAP post to \"%s\" failed: %s, HTTP status %ld, result %d", endpoint,
                    curl_easy_strerror(cc), *status, rc);
    return rc;
}

}  // namespace

int KSH1_SoapRequest(const char* endpoint, const char* text, unsigned long length, char** response,
                     unsigned long* responseLength, unsigned options) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = KSH1_OK;
    tHandle.lastStatus = 0;
    if (endpoint == nullptr || text == nullptr || response == nullptr || responseLength == nullptr ||
        (options & ~static_cast<unsigned>(KSH1_SOAP11)) != 0) {
        rc = KSH1_BADARG;
    } else if (!httpUrl(endpoint)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Endpoint \"%s\" is not an http or https URL", endpoint);
        rc = KSH1_HTTPERROR;
    }
    CURL* c = rc == KSH1_OK ? threadCurl() : nullptr;
    if (rc == KSH1_OK && c == nullptr) rc = KSH1_NOMEM;
    Sink sink;
    if (rc == KSH1_OK) {
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "POST %lu bytes to \"%s\"", length, endpoint);
        rc = post(c, endpoint, text, length, options, &sink, &tHandle.lastStatus);
    }
    if (rc == KSH1_OK && sink.data == nullptr) {  // an empty answer is an empty text
        sink.data = static_cast<char*>(calloc(1, 1));
        if (sink.data == nullptr) rc = KSH1_NOMEM;
    }
    if (rc == KSH1_OK) {
        *response = sink.data;
        *responseLength = sink.length;
        sink.data = nullptr;
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Answer of %zu bytes, HTTP status %ld", sink.length, tHandle.lastStatus);
    }
    free(sink.data);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

long KSH1_LastHttpStatus() { return tHandle.lastStatus; }
