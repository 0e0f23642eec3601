// Fuzz target: the SQL dialect translator. Arbitrary text must never crash
// the translator, and a text it accepts must come out as exactly one SQLite
// statement: whatever a client writes into literals, the translation never
// carries a second statement past the first.
#include <sqlite3.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <string>

#include "sql1/sql1.h"
#include "sql1/sql1dial.h"

namespace {

class Dict : public SQL1_DialDictionary {
public:
    Dict() {
        add({"O4SRV.TSITDESC", "", false, "", {{"SITNAME", 452, 32}, {"TEXT", 1018, 64}, {"PDT", 1018, 200}}, ""});
        add({"O4SRV.TOBJACCL", "", false, "", {{"OBJNAME", 452, 32}, {"NODEL", 452, 32}}, ""});
        add({"ZAG.CPU", "ORIGINNODE", true, "ZAG.CPU_HIST",
             {{"ORIGINNODE", 452, 32}, {"CPUID", 500, 2}, {"BUSYPCT", 496, 4}}, ""});
        add({"ZAG.CPU_HIST", "", false, "",
             {{"WRITETIME", 452, 16}, {"ORIGINNODE", 452, 32}, {"CPUID", 500, 2}, {"BUSYPCT", 496, 4}}, ""});
        add({"O4SRV.CLACTLCL", "", false, "", {{"ACTSECURE", 452, 10}, {"CLCMD", 448, 200}}, "CLCMD"});
    }
    const SQL1_DialTable* find(std::string_view name) const override {
        std::string u(name);
        for (char& c : u) c = static_cast<char>(toupper(static_cast<unsigned char>(c)));
        auto it = tables_.find(u);
        return it == tables_.end() ? nullptr : &it->second;
    }
    const std::map<std::string, SQL1_DialTable>& tables() const { return tables_; }

private:
    void add(SQL1_DialTable t) { tables_[t.name] = std::move(t); }
    std::map<std::string, SQL1_DialTable> tables_;
};

const Dict& dict() {
    static Dict d;
    return d;
}

// An in-memory database holding the dictionary's tables, to prepare the
// translations against.
sqlite3* database() {
    static sqlite3* db = [] {
        sqlite3* h = nullptr;
        if (sqlite3_open(":memory:", &h) != SQLITE_OK) abort();
        for (const auto& [name, table] : dict().tables()) {
            std::string ddl = "CREATE TABLE \"" + name + "\" (";
            for (size_t i = 0; i < table.columns.size(); i++)
                ddl += (i ? ", " : "") + table.columns[i].name + " TEXT";
            ddl += ")";
            if (sqlite3_exec(h, ddl.c_str(), nullptr, nullptr, nullptr) != SQLITE_OK) abort();
        }
        return h;
    }();
    return db;
}

bool onlyBlanks(const char* s) {
    for (; *s; s++)
        if (*s != ' ' && *s != '\t' && *s != '\n' && *s != '\r' && *s != ';') return false;
    return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    std::string text(reinterpret_cast<const char*>(data), size);
    if (text.find('\0') != std::string::npos) return 0;  // the dialect is NUL-terminated text
    SQL1_Translation tr;
    if (SQL1_Translate(text.c_str(), dict(), "HUB_X", &tr) != SQL1_OK) return 0;
    sqlite3_stmt* stmt = nullptr;
    const char* tail = nullptr;
    if (sqlite3_prepare_v2(database(), tr.sql.c_str(), -1, &stmt, &tail) == SQLITE_OK) {
        if (tail && !onlyBlanks(tail)) {
            fprintf(stderr, "translation carries a second statement:\n  in:  %s\n  out: %s\n", text.c_str(),
                    tr.sql.c_str());
            abort();
        }
    }
    sqlite3_finalize(stmt);
    return 0;
}
