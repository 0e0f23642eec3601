// kshmtrq: the meta request's fixed order of steps and the batch of
// sub-requests (see kshmtrq.h).
#include "kshmtrq.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "kshexreq.h"
#include "kshhttp.h"
#include "kshprs.h"
#include "kshroreq.h"
#include "kshssrv.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshmtrq");

namespace {

const char kAttachFailed[] = "\n<error>Unable to attach file</error>\n";
const char kTransformFailed[] = "<transform>FAILED</transform>";

// The client address without its port, as the SOAP start-up takes it.
void takeClientHost(WSQL_HttpServer* http, WSQL_Request_t* rec) {
    const char* client = http->getRequestClient();
    const char* colon = client != nullptr ? strchr(client, ':') : nullptr;
    if (colon == nullptr) return;
    size_t n = static_cast<size_t>(colon - client);
    memcpy(rec->clientHost, client, n < WSQL_CREDENTIAL_SIZE ? n : WSQL_CREDENTIAL_SIZE);
}

}  // namespace

// The steps of a batch by the tag of the sub-request.
const WSQL_BatchStep WSQL_MetaRequest::kBatchSteps[] = {
    {"CT_Get", &WSQL_MetaRequest::getRequest},    {"CT_Redirect", &WSQL_MetaRequest::routeStep},
    {"attach", &WSQL_MetaRequest::attachRequest}, {"insert", &WSQL_MetaRequest::insertRequest},
    {"execute", &WSQL_MetaRequest::executeStep},
};

WSQL_MetaRequest::WSQL_MetaRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document)
    : WSQL_Request(hub, http),
      action(nullptr),
      document(document),
      transformResult(0),
      outputData(nullptr),
      outputLength(0),
      transformedData(nullptr),
      transformedLength(0),
      stylesheet(nullptr),
      subHub(nullptr),
      prefixName(nullptr),
      prefixText(nullptr),
      prefixLength(0),
      suffixName(nullptr),
      suffixText(nullptr),
      suffixLength(0),
      subRequestId(nullptr),
      batchSteps(kBatchSteps),
      batchStepCount(sizeof kBatchSteps / sizeof kBatchSteps[0]) {
    memset(&subRequest, 0, sizeof subRequest);
}

WSQL_MetaRequest::~WSQL_MetaRequest() {
    free(prefixText);
    free(suffixText);
    free(transformedData);
}

int WSQL_MetaRequest::processRequest() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    // Member pointers dispatch virtually, so the overrides run.
    static int (WSQL_MetaRequest::*const kSteps[])() = {
        &WSQL_MetaRequest::parseCommonParms, &WSQL_MetaRequest::parseXML,         &WSQL_MetaRequest::setupOutput,
        &WSQL_MetaRequest::retrieveData,     &WSQL_MetaRequest::finishOutput,     &WSQL_MetaRequest::transformResults,
        &WSQL_MetaRequest::processResults,
    };
    int rc = WSQL_OK;
    for (auto step : kSteps) {
        rc = (this->*step)();
        if (rc != WSQL_OK) break;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_MetaRequest::parseXML() { return WSQL_OK; }
int WSQL_MetaRequest::insertRequestData() { return WSQL_OK; }

int WSQL_MetaRequest::parseCommonParms() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    unsigned n = 0;
    if (document->getElementValue("stylesheet", &stylesheet, &n) != WSQL_OK) stylesheet = nullptr;
    if (document->getElementValue("prefix", &prefixName, &n) != WSQL_OK) prefixName = nullptr;
    if (document->getElementValue("suffix", &suffixName, &n) != WSQL_OK) suffixName = nullptr;
    // A prefix or suffix that cannot be read leaves its text empty.
    (void)readFile(prefixName, &prefixText, &prefixLength);
    (void)readFile(suffixName, &suffixText, &suffixLength);
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "stylesheet \"%s\" prefix \"%s\" (%u) suffix \"%s\" (%u)",
                    stylesheet ? stylesheet : "", prefixName ? prefixName : "", prefixLength,
                    suffixName ? suffixName : "", suffixLength);
    RAS1_EXIT_RC(ras, WSQL_OK);
    return WSQL_OK;
}

bool WSQL_MetaRequest::staysInFileDirectory(const char* name) {
    if (name == nullptr || *name == '\0' || *name == '/') return false;
    for (const char* p = name; p != nullptr; p = strchr(p, '/')) {
        if (*p == '/') ++p;
        if (*p == '.') return false;
    }
    return true;
}

