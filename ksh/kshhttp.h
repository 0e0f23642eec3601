// kshhttp: one HTTP request as the gateway sees it, and its response.
//
// WSQL_HttpServer wraps a request for its whole life: what was asked (method,
// query string and its items, path, client), the response body collected in
// a growing WSQL_ResponseBuffer, the first request error, and the writers of
// the response: HTTP headers, the XML declaration with its processing
// instructions, the SOAP envelope around the body, a SOAP fault, or a small
// HTML error page. The transport is supplied by a subclass (WSQL_KDHServer
// over the HTTP service layer). One object per request, used by one thread.
//
// Results: 0 success; 1 no response buffer, or it could not grow; 6 the body
// of a SOAP response could not be sent; 7 no memory for a header line; the
// write operations return the HTTP layer's status unchanged.
//
// Text a client controls is escaped for XML/HTML wherever these writers put
// it into markup: the SOAP fault string and detail, the error page's message
// and the href of a stylesheet line.
#pragma once

#include <cstddef>
#include <cstdint>

#include "kdh1/kdh1.h"

class LinkedList;

// The text of the first response buffer a request gets, and of size 0.
constexpr size_t WSQL_DEFAULT_BUFFER_SIZE = 10240;
// Query items kept per request; later items are ignored.
constexpr int WSQL_MAX_QUERY_ITEMS = 20;

// A growing text buffer. The allocated size is always capacity + 1, so the
// content can be NUL-terminated; bytes after the content are zero right after
// allocation or growth. Owns its array (freed with free).
class WSQL_ResponseBuffer {
public:
    // A zeroed buffer of `size` bytes (0: WSQL_DEFAULT_BUFFER_SIZE), capacity
    // size - 1. When memory is short the buffer has no data (valid() false)
    // and every append returns 1.
    explicit WSQL_ResponseBuffer(size_t size = 0);
    virtual ~WSQL_ResponseBuffer();
    WSQL_ResponseBuffer(const WSQL_ResponseBuffer&) = delete;
    WSQL_ResponseBuffer& operator=(const WSQL_ResponseBuffer&) = delete;

    bool valid() const { return data != nullptr; }
    // Adds `n` bytes (growing first when they do not fit): 0, or 1 when the
    // buffer cannot grow (nothing is appended).
    int append(const char* bytes, size_t n);
    int append(const char* text);
    // Grows to (extra + capacity) x 2 bytes, keeping the content: 0, or 1
    // (the old array stays).
    int reallocBuffer(size_t extra);
    // The end of the content, for a caller that writes a NUL-terminated text
    // there directly (at most freeSpace() characters); the next getLength()
    // counts it in.
    operator char*();
    // Content length, after counting in text written at the end directly.
    size_t getLength();
    void recalc();
    // Empties the buffer (the bytes are not erased).
    void clear();
    size_t freeSpace() { return static_cast<size_t>(capacity - getLength()); }
    size_t getMaxLength() const { return static_cast<size_t>(capacity); }
    char* getBuffer() const { return data; }

    // Adds `text` with the five XML special characters replaced by entity
    // references, writing in place and doubling the buffer whenever fewer than
    // 6 bytes remain: 0, or 1 when it cannot grow (what was written stays).
    int appendEscaped(const char* text);

private:
    char* data;
    uint64_t length;    // bytes in use
    uint64_t capacity;  // usable bytes: allocated size - 1
    bool needsRecount;  // text was written at the end directly
};

// Test hook: replaces the allocator of zeroed response buffer arrays (null:
// calloc again). The allocator returns memory that free() releases.
using WSQL_BufferAllocator = void* (*)(size_t size);
void WSQL_SetBufferAllocator(WSQL_BufferAllocator allocator);

// One query item: pointers into the text the query string was split in.
struct WSQL_QueryItem {
    char* name;
    char* value;
};

// The byte whose two hexadecimal digits `what[0]` and `what[1]` are (both must
// be readable). No validation: other characters give some byte.
char x2c(const char* what);
// Decodes `url` in place: "%XY" becomes one byte, '+' a blank, everything
// else stays. A '%' with fewer than two characters after it is kept as it is.
void WSQL_UnescapeURL(char* url);
// Splits `text` in place into at most `max` items at '&'; each item's name
// ends at its first '=' (none: the whole item, value empty); values are
// decoded, names are not. Returns the number of items.
int WSQL_ParseQueryString(char* text, WSQL_QueryItem* items, int max);

class WSQL_HttpServer {
public:
    // A request with a response buffer of `bufferSize` bytes (0: default).
    explicit WSQL_HttpServer(size_t bufferSize = 0);
    virtual ~WSQL_HttpServer();
    WSQL_HttpServer(const WSQL_HttpServer&) = delete;
    WSQL_HttpServer& operator=(const WSQL_HttpServer&) = delete;

