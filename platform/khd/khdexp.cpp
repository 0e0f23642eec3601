// khdexp: KHD_ExportHistory, snapshot records into a warehouse table
// through the SQL client layer (see khd.h).
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "khd/khd.h"
#include "ras1/ras1.h"
#include "sql1/sql1.h"

RAS1_UNIT("khdexp");

namespace {

constexpr size_t kMaxFields = 16;
constexpr size_t kMaxHeader = 4096;
constexpr size_t kMaxRecord = 1u << 20;
const char kDefaultTable[] = "WAREHOUSE.SNAPSHOT";
const char kLocalServer[] = "CT/DS:{}";

struct Field {
    std::string column;
    size_t offset;
    size_t length;
};

bool plainName(const std::string& s, bool dotted) {
    if (s.empty() || !(isalpha(static_cast<unsigned char>(s[0])) || s[0] == '_')) return false;
    for (unsigned char c : s)
        if (!(isalnum(c) || c == '_' || (dotted && c == '.'))) return false;
    return true;
}

// One "NAME(char,OFFSET,LENGTH)" item.
bool parseField(const std::string& item, Field* f) {
    size_t open = item.find('(');
    if (open == std::string::npos || item.back() != ')') return false;
    std::string name = item.substr(0, open);
    std::string shape = item.substr(open + 1, item.size() - open - 2);
    size_t dot = name.rfind('.');
    f->column = dot == std::string::npos ? name : name.substr(dot + 1);
    unsigned long off = 0, len = 0;
    char type[8] = {};
    int used = 0;
    if (sscanf(shape.c_str(), "%7[a-z],%lu,%lu%n", type, &off, &len, &used) != 3 ||
        static_cast<size_t>(used) != shape.size() || strcmp(type, "char") != 0)
        return false;
    f->offset = off;
    f->length = len;
    return plainName(f->column, false) && len > 0 && off < kMaxRecord && len <= 0xFFFF && off + len <= kMaxRecord;
}

int readHeader(const std::string& name, std::vector<Field>* fields, size_t* recordLength) {
    FILE* f = fopen(name.c_str(), "r");
    if (f == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open header \"%s\" - %d", name.c_str(), errno);
        return KHD_FAILED;
    }
    char buf[kMaxHeader + 1];
    size_t n = fread(buf, 1, kMaxHeader, f);
    bool tooLong = n == kMaxHeader && fgetc(f) != EOF;
    fclose(f);
    buf[n] = '\0';
    while (n > 0 && (buf[n - 1] == '\n' || buf[n - 1] == '\r')) buf[--n] = '\0';
    int rc = tooLong || n == 0 ? KHD_BADARG : KHD_OK;
    *recordLength = 0;
    for (const char* p = buf; rc == KHD_OK && *p != '\0';) {
        const char* tab = strchr(p, '\t');
        std::string item(p, tab != nullptr ? static_cast<size_t>(tab - p) : strlen(p));
        Field fld{};
        if (fields->size() >= kMaxFields || !parseField(item, &fld)) {
            rc = KHD_BADARG;
        } else {
            fields->push_back(fld);
            if (fld.offset + fld.length > *recordLength) *recordLength = fld.offset + fld.length;
        }
        p = tab != nullptr ? tab + 1 : p + item.size();
    }
    if (rc != KHD_OK) RAS1_Printf(RAS1_THIS, __LINE__, "Malformed header \"%s\"", name.c_str());
    return rc;
}

// The records of the data file; a trailing partial record fails.
int readRecords(const char* name, size_t recordLength, std::string* data) {
    FILE* f = fopen(name, "rb");
    if (f == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open \"%s\" - %d", name, errno);
        return KHD_FAILED;
    }
    char buf[8192];
    for (size_t n; (n = fread(buf, 1, sizeof buf, f)) > 0;) data->append(buf, n);
    bool bad = ferror(f) != 0;
    fclose(f);
    if (bad || data->size() % recordLength != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "\"%s\" holds %zu bytes, not whole records of %zu", name, data->size(),
                    recordLength);
        return KHD_FAILED;
    }
    return KHD_OK;
}

std::string insertSql(const std::string& table, const std::vector<Field>& fields) {
    std::string cols, marks;
    for (const Field& f : fields) {
        cols += f.column + ", ";
        marks += "?, ";
    }
    return "INSERT INTO " + table + " (" + cols + "HOSTNAME) VALUES (" + marks + "?)";
}

