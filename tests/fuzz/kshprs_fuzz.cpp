// Parses arbitrary bytes as a SOAP request into the request record and
// applies the method defaults (or the CT_Get completion) the parsed method
// calls for, on a hub that has a node name but no store. Every string the
// record then holds must be readable and terminated, and every array count
// within its bounds.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "fuzzcommon.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshprs.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"

namespace {

using fuzzcommon::checkRecord;
using fuzzcommon::FuzzHttp;
using fuzzcommon::fail;
using fuzzcommon::touch;

WSQL_Hub* fuzzHub() {
    static WSQL_Hub* hub = [] {
        // The source tree: CSIT_SOURCE_DIR, else the one this file was
        // compiled from (tests/fuzz/ below it).
        const char* src = getenv("CSIT_SOURCE_DIR");
        std::string root = src ? src : __FILE__;
        if (!src) root = root.substr(0, root.rfind("/tests/fuzz/"));
        std::string dir = root + "/data/attrlib";
        setenv("CT_ATTRLIB", dir.c_str(), 0);
        RAS1_Configure("NONE", "/dev/null");
        WSQL_GetCatalog();
        auto* h = new WSQL_Hub("FUZZ_NO_STORE", "soap", "soap", nullptr);
        h->setServerPath("FUZZ_NO_STORE", "HUB_MAIN");
        return h;
    }();
    return hub;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    WSQL_Hub* hub = fuzzHub();
    std::string body(reinterpret_cast<const char*>(data), size);
    FuzzHttp http;
    KSH_XML doc;
    WSQL_Request_t req;
    memset(&req, 0, sizeof req);
    memcpy(req.clientHost, "10.0.0.1", 8);
    char* action = nullptr;
    char* buffer = body.data();
    unsigned long length = size;
    int rc = WSQL_ParseSoapRequest(&http, hub, buffer, &length, &req, &action, &doc);
    if (rc != 0 && !http.isRequestErrorSet()) fail("refused without an error");
    checkRecord(req);
    if (rc != 0) return 0;
    touch(action);
    const uint32_t m = req.methods & ~WSQL_METHODS_LOW;
    char defaults[WSQL_DEFAULTS_SIZE];
    if (m == WSQL_METHOD_GET || m == (WSQL_METHOD_GET | WSQL_METHOD_ACTION)) {
        WSQL_SetupGetMethod(&http, &req);
    } else if (m & (WSQL_METHODS_STATUS | WSQL_METHODS_ACTIVATION | WSQL_METHOD_WTO | WSQL_METHOD_THRESHOLDS)) {
        int st = WSQL_SetupMethodDefaults(&http, hub, &req, defaults, sizeof defaults, m);
        if (st != 0 && !http.isRequestErrorSet()) fail("defaults failed without an error");
    }
    checkRecord(req);
    return 0;
}
