// Runs arbitrary bytes, parsed as a request document, through the meta
// request's steps: common parameters, the batch walk with its "XML ID"
// wrappers, attach, insert and execute steps (over an empty file directory,
// so that no file is ever found), CT_Get sub-requests parsed into the
// sub-request record without running them, CT_Redirect sub-requests
// checked and serialised without being posted, the suffix and the
// stylesheet step. Nothing reaches a store or the network.
//
// Checks: the output data lies inside the response buffer, every string of
// the sub-request record is readable, and a document with a stylesheet
// ends its response with the transform's failure mark.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include <unistd.h>

#include "fuzzcommon.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshmtrq.h"
#include "kshreq.h"
#include "kshroreq.h"
#include "kshssrv.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"

namespace {

using fuzzcommon::checkRecord;
using fuzzcommon::FuzzHttp;
using fuzzcommon::fail;
using fuzzcommon::touch;

// A meta request whose CT_Get and CT_Redirect steps stop short of the store
// and the network.
class DryMeta : public WSQL_MetaRequest {
public:
    DryMeta(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* doc) : WSQL_MetaRequest(hub, http, doc) {
        setBatchSteps(kDrySteps, sizeof kDrySteps / sizeof kDrySteps[0]);
    }
    int processResults() override { return 0; }

    int dryGet(KSH_XML* fragment) {
        memset(&subRequest, 0, sizeof subRequest);
        KSH_XML parsed;
        int rc = parseGetRequest(fragment, &parsed);
        checkRecord(subRequest);
        if (rc == 0) rc = insertRequestData();
        memset(&subRequest, 0, sizeof subRequest);
        action = nullptr;
        return rc;
    }
    int dryRoute(KSH_XML* fragment) {
        WSQL_RouteRequest route(getHub(), getHttp(), fragment);
        char* endpoint = nullptr;
        char* text = nullptr;
        unsigned length = 0;
        if (route.prepareRoute(&endpoint, &text, &length) != 0) return 0;
        touch(endpoint);
        if (strlen(text) != length) fail("serialised envelope length");
        return 0;
    }

    bool hasStylesheet() const { return stylesheet != nullptr; }

private:
    using Step = int (WSQL_MetaRequest::*)(KSH_XML*);
    static const WSQL_BatchStep kDrySteps[5];
};

const WSQL_BatchStep DryMeta::kDrySteps[5] = {
    {"CT_Get", static_cast<Step>(&DryMeta::dryGet)},
    {"CT_Redirect", static_cast<Step>(&DryMeta::dryRoute)},
    {"attach", &WSQL_MetaRequest::attachRequest},
    {"insert", &WSQL_MetaRequest::insertRequest},
    {"execute", &DryMeta::executeStep},
};

WSQL_Hub* fuzzHub() {
    static WSQL_Hub* hub = [] {
        const char* src = getenv("CSIT_SOURCE_DIR");
        std::string root = src ? src : __FILE__;
        if (!src) root = root.substr(0, root.rfind("/tests/fuzz/"));
        setenv("CT_ATTRLIB", (root + "/data/attrlib").c_str(), 0);
        RAS1_Configure("NONE", "/dev/null");
        WSQL_GetCatalog();
        // The request list is not started: requests work without it, and
        // its expiry thread would outlive the fuzzer's exit. An empty file
        // directory of its own: no attach or execute file is ever found.
        static char tmpl[] = "/tmp/kshmtrq_fuzz.XXXXXX";
        const char* dir = mkdtemp(tmpl);
        if (dir != nullptr) atexit([] { rmdir(tmpl); });
        WSQL_SetFileDirectory(dir != nullptr ? dir : "/nonexistent-kshmtrq-fuzz");
        auto* h = new WSQL_Hub("FUZZ_NO_STORE", "soap", "soap", nullptr);
        h->setServerPath("FUZZ_NO_STORE", "HUB_MAIN");
        return h;
    }();
    return hub;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    WSQL_Hub* hub = fuzzHub();
    KSH_XML doc;
    if (doc.parseMessage(reinterpret_cast<const char*>(data), static_cast<unsigned>(size)) != 0) return 0;
    FuzzHttp http;
    DryMeta meta(hub, &http, &doc);
    (void)meta.processRequest();
    WSQL_ResponseBuffer* b = http.getBuffer();
    if (b == nullptr || !b->valid()) return 0;
    const char* text = b->getBuffer();
    size_t length = b->getLength();
    const char* out = meta.getOutputData();
    if (out != nullptr && (out != text || meta.getOutputLength() > length)) fail("output data outside the buffer");
    static const char kMark[] = "<transform>FAILED</transform>";
    const size_t markLength = sizeof kMark - 1;
    if (meta.hasStylesheet() && (length < markLength || memcmp(text + length - markLength, kMark, markLength) != 0))
        fail("stylesheet without the failure mark");
    return 0;
}
