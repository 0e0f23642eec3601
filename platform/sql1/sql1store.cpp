// sql1store: the hub store (SQLite file) behind the sql1 layer: connections
// and their pool, creation from schema and seed, the dictionary, settings,
// users, the server registry with servers.conf, and the test hooks.
#include <limits.h>
#include <sodium.h>
#include <strings.h>
#include <sys/stat.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

#include "bss1/bss1.h"
#include "ras1/ras1.h"
#include "sql1/sql1int.h"

RAS1_UNIT("sql1store");

namespace {

thread_local std::string tLastError;

std::string upper(std::string_view s) {
    std::string u(s);
    for (char& c : u) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return u;
}

bool startsWithNoCase(std::string_view s, std::string_view prefix) {
    return s.size() >= prefix.size() && strncasecmp(s.data(), prefix.data(), prefix.size()) == 0;
}

// The layer's own tables and SQLite's: never reachable by client statements.
bool internalName(const char* name) {
    return name != nullptr &&
           (startsWithNoCase(name, "CSIT_") || startsWithNoCase(name, "sqlite_") || startsWithNoCase(name, "pragma_"));
}

// Statements sent through the layer may read every store table, write every
// table but the system ones, and nothing else (no DDL, PRAGMA, ATTACH,
// transactions). The layer's own statements run in internal mode.
int authorize(void* arg, int action, const char* a, const char*, const char*, const char*) {
    const Sql1Conn* conn = static_cast<const Sql1Conn*>(arg);
    if (conn->internal) return SQLITE_OK;
    switch (action) {
    case SQLITE_SELECT:
    case SQLITE_FUNCTION:
    case SQLITE_RECURSIVE:
        return SQLITE_OK;
    case SQLITE_READ:
        return internalName(a) ? SQLITE_DENY : SQLITE_OK;
    case SQLITE_INSERT:
    case SQLITE_UPDATE:
    case SQLITE_DELETE:
        return internalName(a) || startsWithNoCase(a != nullptr ? a : "", "SYSTEM.") ? SQLITE_DENY : SQLITE_OK;
    default:
        return SQLITE_DENY;
    }
}

bool readFile(const std::string& path, std::string* out) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return false;
    std::ostringstream ss;
    ss << in.rdbuf();
    *out = ss.str();
    return true;
}

bool fileExists(const std::string& path) {
    struct stat st;
    return ::stat(path.c_str(), &st) == 0;
}

// "VV.RR" -> VVRR, or -1.
int versionNumber(const char* v) {
    if (v == nullptr || std::strlen(v) != 5 || !std::isdigit(static_cast<unsigned char>(v[0])) ||
        !std::isdigit(static_cast<unsigned char>(v[1])) || v[2] != '.' ||
        !std::isdigit(static_cast<unsigned char>(v[3])) || !std::isdigit(static_cast<unsigned char>(v[4]))) {
        return -1;
    }
    return ((v[0] - '0') * 10 + (v[1] - '0')) * 100 + (v[3] - '0') * 10 + (v[4] - '0');
}

bool useMinimalHash(int flag) {
    return flag != 0 || std::strcmp(BSS1_GetEnv("SQL1_PWHASH", ""), "min") == 0;
}

int hashPassword(const char* password, int minimalHash, char out[crypto_pwhash_STRBYTES]) {
    bool min = useMinimalHash(minimalHash);
    int rc = crypto_pwhash_str(out, password, std::strlen(password),
                               min ? crypto_pwhash_OPSLIMIT_MIN : crypto_pwhash_OPSLIMIT_INTERACTIVE,
                               min ? crypto_pwhash_MEMLIMIT_MIN : crypto_pwhash_MEMLIMIT_INTERACTIVE);
    return rc == 0 ? SQL1_OK : SQL1_ST_NOMEM;
}

// One internal statement with text bindings, stepped to the end; the
// callback (may be null) sees each row.
template <class RowFn>
int runInternal(Sql1Conn* conn, const char* sql, const std::vector<std::string>& binds, RowFn&& onRow) {
    Sql1Internal in(conn);
    sqlite3_stmt* st = nullptr;
    int rc = sqlite3_prepare_v2(conn->db, sql, -1, &st, nullptr);
    if (rc != SQLITE_OK) {
        Sql1_SetError(sqlite3_errmsg(conn->db));
        return Sql1_Status(rc);
    }
    for (size_t i = 0; i < binds.size(); i++) {
        sqlite3_bind_text(st, static_cast<int>(i + 1), binds[i].c_str(), -1, SQLITE_TRANSIENT);
    }
    while ((rc = sqlite3_step(st)) == SQLITE_ROW) onRow(st);
    int status = rc == SQLITE_DONE ? SQL1_OK : Sql1_Status(rc);
    if (status != SQL1_OK) Sql1_SetError(sqlite3_errmsg(conn->db));
    sqlite3_finalize(st);
    return status;
}

