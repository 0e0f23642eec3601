// kshtab: one table of the attribute catalog: its qualified name
// (APPLICATION.TABLE), the attribute group (object) name users know it by,
// the attribute file it came from, and its columns in file order.
//
// A table belongs to the catalog once WSQL_Catalog::AddTable accepted it;
// deleting it deletes its columns. A historical copy made by a request
// (copy constructor) belongs to that request.
#pragma once

#include <atomic>
#include <string>

class LinkedList;
class WSQL_Column;

class WSQL_Table {
public:
    // Copies the three texts (null reads as empty); an empty object name
    // makes the object name the table name. No columns, not dynamic.
    // Names are kept whole (see WSQL_Column).
    WSQL_Table(const char* tableName, const char* objectName, const char* attrFile);
    // Copies the names, the attribute file name and the dynamic flag, and
    // appends a copy of every column in order.
    WSQL_Table(const WSQL_Table& other);
    WSQL_Table& operator=(const WSQL_Table&) = delete;
    virtual ~WSQL_Table();

    const char* TableName() const { return tableName_.c_str(); }
    const char* ObjectName() const { return objectName_.c_str(); }
    const char* AttributeFilename() const { return attrFile_.c_str(); }
    // Text after the first '.' of the table name, or the whole name.
    const char* UnqualifiedTableName() const;
    // The columns (WSQL_Column*), in order; owned by the table. Walk it with
    // a LinkedListIter: the list has its own lock, so columns appended by
    // another thread during a walk do no harm.
    LinkedList* Columns() const { return columns_; }

    // True when the table was created at run time by a request.
    bool dynamicAdd() const { return dynamic_.load(std::memory_order_relaxed); }
    void setDynamic(bool flag) { dynamic_.store(flag, std::memory_order_relaxed); }

    // Add `column` at the end / at the front. On 0 the table owns it; on
    // failure (2, list full or no memory) the caller keeps it.
    [[nodiscard]] int AppendColumn(WSQL_Column* column);
    [[nodiscard]] int InsertColumn(WSQL_Column* column);

    // First column whose column name / attribute name equals `name`
    // ignoring case, or null. The column stays owned by the table.
    WSQL_Column* GetColumn(const char* name) const;
    WSQL_Column* GetAttr(const char* name) const;

    // Traces "Table: NAME[OBJECT]" and, when `level` is not 0, each column.
    void Dump(int level) const;

private:
    std::string tableName_;
    std::string objectName_;
    std::string attrFile_;
    LinkedList* columns_;
    std::atomic<bool> dynamic_{false};
};
