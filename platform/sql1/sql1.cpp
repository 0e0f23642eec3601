// sql1: handles, paths, statements, requests and descriptors of the SQL
// client layer (see sql1.h); the store itself is in sql1store.cpp.
#include "sql1/sql1.h"

#include <sodium.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cmath>
#include <condition_variable>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <thread>

#include "bss1/bss1.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "sql1/sql1int.h"

RAS1_UNIT("sql1");

namespace {

enum class Kind : uint8_t { None, Path, Stmt, Request, Row };

// A slot: the never-freed home of one object at a time. `mu` serialises the
// operations on the object and guards kind, impl and changes of id.
struct Slot : SQL1_Object {
    std::mutex mu;
    Kind kind = Kind::None;
    void* impl = nullptr;
};

extern const SQL1_Ops kOps;

// Slots come in chunks that are never freed, so that a stale handle can
// always be checked. Released slots are reused oldest first and every
// object gets the next id of a 16-bit counter (0 skipped), which makes a
// stale handle that happens to match rare.
class SlotTable {
public:
    // Callers may hold another slot's lock; no slot lock is taken here.
    Slot* alloc(Kind kind, void* impl, SQL1_Handle* h) {
        Slot* s;
        uint16_t id;
        {
            std::lock_guard<std::mutex> g(mu_);
            if (free_.empty()) {
                constexpr size_t kChunk = 256;
                Slot* chunk = new Slot[kChunk];
                for (size_t i = 0; i < kChunk; i++) free_.push_back(&chunk[i]);
            }
            s = free_.front();
            free_.pop_front();
            if (++nextId_ == 0) nextId_ = 1;
            id = nextId_;
        }
        // No slot lock here: the slot came off the free list (after its
        // release, through mu_), and whoever reads kind and impl does so only
        // after seeing the id stored last, with release/acquire ordering.
        s->ops = &kOps;
        s->kind = kind;
        s->impl = impl;
        s->id.store(id, std::memory_order_release);
        *h = {id, s};
        return s;
    }
    void recycle(Slot* s) {
        std::lock_guard<std::mutex> g(mu_);
        free_.push_back(s);
    }

private:
    std::mutex mu_;
    std::deque<Slot*> free_;
    uint16_t nextId_ = 0;
};

SlotTable& slots() {
    static SlotTable* t = new SlotTable;  // never destroyed, like the slots
    return *t;
}

// State shared by a path and everything made on it.
struct PathCore {
    std::shared_ptr<Sql1Store> store;
    std::atomic<int> lost{0};  // connection-lost status once the path is dead
    std::mutex mu;             // guards children and the settable properties
    std::vector<SQL1_Handle> children;
    long codepage = 0;
    long options = 0;

    // The status of a dead path, or of an injected failure (which kills the
    // path when it is a connection-level status).
    int check(bool counted) {
        int st = lost.load();
        if (st == 0 && counted) {
            st = store->inject();
            if (SQL1_IsConnectionLost(st)) lost.store(st);
        }
        return st;
    }
    // Records a real connection-level failure.
    int note(int st) {
        if (SQL1_IsConnectionLost(st)) lost.store(st);
        return st;
    }
    void adopt(SQL1_Handle h) {
        std::lock_guard<std::mutex> g(mu);
        children.push_back(h);
    }
    void forget(SQL1_Handle h) {
        std::lock_guard<std::mutex> g(mu);
        for (size_t i = 0; i < children.size(); i++) {
            if (children[i].object == h.object && children[i].id == h.id) {
                children.erase(children.begin() + static_cast<long>(i));
                return;
            }
        }
    }
};

struct PathObj {
    std::shared_ptr<PathCore> core;
};

struct StmtObj {
    std::shared_ptr<PathCore> core;
    std::shared_ptr<const SQL1_Translation> tr;
    SQL1_Handle self{};
};

struct RequestObj;
struct RowObj {
    RequestObj* req;
};

struct RequestObj {
    std::shared_ptr<PathCore> core;
    std::shared_ptr<const SQL1_Translation> tr;
    Sql1Conn* conn = nullptr;
    sqlite3_stmt* st = nullptr;
    sqlite3_stmt* record = nullptr;  // the action table's recording insert, or null
    SQL1_Sqlda in{};
    SQL1_Sqlda out{};
    std::vector<size_t> outCap;  // capacity of each output entry's data
    int flags = 0;
    bool hasExit = false;
    SQL1_Exit exit{};
    SQL1_Handle self{};
    SQL1_Handle row{};