const char* col(sqlite3_stmt* st, int i) {
    const unsigned char* t = sqlite3_column_text(st, i);
    return t != nullptr ? reinterpret_cast<const char*>(t) : "";
}

// Process-wide registry of servers and stores.
struct Registry {
    std::mutex mu;
    std::map<std::string, std::string> servers;  // upper-case LMS name -> store path
    std::string localName;                       // upper-case LMS name of the local server
    std::string home = ".";
    std::map<std::string, std::shared_ptr<Sql1Store>> stores;  // canonical path -> store
};

Registry& registry() {
    static Registry* r = new Registry;  // never destroyed: stores may outlive static destruction
    return *r;
}

// Absolute path of `path` (the folder resolved, the file need not exist).
std::string canonical(const std::string& path) {
    char buf[PATH_MAX];
    if (::realpath(path.c_str(), buf) != nullptr) return buf;
    size_t slash = path.rfind('/');
    std::string dir = slash == std::string::npos ? "." : path.substr(0, slash == 0 ? 1 : slash);
    std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
    if (::realpath(dir.c_str(), buf) == nullptr) return path;
    return std::string(buf) + (std::strcmp(buf, "/") == 0 ? "" : "/") + name;
}

// "NAME[QUALIFIER]" -> "NAME".
std::string baseName(std::string_view name) {
    size_t b = name.find('[');
    return std::string(b == std::string::npos ? name : name.substr(0, b));
}

// Looks `name` up in servers.conf of the home folder. Caller holds registry().mu.
bool fromServersConf(const Registry& r, const std::string& name, std::string* storePath) {
    std::ifstream in(r.home + "/servers.conf");
    std::string line;
    while (in && std::getline(in, line)) {
        std::istringstream ls(line);
        std::string lms, uri;
        if (!(ls >> lms) || lms[0] == '#' || !(ls >> uri)) continue;
        if (strcasecmp(lms.c_str(), name.c_str()) != 0) continue;
        if (!startsWithNoCase(uri, "sqlite:")) continue;  // the only scheme known
        std::string p = uri.substr(7);
        *storePath = !p.empty() && p[0] == '/' ? p : r.home + "/" + p;
        return true;
    }
    return false;
}

// Store path of the server `name`; false when unknown.
bool serverStorePath(const std::string& name, std::string* storePath, bool* local) {
    Registry& r = registry();
    std::lock_guard<std::mutex> g(r.mu);
    std::string key = upper(baseName(name));
    auto it = r.servers.find(key);
    *local = it != r.servers.end() && key == r.localName;
    if (it != r.servers.end()) {
        *storePath = it->second;
        return true;
    }
    return fromServersConf(r, baseName(name), storePath);
}

}  // namespace

// ---------------------------------------------------------------------------
// Helpers
// ---------------------------------------------------------------------------

void Sql1_SetError(const std::string& text) { tLastError = text; }

const char* SQL1_LastError() { return tLastError.c_str(); }

std::string Sql1_Field16(const char* field) { return std::string(field, strnlen(field, 16)); }

int Sql1_Status(int sqliteRc) {
    static const struct {
        int sqlite;
        int status;
    } map[] = {
        {SQLITE_OK, SQL1_OK},
        {SQLITE_CANTOPEN, SQL1_ST_CONNLOST},
        {SQLITE_IOERR, SQL1_ST_CONNIO},
        {SQLITE_FULL, SQL1_ST_CONNIO},
        {SQLITE_CORRUPT, SQL1_ST_CONNBAD},
        {SQLITE_NOTADB, SQL1_ST_CONNBAD},
        {SQLITE_CONSTRAINT, SQL1_ST_CONSTRAINT},
        {SQLITE_TOOBIG, SQL1_ST_TOOLONG},
        {SQLITE_BUSY, SQL1_ST_BUSY},
        {SQLITE_LOCKED, SQL1_ST_BUSY},
        {SQLITE_AUTH, SQL1_ST_DENIED},
        {SQLITE_READONLY, SQL1_ST_DENIED},
        {SQLITE_NOMEM, SQL1_ST_NOMEM},
        {SQLITE_ERROR, SQL1_ST_SYNTAX},
    };
    int primary = sqliteRc & 0xFF;
    for (const auto& m : map) {
        if (m.sqlite == primary) return m.status;
    }
    return SQL1_ST_EXEC;
}

