// kuishort: base short names, short-name generation and the uniqueness check.
#include "kuishort.h"

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "kuisql.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuishort");

namespace {

constexpr size_t kShortBytes = 31;   // longest short name
constexpr size_t kPrefixBytes = 15;  // prefix before the identifier
constexpr size_t kImportAffinity = 16;
// Identifiers are unique, so a free name turns up at the first try unless
// the server answers wrongly; a server that calls every name taken must not
// keep the command looping for ever.
constexpr int kMaxAttempts = 100;

// Bytes of the UTF-8 character starting with `lead` (1 for a stray byte).
size_t charBytes(unsigned char lead) {
    if (lead < 0xC0) return 1;
    if (lead < 0xE0) return 2;
    if (lead < 0xF0) return 3;
    return 4;
}

// The first `max` bytes of `s`, never ending inside a character.
std::string cutAtCharacter(const char* s, size_t max) {
    size_t n = 0, len = strlen(s);
    while (n < len) {
        size_t c = charBytes((unsigned char)s[n]);
        if (n + c > max || n + c > len) break;
        n += c;
    }
    return std::string(s, n);
}

bool startsBadly(const std::string& s) { return !s.empty() && (s[0] == '_' || isdigit((unsigned char)s[0])); }

// Prefixes "Z": inserted when the name has at most 30 bytes, else it
// replaces the first character.
void prefixZ(std::string& s, size_t len) {
    if (len <= kShortBytes - 1) s.insert(0, "Z");
    else s[0] = 'Z';
}

// The 15-byte prefix: the candidate's characters, white space and positions
// past `len` as "_". A character that would not fit whole is replaced by
// "_" for its bytes, so the prefix is always valid UTF-8.
std::string namePrefix(const std::string& candidate, size_t len) {
    std::string prefix;
    size_t i = 0;
    while (prefix.size() < kPrefixBytes) {
        if (i >= len || i >= candidate.size()) {
            prefix += '_';
            i++;
            continue;
        }
        size_t c = charBytes((unsigned char)candidate[i]);
        if (prefix.size() + c > kPrefixBytes || i + c > candidate.size()) {
            prefix.append(kPrefixBytes - prefix.size(), '_');
            break;
        }
        if (isspace((unsigned char)candidate[i])) prefix += '_';
        else prefix.append(candidate, i, c);
        i += c;
    }
    return prefix;
}

// The affinity text made into a 15-byte prefix: letters and digits kept,
// everything else "_", padded with "_"; an empty text gives zeros.
std::string affinityPrefix(const char* text) {
    if (!*text) return std::string(kPrefixBytes, '0');
    std::string p;
    for (size_t i = 0; i < kPrefixBytes; i++) {
        unsigned char c = i < strlen(text) ? (unsigned char)text[i] : '_';
        p += (c < 0x80 && isalnum(c)) ? (char)c : '_';
    }
    return p;
}

const char* valueOfColumn(const char* column) {
    for (int e = 0; elementArray && e < arrayCount; e++)
        if (strcmp(elementArray[e], column) == 0) return valueArray[e];
    return "";
}

// Stage 3 of generation: prefix plus identifier until the name is free.
int uniqueName(std::string name, char* out, void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    char id[KUI_UUID_SIZE];
    getUUID(id);
    name = name.substr(0, kPrefixBytes) + id;
    if (startsBadly(name)) prefixZ(name, name.size());
    KUI_TRACE_DETAIL(ras, "Generated Short name is [%s]", name.c_str());
    for (int attempt = 1;; attempt++) {
        snprintf(out, kShortBytes + 1, "%s", name.c_str());
        int rc = checkShortNameValidity(ctx, msgBuf, respSlot, out);
        if (rc == 0 || rc == KUIR_COMM || rc == KUIR_SERVER || rc == KUIR_INTERNAL) return rc;
        if (attempt >= kMaxAttempts) {
            errCode = KUIE_INTERNAL;
            KUI_TRACE_ERROR(ras, "Internal error occurred while generating a short name: %d names were all taken",
                            attempt);
            return KUIR_INTERNAL;
        }
        getUUID(id);
        name = name.substr(0, kPrefixBytes) + std::string(id, 16);
    }
}

}  // namespace

