// kuistate: the module state of the createsit command, shared by every
// source of the command, and its internal error codes.
//
// The command keeps its whole working state in these module-level variables.
// They are zero, null or empty when the module is loaded (invalidNVPair
// starts as 'N'). A run fills them and ends with deallocation(), which
// releases the owned texts; flags, counts and errCode are not reset, so the
// module serves one run per load. Tests start each scenario with
// kuiResetState(), which is not exported from the shared library.
//
// Owned texts are character arrays allocated with new[] and released with
// delete[] (kuiDup / kuiFree). A run executes on the caller's thread from
// start to end; runs must not overlap in one process (nothing here is locked).
#pragma once

#include <string>

#include "ras1/ras1.h"

// Capacity of the two property arrays.
enum : int { MAX_PROPERTY_NUM = 7 };

// Internal error codes of a run (errCode). The first failing check sets the
// code and the run stops; the result message is chosen from it.
enum : int {
    KUIE_NONE = 0,            // the situation was created
    KUIE_NOBASE = 1,          // -s given without -b
    KUIE_BADPAIRS = 2,        // -p without usable NAME=VALUE pairs
    KUIE_NOLOGIN_SIT = 3,     // not logged in, run with -s
    KUIE_EXISTS = 4,          // a situation of that name (short or long) exists
    KUIE_NOSUCHBASE = 5,      // the base situation does not exist
    KUIE_NOOPTION = 6,        // neither -s nor -i
    KUIE_BADEXPORT = 7,       // the export file is not a valid situation export
    KUIE_NOLOGIN = 8,         // not logged in, run without -s
    KUIE_LONGEXISTS = 9,      // the export file's long name exists
    KUIE_NOFILE = 11,         // the export file does not exist
    KUIE_COMM = 14,           // a SOAP query failed
    KUIE_COMBINED = 15,       // -i combined with -s, -b or -p
    KUIE_INTERVAL = 16,       // INTERVAL value invalid
    KUIE_UNPARSABLE = 17,     // the export file cannot be parsed
    KUIE_PROPNAME = 19,       // unrecognised property name
    KUIE_EMPTYFILE = 21,      // the export file holds no data
    KUIE_FORMULA = 22,        // FORMULA empty
    KUIE_RUNONSTART = 24,     // RUNONSTART neither yes nor no
    KUIE_ENCIPHERED = 26,     // the export file holds enciphered data
    KUIE_SEV = 27,            // SITINFO severity invalid
    KUIE_TFWD = 28,           // SITINFO event forwarding invalid
    KUIE_TDST = 29,           // SITINFO event destination invalid
    KUIE_ATOM = 30,           // SITINFO ATOM invalid
    KUIE_COUNT = 31,          // SITINFO COUNT invalid
    KUIE_SITINFO = 32,        // SITINFO invalid otherwise
    KUIE_NOEIF = 33,          // TDST given, event integration facility disabled
    KUIE_SITNAMELEN = 35,     // situation name longer than 256 bytes
    KUIE_BASENAMELEN = 36,    // base situation name longer than 256 bytes
    KUIE_OLDSITNAME = 37,     // long situation name, server older than 06.21
    KUIE_OLDBASENAME = 38,    // long base name, server older than 06.21
    KUIE_UADVISOR = 39,       // the base is refused by the UADVISOR check
    KUIE_SERVER = 97,         // the server answered with an error
    KUIE_INTERNAL = 99,       // internal error
};

// Results of the command's steps (the support library's codes, plus 10).
enum : int {
    KUIR_OK = 0,
    KUIR_FAIL = 1,        // a check of the arguments failed
    KUIR_NOLOGIN = 2,     // not logged in
    KUIR_COMM = 4,        // communication error
    KUIR_INVALID = 6,     // invalid input (export, name length)
    KUIR_SERVER = 7,      // server exception
    KUIR_INTERNAL = 8,    // internal error; unreadable, empty or enciphered file
    KUIR_ABSENT = 9,      // no such row; file not found
    KUIR_TAKEN = 10,      // the name is taken
};

