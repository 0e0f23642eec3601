// kshdsr: database request objects over the SQL client layer (see kshdsr.h).
#include "kshdsr.h"

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "kshhub.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshdsr");

namespace {

// Stands in for a password in every trace.
const char kMask[] = "xxxxxxxxxxxxxxxx";

// Room for a server path copied out of the hub ("NCS:{SOCKET=...} CT/DS:{...}"
// with an LMS name of up to 255 characters).
constexpr size_t kPathSize = 512;

// Path properties a server that takes national-language text gets on every
// path: UTF-8 code page and the client's option bits.
constexpr long kCodepageUTF8 = 1208;
constexpr long kNLSOptions = 0x03480001;

int passwordLength(const SQL1_LoginId& id) { return static_cast<int>(strnlen(id.password, sizeof id.password)); }

const SQL1_Ops* opsOf(SQL1_Handle h) { return h.object != nullptr ? h.object->ops : nullptr; }

// Releases `h` when it names an object; clears it.
void releaseHandle(SQL1_Handle* h) {
    const SQL1_Ops* ops = opsOf(*h);
    if (ops != nullptr && SQL1_IsCurrent(*h)) (void)ops->release(*h);
    *h = SQL1_Handle{};
}

// Sets the national-language properties on `path`; 0 or the first failure.
int setNLSProperties(SQL1_Handle path) {
    const SQL1_Ops* ops = opsOf(path);
    if (ops == nullptr) return SQL1_ST_STALE;
    int rc = ops->setProperty(path, SQL1_PROP_CODEPAGE_SET, kCodepageUTF8);
    if (rc == SQL1_OK) rc = ops->setProperty(path, SQL1_PROP_OPTIONS_SET, kNLSOptions);
    return rc;
}

// Reads the server's properties through `path` into the hub: version,
// build, NLS capability and the validation level.
void learnServer(WSQL_Hub* hub, SQL1_Handle path, int ras) {
    const SQL1_Ops* ops = opsOf(path);
    long version = 0, build = 0, level = 0, dialect = 0;
    int validate = WSQL_VALIDATE_UNSURE;
    int rc = ops->getProperty(path, SQL1_PROP_VERSION, &version);
    if (rc == SQL1_OK) rc = ops->getProperty(path, SQL1_PROP_BUILD, &build);
    if (rc == SQL1_OK) rc = ops->getProperty(path, SQL1_PROP_LEVEL, &level);
    if (rc == SQL1_OK) rc = ops->getProperty(path, SQL1_PROP_DIALECT, &dialect);
    if (rc == SQL1_OK) {
        hub->setLMSVersion(static_cast<int>(version));
        hub->setLMSBuild(static_cast<int>(build));
        if (level >= 400) {
            long v112 = 0, v108 = 0, v11 = 0, v12 = 0;
            int q = ops->getProperty(path, SQL1_PROP_VALIDATE, &v112);
            if (q == SQL1_OK) q = ops->getProperty(path, SQL1_PROP_CODEPAGE, &v108);
            if (q == SQL1_OK) q = ops->getProperty(path, SQL1_PROP_NLS_CONVERT, &v11);
            if (q == SQL1_OK) q = ops->getProperty(path, SQL1_PROP_NLS_WIDTH, &v12);
            if (q == SQL1_OK) {
                hub->setHubIsNLS(version > 350 && level > 350 && v11 > 0 && v12 > 0);
                validate = v112 == 1 ? WSQL_VALIDATE_ON : v112 == 0 ? WSQL_VALIDATE_OFF : WSQL_VALIDATE_UNSURE;
            }
        }
    }
    hub->setValidate(validate);
    RAS1_TRACE_IF(ras, RAS1_STATE, "Initialize hub validate attribute =%d", validate);
}

}  // namespace

DS_SQLRequest::DS_SQLRequest(WSQL_Hub* h, const char* sql)
    : state(SQL_NOTLOGGEDON),
      rowHandle{},
      rowHandleRef(&rowHandle),
      pathHandle{},
      stmtHandle{},
      requestHandle{},
      inputDA(nullptr),
      outputDA(nullptr),
      login_{},
      sqlText(sql),
      globalPath(0),
      hub(h),
      asyncOpen(false) {
    sql1cpli(&login_);
}

