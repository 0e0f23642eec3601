// The HTTP service layer, driven by real HTTP clients on loopback.
#include "kdh1/kdh1.h"

#include <arpa/inet.h>
#include <curl/curl.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <functional>
#include <map>
#include <string>
#include <thread>
#include <vector>

namespace {

using Handler = std::function<int(KDH1_request_struct*)>;

int trampoline(KDH1_request_struct* r) { return (*static_cast<Handler*>(r->userData))(r); }

bool waitFor(const std::function<bool()>& cond, int millis = 10000) {
    for (int waited = 0; waited < millis; waited += 5) {
        if (cond()) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return cond();
}

// A service listening on its own thread for the life of the object.
class Listening {
public:
    Listening(const char* name, Handler h) : handler_(std::move(h)) {
        rcNew_ = KDH1_New(&server_, name, trampoline, &handler_, 0, 0);
        if (rcNew_ != KDH1_STC_OK) return;
        thread_ = std::thread([this] { rcListen_ = KDH1_Listen(server_, 0); });
        waitFor([this] {
            KDH1_service_info info;
            return KDH1_BoundPort() != 0 && KDH1_QueryService(server_, &info) == 0 && info.listening;
        });
    }
    Listening(const Listening&) = delete;
    Listening& operator=(const Listening&) = delete;
    ~Listening() { stop(); }
    uint32_t stop() {
        if (!thread_.joinable()) return KDH1_STC_OK;
        uint32_t rc = KDH1_Delete(server_);
        thread_.join();
        return rc;
    }
    uint32_t newStatus() const { return rcNew_; }
    uint32_t listenStatus() const { return rcListen_; }
    KDH1_server_t server() const { return server_; }

private:
    Handler handler_;
    KDH1_server_t server_ = 0;
    uint32_t rcNew_ = 0;
    std::atomic<uint32_t> rcListen_{0xFFFFFFFF};
    std::thread thread_;
};

std::string url(const std::string& path) { return "http://127.0.0.1:" + std::to_string(KDH1_BoundPort()) + path; }

struct Reply {
    CURLcode rc = CURLE_OK;
    long status = 0;
    std::string body;
    std::map<std::string, std::string> headers;  // lower-case names
};

struct Ask {
    std::string method = "GET";
    std::string body;
    bool chunked = false;
    std::vector<std::string> headers;
    std::function<bool(size_t received)> onData;  // false aborts the transfer
};

size_t onHeader(char* p, size_t, size_t n, void* ud) {
    std::string line(p, n);
    size_t colon = line.find(':');
    if (colon != std::string::npos) {
        std::string name = line.substr(0, colon);
        for (auto& c : name) c = static_cast<char>(tolower(c));
        std::string value = line.substr(colon + 1);
        value.erase(0, value.find_first_not_of(' '));
        value.erase(value.find_last_not_of("\r\n") + 1);
        static_cast<Reply*>(ud)->headers[name] = value;
    }
    return n;
}

struct Transfer {
    Reply* reply;
    const Ask* ask;
    size_t sentBody = 0;
};

size_t onBody(char* p, size_t, size_t n, void* ud) {
    auto* t = static_cast<Transfer*>(ud);
    t->reply->body.append(p, n);
    if (t->ask->onData && !t->ask->onData(t->reply->body.size())) return 0;
    return n;
}

size_t onRead(char* p, size_t size, size_t n, void* ud) {
    auto* t = static_cast<Transfer*>(ud);
    size_t left = t->ask->body.size() - t->sentBody;
    size_t k = std::min(left, size * n);
    memcpy(p, t->ask->body.data() + t->sentBody, k);
    t->sentBody += k;
    return k;
}

Reply fetch(const std::string& target, const Ask& ask = Ask()) {
    Reply reply;
    Transfer t{&reply, &ask};
    CURL* c = curl_easy_init();
    curl_slist* hs = nullptr;
    for (const auto& h : ask.headers) hs = curl_slist_append(hs, h.c_str());
    curl_easy_setopt(c, CURLOPT_URL, target.c_str());
    curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(c, CURLOPT_TIMEOUT, 60L);
    curl_easy_setopt(c, CURLOPT_HEADERFUNCTION, onHeader);
    curl_easy_setopt(c, CURLOPT_HEADERDATA, &reply);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, onBody);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, &t);
    if (ask.method == "POST") {
        curl_easy_setopt(c, CURLOPT_POST, 1L);
        curl_easy_setopt(c, CURLOPT_READFUNCTION, onRead);
        curl_easy_setopt(c, CURLOPT_READDATA, &t);
        if (ask.chunked)
            hs = curl_slist_append(hs, "Transfer-Encoding: chunked");
        else
            curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE_LARGE, (curl_off_t)ask.body.size());
    } else if (ask.method == "HEAD") {
        curl_easy_setopt(c, CURLOPT_NOBODY, 1L);
    } else if (ask.method != "GET") {
        curl_easy_setopt(c, CURLOPT_CUSTOMREQUEST, ask.method.c_str());
    }
    curl_easy_setopt(c, CURLOPT_HTTPHEADER, hs);
    reply.rc = curl_easy_perform(c);
    curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, &reply.status);
    curl_slist_free_all(hs);
    curl_easy_cleanup(c);
    return reply;
}

