// kshprsmd: method defaults. Turns a parsed status, activation, CT_WTO or
// CT_Thresholds record into the generic insert the request engine runs, and
// checks and completes a CT_Get.
//
// Every text added to the record is laid into the request's 4096-byte
// defaults buffer through a WSQL_TextArena, so nothing is written past it; a
// text that does not fit fails the method with 7. Values pasted into the
// literal form of the status-history statement, and the situation name in a
// packed predicate, have their double quotes doubled; values put into the
// XML of a threshold command are escaped for XML.
#include <cstdio>
#include <cstring>
#include <utility>

#include "kshcat.h"
#include "kshcol.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshprsint.h"
#include "kshreq.h"
#include "kshtab.h"
#include "kshutil.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshprsmd");

namespace {

// Result of a refused method whose message is already set.
constexpr int kInvalid = 400;
// Result of an invalid alert attribute (message set).
constexpr int kBadAttribute = 1;

// New and required DELTASTAT of the status methods.
const struct {
    uint32_t bit;
    const char* newStatus;
    const char* required;  // null: no existing row is read
} kStatusTable[] = {
    {WSQL_METHOD_ALERT, "Y", nullptr},
    {WSQL_METHOD_ACKNOWLEDGE, "A", "Y"},
    {WSQL_METHOD_RESET, "N", "Y"},
    {WSQL_METHOD_RESURFACE, "E", "A"},
};

// The columns the second statement selects, in the positions the insert
// must give them.
const char* const kSubColumns[] = {"SITNAME", "ORIGINNODE", "ATOMIZE", "TYPE", "NODE"};

struct MdCtx {
    WSQL_HttpServer* http;
    WSQL_Hub* hub;
    WSQL_Request_t* req;
    WSQL_TextArena& arena;
    unsigned methods;
    char user[WSQL_CREDENTIAL_SIZE + 1];
};

char* lit(const char* text) { return WSQL_Literal(text); }

int addColumn(MdCtx& m, const char* column, char* value) {
    if (value == nullptr) return WSQL_NOMEM;
    return WSQL_AddColumnValue(m.req, lit(column), value);
}

// Sets the client fault `message` with `detail` and returns 400.
int invalid(MdCtx& m, const char* message, const char* detail) {
    m.http->setRequestError(true, message, detail, 0);
    return kInvalid;
}

// The user cut to the 10 characters of a user profile column.
char* userProfile(MdCtx& m) { return m.arena.copy(m.user, strnlen(m.user, 10)); }

const char* hubNode(MdCtx& m) { return m.hub ? m.hub->getNodeID() : ""; }

// ------------------------------------------------------------ status methods

// NODE of an alert: the managing node of the origin. The hub itself when the
// origin is the hub or not named; otherwise the origin's thru-node from the
// hub's node cache. An origin the cache does not know is attributed to the
// hub, the only managing server the gateway can name for it.
char* alertNode(MdCtx& m) {
    int ras = RAS1_Sync(RAS1_THIS);
    int idx = WSQL_FindColumn(m.req, "ORIGINNODE");
    const char* node = hubNode(m);
    if (idx < 0) {
        if (ras & RAS1_STATE)
            RAS1_Printf(RAS1_THIS, __LINE__, "ORIGINNODE not found in the request, Thrunode is the hub, %s", node);
    } else if (strcmp(m.req->values[idx], node) == 0) {
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Thrunode is the hub, %s", node);
    } else if (Node* n = m.hub ? m.hub->lookupCachedNode(m.req->values[idx]) : nullptr) {
        node = n->getThrunode();
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Thrunode is %s", node);
    } else if (ras & RAS1_STATE) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Origin %s not cached, Thrunode is the hub, %s", m.req->values[idx], node);
    }
    return m.arena.copy(node);
}

// Step 2: the default columns. Returns 0 or 7; *second tells whether a
// second statement must read the current row.
int statusColumns(MdCtx& m, bool alert, bool* second) {
    const uint32_t el = m.req->elements;
    const struct {
        uint32_t given;
        const char* column;
        const char* value;
    } defaults[] = {
        {WSQL_ELEM_SOURCE, "ORIGINNODE", ""},
        {WSQL_ELEM_ITEM, "ATOMIZE", ""},
        {WSQL_ELEM_TYPE, "TYPE", alert ? "0" : ""},
    };
    int rc = WSQL_OK;
    for (const auto& d : defaults) {
        if ((el & d.given) || rc != WSQL_OK) continue;
        rc = addColumn(m, d.column, lit(d.value));
    }
    if (rc == WSQL_OK) rc = addColumn(m, "NODE", alert ? alertNode(m) : lit(""));
    // Every method but CT_Alert adds at least NODE, so it always reads the
    // current row.
    *second = !alert;
    return rc;
}