    // The request. Each returns an empty text when the request has none; the
    // texts stay valid for the life of the object.
    virtual const char* getRequestMethod() = 0;
    virtual const char* getQueryString() = 0;
    virtual const char* getPathInfo() = 0;
    virtual const char* getPathTranslated() = 0;
    virtual const char* getRequestClient() = 0;
    // Starts the response: status (KDH1_stc_t), media (KDH1_media_t), content
    // length (0: not announced) and extra headers.
    virtual int writeHeaders(uint32_t status, uint32_t media, uint64_t contentLength, uint32_t headerCount,
                             const KDH1_sendhdr_struct* headers) = 0;
    // Sends the buffer's content and empties it; 1 without a buffer.
    virtual int writeClientBuffer();
    virtual int writeClient(const char* data, size_t length) = 0;
    // The whole request body in a new malloc'd, NUL-terminated array that the
    // caller frees with free(); *data stays null for an empty body.
    virtual int readClient(char** data, uint32_t* length) = 0;
    virtual int writeClientUTF8(const char* data, size_t length) = 0;
    virtual int writeClientBufferUTF8();
    virtual void dump();
    // Sends the HTML error page "Request Failed" (HTTP success, HTML) with
    // `status` less the HTTP layer's status base, `code` and `message`. 0.
    virtual int returnError(uint32_t status, const char* message, int code);
    // writeHeaders(0, XML, 0, ...), then the XML declaration and the XML
    // header lines in the order added; the status of writeHeaders.
    virtual int writeXMLHeader(uint32_t headerCount, const KDH1_sendhdr_struct* headers);
    // Replaces the response buffer by a new one of `size` bytes (0: default);
    // 1 when it cannot be allocated (the request then has none).
    virtual int setBuffer(size_t size);
    // Add text unchanged (append) or XML-escaped (appendText); 1 without a
    // buffer, else the buffer's status. The UTF8 forms do the same: the text
    // is already in the encoding that is sent.
    virtual int append(const char* text);
    virtual int appendUTF8(const char* text);
    virtual int appendText(const char* text);
    virtual int appendTextUTF8(const char* text);

    // Splits a copy of getQueryString() into items; returns their count.
    int parseQueryString();
    // The value of the first item named exactly `name`, or null.
    const char* getQueryValue(const char* name) const;
    WSQL_QueryItem* getQueryItems() { return queryItems; }
    int getNumQueryItems() const { return numQueryItems; }

    WSQL_ResponseBuffer* getBuffer() { return buffer; }

    // Adds `text` (malloc'd; ownership passes, also on failure) as an XML
    // header line: 0, or 7 when the list cannot be created.
    int addXMLHeader(char* text);
    // Adds a copy of `text`: 0, or 7.
    int addRawXMLHeader(const char* text);
    // Adds the line <?xml-stylesheet type="text/xsl" href="HREF" ?> (with a
    // line feed) with `href` escaped; addXMLHeader's result, 0 when the line
    // cannot be allocated.
    int addXSLReference(const char* href);

    // The SOAP envelope: opening (after the XML header with the cache header),
    // closing, and the whole response: the collected body in the envelope, or
    // the fault when an error is recorded. 0, or 6 when the body could not be
    // sent.
    int startSoapResponse();
    int finishSoapResponse();
    int WriteSoapResponse();
    int writeSoapErrorResponse();

    // Records the first error only: a client or server fault with copies of
    // its text and detail (either may be null) and its code.
    void setRequestError(bool clientFault, const char* faultString, const char* detail, uint32_t code);
    void setRequestMemoryError();
    bool isRequestErrorSet() const { return (errorFlags & (kClientFault | kServerFault)) != 0; }
    bool isClientFault() const { return (errorFlags & kClientFault) != 0; }
    const char* getFaultString() const { return faultString; }
    const char* getFaultDetail() const { return faultDetail; }
    uint32_t getErrorCode() const { return errorCode; }

    static constexpr uint32_t kClientFault = 0x80000000u;  // error flag bit 31
    static constexpr uint32_t kServerFault = 0x40000000u;  // error flag bit 30

protected:
    WSQL_ResponseBuffer* buffer;                    // owned, or null
    WSQL_QueryItem queryItems[WSQL_MAX_QUERY_ITEMS];
    LinkedList* xmlHeaders;                         // owned malloc'd lines, or null
    int numQueryItems;
    uint32_t errorFlags;
    char* faultString;                              // malloc'd, or null
    char* faultDetail;                              // malloc'd, or null
    uint32_t errorCode;
    char* queryCopy;                                // the split copy the items point into (malloc'd)
};
