// kshreq: one SQL request of the gateway against a hub's monitoring server.
//
// A WSQL_Request owns the SQL text built from a parsed request record
// (WSQL_Request_t), the database statement objects (DS_SQLSelect) and the
// state that lets a request outlive its HTTP request. A request the client
// asked to persist stays in the process-wide request list under a numeric
// handle; a later request names the handle to fetch from it again. A
// background expiry thread deletes persisted requests nobody has used for
// the expiry interval (KSH_REQUEST_EXPIRY seconds, default 3600).
// Persisted requests open asynchronously: the SQL layer calls Exit when the
// open has finished and the waiting thread is woken through the request's
// completion event.
//
// Order of use: construct, InitReq, Start, Fetch (or WriteResponse),
// Process; then deactiveRequest (persisted: kept in the list) or Done and
// delete. A resumed request: locateRequest, optionally buildInput, Fetch,
// Process, deactiveRequest.
//
// The sources: kshreq.cpp (life cycle, request list, expiry), kshreqsql.cpp
// (SQL text), kshreqout.cpp (rows written as XML, topology results).
//
// Results: 0 success; 5 no table or statement, nothing to insert or set,
// managing system not online; 6 protocol error; 7 statement too long; 8
// abnormal end or thru-node resolution unavailable; 1009 cancelled; other
// values are statuses of the SQL layer or logon.
//
// Every value the builders put into an SQL literal is escaped (a double
// quote is doubled), and names taken from a request (tables, columns,
// attributes, parma names, routing nodes) must be plain identifiers; a
// statement that would not fit the SQL buffer fails, it is never cut.
//
// Thread safety: a request is used by one HTTP worker at a time
// (locateRequest hands a persisted request to one worker only). The request
// list is guarded by requestListMutex; the state and type words are atomic.
// Lock order: requestListMutex, then a request's completion mutex; the
// timer's mutex is taken alone or inside a completion mutex.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <ctime>
#include <mutex>

#include "kshdsr.h"
#include "kshlst.h"
#include "kshreqt.h"
#include "sql1/sql1.h"

class WSQL_Hub;
class WSQL_HttpServer;
class WSQL_Table;
class WSQL_Column;
class WSQL_SqlText;

// Size of a request's SQL buffer, terminator included.
constexpr size_t WSQL_SQL_SIZE = 8096;

// Room for a routing node name (32 characters and the terminator).
constexpr size_t WSQL_NODE_ROUTE_SIZE = 33;

// The request expiry interval's default, seconds.
constexpr int WSQL_DEFAULT_EXPIRY = 3600;

// Writes `value` (`n` bytes; n < 0: up to the terminator) into `out` as the
// inside of a double-quoted SQL literal: every double quote is doubled.
// Returns the length written, or -1 when it does not fit in `size` bytes
// with its terminator (`out` then holds "").
int WSQL_EscapeLiteral(const char* value, int n, char* out, size_t size);
// True when `name` may be pasted into SQL as a name: a letter, '_', '#',
// '@' or '$' first, then letters, digits, '_', '#', '@', '$' and '.'.
bool WSQL_IsPlainName(const char* name);

// Cleans an attribute name in place: every character other than a letter,
// digit or '_' is deleted, then leading characters up to the first letter.
// Returns 0.
int WSQL_ConvertAttr(char* name);

// The column `name` of `table`, appended (column and attribute name alike,
// not hidden, of type `type`) when the table has none; null when memory is
// short. Serialised, so concurrent requests add a column once.
WSQL_Column* WSQL_AddDynamicColumn(WSQL_Table* table, const char* name, int type);

// A signal event: a condition, its mutex, a code and a posted flag.
// Signalling sets code and posted under the mutex and wakes the waiter;
// waiting returns when posted (0) or at the deadline (110), hands back the
// code and clears code and posted.
class WSQL_SignalEvent {
public:
    enum : int { WAIT_OK = 0, WAIT_TIMEOUT = 110 };

    void clear();
    void signal(int code);
    // REQUIRES: mutex() held by the caller (for signals made inside a larger
    // critical section).
    void signalLocked(int code);
    // Waits untimed.
    int wait(int* code);
    // Waits untimed with `bit` set in `word` for exactly as long as the
    // wait lasts (set and cleared under the mutex, so whoever looks at the
    // bit under the mutex sees a waiter that has not been woken yet).
    int waitMarked(int* code, std::atomic<uint32_t>& word, uint32_t bit);
    // Waits until `deadlineMillis` of BSS1_MonotonicMillis().
    int waitUntil(long long deadlineMillis, int* code);
    bool posted();
    // REQUIRES: mutex() held. True while a signal of `code` awaits its waiter.
    bool pendingLocked(int code) const { return signaled != 0 && code_ == code; }
    std::mutex& mutex() { return mu; }

private:
    std::mutex mu;
    std::condition_variable cond;
    int code_ = 0;     // GUARDED_BY(mu)
    int signaled = 0;  // GUARDED_BY(mu)
};

