// kshdhtp: WSQL_KDHServer, the request/response object over kdh1 (see
// kshdhtp.h).
#include "kshdhtp.h"

#include <cstdlib>

#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshdhtp");

WSQL_KDHServer::WSQL_KDHServer(KDH1_request_struct* r)
    : WSQL_HttpServer(WSQL_DEFAULT_BUFFER_SIZE), request(r), entityType(0), entityLength(0) {}

WSQL_KDHServer::~WSQL_KDHServer() = default;

const char* WSQL_KDHServer::getHeaderValue(KDH1_hdr_t kind) {
    int ras = RAS1_Sync(RAS1_THIS);
    const char* v = KDH1_GetHeader(request, kind);
    if (!v) v = "";
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Header is <%s>", v);
    return v;
}

const char* WSQL_KDHServer::getRequestMethod() { return getHeaderValue(KDH1_HDR_METHOD); }
const char* WSQL_KDHServer::getQueryString() { return getHeaderValue(KDH1_HDR_QUERYSTRING); }
const char* WSQL_KDHServer::getPathInfo() { return getHeaderValue(KDH1_HDR_PATHINFO); }
const char* WSQL_KDHServer::getPathTranslated() { return getHeaderValue(KDH1_HDR_PATHINFO); }
const char* WSQL_KDHServer::getRequestClient() { return getHeaderValue(KDH1_HDR_CLIENT); }

int WSQL_KDHServer::writeHeaders(uint32_t status, uint32_t media, uint64_t contentLength, uint32_t headerCount,
                                 const KDH1_sendhdr_struct* headers) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    KDH1_Response(request->handle, status, headerCount, headers);
    if (request->code == KDH1_METHOD_GET) {
        uint32_t options = 0;
        KDH1_ActivityOptions(request->handle, KDH1_OPTSET_ACTIVITY, nullptr, &options);
        options |= KDH1_OPT_PERSIST;
        KDH1_ActivityOptions(request->handle, KDH1_OPTSET_ACTIVITY, &options, nullptr);
    }
    int rc = static_cast<int>(KDH1_CreateEntity(request->handle, media, contentLength));
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_KDHServer::writeClient(const char* data, size_t length) {
    int ras = RAS1_Sync(RAS1_THIS);
    uint32_t rc = KDH1_Put(request->handle, data, length);
    if (ras & RAS1_DETAIL)
        RAS1_Printf(RAS1_THIS, __LINE__, "Wrote %u of %u to client, status = %u", (unsigned)length, (unsigned)length,
                    rc);
    return static_cast<int>(rc);
}

int WSQL_KDHServer::writeClientUTF8(const char* data, size_t length) { return writeClient(data, length); }

int WSQL_KDHServer::readClient(char** data, uint32_t* length) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_OK;
    if (entityType == 0) {
        uint32_t options = 0;
        KDH1_ActivityOptions(request->handle, KDH1_OPTSET_ACTIVITY, nullptr, &options);
        options |= KDH1_OPT_ENTITY | KDH1_OPT_PERSIST;
        KDH1_ActivityOptions(request->handle, KDH1_OPTSET_ACTIVITY, &options, nullptr);
        rc = static_cast<int>(KDH1_OpenEntity(request->handle, &entityType, &entityLength));
        if (rc != WSQL_OK) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open entity, rc=%x", (unsigned)rc);
    }
    if (rc == WSQL_OK && entityLength != 0) {
        char* body = static_cast<char*>(malloc(static_cast<size_t>(entityLength) + 1));
        uint32_t got = 0;
        if (!body) rc = WSQL_NOMEM;
        // The layer hands out what it holds; read until the entity is in.
        while (rc == WSQL_OK && got < entityLength) {
            uint32_t n = entityLength - got;
            rc = static_cast<int>(KDH1_Get(request->handle, body + got, &n));
            if (n == 0) break;
            got += n;
        }
        if (body) {
            body[got] = '\0';
            *data = body;
            *length = got;
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void WSQL_KDHServer::dump() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!(ras & RAS1_DETAIL)) return;
    RAS1_Printf(RAS1_THIS, __LINE__, "Request version = %0x", request->version);
    RAS1_Printf(RAS1_THIS, __LINE__, "Request code = %x", request->code);
    RAS1_Printf(RAS1_THIS, __LINE__, "Request Method = %s", getRequestMethod());
    RAS1_Printf(RAS1_THIS, __LINE__, "Query String = %s", getQueryString());
    RAS1_Printf(RAS1_THIS, __LINE__, "Path Info = %s", getPathInfo());
    RAS1_Printf(RAS1_THIS, __LINE__, "Path Translated = %s", getPathTranslated());
    RAS1_Printf(RAS1_THIS, __LINE__, "Entity Type = %u", entityType);
    RAS1_Printf(RAS1_THIS, __LINE__, "Request Client = %s", getRequestClient());
    if (request->path) RAS1_Printf(RAS1_THIS, __LINE__, "Path = %.*s", (int)request->pathLength, request->path);
}
