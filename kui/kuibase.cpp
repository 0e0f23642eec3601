// kuibase: the base-situation path: name checks by server version, reading
// the base row and distribution, merging the properties, and the writes.
#include "kuibase.h"

#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "kshxmlxp.h"
#include "kuiimport.h"
#include "kuiinsert.h"
#include "kuishort.h"
#include "kuisql.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuibase");

namespace {

const char kBaseColumns[] =
    "SELECT ADVISE,AFFINITIES,ALERTLIST,AUTOSOPT,AUTOSTART,CMD,DESTNODE,HUB,LOCFLAG,LSTCCSID,LSTDATE,LSTRELEASE,"
    "LSTUSRPRF,NOTIFYARGS,NOTIFYOPTS,OBJECTLOCK,PDT,PRNAMES,QIBSCOPE,REEV_DAYS,REEV_TIME,REFLEXOK,SENDMSGQ,SITINFO,"
    "SITNAME,SOURCE,TEXT FROM O4SRV.TSITDESC WHERE SITNAME =";

int internalError(const char* text, int status) {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_ERROR(ras, text, status);
    errCode = KUIE_INTERNAL;
    return KUIR_INTERNAL;
}

// Step 1: the base's short name, by server version.
int baseShortName(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!kuiOldServer()) return determineShortname(ctx, msgBuf, respSlot);
    if (isLongName(sitName)) {
        KUI_TRACE_ERROR(ras, "Situation Name has non-latin characters or exceeds maximum allowed length 31 chars, which "
                             "is only allowed in the VEMS version 6.21 and above");
        errCode = KUIE_OLDSITNAME;
        return KUIR_ABSENT;
    }
    if (isLongName(baseSitName)) {
        KUI_TRACE_ERROR(ras, "Base Situation Name has non-latin characters or exceeds maximum allowed length 31 chars, "
                             "which is only allowed in the VEMS version 6.21 and above");
        errCode = KUIE_OLDBASENAME;
        return KUIR_ABSENT;
    }
    kuiReplace(basesitShortName, baseSitName);
    return 0;
}

// A new server also knows the base by its full name.
int baseByFullName(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_ERROR(ras, "situation [%s] specified does not exist into TSITDESC, check also TNAME table",
                    kuiText(basesitShortName));
    char shortName[KUI_SHORTNAME_SIZE] = "";
    int rc = getSitNamefromTNAME(ctx, msgBuf, respSlot, basesitShortName, shortName);
    if (rc == 0 && shortName[0]) {
        KUI_TRACE_DETAIL(ras, "Base situation name specified exists [%s] :", shortName);
        kuiReplace(basesitShortName, shortName);
        return 0;
    }
    if (!KUI_QUERY_FAILED(ras, rc,
                          "Server exception occurred while checking whether the base situation exists as full name on "
                          "the server",
                          "Communication error occurred, SOAP query failed while checking whether the base situation "
                          "exists as full name in the server",
                          "Internal error occurred while checking whether the base situation exists as full name in "
                          "the server")) {
        rc = KUIR_ABSENT;
        KUI_TRACE_ERROR(ras, "Base situation name specified does not exist [%s]:", kuiText(baseSitName));
        errCode = KUIE_NOSUCHBASE;
    }
    return rc;
}

// Step 2: the base must exist.
int baseExists(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = checkSitExistsinTSITDESC(ctx, msgBuf, respSlot, basesitShortName);
    if (rc == KUIR_ABSENT && kuiOldServer()) {
        KUI_TRACE_ERROR(ras, "Base situation name specified does not exist [%s]:", kuiText(baseSitName));
        errCode = KUIE_NOSUCHBASE;
    } else if (rc == KUIR_ABSENT) {
        rc = baseByFullName(ctx, msgBuf, respSlot);
    } else if (rc == KUIR_SERVER || rc == KUIR_COMM) {
        KUI_QUERY_FAILED(ras, rc,
                         "Server exception occurred while checking whether the base situation already exist on the "
                         "server",
                         "Communication error occurred, SOAP query failed while checking whether the base situation "
                         "already exist in the server",
                         nullptr);
    } else {
        KUI_TRACE_DETAIL(ras, "Base situation name specified exists [%s] :", kuiText(basesitShortName));
        if (rc != 0) errCode = KUIE_INTERNAL;
    }
    return rc;
}

