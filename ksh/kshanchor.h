// kshanchor: the anchor record the host hands to kshstart and kshstop, and
// the process-wide pointer to the anchor of the running gateway.
//
// Only the fields the gateway reads are declared. The host fills the local
// server record through its server-information call in START mode; the
// gateway reads the local alias, LMS name, version, build and option bits
// from it.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <mutex>

// Anchor flag bits.
enum : uint32_t {
    WSQL_ANCHOR_EMBEDDED = 0x10000000u,   // runs embedded in the monitoring server (START mode)
    WSQL_ANCHOR_VALIDATE = 0x08000000u,   // user validation requested
    WSQL_ANCHOR_LOCALHUB = 0x02000000u,   // the hub list file names the local hub
};

// Option bits of the local server record.
enum : uint32_t { WSQL_LOCAL_NLS = 0x1u };  // the local LMS takes national-language text

// The local server record.
struct WSQL_LocalServer {
    int32_t aliasLength;   // characters of `alias` in use
    int32_t hubNodeRef;    // not negative: the hub's own node is written by its node id
    char alias[33];        // the local server's node name (the local hub's alias)
    char lmsName[256];     // the local LMS name
    int32_t version;       // LMS version (VVRR)
    int32_t build;         // LMS build
    uint32_t options;      // WSQL_LOCAL_* bits
    int32_t numNames;      // entries of `names`
    char (*names)[33];     // counted list of names (history export)
};

// The completion event of the main routine.
struct WSQL_AnchorEvent {
    std::condition_variable cond;
    std::mutex mutex;
    uint32_t value = 0;
    uint32_t posted = 0;
};

struct WSQL_Anchor {
    uint32_t flags = 0;                       // WSQL_ANCHOR_* bits
    uint32_t parmPresent = 0;                 // non-zero when a start parameter is given
    const char* startParm = nullptr;          // "test" or "START"
    void* hostField = nullptr;                // given, by address, to the server-information call
    WSQL_LocalServer* localServer = nullptr;  // filled by the server-information call
    WSQL_AnchorEvent completion;              // signalled when the main routine ends
    uint32_t threadStackSize = 0;             // bytes, for every thread the gateway creates

    // The host's calls, used in START mode only (null: the host offers none,
    // and START mode cannot start). serverInfo is given the addresses of
    // hostField and localServer and fills the latter (the record stays the
    // host's); 0 = success. configCompare answers 0 when the host's
    // configuration variable `name` has the value `value`.
    int (*serverInfo)(void** hostField, WSQL_LocalServer** localServer) = nullptr;
    int (*configCompare)(const char* name, const char* value) = nullptr;
};

// The anchor of the running gateway; null when started without one.
extern WSQL_Anchor* gAnchor;