// Result kinds of GetResults.
enum ResultsType : int {
    RESULTS_TEMPLATES = 0,    // TEMPLATE, STATE rows -> SitTemplate
    RESULTS_MANAGEDOBJS = 1,  // NAME, NODE rows -> ManagedObj
    RESULTS_NODES = 2,        // NODE, NODETYPE rows -> Node
};

// The thru-node resolver: given a managed-system name, writes the name of
// the node through which the system is now reached into `thruNode`
// (`size` bytes, terminated), or an empty text. Returns 0, or non-zero when
// it cannot answer. Loaded at initialize from module "KFAPRB", symbol
// "KFARSVTN".
using KFA_ResolveThruNode_t = int (*)(const char* lmsName, const char* managedSystem, char* thruNode, int size);

class WSQL_Request {
public:
    // State bits.
    enum : uint32_t {
        STATE_PERSISTED = 0x80000000u,
        STATE_ACTIVE = 0x40000000u,
        STATE_SHUTDOWN_CANCEL = 0x00000800u,
        STATE_WAITING = 0x00000100u,
    };

    // Class start and stop (the gateway's start and stop threads). 0.
    static int initialize();
    static int terminate();
    // The expiry thread body (`list` is the request list).
    static void deleteExpiredRequests(LinkedList* list);
    // The persisted request of `handle`, made active for `http`; null when
    // the handle is unknown, expired or in use by another HTTP request.
    static WSQL_Request* locateRequest(unsigned handle, WSQL_HttpServer* http);
    // The SQL layer's exit: the open of `request` finished with `status`.
    static void Exit(long status, void* request);

    // Test hooks. expiryPassNow wakes the expiry thread for one pass and
    // returns when that pass is over (0), or 5 without a running thread.
    static int expiryPassNow();
    // Requests in the list.
    static unsigned requestCount();
    // The interval read at initialize.
    static int getRequestExpiry();
    // The loaded resolver, or null.
    static KFA_ResolveThruNode_t getResolver();
    // Replaces the resolver (null: none), returning the previous one.
    static KFA_ResolveThruNode_t setResolver(KFA_ResolveThruNode_t resolver);

    // A new active request of `hub` for `http`, appended to the list.
    WSQL_Request(WSQL_Hub* hub, WSQL_HttpServer* http);
    virtual ~WSQL_Request();
    WSQL_Request(const WSQL_Request&) = delete;
    WSQL_Request& operator=(const WSQL_Request&) = delete;

    // Resolves the table, builds the SQL, creates the statement objects.
    // The record stays the caller's; it is used only while this HTTP
    // request runs. 0, 5, 8 or the builder's result.
    [[nodiscard]] int InitReq(WSQL_Request_t* record, const char* action);
    // A select over `sql` (copied) for a request of another component
    // (topology queries); logs on through the hub's global path.
    [[nodiscard]] int InitializeAuxReq(const char* sql);
    // Validates the user, logs on, creates (and for updates binds) the
    // statements. 0, 5 (no select), 6, 8 or a logon/SQL status.
    [[nodiscard]] int Start();
    // 0.
    int Process(const char* action);
    // Releases the statements; a cancelled request (1009) is not closed.
    int Done(int status);

    // The SOAP response body of the rows (see kshreqout.cpp). 0 or the
    // open's failure.
    int Fetch(const char* action, bool unused = true);
    // The whole XML document of a query-string request.
    int WriteResponse();
    // The events body of the action "events".
    int buildEventsXML();
    // Rows converted to topology objects (no XML); a new list owned by the
    // caller (element destructor set), or null when the rows cannot be read.
    // For RESULTS_NODES, `hubName` (hubNameSize + 1 bytes) receives the NODE
    // of the first "V" row, at most hubNameSize characters.
    LinkedList* GetResults(ResultsType type, char* hubName, int hubNameSize);

