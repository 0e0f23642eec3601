// kshreqout: result rows of a request written as XML into the HTTP
// object's response, the events form, and rows turned into topology objects
// (see kshreq.h).
//
// Shapes: <TABLE name="T">\n<OBJECT>O</OBJECT>\n<DATA>\n<ROW>\n<ATTR>v</ATTR>\n
// ...</ROW>\n</DATA>\n</TABLE>\n. Character values that hold markup
// characters go into CDATA sections; a "]]>" inside one is split so that
// the section cannot end early. Element names come from the catalog or the
// result columns; a name that is not an XML name is written with its other
// characters replaced by '_'.
#include <cctype>
#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "kshcat.h"
#include "kshcol.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshlst.h"
#include "kshreq.h"
#include "kshtab.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshreqout");

namespace {

// The namespace URN behind the dt prefix of query-string responses.
const char kDatatypesURN[] = "urn:createsit:xml-data:datatypes";

// Stands for a result column the catalog does not know (non-dynamic tables).
WSQL_Column& unknownColumn() {
    static WSQL_Column* c = [] {
        auto* col = new WSQL_Column("UNKNOWN", "Unknown_Attribute", false);
        col->SetType(452);
        return col;
    }();
    return *c;
}

int baseType(int t) { return t > 383 ? (t & ~1) : t; }

bool isNumberType(int t) { return t == 500 || t == 2 || t == 496 || t == 1006 || t == 492 || t == 1032; }

const char* unqualified(const char* name) {
    const char* dot = std::strchr(name, '.');
    return dot != nullptr ? dot + 1 : name;
}

bool isXmlNameChar(unsigned char c, bool first) {
    if (std::isalpha(c) || c == '_' || c == ':') return true;
    return !first && (std::isdigit(c) || c == '-' || c == '.');
}

bool isXmlName(const char* s) {
    if (s == nullptr || *s == '\0') return false;
    for (const char* p = s; *p != '\0'; p++) {
        if (!isXmlNameChar(static_cast<unsigned char>(*p), p == s)) return false;
    }
    return true;
}

// An element name for `name`: invalid characters become '_'.
std::string tagName(const char* name) {
    std::string t = name != nullptr && *name != '\0' ? name : "_";
    for (size_t i = 0; i < t.size(); i++) {
        if (!isXmlNameChar(static_cast<unsigned char>(t[i]), i == 0)) t[i] = '_';
    }
    return t;
}

// The element name of a catalog column: its attribute name, else its column name.
std::string columnTag(WSQL_Column* col) { return tagName(col->HasAttrName() && *col->AttrName() ? col->AttrName() : col->ColName()); }

bool needsCData(const std::string& v, bool highBytes) {
    for (unsigned char c : v) {
        if (c < 0x20 && c != '\t' && c != '\n' && c != '\r') return true;
        if (c == '"' || c == '&' || c == '\'' || c == '<' || c == '>') return true;
        if (highBytes && c >= 0x80) return true;
    }
    return false;
}

// "a]]>b" becomes two sections, "a]]" and ">b".
std::string cdata(const std::string& v) {
    std::string out = "<![CDATA[";
    size_t from = 0;
    for (size_t at; (at = v.find("]]>", from)) != std::string::npos; from = at + 2) out += v.substr(from, at + 2 - from) + "]]><![CDATA[";
    out += v.substr(from) + "]]>";
    return out;
}

std::string trimmed(const char* data, size_t n) {
    while (n > 0 && data[n - 1] == ' ') n--;
    return std::string(data, n);
}

// Current length of an output value, never past its buffer.
size_t valueLength(const SQL1_SqlVar& v) { return v.data == nullptr || v.nullInd < 0 ? 0 : v.length; }

}  // namespace

// ---------------------------------------------------------------------------
// Integers
// ---------------------------------------------------------------------------

int WSQL_Request::getInt(const char* data, int length) {
    int ras = RAS1_Sync(RAS1_THIS);
    switch (length) {
    case 1: return static_cast<int8_t>(data[0]);
    case 2: {
        int16_t v;
        std::memcpy(&v, data, sizeof v);
        return v;
    }
    case 4: {
        int32_t v;
        std::memcpy(&v, data, sizeof v);
        return v;
    }
    default:
        RAS1_TRACE_IF(ras, RAS1_ERROR, "Unsupported integer requested, length=%d", length);
        return 0;
    }
}

