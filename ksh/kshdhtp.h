// kshdhtp: the gateway's binding to the HTTP service layer (kdh1).
//
// WSQL_KDHServer is the concrete WSQL_HttpServer: it answers the request
// questions from the kdh1 request record and sends headers and body through
// the kdh1 calls. The per-hub service threads and the request callback that
// routes each request (POST to the SOAP parser, "action" queries to the URL
// parser, everything else to the file server) belong beside it in this
// component.
#pragma once

#include <cstdint>

#include "kdh1/kdh1.h"
#include "kshhttp.h"

class WSQL_KDHServer : public WSQL_HttpServer {
public:
    // Wraps `request` (not owned; valid for the callback the object lives in)
    // with a response buffer of the default size.
    explicit WSQL_KDHServer(KDH1_request_struct* request);
    ~WSQL_KDHServer() override;

    const char* getRequestMethod() override;
    const char* getQueryString() override;
    const char* getPathInfo() override;
    const char* getPathTranslated() override;  // the same as the path info
    const char* getRequestClient() override;
    // KDH1_Response, for GET the persistent-connection option, then
    // KDH1_CreateEntity, whose status is the result.
    int writeHeaders(uint32_t status, uint32_t media, uint64_t contentLength, uint32_t headerCount,
                     const KDH1_sendhdr_struct* headers) override;
    int writeClient(const char* data, size_t length) override;
    // On the first call opens the request entity (and marks the connection
    // as reading it). 0 with *data a malloc'd NUL-terminated copy of the body
    // (the caller frees it; left null for an empty body), the layer's status,
    // or 7 when the copy cannot be allocated.
    int readClient(char** data, uint32_t* length) override;
    int writeClientUTF8(const char* data, size_t length) override;
    void dump() override;

    // The value of the request header of `kind`, "" when there is none.
    const char* getHeaderValue(KDH1_hdr_t kind);
    KDH1_request_struct* getRequest() const { return request; }

private:
    KDH1_request_struct* request;
    uint32_t entityType;    // 0 until the entity is opened
    uint32_t entityLength;  // bytes of the request entity
};
