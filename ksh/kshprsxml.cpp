// kshprsxml: parsing of a SOAP document into a WSQL_Request_t: the method
// element (CTMethods) and the elements of the request, read in a fixed
// order by the handlers of one table.
//
// Strings stored in the record point into the document's node values (which
// are split in place where a value holds several parts) or are static texts.
#include <climits>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "kshhttp.h"
#include "kshprs.h"
#include "kshprsint.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshprsxml");

const WSQL_CTMethod CTMethods[] = {
    {"CT_EMail", "start", WSQL_METHOD_EMAIL},
    {"CT_Email", "start", WSQL_METHOD_EMAIL},
    {"CT_Affinity", "start", WSQL_METHOD_AFFINITY},
    {"CT_Export", "start", WSQL_METHOD_EXPORT},
    {"CT_Redirect", "start", WSQL_METHOD_REDIRECT},
    {"CT_Execute", "start", WSQL_METHOD_EXECUTE},
    {"CT_Get", "start", WSQL_METHOD_GET},
    {"CT_Alert", "insert", WSQL_METHOD_ALERT},
    {"CT_Acknowledge", "insert", WSQL_METHOD_ACKNOWLEDGE},
    {"CT_Reset", "insert", WSQL_METHOD_RESET},
    {"CT_Resurface", "insert", WSQL_METHOD_RESURFACE},
    {"CT_SQL", "sql", WSQL_METHOD_SQL},
    {"CT_WTO", "start", WSQL_METHOD_WTO},
    {"CT_Activate", "insert", WSQL_METHOD_ACTIVATE},
    {"CT_Deactivate", "insert", WSQL_METHOD_DEACTIVATE},
    {"CT_Thresholds", "start", WSQL_METHOD_THRESHOLDS},
    {"CT_Login", "login", WSQL_METHOD_LOGIN},
    {"CT_Action", "", WSQL_METHOD_ACTION},
    {nullptr, nullptr, 0},
};

namespace {

// Result of a handler that refused the request.
constexpr int kRefused = 1;

// The action strings of an "action" element and their bits.
const struct {
    const char* name;
    uint32_t bit;
} kActionBits[] = {
    {"start", WSQL_ACTION_START},   {"insert", WSQL_ACTION_INSERT}, {"delete", WSQL_ACTION_DELETE},
    {"update", WSQL_ACTION_UPDATE}, {"events", WSQL_ACTION_EVENTS},
};

// CT_Alert "type" texts and the TYPE values they give; anything else is "0".
const struct {
    const char* text;
    const char* value;
} kAlertTypes[] = {
    {"sampled", "0"}, {"0", "0"}, {"pure", "1"}, {"1", "1"}, {"meta", "2"}, {"2", "2"},
};

// The threshold elements read when no "overrides" are given, in order.
const struct {
    const char* tag;
    uint32_t bit;
    bool qualified;  // OBJECT.COLUMN: the column is stored, the object may name the table
} kThresholdTags[] = {
    {"keyname", WSQL_ELEM_KEYNAME, true},
    {"keyvalue", WSQL_ELEM_KEYVALUE, false},
    {"thresholdname", WSQL_ELEM_THRESHOLDNAME, true},
    {"thresholdvalue", WSQL_ELEM_THRESHOLDVALUE, false},
    {"thresholddefault", WSQL_ELEM_THRESHOLDDEFAULT, false},
};

struct ParseCtx {
    WSQL_HttpServer* http;
    WSQL_Hub* hub;
    WSQL_Request_t* req;
    char** action;
    KSH_XML* doc;

