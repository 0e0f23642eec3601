// kshreq: request life cycle, the request list and its expiry thread (see
// kshreq.h). SQL construction is in kshreqsql.cpp, result writing in
// kshreqout.cpp.
#include "kshreq.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "anc1/anc1.h"
#include "bss1/bss1.h"
#include "cnt1/cnt1.h"
#include "kshcat.h"
#include "kshcol.h"
#include "kshhttp.h"
#include "kshanchor.h"
#include "kshhub.h"
#include "kshtab.h"
#include "kshutil.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshreq");

namespace {

// Codes carried by the request list timer.
enum : int {
    kTimerNone = 0,      // a timed-out wait: time for a pass
    kTimerExit = 1,      // terminate: the expiry thread ends
    kTimerScanNow = 2,   // test hook: one pass now
    kTimerCancelled = 4, // a request cancelled by terminate is gone
};

// The expiry thread waits this long between passes.
constexpr long long kPassMillis = 60 * 1000;

// Class-wide state. The recursive list mutex may be taken again by a
// request's destructor while a scan that deletes it holds it.
std::recursive_mutex gListMutex;           // requestListMutex
LinkedList* gRequestList = nullptr;        // GUARDED_BY(gListMutex) for scans and its life
WSQL_SignalEvent gTimer;                   // requestListTimer
BSS1_Thread* gExpiryThread = nullptr;      // requestListThreadID
std::atomic<int> gExpiry{WSQL_DEFAULT_EXPIRY};
std::atomic<KFA_ResolveThruNode_t> gResolver{nullptr};
std::atomic<bool> gRunning{false};

// Pass accounting for expiryPassNow.
std::mutex gPassMu;
std::condition_variable gPassCv;
unsigned gPassesStarted = 0;    // GUARDED_BY(gPassMu)
unsigned gPassesCompleted = 0;  // GUARDED_BY(gPassMu)

// Credential field copy: at most 16 bytes, the rest zero.
void copyCredential(char* dst, const char* src) {
    size_t n = strnlen(src, WSQL_CREDENTIAL_SIZE);
    std::memset(dst, 0, WSQL_CREDENTIAL_SIZE);
    std::memcpy(dst, src, n);
}

bool isAction(const char* action, const char* name) { return action != nullptr && WSQL_CaseCompare(action, name) == 0; }

}  // namespace

// ---------------------------------------------------------------------------
// Signal event
// ---------------------------------------------------------------------------

void WSQL_SignalEvent::clear() {
    std::lock_guard<std::mutex> g(mu);
    code_ = 0;
    signaled = 0;
}

void WSQL_SignalEvent::signalLocked(int code) {
    code_ = code;
    signaled = 1;
    cond.notify_all();
}

void WSQL_SignalEvent::signal(int code) {
    std::lock_guard<std::mutex> g(mu);
    signalLocked(code);
}

int WSQL_SignalEvent::wait(int* code) {
    std::unique_lock<std::mutex> l(mu);
    cond.wait(l, [this] { return signaled != 0; });
    if (code != nullptr) *code = code_;
    code_ = 0;
    signaled = 0;
    return WAIT_OK;
}

int WSQL_SignalEvent::waitMarked(int* code, std::atomic<uint32_t>& word, uint32_t bit) {
    std::unique_lock<std::mutex> l(mu);
    word.fetch_or(bit);
    cond.wait(l, [this] { return signaled != 0; });
    word.fetch_and(~bit);
    if (code != nullptr) *code = code_;
    code_ = 0;
    signaled = 0;
    return WAIT_OK;
}

int WSQL_SignalEvent::waitUntil(long long deadlineMillis, int* code) {
    std::unique_lock<std::mutex> l(mu);
    int rc = WAIT_OK;
    while (signaled == 0) {
        long long left = deadlineMillis - BSS1_MonotonicMillis();
        if (left <= 0) {
            rc = WAIT_TIMEOUT;
            break;
        }
        cond.wait_for(l, std::chrono::milliseconds(left));
    }
    if (code != nullptr) *code = code_;
    code_ = 0;
    signaled = 0;
    return rc;
}

