// kshroreq: the route request (method CT_Redirect).
//
// Each "request" element of the document carries an "endpoint" attribute
// and a SOAP envelope as its immediate child element "SOAP-ENV:Envelope".
// The envelope, with everything inside it, is posted to the endpoint through
// the platform's SOAP client (KSH1_SoapRequest), and the body of the answer
// (the text between the "<SOAP-ENV:Body ...>" tag and "</SOAP-ENV:Body", or
// the whole answer when it has no such body) is appended to this request's
// response. Every failure is a client fault on the HTTP object; routing
// always goes on with the next request element.
//
// Ownership: the routed answer is the platform's malloc'd text, owned by the
// request from the call until it has been copied (freed with free, at the
// latest by the destructor).
#pragma once

#include <cstdint>

#include "kshmtrq.h"

class WSQL_RouteRequest : public WSQL_MetaRequest {
public:
    WSQL_RouteRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document);
    ~WSQL_RouteRequest() override;

    // Nothing to read: 0.
    int parseXML() override;
    // Routes every "request" element of the document. 0.
    int retrieveData() override;
    // Nothing to do: 0.
    int processResults() override;

    // Routes the envelope of the document's current node (a "request"
    // element, or the CT_Redirect element of a batch step). 0 always; a
    // failure is recorded as a client fault.
    int routeRequest();

    // The checks and the serialisation of routeRequest without the post:
    // 0 with the endpoint (in the document) and the envelope's text (valid
    // until the next serialisation of the fragment) set, or nonzero when
    // there is nothing to send (the fault is recorded for a malformed
    // request).
    int prepareRoute(char** endpoint, char** text, unsigned* length);

    // Envelopes posted so far.
    int32_t getRouteCount() const { return routeCount; }

private:
    // Appends the body of the routed answer (which it may cut).
    void copyBody();
    // Posts one envelope and copies the answer's body; the client's status.
    int post(const char* endpoint, const char* text, unsigned length);

    char* routedResponse;  // malloc'd by KSH1_SoapRequest, or null
    int32_t routeCount;
};