    bool isStatus() const { return (req->methods & WSQL_METHODS_STATUS) != 0; }
    bool isActivation() const { return (req->methods & WSQL_METHODS_ACTIVATION) != 0; }
    bool isThresholds() const { return (req->methods & WSQL_METHOD_THRESHOLDS) != 0; }
    bool isWTO() const { return (req->methods & WSQL_METHOD_WTO) != 0; }
    bool isGet() const { return (req->methods & WSQL_METHOD_GET) != 0; }
    bool hasAction() const { return (req->methods & WSQL_METHOD_ACTION) != 0; }
    const char* client() const { return req->clientHost; }
};

// The text of the first element named `tag` (document order), or null when
// there is none or it is empty.
char* textOf(ParseCtx& c, const char* tag) {
    char* value = nullptr;
    unsigned length = 0;
    if (c.doc->getElementValue(tag, &value, &length) != WSQL_OK || value == nullptr) return nullptr;
    return value;
}

// The first element named `tag`, or null.
KSH_DOMNode* elementOf(ParseCtx& c, const char* tag) {
    if (c.doc->getElementValue(tag, nullptr, nullptr) != WSQL_OK) return nullptr;
    return c.doc->getCurrent();
}

char* valueOf(KSH_DOMNode* node) {
    char* v = node ? node->getValue() : nullptr;
    return v ? v : WSQL_Literal("");
}

// Records a refusal: the trace line, and the client fault that tells the
// client why (a refusal is never answered as an empty success).
int refuse(ParseCtx& c, const char* fault, const char* detail) {
    c.http->setRequestError(true, fault, detail, 0);
    return kRefused;
}

int refuseTooManyParma(ParseCtx& c) {
    RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s has too many parma settings.", c.client());
    return refuse(c, "Too many parma settings in request.", nullptr);
}

int refuseTooManyColumns(ParseCtx& c) {
    RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s has too many column values.", c.client());
    return refuse(c, "Too many column values in request.", nullptr);
}

// Adds a column/value pair. A full list drops the pair, or refuses the
// request when `required`.
int addPair(ParseCtx& c, const char* column, char* value, bool required) {
    if (WSQL_AddColumnValue(c.req, WSQL_Literal(column), value) == WSQL_OK) return WSQL_OK;
    return required ? refuseTooManyColumns(c) : WSQL_OK;
}

// ------------------------------------------------------------ handlers

int readTable(ParseCtx& c) {
    if (char* t = textOf(c, "table")) c.req->table = t;
    if (char* o = textOf(c, "object")) {
        c.req->table = o;
        c.req->elements |= WSQL_ELEM_OBJECT;
    }
    return WSQL_OK;
}

int readResults(ParseCtx& c) {
    char* t = textOf(c, "results");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_RESULTS;
    if (c.isStatus()) return addPair(c, "RESULTS", t, false);
    if (WSQL_CaseCompare(t, "parse") == 0) c.req->parse = 1;
    return WSQL_OK;
}

int readTimestamp(ParseCtx& c) {
    char* t = textOf(c, "timestamp");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_TIMESTAMP;
    return c.isStatus() ? addPair(c, "LCLTMSTMP", t, false) : WSQL_OK;
}

int readIntv(ParseCtx& c) {
    if (char* t = textOf(c, "intv")) c.req->intv = static_cast<int32_t>(strtol(t, nullptr, 10));
    return WSQL_OK;
}

int readTarget(ParseCtx& c) {
    char* t = textOf(c, "targets");
    if (t == nullptr) t = textOf(c, "target");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_TARGET;
    c.req->target = t;
    if (WSQL_AddParma(c.req, WSQL_Literal("NODELIST"), t) != WSQL_OK) return refuseTooManyParma(c);
    if (c.isGet() && strcmp(t, "*ALL") == 0) c.req->type |= WSQL_TYPE_ALLTARGETS;
    return WSQL_OK;
}

int readParma(ParseCtx& c) {
    unsigned count = 0;
    for (int rc = c.doc->getArray("parma", &count); rc == WSQL_OK; rc = c.doc->nextNode()) {
        char* text = valueOf(c.doc->getCurrent());
        char* parts[2];
        if (!WSQL_SplitAtSemicolons(text, 1, parts)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s has incorrectly formatted parma.", c.client());
            return refuse(c, "Incorrectly formatted parma in request.", text);
        }
        if (WSQL_AddParma(c.req, parts[0], parts[1]) != WSQL_OK) return refuseTooManyParma(c);
    }
    return WSQL_OK;
}

// A filter value may hold a date/time stamp variable ($yymmdd$ ...): it is
// replaced, in place, by the current date and time, so that the value
// compares with the stored timestamps. The expanded text is always shorter
// than the variable (two dollar signs go, each token gives two digits).
// 0, or 6 for a malformed variable (the value stays as it was).
int expandDateTime(char* value) {
    dateTimeVariableParms parms;
    unsigned st = parseDateTimeVariable(value, &parms);
    if (st == WSQL_NOTFOUND) return WSQL_OK;
    if (st != WSQL_OK) return static_cast<int>(st);
    size_t n = strlen(value);
    std::vector<char> out(n + 1);
    insertDateTimeValue(value, out.data(), &parms);
    size_t m = strnlen(out.data(), n + 1);
    if (m <= n) memcpy(value, out.data(), m + 1);
    return WSQL_OK;
}

int readFilters(ParseCtx& c) {
    unsigned count = 0;
    unsigned char isAfilter = 0;
    int rc = c.doc->getArray("filter", &count);
    if (rc != WSQL_OK) {
        isAfilter = 1;
        rc = c.doc->getArray("afilter", &count);
    }
    for (; rc == WSQL_OK; rc = c.doc->nextNode()) {
        char* text = valueOf(c.doc->getCurrent());
        char* parts[3];
        if (c.req->numFilters >= WSQL_MAX_FILTERS || !WSQL_SplitAtSemicolons(text, 2, parts)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Malformed filter: %s", text);
            return refuse(c, c.req->numFilters >= WSQL_MAX_FILTERS ? "Too many filters in request."
                                                                   : "Malformed filter in request.",
                          text);
        }
        (void)WSQL_AddFilter(c.req, parts[0], parts[1], parts[2], isAfilter);
        int st = expandDateTime(parts[2]);
        if (st != WSQL_OK) {
            c.http->setRequestError(true, "Invalid afilter date/time stamp variable.", parts[2], 0);
            return st;
        }
    }
    return WSQL_OK;
}

int readHub(ParseCtx& c) {
    if (char* t = textOf(c, "hub")) c.req->hubAlias = t;
    return WSQL_OK;
}

int readName(ParseCtx& c) {
    char* t = textOf(c, "name");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_NAME;
    if (c.hasAction()) {
        if (WSQL_AddParma(c.req, WSQL_Literal("SITNAME"), t) != WSQL_OK) return refuseTooManyParma(c);
    } else if (c.isStatus()) {
        c.req->statusSitName = t;
        return addPair(c, "SITNAME", t, true);
    } else if (c.isActivation()) {
        return addPair(c, "OBJNAME", t, true);
    } else if (c.isThresholds()) {
        if (WSQL_AddFilter(c.req, WSQL_Literal("name"), nullptr, t, 0) != WSQL_OK) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s CT_Threhold has too many tag values.", c.client());
            return refuse(c, "Too many tag values in request.", nullptr);
        }
    }
    return WSQL_OK;
}