bool WSQL_SignalEvent::posted() {
    std::lock_guard<std::mutex> g(mu);
    return signaled != 0;
}

// ---------------------------------------------------------------------------
// Class start and stop
// ---------------------------------------------------------------------------

int WSQL_Request::initialize() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    {
        std::lock_guard<std::recursive_mutex> g(gListMutex);
        if (gRunning.load()) {
            RAS1_EXIT_RC(ras, 0);
            return 0;
        }
        if (gRequestList == nullptr) gRequestList = new LinkedList(nullptr);
        gTimer.clear();
        const char* env = BSS1_GetEnv("KSH_REQUEST_EXPIRY", nullptr);
        int expiry = WSQL_DEFAULT_EXPIRY;
        if (env != nullptr) {
            char* end = nullptr;
            long v = std::strtol(env, &end, 10);
            if (end != env && v > 0 && v <= 0x7FFFFFFF) expiry = static_cast<int>(v);
            RAS1_TRACE_IF(ras, RAS1_STATE, "Request expiry interval set to %d seconds", expiry);
        }
        gExpiry.store(expiry);
        // Sized like every thread of the gateway: the anchor's stack size.
        size_t stack = gAnchor != nullptr ? gAnchor->threadStackSize : 0;
        int st = BSS1_CreateThread(&gExpiryThread, stack,
                                   [](void* list) { deleteExpiredRequests(static_cast<LinkedList*>(list)); },
                                   gRequestList);
        if (st != 0) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Unable to start the request expiry thread st=%d", st);
            gExpiryThread = nullptr;
        }
        gRunning.store(true);
    }
    // The thru-node resolver: a module of that name when one is installed,
    // otherwise the one the platform library carries.
    void* sym = nullptr;
    int rc = CNT1_Load("KFAPRB", "KFARSVTN", &sym);
    if (rc != CNT1_OK) rc = CNT1_Load("platform", "KFARSVTN", &sym);
    if (rc != CNT1_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "KFA_ResolveThruNode not initialized - CNT1 load error - %s", CNT1_LastError());
        sym = nullptr;
    }
    gResolver.store(reinterpret_cast<KFA_ResolveThruNode_t>(sym));
    RAS1_EXIT_RC(ras, 0);
    return 0;
}

void WSQL_Request::deleteExpiredRequests(LinkedList* list) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    for (;;) {
        int code = 0;
        int rc = gTimer.waitUntil(BSS1_MonotonicMillis() + kPassMillis, &code);
        bool pass = (rc == WSQL_SignalEvent::WAIT_TIMEOUT && code == kTimerNone) ||
                    (rc == WSQL_SignalEvent::WAIT_OK && code == kTimerScanNow);
        if (!pass) {
            RAS1_TRACE_IF(ras, RAS1_STATE, "Signal received: exiting rc=%d code=%d", rc, code);
            break;
        }
        {
            std::lock_guard<std::mutex> g(gPassMu);
            gPassesStarted++;
        }
        time_t now = BSS1_Time();
        RAS1_TRACE_IF(ras, RAS1_STATE, "Scouting for expired requests - Wakeup at %d/%d rc=%d code=%d",
                      static_cast<int>(now), static_cast<int>(now % 60), rc, code);
        {
            std::lock_guard<std::recursive_mutex> g(gListMutex);
            now = BSS1_Time();
            LinkedListIter it(list);
            for (void* v = it.Next(); v != nullptr; v = it.Next()) {
                auto* r = static_cast<WSQL_Request*>(v);
                char d[160];
                r->describe(d, sizeof d);
                if (!r->isPersisted()) {
                    RAS1_TRACE_IF(ras, RAS1_DETAIL, "Skipping Non-Persisted Request %s", d);
                } else if (!r->hasExpired(now)) {
                    RAS1_TRACE_IF(ras, RAS1_DETAIL, "Skipping Non-Expired Persist Request %s", d);
                } else if (!r->isActive()) {
                    RAS1_TRACE_IF(ras, RAS1_STATE, "Deleting Expired Persist Request %s", d);
                    (void)r->Done(0);
                    delete r;
                } else if ((r->getType() & WSQL_TYPE_ASYNC) == 0) {
                    RAS1_TRACE_IF(ras, RAS1_DETAIL, "Skipping Active Expired Persist Request %s", d);
                } else {
                    std::lock_guard<std::mutex> cg(r->completion.mutex());
                    if (r->state.load() & STATE_WAITING) {
                        r->state.fetch_and(~STATE_PERSISTED);
                        r->completion.signalLocked(WSQL_CANCELLED);
                        RAS1_TRACE_IF(ras, RAS1_STATE, "Signal Cancel Persist Request status=>%d %s", WSQL_CANCELLED, d);
                    } else {
                        RAS1_TRACE_IF(ras, RAS1_DETAIL, "Skipping Active Expired Persist Asynch Request %s", d);
                    }
                }
            }
        }
        {
            std::lock_guard<std::mutex> g(gPassMu);
            gPassesCompleted++;
        }
        gPassCv.notify_all();
    }
    RAS1_EXIT(ras);
}

