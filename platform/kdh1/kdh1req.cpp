// kdh1 request calls: what a service callback uses to read its request and
// write its response, the status/media/header tables, and the stream buffer
// between KDH1_Put and the network thread.
#include <strings.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <vector>

#include "bss1/bss1.h"
#include "kdh1/kdh1int.h"
#include "ras1/ras1.h"

RAS1_UNIT("kdh1req");

using namespace kdh1;

namespace {

struct StatusEntry {
    uint32_t status;
    int http;
};
const StatusEntry kStatuses[] = {
    {KDH1_STC_OK, 200},
    {KDH1_STC_BADREQUEST, 400},
    {KDH1_STC_UNAUTHORIZED, 401},
    {KDH1_STC_FORBIDDEN, 403},
    {KDH1_STC_NOTFOUND, 404},
    {KDH1_STC_BADMETHOD, 405},
    {KDH1_STC_TIMEOUT, 408},
    {KDH1_STC_TOOLARGE, 413},
    {KDH1_STC_SERVERERROR, 500},
    {KDH1_STC_NOTIMPLEMENTED, 501},
    {KDH1_STC_UNAVAILABLE, 503},
};

struct MediaEntry {
    uint32_t media;
    const char* contentType;
};
const MediaEntry kMedia[] = {
    {KDH1_MEDIA_TEXT, "text/plain"},
    {KDH1_MEDIA_HTML, "text/html"},
    {KDH1_MEDIA_CSS, "text/css"},
    {KDH1_MEDIA_XML, "text/xml"},
    {KDH1_MEDIA_OTHER, "application/octet-stream"},
    {KDH1_MEDIA_PDF, "application/pdf"},
};
// Further request content types that read as one of the media above.
const MediaEntry kMoreMedia[] = {
    {KDH1_MEDIA_XML, "application/xml"},
    {KDH1_MEDIA_XML, "application/soap+xml"},
    {KDH1_MEDIA_TEXT, "application/x-www-form-urlencoded"},
};

struct HeaderEntry {
    KDH1_hdr_t kind;
    const char* name;
    bool sendable;
};
const HeaderEntry kHeaders[] = {
    {KDH1_HDR_ACCEPT, "Accept", true},
    {KDH1_HDR_AUTHORIZATION, "Authorization", false},
    {KDH1_HDR_CONTENTDISPOSITION, "Content-Disposition", true},
    {KDH1_HDR_CONTENTLENGTH, "Content-Length", false},
    {KDH1_HDR_CONTENTTYPE, "Content-Type", false},
    {KDH1_HDR_HOST, "Host", false},
    {KDH1_HDR_USERAGENT, "User-Agent", false},
    {KDH1_HDR_SOAPACTION, "SOAPAction", false},
    {KDH1_HDR_LASTMODIFIED, "Last-Modified", true},
    {KDH1_HDR_IFMODIFIEDSINCE, "If-Modified-Since", false},
    {KDH1_HDR_LOCATION, "Location", true},
    {KDH1_HDR_CACHE, "Cache-Control", true},
};

// Stream buffers are all of the listener's stream-buffer size and are
// reused: allocating and freeing them per request (often on different
// threads) costs more than the copying they serve.
struct BufferPool {
    std::mutex mu;
    std::vector<char*> free;  // guarded by mu
    size_t size = 0;          // guarded by mu; size of every pooled buffer
};
BufferPool& bufferPool() {
    static BufferPool* p = new BufferPool;  // never destroyed: buffers may come back at exit
    return *p;
}
constexpr size_t kPooledBuffers = 32;

char* takeBuffer(size_t size) {
    BufferPool& P = bufferPool();
    {
        std::lock_guard<std::mutex> g(P.mu);
        if (P.size != size) {
            for (char* b : P.free) ::free(b);
            P.free.clear();
            P.size = size;
        }
        if (!P.free.empty()) {
            char* b = P.free.back();
            P.free.pop_back();
            return b;
        }
    }
    return static_cast<char*>(malloc(size));
}

// Makes room for `need` more bytes after wr: the pending bytes move to the
// front. REQUIRES: r->mu held; need <= limit - pending.
bool makeRoom(KDH1_Request* r, size_t need, size_t limit) {
    if (!r->buf) {
        r->buf = takeBuffer(limit);
        if (!r->buf) return false;
        r->cap = limit;
    }
    if (r->wr + need > r->cap && r->rd > 0) {
        memmove(r->buf, r->buf + r->rd, r->wr - r->rd);
        r->wr -= r->rd;
        r->rd = 0;
    }
    return r->wr + need <= r->cap;
}

}  // namespace