DS_SQLRequest::~DS_SQLRequest() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (state == SQL_OPEN) (void)close();
    if (state == SQL_CREATED) (void)drop();
    releaseHandle(&stmtHandle);
    if (state != SQL_NOTLOGGEDON && !globalPath && SQL1_IsCurrent(pathHandle)) {
        int rc = opsOf(pathHandle)->release(pathHandle);
        if (rc != SQL1_OK) report(rc);
    }
    pathHandle = SQL1_Handle{};
    RAS1_EXIT(ras);
}

void DS_SQLRequest::report(int status) {
    if (hub != nullptr && status != SQL1_OK) (void)hub->setGlobalPathStatus(status);
}

void DS_SQLRequest::fallBack(int status) {
    report(status);
    if (globalPath) {
        state = SQL_LOGGEDON;
        return;
    }
    releaseHandle(&stmtHandle);
    releaseHandle(&pathHandle);
    state = SQL_NOTLOGGEDON;
}

// ---------------------------------------------------------------------------
// Logon
// ---------------------------------------------------------------------------

int DS_SQLRequest::login(int flags) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_FAULT;
    if (hub == nullptr) {
        RAS1_EXIT_RC(ras, rc);
        return rc;
    }
    if (state != SQL_NOTLOGGEDON) {
        RAS1_EXIT_RC(ras, -1);
        return -1;
    }
    bool retry = true;
    while (retry) {
        retry = false;
        rc = loginPass(flags, &retry);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// One pass of the logon: locate the server, create or join the global path,
// create an own path. A connection loss met with a server path that existed
// at the start of the pass may be retried once the hub dropped that path.
int DS_SQLRequest::loginPass(int flags, bool* retry) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = SQL1_OK;
    bool hadPath;
    BSS1_GetLock(hub->getLock());
    hadPath = hub->getServerPath() != nullptr;
    if (!hadPath) {
        SQL1_LbLookup_t* lb = nullptr;
        int st = SQL1_LbLookup(hub->getLMSName(), SQL1_LB_HUB, &lb);
        if (st == SQL1_OK && lb != nullptr && lb->count > 0) {
            (void)hub->setServerPath(hub->getLMSName(), lb->entries[0].nodeName);
        } else {
            RAS1_Printf(RAS1_THIS, __LINE__, "Error : SQL1_LbLookup failed for hub %s; rc = %d", hub->getLMSName(), st);
            rc = WSQL_NOTFOUND;
        }
        if (lb != nullptr) {
            int dst = SQL1_DestroyLbLookup(lb);
            if (dst != SQL1_OK)
                RAS1_Printf(RAS1_THIS, __LINE__, "Error : destruction of LbLookup failed for hub %s; rc = %d",
                            hub->getLMSName(), dst);
        }
    }
    BSS1_ReleaseLock(hub->getLock());
    if (rc != SQL1_OK) return rc;

    if (globalPath || hub->getValidate() == WSQL_VALIDATE_UNKNOWN) rc = logonGlobal(flags);
    if (rc == SQL1_OK && !globalPath) rc = logonOwn();

    if (hadPath && SQL1_IsConnectionLost(rc) && !hub->hasServerPath()) {
        RAS1_TRACE_IF(ras, RAS1_STATE, "Attempting re-connect to hub %s for status %d", hub->getLMSName(), rc);
        *retry = true;
    } else if (SQL1_IsConnectionLost(rc)) {
        RAS1_TRACE_IF(ras, RAS1_STATE, "Abandon re-connect to hub %s for status %d", hub->getLMSName(), rc);
    } else if (rc != SQL1_OK) {
        RAS1_TRACE_IF(ras, RAS1_STATE, "Abandon re-connect to hub %s for %d", hub->getLMSName(), rc);
    }
    return rc;
}

