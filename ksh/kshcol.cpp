// kshcol: catalog columns and their enumerated values.
#include "kshcol.h"

#include <cstdio>
#include <cstring>

#include "kshlst.h"
#include "kshutil.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshcol");

namespace {

// Copies at most WSQL_ENUM_MAX characters of `text` into a WSQL_ENUM_MAX+1
// field.
void setText(char* field, const char* text) {
    snprintf(field, WSQL_ENUM_MAX + 1, "%.*s", (int)WSQL_ENUM_MAX, text ? text : "");
}

}  // namespace

WSQL_Enum::WSQL_Enum(const char* vale, const char* vali) {
    if (vale && *vale)
        setText(vale_, vale);
    else if (vali && *vali)
        setText(vali_, vali);
    else if (RAS1_Sync(RAS1_THIS) & RAS1_ERROR)
        RAS1_Printf(RAS1_THIS, __LINE__, "Error: null or empty parms passed to constructor");
}

WSQL_Enum::WSQL_Enum(const WSQL_Enum& other) {
    memcpy(vale_, other.vale_, sizeof vale_);
    memcpy(vali_, other.vali_, sizeof vali_);
}

WSQL_Enum::~WSQL_Enum() = default;

int WSQL_Enum::addVale(const char* text) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (vale_[0] && (ras & RAS1_ERROR)) RAS1_Printf(RAS1_THIS, __LINE__, "Error: vale value lost: %s", vale_);
    setText(vale_, text);
    if (vali_[0]) return 0;
    if (ras & RAS1_ERROR) RAS1_Printf(RAS1_THIS, __LINE__, "Error: vali value missing");
    return 5;
}

int WSQL_Enum::addVali(const char* text) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (vali_[0] && (ras & RAS1_ERROR)) RAS1_Printf(RAS1_THIS, __LINE__, "Error: vali value lost: %s", vali_);
    setText(vali_, text);
    if (vale_[0]) return 0;
    if (ras & RAS1_ERROR) RAS1_Printf(RAS1_THIS, __LINE__, "Error: vale value missing");
    return 5;
}

void destroy_WSQL_Enum(void* item) { delete static_cast<WSQL_Enum*>(item); }

WSQL_Column::WSQL_Column(const char* colName, const char* attrName, bool hidden)
    : colName_(colName ? colName : ""),
      attrName_(attrName ? attrName : ""),
      hasAttrName_(attrName != nullptr),
      hidden_(hidden) {}

WSQL_Column::WSQL_Column(const WSQL_Column& other)
    : colName_(other.colName_),
      attrName_(other.attrName_),
      hasAttrName_(other.hasAttrName_),
      type_(other.GetType()),
      scale_(other.scale_),
      hidden_(other.hidden_) {
    if (!other.enums_) return;
    enums_ = new LinkedList(destroy_WSQL_Enum);
    LinkedListIter it(other.enums_);
    while (auto* e = static_cast<WSQL_Enum*>(it.Next())) {
        auto* copy = new WSQL_Enum(*e);
        if (enums_->AppendEntry(copy) != 0) delete copy;
    }
}

WSQL_Column::~WSQL_Column() { delete enums_; }

void WSQL_Column::SetEnums(LinkedList* list) {
    if (list == enums_) return;
    delete enums_;
    enums_ = list;
}

const char* WSQL_Column::GetEnumeration(const char* value) const {
    if (!enums_ || !value) return value;
    LinkedListIter it(enums_);
    while (auto* e = static_cast<WSQL_Enum*>(it.Next()))
        if (WSQL_CaseCompare(e->Vali(), value) == 0) return e->Vale();
    return value;
}

void WSQL_Column::Dump() const {
    RAS1_Printf(RAS1_THIS, __LINE__, "--> %s[%s]", colName_.c_str(), attrName_.c_str());
}

void destroy_WSQL_Column(void* item) { delete static_cast<WSQL_Column*>(item); }