int WSQL_Request::terminate() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (!gRunning.exchange(false)) {
        RAS1_EXIT_RC(ras, 0);
        return 0;
    }
    gTimer.signal(kTimerExit);
    if (gExpiryThread != nullptr) (void)BSS1_JoinThread(gExpiryThread);
    gExpiryThread = nullptr;
    gTimer.clear();
    bool activeLeft = false;
    {
        std::unique_lock<std::recursive_mutex> l(gListMutex);
        LinkedListIter it(gRequestList);
        for (void* v = it.Next(); v != nullptr; v = it.Next()) {
            auto* r = static_cast<WSQL_Request*>(v);
            char d[160];
            r->describe(d, sizeof d);
            bool cancelled = false;
            if (r->getType() & WSQL_TYPE_ASYNC) {
                std::lock_guard<std::mutex> cg(r->completion.mutex());
                if (r->state.load() & STATE_WAITING) {
                    r->state.fetch_and(~STATE_PERSISTED);
                    r->state.fetch_or(STATE_SHUTDOWN_CANCEL);
                    r->completion.signalLocked(WSQL_CANCELLED);
                    cancelled = true;
                }
            }
            if (cancelled) {
                RAS1_TRACE_IF(ras, RAS1_STATE, "Wait on request cancel to Complete %s", d);
                // The list mutex is let go while waiting: the cancelled
                // request's own thread needs it to leave the list. The
                // registered iterator keeps the walk safe meanwhile.
                l.unlock();
                int code = 0;
                int rc = gTimer.waitUntil(BSS1_MonotonicMillis() + 1000, &code);
                l.lock();
                RAS1_TRACE_IF(ras, RAS1_STATE, "Request cancel wait Completed rc=%d code=%d. %s", rc, code, d);
            } else if (r->isPersisted() && !r->isActive()) {
                RAS1_TRACE_IF(ras, RAS1_STATE, "Deleting Inactive Persist Request %s", d);
                (void)r->Done(0);
                delete r;
            } else if (r->isPersisted()) {
                RAS1_TRACE_IF(ras, RAS1_STATE, "Skipping Active Persist Request %s", d);
                activeLeft = true;
            } else {
                RAS1_TRACE_IF(ras, RAS1_STATE, "Skipping Active Request %s", d);
                activeLeft = true;
            }
        }
    }
    int code = 0;
    if (activeLeft) {
        RAS1_TRACE_IF(ras, RAS1_STATE, "Waiting %d seconds for Active Request(s) to complete", 10);
        // Nothing signals the end of an ordinary request: look at the list
        // now and then, so that a stop does not always take ten seconds.
        long long deadline = BSS1_MonotonicMillis() + 10000;
        while (requestCount() > 0 && BSS1_MonotonicMillis() < deadline) {
            long long next = BSS1_MonotonicMillis() + 50;
            (void)gTimer.waitUntil(next < deadline ? next : deadline, &code);
        }
    } else {
        RAS1_TRACE_IF(ras, RAS1_DETAIL, "Yielding requestList");
        (void)gTimer.waitUntil(BSS1_MonotonicMillis(), &code);
    }
    {
        std::lock_guard<std::recursive_mutex> g(gListMutex);
        LinkedListIter* it = new LinkedListIter(gRequestList);
        for (void* v = it->Next(); v != nullptr; v = it->Next()) {
            auto* r = static_cast<WSQL_Request*>(v);
            RAS1_Printf(RAS1_THIS, __LINE__, "Active Request detected (%p) %d a=%d p=%d", static_cast<void*>(r),
                        static_cast<int>(r->alias), r->isActive() ? 1 : 0, r->isPersisted() ? 1 : 0);
        }
        delete it;
        // Requests still alive keep the list; it is reused by the next
        // initialize.
        if (gRequestList->NumEntries() == 0) {
            delete gRequestList;
            gRequestList = nullptr;
        }
    }
    RAS1_EXIT_RC(ras, 0);
    return 0;
}