int readSource(ParseCtx& c) {
    char* t = textOf(c, "source");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_SOURCE;
    if (c.hasAction()) return WSQL_OK;
    if (c.isStatus()) return addPair(c, "ORIGINNODE", t, true);
    if (c.isActivation()) return addPair(c, "NODEL", t, true);
    return WSQL_OK;
}

int readXslHistory(ParseCtx& c) {
    if (char* t = textOf(c, "xsl")) c.http->addXSLReference(t);
    if (char* t = textOf(c, "history")) c.req->history = (t[0] == 'Y' || t[0] == 'y') ? 1 : 0;
    return WSQL_OK;
}

int readAction(ParseCtx& c) {
    char* t = textOf(c, "action");
    if (t != nullptr) {
        *c.action = t;
        c.req->methods |= WSQL_METHOD_ACTION;
        for (const auto& a : kActionBits)
            if (strcmp(t, a.name) == 0) c.req->methods |= a.bit;
    } else if (c.isGet()) {
        *c.action = WSQL_Literal("start");
        c.req->methods |= WSQL_ACTION_START;
    }
    return WSQL_OK;
}

// The selected columns: "column" elements, or "attribute" elements
// (OBJECT.ATTRIBUTE). Only for a "start" action; more than 200 are ignored.
int readColumns(ParseCtx& c) {
    if ((c.req->methods & WSQL_ACTION_START) == 0) return WSQL_OK;
    unsigned count = 0;
    int rc = c.doc->getArray("column", &count);
    c.req->attributeForm = 0;
    if (rc != WSQL_OK) {
        rc = c.doc->getArray("attribute", &count);
        if (rc == WSQL_OK) c.req->attributeForm = 1;
    }
    for (; rc == WSQL_OK && c.req->numColumns < WSQL_MAX_COLUMNS; rc = c.doc->nextNode()) {
        // An empty element names no column. (Names are cleaned in place
        // later, so a column must point into the document, never at a
        // static text.)
        KSH_DOMNode* node = c.doc->getCurrent();
        if (node == nullptr || node->getValueLength() == 0) continue;
        char* text = node->getValue();
        if (c.req->attributeForm) {
            if (char* dot = strchr(text, '.')) {
                *dot = '\0';
                if (c.req->table == nullptr) {
                    c.req->table = text;
                    c.req->elements |= WSQL_ELEM_OBJECT;
                }
                text = dot + 1;
            }
        }
        c.req->columns[c.req->numColumns++] = text;
    }
    return WSQL_OK;
}