std::string header(const KDH1_request_struct* r, KDH1_hdr_t kind) {
    const char* v = KDH1_GetHeader(r, kind);
    return v ? v : "<none>";
}

// Answers with `text` as a whole (announced length) or streamed.
int answerText(KDH1_request_struct* r, const std::string& text, uint32_t media = KDH1_MEDIA_TEXT,
               bool announce = true, uint32_t status = KDH1_STC_OK) {
    uint32_t persist = KDH1_OPT_PERSIST;
    KDH1_ActivityOptions(r->handle, KDH1_OPTSET_ACTIVITY, &persist, nullptr);
    KDH1_Response(r->handle, status, 0, nullptr);
    KDH1_CreateEntity(r->handle, media, announce ? text.size() : 0);
    return static_cast<int>(KDH1_Put(r->handle, text.data(), text.size()));
}

// The byte at offset i of the streamed test body.
char patternAt(uint64_t i) { return static_cast<char>('a' + (i * 7 + i / 4093) % 26); }

constexpr size_t kBodyLimit = 64 * 1024;

class Env : public ::testing::Environment {
public:
    void SetUp() override {
        curl_global_init(CURL_GLOBAL_ALL);
        KDH1_SetListenAddress("127.0.0.1", 0);
        KDH1_limits_struct limits{};
        limits.maxEntity = kBodyLimit;
        limits.connectionTimeout = 10;
        KDH1_SetLimits(&limits);
    }
    void TearDown() override { curl_global_cleanup(); }
};
const auto* env = ::testing::AddGlobalTestEnvironment(new Env);

}  // namespace

TEST(Kdh1Routing, FirstPathSegmentChoosesTheServiceIgnoringCaseElseTheFirstService) {
    auto echo = [](const char* who) {
        return [who](KDH1_request_struct* r) {
            std::string text = std::string(who) + "|" + header(r, KDH1_HDR_PATHINFO) + "|" +
                               header(r, KDH1_HDR_QUERYSTRING) + "|" + header(r, KDH1_HDR_METHOD) + "|" +
                               std::string(r->path, r->pathLength) + "|" + std::to_string(r->code);
            return answerText(r, text);
        };
    };
    Listening alpha("alpha", echo("alpha"));
    Listening beta("Beta", echo("beta"));
    ASSERT_EQ(alpha.newStatus(), 0u);
    ASSERT_EQ(beta.newStatus(), 0u);

    EXPECT_EQ(fetch(url("/BETA/x?q=a%20b")).body, "beta|/BETA/x|q=a%20b|GET|/BETA/x|1");
    EXPECT_EQ(fetch(url("/alpha")).body, "alpha|/alpha|<none>|GET|/alpha|1");
    EXPECT_EQ(fetch(url("/other/beta")).body, "alpha|/other/beta|<none>|GET|/other/beta|1");
    EXPECT_EQ(fetch(url("/")).body, "alpha|/|<none>|GET|/|1");
    EXPECT_EQ(fetch(url("/betamax")).body.substr(0, 6), "alpha|");
    // The path is decoded exactly once; the raw path and the query stay raw.
    EXPECT_EQ(fetch(url("/beta/a%20b/%252e%252e?x=%41")).body, "beta|/beta/a b/%2e%2e|x=%41|GET|/beta/a%20b/%252e%252e|1");
    Ask del;
    del.method = "DELETE";
    EXPECT_EQ(fetch(url("/beta/"), del).body, "beta|/beta/|<none>|DELETE|/beta/|5");
    // A path that decodes to a NUL byte is refused before any service sees it.
    EXPECT_EQ(fetch(url("/beta/x%00.htm")).status, 400);
}

