// kglcnmnt: the component inventory of a process.
//
// A loadable module describes itself with a contents descriptor and hands it
// to kglcnmnt when asked (its cnt1entd entry); tools and diagnostics read the
// inventory back by component name. The inventory keeps pointers, not
// copies: a descriptor must stay valid while the module is loaded (static
// storage in the module), and a module removes it with kglcnrmv before it is
// unloaded.
#pragma once

// Results.
enum : int {
    KGL_CN_OK = 0,
    KGL_CN_BADARG = 2,    // null descriptor, or no name
    KGL_CN_NOTFOUND = 5,  // no component of that name
};

struct KGL_Contents {
    const char* name;         // component name, e.g. "createsit"
    const char* version;      // component version text
    const char* description;  // one line saying what it is
};

// Records `contents` under its name; a later descriptor of the same name
// replaces the earlier one. 0, or 2.
int kglcnmnt(const KGL_Contents* contents);
// The descriptor recorded under `name` (exact comparison), or null.
const KGL_Contents* kglcnqry(const char* name);
// Removes the component `name`. 0, or 5.
int kglcnrmv(const char* name);
