// kdh1 services and the listener: the service registry, routing, the worker
// threads that run callbacks, the watchdog, and starting and stopping the
// HTTP engine with the first and last listening service.
#include <fcntl.h>
#include <netdb.h>
#include <netinet/in.h>
#include <strings.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "bss1/bss1.h"
#include "kdh1/kdh1int.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"

RAS1_UNIT("kdh1svc");

using namespace kdh1;

namespace {

constexpr size_t kMaxName = 63;
constexpr long long kWatchdogTickMillis = 25;
constexpr unsigned kPeerCheckTicks = 40;  // every second
constexpr int kSpinMicros = 50;

// Worker threads. They are started as requests need them, up to the
// listener's maxWorkers, and kept until the listener stops: a thread per
// concurrent callback is what the callbacks (which may block on a database or
// a slow client) need, and idle ones cost only their stacks.
struct Pool {
    std::mutex mu;
    std::condition_variable cv;
    std::deque<KDH1_Request*> jobs;  // guarded by mu
    std::vector<std::thread> threads;  // guarded by mu
    size_t idle = 0;                   // guarded by mu
    std::atomic<size_t> queued{0};     // jobs.size(), readable without mu
    std::atomic<size_t> spinning{0};   // workers looking for work before they sleep
    bool stop = false;                 // guarded by mu
    size_t max = 64;
};
Pool& pool() {
    static Pool p;
    return p;
}

struct Watchdog {
    std::thread thread;
    std::condition_variable cv;  // waits under Layer::mu
    bool stop = false;           // guarded by Layer::mu
};
Watchdog& watchdog() {
    static Watchdog w;
    return w;
}

Service* findLocked(Layer& L, KDH1_server_t id) {
    for (Service* s : L.services)
        if (s->id == id) return s;
    return nullptr;
}

// Ends a request the layer could not give to a worker: the client gets 503.
void refuse(KDH1_Request* r) {
    {
        std::lock_guard<std::mutex> g(r->mu);
        r->producerDone = true;
        cancelLocked(r, BSS1_MonotonicMillis());
    }
    Layer& L = layer();
    {
        std::lock_guard<std::mutex> g(L.mu);
        r->service->active--;
        L.registry.erase(r);
        L.changed.notify_all();
    }
    release(r);
}

void runJob(KDH1_Request* r) {
    int ras = RAS1_Sync(RAS1_THIS);
    Service* s = r->service;
    int rc = PFM1_Guard("kdh1 service callback", [&] { return s->callback(&r->record); });
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Service %s request done rc=%d", s->name.c_str(), rc);
    finishCallback(r);
    Layer& L = layer();
    {
        std::lock_guard<std::mutex> g(L.mu);
        s->active--;
        L.registry.erase(r);
        L.changed.notify_all();
    }
    release(r);
}

// Looks for a job for a short while before the worker goes to sleep: under
// load the next job comes within microseconds, and taking it this way spares
// the wake-up of a sleeping thread, which costs more than the spin.
bool spinForJob(Pool& P) {
    auto until = std::chrono::steady_clock::now() + std::chrono::microseconds(kSpinMicros);
    while (P.queued.load(std::memory_order_relaxed) == 0) {
        for (int i = 0; i < 64; i++) __builtin_ia32_pause();
        if (std::chrono::steady_clock::now() >= until) return false;
    }
    return true;
}

void workerMain() {
    Pool& P = pool();
    std::unique_lock<std::mutex> g(P.mu);
    for (;;) {
        if (P.jobs.empty() && !P.stop) {
            P.spinning++;
            g.unlock();
            spinForJob(P);
            P.spinning--;  // before the lock: submit then sees this worker as not spinning
            g.lock();
        }
        while (P.jobs.empty() && !P.stop) {
            P.idle++;
            P.cv.wait(g);
            P.idle--;
        }
        if (P.jobs.empty()) return;
        KDH1_Request* r = P.jobs.front();
        P.jobs.pop_front();
        P.queued = P.jobs.size();
        g.unlock();
        runJob(r);
        g.lock();
    }
}

void stopPool() {
    Pool& P = pool();
    std::vector<std::thread> threads;
    {
        std::lock_guard<std::mutex> g(P.mu);
        P.stop = true;
        threads.swap(P.threads);
    }
    P.cv.notify_all();
    for (auto& t : threads) t.join();
    std::lock_guard<std::mutex> g(P.mu);
    P.stop = false;
}

// True when the client has closed its end of a parked connection.
bool peerClosed(int fd) {
    if (fd < 0) return false;
    char c;
    ssize_t n = recv(fd, &c, 1, MSG_PEEK | MSG_DONTWAIT);
    if (n == 0) return true;
    return n < 0 && errno != EAGAIN && errno != EWOULDBLOCK && errno != EINTR;
}

// One look at a parked request. REQUIRES: Layer::mu and r->mu held.
void watchRequest(KDH1_Request* r, long long now, bool peerCheck) {
    if (!r->parked) return;
    if (peerCheck && peerClosed(r->fd)) {
        r->peerGone = true;
        cancelLocked(r, now);
        return;
    }
    if (r->entityCreated && r->pendingSince && now - r->pendingSince >= kFlushMillis) {
        wakeLocked(r, now, true);
        return;
    }
    long long stall = (long long)layer().running.stallSeconds * 1000;
    if (now - r->lastProgress >= stall) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Request %s stalled for %lld ms, cancelled", r->pathRaw.c_str(),
                    now - r->lastProgress);
        cancelLocked(r, now);
    }
}