// The hub's shared path: created once per hub under the hub's lock; the
// first logon learns the server's properties through it.
int DS_SQLRequest::logonGlobal(int flags) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = SQL1_OK;
    BSS1_GetLock(hub->getLock());
    bool created = false;
    if (hub->getGlobalState() != SQL_LOGGEDON) {
        char path[kPathSize];
        if (!hub->copyServerPath(path, sizeof path)) {
            rc = SQL1_ST_CONNLOST;
        } else {
            SQL1_LoginId dflt;
            sql1cpli(&dflt);
            SQL1_Handle h{};
            rc = sql1cpth(path, &dflt, &h);
            RAS1_TRACE_IF(ras, RAS1_STATE, "Create global path handle, st=%x", rc);
            if (rc == SQL1_OK) {
                hub->setGlobalPath(h);
                hub->setGlobalState(SQL_LOGGEDON);
                created = true;
            }
        }
    }
    SQL1_Handle global = hub->getGlobalPathHdl();
    if (rc == SQL1_OK && hub->getValidate() == WSQL_VALIDATE_UNKNOWN) learnServer(hub, global, ras);
    if (rc == SQL1_OK) {
        if (!hub->isHubNLS()) {
            rc = WSQL_NONLS;
        } else if (created) {
            rc = setNLSProperties(global);
        }
    }
    if (rc == SQL1_OK && globalPath && (flags & 1) && hub->getValidate() > WSQL_VALIDATE_OFF) globalPath = 0;
    if (rc != SQL1_OK) {
        report(rc);
    } else if (globalPath) {
        pathHandle = global;
        state = SQL_LOGGEDON;
    }
    BSS1_ReleaseLock(hub->getLock());
    return rc;
}

// A path of the request's own, with its login id.
int DS_SQLRequest::logonOwn() {
    int ras = RAS1_Sync(RAS1_THIS);
    char path[kPathSize];
    if (!hub->copyServerPath(path, sizeof path)) {
        report(SQL1_ST_CONNLOST);
        return SQL1_ST_CONNLOST;
    }
    SQL1_Handle h{};
    int rc = sql1cpth(path, &login_, &h);
    if (rc == SQL1_OK && !hub->isHubNLS()) {
        (void)opsOf(h)->release(h);
        return WSQL_NONLS;
    }
    if (rc == SQL1_OK) rc = setNLSProperties(h);
    if (rc == SQL1_OK) {
        pathHandle = h;
        state = SQL_LOGGEDON;
        RAS1_TRACE_IF(ras, RAS1_STATE, "Create Path Logon '%.16s' '%.*s' '%.16s'\n", login_.userId,
                      passwordLength(login_), kMask, login_.clientHost);
        return SQL1_OK;
    }
    if (SQL1_IsCurrent(h)) (void)opsOf(h)->release(h);
    RAS1_Printf(RAS1_THIS, __LINE__, "Create Path Error st=%d for '%.16s' '%.*s' '%.16s'\n", rc, login_.userId,
                passwordLength(login_), kMask, login_.clientHost);
    report(rc);
    return rc;
}

// ---------------------------------------------------------------------------
// Statement
// ---------------------------------------------------------------------------

int DS_SQLRequest::create(int flags, SQL1_Exit* exit) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = state == SQL_LOGGEDON ? createStatement(flags, exit) : -1;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int DS_SQLRequest::createStatement(int flags, SQL1_Exit* exit) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_TRACE_IF(ras, RAS1_STATE, "SQL: ~%s~\n", sqlText != nullptr ? sqlText : "");
    const SQL1_Ops* ops = opsOf(pathHandle);
    int rc = ops == nullptr ? SQL1_ST_STALE : SQL1_OK;
    releaseHandle(&stmtHandle);
    if (rc == SQL1_OK) rc = ops->prepare(pathHandle, sqlText != nullptr ? sqlText : "", &stmtHandle);
    if (rc == SQL1_OK) rc = ops->createRequest(stmtHandle, flags, exit, &requestHandle, rowHandleRef);
    if (rc == SQL1_OK) rc = ops->getInputDescriptor(requestHandle, &inputDA);
    if (rc == SQL1_OK) rc = ops->getOutputDescriptor(*rowHandleRef, &outputDA);
    if (rc == SQL1_OK) {
        asyncOpen = exit != nullptr;
        state = SQL_CREATED;
        return rc;
    }
    RAS1_Printf(RAS1_THIS, __LINE__, "Error: unable to create request; rc = <%d>", rc);
    releaseHandle(&requestHandle);
    releaseHandle(&stmtHandle);
    inputDA = outputDA = nullptr;
    fallBack(rc);
    return rc;
}

