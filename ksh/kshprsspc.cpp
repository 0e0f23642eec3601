// kshprsspc: the special methods (CT_Affinity, CT_EMail, CT_Export,
// CT_Redirect, CT_Execute), each run by its meta request class.
#include <new>

#include "kshaffin.h"
#include "kshemail.h"
#include "kshexprt.h"
#include "kshexreq.h"
#include "kshhttp.h"
#include "kshprs.h"
#include "kshreqt.h"
#include "kshroreq.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshprsspc");

namespace {

template <class Request>
WSQL_MetaRequest* make(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* doc) {
    return new (std::nothrow) Request(hub, http, doc);
}

// The special methods in their order of precedence.
const struct {
    uint32_t bit;
    const char* name;
    WSQL_MetaRequest* (*create)(WSQL_Hub*, WSQL_HttpServer*, KSH_XML*);
} kSpecial[] = {
    {WSQL_METHOD_AFFINITY, "CT_Affinity", make<WSQL_AffinityRequest>},
    {WSQL_METHOD_EMAIL, "CT_EMail", make<WSQL_EMailRequest>},
    {WSQL_METHOD_EXPORT, "CT_Export", make<WSQL_ExportRequest>},
    {WSQL_METHOD_REDIRECT, "CT_Redirect", make<WSQL_RouteRequest>},
    {WSQL_METHOD_EXECUTE, "CT_Execute", make<WSQL_ExecuteRequest>},
};

}  // namespace

int WSQL_RunSpecialRequest(unsigned methods, WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* doc) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_NOTHING;
    for (const auto& s : kSpecial) {
        if ((methods & s.bit) == 0) continue;
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Special method %s", s.name);
        WSQL_MetaRequest* request = s.create(hub, http, doc);
        if (request == nullptr) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Unable to create the %s request", s.name);
            http->setRequestMemoryError();
            rc = WSQL_NOMEM;
        } else {
            rc = request->processRequest();
            delete request;
        }
        break;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