// Length of the UTF-8 conversion buffers (names and property values hold at
// most 2047 bytes).
enum : int { KUI_CONV_SIZE = 2048 };

// Columns of a distribution row, and the slots of their table.
enum : int { KUI_OBJACCL_SLOTS = 17, KUI_OBJACCL_WIDTH = 15, KUI_OBJACCL_COLUMNS = 12 };

// Values shared by several statements.
extern const char* const KUI_QIBUSER;     // "&QIBUSER"
extern const char* const KUI_SITCLASS;    // "5140"

// --- the state
extern char** propertyName;    // MAX_PROPERTY_NUM owned texts (upper-cased names)
extern char** propertyValue;   // MAX_PROPERTY_NUM owned texts
extern int propertyCount;      // pairs whose name is not empty
extern int propertySlots;      // slots filled by -p (beyond propertyCount: empty names)
extern char invalidNVPair;     // 'Y' when an entry after -p has no "=" (or too many pairs)

extern char** elementArray;    // column names of the situation row
extern char** valueArray;      // the column values, parallel to elementArray
extern int arrayCount;         // entries used
extern int arrayCapacity;      // entries allocated

extern char** vecValArray;     // noOfVecRows x 10 owned texts
extern int noOfVecRows;
extern int vecSlotExist;

extern char* distList;         // targets separated by ","
extern int distPresent;        // DISTRIBUTION given with -p
extern char objAcclArray[KUI_OBJACCL_SLOTS][KUI_OBJACCL_WIDTH];
extern int distInserted;
extern int sitInserted;

extern char* sitFileName;             // the -i argument (not owned)
extern std::string displayFileName;   // its UTF-8 form, for messages
extern char* sitName;
extern char* longSitName;
extern char* baseSitName;
extern char* basesitShortName;
extern char* vemsVersion;      // owned by the support library

extern char reev_days[10];
extern char reev_time[8];

extern int errCode;
extern int sitFilePresent;
extern int sitPresent;
extern int baseSitNamePresent;
extern int propOptPresent;
extern int longNameExist;
extern int duplicateFullName;
extern int longNameDiscarded;
extern int tdstDiscarded;

// Writes an error-level trace line of the calling source's unit (when that
// class is enabled, as every trace text of the command).
#define KUI_TRACE_ERROR(ras, ...) RAS1_TRACE_IF(ras, RAS1_ERROR, __VA_ARGS__)
#define KUI_TRACE_DETAIL(ras, ...) RAS1_TRACE_IF(ras, RAS1_DETAIL, __VA_ARGS__)

// --- helpers over the state
// New[] copy of `s` ("" for null).
char* kuiDup(const char* s);
// delete[] and null.
void kuiFree(char*& p);
// Replaces an owned text by a copy of `s`.
void kuiReplace(char*& p, const char* s);
// `s`, or "" for null.
inline const char* kuiText(const char* s) { return s ? s : ""; }
// True when the server is older than 06.21 (first 5 characters of vemsVersion).
bool kuiOldServer();

// The trace texts of one server query's failures (null: that failure is
// not traced).
struct KuiQueryTexts {
    const char* server;    // server exception (7)
    const char* comm;      // communication error (4)
    const char* internal;  // internal error (8)
};
// When `rc` is one of the support library's failures 7, 4 or 8, sets errCode
// to 97, 14 or 99, traces the matching text under `unit` and returns true;
// otherwise changes nothing and returns false.
bool kuiQueryFailed(RAS1_Unit& unit, int line, int ras, int rc, const KuiQueryTexts& texts);
#define KUI_QUERY_FAILED(ras, rc, ...) kuiQueryFailed(RAS1_THIS, __LINE__, (ras), (rc), KuiQueryTexts{__VA_ARGS__})

// Releases the owned state (the end of every run).
void deallocation();
// Puts the whole state back to its load-time values (for tests: a fresh run
// in the same process). Releases what a run left.
void kuiResetState();
