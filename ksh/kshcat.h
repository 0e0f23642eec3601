// kshcat: the attribute catalog, the gateway's dictionary of the server's
// tables keyed by qualified name (APPLICATION.TABLE), and the process-wide
// access point to it.
//
// The catalog is filled once from the attribute files (kshatrp) and extended
// at run time by requests that meet tables the files do not describe. Its
// tables are kept in ascending byte order of their qualified names (the
// order of strcmp), which decides which table the walking look-ups find
// first. The catalog owns its tables.
//
// Thread safety: the table map is guarded by the catalog's own lock, so
// look-ups on request threads may run while another thread adds a table.
// A table pointer stays valid until that table is removed (RemoveTable,
// RemoveAttributeFile); removal is for administration, not for serving.
#pragma once

#include <cstddef>
#include <map>
#include <string>

#include "bss1/bss1.h"

class WSQL_Table;

class WSQL_Catalog {
public:
    WSQL_Catalog();
    // Deletes every table.
    virtual ~WSQL_Catalog();
    WSQL_Catalog(const WSQL_Catalog&) = delete;
    WSQL_Catalog& operator=(const WSQL_Catalog&) = delete;

    // The table whose qualified name equals `name` exactly (case-sensitive),
    // or null.
    WSQL_Table* GetTable(const char* name) const;
    // The first table, in catalog order, whose name after the first '.'
    // (the whole name for one without a dot) equals `name` exactly, or null.
    // Walks the catalog: O(number of tables).
    WSQL_Table* GetUnqualifiedTable(const char* name) const;
    // The first table, in catalog order, whose object name equals `name`
    // ignoring case, or null. Walks the catalog.
    WSQL_Table* GetTableByObject(const char* name) const;

    // Inserts `table`. Returns 0 and owns the table from then on; or, with
    // the caller still owning it: 2 for a null table, 6 when a table of that
    // name is already there, 7 when no memory was left, 8 for an unusable
    // catalog.
    [[nodiscard]] int AddTable(WSQL_Table* table);
    // Removes and deletes the table of that qualified name. 0, or 5 when
    // there is none.
    int RemoveTable(const char* name);
    // Removes every table whose attribute file name equals `name` ignoring
    // case. Returns the status of the last removal (0 when none matched).
    int RemoveAttributeFile(const char* name);

    size_t NumTables() const;
    // The first table, in catalog order, whose name sorts after `after`
    // (null: the first table), or null. Walks the catalog without holding
    // its lock between steps: tables added meanwhile are met when they sort
    // later.
    WSQL_Table* NextTable(const char* after) const;

    // Traces every table in catalog order (with its columns when `level` is
    // not 0).
    void Dump(int level) const;

private:
    mutable BSS1_Lock lock_;
    bool usable_ = false;  // false when the lock could not be created: every
                           // look-up then finds nothing and AddTable gives 8
    std::map<std::string, WSQL_Table*> tables_;  // GUARDED_BY(lock_); owning
};

// The process-wide catalog, built from the default attribute directory on
// the first call (concurrent first callers wait for that one build). Never
// null unless memory ran out at the first call; lives until the process
// ends. (Also declared in kshutil.h.)
WSQL_Catalog* WSQL_GetCatalog();
// The one-time initialisation behind WSQL_GetCatalog; `arg` is ignored.
void WSQL_InitCatalog(void* arg);

// The process-wide catalog as it stands, created empty when there is none
// yet; reads no file. For the attribute parser, which fills it; everyone
// else calls WSQL_GetCatalog.
WSQL_Catalog* WSQL_EnsureCatalog();
