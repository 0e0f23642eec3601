// kuiimport: the export-file path: reading the file, checking the export,
// building the column set, the name checks and the writes.
#include "kuiimport.h"

#include <unicode/unistr.h>
#include <unicode/ustdio.h>
#include <unicode/ustring.h>

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "kshlst.h"
#include "kshxmlxp.h"
#include "kuiinsert.h"
#include "kuishort.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "kuivec.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuiimport");

namespace {

constexpr size_t kShortBytes = 31;
constexpr int32_t kReadUnits = 150000;  // UTF-16 units of the read buffer
constexpr int32_t kReadCount = 8192;    // units asked of one u_fgets call
const char kEnciphered[] = "{AES";

const char* const kEventColumns[] = {"EIB_Changes.Operation",   "EIB_Changes.Table_Name",
                                     "EIB_Changes.Object_Type", "EIB_Changes.Global_Timestamp",
                                     "EIB_Changes.Object_Name", "EIB_Changes.Userid"};

void freeText(void* p) { free(p); }

bool allDigits(const char* s) {
    for (; *s; s++)
        if (!isdigit((unsigned char)*s)) return false;
    return true;
}

int twoDigits(const char* s) { return (s[0] - '0') * 10 + (s[1] - '0'); }

// Bytes of the UTF-8 character starting with `lead`.
size_t charBytes(unsigned char lead) { return lead < 0xC0 ? 1 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4; }

// --- column rules of the situation ROW. Each gets the element's value (null
// when it has none) and returns 0, 6, or a query result with errCode set.
struct RuleContext {
    void* ctx;
    char** sitinfo;
};

int invalid(const char* text) {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_ERROR(ras, "%s", text);
    return KUIR_INVALID;
}

int ruleSitname(const char* v, RuleContext&) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!v) return invalid("The situation name is NULL in the file - Invalid situation export");
    if (strchr(v, '&') || isLongName(v)) return invalid("The situation name in the file is invalid");
    if (strlen(v) <= kShortBytes) {
        kuiReplace(sitName, v);
        KUI_TRACE_DETAIL(ras, "SITNAME from filename: [%s]", sitName);
        return 0;
    }
    // A Latin name whose UTF-8 form exceeds 31 bytes: its first 31 bytes,
    // never ending inside a character.
    size_t n = 0;
    while (n < strlen(v) && n + charBytes((unsigned char)v[n]) <= kShortBytes) n += charBytes((unsigned char)v[n]);
    std::string cut(v, n);
    kuiReplace(sitName, cut.c_str());
    KUI_TRACE_DETAIL(ras, "Length of sitname [%d] and so curtailed to [%s]", (int)strlen(v), sitName);
    displayMsg("025I", 0, "kuicreatesitErr.xml", 1, 0, 1);
    return 0;
}

int ruleFullname(const char* v, RuleContext&) {
    if (!v) return 0;
    if (kuiOldServer()) longNameDiscarded = 1;
    else {
        longNameExist = 1;
        kuiReplace(longSitName, v);
    }
    return 0;
}

int ruleAlertlist(const char* v, RuleContext&) {
    if (!v || strcmp(v, "*YES") == 0 || strcmp(v, "*NO") == 0) return 0;
    return invalid("ALERTLIST can be either *YES or *NO or no value - Invalid situation export");
}

int ruleHub(const char* v, RuleContext&) {
    if (!v || strcmp(v, "Y") == 0 || strcmp(v, "N") == 0) return 0;
    return invalid("HUB can be either Y or N or no value - Invalid situation export");
}

int ruleAutostart(const char* v, RuleContext&) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (v && (strcmp(v, "*YES") == 0 || strcmp(v, "*NO") == 0)) return 0;
    if (v && strcmp(v, "*SYN") == 0) {
        KUI_TRACE_ERROR(ras, "AUTOSTART should be either *YES or *NO");
        KUI_TRACE_ERROR(ras, "Here it is *SYN, indicating the situation is of type Historical or Enterprise level siutation");
        return invalid("Cannot import a situation of type Historical or Enterprise level situation");
    }
    return invalid("AUTOSTART should be either *YES or *NO - Invalid situation export");
}