TEST(Kdh1Routing, ServicesAreUniqueByNameAndDeleteEndsListen) {
    std::atomic<bool> callbackReturned{false};
    std::atomic<uint32_t> putStatus{0};
    std::atomic<bool> streaming{false};
    Listening a("one", [&](KDH1_request_struct* r) {
        KDH1_CreateEntity(r->handle, KDH1_MEDIA_OTHER, 0);
        std::string chunk(8192, 'z');
        uint32_t rc;
        streaming = true;
        while ((rc = KDH1_Put(r->handle, chunk.data(), chunk.size())) == KDH1_STC_OK) {
        }
        putStatus = rc;
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        callbackReturned = true;
        return 0;
    });
    KDH1_server_t dup = 0;
    EXPECT_EQ(KDH1_New(&dup, "ONE", trampoline, nullptr, 0, 0), KDH1_STC_EXISTS);
    EXPECT_EQ(KDH1_Listen(a.server(), 0), KDH1_STC_BADHANDLE) << "already listening";

    // A client that stops reading keeps the producer blocked in KDH1_Put.
    std::atomic<bool> letGo{false};
    std::thread client([&] {
        Ask slow;
        slow.onData = [&](size_t got) {
            while (got > (1u << 20) && !letGo) std::this_thread::sleep_for(std::chrono::milliseconds(5));
            return !letGo;
        };
        fetch(url("/one/stream"), slow);
    });
    ASSERT_TRUE(waitFor([&] { return streaming.load(); }));
    EXPECT_EQ(a.stop(), KDH1_STC_OK);
    // Listen returned only after the callback did, with its Puts refused.
    EXPECT_TRUE(callbackReturned.load());
    EXPECT_EQ(putStatus.load(), KDH1_STC_CLOSED);
    EXPECT_EQ(a.listenStatus(), KDH1_STC_OK);
    letGo = true;
    client.join();
    EXPECT_EQ(KDH1_BoundPort(), 0) << "the listener stops with its last service";
    EXPECT_EQ(KDH1_Delete(a.server()), KDH1_STC_BADHANDLE);
    EXPECT_EQ(KDH1_Listen(a.server(), 0), KDH1_STC_BADHANDLE);

    // The name is free again, and a new listener starts for the next service.
    Listening again("one", [](KDH1_request_struct* r) { return answerText(r, "again"); });
    EXPECT_EQ(again.newStatus(), 0u);
    EXPECT_EQ(fetch(url("/one")).body, "again");
}

TEST(Kdh1Routing, AListenerThatCannotBindFailsAtOnce) {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    ASSERT_EQ(bind(fd, reinterpret_cast<sockaddr*>(&sa), sizeof sa), 0);
    ASSERT_EQ(listen(fd, 1), 0);
    socklen_t len = sizeof sa;
    getsockname(fd, reinterpret_cast<sockaddr*>(&sa), &len);
    ASSERT_EQ(KDH1_SetListenAddress("127.0.0.1", ntohs(sa.sin_port)), 0u);
    KDH1_server_t s = 0;
    ASSERT_EQ(KDH1_New(&s, "taken", trampoline, nullptr, 0, 0), 0u);
    EXPECT_EQ(KDH1_Listen(s, 0), KDH1_STC_LISTENFAILED);
    EXPECT_EQ(KDH1_Delete(s), KDH1_STC_OK);
    close(fd);
    EXPECT_EQ(KDH1_SetListenAddress("no such host.invalid", 0), 0u);
    ASSERT_EQ(KDH1_New(&s, "taken", trampoline, nullptr, 0, 0), 0u);
    EXPECT_EQ(KDH1_Listen(s, 0), KDH1_STC_LISTENFAILED);
    KDH1_Delete(s);
    EXPECT_EQ(KDH1_SetListenAddress("127.0.0.1", 70000), KDH1_STC_BADARG);
    EXPECT_EQ(KDH1_SetListenAddress("127.0.0.1", 0), 0u);
}

