// kshreqsql: the SQL text of a request (see kshreq.h): SELECT with routing,
// history, parameters and filters; INSERT, UPDATE and DELETE; the binding
// of input markers.
//
// Every builder writes through SqlText, which refuses a term that does not
// fit the 8096-byte buffer (result 7) and leaves the statement as it was
// before that term; the request then creates no statement, so a cut
// statement never reaches the server. Values are escaped for double-quoted
// literals; names from the request must be plain identifiers.
#include <cctype>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>

#include "kshanchor.h"
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

RAS1_UNIT("kshreqsql");

// The statement being written into a request's SQL buffer.
class WSQL_SqlText {
public:
    WSQL_SqlText(char* buffer, size_t size) : buf(buffer), cap(size) { buf[0] = '\0'; }

    // Appends the formatted term; 0, or 7 when it does not fit (the text
    // stays as it was).
    int put(const char* fmt, ...) __attribute__((format(printf, 2, 3))) {
        if (failed) return WSQL_NOMEM;
        va_list ap;
        va_start(ap, fmt);
        int n = std::vsnprintf(buf + pos, cap - pos, fmt, ap);
        va_end(ap);
        if (n < 0 || static_cast<size_t>(n) >= cap - pos) {
            buf[pos] = '\0';
            failed = true;
            return WSQL_NOMEM;
        }
        pos += static_cast<size_t>(n);
        return 0;
    }
    // Appends `value` as the inside of a double-quoted literal.
    int putEscaped(const char* value) {
        if (failed) return WSQL_NOMEM;
        int n = WSQL_EscapeLiteral(value != nullptr ? value : "", -1, buf + pos, cap - pos);
        if (n < 0) {
            buf[pos] = '\0';
            failed = true;
            return WSQL_NOMEM;
        }
        pos += static_cast<size_t>(n);
        return 0;
    }
    size_t length() const { return pos; }

private:
    char* buf;
    size_t cap;
    size_t pos = 0;
    bool failed = false;
};

namespace {

using SqlText = WSQL_SqlText;

// Guards the check-and-append of run-time columns on shared catalog tables.
std::mutex gDynamicColumns;

// Numeric column types: their values are written without quotes.
bool isNumericType(int t) {
    static const int kNumeric[] = {500, 484, 480, 2, 492, 496, 1000, 1006, 1008, 1032};
    for (int n : kNumeric) {
        if (t == n) return true;
    }
    return false;
}

int baseType(int t) { return t > 383 ? (t & ~1) : t; }

// True for an unsigned or signed decimal number, optionally with a
// fraction and exponent: what may stand bare in a statement.
bool isNumber(const char* v) {
    if (v == nullptr || *v == '\0') return false;
    char* end = nullptr;
    (void)std::strtod(v, &end);
    if (end == v || *end != '\0') return false;
    for (const char* p = v; *p != '\0'; p++) {
        if (!(std::isdigit(static_cast<unsigned char>(*p)) || *p == '-' || *p == '+' || *p == '.' || *p == 'e' ||
              *p == 'E'))
            return false;
    }
    return true;
}

bool hasRouting(const char* node, WSQL_Hub* hub) {
    return node != nullptr && *node != '\0' && std::strcmp(node, hub->getNodeID()) != 0;
}

}  // namespace

int WSQL_EscapeLiteral(const char* value, int n, char* out, size_t size) {
    if (out == nullptr || size == 0) return -1;
    size_t len = value == nullptr ? 0 : n < 0 ? std::strlen(value) : strnlen(value, static_cast<size_t>(n));
    size_t o = 0;
    for (size_t i = 0; i < len; i++) {
        size_t need = value[i] == '"' ? 2 : 1;
        if (o + need >= size) {
            out[0] = '\0';
            return -1;
        }
        out[o++] = value[i];
        if (value[i] == '"') out[o++] = '"';
    }
    out[o] = '\0';
    return static_cast<int>(o);
}

bool WSQL_IsPlainName(const char* name) {
    if (name == nullptr || *name == '\0') return false;
    auto special = [](char c) { return c == '_' || c == '#' || c == '@' || c == '$'; };
    if (!(std::isalpha(static_cast<unsigned char>(*name)) || special(*name))) return false;
    for (const char* p = name + 1; *p != '\0'; p++) {
        if (!(std::isalnum(static_cast<unsigned char>(*p)) || special(*p) || *p == '.')) return false;
    }
    return true;
}