int determineShortname(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    if (isLongName(baseSitName)) {
        char shortName[KUI_SHORTNAME_SIZE] = "";
        rc = getSitNamefromTNAME(ctx, msgBuf, respSlot, baseSitName, shortName);
        if (rc == 0 && shortName[0]) {
            kuiReplace(basesitShortName, shortName);
            KUI_TRACE_DETAIL(ras, "Short name for baseSitName [%s] :", basesitShortName);
        } else if (!KUI_QUERY_FAILED(ras, rc,
                                     "Server exception occurred while checking whether the base situation name already "
                                     "exist on the server",
                                     "Communication error occurred, SOAP query failed while checking whether the base "
                                     "situation name already exist in the server",
                                     "Internal error occurred while checking whether the base situation name already "
                                     "exist in the server")) {
            rc = KUIR_ABSENT;
            errCode = KUIE_NOSUCHBASE;
            KUI_TRACE_ERROR(ras, "Base situation [%s] specified does not exist on the server", kuiText(baseSitName));
        }
    } else {
        kuiReplace(basesitShortName, baseSitName);
    }
    if (rc == 0 && isLongName(sitName)) {
        kuiReplace(longSitName, sitName);
        char generated[KUI_GEN_NAME_SIZE] = "";
        rc = generateShortName(generated, ctx, msgBuf, respSlot);
        if (rc == 0) kuiReplace(sitName, generated);
        longNameExist = 1;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int generateShortName(char* out, void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    out[0] = '\0';
    // The short name is a key of at most 31 bytes: the long name is cut
    // there, at a character boundary.
    std::string candidate = cutAtCharacter(kuiText(longSitName), kShortBytes);
    size_t len = candidate.size();
    int rc = 0;
    bool readable = !hasNonLatin(candidate.c_str());
    if (readable) {
        if (candidate.find(' ') != std::string::npos)
            for (char& c : candidate)
                if (isspace((unsigned char)c)) c = '_';
        size_t end = candidate.size();
        while (end > 1 && candidate[end - 1] == '_') end--;
        if (end < candidate.size()) {
            candidate.resize(end);
            len = end;
        }
        if (startsBadly(candidate)) prefixZ(candidate, len);
        rc = checkShortNameValidity(ctx, msgBuf, respSlot, candidate.c_str());
        if (rc == 0) {
            snprintf(out, kShortBytes + 1, "%s", candidate.c_str());
            KUI_TRACE_DETAIL(ras, "Generated Short name is [%s]", out);
            RAS1_EXIT_RC(ras, 0);
            return 0;
        }
        if (rc != KUIR_TAKEN) {
            RAS1_EXIT_RC(ras, rc);
            return rc;
        }
        rc = 0;
    }
    std::string prefix = namePrefix(candidate, len);
    if (hasNonLatin(prefix.c_str())) {
        char affinity[KUI_AFFINITY_SIZE] = "";
        rc = fillAffintiyCharforShortName(affinity, ctx, msgBuf, respSlot);
        if (rc == 0) prefix = affinityPrefix(affinity);
    }
    if (rc == 0) rc = uniqueName(prefix, out, ctx, msgBuf, respSlot);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int checkShortNameValidity(void* ctx, char* msgBuf, char** respSlot, const char* name) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char found[KUI_SHORTNAME_SIZE] = "";
    int rc = getSitNamefromTNAME(ctx, msgBuf, respSlot, name, found);
    if (rc == 0 && found[0]) {
        rc = KUIR_TAKEN;
        KUI_TRACE_DETAIL(ras, "[%s] already exists as a Full name. Hence it cannot be a shortname :", name);
    } else if (!KUI_QUERY_FAILED(ras, rc,
                                 "Server exception occurred while checking whether the name exists as full name in "
                                 "TNAME table",
                                 "Communication error occurred, SOAP query failed while checking whether the name "
                                 "exists as full name in TNAME table",
                                 "Internal error occurred while while checking whether the name exists as full name in "
                                 "TNAME table")) {
        rc = 0;
        KUI_TRACE_DETAIL(ras, "Name specified does not exist in TNAME [%s] table", name);
    }
    if (rc == 0) {
        rc = checkSitExistsinTSITDESC(ctx, msgBuf, respSlot, name);
        if (rc == 0) {
            rc = KUIR_TAKEN;
            KUI_TRACE_DETAIL(ras, "Name exists in TSITDESC [%s] :", name);
        } else if (rc == KUIR_ABSENT) {
            rc = 0;
            KUI_TRACE_DETAIL(ras, "Name [%s] is unique. Can be used as short name", name);
        } else {
            // Any other failure of the look-up counts as an internal error.
            KUI_QUERY_FAILED(ras, (rc == KUIR_SERVER || rc == KUIR_COMM) ? rc : KUIR_INTERNAL,
                             "Server Exception error occurred while checking the sitname already exist in the server",
                             "Communication error occurred while checking the sitname already exist in the server",
                             nullptr);
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int fillAffintiyCharforShortName(char* out, void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    out[0] = '\0';
    if (sitFilePresent) {
        const char* affinity = valueOfColumn("AFFINITIES");
        if (*affinity) {
            snprintf(out, kImportAffinity + 1, "%s", affinity);
            KUI_TRACE_DETAIL(ras, "The affinity string: %s ", out);
        }
        RAS1_EXIT_RC(ras, 0);
        return 0;
    }
    KUI_Statement st(msgBuf);
    st.add("SELECT AFFINITIES FROM O4SRV.TSITDESC WHERE SITNAME = \"").addQuotedOutsideCdata(basesitShortName).add("\"");
    KUI_TRACE_DETAIL(ras, "Select request to retrieve the affinity string for filling the shortname is :[%s]", st.text());
    char* reply = nullptr;
    rc = kuiSend(ctx, st, &reply);
    if (rc == KUIR_COMM) {
        errCode = KUIE_COMM;
        KUI_TRACE_ERROR(ras, "Communication error occurred while retrieving the affinity string");
    } else if (rc == 0 && strstr(reply, "ROW")) {
        char** values = nullptr;
        int count = 0;
        int prc = parseSoapResponseIntoArray(reply, &count, 1, &values);
        if (prc != 0) {
            KUI_TRACE_ERROR(ras, "parseSoapResponseIntoArray failed, retCode = [%d]", prc);
            rc = KUIR_INTERNAL;
            errCode = KUIE_INTERNAL;
        } else {
            snprintf(out, KUI_AFFINITY_SIZE, "%s", values[0]);
            KUI_TRACE_DETAIL(ras, "The affinity string: %s ", out);
        }
        releaseSoapResponseArray(values, count);
    } else if (rc == 0 && strstr(reply, "</TABLE>")) {
        KUI_TRACE_ERROR(ras, "The Base Situation [%s] does not exist on the VEMS, invalid base situation",
                        kuiText(basesitShortName));
        rc = KUIR_ABSENT;
        errCode = KUIE_NOSUCHBASE;
    } else if (rc == 0) {
        KUI_TRACE_ERROR(ras, "Server exception error occurred while retrieving the affinity string");
        rc = KUIR_SERVER;
        errCode = KUIE_SERVER;
    }
    free(reply);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
