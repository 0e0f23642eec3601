// kshprsspc: the special methods (CT_Affinity, CT_EMail, CT_Export,
// CT_Redirect, CT_Execute).
//
// This build has no special request classes: every special method is
// answered as an unsupported method, before any database work.
#include "kshhttp.h"
#include "kshprs.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshprsspc");

int WSQL_RunSpecialRequest(unsigned methods, WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* doc) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    (void)hub;
    (void)doc;
    RAS1_Printf(RAS1_THIS, __LINE__, "Special method 0x%x not available", methods);
    http->setRequestError(true, "Invalid or missing CT method in string.", nullptr, 0);
    RAS1_EXIT_RC(ras, 1);
    return 1;
}
