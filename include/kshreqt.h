// kshreqt: the parsed form of one SOAP or query-string request.
//
// The caller allocates a WSQL_Request_t, zero-fills it and keeps it for one
// HTTP request. Nothing in it is owned: every string points into the request
// body, the query items, the parsed document or the 4096-byte defaults
// buffer that the request parser provides (WSQL_DEFAULTS_SIZE). The fields
// and their order are fixed; peers read them by name.
//
// userid, password and clientHost are 16-byte fields that hold up to 16
// characters and are NOT terminated when all 16 are used: read them with a
// bounded copy (%.16s, strnlen(.., 16)).
#pragma once

#include <cstdint>

// Array sizes of the record.
enum : int {
    WSQL_MAX_PARMA = 10,        // parma entries
    WSQL_MAX_FILTERS = 20,      // filter entries
    WSQL_MAX_DATAITEMS = 10,    // named children of a status method's "data"
    WSQL_MAX_COLUMNS = 200,     // columns and values
    WSQL_CREDENTIAL_SIZE = 16,  // userid, password, clientHost
    WSQL_DEFAULTS_SIZE = 4096,  // the method defaults buffer of one request
};

// One parameter that becomes a SYSTEM.PARMA term.
struct WSQL_Parma_t {
    char* name;
    char* value;
};

// One filter (or data item): COLUMN OPERATOR VALUE. `oper` is the operator
// as the request spells it ("EQ", "=", or null when none was given).
struct WSQL_Filter_t {
    char* column;
    char* oper;
    char* value;
    unsigned char isAfilter;  // 1: `column` names an attribute, not a column
};

struct WSQL_Request_t {
    char* table;                                 // table or object name
    int32_t intv;                                // sampling interval ("intv")
    char* target;                                // text of "target"/"targets"
    int32_t numParma;
    WSQL_Parma_t parma[WSQL_MAX_PARMA];
    int32_t numFilters;
    WSQL_Filter_t filters[WSQL_MAX_FILTERS];
    WSQL_Filter_t dataItems[WSQL_MAX_DATAITEMS];  // operator always "="
    unsigned char parse;                         // 1: results are to be parsed
    int16_t history;                             // 1: historical data asked for
    uint32_t type;                               // WSQL_TYPE_* bits
    uint32_t methods;                            // WSQL_METHOD_* and WSQL_ACTION_* bits
    uint32_t elements;                           // WSQL_ELEM_* bits
    int32_t numColumns;
    char* columns[WSQL_MAX_COLUMNS];             // column or attribute names
    int32_t rowNumber;                           // 1 once a "row" element was read
    int32_t numValues;
    int32_t numDataItems;
    char* values[WSQL_MAX_COLUMNS];              // value of the column of the same index
    char userid[WSQL_CREDENTIAL_SIZE];           // not terminated when 16 long
    char password[WSQL_CREDENTIAL_SIZE];         // same rule
    char clientHost[WSQL_CREDENTIAL_SIZE];       // client address without the port
    char* sql;                                   // SQL text given by the caller
    unsigned char versionedTable;                // table found only under its versioned name
    unsigned char attributeForm;                 // 1: columns were "attribute" elements
    char* thrunode;                              // node the request is routed through
    char* subSql;                                // second statement (method defaults)
    char* requestHandle;                         // decimal handle of a persisted request
    char* hubAlias;                              // hub to use instead of the default hub
    char* statusSitName;                         // situation name of a status method
    char* expire;                                // expiry value of an acknowledgement
};

// Bits of `methods`: one per CT method element.
enum : uint32_t {
    WSQL_METHOD_ALERT = 0x80000000u,        // CT_Alert
    WSQL_METHOD_ACKNOWLEDGE = 0x40000000u,  // CT_Acknowledge
    WSQL_METHOD_RESET = 0x20000000u,        // CT_Reset
    WSQL_METHOD_RESURFACE = 0x10000000u,    // CT_Resurface
    WSQL_METHOD_GET = 0x08000000u,          // CT_Get
    WSQL_METHOD_SQL = 0x04000000u,          // CT_SQL
    WSQL_METHOD_WTO = 0x02000000u,          // CT_WTO
    WSQL_METHOD_ACTION = 0x01000000u,       // CT_Action, or an explicit "action" element
    WSQL_METHOD_ACTIVATE = 0x00800000u,     // CT_Activate
    WSQL_METHOD_DEACTIVATE = 0x00400000u,   // CT_Deactivate
    WSQL_METHOD_THRESHOLDS = 0x00200000u,   // CT_Thresholds
    WSQL_METHOD_LOGIN = 0x00100000u,        // CT_Login
    WSQL_METHOD_EMAIL = 0x00080000u,        // CT_EMail and CT_Email
    WSQL_METHOD_EXPORT = 0x00040000u,       // CT_Export
    WSQL_METHOD_REDIRECT = 0x00020000u,     // CT_Redirect
    WSQL_METHOD_EXECUTE = 0x00010000u,      // CT_Execute
    WSQL_METHOD_AFFINITY = 0x00008000u,     // CT_Affinity