int ruleQibscope(const char* v, RuleContext&) {
    if (!v || strlen(v) == 1) return 0;
    return invalid("QIBSCOPE should be of length one - Invalid situation export");
}

int rulePdt(const char* v, RuleContext&) {
    bool bad = !v;
    for (const char* a : kEventColumns)
        if (v && strstr(v, a)) bad = true;
    return bad ? invalid("The FORMULA / PDT is NULL in the file or has invalid values - Invalid situation export") : 0;
}

// Days must be a number: a value that is not one is refused like a
// negative one.
int ruleReevDays(const char* v, RuleContext&) {
    if (!v || (strlen(v) <= 3 && allDigits(v))) return 0;
    return invalid("Allowed length for REEV_DAYS is 3 but this is exceeded or it is negative");
}

int ruleReevTime(const char* v, RuleContext&) {
    if (!v) return 0;
    if (strlen(v) != 6) return invalid("Allowed length for REEV_TIME is 6 but this is not here");
    if (!allDigits(v) || twoDigits(v) > 23 || twoDigits(v + 2) > 59 || twoDigits(v + 4) > 59)
        return invalid("Hour , Min and Sec should be non negative and within the range of 23, 59 , 59 respectively");
    return 0;
}

int sitinfoInvalid() {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_ERROR(ras, "The situation definition is invalid for [%s]", "SITINFO");
    return KUIR_INVALID;
}

int ruleSitinfo(const char* v, RuleContext& rc) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!v) return 0;
    if (strcmp(v, "~") == 0) {
        (*rc.sitinfo)[0] = '\0';
        return 0;
    }
    LinkedList destinations(freeText);
    if (strstr(v, "TDST")) {
        int erc = GetEventID(&destinations, rc.ctx);
        if (erc == KUIR_ABSENT) {
            KUI_TRACE_ERROR(ras, "Velstra Event Integration Facility is not enabled on the VEMS. Therefore skipping TDST");
            tdstDiscarded = 1;
        } else if (erc != 0) {
            errCode = erc == KUIR_SERVER ? KUIE_SERVER : erc == KUIR_COMM ? KUIE_COMM : KUIE_INTERNAL;
            return erc;
        }
    }
    size_t size = strlen(v) + 3;
    char* out = new char[size]();
    int vrc = validateVEC(v, &destinations, &out);
    out[size - 1] = '\0';
    // The validated text travels in a buffer of KUI_SITINFO_SIZE bytes, the
    // width of the SITINFO column: a longer one makes the export invalid.
    int result = 0;
    if (vrc != 0 || strlen(out) >= KUI_SITINFO_SIZE) result = sitinfoInvalid();
    else memcpy(*rc.sitinfo, out, strlen(out) + 1);
    delete[] out;
    return result;
}

int ruleAny(const char*, RuleContext&) { return 0; }

struct ColumnRule {
    const char* column;
    int (*check)(const char* value, RuleContext& rc);
};
const ColumnRule kColumns[] = {
    {"SITNAME", ruleSitname},       {"FULLNAME", ruleFullname},   {"ALERTLIST", ruleAlertlist},
    {"HUB", ruleHub},               {"AUTOSTART", ruleAutostart}, {"QIBSCOPE", ruleQibscope},
    {"PDT", rulePdt},               {"REEV_DAYS", ruleReevDays},  {"REEV_TIME", ruleReevTime},
    {"SITINFO", ruleSitinfo},       {"ADVISE", ruleAny},          {"AFFINITIES", ruleAny},
    {"AUTOSOPT", ruleAny},          {"CMD", ruleAny},             {"DESTNODE", ruleAny},
    {"DISTRIBUTION", ruleAny},      {"LOCFLAG", ruleAny},         {"LSTCCSID", ruleAny},
    {"LSTDATE", ruleAny},           {"LSTRELEASE", ruleAny},      {"LSTUSRPRF", ruleAny},
    {"NOTIFYARGS", ruleAny},        {"NOTIFYOPTS", ruleAny},      {"OBJECTLOCK", ruleAny},
    {"PRNAMES", ruleAny},           {"REFLEXOK", ruleAny},        {"SENDMSGQ", ruleAny},
    {"SOURCE", ruleAny},            {"TEXT", ruleAny},
};

