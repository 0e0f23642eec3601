// kshstrt: starting and stopping the gateway (see kshstrt.h).
#include "kshstrt.h"

#include <cctype>
#include <chrono>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <mutex>

#include "bss1/bss1.h"
#include "kshdhtpsvc.h"
#include "kshhub.h"
#include "kshreq.h"
#include "kshssrv.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshstrt");

namespace {

// How long stopServer waits for the main routine.
constexpr long long kStopWaitMillis = 120 * 1000;

// A setting of the stack size is a plain unsigned decimal number.
bool parseUnsigned(const char* text, unsigned long long* out) {
    if (text == nullptr || *text == '\0') return false;
    unsigned long long v = 0;
    for (const char* p = text; *p != '\0'; ++p) {
        if (!std::isdigit(static_cast<unsigned char>(*p))) return false;
        if (v > (ULLONG_MAX - 9) / 10) return false;
        v = v * 10 + static_cast<unsigned>(*p - '0');
    }
    *out = v;
    return true;
}

unsigned long long roundUp(unsigned long long v, unsigned long long unit) { return (v + unit - 1) / unit * unit; }

void computeStackSize(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    anchor->threadStackSize = WSQL_ThreadStackSize(BSS1_MinThreadStack(), WSQL_StackSizeSetting());
    if (ras & RAS1_DETAIL)
        RAS1_Printf(RAS1_THIS, __LINE__, "ksh http listen stack size %dK", static_cast<int>(anchor->threadStackSize / 1024));
}

void initializeFacilities() {
    (void)KSH_XML::initializeXML();
    WSQL_InitTransformLayer();
    (void)WSQL_GetCatalog();
    (void)WSQL_Request::initialize();
    WSQL_InitExportLayer();
}

int mainRoutine(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_SetFileDirectory(BSS1_GetEnv("KSH_DIRECTORY", "HTML"));
    gAnchor = anchor;
    if (anchor != nullptr) computeStackSize(anchor);
    initializeFacilities();
    LinkedList* hubs = WSQL_build_hub_list(anchor);
    if (hubs == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error : No hub list");
        return WSQL_OK;
    }
    WSQL_KDH_PublishHubList(hubs);
    if (!WSQL_KDH_Stopping()) (void)WSQL_KDH_StartServers();
    int joined = 0;
    hubs = WSQL_KDH_JoinServers(&joined);
    if (hubs == nullptr || hubs->NumEntries() == 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error : No hubs on hub list");
    } else {
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "%d hubs have been terminated.", joined);
    }
    delete hubs;
    return WSQL_OK;
}

// Ends the main routine: a later start in this process begins afresh.
void finishMainRoutine(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_KDH_ResetStop();
    gAnchor = nullptr;
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "main thread is terminating");
    // Every mode with an anchor posts the completion event, so that stopServer
    // can wait for the end whatever the mode.
    if (anchor == nullptr || (anchor->flags & WSQL_ANCHOR_EMBEDDED) == 0) BSS1_Sleep(5);
    if (anchor != nullptr) WSQL_PostEvent(&anchor->completion, 1);
}

// START mode: the host's calls give the local server and the VALIDATE
// setting. False when the host cannot describe the local server.
bool prepareEmbedded(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = anchor->serverInfo != nullptr ? anchor->serverInfo(&anchor->hostField, &anchor->localServer) : WSQL_NOTHING;
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to get the local server information, rc=%d", rc);
        return false;
    }
    anchor->flags |= WSQL_ANCHOR_EMBEDDED;
    if (anchor->configCompare != nullptr) {
        if (anchor->configCompare("VALIDATE", "YES") == 0) {
            anchor->flags |= WSQL_ANCHOR_VALIDATE;
        } else if (anchor->configCompare("VALIDATE", "NO") == 0) {
            anchor->flags &= ~WSQL_ANCHOR_VALIDATE;
        }
    }
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "START mode flags 0x%08x", anchor->flags);
    return true;
}

struct StartMode {
    const char* parm;   // compared in any case
    bool embedded;
};
constexpr StartMode kModes[] = {
    {"test", false},
    {"START", true},
};

void serverThreadBody(void*) { (void)startServer(nullptr); }

}  // namespace

