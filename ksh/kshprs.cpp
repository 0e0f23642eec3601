// kshprs: request dispatch. The GET actions table and its handlers that
// run SQL, the POST entry and the run of one SOAP document: validation,
// method defaults, special requests and the request engine.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "kdh1/kdh1.h"
#include "kshdsr.h"
#include "kshfile.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshprsint.h"
#include "kshreq.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshprs");

const WSQL_Action actions[] = {
    {"start", WSQL_StartRequest},  {"login", WSQL_LMS_Login},    {"insert", WSQL_StartRequest},
    {"delete", WSQL_StartRequest}, {"update", WSQL_StartRequest}, {"events", WSQL_StartRequest},
    {"addhub", WSQL_AddHub},       {"delhub", WSQL_DeleteHub},    {nullptr, nullptr},
};

namespace {

// Result of a refused request (the error is set).
constexpr int kRefused = 1;

// KDH1 statuses of the pages written here.
constexpr uint32_t kStatusBadRequest = KDH1_STC_BASE + 0x16;    // 0x7C4C8016
constexpr uint32_t kStatusUnauthorized = KDH1_STC_BASE + 0x17;  // 0x7C4C8017
constexpr uint32_t kStatusStartFailed = KDH1_STC_BASE + 0x19;   // 0x7C4C8019

const char kBadActionPage[] =
    "<HTML><TITLE>Error</TITLE><BODY><H1>Error 400</H1><P>Invalid or missing action in query string.</P></BODY>"
    "</HTML>";
const char kLoginFailedPage[] =
    "<HTML><HEAD><META HTTP-EQUIV='Refresh' CONTENT='2; URL=login.htm'></META><TITLE>Error</TITLE></HEAD><BODY>"
    "<H1>Error 401</H1> <P>Invalid user ID or password.</P></BODY></HTML>";

// The actions a CT_Action request may carry.
const char* const kDataActions[] = {"start", "insert", "delete", "events"};

int refuse(WSQL_HttpServer* http, const char* fault, const char* trace) {
    if (trace != nullptr) RAS1_Printf(RAS1_THIS, __LINE__, "%s", trace);
    http->setRequestError(true, fault, nullptr, 0);
    return kRefused;
}

// A table name is pasted into SQL only when it is a plain name; any other
// is answered like a table that does not exist.
int checkTableName(WSQL_HttpServer* http, const char* table) {
    if (table == nullptr || WSQL_IsPlainName(table)) return WSQL_OK;
    RAS1_Printf(RAS1_THIS, __LINE__, "Unable to find table/object %.79s", table);
    http->setRequestError(true, "Invalid object name", table, 0);
    return WSQL_NOTFOUND;
}

// ------------------------------------------------------------ query string

struct QueryCtx {
    WSQL_HttpServer* http;
    WSQL_Request_t* req;
    const char* client;
};

int queryParma(QueryCtx& q, char* name, char* value) {
    if (WSQL_AddParma(q.req, name, value) == WSQL_OK) return WSQL_OK;
    RAS1_Printf(RAS1_THIS, __LINE__, "Request %s has too many parma settings.", q.client);
    return kRefused;
}

// One query item into the record: 0, or 1 for a malformed item.
int queryItem(QueryCtx& q, char* name, char* value) {
    WSQL_Request_t* r = q.req;
    if (WSQL_CaseCompare(name, "table") == 0) {
        r->table = value;
    } else if (WSQL_CaseCompare(name, "intv") == 0) {
        r->intv = static_cast<int32_t>(strtol(value, nullptr, 10));
    } else if (WSQL_CaseCompare(name, "results") == 0) {
        if (WSQL_CaseCompare(value, "parse") == 0) r->parse = 1;
    } else if (WSQL_CaseCompare(name, "targets") == 0) {
        return queryParma(q, WSQL_Literal("NODELIST"), value);
    } else if (WSQL_CaseCompare(name, "name") == 0) {
        return queryParma(q, WSQL_Literal("SITNAME"), value);
    } else if (WSQL_CaseCompare(name, "parma") == 0) {
        char* parts[2];
        if (!WSQL_SplitAtSemicolons(value, 1, parts)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Request %s has incorrectly formatted parma.", q.client);
            return kRefused;
        }
        return queryParma(q, parts[0], parts[1]);
    } else if (WSQL_NCaseCompare(name, "filter", 6) == 0 || WSQL_NCaseCompare(name, "afilter", 7) == 0) {
        char* parts[3];
        if (r->numFilters >= WSQL_MAX_FILTERS || !WSQL_SplitAtSemicolons(value, 2, parts)) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Malformed filter: %s", value);
            return kRefused;
        }
        unsigned char isAfilter = (name[0] == 'a' || name[0] == 'A') ? 1 : 0;
        (void)WSQL_AddFilter(r, parts[0], parts[1], parts[2], isAfilter);
    } else if (WSQL_CaseCompare(name, "xsl") == 0) {
        q.http->addXSLReference(value);
    } else if (WSQL_CaseCompare(name, "history") == 0) {
        r->history = (value[0] == 'Y' || value[0] == 'y') ? 1 : 0;
    } else if (WSQL_CaseCompare(name, "column") == 0) {
        if (r->numColumns < WSQL_MAX_COLUMNS) r->columns[r->numColumns++] = value;
    } else if (WSQL_CaseCompare(name, "sql") == 0) {
        r->sql = value;
    } else if (WSQL_CaseCompare(name, "thrunode") == 0) {
        r->thrunode = value;
    }
    return WSQL_OK;
}