int readSqlThrunode(ParseCtx& c) {
    if (char* t = textOf(c, "sql")) c.req->sql = t;
    if (char* t = textOf(c, "thrunode")) c.req->thrunode = t;
    return WSQL_OK;
}

int readData(ParseCtx& c) {
    if (c.isWTO()) {
        char* t = textOf(c, "data");
        if (t == nullptr) return WSQL_OK;
        c.req->elements |= WSQL_ELEM_DATA;
        if (WSQL_AddFilter(c.req, WSQL_Literal("data"), nullptr, t, 0) != WSQL_OK)
            return refuse(c, "Too many filters in request.", nullptr);
        return WSQL_OK;
    }
    if (!c.isStatus()) return WSQL_OK;
    KSH_DOMNode* data = elementOf(c, "data");
    if (data == nullptr) return WSQL_OK;
    if (data->getNumChildren() == 0) {
        if (data->getValueLength() == 0) return WSQL_OK;  // an empty element counts as absent
        c.req->elements |= WSQL_ELEM_DATA;
        return addPair(c, "RESULTS", data->getValue(), false);
    }
    c.req->elements |= WSQL_ELEM_DATA;
    for (KSH_DOMNode* item = data->getFirstChild(); item != nullptr && c.req->numDataItems < WSQL_MAX_DATAITEMS;
         item = data->getNextChild()) {
        WSQL_Filter_t& f = c.req->dataItems[c.req->numDataItems++];
        f.column = item->getName();
        f.oper = WSQL_Literal("=");
        f.value = valueOf(item);
    }
    return WSQL_OK;
}

int readExpire(ParseCtx& c) {
    if (char* t = textOf(c, "expire")) c.req->expire = t;
    return WSQL_OK;
}

