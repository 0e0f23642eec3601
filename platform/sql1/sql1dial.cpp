// sql1dial: the server dialect -> SQLite translator (see sql1dial.h).
#include "sql1/sql1dial.h"

#include <strings.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "ras1/ras1.h"
#include "sql1/sql1.h"

RAS1_UNIT("sql1dial");

namespace {

enum class Tk { Ident, QIdent, String, Blob, Number, Param, Punct, End };

struct Token {
    Tk kind = Tk::End;
    std::string text;     // raw text (idents, numbers, punctuation, quoted identifiers, blobs)
    std::string value;    // decoded value of a string literal
    std::string space;    // white space (and comments) before the token
    std::string before;   // text emitted before the token (inserted clauses)
    std::string replace;  // when set, emitted instead of the token
    bool replaced = false;
    bool deleted = false;
};

bool ieq(std::string_view a, std::string_view b) {
    return a.size() == b.size() && strncasecmp(a.data(), b.data(), a.size()) == 0;
}

bool identStart(char c) { return std::isalpha(static_cast<unsigned char>(c)) || c == '_'; }
bool identChar(char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_' || c == '$' || c == '#'; }

// Reads a quoted literal whose quote is text[i]; a doubled quote stands for
// one. Returns the index after the closing quote, or npos when unterminated.
size_t readQuoted(const std::string& text, size_t i, std::string* value) {
    char q = text[i++];
    while (i < text.size()) {
        if (text[i] == q) {
            if (i + 1 < text.size() && text[i + 1] == q) {
                value->push_back(q);
                i += 2;
                continue;
            }
            return i + 1;
        }
        value->push_back(text[i++]);
    }
    return std::string::npos;
}

// Skips white space and comments from i, appending them to *space.
size_t skipSpace(const std::string& s, size_t i, std::string* space) {
    while (i < s.size()) {
        if (std::isspace(static_cast<unsigned char>(s[i]))) {
            space->push_back(s[i++]);
        } else if (s.compare(i, 2, "--") == 0) {
            while (i < s.size() && s[i] != '\n') i++;
            space->push_back(' ');
        } else if (s.compare(i, 2, "/*") == 0) {
            size_t e = s.find("*/", i + 2);
            i = e == std::string::npos ? s.size() : e + 2;
            space->push_back(' ');
        } else {
            break;
        }
    }
    return i;
}

const char* const kTwoCharOps[] = {"<=", ">=", "<>", "!=", "==", "||", "<<", ">>"};

// Splits `s` into tokens; the last token is End. 0 or SQL1_ST_SYNTAX.
int tokenize(const std::string& s, std::vector<Token>* out, std::string* error) {
    size_t i = 0;
    for (;;) {
        Token t;
        i = skipSpace(s, i, &t.space);
        if (i >= s.size()) {
            t.kind = Tk::End;
            out->push_back(std::move(t));
            return SQL1_OK;
        }
        char c = s[i];
        char n = i + 1 < s.size() ? s[i + 1] : '\0';
        if ((c == 'N' || c == 'n') && (n == '"' || n == '\'')) {
            t.kind = Tk::String;  // national literal: the store keeps UTF-8 either way
            i = readQuoted(s, i + 1, &t.value);
        } else if ((c == 'X' || c == 'x') && n == '\'') {
            t.kind = Tk::Blob;
            std::string v;
            size_t e = readQuoted(s, i + 1, &v);
            if (e != std::string::npos) t.text = s.substr(i, e - i);
            i = e;
        } else if (c == '"' || c == '\'') {
            t.kind = Tk::String;
            i = readQuoted(s, i, &t.value);
        } else if (identStart(c)) {
            size_t b = i;
            while (i < s.size() && identChar(s[i])) i++;
            t.kind = Tk::Ident;
            t.text = s.substr(b, i - b);
        } else if (std::isdigit(static_cast<unsigned char>(c)) || (c == '.' && std::isdigit(static_cast<unsigned char>(n)))) {
            size_t b = i;
            while (i < s.size() && (std::isalnum(static_cast<unsigned char>(s[i])) || s[i] == '.' ||
                                    ((s[i] == '+' || s[i] == '-') && (s[i - 1] == 'e' || s[i - 1] == 'E')))) {
                i++;
            }
            t.kind = Tk::Number;
            t.text = s.substr(b, i - b);
        } else if (c == '`' || c == '[') {
            char close = c == '`' ? '`' : ']';
            size_t e = s.find(close, i + 1);
            if (e == std::string::npos) {
                i = std::string::npos;
            } else {
                t.kind = Tk::QIdent;
                t.text = s.substr(i, e + 1 - i);
                i = e + 1;
            }
        } else if (c == '?') {
            if (std::isdigit(static_cast<unsigned char>(n))) {
                *error = "numbered parameter markers are not supported";
                return SQL1_ST_SYNTAX;
            }
            t.kind = Tk::Param;
            t.text = "?";
            i++;
        } else if ((c == ':' || c == '@' || c == '$') && identStart(n)) {
            *error = "named parameter markers are not supported";
            return SQL1_ST_SYNTAX;
        } else {
            t.kind = Tk::Punct;
            t.text = std::string(1, c);
            for (const char* op : kTwoCharOps) {
                if (s.compare(i, 2, op) == 0) t.text = op;
            }
            i += t.text.size();
        }
        if (i == std::string::npos) {
            *error = "unterminated literal or quoted name";
            return SQL1_ST_SYNTAX;
        }
        out->push_back(std::move(t));
    }
}

// A table named in the statement, with its AT and HISTORY() clauses.
struct TableRef {
    size_t index;  // token of the (first part of the) name
    int depth;     // parenthesis depth
    const SQL1_DialTable* table;
    bool hasAt = false;
    std::vector<std::string> nodes;
    bool history = false;
};

class Translator {
public:
    Translator(const SQL1_DialDictionary& dict, const std::string& hubNode, SQL1_Translation* out)
        : dict_(dict), hubNode_(hubNode), out_(out) {}

    int run(const char* text);

private:
    const SQL1_DialDictionary& dict_;
    const std::string& hubNode_;
    SQL1_Translation* out_;
    std::vector<Token> t_;
    std::vector<int> depth_;  // parenthesis depth before each token
    std::vector<TableRef> refs_;

    int fail(int rc, const std::string& why) {
        out_->error = why;
        return rc;
    }
    // Token k, or the End token past the end.
    const Token& at(size_t k) const { return k < t_.size() ? t_[k] : t_.back(); }
    bool isPunct(size_t i, const char* p) const { return at(i).kind == Tk::Punct && at(i).text == p; }
    bool isWord(size_t i, const char* w) const { return at(i).kind == Tk::Ident && ieq(at(i).text, w); }
    // Next / previous token that is not deleted (End stops the forward walk).
    size_t next(size_t i) const {
        do { i++; } while (i < t_.size() - 1 && t_[i].deleted);
        return i < t_.size() ? i : t_.size() - 1;
    }
    size_t prev(size_t i) const {
        while (i > 0) {
            i--;
            if (!t_[i].deleted) return i;
        }
        return std::string::npos;
    }
    void computeDepth();
    int statementKind();
    int resolveNames();
    int tableClauses(TableRef* ref, size_t after);
    int collectParmas();
    void removeTerm(size_t first, size_t last);
    int mainTable();
    int routing(const TableRef& ref, const SQL1_DialTable* base);
    bool clauseEnd(size_t i) const;
    void typeMarkers();
    int insertColumns(std::vector<std::string>* columns, size_t* valuesOpen);
    int checkLiterals();
    void actionRecord();
    std::string quote(const std::string& v) const;
    std::string render() const;
};

void Translator::computeDepth() {
    depth_.assign(t_.size(), 0);
    int d = 0;
    for (size_t i = 0; i < t_.size(); i++) {
        if (isPunct(i, ")")) d--;
        depth_[i] = d;
        if (isPunct(i, "(")) d++;
    }
}

int Translator::statementKind() {
    static const struct {
        const char* word;
        SQL1_StmtKind kind;
    } kinds[] = {{"SELECT", SQL1_StmtKind::Select},
                 {"INSERT", SQL1_StmtKind::Insert},
                 {"UPDATE", SQL1_StmtKind::Update},
                 {"DELETE", SQL1_StmtKind::Delete}};
    for (const auto& k : kinds) {
        if (isWord(0, k.word)) {
            out_->kind = k.kind;
            return SQL1_OK;
        }
    }
    return fail(SQL1_ST_DENIED, "only SELECT, INSERT, UPDATE and DELETE statements are accepted");
}

// Replaces A.B table names by the store's quoted name and records each table
// with its AT and HISTORY() clauses; refuses the layer's own names.
int Translator::resolveNames() {
    for (size_t i = 0; i + 1 < t_.size(); i++) {
        Token& tok = t_[i];
        if (tok.deleted || (tok.kind != Tk::Ident && tok.kind != Tk::QIdent)) continue;
        std::string_view name = tok.text;
        if (tok.kind == Tk::QIdent) name = name.substr(1, name.size() - 2);
        auto prefixed = [&](std::string_view p) { return name.size() >= p.size() && ieq(name.substr(0, p.size()), p); };
        if (prefixed("CSIT_") || prefixed("sqlite_") || prefixed("pragma_")) {
            return fail(SQL1_ST_DENIED, "name not accessible: " + std::string(name));
        }
        if (tok.kind != Tk::Ident || !isPunct(i + 1, ".") || at(i + 2).kind != Tk::Ident) continue;
        std::string joined = tok.text + "." + t_[i + 2].text;
        if (ieq(joined, "SYSTEM.PARMA")) continue;  // handled by collectParmas
        const SQL1_DialTable* table = dict_.find(joined);
        if (table == nullptr) continue;
        tok.replace = "\"" + table->name + "\"";
        tok.replaced = true;
        t_[i + 1].deleted = true;
        t_[i + 2].deleted = true;
        TableRef ref{i, depth_[i], table, false, {}, false};
        int rc = tableClauses(&ref, i + 2);
        if (rc != SQL1_OK) return rc;
        refs_.push_back(std::move(ref));
    }
    return SQL1_OK;
}

// Reads `AT ( "n" [, "n"]... )` and `HISTORY ( )` clauses (in any order)
// following a table name ending at token `after`, deleting them.
int Translator::tableClauses(TableRef* ref, size_t after) {
    size_t i = after + 1;
    for (;;) {
        if (isWord(i, "HISTORY") && isPunct(i + 1, "(") && isPunct(i + 2, ")")) {
            if (ref->history) return fail(SQL1_ST_SYNTAX, "HISTORY() given twice");
            ref->history = true;
            for (size_t k = i; k <= i + 2; k++) t_[k].deleted = true;
            i += 3;
        } else if (isWord(i, "AT") && isPunct(i + 1, "(")) {
            if (ref->hasAt) return fail(SQL1_ST_SYNTAX, "AT given twice");
            ref->hasAt = true;
            size_t k = i + 2;
            for (;;) {
                if (at(k).kind != Tk::String) return fail(SQL1_ST_SYNTAX, "AT expects quoted node names");
                ref->nodes.push_back(at(k).value == "*HUB" ? hubNode_ : at(k).value);
                if (isPunct(k + 1, ")")) break;
                if (!isPunct(k + 1, ",")) return fail(SQL1_ST_SYNTAX, "AT list is malformed");
                k += 2;
            }
            for (size_t d = i; d <= k + 1; d++) t_[d].deleted = true;
            i = k + 2;
        } else {
            return SQL1_OK;
        }
    }
}

// Collects SYSTEM.PARMA(name, value, length) terms and removes them.
int Translator::collectParmas() {
    for (size_t i = 0; i + 3 < t_.size(); i++) {
        if (t_[i].deleted || !isWord(i, "SYSTEM") || !isPunct(i + 1, ".") || !isWord(i + 2, "PARMA")) continue;
        // SYSTEM . PARMA ( a , b , c )  -> tokens i .. i+9
        static const char* const shape[] = {"(", nullptr, ",", nullptr, ",", nullptr, ")"};
        std::string args[3];
        for (size_t k = 0; k < 7; k++) {
            const Token& a = t_[std::min(i + 3 + k, t_.size() - 1)];
            if (shape[k] != nullptr) {
                if (a.kind != Tk::Punct || a.text != shape[k]) return fail(SQL1_ST_SYNTAX, "SYSTEM.PARMA term is malformed");
            } else if (a.kind == Tk::String) {
                args[k / 2] = a.value;
            } else if (a.kind == Tk::Ident || a.kind == Tk::Number) {
                args[k / 2] = a.text;
            } else {
                return fail(SQL1_ST_SYNTAX, "SYSTEM.PARMA argument is malformed");
            }
        }
        out_->parmas.emplace_back(args[0], args[1]);
        removeTerm(i, i + 9);
    }
    return SQL1_OK;
}

// Removes tokens first..last (a WHERE term) with one adjacent AND; when the
// term was the whole WHERE clause, the WHERE goes too; otherwise (next to OR
// or inside other syntax) the term becomes 1.
void Translator::removeTerm(size_t first, size_t last) {
    for (size_t k = first; k <= last; k++) t_[k].deleted = true;
    size_t p = prev(first);
    size_t n = next(last);
    if (p != std::string::npos && isWord(p, "AND")) {
        t_[p].deleted = true;
    } else if (isWord(n, "AND")) {
        t_[n].deleted = true;
    } else if (p != std::string::npos && isWord(p, "WHERE") && clauseEnd(n)) {
        t_[p].deleted = true;
    } else {
        t_[first].deleted = false;
        t_[first].replace = "1";
        t_[first].replaced = true;
    }
}

// Is token i the end of a WHERE clause at its depth (end of text, ";", a
// clause keyword, or the ")" closing the enclosing group)?
bool Translator::clauseEnd(size_t i) const {
    static const char* const words[] = {"ORDER", "GROUP", "LIMIT", "HAVING", "UNION", "EXCEPT", "INTERSECT", "WINDOW",
                                        "RETURNING"};
    if (t_[i].kind == Tk::End || isPunct(i, ";") || isPunct(i, ")")) return true;
    for (const char* w : words) {
        if (isWord(i, w)) return true;
    }
    return false;
}

// Applies HISTORY() to every table and AT to the statement's own table (the
// first at depth 0).
int Translator::mainTable() {
    bool first = true;
    for (TableRef& ref : refs_) {
        const SQL1_DialTable* base = ref.table;  // a history table is routed like its table
        if (ref.history) {
            const SQL1_DialTable* hist = ref.table->histTable.empty() ? nullptr : dict_.find(ref.table->histTable);
            if (hist == nullptr) return fail(SQL1_ST_SYNTAX, "table " + ref.table->name + " has no history");
            ref.table = hist;
            t_[ref.index].replace = "\"" + hist->name + "\"";
        }
        bool own = first && ref.depth == 0;
        if (own) {
            out_->table = ref.table;
            first = false;
        }
        if (!ref.hasAt || base->nodeColumn.empty() || out_->kind == SQL1_StmtKind::Insert) continue;
        if (!own) return fail(SQL1_ST_SYNTAX, "AT is supported on the statement's own table only");
        int rc = routing(ref, base);
        if (rc != SQL1_OK) return rc;
    }
    return SQL1_OK;
}

std::string Translator::quote(const std::string& v) const {
    std::string q = "'";
    for (char c : v) {
        q.push_back(c);
        if (c == '\'') q.push_back('\'');
    }
    q.push_back('\'');
    return q;
}

// Limits the rows of the statement's table to the AT nodes.
int Translator::routing(const TableRef& ref, const SQL1_DialTable* base) {
    std::string list;
    for (const std::string& n : ref.nodes) list += (list.empty() ? "" : ",") + quote(n);
    std::string col = "\"" + base->nodeColumn + "\"";
    std::string pred = col + " IN (" + list + ")";
    const SQL1_DialTable* status = dict_.find("O4SRV.INODESTS");
    if (base->viaThru && status != nullptr) {
        pred = "(" + pred + " OR " + col + " IN (SELECT NODE FROM \"" + status->name + "\" WHERE THRUNODE IN (" + list +
               ")))";
    }
    size_t where = std::string::npos;
    size_t end = ref.index + 1;
    for (; end < t_.size(); end++) {
        if (t_[end].deleted || depth_[end] != 0) continue;
        if (where == std::string::npos && isWord(end, "WHERE")) {
            where = end;
            continue;
        }
        if (clauseEnd(end) && !isPunct(end, ")")) break;
    }
    if (end >= t_.size()) end = t_.size() - 1;
    if (where == std::string::npos) {
        t_[end].before = " WHERE " + pred;
    } else {
        t_[where].replace = "WHERE " + pred + " AND (";
        t_[where].replaced = true;
        t_[end].before = ")";
    }
    return SQL1_OK;
}

// For an INSERT: the column list (or the table's columns) and the index of
// the "(" opening the VALUES list (npos when the insert has no VALUES).
int Translator::insertColumns(std::vector<std::string>* columns, size_t* valuesOpen) {
    *valuesOpen = std::string::npos;
    if (out_->table == nullptr) return SQL1_OK;
    size_t i = next(refs_.front().index);
    if (isPunct(i, "(")) {
        for (i = next(i); !isPunct(i, ")"); i = next(i)) {
            if (t_[i].kind == Tk::End) return fail(SQL1_ST_SYNTAX, "INSERT column list is not closed");
            if (t_[i].kind == Tk::Ident) columns->push_back(t_[i].text);
        }
        i = next(i);
    } else {
        for (const SQL1_DialColumn& c : out_->table->columns) columns->push_back(c.name);
    }
    if (isWord(i, "VALUES") && isPunct(next(i), "(")) *valuesOpen = next(i);
    return SQL1_OK;
}

// Gives every ? marker the type of the column it stands for.
void Translator::typeMarkers() {
    static const char* const cmp[] = {"=", "==", "<>", "!=", "<", ">", "<=", ">="};
    std::vector<std::string> insertCols;
    size_t valuesOpen = std::string::npos;
    if (out_->kind == SQL1_StmtKind::Insert) (void)insertColumns(&insertCols, &valuesOpen);
    for (size_t i = 0; i < t_.size(); i++) {
        if (t_[i].deleted || t_[i].kind != Tk::Param) continue;
        std::string column;
        size_t p = prev(i);
        size_t n = next(i);
        auto isCmp = [&](size_t k) {
            if (k == std::string::npos) return false;
            for (const char* c : cmp) {
                if (isPunct(k, c)) return true;
            }
            return isWord(k, "LIKE") || isWord(k, "GLOB");
        };
        if (isCmp(p) && prev(p) != std::string::npos && t_[prev(p)].kind == Tk::Ident) {
            column = t_[prev(p)].text;
        } else if (isCmp(n) && t_[next(n)].kind == Tk::Ident) {
            column = t_[next(n)].text;
        } else if (valuesOpen != std::string::npos && i > valuesOpen && depth_[i] == depth_[valuesOpen] + 1) {
            size_t item = 0;
            for (size_t k = next(valuesOpen); k < i; k = next(k)) {
                if (isPunct(k, ",") && depth_[k] == depth_[i]) item++;
            }
            if (item < insertCols.size()) column = insertCols[item];
        }
        const SQL1_DialColumn* c = out_->table != nullptr && !column.empty() ? out_->table->column(column) : nullptr;
        if (c != nullptr) {
            out_->markers.push_back({c->name, c->type, c->maxLength});
        } else {
            out_->markers.push_back({column, SQL1_T_VARCHAR, 256});
        }
    }
}

// Refuses literals longer than the character column they go into.
int Translator::checkLiterals() {
    if (out_->table == nullptr) return SQL1_OK;
    auto check = [&](const std::string& column, size_t k) -> int {
        const SQL1_DialColumn* c = out_->table->column(column);
        const Token& v = t_[k];
        if (c == nullptr || !SQL1_IsCharType(c->type) || (v.kind != Tk::String && v.kind != Tk::Number)) return SQL1_OK;
        size_t len = v.kind == Tk::String ? v.value.size() : v.text.size();
        if (len <= c->maxLength) return SQL1_OK;
        return fail(SQL1_ST_TOOLONG, "value of " + std::to_string(len) + " bytes for column " + c->name + " of " +
                                         std::to_string(c->maxLength));
    };
    if (out_->kind == SQL1_StmtKind::Insert) {
        std::vector<std::string> cols;
        size_t open = std::string::npos;
        int rc = insertColumns(&cols, &open);
        if (rc != SQL1_OK || open == std::string::npos) return rc;
        size_t item = 0;
        size_t start = next(open);
        for (size_t k = start; t_[k].kind != Tk::End; k = next(k)) {
            bool close = isPunct(k, ")") && depth_[k] == depth_[open];
            bool comma = isPunct(k, ",") && depth_[k] == depth_[open] + 1;
            if (!close && !comma) continue;
            // the item spans start .. k-1; only a single literal is checked
            if (start != k && next(start) == k && item < cols.size() && (rc = check(cols[item], start)) != SQL1_OK) {
                return rc;
            }
            item++;
            start = next(k);
            if (close) break;
        }
    } else if (out_->kind == SQL1_StmtKind::Update) {
        for (size_t k = 0; k + 2 < t_.size(); k++) {
            if (t_[k].deleted || depth_[k] != 0 || t_[k].kind != Tk::Ident) continue;
            size_t eq = next(k);
            size_t v = next(eq);
            size_t after = next(v);
            size_t before = prev(k);
            bool assign = before != std::string::npos && (isWord(before, "SET") || isPunct(before, ","));
            if (assign && isPunct(eq, "=") && (isPunct(after, ",") || isWord(after, "WHERE") || clauseEnd(after))) {
                int rc = check(t_[k].text, v);
                if (rc != SQL1_OK) return rc;
            }
            if (isWord(k, "WHERE")) break;
        }
    }
    return SQL1_OK;
}

// For a SELECT on an action table: INSERT INTO table (c...) VALUES (v...)
// from WHERE c = v AND ... (nothing when the clause has another shape).
void Translator::actionRecord() {
    if (out_->kind != SQL1_StmtKind::Select || out_->table == nullptr || out_->table->actionColumn.empty()) return;
    size_t where = std::string::npos;
    for (size_t k = refs_.front().index + 1; k < t_.size() && where == std::string::npos; k++) {
        if (!t_[k].deleted && depth_[k] == 0 && isWord(k, "WHERE")) where = k;
    }
    if (where == std::string::npos) return;
    std::string cols, vals;
    size_t markers = 0;
    bool command = false;
    for (size_t k = next(where);; k = next(k)) {
        size_t eq = next(k), v = next(eq), after = next(v);
        const Token& val = t_[v];
        const SQL1_DialColumn* c = t_[k].kind == Tk::Ident ? out_->table->column(t_[k].text) : nullptr;
        bool isValue = val.kind == Tk::String || val.kind == Tk::Number || val.kind == Tk::Param;
        if (c == nullptr || !isPunct(eq, "=") || !isValue) return;
        cols += (cols.empty() ? "" : ", ") + c->name;
        vals += (vals.empty() ? "" : ", ") + (val.kind == Tk::String ? quote(val.value) : val.text);
        if (val.kind == Tk::Param) markers++;
        if (ieq(c->name, out_->table->actionColumn)) command = true;
        if (clauseEnd(after)) break;
        if (!isWord(after, "AND")) return;
        k = after;
    }
    if (!command || markers != out_->markers.size()) return;  // no command, or markers elsewhere
    out_->record = "INSERT INTO \"" + out_->table->name + "\" (" + cols + ") VALUES (" + vals + ")";
}

std::string Translator::render() const {
    std::string s;
    for (const Token& tok : t_) {
        s += tok.before;
        if (tok.deleted) continue;
        s += tok.space;
        if (tok.replaced || !tok.replace.empty()) {
            s += tok.replace;
        } else if (tok.kind == Tk::String) {
            s += quote(tok.value);
        } else {
            s += tok.text;
        }
    }
    return s;
}

int Translator::run(const char* text) {
    int rc = tokenize(text, &t_, &out_->error);
    if (rc != SQL1_OK) return rc;
    computeDepth();
    rc = statementKind();
    for (size_t i = 0; rc == SQL1_OK && i + 1 < t_.size(); i++) {
        if (isPunct(i, ";") && t_[i + 1].kind != Tk::End) rc = fail(SQL1_ST_SYNTAX, "one statement at a time");
    }
    if (rc == SQL1_OK) rc = resolveNames();
    if (rc == SQL1_OK) rc = collectParmas();
    if (rc == SQL1_OK) rc = mainTable();
    if (rc == SQL1_OK) rc = checkLiterals();
    if (rc == SQL1_OK) {
        typeMarkers();
        actionRecord();
        out_->sql = render();
    }
    return rc;
}

}  // namespace

const SQL1_DialColumn* SQL1_DialTable::column(std::string_view columnName) const {
    for (const SQL1_DialColumn& c : columns) {
        if (ieq(c.name, columnName)) return &c;
    }
    return nullptr;
}

int SQL1_Translate(const char* text, const SQL1_DialDictionary& dict, const std::string& hubNode,
                   SQL1_Translation* out) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    *out = SQL1_Translation{};
    int rc = SQL1_ST_BADARG;
    if (text != nullptr) {
        Translator tr(dict, hubNode, out);
        rc = tr.run(text);
    }
    if (rc != SQL1_OK && (ras & RAS1_STATE)) RAS1_Printf(RAS1_THIS, __LINE__, "translation failed %d: %s", rc, out->error.c_str());
    if (rc == SQL1_OK && (ras & RAS1_STATE)) RAS1_Printf(RAS1_THIS, __LINE__, "translated: %s", out->sql.c_str());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

bool SQL1_IsCharType(int16_t type) {
    return type == SQL1_T_VARCHAR || type == SQL1_T_CHAR || type == SQL1_T_NVARCHAR || type == SQL1_T_NCHAR ||
           type == SQL1_T_DECIMAL;
}

void SQL1_TypeFromDecl(const char* decl, uint16_t dfltLength, int16_t* type, uint16_t* maxLength) {
    // Longest names first where one is a prefix of another (NVARCHAR / NCHAR).
    static const struct {
        const char* name;
        int16_t type;
        uint16_t size;  // fixed size; 0: the declared (n)
    } table[] = {
        {"NVARCHAR", SQL1_T_NVARCHAR, 0}, {"NCHAR", SQL1_T_NCHAR, 0},       {"VARCHAR", SQL1_T_VARCHAR, 0},
        {"CHARACTER", SQL1_T_CHAR, 0},    {"CHAR", SQL1_T_CHAR, 0},         {"USMALLINT", SQL1_T_USMALLINT, 2},
        {"SMALLINT", SQL1_T_SMALLINT, 2}, {"UINTEGER", SQL1_T_UINTEGER, 4}, {"UBIGINT", SQL1_T_UBIGINT, 8},
        {"BIGINT", SQL1_T_BIGINT, 8},     {"INTEGER", SQL1_T_INTEGER, 4},   {"INT", SQL1_T_INTEGER, 4},
        {"DOUBLE", SQL1_T_DOUBLE, 8},     {"REAL", SQL1_T_DOUBLE, 8},       {"FLOAT", SQL1_T_DOUBLE, 8},
        {"DECIMAL", SQL1_T_DECIMAL, 0},   {"NUMERIC", SQL1_T_DECIMAL, 0},   {"BLOB", SQL1_T_BINARY, 0},
    };
    *type = SQL1_T_VARCHAR;
    *maxLength = dfltLength;
    if (decl == nullptr) return;
    while (std::isspace(static_cast<unsigned char>(*decl))) decl++;
    for (const auto& e : table) {
        size_t n = std::strlen(e.name);
        if (strncasecmp(decl, e.name, n) != 0 || identChar(decl[n])) continue;
        *type = e.type;
        if (e.size != 0) {
            *maxLength = e.size;
            return;
        }
        const char* p = std::strchr(decl + n, '(');
        long len = p != nullptr ? std::strtol(p + 1, nullptr, 10) : 0;
        if (e.type == SQL1_T_DECIMAL) len = (len > 0 ? len : 15) + 2;  // digits, sign, point
        if (len <= 0) len = e.type == SQL1_T_CHAR || e.type == SQL1_T_NCHAR ? 1 : dfltLength;
        *maxLength = static_cast<uint16_t>(len > 65535 ? 65535 : len);
        return;
    }
}
