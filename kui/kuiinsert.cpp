// kuiinsert: the INSERT statements of the definition, distribution and
// long-name rows.
#include "kuiinsert.h"

#include <cstdio>
#include <cstring>
#include <vector>

#include "kuisql.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuiinsert");

namespace {

// Definition-row columns that hold national text and take an N literal.
const char* const kNationalColumns[] = {"ADVISE", "CMD", "PDT", "TEXT"};

bool isNational(const char* column) {
    for (const char* c : kNationalColumns)
        if (strcmp(column, c) == 0) return true;
    return false;
}

// The columns of a distribution row and the value each gets; null: the
// target (NODEL) or the situation's name (OBJNAME), filled per row.
struct ObjAcclColumn {
    const char* name;
    const char* value;
};
const ObjAcclColumn kObjAccl[KUI_OBJACCL_COLUMNS] = {
    {"ACTIVATION", ""}, {"HUB", "Y"},         {"LOCFLAG", ""},    {"LSTDATE", ""},
    {"LSTRELEASE", ""}, {"LSTUSRPRF", nullptr}, {"NETID", ""},     {"NODEL", nullptr},
    {"OBJCLASS", nullptr}, {"OBJECTLOCK", ""}, {"OBJNAME", nullptr}, {"QIBCLASSID", "5535"},
};

const char* objAcclValue(const char* column, const char* fixed, const char* target) {
    if (fixed) return fixed;
    if (strcmp(column, "NODEL") == 0) return target;
    if (strcmp(column, "OBJNAME") == 0) return kuiText(sitName);
    if (strcmp(column, "LSTUSRPRF") == 0) return KUI_QIBUSER;
    return KUI_SITCLASS;  // OBJCLASS
}

// The value written for definition column e.
const char* definitionValue(int e) {
    const char* column = elementArray[e];
    if (strcmp(column, "REEV_DAYS") == 0 && reev_days[0]) return reev_days;
    if (strcmp(column, "REEV_TIME") == 0 && reev_time[0]) return reev_time;
    if (strcmp(valueArray[e], KUI_QIBUSER) != 0) escapeDoubleQuotes(&valueArray[e], 0);
    return valueArray[e];
}

// Splits distList at "," (consuming it) into its trimmed non-empty targets.
std::vector<char*> splitTargets() {
    int ras = RAS1_Sync(RAS1_THIS);
    std::vector<char*> targets;
    char* p = distList;
    for (bool more = true; more;) {
        char* comma = strchr(p, ',');
        more = comma != nullptr;
        if (comma) *comma = '\0';
        char* piece = p;
        trimTheString(&piece);
        if (*piece) targets.push_back(piece);
        else KUI_TRACE_DETAIL(ras, "dist not used as it contains no value");
        if (comma) p = comma + 1;
    }
    return targets;
}

// Maps a failed send to errCode: 4 -> 14, 7 -> 97 (8 has errCode 99 already).
void noteFailure(int rc) {
    if (rc == KUIR_COMM) errCode = KUIE_COMM;
    else if (rc == KUIR_SERVER) errCode = KUIE_SERVER;
}

}  // namespace

void constructObjAccl() {
    memset(objAcclArray, 0, sizeof objAcclArray);
    for (int i = 0; i < KUI_OBJACCL_COLUMNS; i++) snprintf(objAcclArray[i], KUI_OBJACCL_WIDTH, "%s", kObjAccl[i].name);
}

