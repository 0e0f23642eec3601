// kdh1 internals shared by its sources: the service registry, the request
// object and the listener. Nothing outside platform/kdh1 includes this.
//
// Threads:
//   network threads (the HTTP engine's pool) parse requests, park them while a
//   callback works, and copy streamed body bytes to the socket;
//   worker threads run service callbacks;
//   the watchdog wakes parked requests whose pending bytes have waited long
//   enough, cancels requests whose client went away or that stalled;
//   listening threads block in KDH1_Listen.
// Locks: Layer::mu (services, registry, listener state) is taken before a
// request's mu, never after. The engine's suspend/resume calls are made with
// the request's mu held, so "parked" always says whether the connection is
// suspended.
#pragma once

#include <microhttpd.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <mutex>
#include <string>
#include <thread>
#include <unordered_set>
#include <utility>
#include <vector>

#include "kdh1/kdh1.h"

namespace kdh1 {

// Returns a stream buffer to the layer's pool (or frees it); null is ignored.
void giveBuffer(void* buffer);

struct Service {
    KDH1_server_t id = 0;
    std::string name;
    KDH1_service_t callback = nullptr;
    void* userData = nullptr;
    std::string title;
    bool hasTitle = false;
    std::string servicePoint;
    bool listening = false;  // guarded by Layer::mu
    bool deleted = false;    // guarded by Layer::mu
    int active = 0;          // callbacks queued or running; guarded by Layer::mu
};

enum class Phase { Receiving, Parked, Streaming, Answered };

}  // namespace kdh1

// One request, shared by the network side (from the URI callback to the
// completion callback) and by the worker running its callback. Freed when
// both have let go (refs).
struct KDH1_Request {
    KDH1_Request(const KDH1_Request&) = delete;
    KDH1_Request& operator=(const KDH1_Request&) = delete;
    KDH1_Request(MHD_Connection* c, const char* uri) : conn(c), target(uri ? uri : "") {}
    ~KDH1_Request() { kdh1::giveBuffer(buf); }

    // Fixed before the callback runs; read without the lock.
    MHD_Connection* conn;
    std::string target;  // the raw request target
    std::string method, pathRaw, pathInfo, query, client;
    std::vector<std::pair<std::string, std::string>> headers;  // every request header
    std::vector<KDH1_header_struct> table;                     // the known kinds, into the strings above
    KDH1_request_struct record{};
    std::string body;  // the request body, at most the entity limit
    size_t bodyRead = 0;
    int fd = -1;
    kdh1::Service* service = nullptr;
    kdh1::Phase phase = kdh1::Phase::Receiving;  // network threads only
    bool firstCall = true;                       // network threads only
    bool tooLarge = false;                       // network threads only
    size_t discarded = 0;                        // network threads only
    std::atomic<int> refs{1};

    std::mutex mu;
    std::condition_variable room;  // a producer waits here for buffer space
    // Everything below is guarded by mu.
    bool responded = false;       // KDH1_Response was called
    bool entityCreated = false;   // KDH1_CreateEntity was called
    uint32_t status = KDH1_STC_OK;
    std::vector<std::pair<std::string, std::string>> extra;  // extra response headers
    uint32_t media = KDH1_MEDIA_NONE;
    uint64_t contentLength = 0;  // announced, 0 = not announced
    uint64_t accepted = 0;       // body bytes taken by KDH1_Put
    uint64_t sent = 0;           // body bytes handed to the engine
    uint32_t options = 0;        // activity option set 4
    char* buf = nullptr;         // stream buffer (pooled, cap bytes), bytes [rd, wr) pending
    size_t rd = 0, wr = 0, cap = 0;
    bool producerDone = false;   // the callback has returned
    bool cancelled = false;      // client gone, stalled or service deleted
    bool peerGone = false;       // the client closed its end
    bool mhdDone = false;        // the engine finished with the connection
    bool parked = false;         // the connection is suspended
    bool started = false;        // the response was handed to the engine
    long long lastProgress = 0;  // monotonic ms of the last step forward
    long long pendingSince = 0;  // monotonic ms since headers or bytes wait while parked
};

namespace kdh1 {

// Process-wide state of the layer.
struct Layer {
    std::mutex mu;
    std::condition_variable changed;  // listening threads and listener start/stop wait here
    std::vector<Service*> services;   // in order of KDH1_New
    KDH1_server_t nextId = 1;
    std::string address = "127.0.0.1";
    int port = 15200;
    KDH1_limits_struct limits{};       // as set; zero fields use defaults
    KDH1_limits_struct running{};      // effective values of the running listener
    MHD_Daemon* daemon = nullptr;
    int listenFd = -1;
    int boundPort = 0;
    int listeners = 0;
    bool stopping = false;
    std::unordered_set<KDH1_Request*> registry;  // requests whose callback is queued or running
};

Layer& layer();

// Effective settings: `set` with defaults filled in.
KDH1_limits_struct effectiveLimits(const KDH1_limits_struct& set);

// Bytes pending before a parked request is woken to send them.
constexpr size_t kWakeBytes = 128 * 1024;
// Milliseconds pending bytes may wait in a parked request before the watchdog
// sends them anyway (a producer that pauses between small writes).
constexpr long long kFlushMillis = 20;

// Request reference counting.
inline void addRef(KDH1_Request* r) { r->refs.fetch_add(1, std::memory_order_relaxed); }
void release(KDH1_Request* r);

// Resumes the connection when the request is parked and has reason to go on
// (cancelled, callback done, enough pending bytes or `force`).
// REQUIRES: r->mu held.
void wakeLocked(KDH1_Request* r, long long now, bool force = false);
// Marks the request cancelled and wakes whoever waits on it.
// REQUIRES: r->mu held.
void cancelLocked(KDH1_Request* r, long long now);

// The engine's callbacks (kdh1mhd.cpp).
void* uriCallback(void* cls, const char* uri, MHD_Connection* conn);
MHD_Result accessCallback(void* cls, MHD_Connection* conn, const char* url, const char* method,
                          const char* version, const char* uploadData, size_t* uploadSize, void** ctx);
void completedCallback(void* cls, MHD_Connection* conn, void** ctx, MHD_RequestTerminationCode toe);

// Routes a request: the service for its first path segment, else the first
// listening one; counts it active and registers the request. Null when no
// service listens. (kdh1svc.cpp)
Service* routeAndRegister(KDH1_Request* r);
// Hands a routed request to a worker thread (kdh1svc.cpp).
void submit(KDH1_Request* r);
// Called by the worker when the callback has returned (kdh1req.cpp).
void finishCallback(KDH1_Request* r);

// Tables (kdh1req.cpp).
KDH1_hdr_t kindOfHeaderName(const char* name);  // 0 when not a known kind
const char* sendableHeaderName(uint32_t kind);  // null when the kind cannot be sent
uint32_t mediaOfContentType(const char* contentType);

}  // namespace kdh1