long long WSQL_Request::getBigInt(const char* data, int length) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (length != 8) {
        RAS1_TRACE_IF(ras, RAS1_ERROR, "Unsupported big integer requested, length=%d", length);
        return 0;
    }
    int64_t v;
    std::memcpy(&v, data, sizeof v);
    return v;
}

// ---------------------------------------------------------------------------
// Rows
// ---------------------------------------------------------------------------

int WSQL_Request::cacheAttributes(LinkedList* list, SQL1_Sqlda* da) {
    int ras = RAS1_Sync(RAS1_THIS);
    for (int i = 0; i < da->used; i++) {
        const SQL1_SqlVar& v = da->var[i];
        const char* name = unqualified(v.name);
        WSQL_Column* col = table != nullptr ? table->GetColumn(name) : nullptr;
        if (col != nullptr) {
            col->SetType(v.type);
        } else if (table != nullptr && table->dynamicAdd()) {
            col = WSQL_AddDynamicColumn(table, name, v.type);
        }
        if (col == nullptr) {
            RAS1_TRACE_IF(ras, RAS1_STATE, "Unable to find attr: %s", name);
            col = &unknownColumn();
        }
        if (list->AppendEntry(col) != 0) return WSQL_NOMEM;
    }
    return 0;
}

namespace {

// Integer of scale `scale` as text: "%d", or divided by 10^scale.
std::string scaledInt(long long v, int scale) {
    char buf[64];
    if (scale <= 0) {
        std::snprintf(buf, sizeof buf, "%lld", v);
    } else {
        std::snprintf(buf, sizeof buf, "%.*lf", scale, static_cast<double>(v) / std::pow(10.0, scale));
    }
    return buf;
}

// A 64-bit integer with a decimal point `scale` digits from the right.
std::string scaledBigInt(long long v, int scale) {
    char digits[32];
    std::snprintf(digits, sizeof digits, "%lld", v);
    if (scale <= 0) return digits;
    bool neg = v < 0;
    const char* d = neg ? digits + 1 : digits;
    int n = static_cast<int>(std::strlen(d));
    char buf[96];
    if (n > scale) {
        std::snprintf(buf, sizeof buf, "%s%.*s.%.*s", neg ? "-" : "", n - scale, d, scale, d + n - scale);
    } else {
        std::string zeros(static_cast<size_t>(scale - n), '0');
        std::snprintf(buf, sizeof buf, "%s0.%s%s", neg ? "-" : "", zeros.c_str(), d);
    }
    return buf;
}

std::string withEnum(WSQL_Column* col, const std::string& text) {
    return col->Enumerated() ? std::string(col->GetEnumeration(text.c_str())) : text;
}

}  // namespace

int WSQL_Request::writeValue(SQL1_SqlVar* var, WSQL_Column* col, char* title, size_t titleSize, char* node,
                             size_t nodeSize) {
    int ras = RAS1_Sync(RAS1_THIS);
    int t = baseType(var->type);
    size_t n = valueLength(*var);
    if (var->nullInd < 0) return 0;
    int scale = col->GetScale();
    char buf[64];
    switch (t) {
    case 500:
    case 496: {
        int v = getInt(var->data, static_cast<int>(n));
        return http->appendText(scale > 0 ? scaledInt(v, scale).c_str() : withEnum(col, scaledInt(v, 0)).c_str());
    }
    case 492: {
        long long v = getBigInt(var->data, static_cast<int>(n));
        return http->appendText(scale > 0 ? scaledBigInt(v, scale).c_str() : withEnum(col, scaledBigInt(v, 0)).c_str());
    }
    case 2:
    case 1006: {
        // Unsigned integers are written as numbers, not as their bytes.
        unsigned long v = 0;
        if (n == 2) {
            uint16_t u;
            std::memcpy(&u, var->data, 2);
            v = u;
        } else if (n == 4) {
            uint32_t u;
            std::memcpy(&u, var->data, 4);
            v = u;
        }
        std::snprintf(buf, sizeof buf, "%lu", v);
        return http->appendText(withEnum(col, buf).c_str());
    }
    case 1032: {
        uint64_t u = 0;
        if (n == 8) std::memcpy(&u, var->data, 8);
        std::snprintf(buf, sizeof buf, "%" PRIu64, u);
        return http->appendText(buf);
    }
    case 480:
    case 1000: {
        double d = 0;
        if (n == 8) std::memcpy(&d, var->data, 8);
        std::snprintf(buf, sizeof buf, "%.17g", d);
        return http->appendText(buf);
    }
    case 1008: {
        if (n < 5) {
            unsigned v = 0;
            for (size_t i = 0; i < n; i++) v |= static_cast<unsigned>(static_cast<unsigned char>(var->data[i])) << (8 * i);
            std::snprintf(buf, sizeof buf, "%x", v);
            return http->appendText(withEnum(col, buf).c_str());
        }
        // Longer binary values as hexadecimal digits: raw bytes are no text.
        std::string hex;
        for (size_t i = 0; i < n; i++) {
            std::snprintf(buf, sizeof buf, "%02x", static_cast<unsigned char>(var->data[i]));
            hex += buf;
        }
        return http->appendText(hex.c_str());
    }
    case 1022:
    case 1018: {
        if (t == 1018 && var->length > var->maxLength) {
            RAS1_TRACE_IF(ras, RAS1_ERROR, "Invalid Length - %d  Max Length - %d New Length - 0", var->length,
                          var->maxLength);
            return 0;
        }
        std::string v = trimmed(var->data, n);
        return http->appendUTF8(needsCData(v, false) ? cdata(v).c_str() : v.c_str());
    }
    default:
        return writeCharValue(var, col, t, title, titleSize, node, nodeSize);
    }
}