// Step 3: SITNAME, ORIGINNODE, ATOMIZE, TYPE, NODE to positions 0 to 4.
int alignSubColumns(MdCtx& m) {
    WSQL_Request_t* r = m.req;
    for (int i = 0; i < 5; ++i) {
        int j = WSQL_FindColumn(r, kSubColumns[i]);
        if (j < 0) return WSQL_NOMEM;  // a pair was dropped for lack of room
        if (j == i) continue;
        std::swap(r->columns[i], r->columns[j]);
        std::swap(r->values[i], r->values[j]);
    }
    return WSQL_OK;
}

// Step 5, the packed predicate of data items: *PREDICATE=SYSTEM.PARMA(...)
// followed by ;TABLE.COLUMN=VALUE per item and "~".
int predicateResults(MdCtx& m) {
    WSQL_Catalog* cat = WSQL_GetCatalog();
    const char* sit = m.req->statusSitName ? m.req->statusSitName : "";
    WSQL_TextArena& a = m.arena;
    a.begin();
    a.append("*PREDICATE=SYSTEM.PARMA(\"SITNAME\", \"");
    a.appendSqlQuoted(sit);
    a.appendf("\", %d)", static_cast<int>(strlen(sit)));
    for (int i = 0; i < m.req->numDataItems && i < WSQL_MAX_DATAITEMS; ++i) {
        const WSQL_Filter_t& item = m.req->dataItems[i];
        const char* dot = strchr(item.column, '.');
        char object[256];
        if (dot == nullptr || static_cast<size_t>(dot - item.column) >= sizeof object) {
            a.end();
            m.http->setRequestError(true, "Invalid alert attribute.  Must be of form object.attribute.", item.column,
                                    0);
            return kBadAttribute;
        }
        snprintf(object, sizeof object, "%.*s", static_cast<int>(dot - item.column), item.column);
        WSQL_Table* table = cat ? cat->GetTableByObject(object) : nullptr;
        WSQL_Column* col = table ? table->GetAttr(dot + 1) : nullptr;
        if (col == nullptr) {
            a.end();
            m.http->setRequestError(true,
                                    table ? "Invalid alert attribute.  Attribute name not found."
                                          : "Invalid alert attribute.  Object name not found.",
                                    table ? dot + 1 : item.column, 0);
            return kBadAttribute;
        }
        if (!a.appendf(";%s.%s=%s", table->UnqualifiedTableName(), col->ColName(), item.value)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Buffer overflow - \"%s\"", item.column);
            break;
        }
    }
    a.append("~");
    return addColumn(m, "RESULTS", a.end());
}

// Step 5 without data items: USR=user, the acknowledgement parts, the data
// text. Replaces the RESULTS column the parser made of a "data" text, or
// adds one.
int userResults(MdCtx& m, bool alert, bool ack) {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_TextArena& a = m.arena;
    int idx = WSQL_FindColumn(m.req, "RESULTS");
    a.begin();
    a.append("USR=");
    a.append(m.user);
    if (ack && m.req->expire != nullptr) {
        char ts[20];
        genTimeStamp(ts);
        a.appendf(";IUS=%s;GTM=%s;LTM=%s;ATM=%s;EXP=%s", m.user, ts, ts, ts, m.req->expire);
    }
    if (idx >= 0) {
        a.append(ack ? ";TXT=" : ";DATA=");
        a.append(m.req->values[idx]);
        a.append(ack ? ";~" : "~");
        char* value = a.end();
        if (value == nullptr) return WSQL_NOMEM;
        m.req->values[idx] = value;
        if (ras & RAS1_STATE)
            RAS1_Printf(RAS1_THIS, __LINE__, "Results data [%d/%d] column '%s' value '%s'", idx, m.req->numColumns,
                        m.req->columns[idx], value);
        return WSQL_OK;
    }
    a.append(alert ? ";DATA=No data was provided~" : "~");
    return addColumn(m, "RESULTS", a.end());
}

