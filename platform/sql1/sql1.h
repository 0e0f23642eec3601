// sql1: the SQL client layer of the monitoring server, over the hub store
// (one SQLite file per server).
//
// A caller reaches a server in four steps:
//   1. SQL1_LbLookup(lmsName) finds the server (its server path and hub node);
//   2. sql1cpth(serverPath, loginId, &path) logs on and gives a path handle;
//   3. through the operation vector of the handles (path.object->ops):
//        prepare(path, sql, &stmt)             dialect text -> statement
//        createRequest(stmt, flags, exit, &request, &row)
//        getInputDescriptor(request, &in)      parameter markers
//        getOutputDescriptor(row, &out)        result columns
//        open(request, in)                     bind, execute (asynchronous with an exit)
//        fetch(row, out) ... 514               next row into out
//        close(request)                        back to the created state
//        release(request), release(stmt), release(path)
//   4. path properties (getProperty/setProperty) tell the server's version,
//      level, user validation and NLS capability.
//
// Every object is reached through a handle {16-bit id, object}. Objects'
// slots are never freed, so a handle can always be checked: an operation on
// a handle whose object's id changed (released, reused) fails with
// SQL1_ST_STALE (2) and touches nothing. Releasing a path releases every
// statement and request made on it; releasing a request releases its row.
//
// The dialect (translated before SQLite sees it): "text" and N"text" are
// string literals ('...' and N'...' too); O4SRV.TSITDESC and other qualified
// names name the store's tables; `T AT ("n1","n2")` limits the rows of T to
// the named nodes where T has a node column ("*HUB" is the hub's own node);
// `T HISTORY()` reads T's history table; SYSTEM.PARMA(name, value, length)
// terms are parameters, not predicates (see getParma). Only SELECT, INSERT,
// UPDATE and DELETE run; the layer's own tables (CSIT_*) are out of reach and
// SYSTEM.* tables are read-only.
//
// Thread safety: every call may be made from any thread. Operations on one
// handle are serialised; each request holds its own store connection, so
// requests of one path run concurrently.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

// ---------------------------------------------------------------------------
// Statuses. 0 is success; every other value is a failure of the call.
// ---------------------------------------------------------------------------
enum : int {
    SQL1_OK = 0,                 // success
    SQL1_ST_STALE = 2,           // null or stale handle, or a handle of the wrong kind
    SQL1_ST_NOTFOUND = 5,        // server name not known (look-up, path creation)
    SQL1_ST_NOMEM = 7,           // allocation failure
    SQL1_ST_FAULT = 8,           // internal fault (exception caught, unexpected library error)
    SQL1_ST_LOGON_PASSWORD = 1005,  // logon refused: wrong password
    SQL1_ST_LOGON_NOPASSWORD = 1006,// logon refused: no password given
    SQL1_ST_LOGON_DISABLED = 1010,  // logon refused: the user is disabled
    SQL1_ST_LOGON_NOUSER = 1011,    // logon refused: no user id given
    SQL1_ST_LOGON_UNKNOWN = 1021,   // logon refused: no such user
    SQL1_ST_CONN_FIRST = 150,    // 150..199: the connection to the server is lost; the
    SQL1_ST_CONN_LAST = 199,     //   path is dead, release it and look the server up again
    SQL1_ST_CONNLOST = 150,      // store cannot be reached (missing, cannot be opened)
    SQL1_ST_CONNIO = 151,        // store read or write error
    SQL1_ST_CONNBAD = 152,       // the file is not a hub store, or it is damaged
    SQL1_ST_EOD = 514,           // end of data
    SQL1_ST_SYNTAX = 1100,       // the statement cannot be translated or prepared
    SQL1_ST_CONSTRAINT = 1101,   // a constraint refused the change (duplicate key, NOT NULL)
    SQL1_ST_TOOLONG = 1102,      // a value is longer than its column (or than 65535 bytes)
    SQL1_ST_BUSY = 1103,         // the store stayed locked beyond the busy time-out, or no
                                 //   connection could be had
    SQL1_ST_DENIED = 1104,       // statement kind or table not allowed through this layer
    SQL1_ST_EXEC = 1105,         // other execution error
    SQL1_ST_STATE = 1106,        // call not valid in the object's state (fetch before open, ...)
    SQL1_ST_BADARG = 1107,       // bad argument (null pointer, unknown property, bad option)
    SQL1_ST_RANGE = 1108,        // a stored value does not fit its column's type
};