int WSQL_Request::writeCharValue(SQL1_SqlVar* var, WSQL_Column* col, int t, char* title, size_t titleSize, char* node,
                                 size_t nodeSize) {
    int ras = RAS1_Sync(RAS1_THIS);
    size_t n = valueLength(*var);
    if (t == 448 && var->length > var->maxLength) {
        RAS1_TRACE_IF(ras, RAS1_ERROR, "Invalid Length - %d  Max Length - %d  New Length - 0", var->length, var->maxLength);
        n = 0;
    }
    std::string v = withEnum(col, trimmed(var->data, n));
    const char* colName = unqualified(var->name);
    if (title != nullptr) {
        if (WSQL_CaseCompare(colName, "APPL_NAME") == 0) {
            std::snprintf(title, titleSize, "%s.", v.c_str());
        } else if (WSQL_CaseCompare(colName, "TABL_NAME") == 0) {
            size_t used = std::strlen(title);
            std::snprintf(title + used, titleSize - used, "%s", v.c_str());
            WSQL_Table* named = WSQL_GetCatalog() != nullptr ? WSQL_GetCatalog()->GetTable(title) : nullptr;
            if (named != nullptr) std::snprintf(title, titleSize, "%s", named->ObjectName());
        }
    }
    if (node != nullptr) {
        if (WSQL_CaseCompare(colName, "NODE") == 0) {
            std::snprintf(node, nodeSize, "%s", v.c_str());
        } else if (WSQL_CaseCompare(colName, "THRUNODE") == 0 && v != hub->getNodeID() && !v.empty()) {
            Node* cached = hub->lookupCachedNode(v.c_str());
            if (cached != nullptr && cached->getThrunode()[0] != '\0' &&
                std::strcmp(cached->getThrunode(), cached->getName()) != 0) {
                RAS1_TRACE_IF(ras, RAS1_STATE, "Changing thrunode of %s from %s to %s", node, v.c_str(),
                              cached->getThrunode());
                v = cached->getThrunode();
            }
        }
    }
    return http->append(needsCData(v, true) ? cdata(v).c_str() : v.c_str());
}

