// kshhttp: the request/response object, its response buffer and the URL
// helpers (see kshhttp.h).
#include "kshhttp.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "kshlst.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshhttp");

namespace {

void* zeroedArray(size_t size) { return calloc(size, 1); }
WSQL_BufferAllocator gAllocate = zeroedArray;

void freeLine(void* p) { free(p); }

// SOAP 1.1 envelope and encoding namespaces; the check namespace is ours.
constexpr const char kEnvelopeHead[] =
    "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"  "
    "SOAP-ENV:encodingStyle=\"http://schemas.xmlsoap.org/soap/encoding/\"> <SOAP-ENV:Body>";
constexpr const char kSuccessOpen[] =
    "<SOAP-CHK:Success xmlns:SOAP-CHK = \"urn:lanthe-soap:check\" xmlns=\"urn:lanthe-soap:attributes\">";
constexpr const char kSuccessClose[] = "</SOAP-CHK:Success></SOAP-ENV:Body></SOAP-ENV:Envelope>";
constexpr const char kFaultClose[] = "</SOAP-ENV:Fault></SOAP-ENV:Body></SOAP-ENV:Envelope>";
constexpr const char kXmlDeclaration[] = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n";
constexpr const char kMemoryError[] = "Unable to obtain memory.";

// The XML header's one extra header: kind 59 with the value "cache".
const KDH1_sendhdr_struct kCacheHeader = {KDH1_HDR_CACHE, 5, "cache"};

struct Entity {
    char c;
    const char* text;
};
constexpr Entity kEntities[] = {
    {'"', "&quot;"}, {'&', "&amp;"}, {'\'', "&apos;"}, {'<', "&lt;"}, {'>', "&gt;"},
};

const char* entityFor(char c) {
    for (const Entity& e : kEntities)
        if (e.c == c) return e.text;
    return nullptr;
}

// Appends `text` escaped to a std::string (for texts composed here).
void appendEscaped(std::string& out, const char* text) {
    for (const char* p = text ? text : ""; *p; p++) {
        const char* e = entityFor(*p);
        if (e)
            out += e;
        else
            out += *p;
    }
}

}  // namespace

void WSQL_SetBufferAllocator(WSQL_BufferAllocator allocator) { gAllocate = allocator ? allocator : zeroedArray; }

// ---------------------------------------------------------------- buffer

WSQL_ResponseBuffer::WSQL_ResponseBuffer(size_t size) : data(nullptr), length(0), capacity(0), needsRecount(false) {
    if (size == 0) size = WSQL_DEFAULT_BUFFER_SIZE;
    data = static_cast<char*>(gAllocate(size));
    if (data) capacity = size - 1;
}

WSQL_ResponseBuffer::~WSQL_ResponseBuffer() { free(data); }

int WSQL_ResponseBuffer::reallocBuffer(size_t extra) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (extra > (SIZE_MAX / 4) || capacity > (SIZE_MAX / 4)) return WSQL_NORESPONSE;
    size_t size = (extra + static_cast<size_t>(capacity)) * 2;
    if (size < 2) size = 2;
    char* grown = static_cast<char*>(gAllocate(size));
    if (!grown) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to grow response buffer to %zu bytes", size);
        return WSQL_NORESPONSE;
    }
    if (data) memcpy(grown, data, static_cast<size_t>(length));
    free(data);
    data = grown;
    capacity = size - 1;
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Response buffer grown to %zu bytes", size);
    return WSQL_OK;
}

int WSQL_ResponseBuffer::append(const char* bytes, size_t n) {
    if (!data) return WSQL_NORESPONSE;
    getLength();
    if (length + n > capacity && reallocBuffer(n) != WSQL_OK) return WSQL_NORESPONSE;
    if (n) memcpy(data + length, bytes, n);
    length += n;
    return WSQL_OK;
}

int WSQL_ResponseBuffer::append(const char* text) { return append(text ? text : "", text ? strlen(text) : 0); }

WSQL_ResponseBuffer::operator char*() {
    if (!data) return nullptr;
    getLength();
    needsRecount = true;
    return data + length;
}

size_t WSQL_ResponseBuffer::getLength() {
    if (needsRecount) recalc();
    return static_cast<size_t>(length);
}

void WSQL_ResponseBuffer::recalc() {
    needsRecount = false;
    if (!data) return;
    // The text written at the end is bounded by the capacity: the byte at
    // data[capacity] is never written and stays the terminating NUL.
    length += strnlen(data + length, static_cast<size_t>(capacity - length));
}

void WSQL_ResponseBuffer::clear() {
    length = 0;
    needsRecount = false;
}