// True for the statuses that mean the connection was lost.
inline bool SQL1_IsConnectionLost(int status) {
    return status >= SQL1_ST_CONN_FIRST && status <= SQL1_ST_CONN_LAST;
}

// ---------------------------------------------------------------------------
// Type codes of descriptor entries. Codes carry no nullable bit: a NULL value
// is an entry with nullInd -1 and length 0.
// ---------------------------------------------------------------------------
enum : int16_t {
    SQL1_T_VARCHAR = 448,     // varying character, current length in bytes
    SQL1_T_CHAR = 452,        // fixed character, padded with blanks to the maximum
    SQL1_T_NVARCHAR = 1018,   // varying national character (UTF-8)
    SQL1_T_NCHAR = 1022,      // fixed national character (UTF-8), blank padded
    SQL1_T_SMALLINT = 500,    // 2-byte signed integer
    SQL1_T_USMALLINT = 2,     // 2-byte unsigned integer
    SQL1_T_INTEGER = 496,     // 4-byte signed integer
    SQL1_T_UINTEGER = 1006,   // 4-byte unsigned integer
    SQL1_T_BIGINT = 492,      // 8-byte signed integer
    SQL1_T_UBIGINT = 1032,    // 8-byte unsigned integer
    SQL1_T_DOUBLE = 480,      // 8-byte floating point
    SQL1_T_FLOAT8 = 1000,     // 8-byte floating point (accepted on input, never declared)
    SQL1_T_DECIMAL = 484,     // decimal number carried as text
    SQL1_T_BINARY = 1008,     // bytes
};

// One descriptor entry: a result column or a parameter marker. Integers and
// floating-point values are in the machine's byte order.
struct SQL1_SqlVar {
    int16_t type;        // SQL1_T_* code
    uint16_t length;     // current length in bytes
    uint16_t maxLength;  // maximum length (the column's declared length; fixed sizes for numbers)
    char* data;          // value bytes; owned by the descriptor (see below)
    int16_t nullInd;     // -1: the value is NULL; 0 otherwise (set it on input to bind NULL)
    char name[65];       // column name (output), or the column a marker stands for (input)
};

// A descriptor (SQLDA). Descriptors belong to the request (input) or its row
// (output) and are freed when the request is released.
//  - input: each entry's data has room for maxLength bytes (+1 for a
//    terminator), zero-filled at creation; the caller writes values there
//    before open. 448/1018/1008 take `length` bytes (1008 with length 0: the
//    maximum). For 452/1022/484 a nonzero length gives the value's length,
//    otherwise the value runs to the first NUL within the maximum; trailing
//    blanks do not count, and open resets such a length to 0 so that a later
//    text value is not cut by it. Numbers are read in their fixed sizes.
//  - output: fetch fills data and length; data always has room for length
//    bytes plus a terminating NUL, and may move when a row holds a value
//    longer than any before; read it only until the next fetch.
struct SQL1_Sqlda {
    uint16_t allocated;  // entries allocated
    uint16_t used;       // entries in use
    SQL1_SqlVar* var;    // the entries
};

// ---------------------------------------------------------------------------
// Handles and the operation vector.
// ---------------------------------------------------------------------------
struct SQL1_Ops;

// The part of every library object that callers may look at. The object's
// storage is never freed, so reading `id` through a stale handle is safe.
struct SQL1_Object {
    const SQL1_Ops* ops;        // the operation vector of the object
    std::atomic<uint16_t> id;   // current id; 0 while the slot is unused
};

// A handle: the id the object had when the handle was issued and the object.
struct SQL1_Handle {
    uint16_t id;
    SQL1_Object* object;
};

// True when `h` still names a live object (its id matches).
inline bool SQL1_IsCurrent(SQL1_Handle h) {
    return h.object != nullptr && h.id != 0 && h.object->id.load(std::memory_order_acquire) == h.id;
}

// Exit block of an asynchronous open: with kind SQL1_EXIT_CALLBACK the
// library calls callback(status, arg) from a thread of its own when the open
// has finished (status 0 or the open's failure). The library copies the block
// in createRequest; the caller's block need not outlive that call.
enum : int { SQL1_EXIT_CALLBACK = 2 };
struct SQL1_Exit {
    int kind;
    void (*callback)(long status, void* arg);
    void* arg;
};

