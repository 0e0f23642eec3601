// kfa: the thru-node resolver over the hub store (see kfa.h).
#include "kfa/kfa.h"

#include <cstdio>
#include <cstring>

#include "ras1/ras1.h"
#include "sql1/sql1.h"

RAS1_UNIT("kfa");

namespace {

const char kQuery[] = "SELECT THRUNODE FROM O4SRV.INODESTS WHERE NODE = ?";

// Runs the query on `path`; copies the first row's value into `out`.
int lookUp(SQL1_Handle path, const char* node, char* out, int size) {
    const SQL1_Ops* ops = path.object->ops;
    SQL1_Handle stmt{}, request{}, row{};
    SQL1_Sqlda* in = nullptr;
    SQL1_Sqlda* result = nullptr;
    int rc = ops->prepare(path, kQuery, &stmt);
    if (rc == SQL1_OK) rc = ops->createRequest(stmt, 0, nullptr, &request, &row);
    if (rc == SQL1_OK) rc = ops->getInputDescriptor(request, &in);
    if (rc == SQL1_OK) rc = ops->getOutputDescriptor(row, &result);
    if (rc == SQL1_OK && (in == nullptr || in->used < 1 || result == nullptr || result->used < 1)) rc = SQL1_ST_FAULT;
    if (rc == SQL1_OK) {
        SQL1_SqlVar& v = in->var[0];
        size_t n = strnlen(node, v.maxLength);
        std::memset(v.data, 0, v.maxLength);
        std::memcpy(v.data, node, n);
        v.length = static_cast<uint16_t>(n);
        rc = ops->open(request, in);
    }
    if (rc == SQL1_OK) {
        int st = ops->fetch(row, result);
        if (st == SQL1_OK) {
            const SQL1_SqlVar& v = result->var[0];
            size_t n = v.nullInd < 0 ? 0 : v.length;
            while (n > 0 && v.data[n - 1] == ' ') n--;
            std::snprintf(out, static_cast<size_t>(size), "%.*s", static_cast<int>(n), v.data);
        } else if (st != SQL1_ST_EOD) {
            rc = st;
        }
        (void)ops->close(request);
    }
    if (request.object != nullptr) (void)ops->release(request);
    if (stmt.object != nullptr) (void)ops->release(stmt);
    return rc;
}

}  // namespace

extern "C" int KFARSVTN(const char* lmsName, const char* managedSystem, char* thruNode, int size) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (thruNode == nullptr || size <= 0) return SQL1_ST_BADARG;
    thruNode[0] = '\0';
    if (lmsName == nullptr || managedSystem == nullptr) return SQL1_ST_BADARG;
    SQL1_LbLookup_t* lb = nullptr;
    int rc = SQL1_LbLookup(lmsName, SQL1_LB_HUB, &lb);
    SQL1_Handle path{};
    if (rc == SQL1_OK && (lb == nullptr || lb->count < 1)) rc = SQL1_ST_NOTFOUND;
    if (rc == SQL1_OK) {
        SQL1_LoginId id;
        sql1cpli(&id);
        rc = sql1cpth(lb->entries[0].serverPath, &id, &path);
    }
    if (lb != nullptr) (void)SQL1_DestroyLbLookup(lb);
    if (rc == SQL1_OK) {
        rc = lookUp(path, managedSystem, thruNode, size);
        (void)path.object->ops->release(path);
    }
    if (rc != SQL1_OK) thruNode[0] = '\0';
    RAS1_TRACE_IF(ras, RAS1_STATE, "thru-node of %s at %s: '%s' rc %d", managedSystem, lmsName, thruNode, rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
