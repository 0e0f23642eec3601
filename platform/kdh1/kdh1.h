// kdh1: the HTTP service layer.
//
// One HTTP listener per process serves any number of named services. A
// service is created with KDH1_New (name, request callback, user data) and
// starts taking requests when some thread calls KDH1_Listen on it; that call
// blocks until KDH1_Delete of the same service. The listener (address and port
// from KDH1_SetListenAddress, default 127.0.0.1:15200) starts with the first
// listening service and stops when the last one has been deleted.
//
// Routing: a request goes to the listening service whose name equals the
// first segment of the decoded request path, ignoring case ("/SOAP/x.htm" ->
// service "soap"); otherwise to the first listening service in the order of
// KDH1_New. With no service listening the answer is 503.
//
// A request callback runs on a service thread of the layer (never on a
// network thread), once per request, with the request body already collected
// (up to the body limit; a larger body is answered 413 without reaching the
// callback). The callback answers with
//     KDH1_Response(handle, status, n, extraHeaders)   status line and headers
//     KDH1_CreateEntity(handle, media, length)         body type and length
//     KDH1_Put(handle, data, n) ...                    body bytes
// Body bytes stream: they go through a bounded buffer to the client while the
// callback is still producing, and KDH1_Put blocks while the buffer is full, so
// a response of any size needs bounded memory. A response whose callback ends
// before the buffer fills goes out in one piece with its exact length.
// A callback that returns without KDH1_CreateEntity gets its status with an
// empty body, or 500 when it did not call KDH1_Response either.
//
// Tables (the values callers rely on):
//
//   status (KDH1_stc_t)        HTTP     media (KDH1_media_t)   Content-Type
//   0 KDH1_STC_OK              200      2  KDH1_MEDIA_TEXT     text/plain
//   base+22 BADREQUEST         400      6  KDH1_MEDIA_HTML     text/html
//   base+23 UNAUTHORIZED       401      16 KDH1_MEDIA_CSS      text/css
//   base+24 FORBIDDEN          403      17 KDH1_MEDIA_XML      text/xml
//   base+25 NOTFOUND           404      44 KDH1_MEDIA_OTHER    application/octet-stream
//   base+26 BADMETHOD          405      60 KDH1_MEDIA_PDF      application/pdf
//   base+27 TIMEOUT            408      0  KDH1_MEDIA_NONE     (no Content-Type)
//   base+28 TOOLARGE           413
//   base+29 SERVERERROR        500   XML and HTML carry no charset parameter:
//   base+30 NOTIMPLEMENTED     501   the document's own declaration governs.
//   base+31 UNAVAILABLE        503
//   any other value            500
//
//   header kind (KDH1_hdr_t)   request                    response header
//   18 KDH1_HDR_LASTMODIFIED   Last-Modified              Last-Modified
//   59 KDH1_HDR_CACHE          Cache-Control              Cache-Control
//   46 KDH1_HDR_PATHINFO       decoded path (no query)    -
//   48 KDH1_HDR_QUERYSTRING    raw text after '?'         -
//   50 KDH1_HDR_METHOD         method, e.g. "GET"         -
//   52 KDH1_HDR_CLIENT         client address "IP:port"   -
//   the others: see KDH1_hdr_t below.
//
// Every call returns a KDH1_stc_t: 0, or one of the call statuses below.
#pragma once

#include <cstddef>
#include <cstdint>

// Statuses. Error statuses count from KDH1_STC_BASE; the call statuses are not
// HTTP statuses (given to KDH1_Response they answer 500).
enum KDH1_stc_t : uint32_t {
    KDH1_STC_OK = 0,
    KDH1_STC_BASE = 0x7C4C8000u,
    KDH1_STC_BADHANDLE = KDH1_STC_BASE + 1,     // no such server or request handle
    KDH1_STC_BADARG = KDH1_STC_BASE + 2,        // argument missing, too long or not allowed
    KDH1_STC_NOMEMORY = KDH1_STC_BASE + 3,      // allocation failed
    KDH1_STC_LISTENFAILED = KDH1_STC_BASE + 4,  // the listener could not be opened
    KDH1_STC_CLOSED = KDH1_STC_BASE + 5,        // client gone, request cancelled or service deleted
    KDH1_STC_STATE = KDH1_STC_BASE + 6,         // call out of order (e.g. a second KDH1_Response)
    KDH1_STC_EXISTS = KDH1_STC_BASE + 7,        // a service of that name exists
    KDH1_STC_OVERFLOW = KDH1_STC_BASE + 8,      // more body than the announced content length
    // Response statuses.
    KDH1_STC_BADREQUEST = KDH1_STC_BASE + 22,
    KDH1_STC_UNAUTHORIZED = KDH1_STC_BASE + 23,
    KDH1_STC_FORBIDDEN = KDH1_STC_BASE + 24,
    KDH1_STC_NOTFOUND = KDH1_STC_BASE + 25,
    KDH1_STC_BADMETHOD = KDH1_STC_BASE + 26,
    KDH1_STC_TIMEOUT = KDH1_STC_BASE + 27,
    KDH1_STC_TOOLARGE = KDH1_STC_BASE + 28,
    KDH1_STC_SERVERERROR = KDH1_STC_BASE + 29,
    KDH1_STC_NOTIMPLEMENTED = KDH1_STC_BASE + 30,
    KDH1_STC_UNAVAILABLE = KDH1_STC_BASE + 31,
};

