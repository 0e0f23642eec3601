// kshdhtpsvc: the hubs' HTTP services and the request callback (see
// kshdhtpsvc.h).
#include "kshdhtpsvc.h"

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstring>
#include <mutex>

#include "bss1/bss1.h"
#include "kshanchor.h"
#include "kshdhtp.h"
#include "kshfile.h"
#include "kshhub.h"
#include "kshlst.h"
#include "kshprs.h"
#include "kshssrv.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshdhtpsvc");

namespace {

constexpr const char* kDefaultServiceId = "lms";
constexpr const char* kDefaultTitle = "Ondex Velstra Monitoring Web Services";

// Guards gHubList's publication, the hubs' server handles and the stopping
// flag, so that a stop and a starting service thread (or a hub being added)
// cannot miss each other. Lock order: this lock, then gHubList's own lock.
struct ServiceLock {
    BSS1_Lock lock;
    bool stopping = false;  // GUARDED_BY(lock)
    ServiceLock() { (void)BSS1_InitializeLock(&lock); }
    ~ServiceLock() { BSS1_DestroyLock(&lock); }
    ServiceLock(const ServiceLock&) = delete;
    ServiceLock& operator=(const ServiceLock&) = delete;
};
ServiceLock& services() {
    static ServiceLock s;
    return s;
}
class ServiceGuard {
public:
    ServiceGuard() { BSS1_GetLock(&services().lock); }
    ~ServiceGuard() { BSS1_ReleaseLock(&services().lock); }
    ServiceGuard(const ServiceGuard&) = delete;
    ServiceGuard& operator=(const ServiceGuard&) = delete;
};

// The HTTP layer hands a request whose path names no service to the service
// created first. That must be the local hub's ("soap"), so its thread is
// started first and the others only once it has created its service (or
// failed to). The wait is bounded: a stuck thread delays the others only.
constexpr int kFirstServiceWaitMillis = 5000;
struct FirstService {
    std::mutex mu;
    std::condition_variable cond;
    WSQL_Hub* awaited = nullptr;  // GUARDED_BY(mu)
    bool created = false;         // GUARDED_BY(mu)
};
FirstService& firstService() {
    static FirstService f;
    return f;
}
void serviceCreated(WSQL_Hub* hub) {
    FirstService& f = firstService();
    std::lock_guard<std::mutex> held(f.mu);
    if (f.awaited != hub) return;
    f.created = true;
    f.cond.notify_all();
}

void hubThreadBody(void* hub) { (void)WSQL_KDH_StartServer(static_cast<WSQL_Hub*>(hub)); }

// Starts the service thread of `hub`. REQUIRES: the service lock.
int startHubThread(WSQL_Hub* hub) {
    BSS1_Thread* thread = nullptr;
    size_t stack = gAnchor != nullptr ? gAnchor->threadStackSize : 0;
    int rc = BSS1_CreateThread(&thread, stack, hubThreadBody, hub);
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error: can't start new hub thread; rc(%d)", rc);
        return rc;
    }
    hub->setThreadID(thread);
    return WSQL_OK;
}

// Starts the local hub's thread and waits until it has created its service.
// REQUIRES: the service lock (the thread does not need it to create the
// service).
void startLocalHubFirst(WSQL_Hub* local) {
    FirstService& f = firstService();
    std::unique_lock<std::mutex> held(f.mu);
    f.awaited = local;
    f.created = false;
    held.unlock();
    if (startHubThread(local) == WSQL_OK) {
        held.lock();
        if (!f.cond.wait_for(held, std::chrono::milliseconds(kFirstServiceWaitMillis), [&f] { return f.created; }))
            RAS1_Printf(RAS1_THIS, __LINE__, "Hub %s has not created its service yet", local->getAliasName());
        held.unlock();
    }
    held.lock();
    f.awaited = nullptr;
}

// Records the new service in the hub unless the gateway is stopping: then
// the service is deleted at once and the thread does not listen.
bool registerService(WSQL_Hub* hub, KDH1_server_t server) {
    ServiceGuard held;
    if (services().stopping) return false;
    hub->setKDHServer(server);
    return true;
}

// The service thread's work between creating and deleting its service.
int serveHub(WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    KDH1_server_t server = 0;
    int rc = static_cast<int>(KDH1_New(&server, hub->getServiceName(), default_service, hub, 0, 0));
    serviceCreated(hub);
    if (rc != WSQL_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to create the service %s for hub %s, status %x", hub->getServiceName(),
                    hub->getAliasName(), static_cast<unsigned>(rc));
        return rc;
    }
    char point[WSQL_SERVICE_POINT_SIZE];
    WSQL_ServicePointName(hub->getNodeID(), point);
    (void)KDH1_PublishService(server, 0, 0, WSQL_ServiceTitle(), 0, point, 0);
    if (!registerService(hub, server)) {
        (void)KDH1_Delete(server);
        return WSQL_OK;
    }
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Listening for requests for %s", hub->getAliasName());
    return static_cast<int>(KDH1_Listen(server, 0));
}

