// kshexreq: running a file of the file directory as a SOAP request (see
// kshexreq.h).
#include "kshexreq.h"

#include <cstdlib>
#include <cstring>

#include "kshhttp.h"
#include "kshprs.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshexreq");

namespace {
// Files being executed on this thread, outermost first.
thread_local int tDepth = 0;
}  // namespace

WSQL_ExecuteRequest::WSQL_ExecuteRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document)
    : WSQL_MetaRequest(hub, http, document) {}

int WSQL_ExecuteRequest::parseXML() {
    if (document->testElement("filename") == WSQL_OK) return WSQL_OK;
    getHttp()->setRequestError(true, "Execute filename tag missing.", nullptr, 0);
    return WSQL_NOTFOUND;
}

int WSQL_ExecuteRequest::retrieveData() { return executeRequest(); }

int WSQL_ExecuteRequest::processResults() { return WSQL_OK; }

int WSQL_ExecuteRequest::executeRequest() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    WSQL_HttpServer* http = getHttp();
    char* name = nullptr;
    unsigned n = 0;
    char* text = nullptr;
    uint32_t length = 0;
    int rc = WSQL_OK;
    if (document->getNodeValue(&name, &n) != WSQL_OK) {
        http->setRequestError(true, "Execute filename missing.", nullptr, 0);
        rc = WSQL_NOTFOUND;
    } else if (readFile(name, &text, &length) != WSQL_OK || text == nullptr) {
        http->setRequestError(true, "Unable to open or read execute file.", name, 0);
        rc = WSQL_NOTFOUND;
    } else if (tDepth >= WSQL_MAX_EXECUTE_DEPTH) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Execute of \"%s\" nested deeper than %d", name, WSQL_MAX_EXECUTE_DEPTH);
        http->setRequestError(true, "Execute files nested too deeply.", name, 0);
        rc = WSQL_NOTFOUND;
    } else {
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Execute \"%s\" (%u bytes)", name, length);
        memset(&subRequest, 0, sizeof subRequest);
        unsigned long len = length;
        tDepth++;
        rc = WSQL_StartSoapRequest(http, getHub(), text, &len, &subRequest, &action);
        tDepth--;
        action = nullptr;  // it pointed into the executed document
    }
    free(text);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
