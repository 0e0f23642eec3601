// ras1: the trace facility.
//
// Every source file is one trace unit. A unit caches the class bits that are
// switched on for it; RAS1_Sync() refreshes the cache only when the
// configuration changed, so a disabled class costs one integer test:
//
//     RAS1_UNIT("kshreq");                         // once per source file
//     int ras = RAS1_Sync(RAS1_THIS);
//     if (ras & RAS1_FLOW) RAS1_Event(RAS1_THIS, __LINE__, __func__, RAS1_EV_ENTRY);
//     if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "rows %d", n);
//
// Configuration comes from the environment on first use:
//   RAS1_TRACE  comma list of [unit:]LEVEL items, LEVEL being ERROR, FLOW,
//               STATE, CATALOG, DUMP, DETAIL, ALL or NONE, or several of them
//               joined with '+' (e.g. "ERROR", "kshreq:ALL,kui:STATE+ERROR").
//               An item without a unit sets the default; a unit item applies
//               to every unit whose name begins with it, the longest match
//               winning. Unset, the default is ERROR.
//   RAS1_LOG    file the trace is appended to; unset, standard error.
//
// Each record is one line "YYYY-MM-DD HH:MM:SS.mmm [tid] unit:line text",
// written with a single write() under a process-wide mutex, so lines from
// concurrent threads never interleave.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdarg>

// Class bits.
enum : int {
    RAS1_ERROR = 0x80,    // errors
    RAS1_FLOW = 0x40,     // function entry and exit
    RAS1_STATE = 0x10,    // state and detail
    RAS1_CATALOG = 0x08,  // catalog additions
    RAS1_DUMP = 0x04,     // buffer dumps
    RAS1_DETAIL = 0x01,   // fine detail
    RAS1_ALL = 0xFF,
};

// Event kinds of RAS1_Event.
enum RAS1_EventKind : int {
    RAS1_EV_ENTRY = 0,    // function entry
    RAS1_EV_EXIT = 1,     // function exit without a result
    RAS1_EV_EXIT_RC = 2,  // function exit with an integer result
};

// One trace unit. Define exactly one per source file with RAS1_UNIT.
struct RAS1_Unit {
    const char* name;
    std::atomic<int> level{0};
    std::atomic<unsigned> generation{0};  // configuration generation the cache belongs to
};

#define RAS1_UNIT(unitName) static RAS1_Unit ras1_unit_{unitName, {0}, {0}}
#define RAS1_THIS ras1_unit_

// The current generation of the configuration; bumped by RAS1_Configure.
extern std::atomic<unsigned> RAS1_generation;

// Recomputes the unit's level from the configuration.
int RAS1_Refresh(RAS1_Unit& unit);

// Returns the unit's class bits, refreshing the cache when the configuration
// changed since it was last read.
inline int RAS1_Sync(RAS1_Unit& unit) {
    if (unit.generation.load(std::memory_order_acquire) == RAS1_generation.load(std::memory_order_relaxed))
        return unit.level.load(std::memory_order_relaxed);
    return RAS1_Refresh(unit);
}

// Records an entry or exit event of function `func` at `line`.
void RAS1_Event(RAS1_Unit& unit, int line, const char* func, RAS1_EventKind kind, long result = 0);

// Writes one formatted trace line (a trailing newline in fmt is dropped).
void RAS1_Printf(RAS1_Unit& unit, int line, const char* fmt, ...) __attribute__((format(printf, 3, 4)));
void RAS1_VPrintf(RAS1_Unit& unit, int line, const char* fmt, va_list ap);

// Dumps `length` bytes at `data` as hex and printable characters, 16 a line.
void RAS1_Dump(RAS1_Unit& unit, int line, const void* data, size_t length);

// Replaces the configuration (null arguments: read RAS1_TRACE / RAS1_LOG
// again). Every unit picks the change up on its next RAS1_Sync.
void RAS1_Configure(const char* traceConfig, const char* logPath);

// Level that a configuration string gives to a unit name (used by
// RAS1_Refresh and by tests of the configuration grammar).
int RAS1_LevelFor(const char* traceConfig, const char* unitName);

// Entry/exit tracing for the common function shape:
//   int ras = RAS1_Sync(RAS1_THIS); RAS1_ENTRY(ras); ... RAS1_EXIT_RC(ras, rc); return rc;
#define RAS1_ENTRY(ras) \
    do { if ((ras) & RAS1_FLOW) RAS1_Event(RAS1_THIS, __LINE__, __func__, RAS1_EV_ENTRY); } while (0)
#define RAS1_EXIT(ras) \
    do { if ((ras) & RAS1_FLOW) RAS1_Event(RAS1_THIS, __LINE__, __func__, RAS1_EV_EXIT); } while (0)
#define RAS1_EXIT_RC(ras, rc) \
    do { if ((ras) & RAS1_FLOW) RAS1_Event(RAS1_THIS, __LINE__, __func__, RAS1_EV_EXIT_RC, (long)(rc)); } while (0)
#define RAS1_TRACE_IF(ras, cls, ...) \
    do { if ((ras) & (cls)) RAS1_Printf(RAS1_THIS, __LINE__, __VA_ARGS__); } while (0)