// Creates, runs and finishes the request of a query string. 0 or the code
// of InitReq or Start.
int runQueryRequest(WSQL_HttpServer* http, WSQL_Hub* hub, WSQL_Request_t* rec, const char* action) {
    auto* request = new WSQL_Request(hub, http);
    int rc = request->InitReq(rec, action);
    if (rc == WSQL_OK) rc = request->Start();
    if (rc == WSQL_OK) {
        request->WriteResponse();
        if (request->isPersisted()) {
            request->deactiveRequest();
            return WSQL_OK;
        }
    }
    request->Done(rc);
    delete request;
    return rc;
}

int startQueryRequest(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_Request_t rec;
    memset(&rec, 0, sizeof rec);
    const char* client = http->getRequestClient();
    QueryCtx q{http, &rec, client};
    WSQL_QueryItem* items = http->getQueryItems();
    int rc = WSQL_OK;
    for (int i = 0; i < http->getNumQueryItems() && rc == WSQL_OK; ++i) {
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "query item '%s'", items[i].name);
        rc = queryItem(q, items[i].name, items[i].value);
    }
    if (rc == WSQL_OK && rec.table == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Must specify a table with request.");
        rc = kRefused;
    }
    if (rc == WSQL_OK) rc = checkTableName(http, rec.table);
    if (rc == WSQL_OK) {
        const char* action = http->getQueryValue("action");
        rc = runQueryRequest(http, hub, &rec, action ? action : "start");
    }
    if (rc != WSQL_OK) http->returnError(kStatusStartFailed, "Unable to start request.", rc);
    return rc;
}

// ------------------------------------------------------------ SOAP steps

struct SoapCtx {
    WSQL_HttpServer* http;
    WSQL_Hub* hub;
    WSQL_Request_t* req;
    char** action;
    KSH_XML* doc;
    char* defaults;  // the 4096-byte defaults buffer
};

// Step 1: the client address up to its first ':', at most 16 characters.
void takeClientHost(WSQL_HttpServer* http, WSQL_Request_t* req) {
    const char* client = http->getRequestClient();
    const char* colon = client ? strchr(client, ':') : nullptr;
    if (colon == nullptr) return;
    size_t n = static_cast<size_t>(colon - client);
    memcpy(req->clientHost, client, n < WSQL_CREDENTIAL_SIZE ? n : WSQL_CREDENTIAL_SIZE);
}

// Steps 3 and 4: the hub named by "hub", and a first logon when the hub has
// no server path yet.
int chooseHub(SoapCtx& s) {
    if (s.req->hubAlias != nullptr) {
        WSQL_Hub* found = WSQL_ResolveHubAlias(s.req->hubAlias, s.hub);
        if (found == nullptr) return refuse(s.http, "Invalid Hub Alias.", nullptr);
        s.hub = found;
    }
    if (s.hub->hasServerPath()) return WSQL_OK;
    DS_SQLRequest probe(s.hub, nullptr);
    probe.useGlobalPath();
    int st = probe.login(0);
    if (st == WSQL_OK) return WSQL_OK;
    if (st == WSQL_NONLS && !s.hub->isHubNLS())
        s.http->setRequestError(true, "HUB Version is incompatible.", s.hub->getLMSName(), 0);
    else
        s.http->setRequestError(true, "Unable to contact LMS server.", nullptr, 0);
    return st;
}