TEST(Kdh1Response, StatusesMediaTypesAndExtraHeadersAreSent) {
    struct Case {
        uint32_t status;
        long http;
    };
    const Case statuses[] = {{KDH1_STC_OK, 200},           {KDH1_STC_BADREQUEST, 400}, {KDH1_STC_UNAUTHORIZED, 401},
                             {KDH1_STC_NOTFOUND, 404},     {KDH1_STC_TOOLARGE, 413},   {KDH1_STC_UNAVAILABLE, 503},
                             {KDH1_STC_BASE + 19, 500},    {12345, 500}};
    const std::pair<uint32_t, const char*> media[] = {
        {KDH1_MEDIA_TEXT, "text/plain"}, {KDH1_MEDIA_HTML, "text/html"},       {KDH1_MEDIA_CSS, "text/css"},
        {KDH1_MEDIA_XML, "text/xml"},    {KDH1_MEDIA_OTHER, "application/octet-stream"},
        {KDH1_MEDIA_PDF, "application/pdf"}};
    Listening svc("h", [](KDH1_request_struct* r) {
        std::string q = header(r, KDH1_HDR_QUERYSTRING);
        uint32_t status = 0, mediaCode = 0;
        sscanf(q.c_str(), "s=%u&m=%u", &status, &mediaCode);
        const char lastModified[] = "Tue, 01 Dec 2026 10:00:00 GMT";
        KDH1_sendhdr_struct extra[] = {
            {KDH1_HDR_LASTMODIFIED, (uint32_t)strlen(lastModified), lastModified},
            {KDH1_HDR_CACHE, 5, "cache"},
            {KDH1_HDR_LOCATION, 12, "x\r\nSet-Evil:"},  // would split the header block
            {KDH1_HDR_PATHINFO, 1, "/"},                // a request fact, not a header
        };
        KDH1_Response(r->handle, status, 4, extra);
        EXPECT_EQ(KDH1_Response(r->handle, status, 0, nullptr), KDH1_STC_STATE);
        KDH1_CreateEntity(r->handle, mediaCode, 2);
        return (int)KDH1_Put(r->handle, "ok", 2);
    });
    for (const auto& c : statuses) {
        Reply rep = fetch(url("/h?s=" + std::to_string(c.status) + "&m=2"));
        EXPECT_EQ(rep.status, c.http) << c.status;
        EXPECT_EQ(rep.body, "ok");
        EXPECT_EQ(rep.headers["last-modified"], "Tue, 01 Dec 2026 10:00:00 GMT");
        EXPECT_EQ(rep.headers["cache-control"], "cache");
        EXPECT_EQ(rep.headers.count("location"), 0u);
        EXPECT_EQ(rep.headers.count("set-evil"), 0u);
        EXPECT_EQ(rep.headers["connection"], "close") << "not persistent unless the callback says so";
    }
    for (const auto& m : media) EXPECT_EQ(fetch(url("/h?s=0&m=" + std::to_string(m.first))).headers["content-type"], m.second);
    EXPECT_EQ(fetch(url("/h?s=0&m=0")).headers.count("content-type"), 0u);
}

TEST(Kdh1Response, IncompleteAnswersAreNeverPassedOffAsComplete) {
    Listening svc("p", [](KDH1_request_struct* r) {
        std::string q = header(r, KDH1_HDR_QUERYSTRING);
        if (q == "none") return 0;  // no response at all
        if (q == "headonly") return (int)KDH1_Response(r->handle, KDH1_STC_NOTFOUND, 0, nullptr);
        KDH1_CreateEntity(r->handle, KDH1_MEDIA_TEXT, 10);
        if (q == "over") {
            EXPECT_EQ(KDH1_Put(r->handle, "0123456789AB", 12), KDH1_STC_OVERFLOW);
            EXPECT_EQ(KDH1_Put(r->handle, "C", 1), KDH1_STC_OVERFLOW);
        } else {
            KDH1_Put(r->handle, "01234", 5);  // "short": half of what was announced
        }
        return 0;
    });
    Reply none = fetch(url("/p?none"));
    EXPECT_EQ(none.status, 500);
    EXPECT_EQ(none.body, "");
    Reply head = fetch(url("/p?headonly"));
    EXPECT_EQ(head.status, 404);
    EXPECT_EQ(head.headers["content-length"], "0");
    Reply over = fetch(url("/p?over"));
    EXPECT_EQ(over.rc, CURLE_OK);
    EXPECT_EQ(over.body, "0123456789");
    Reply shortBody = fetch(url("/p?short"));
    EXPECT_NE(shortBody.rc, CURLE_OK) << "a body shorter than announced must fail at the client";
}