int WSQL_Request::expiryPassNow() {
    if (!gRunning.load() || gExpiryThread == nullptr) return WSQL_NOTFOUND;
    std::unique_lock<std::mutex> l(gPassMu);
    unsigned target = gPassesStarted + 1;
    gTimer.signal(kTimerScanNow);
    gPassCv.wait(l, [target] { return gPassesCompleted >= target || !gRunning.load(); });
    return gPassesCompleted >= target ? 0 : WSQL_NOTFOUND;
}

unsigned WSQL_Request::requestCount() {
    std::lock_guard<std::recursive_mutex> g(gListMutex);
    return gRequestList != nullptr ? gRequestList->NumEntries() : 0;
}

int WSQL_Request::getRequestExpiry() { return gExpiry.load(); }

KFA_ResolveThruNode_t WSQL_Request::getResolver() { return gResolver.load(); }

KFA_ResolveThruNode_t WSQL_Request::setResolver(KFA_ResolveThruNode_t resolver) { return gResolver.exchange(resolver); }

// ---------------------------------------------------------------------------
// Handles and the asynchronous exit
// ---------------------------------------------------------------------------

WSQL_Request* WSQL_Request::locateRequest(unsigned handle, WSQL_HttpServer* http) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    std::lock_guard<std::recursive_mutex> g(gListMutex);
    void* obj = nullptr;
    WSQL_Request* r = nullptr;
    if (handle != 0 && ANC1_Convert(handle, &obj) == ANC1_OK && obj != nullptr) {
        r = static_cast<WSQL_Request*>(obj);
        // One HTTP request at a time drives a statement: a request that is
        // active elsewhere is not handed out a second time.
        uint32_t old = r->state.fetch_or(STATE_ACTIVE);
        if ((old & STATE_ACTIVE) != 0 || (old & STATE_PERSISTED) == 0) {
            if ((old & STATE_ACTIVE) == 0) r->state.fetch_and(~STATE_ACTIVE);
            RAS1_TRACE_IF(ras, RAS1_STATE, "Request %u is in use or not persisted", handle);
            r = nullptr;
        } else {
            r->http = http;
        }
    }
    RAS1_EXIT(ras);
    return r;
}

