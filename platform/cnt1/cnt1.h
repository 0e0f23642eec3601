// cnt1: loading a symbol from a module by name, over dlopen/dlsym.
//
// A module name without "/" is looked for as lib<name>.so (the name in lower
// case, then as given), then <name>.so and <name>, in each folder of the
// environment variable CNT1_PATH (colon separated), then in the folder of
// the platform library, then where the dynamic loader looks by default. A
// name with "/" is a path. A loaded module stays loaded for the life of the
// process, so loaded addresses stay valid.
//
// Thread safety: every call may be made from any thread.
#pragma once

enum : int {
    CNT1_OK = 0,
    CNT1_BADARG = 2,    // null or empty argument
    CNT1_NOMODULE = 5,  // no loadable module of that name
    CNT1_NOSYMBOL = 6,  // the module has no such symbol
};

// Loads `symbol` of module `module` into *address (null on failure).
[[nodiscard]] int CNT1_Load(const char* module, const char* symbol, void** address);

// The text of the calling thread's last failure of CNT1_Load.
const char* CNT1_LastError();