// ---- routing

bool isPost(const char* method, const char*) { return std::strcmp(method, "POST") == 0; }
// Exactly these six lower-case letters: "Action=..." is a file request.
bool isAction(const char*, const char* query) { return std::strncmp(query, "action", 6) == 0; }
bool always(const char*, const char*) { return true; }

int serveFile(WSQL_HttpServer* server, WSQL_Hub* hub) { return WSQL_FileServer::serveFile(server, hub); }

struct Route {
    bool (*matches)(const char* method, const char* query);
    int (*handler)(WSQL_HttpServer* server, WSQL_Hub* hub);
    const char* name;
};
// Searched in order; the last entry takes every request.
constexpr Route kRoutes[] = {
    {isPost, WSQL_ParsePostRequest, "SOAP"},
    {isAction, WSQL_ParseRequest, "URL"},
    {always, serveFile, "file"},
};

int routeRequest(KDH1_request_struct* request, WSQL_Hub* hub, const char** pathInfo) {
    WSQL_KDHServer server(request);
    *pathInfo = server.getPathInfo();
    const char* method = server.getRequestMethod();
    const char* query = server.getQueryString();
    for (const Route& r : kRoutes) {
        if (!r.matches(method, query)) continue;
        int ras = RAS1_Sync(RAS1_THIS);
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "%s %s goes to the %s handler", method, *pathInfo, r.name);
        return r.handler(&server, hub);
    }
    return WSQL_OK;
}

}  // namespace

void WSQL_ServicePointName(const char* nodeId, char* out) {
    const char* id = BSS1_GetEnv("KSH_SERVICEID", kDefaultServiceId);
    size_t idLen = std::strlen(id);
    // Room for the node part: 253 less the identifier (an underscore, the
    // identifier and the terminator must still fit the 256 bytes).
    size_t room = idLen < 253 ? 253 - idLen : 0;
    char node[WSQL_SERVICE_POINT_SIZE] = "";
    const char* wanted = BSS1_GetEnv("KSH_SERVICEPOINT", nodeId != nullptr && *nodeId != '\0' ? nodeId : nullptr);
    if (wanted != nullptr && std::strlen(wanted) < room) {
        std::snprintf(node, sizeof node, "%s", wanted);
    } else {
        BSS1_HostInfo info;
        if (room > 0 && BSS1_Info(&info) == 0) std::snprintf(node, sizeof node, "%.*s", static_cast<int>(room), info.hostName);
    }
    char* underscore = std::strrchr(node, '_');
    if (underscore != nullptr && std::strcmp(underscore, "_ms") == 0) *underscore = '\0';
    if (node[0] != '\0') {
        std::snprintf(out, WSQL_SERVICE_POINT_SIZE, "%s_%.*s", node, static_cast<int>(WSQL_SERVICE_POINT_SIZE - 2 - std::strlen(node)), id);
    } else {
        std::snprintf(out, WSQL_SERVICE_POINT_SIZE, "%s", id);
    }
}

const char* WSQL_ServiceTitle() {
    const char* title = BSS1_GetEnv("KSH_SERVICETITLE", kDefaultTitle);
    return std::strcmp(title, "*") == 0 ? nullptr : title;
}

int WSQL_KDH_StartServers() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    ServiceGuard held;
    if (gHubList != nullptr) {
        WSQL_Hub* local = nullptr;
        {
            LinkedListIter it(gHubList);
            for (void* v = it.Next(); v != nullptr && local == nullptr; v = it.Next())
                if (std::strcmp(static_cast<WSQL_Hub*>(v)->getServiceName(), "soap") == 0) local = static_cast<WSQL_Hub*>(v);
        }
        if (local != nullptr) startLocalHubFirst(local);
        LinkedListIter it(gHubList);
        for (void* v = it.Next(); v != nullptr; v = it.Next())
            if (v != local) (void)startHubThread(static_cast<WSQL_Hub*>(v));
    }
    RAS1_EXIT_RC(ras, 0);
    return WSQL_OK;
}