    // Groups.
    WSQL_METHODS_STATUS = 0xF0000000u,      // alert, acknowledge, reset, resurface
    WSQL_METHODS_ACTIVATION = 0x00C00000u,  // activate, deactivate
    WSQL_METHODS_SPECIAL = 0x000F8000u,     // affinity, execute, redirect, export, e-mail
    WSQL_METHODS_UPDATING = 0xF0E00000u,    // status, activation and threshold methods
    // The low bits: action bits and CT_Login. Removing them leaves the bits
    // that name a data or special method.
    WSQL_METHODS_LOW = 0x00107FFFu,

    // Action bits (the low bits of `methods`).
    WSQL_ACTION_UPDATE = 0x01u,
    WSQL_ACTION_DELETE = 0x02u,
    WSQL_ACTION_INSERT = 0x04u,
    WSQL_ACTION_START = 0x08u,
    WSQL_ACTION_EVENTS = 0x10u,
};

// Bits of `elements`: one per element seen in the SOAP document.
enum : uint32_t {
    WSQL_ELEM_USERID = 0x000001u,
    WSQL_ELEM_PASSWORD = 0x000002u,
    WSQL_ELEM_TIMESTAMP = 0x000008u,
    WSQL_ELEM_ROW = 0x000010u,
    WSQL_ELEM_DATA = 0x000020u,
    WSQL_ELEM_RESULTS = 0x000040u,
    WSQL_ELEM_TYPE = 0x000080u,
    WSQL_ELEM_ITEM = 0x000100u,
    WSQL_ELEM_SEVERITY = 0x000200u,          // CT_WTO
    WSQL_ELEM_CATEGORY = 0x000400u,          // CT_WTO
    WSQL_ELEM_TARGET = 0x001000u,            // "target" or "targets"
    WSQL_ELEM_OBJECT = 0x002000u,            // the table was named as an object
    WSQL_ELEM_SOURCE = 0x004000u,
    WSQL_ELEM_NAME = 0x008000u,
    WSQL_ELEM_PERSIST = 0x010000u,           // persist="yes" or "PersistRequest"
    WSQL_ELEM_THRESHOLDDEFAULT = 0x020000u,
    WSQL_ELEM_THRESHOLDVALUE = 0x040000u,
    WSQL_ELEM_THRESHOLDNAME = 0x080000u,
    WSQL_ELEM_KEYVALUE = 0x200000u,
    WSQL_ELEM_KEYNAME = 0x400000u,
    WSQL_ELEM_OVERRIDES = 0x800000u,
};

// Bits of `type` (copied into the WSQL_Request, which adds its own).
enum : uint32_t {
    WSQL_TYPE_SOAP = 0x80000000u,        // a CT method element was recognised
    WSQL_TYPE_ALLTARGETS = 0x20000000u,  // CT_Get over all targets ("*ALL")
    WSQL_TYPE_SUBSELECT = 0x10000000u,   // a second statement reads the current row
    WSQL_TYPE_SELECT = 0x08000000u,      // the built statement is a select
    WSQL_TYPE_INSERT = 0x04000000u,      // ... an insert
    WSQL_TYPE_DELETE = 0x02000000u,      // ... a delete
    WSQL_TYPE_UPDATE = 0x01000000u,      // ... an update
    WSQL_TYPE_BOUNDINPUT = 0x00800000u,  // values are bound as input (persisted with updates)
    WSQL_TYPE_ASYNC = 0x00200000u,       // asynchronous completion through the exit block
    WSQL_TYPE_PERSISTED = 0x00100000u,   // persisted
    WSQL_TYPE_SUBINPUT = 0x00080000u,    // the second statement takes input values
    WSQL_TYPE_OVERRIDES = 0x00000800u,   // threshold overrides given as XML
};
