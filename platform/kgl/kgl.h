// kgl: general platform calls. This header holds the directory scan; other
// kgl services have their own headers in this folder.
//
// Directory scan: a scan yields the names of the regular files of one
// directory, or of each directory of a search list in turn, in ascending
// byte order of their names within each directory ("." and "..", and
// subdirectories, are never yielded):
//
//     KGL_Dir* scan = nullptr;
//     if (kglqpopd("CT_ATTRLIB", KGL_BYENV, &scan) == 0) {
//         char name[KGL_NAMESIZE], dir[KGL_NAMESIZE];
//         while (kglqprdd(scan, name, sizeof name) == 0)
//             if (kglqpqdr(scan, dir, sizeof dir) == 0) use(dir, name);
//         kglqpcld(scan);
//     }
//
// A scan is used by one thread at a time.
#pragma once

#include <cstddef>

// Results of the directory scan.
enum : int {
    KGL_OK = 0,        // done
    KGL_BADARG = 2,    // null or empty argument, unknown mode, no entry yet
    KGL_NOTFOUND = 5,  // no such directory or variable; end of the scan
    KGL_NOROOM = 7,    // the name does not fit the caller's field; allocation failure
    KGL_FAULT = 8,     // the directory exists but cannot be read
};

// Modes of kglqpopd.
enum : char {
    KGL_BYPATH = 'R',  // `name` is the path of the directory to read
    KGL_BYENV = 'E',   // `name` is an environment variable whose value is a
                       // ':'-separated list of directories, read in that order
};

// Size of the name fields the scan's users keep (a file name of the system
// has at most 255 bytes, so it always fits with its terminator).
enum : size_t { KGL_NAMESIZE = 256 };

struct KGL_Dir;  // one open scan; opaque

// Opens a scan of `name` read as `mode` says. On success *handle holds the
// scan, which the caller closes with kglqpcld. For KGL_BYENV the variable
// must be set and at least one of its directories must open; directories
// of the list that do not open are left out. On failure *handle is null and
// the result is KGL_BADARG, KGL_NOTFOUND (no such directory, or the
// variable is unset or empty), KGL_FAULT or KGL_NOROOM.
[[nodiscard]] int kglqpopd(const char* name, char mode, KGL_Dir** handle);

// Writes the next entry's name, terminated, into `name` (`size` bytes).
// Returns KGL_OK, KGL_NOTFOUND at the end of the scan, KGL_BADARG for a null
// scan or buffer. A name longer than the field is skipped, never cut.
[[nodiscard]] int kglqprdd(KGL_Dir* handle, char* name, size_t size);

// Writes the directory in which the entry last returned by kglqprdd lies,
// as it was named when the scan was opened. Returns KGL_OK, KGL_BADARG when
// there is no such entry (none returned yet, or the scan has ended),
// KGL_NOROOM when the path does not fit `size`.
[[nodiscard]] int kglqpqdr(KGL_Dir* handle, char* dir, size_t size);

// Ends the scan and frees it (null is accepted). Returns KGL_OK, or
// KGL_BADARG for a null scan.
int kglqpcld(KGL_Dir* handle);
