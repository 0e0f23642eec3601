// kshexreq: the execute request (method CT_Execute, or an "execute" step of
// a batch).
//
// A file of the gateway's file directory holds a SOAP document; it is run
// through the SOAP start-up (WSQL_StartSoapRequest) as if it had been
// posted, writing into the same response. For a top-level CT_Execute the
// "filename" element names the file; for a batch step the "execute"
// element's own text does. A file that itself executes files may nest at
// most WSQL_MAX_EXECUTE_DEPTH deep, so a file that executes itself ends with
// a fault instead of exhausting the stack.
#pragma once

#include "kshmtrq.h"

// Nesting limit of executed files.
constexpr int WSQL_MAX_EXECUTE_DEPTH = 8;

class WSQL_ExecuteRequest : public WSQL_MetaRequest {
public:
    WSQL_ExecuteRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document);
    ~WSQL_ExecuteRequest() override = default;

    // The document must hold a "filename" element (it becomes the current
    // node): 0, or 5 with the client fault "Execute filename tag missing.".
    int parseXML() override;
    // executeRequest.
    int retrieveData() override;
    // Nothing to do: 0.
    int processResults() override;

    // Runs the file named by the current node's text: 5 (no name, a file
    // that cannot be read, too deep a nesting; the fault is set) or the
    // result of the SOAP start-up.
    int executeRequest();
};
