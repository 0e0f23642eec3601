// kshroreq: routing SOAP envelopes to other endpoints (see kshroreq.h).
#include "kshroreq.h"

#include <cstdlib>
#include <cstring>

#include "ksh1/ksh1.h"
#include "kshhttp.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshroreq");

WSQL_RouteRequest::WSQL_RouteRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document)
    : WSQL_MetaRequest(hub, http, document), routedResponse(nullptr), routeCount(0) {}

WSQL_RouteRequest::~WSQL_RouteRequest() { free(routedResponse); }

int WSQL_RouteRequest::parseXML() { return WSQL_OK; }
int WSQL_RouteRequest::processResults() { return WSQL_OK; }

int WSQL_RouteRequest::retrieveData() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    unsigned count = 0;
    for (int more = document->getArray("request", &count); more == WSQL_OK; more = document->nextNode())
        if (routeRequest() != WSQL_OK) break;
    RAS1_EXIT_RC(ras, WSQL_OK);
    return WSQL_OK;
}

void WSQL_RouteRequest::copyBody() {
    int ras = RAS1_Sync(RAS1_THIS);
    char* copied = routedResponse;
    char* body = strstr(routedResponse, "<SOAP-ENV:Body");
    char* first = body != nullptr ? strchr(body + 1, '<') : nullptr;
    char* close = first != nullptr ? strstr(first, "</SOAP-ENV:Body") : nullptr;
    if (close != nullptr) {
        *close = '\0';
        copied = first;
    }
    (void)getHttp()->append(copied);
    if (ras & RAS1_DETAIL) {
        RAS1_Printf(RAS1_THIS, __LINE__, "SOAP Response:\n");
        RAS1_Dump(RAS1_THIS, __LINE__, copied, strlen(copied));
    }
}

int WSQL_RouteRequest::post(const char* endpoint, const char* text, unsigned length) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Route to \"%s\"", endpoint);
    free(routedResponse);
    routedResponse = nullptr;
    unsigned long responseLength = 0;
    routeCount++;
    int st = KSH1_SoapRequest(endpoint, text, length, &routedResponse, &responseLength, KSH1_SOAP11);
    if (st != KSH1_OK || routedResponse == nullptr) {
        getHttp()->setRequestError(true, "Unable to redirect SOAP request.", endpoint, 0);
    } else {
        copyBody();
    }
    free(routedResponse);
    routedResponse = nullptr;
    return st;
}

int WSQL_RouteRequest::prepareRoute(char** endpoint, char** text, unsigned* length) {
    WSQL_HttpServer* http = getHttp();
    if (document->getAttributeList() != WSQL_OK || document->getAttribute("endpoint", endpoint) != WSQL_OK) {
        http->setRequestError(true, "No endpoint attribute specified for CT_Redirect request.", nullptr, 0);
        return WSQL_NOTFOUND;
    }
    char* id = nullptr;
    (void)document->getAttribute("id", &id);  // read, not otherwise used
    if (document->testElementImmediate("SOAP-ENV:Envelope") != WSQL_OK) {
        http->setRequestError(true, "Unable to redirect SOAP request - SOAP-ENV:Envelope element missing.", nullptr, 0);
        return WSQL_NOTFOUND;
    }
    // The test moved the current node to the envelope: it goes out whole.
    KSH_XML* fragment = document->createFragment(nullptr);
    if (fragment == nullptr || fragment->extractDocumentXML(text, length) != WSQL_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Envelope for \"%s\" could not be serialised", *endpoint);
        return WSQL_NOMEM;
    }
    return WSQL_OK;
}

int WSQL_RouteRequest::routeRequest() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char* endpoint = nullptr;
    char* text = nullptr;
    unsigned length = 0;
    if (prepareRoute(&endpoint, &text, &length) == WSQL_OK) (void)post(endpoint, text, length);
    RAS1_EXIT_RC(ras, WSQL_OK);
    return WSQL_OK;
}