const ColumnRule* ruleFor(const char* column) {
    for (const ColumnRule& r : kColumns)
        if (strcmp(r.column, column) == 0) return &r;
    return nullptr;
}

// --- the column set

void releaseColumnSet() {
    for (int e = 0; e < arrayCount; e++) {
        delete[] elementArray[e];
        delete[] valueArray[e];
    }
    delete[] elementArray;
    delete[] valueArray;
    elementArray = valueArray = nullptr;
    arrayCount = arrayCapacity = 0;
}

void addColumn(const char* column, const char* value) {
    if (arrayCount >= arrayCapacity) return;  // sized for every child plus the two appended columns
    elementArray[arrayCount] = kuiDup(column);
    valueArray[arrayCount] = kuiDup(value);
    arrayCount++;
}

// The value the column set takes for one child of the row.
const char* columnValue(const char* name, const char* v, int mode, const char* const* sitinfo) {
    if (strcmp(name, "LSTUSRPRF") == 0) return KUI_QIBUSER;
    if (strcmp(name, "QIBCLASSID") == 0) return KUI_SITCLASS;
    if (mode == 0 && strcmp(name, "SITNAME") == 0) return kuiText(sitName);
    if (strcmp(name, "SITINFO") == 0 && v) return mode == 1 ? v : (sitinfo && *sitinfo ? *sitinfo : "");
    if (v) return v;
    if (strcmp(name, "CMD") == 0 || strcmp(name, "SENDMSGQ") == 0) return "*NONE";
    if (strcmp(name, "REEV_DAYS") == 0) return "0";
    if (strcmp(name, "REEV_TIME") == 0) return "001500";
    return "";
}

// Reads the file as UTF-8 into *text. 0, or the result with errCode set.
int readExport(const char* fileName, std::string* text) {
    int ras = RAS1_Sync(RAS1_THIS);
    char name[KUI_FILENAME_SIZE];
    // A name that does not fit the buffer cannot name a file the command can
    // open: it is refused as not found, never cut to another file's name.
    UFILE* f = nullptr;
    if (strlen(fileName) < sizeof name) {
        snprintf(name, sizeof name, "%s", fileName);
        f = u_fopen(name, "r", nullptr, "UTF-8");
    }
    if (!f) {
        errCode = KUIE_NOFILE;
        KUI_TRACE_ERROR(ras, "The specified file [%s] is not found", displayFileName.c_str());
        return KUIR_ABSENT;
    }
    KUI_TRACE_DETAIL(ras, "The file to be opened is: [%s]", name);
    std::vector<UChar> piece(kReadUnits, 0);
    icu::UnicodeString all;
    while (u_fgets(piece.data(), kReadCount, f)) {
        all.append(piece.data(), u_strlen(piece.data()));
        u_memset(piece.data(), 0, kReadCount);
    }
    u_fclose(f);
    if (all.isEmpty()) {
        errCode = KUIE_EMPTYFILE;
        KUI_TRACE_ERROR(ras, "The XML file [%s] contains no data", displayFileName.c_str());
        return KUIR_INTERNAL;
    }
    const UChar* units = all.getTerminatedBuffer();
    int32_t count = all.length();
    KUI_TRACE_DETAIL(ras, "Length of containerData: [%d]", (int)count);
    // Three bytes per UTF-16 unit is the most UTF-8 can need.
    std::vector<char> utf8((size_t)count * 3 + 1, '\0');
    int32_t length = 0;
    UErrorCode status = U_ZERO_ERROR;
    u_strToUTF8(utf8.data(), (int32_t)utf8.size() - 1, &length, units, count, &status);
    if (U_FAILURE(status)) {
        errCode = KUIE_UNPARSABLE;
        KUI_TRACE_ERROR(ras, "Unable to process the file [%s]. Parser error", displayFileName.c_str());
        return KUIR_INTERNAL;
    }
    text->assign(utf8.data(), (size_t)length);
    KUI_TRACE_DETAIL(ras, "Content of the file:[%s] destRet:[%d]", text->c_str(), (int)length);
    return 0;
}

