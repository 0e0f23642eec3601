// kdh1 network side: the HTTP engine's callbacks. A request is taken apart
// when its headers arrive, its body is collected up to the limit, then it is
// parked (the connection suspended) and handed to a worker. When the callback
// has produced headers and enough body, or has returned, the connection is
// resumed and the response is queued: in one piece when the callback is done,
// otherwise as a stream read from the request's buffer.
#include <netdb.h>
#include <sys/socket.h>

#include <cstdlib>
#include <cstring>

#include "bss1/bss1.h"
#include "kdh1/kdh1int.h"
#include "ras1/ras1.h"

RAS1_UNIT("kdh1mhd");

using namespace kdh1;

namespace {

// Bytes the engine asks for per read of a streamed body.
constexpr size_t kBlockSize = 16 * 1024;

struct MethodEntry {
    const char* name;
    uint32_t code;
};
const MethodEntry kMethods[] = {
    {"GET", KDH1_METHOD_GET},   {"HEAD", KDH1_METHOD_HEAD},     {"POST", KDH1_METHOD_POST},
    {"PUT", KDH1_METHOD_PUT},   {"DELETE", KDH1_METHOD_DELETE}, {"OPTIONS", KDH1_METHOD_OPTIONS},
};

uint32_t methodCode(const std::string& m) {
    for (const auto& e : kMethods)
        if (m == e.name) return e.code;
    return KDH1_METHOD_OTHER;
}

int hexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// Percent-decodes `raw` once into `out`. A '%' without two hex digits stays as
// it is. False when the text decodes to a NUL byte, which no path may hold.
bool decodePath(const std::string& raw, std::string* out) {
    out->clear();
    out->reserve(raw.size());
    for (size_t i = 0; i < raw.size(); i++) {
        int hi, lo;
        if (raw[i] == '%' && i + 2 < raw.size() && (hi = hexDigit(raw[i + 1])) >= 0 &&
            (lo = hexDigit(raw[i + 2])) >= 0) {
            char c = static_cast<char>(hi * 16 + lo);
            if (c == '\0') return false;
            out->push_back(c);
            i += 2;
        } else {
            out->push_back(raw[i]);
        }
    }
    return true;
}

// Splits the request target into the raw path and the query string. An
// absolute-form target ("http://host/path") keeps only its path.
void splitTarget(const std::string& target, std::string* path, std::string* query, bool* hasQuery) {
    size_t start = 0;
    size_t scheme = target.find("://");
    if (!target.empty() && target[0] != '/' && scheme != std::string::npos) {
        start = target.find('/', scheme + 3);
        if (start == std::string::npos) start = target.size();
    }
    size_t q = target.find('?', start);
    *hasQuery = q != std::string::npos;
    *path = target.substr(start, (*hasQuery ? q : target.size()) - start);
    if (path->empty() || (*path)[0] != '/') path->insert(path->begin(), '/');
    *query = *hasQuery ? target.substr(q + 1) : std::string();
}

MHD_Result collectHeader(void* cls, MHD_ValueKind, const char* key, const char* value) {
    auto* r = static_cast<KDH1_Request*>(cls);
    r->headers.emplace_back(key ? key : "", value ? value : "");
    return MHD_YES;
}

std::string clientAddress(MHD_Connection* conn) {
    const MHD_ConnectionInfo* info = MHD_get_connection_info(conn, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    if (!info || !info->client_addr) return std::string();
    const sockaddr* sa = info->client_addr;
    socklen_t len = sa->sa_family == AF_INET6 ? sizeof(sockaddr_in6) : sizeof(sockaddr_in);
    char host[NI_MAXHOST], serv[NI_MAXSERV];
    if (getnameinfo(sa, len, host, sizeof host, serv, sizeof serv, NI_NUMERICHOST | NI_NUMERICSERV) != 0)
        return std::string();
    return std::string(host) + ":" + serv;
}

// Queues a short plain-text answer of the layer itself (400, 413, 503) and
// closes the connection after it.
MHD_Result answer(KDH1_Request* r, unsigned http, const char* text) {
    r->phase = Phase::Answered;
    MHD_Response* resp =
        MHD_create_response_from_buffer(strlen(text), const_cast<char*>(text), MHD_RESPMEM_PERSISTENT);
    if (!resp) return MHD_NO;
    MHD_add_response_header(resp, MHD_HTTP_HEADER_CONTENT_TYPE, "text/plain");
    MHD_add_response_header(resp, MHD_HTTP_HEADER_CONNECTION, "close");
    MHD_Result rc = MHD_queue_response(r->conn, http, resp);
    MHD_destroy_response(resp);
    return rc;
}

// The request's header table: the facts of the request, then the first
// header of each known kind. The table was reserved large enough not to move.
void buildRecord(KDH1_Request* r, bool hasQuery) {
    r->record.headers = r->table.data();
    auto add = [r](KDH1_hdr_t kind, const std::string& v) {
        r->table.push_back({kind, static_cast<uint32_t>(v.size()), v.c_str()});
        r->record.headerCount = static_cast<uint32_t>(r->table.size());
    };
    add(KDH1_HDR_PATHINFO, r->pathInfo);
    if (hasQuery) add(KDH1_HDR_QUERYSTRING, r->query);
    add(KDH1_HDR_METHOD, r->method);
    add(KDH1_HDR_CLIENT, r->client);
    const char* contentType = nullptr;
    for (const auto& h : r->headers) {
        KDH1_hdr_t kind = kindOfHeaderName(h.first.c_str());
        if (kind == 0 || KDH1_GetHeader(&r->record, kind)) continue;
        if (kind == KDH1_HDR_CONTENTTYPE) contentType = h.second.c_str();
        add(kind, h.second);
    }
    r->record.handle = r;
    r->record.path = r->pathRaw.c_str();
    r->record.pathLength = static_cast<uint32_t>(r->pathRaw.size());
    r->record.entityType = mediaOfContentType(contentType);
}

// First call: the request line and headers are in.
MHD_Result takeHeaders(KDH1_Request* r, const char* method, const char* version) {
    bool hasQuery = false;
    splitTarget(r->target, &r->pathRaw, &r->query, &hasQuery);
    r->method = method ? method : "";
    r->record.code = methodCode(r->method);
    r->record.version = (version && strcmp(version, MHD_HTTP_VERSION_1_1) == 0) ? 0x0101 : 0x0100;
    MHD_get_connection_values(r->conn, MHD_HEADER_KIND, collectHeader, r);
    r->table.reserve(r->headers.size() + 4);
    r->client = clientAddress(r->conn);
    if (const MHD_ConnectionInfo* fi = MHD_get_connection_info(r->conn, MHD_CONNECTION_INFO_CONNECTION_FD))
        r->fd = fi->connect_fd;
    if (!decodePath(r->pathRaw, &r->pathInfo)) return answer(r, MHD_HTTP_BAD_REQUEST, "Bad request path\n");
    buildRecord(r, hasQuery);
    const char* length = KDH1_GetHeader(&r->record, KDH1_HDR_CONTENTLENGTH);
    if (length) {
        char* end = nullptr;
        unsigned long long n = strtoull(length, &end, 10);
        if (n > layer().running.maxEntity) {
            r->tooLarge = true;
            RAS1_Printf(RAS1_THIS, __LINE__, "Request body of %llu bytes refused", n);
            return answer(r, MHD_HTTP_CONTENT_TOO_LARGE, "Request body too large\n");
        }
    }
    return MHD_YES;
}

// Body bytes. Past the limit they are dropped (the answer will be 413); a
// client that keeps sending as much again loses its connection.
MHD_Result takeBody(KDH1_Request* r, const char* data, size_t n) {
    size_t limit = layer().running.maxEntity;
    if (!r->tooLarge && r->body.size() + n > limit) {
        r->tooLarge = true;
        RAS1_Printf(RAS1_THIS, __LINE__, "Request body over %zu bytes refused", limit);
        r->discarded = r->body.size();
        std::string().swap(r->body);
    }
    if (r->tooLarge) {
        r->discarded += n;
        return r->discarded > 2 * limit ? MHD_NO : MHD_YES;
    }
    r->body.append(data, n);
    return MHD_YES;
}

// Last call of a received request: route it and park it for a worker.
MHD_Result dispatch(KDH1_Request* r) {
    if (r->tooLarge) return answer(r, MHD_HTTP_CONTENT_TOO_LARGE, "Request body too large\n");
    if (!routeAndRegister(r)) return answer(r, MHD_HTTP_SERVICE_UNAVAILABLE, "No service\n");
    r->record.userData = r->service->userData;
    {
        std::lock_guard<std::mutex> g(r->mu);
        r->parked = true;
        r->lastProgress = BSS1_MonotonicMillis();
        MHD_suspend_connection(r->conn);
    }
    r->phase = Phase::Parked;
    addRef(r);
    submit(r);
    return MHD_YES;
}

ssize_t readBody(void* cls, uint64_t, char* out, size_t max) {
    auto* r = static_cast<KDH1_Request*>(cls);
    std::lock_guard<std::mutex> g(r->mu);
    if (r->cancelled) return MHD_CONTENT_READER_END_WITH_ERROR;
    size_t pending = r->wr - r->rd;
    if (pending > 0) {
        size_t n = pending < max ? pending : max;
        memcpy(out, r->buf + r->rd, n);
        r->rd += n;
        r->sent += n;
        if (r->rd == r->wr) r->rd = r->wr = 0;
        if (r->wr - r->rd <= layer().running.streamBuffer / 2) r->room.notify_all();
        r->lastProgress = BSS1_MonotonicMillis();
        return static_cast<ssize_t>(n);
    }
    if (r->producerDone) {
        // A body shorter than its announced length must not look complete.
        bool shortBody = r->contentLength && r->sent < r->contentLength;
        return shortBody ? MHD_CONTENT_READER_END_WITH_ERROR : MHD_CONTENT_READER_END_OF_STREAM;
    }
    // Nothing to send yet: park instead of being asked again at once.
    r->parked = true;
    r->pendingSince = 0;
    MHD_suspend_connection(r->conn);
    return 0;
}

// Builds the response once the callback has given its headers (or returned).
// REQUIRES: r->mu held.
MHD_Response* buildResponseLocked(KDH1_Request* r, unsigned* http) {
    uint32_t status = r->responded || r->entityCreated ? r->status : KDH1_STC_SERVERERROR;
    *http = static_cast<unsigned>(KDH1_HttpStatus(status));
    size_t pending = r->wr - r->rd;
    bool whole = r->producerDone && (r->contentLength == 0 || r->accepted == r->contentLength);
    MHD_Response* resp = nullptr;
    if (whole && pending > 0 && r->rd == 0) {
        resp = MHD_create_response_from_buffer_with_free_callback(pending, r->buf, giveBuffer);
        if (resp) {
            r->buf = nullptr;
            r->rd = r->wr = r->cap = 0;
        }
    } else if (whole) {
        resp = MHD_create_response_from_buffer(pending, r->buf ? r->buf + r->rd : nullptr, MHD_RESPMEM_MUST_COPY);
        r->rd = r->wr = 0;
    } else {
        uint64_t size = r->contentLength ? r->contentLength : MHD_SIZE_UNKNOWN;
        resp = MHD_create_response_from_callback(size, kBlockSize, readBody, r, nullptr);
        r->phase = Phase::Streaming;
    }
    if (!resp) return nullptr;
    if (const char* type = KDH1_MediaType(r->media)) MHD_add_response_header(resp, MHD_HTTP_HEADER_CONTENT_TYPE, type);
    for (const auto& h : r->extra) MHD_add_response_header(resp, h.first.c_str(), h.second.c_str());
    if (!(r->options & KDH1_OPT_PERSIST)) MHD_add_response_header(resp, MHD_HTTP_HEADER_CONNECTION, "close");
    if (whole) r->phase = Phase::Answered;
    r->started = true;
    return resp;
}

// Called when a parked request is resumed before its response started.
MHD_Result startResponse(KDH1_Request* r) {
    std::unique_lock<std::mutex> g(r->mu);
    if (r->peerGone) return MHD_NO;
    if (r->cancelled) {
        g.unlock();
        return answer(r, MHD_HTTP_SERVICE_UNAVAILABLE, "Request cancelled\n");
    }
    if (!r->entityCreated && !r->producerDone) {
        // Woken without headers to send: park again.
        r->parked = true;
        MHD_suspend_connection(r->conn);
        return MHD_YES;
    }
    unsigned http = 500;
    MHD_Response* resp = buildResponseLocked(r, &http);
    g.unlock();
    if (!resp) return MHD_NO;
    MHD_Result rc = MHD_queue_response(r->conn, http, resp);
    MHD_destroy_response(resp);
    return rc;
}

}  // namespace

namespace kdh1 {

void* uriCallback(void*, const char* uri, MHD_Connection* conn) {
    return new (std::nothrow) KDH1_Request(conn, uri);
}

MHD_Result accessCallback(void*, MHD_Connection*, const char*, const char* method, const char* version,
                          const char* uploadData, size_t* uploadSize, void** ctx) {
    auto* r = static_cast<KDH1_Request*>(*ctx);
    if (!r) return MHD_NO;
    if (r->firstCall) {
        r->firstCall = false;
        return takeHeaders(r, method, version);
    }
    if (*uploadSize > 0) {
        size_t n = *uploadSize;
        *uploadSize = 0;
        return r->phase == Phase::Receiving ? takeBody(r, uploadData, n) : MHD_YES;
    }
    switch (r->phase) {
    case Phase::Receiving: return dispatch(r);
    case Phase::Parked: return startResponse(r);
    default: return MHD_YES;
    }
}

void completedCallback(void*, MHD_Connection*, void** ctx, MHD_RequestTerminationCode toe) {
    auto* r = static_cast<KDH1_Request*>(*ctx);
    if (!r) return;
    *ctx = nullptr;
    {
        std::lock_guard<std::mutex> g(r->mu);
        r->mhdDone = true;
        r->parked = false;
        r->cancelled = true;  // any later KDH1_Put learns that the client is gone
        r->room.notify_all();
    }
    int ras = RAS1_Sync(RAS1_THIS);
    if ((ras & RAS1_DETAIL) && toe != MHD_REQUEST_TERMINATED_COMPLETED_OK)
        RAS1_Printf(RAS1_THIS, __LINE__, "Request %s ended early (%d)", r->pathRaw.c_str(), (int)toe);
    release(r);
}

}  // namespace kdh1