// ---------------------------------------------------------------------------
// Connections
// ---------------------------------------------------------------------------

Sql1Conn::~Sql1Conn() {
    for (auto& e : idle_) sqlite3_finalize(e.second);
    if (db != nullptr) sqlite3_close_v2(db);
}

int Sql1Conn::open(const std::string& path, bool create, int busyMillis) {
    int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_FULLMUTEX | (create ? SQLITE_OPEN_CREATE : 0);
    int rc = sqlite3_open_v2(path.c_str(), &db, flags, nullptr);
    if (rc != SQLITE_OK) {
        Sql1_SetError(std::string("cannot open store ") + path + ": " + (db ? sqlite3_errmsg(db) : "no memory"));
        return rc == SQLITE_NOMEM ? SQL1_ST_NOMEM : SQL1_ST_CONNLOST;
    }
    // The double-quoted-string fallback goes off before anything is prepared.
    sqlite3_db_config(db, SQLITE_DBCONFIG_DQS_DML, 0, nullptr);
    sqlite3_db_config(db, SQLITE_DBCONFIG_DQS_DDL, 0, nullptr);
    sqlite3_db_config(db, SQLITE_DBCONFIG_ENABLE_LOAD_EXTENSION, 0, nullptr);
    sqlite3_db_config(db, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
    sqlite3_extended_result_codes(db, 1);
    sqlite3_busy_timeout(db, busyMillis);
    sqlite3_set_authorizer(db, authorize, this);
    return execInternal("PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL;");
}

int Sql1Conn::execInternal(const char* sql) {
    Sql1Internal in(this);
    char* err = nullptr;
    int rc = sqlite3_exec(db, sql, nullptr, nullptr, &err);
    if (rc != SQLITE_OK) {
        Sql1_SetError(err != nullptr ? err : sqlite3_errstr(rc));
        sqlite3_free(err);
        return Sql1_Status(rc);
    }
    return SQL1_OK;
}

int Sql1Conn::acquire(const std::string& sql, sqlite3_stmt** stmt) {
    auto it = idle_.find(sql);
    if (it != idle_.end()) {
        *stmt = it->second;
        idle_.erase(it);
        return SQL1_OK;
    }
    const char* tail = nullptr;
    int rc = sqlite3_prepare_v3(db, sql.c_str(), static_cast<int>(sql.size()), SQLITE_PREPARE_PERSISTENT, stmt, &tail);
    if (rc != SQLITE_OK) {
        Sql1_SetError(sqlite3_errmsg(db));
        *stmt = nullptr;
        return Sql1_Status(rc);
    }
    while (tail != nullptr && *tail != '\0' && std::isspace(static_cast<unsigned char>(*tail))) tail++;
    if (*stmt == nullptr || (tail != nullptr && *tail != '\0')) {
        sqlite3_finalize(*stmt);
        *stmt = nullptr;
        Sql1_SetError("the text must hold exactly one statement");
        return SQL1_ST_SYNTAX;
    }
    return SQL1_OK;
}

void Sql1Conn::giveBack(const std::string& sql, sqlite3_stmt* stmt) {
    sqlite3_reset(stmt);
    sqlite3_clear_bindings(stmt);
    if (idle_.size() >= kCacheMax) {
        sqlite3_finalize(stmt);
        return;
    }
    idle_.emplace(sql, stmt);
}

// ---------------------------------------------------------------------------
// Store
// ---------------------------------------------------------------------------

Sql1Store::~Sql1Store() {
    for (Sql1Conn* c : idle_) delete c;
}

int Sql1Store::load(const SQL1_StoreOptions* options, bool allowCreate) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (options != nullptr && options->busyMillis > 0) busyMillis_ = options->busyMillis;
    bool existed = fileExists(path_);
    if (!existed && !allowCreate) {
        Sql1_SetError("no store at " + path_);
        RAS1_EXIT_RC(ras, SQL1_ST_CONNLOST);
        return SQL1_ST_CONNLOST;
    }
    auto conn = std::make_unique<Sql1Conn>();
    int rc = conn->open(path_, allowCreate, busyMillis_);
    bool empty = false;
    if (rc == SQL1_OK) {
        rc = runInternal(conn.get(), "SELECT count(*) FROM sqlite_master", {},
                         [&](sqlite3_stmt* st) { empty = sqlite3_column_int(st, 0) == 0; });
    }
    if (rc == SQL1_OK && empty) {
        if (!allowCreate) {
            Sql1_SetError(path_ + " is not a hub store");
            rc = SQL1_ST_CONNBAD;
        } else {
            rc = create(conn.get(), options);
        }
    }
    if (rc == SQL1_OK) rc = loadDictionary(conn.get());
    if (rc == SQL1_OK) rc = applyOptions(options);
    if (rc == SQL1_OK) {
        std::lock_guard<std::mutex> g(mu_);
        idle_.push_back(conn.release());
        openCount_++;
    }
    if (rc != SQL1_OK) RAS1_Printf(RAS1_THIS, __LINE__, "store %s not opened, status %d: %s", path_.c_str(), rc, SQL1_LastError());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// Schema, seed rows and the administrator, in one transaction.
int Sql1Store::create(Sql1Conn* conn, const SQL1_StoreOptions* o) {
    const char* dir = o != nullptr && o->dataDir != nullptr ? o->dataDir : BSS1_GetEnv("SQL1_STORE_DATA", nullptr);
    const char* admin = o != nullptr && o->adminUser != nullptr ? o->adminUser : "sysadmin";
    const char* password = o != nullptr ? o->adminPassword : nullptr;
    std::string schema, seed;
    // User ids and passwords fill at most the 16 bytes of a login id field.
    if (dir == nullptr || password == nullptr || *password == '\0' || *admin == '\0' || std::strlen(admin) > 16 ||
        std::strlen(password) > 16) {
        Sql1_SetError("a new store needs its data folder and an administrator with a password of 1 to 16 characters");
        return SQL1_ST_BADARG;
    }
    if (!readFile(std::string(dir) + "/schema.sql", &schema) || !readFile(std::string(dir) + "/seed.sql", &seed)) {
        Sql1_SetError(std::string("cannot read schema.sql and seed.sql in ") + dir);
        return SQL1_ST_BADARG;
    }
    char hash[crypto_pwhash_STRBYTES];
    int rc = hashPassword(password, o->minimalHash, hash);
    if (rc == SQL1_OK) rc = conn->execInternal("BEGIN IMMEDIATE");
    if (rc != SQL1_OK) return rc;
    // Another process or thread may have created it meanwhile.
    bool empty = true;
    rc = runInternal(conn, "SELECT count(*) FROM sqlite_master", {},
                     [&](sqlite3_stmt* st) { empty = sqlite3_column_int(st, 0) == 0; });
    if (rc != SQL1_OK || !empty) {
        int end = conn->execInternal("COMMIT");
        return rc != SQL1_OK ? rc : end;
    }
    rc = conn->execInternal(schema.c_str());
    if (rc == SQL1_OK) rc = conn->execInternal(seed.c_str());
    if (rc == SQL1_OK) {
        rc = runInternal(conn, "INSERT INTO CSIT_USERS (USERID, PWHASH, ENABLED) VALUES (?, ?, 'Y')", {admin, hash},
                         [](sqlite3_stmt*) {});
    }
    rc = conn->execInternal(rc == SQL1_OK ? "COMMIT" : "ROLLBACK") == SQL1_OK ? rc : SQL1_ST_CONNIO;
    if (rc == SQL1_OK) RAS1_Printf(RAS1_THIS, __LINE__, "created store %s with administrator %s", path_.c_str(), admin);
    return rc;
}

int Sql1Store::loadDictionary(Sql1Conn* conn) {
    std::vector<std::string> names;
    int rc = runInternal(conn, "SELECT name FROM sqlite_master WHERE type IN ('table','view')", {},
                         [&](sqlite3_stmt* st) { names.push_back(col(st, 0)); });
    bool hubStore = false;
    for (size_t i = 0; rc == SQL1_OK && i < names.size(); i++) {
        if (names[i] == "CSIT_TABLES") hubStore = true;
        if (internalName(names[i].c_str())) continue;
        SQL1_DialTable t;
        t.name = names[i];
        std::string sql = "SELECT name, type FROM pragma_table_info(?)";
        rc = runInternal(conn, sql.c_str(), {names[i]}, [&](sqlite3_stmt* st) {
            SQL1_DialColumn c;
            c.name = col(st, 0);
            SQL1_TypeFromDecl(col(st, 1), 256, &c.type, &c.maxLength);
            t.columns.push_back(std::move(c));
        });
        tables_[upper(t.name)] = std::move(t);
    }
    if (rc == SQL1_OK && !hubStore) {
        Sql1_SetError(path_ + " is not a hub store");
        return SQL1_ST_CONNBAD;
    }
    if (rc == SQL1_OK) {
        rc = runInternal(conn, "SELECT TABLENAME, NODECOLUMN, VIATHRU, HISTTABLE, ACTION FROM CSIT_TABLES", {},
                         [&](sqlite3_stmt* st) {
                             auto it = tables_.find(upper(col(st, 0)));
                             if (it == tables_.end()) return;
                             it->second.nodeColumn = col(st, 1);
                             it->second.viaThru = sqlite3_column_int(st, 2) != 0;
                             it->second.histTable = col(st, 3);
                             it->second.actionColumn = col(st, 4);
                         });
    }
    return rc == SQL1_OK ? loadSettings(conn) : rc;
}

int Sql1Store::loadSettings(Sql1Conn* conn) {
    Sql1Settings s;
    int rc = runInternal(conn, "SELECT NAME, VALUE FROM \"SYSTEM.SERVERINFO\"", {}, [&](sqlite3_stmt* st) {
        std::string name = col(st, 0), value = col(st, 1);
        if (name == "VERSION" && versionNumber(value.c_str()) > 0) {
            s.version = value;
            s.versionNumber = versionNumber(value.c_str());
        } else if (name == "BUILD") {
            s.build = std::atoi(value.c_str());
        } else if (name == "HUBNODE") {
            s.hubNode = value;
        } else if (name == "VALIDATE") {
            s.validate = value != "N";
        } else if (name == "NLS") {
            s.nls = value != "N";
        }
    });
    if (rc != SQL1_OK) return rc;
    std::lock_guard<std::mutex> g(mu_);
    s.level = levelOverride_ > 0 ? levelOverride_ : s.versionNumber;
    settings_ = s;
    return SQL1_OK;
}

int Sql1Store::applyOptions(const SQL1_StoreOptions* o) {
    if (o == nullptr) return SQL1_OK;
    if (o->serverVersion != nullptr && versionNumber(o->serverVersion) < 0) {
        Sql1_SetError(std::string("server version must have the form VV.RR: ") + o->serverVersion);
        return SQL1_ST_BADARG;
    }
    std::vector<std::pair<std::string, std::string>> rows;
    if (o->serverVersion != nullptr) rows.emplace_back("VERSION", o->serverVersion);
    if (o->validate >= 0) rows.emplace_back("VALIDATE", o->validate ? "Y" : "N");
    if (o->nls >= 0) rows.emplace_back("NLS", o->nls ? "Y" : "N");
    {
        std::lock_guard<std::mutex> g(mu_);
        if (o->level > 0) levelOverride_ = o->level;
    }
    Sql1Conn* conn = nullptr;
    int rc = acquire(&conn);
    if (rc != SQL1_OK) return rc;
    if (!rows.empty()) rc = conn->execInternal("BEGIN IMMEDIATE");
    for (size_t i = 0; rc == SQL1_OK && i < rows.size(); i++) {
        rc = runInternal(conn, "INSERT OR REPLACE INTO \"SYSTEM.SERVERINFO\" (NAME, VALUE) VALUES (?, ?)",
                         {rows[i].first, rows[i].second}, [](sqlite3_stmt*) {});
    }
    if (!rows.empty()) {
        int end = conn->execInternal(rc == SQL1_OK ? "COMMIT" : "ROLLBACK");
        if (rc == SQL1_OK) rc = end;
    }
    if (rc == SQL1_OK) rc = loadSettings(conn);
    release(conn);
    return rc;
}

const SQL1_DialTable* Sql1Store::find(std::string_view tableName) const {
    auto it = tables_.find(upper(tableName));
    return it == tables_.end() ? nullptr : &it->second;
}

Sql1Settings Sql1Store::settings() const {
    std::lock_guard<std::mutex> g(mu_);
    return settings_;
}

int Sql1Store::acquire(Sql1Conn** conn) {
    // A request holds its connection from creation to release; beyond this
    // many open connections a store refuses more rather than exhaust files.
    constexpr int kMaxOpen = 128;
    {
        std::lock_guard<std::mutex> g(mu_);
        if (!idle_.empty()) {
            *conn = idle_.back();
            idle_.pop_back();
            return SQL1_OK;
        }
        if (openCount_ >= kMaxOpen) {
            Sql1_SetError("too many open requests on store " + path_);
            return SQL1_ST_BUSY;
        }
        openCount_++;
    }
    auto c = std::make_unique<Sql1Conn>();
    int rc = c->open(path_, false, busyMillis_);
    if (rc != SQL1_OK) {
        std::lock_guard<std::mutex> g(mu_);
        openCount_--;
        return rc;
    }
    *conn = c.release();
    return SQL1_OK;
}

void Sql1Store::release(Sql1Conn* conn) {
    // Idle connections kept for reuse: as many as the HTTP layer runs requests
    // at once, so a loaded gateway does not reopen (and re-read the schema of)
    // a connection for most requests.
    constexpr size_t kMaxIdle = 64;
    if (conn == nullptr) return;
    {
        std::lock_guard<std::mutex> g(mu_);
        if (idle_.size() < kMaxIdle) {
            idle_.push_back(conn);
            return;
        }
        openCount_--;
    }
    delete conn;
}

int Sql1Store::inject() {
    std::lock_guard<std::mutex> g(mu_);
    if (injectCount_ <= 0) return SQL1_OK;
    if (injectSkip_ > 0) {
        injectSkip_--;
        return SQL1_OK;
    }
    injectCount_--;
    Sql1_SetError("injected status " + std::to_string(injectStatus_));
    return injectStatus_;
}

void Sql1Store::setInjection(int status, int count, int skip) {
    std::lock_guard<std::mutex> g(mu_);
    injectStatus_ = status;
    injectCount_ = count;
    injectSkip_ = skip;
}

// ---------------------------------------------------------------------------
// Users
// ---------------------------------------------------------------------------

int Sql1Store::logon(const char* user, const char* password) {
    if (!settings().validate) return SQL1_OK;
    if (*user == '\0') return SQL1_ST_LOGON_NOUSER;
    if (*password == '\0') return SQL1_ST_LOGON_NOPASSWORD;
    static unsigned char key[crypto_generichash_KEYBYTES];
    static BSS1_Once once;
    BSS1_InitializeOnce(&once, [](void*) { randombytes_buf(key, sizeof key); }, nullptr);
    Sql1Conn* conn = nullptr;
    int rc = acquire(&conn);
    if (rc != SQL1_OK) return rc;
    std::string stored, enabled;
    bool found = false;
    rc = runInternal(conn, "SELECT PWHASH, ENABLED FROM CSIT_USERS WHERE USERID = ?", {user}, [&](sqlite3_stmt* st) {
        stored = col(st, 0);
        enabled = col(st, 1);
        found = true;
    });
    release(conn);
    if (rc != SQL1_OK) return rc;
    if (!found) {
        // Spend the time of a real check, so that the answer's delay does not
        // tell which user ids exist.
        static char dummy[crypto_pwhash_STRBYTES];
        static BSS1_Once dummyOnce;
        BSS1_InitializeOnce(&dummyOnce, [](void*) { (void)hashPassword("-", 0, dummy); }, nullptr);
        (void)crypto_pwhash_str_verify(dummy, password, std::strlen(password));
        return SQL1_ST_LOGON_UNKNOWN;
    }
    if (enabled == "N") return SQL1_ST_LOGON_DISABLED;

    // A keyed hash of the login, never the password itself, remembers a
    // successful check for a few minutes: Argon2 on every request would cost
    // tens of milliseconds and megabytes each.
    constexpr long long kVerifiedMillis = 300000;
    unsigned char digest[32];
    std::string msg = std::string(user) + '\0' + password;
    crypto_generichash(digest, sizeof digest, reinterpret_cast<const unsigned char*>(msg.data()), msg.size(), key,
                       sizeof key);
    sodium_memzero(msg.data(), msg.size());
    std::string id(reinterpret_cast<char*>(digest), sizeof digest);
    long long now = BSS1_MonotonicMillis();
    {
        std::lock_guard<std::mutex> g(mu_);
        auto it = verified_.find(id);
        if (it != verified_.end() && it->second.first == stored && it->second.second > now) return SQL1_OK;
    }
    if (crypto_pwhash_str_verify(stored.c_str(), password, std::strlen(password)) != 0) return SQL1_ST_LOGON_PASSWORD;
    std::lock_guard<std::mutex> g(mu_);
    if (verified_.size() >= 256) verified_.clear();
    verified_[id] = {stored, now + kVerifiedMillis};
    return SQL1_OK;
}

int Sql1Store::setUser(const char* user, const char* password, int enabled, int minimalHash) {
    if (user == nullptr || password == nullptr || *user == '\0' || std::strlen(user) > 16 || *password == '\0' ||
        std::strlen(password) > 16) {
        Sql1_SetError("user id and password must have 1 to 16 characters");
        return SQL1_ST_BADARG;
    }
    char hash[crypto_pwhash_STRBYTES];
    int rc = hashPassword(password, minimalHash, hash);
    Sql1Conn* conn = nullptr;
    if (rc == SQL1_OK) rc = acquire(&conn);
    if (rc != SQL1_OK) return rc;
    rc = runInternal(conn, "INSERT OR REPLACE INTO CSIT_USERS (USERID, PWHASH, ENABLED) VALUES (?, ?, ?)",
                     {user, hash, enabled ? "Y" : "N"}, [](sqlite3_stmt*) {});
    release(conn);
    std::lock_guard<std::mutex> g(mu_);
    verified_.clear();
    return rc;
}

// ---------------------------------------------------------------------------
// Registry and look-up
// ---------------------------------------------------------------------------

std::shared_ptr<Sql1Store> Sql1_OpenStore(const std::string& path, const SQL1_StoreOptions* options, bool create,
                                          int* rc) {
    static BSS1_Once sodiumOnce;
    BSS1_InitializeOnce(&sodiumOnce, [](void*) { (void)sodium_init(); }, nullptr);
    std::string key = canonical(path);
    Registry& r = registry();
    std::shared_ptr<Sql1Store> store;
    {
        std::lock_guard<std::mutex> g(r.mu);
        auto it = r.stores.find(key);
        if (it != r.stores.end()) store = it->second;
    }
    if (store != nullptr) {
        *rc = store->applyOptions(options);
        return *rc == SQL1_OK ? store : nullptr;
    }
    store = std::make_shared<Sql1Store>(key);
    *rc = store->load(options, create);
    if (*rc != SQL1_OK) return nullptr;
    std::lock_guard<std::mutex> g(r.mu);
    auto ins = r.stores.emplace(key, store);  // another thread may have won the race
    return ins.first->second;
}

std::shared_ptr<Sql1Store> Sql1_ResolveServer(const char* serverPath, int* rc) {
    std::string sp = serverPath != nullptr ? serverPath : "";
    std::string storePath;
    bool local = false;
    size_t sock = sp.find("NCS:{SOCKET=");
    if (startsWithNoCase(sp, "sqlite:")) {
        storePath = sp.substr(7);
    } else if (sock != std::string::npos) {
        size_t b = sock + 12;
        size_t e = sp.find('}', b);
        if (e == std::string::npos || !serverStorePath(sp.substr(b, e - b), &storePath, &local)) storePath.clear();
    } else if (startsWithNoCase(sp, "CT/DS:")) {
        Registry& r = registry();
        std::lock_guard<std::mutex> g(r.mu);
        auto it = r.servers.find(r.localName);
        if (it != r.servers.end() && !r.localName.empty()) storePath = it->second;
    } else if (!sp.empty() && !serverStorePath(sp, &storePath, &local)) {
        storePath.clear();
    }
    if (storePath.empty()) {
        Sql1_SetError("no server for path " + sp);
        *rc = SQL1_ST_NOTFOUND;
        return nullptr;
    }
    return Sql1_OpenStore(storePath, nullptr, false, rc);
}

// ---------------------------------------------------------------------------
// Public store calls
// ---------------------------------------------------------------------------

int SQL1_CreateStore(const char* path, const SQL1_StoreOptions* options) {
    if (path == nullptr || *path == '\0') return SQL1_ST_BADARG;
    int rc = SQL1_OK;
    std::shared_ptr<Sql1Store> store = Sql1_OpenStore(path, options, true, &rc);
    return rc;
}

int SQL1_RegisterServer(const char* lmsName, const char* storePath, const SQL1_StoreOptions* options) {
    if (lmsName == nullptr || *lmsName == '\0' || std::strlen(lmsName) > 255) return SQL1_ST_BADARG;
    int rc = SQL1_CreateStore(storePath, options);
    if (rc != SQL1_OK) return rc;
    Registry& r = registry();
    std::lock_guard<std::mutex> g(r.mu);
    std::string key = upper(baseName(lmsName));
    r.servers[key] = canonical(storePath);
    if (options != nullptr && options->local) r.localName = key;
    RAS1_Printf(RAS1_THIS, __LINE__, "server %s registered with store %s", lmsName, storePath);
    return SQL1_OK;
}

void SQL1_SetHome(const char* homeDir) {
    Registry& r = registry();
    std::lock_guard<std::mutex> g(r.mu);
    r.home = homeDir != nullptr && *homeDir != '\0' ? homeDir : ".";
}

int SQL1_GetStoreInfo(const char* storePath, SQL1_StoreInfo* info) {
    if (storePath == nullptr || info == nullptr) return SQL1_ST_BADARG;
    int rc = SQL1_OK;
    std::shared_ptr<Sql1Store> store = Sql1_OpenStore(storePath, nullptr, false, &rc);
    if (store == nullptr) return rc;
    Sql1Settings s = store->settings();
    std::snprintf(info->hubNode, sizeof info->hubNode, "%s", s.hubNode.c_str());
    std::snprintf(info->version, sizeof info->version, "%s", s.version.c_str());
    info->build = s.build;
    info->validate = s.validate ? 1 : 0;
    info->nls = s.nls ? 1 : 0;
    return SQL1_OK;
}

int SQL1_SetUser(const char* storePath, const char* userId, const char* password, int enabled, int minimalHash) {
    int rc = SQL1_OK;
    std::shared_ptr<Sql1Store> store = Sql1_OpenStore(storePath != nullptr ? storePath : "", nullptr, false, &rc);
    return store == nullptr ? rc : store->setUser(userId, password, enabled, minimalHash);
}

int SQL1_LbLookup(const char* lmsName, unsigned options, SQL1_LbLookup_t** result) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    (void)options;  // every look-up is of a hub's server
    if (result == nullptr) return SQL1_ST_BADARG;
    *result = nullptr;
    std::string storePath;
    bool local = false;
    if (lmsName == nullptr || !serverStorePath(lmsName, &storePath, &local)) {
        Sql1_SetError(std::string("unknown server ") + (lmsName ? lmsName : "(null)"));
        RAS1_EXIT_RC(ras, SQL1_ST_NOTFOUND);
        return SQL1_ST_NOTFOUND;
    }
    auto* r = static_cast<SQL1_LbLookup_t*>(std::calloc(1, sizeof(SQL1_LbLookup_t)));
    auto* e = static_cast<SQL1_LbEntry*>(std::calloc(1, sizeof(SQL1_LbEntry)));
    if (r == nullptr || e == nullptr) {
        std::free(r);
        std::free(e);
        return SQL1_ST_NOMEM;
    }
    std::snprintf(e->lmsName, sizeof e->lmsName, "%s", baseName(lmsName).c_str());
    std::snprintf(e->serverPath, sizeof e->serverPath, "sqlite:%s", storePath.c_str());
    e->local = local ? 1 : 0;
    int rc = SQL1_OK;
    std::shared_ptr<Sql1Store> store = Sql1_OpenStore(storePath, nullptr, false, &rc);
    if (store != nullptr) std::snprintf(e->nodeName, sizeof e->nodeName, "%s", store->settings().hubNode.c_str());
    r->count = 1;
    r->entries = e;
    *result = r;
    RAS1_TRACE_IF(ras, RAS1_STATE, "server %s: %s node %s", lmsName, e->serverPath, e->nodeName);
    RAS1_EXIT_RC(ras, SQL1_OK);
    return SQL1_OK;
}

int SQL1_DestroyLbLookup(SQL1_LbLookup_t* result) {
    if (result == nullptr) return SQL1_ST_BADARG;
    std::free(result->entries);
    std::free(result);
    return SQL1_OK;
}

int SQL1_InjectStatus(const char* server, int status, int count, int skip) {
    if (server == nullptr) return SQL1_ST_BADARG;
    std::string storePath;
    bool local = false;
    if (!serverStorePath(server, &storePath, &local)) storePath = server;
    int rc = SQL1_OK;
    std::shared_ptr<Sql1Store> store = Sql1_OpenStore(storePath, nullptr, false, &rc);
    if (store == nullptr) return rc;
    store->setInjection(status, count, skip);
    return SQL1_OK;
}

void SQL1_Shutdown() {
    Registry& r = registry();
    std::map<std::string, std::shared_ptr<Sql1Store>> stores;
    {
        std::lock_guard<std::mutex> g(r.mu);
        stores.swap(r.stores);
        r.servers.clear();
        r.localName.clear();
    }
}