int WSQL_Request::writeRow(SQL1_Sqlda* da, LinkedList* list) {
    int rc = http->append("<ROW>\n");
    const char* tableName = table != nullptr ? table->TableName() : "";
    char titleBuf[160] = "";
    char nodeBuf[34] = "";
    char* title = WSQL_CaseCompare(tableName, "SYSTEM.SYSTABLES") == 0 ? titleBuf : nullptr;
    char* node = table != nullptr && table->dynamicAdd() && WSQL_CaseCompare(tableName, "O4SRV.INODESTS") == 0 ? nodeBuf
                                                                                                               : nullptr;
    LinkedListIter it(list);
    for (int i = 0; i < da->used && rc == 0; i++) {
        auto* col = static_cast<WSQL_Column*>(it.Next());
        if (col == nullptr) break;
        SQL1_SqlVar* var = &da->var[i];
        std::string tag = columnTag(col);
        rc = http->append(("<" + tag + (isNumberType(baseType(var->type)) ? " dt=\"number\"" : "") + ">").c_str());
        if (rc != 0) break;
        if (parse && WSQL_CaseCompare(unqualified(var->name), "RESULTS") == 0) {
            if (var->length <= var->maxLength && var->nullInd >= 0) {
                std::string work(var->data, valueLength(*var));
                std::string scratch(work.size() + 1, '\0');
                (void)writeResultColumn(work.data(), work.size(), scratch.data());
            }
        } else {
            rc = writeValue(var, col, title, sizeof titleBuf, node, sizeof nodeBuf);
        }
        if (rc == 0) rc = http->append(("</" + tag + ">\n").c_str());
    }
    if (rc == 0 && title != nullptr && title[0] != '\0') {
        rc = http->append("<Title>");
        if (rc == 0) rc = http->appendText(title);
        if (rc == 0) rc = http->append("</Title>");
    }
    if (rc == 0) rc = http->append("</ROW>\n");
    return rc;
}

// ---------------------------------------------------------------------------
// Packed situation status results
// ---------------------------------------------------------------------------

namespace {

// Writes "<TABLE name=...>" with the table's names escaped.
void openTableElement(WSQL_HttpServer* http, WSQL_Table* t, bool withData) {
    (void)http->append("<TABLE name=\"");
    (void)http->appendText(t->TableName());
    (void)http->append("\">\n<OBJECT>");
    (void)http->appendText(t->ObjectName());
    (void)http->append(withData ? "</OBJECT>\n<DATA>\n<ROW>\n" : "</OBJECT>\n");
}

}  // namespace

int WSQL_Request::writeResultColumn(char* data, unsigned long length, char* work) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (length < 2) return 0;
    data[length - 1] = '\0';
    char* p = data;
    char* end = data + length - 1;
    if (std::strncmp(p, "*PREDICATE", 10) == 0) {
        char* semi = std::strchr(p, ';');
        if (semi == nullptr) {
            RAS1_TRACE_IF(ras, RAS1_ERROR, "*PREDICATE missing \";\", unknown predicate format. status %d", 6);
            return WSQL_BADINPUT;
        }
        *semi = '\0';
        char* eq = std::strchr(p, '=');
        if (eq != nullptr) {
            (void)http->append("<PREDICATE>");
            (void)http->appendTextUTF8(eq + 1);
            (void)http->append("</PREDICATE>\n");
        }
        p = semi + 1;
    }
    WSQL_Catalog* cat = WSQL_GetCatalog();
    WSQL_Table* open = nullptr;
    std::string openName;  // table part of the open (or unknown) table
    bool anyOpen = false;
    int rc = 0;
    while (p < end && rc == 0) {
        char* tilde = std::strchr(p, '~');
        char* rowEnd = tilde != nullptr ? tilde : end;
        *rowEnd = '\0';
        if (open != nullptr) (void)http->append("<ROW>\n");
        for (char* c = p; c < rowEnd && rc == 0;) {
            char* semi = std::strchr(c, ';');
            char* colEnd = semi != nullptr && semi < rowEnd ? semi : rowEnd;
            *colEnd = '\0';
            char* eq = std::strchr(c, '=');
            char* dot = eq != nullptr ? static_cast<char*>(std::memchr(c, '.', static_cast<size_t>(eq - c))) : nullptr;
            if (eq == nullptr) {
                RAS1_TRACE_IF(ras, RAS1_ERROR, "Unknown column found missing \"=\": %.*s status %d",
                              static_cast<int>(colEnd - c), c, 6);
                rc = WSQL_BADINPUT;
                break;
            }
            if (dot == nullptr) {
                *eq = '\0';
                RAS1_TRACE_IF(ras, RAS1_ERROR, "Unqualified column name %s in result. status %d", c, 6);
                rc = WSQL_BADINPUT;
                break;
            }
            std::string tablePart(c, static_cast<size_t>(dot - c));
            std::string column(dot + 1, static_cast<size_t>(eq - dot - 1));
            if (!anyOpen || tablePart != openName) {
                RAS1_TRACE_IF(ras, RAS1_STATE, "%s not equal to %s[%s]", tablePart.c_str(), openName.c_str(),
                              open != nullptr ? open->TableName() : "");
                if (open != nullptr) (void)http->append("</ROW>\n</DATA>\n</TABLE>\n");
                open = cat != nullptr ? cat->GetUnqualifiedTable(tablePart.c_str()) : nullptr;
                openName = tablePart;
                anyOpen = true;
                if (open == nullptr) {
                    RAS1_TRACE_IF(ras, RAS1_STATE, "No table %s found in attr files.", tablePart.c_str());
                } else {
                    openTableElement(http, open, true);
                }
            }
            WSQL_Column* col = open != nullptr ? open->GetColumn(column.c_str()) : nullptr;
            if (col != nullptr) {
                std::string tag = columnTag(col);
                (void)http->append(("<" + tag + ">").c_str());
                (void)http->appendTextUTF8(eq + 1);
                (void)http->append(("</" + tag + ">").c_str());
            }
            c = colEnd + 1;
        }
        if (open != nullptr) (void)http->append("</ROW>\n");
        p = rowEnd + 1;
    }
    if (open != nullptr) (void)http->append("</DATA>\n</TABLE>\n");
    (void)work;
    return rc;
}