WSQL_Column* WSQL_AddDynamicColumn(WSQL_Table* t, const char* name, int colType) {
    int ras = RAS1_Sync(RAS1_THIS);
    std::lock_guard<std::mutex> g(gDynamicColumns);
    WSQL_Column* col = t->GetColumn(name);
    if (col != nullptr) return col;
    col = new WSQL_Column(name, name, false);
    col->SetType(colType);
    if (t->AppendColumn(col) != 0) {
        delete col;
        return nullptr;
    }
    RAS1_TRACE_IF(ras, RAS1_CATALOG, "Dynamically added column %s to table %s : type %d", name, t->TableName(), colType);
    return col;
}

const char* WSQL_Request::filterOper(const char* op) {
    static const struct {
        const char* name;
        const char* sql;
    } kOps[] = {
        {"EQ", "="}, {"NE", "<>"}, {"GE", ">="}, {"LE", "<="},       {"LT", "<"},
        {"GT", ">"}, {"AND", "AND"}, {"OR", "OR"}, {"LIKE", "LIKE"},
    };
    for (const auto& e : kOps) {
        if (op != nullptr && WSQL_CaseCompare(op, e.name) == 0) return e.sql;
    }
    return "";
}

WSQL_Table* WSQL_Request::CreateHistoricalTable(WSQL_Table* t) {
    auto* copy = new WSQL_Table(*t);
    auto* wt = new WSQL_Column("WRITETIME", "Write_Time", false);
    wt->SetType(452);
    if (copy->InsertColumn(wt) != 0) {
        delete wt;
        delete copy;
        return nullptr;
    }
    return copy;
}

int WSQL_ConvertAttr(char* name) {
    if (name == nullptr) return 0;
    char* w = name;
    for (char* r = name; *r != '\0'; r++) {
        if (std::isalnum(static_cast<unsigned char>(*r)) || *r == '_') *w++ = *r;
    }
    *w = '\0';
    char* first = name;
    while (*first != '\0' && !std::isalpha(static_cast<unsigned char>(*first))) first++;
    if (first != name) std::memmove(name, first, std::strlen(first) + 1);
    return 0;
}

// ---------------------------------------------------------------------------
// SELECT
// ---------------------------------------------------------------------------

// The refusal of a name that may not go into a statement.
static int refuseName(WSQL_HttpServer* http, const char* what, const char* name) {
    RAS1_Printf(RAS1_THIS, __LINE__, "Refused %s name '%s'", what, name != nullptr ? name : "");
    if (http != nullptr) http->setRequestError(true, "No valid attributes found for object", name, 0);
    return WSQL_NOTFOUND;
}