int longNameFree(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    char shortName[KUI_SHORTNAME_SIZE] = "";
    int rc = getSitNamefromTNAME(ctx, msgBuf, respSlot, longSitName, shortName);
    if (rc == 0 && shortName[0]) {
        duplicateFullName = 1;
        errCode = KUIE_EXISTS;
        KUI_TRACE_ERROR(ras, "Long name specified already exists [%s] :", kuiText(longSitName));
        return KUIR_TAKEN;
    }
    if (!KUI_QUERY_FAILED(ras, rc,
                          "Server exception occurred while checking whether the situation long name already exist on "
                          "the server",
                          "Communication error occurred, SOAP query failed while checking whether the situation long "
                          "name already exist in the server",
                          "Internal error occurred while checking whether the situation long name already exist in "
                          "the server")) {
        rc = 0;
        KUI_TRACE_DETAIL(ras, "Long name specified does not exist [%s], hence proceed to creation process :",
                         kuiText(longSitName));
    }
    return rc;
}

int oldServerNameFree(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = checkSitExistsinTSITDESC(ctx, msgBuf, respSlot, sitName);
    if (rc == KUIR_ABSENT) {
        KUI_TRACE_DETAIL(ras, "situation [%s] specified does not exist on the server, proceed with creation process",
                         kuiText(sitName));
        return 0;
    }
    if (!KUI_QUERY_FAILED(ras, rc,
                          "Server exception occurred while checking whether the situation already exist on the server",
                          "Communication error occurred, SOAP query failed while checking whether the situation "
                          "already exist in the server",
                          nullptr)) {
        rc = KUIR_TAKEN;
        errCode = KUIE_EXISTS;
        KUI_TRACE_ERROR(ras, "situation name specified already exists [%s] :", kuiText(sitName));
    }
    return rc;
}

// Step 3: the new name must be free.
int newNameFree(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (longNameExist) return longNameFree(ctx, msgBuf, respSlot);
    if (kuiOldServer()) return oldServerNameFree(ctx, msgBuf, respSlot);
    int rc = checkShortNameValidity(ctx, msgBuf, respSlot, sitName);
    if (rc == 0)
        KUI_TRACE_DETAIL(ras, "Shortname specified does not exist [%s], hence proceed to creation process :",
                         kuiText(sitName));
    else if (rc == KUIR_TAKEN) {
        errCode = KUIE_EXISTS;
        KUI_TRACE_ERROR(ras, "situation name specified already exists [%s] :", kuiText(sitName));
    }
    return rc;
}

// Step 4: internal data-collection situations are no base.
int baseUsable(void* ctx, char* msgBuf, char** respSlot) {
    int rc = checkUADVISORSituation(ctx, msgBuf, respSlot, basesitShortName, baseSitName);
    switch (rc) {
        case 0: break;
        case KUIR_INVALID: errCode = KUIE_UADVISOR; break;
        case KUIR_ABSENT: errCode = KUIE_NOSUCHBASE; break;
        case KUIR_SERVER: errCode = KUIE_SERVER; break;
        case KUIR_COMM: errCode = KUIE_COMM; break;
        default: errCode = KUIE_INTERNAL; break;
    }
    return rc;
}

// The DATA element of a reply's TABLE: the walk goes down through children
// that have children of their own until it meets DATA.
KSH_DOMNode* findData(KSH_DOMNode* table) {
    KSH_DOMNode* walked = table;
    for (int depth = 0; walked && depth < 8; depth++) {
        KSH_DOMNode* next = nullptr;
        for (KSH_DOMNode* c = walked->getFirstChild(); c; c = walked->getNextChild()) {
            if (strcmp(c->getName(), "DATA") == 0) return c;
            if (!next && c->getNumChildren() > 0) next = c;
        }
        walked = next;
    }
    return nullptr;
}