TEST(Kdh1Streaming, LargeBodiesStreamThroughABoundedBufferAndArriveIntact) {
    const uint64_t total = 48ull << 20;
    std::atomic<uint64_t> produced{0};
    Listening svc("big", [&](KDH1_request_struct* r) {
        bool announce = header(r, KDH1_HDR_QUERYSTRING) == "announce";
        KDH1_ActivityOptions(r->handle, KDH1_OPTSET_ACTIVITY, nullptr, nullptr);
        KDH1_CreateEntity(r->handle, KDH1_MEDIA_OTHER, announce ? total : 0);
        std::vector<char> chunk(10239);
        for (uint64_t off = 0; off < total; off += chunk.size()) {
            size_t n = (size_t)std::min<uint64_t>(chunk.size(), total - off);
            for (size_t i = 0; i < n; i++) chunk[i] = patternAt(off + i);
            if (KDH1_Put(r->handle, chunk.data(), n) != KDH1_STC_OK) return 8;
            produced += n;
        }
        return 0;
    });
    for (const char* mode : {"announce", "chunked"}) {
        produced = 0;
        uint64_t producedWhilePaused = 0;
        bool paused = false;
        Ask ask;
        ask.onData = [&](size_t got) {
            if (!paused && got > (1u << 20)) {
                // Stop reading until the producer is stuck: it must not be
                // able to run ahead by more than the buffers in between.
                paused = true;
                uint64_t last = produced;
                for (int quiet = 0; quiet < 10;) {
                    std::this_thread::sleep_for(std::chrono::milliseconds(30));
                    uint64_t now = produced;
                    quiet = now == last ? quiet + 1 : 0;
                    last = now;
                }
                producedWhilePaused = last;
            }
            return true;
        };
        Reply rep = fetch(url(std::string("/big?") + mode), ask);
        ASSERT_EQ(rep.rc, CURLE_OK) << mode;
        ASSERT_EQ(rep.body.size(), total) << mode;
        size_t bad = 0;
        for (uint64_t i = 0; i < total; i++)
            if (rep.body[i] != patternAt(i)) bad++;
        EXPECT_EQ(bad, 0u) << mode;
        EXPECT_LT(producedWhilePaused, 16ull << 20) << mode << ": the body was collected, not streamed";
        if (std::string(mode) == "announce") EXPECT_EQ(rep.headers["content-length"], std::to_string(total));
        else EXPECT_EQ(rep.headers["transfer-encoding"], "chunked");
    }
}

TEST(Kdh1Streaming, ConcurrentClientsEachGetTheirOwnAnswer) {
    Listening svc("many", [](KDH1_request_struct* r) {
        std::string q = header(r, KDH1_HDR_QUERYSTRING);
        // Every third answer is streamed in small pieces, the rest go whole.
        if (q.back() % 3 != 0) return answerText(r, "answer " + q);
        KDH1_CreateEntity(r->handle, KDH1_MEDIA_TEXT, 0);
        std::string text = "answer " + q;
        for (char ch : text) KDH1_Put(r->handle, &ch, 1);
        return 0;
    });
    std::atomic<int> wrong{0};
    std::vector<std::thread> clients;
    for (int t = 0; t < 6; t++)
        clients.emplace_back([t, &wrong] {
            for (int i = 0; i < 100; i++) {
                std::string q = std::to_string(t) + "-" + std::to_string(i);
                Reply rep = fetch(url("/many?" + q));
                if (rep.rc != CURLE_OK || rep.body != "answer " + q) wrong++;
            }
        });
    for (auto& c : clients) c.join();
    EXPECT_EQ(wrong.load(), 0);
}

TEST(Kdh1Streaming, AClientThatGoesAwayReleasesTheProducer) {
    std::atomic<uint32_t> lastPut{0};
    std::atomic<bool> done{false};
    Listening svc("gone", [&](KDH1_request_struct* r) {
        KDH1_CreateEntity(r->handle, KDH1_MEDIA_OTHER, 0);
        std::string chunk(4096, 'q');
        uint32_t rc;
        while ((rc = KDH1_Put(r->handle, chunk.data(), chunk.size())) == KDH1_STC_OK) {
        }
        lastPut = rc;
        done = true;
        return 0;
    });
    Ask ask;
    ask.onData = [](size_t got) { return got < (2u << 20); };
    Reply rep = fetch(url("/gone"), ask);
    EXPECT_EQ(rep.rc, CURLE_WRITE_ERROR);
    ASSERT_TRUE(waitFor([&] { return done.load(); }, 30000)) << "producer still blocked after the client left";
    EXPECT_EQ(lastPut.load(), KDH1_STC_CLOSED);
}

