// kshstrt: starting and stopping the gateway.
//
// The host calls kshstart with its anchor record on a thread of its own;
// kshstart returns when the gateway's main routine (startServer) ends,
// which is after kshstop (on another host thread) has stopped the services.
// Three modes, chosen by the anchor's start parameter: none (plain), "test",
// and "START" (embedded in the monitoring server: the host's calls give the
// local server record and the VALIDATE setting, the local hub is served,
// and the end of the main routine is signalled through the anchor's
// completion event).
//
// The anchor stays the host's and must stay valid until kshstop returns.
#pragma once

#include <cstddef>
#include <cstdint>

#include "kshanchor.h"

// The exported entries (C linkage). Both return 0. The anchor may be null
// (plain mode without host).
extern "C" __attribute__((visibility("default"))) int kshstart(WSQL_Anchor* anchor, ...);
extern "C" __attribute__((visibility("default"))) int kshstop(WSQL_Anchor* anchor, ...);

// The main routine: prepares the shared facilities, builds gHubList, starts
// the hubs' services and waits until all of them have ended. 0.
int startServer(WSQL_Anchor* anchor);
// Terminates the request layer, stops the services and waits (at most 120
// seconds) for the main routine of a gateway started with `anchor`. 0, or
// the timed-out status of the wait.
int stopServer(WSQL_Anchor* anchor);
// Runs startServer without an anchor on a new (detached) thread. 0, or the
// thread-creation status.
int startServerThread();

// The wait status of an event whose deadline passed.
constexpr int WSQL_EVENT_TIMEDOUT = 110;

// The event discipline used between the gateway's threads: post sets the
// value and the posted flag under the mutex and wakes the waiter; a wait
// takes the mutex, waits until posted (or until the deadline), takes the
// value and clears value and posted flag.
void WSQL_ClearEvent(WSQL_AnchorEvent* event);
void WSQL_PostEvent(WSQL_AnchorEvent* event, uint32_t value);
// timeoutMillis < 0: no limit. 0 (with *value when given) or
// WSQL_EVENT_TIMEDOUT.
int WSQL_WaitEvent(WSQL_AnchorEvent* event, long long timeoutMillis, uint32_t* value);

// The thread stack size in bytes for a system minimum of `minimumBytes` (0:
// none reported) and a stack-size setting `setting` (kilobyte units; null or
// not a number: none). The minimum is rounded up to whole kilobytes and to a
// multiple of 128; a larger setting, rounded up to a multiple of 64, replaces
// it; the result is counted in 4096-byte units.
uint32_t WSQL_ThreadStackSize(size_t minimumBytes, const char* setting);
// The stack-size setting: the first of OVM_THREADSTACKSIZE,
// KDC_TASK_STACK_SIZE and KDS_THREADSTACKSIZE that is set, or null.
const char* WSQL_StackSizeSetting();

// Set-up of the layers of the special requests, called by startServer
// between the XML layer and the catalog (transform layer) and after the
// request layer (export layer). Defined in kshstrtspc.cpp.
void WSQL_InitTransformLayer();
void WSQL_InitExportLayer();