// Step 3 of createFromXMLFile: is the file's long name already in TNAME?
int checkLongName(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    char shortName[KUI_SHORTNAME_SIZE] = "";
    int rc = getSitNamefromTNAME(ctx, msgBuf, respSlot, longSitName, shortName);
    if (rc == 0 && shortName[0]) {
        duplicateFullName = 1;
        errCode = KUIE_LONGEXISTS;
        KUI_TRACE_ERROR(ras, "Long name specified in the XML already exists [%s] :", kuiText(longSitName));
        return KUIR_TAKEN;
    }
    if (!KUI_QUERY_FAILED(ras, rc,
                          "Server exception occurred while checking whether the long situation name already exist on "
                          "the server",
                          "Communication error occurred, SOAP query failed while checking whether the long situation "
                          "name already exist in the server",
                          "Internal error occurred while checking whether the long situation name already exist in "
                          "the server")) {
        KUI_TRACE_DETAIL(ras, "Long name specified in the XML does not exist [%s], hence proceed to creation process :",
                         kuiText(longSitName));
        rc = 0;
    }
    return rc;
}

// Step 4: is the short name free? A taken name with a long name gets a
// generated short name instead.
int checkShortName(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = checkSitExistsinTSITDESC(ctx, msgBuf, respSlot, sitName);
    if (rc == KUIR_ABSENT) {
        KUI_TRACE_DETAIL(ras, "situation name specified in the XML does not exist [%s], hence proceed to creation process :",
                         kuiText(sitName));
        return 0;
    }
    // An internal failure of the look-up itself: the name is not known to be taken.
    if (KUI_QUERY_FAILED(ras, rc,
                         "Server exception occurred while checking whether the situation name already exist on the "
                         "server",
                         "Communication error occurred, SOAP query failed while checking whether the situation name "
                         "already exist in the server",
                         nullptr))
        return rc;
    if (longNameExist) {
        KUI_TRACE_DETAIL(ras, "situation name specified in the XML already exists [%s]. Generate another one:",
                         kuiText(sitName));
        char generated[KUI_SHORTNAME_SIZE] = "";
        rc = generateShortName(generated, ctx, msgBuf, respSlot);
        if (rc == 0) {
            kuiReplace(sitName, generated);
            for (int e = 0; e < arrayCount; e++)
                if (strcmp(elementArray[e], "SITNAME") == 0) kuiReplace(valueArray[e], generated);
        }
        return rc;
    }
    errCode = KUIE_EXISTS;
    KUI_TRACE_ERROR(ras, "Situation name specified in the XML already exists on the server [%s] :", kuiText(sitName));
    return KUIR_TAKEN;
}

}  // namespace

void constructValues(KSH_DOMNode* row, int mode, const char* const* sitinfo) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    releaseColumnSet();
    arrayCapacity = (int)row->getNumChildren() + 2;
    elementArray = new char*[arrayCapacity]();
    valueArray = new char*[arrayCapacity]();
    bool user = false, classId = false;
    for (KSH_DOMNode* c = row->getFirstChild(); c; c = row->getNextChild()) {
        const char* name = c->getName();
        const char* v = c->getValue();
        if (strcmp(name, "DISTRIBUTION") == 0) {
            if (v) kuiReplace(distList, v);
            continue;
        }
        if (strcmp(name, "FULLNAME") == 0) continue;
        user = user || strcmp(name, "LSTUSRPRF") == 0;
        classId = classId || strcmp(name, "QIBCLASSID") == 0;
        addColumn(name, columnValue(name, v, mode, sitinfo));
    }
    KUI_TRACE_DETAIL(ras, "LSTUSRPRF found[%d]", (int)user);
    if (!user) {
        KUI_TRACE_DETAIL(ras, "Inserting LSTUSRPRF in array");
        addColumn("LSTUSRPRF", KUI_QIBUSER);
    }
    KUI_TRACE_DETAIL(ras, "QIBCLASSID found[%d]", (int)classId);
    if (!classId) {
        KUI_TRACE_DETAIL(ras, "Inserting QIBCLASSID in array");
        addColumn("QIBCLASSID", KUI_SITCLASS);
    }
    for (int e = 0; e < arrayCount; e++) {
        KUI_TRACE_DETAIL(ras, "element Name [%s]", elementArray[e]);
        KUI_TRACE_DETAIL(ras, "element Value [%s]", valueArray[e]);
    }
    RAS1_EXIT(ras);
}