int WSQL_ResponseBuffer::appendEscaped(const char* text) {
    if (!data) return WSQL_NORESPONSE;
    getLength();
    for (const char* p = text ? text : ""; *p; p++) {
        while (capacity - length < 6) {
            data[length] = '\0';
            if (reallocBuffer(0) != WSQL_OK) return WSQL_NORESPONSE;
        }
        const char* e = entityFor(*p);
        size_t n = e ? strlen(e) : 1;
        memcpy(data + length, e ? e : p, n);
        length += n;
    }
    data[length] = '\0';
    return WSQL_OK;
}

// ---------------------------------------------------------------- URL helpers

char x2c(const char* what) {
    auto digit = [](char c) -> int {
        if (c < 'A') return c - '0';
        return (c & ~0x20) - 'A' + 10;
    };
    return static_cast<char>(digit(what[0]) * 16 + digit(what[1]));
}

void WSQL_UnescapeURL(char* url) {
    if (!url) return;
    char* out = url;
    for (char* in = url; *in; in++) {
        if (*in == '%' && in[1] != '\0' && in[2] != '\0') {
            *out++ = x2c(in + 1);
            in += 2;
        } else {
            *out++ = *in == '+' ? ' ' : *in;
        }
    }
    *out = '\0';
}

int WSQL_ParseQueryString(char* text, WSQL_QueryItem* items, int max) {
    int count = 0;
    char* p = text;
    while (p && *p && count < max) {
        char* amp = strchr(p, '&');
        char* next = nullptr;
        if (amp) {
            *amp = '\0';
            next = amp + 1;
        }
        char* eq = strchr(p, '=');
        items[count].name = p;
        if (eq) {
            *eq = '\0';
            items[count].value = eq + 1;
            WSQL_UnescapeURL(eq + 1);
        } else {
            items[count].value = p + strlen(p);  // the item's own terminating NUL: empty
        }
        count++;
        p = next;
    }
    return count;
}

// ---------------------------------------------------------------- request object

WSQL_HttpServer::WSQL_HttpServer(size_t bufferSize)
    : buffer(nullptr),
      queryItems{},
      xmlHeaders(nullptr),
      numQueryItems(0),
      errorFlags(0),
      faultString(nullptr),
      faultDetail(nullptr),
      errorCode(0),
      queryCopy(nullptr) {
    setBuffer(bufferSize);
}

WSQL_HttpServer::~WSQL_HttpServer() {
    delete buffer;
    delete xmlHeaders;
    free(faultString);
    free(faultDetail);
    free(queryCopy);
}

int WSQL_HttpServer::setBuffer(size_t size) {
    delete buffer;
    buffer = new (std::nothrow) WSQL_ResponseBuffer(size);
    if (buffer && !buffer->valid()) {
        delete buffer;
        buffer = nullptr;
    }
    return buffer ? WSQL_OK : WSQL_NORESPONSE;
}

int WSQL_HttpServer::append(const char* text) { return buffer ? buffer->append(text) : WSQL_NORESPONSE; }
int WSQL_HttpServer::appendUTF8(const char* text) { return append(text); }
int WSQL_HttpServer::appendText(const char* text) { return buffer ? buffer->appendEscaped(text) : WSQL_NORESPONSE; }
int WSQL_HttpServer::appendTextUTF8(const char* text) { return appendText(text); }

int WSQL_HttpServer::writeClientBuffer() {
    if (!buffer) return WSQL_NORESPONSE;
    int rc = writeClient(buffer->getBuffer(), buffer->getLength());
    buffer->clear();
    return rc;
}

int WSQL_HttpServer::writeClientBufferUTF8() {
    if (!buffer) return WSQL_NORESPONSE;
    int rc = writeClientUTF8(buffer->getBuffer(), buffer->getLength());
    buffer->clear();
    return rc;
}

void WSQL_HttpServer::dump() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_DETAIL) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Method=%s", getRequestMethod());
        RAS1_Printf(RAS1_THIS, __LINE__, "QueryString=%s", getQueryString());
    }
}

int WSQL_HttpServer::parseQueryString() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    // The items point into a copy of our own, so the transport's text stays
    // as it came.
    free(queryCopy);
    queryCopy = WSQL_Strdup(getQueryString());
    numQueryItems = queryCopy ? WSQL_ParseQueryString(queryCopy, queryItems, WSQL_MAX_QUERY_ITEMS) : 0;
    RAS1_EXIT_RC(ras, numQueryItems);
    return numQueryItems;
}

const char* WSQL_HttpServer::getQueryValue(const char* name) const {
    if (!name) return nullptr;
    for (int i = 0; i < numQueryItems; i++)
        if (strcmp(queryItems[i].name, name) == 0) return queryItems[i].value;
    return nullptr;
}