// Step 6: the timestamp columns.
int timestampColumns(MdCtx& m, bool ack) {
    char ts[20];
    genTimeStamp(ts);
    int rc = WSQL_OK;
    if (!(m.req->elements & WSQL_ELEM_TIMESTAMP)) rc = addColumn(m, "LCLTMSTMP", m.arena.copy(ts));
    char* gbl = (ack && m.req->expire != nullptr) ? m.req->expire : m.arena.copy(ts);
    if (rc == WSQL_OK) rc = addColumn(m, "GBLTMSTMP", gbl);
    if (rc == WSQL_OK) rc = addColumn(m, "LOCFLAG", lit("  "));
    return rc;
}

// Step 7: the statement that reads the current status rows.
int statusSubSql(MdCtx& m, const char* required, char* sit, char* origin, char* atom) {
    WSQL_Request_t* r = m.req;
    const bool source = (r->elements & WSQL_ELEM_SOURCE) != 0;
    const bool item = (r->elements & WSQL_ELEM_ITEM) != 0;
    WSQL_TextArena& a = m.arena;
    a.begin();
    a.append("SELECT SITNAME, ORIGINNODE, ATOMIZE, TYPE, NODE,DELTASTAT FROM O4SRV.ISITSTSH AT (\"*HUB\")");
    if (r->numFilters == 0) {
        // Bound form: the filters become the markers' values.
        a.append(" WHERE SITNAME = ?");
        if (source) a.append(" AND ORIGINNODE = ?");
        if (item) a.append(" AND ATOMIZE = ?");
        if (required) a.append(" AND DELTASTAT = ?");
        const struct {
            bool use;
            const char* column;
            char* value;
        } pairs[] = {{true, "SITNAME", sit}, {source, "ORIGINNODE", origin}, {item, "ATOMIZE", atom},
                     {required != nullptr, "DELTASTAT", lit(required ? required : "")}};
        for (const auto& p : pairs)
            if (p.use) (void)WSQL_AddFilter(r, lit(p.column), lit("="), p.value, 0);
        r->type |= WSQL_TYPE_SUBINPUT;
    } else {
        a.append(" WHERE SITNAME = \"");
        a.appendSqlQuoted(sit);
        a.append("\"");
        if (required) a.appendf(" AND DELTASTAT = \"%s\"", required);
        if (source) {
            a.append(" AND ORIGINNODE = \"");
            a.appendSqlQuoted(origin);
            a.append("\"");
        }
        if (item) {
            a.append(" AND ATOMIZE = N\"");
            a.appendSqlQuoted(atom);
            a.append("\"");
        }
    }
    r->subSql = a.end();
    if (r->subSql == nullptr) return WSQL_NOMEM;
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Status History subSql %s", r->subSql);
    return WSQL_OK;
}

int statusDefaults(MdCtx& m) {
    WSQL_Request_t* r = m.req;
    const bool alert = (m.methods & WSQL_METHOD_ALERT) != 0;
    const bool ack = (m.methods & WSQL_METHOD_ACKNOWLEDGE) != 0;
    const char* newStatus = "U";
    const char* required = nullptr;
    for (const auto& s : kStatusTable) {
        if (!(m.methods & s.bit)) continue;
        newStatus = s.newStatus;
        required = s.required;
        break;
    }
    r->table = lit("O4SRV.TSITSTSH");
    r->type |= WSQL_TYPE_BOUNDINPUT;
    bool second = false;
    int rc = statusColumns(m, alert, &second);
    char* remembered[3] = {nullptr, nullptr, nullptr};
    if (rc == WSQL_OK && second) {
        r->type |= WSQL_TYPE_SUBSELECT;
        rc = alignSubColumns(m);
        for (int i = 0; i < 3 && rc == WSQL_OK; ++i) remembered[i] = r->values[i];
    }
    if (rc == WSQL_OK) rc = addColumn(m, "DELTASTAT", lit(newStatus));
    if (rc == WSQL_OK && !(r->elements & WSQL_ELEM_RESULTS))
        rc = r->numDataItems > 0 ? predicateResults(m) : userResults(m, alert, ack);
    if (rc == WSQL_OK) rc = timestampColumns(m, ack);
    if (rc == WSQL_OK && second) rc = statusSubSql(m, required, remembered[0], remembered[1], remembered[2]);
    return rc;
}

// ------------------------------------------------------------ activation