// ---------------------------------------------------------------------------
// Fetch and WriteResponse
// ---------------------------------------------------------------------------

// Waits for the asynchronous open to report; the open's status.
int WSQL_Request::waitForOpen() {
    int ras = RAS1_Sync(RAS1_THIS);
    char d[160];
    describe(d, sizeof d);
    RAS1_TRACE_IF(ras, RAS1_STATE, "Request waiting... %s", d);
    int code = 0;
    (void)completion.waitMarked(&code, state, STATE_WAITING);
    RAS1_TRACE_IF(ras, RAS1_STATE, "Request signaled  status=%d %s", code, d);
    return code;
}

int WSQL_Request::openForRows() {
    int rc = select->open();
    if (rc == 0 && (type.load() & WSQL_TYPE_ASYNC) && select->CurrentState() == DS_SQLRequest::SQL_OPEN &&
        (type.load() & WSQL_TYPE_SOAP))
        rc = waitForOpen();
    if (rc != 0 && http != nullptr) {
        if (rc == WSQL_CANCELLED) {
            http->setRequestError(false, "Request has been cancelled", nullptr, static_cast<uint32_t>(rc));
        } else {
            char msg[64];
            std::snprintf(msg, sizeof msg, "Unable to open request (%d)", rc);
            http->setRequestError(false, msg, nullptr, static_cast<uint32_t>(rc));
        }
    }
    return rc;
}

// Rows as <DATA><ROW>...; without rows and the action "insert" the result
// code element; `echoItems` adds the query items to it (query-string form).
int WSQL_Request::writeRows(const char* action, bool echoItems) {
    int ras = RAS1_Sync(RAS1_THIS);
    LinkedList attrs(nullptr);
    int rows = 0;
    int rc;
    while ((rc = select->fetch()) == 0) {
        SQL1_Sqlda* da = select->getOutputSQLDA();
        if (da == nullptr) break;
        if (rows == 0) {
            (void)http->append("<DATA>\n");
            rc = cacheAttributes(&attrs, da);
            if (rc != 0) break;
        }
        rows++;
        rc = writeRow(da, &attrs);
        if (rc != 0) break;
    }
    int fetchRc = rc == WSQL_ENDOFDATA || rc == -1 ? 0 : rc;
    select->Lock();
    (void)select->close();
    select->Unlock();
    if (rows > 0) (void)http->append("</DATA>");
    if (rows == 0 && action != nullptr && WSQL_CaseCompare(action, "insert") == 0) {
        (void)http->append("<DATA>\n<ROW>\n");
        (void)http->append("<RC>0</RC>");
        if (echoItems) {
            WSQL_QueryItem* items = http->getQueryItems();
            for (int i = 0; i < http->getNumQueryItems(); i++) {
                const char* name = items[i].name;
                const char* value = items[i].value != nullptr ? items[i].value : "";
                if (name == nullptr || std::strcmp(name, "xsl") == 0 || std::strcmp(name, "table") == 0) continue;
                std::string tag = name;
                std::string text = value;
                if (std::strcmp(name, "filter") == 0) {
                    // COLUMN;OPERATOR;VALUE: the column names the element.
                    const char* s1 = std::strchr(value, ';');
                    const char* s2 = s1 != nullptr ? std::strchr(s1 + 1, ';') : nullptr;
                    tag.assign(value, s1 != nullptr ? static_cast<size_t>(s1 - value) : std::strlen(value));
                    text = s2 != nullptr ? s2 + 1 : "";
                }
                if (!isXmlName(tag.c_str())) continue;
                // As in PARMS, the SQL text itself is not echoed.
                (void)http->append(("<" + tag + ">").c_str());
                if (std::strcmp(name, "sql") != 0) (void)http->appendText(text.c_str());
                (void)http->append(("</" + tag + ">").c_str());
            }
        }
        (void)http->append("</ROW>\n</DATA>\n");
    }
    if (fetchRc != 0) {
        // Rows cut short are a failure, not a short answer.
        RAS1_TRACE_IF(ras, RAS1_ERROR, "Fetch failed %d after %d rows", fetchRc, rows);
        char msg[64];
        std::snprintf(msg, sizeof msg, "Unable to fetch request (%d)", fetchRc);
        http->setRequestError(false, msg, nullptr, static_cast<uint32_t>(fetchRc));
    }
    return fetchRc;
}