int WSQL_HttpServer::addXMLHeader(char* text) {
    if (!xmlHeaders) xmlHeaders = new (std::nothrow) LinkedList(freeLine);
    if (!xmlHeaders || xmlHeaders->AppendEntry(text) != WSQL_OK) {
        free(text);
        return WSQL_NOMEM;
    }
    return WSQL_OK;
}

int WSQL_HttpServer::addRawXMLHeader(const char* text) {
    char* copy = WSQL_Strdup(text ? text : "");
    return copy ? addXMLHeader(copy) : WSQL_NOMEM;
}

int WSQL_HttpServer::addXSLReference(const char* href) {
    std::string line = "<?xml-stylesheet type=\"text/xsl\" href=\"";
    appendEscaped(line, href);
    line += "\" ?>\n";
    char* copy = WSQL_Strdup(line.c_str());
    return copy ? addXMLHeader(copy) : WSQL_OK;
}

int WSQL_HttpServer::writeXMLHeader(uint32_t headerCount, const KDH1_sendhdr_struct* headers) {
    int rc = writeHeaders(KDH1_STC_OK, KDH1_MEDIA_XML, 0, headerCount, headers);
    std::string prologue = kXmlDeclaration;
    if (xmlHeaders) {
        LinkedListIter it(xmlHeaders);
        while (const char* line = static_cast<const char*>(it.Next())) prologue += line;
    }
    writeClient(prologue.data(), prologue.size());
    return rc;
}

int WSQL_HttpServer::startSoapResponse() {
    writeXMLHeader(1, &kCacheHeader);
    std::string open = std::string(kEnvelopeHead) + kSuccessOpen;
    writeClient(open.data(), open.size());
    return WSQL_OK;
}

int WSQL_HttpServer::finishSoapResponse() {
    writeClient(kSuccessClose, sizeof kSuccessClose - 1);
    return WSQL_OK;
}

int WSQL_HttpServer::WriteSoapResponse() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_OK;
    if (isRequestErrorSet()) {
        rc = writeSoapErrorResponse();
    } else {
        startSoapResponse();
        if (writeClientBufferUTF8() != 0) rc = WSQL_BADINPUT;
        finishSoapResponse();
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_HttpServer::writeSoapErrorResponse() {
    writeXMLHeader(1, &kCacheHeader);
    std::string fault = std::string(kEnvelopeHead) + "<SOAP-ENV:Fault>";
    fault += isClientFault() ? "\n<faultcode>SOAP-ENV:Client</faultcode>" : "\n<faultcode>SOAP-ENV:Server</faultcode>";
    fault += "\n<faultstring>";
    appendEscaped(fault, faultString);
    fault += "</faultstring>";
    if (isClientFault() && faultDetail) {
        fault += "\n<detail>";
        appendEscaped(fault, faultDetail);
        fault += "</detail>\n";
    }
    fault += kFaultClose;
    writeClient(fault.data(), fault.size());
    return WSQL_OK;
}

void WSQL_HttpServer::setRequestError(bool clientFault, const char* text, const char* detail, uint32_t code) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (isRequestErrorSet()) return;
    faultString = text ? WSQL_Strdup(text) : nullptr;
    faultDetail = detail ? WSQL_Strdup(detail) : nullptr;
    errorCode = code;
    errorFlags |= clientFault ? kClientFault : kServerFault;
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Request error %s fault code %u: %s", clientFault ? "client" : "server",
                    code, text ? text : "");
}

void WSQL_HttpServer::setRequestMemoryError() { setRequestError(false, kMemoryError, nullptr, 0); }

int WSQL_HttpServer::returnError(uint32_t status, const char* message, int code) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    // The error code shown is the status less the HTTP layer's status base
    // (a status below the base shows as a negative number).
    int shown = static_cast<int>(static_cast<int64_t>(status) - static_cast<int64_t>(KDH1_STC_BASE));
    char numbers[64];
    snprintf(numbers, sizeof numbers, "<TD>%d</TD><TD>%d</TD><TD>", shown, code);
    std::string page =
        "<HTML><HEAD><TITLE>Request Failed</TITLE></HEAD><BODY><H2>Request Failed:</H2><TABLE><TR><TH>Error Code</TH>"
        "<TH>Status</TH><TH>Message</TH></TR>";
    page += numbers;
    appendEscaped(page, message);
    page += "</TD></TABLE></BODY></HTML>";
    writeHeaders(KDH1_STC_OK, KDH1_MEDIA_HTML, 0, 0, nullptr);
    writeClient(page.data(), page.size());
    RAS1_EXIT_RC(ras, 0);
    return WSQL_OK;
}