// Path property identifiers.
enum : int {
    SQL1_PROP_CODEPAGE_SET = 9,   // set: the client's code page (1208 is UTF-8)
    SQL1_PROP_OPTIONS_SET = 10,   // set: the client's option bits
    SQL1_PROP_NLS_CONVERT = 11,   // get: > 0 when the server converts national text
    SQL1_PROP_NLS_WIDTH = 12,     // get: > 0, the bytes per national character (0: no NLS)
    SQL1_PROP_VERSION = 100,      // get: server version VVRR as a number ("06.30" -> 630)
    SQL1_PROP_LEVEL = 103,        // get: server level (the version unless the store sets one)
    SQL1_PROP_CODEPAGE = 108,     // get: code page of stored text (1208)
    SQL1_PROP_BUILD = 110,        // get: server build number
    SQL1_PROP_DIALECT = 111,      // get: dialect level of the SQL interface (1)
    SQL1_PROP_VALIDATE = 112,     // get: 1 when the server validates users, 0 when not
};

struct SQL1_Ops {
    // Translates `sql` (the dialect, NUL-terminated) into a statement on `path`.
    int (*prepare)(SQL1_Handle path, const char* sql, SQL1_Handle* stmt);
    // Makes an executable request of `stmt` with its row handle. `flags` is
    // kept but not interpreted. `exit` may be null (synchronous open).
    int (*createRequest)(SQL1_Handle stmt, int flags, const SQL1_Exit* exit, SQL1_Handle* request,
                         SQL1_Handle* row);
    // The request's input descriptor (one entry per parameter marker; none: used 0).
    int (*getInputDescriptor)(SQL1_Handle request, SQL1_Sqlda** sqlda);
    // The row's output descriptor (one entry per result column; used 0 for
    // statements without a result).
    int (*getOutputDescriptor)(SQL1_Handle row, SQL1_Sqlda** sqlda);
    // Binds the values of `input` (the request's own input descriptor, or
    // null) and executes: a select is positioned before its first row, an
    // insert, update or delete is done. With an exit block the call returns 0
    // at once and the exit reports the open's status.
    int (*open)(SQL1_Handle request, SQL1_Sqlda* input);
    // Next row into `output` (the row's own output descriptor, or null);
    // SQL1_ST_EOD after the last row and for statements without a result.
    int (*fetch)(SQL1_Handle row, SQL1_Sqlda* output);
    // Ends the open; the request may be opened again.
    int (*close)(SQL1_Handle request);
    // Releases a path, statement or request (not a row: it goes with its request).
    int (*release)(SQL1_Handle object);
    int (*getProperty)(SQL1_Handle path, int id, long* value);
    int (*setProperty)(SQL1_Handle path, int id, long value);
    // The index-th SYSTEM.PARMA term of a statement or request (0-based):
    // name and value point into the object and live as long as it does.
    // SQL1_ST_EOD when there is no such term.
    int (*getParma)(SQL1_Handle stmtOrRequest, int index, const char** name, const char** value);
    // Rows changed by the last open of an insert, update or delete request.
    int (*changes)(SQL1_Handle request, long* rows);
};

// ---------------------------------------------------------------------------
// Logon.
// ---------------------------------------------------------------------------

// A login id: three fixed fields of 16 bytes, each NUL-terminated when
// shorter (a 16-byte value has no terminator).
struct SQL1_LoginId {
    char userId[16];
    char password[16];
    char clientHost[16];
};
static_assert(sizeof(SQL1_LoginId) == 48, "a login id is 3 x 16 bytes");

// The library's default login id: the process's own trusted identity (its
// password field is a random token of this process). Paths made with it are
// not subject to user validation.
void sql1cpli(SQL1_LoginId* loginId);

// Creates a path to the server named by `serverPath` and logs on with
// `loginId`. serverPath is one of:
//   "CT/DS:{...}"                          the local server (SQL1_RegisterServer, local)
//   "NCS:{SOCKET=NAME} CT/DS:{...}"        the server with LMS name NAME
//   "sqlite:PATH"                          the store at PATH
//   NAME                                   the server with LMS name NAME
// ("NAME[QUALIFIER]" stands for NAME). When the server validates users, a
// login id other than the default must name an enabled user with the right
// password, else a SQL1_ST_LOGON_* status is returned and no path is made.
[[nodiscard]] int sql1cpth(const char* serverPath, const SQL1_LoginId* loginId, SQL1_Handle* path);

