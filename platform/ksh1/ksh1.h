// ksh1: the SOAP client of the platform. Posts a SOAP envelope to an HTTP
// endpoint and hands back the text of the answer.
//
// Transport: an HTTP/1.1 POST with libcurl. Each calling thread keeps one
// connection handle of its own, so that calls to the same endpoint reuse the
// connection. Only http:// and https:// endpoints are accepted (also for
// redirections, which are not followed); a client-supplied endpoint cannot
// make the process read local files or speak other protocols.
//
// Time limits (the library's defaults would wait for ever): connecting may
// take KSH1_CONNECT_TIMEOUT seconds (default 5), the whole exchange
// KSH1_TIMEOUT seconds (default 60), and an answer that arrives slower than
// 1 byte a second for 30 seconds is given up. Signals are not used
// (CURLOPT_NOSIGNAL). An answer larger than 64 MiB is refused.
//
// Results: 0 success; 2 bad argument (null endpoint or text, or an
// `options` bit this layer does not know); 5 the endpoint cannot be reached
// (name not resolved, connection refused, time-out); 6 the endpoint answered
// with an HTTP error status (400 and above) or the endpoint is not an
// http/https URL; 7 no memory, or the answer is too large; 8 any other
// transport failure.
//
// Thread safety: every call may be made from any thread; a call blocks its
// thread until the answer is complete or a time limit passes.
#pragma once

#include <cstddef>

enum : int {
    KSH1_OK = 0,
    KSH1_BADARG = 2,
    KSH1_UNREACHABLE = 5,
    KSH1_HTTPERROR = 6,
    KSH1_NOMEM = 7,
    KSH1_FAILED = 8,
};

// Bits of the `options` argument.
enum : unsigned {
    // The text is a SOAP 1.1 envelope: sent as "text/xml; charset=utf-8" with
    // an empty SOAPAction header. Without it the text goes as
    // "application/xml".
    KSH1_SOAP11 = 0x100,
};

// Posts `length` bytes of `text` to `endpoint` (a NUL-terminated URL).
// The caller sets *response to null and *responseLength to 0 before the call.
// On success *response is a new NUL-terminated text of *responseLength bytes
// (malloc'd; the caller releases it with free); on failure both stay as they
// were. The HTTP status of the last call on this thread is kept for
// KSH1_LastHttpStatus.
[[nodiscard]] int KSH1_SoapRequest(const char* endpoint, const char* text, unsigned long length, char** response,
                                   unsigned long* responseLength, unsigned options);

// The HTTP status of this thread's last KSH1_SoapRequest (0 when none was
// received).
long KSH1_LastHttpStatus();
