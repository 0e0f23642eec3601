// kshdsr: the database request objects. A DS_SQLRequest wraps one SQL
// statement against a hub's monitoring server through the SQL client layer
// (sql1): log on (over the hub's shared global path or a path of its own),
// create the statement from SQL text, bind input values, open, fetch rows,
// close, drop. DS_SQLSelect adds row fetching, DS_SQLTransaction a one-shot
// execute.
//
// States: 0 not logged on -> login -> 1 -> create -> 2 -> open -> 3 ->
// fetch... -> close -> 2 -> drop -> 1. A call made in the wrong state
// returns -1 without calling the library. A failed create or open on an own
// path falls back to 0; on the global path to 1. Every library failure is
// returned and reported to the hub (WSQL_Hub::setGlobalPathStatus), which
// drops the shared connection for statuses 150 to 199.
//
// Results: 0 success; -1 wrong state or no such marker; 5 the server cannot
// be located; 107 the server cannot take national-language text; any other
// value is a status of the SQL client layer (sql1.h), 514 end of data.
//
// Thread safety: one object is used by one thread at a time, except that
// close and drop are called under the object's own lock (Lock/Unlock) by
// whoever ends a request. The hub's lock guards the server look-up and the
// creation of the hub's global path.
#pragma once

#include <cstdint>

#include "kshlst.h"
#include "sql1/sql1.h"

class WSQL_Hub;

class DS_SQLRequest {
public:
    enum SQLSTATE : int {
        SQL_NOTLOGGEDON = 0,
        SQL_LOGGEDON = 1,
        SQL_CREATED = 2,
        SQL_OPEN = 3,
    };

    // A request of `hub` over `sql` (may be null for a logon-only request).
    // The text is not copied: the caller keeps it alive as long as the
    // object. The login id starts as the library's default login id.
    DS_SQLRequest(WSQL_Hub* hub, const char* sql);
    // Drops a created statement, releases an own path (a failure is
    // reported to the hub).
    virtual ~DS_SQLRequest();
    DS_SQLRequest(const DS_SQLRequest&) = delete;
    DS_SQLRequest& operator=(const DS_SQLRequest&) = delete;

    // State 1 -> 2: prepares the text and makes the executable request.
    // `exit` (may be null) makes the opens asynchronous: the library calls
    // exit->callback(status, exit->arg) from its own thread when an open
    // has finished. -1 in any other state.
    [[nodiscard]] virtual int create(int flags, SQL1_Exit* exit);

    // Logs on with the hub's shared path from now on.
    void useGlobalPath() { globalPath = 1; }
    bool usesGlobalPath() const { return globalPath != 0; }
    // The login id (user id, password, client host; 16 bytes each, not
    // terminated when full) for the caller to fill before login.
    SQL1_LoginId* loginId() { return &login_; }
    SQLSTATE CurrentState() const { return state; }
    // Descriptors of a created request (null before create). Owned by the
    // library; valid until the request is dropped.
    SQL1_Sqlda* getOutputSQLDA() const { return outputDA; }
    SQL1_Sqlda* getInputSQLDA() const { return inputDA; }
    const char* getSQL() const { return sqlText; }
    WSQL_Hub* getHub() const { return hub; }
    void Lock() { lock.Lock(); }
    void Unlock() { lock.Unlock(); }

    // State 0 -> 1. Bit 0 of `flags`: a request on the global path logs on
    // with its own login id when the hub validates users. See the class
    // comment for the results.
    [[nodiscard]] int login(int flags);
    // 2 -> 3; with an exit block the open completes later (the exit is
    // called). A failure drops the request.
    [[nodiscard]] int open();
    // 3 -> 2 and 2 -> 1; the state changes even when the library fails.
    int close();
    int drop();

    // Marker binding, state 2 only; 0 or -1 (no such marker, wrong state or
    // an explicit length for a numeric marker).
    // `text` with `length` -1 is a terminated string, converted by the
    // marker's type; an explicit length copies bytes (character and binary
    // markers only).
    int setInputValue(int index, const char* text, short length);
    // Copies `length` bytes and sets the marker's current length.
    int setInputValue(int index, const void* data, short length);
    // A type-496 marker only: stores the 4-byte value.
    int setInputValue(int index, int value);
    // Resets marker `index` for a new value (blanks for fixed character
    // markers, zero bytes otherwise); the entry, or null when there is none.
    SQL1_SqlVar* cleanInputValue(int index);

protected:
    // Releases an own path and falls back to state 0 (after a failed
    // create or open); on the global path only the state falls back to 1.
    void fallBack(int status);
    // Reports a library status to the hub.
    void report(int status);

    SQLSTATE state;
    SQL1_Handle rowHandle;
    SQL1_Handle* rowHandleRef;   // where create stores the row handle (rowHandle)
    SQL1_Handle pathHandle;      // own path, or a copy of the hub's global one
    SQL1_Handle stmtHandle;
    SQL1_Handle requestHandle;
    SQL1_Sqlda* inputDA;
    SQL1_Sqlda* outputDA;
    SQL1_LoginId login_;
    const char* sqlText;         // not owned
    WSQL_Lock lock;
    int16_t globalPath;
    WSQL_Hub* hub;
    bool asyncOpen;              // created with an exit block

private:
    // One pass of login; *retry is set when the pass may be repeated.
    int loginPass(int flags, bool* retry);
    int logonGlobal(int flags);
    int logonOwn();
    // Prepares and creates; fills the descriptors.
    int createStatement(int flags, SQL1_Exit* exit);
};

class DS_SQLSelect : public DS_SQLRequest {
public:
    DS_SQLSelect(WSQL_Hub* hub, const char* sql) : DS_SQLRequest(hub, sql) {}
    ~DS_SQLSelect() override = default;
    [[nodiscard]] int create(int flags, SQL1_Exit* exit) override;

    // Next row into the output descriptor: 0, a status (514 end of data,
    // reported to the hub like every other), or -1 when not open.
    [[nodiscard]] int fetch();
    // Copies column `index` of the current row (its current length) into
    // `buffer`, which holds at least the column's maximum length. 0 or -1.
    int GetOutputValue(int index, void* buffer);
};

class DS_SQLTransaction : public DS_SQLRequest {
public:
    DS_SQLTransaction(WSQL_Hub* hub, const char* sql) : DS_SQLRequest(hub, sql) {}
    ~DS_SQLTransaction() override = default;
    [[nodiscard]] int create(int flags, SQL1_Exit* exit) override;

    // open, then close when the open succeeded. 0 or the open's status.
    [[nodiscard]] int executeTransaction();
};