// The first "row": each immediate "column" child with a "name" attribute
// is a column of that name with the child's text as value.
int readRow(ParseCtx& c) {
    KSH_DOMNode* row = elementOf(c, "row");
    if (row == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_ROW;
    c.req->rowNumber = 1;
    for (KSH_DOMNode* col = row->getFirstChild(); col != nullptr; col = row->getNextChild()) {
        char* name = nullptr;
        if (strcmp(col->getName(), "column") != 0 || col->getAttribute("name", &name) != WSQL_OK) continue;
        if (WSQL_AddColumnValue(c.req, name, valueOf(col)) != WSQL_OK) return refuseTooManyColumns(c);
    }
    return WSQL_OK;
}

int readSeverityCategory(ParseCtx& c) {
    if (!c.isWTO()) return WSQL_OK;
    static const struct {
        const char* tag;
        uint32_t bit;
    } kTags[] = {{"severity", WSQL_ELEM_SEVERITY}, {"category", WSQL_ELEM_CATEGORY}};
    for (const auto& t : kTags) {
        char* text = textOf(c, t.tag);
        if (text == nullptr) continue;
        c.req->elements |= t.bit;
        if (WSQL_AddFilter(c.req, WSQL_Literal(t.tag), nullptr, text, 0) != WSQL_OK)
            return refuse(c, "Too many filters in request.", nullptr);
    }
    return WSQL_OK;
}

int readItem(ParseCtx& c) {
    char* t = textOf(c, "item");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_ITEM;
    return c.isStatus() ? addPair(c, "ATOMIZE", t, false) : WSQL_OK;
}

int readType(ParseCtx& c) {
    char* t = textOf(c, "type");
    if (t == nullptr) return WSQL_OK;
    c.req->elements |= WSQL_ELEM_TYPE;
    if (c.isActivation())
        return addPair(c, "OBJCLASS", WSQL_Literal(WSQL_CaseCompare(t, "policy") == 0 ? "5130" : "5140"), false);
    if (c.req->methods & WSQL_METHOD_ALERT) {
        const char* value = "0";
        for (const auto& a : kAlertTypes)
            if (WSQL_CaseCompare(t, a.text) == 0) value = a.value;
        return addPair(c, "TYPE", WSQL_Literal(value), false);
    }
    if (c.isStatus()) {
        c.req->elements &= ~WSQL_ELEM_TYPE;
        int ras = RAS1_Sync(RAS1_THIS);
        if (ras & RAS1_STATE)
            RAS1_Printf(RAS1_THIS, __LINE__,
                        "Ignoring Type tag. Not applicable for update status history. value=%s", t);
    }
    return WSQL_OK;
}

int readCredentials(ParseCtx& c) {
    if (char* t = textOf(c, "userid")) {
        c.req->elements |= WSQL_ELEM_USERID;
        size_t n = strlen(t);
        if (n > WSQL_CREDENTIAL_SIZE) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s Userid '%.16s...' Length exceeds %d.", c.client(), t,
                        WSQL_CREDENTIAL_SIZE);
            return refuse(c, "Userid length exceeds 16 characters.", nullptr);
        }
        memcpy(c.req->userid, t, n);
    }
    if (char* t = textOf(c, "password")) {
        c.req->elements |= WSQL_ELEM_PASSWORD;
        size_t n = strlen(t);
        if (n > WSQL_CREDENTIAL_SIZE) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s Password Length %d exceeds %d.", c.client(),
                        static_cast<int>(n), WSQL_CREDENTIAL_SIZE);
            return refuse(c, "Password length exceeds 16 characters.", nullptr);
        }
        memcpy(c.req->password, t, n);
    }
    return WSQL_OK;
}

int readPersist(ParseCtx& c) {
    if (c.doc->testElement("PersistRequest") == WSQL_OK) c.req->elements |= WSQL_ELEM_PERSIST;
    if (char* t = textOf(c, "handle")) c.req->requestHandle = t;
    return WSQL_OK;
}

// The XML text of the children of `node`: the node is serialised and its own
// start tag, text and end tag are cut off, leaving the children's markup in
// document order. Null when the document cannot serialise it.
char* childrenXML(KSH_XML* doc, KSH_DOMNode* node) {
    size_t inner = 0;
    for (KSH_DOMNode* ch = node->getFirstChild(); ch != nullptr; ch = node->getNextChild())
        inner += KSH_XML::measureXML(ch);
    char* text = nullptr;
    unsigned length = 0;
    if (doc->extractMessage(node, &text, &length) != WSQL_OK || text == nullptr) return nullptr;
    size_t closeTag = node->fullNameLength() + 3;  // "</" NAME ">"
    if (inner + closeTag > length) return nullptr;
    char* start = text + (length - closeTag - inner);
    start[inner] = '\0';
    return start;
}

int readThresholds(ParseCtx& c) {
    if (!c.isThresholds()) return WSQL_OK;
    if (KSH_DOMNode* ov = elementOf(c, "overrides")) {
        char* xml = childrenXML(c.doc, ov);
        if (xml == nullptr) {
            c.http->setRequestMemoryError();
            return kRefused;
        }
        c.req->elements |= WSQL_ELEM_OVERRIDES;
        c.req->type |= WSQL_TYPE_OVERRIDES;
        if (WSQL_AddFilter(c.req, WSQL_Literal("overrides"), nullptr, xml, 0) != WSQL_OK) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Request %.16s CT_Threhold has too many tag values.", c.client());
            return refuse(c, "Too many tag values in request.", nullptr);
        }
        return WSQL_OK;
    }
    for (const auto& t : kThresholdTags) {
        if (c.req->numFilters >= WSQL_MAX_FILTERS) break;
        char* text = textOf(c, t.tag);
        if (text == nullptr) continue;
        c.req->elements |= t.bit;
        if (t.qualified) {
            if (char* dot = strchr(text, '.')) {
                *dot = '\0';
                if (c.req->table == nullptr) c.req->table = text;
                text = dot + 1;
            }
        }
        (void)WSQL_AddFilter(c.req, WSQL_Literal(t.tag), nullptr, text, 0);
    }
    return WSQL_OK;
}