int WSQL_KDH_StartServer(WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    // A fault while serving ends this hub's thread with 8; the clean-up runs
    // on every way out. (The platform keeps no per-thread error context
    // beyond this recovery frame.)
    int rc = PFM1_Guard("WSQL_KDH_StartServer", [hub] { return serveHub(hub); });
    if (gAnchor != nullptr && (ras & RAS1_DETAIL))
        RAS1_Printf(RAS1_THIS, __LINE__, "anchor = %p anchor->parm[0] = %s", static_cast<void*>(gAnchor),
                    gAnchor->startParm != nullptr ? gAnchor->startParm : "");
    RAS1_Printf(RAS1_THIS, __LINE__, "Thread for hub %s is exiting with status %x", hub->getAliasName(),
                static_cast<unsigned>(rc));
    cleanupServer(hub);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void cleanupServer(WSQL_Hub* hub) {
    ServiceGuard held;
    hub->setKDHServer(0);
}

int WSQL_KDH_StopServer() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_NOTHING;
    ServiceGuard held;
    services().stopping = true;
    LinkedList* list = gHubList;
    WSQL_Hub* hub = nullptr;
    rc = PFM1_Guard("WSQL_KDH_StopServer", [&] {
        int last = WSQL_NOTHING;
        if (list == nullptr) return last;
        LinkedListIter it(list);
        for (void* v = it.Next(); v != nullptr; v = it.Next()) {
            hub = static_cast<WSQL_Hub*>(v);
            KDH1_server_t server = hub->getKDHServer();
            last = server != 0 ? static_cast<int>(KDH1_Delete(server)) : WSQL_OK;
        }
        return last;
    });
    if (rc == PFM1_ABEND)
        RAS1_Printf(RAS1_THIS, __LINE__, "Stop Server fault. list = %p hub = %p", static_cast<void*>(list),
                    static_cast<void*>(hub));
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_KDH_AddHub(WSQL_Hub* hub) {
    ServiceGuard held;
    if (services().stopping || gHubList == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Hub %s not started: the gateway is not running", hub->getAliasName());
        delete hub;
        return WSQL_NOTHING;
    }
    if (gHubList->AppendEntry(hub) != WSQL_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Hub %s cannot be listed", hub->getAliasName());
        delete hub;
        return WSQL_NOMEM;
    }
    int rc = startHubThread(hub);
    if (rc != WSQL_OK) (void)gHubList->RemoveEntry(hub);  // the list's destructor deletes it
    return rc;
}

void WSQL_KDH_PublishHubList(LinkedList* list) {
    ServiceGuard held;
    gHubList = list;
}

LinkedList* WSQL_KDH_JoinServers(int* joined) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    *joined = 0;
    for (;;) {
        WSQL_Hub* hub = nullptr;
        BSS1_Thread* thread = nullptr;
        {
            ServiceGuard held;
            if (gHubList == nullptr) break;
            LinkedListIter it(gHubList);
            for (void* v = it.Next(); v != nullptr && hub == nullptr; v = it.Next()) {
                auto* h = static_cast<WSQL_Hub*>(v);
                if (h->getThreadID() != nullptr) hub = h;
            }
            if (hub == nullptr) {
                // No thread left, and none can be added any more.
                LinkedList* list = gHubList;
                gHubList = nullptr;
                RAS1_EXIT(ras);
                return list;
            }
            thread = static_cast<BSS1_Thread*>(hub->getThreadID());
            hub->setThreadID(nullptr);
        }
        if (ras & RAS1_STATE)
            RAS1_Printf(RAS1_THIS, __LINE__, "Waiting for hub %.255s %.255s termination.", hub->getAliasName(),
                        hub->getLMSName());
        (void)BSS1_JoinThread(thread);
        if (ras & RAS1_STATE)
            RAS1_Printf(RAS1_THIS, __LINE__, "Hub %.255s %.255s terminated.", hub->getAliasName(), hub->getLMSName());
        ++*joined;
    }
    RAS1_EXIT(ras);
    return nullptr;
}

void WSQL_KDH_ResetStop() {
    ServiceGuard held;
    services().stopping = false;
}

bool WSQL_KDH_Stopping() {
    ServiceGuard held;
    return services().stopping;
}

int default_service(KDH1_request_struct* request) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    auto* hub = static_cast<WSQL_Hub*>(request->userData);
    const char* pathInfo = nullptr;
    bool finished = false;
    int rc = PFM1_Guard("default_service", [&] {
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Processing request for %s", hub ? hub->getAliasName() : "");
        int status = routeRequest(request, hub, &pathInfo);
        finished = true;
        return status;
    });
    if (!finished && pathInfo != nullptr && hub != nullptr)
        RAS1_Printf(RAS1_THIS, __LINE__, "System Error Request %s for %s", pathInfo, hub->getAliasName());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
