// kshtab: catalog tables and their column lists.
#include "kshtab.h"

#include <cstring>

#include "kshcol.h"
#include "kshlst.h"
#include "kshutil.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshtab");

WSQL_Table::WSQL_Table(const char* tableName, const char* objectName, const char* attrFile)
    : tableName_(tableName ? tableName : ""),
      objectName_(objectName && *objectName ? objectName : tableName_),
      attrFile_(attrFile ? attrFile : ""),
      columns_(new LinkedList(destroy_WSQL_Column)) {}

WSQL_Table::WSQL_Table(const WSQL_Table& other)
    : tableName_(other.tableName_),
      objectName_(other.objectName_),
      attrFile_(other.attrFile_),
      columns_(new LinkedList(destroy_WSQL_Column)),
      dynamic_(other.dynamicAdd()) {
    LinkedListIter it(other.columns_);
    while (auto* c = static_cast<WSQL_Column*>(it.Next())) {
        auto* copy = new WSQL_Column(*c);
        if (columns_->AppendEntry(copy) != 0) delete copy;
    }
}

WSQL_Table::~WSQL_Table() { delete columns_; }

const char* WSQL_Table::UnqualifiedTableName() const {
    const char* name = tableName_.c_str();
    const char* dot = strchr(name, '.');
    return dot ? dot + 1 : name;
}

int WSQL_Table::AppendColumn(WSQL_Column* column) { return columns_->AppendEntry(column); }

int WSQL_Table::InsertColumn(WSQL_Column* column) { return columns_->AddEntry(column); }

WSQL_Column* WSQL_Table::GetColumn(const char* name) const {
    if (!name) return nullptr;
    LinkedListIter it(columns_);
    while (auto* c = static_cast<WSQL_Column*>(it.Next()))
        if (WSQL_CaseCompare(c->ColName(), name) == 0) return c;
    return nullptr;
}

WSQL_Column* WSQL_Table::GetAttr(const char* name) const {
    if (!name) return nullptr;
    LinkedListIter it(columns_);
    while (auto* c = static_cast<WSQL_Column*>(it.Next()))
        if (c->HasAttrName() && WSQL_CaseCompare(c->AttrName(), name) == 0) return c;
    return nullptr;
}

void WSQL_Table::Dump(int level) const {
    RAS1_Printf(RAS1_THIS, __LINE__, "Table: %s[%s]", tableName_.c_str(), objectName_.c_str());
    if (level == 0) return;
    LinkedListIter it(columns_);
    while (auto* c = static_cast<WSQL_Column*>(it.Next())) c->Dump();
}