// Step 6 of constructValFromBaseSit: the properties replace the base's values.
void mergeProperties() {
    int p = 0, e = 0;
    while (e < arrayCount && p < propertyCount) {
        if (strcmp(propertyName[p], "DISTRIBUTION") == 0 || strcmp(propertyName[p], "INTERVAL") == 0) {
            p++;
            e = 0;
        } else if (strcmp(propertyName[p], elementArray[e]) == 0) {
            kuiReplace(valueArray[e], propertyValue[p]);
            p++;
            e = 0;
        } else {
            e++;
        }
    }
}

// Drops the SITINFO items that override thresholds ("OV="); each item kept
// is followed by ";".
void dropOverrides(char*& sitinfo) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!strstr(sitinfo, "OV=")) {
        KUI_TRACE_DETAIL(ras, "Override value not present in sitinfo property");
        return;
    }
    std::string kept;
    std::string all(sitinfo);
    size_t pos = 0;
    while (pos <= all.size()) {
        size_t semi = all.find(';', pos);
        std::string item = all.substr(pos, semi == std::string::npos ? std::string::npos : semi - pos);
        if (item.find("OV=") != std::string::npos) KUI_TRACE_DETAIL(ras, "Bypassed Override value [%s] ", item.c_str());
        else if (!item.empty()) kept += item + ";";
        if (semi == std::string::npos) break;
        pos = semi + 1;
    }
    kuiReplace(sitinfo, kept.c_str());
}

void fixColumns() {
    for (int e = 0; e < arrayCount; e++) {
        if (strcmp(elementArray[e], "SITNAME") == 0) kuiReplace(valueArray[e], sitName);
        else if (strcmp(elementArray[e], "LSTUSRPRF") == 0) kuiReplace(valueArray[e], KUI_QIBUSER);
        else if (strcmp(elementArray[e], "SITINFO") == 0) dropOverrides(valueArray[e]);
    }
}

}  // namespace

