// kshprsals: the hub a request names by alias.
//
// This build serves the one hub its requests arrive at: there is no list of
// further hubs to search, so an alias names a hub only when it is that
// hub's own alias. Where the gateway keeps a hub list, the look-up is made
// in that list instead.
#include "kshhub.h"
#include "kshprs.h"
#include "kshutil.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshprsals");

WSQL_Hub* WSQL_ResolveHubAlias(const char* alias, WSQL_Hub* defaultHub) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Search alias: \"%s\"", alias ? alias : "");
    if (alias == nullptr || defaultHub == nullptr) return nullptr;
    return WSQL_CaseCompare(alias, defaultHub->getAliasName()) == 0 ? defaultHub : nullptr;
}