TEST(Kdh1Streaming, AClientThatLeavesWhileTheCallbackIsBusyIsNoticed) {
    std::atomic<uint32_t> seen{KDH1_STC_OK};
    Listening svc("busy", [&](KDH1_request_struct* r) {
        // Nothing is sent, so only the layer's watch over parked requests can
        // tell that the client left.
        waitFor([&] { return KDH1_Status(r->handle) != KDH1_STC_OK; }, 30000);
        seen = KDH1_Status(r->handle);
        if (seen != KDH1_STC_OK) EXPECT_EQ(KDH1_CreateEntity(r->handle, KDH1_MEDIA_TEXT, 0), KDH1_STC_CLOSED);
        return 0;
    });
    CURL* c = curl_easy_init();
    curl_easy_setopt(c, CURLOPT_URL, url("/busy").c_str());
    curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(c, CURLOPT_TIMEOUT_MS, 300L);
    EXPECT_EQ(curl_easy_perform(c), CURLE_OPERATION_TIMEDOUT);
    curl_easy_cleanup(c);
    ASSERT_TRUE(waitFor([&] { return seen.load() != KDH1_STC_OK; }, 30000));
    EXPECT_EQ(seen.load(), KDH1_STC_CLOSED);
}

TEST(Kdh1Entity, BodiesAreReadUpToTheLimitAndLargerOnesAnswer413) {
    std::atomic<int> calls{0};
    Listening svc("post", [&](KDH1_request_struct* r) {
        calls++;
        uint32_t type = 0, length = 0;
        KDH1_OpenEntity(r->handle, &type, &length);
        std::string body(length, '\0');
        uint32_t got = length + 100;  // asks for more than there is
        KDH1_Get(r->handle, body.data(), &got);
        uint32_t more = 10;
        char extra[10];
        KDH1_Get(r->handle, extra, &more);
        std::string text = std::to_string(type) + " " + std::to_string(length) + " " + std::to_string(got) + " " +
                           std::to_string(more) + " " + (body == std::string(length, 'b') ? "same" : "differs") +
                           " " + header(r, KDH1_HDR_CONTENTTYPE);
        return answerText(r, text);
    });
    Ask small;
    small.method = "POST";
    small.body.assign(kBodyLimit, 'b');
    small.headers = {"Content-Type: text/xml; charset=utf-8"};
    EXPECT_EQ(fetch(url("/post"), small).body, "17 65536 65536 0 same text/xml; charset=utf-8");
    small.chunked = true;
    small.headers = {};
    EXPECT_EQ(fetch(url("/post"), small).body.substr(0, 19), "2 65536 65536 0 sam") << "curl posts forms";
    EXPECT_EQ(calls.load(), 2);

    Ask big = small;
    big.body.assign(kBodyLimit + 1, 'b');
    for (bool chunked : {false, true}) {
        big.chunked = chunked;
        EXPECT_EQ(fetch(url("/post"), big).status, 413) << (chunked ? "chunked" : "with length");
    }
    big.chunked = false;
    big.body.assign(8 * kBodyLimit, 'b');
    big.headers = {"Expect: 100-continue"};
    EXPECT_EQ(fetch(url("/post"), big).status, 413);
    EXPECT_EQ(calls.load(), 2) << "refused bodies never reach the service";
}

TEST(Kdh1Entity, RequestFactsAndPersistentConnections) {
    Listening svc("facts", [](KDH1_request_struct* r) {
        std::string text = header(r, KDH1_HDR_CLIENT) + "|" + header(r, KDH1_HDR_HOST) + "|" +
                           header(r, KDH1_HDR_SOAPACTION) + "|" + std::string(KDH1_GetNamedHeader(r->handle, "x-odd") ? KDH1_GetNamedHeader(r->handle, "x-odd") : "-") +
                           "|" + std::to_string(r->version);
        uint32_t opts = 0;
        KDH1_ActivityOptions(r->handle, KDH1_OPTSET_ACTIVITY, nullptr, &opts);
        EXPECT_EQ(opts, 0u);
        EXPECT_EQ(KDH1_ActivityOptions(r->handle, 3, nullptr, &opts), KDH1_STC_BADARG);
        return answerText(r, text, KDH1_MEDIA_TEXT, false);
    });
    Ask ask;
    ask.headers = {"SOAPAction: \"urn:x\"", "X-Odd: 1"};
    Reply rep = fetch(url("/facts"), ask);
    std::string port = std::to_string(KDH1_BoundPort());
    EXPECT_EQ(rep.body.substr(0, 10), "127.0.0.1:");
    EXPECT_NE(rep.body.find("|127.0.0.1:" + port + "|\"urn:x\"|1|257"), std::string::npos) << rep.body;
    EXPECT_EQ(rep.headers.count("connection"), 0u) << "the callback asked for a persistent connection";
}