int KDH1_HttpStatus(uint32_t status) {
    for (const auto& e : kStatuses)
        if (e.status == status) return e.http;
    return 500;
}

const char* KDH1_MediaType(uint32_t media) {
    for (const auto& e : kMedia)
        if (e.media == media) return e.contentType;
    return nullptr;
}

namespace kdh1 {

KDH1_hdr_t kindOfHeaderName(const char* name) {
    for (const auto& e : kHeaders)
        if (strcasecmp(e.name, name) == 0) return e.kind;
    return static_cast<KDH1_hdr_t>(0);
}

const char* sendableHeaderName(uint32_t kind) {
    for (const auto& e : kHeaders)
        if (e.kind == kind) return e.sendable ? e.name : nullptr;
    return nullptr;
}

uint32_t mediaOfContentType(const char* contentType) {
    if (!contentType) return KDH1_MEDIA_OTHER;
    size_t n = strcspn(contentType, "; \t");
    for (const auto* table : {kMedia, kMoreMedia}) {
        size_t count = table == kMedia ? std::size(kMedia) : std::size(kMoreMedia);
        for (size_t i = 0; i < count; i++)
            if (strlen(table[i].contentType) == n && strncasecmp(table[i].contentType, contentType, n) == 0)
                return table[i].media;
    }
    return KDH1_MEDIA_OTHER;
}

void giveBuffer(void* buffer) {
    if (!buffer) return;
    BufferPool& P = bufferPool();
    {
        std::lock_guard<std::mutex> g(P.mu);
        if (P.free.size() < kPooledBuffers) {
            P.free.push_back(static_cast<char*>(buffer));
            return;
        }
    }
    ::free(buffer);
}

void release(KDH1_Request* r) {
    if (r->refs.fetch_sub(1, std::memory_order_acq_rel) == 1) delete r;
}

void wakeLocked(KDH1_Request* r, long long now, bool force) {
    if (!r->parked || r->mhdDone) return;
    bool go = force || r->cancelled || r->producerDone;
    if (!go && r->entityCreated) {
        // Headers not yet sent, or bytes waiting: go on once there is a
        // worthwhile amount (so that a small response goes out in one piece);
        // the watchdog sends smaller amounts after kFlushMillis.
        size_t pending = r->wr - r->rd;
        go = pending >= std::min(kWakeBytes, layer().running.streamBuffer);
        if (!go && (pending > 0 || !r->started) && r->pendingSince == 0) r->pendingSince = now;
    }
    if (!go) return;
    r->parked = false;
    r->pendingSince = 0;
    MHD_resume_connection(r->conn);
}

void cancelLocked(KDH1_Request* r, long long now) {
    r->cancelled = true;
    r->room.notify_all();
    wakeLocked(r, now);
}

void finishCallback(KDH1_Request* r) {
    std::lock_guard<std::mutex> g(r->mu);
    r->producerDone = true;
    r->lastProgress = BSS1_MonotonicMillis();
    wakeLocked(r, r->lastProgress);
}

}  // namespace kdh1

const char* KDH1_GetHeader(const KDH1_request_struct* request, KDH1_hdr_t kind) {
    if (!request) return nullptr;
    for (uint32_t i = 0; i < request->headerCount; i++)
        if (request->headers[i].kind == kind) return request->headers[i].value;
    return nullptr;
}

const char* KDH1_GetNamedHeader(KDH1_request_t request, const char* name) {
    if (!request || !name) return nullptr;
    for (const auto& h : request->headers)
        if (strcasecmp(h.first.c_str(), name) == 0) return h.second.c_str();
    return nullptr;
}

