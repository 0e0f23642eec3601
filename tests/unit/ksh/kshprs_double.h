// Test double of the HTTP request object for the request parser's tests:
// fed a query string or a POST body, it records the headers and the body
// the gateway writes instead of sending them.
#pragma once

#include <cstdlib>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "kshhttp.h"

class PrsHttp : public WSQL_HttpServer {
public:
    struct Headers {
        uint32_t status;
        uint32_t media;
    };

    PrsHttp(std::string q = "", std::string b = "", std::string c = "10.1.2.3:4567")
        : query(std::move(q)), body(std::move(b)), client(std::move(c)) {}

    const char* getRequestMethod() override { return body.empty() ? "GET" : "POST"; }
    const char* getQueryString() override { return query.c_str(); }
    const char* getPathInfo() override { return path.c_str(); }
    const char* getPathTranslated() override { return path.c_str(); }
    const char* getRequestClient() override { return client.c_str(); }
    int writeHeaders(uint32_t status, uint32_t media, uint64_t, uint32_t, const KDH1_sendhdr_struct*) override {
        headers.push_back({status, media});
        return 0;
    }
    int writeClient(const char* data, size_t n) override {
        sent.append(data, n);
        return 0;
    }
    int writeClientUTF8(const char* data, size_t n) override { return writeClient(data, n); }
    int readClient(char** data, uint32_t* n) override {
        *data = nullptr;
        *n = 0;
        if (readStatus != 0) return readStatus;
        if (body.empty()) return 0;
        *data = static_cast<char*>(malloc(body.size() + 1));
        memcpy(*data, body.c_str(), body.size() + 1);
        *n = static_cast<uint32_t>(body.size());
        return 0;
    }

    // The fault string of the recorded error, "" without one.
    std::string fault() const { return getFaultString() ? getFaultString() : ""; }
    std::string detail() const { return getFaultDetail() ? getFaultDetail() : ""; }

    std::string query;
    std::string body;
    std::string client;
    std::string path = "/soap/index.htm";
    int readStatus = 0;
    std::string sent;
    std::vector<Headers> headers;
};

// A SOAP 1.1 envelope around `method`.
inline std::string soapEnvelope(const std::string& method) {
    return "<?xml version=\"1.0\"?><SOAP-ENV:Envelope "
           "xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"><SOAP-ENV:Body>" +
           method + "</SOAP-ENV:Body></SOAP-ENV:Envelope>";
}

// The texts of a record's strings, for comparisons.
inline std::string str(const char* s) { return s ? s : "(null)"; }