int WSQL_Request::buildSQL(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    if (rec->sql != nullptr) {
        size_t n = std::strlen(rec->sql);
        if (n < sizeof sqlText) {
            std::memcpy(sqlText, rec->sql, n + 1);
            if (table != nullptr) table->setDynamic(true);
            RAS1_TRACE_IF(ras, RAS1_STATE, "Using pre-built SQL: %s", sqlText);
        } else {
            RAS1_Printf(RAS1_THIS, __LINE__, "Error: Pre-built SQL length (%d chars) exceeds maximum of %d",
                        static_cast<int>(n), static_cast<int>(sizeof sqlText));
            sqlText[0] = '\0';
            rc = WSQL_NOMEM;
        }
        RAS1_EXIT_RC(ras, rc);
        return rc;
    }
    SqlText s(sqlText, sizeof sqlText);
    rc = s.put("SELECT ");
    if (rc == 0) rc = writeSelectList(rec, s);
    if (rc == 0) rc = writeFrom(rec, s);
    if (rc == 0) rc = writeParma(rec, s);
    if (rc == 0) rc = writeFilters(rec, s);
    if (rc == 0) RAS1_TRACE_IF(ras, RAS1_STATE, "Using SQL: %s", sqlText);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::writeSelectList(WSQL_Request_t* rec, SqlText& s) {
    int ras = RAS1_Sync(RAS1_THIS);
    int written = 0;
    int rc = 0;
    if (rec->numColumns <= 0) {
        LinkedListIter it(table->Columns());
        for (void* v = it.Next(); v != nullptr && rc == 0; v = it.Next()) {
            auto* c = static_cast<WSQL_Column*>(v);
            if (c->Hidden()) continue;
            rc = s.put("%s%s", written > 0 ? "," : "", c->ColName());
            written++;
        }
    } else {
        for (int i = 0; i < rec->numColumns && i < WSQL_MAX_COLUMNS && rc == 0; i++) {
            const char* name = rec->columns[i];
            if (name == nullptr) continue;
            if (rec->attributeForm) {
                WSQL_Column* c = table->GetAttr(name);
                if (c == nullptr) {
                    RAS1_TRACE_IF(ras, RAS1_STATE, "attribute '%s' not found excluded from select for table '%s'",
                                  name, table->TableName());
                    continue;
                }
                name = c->ColName();
            } else if (!WSQL_IsPlainName(name)) {
                return refuseName(http, "column", name);
            }
            rc = s.put("%s%s", written > 0 ? "," : "", name);
            written++;
        }
    }
    if (rc == 0 && written == 0 && http != nullptr)
        http->setRequestError(true, "No valid attributes found for object", table->ObjectName(), 0);
    return rc;
}

int WSQL_Request::writeFrom(WSQL_Request_t* rec, SqlText& s) {
    bool versioned = rec->versionedTable && rec->table != nullptr;
    const char* tableName = versioned ? rec->table : table->TableName();
    if (!WSQL_IsPlainName(tableName)) return refuseName(http, "table", tableName);
    bool where = rec->numParma > 0 || rec->numFilters > 0;
    const char* hist = rec->history ? "HISTORY()" : "";
    const char* whereText = where ? "WHERE " : "";
    if (WSQL_NCaseCompare(tableName, "O4SRV.", 6) == 0) {
        if (hasRouting(rec->thrunode, hub)) {
            int rc = s.put(" FROM %s AT (\"", tableName);
            if (rc == 0) rc = s.putEscaped(rec->thrunode);
            if (rc == 0) rc = s.put("\") %s %s", hist, whereText);
            return rc;
        }
        return s.put(" FROM %s%s%s ", tableName, rec->history ? " HISTORY()" : "", where ? " WHERE" : "");
    }
    if (type.load() & WSQL_TYPE_ALLTARGETS) return writeAllTargets(rec, tableName, s);
    const char* node = nullptr;
    int rc = resolveTarget(rec, &node);
    if (rc != 0) return rc;
    if (hasRouting(node, hub)) {
        rc = s.put(" FROM %s AT (\"", tableName);
        if (rc == 0) rc = s.putEscaped(node);
        if (rc == 0) rc = s.put("\") %s %s", hist, whereText);
        return rc;
    }
    return s.put(" FROM %s%s%s ", tableName, rec->history ? " HISTORY()" : "", where ? " WHERE" : "");
}

// The managing servers that are online and have the table's application.
int WSQL_Request::writeAllTargets(WSQL_Request_t* rec, const char* tableName, SqlText& s) {
    int ras = RAS1_Sync(RAS1_THIS);
    static const char kAllLms[] = "*ALL_LMS";
    Node* all = hub->lookupCachedNode(kAllLms);
    (void)hub->refreshCachedNodeStatus(kAllLms);
    int rc = s.put(" FROM %s", tableName);
    char appl[WSQL_APPL_NAME_MAX + 1] = "";
    const char* dot = std::strchr(tableName, '.');
    if (dot != nullptr) std::snprintf(appl, sizeof appl, "%.*s", static_cast<int>(dot - tableName), tableName);
    // The hub itself is "*HUB", unless the gateway runs embedded and the
    // host asks for the hub's own node name.
    const WSQL_LocalServer* local = gAnchor != nullptr ? gAnchor->localServer : nullptr;
    bool hubByName = gAnchor != nullptr && (gAnchor->flags & WSQL_ANCHOR_EMBEDDED) && local != nullptr &&
                     local->hubNodeRef >= 0;
    int taken = 0;
    LinkedList* members = all != nullptr ? all->getNodeList() : nullptr;
    if (members != nullptr) {
        LinkedListIter it(members);
        unsigned left = members->NumEntries();
        for (void* v = it.Next(); v != nullptr && left > 0 && rc == 0; v = it.Next(), left--) {
            auto* n = static_cast<Node*>(v);
            bool isHub = std::strcmp(n->getName(), hub->getNodeID()) == 0;
            char online = n->getOnline();
            if (!isHub && online != 'Y') {
                RAS1_TRACE_IF(ras, RAS1_STATE, "target=*all lms node %s offline=%.1s-excluded from AT for table %s",
                              n->getName(), &online, tableName);
                continue;
            }
            if (appl[0] == '\0') {
                RAS1_TRACE_IF(ras, RAS1_STATE, "target=*all lms node %s Appl not specified-excluded from AT for table %s",
                              n->getName(), tableName);
                continue;
            }
            if (n->lookupNodeAppl(appl) == nullptr) {
                RAS1_TRACE_IF(ras, RAS1_STATE, "target=*all lms node %s Appl %s not available-excluded from AT for table %s",
                              n->getName(), appl, tableName);
                continue;
            }
            const char* shown = isHub ? (hubByName ? hub->getNodeID() : "*HUB") : n->getName();
            rc = s.put("%s\"", taken == 0 ? " AT (" : ",");
            if (rc == 0) rc = s.putEscaped(shown);
            if (rc == 0) rc = s.put("\"");
            taken++;
            RAS1_TRACE_IF(ras, RAS1_STATE, "target=*all lms node %s added to AT %s%s%s for table %s", n->getName(), "\"",
                          shown, "\"", tableName);
        }
    }
    if (rc == 0 && taken > 0) rc = s.put(") ");
    bool where = rec->numParma > 0 || rec->numFilters > 0;
    if (rc == 0) rc = s.put(" %s %s", rec->history ? "HISTORY()" : "", where ? "WHERE " : "");
    return rc;
}

// The routing node of a request with a target: the node the target's
// managed system is reached through now.
int WSQL_Request::resolveTarget(WSQL_Request_t* rec, const char** node) {
    int ras = RAS1_Sync(RAS1_THIS);
    *node = rec->thrunode;
    if (rec->target == nullptr || rec->thrunode != nullptr) return 0;
    Node* n = hub->lookupCachedNode(rec->target);
    if (n == nullptr) return 0;
    // A node list is reached through its members, not under its own name:
    // it gets no routing node (its rows come from every node).
    if (n->getNodeList() == nullptr) *node = n->getThrunode();
    if (std::strcmp(n->getThrunode(), n->getName()) != 0) {
        RAS1_TRACE_IF(ras, RAS1_STATE, "Re-check for agent switch - %s ", rec->target);
        KFA_ResolveThruNode_t resolve = getResolver();
        if (resolve == nullptr) {
            RAS1_Printf(RAS1_THIS, __LINE__, "KFA_ResolveThruNode() not initialized");
            if (http != nullptr) http->setRequestError(false, "System error function not found", rec->target, 0);
            return WSQL_FAULT;
        }
        char resolved[WSQL_NODE_ROUTE_SIZE] = "";
        if (resolve(hub->getLMSName(), rec->target, resolved, sizeof resolved) != 0) resolved[0] = '\0';
        RAS1_TRACE_IF(ras, RAS1_STATE, "thruNodes - %s ", resolved);
        if (resolved[0] != '\0') {
            std::snprintf(routeNode, sizeof routeNode, "%s", resolved);
            *node = routeNode;
            RAS1_TRACE_IF(ras, RAS1_STATE, "thruNodes not null, thrunode set to %s", routeNode);
        } else {
            *node = n->getThrunode();
            RAS1_TRACE_IF(ras, RAS1_STATE, "thruNodes  null, thrunode set to %s", *node);
        }
    }
    if (n->getOnline() == 'N') {
        if (http != nullptr) http->setRequestError(false, "Managing system not online", *node, 0);
        return WSQL_NOTFOUND;
    }
    return 0;
}

int WSQL_Request::writeParma(WSQL_Request_t* rec, SqlText& s) {
    int rc = 0;
    for (int i = 0; i < rec->numParma && i < WSQL_MAX_PARMA && rc == 0; i++) {
        const char* name = rec->parma[i].name != nullptr ? rec->parma[i].name : "";
        const char* value = rec->parma[i].value != nullptr ? rec->parma[i].value : "";
        rc = s.put("%s SYSTEM.PARMA(\"", i == 0 ? "" : " AND");
        if (rc == 0) rc = s.putEscaped(name);
        if (rc == 0) rc = s.put("\", \"");
        if (rc == 0) rc = s.putEscaped(value);
        if (rc == 0) rc = s.put("\", %d)", static_cast<int>(std::strlen(value)));
    }
    return rc;
}

int WSQL_Request::writeFilters(WSQL_Request_t* rec, SqlText& s) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = 0;
    bool bound = (type.load() & WSQL_TYPE_BOUNDINPUT) != 0;
    for (int i = 0; i < rec->numFilters && i < WSQL_MAX_FILTERS && rc == 0; i++) {
        WSQL_Filter_t& f = rec->filters[i];
        if (f.column == nullptr) continue;
        WSQL_Column* col = nullptr;
        if (f.isAfilter) {
            col = table->GetAttr(f.column);
            if (col != nullptr) {
                f.column = const_cast<char*>(col->ColName());
                f.isAfilter = 0;
            }
        } else {
            col = table->GetColumn(f.column);
        }
        if (!WSQL_IsPlainName(f.column)) return refuseName(http, "filter column", f.column);
        if (col == nullptr && rec->numColumns <= 0) {
            RAS1_TRACE_IF(ras, RAS1_STATE, "Warning: Filter column %s not found in atr files.", f.column);
            col = WSQL_AddDynamicColumn(table, f.column, 452);
        }
        const char* connector = i == 0 ? (rec->numParma > 0 ? " AND " : "") : " AND";
        const char* op = filterOper(f.oper);
        if (bound) {
            rc = s.put("%s %s %s ?", connector, f.column, op);
            continue;
        }
        // A column nobody typed is compared as character data.
        int t = col != nullptr ? baseType(col->GetType()) : 452;
        const char* value = f.value != nullptr ? f.value : "";
        const char* open = "";
        const char* close = "";
        if (t == 1022) {
            open = " N\"";
            close = "\"";
        } else if (t != 496 && t != 492 &&
                   (t == 452 || col == nullptr || (rec->numColumns > 0 && (rec->methods & WSQL_METHOD_ACTION)))) {
            open = close = "\"";
        } else if (!isNumber(value)) {
            // Written bare only when it is a number: anything else is a
            // literal, so that it can never become part of the statement.
            open = close = "\"";
        }
        rc = s.put("%s %s %s %s", connector, f.column, op, open);
        if (rc == 0) rc = s.putEscaped(value);
        if (rc == 0) rc = s.put("%s", close);
    }
    return rc;
}