    std::mutex mu;  // guards everything below and the use of st
    std::condition_variable cv;
    bool pending = false;  // an asynchronous open is running
    std::thread worker;
    bool open = false;
    bool rowReady = false;  // the open stepped to the first row, not yet fetched
    bool done = false;      // no more rows
    long changes = 0;

    void waitIdle(std::unique_lock<std::mutex>& l) {
        cv.wait(l, [this] { return !pending; });
    }
};

void freeSqlda(SQL1_Sqlda* d) {
    for (uint16_t i = 0; i < d->allocated; i++) std::free(d->var[i].data);
    std::free(d->var);
    *d = SQL1_Sqlda{};
}

int allocSqlda(SQL1_Sqlda* d, size_t n) {
    if (n > 0xFFFF) return SQL1_ST_TOOLONG;
    d->var = static_cast<SQL1_SqlVar*>(std::calloc(n == 0 ? 1 : n, sizeof(SQL1_SqlVar)));
    if (d->var == nullptr) return SQL1_ST_NOMEM;
    d->allocated = static_cast<uint16_t>(n);
    d->used = static_cast<uint16_t>(n);
    return SQL1_OK;
}

// Runs `body(object)` on the live object of handle `h` of kind `kind`,
// holding the slot's lock, inside a recovery frame.
template <class T, class Body>
int withObject(SQL1_Handle h, Kind kind, const char* where, Body&& body) {
    Slot* s = static_cast<Slot*>(h.object);
    if (s == nullptr || h.id == 0) return SQL1_ST_STALE;
    std::lock_guard<std::mutex> g(s->mu);
    if (s->id.load(std::memory_order_acquire) != h.id || s->kind != kind) return SQL1_ST_STALE;
    T* obj = static_cast<T*>(s->impl);
    return PFM1_Guard(where, [&] { return body(*obj); });
}

void destroy(Kind kind, void* impl);

// Releases the object of `h`: the id changes at once (later calls through
// the handle fail as stale), then the object and what hangs on it go.
int releaseHandle(SQL1_Handle h, bool allowRow) {
    Slot* s = static_cast<Slot*>(h.object);
    if (s == nullptr || h.id == 0) return SQL1_ST_STALE;
    Kind kind;
    void* impl;
    {
        std::lock_guard<std::mutex> g(s->mu);
        if (s->id.load(std::memory_order_acquire) != h.id) return SQL1_ST_STALE;
        if (s->kind == Kind::Row && !allowRow) return SQL1_ST_BADARG;
        kind = s->kind;
        impl = s->impl;
        s->id.store(0, std::memory_order_release);
        s->kind = Kind::None;
        s->impl = nullptr;
    }
    destroy(kind, impl);
    slots().recycle(s);
    return SQL1_OK;
}

void destroyRequest(RequestObj* r) {
    {
        std::unique_lock<std::mutex> l(r->mu);
        r->waitIdle(l);
    }
    if (r->worker.joinable()) {
        // Released from inside its own exit: the thread ends on its own.
        if (r->worker.get_id() == std::this_thread::get_id()) {
            r->worker.detach();
        } else {
            r->worker.join();
        }
    }
    (void)releaseHandle(r->row, true);
    if (r->st != nullptr) r->conn->giveBack(r->tr->sql, r->st);
    if (r->record != nullptr) r->conn->giveBack(r->tr->record, r->record);
    r->core->store->release(r->conn);
    freeSqlda(&r->in);
    freeSqlda(&r->out);
    r->core->forget(r->self);
    delete r;
}

void destroy(Kind kind, void* impl) {
    switch (kind) {
    case Kind::Path: {
        auto* p = static_cast<PathObj*>(impl);
        std::vector<SQL1_Handle> children;
        {
            std::lock_guard<std::mutex> g(p->core->mu);
            children.swap(p->core->children);
        }
        for (SQL1_Handle c : children) (void)releaseHandle(c, false);
        delete p;
        break;
    }
    case Kind::Stmt: {
        auto* s = static_cast<StmtObj*>(impl);
        s->core->forget(s->self);
        delete s;
        break;
    }
    case Kind::Request:
        destroyRequest(static_cast<RequestObj*>(impl));
        break;
    case Kind::Row:
        delete static_cast<RowObj*>(impl);
        break;
    case Kind::None:
        break;
    }
}

// ---------------------------------------------------------------------------
// Binding and fetching
// ---------------------------------------------------------------------------

template <class T>
T readAs(const char* data) {
    T v;
    std::memcpy(&v, data, sizeof v);
    return v;
}

// Binds input entry `v` to marker k (1-based).
int bindOne(sqlite3_stmt* st, int k, SQL1_SqlVar* v) {
    if (v->nullInd < 0) return sqlite3_bind_null(st, k);
    const char* d = v->data;
    switch (v->type) {
    case SQL1_T_VARCHAR:
    case SQL1_T_NVARCHAR:
        return sqlite3_bind_text(st, k, d, std::min(v->length, v->maxLength), SQLITE_TRANSIENT);
    case SQL1_T_CHAR:
    case SQL1_T_NCHAR:
    case SQL1_T_DECIMAL: {
        // A set length gives the value; otherwise the value runs to the first
        // NUL within the maximum. Trailing blanks do not count.
        size_t n = v->length != 0 ? std::min(v->length, v->maxLength) : strnlen(d, v->maxLength);
        while (n > 0 && (d[n - 1] == ' ' || d[n - 1] == '\0')) n--;
        return sqlite3_bind_text(st, k, d, static_cast<int>(n), SQLITE_TRANSIENT);
    }
    case SQL1_T_SMALLINT:
        return sqlite3_bind_int64(st, k, readAs<int16_t>(d));
    case SQL1_T_USMALLINT:
        return sqlite3_bind_int64(st, k, readAs<uint16_t>(d));
    case SQL1_T_INTEGER:
        return sqlite3_bind_int64(st, k, readAs<int32_t>(d));
    case SQL1_T_UINTEGER:
        return sqlite3_bind_int64(st, k, readAs<uint32_t>(d));
    case SQL1_T_BIGINT:
        return sqlite3_bind_int64(st, k, readAs<int64_t>(d));
    case SQL1_T_UBIGINT: {
        uint64_t u = readAs<uint64_t>(d);
        if (u > static_cast<uint64_t>(INT64_MAX)) return sqlite3_bind_double(st, k, static_cast<double>(u));
        return sqlite3_bind_int64(st, k, static_cast<int64_t>(u));
    }
    case SQL1_T_DOUBLE:
    case SQL1_T_FLOAT8:
        return sqlite3_bind_double(st, k, readAs<double>(d));
    default:  // 1008 and anything else: bytes
        return sqlite3_bind_blob(st, k, d, v->length != 0 ? std::min(v->length, v->maxLength) : v->maxLength,
                                 SQLITE_TRANSIENT);
    }
}

int bindInputs(RequestObj& r, sqlite3_stmt* st, SQL1_Sqlda* in) {
    for (uint16_t i = 0; i < in->used && i < r.tr->markers.size(); i++) {
        int rc = bindOne(st, i + 1, &in->var[i]);
        if (rc != SQLITE_OK) {
            Sql1_SetError(sqlite3_errmsg(r.conn->db));
            return Sql1_Status(rc);
        }
    }
    return SQL1_OK;
}

// Makes room for n bytes (+ NUL) in output entry i.
int reserve(RequestObj& r, size_t i, size_t n) {
    if (n > 0xFFFF) {
        Sql1_SetError(std::string("value of column ") + r.out.var[i].name + " is longer than 65535 bytes");
        return SQL1_ST_TOOLONG;
    }
    if (n + 1 <= r.outCap[i]) return SQL1_OK;
    char* p = static_cast<char*>(std::realloc(r.out.var[i].data, n + 1));
    if (p == nullptr) return SQL1_ST_NOMEM;
    r.out.var[i].data = p;
    r.outCap[i] = n + 1;
    return SQL1_OK;
}

// The column as a 64-bit integer; false when it holds no integer.
bool columnInt(sqlite3_stmt* st, int j, int64_t* v, bool* big) {
    *big = false;
    switch (sqlite3_column_type(st, j)) {
    case SQLITE_INTEGER:
        *v = sqlite3_column_int64(st, j);
        return true;
    case SQLITE_FLOAT: {
        double d = sqlite3_column_double(st, j);
        if (!(d >= -9.2e18 && d <= 1.8e19)) return false;
        if (d > 9.2e18) {  // only an unsigned 8-byte column can take it
            *big = true;
            *v = static_cast<int64_t>(static_cast<uint64_t>(d));
        } else {
            *v = static_cast<int64_t>(d);
        }
        return true;
    }
    default: {
        const char* t = reinterpret_cast<const char*>(sqlite3_column_text(st, j));
        char* end = nullptr;
        errno = 0;
        long long x = std::strtoll(t != nullptr ? t : "", &end, 10);
        if (t == nullptr || end == t || *end != '\0' || errno != 0) return false;
        *v = x;
        return true;
    }
    }
}

int fillInt(RequestObj& r, int j, SQL1_SqlVar* v) {
    int64_t x = 0;
    bool big = false;
    bool ok = columnInt(r.st, j, &x, &big);
    struct Range {
        int16_t type;
        int64_t lo, hi;
        uint16_t size;
    };
    static const Range ranges[] = {
        {SQL1_T_SMALLINT, INT16_MIN, INT16_MAX, 2}, {SQL1_T_USMALLINT, 0, UINT16_MAX, 2},
        {SQL1_T_INTEGER, INT32_MIN, INT32_MAX, 4},  {SQL1_T_UINTEGER, 0, UINT32_MAX, 4},
        {SQL1_T_BIGINT, INT64_MIN, INT64_MAX, 8},   {SQL1_T_UBIGINT, 0, INT64_MAX, 8},
    };
    for (const Range& g : ranges) {
        if (g.type != v->type) continue;
        bool fits = ok && (big ? v->type == SQL1_T_UBIGINT : (x >= g.lo && x <= g.hi));
        if (!fits) {
            Sql1_SetError(std::string("value of column ") + v->name + " does not fit its type");
            return SQL1_ST_RANGE;
        }
        int16_t i16 = static_cast<int16_t>(x);
        uint16_t u16 = static_cast<uint16_t>(x);
        int32_t i32 = static_cast<int32_t>(x);
        uint32_t u32 = static_cast<uint32_t>(x);
        const void* src = g.size == 8 ? static_cast<const void*>(&x)
                          : g.size == 4 ? (v->type == SQL1_T_INTEGER ? static_cast<const void*>(&i32) : &u32)
                                        : (v->type == SQL1_T_SMALLINT ? static_cast<const void*>(&i16) : &u16);
        std::memcpy(v->data, src, g.size);
        v->length = g.size;
        return SQL1_OK;
    }
    return SQL1_ST_FAULT;
}

int fillColumn(RequestObj& r, int j) {
    SQL1_SqlVar* v = &r.out.var[j];
    v->nullInd = 0;
    int ctype = sqlite3_column_type(r.st, j);
    if (ctype == SQLITE_NULL) {
        v->nullInd = -1;
        v->length = 0;
        std::memset(v->data, 0, r.outCap[j]);
        return SQL1_OK;
    }
    switch (v->type) {
    case SQL1_T_SMALLINT:
    case SQL1_T_USMALLINT:
    case SQL1_T_INTEGER:
    case SQL1_T_UINTEGER:
    case SQL1_T_BIGINT:
    case SQL1_T_UBIGINT:
        return fillInt(r, j, v);
    case SQL1_T_DOUBLE:
    case SQL1_T_FLOAT8: {
        double d = sqlite3_column_double(r.st, j);
        std::memcpy(v->data, &d, sizeof d);
        v->length = sizeof d;
        return SQL1_OK;
    }
    case SQL1_T_BINARY: {
        const void* b = sqlite3_column_blob(r.st, j);
        size_t n = static_cast<size_t>(sqlite3_column_bytes(r.st, j));
        int rc = reserve(r, j, n);
        if (rc != SQL1_OK) return rc;
        if (n > 0) std::memcpy(r.out.var[j].data, b, n);
        r.out.var[j].length = static_cast<uint16_t>(n);
        return SQL1_OK;
    }
    default: {  // character types
        const unsigned char* t = sqlite3_column_text(r.st, j);
        size_t n = static_cast<size_t>(sqlite3_column_bytes(r.st, j));
        bool fixed = v->type == SQL1_T_CHAR || v->type == SQL1_T_NCHAR;
        size_t total = fixed ? std::max<size_t>(n, v->maxLength) : n;
        int rc = reserve(r, j, total);
        if (rc != SQL1_OK) return rc;
        v = &r.out.var[j];
        if (n > 0) std::memcpy(v->data, t, n);
        std::memset(v->data + n, ' ', total - n);
        v->data[total] = '\0';
        v->length = static_cast<uint16_t>(total);
        return SQL1_OK;
    }
    }
}

// Steps a request; 0 with a row, SQL1_ST_EOD at the end, else a status.
int step(RequestObj& r) {
    int src = sqlite3_step(r.st);
    if (src == SQLITE_ROW) return SQL1_OK;
    if (src == SQLITE_DONE) return SQL1_ST_EOD;
    Sql1_SetError(sqlite3_errmsg(r.conn->db));
    return r.core->note(Sql1_Status(src));
}

// Binds and executes (caller has the request to itself).
int doOpen(RequestObj& r) {
    sqlite3_reset(r.st);
    int rc = SQL1_OK;
    if (r.record != nullptr) {  // record the action first, so that the select finds it
        sqlite3_reset(r.record);
        rc = bindInputs(r, r.record, &r.in);
        int src = rc == SQL1_OK ? sqlite3_step(r.record) : SQLITE_OK;
        if (rc == SQL1_OK && src != SQLITE_DONE) {
            Sql1_SetError(sqlite3_errmsg(r.conn->db));
            rc = r.core->note(Sql1_Status(src));
        }
        sqlite3_reset(r.record);
    }
    if (rc == SQL1_OK) rc = bindInputs(r, r.st, &r.in);
    // Fixed-character lengths are consumed, so that a later text value is
    // not cut by an old binary length.
    for (uint16_t i = 0; i < r.in.used; i++) {
        int16_t t = r.in.var[i].type;
        if (t == SQL1_T_CHAR || t == SQL1_T_NCHAR || t == SQL1_T_DECIMAL) r.in.var[i].length = 0;
    }
    if (rc == SQL1_OK) rc = step(r);
    if (rc == SQL1_OK || rc == SQL1_ST_EOD) {
        r.open = true;
        r.rowReady = rc == SQL1_OK;
        r.done = rc == SQL1_ST_EOD;
        r.changes = r.tr->kind == SQL1_StmtKind::Select ? 0 : sqlite3_changes(r.conn->db);
        return SQL1_OK;
    }
    sqlite3_reset(r.st);
    r.open = false;
    return rc;
}

// ---------------------------------------------------------------------------
// The operations
// ---------------------------------------------------------------------------

int opPrepare(SQL1_Handle path, const char* sql, SQL1_Handle* stmt) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (sql == nullptr || stmt == nullptr) return SQL1_ST_BADARG;
    int rc = withObject<PathObj>(path, Kind::Path, "SQL1 prepare", [&](PathObj& p) -> int {
        int st = p.core->check(true);
        if (st != SQL1_OK) return st;
        auto tr = std::make_shared<SQL1_Translation>();
        st = SQL1_Translate(sql, *p.core->store, p.core->store->settings().hubNode, tr.get());
        if (st != SQL1_OK) {
            Sql1_SetError(tr->error);
            return st;
        }
        auto* s = new StmtObj{p.core, std::move(tr)};
        slots().alloc(Kind::Stmt, s, &s->self);
        p.core->adopt(s->self);
        *stmt = s->self;
        return SQL1_OK;
    });
    if (rc != SQL1_OK) RAS1_TRACE_IF(ras, RAS1_ERROR, "prepare failed %d: %s", rc, SQL1_LastError());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int buildDescriptors(RequestObj& r) {
    int rc = allocSqlda(&r.in, r.tr->markers.size());
    for (size_t i = 0; rc == SQL1_OK && i < r.tr->markers.size(); i++) {
        SQL1_SqlVar& v = r.in.var[i];
        const SQL1_Marker& m = r.tr->markers[i];
        v.type = m.type;
        v.maxLength = m.maxLength;
        std::snprintf(v.name, sizeof v.name, "%s", m.column.c_str());
        v.data = static_cast<char*>(std::calloc(static_cast<size_t>(m.maxLength) + 1, 1));
        if (v.data == nullptr) rc = SQL1_ST_NOMEM;
    }
    int n = sqlite3_column_count(r.st);
    if (rc == SQL1_OK) rc = allocSqlda(&r.out, static_cast<size_t>(n));
    r.outCap.assign(static_cast<size_t>(n), 0);
    for (int j = 0; rc == SQL1_OK && j < n; j++) {
        SQL1_SqlVar& v = r.out.var[j];
        const char* decl = sqlite3_column_decltype(r.st, j);
        // An expression has no declared type: text, with room for a long value.
        SQL1_TypeFromDecl(decl, decl == nullptr ? 4096 : 256, &v.type, &v.maxLength);
        const char* name = sqlite3_column_name(r.st, j);
        std::snprintf(v.name, sizeof v.name, "%s", name != nullptr ? name : "");
        size_t cap = std::max<size_t>(v.maxLength, 8) + 1;
        v.data = static_cast<char*>(std::calloc(cap, 1));
        if (v.data == nullptr) rc = SQL1_ST_NOMEM;
        r.outCap[static_cast<size_t>(j)] = cap;
    }
    return rc;
}

int opCreateRequest(SQL1_Handle stmt, int flags, const SQL1_Exit* exit, SQL1_Handle* request, SQL1_Handle* row) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (request == nullptr) return SQL1_ST_BADARG;
    int rc = withObject<StmtObj>(stmt, Kind::Stmt, "SQL1 createRequest", [&](StmtObj& s) -> int {
        int st = s.core->check(true);
        if (st != SQL1_OK) return st;
        auto r = std::make_unique<RequestObj>();
        r->core = s.core;
        r->tr = s.tr;
        r->flags = flags;
        if (exit != nullptr && exit->kind == SQL1_EXIT_CALLBACK && exit->callback != nullptr) {
            r->hasExit = true;
            r->exit = *exit;
        }
        st = s.core->store->acquire(&r->conn);
        if (st != SQL1_OK) return s.core->note(st);
        st = r->conn->acquire(r->tr->sql, &r->st);
        if (st == SQL1_OK && !r->tr->record.empty()) st = r->conn->acquire(r->tr->record, &r->record);
        if (st == SQL1_OK && sqlite3_bind_parameter_count(r->st) != static_cast<int>(r->tr->markers.size())) {
            Sql1_SetError("parameter markers other than ? are not supported");
            st = SQL1_ST_SYNTAX;
        }
        if (st == SQL1_OK) st = buildDescriptors(*r);
        if (st != SQL1_OK) {
            if (r->st != nullptr) r->conn->giveBack(r->tr->sql, r->st);
            if (r->record != nullptr) r->conn->giveBack(r->tr->record, r->record);
            s.core->store->release(r->conn);
            freeSqlda(&r->in);
            freeSqlda(&r->out);
            return s.core->note(st);
        }
        RequestObj* req = r.release();
        auto* ro = new RowObj{req};
        slots().alloc(Kind::Request, req, &req->self);
        slots().alloc(Kind::Row, ro, &req->row);
        s.core->adopt(req->self);
        *request = req->self;
        if (row != nullptr) *row = req->row;
        return SQL1_OK;
    });
    if (rc != SQL1_OK) RAS1_TRACE_IF(ras, RAS1_ERROR, "createRequest failed %d: %s", rc, SQL1_LastError());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int opGetInputDescriptor(SQL1_Handle request, SQL1_Sqlda** sqlda) {
    if (sqlda == nullptr) return SQL1_ST_BADARG;
    return withObject<RequestObj>(request, Kind::Request, "SQL1 input descriptor", [&](RequestObj& r) -> int {
        *sqlda = &r.in;
        return SQL1_OK;
    });
}

int opGetOutputDescriptor(SQL1_Handle row, SQL1_Sqlda** sqlda) {
    if (sqlda == nullptr) return SQL1_ST_BADARG;
    return withObject<RowObj>(row, Kind::Row, "SQL1 output descriptor", [&](RowObj& ro) -> int {
        *sqlda = &ro.req->out;
        return SQL1_OK;
    });
}

// The asynchronous open: runs doOpen on its own thread, then reports.
void asyncOpen(RequestObj* r) {
    int status = PFM1_Guard("SQL1 asynchronous open", [r] { return doOpen(*r); });
    void (*callback)(long, void*) = r->exit.callback;
    void* arg = r->exit.arg;
    {
        std::lock_guard<std::mutex> g(r->mu);
        r->pending = false;
    }
    r->cv.notify_all();
    // r may be released from here on; only the copies are used.
    callback(status, arg);
}

int opOpen(SQL1_Handle request, SQL1_Sqlda* input) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = withObject<RequestObj>(request, Kind::Request, "SQL1 open", [&](RequestObj& r) -> int {
        std::unique_lock<std::mutex> l(r.mu);
        r.waitIdle(l);
        if (input != nullptr && input != &r.in) return SQL1_ST_BADARG;
        if (r.open) return SQL1_ST_STATE;
        int st = r.core->check(true);
        if (st != SQL1_OK) return st;
        if (!r.hasExit) return doOpen(r);
        if (r.worker.joinable()) r.worker.join();  // the previous open's thread has finished its work
        r.pending = true;
        r.worker = std::thread(asyncOpen, &r);
        return SQL1_OK;
    });
    if (rc != SQL1_OK) RAS1_TRACE_IF(ras, RAS1_ERROR, "open failed %d: %s", rc, SQL1_LastError());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int opFetch(SQL1_Handle row, SQL1_Sqlda* output) {
    return withObject<RowObj>(row, Kind::Row, "SQL1 fetch", [&](RowObj& ro) -> int {
        RequestObj& r = *ro.req;
        std::unique_lock<std::mutex> l(r.mu);
        r.waitIdle(l);
        if (output != nullptr && output != &r.out) return SQL1_ST_BADARG;
        if (!r.open) return SQL1_ST_STATE;
        int st = r.core->check(true);
        if (st != SQL1_OK) return st;
        if (r.done) return SQL1_ST_EOD;
        if (!r.rowReady) {
            st = step(r);
            if (st == SQL1_ST_EOD) r.done = true;
            if (st != SQL1_OK) return st;
        }
        r.rowReady = false;
        for (int j = 0; st == SQL1_OK && j < r.out.used; j++) st = fillColumn(r, j);
        return st;
    });
}

int opClose(SQL1_Handle request) {
    return withObject<RequestObj>(request, Kind::Request, "SQL1 close", [&](RequestObj& r) -> int {
        std::unique_lock<std::mutex> l(r.mu);
        r.waitIdle(l);
        if (!r.open) return SQL1_ST_STATE;
        sqlite3_reset(r.st);
        r.open = r.rowReady = r.done = false;
        return SQL1_OK;
    });
}

int opRelease(SQL1_Handle object) {
    return PFM1_Guard("SQL1 release", [&]() -> int { return releaseHandle(object, false); });
}

int opGetProperty(SQL1_Handle path, int id, long* value) {
    if (value == nullptr) return SQL1_ST_BADARG;
    return withObject<PathObj>(path, Kind::Path, "SQL1 get property", [&](PathObj& p) -> int {
        int st = p.core->check(true);
        if (st != SQL1_OK) return st;
        Sql1Settings s = p.core->store->settings();
        std::lock_guard<std::mutex> g(p.core->mu);
        const struct {
            int id;
            long value;
        } props[] = {
            {SQL1_PROP_VERSION, s.versionNumber},   {SQL1_PROP_BUILD, s.build},
            {SQL1_PROP_LEVEL, s.level},             {SQL1_PROP_DIALECT, 1},
            {SQL1_PROP_VALIDATE, s.validate ? 1 : 0}, {SQL1_PROP_CODEPAGE, 1208},
            {SQL1_PROP_NLS_CONVERT, s.nls ? 1 : 0}, {SQL1_PROP_NLS_WIDTH, s.nls ? 4 : 0},
            {SQL1_PROP_CODEPAGE_SET, p.core->codepage}, {SQL1_PROP_OPTIONS_SET, p.core->options},
        };
        for (const auto& e : props) {
            if (e.id == id) {
                *value = e.value;
                return SQL1_OK;
            }
        }
        Sql1_SetError("unknown path property " + std::to_string(id));
        return SQL1_ST_BADARG;
    });
}

int opSetProperty(SQL1_Handle path, int id, long value) {
    return withObject<PathObj>(path, Kind::Path, "SQL1 set property", [&](PathObj& p) -> int {
        int st = p.core->check(true);
        if (st != SQL1_OK) return st;
        std::lock_guard<std::mutex> g(p.core->mu);
        if (id == SQL1_PROP_CODEPAGE_SET) {
            p.core->codepage = value;
        } else if (id == SQL1_PROP_OPTIONS_SET) {
            p.core->options = value;
        } else {
            Sql1_SetError("path property " + std::to_string(id) + " cannot be set");
            return SQL1_ST_BADARG;
        }
        return SQL1_OK;
    });
}

int parmaOf(const SQL1_Translation& tr, int index, const char** name, const char** value) {
    if (index < 0 || static_cast<size_t>(index) >= tr.parmas.size()) return SQL1_ST_EOD;
    *name = tr.parmas[static_cast<size_t>(index)].first.c_str();
    *value = tr.parmas[static_cast<size_t>(index)].second.c_str();
    return SQL1_OK;
}

int opGetParma(SQL1_Handle h, int index, const char** name, const char** value) {
    if (name == nullptr || value == nullptr) return SQL1_ST_BADARG;
    Slot* s = static_cast<Slot*>(h.object);
    bool isStmt = false;
    if (s != nullptr) {
        std::lock_guard<std::mutex> g(s->mu);
        isStmt = s->id.load(std::memory_order_acquire) == h.id && s->kind == Kind::Stmt;
    }
    if (isStmt) {
        return withObject<StmtObj>(h, Kind::Stmt, "SQL1 parma", [&](StmtObj& o) -> int { return parmaOf(*o.tr, index, name, value); });
    }
    return withObject<RequestObj>(h, Kind::Request, "SQL1 parma",
                                  [&](RequestObj& o) -> int { return parmaOf(*o.tr, index, name, value); });
}

int opChanges(SQL1_Handle request, long* rows) {
    if (rows == nullptr) return SQL1_ST_BADARG;
    return withObject<RequestObj>(request, Kind::Request, "SQL1 changes", [&](RequestObj& r) -> int {
        std::unique_lock<std::mutex> l(r.mu);
        r.waitIdle(l);
        *rows = r.changes;
        return SQL1_OK;
    });
}

const SQL1_Ops kOps = {
    opPrepare, opCreateRequest, opGetInputDescriptor, opGetOutputDescriptor, opOpen, opFetch,
    opClose,   opRelease,       opGetProperty,        opSetProperty,         opGetParma, opChanges,
};

// The default login id, made once per process.
SQL1_LoginId gDefaultLogin;
BSS1_Once gDefaultOnce;

void makeDefaultLogin(void*) {
    (void)sodium_init();
    static const char kAlnum[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
    std::snprintf(gDefaultLogin.userId, sizeof gDefaultLogin.userId, "%s", "*LOCAL");
    for (char& c : gDefaultLogin.password) c = kAlnum[randombytes_uniform(sizeof kAlnum - 1)];
    char host[256] = "";
    (void)gethostname(host, sizeof host - 1);
    std::snprintf(gDefaultLogin.clientHost, sizeof gDefaultLogin.clientHost, "%.15s", host);
}

bool isDefaultLogin(const SQL1_LoginId* id) {
    BSS1_InitializeOnce(&gDefaultOnce, makeDefaultLogin, nullptr);
    return std::memcmp(id->userId, gDefaultLogin.userId, sizeof id->userId) == 0 &&
           sodium_memcmp(id->password, gDefaultLogin.password, sizeof id->password) == 0;
}

}  // namespace

void sql1cpli(SQL1_LoginId* loginId) {
    BSS1_InitializeOnce(&gDefaultOnce, makeDefaultLogin, nullptr);
    if (loginId != nullptr) *loginId = gDefaultLogin;
}

int sql1cpth(const char* serverPath, const SQL1_LoginId* loginId, SQL1_Handle* path) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (path == nullptr || loginId == nullptr) return SQL1_ST_BADARG;
    *path = SQL1_Handle{};
    int rc = PFM1_Guard("sql1cpth", [&]() -> int {
        int st = SQL1_OK;
        std::shared_ptr<Sql1Store> store = Sql1_ResolveServer(serverPath, &st);
        if (store == nullptr) return st;
        st = store->inject();
        if (st != SQL1_OK) return st;
        std::string user = Sql1_Field16(loginId->userId);
        if (!isDefaultLogin(loginId)) {
            std::string password = Sql1_Field16(loginId->password);
            st = store->logon(user.c_str(), password.c_str());
            sodium_memzero(password.data(), password.size());
            if (st != SQL1_OK) {
                // Always traced; the password never is.
                RAS1_Printf(RAS1_THIS, __LINE__, "logon of '%s' to %s refused, status %d", user.c_str(),
                            store->path().c_str(), st);
                return st;
            }
        }
        auto* p = new PathObj{std::make_shared<PathCore>()};
        p->core->store = std::move(store);
        slots().alloc(Kind::Path, p, path);
        return SQL1_OK;
    });
    RAS1_TRACE_IF(ras, RAS1_STATE, "path to %s: status %d", serverPath != nullptr ? serverPath : "(null)", rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