int WSQL_Request::Fetch(const char* action, bool) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    setExpiry();
    if (http == nullptr) {
        RAS1_EXIT_RC(ras, WSQL_NORESPONSE);
        return WSQL_NORESPONSE;
    }
    (void)http->append("<TABLE name=\"");
    (void)http->appendText(table != nullptr ? table->TableName() : "");
    if (isPersisted()) {
        char h[48];
        std::snprintf(h, sizeof h, "\" handle=\"%d", static_cast<int>(alias));
        (void)http->append(h);
    }
    (void)http->append("\">\n<OBJECT>");
    (void)http->appendText(table != nullptr ? table->ObjectName() : "");
    (void)http->append("</OBJECT>\n");
    int rc = 0;
    uint32_t t = type.load();
    bool updates = (t & (WSQL_TYPE_SUBSELECT | WSQL_TYPE_BOUNDINPUT)) == (WSQL_TYPE_SUBSELECT | WSQL_TYPE_BOUNDINPUT);
    if (select != nullptr && select->CurrentState() != DS_SQLRequest::SQL_OPEN && !updates) rc = openForRows();
    if (rc == 0 && select != nullptr) {
        if (action != nullptr && WSQL_CaseCompare(action, "events") == 0) {
            rc = buildEventsXML();
        } else {
            rc = writeRows(action, false);
        }
    }
    (void)http->append("\n</TABLE>\n");
    WSQL_ResponseBuffer* b = http->getBuffer();
    if (b != nullptr && (ras & RAS1_DETAIL))
        RAS1_Printf(RAS1_THIS, __LINE__, "Response is l'%d:\n\"%*s\"", static_cast<int>(b->getLength()),
                    static_cast<int>(b->getLength()), b->getBuffer());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::WriteResponse() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (http == nullptr) {
        RAS1_EXIT_RC(ras, WSQL_NORESPONSE);
        return WSQL_NORESPONSE;
    }
    static const char kCache[] = "cache";
    KDH1_sendhdr_struct header{KDH1_HDR_CACHE, 5, kCache};
    int rc = http->writeXMLHeader(1, &header);
    (void)http->append("<REQUEST xmlns:dt=\"");
    (void)http->append(kDatatypesURN);
    (void)http->append("\" >\n<PARMS>\n");
    WSQL_QueryItem* items = http->getQueryItems();
    for (int i = 0; i < http->getNumQueryItems(); i++) {
        const char* name = items[i].name;
        if (!isXmlName(name)) continue;
        (void)http->append(("<" + std::string(name) + ">").c_str());
        if (std::strcmp(name, "sql") != 0 && items[i].value != nullptr) (void)http->appendText(items[i].value);
        (void)http->append(("</" + std::string(name) + ">").c_str());
    }
    (void)http->append("</PARMS>");
    (void)http->append("<TABLE name=\"");
    (void)http->appendText(table != nullptr ? table->TableName() : "");
    (void)http->append("\">\n<OBJECT>");
    (void)http->appendText(table != nullptr ? table->ObjectName() : "");
    (void)http->append("</OBJECT>\n");
    int open = 0;
    if (select != nullptr && select->CurrentState() != DS_SQLRequest::SQL_OPEN) open = select->open();
    if (select != nullptr && open == 0) {
        const char* action = http->getQueryValue("action");
        if (action != nullptr && std::strcmp(action, "events") == 0) {
            (void)buildEventsXML();
        } else {
            (void)writeRows(action, true);
        }
    }
    (void)http->append("\n</TABLE>\n</REQUEST>\n");
    int wrc = http->writeClientBufferUTF8();
    if (rc == 0) rc = wrc;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// ---------------------------------------------------------------------------
