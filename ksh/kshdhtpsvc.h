// kshdhtpsvc: the hubs' HTTP services and the request callback.
//
// Each hub of gHubList is served by one service of the HTTP layer (kdh1),
// created, published under its service-point name and listened on by a
// thread of its own. The layer calls default_service for every request; it
// wraps the request in a WSQL_KDHServer and routes it: POST to the SOAP
// request parser, GET with a query string beginning "action" to the URL
// request parser, everything else to the file server.
//
// Stopping deletes every hub's service, which ends its listen call and so
// its thread. A stop that comes while a hub's thread is still creating its
// service is not lost: the thread checks, under the service lock, whether
// the gateway is stopping before it starts listening, and hubs added after
// the stop began are refused.
#pragma once

#include <cstddef>

#include "kdh1/kdh1.h"

class LinkedList;
class WSQL_Hub;

// Room of a service-point name, terminator included.
constexpr size_t WSQL_SERVICE_POINT_SIZE = 256;

// Starts one service thread per hub of gHubList (stack size from the
// anchor). 0.
int WSQL_KDH_StartServers();
// The body of a hub's service thread: creates, publishes and listens on the
// hub's service until it is deleted. The exit status (0, the layer's status,
// or 8 after a fault).
int WSQL_KDH_StartServer(WSQL_Hub* hub);
// Deletes the service of every hub that has one. The status of the last
// deletion, 0 when the last hub had no service, 2 when the list is empty.
int WSQL_KDH_StopServer();
// Clean-up of a service thread: the hub has no service any more.
void cleanupServer(WSQL_Hub* hub);
// The request callback. The routed handler's status, or 8 after a fault.
int default_service(KDH1_request_struct* request);

// Appends `hub` to gHubList and starts its service thread. The hub is the
// gateway's from then on, also on failure (then it is deleted). 0, the
// thread-creation status (traced), 7 when it cannot be listed, or 2 when
// the gateway is not running or is stopping.
int WSQL_KDH_AddHub(WSQL_Hub* hub);
// Makes `list` the gateway's gHubList (startServer, before the services
// start).
void WSQL_KDH_PublishHubList(LinkedList* list);
// Joins the service thread of every hub of gHubList, hubs added meanwhile
// included, in list order; *joined gets their number. When no thread is
// left, takes gHubList back (null from then on, so no hub can be added) and
// returns it for the caller to delete. The hubs are released only then: a
// request of one hub may use another hub (named by its alias) until its own
// service has ended.
LinkedList* WSQL_KDH_JoinServers(int* joined);
// Forgets a finished stop, so that a gateway started again in this process
// serves (the main routine calls it when its hubs have ended).
void WSQL_KDH_ResetStop();
// True once WSQL_KDH_StopServer has begun (until WSQL_KDH_ResetStop).
bool WSQL_KDH_Stopping();

// The service-point name of a hub whose node identifier is `nodeId` (null
// or "": none), composed from KSH_SERVICEID (default "lms") and
// KSH_SERVICEPOINT (default the node identifier), into `out`
// (WSQL_SERVICE_POINT_SIZE bytes).
void WSQL_ServicePointName(const char* nodeId, char* out);
// The service title: KSH_SERVICETITLE, or the default title; null when the
// variable is "*".
const char* WSQL_ServiceTitle();
