// kgldir: the directory scan of kgl.h over opendir/readdir/stat.
//
// The whole listing is read when the scan opens, so that entries can be
// sorted (readdir order differs between file systems, and the order in which
// files are read is visible to the scan's users) and so that a file created
// or removed during the scan does not change what it yields.
#include "kgl/kgl.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <string>
#include <vector>

#include "bss1/bss1.h"
#include "ras1/ras1.h"

RAS1_UNIT("kgldir");

struct KGL_Dir {
    struct Entry {
        size_t dir;  // index into dirs
        std::string name;
    };
    std::vector<std::string> dirs;  // directories as named at open
    std::vector<Entry> entries;     // in yield order
    size_t next = 0;                // index of the entry kglqprdd looks at next
    size_t last = SIZE_MAX;         // index of the entry it returned last, if any
};

namespace {

// Status of a failed opendir in the scan's own codes.
int openFailure(int err) {
    return (err == ENOENT || err == ENOTDIR) ? KGL_NOTFOUND : KGL_FAULT;
}

// True when `dir`/`name` is a regular file (symbolic links are followed).
bool isRegularFile(const std::string& dir, const char* name) {
    std::string path = dir;
    path += '/';
    path += name;
    struct stat st;
    return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

// Appends the regular files of dirs[index], sorted by name, to scan's
// entries. Returns KGL_OK or the status of the failed open.
int readOne(KGL_Dir* scan, size_t index) {
    const std::string& dir = scan->dirs[index];
    DIR* d = opendir(dir.c_str());
    if (!d) return openFailure(errno);
    std::vector<std::string> names;
    while (struct dirent* e = readdir(d)) {
        if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
        if (isRegularFile(dir, e->d_name)) names.emplace_back(e->d_name);
    }
    closedir(d);
    std::sort(names.begin(), names.end());
    for (auto& n : names) scan->entries.push_back({index, std::move(n)});
    return KGL_OK;
}

// Splits a search list at ':' into scan->dirs (empty items are left out).
void splitList(KGL_Dir* scan, const char* list) {
    const char* p = list;
    while (*p) {
        const char* end = strchr(p, ':');
        size_t n = end ? (size_t)(end - p) : strlen(p);
        if (n > 0) scan->dirs.emplace_back(p, n);
        p += n;
        if (*p == ':') p++;
    }
}

// Reads every directory of the scan. Succeeds when at least one opened;
// otherwise gives the status of the last failure.
int readAll(KGL_Dir* scan) {
    int rc = KGL_NOTFOUND;
    bool anyOpened = false;
    for (size_t i = 0; i < scan->dirs.size(); i++) {
        int st = readOne(scan, i);
        if (st == KGL_OK)
            anyOpened = true;
        else
            rc = st;
    }
    return anyOpened ? KGL_OK : rc;
}

int openScan(const char* name, char mode, KGL_Dir** handle) {
    KGL_Dir* scan = new KGL_Dir;
    if (mode == KGL_BYENV) {
        const char* list = BSS1_GetEnv(name, nullptr);
        if (list) splitList(scan, list);
    } else {
        scan->dirs.emplace_back(name);
    }
    int rc = readAll(scan);
    if (rc == KGL_OK)
        *handle = scan;
    else
        delete scan;
    return rc;
}

}  // namespace

int kglqpopd(const char* name, char mode, KGL_Dir** handle) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = KGL_BADARG;
    if (handle) *handle = nullptr;
    if (handle && name && *name && (mode == KGL_BYPATH || mode == KGL_BYENV)) {
        try {
            rc = openScan(name, mode, handle);
        } catch (const std::bad_alloc&) {
            rc = KGL_NOROOM;
        }
    }
    RAS1_TRACE_IF(ras, RAS1_STATE, "open %s mode %c: %d entries, st=%d", name ? name : "", mode,
                  (handle && *handle) ? (int)(*handle)->entries.size() : 0, rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int kglqprdd(KGL_Dir* handle, char* name, size_t size) {
    if (!handle || !name || size == 0) return KGL_BADARG;
    while (handle->next < handle->entries.size()) {
        size_t i = handle->next++;
        const std::string& n = handle->entries[i].name;
        if (n.size() < size) {
            memcpy(name, n.c_str(), n.size() + 1);
            handle->last = i;
            return KGL_OK;
        }
    }
    handle->last = SIZE_MAX;
    name[0] = '\0';
    return KGL_NOTFOUND;
}

int kglqpqdr(KGL_Dir* handle, char* dir, size_t size) {
    if (!handle || !dir || size == 0 || handle->last == SIZE_MAX) return KGL_BADARG;
    const std::string& d = handle->dirs[handle->entries[handle->last].dir];
    if (d.size() >= size) {
        dir[0] = '\0';
        return KGL_NOROOM;
    }
    memcpy(dir, d.c_str(), d.size() + 1);
    return KGL_OK;
}

int kglqpcld(KGL_Dir* handle) {
    if (!handle) return KGL_BADARG;
    delete handle;
    return KGL_OK;
}