void watchdogMain() {
    Layer& L = layer();
    Watchdog& W = watchdog();
    std::unique_lock<std::mutex> g(L.mu);
    unsigned tick = 0;
    while (!W.stop) {
        W.cv.wait_for(g, std::chrono::milliseconds(kWatchdogTickMillis));
        bool peerCheck = ++tick % kPeerCheckTicks == 0;
        long long now = BSS1_MonotonicMillis();
        for (KDH1_Request* r : L.registry) {
            std::lock_guard<std::mutex> rg(r->mu);
            watchRequest(r, now, peerCheck);
        }
    }
}

void engineLog(void*, const char* fmt, va_list ap) { RAS1_VPrintf(RAS1_THIS, __LINE__, fmt, ap); }

// Opens, binds and listens on the layer's address; -1 on failure.
int openListenSocket(const std::string& address, int port, int* bound) {
    addrinfo hints{};
    hints.ai_family = AF_UNSPEC;
    hints.ai_socktype = SOCK_STREAM;
    hints.ai_flags = AI_PASSIVE | AI_NUMERICSERV;
    char service[16];
    snprintf(service, sizeof service, "%d", port);
    addrinfo* list = nullptr;
    int gai = getaddrinfo(address.c_str(), service, &hints, &list);
    if (gai != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Cannot resolve listen address %s: %s", address.c_str(), gai_strerror(gai));
        return -1;
    }
    int fd = -1;
    for (addrinfo* a = list; a && fd < 0; a = a->ai_next) {
        fd = socket(a->ai_family, a->ai_socktype | SOCK_CLOEXEC | SOCK_NONBLOCK, a->ai_protocol);
        if (fd < 0) continue;
        int on = 1;
        setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
        if (bind(fd, a->ai_addr, a->ai_addrlen) != 0 || listen(fd, 511) != 0) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Cannot listen on %s:%d: %s", address.c_str(), port, strerror(errno));
            close(fd);
            fd = -1;
        }
    }
    freeaddrinfo(list);
    if (fd < 0) return -1;
    sockaddr_storage ss{};
    socklen_t len = sizeof ss;
    getsockname(fd, reinterpret_cast<sockaddr*>(&ss), &len);
    *bound = ntohs(ss.ss_family == AF_INET6 ? reinterpret_cast<sockaddr_in6*>(&ss)->sin6_port
                                             : reinterpret_cast<sockaddr_in*>(&ss)->sin_port);
    return fd;
}

// REQUIRES: Layer::mu held, no listener running.
uint32_t startListenerLocked(Layer& L) {
    int ras = RAS1_Sync(RAS1_THIS);
    L.running = effectiveLimits(L.limits);
    int bound = 0;
    int fd = openListenSocket(L.address, L.port, &bound);
    if (fd < 0) return KDH1_STC_LISTENFAILED;
    pool().max = L.running.maxWorkers;
    unsigned flags = MHD_USE_INTERNAL_POLLING_THREAD | MHD_USE_EPOLL | MHD_ALLOW_SUSPEND_RESUME | MHD_USE_ERROR_LOG;
    // One network thread runs without a pool (the engine refuses a pool of 1).
    unsigned threads = L.running.networkThreads;
    MHD_OptionItem options[] = {
        {MHD_OPTION_EXTERNAL_LOGGER, (intptr_t)engineLog, nullptr},
        {MHD_OPTION_LISTEN_SOCKET, fd, nullptr},
        {MHD_OPTION_CONNECTION_LIMIT, (intptr_t)L.running.connectionLimit, nullptr},
        {MHD_OPTION_CONNECTION_TIMEOUT, (intptr_t)L.running.connectionTimeout, nullptr},
        {MHD_OPTION_CONNECTION_MEMORY_LIMIT, (intptr_t)L.running.connectionMemory, nullptr},
        {MHD_OPTION_URI_LOG_CALLBACK, (intptr_t)uriCallback, nullptr},
        {MHD_OPTION_NOTIFY_COMPLETED, (intptr_t)completedCallback, nullptr},
        {threads > 1 ? MHD_OPTION_THREAD_POOL_SIZE : MHD_OPTION_END, (intptr_t)threads, nullptr},
        {MHD_OPTION_END, 0, nullptr},
    };
    MHD_Daemon* d = MHD_start_daemon(flags, 0, nullptr, nullptr, accessCallback, nullptr, MHD_OPTION_ARRAY, options,
                                     MHD_OPTION_END);
    if (!d) {
        RAS1_Printf(RAS1_THIS, __LINE__, "HTTP engine did not start on %s:%d", L.address.c_str(), bound);
        close(fd);
        return KDH1_STC_LISTENFAILED;
    }
    L.daemon = d;
    L.listenFd = fd;
    L.boundPort = bound;
    watchdog().stop = false;
    watchdog().thread = std::thread(watchdogMain);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Listening on %s:%d", L.address.c_str(), bound);
    return KDH1_STC_OK;
}