int activationDefaults(MdCtx& m) {
    const bool activate = (m.methods & WSQL_METHOD_ACTIVATE) != 0;
    m.req->table = lit("O4SRV.TOBJACCL");
    int rc = WSQL_OK;
    if (!(m.req->elements & WSQL_ELEM_SOURCE)) rc = addColumn(m, "NODEL", m.arena.copy(hubNode(m)));
    if (rc == WSQL_OK) rc = addColumn(m, "LSTUSRPRF", userProfile(m));
    if (rc == WSQL_OK) rc = addColumn(m, "OPERATION", lit(activate ? "R" : "T"));
    if (rc == WSQL_OK) rc = addColumn(m, "QIBCLASSID", lit("5625"));
    if (rc == WSQL_OK) rc = addColumn(m, "LSTDATE", lit(" "));
    return rc;
}

// ------------------------------------------------------------ command texts

// The value of the filter named `tag`, or null.
char* filterValue(const WSQL_Request_t* r, const char* tag) {
    int i = WSQL_FindFilter(r, tag);
    return i < 0 ? nullptr : r->filters[i].value;
}

// Replaces the filters by (ACTSECURE EQ user) and (CLCMD EQ command).
int commandFilters(MdCtx& m, char* command, const char* traceFmt) {
    int ras = RAS1_Sync(RAS1_THIS);
    char* secure = userProfile(m);
    if (command == nullptr || secure == nullptr) return WSQL_NOMEM;
    WSQL_Request_t* r = m.req;
    r->numFilters = 0;
    (void)WSQL_AddFilter(r, lit("ACTSECURE"), lit("EQ"), secure, 0);
    (void)WSQL_AddFilter(r, lit("CLCMD"), lit("EQ"), command, 0);
    for (int i = 0; i < r->numFilters && (ras & RAS1_STATE); ++i)
        RAS1_Printf(RAS1_THIS, __LINE__, traceFmt, i, r->filters[i].column, r->filters[i].value);
    return WSQL_OK;
}

int wtoDefaults(MdCtx& m) {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_Request_t* r = m.req;
    r->table = lit("O4SRV.CLACTLCL");
    for (int i = 0; i < r->numFilters && (ras & RAS1_STATE); ++i)
        RAS1_Printf(RAS1_THIS, __LINE__, "filter [%d/%d] Name '%s' Value '%s'", i, r->numFilters,
                    r->filters[i].column, r->filters[i].value);
    if (r->numFilters > WSQL_MAX_FILTERS - 1) return WSQL_NOMEM;
    const char* severity = filterValue(r, "severity");
    const char* category = filterValue(r, "category");
    const char* data = filterValue(r, "data");
    char* command = m.arena.format("message:severity=%s;Category=%s;message=%s", severity ? severity : " ",
                                   category ? category : " ", data ? data : " ");
    return commandFilters(m, command, "WTO Filter [%d] Name '%s' Value '%s'");
}

// The column of the threshold attribute filter `tag` ("keyname",
// "thresholdname") of `table`: the filter's text cleaned and looked up as
// an attribute. Null without the filter; *rc 400 when it is unknown.
const char* thresholdColumn(MdCtx& m, WSQL_Table* table, const char* tag, const char* message, int* rc) {
    char* name = filterValue(m.req, tag);
    if (name == nullptr || *rc != WSQL_OK) return nullptr;
    WSQL_ConvertAttr(name);
    WSQL_Column* col = table ? table->GetAttr(name) : nullptr;
    if (col == nullptr) {
        *rc = invalid(m, message, nullptr);
        return nullptr;
    }
    return col->ColName();
}

// An XML-escaped copy of at most `max` characters of `text`; null for a
// null text. *rc becomes 7 when it does not fit.
char* xmlPart(MdCtx& m, const char* text, size_t max, int* rc) {
    if (text == nullptr || *rc != WSQL_OK) return nullptr;
    char raw[WSQL_DEFAULTS_SIZE];
    size_t n = strnlen(text, max);
    char* out = nullptr;
    if (n < sizeof raw) {
        memcpy(raw, text, n);
        raw[n] = '\0';
        out = m.arena.xmlEscaped(raw);
    }
    if (out == nullptr) *rc = WSQL_NOMEM;
    return out;
}

