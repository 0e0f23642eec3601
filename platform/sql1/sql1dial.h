// sql1dial: translation of the server's SQL dialect into the SQLite form the
// hub store runs. Internal to the sql1 layer (and its tests).
//
// The translator is a tokenizer plus a few passes over the token list:
//   - "text", N"text", 'text' and N'text' become SQLite string literals
//     ('text', quotes doubled); x'..' blobs stay;
//   - A.B naming a store table becomes the quoted identifier "A.B";
//   - `AT ("n1", ...)` after a table is removed; on the statement's own table,
//     when that table has a node column, it becomes a predicate limiting the
//     rows to those nodes ("*HUB" stands for the hub's node);
//   - `HISTORY()` after a table is removed and the table replaced by its
//     history table;
//   - SYSTEM.PARMA(name, value, length) terms are collected and removed from
//     the WHERE clause together with one adjacent AND (a term that cannot be
//     removed that way becomes the always-true 1);
//   - each ? marker is given the type and length of the column it is
//     compared with, assigned to or inserted into;
//   - a literal inserted into or assigned to a character column longer than
//     the column's declared length is refused.
// Only SELECT, INSERT, UPDATE and DELETE are accepted, and names beginning
// CSIT_ or sqlite_ (the layer's own tables) are refused.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

struct SQL1_DialColumn {
    std::string name;
    int16_t type;
    uint16_t maxLength;
};

struct SQL1_DialTable {
    std::string name;        // canonical name, e.g. "O4SRV.TSITDESC"
    std::string nodeColumn;  // column AT compares with; empty: AT does not limit rows
    bool viaThru = false;    // AT also takes rows of nodes reached through a named node
    std::string histTable;   // table HISTORY() reads; empty: none
    std::vector<SQL1_DialColumn> columns;
    std::string actionColumn;  // action table: its command column (a SELECT naming a command records it)
    // The column of that name (without regard to case), or null.
    const SQL1_DialColumn* column(std::string_view columnName) const;
};

// The tables a translation may name.
class SQL1_DialDictionary {
public:
    virtual ~SQL1_DialDictionary() = default;
    // The table of that name (without regard to case), or null.
    virtual const SQL1_DialTable* find(std::string_view tableName) const = 0;
};

enum class SQL1_StmtKind { Select, Insert, Update, Delete };

struct SQL1_Marker {
    std::string column;  // the column the marker stands for; empty when unknown
    int16_t type;
    uint16_t maxLength;
};

struct SQL1_Translation {
    SQL1_StmtKind kind = SQL1_StmtKind::Select;
    std::string sql;                                          // the SQLite text
    std::vector<std::pair<std::string, std::string>> parmas;  // SYSTEM.PARMA name, value
    std::vector<SQL1_Marker> markers;                         // one per ?, in order
    const SQL1_DialTable* table = nullptr;                    // the statement's own table
    std::string record;  // SELECT on an action table: the INSERT recording the command's
                         // COLUMN = value terms (its markers are the SELECT's, in order)
    std::string error;                                        // why translation failed
};

// Translates `text`. Returns 0, SQL1_ST_SYNTAX (malformed text),
// SQL1_ST_DENIED (statement kind or name not allowed) or SQL1_ST_TOOLONG (a
// literal longer than its column); `out->error` then says why.
[[nodiscard]] int SQL1_Translate(const char* text, const SQL1_DialDictionary& dict, const std::string& hubNode,
                                 SQL1_Translation* out);

// Type code and maximum length for a declared column type ("VARCHAR(32)" ->
// 448/32, "INTEGER" -> 496/4, ...). Unknown or empty declarations give
// 448 with `dfltLength`.
void SQL1_TypeFromDecl(const char* decl, uint16_t dfltLength, int16_t* type, uint16_t* maxLength);

// Is `type` one of the character types (448, 452, 1018, 1022, 484)?
bool SQL1_IsCharType(int16_t type);
