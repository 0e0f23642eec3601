// kshaffin: affinity entries looked up in the platform's table and written
// as XML (see kshaffin.h).
#include "kshaffin.h"

#include <cstdio>
#include <cstring>

#include "aff1/aff1.h"
#include "kshhttp.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshaffin");

WSQL_AffinityRequest::WSQL_AffinityRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document)
    : WSQL_MetaRequest(hub, http, document),
      id(nullptr),
      idLength(0),
      text(nullptr),
      textLength(0),
      product(nullptr),
      productLength(0),
      resid(nullptr),
      residLength(0),
      subset(0),
      lookupResult(WSQL_OK) {}

int WSQL_AffinityRequest::parseXML() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    static const struct {
        const char* tag;
        int (WSQL_AffinityRequest::*check)();
    } kKeys[] = {
        {"id", &WSQL_AffinityRequest::processID},
        {"product", &WSQL_AffinityRequest::processProduct},
        {"text", &WSQL_AffinityRequest::processText},
        {"resid", &WSQL_AffinityRequest::processResid},
    };
    int rc = WSQL_NOTHING;
    bool found = false;
    for (const auto& k : kKeys) {
        if (document->testElement(k.tag) != WSQL_OK) continue;
        found = true;
        rc = (this->*k.check)();
        break;
    }
    if (!found) getHttp()->setRequestError(true, "Specify id, product, resid or text", nullptr, 0);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_AffinityRequest::readKey(const char* tag, char** value, uint32_t* length, const char* missing,
                                  const char* what) {
    int ras = RAS1_Sync(RAS1_THIS);
    unsigned n = 0;
    if (document->getElementValue(tag, value, &n) != WSQL_OK) {
        *value = nullptr;
        getHttp()->setRequestError(true, missing, nullptr, 0);
        return WSQL_NOTHING;
    }
    *length = n;
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "CT_Affinity - Retrieving data for %s = %s", what, *value);
    return WSQL_OK;
}

int WSQL_AffinityRequest::processID() {
    int rc = readKey("id", &id, &idLength, "Unable to retrieve id.", "id");
    char* match = nullptr;
    // readKey left the id element as the current node.
    if (rc == WSQL_OK && document->getAttribute("match", &match) == WSQL_OK) {
        int ras = RAS1_Sync(RAS1_THIS);
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "match = %s", match);
        if (WSQL_CaseCompare(match, "subset") == 0) subset = 1;
    }
    return rc;
}

int WSQL_AffinityRequest::processProduct() {
    return readKey("product", &product, &productLength, "Unable to retrieve product.", "product");
}

int WSQL_AffinityRequest::processText() {
    return readKey("text", &text, &textLength, "Unable to retrieve text.", "text");
}

int WSQL_AffinityRequest::processResid() {
    return readKey("resid", &resid, &residLength, "Unable to retrieve resource id.", "resource id");
}

void WSQL_AffinityRequest::writeEntry(const AFF1_Entry* e) {
    WSQL_HttpServer* http = getHttp();
    // {tag, value, written even when empty}
    const struct {
        const char* tag;
        const char* value;
        bool always;
    } kFields[] = {
        {"STATIC", e->staticAffinity, false}, {"DYNAMIC", e->dynamicAffinity, false}, {"TEXT", e->text, true},
        {"PRODUCT", e->product, true},        {"RESID", e->resid, false},
    };
    (void)http->append("<AFFINITY>");
    char tag[16];
    for (const auto& f : kFields) {
        if (!f.always && f.value[0] == '\0') continue;
        snprintf(tag, sizeof tag, "<%s>", f.tag);
        (void)http->append(tag);
        (void)http->appendText(f.value);
        snprintf(tag, sizeof tag, "</%s>", f.tag);
        (void)http->append(tag);
    }
    (void)http->append("</AFFINITY>\n");
}

int WSQL_AffinityRequest::lookUp() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    WSQL_HttpServer* http = getHttp();
    int keys = (id != nullptr) + (product != nullptr) + (text != nullptr) + (resid != nullptr);
    // The key that was read, its look-up kind and whether it asks for an
    // array of entries.
    const char* key = id ? id : product ? product : text ? text : resid;
    uint32_t keyLength = id ? idLength : product ? productLength : text ? textLength : residLength;
    const char* what = id ? "id" : product ? "product" : text ? "text" : "resource id";
    int kind = id ? AFF1_BY_AFFINITY : product ? AFF1_BY_PRODUCT : text ? AFF1_BY_TEXT : AFF1_BY_RESID;
    bool many = product != nullptr || (id != nullptr && subset != 0);
    int rc = WSQL_OK;
    if (keys > 1) {
        http->setRequestError(true, "Too many operations specified.", nullptr, 0);
        rc = 1;
    } else if (keys == 0) {
        rc = WSQL_NOTHING;
    } else if (many) {
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "CT_Affinity - Retrieving affinity for %s =  %s", what, key);
        AFF1_EntryArray* array = nullptr;
        rc = AFF1_GetEntries(kind, key, keyLength, &array);
        if (rc == AFF1_OK && array->count > 0) {
            (void)http->append("\n<DATA>\n");
            for (int i = 0; i < array->count; i++) writeEntry(AFF1_EntryAt(array, i));
            (void)http->append("</DATA>\n");
        }
        AFF1_FreeEntryArray(array);
    } else {
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "CT_Affinity - Retrieving affinity for %s =  %s", what, key);
        AFF1_Entry entry;
        rc = AFF1_GetEntry(kind, key, keyLength, &entry);
        if (rc == AFF1_OK) {
            (void)http->append("\n<DATA>\n");
            writeEntry(&entry);
            (void)http->append("</DATA>\n");
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// The entries go between the prefix and the suffix of the output, so the
// look-up runs here, before the base appends the suffix.
int WSQL_AffinityRequest::finishOutput() {
    lookupResult = lookUp();
    return WSQL_MetaRequest::finishOutput();
}

int WSQL_AffinityRequest::processResults() { return lookupResult; }
