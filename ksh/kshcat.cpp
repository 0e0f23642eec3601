// kshcat: the attribute catalog and the process-wide access point to it.
#include "kshcat.h"

#include <atomic>
#include <cstring>
#include <new>
#include <vector>

#include "kshatrp.h"
#include "kshtab.h"
#include "kshutil.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshcat");

namespace {

// Holds the catalog's lock for one scope.
class Hold {
public:
    explicit Hold(BSS1_Lock* lock) : lock_(lock) { BSS1_GetLock(lock_); }
    ~Hold() { BSS1_ReleaseLock(lock_); }
    Hold(const Hold&) = delete;
    Hold& operator=(const Hold&) = delete;

private:
    BSS1_Lock* lock_;
};

}  // namespace

WSQL_Catalog::WSQL_Catalog() {
    int stc = BSS1_InitializeLock(&lock_);
    usable_ = stc == 0;
    if (!usable_) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to create tree stc=%d", stc);
}

WSQL_Catalog::~WSQL_Catalog() {
    for (auto& entry : tables_) delete entry.second;
    if (usable_) BSS1_DestroyLock(&lock_);
}

WSQL_Table* WSQL_Catalog::GetTable(const char* name) const {
    if (!usable_ || !name) return nullptr;
    Hold hold(&lock_);
    auto it = tables_.find(name);
    return it == tables_.end() ? nullptr : it->second;
}

WSQL_Table* WSQL_Catalog::GetUnqualifiedTable(const char* name) const {
    if (!usable_ || !name) return nullptr;
    Hold hold(&lock_);
    for (const auto& entry : tables_)
        if (strcmp(entry.second->UnqualifiedTableName(), name) == 0) return entry.second;
    return nullptr;
}

WSQL_Table* WSQL_Catalog::GetTableByObject(const char* name) const {
    if (!usable_ || !name) return nullptr;
    Hold hold(&lock_);
    for (const auto& entry : tables_)
        if (WSQL_CaseCompare(entry.second->ObjectName(), name) == 0) return entry.second;
    return nullptr;
}

int WSQL_Catalog::AddTable(WSQL_Table* table) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!table) return 2;
    if (!usable_) return 8;
    int rc = 0;
    {
        Hold hold(&lock_);
        try {
            rc = tables_.emplace(table->TableName(), table).second ? 0 : 6;
        } catch (const std::bad_alloc&) {
            rc = 7;
        }
    }
    if (ras & RAS1_CATALOG)
        RAS1_Printf(RAS1_THIS, __LINE__, "AddTable %s[%s] st=%d", table->TableName(), table->ObjectName(), rc);
    return rc;
}

int WSQL_Catalog::RemoveTable(const char* name) {
    if (!usable_ || !name) return 5;
    WSQL_Table* gone = nullptr;
    {
        Hold hold(&lock_);
        auto it = tables_.find(name);
        if (it == tables_.end()) return 5;
        gone = it->second;
        tables_.erase(it);
    }
    delete gone;
    return 0;
}

int WSQL_Catalog::RemoveAttributeFile(const char* name) {
    if (!usable_ || !name) return 0;
    // Collect first, remove afterwards: erasing while walking the map would
    // invalidate the walk.
    std::vector<std::string> names;
    {
        Hold hold(&lock_);
        for (const auto& entry : tables_)
            if (WSQL_CaseCompare(entry.second->AttributeFilename(), name) == 0) names.push_back(entry.first);
    }
    int rc = 0;
    for (const auto& n : names) rc = RemoveTable(n.c_str());
    return rc;
}

size_t WSQL_Catalog::NumTables() const {
    if (!usable_) return 0;
    Hold hold(&lock_);
    return tables_.size();
}

WSQL_Table* WSQL_Catalog::NextTable(const char* after) const {
    if (!usable_) return nullptr;
    Hold hold(&lock_);
    auto it = after ? tables_.upper_bound(after) : tables_.begin();
    return it == tables_.end() ? nullptr : it->second;
}

void WSQL_Catalog::Dump(int level) const {
    if (!usable_) return;
    Hold hold(&lock_);
    for (const auto& entry : tables_) entry.second->Dump(level);
}

// ---- process-wide access point ----------------------------------------

namespace {
std::atomic<WSQL_Catalog*> theCatalog{nullptr};
BSS1_Once catalogOnce;
}  // namespace

WSQL_Catalog* WSQL_EnsureCatalog() {
    WSQL_Catalog* cat = theCatalog.load(std::memory_order_acquire);
    if (cat) return cat;
    auto* fresh = new WSQL_Catalog;
    if (theCatalog.compare_exchange_strong(cat, fresh, std::memory_order_acq_rel)) return fresh;
    delete fresh;  // another thread stored one first
    return cat;
}

void WSQL_InitCatalog(void*) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (!theCatalog.load(std::memory_order_acquire)) {
        WSQL_AttrParser parser;
        int rc = PFM1_Guard("WSQL_InitCatalog", [&] { return parser.parseDir(nullptr); });
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Catalog read, st=%d", rc);
    }
    // The parser stores the catalog even when no file was read; a fault
    // before that point still leaves an (empty) catalog.
    PFM1_Guard("WSQL_InitCatalog", [] {
        WSQL_EnsureCatalog();
        return 0;
    });
    RAS1_EXIT(ras);
}

WSQL_Catalog* WSQL_GetCatalog() {
    if (!BSS1_OnceDone(&catalogOnce)) BSS1_InitializeOnce(&catalogOnce, WSQL_InitCatalog, nullptr);
    return theCatalog.load(std::memory_order_acquire);
}