// Stops the engine. By now every callback has returned, so no connection
// stays suspended (the engine must not be stopped with suspended ones).
// REQUIRES: Layer::mu not held (the engine's threads may be waiting for it).
void stopListener(MHD_Daemon* d, int fd) {
    {
        std::lock_guard<std::mutex> g(layer().mu);
        watchdog().stop = true;
    }
    watchdog().cv.notify_all();
    watchdog().thread.join();
    MHD_quiesce_daemon(d);  // the listening socket stays ours to close
    MHD_stop_daemon(d);
    close(fd);
    stopPool();
}

// Waits for the service's callbacks, frees it, and stops the listener when it
// was the last one listening. REQUIRES: g holds Layer::mu; s was listening.
void leaveListen(Layer& L, std::unique_lock<std::mutex>& g, Service* s) {
    L.changed.wait(g, [&] { return s->active == 0; });
    delete s;
    if (--L.listeners > 0 || !L.daemon) return;
    MHD_Daemon* d = L.daemon;
    int fd = L.listenFd;
    L.daemon = nullptr;
    L.listenFd = -1;
    L.boundPort = 0;
    L.stopping = true;
    g.unlock();
    stopListener(d, fd);
    g.lock();
    L.stopping = false;
    L.changed.notify_all();
}

}  // namespace

namespace kdh1 {

Layer& layer() {
    static Layer L;
    return L;
}

KDH1_limits_struct effectiveLimits(const KDH1_limits_struct& set) {
    KDH1_limits_struct e = set;
    BSS1_HostInfo info;
    int cores = BSS1_Info(&info) == 0 && info.cpuCount > 0 ? info.cpuCount : 1;
    if (!e.maxEntity) e.maxEntity = 8u << 20;
    if (!e.connectionLimit) e.connectionLimit = 512;
    if (!e.connectionTimeout) e.connectionTimeout = 60;
    if (!e.connectionMemory) e.connectionMemory = 48u << 10;
    // The engine needs room for the headers and one stream block.
    if (e.connectionMemory < 40u << 10) e.connectionMemory = 40u << 10;
    if (!e.networkThreads) e.networkThreads = static_cast<unsigned>(cores);
    if (!e.maxWorkers) e.maxWorkers = 64;
    if (!e.streamBuffer) e.streamBuffer = 256u << 10;
    if (!e.stallSeconds) e.stallSeconds = 300;
    return e;
}

Service* routeAndRegister(KDH1_Request* r) {
    Layer& L = layer();
    const std::string& p = r->pathInfo;
    size_t begin = p.empty() || p[0] != '/' ? 0 : 1;
    size_t end = p.find('/', begin);
    size_t n = (end == std::string::npos ? p.size() : end) - begin;
    std::lock_guard<std::mutex> g(L.mu);
    Service* chosen = nullptr;
    for (Service* s : L.services) {
        if (!s->listening) continue;
        if (!chosen) chosen = s;
        if (n > 0 && s->name.size() == n && strncasecmp(s->name.c_str(), p.c_str() + begin, n) == 0) {
            chosen = s;
            break;
        }
    }
    if (!chosen) return nullptr;
    chosen->active++;
    r->service = chosen;
    L.registry.insert(r);
    return chosen;
}

void submit(KDH1_Request* r) {
    Pool& P = pool();
    std::unique_lock<std::mutex> g(P.mu);
    P.jobs.push_back(r);
    P.queued = P.jobs.size();
    if (P.jobs.size() > P.idle + P.spinning && P.threads.size() < P.max) {
        try {
            P.threads.emplace_back(workerMain);
            return;
        } catch (...) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Cannot start a worker thread (%zu running)", P.threads.size());
            if (P.threads.empty()) {
                P.jobs.pop_back();
                g.unlock();
                refuse(r);
                return;
            }
        }
    }
    bool taken = P.jobs.size() <= P.spinning;  // a spinning worker will take it
    g.unlock();  // the woken worker should not find the lock still taken
    if (!taken) P.cv.notify_one();
}

}  // namespace kdh1