// The readers in the order the elements are looked up.
int (*const kParseTable[])(ParseCtx&) = {
    readTable,  readResults, readTimestamp,   readIntv,     readTarget,     readParma,
    readFilters, readHub,    readName,        readSource,   readXslHistory, readAction,
    readColumns, readSqlThrunode, readData,   readExpire,   readRow,        readSeverityCategory,
    readItem,   readType,    readCredentials, readPersist,  readThresholds,
};

// ------------------------------------------------------------ the method

// Descends from `node` through first children until an element is a CT
// method; fills the action, the method bit and the type bit. False when
// none is found.
bool findMethod(ParseCtx& c, KSH_DOMNode* node) {
    int ras = RAS1_Sync(RAS1_THIS);
    for (; node != nullptr; node = node->getFirstChild()) {
        for (const WSQL_CTMethod* m = CTMethods; m->tag != nullptr; ++m) {
            if (strcmp(node->getName(), m->tag) != 0) continue;
            *c.action = WSQL_Literal(m->action);
            c.req->methods |= m->bit;
            c.req->type |= WSQL_TYPE_SOAP;
            if (ras & RAS1_STATE)
                RAS1_Printf(RAS1_THIS, __LINE__, "CT_Method '%s' default action '%s' type 0x%x", m->tag, m->action,
                            c.req->type);
            char* value = nullptr;
            if (node->getAttribute("persist", &value) == WSQL_OK && WSQL_CaseCompare(value, "yes") == 0)
                c.req->elements |= WSQL_ELEM_PERSIST;
            if (node->getAttribute("handle", &value) == WSQL_OK) {
                c.req->requestHandle = value;
                if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "requestHandle:  \"%s\"", value);
            }
            return true;
        }
    }
    return false;
}

int parseDocument(ParseCtx& c, char* buffer, unsigned long length) {
    int ras = RAS1_Sync(RAS1_THIS);
    static char empty[] = "";
    if (buffer == nullptr) {
        buffer = empty;
        length = 0;
    }
    int st = length > UINT_MAX ? WSQL_BADINPUT : c.doc->parseMessage(buffer, static_cast<unsigned>(length));
    if (st != WSQL_OK) {
        if (ras & RAS1_ERROR) RAS1_Printf(RAS1_THIS, __LINE__, "xmlParserStatus:  %d\n", st);
        return refuse(c, "XML parse error", c.doc->getParseError());
    }
    KSH_DOMNode* top = c.doc->getRoot();
    if (top == nullptr) return refuse(c, "XML parse error", nullptr);
    KSH_DOMNode* start = top;
    if (strcmp(top->getName(), "SOAP-ENV:Envelope") == 0) {
        if (c.doc->getElementValue("SOAP-ENV:Body", nullptr, nullptr, nullptr, top) != WSQL_OK)
            return refuse(c, "Invalid SOAP message", nullptr);
        start = c.doc->getCurrent()->getFirstChild();
    }
    if (!findMethod(c, start)) return WSQL_OK;  // no method: refused by the caller
    if (c.req->methods & WSQL_METHODS_SPECIAL) return WSQL_OK;  // their classes read the document
    for (auto reader : kParseTable) {
        int rc = reader(c);
        if (rc != WSQL_OK) return rc;
    }
    return WSQL_OK;
}

}  // namespace

int WSQL_ParseSoapRequest(WSQL_HttpServer* http, WSQL_Hub* hub, char*& buffer, unsigned long* length,
                          WSQL_Request_t* req, char** action, KSH_XML* doc) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    ParseCtx c{http, hub, req, action, doc};
    char* body = buffer;
    unsigned long n = length ? *length : 0;
    int rc = PFM1_Guard("WSQL_ParseSoapRequest", [&]() { return parseDocument(c, body, n); });
    if (rc == PFM1_ABEND) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Abend detected parsing Client Data");
        http->setRequestError(false, "Internal error parsing client XML request.", nullptr, 0);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