int DS_SQLRequest::open() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (state != SQL_CREATED) {
        RAS1_EXIT_RC(ras, -1);
        return -1;
    }
    int rc = opsOf(requestHandle) != nullptr ? opsOf(requestHandle)->open(requestHandle, inputDA) : SQL1_ST_STALE;
    if (rc == SQL1_OK) {
        state = SQL_OPEN;
    } else {
        RAS1_Printf(RAS1_THIS, __LINE__, "SQL <%s> open failed. %d", sqlText != nullptr ? sqlText : "", rc);
        (void)drop();
        fallBack(rc);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int DS_SQLRequest::close() {
    if (state != SQL_OPEN) return -1;
    int rc = opsOf(requestHandle) != nullptr ? opsOf(requestHandle)->close(requestHandle) : SQL1_ST_STALE;
    report(rc);
    state = SQL_CREATED;
    return rc;
}

int DS_SQLRequest::drop() {
    if (state != SQL_CREATED) return -1;
    int rc = opsOf(requestHandle) != nullptr ? opsOf(requestHandle)->release(requestHandle) : SQL1_ST_STALE;
    // A stale request went with its path (a dropped global path takes its
    // children along): nothing to report.
    if (rc != SQL1_ST_STALE) report(rc);
    requestHandle = SQL1_Handle{};
    *rowHandleRef = SQL1_Handle{};
    inputDA = outputDA = nullptr;
    state = SQL_LOGGEDON;
    return rc == SQL1_ST_STALE ? SQL1_OK : rc;
}

// ---------------------------------------------------------------------------
// Input markers
// ---------------------------------------------------------------------------

SQL1_SqlVar* DS_SQLRequest::cleanInputValue(int index) {
    if (state != SQL_CREATED || inputDA == nullptr || index < 0 || index >= inputDA->allocated) return nullptr;
    SQL1_SqlVar* v = &inputDA->var[index];
    if (v->type == SQL1_T_VARCHAR) return v;
    int fill = v->type == SQL1_T_CHAR || v->type == SQL1_T_NCHAR ? ' ' : 0;
    if (v->data != nullptr) std::memset(v->data, fill, v->maxLength);
    v->length = 0;
    v->nullInd = 0;
    return v;
}

namespace {

// Stores `value` in the entry's first `size` bytes.
template <class T>
void store(SQL1_SqlVar* v, T value) {
    std::memcpy(v->data, &value, sizeof value);
    v->length = sizeof value;
}

void copyBytes(SQL1_SqlVar* v, const char* text, size_t n) {
    std::memcpy(v->data, text, n);
    v->length = static_cast<uint16_t>(n);
}

// Binary marker: "0x.." into an entry of 1, 2 or 4 bytes is a number,
// anything else is copied as bytes.
void setBinary(SQL1_SqlVar* v, const char* text, size_t n) {
    bool hex = std::strlen(text) > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X') && v->maxLength <= 4;
    if (hex) {
        unsigned long value = std::strtoul(text + 2, nullptr, 16);
        switch (v->maxLength) {
        case 1: store(v, static_cast<uint8_t>(value)); return;
        case 2: store(v, static_cast<uint16_t>(value)); return;
        case 4: store(v, static_cast<uint32_t>(value)); return;
        default: break;
        }
    }
    copyBytes(v, text, n);
}

// Converts the terminated text for a numeric or binary entry. `n` is the
// text's length cut to the entry's maximum.
void convertText(SQL1_SqlVar* v, const char* text, size_t n) {
    switch (v->type) {
    case SQL1_T_SMALLINT: store(v, static_cast<int16_t>(std::strtol(text, nullptr, 0))); break;
    case SQL1_T_INTEGER: store(v, static_cast<int32_t>(std::strtol(text, nullptr, 0))); break;
    case SQL1_T_USMALLINT: store(v, static_cast<uint16_t>(std::strtoul(text, nullptr, 0))); break;
    case SQL1_T_UINTEGER: store(v, static_cast<uint32_t>(std::strtoul(text, nullptr, 0))); break;
    case SQL1_T_DOUBLE:
    case SQL1_T_FLOAT8: store(v, std::strtod(text, nullptr)); break;
    case SQL1_T_BIGINT: {
        long long x = 0;
        if (std::sscanf(text, "%lld", &x) != 1) x = 0;
        store(v, static_cast<int64_t>(x));
        break;
    }
    case SQL1_T_UBIGINT: {
        unsigned long long x = 0;
        if (std::sscanf(text, "%llu", &x) != 1) x = 0;
        store(v, static_cast<uint64_t>(x));
        break;
    }
    case SQL1_T_BINARY: setBinary(v, text, n); break;
    default: copyBytes(v, text, n); break;
    }
}

}  // namespace

int DS_SQLRequest::setInputValue(int index, const char* text, short length) {
    SQL1_SqlVar* v = cleanInputValue(index);
    if (v == nullptr || text == nullptr || v->data == nullptr) return -1;
    size_t n = length == -1 ? std::strlen(text) : length < 0 ? 0 : static_cast<size_t>(length);
    if (n > v->maxLength) n = v->maxLength;
    switch (v->type) {
    case SQL1_T_VARCHAR:
    case SQL1_T_NVARCHAR:
        copyBytes(v, text, n);
        return 0;
    case SQL1_T_CHAR:
    case SQL1_T_NCHAR:
        // The rest of the entry stays blank; the length tells the layer
        // where the value ends.
        copyBytes(v, text, n);
        return 0;
    default:
        if (length != -1) return -1;
        // Numbers are read from a terminated copy: the text may be longer
        // than the entry, and the entry is no terminated string.
        convertText(v, text, n);
        return 0;
    }
}

int DS_SQLRequest::setInputValue(int index, const void* data, short length) {
    SQL1_SqlVar* v = cleanInputValue(index);
    if (v == nullptr || data == nullptr || v->data == nullptr || length < 0) return -1;
    size_t n = static_cast<size_t>(length) > v->maxLength ? v->maxLength : static_cast<size_t>(length);
    copyBytes(v, static_cast<const char*>(data), n);
    return 0;
}

int DS_SQLRequest::setInputValue(int index, int value) {
    SQL1_SqlVar* v = cleanInputValue(index);
    if (v == nullptr || v->type != SQL1_T_INTEGER || v->data == nullptr) return -1;
    store(v, static_cast<int32_t>(value));
    return 0;
}

// ---------------------------------------------------------------------------
// Select and transaction
// ---------------------------------------------------------------------------

int DS_SQLSelect::create(int flags, SQL1_Exit* exit) { return DS_SQLRequest::create(flags, exit); }

int DS_SQLSelect::fetch() {
    if (state != SQL_OPEN) return -1;
    const SQL1_Ops* ops = rowHandleRef->object != nullptr ? rowHandleRef->object->ops : nullptr;
    int rc = ops != nullptr ? ops->fetch(*rowHandleRef, outputDA) : SQL1_ST_STALE;
    report(rc);
    return rc;
}

int DS_SQLSelect::GetOutputValue(int index, void* buffer) {
    if (state != SQL_OPEN || outputDA == nullptr || buffer == nullptr || index < 0 || index >= outputDA->used)
        return -1;
    const SQL1_SqlVar& v = outputDA->var[index];
    size_t n = v.length < v.maxLength ? v.length : v.maxLength;
    if (n > 0 && v.data != nullptr) std::memcpy(buffer, v.data, n);
    return 0;
}

int DS_SQLTransaction::create(int flags, SQL1_Exit* exit) { return DS_SQLRequest::create(flags, exit); }

int DS_SQLTransaction::executeTransaction() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = open();
    if (rc == SQL1_OK) rc = close();
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