uint32_t KDH1_SetListenAddress(const char* address, int port) {
    if (!address || !*address || strlen(address) > 255 || port < 0 || port > 65535) return KDH1_STC_BADARG;
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    L.address = address;
    L.port = port;
    return KDH1_STC_OK;
}

int KDH1_BoundPort() {
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    return L.boundPort;
}

uint32_t KDH1_SetLimits(const KDH1_limits_struct* limits) {
    if (!limits) return KDH1_STC_BADARG;
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    L.limits = *limits;
    return KDH1_STC_OK;
}

void KDH1_GetLimits(KDH1_limits_struct* limits) {
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    *limits = effectiveLimits(L.limits);
}

uint32_t KDH1_New(KDH1_server_t* server, const char* name, KDH1_service_t callback, void* userData, int, int) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    uint32_t rc = KDH1_STC_OK;
    if (!server || !name || !callback || strlen(name) > kMaxName) rc = KDH1_STC_BADARG;
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    for (Service* s : L.services)
        if (rc == KDH1_STC_OK && *name && strcasecmp(s->name.c_str(), name) == 0) rc = KDH1_STC_EXISTS;
    if (rc == KDH1_STC_OK) {
        auto* s = new (std::nothrow) Service;
        if (!s) {
            rc = KDH1_STC_NOMEMORY;
        } else {
            s->id = L.nextId++;
            s->name = name;
            s->callback = callback;
            s->userData = userData;
            L.services.push_back(s);
            *server = s->id;
            if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Service %s created as %lu", name, s->id);
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

uint32_t KDH1_PublishService(KDH1_server_t server, int, int, const char* title, int, const char* servicePoint, int) {
    int ras = RAS1_Sync(RAS1_THIS);
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    Service* s = findLocked(L, server);
    if (!s) return KDH1_STC_BADHANDLE;
    s->hasTitle = title != nullptr;
    s->title = title ? title : "";
    s->servicePoint = servicePoint ? servicePoint : "";
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Service %s published as %s", s->name.c_str(), s->servicePoint.c_str());
    return KDH1_STC_OK;
}

uint32_t KDH1_Listen(KDH1_server_t server, int) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    Layer& L = layer();
    std::unique_lock<std::mutex> g(L.mu);
    Service* s = findLocked(L, server);
    if (!s || s->listening) {
        RAS1_EXIT_RC(ras, KDH1_STC_BADHANDLE);
        return KDH1_STC_BADHANDLE;
    }
    // Listening from here on, so that a Delete while the listener is still
    // stopping leaves the service to this thread.
    s->listening = true;
    L.changed.wait(g, [&] { return !L.stopping; });
    uint32_t rc = KDH1_STC_OK;
    if (!s->deleted && !L.daemon) rc = startListenerLocked(L);
    if (rc != KDH1_STC_OK || s->deleted) {
        s->listening = false;
        if (s->deleted) delete s;
        RAS1_EXIT_RC(ras, rc);
        return rc;
    }
    L.listeners++;
    L.changed.wait(g, [&] { return s->deleted; });
    leaveListen(L, g, s);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

uint32_t KDH1_Delete(KDH1_server_t server) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    Service* s = findLocked(L, server);
    if (!s) {
        RAS1_EXIT_RC(ras, KDH1_STC_BADHANDLE);
        return KDH1_STC_BADHANDLE;
    }
    std::erase(L.services, s);
    s->deleted = true;
    long long now = BSS1_MonotonicMillis();
    for (KDH1_Request* r : L.registry) {
        if (r->service != s) continue;
        std::lock_guard<std::mutex> rg(r->mu);
        cancelLocked(r, now);
    }
    if (s->listening) {
        // The listening thread frees it once its callbacks have returned.
        s->listening = false;
        L.changed.notify_all();
    } else {
        delete s;
    }
    RAS1_EXIT_RC(ras, KDH1_STC_OK);
    return KDH1_STC_OK;
}

uint32_t KDH1_QueryService(KDH1_server_t server, KDH1_service_info* info) {
    if (!info) return KDH1_STC_BADARG;
    Layer& L = layer();
    std::lock_guard<std::mutex> g(L.mu);
    Service* s = findLocked(L, server);
    if (!s) return KDH1_STC_BADHANDLE;
    snprintf(info->name, sizeof info->name, "%s", s->name.c_str());
    snprintf(info->title, sizeof info->title, "%s", s->title.c_str());
    snprintf(info->servicePoint, sizeof info->servicePoint, "%s", s->servicePoint.c_str());
    info->hasTitle = s->hasTitle;
    info->listening = s->listening;
    return KDH1_STC_OK;
}