uint32_t WSQL_ThreadStackSize(size_t minimumBytes, const char* setting) {
    unsigned long long kb = minimumBytes != 0 ? roundUp(minimumBytes, 1024) / 1024 : 1;
    kb = roundUp(kb, 128);
    unsigned long long wanted = 0;
    if (parseUnsigned(setting, &wanted) && wanted > kb) kb = roundUp(wanted, 64);
    // The stored size is a 32-bit byte count: larger settings are capped.
    const unsigned long long maxKb = (UINT32_MAX / 4096) / 64 * 64;
    if (kb > maxKb) kb = maxKb;
    return static_cast<uint32_t>(kb * 4096);
}

const char* WSQL_StackSizeSetting() {
    static const char* const kNames[] = {"OVM_THREADSTACKSIZE", "KDC_TASK_STACK_SIZE", "KDS_THREADSTACKSIZE"};
    for (const char* name : kNames)
        if (const char* v = BSS1_GetEnv(name, nullptr)) return v;
    return nullptr;
}

void WSQL_ClearEvent(WSQL_AnchorEvent* event) {
    std::lock_guard<std::mutex> hold(event->mutex);
    event->value = 0;
    event->posted = 0;
}

void WSQL_PostEvent(WSQL_AnchorEvent* event, uint32_t value) {
    std::lock_guard<std::mutex> hold(event->mutex);
    event->value = value;
    event->posted = 1;
    event->cond.notify_all();
}

int WSQL_WaitEvent(WSQL_AnchorEvent* event, long long timeoutMillis, uint32_t* value) {
    std::unique_lock<std::mutex> hold(event->mutex);
    auto posted = [event] { return event->posted != 0; };
    if (timeoutMillis < 0) {
        event->cond.wait(hold, posted);
    } else if (!event->cond.wait_until(hold, std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMillis),
                                       posted)) {
        return WSQL_EVENT_TIMEDOUT;
    }
    if (value != nullptr) *value = event->value;
    event->value = 0;
    event->posted = 0;
    return WSQL_OK;
}

int startServer(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = PFM1_Guard("startServer", [&] { return mainRoutine(anchor); });
    finishMainRoutine(anchor);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int stopServer(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    (void)WSQL_Request::terminate();
    (void)WSQL_KDH_StopServer();
    int rc = WSQL_OK;
    if (anchor != nullptr) {
        rc = WSQL_WaitEvent(&anchor->completion, kStopWaitMillis, nullptr);
        if (rc != WSQL_OK || (ras & RAS1_STATE))
            RAS1_Printf(RAS1_THIS, __LINE__, "Wait Complete for Server main thread rc = %d", rc);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int startServerThread() {
    int ras = RAS1_Sync(RAS1_THIS);
    BSS1_Thread* thread = nullptr;
    size_t stack = gAnchor != nullptr ? gAnchor->threadStackSize : 0;
    int rc = BSS1_CreateThread(&thread, stack, serverThreadBody, nullptr);
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to start KDH server thread st=%d", rc);
        return rc;
    }
    (void)BSS1_DetachThread(thread);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Running KDH server on seperate thread.");
    return WSQL_OK;
}

extern "C" int kshstart(WSQL_Anchor* anchor, ...) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (anchor == nullptr || anchor->parmPresent == 0) {
        if (anchor != nullptr) WSQL_ClearEvent(&anchor->completion);
        (void)startServer(anchor);
        RAS1_EXIT_RC(ras, 0);
        return 0;
    }
    const char* parm = anchor->startParm != nullptr ? anchor->startParm : "";
    const StartMode* mode = nullptr;
    for (const StartMode& m : kModes)
        if (WSQL_CaseCompare(parm, m.parm) == 0) mode = &m;
    if (mode == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "*** Error *** Unsupported parm '%s'", parm);
    } else if (!mode->embedded || prepareEmbedded(anchor)) {
        WSQL_ClearEvent(&anchor->completion);
        (void)startServer(anchor);
    }
    RAS1_EXIT_RC(ras, 0);
    return 0;
}

extern "C" int kshstop(WSQL_Anchor* anchor, ...) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    (void)stopServer(anchor);
    // The completion event's condition variable and mutex are members of the
    // anchor and go with it; there is nothing to destroy here.
    RAS1_EXIT_RC(ras, 0);
    return 0;
}
