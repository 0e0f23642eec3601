// kshprshub: the requests that concern the hub list: the hub a SOAP request
// names by alias, and the query actions "addhub" and "delhub" that add a
// hub to the hub list file or remove hubs from it.
#include <cstdio>
#include <cstring>

#include "kdh1/kdh1.h"
#include "kshfile.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshssrv.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshprshub");

namespace {

constexpr uint32_t kStatusStartFailed = KDH1_STC_BASE + 0x19;  // 0x7C4C8019

// The value of the query item `name` (ignoring case; the last one counts),
// or null. An empty value counts as none.
const char* itemValue(WSQL_HttpServer* http, const char* name) {
    const char* found = nullptr;
    WSQL_QueryItem* items = http->getQueryItems();
    for (int i = 0; i < http->getNumQueryItems(); ++i)
        if (WSQL_CaseCompare(items[i].name, name) == 0 && items[i].value[0] != '\0') found = items[i].value;
    return found;
}

int failed(WSQL_HttpServer* http, int code) {
    http->returnError(kStatusStartFailed, "Unable to start request.", code);
    return 1;
}

}  // namespace

WSQL_Hub* WSQL_ResolveHubAlias(const char* alias, WSQL_Hub* defaultHub) {
    (void)defaultHub;
    return alias ? searchHubList(alias) : nullptr;
}

int WSQL_AddHub(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const char* lms = itemValue(http, "lmsname");
    const char* service = itemValue(http, "servicename");
    const char* alias = itemValue(http, "aliasname");
    const char* port = itemValue(http, "portno");
    int rc = 1;
    if (lms == nullptr || service == nullptr || alias == nullptr) {
        rc = failed(http, 1);
    } else {
        int st = WSQL_Add_New_Hub(lms, service, alias, port);
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Add hub %s %s %s status %d", lms, service, alias, st);
        // A hub that could not be added is reported, not answered with the
        // page of a success.
        rc = st == 0 ? WSQL_FileServer::serveFile(http, hub) : failed(http, st);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_DeleteHub(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const char* list = nullptr;
    WSQL_QueryItem* items = http->getQueryItems();
    for (int i = 0; i < http->getNumQueryItems(); ++i) {
        int position = 0;
        if (strcmp(items[i].name, "DelHubList") == 0 && sscanf(items[i].value, "#%d", &position) == 1)
            list = items[i].value;
    }
    int rc = 1;
    if (list == nullptr) {
        rc = failed(http, 1);
    } else {
        int st = WSQL_Remove_Hubs(list);
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Remove hubs %s status %d", list, st);
        rc = st == 0 ? WSQL_FileServer::serveFile(http, hub) : failed(http, st);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