int insertintoTSITDESC(void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    KUI_Statement st(msgBuf);
    st.add("<![CDATA[").add("INSERT INTO O4SRV.TSITDESC(");
    for (int e = 0; e < arrayCount; e++) st.add(e ? " ," : "").add(elementArray[e]);
    st.add(") VALUES (");
    for (int e = 0; e < arrayCount; e++) {
        st.add(e ? " ," : "").add(isNational(elementArray[e]) ? "N" : "").add("\"");
        st.addInCdata(definitionValue(e)).add("\"");
    }
    st.add(")").add("]]>");
    KUI_TRACE_DETAIL(ras, "SOAP request for inserting situation definition is [%s] ", st.text());
    int rc = kuiSendUpdate(ctx, st);
    if (rc == KUIR_OK) {
        sitInserted = 1;
        KUI_TRACE_DETAIL(ras, "Situation [%s] successfully inserted into TSITDESC", kuiText(sitName));
    } else if (rc == KUIR_SERVER || rc == KUIR_COMM) {
        KUI_QUERY_FAILED(ras, rc,
                         "Server exception occurred, SOAP query failed during insertion of situation details into "
                         "TSITDESC table in the server",
                         "Communication error occurred, SOAP query failed during insertion of situation details "
                         "into TSITDESC table in the server",
                         nullptr);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int insertintoTOBJACCL(void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    msgBuf[0] = '\0';
    if (!distList && sitInserted == 1)
        KUI_TRACE_DETAIL(ras, "Situation is not distributed as distribution tag contains no value");
    if (!distList || sitInserted != 1 || distInserted != 0) {
        RAS1_EXIT_RC(ras, 0);
        return 0;
    }
    if (objAcclArray[0][0] == '\0') constructObjAccl();
    std::vector<char*> targets = splitTargets();
    if (targets.empty())
        KUI_TRACE_DETAIL(ras, "Distribution list contains no valid value and hence no accesslist record is inserted");
    int rc = 0;
    for (size_t t = 0; rc == 0 && t < targets.size(); t++) {
        KUI_Statement st(msgBuf);
        st.add("INSERT INTO O4SRV.TOBJACCL(");
        for (int c = 0; c < KUI_OBJACCL_COLUMNS; c++) st.add(c ? " ," : "").add(objAcclArray[c]);
        st.add(") VALUES (");
        // Values are escaped like those of the definition row: a quote in a
        // target or a name can never end its literal.
        for (int c = 0; c < KUI_OBJACCL_COLUMNS; c++)
            st.add(c ? " ," : "").add("\"").addQuotedOutsideCdata(objAcclValue(objAcclArray[c], kObjAccl[c].value, targets[t])).add("\"");
        st.add(")");
        KUI_TRACE_DETAIL(ras, "Insert SQL for TOBJACCL:\n [%s]", st.text());
        rc = kuiSendUpdate(ctx, st);
        noteFailure(rc);
        if (rc == KUIR_OK)
            KUI_TRACE_DETAIL(ras, "Distribution [%s] successfully inserted into TOBJACCL for the situation [%s]",
                             targets[t], kuiText(sitName));
        else if (rc == KUIR_SERVER)
            KUI_TRACE_ERROR(ras,
                            "Server exception error occurred, Insert into TOBJACCL failed for the distribution [%s] for "
                            "the situation [%s]",
                            targets[t], kuiText(sitName));
        else if (rc == KUIR_COMM)
            KUI_TRACE_ERROR(ras, "Communication error occurred, SOAP query failed during insertion of situation "
                                 "distribution into TOBJACCL table in the server");
    }
    if (rc == 0) distInserted = 1;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int insertintoTNAME(void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char* fullName = kuiDup(longSitName);
    escapeDoubleQuotes(&fullName, 0);
    char* shortName = kuiDup(sitName);
    escapeDoubleQuotes(&shortName, 0);
    KUI_Statement st(msgBuf);
    st.add("<![CDATA[").add("INSERT INTO O4SRV.TNAME(ID,FULLNAME,OBJCLASS,LSTUSRPRF,QIBCLASSID) VALUES (\"");
    st.addInCdata(shortName).add("\", N\"").addInCdata(fullName).add("\", \"").add(KUI_SITCLASS).add("\", \"");
    st.add(KUI_QIBUSER).add("\", \"").add("2012").add("\"").add(")").add("]]>");
    KUI_TRACE_DETAIL(ras, "SOAP request for inserting situation fullname into TNAME table is [%s] ", st.text());
    int rc = kuiSendUpdate(ctx, st);
    if (rc == KUIR_OK)
        KUI_TRACE_DETAIL(ras, "Situation [%s] successfully inserted into TNAME", kuiText(sitName));
    else if (rc == KUIR_SERVER || rc == KUIR_COMM)
        KUI_QUERY_FAILED(ras, rc,
                         "Server exception occurred, SOAP query failed during insertion of situation details into "
                         "TNAME table in the server",
                         "Communication error occurred, SOAP query failed during insertion of situation details "
                         "into TNAME table in the server",
                         nullptr);
    delete[] fullName;
    delete[] shortName;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
