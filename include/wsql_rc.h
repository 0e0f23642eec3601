// Result codes of the gateway and of the shared list and XML document model.
// Functions return these integers; the names only make the intent readable,
// the values are what callers and peers rely on.
#pragma once

enum : int {
    WSQL_OK = 0,            // success, found, done
    WSQL_NORESPONSE = 1,    // no response buffer, or it could not grow
    WSQL_NOTHING = 2,       // nothing open, nothing to act on; list element not allocated
    WSQL_NOTFOUND = 5,      // not found, end of data or walk, nothing pending, missing counterpart
    WSQL_BADINPUT = 6,      // malformed input, parse error, unknown mode
    WSQL_NOMEM = 7,         // allocation failure or no room
    WSQL_FAULT = 8,         // open failure, read or write error, fault caught while serving; no parent
    WSQL_NONLS = 107,       // the hub cannot take national-language text
    WSQL_ENDOFDATA = 514,   // SQL end of data
    WSQL_CANCELLED = 1009,  // request cancelled
};