// ---------------------------------------------------------------------------
// Server look-up.
// ---------------------------------------------------------------------------
enum : unsigned { SQL1_LB_HUB = 0x40000000u };  // look up a hub's server (other bits are ignored)

struct SQL1_LbEntry {
    char lmsName[256];     // the name looked up, without qualifier
    char serverPath[512];  // "sqlite:PATH" of the server's store
    char nodeName[33];     // the hub's own node name (empty when the store cannot be read)
    int local;             // 1 for the local server
};
struct SQL1_LbLookup_t {
    int count;
    SQL1_LbEntry* entries;
};

// Looks the server with LMS name `lmsName` up: the servers registered with
// SQL1_RegisterServer first, then servers.conf in the home folder
// (SQL1_SetHome). Fills *result (free with SQL1_DestroyLbLookup) with one
// entry; an unknown name fails with SQL1_ST_NOTFOUND and *result is null.
[[nodiscard]] int SQL1_LbLookup(const char* lmsName, unsigned options, SQL1_LbLookup_t** result);
int SQL1_DestroyLbLookup(SQL1_LbLookup_t* result);

// ---------------------------------------------------------------------------
// Stores (used by the host and by tests).
// ---------------------------------------------------------------------------
struct SQL1_StoreOptions {
    const char* serverVersion = nullptr;  // "VV.RR"; null keeps the store's
    int validate = -1;                    // 1 validate users, 0 do not, -1 keep the store's
    int nls = -1;                         // 1 NLS capable, 0 not, -1 keep the store's
    int level = 0;                        // property 103 if > 0, else derived from the version
    const char* dataDir = nullptr;        // folder with schema.sql and seed.sql (new store);
                                          //   null: environment SQL1_STORE_DATA
    const char* adminUser = nullptr;      // administrator of a new store (null: "sysadmin")
    const char* adminPassword = nullptr;  // its password (1 to 16 characters); required for a new store
    int minimalHash = 0;                  // 1: Argon2 with the minimum limits (tests); the
                                          //   environment SQL1_PWHASH=min does the same
    int busyMillis = 5000;                // busy time-out of the store's connections
    int local = 0;                        // SQL1_RegisterServer: this is the local server
};

// Creates the store at `path` (schema, seed rows, administrator) when the
// file does not exist or holds no tables, otherwise opens it; then applies
// the options that are set (version, validation, NLS). 0 or a status.
[[nodiscard]] int SQL1_CreateStore(const char* path, const SQL1_StoreOptions* options);

// SQL1_CreateStore, then registers the store as the server `lmsName`
// (replacing an earlier registration of that name).
[[nodiscard]] int SQL1_RegisterServer(const char* lmsName, const char* storePath, const SQL1_StoreOptions* options);

// The folder holding servers.conf ("LMSNAME STORE-URI" lines, '#' comments;
// STORE-URI "sqlite:PATH", PATH relative to this folder unless absolute).
void SQL1_SetHome(const char* homeDir);

// What the host needs of a store.
struct SQL1_StoreInfo {
    char hubNode[33];    // the hub's own node name
    char version[8];     // "VV.RR"
    int build;
    int validate;        // 1 or 0
    int nls;             // 1 or 0
};
[[nodiscard]] int SQL1_GetStoreInfo(const char* storePath, SQL1_StoreInfo* info);

// Adds or replaces a user of the store (user id and password of 1 to 16
// characters; the password hashed with Argon2, the clear text not kept).
// enabled 0 keeps the user but refuses its logon.
[[nodiscard]] int SQL1_SetUser(const char* storePath, const char* userId, const char* password, int enabled,
                               int minimalHash);

// Closes idle connections and forgets registrations and stores; objects still
// alive keep their store until they are released.
void SQL1_Shutdown();

// The text of the calling thread's last failure (empty when none).
const char* SQL1_LastError();

// ---------------------------------------------------------------------------
// Test hooks.
// ---------------------------------------------------------------------------

// Fails operations that reach the store `server` (an LMS name or a store
// path): after `skip` further operations, the next `count` fail with `status`
// (a status from 150 to 199 also marks the failing path as lost). Counted
// operations: sql1cpth, prepare, createRequest, open, fetch, getProperty,
// setProperty. count 0 clears the hook.
[[nodiscard]] int SQL1_InjectStatus(const char* server, int status, int count, int skip);