// Events
// ---------------------------------------------------------------------------

namespace {

struct EventColumns {
    int sit = -1, origin = -1, node = -1, atom = -1, lcl = -1, gbl = -1, delta = -1;
};

std::string columnText(const SQL1_Sqlda* da, int index) {
    if (index < 0 || index >= da->used) return "";
    const SQL1_SqlVar& v = da->var[index];
    return trimmed(v.data != nullptr ? v.data : "", valueLength(v));
}

bool hasNodeNamed(LinkedList* msList, const std::string& name) {
    LinkedListIter it(msList);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        if (name == static_cast<Node*>(v)->getName()) return true;
    }
    return false;
}

}  // namespace

int WSQL_Request::buildEventsXML() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    EventColumns c;
    int rows = 0;
    int rc;
    while ((rc = select->fetch()) == 0) {
        SQL1_Sqlda* da = select->getOutputSQLDA();
        if (da == nullptr) break;
        if (rows++ == 0) {
            (void)http->append("<DATA>\n");
            static const struct {
                const char* name;
                int EventColumns::*field;
            } kCols[] = {{"SITNAME", &EventColumns::sit},     {"ORIGINNODE", &EventColumns::origin},
                         {"NODE", &EventColumns::node},       {"ATOMIZE", &EventColumns::atom},
                         {"LCLTMSTMP", &EventColumns::lcl},   {"GBLTMSTMP", &EventColumns::gbl},
                         {"DELTASTAT", &EventColumns::delta}};
            for (int i = 0; i < da->used; i++) {
                for (const auto& k : kCols) {
                    if (WSQL_CaseCompare(unqualified(da->var[i].name), k.name) == 0) c.*k.field = i;
                }
            }
        }
        std::string delta = columnText(da, c.delta);
        if (!delta.empty() && delta[0] == 'N') continue;
        std::string sit = columnText(da, c.sit);
        LinkedList* temps = hub->getCachedTempsForSit(sit.c_str());
        if (temps == nullptr) continue;
        std::string origin = columnText(da, c.origin), node = columnText(da, c.node), atom = columnText(da, c.atom),
                    lcl = columnText(da, c.lcl), gbl = columnText(da, c.gbl);
        std::string d = delta.substr(0, 1);
        bool opened = false;
        LinkedListIter ti(temps);
        for (void* tv = ti.Next(); tv != nullptr; tv = ti.Next()) {
            auto* tmpl = static_cast<SitTemplate*>(tv);
            LinkedList* mos = tmpl->getMOList();
            if (mos == nullptr) continue;
            LinkedListIter mi(mos);
            for (void* mv = mi.Next(); mv != nullptr; mv = mi.Next()) {
                auto* mo = static_cast<ManagedObj*>(mv);
                if (!hasNodeNamed(mo->getMSList(), origin)) continue;
                if (!opened) {
                    // Every value is escaped: an apostrophe would end the attribute.
                    const std::pair<const char*, const std::string*> attrs[] = {
                        {"<Situation name='", &sit}, {"' atom='", &atom},   {"' gbltime='", &gbl}, {"' lcltime='", &lcl},
                        {"' origin='", &origin},     {"' node='", &node},   {"' deltastat='", &d}};
                    for (const auto& a : attrs) {
                        (void)http->append(a.first);
                        (void)http->appendTextUTF8(a.second->c_str());
                    }
                    (void)http->append("'>");
                    opened = true;
                }
                (void)http->append("<MO name='");
                (void)http->appendTextUTF8(mo->getName());
                (void)http->append("' state='");
                (void)http->appendTextUTF8(tmpl->getState());
                (void)http->append("' />");
            }
        }
        if (opened) (void)http->append("</Situation>");
    }
    select->Lock();
    (void)select->close();
    select->Unlock();
    if (rows > 0) (void)http->append("</DATA>");
    int out = rc == WSQL_ENDOFDATA || rc == -1 ? 0 : rc;
    RAS1_EXIT_RC(ras, out);
    return out;
}