uint32_t KDH1_Response(KDH1_request_t request, uint32_t status, uint32_t headerCount,
                       const KDH1_sendhdr_struct* headers) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!request || (headerCount > 0 && !headers)) return KDH1_STC_BADARG;
    std::lock_guard<std::mutex> g(request->mu);
    if (request->responded || request->entityCreated) return KDH1_STC_STATE;
    for (uint32_t i = 0; i < headerCount; i++) {
        const KDH1_sendhdr_struct& h = headers[i];
        const char* name = sendableHeaderName(h.kind);
        std::string value(h.value ? h.value : "", h.value ? h.length : 0);
        // A header that cannot be sent, or whose value would split the
        // header block, is left out rather than sent damaged.
        if (!name || value.find_first_of("\r\n", 0) != std::string::npos || value.find('\0') != std::string::npos) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Extra header kind %u refused", (unsigned)h.kind);
            continue;
        }
        request->extra.emplace_back(name, std::move(value));
    }
    request->status = status;
    request->responded = true;
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Response status %x, %u headers", status, headerCount);
    return KDH1_STC_OK;
}

uint32_t KDH1_ActivityOptions(KDH1_request_t request, uint32_t optionSet, const uint32_t* newOptions,
                              uint32_t* oldOptions) {
    if (!request || optionSet != KDH1_OPTSET_ACTIVITY) return KDH1_STC_BADARG;
    std::lock_guard<std::mutex> g(request->mu);
    if (oldOptions) *oldOptions = request->options;
    if (newOptions) request->options = *newOptions;
    return KDH1_STC_OK;
}

uint32_t KDH1_CreateEntity(KDH1_request_t request, uint32_t media, uint64_t contentLength) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!request) return KDH1_STC_BADARG;
    std::lock_guard<std::mutex> g(request->mu);
    if (request->entityCreated) return KDH1_STC_STATE;
    if (request->cancelled || request->mhdDone) return KDH1_STC_CLOSED;
    request->media = media;
    request->contentLength = contentLength;
    request->entityCreated = true;
    request->lastProgress = BSS1_MonotonicMillis();
    wakeLocked(request, request->lastProgress);
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Entity media %u length %llu", media, (unsigned long long)contentLength);
    return KDH1_STC_OK;
}

uint32_t KDH1_Put(KDH1_request_t request, const void* data, size_t length) {
    if (!request || (length > 0 && !data)) return KDH1_STC_BADARG;
    const char* p = static_cast<const char*>(data);
    std::unique_lock<std::mutex> g(request->mu);
    if (!request->entityCreated) return KDH1_STC_STATE;
    uint32_t rc = KDH1_STC_OK;
    if (request->contentLength && request->accepted + length > request->contentLength) {
        length = request->contentLength - request->accepted;
        rc = KDH1_STC_OVERFLOW;
    }
    const size_t limit = layer().running.streamBuffer;
    while (length > 0) {
        if (request->cancelled || request->mhdDone) return KDH1_STC_CLOSED;
        size_t pending = request->wr - request->rd;
        if (pending >= limit) {
            // Full: make sure the network side is draining, then wait for it.
            wakeLocked(request, BSS1_MonotonicMillis(), true);
            request->room.wait(g);
            continue;
        }
        size_t n = std::min(length, limit - pending);
        if (!makeRoom(request, n, limit)) return KDH1_STC_NOMEMORY;
        memcpy(request->buf + request->wr, p, n);
        request->wr += n;
        request->accepted += n;
        p += n;
        length -= n;
        long long now = BSS1_MonotonicMillis();
        request->lastProgress = now;
        wakeLocked(request, now);
    }
    return rc;
}

uint32_t KDH1_Status(KDH1_request_t request) {
    if (!request) return KDH1_STC_BADARG;
    std::lock_guard<std::mutex> g(request->mu);
    return request->cancelled || request->mhdDone ? KDH1_STC_CLOSED : KDH1_STC_OK;
}

uint32_t KDH1_OpenEntity(KDH1_request_t request, uint32_t* entityType, uint32_t* entityLength) {
    if (!request) return KDH1_STC_BADARG;
    if (entityType) *entityType = request->record.entityType;
    if (entityLength) *entityLength = static_cast<uint32_t>(request->body.size());
    return KDH1_STC_OK;
}

uint32_t KDH1_Get(KDH1_request_t request, void* buffer, uint32_t* length) {
    if (!request || !length || (*length > 0 && !buffer)) return KDH1_STC_BADARG;
    size_t left = request->body.size() - request->bodyRead;
    size_t n = std::min<size_t>(*length, left);
    if (n) memcpy(buffer, request->body.data() + request->bodyRead, n);
    request->bodyRead += n;
    *length = static_cast<uint32_t>(n);
    return KDH1_STC_OK;
}
