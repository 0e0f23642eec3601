// Fuzzes the query-string split, URL decoding and XML escaping of the
// request object: nothing may be read or written outside the text, items
// point into it, and the escaped text matches a plain reference.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "kshhttp.h"

namespace {

void check(bool ok) {
    if (!ok) abort();
}

std::string referenceEscape(const char* s) {
    std::string out;
    for (; *s; s++) {
        switch (*s) {
        case '"': out += "&quot;"; break;
        case '&': out += "&amp;"; break;
        case '\'': out += "&apos;"; break;
        case '<': out += "&lt;"; break;
        case '>': out += "&gt;"; break;
        default: out += *s;
        }
    }
    return out;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size == 0) return 0;
    int max = data[0] % (WSQL_MAX_QUERY_ITEMS + 2);
    // An allocation of exactly the text and its NUL, so any overrun is seen.
    size_t n = size - 1;
    char* text = static_cast<char*>(malloc(n + 1));
    memcpy(text, data + 1, n);
    text[n] = '\0';
    size_t len = strlen(text);

    char* copy = static_cast<char*>(malloc(len + 1));
    memcpy(copy, text, len + 1);
    WSQL_QueryItem items[WSQL_MAX_QUERY_ITEMS + 2];
    int count = WSQL_ParseQueryString(copy, items, max);
    check(count >= 0 && count <= max);
    for (int i = 0; i < count; i++) {
        check(items[i].name >= copy && items[i].name <= copy + len);
        check(items[i].value >= copy && items[i].value <= copy + len);
        check(strchr(items[i].name, '&') == nullptr && strchr(items[i].name, '=') == nullptr);
    }

    char* url = static_cast<char*>(malloc(len + 1));
    memcpy(url, text, len + 1);
    WSQL_UnescapeURL(url);
    check(strlen(url) <= len);

    WSQL_ResponseBuffer small(8);
    check(small.appendEscaped(text) == 0);
    check(std::string(small.getBuffer(), small.getLength()) == referenceEscape(text));
    check(small.getLength() <= small.getMaxLength());

    free(url);
    free(copy);
    free(text);
    return 0;
}