// Steps 5 and 6: a data or special method, and credentials when the hub
// validates users.
int checkMethodAndUser(SoapCtx& s) {
    const uint32_t methods = s.req->methods;
    if ((methods & ~WSQL_METHODS_LOW) == 0)
        return refuse(s.http, "Invalid or missing CT method in string.", "Must specify a valid CT method in request.");
    if (!(methods & WSQL_METHODS_SPECIAL) && s.hub->getValidate() == WSQL_VALIDATE_ON &&
        !(s.req->elements & (WSQL_ELEM_USERID | WSQL_ELEM_PASSWORD)))
        return refuse(s.http, "Missing Userid or Password for LMS validation.",
                      "Must specify a Userid or Password for LMS validation.");
    return WSQL_OK;
}

int statusChecks(SoapCtx& s, uint32_t m) {
    const uint32_t el = s.req->elements;
    if ((m & WSQL_METHOD_ALERT) && !(el & WSQL_ELEM_SOURCE))
        return refuse(s.http, "Invalid or missing source name for CT_Alert.", "Must specify an source name with CT_Alert.");
    if ((el & WSQL_ELEM_RESULTS) && !(el & WSQL_ELEM_TIMESTAMP))
        return refuse(s.http, "Missing timestamp for results in CT status method.", nullptr);
    if ((el & WSQL_ELEM_RESULTS) && (el & WSQL_ELEM_DATA))
        return refuse(s.http, "Results and data cannot both be specified in CT status method.", nullptr);
    if ((m & WSQL_METHOD_ACKNOWLEDGE) && s.req->expire != nullptr && strtol(s.req->expire, nullptr, 10) <= 0)
        return refuse(s.http, "Invalid CT_Alert expire value.", nullptr);
    return WSQL_OK;
}

int objectChecks(SoapCtx& s, uint32_t m) {
    const uint32_t el = s.req->elements;
    if (!(el & WSQL_ELEM_NAME))
        return refuse(s.http, "Invalid or missing object name.", "Must specify an object name with CT status method.");
    if ((m & WSQL_METHODS_ACTIVATION) && !(el & WSQL_ELEM_TYPE))
        return refuse(s.http, "Invalid or missing object name.", "Must specify an object type with CT Activation method.");
    return WSQL_OK;
}

int thresholdChecks(SoapCtx& s) {
    const uint32_t el = s.req->elements;
    const char* msg = nullptr;
    if (!(el & WSQL_ELEM_TARGET)) {
        msg = "Must specify a target with CT Thresholds method";
    } else if (el & WSQL_ELEM_OVERRIDES) {
        msg = nullptr;
    } else if (!(el & WSQL_ELEM_NAME)) {
        msg = "Must specify a situation name with CT Thresholds method";
    } else if (!(el & WSQL_ELEM_THRESHOLDNAME) || !(el & WSQL_ELEM_THRESHOLDVALUE)) {
        msg = "Must specify Threshold Name/Value with CT Thresholds method.";
    } else if ((el & WSQL_ELEM_KEYNAME) && !(el & WSQL_ELEM_KEYVALUE)) {
        msg = "Must specify a key value with key name for CT Thresholds method";
    } else if ((el & WSQL_ELEM_KEYVALUE) && !(el & WSQL_ELEM_KEYNAME)) {
        msg = "Must specify a key name with key value for CT Thresholds method";
    }
    if (msg == nullptr) return WSQL_OK;
    RAS1_Printf(RAS1_THIS, __LINE__, "CT Thresholds method Error Http Status %d: '%s'", 400, msg);
    s.http->setRequestError(true, msg, nullptr, 0);
    return 400;
}