// Media types of response bodies (and the entity type of request bodies).
enum KDH1_media_t : uint32_t {
    KDH1_MEDIA_NONE = 0,
    KDH1_MEDIA_TEXT = 2,
    KDH1_MEDIA_HTML = 6,
    KDH1_MEDIA_CSS = 16,
    KDH1_MEDIA_XML = 17,
    KDH1_MEDIA_OTHER = 44,
    KDH1_MEDIA_PDF = 60,
};

// Header kinds. Request headers are looked up by kind (KDH1_GetHeader); the
// kinds marked "request only" are facts of the request, not HTTP headers, and
// cannot be sent. The others can be sent as extra response headers.
enum KDH1_hdr_t : uint32_t {
    KDH1_HDR_ACCEPT = 2,             // Accept
    KDH1_HDR_AUTHORIZATION = 4,      // Authorization (request only; never traced)
    KDH1_HDR_CONTENTDISPOSITION = 6, // Content-Disposition
    KDH1_HDR_CONTENTLENGTH = 8,      // Content-Length (request only)
    KDH1_HDR_CONTENTTYPE = 10,       // Content-Type (request only; responses use the media type)
    KDH1_HDR_HOST = 12,              // Host (request only)
    KDH1_HDR_USERAGENT = 14,         // User-Agent (request only)
    KDH1_HDR_SOAPACTION = 16,        // SOAPAction (request only)
    KDH1_HDR_LASTMODIFIED = 18,      // Last-Modified
    KDH1_HDR_IFMODIFIEDSINCE = 20,   // If-Modified-Since (request only)
    KDH1_HDR_LOCATION = 22,          // Location
    KDH1_HDR_PATHINFO = 46,          // request only: the path, percent-decoded once
    KDH1_HDR_QUERYSTRING = 48,       // request only: the raw query string
    KDH1_HDR_METHOD = 50,            // request only: the request method
    KDH1_HDR_CLIENT = 52,            // request only: the client's address and port
    KDH1_HDR_CACHE = 59,             // Cache-Control
};

// Request method codes (KDH1_request_struct::code).
enum : uint32_t {
    KDH1_METHOD_OTHER = 0,
    KDH1_METHOD_GET = 1,
    KDH1_METHOD_HEAD = 2,
    KDH1_METHOD_POST = 3,
    KDH1_METHOD_PUT = 4,
    KDH1_METHOD_DELETE = 5,
    KDH1_METHOD_OPTIONS = 6,
};

// Activity option set 4 and its bits (KDH1_ActivityOptions).
enum : uint32_t {
    KDH1_OPTSET_ACTIVITY = 4,
    KDH1_OPT_ENTITY = 0x1,   // the callback reads the request entity
    KDH1_OPT_PERSIST = 0x2,  // the connection may stay open after the response;
                             // clear (the default), the response closes it
};

using KDH1_server_t = unsigned long;      // service handle; 0 = none
using KDH1_request_t = struct KDH1_Request*;  // request handle, valid during its callback

// One request header as the callback sees it.
struct KDH1_header_struct {
    KDH1_hdr_t kind;
    uint32_t length;
    const char* value;  // NUL-terminated
};

// The request record handed to a service callback. Everything it points to
// belongs to the layer and stays valid until the callback returns.
struct KDH1_request_struct {
    KDH1_request_t handle;             // the handle for the KDH1_ calls below
    const KDH1_header_struct* headers; // the request's headers of known kinds
    uint32_t headerCount;
    uint32_t code;                     // KDH1_METHOD_*
    uint32_t version;                  // HTTP version, 0x0100 or 0x0101
    const char* path;                  // raw request path, without the query string
    uint32_t pathLength;
    uint32_t entityType;               // media type of the request body (KDH1_media_t)
    void* userData;                    // as given to KDH1_New
};

// An extra response header.
struct KDH1_sendhdr_struct {
    KDH1_hdr_t kind;
    uint32_t length;     // bytes of value
    const char* value;   // need not be NUL-terminated; CR and LF are refused
};

// The request callback. Its result is traced, not sent.
using KDH1_service_t = int (*)(KDH1_request_struct* request);