int WSQL_MetaRequest::readFile(const char* name, char** text, uint32_t* length) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (name == nullptr) {
        RAS1_EXIT_RC(ras, WSQL_OK);
        return WSQL_OK;
    }
    const char* dir = WSQL_GetFileDirectory();
    char path[4096];
    int n = dir != nullptr && *dir != '\0' ? snprintf(path, sizeof path, "%s/%s", dir, name)
                                           : snprintf(path, sizeof path, "%s", name);
    int rc = 1;
    struct stat st;
    FILE* f = nullptr;
    if (!staysInFileDirectory(name)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "File name \"%s\" refused: it could leave the file directory", name);
    } else if (n < 0 || static_cast<size_t>(n) >= sizeof path || stat(path, &st) != 0 || !S_ISREG(st.st_mode) ||
               st.st_size >= UINT32_MAX || (f = fopen(path, "r")) == nullptr) {
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open \"%s\"", path);
    } else {
        size_t size = static_cast<size_t>(st.st_size) + 1;
        char* buf = static_cast<char*>(malloc(size));
        if (buf == nullptr) {
            RAS1_Printf(RAS1_THIS, __LINE__, "No memory to read \"%s\" (%zu bytes)", path, size);
        } else {
            size_t got = fread(buf, 1, size, f);
            buf[got < size ? got : size - 1] = '\0';
            free(*text);
            *text = buf;
            *length = static_cast<uint32_t>(strlen(buf));
            rc = WSQL_OK;
        }
        fclose(f);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_MetaRequest::setupOutput() {
    if (prefixText != nullptr) (void)getHttp()->append(prefixText);
    return WSQL_OK;
}

void WSQL_MetaRequest::takeOutput() {
    WSQL_ResponseBuffer* b = getHttp()->getBuffer();
    if (b == nullptr || !b->valid()) {
        outputData = nullptr;
        outputLength = 0;
        return;
    }
    outputLength = static_cast<uint32_t>(b->getLength());
    outputData = b->getBuffer();
    outputData[outputLength] = '\0';  // the buffer always has room for its terminator
}

int WSQL_MetaRequest::finishOutput() {
    if (suffixText != nullptr) (void)getHttp()->append(suffixText);
    takeOutput();
    return WSQL_OK;
}

int WSQL_MetaRequest::transformResults() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (stylesheet != nullptr) {
        char* text = nullptr;
        uint32_t n = 0;
        transformResult = transformer.transformObject(outputData, outputLength, stylesheet, &text, &n);
        if (transformResult != WSQL_OK) {
            (void)getHttp()->append(kTransformFailed);
            // The append may have moved the buffer: the output keeps its
            // length but is read from where the buffer is now.
            uint32_t keep = outputLength;
            takeOutput();
            if (outputData != nullptr && keep <= outputLength) outputLength = keep;
        } else {
            free(transformedData);
            transformedData = text;
            transformedLength = n;
            outputData = transformedData;
            outputLength = transformedLength;
        }
    }
    RAS1_EXIT_RC(ras, WSQL_OK);
    return WSQL_OK;
}

int WSQL_MetaRequest::insertXMLTagHeader() {
    if (subRequestId == nullptr) return WSQL_OK;
    WSQL_HttpServer* http = getHttp();
    (void)http->append("<XML ID=\"");
    (void)http->appendText(subRequestId);
    return http->append("\">");
}

int WSQL_MetaRequest::insertXMLTagTrailer() {
    return subRequestId != nullptr ? getHttp()->append("</XML>") : WSQL_OK;
}

int WSQL_MetaRequest::retrieveData() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    unsigned count = 0;
    int more = document->getArray("request", &count);
    while (more == WSQL_OK) {
        subRequestId = nullptr;
        char* id = nullptr;
        if (document->getAttributeList() == WSQL_OK && document->getAttribute("id", &id) == WSQL_OK) subRequestId = id;
        KSH_DOMNode* element = document->getCurrent();
        KSH_XML* fragment = element != nullptr && element->getNumChildren() != 0 ? document->createChildFragment() : nullptr;
        char* tag = nullptr;
        if (fragment == nullptr || fragment->getFirstChild() == nullptr || fragment->getNodeTagname(&tag) != WSQL_OK) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Internal error processing sub-request");
            getHttp()->setRequestError(false, "Internal error processing sub-request", nullptr, 0);
            break;
        }
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Sub-request \"%s\" id \"%s\"", tag, id ? id : "");
        (void)insertXMLTagHeader();
        for (size_t i = 0; i < batchStepCount; i++)
            if (strcmp(tag, batchSteps[i].tag) == 0) (void)(this->*batchSteps[i].run)(fragment);
        (void)insertXMLTagTrailer();
        more = document->nextNode();
    }
    subRequestId = nullptr;
    RAS1_EXIT_RC(ras, WSQL_OK);
    return WSQL_OK;
}