void WSQL_Request::Exit(long status, void* arg) {
    // The argument is the request's handle, not its address: the open may
    // finish after the request was cancelled and destroyed, and a handle is
    // checked where an address could not be.
    unsigned alias = static_cast<unsigned>(reinterpret_cast<uintptr_t>(arg));
    int rc = PFM1_Guard("Request Exit", [&]() -> int {
        int ras = RAS1_Sync(RAS1_THIS);
        std::lock_guard<std::recursive_mutex> g(gListMutex);
        void* obj = nullptr;
        if (ANC1_Convert(alias, &obj) != ANC1_OK || obj == nullptr) {
            RAS1_TRACE_IF(ras, RAS1_STATE, "Request Exit alias %d object(%p) != parm(%p) reqStatus %d ",
                          static_cast<int>(alias), obj, arg, static_cast<int>(status));
            return 0;
        }
        auto* r = static_cast<WSQL_Request*>(obj);
        char d[160];
        r->describe(d, sizeof d);
        std::lock_guard<std::mutex> cg(r->completion.mutex());
        // A cancel the waiter has not seen yet wins over the open's late
        // report: the request is no longer persisted and must end.
        if (r->completion.pendingLocked(WSQL_CANCELLED)) return 0;
        r->completion.signalLocked(static_cast<int>(status));
        RAS1_TRACE_IF(ras, RAS1_STATE, "Signal request status=%d %s", static_cast<int>(status), d);
        return 0;
    });
    if (rc != 0)
        RAS1_Printf(RAS1_THIS, __LINE__, "Request Exit Abend parm(%p) reqStatus %d request(%p), alias %d ", arg,
                    static_cast<int>(status), arg, static_cast<int>(alias));
}

// ---------------------------------------------------------------------------
// Construction and destruction
// ---------------------------------------------------------------------------

WSQL_Request::WSQL_Request(WSQL_Hub* h, WSQL_HttpServer* server)
    : table(nullptr),
      select(nullptr),
      subSelect(nullptr),
      parse(0),
      historyTable(0),
      type(0),
      hub(h),
      credentials(nullptr),
      record(nullptr),
      alias(0),
      _expiry(0),
      http(server),
      state(0),
      exitBlock{},
      subSqlCopy(nullptr) {
    sqlText[0] = '\0';
    userid[0] = password[0] = clientHost[0] = '\0';
    std::memset(userid, 0, sizeof userid);
    std::memset(password, 0, sizeof password);
    std::memset(clientHost, 0, sizeof clientHost);
    routeNode[0] = '\0';
    setExpiry();
    std::lock_guard<std::recursive_mutex> g(gListMutex);
    if (ANC1_Reserve(this, &alias) != ANC1_OK) alias = 0;
    state.fetch_or(STATE_ACTIVE);
    if (gRequestList != nullptr && gRequestList->AppendEntry(this) != 0)
        RAS1_Printf(RAS1_THIS, __LINE__, "Request (%p) could not join the request list", static_cast<void*>(this));
}

WSQL_Request::~WSQL_Request() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    {
        // Out of the list before the active bit goes: an expiry pass must
        // never see this request inactive and delete it a second time.
        std::lock_guard<std::recursive_mutex> g(gListMutex);
        if (alias != 0) (void)ANC1_Release(alias);
        if (gRequestList != nullptr) (void)gRequestList->RemoveEntry(this);
        state.fetch_and(~STATE_ACTIVE);
    }
    // Out of the list: a stop waiting for this cancelled request may go on
    // while the statements are released below.
    if (type.load() & WSQL_TYPE_ASYNC) {
        std::lock_guard<std::mutex> cg(completion.mutex());
        if (state.load() & STATE_SHUTDOWN_CANCEL) {
            state.fetch_and(~STATE_SHUTDOWN_CANCEL);
            gTimer.signal(kTimerCancelled);
        }
    }
    delete subSelect;
    delete select;
    if (historyTable) delete table;
    std::free(subSqlCopy);
    RAS1_EXIT(ras);
}

void WSQL_Request::setExpiry() {
    int ras = RAS1_Sync(RAS1_THIS);
    time_t e = BSS1_Time() + gExpiry.load();
    _expiry.store(e);
    RAS1_TRACE_IF(ras, RAS1_DETAIL, "_expiry set to %d", static_cast<int>(e));
}