int constructValFromBaseSit(const char* reply) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    KSH_XML doc;
    int prc = doc.parseMessage(reply, (unsigned)strlen(reply));
    int rc = prc ? internalError("xmlParser.parseMessage failed, status code = %d", prc) : 0;
    unsigned tables = 0;
    if (rc == 0 && !doc.getFirstChild()) {
        RAS1_EXIT_RC(ras, 0);
        return 0;
    }
    if (rc == 0 && (prc = doc.getArray("TABLE", &tables)) != 0) {
        KUI_TRACE_DETAIL(ras, "xmlParser.getArray failed, status code = %d", prc);
        errCode = KUIE_INTERNAL;
        rc = KUIR_INTERNAL;
    }
    KSH_DOMNode* data = rc == 0 ? findData(doc.getCurrent()) : nullptr;
    // Only the first row is the base's: the query names one situation.
    KSH_DOMNode* row = data ? data->getFirstChild() : nullptr;
    if (rc == 0 && row) {
        KUI_TRACE_DETAIL(ras, "dom1->getname[%s]", data->getName());
        constructValues(row, 1, nullptr);
        mergeProperties();
        fixColumns();
    } else if (rc == 0) {
        rc = internalError("Internal error occurred while reading the base situation: the reply holds no row (%d)", 0);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int getBasesitProperty(void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    KUI_Statement st(msgBuf);
    st.add(kBaseColumns).add("\"").addQuotedOutsideCdata(basesitShortName).add("\"");
    char* reply = nullptr;
    int rc = kuiSend(ctx, st, &reply);
    if (rc == 0 && strstr(reply, "ROW")) {
        rc = constructValFromBaseSit(reply);
    } else if (rc == 0 && strstr(reply, "</TABLE>")) {
        KUI_TRACE_ERROR(ras, "The Base Situation [%s] does not exist on the VEMS, invalid base situation",
                        kuiText(basesitShortName));
        rc = KUIR_ABSENT;
        errCode = KUIE_NOSUCHBASE;
    } else if (rc == 0) {
        KUI_TRACE_ERROR(ras, "Server exception error occurred while retrieving the base situation properties");
        rc = KUIR_SERVER;
        errCode = KUIE_SERVER;
    } else if (rc == KUIR_COMM) {
        KUI_TRACE_ERROR(ras, "Communication error occurred while retrieving the base situation properties");
        errCode = KUIE_COMM;
    }
    free(reply);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int getNodel(const char* reply) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    KSH_XML doc;
    int prc = doc.parseMessage(reply, (unsigned)strlen(reply));
    if (prc != 0) {
        KUI_TRACE_ERROR(ras, "xmlParser.parseMessage failed, status code = %d", prc);
        KUI_TRACE_ERROR(ras, "ParserError while constructing TOBJACCL nodel object");
        errCode = KUIE_INTERNAL;
        RAS1_EXIT_RC(ras, KUIR_INTERNAL);
        return KUIR_INTERNAL;
    }
    unsigned rows = 0;
    // The list grows with the targets: none is ever dropped for room.
    std::string list = kuiText(distList);
    bool any = distList != nullptr;
    if (doc.getFirstChild() && doc.getArray("ROW", &rows) == 0) {
        for (unsigned r = 0; r < rows; r++) {
            KSH_DOMNode* row = doc.getCurrent();
            KSH_DOMNode* first = row ? row->getFirstChild() : nullptr;
            const char* v = first ? first->getValue() : nullptr;
            if (v) {
                KUI_TRACE_DETAIL(ras, "ElementValue:[%s]", v);
                if (!list.empty()) list += ",";
                list += v;
                any = true;
                KUI_TRACE_DETAIL(ras, "distList:[%s]", list.c_str());
            }
            doc.nextNode();
        }
    }
    if (any) kuiReplace(distList, list.c_str());
    RAS1_EXIT_RC(ras, 0);
    return 0;
}

int getBasesitDistribution(void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    KUI_Statement st(msgBuf);
    st.add("SELECT NODEL FROM O4SRV.TOBJACCL WHERE OBJNAME =").add("\"").addQuotedOutsideCdata(basesitShortName);
    st.add("\" AND SYSTEM.PARMA('QIBNODE', 'QPANOSCOPE', 32)");
    char* reply = nullptr;
    int rc = kuiSend(ctx, st, &reply);
    if (rc == 0 && strstr(reply, "</TABLE>")) {
        KUI_TRACE_DETAIL(ras, "About to get NODEL from TOBJACCL");
        rc = getNodel(reply);
    } else if (rc == 0) {
        // An error answer must not pass for a base without distribution.
        KUI_TRACE_ERROR(ras, "Server exception error occurred while retrieving the base situation distribution");
        rc = KUIR_SERVER;
        errCode = KUIE_SERVER;
    } else if (rc == KUIR_COMM) {
        KUI_TRACE_ERROR(ras, "Communication error occurred while retrieving the base situation distribution");
        errCode = KUIE_COMM;
    }
    free(reply);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int createFromBaseSituation(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = baseShortName(ctx, msgBuf, respSlot);
    if (rc == 0) rc = baseExists(ctx, msgBuf, respSlot);
    if (rc == 0) rc = newNameFree(ctx, msgBuf, respSlot);
    if (rc == 0) rc = baseUsable(ctx, msgBuf, respSlot);
    if (rc == 0) rc = getBasesitProperty(ctx, msgBuf, respSlot);
    if (rc == 0 && distPresent == 0) rc = getBasesitDistribution(ctx, msgBuf, respSlot);
    if (rc == 0) rc = insertintoTSITDESC(ctx, msgBuf, respSlot);
    if (rc == 0) rc = insertintoTOBJACCL(ctx, msgBuf, respSlot);
    if (rc == 0 && longNameExist == 1 && !kuiOldServer()) rc = insertintoTNAME(ctx, msgBuf, respSlot);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