int WSQL_MetaRequest::parseGetRequest(KSH_XML* fragment, KSH_XML* parsed) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    WSQL_HttpServer* http = getHttp();
    fragment->resetCurrentNode();
    // The record's strings must point into a document of their own: the
    // fragment's text is parsed again into `parsed`.
    char* text = nullptr;
    unsigned n = 0;
    int rc = fragment->extractDocumentXML(&text, &n) == WSQL_OK ? WSQL_OK : 1;
    takeClientHost(http, &subRequest);
    unsigned long length = n;
    if (rc == WSQL_OK && WSQL_ParseSoapRequest(http, getHub(), text, &length, &subRequest, &action, parsed) != WSQL_OK)
        rc = 1;
    if (rc == WSQL_OK && WSQL_SetupGetMethod(http, &subRequest) != WSQL_OK) rc = 1;
    subHub = getHub();
    if (rc == WSQL_OK && subRequest.hubAlias != nullptr) {
        subHub = WSQL_ResolveHubAlias(subRequest.hubAlias, getHub());
        if (subHub == nullptr) {
            http->setRequestError(true, "Invalid Hub Alias.", nullptr, 0);
            rc = 1;
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_MetaRequest::getRequest(KSH_XML* fragment) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    memset(&subRequest, 0, sizeof subRequest);
    action = nullptr;
    KSH_XML parsed;
    int rc = parseGetRequest(fragment, &parsed);
    if (rc == WSQL_OK) rc = insertRequestData();
    WSQL_Request* located = nullptr;
    if (rc == WSQL_OK && subRequest.requestHandle != nullptr)
        located = WSQL_Request::locateRequest(static_cast<unsigned>(atoi(subRequest.requestHandle)), getHttp());
    if (rc == WSQL_OK && located != nullptr) {
        rc = located->Fetch(action, false);
        if (rc == WSQL_OK) rc = located->Process(action);
        located->deactiveRequest();  // an active request would never expire
    } else if (rc == WSQL_OK) {
        auto* request = new (std::nothrow) WSQL_Request(subHub, getHttp());
        if (request == nullptr) {
            getHttp()->setRequestMemoryError();
            rc = WSQL_NOMEM;
        } else {
            rc = request->InitReq(&subRequest, action);
            if (rc == WSQL_OK) rc = request->Start();
            if (rc == WSQL_OK) rc = request->Fetch(action, false);
            if (rc == WSQL_OK) rc = request->Process(action);
            // Kept only as the SOAP path keeps one: persisted and run through.
            if (rc == WSQL_OK && request->isPersisted()) {
                request->deactiveRequest();
            } else {
                request->Done(0);
                delete request;
            }
        }
    }
    // The record's strings pointed into `parsed`, which ends here: only the
    // user id (which the warehouse export records) is kept.
    char userid[WSQL_CREDENTIAL_SIZE];
    memcpy(userid, subRequest.userid, sizeof userid);
    memset(&subRequest, 0, sizeof subRequest);
    memcpy(subRequest.userid, userid, sizeof userid);
    action = nullptr;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_MetaRequest::attachRequest(KSH_XML* fragment) {
    char* name = nullptr;
    unsigned n = 0;
    char* text = nullptr;
    uint32_t length = 0;
    int rc = fragment->getNodeValue(&name, &n) == WSQL_OK ? readFile(name, &text, &length) : 1;
    if (rc == WSQL_OK && text == nullptr) rc = 1;
    if (rc != WSQL_OK) {
        (void)getHttp()->append(kAttachFailed);
    } else {
        (void)getHttp()->append(text);
    }
    free(text);
    return rc;
}

int WSQL_MetaRequest::insertRequest(KSH_XML* fragment) {
    char* xml = nullptr;
    unsigned n = 0;
    int rc = fragment->extractChildNodeXML(&xml, &n);
    if (rc == WSQL_OK) rc = getHttp()->append(xml);
    return rc;
}

int WSQL_MetaRequest::routeStep(KSH_XML* fragment) {
    auto* route = new (std::nothrow) WSQL_RouteRequest(getHub(), getHttp(), fragment);
    if (route == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to create WSQL_RouteRequest");
        return WSQL_NOMEM;
    }
    int rc = route->routeRequest();
    delete route;
    return rc;
}

int WSQL_MetaRequest::executeStep(KSH_XML* fragment) {
    auto* exec = new (std::nothrow) WSQL_ExecuteRequest(getHub(), getHttp(), fragment);
    if (exec == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to create WSQL_ExecuteRequest");
        return WSQL_NOMEM;
    }
    int rc = exec->executeRequest();
    delete exec;
    return rc;
}
