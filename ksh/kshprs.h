// kshprs: the front door of request processing.
//
// The HTTP binding hands every GET request whose query string begins with
// "action" to WSQL_ParseRequest, and every POST to WSQL_ParsePostRequest,
// each with the request's WSQL_HttpServer and the default hub. A GET names
// its operation in the query item "action" and is dispatched through the
// actions table; a POST carries a SOAP document whose method element is one
// of the CT methods. A SOAP document is parsed into a WSQL_Request_t
// (WSQL_ParseSoapRequest), validated, completed with the method's defaults
// (WSQL_SetupMethodDefaults, WSQL_SetupGetMethod) and either handed to a
// special request (WSQL_RunSpecialRequest) or run as a WSQL_Request.
//
// Every refusal is recorded on the HTTP object as the request's first error
// (a client fault unless said otherwise) and answered as a SOAP fault, or as
// an HTML error page for the query-string actions.
//
// Names that a request supplies for tables, columns and attributes are used
// in SQL only when they are plain identifiers (letters, digits and "_",
// not beginning with a digit; a table name may be qualified with "."); any
// other name is answered as not found. Values written into SQL literals have
// their double quotes doubled.
//
// Results: 0 success; 1 a refused request or document; 6 a malformed
// date/time variable in a filter; 7 no room (the 4096-byte defaults buffer
// or an array of the record is full); 8 an abnormal end caught while
// parsing; 400 a refused method (the message is set); other values are
// those of the request engine.
//
// Thread safety: each call serves one HTTP request on the calling thread;
// the record, the document and the defaults buffer are that thread's own.
#pragma once

#include <cstdint>

#include "kshreqt.h"

class KSH_XML;
class WSQL_Hub;
class WSQL_HttpServer;

// One query-string action: its exact name and its handler.
struct WSQL_Action {
    const char* name;
    int (*handler)(WSQL_HttpServer*, WSQL_Hub*);
};

// One SOAP method: its element tag, default action and `methods` bit.
struct WSQL_CTMethod {
    const char* tag;
    const char* action;
    uint32_t bit;
};

// The tables, ended by a null name / tag. Searched in order, exact and
// case-sensitive.
extern const WSQL_Action actions[];
extern const WSQL_CTMethod CTMethods[];

// GET entry: dispatches on the query item "action"; an unknown or missing
// action is answered with the HTML page "Error 400". The handler's result,
// or 0.
int WSQL_ParseRequest(WSQL_HttpServer* http, WSQL_Hub* hub);
// POST entry: reads the body, runs it as a SOAP document and always writes
// the SOAP response (or fault). The result of WSQL_StartSoapRequest, or 0
// when the body could not be read (the fault says so).
int WSQL_ParsePostRequest(WSQL_HttpServer* http, WSQL_Hub* hub);
// Handler of the query-string actions that run SQL ("start", "insert",
// "delete", "update", "events"): the record is filled from the query items
// and run; the response is the query-string XML document, or the error page
// "Unable to start request.".
int WSQL_StartRequest(WSQL_HttpServer* http, WSQL_Hub* hub);
// Runs one SOAP document of `*length` bytes at `buffer` (a NUL-terminated
// text the caller owns) with the zero-filled record `req`; *action receives
// the action string (a pointer into the document or a static text, valid
// while the call runs). The response body, or the error, is left on `http`
// for the caller to write.
int WSQL_StartSoapRequest(WSQL_HttpServer* http, WSQL_Hub* hub, char* buffer, unsigned long* length,
                          WSQL_Request_t* req, char** action);
// Parses the document into `doc` and fills `req`. The record's strings then
// point into `doc` (which the caller keeps alive as long as the record) or
// are static texts: nobody writes into a record string except where it came
// from the document. 0 the record is usable; 1 refused (the error is set);
// 6 a malformed date/time variable in a filter; 8 an abnormal end.
int WSQL_ParseSoapRequest(WSQL_HttpServer* http, WSQL_Hub* hub, char*& buffer, unsigned long* length,
                          WSQL_Request_t* req, char** action, KSH_XML* doc);

// Completes a status, activation, CT_WTO or CT_Thresholds record. `buffer`
// (`size` bytes, normally WSQL_DEFAULTS_SIZE) is cleared and receives every
// text added to the record; it must outlive the record's use. `methods` is
// the record's method bits without WSQL_METHODS_LOW. 0; 1 invalid alert
// attribute; 7 no room; 8 abnormal end; 400 invalid request. The error is
// set on `http` in every failing case.
int WSQL_SetupMethodDefaults(WSQL_HttpServer* http, WSQL_Hub* hub, WSQL_Request_t* req, char* buffer, int size,
                             unsigned int methods);
// Checks and completes a CT_Get: 0, 7, 8 or 400 (the error is set).
int WSQL_SetupGetMethod(WSQL_HttpServer* http, WSQL_Request_t* req);

// Query action "login": logs on with the items "userid" and "password" and
// serves the requested file, or answers with the "Error 401" page. 0; 1 for
// a request without both items (nothing is written).
int WSQL_LMS_Login(WSQL_HttpServer* http, WSQL_Hub* hub);

// Query action "addhub": adds the hub named by the items "lmsname",
// "servicename", "aliasname" (and "portno", the qualifier, when not empty)
// to the gateway and its hub list file, then serves the requested file.
// Query action "delhub": removes the hubs listed by the item "DelHubList"
// ("#2#5") from the hub list file, then serves the requested file. Both
// answer with the page "Unable to start request." when items are missing
// (code 1) or the hub list cannot be changed (the failure status); 0 or 1.
int WSQL_AddHub(WSQL_HttpServer* http, WSQL_Hub* hub);
int WSQL_DeleteHub(WSQL_HttpServer* http, WSQL_Hub* hub);

// The hub a request names by its alias (ignoring case) in the gateway's hub
// list, or null when no hub has that alias. `defaultHub` is the hub the
// request arrived at.
WSQL_Hub* WSQL_ResolveHubAlias(const char* alias, WSQL_Hub* defaultHub);

// Runs the special method selected by `methods` (CT_Affinity, CT_EMail,
// CT_Export, CT_Redirect, CT_Execute, in this order of precedence) on the
// parsed document. Its result is the request's result; errors are set on
// `http`.
int WSQL_RunSpecialRequest(unsigned methods, WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* doc);
