// kuitext: the text helpers of the support library: name classes, UTF-8
// conversion, trimming, quote escaping and the SITINFO check.
#include <unicode/ucnv.h>
#include <unicode/unistr.h>

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "kshlst.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuitext");

namespace {

// Longest name that is still a short name, in characters.
constexpr int kShortNameChars = 31;
// Longest COUNT value, in digits, so that it stays an integer on the server.
constexpr size_t kMaxCountDigits = 9;

// Decodes the UTF-8 character at p (n bytes left) into *cp and returns its
// length. A byte that does not start a well-formed sequence counts as one
// character of its own value, so malformed input is never read past its end.
size_t decodeUtf8(const unsigned char* p, size_t n, unsigned* cp) {
    unsigned c = p[0];
    size_t len = c < 0x80 ? 1 : (c >> 5) == 6 ? 2 : (c >> 4) == 14 ? 3 : (c >> 3) == 30 ? 4 : 0;
    if (len == 0 || len > n) {
        *cp = c;
        return 1;
    }
    if (len == 1) {
        *cp = c;
        return 1;
    }
    unsigned v = c & (0x7F >> len);
    for (size_t i = 1; i < len; i++) {
        if ((p[i] & 0xC0) != 0x80) {
            *cp = c;
            return 1;
        }
        v = (v << 6) | (p[i] & 0x3F);
    }
    *cp = v;
    return len;
}

// Counts the characters of `text` and whether one lies outside Latin-1.
void classify(const char* text, int* chars, bool* nonLatin) {
    *chars = 0;
    *nonLatin = false;
    if (!text) return;
    const unsigned char* p = reinterpret_cast<const unsigned char*>(text);
    size_t n = strlen(text);
    while (n > 0) {
        unsigned cp;
        size_t len = decodeUtf8(p, n, &cp);
        if (cp > 0xFF) *nonLatin = true;
        ++*chars;
        p += len;
        n -= len;
    }
}

bool isBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }

std::string trimmed(const std::string& s) {
    size_t b = 0, e = s.size();
    while (b < e && isBlank(s[b])) b++;
    while (e > b && isBlank(s[e - 1])) e--;
    return s.substr(b, e - b);
}

std::vector<std::string> split(const std::string& s, char sep) {
    std::vector<std::string> parts;
    size_t pos = 0;
    for (;;) {
        size_t at = s.find(sep, pos);
        parts.push_back(s.substr(pos, at == std::string::npos ? std::string::npos : at - pos));
        if (at == std::string::npos) break;
        pos = at + 1;
    }
    return parts;
}

bool equalsNoCase(const std::string& a, const char* b) { return strcasecmp(a.c_str(), b) == 0; }

// --- SITINFO item rules. Each normalises `value` in place; false refuses it.

const char* const kSeverities[] = {"Fatal", "Critical", "Minor", "Warning", "Harmless", "Informational", "Unknown"};

bool checkSeverity(std::string& value, LinkedList*) {
    for (const char* s : kSeverities)
        if (equalsNoCase(value, s)) {
            value = s;
            return true;
        }
    return false;
}

bool checkForwarding(std::string& value, LinkedList*) {
    if (value.size() != 1 || (toupper((unsigned char)value[0]) != 'Y' && toupper((unsigned char)value[0]) != 'N'))
        return false;
    value[0] = (char)toupper((unsigned char)value[0]);
    return true;
}

bool knownDestination(LinkedList* list, const std::string& id) {
    LinkedListIter it(list);
    for (void* v = it.Next(); v; v = it.Next())
        if (id == static_cast<const char*>(v)) return true;
    return false;
}

bool checkDestinations(std::string& value, LinkedList* list) {
    std::string out;
    for (const std::string& part : split(value, ',')) {
        std::string id = trimmed(part);
        if (id.empty()) continue;
        if (!knownDestination(list, id)) return false;
        if (!out.empty()) out += ",";
        out += id;
    }
    if (out.empty()) return false;
    value = out;
    return true;
}

bool identifier(const std::string& s) {
    if (s.empty() || !isalpha((unsigned char)s[0])) return false;
    for (char c : s)
        if (!isalnum((unsigned char)c) && c != '_') return false;
    return true;
}

bool checkAtom(std::string& value, LinkedList*) {
    size_t dot = value.find('.');
    if (dot == std::string::npos) return identifier(value);
    return identifier(value.substr(0, dot)) && identifier(value.substr(dot + 1));
}

bool checkCount(std::string& value, LinkedList*) {
    if (value.empty()) return false;
    for (char c : value)
        if (!isdigit((unsigned char)c)) return false;
    size_t first = value.find_first_not_of('0');
    if (first == std::string::npos) return false;  // zero is not positive
    std::string digits = value.substr(first);
    if (digits.size() > kMaxCountDigits) return false;
    value = digits;
    return true;
}