void WSQL_Request::describe(char* out, size_t size) const {
    // Only a persisted request's names are read here: they are written
    // before the persisted bit is published, and never change afterwards.
    bool named = isPersisted();
    const char* tableName = named && table != nullptr ? table->TableName() : "";
    std::snprintf(out, size, "%s %.16s[%.16s] (%p) %d", tableName, named ? userid : "", named ? clientHost : "",
                  static_cast<const void*>(this), static_cast<int>(alias));
}

// ---------------------------------------------------------------------------
// InitReq
// ---------------------------------------------------------------------------

int WSQL_Request::InitReq(WSQL_Request_t* rec, const char* action) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = PFM1_Guard("InitReq", [&] { return initReqBody(rec, action); });
    if (rc == PFM1_ABEND) RAS1_Printf(RAS1_THIS, __LINE__, "Abend detected creating Client Request");
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::resolveTable(WSQL_Request_t* rec) {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_Catalog* cat = WSQL_GetCatalog();
    const char* name = rec->table;
    table = nullptr;
    if (cat == nullptr || name == nullptr || !WSQL_IsPlainName(name)) return WSQL_NOTFOUND;
    bool byObject = (rec->methods & WSQL_METHOD_GET) != 0 && (rec->elements & WSQL_ELEM_OBJECT) != 0;
    auto find = [&](const char* n) { return byObject ? cat->GetTableByObject(n) : cat->GetTable(n); };
    WSQL_Table* t = find(name);
    const char* dotV = std::strstr(name, ".V");
    if (t == nullptr && dotV != nullptr) {
        char unversioned[256];
        size_t head = static_cast<size_t>(dotV - name) + 1;
        if (std::strlen(name) < sizeof unversioned) {
            std::snprintf(unversioned, sizeof unversioned, "%.*s%s", static_cast<int>(head), name, dotV + 2);
            t = find(unversioned);
            if (t != nullptr) rec->versionedTable = 1;
        }
    }
    if (t == nullptr && rec->numColumns > 0) {
        auto* dyn = new WSQL_Table(name, name, "DynamicObject");
        dyn->setDynamic(true);
        int st = cat->AddTable(dyn);
        if (st != 0) {
            delete dyn;
            t = cat->GetTable(name);  // another request added it meanwhile
        } else {
            t = dyn;
            RAS1_TRACE_IF(ras, RAS1_CATALOG, "Dynamic table %s added", name);
        }
    }
    table = t;
    return t != nullptr ? 0 : WSQL_NOTFOUND;
}

int WSQL_Request::initReqBody(WSQL_Request_t* rec, const char* action) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_TRACE_IF(ras, RAS1_STATE, "req->methods = %#.08X", rec->methods);
    (void)resolveTable(rec);
    record = rec;
    type.fetch_or(rec->type);
    copyCredential(userid, rec->userid);
    copyCredential(password, rec->password);
    copyCredential(clientHost, rec->clientHost);
    credentials = userid;
    if (rec->history && table != nullptr) {
        WSQL_Table* copy = CreateHistoricalTable(table);
        if (copy == nullptr) return WSQL_NOMEM;
        table = copy;
        historyTable = 1;
    }
    if (rec->elements & WSQL_ELEM_PERSIST) {
        uint32_t t = WSQL_TYPE_PERSISTED | WSQL_TYPE_ASYNC;
        if (rec->numFilters > 0 || rec->numValues > 0) t |= WSQL_TYPE_BOUNDINPUT;
        type.fetch_or(t);
        // Published last: the expiry thread reads the names once it sees it.
        state.fetch_or(STATE_PERSISTED);
    }
    if (type.load() & WSQL_TYPE_ASYNC) {
        completion.clear();
        exitBlock.kind = SQL1_EXIT_CALLBACK;
        exitBlock.callback = Exit;
        exitBlock.arg = reinterpret_cast<void*>(static_cast<uintptr_t>(alias));
    }
    if (table == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to find table/object %s", rec->table != nullptr ? rec->table : "");
        if (http != nullptr) http->setRequestError(true, "Invalid object name", rec->table, 0);
        return WSQL_NOTFOUND;
    }
    int rc;
    if (isAction(action, "insert")) {
        rc = buildInsertSQL(rec);
        type.fetch_or(WSQL_TYPE_INSERT);
    } else if (isAction(action, "delete")) {
        rc = buildDeleteSQL(rec);
        type.fetch_or(WSQL_TYPE_DELETE);
    } else if (isAction(action, "update")) {
        rc = buildUpdateSQL(rec);
        type.fetch_or(WSQL_TYPE_UPDATE);
    } else {
        rc = buildSQL(rec);
        type.fetch_or(WSQL_TYPE_SELECT);
    }
    if (rc != 0) return rc;
    select = new DS_SQLSelect(hub, sqlText);
    parse = rec->parse;
    if (type.load() & WSQL_TYPE_SUBSELECT) {
        // The record's texts live only as long as this HTTP request; a
        // persisted request keeps its statements longer.
        subSqlCopy = WSQL_Strdup(rec->subSql != nullptr ? rec->subSql : "");
        if (subSqlCopy == nullptr) return WSQL_NOMEM;
        subSelect = new DS_SQLSelect(hub, subSqlCopy);
    }
    return 0;
}