int validateSitExport(KSH_DOMNode* root, void* ctx, char** sitinfo) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    KSH_DOMNode* row = root ? root->getFirstChild() : nullptr;
    if (!root) rc = KUIR_INVALID;
    else if (strcmp(root->getName(), "TABLE") != 0) rc = invalid("The TABLE tag in the file has been tampered.");
    else if (!row) rc = invalid("The ROW tag in the file has been tampered.");
    else if (strcmp(row->getName(), "ROW") != 0 || row->getNumChildren() < 27 || row->getNumChildren() > 29)
        rc = invalid("The file does not contain valid situation export - either not well formed or number of "
                     "situation columns more than 28");
    RuleContext rcx{ctx, sitinfo};
    for (KSH_DOMNode* c = rc == 0 ? row->getFirstChild() : nullptr; c && rc == 0; c = row->getNextChild()) {
        const ColumnRule* rule = ruleFor(c->getName());
        if (!rule) {
            KUI_TRACE_ERROR(ras, "The situation definition is invalid for [%s]", c->getName());
            rc = KUIR_INVALID;
        } else {
            rc = rule->check(c->getValue(), rcx);
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int processFileName(const char* fileName, void* ctx) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    std::string text;
    int rc = readExport(kuiText(fileName), &text);
    if (rc == 0 && text.compare(0, strlen(kEnciphered), kEnciphered) == 0) {
        KUI_TRACE_ERROR(ras, "The XML file has encrypted data ");
        errCode = KUIE_ENCIPHERED;
        rc = KUIR_INTERNAL;
    }
    KSH_XML doc;
    KSH_DOMNode* root = nullptr;
    if (rc == 0) {
        int prc = doc.parseMessage(text.data(), (unsigned)text.size());
        if (prc != 0) {
            KUI_TRACE_ERROR(ras, "Unable to process the file [%s]. Parser error", displayFileName.c_str());
            errCode = KUIE_UNPARSABLE;
            rc = KUIR_INTERNAL;
        } else {
            KUI_TRACE_DETAIL(ras, "parserStatus[%d]", prc);
            root = doc.getFirstChild();
        }
    }
    if (rc == 0 && root) {
        char sitinfoBuffer[KUI_SITINFO_SIZE] = "";
        char* sitinfo = sitinfoBuffer;
        rc = validateSitExport(root, ctx, &sitinfo);
        if (rc == 0) {
            const char* validated = sitinfo;
            constructValues(root->getFirstChild(), 0, &validated);
            noOfVecRows = (int)root->getNumChildren() - 1;
            if (noOfVecRows > 0) {
                vecSlotExist = 1;
                rc = validateAndConstructVECDetails(noOfVecRows, root);
            }
        } else if (rc == KUIR_INVALID) {
            KUI_TRACE_ERROR(ras, "Invalid situation export");
            errCode = KUIE_BADEXPORT;
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int createFromXMLFile(void* ctx, char* msgBuf, char** respSlot) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = processFileName(sitFileName, ctx);
    KUI_TRACE_DETAIL(ras, "After call to processFileName, errCode is [%d] and ARRAYCOUNT is [%d]:", errCode, arrayCount);
    if (errCode == 0 && arrayCount == 0) {
        errCode = KUIE_BADEXPORT;
        rc = KUIR_INTERNAL;
        KUI_TRACE_ERROR(ras, "Since the arrayCount is 0, the file is invalid and the errCode is set to 7 and return ");
    }
    if (rc == 0 && longNameExist == 1) rc = checkLongName(ctx, msgBuf, respSlot);
    if (rc == 0) rc = checkShortName(ctx, msgBuf, respSlot);
    if (rc == 0) rc = insertintoTSITDESC(ctx, msgBuf, respSlot);
    if (rc == 0) rc = insertintoTOBJACCL(ctx, msgBuf, respSlot);
    if (rc == 0 && longNameExist == 1) rc = insertintoTNAME(ctx, msgBuf, respSlot);
    if (rc == 0 && vecSlotExist == 1) rc = insertVECDetails(ctx, msgBuf, respSlot);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