struct SitinfoRule {
    const char* key;
    bool (*check)(std::string& value, LinkedList* destinations);
    int failure;  // result of validateVEC when the check refuses
};

const SitinfoRule kRules[] = {
    {"SEV", checkSeverity, 1},  {"TFWD", checkForwarding, 2}, {"TDST", checkDestinations, 3},
    {"ATOM", checkAtom, 4},     {"COUNT", checkCount, 5},
};

// Normalises one item into *out (followed by ";"); returns 0 or its failure.
int normaliseItem(const std::string& item, LinkedList* destinations, std::vector<std::string>* seen,
                  std::string* out) {
    size_t eq = item.find('=');
    if (eq == std::string::npos) return 6;
    std::string key = trimmed(item.substr(0, eq));
    std::string value = trimmed(item.substr(eq + 1));
    if (key.empty()) return 6;
    for (const std::string& k : *seen)
        if (equalsNoCase(k, key.c_str())) return 6;
    seen->push_back(key);
    for (const SitinfoRule& r : kRules) {
        if (!equalsNoCase(key, r.key)) continue;
        // Without known destinations the event integration facility is off:
        // the destination is dropped, not refused.
        if (r.check == checkDestinations && (!destinations || destinations->NumEntries() == 0)) return 0;
        if (!r.check(value, destinations)) return r.failure;
        key = r.key;
        break;
    }
    *out += key + "=" + value + ";";
    return 0;
}

}  // namespace

int isLongName(const char* name) {
    int chars;
    bool nonLatin;
    classify(name, &chars, &nonLatin);
    return (nonLatin || chars > kShortNameChars) ? 1 : 0;
}

int hasNonLatin(const char* text) {
    int chars;
    bool nonLatin;
    classify(text, &chars, &nonLatin);
    return nonLatin ? 1 : 0;
}

char* convertToUTF8(const char* text) {
    if (!text) return nullptr;
    // The default converter follows the process's code page (and a name set
    // with ucnv_setDefaultName), as the command's own conversions do.
    UErrorCode status = U_ZERO_ERROR;
    UConverter* conv = ucnv_open(nullptr, &status);
    std::string utf8;
    if (U_SUCCESS(status)) {
        int32_t n = (int32_t)strlen(text);
        std::vector<UChar> wide((size_t)n + 1);
        int32_t units = ucnv_toUChars(conv, wide.data(), n + 1, text, n, &status);
        if (U_SUCCESS(status)) icu::UnicodeString(wide.data(), units).toUTF8String(utf8);
        ucnv_close(conv);
    }
    if (U_FAILURE(status)) utf8 = text;  // no converter: the bytes as they are
    char* copy = new char[utf8.size() + 1];
    memcpy(copy, utf8.c_str(), utf8.size() + 1);
    return copy;
}

void trimTheString(char** text) {
    if (!text || !*text) return;
    char* s = *text;
    while (isBlank(*s)) s++;
    size_t n = strlen(s);
    while (n > 0 && isBlank(s[n - 1])) s[--n] = '\0';
    *text = s;
}

void escapeDoubleQuotes(char** text, int) {
    if (!text || !*text) return;
    const char* s = *text;
    size_t n = strlen(s), quotes = 0;
    for (size_t i = 0; i < n; i++)
        if (s[i] == '"') quotes++;
    char* copy = new char[n + quotes + 1];
    char* d = copy;
    for (size_t i = 0; i < n; i++) {
        *d++ = s[i];
        if (s[i] == '"') *d++ = '"';
    }
    *d = '\0';
    delete[] *text;
    *text = copy;
}

int validateVEC(const char* sitinfo, LinkedList* destinations, char** out) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (!sitinfo || !out || !*out) {
        RAS1_EXIT_RC(ras, 6);
        return 6;
    }
    std::string normal;
    std::vector<std::string> seen;
    int rc = 0;
    for (const std::string& item : split(sitinfo, ';')) {
        if (trimmed(item).empty()) continue;
        rc = normaliseItem(item, destinations, &seen, &normal);
        if (rc) {
            RAS1_TRACE_IF(ras, RAS1_STATE, "SITINFO item [%s] refused (%d)", item.c_str(), rc);
            break;
        }
    }
    // An invalid text is handed back as it came; a valid one is never longer
    // than its input plus the final ";", so both fit the caller's buffer.
    const std::string& result = rc ? std::string(sitinfo) : normal;
    memcpy(*out, result.c_str(), result.size() + 1);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