// Step 7: the checks and defaults of the methods that have them.
int methodChecks(SoapCtx& s) {
    const uint32_t m = s.req->methods & ~WSQL_METHODS_LOW;
    if (m == WSQL_METHOD_GET || m == (WSQL_METHOD_GET | WSQL_METHOD_ACTION)) return WSQL_SetupGetMethod(s.http, s.req);
    int rc = WSQL_OK;
    if (m == WSQL_METHOD_ALERT || m == WSQL_METHOD_ACKNOWLEDGE || m == WSQL_METHOD_RESET || m == WSQL_METHOD_RESURFACE) {
        rc = statusChecks(s, m);
        if (rc == WSQL_OK) rc = objectChecks(s, m);
    } else if (m == WSQL_METHOD_ACTIVATE || m == WSQL_METHOD_DEACTIVATE) {
        rc = objectChecks(s, m);
    } else if (m == WSQL_METHOD_WTO) {
        if (!(s.req->elements & WSQL_ELEM_DATA)) rc = refuse(s.http, "Must specify data for CT WTO method", nullptr);
    } else if (m == WSQL_METHOD_THRESHOLDS) {
        rc = thresholdChecks(s);
    } else {
        return WSQL_OK;  // CT_SQL, CT_Action, special methods, explicit actions
    }
    if (rc == WSQL_OK) rc = WSQL_SetupMethodDefaults(s.http, s.hub, s.req, s.defaults, WSQL_DEFAULTS_SIZE, m);
    return rc;
}

// Step 9: a table and an action the request engine can run.
int checkDataRequest(SoapCtx& s) {
    const uint32_t methods = s.req->methods;
    if (s.req->table == nullptr && !(methods & WSQL_METHOD_SQL))
        return refuse(s.http, "Invalid or missing object or table in request string.", "Must specify a table with request.");
    const char* action = *s.action;
    bool ok = action != nullptr && *action != '\0';
    if (ok && (methods & WSQL_METHOD_ACTION)) {
        ok = false;
        for (const char* a : kDataActions)
            if (strcmp(action, a) == 0) ok = true;
    }
    if (!ok)
        return refuse(s.http, "Invalid or missing action in query string.", "Must specify a valid action with request.");
    return checkTableName(s.http, s.req->table);
}

// Step 10: resumes a persisted request. 0 with *request null when the
// handle names none.
int resumeRequest(SoapCtx& s, WSQL_Request** request) {
    *request = WSQL_Request::locateRequest(static_cast<unsigned>(strtoul(s.req->requestHandle, nullptr, 10)), s.http);
    if (*request == nullptr) return WSQL_OK;
    WSQL_Request* r = *request;
    int rc = WSQL_OK;
    if (r->getType() & WSQL_TYPE_BOUNDINPUT) {
        if (s.req->numValues > 0 || s.req->numFilters > 0)
            rc = r->buildInput(s.req);
        else
            rc = refuse(s.http, "Invalid or missing updates to resume request.", nullptr);
    }
    if (rc == WSQL_OK) rc = r->Fetch(*s.action, true);
    if (rc == WSQL_OK) rc = r->Process(*s.action);
    r->deactiveRequest();
    return rc;
}

// Steps 11 and 12: a new request, kept when it is persisted and succeeded.
int newRequest(SoapCtx& s) {
    auto* request = new WSQL_Request(s.hub, s.http);
    int rc = request->InitReq(s.req, *s.action);
    if (rc == WSQL_OK) rc = request->Start();
    if (rc == WSQL_OK) rc = request->Fetch(*s.action, true);
    if (rc == WSQL_OK) rc = request->Process(*s.action);
    if (rc == WSQL_OK && request->isPersisted()) {
        request->deactiveRequest();
        return rc;
    }
    request->Done(rc);
    delete request;
    return rc;
}

int runSoap(SoapCtx& s) {
    int rc = chooseHub(s);
    if (rc == WSQL_OK) rc = checkMethodAndUser(s);
    if (rc == WSQL_OK) rc = methodChecks(s);
    if (rc != WSQL_OK) return rc;
    const uint32_t special = s.req->methods & WSQL_METHODS_SPECIAL;
    if (special != 0) return WSQL_RunSpecialRequest(special, s.hub, s.http, s.doc);
    rc = checkDataRequest(s);
    if (rc != WSQL_OK) return rc;
    WSQL_Request* resumed = nullptr;
    if (s.req->requestHandle != nullptr) rc = resumeRequest(s, &resumed);
    if (resumed == nullptr && rc == WSQL_OK) rc = newRequest(s);
    return rc;
}

}  // namespace