int thresholdDefaults(MdCtx& m) {
    WSQL_Request_t* r = m.req;
    WSQL_Catalog* cat = WSQL_GetCatalog();
    WSQL_Table* table = (cat && r->table) ? cat->GetTableByObject(r->table) : nullptr;
    char* overrides = filterValue(r, "overrides");
    if (table == nullptr && overrides == nullptr) {
        const char* msg = "Missing or Invalid Object for key, threshold Name for CT_Thresholds method.";
        RAS1_Printf(RAS1_THIS, __LINE__, "CT Thresholds method error Http Status %d: '%s'", kInvalid, msg);
        return invalid(m, msg, nullptr);
    }
    r->table = lit("O4SRV.CLACTRMT");
    r->type |= WSQL_TYPE_BOUNDINPUT;
    char* command = nullptr;
    int rc = WSQL_OK;
    if (overrides != nullptr) {
        command = m.arena.format("thresh:<?xml version=\"1.0\"?><overrides>%s</overrides>", overrides);
    } else {
        const char* keyCol = thresholdColumn(m, table, "keyname", "Invalid keyname for CT_Thresholds method.", &rc);
        const char* thrCol =
            thresholdColumn(m, table, "thresholdname", "Invalid thresholdname for CT_Thresholds method.", &rc);
        // The situation name is cut to its 32 characters before escaping, so
        // that no entity reference is cut.
        char* sit = xmlPart(m, filterValue(r, "name"), 32, &rc);
        char* keyValue = xmlPart(m, filterValue(r, "keyvalue"), SIZE_MAX, &rc);
        char* value = xmlPart(m, filterValue(r, "thresholdvalue"), SIZE_MAX, &rc);
        char* dflt = xmlPart(m, filterValue(r, "thresholddefault"), SIZE_MAX, &rc);
        if (rc != WSQL_OK) return rc;
        const char* s = sit ? sit : "";
        const char* kv = keyValue ? keyValue : "";
        const char* tc = thrCol ? thrCol : "";
        const char* tv = value ? value : "";
        if (keyCol && dflt)
            command = m.arena.format(
                "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"%s\"><key column=\"%.10s\" "
                "value=\"%s\"><threshold column=\"%.10s\">%s</threshold></key><default><threshold "
                "column=\"%.10s\">%s</threshold></default></situation></overrides>",
                s, keyCol, kv, tc, tv, tc, dflt);
        else if (keyCol)
            command = m.arena.format(
                "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"%s\"><key column=\"%.10s\" "
                "value=\"%s\"><threshold column=\"%.10s\">%s</threshold></key></situation></overrides>",
                s, keyCol, kv, tc, tv);
        else if (dflt)
            command = m.arena.format(
                "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"%s\"><threshold "
                "column=\"%.10s\">%s</threshold><default><threshold column=\"%.10s\">%s</threshold></default>"
                "</situation></overrides>",
                s, tc, tv, tc, dflt);
        else
            command = m.arena.format(
                "thresh:<?xml version=\"1.0\"?><overrides><situation name=\"%s\"><threshold "
                "column=\"%.10s\">%s</threshold></situation></overrides>",
                s, tc, tv);
    }
    if (r->numFilters > WSQL_MAX_FILTERS - 1) return WSQL_NOMEM;
    return commandFilters(m, command, "New Filter [%d] Name '%s' Value '%s'");
}

int methodDefaults(MdCtx& m) {
    if (m.methods & WSQL_METHODS_STATUS) return (m.req->elements & WSQL_ELEM_NAME) ? statusDefaults(m) : WSQL_OK;
    if (m.methods & WSQL_METHODS_ACTIVATION) return activationDefaults(m);
    if (m.methods & WSQL_METHOD_WTO) return wtoDefaults(m);
    if (m.methods & WSQL_METHOD_THRESHOLDS) return thresholdDefaults(m);
    return WSQL_OK;
}

}  // namespace

int WSQL_SetupMethodDefaults(WSQL_HttpServer* http, WSQL_Hub* hub, WSQL_Request_t* req, char* buffer, int size,
                             unsigned int methods) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    WSQL_TextArena arena(buffer, size > 0 ? static_cast<size_t>(size) : 0);
    arena.clear();
    MdCtx m{http, hub, req, arena, methods, {}};
    WSQL_RecordUser(req, m.user);
    int rc = PFM1_Guard("WSQL_SetupMethodDefaults", [&]() { return methodDefaults(m); });
    if (rc == PFM1_ABEND) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Abend detected processing Method default values");
        http->setRequestError(true, "Method default values abnormal end", nullptr, 0);
    } else if (rc == WSQL_NOMEM) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s Insufficient storage for Method default values",
                    req->clientHost);
        http->setRequestMemoryError();
    } else if (rc != WSQL_OK && rc != kInvalid && rc != kBadAttribute) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s Processing error %d", req->clientHost, rc);
        http->setRequestError(true, "Method default values processing error", nullptr, 0);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// ------------------------------------------------------------ CT_Get