// ---------------------------------------------------------------------------
// INSERT, UPDATE, DELETE
// ---------------------------------------------------------------------------

int WSQL_Request::routingNode(WSQL_Request_t* rec, const char** node) const {
    *node = hasRouting(rec->thrunode, hub) ? rec->thrunode : "*HUB";
    return 0;
}

namespace {

// Prefix and quote of an insert or update value of column type `t`.
void valueQuoting(int t, const char* value, char* prefix, char* quote) {
    *prefix = ' ';
    *quote = '"';
    if (isNumericType(t)) *quote = ' ';
    if (t == 1018 || t == 1022) *prefix = 'N';
    if (value != nullptr && std::strcmp(value, "0") == 0) {
        *quote = ' ';
        *prefix = ' ';
    }
    // A value written without quotes must be a number; anything else is
    // quoted so that it stays a literal.
    if (*quote == ' ' && !isNumber(value)) *quote = '"';
}

int columnType(WSQL_Table* table, const char* name) {
    WSQL_Column* c = table != nullptr && name != nullptr ? table->GetColumn(name) : nullptr;
    return c != nullptr ? baseType(c->GetType()) : 0;
}

}  // namespace

int WSQL_Request::buildInsertSQL(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    bool useValues = rec->numValues > 0;
    int count = useValues ? rec->numValues : rec->numFilters;
    if (count <= 0) {
        RAS1_EXIT_RC(ras, WSQL_NOTFOUND);
        return WSQL_NOTFOUND;
    }
    auto colAt = [&](int i) -> const char* { return useValues ? rec->columns[i] : rec->filters[i].column; };
    auto valAt = [&](int i) -> const char* { return useValues ? rec->values[i] : rec->filters[i].value; };
    if (rec->table == nullptr || !WSQL_IsPlainName(rec->table)) return refuseName(http, "table", rec->table);
    for (int i = 0; i < count; i++) {
        if (!WSQL_IsPlainName(colAt(i))) return refuseName(http, "column", colAt(i));
    }
    const char* node;
    (void)routingNode(rec, &node);
    bool bound = (type.load() & WSQL_TYPE_BOUNDINPUT) != 0;
    SqlText s(sqlText, sizeof sqlText);
    int rc = s.put("INSERT INTO %s AT (\"", rec->table);
    if (rc == 0) rc = s.putEscaped(node);
    if (rc == 0) rc = s.put("\") (");
    for (int i = 0; i < count && rc == 0; i++) rc = s.put("%s%s", i == 0 ? " " : ",", colAt(i));
    if (rc == 0) rc = s.put(") VALUES(");
    for (int i = 0; i < count && rc == 0; i++) {
        const char* sep = i + 1 < count ? "," : " ";
        if (bound) {
            rc = s.put(" ?%s", sep);
            continue;
        }
        const char* value = valAt(i) != nullptr ? valAt(i) : "";
        WSQL_Column* c = table->GetColumn(colAt(i));
        if (c == nullptr)
            RAS1_TRACE_IF(ras, RAS1_STATE, "Table %s Column %d: %p %s not found.  using default datatype.",
                          table->TableName(), i, static_cast<const void*>(colAt(i)), colAt(i));
        char prefix, quote;
        valueQuoting(columnType(table, colAt(i)), value, &prefix, &quote);
        rc = s.put("%c%c", prefix, quote);
        if (rc == 0) rc = quote == '"' ? s.putEscaped(value) : s.put("%s", value);
        if (rc == 0) rc = s.put("%c%s", quote, sep);
    }
    if (rc == 0) rc = s.put(")");
    if (rc == 0) RAS1_TRACE_IF(ras, RAS1_STATE, "Using SQL: %s", sqlText);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::buildUpdateSQL(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (rec->numValues <= 0) {
        RAS1_EXIT_RC(ras, WSQL_NOTFOUND);
        return WSQL_NOTFOUND;
    }
    if (rec->table == nullptr || !WSQL_IsPlainName(rec->table)) return refuseName(http, "table", rec->table);
    for (int i = 0; i < rec->numValues; i++) {
        if (!WSQL_IsPlainName(rec->columns[i])) return refuseName(http, "column", rec->columns[i]);
    }
    for (int i = 0; i < rec->numFilters; i++) {
        if (!WSQL_IsPlainName(rec->filters[i].column)) return refuseName(http, "filter column", rec->filters[i].column);
    }
    SqlText s(sqlText, sizeof sqlText);
    int rc = s.put("UPDATE %s ", rec->table);
    if (rc == 0 && hasRouting(rec->thrunode, hub)) {
        rc = s.put("AT (\"");
        if (rc == 0) rc = s.putEscaped(rec->thrunode);
        if (rc == 0) rc = s.put("\") ");
    }
    if (rc == 0) rc = s.put("SET ");
    for (int i = 0; i < rec->numValues && rc == 0; i++) {
        const char* value = rec->values[i] != nullptr ? rec->values[i] : "";
        if (table->GetColumn(rec->columns[i]) == nullptr)
            RAS1_TRACE_IF(ras, RAS1_STATE, "Table %s Column %s not found.  using default datatype.", table->TableName(),
                          rec->columns[i]);
        char prefix, quote;
        valueQuoting(columnType(table, rec->columns[i]), value, &prefix, &quote);
        rc = s.put("%s = %c%c", rec->columns[i], prefix, quote);
        if (rc == 0) rc = quote == '"' ? s.putEscaped(value) : s.put("%s", value);
        if (rc == 0) rc = s.put("%c%s", quote, i + 1 < rec->numValues ? "," : " ");
    }
    if (rc == 0 && rec->numFilters > 0) rc = s.put("WHERE ");
    for (int i = 0; i < rec->numFilters && rc == 0; i++) {
        const WSQL_Filter_t& f = rec->filters[i];
        const char* value = f.value != nullptr ? f.value : "";
        char prefix, quote;
        valueQuoting(columnType(table, f.column), value, &prefix, &quote);
        rc = s.put("%s %s %c%c", f.column, filterOper(f.oper), prefix, quote);
        if (rc == 0) rc = quote == '"' ? s.putEscaped(value) : s.put("%s", value);
        // "AND " with its blank: the next term must not run into it.
        if (rc == 0) rc = s.put("%c %s", quote, i + 1 < rec->numFilters ? "AND " : "");
    }
    if (rc == 0) RAS1_TRACE_IF(ras, RAS1_STATE, "Using SQL: %s", sqlText);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::buildDeleteSQL(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (rec->table == nullptr || !WSQL_IsPlainName(rec->table)) return refuseName(http, "table", rec->table);
    for (int i = 0; i < rec->numFilters; i++) {
        if (!WSQL_IsPlainName(rec->filters[i].column)) return refuseName(http, "filter column", rec->filters[i].column);
    }
    const char* node;
    (void)routingNode(rec, &node);
    SqlText s(sqlText, sizeof sqlText);
    int rc = s.put("DELETE FROM %s AT (\"", rec->table);
    if (rc == 0) rc = s.putEscaped(node);
    if (rc == 0) rc = s.put("\") %s", rec->numFilters > 0 ? "WHERE " : "");
    for (int i = 0; i < rec->numFilters && rc == 0; i++) {
        const WSQL_Filter_t& f = rec->filters[i];
        rc = s.put("%s %s %s \"", i == 0 ? "" : " AND ", f.column, filterOper(f.oper));
        if (rc == 0) rc = s.putEscaped(f.value);
        if (rc == 0) rc = s.put("\"");
    }
    if (rc == 0) RAS1_TRACE_IF(ras, RAS1_STATE, "Using SQL: %s", sqlText);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// ---------------------------------------------------------------------------
// Input markers
// ---------------------------------------------------------------------------

int WSQL_Request::buildInput(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (select == nullptr || rec == nullptr) {
        RAS1_EXIT_RC(ras, 1);
        return 1;
    }
    bool useValues = rec->numValues > 0;
    uint32_t t = type.load();
    // Without column/value pairs the filters are the values: the markers of
    // a select's WHERE clause, or the value list of an insert built from
    // the filters.
    int count = useValues ? rec->numValues : ((t & (WSQL_TYPE_SELECT | WSQL_TYPE_INSERT)) ? rec->numFilters : 0);
    SQL1_Sqlda* sub = nullptr;
    if ((t & (WSQL_TYPE_SUBSELECT | WSQL_TYPE_BOUNDINPUT)) == (WSQL_TYPE_SUBSELECT | WSQL_TYPE_BOUNDINPUT) &&
        subSelect != nullptr)
        sub = subSelect->getOutputSQLDA();
    int rc = 0;
    for (int i = 0; i < count && rc == 0; i++) {
        const char* column = useValues ? rec->columns[i] : rec->filters[i].column;
        const char* value = useValues ? rec->values[i] : rec->filters[i].value;
        if (value == nullptr) value = "";
        if (value[0] == '\0' && sub != nullptr && i < sub->used) {
            const SQL1_SqlVar& v = sub->var[i];
            short n = static_cast<short>(v.length < v.maxLength ? v.length : v.maxLength);
            rc = select->setInputValue(i, static_cast<const void*>(v.data), n);
            RAS1_TRACE_IF(ras, RAS1_DETAIL, "Input [%d/%d] column: %-10s value: %.*s (binary %d)", i, count,
                          column != nullptr ? column : "", static_cast<int>(n), v.data, static_cast<int>(n));
        } else {
            rc = select->setInputValue(i, value, static_cast<short>(-1));
            RAS1_TRACE_IF(ras, RAS1_DETAIL, "Input [%d/%d] column: %-10s value: %s", i, count,
                          column != nullptr ? column : "", value);
        }
        if (rc != 0) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Error %d Input [%d/%d] column: %s value: %s", rc, i, count,
                        column != nullptr ? column : "", value);
            rc = rc == -1 ? 1 : rc;
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::buildSubInput(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    if (subSelect != nullptr && rec->numFilters > 0 && (type.load() & WSQL_TYPE_SUBINPUT)) {
        for (int i = 0; i < rec->numFilters && rc == 0; i++) {
            const WSQL_Filter_t& f = rec->filters[i];
            const char* value = f.value != nullptr ? f.value : "";
            int len = static_cast<int>(std::strlen(value));
            rc = subSelect->setInputValue(i, value, static_cast<short>(len > 32767 ? 32767 : len));
            RAS1_TRACE_IF(ras, RAS1_DETAIL, "Input [%d/%d] column: %-10s len: %d value: %.*s", i, rec->numFilters,
                          f.column != nullptr ? f.column : "", len, len, value);
            if (rc != 0) {
                RAS1_Printf(RAS1_THIS, __LINE__, "Error %d Input [%d/%d] column: %s len: %d value: %.*s", rc, i,
                            rec->numFilters, f.column != nullptr ? f.column : "", len, len, value);
                rc = 1;
            }
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