    // SQL construction (kshreqsql.cpp). Results: 0; 5 nothing to insert or
    // set, managing system not online, or a name that is not an identifier;
    // 7 too long; 8 resolution unavailable.
    [[nodiscard]] int buildSQL(WSQL_Request_t* record);
    [[nodiscard]] int buildInsertSQL(WSQL_Request_t* record);
    [[nodiscard]] int buildUpdateSQL(WSQL_Request_t* record);
    [[nodiscard]] int buildDeleteSQL(WSQL_Request_t* record);
    // Binds the select's markers from the record. 0 or 1.
    int buildInput(WSQL_Request_t* record);
    // Binds the subSelect's markers from the filters. 0 or 1.
    int buildSubInput(WSQL_Request_t* record);
    // The SQL operator of a filter operator ("EQ" -> "="), "" when unknown.
    static const char* filterOper(const char* op);
    // A copy of `table` with the WRITETIME column in front; owned by the
    // request from then on (null when memory is short).
    WSQL_Table* CreateHistoricalTable(WSQL_Table* table);

    // Row rendering (kshreqout.cpp).
    int cacheAttributes(LinkedList* list, SQL1_Sqlda* descriptor);
    int writeRow(SQL1_Sqlda* descriptor, LinkedList* list);
    int writeResultColumn(char* data, unsigned long length, char* work);
    static int getInt(const char* data, int length);
    static long long getBigInt(const char* data, int length);

    void setExpiry();
    bool isActive() const { return (state.load() & STATE_ACTIVE) != 0; }
    bool isPersisted() const { return (state.load() & STATE_PERSISTED) != 0; }
    bool hasExpired(time_t now) const { return _expiry.load() <= now; }
    void deactiveRequest() { state.fetch_and(~STATE_ACTIVE); }
    uint32_t getType() const { return type.load(); }
    uint32_t getState() const { return state.load(); }
    unsigned getAlias() const { return alias; }
    time_t getExpiry() const { return _expiry.load(); }
    const char* getSQL() const { return sqlText; }
    WSQL_Table* getTable() const { return table; }
    DS_SQLSelect* getSelect() const { return select; }
    DS_SQLSelect* getSubSelect() const { return subSelect; }
    WSQL_Hub* getHub() const { return hub; }
    WSQL_HttpServer* getHttp() const { return http; }

private:
    // Trace description "%s %.16s[%.16s] (%p) %d" of the request.
    void describe(char* out, size_t size) const;
    int initReqBody(WSQL_Request_t* rec, const char* action);
    int resolveTable(WSQL_Request_t* rec);
    int startBody();
    int verifyAccess();
    int logon(DS_SQLSelect* stmt, bool own);
    int startUpdates();
    int waitForOpen();
    int openForRows();
    int writeRows(const char* action, bool insertRc);

    // SQL helpers (kshreqsql.cpp).
    int writeSelectList(WSQL_Request_t* rec, WSQL_SqlText& s);
    int writeFrom(WSQL_Request_t* rec, WSQL_SqlText& s);
    int writeAllTargets(WSQL_Request_t* rec, const char* tableName, WSQL_SqlText& s);
    int resolveTarget(WSQL_Request_t* rec, const char** node);
    int writeParma(WSQL_Request_t* rec, WSQL_SqlText& s);
    int writeFilters(WSQL_Request_t* rec, WSQL_SqlText& s);
    int routingNode(WSQL_Request_t* rec, const char** node) const;

    // Row helpers (kshreqout.cpp).
    int writeValue(SQL1_SqlVar* var, WSQL_Column* col, char* title, size_t titleSize, char* node,
                   size_t nodeSize);
    int writeCharValue(SQL1_SqlVar* var, WSQL_Column* col, int type, char* title, size_t titleSize,
                       char* node, size_t nodeSize);

    char sqlText[WSQL_SQL_SIZE];
    WSQL_Table* table;          // owned only when historyTable
    DS_SQLSelect* select;       // owned
    DS_SQLSelect* subSelect;    // owned
    unsigned char parse;
    unsigned char historyTable;
    std::atomic<uint32_t> type;
    WSQL_Hub* hub;
    char* credentials;          // userid below, once InitReq copied the record's
    WSQL_Request_t* record;     // not owned; valid while the creating HTTP request runs
    unsigned alias;
    std::atomic<time_t> _expiry;
    WSQL_HttpServer* http;
    std::atomic<uint32_t> state;
    char userid[WSQL_CREDENTIAL_SIZE];
    char password[WSQL_CREDENTIAL_SIZE];
    char clientHost[WSQL_CREDENTIAL_SIZE];
    SQL1_Exit exitBlock;
    WSQL_SignalEvent completion;
    char* subSqlCopy;           // malloc'd copy of the record's subSql
    char routeNode[WSQL_NODE_ROUTE_SIZE];  // routing node chosen by buildSQL
};