namespace {

struct GetCtx {
    WSQL_HttpServer* http;
    WSQL_Request_t* req;
    char message[200];
};

// The message `fmt` with at most 79 characters of `name`.
int getRefused(GetCtx& g, const char* fmt, const char* name) {
    char shown[80];
    snprintf(shown, sizeof shown, "%s", name ? name : "");
    snprintf(g.message, sizeof g.message, fmt, shown);
    return kInvalid;
}

// True for the write-time column of a history request, which the
// historical table copy adds itself.
bool isWriteTime(const WSQL_Request_t* r, const char* name, bool attribute) {
    return r->history && WSQL_CaseCompare(name, attribute ? "Write_Time" : "WRITETIME") == 0;
}

// Checks one name of the request against `table` (null: no table known,
// only the name's form is checked). Attribute names are cleaned in place.
int checkName(GetCtx& g, WSQL_Table* table, char* name, bool attribute, const char* attrFmt, const char* colFmt) {
    char spelled[80];
    snprintf(spelled, sizeof spelled, "%s", name ? name : "");
    if (name == nullptr) return getRefused(g, attribute ? attrFmt : colFmt, spelled);
    if (attribute) WSQL_ConvertAttr(name);
    if (isWriteTime(g.req, name, attribute)) return WSQL_OK;
    bool known = WSQL_IsPlainName(name) &&
                 (table == nullptr || (attribute ? table->GetAttr(name) : table->GetColumn(name)) != nullptr);
    return known ? WSQL_OK : getRefused(g, attribute ? attrFmt : colFmt, spelled);
}

int getDefaults(GetCtx& g) {
    WSQL_Request_t* r = g.req;
    const bool action = (r->methods & WSQL_METHOD_ACTION) != 0;
    if (!action && !(r->elements & WSQL_ELEM_TARGET)) {
        if (WSQL_AddParma(r, lit("NODELIST"), lit("*ALL")) != WSQL_OK) return WSQL_NOMEM;
        r->type |= WSQL_TYPE_ALLTARGETS;
    }
    if (r->numColumns == 0 && r->numFilters == 0) return WSQL_OK;
    const bool byObject = (r->elements & WSQL_ELEM_OBJECT) != 0;
    WSQL_Catalog* cat = WSQL_GetCatalog();
    WSQL_Table* table = nullptr;
    if (cat && r->table) table = byObject ? cat->GetTableByObject(r->table) : cat->GetTable(r->table);
    if (table == nullptr && (!action || (r->table && !WSQL_IsPlainName(r->table))))
        return getRefused(g, byObject ? "CT_Get object \"%s\" Not Found." : "CT_Get table \"%s\" Not Found.",
                          r->table);
    int rc = WSQL_OK;
    for (int i = 0; i < r->numColumns && rc == WSQL_OK; ++i)
        rc = checkName(g, table, r->columns[i], r->attributeForm != 0, "CT_Get attribute \"%s\" Not Found.",
                       "CT_Get column \"%s\" Not Found.");
    for (int i = 0; i < r->numFilters && rc == WSQL_OK; ++i)
        rc = checkName(g, table, r->filters[i].column, r->filters[i].isAfilter != 0,
                       "CT_Get filter attribute \"%s\" Not Found.", "CT_Get filter column \"%s\" Not Found.");
    return rc;
}

}  // namespace

int WSQL_SetupGetMethod(WSQL_HttpServer* http, WSQL_Request_t* req) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    GetCtx g{http, req, {}};
    int rc = PFM1_Guard("WSQL_SetupGetMethod", [&]() { return getDefaults(g); });
    if (rc == PFM1_ABEND) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Abend detected processing CT_Get Method values");
        http->setRequestError(true, "CT_Get Method values abnormal end", nullptr, 0);
    } else if (rc == kInvalid) {
        RAS1_Printf(RAS1_THIS, __LINE__, "%s Request %.16s %.16s", g.message, req->clientHost, req->userid);
        http->setRequestError(true, g.message, nullptr, 0);
    } else if (rc == WSQL_NOMEM) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Insufficient resources for CT_Get default values");
        http->setRequestMemoryError();
    } else if (rc != WSQL_OK) {
        char msg[80];
        snprintf(msg, sizeof msg, "CT_Get method setup processing error. %d", rc);
        RAS1_Printf(RAS1_THIS, __LINE__, "%s Request %.16s %.16s", msg, req->clientHost, req->userid);
        http->setRequestError(true, msg, nullptr, 0);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