// Writes one value into an input entry, trailing blanks removed.
int bind(SQL1_SqlVar* v, const char* bytes, size_t n) {
    while (n > 0 && (bytes[n - 1] == ' ' || bytes[n - 1] == '\0')) n--;
    if (n > v->maxLength) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Value of %zu bytes longer than column %s (%u)", n, v->name, v->maxLength);
        return KHD_FAILED;
    }
    memset(v->data, 0, v->maxLength + 1u);
    memcpy(v->data, bytes, n);
    v->length = static_cast<uint16_t>(n);
    v->nullInd = 0;
    return KHD_OK;
}

// Inserts every record into the table of one server.
int storeRecords(const char* server, const std::string& sql, const std::vector<Field>& fields, size_t recordLength,
                 const std::string& data, const char* hostName) {
    SQL1_LoginId id;
    sql1cpli(&id);
    SQL1_Handle path{}, stmt{}, request{}, row{};
    int st = sql1cpth(server, &id, &path);
    const SQL1_Ops* ops = st == SQL1_OK ? path.object->ops : nullptr;
    SQL1_Sqlda* in = nullptr;
    if (st == SQL1_OK) st = ops->prepare(path, sql.c_str(), &stmt);
    if (st == SQL1_OK) st = ops->createRequest(stmt, 0, nullptr, &request, &row);
    if (st == SQL1_OK) st = ops->getInputDescriptor(request, &in);
    if (st == SQL1_OK && in->used != fields.size() + 1) st = SQL1_ST_BADARG;
    int rc = st == SQL1_OK ? KHD_OK : st == SQL1_ST_NOTFOUND ? KHD_UNREACHABLE : KHD_FAILED;
    for (size_t at = 0; rc == KHD_OK && at < data.size(); at += recordLength) {
        for (size_t i = 0; rc == KHD_OK && i < fields.size(); i++)
            rc = bind(&in->var[i], data.data() + at + fields[i].offset, fields[i].length);
        if (rc == KHD_OK) rc = bind(&in->var[fields.size()], hostName ? hostName : "", hostName ? strlen(hostName) : 0);
        if (rc == KHD_OK && (st = ops->open(request, in)) != SQL1_OK) rc = KHD_FAILED;
        if (rc == KHD_OK) (void)ops->close(request);
    }
    if (st != SQL1_OK)
        RAS1_Printf(RAS1_THIS, __LINE__, "Export to \"%s\" failed, status %d: %s", server, st, SQL1_LastError());
    if (ops != nullptr) (void)ops->release(path);  // statement and request go with it
    return rc;
}

}  // namespace

int KHD_ExportHistory(uint32_t flags, const char* dataFile, const char* headerFile, const char* table, long reserved5,
                      long reserved6, long reserved7, long reserved8, const char* hostName, long reserved10,
                      long reserved11, long reserved12, const char* serverList, long reserved14, long reserved15) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = KHD_OK;
    std::string tableName = table != nullptr ? table : kDefaultTable;
    if (flags != KHD_SNAPSHOT || dataFile == nullptr || *dataFile == '\0' || !plainName(tableName, true) ||
        (reserved5 | reserved6 | reserved7 | reserved8 | reserved10 | reserved11 | reserved12 | reserved14 | reserved15) != 0)
        rc = KHD_BADARG;
    std::vector<Field> fields;
    size_t recordLength = 0;
    std::string data;
    if (rc == KHD_OK)
        rc = readHeader(headerFile != nullptr ? headerFile : std::string(dataFile) + ".hdr", &fields, &recordLength);
    if (rc == KHD_OK) rc = readRecords(dataFile, recordLength, &data);
    const std::string sql = insertSql(tableName, fields);
    if (rc == KHD_OK && (serverList == nullptr || *serverList == '\0')) {
        rc = storeRecords(kLocalServer, sql, fields, recordLength, data, hostName);
    } else if (rc == KHD_OK) {
        for (const char* s = serverList; rc == KHD_OK && *s != '\0'; s += strlen(s) + 1)
            rc = storeRecords(s, sql, fields, recordLength, data, hostName);
    }
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Export of \"%s\" (%zu records) into %s: %d", dataFile,
                    recordLength ? data.size() / recordLength : 0, tableName.c_str(), rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