int WSQL_ParseRequest(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    http->dump();
    http->parseQueryString();
    const char* action = http->getQueryValue("action");
    int rc = WSQL_OK;
    const WSQL_Action* a = actions;
    while (a->name != nullptr && (action == nullptr || strcmp(a->name, action) != 0)) ++a;
    if (a->name != nullptr) {
        rc = PFM1_Guard("WSQL_ParseRequest", [&]() { return a->handler(http, hub); });
    } else {
        http->writeHeaders(kStatusBadRequest, KDH1_MEDIA_HTML, 0, 0, nullptr);
        http->append(kBadActionPage);
        http->writeClientBuffer();
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_StartRequest(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = startQueryRequest(http, hub);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_ParsePostRequest(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    http->dump();
    char* body = nullptr;
    uint32_t length = 0;
    int st = http->readClient(&body, &length);
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Read Client buf %p len %d status %d", static_cast<void*>(body),
                    static_cast<int>(length), st);
    int rc = WSQL_OK;
    if (st != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to read client data. status %d.", st);
        http->setRequestError(false, "Unable to extract client data from posted request.", nullptr, 0);
    } else {
        WSQL_Request_t rec;
        memset(&rec, 0, sizeof rec);
        unsigned long n = length;
        char* action = nullptr;
        rc = PFM1_Guard("WSQL_ParsePostRequest", [&]() {
            return WSQL_StartSoapRequest(http, hub, body, &n, &rec, &action);
        });
        if (rc == PFM1_ABEND && !http->isRequestErrorSet())
            http->setRequestError(false, "Unable to start request (8)", nullptr, 0);
    }
    http->WriteSoapResponse();
    free(body);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_StartSoapRequest(WSQL_HttpServer* http, WSQL_Hub* hub, char* buffer, unsigned long* length,
                          WSQL_Request_t* req, char** action) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char defaults[WSQL_DEFAULTS_SIZE];
    memset(defaults, 0, sizeof defaults);
    char* noAction = nullptr;
    if (action == nullptr) action = &noAction;
    *action = nullptr;
    takeClientHost(http, req);
    KSH_XML doc;
    int rc = WSQL_ParseSoapRequest(http, hub, buffer, length, req, action, &doc);
    if (rc == WSQL_OK) {
        SoapCtx s{http, hub, req, action, &doc, defaults};
        rc = runSoap(s);
    }
    if (rc != WSQL_OK && !http->isRequestErrorSet()) {
        char msg[64];
        snprintf(msg, sizeof msg, "Unable to start request (%d)", rc);
        http->setRequestError(false, msg, nullptr, 0);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// ------------------------------------------------------------ login

namespace {

// The "userid" and "password" items; false when another item is present or
// either is missing.
bool loginItems(WSQL_HttpServer* http, const char** user, const char** password) {
    *user = *password = nullptr;
    WSQL_QueryItem* items = http->getQueryItems();
    for (int i = 0; i < http->getNumQueryItems(); ++i) {
        if (WSQL_CaseCompare(items[i].name, "userid") == 0)
            *user = items[i].value;
        else if (WSQL_CaseCompare(items[i].name, "password") == 0)
            *password = items[i].value;
        else if (WSQL_CaseCompare(items[i].name, "action") != 0)
            return false;
    }
    return *user != nullptr && *password != nullptr;
}

}  // namespace

int WSQL_LMS_Login(WSQL_HttpServer* http, WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const char* user = nullptr;
    const char* password = nullptr;
    if (!loginItems(http, &user, &password)) {
        RAS1_EXIT_RC(ras, kRefused);
        return kRefused;
    }
    // A user id or password longer than the login id's 16-byte fields can
    // name no user: it is answered as a failed logon without trying one.
    size_t ul = strlen(user);
    size_t pl = strlen(password);
    int st = WSQL_FAULT;
    if (ul <= WSQL_CREDENTIAL_SIZE && pl <= WSQL_CREDENTIAL_SIZE) {
        DS_SQLRequest logon(hub, nullptr);
        SQL1_LoginId* id = logon.loginId();
        memset(id, 0, sizeof *id);
        memcpy(id->userId, user, ul);
        memcpy(id->password, password, pl);
        st = logon.login(0);
    }
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Login of '%.16s' status %d", user, st);
    if (st == WSQL_OK) {
        WSQL_FileServer::serveFile(http, hub);
    } else {
        http->writeHeaders(kStatusUnauthorized, KDH1_MEDIA_HTML, 0, 0, nullptr);
        http->append(kLoginFailedPage);
        http->writeClientBuffer();
    }
    RAS1_EXIT_RC(ras, WSQL_OK);
    return WSQL_OK;
}
