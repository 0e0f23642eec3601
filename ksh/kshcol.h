// kshcol: one column of a catalog table, and the enumerated values of a
// column (stored code -> display text).
//
// Columns are created by the attribute file parser (kshatrp) and, at run
// time, by requests that meet a result or filter column the catalog does not
// describe. A column belongs to the table whose column list holds it; the
// list's destructor (destroy_WSQL_Column) deletes it.
#pragma once

#include <atomic>
#include <string>

class LinkedList;

// Longest display or internal text of an enumerated value.
enum : int { WSQL_ENUM_MAX = 79 };

// One enumerated value: vale, the display text, and vali, the internal value
// as the server stores it. Texts are kept to WSQL_ENUM_MAX characters.
class WSQL_Enum {
public:
    // Takes the vale when it is given and not empty (the vali is then
    // ignored), else a non-empty vali; with neither, traces an error and
    // keeps both texts empty. A pair is completed with addVale / addVali.
    WSQL_Enum(const char* vale, const char* vali);
    WSQL_Enum(const WSQL_Enum& other);
    WSQL_Enum& operator=(const WSQL_Enum&) = delete;
    virtual ~WSQL_Enum();

    // Sets the display half (a vale already there is lost, and traced).
    // Returns 0 when the internal half is already set, else traces
    // "vali value missing" and returns 5.
    [[nodiscard]] int addVale(const char* text);
    // Mirror of addVale for the internal half.
    [[nodiscard]] int addVali(const char* text);

    const char* Vale() const { return vale_; }
    const char* Vali() const { return vali_; }

private:
    char vale_[WSQL_ENUM_MAX + 1] = "";
    char vali_[WSQL_ENUM_MAX + 1] = "";
};

// List element destructor: deletes one WSQL_Enum (nothing for null).
void destroy_WSQL_Enum(void* item);

// Type code of a column nothing has typed yet.
enum : int { WSQL_TYPE_UNSET = 2 };

class WSQL_Column {
public:
    // Copies `colName` and `attrName` (null: the column has no attribute
    // name). Type WSQL_TYPE_UNSET, scale 0, no enumerations. Names are kept
    // whole: the attribute file parser cuts the names it reads to their
    // field widths, and a name met at run time must be found again under the
    // same spelling.
    WSQL_Column(const char* colName, const char* attrName, bool hidden);
    // Copies everything, the enumerations into a new list of copies.
    WSQL_Column(const WSQL_Column& other);
    WSQL_Column& operator=(const WSQL_Column&) = delete;
    virtual ~WSQL_Column();

    const char* ColName() const { return colName_.c_str(); }
    // Never null: empty when the column has no attribute name.
    const char* AttrName() const { return attrName_.c_str(); }
    bool HasAttrName() const { return hasAttrName_; }

    // SQL type code (496, 452, 1022, 492, or a server result column's code).
    // Atomic because result writers on several request threads retype a
    // shared catalog column from the result descriptor.
    int GetType() const { return type_.load(std::memory_order_relaxed); }
    void SetType(int code) { type_.store(code, std::memory_order_relaxed); }
    int GetScale() const { return scale_; }
    void SetScale(int n) { scale_ = n; }
    // Hidden columns are left out of generated select lists.
    bool Hidden() const { return hidden_; }

    // True when the column has an enumeration list (even an empty one).
    bool Enumerated() const { return enums_ != nullptr; }
    // The enumeration list (of WSQL_Enum*), or null. Owned by the column.
    LinkedList* Enums() const { return enums_; }
    // Takes ownership of `list` (WSQL_Enum values, destructor
    // destroy_WSQL_Enum; null: no enumerations); a previous list is deleted.
    void SetEnums(LinkedList* list);

    // Display text of the stored value `value`: the vale of the first
    // enumeration whose vali equals `value` ignoring case; otherwise (or
    // without enumerations) `value` itself.
    const char* GetEnumeration(const char* value) const;

    // Traces "--> COLUMN[ATTRIBUTE]".
    void Dump() const;

private:
    std::string colName_;
    std::string attrName_;
    bool hasAttrName_;
    std::atomic<int> type_{WSQL_TYPE_UNSET};
    int scale_ = 0;
    bool hidden_;
    LinkedList* enums_ = nullptr;
};

// List element destructor: deletes one WSQL_Column (nothing for null).
void destroy_WSQL_Column(void* item);
