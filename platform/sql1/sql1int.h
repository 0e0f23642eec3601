// sql1int: the hub store behind the sql1 layer: SQLite connections with
// their statement cache, the store's dictionary and settings, its users, the
// server registry and the test hooks. Internal to platform/sql1.
#pragma once

#include <sqlite3.h>

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "sql1/sql1.h"
#include "sql1/sql1dial.h"

// One SQLite connection of a store. Used by one request (or one internal
// task) at a time; the pool hands it over.
class Sql1Conn {
public:
    Sql1Conn() = default;
    ~Sql1Conn();
    Sql1Conn(const Sql1Conn&) = delete;
    Sql1Conn& operator=(const Sql1Conn&) = delete;

    // Opens `path` with the store's settings (DQS off before any statement,
    // WAL, busy time-out, the authorizer). 0 or a status.
    int open(const std::string& path, bool create, int busyMillis);
    // A prepared statement for `sql` from the cache or freshly prepared; the
    // text must hold exactly one statement. 0 or a status.
    int acquire(const std::string& sql, sqlite3_stmt** stmt);
    // Resets `stmt` and keeps it for the next acquire of the same text.
    void giveBack(const std::string& sql, sqlite3_stmt* stmt);
    // Runs `sql` (several statements allowed) as the layer itself. 0 or a status.
    int execInternal(const char* sql);

    sqlite3* db = nullptr;
    bool internal = false;  // the layer's own statements: the authorizer lets everything through

private:
    static constexpr size_t kCacheMax = 32;  // cached statements per connection
    std::unordered_multimap<std::string, sqlite3_stmt*> idle_;
};

// Scoped internal mode of a connection.
class Sql1Internal {
public:
    explicit Sql1Internal(Sql1Conn* c) : c_(c) { c_->internal = true; }
    ~Sql1Internal() { c_->internal = false; }
    Sql1Internal(const Sql1Internal&) = delete;
    Sql1Internal& operator=(const Sql1Internal&) = delete;

private:
    Sql1Conn* c_;
};

struct Sql1Settings {
    std::string version = "06.30";  // VV.RR
    int versionNumber = 630;        // VVRR
    int build = 0;
    int level = 0;                  // property 103
    std::string hubNode;
    bool validate = true;
    bool nls = true;
};

class Sql1Store : public SQL1_DialDictionary {
public:
    explicit Sql1Store(std::string path) : path_(std::move(path)) {}
    ~Sql1Store() override;
    Sql1Store(const Sql1Store&) = delete;
    Sql1Store& operator=(const Sql1Store&) = delete;

    // Opens the store (creating it when `create` and the file is new or
    // empty) and loads its dictionary and settings.
    int load(const SQL1_StoreOptions* options, bool create);
    // Applies the options that are set (version, validation, NLS, level).
    int applyOptions(const SQL1_StoreOptions* options);

    const SQL1_DialTable* find(std::string_view tableName) const override;
    const std::string& path() const { return path_; }
    Sql1Settings settings() const;

    // A connection of the pool (give it back with release). 0 or a status.
    int acquire(Sql1Conn** conn);
    void release(Sql1Conn* conn);

    // Checks a login against the users (only when the store validates).
    // 0 or a SQL1_ST_LOGON_* status.
    int logon(const char* user, const char* password);
    int setUser(const char* user, const char* password, int enabled, int minimalHash);

    // Test hook: 0, or the status the next counted operation must fail with.
    int inject();
    void setInjection(int status, int count, int skip);

private:
    int create(Sql1Conn* conn, const SQL1_StoreOptions* options);
    int loadDictionary(Sql1Conn* conn);
    int loadSettings(Sql1Conn* conn);

    const std::string path_;
    int busyMillis_ = 5000;
    std::map<std::string, SQL1_DialTable> tables_;  // key: upper-case name; fixed after load

    mutable std::mutex mu_;  // guards everything below
    Sql1Settings settings_;
    int levelOverride_ = 0;
    std::vector<Sql1Conn*> idle_;
    int openCount_ = 0;
    int injectStatus_ = 0, injectCount_ = 0, injectSkip_ = 0;
    // verified logins: keyed hash of user and password -> the stored hash it was checked against
    std::unordered_map<std::string, std::pair<std::string, long long>> verified_;
};

// The store a server path names (see sql1cpth), opened on first use.
std::shared_ptr<Sql1Store> Sql1_ResolveServer(const char* serverPath, int* rc);
// The store at `path` (opened on first use; created when `options` allow).
std::shared_ptr<Sql1Store> Sql1_OpenStore(const std::string& path, const SQL1_StoreOptions* options, bool create,
                                          int* rc);

// Maps an SQLite result to a status (connection-level errors to 150..199).
int Sql1_Status(int sqliteRc);
// Records the calling thread's last failure text.
void Sql1_SetError(const std::string& text);
// Bounded copy of a 16-byte login field into a terminated string.
std::string Sql1_Field16(const char* field);