// ---------------------------------------------------------------------------
// Topology results
// ---------------------------------------------------------------------------

LinkedList* WSQL_Request::GetResults(ResultsType kind, char* hubName, int hubNameSize) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (select == nullptr) {
        RAS1_EXIT(ras);
        return nullptr;
    }
    int rc = select->CurrentState() == DS_SQLRequest::SQL_OPEN ? 0 : select->open();
    if (rc != 0) {
        RAS1_EXIT(ras);
        return nullptr;
    }
    static const char* const kNames[][2] = {{"TEMPLATE", "STATE"}, {"NAME", "NODE"}, {"NODE", "NODETYPE"}};
    static const char* const kMissing[] = {"Error: Can't find TEMPLATE or STATE", "Error: Can't find NODE or NAME",
                                           "Error: Can't find NODE or NODETYPE"};
    static const LinkedList::Destructor kDestroy[] = {destroy_SitTemplate, destroy_ManagedObj, destroy_Node};
    int k = static_cast<int>(kind);
    if (k < 0 || k > 2) {
        (void)select->close();
        RAS1_EXIT(ras);
        return nullptr;
    }
    auto* list = new LinkedList(kDestroy[k]);
    int a = -1, b = -1;
    bool first = true;
    while ((rc = select->fetch()) == 0) {
        SQL1_Sqlda* da = select->getOutputSQLDA();
        if (da == nullptr) break;
        if (first) {
            first = false;
            for (int i = 0; i < da->used; i++) {
                if (WSQL_CaseCompare(unqualified(da->var[i].name), kNames[k][0]) == 0 && a < 0) a = i;
                if (WSQL_CaseCompare(unqualified(da->var[i].name), kNames[k][1]) == 0 && b < 0) b = i;
            }
            if (a < 0 || b < 0) {
                RAS1_Printf(RAS1_THIS, __LINE__, "%s", kMissing[k]);
                rc = WSQL_NOTFOUND;
                break;
            }
        }
        const SQL1_SqlVar& va = da->var[a];
        const SQL1_SqlVar& vb = da->var[b];
        const char* da_ = va.data != nullptr ? va.data : "";
        const char* db_ = vb.data != nullptr ? vb.data : "";
        int la = static_cast<int>(valueLength(va)), lb = static_cast<int>(valueLength(vb));
        if (kind == RESULTS_TEMPLATES) {
            auto* t = new SitTemplate(da_, la, db_, lb);
            if (list->AppendEntry(t) != 0) delete t;
        } else if (kind == RESULTS_MANAGEDOBJS) {
            if (lb > 0 && std::isspace(static_cast<unsigned char>(db_[0]))) continue;
            auto* mo = new ManagedObj(da_, la, db_, lb);
            if (list->AppendEntry(mo) != 0) delete mo;
        } else {
            char nodeType = lb > 0 ? db_[0] : ' ';
            if (nodeType == 'M' || nodeType == ' ') {
                auto* n = new Node(da_, la);
                bool dup = false;
                {
                    LinkedListIter it(list);
                    for (void* v = it.Next(); v != nullptr && !dup; v = it.Next())
                        dup = std::strcmp(static_cast<Node*>(v)->getName(), n->getName()) == 0;
                }
                if (dup) {
                    RAS1_TRACE_IF(ras, RAS1_DETAIL, "Duplicate node name skipped \"%s\"", n->getName());
                    delete n;
                } else if (list->AppendEntry(n) != 0) {
                    delete n;
                }
                continue;
            }
            if (nodeType == 'V' && hubName != nullptr && hubNameSize > 0) {
                std::string h = trimmed(da_, static_cast<size_t>(la));
                std::snprintf(hubName, static_cast<size_t>(hubNameSize) + 1, "%.*s", hubNameSize, h.c_str());
            }
            rc = WSQL_ENDOFDATA;
            break;
        }
    }
    select->Lock();
    (void)select->close();
    select->Unlock();
    if (rc != WSQL_ENDOFDATA) {
        delete list;
        list = nullptr;
    }
    RAS1_EXIT(ras);
    return list;
}
