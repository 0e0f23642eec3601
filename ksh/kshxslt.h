// kshxslt: the stylesheet transformer of the meta request.
//
// This gateway has no stylesheet engine: transformObject performs no
// transformation and reports failure, so a request that names a stylesheet
// carries "<transform>FAILED</transform>" at the end of its output. The
// class holds no data.
#pragma once

#include <cstdint>

// Result of a transform that did not take place.
constexpr int WSQL_XSLT_FAILED = 10;

class WSQL_XSLT {
public:
    WSQL_XSLT() = default;
    virtual ~WSQL_XSLT() = default;
    WSQL_XSLT(const WSQL_XSLT&) = delete;
    WSQL_XSLT& operator=(const WSQL_XSLT&) = delete;

    // Set-up of the transform layer at gateway start. 0.
    static int initOnce();

    // Would transform `length` bytes of `input` with the stylesheet named
    // `stylesheet` into a new text (*output, malloc'd, the caller frees it,
    // and *outputLength). Always WSQL_XSLT_FAILED; the outputs are left
    // untouched.
    int transformObject(const char* input, uint32_t length, const char* stylesheet, char** output,
                        uint32_t* outputLength);
};