int WSQL_Request::InitializeAuxReq(const char* sql) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    if (sql == nullptr || std::strlen(sql) >= sizeof sqlText) {
        rc = WSQL_NOMEM;
    } else {
        std::snprintf(sqlText, sizeof sqlText, "%s", sql);
        select = new DS_SQLSelect(hub, sqlText);
        type.fetch_or(WSQL_TYPE_SELECT);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// ---------------------------------------------------------------------------
// Start
// ---------------------------------------------------------------------------

int WSQL_Request::Start() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = PFM1_Guard("Start", [&] { return startBody(); });
    if (rc == PFM1_ABEND) RAS1_Printf(RAS1_THIS, __LINE__, "Abend detected starting Client Request");
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Request::verifyAccess() {
    char user[WSQL_CREDENTIAL_SIZE + 1];
    std::snprintf(user, sizeof user, "%.16s", userid);
    int level = hub->verifyUser(user[0] != '\0' ? user : nullptr);
    uint32_t methods = record != nullptr ? record->methods : 0;
    bool ok = (methods & WSQL_METHODS_UPDATING) != 0 ? level == WSQL_ACCESS_UPDATE
                                                     : level == WSQL_ACCESS_QUERY || level == WSQL_ACCESS_UPDATE;
    if (ok) return 0;
    if (http != nullptr) http->setRequestError(true, "Hub User Access List Validation Failed.", nullptr, 0);
    return WSQL_BADINPUT;
}

int WSQL_Request::logon(DS_SQLSelect* stmt, bool own) {
    int rc;
    if (own) {
        if (credentials != nullptr) {
            SQL1_LoginId* id = stmt->loginId();
            std::memcpy(id->userId, userid, sizeof id->userId);
            std::memcpy(id->password, password, sizeof id->password);
            std::memcpy(id->clientHost, clientHost, sizeof id->clientHost);
        }
        rc = stmt->login(1);
    } else {
        stmt->useGlobalPath();
        rc = stmt->login(0);
    }
    if (rc == 0 || http == nullptr) return rc;
    static const int kLogonRefusals[] = {1021, 1005, 1006, 1010, 1011, 11, 1015, 8};
    bool refused = false;
    for (int code : kLogonRefusals) refused = refused || rc == code;
    if (refused) {
        char user[WSQL_CREDENTIAL_SIZE + 1];
        std::snprintf(user, sizeof user, "%.16s", userid);
        http->setRequestError(true, "LMS logon validation failed.", user, 0);
    } else if (rc == WSQL_NONLS && !hub->isHubNLS()) {
        http->setRequestError(true, "HUB Version is incompatible.", hub->getLMSName(), 0);
    } else {
        http->setRequestError(true, "Unable to connect to LMS.", hub->getLMSName(), 0);
    }
    return rc;
}

// A second statement reads the current rows; each row drives one execution
// of the main statement, whose empty values take the row's values.
int WSQL_Request::startUpdates() {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = logon(subSelect, false);
    if (rc == 0) rc = subSelect->create(0, nullptr);
    if (rc == 0) rc = select->create(0, nullptr);
    if (rc == 0 && (type.load() & WSQL_TYPE_SUBINPUT) && record != nullptr) rc = buildSubInput(record);
    if (rc == 0) rc = subSelect->open();
    while (rc == 0 && (rc = subSelect->fetch()) == 0) {
        if (select->CurrentState() != DS_SQLRequest::SQL_CREATED) {
            RAS1_TRACE_IF(ras, RAS1_ERROR, "Request not Created %d.", static_cast<int>(select->CurrentState()));
            rc = WSQL_BADINPUT;
            break;
        }
        if (record != nullptr) rc = buildInput(record);
        if (rc != 0) break;
        if (select->CurrentState() == DS_SQLRequest::SQL_OPEN) (void)select->close();
        rc = select->open();
        if (rc == 0) rc = select->close();
    }
    if (rc == WSQL_ENDOFDATA) rc = 0;
    if (subSelect->CurrentState() == DS_SQLRequest::SQL_OPEN) (void)subSelect->close();
    return rc;
}

int WSQL_Request::startBody() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (select == nullptr) return WSQL_NOTFOUND;
    int rc = 0;
    if (credentials != nullptr) rc = verifyAccess();
    if (rc != 0) return rc;
    uint32_t t = type.load();
    // the main statement logs on through the global path of the hub unless
    // the request came from a SOAP method, which carries its own user
    rc = logon(select, (t & WSQL_TYPE_SOAP) != 0);
    if (rc == 0) {
        if ((t & (WSQL_TYPE_SUBSELECT | WSQL_TYPE_BOUNDINPUT)) == (WSQL_TYPE_SUBSELECT | WSQL_TYPE_BOUNDINPUT) &&
            subSelect != nullptr) {
            rc = startUpdates();
        } else {
            bool async = (t & (WSQL_TYPE_SOAP | WSQL_TYPE_ASYNC)) == (WSQL_TYPE_SOAP | WSQL_TYPE_ASYNC);
            rc = select->create(0, async ? &exitBlock : nullptr);
            if (rc == 0 && (t & WSQL_TYPE_BOUNDINPUT)) {
                if (select->CurrentState() != DS_SQLRequest::SQL_CREATED) {
                    RAS1_TRACE_IF(ras, RAS1_ERROR, "Request not Created %d.", static_cast<int>(select->CurrentState()));
                    rc = WSQL_BADINPUT;
                } else if (record != nullptr) {
                    rc = buildInput(record);
                }
            }
        }
    }
    if (rc == -1) {
        RAS1_TRACE_IF(ras, RAS1_ERROR, "Request Protocol Error (-1) %d.", rc);
        rc = WSQL_BADINPUT;
    } else if (rc != 0) {
        RAS1_TRACE_IF(ras, RAS1_ERROR, "Request Error %d.", rc);
    }
    return rc;
}

int WSQL_Request::Process(const char* action) { return 0; }

int WSQL_Request::Done(int status) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (subSelect != nullptr) {
        subSelect->Lock();
        (void)subSelect->close();
        (void)subSelect->drop();
        subSelect->Unlock();
    }
    if (select != nullptr) {
        select->Lock();
        // A cancelled request is not closed: its open may still be running.
        if (select->CurrentState() == DS_SQLRequest::SQL_OPEN && status != WSQL_CANCELLED) (void)select->close();
        (void)select->drop();
        select->Unlock();
    }
    RAS1_EXIT_RC(ras, 0);
    return 0;
}