// Listener settings, read when the listener starts (the first KDH1_Listen
// after none was listening). Zero fields keep their defaults.
struct KDH1_limits_struct {
    size_t maxEntity;            // request body bytes; larger: 413 (8 MiB)
    unsigned connectionLimit;    // open connections (512)
    unsigned connectionTimeout;  // seconds a connection may stay idle (60)
    size_t connectionMemory;     // bytes of buffer per connection (48 KiB, at least 40; cleared per request)
    unsigned networkThreads;     // network threads (the number of cores)
    unsigned maxWorkers;         // threads running callbacks at once (64)
    size_t streamBuffer;         // body bytes held between KDH1_Put and the client (256 KiB)
    unsigned stallSeconds;       // a parked request without progress this long is cancelled (300)
};

// Sets the address and port of the listener; port 0 picks a free port (see
// KDH1_BoundPort). Takes effect when the listener next starts. BADARG for a
// null or over-long address or a port outside 0..65535.
uint32_t KDH1_SetListenAddress(const char* address, int port);
// The port the running listener is bound to, 0 when none is running.
int KDH1_BoundPort();
// Replaces (SetLimits) or reads (GetLimits) the listener settings.
uint32_t KDH1_SetLimits(const KDH1_limits_struct* limits);
void KDH1_GetLimits(KDH1_limits_struct* limits);

// Creates a service named `name` (at most 63 characters; the empty name can
// only be reached as the default service) calling `callback` with `userData`.
// The two trailing arguments are reserved (0). EXISTS when a service of that
// name (ignoring case) exists.
uint32_t KDH1_New(KDH1_server_t* server, const char* name, KDH1_service_t callback, void* userData,
                  int reserved1, int reserved2);
// Records the service's title (null: none) and service-point name. The service
// is reached by its name whatever the service point is; the point and the
// title are kept for KDH1_QueryService. Reserved arguments are 0.
uint32_t KDH1_PublishService(KDH1_server_t server, int reserved1, int reserved2, const char* title,
                             int reserved3, const char* servicePoint, int reserved4);
// Serves the service's requests until KDH1_Delete(server); returns 0 then, or
// LISTENFAILED at once when the listener cannot be opened, BADHANDLE for an
// unknown or already listening service. Before returning it waits until every
// callback of the service has returned, so its user data may be freed then.
uint32_t KDH1_Listen(KDH1_server_t server, int reserved);
// Deletes the service: new requests no longer reach it, its requests in
// progress see CLOSED from their next KDH1_Put, and its KDH1_Listen returns.
uint32_t KDH1_Delete(KDH1_server_t server);

struct KDH1_service_info {
    char name[64];
    char title[256];
    char servicePoint[256];
    bool hasTitle;
    bool listening;
};
// Describes a service (BADHANDLE when there is none).
uint32_t KDH1_QueryService(KDH1_server_t server, KDH1_service_info* info);

// The value of the request's header of `kind`, null when it has none.
const char* KDH1_GetHeader(const KDH1_request_struct* request, KDH1_hdr_t kind);
// The value of any request header by name (ignoring case), null when absent.
const char* KDH1_GetNamedHeader(KDH1_request_t request, const char* name);

// Sets the response status and extra headers (copied). STATE when called twice
// or after KDH1_CreateEntity.
uint32_t KDH1_Response(KDH1_request_t request, uint32_t status, uint32_t headerCount,
                       const KDH1_sendhdr_struct* headers);
// Reads (newOptions null) or writes (oldOptions null) the request's option bits
// of `optionSet` (only KDH1_OPTSET_ACTIVITY); both given: swaps.
uint32_t KDH1_ActivityOptions(KDH1_request_t request, uint32_t optionSet, const uint32_t* newOptions,
                              uint32_t* oldOptions);
// Opens the response body: its media type and content length (0 = not
// announced: the body is sent chunked, or up to the connection's end for an
// HTTP/1.0 client). KDH1_Response before it is optional (status 200).
uint32_t KDH1_CreateEntity(KDH1_request_t request, uint32_t media, uint64_t contentLength);
// Sends `length` bytes of body; blocks while the stream buffer is full.
// CLOSED once the client is gone or the request was cancelled, STATE before
// KDH1_CreateEntity, OVERFLOW for bytes past the announced length (the bytes
// up to it are sent).
uint32_t KDH1_Put(KDH1_request_t request, const void* data, size_t length);
// KDH1_STC_OK while the client may still get an answer; CLOSED once it went
// away (noticed within about a second even while nothing is being sent), the
// request was cancelled or the service deleted. Long callbacks may poll it.
uint32_t KDH1_Status(KDH1_request_t request);
// Opens the request body: its media type (from Content-Type; 44 when absent
// or unknown) and length in bytes.
uint32_t KDH1_OpenEntity(KDH1_request_t request, uint32_t* entityType, uint32_t* entityLength);
// Reads up to *length bytes of the request body into `buffer`; *length is set
// to the count read (0 at the end of the body).
uint32_t KDH1_Get(KDH1_request_t request, void* buffer, uint32_t* length);

// The HTTP status code a KDH1 status answers with, and the Content-Type of a
// media type (null for none).
int KDH1_HttpStatus(uint32_t status);
const char* KDH1_MediaType(uint32_t media);
