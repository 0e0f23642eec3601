// kshssrv: the hubs the gateway serves and the hub list file (see
// kshssrv.h).
#include "kshssrv.h"

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <string>

#include "bss1/bss1.h"
#include "kshanchor.h"
#include "kshdhtpsvc.h"
#include "kshhttp.h"
#include "kshhub.h"
#include "kshutil.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshssrv");

LinkedList* gHubList = nullptr;

namespace {

constexpr const char* kDefaultHubFile = "kshxhubs.xml";
// The address of the default hub when neither a hub list nor a sites file
// names one: this machine.
constexpr const char* kDefaultAddress = "ip:127.0.0.1";
constexpr size_t kReadLine = 1024;     // hub file lines read at start (1023 characters)
constexpr size_t kRewriteLine = 4096;  // lines of a rewrite (4095 characters)
constexpr size_t kPathSize = 4096;
constexpr size_t kNameSize = 512;

// The file directory read by startServer; empty before.
char gFileDirectory[kPathSize];

std::atomic<WSQL_HubFileWriteHook> gWriteHook{nullptr};

// Serialises the rewrites of the hub list file: they share the new-version
// and backup names.
struct RewriteLock {
    BSS1_Lock lock;
    RewriteLock() { (void)BSS1_InitializeLock(&lock); }
    ~RewriteLock() { BSS1_DestroyLock(&lock); }
    RewriteLock(const RewriteLock&) = delete;
    RewriteLock& operator=(const RewriteLock&) = delete;
};
BSS1_Lock* rewriteLock() {
    static RewriteLock l;
    return &l.lock;
}
class RewriteGuard {
public:
    RewriteGuard() { BSS1_GetLock(rewriteLock()); }
    ~RewriteGuard() { BSS1_ReleaseLock(rewriteLock()); }
    RewriteGuard(const RewriteGuard&) = delete;
    RewriteGuard& operator=(const RewriteGuard&) = delete;
};

bool startMode(const WSQL_Anchor* anchor) {
    return anchor != nullptr && (anchor->flags & WSQL_ANCHOR_EMBEDDED) != 0;
}

const char* hubFileName() { return BSS1_GetEnv("KSH_HUB_FILE", kDefaultHubFile); }

void destroyHub(void* hub) { delete static_cast<WSQL_Hub*>(hub); }

// The text of the immediate child `name` of `parent`, or null when it is
// missing or empty.
const char* childText(KSH_DOMNode* parent, const char* name) {
    for (KSH_DOMNode* c = parent->getFirstChild(); c != nullptr; c = parent->getNextChild()) {
        if (std::strcmp(c->getName(), name) != 0) continue;
        parent->resetChildIter();
        const char* v = c->getValue();
        return (v != nullptr && *v != '\0') ? v : nullptr;
    }
    return nullptr;
}

KSH_DOMNode* childNode(KSH_DOMNode* parent, const char* name) {
    for (KSH_DOMNode* c = parent->getFirstChild(); c != nullptr; c = parent->getNextChild()) {
        if (std::strcmp(c->getName(), name) == 0) {
            parent->resetChildIter();
            return c;
        }
    }
    return nullptr;
}

// A list of copies of the User texts below `group` (a Query or Update
// element), or null when there is none.
LinkedList* userList(KSH_DOMNode* group, const char* kind) {
    int ras = RAS1_Sync(RAS1_THIS);
    LinkedList* users = nullptr;
    for (KSH_DOMNode* c = group->getFirstChild(); c != nullptr; c = group->getNextChild()) {
        if (std::strcmp(c->getName(), "User") != 0 || c->getValue() == nullptr) continue;
        char* copy = WSQL_Strdup(c->getValue());
        if (copy == nullptr) continue;
        if (users == nullptr) users = new LinkedList(WSQL_FreeText);
        if (users->AppendEntry(copy) != WSQL_OK) {
            std::free(copy);
            continue;
        }
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Added \"%s\" to %s list", copy, kind);
    }
    return users;
}

void readAccessLists(WSQL_Hub* hub, KSH_DOMNode* hubNode) {
    KSH_DOMNode* access = childNode(hubNode, "Access");
    if (access == nullptr) return;
    if (KSH_DOMNode* q = childNode(access, "Query")) {
        if (LinkedList* users = userList(q, "Query")) hub->setQueryUserList(users);
    }
    if (KSH_DOMNode* u = childNode(access, "Update")) {
        if (LinkedList* users = userList(u, "Update")) hub->setUpdateUserList(users);
    }
}

// Adds the hub described by one HUB element to *list (created on the first
// hub). False when the element lacks Alias or LMS_Name: reading ends there.
bool addFileHub(WSQL_Anchor* anchor, KSH_DOMNode* hubNode, LinkedList** list) {
    int ras = RAS1_Sync(RAS1_THIS);
    const char* alias = childText(hubNode, "Alias");
    const char* lms = childText(hubNode, "LMS_Name");
    if (alias == nullptr || lms == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "HUB without %s ends the hub list", alias == nullptr ? "Alias" : "LMS_Name");
        return false;
    }
    const char* service = childText(hubNode, "Service_Name");
    if (service == nullptr) service = "";
    if (WSQL_CaseCompare(alias, "soap") == 0) {
        if (anchor != nullptr) anchor->flags |= WSQL_ANCHOR_LOCALHUB;
        service = "soap";
    }
    auto* hub = new WSQL_Hub(lms, service, alias, nullptr);
    if (*list == nullptr) *list = new LinkedList(destroyHub);
    if ((*list)->AppendEntry(hub) != WSQL_OK) {
        delete hub;
        return false;
    }
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Hub alias %s LMS_Name %s Service_Name %s", alias, lms, service);
    readAccessLists(hub, hubNode);
    return true;
}

// ---- file names in the file directory

bool buildPath(char* out, size_t size, const char* directory, const char* name) {
    int n = std::snprintf(out, size, "%s/%s", directory, name);
    return n >= 0 && static_cast<size_t>(n) < size;
}

// The three names of a rewrite: the file, "_file" (new version) and
// "_file~" (backup).
struct HubFileNames {
    char file[kNameSize];
    char newVersion[kNameSize];
    char backup[kNameSize];
    bool ok;
    HubFileNames() {
        const char* f = hubFileName();
        int a = std::snprintf(file, sizeof file, "%s", f);
        int b = std::snprintf(newVersion, sizeof newVersion, "_%s", f);
        int c = std::snprintf(backup, sizeof backup, "_%s~", f);
        ok = a >= 0 && b >= 0 && c >= 0 && static_cast<size_t>(c) < sizeof backup;
    }
};

// One rewrite of the hub list file: the current file read line by line, the
// new version written beside it. Every write is checked; the new version is
// swapped in only when all of it, its flush, sync and close succeeded.
class HubFileRewrite {
public:
    HubFileRewrite() = default;
    ~HubFileRewrite() {
        if (in != nullptr) std::fclose(in);
        if (out != nullptr) {
            std::fclose(out);
            discardNewVersion();
        }
    }
    HubFileRewrite(const HubFileRewrite&) = delete;
    HubFileRewrite& operator=(const HubFileRewrite&) = delete;

    // -1 when either file cannot be opened (nothing changes then).
    int open() {
        if (!names.ok) return -1;
        in = WSQL_open_file(names.file, nullptr, "read");
        if (in == nullptr) return -1;
        out = WSQL_open_file(names.newVersion, nullptr, "write");
        return out != nullptr ? WSQL_OK : -1;
    }
    bool readLine(char* line, size_t size) { return std::fgets(line, static_cast<int>(size), in) != nullptr; }
    void write(const char* data, size_t n) {
        if (failed || n == 0) return;
        WSQL_HubFileWriteHook hook = gWriteHook.load();
        ++writes;
        if (hook != nullptr && hook(writes) != 0) {
            fail(EIO);
        } else if (std::fwrite(data, 1, n, out) != n) {
            fail(errno);
        }
    }
    void write(const char* text) { write(text, std::strlen(text)); }
    // Refuses the new version (it is deleted, the file stays).
    void abandon(int rc) {
        failed = true;
        result = rc;
    }
    // Closes both files and swaps the new version in. 0, 8 (the new
    // version was incomplete; deleted), the abandon status, or the swap's.
    int finish() {
        if (std::ferror(in)) fail(errno);
        std::fclose(in);
        in = nullptr;
        if (!failed && std::fflush(out) != 0) fail(errno);
        if (!failed && fsync(fileno(out)) != 0) fail(errno);
        int closeRc = std::fclose(out);
        out = nullptr;
        if (!failed && closeRc != 0) fail(errno);
        if (failed) {
            discardNewVersion();
            return result;
        }
        return WSQL_Backup_and_Save(names.file, names.backup, names.newVersion);
    }

private:
    void fail(int err) {
        if (failed) return;
        failed = true;
        result = WSQL_FAULT;
        RAS1_Printf(RAS1_THIS, __LINE__, "Error writing %s: errno=%d; %s is kept", names.newVersion, err,
                    names.file);
    }
    void discardNewVersion() {
        char path[kPathSize];
        if (buildPath(path, sizeof path, WSQL_GetFileDirectory(), names.newVersion)) (void)std::remove(path);
    }

    HubFileNames names;
    FILE* in = nullptr;
    FILE* out = nullptr;
    bool failed = false;
    int result = WSQL_OK;
    unsigned writes = 0;
};

// True when `p` (the text after a '<') is the closing tag of `name`, the
// name compared in any case.
bool isClosingTag(const char* p, const char* name) {
    size_t n = std::strlen(name);
    if (p[0] != '/' || WSQL_NCaseCompare(p + 1, name, n) != 0) return false;
    unsigned char after = static_cast<unsigned char>(p[1 + n]);
    return after == '>' || after == '\0' || std::isspace(after);
}

bool isBlankLine(const char* line) {
    for (; *line != '\0'; ++line)
        if (!std::isspace(static_cast<unsigned char>(*line))) return false;
    return true;
}

// Text escaped for an XML element's content.
void appendEscaped(std::string& out, const char* text) {
    for (; text != nullptr && *text != '\0'; ++text) {
        switch (*text) {
            case '&': out += "&amp;"; break;
            case '<': out += "&lt;"; break;
            case '>': out += "&gt;"; break;
            case '"': out += "&quot;"; break;
            case '\'': out += "&apos;"; break;
            default: out += *text;
        }
    }
}

// The six lines of a new HUB block.
std::string hubBlock(const WSQL_Hub* hub) {
    std::string b = "<HUB>\n<LMS_Name>";
    appendEscaped(b, hub->getLMSName());
    b += "</LMS_Name>\n<Service_Name>";
    appendEscaped(b, hub->getServiceName());
    b += "</Service_Name>\n<Alias>";
    appendEscaped(b, hub->getAliasName());
    b += "</Alias>\n</HUB>\n\n";
    return b;
}

int addHubToFile(const WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    HubFileRewrite rw;
    int rc = rw.open();
    if (rc == WSQL_OK) {
        std::string block = hubBlock(hub);
        char line[kRewriteLine];
        bool added = false;
        while (rw.readLine(line, sizeof line)) {
            const char* lt = std::strchr(line, '<');
            if (!added && lt != nullptr && isClosingTag(lt + 1, "ENTERPRISE")) {
                rw.write(line, static_cast<size_t>(lt - line));
                rw.write("\n");
                rw.write(block.data(), block.size());
                rw.write(lt);
                added = true;
            } else {
                rw.write(line);
            }
        }
        // Without the closing root tag the hub would silently not be kept.
        if (!added) {
            RAS1_Printf(RAS1_THIS, __LINE__, "No closing ENTERPRISE tag in %s; hub %s not added to the file",
                        hubFileName(), hub->getAliasName());
            rw.abandon(WSQL_BADINPUT);
        }
        rc = rw.finish();
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// The next "#N" item of a removal list, or -1 (no further target).
int nextTarget(const char** cursor) {
    const char* p = std::strchr(*cursor, '#');
    if (p == nullptr || !std::isdigit(static_cast<unsigned char>(p[1]))) {
        *cursor += std::strlen(*cursor);
        return -1;
    }
    char* end = nullptr;
    long v = std::strtol(p + 1, &end, 10);
    *cursor = end;
    return (v > 0 && v < 1000000) ? static_cast<int>(v) : -1;
}

// ---- the default hub of plain mode

// The first non-empty line of the sites file, or false.
bool sitesAddress(char* out, size_t size) {
    const char* sites = BSS1_GetEnv("KDC_GLBSITES", "./glb_site.txt");
    char path[kPathSize];
    int n = sites[0] == '/' ? std::snprintf(path, sizeof path, "%s", sites)
                            : std::snprintf(path, sizeof path, "%s/../%s", WSQL_GetFileDirectory(), sites);
    if (n < 0 || static_cast<size_t>(n) >= sizeof path) return false;
    FILE* f = std::fopen(path, "r");
    if (f == nullptr) return false;
    char line[kReadLine];
    bool found = false;
    while (!found && std::fgets(line, sizeof line, f) != nullptr) {
        line[std::strcspn(line, "\r\n")] = '\0';
        if (line[0] == '\0') continue;
        std::snprintf(out, size, "%s", line);
        found = true;
    }
    std::fclose(f);
    return found;
}

LinkedList* defaultHubList() {
    int ras = RAS1_Sync(RAS1_THIS);
    char address[kReadLine];
    if (!sitesAddress(address, sizeof address)) std::snprintf(address, sizeof address, "%s", kDefaultAddress);
    const char* task = BSS1_GetEnv("KSH_TASK_NAME", "websql");
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Default hub LMS_Name=%s Service_Name=%s Alias_Name=%s", address, task, task);
    auto* list = new LinkedList(destroyHub);
    auto* hub = new WSQL_Hub(address, task, task, nullptr);
    if (list->AppendEntry(hub) != WSQL_OK) delete hub;
    return list;
}

void appendLocalHub(WSQL_Anchor* anchor, LinkedList** list) {
    int ras = RAS1_Sync(RAS1_THIS);
    const WSQL_LocalServer* local = anchor->localServer;
    if (local == nullptr) {
        RAS1_Printf(RAS1_THIS, __LINE__, "No local server record: no local hub");
        return;
    }
    char alias[sizeof local->alias];
    int len = local->aliasLength;
    if (len < 0 || static_cast<size_t>(len) >= sizeof alias) len = static_cast<int>(strnlen(local->alias, sizeof alias - 1));
    std::snprintf(alias, sizeof alias, "%.*s", len, local->alias);
    char lms[sizeof local->lmsName];
    std::snprintf(lms, sizeof lms, "%.*s", static_cast<int>(sizeof lms - 1), local->lmsName);
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Web service for Local LMS_Name=%s Service_Name=soap Alias_Name=%s", lms,
                    alias);
    auto* hub = new WSQL_Hub(lms, "soap", alias, nullptr);
    hub->setServerPath(lms, alias);
    if (*list == nullptr) *list = new LinkedList(destroyHub);
    if ((*list)->AppendEntry(hub) != WSQL_OK) delete hub;
}

}  // namespace

const char* WSQL_GetFileDirectory() {
    return gFileDirectory[0] != '\0' ? gFileDirectory : BSS1_GetEnv("KSH_DIRECTORY", "HTML");
}

void WSQL_SetFileDirectory(const char* dir) {
    std::snprintf(gFileDirectory, sizeof gFileDirectory, "%s", dir != nullptr ? dir : "");
}

void WSQL_SetHubFileWriteHook(WSQL_HubFileWriteHook hook) { gWriteHook.store(hook); }

WSQL_Hub* searchHubList(const char* alias) {
    int ras = RAS1_Sync(RAS1_THIS);
    LinkedList* list = gHubList;
    if (list == nullptr || alias == nullptr) return nullptr;
    LinkedListIter it(list);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        auto* hub = static_cast<WSQL_Hub*>(v);
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Search alias: \"%s\"", hub->getAliasName());
        if (WSQL_CaseCompare(hub->getAliasName(), alias) == 0) return hub;
    }
    return nullptr;
}

FILE* WSQL_open_file(const char* name, const char* directory, const char* mode) {
    int ras = RAS1_Sync(RAS1_THIS);
    char path[kPathSize];
    if (name == nullptr || !buildPath(path, sizeof path, directory ? directory : WSQL_GetFileDirectory(), name)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open %s, errno=%d", name ? name : "(null)", ENAMETOOLONG);
        return nullptr;
    }
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Using %s as path to hubs file", path);
    bool reading = mode != nullptr && std::strcmp(mode, "read") == 0;
    FILE* f = std::fopen(path, reading ? "r" : "w");
    if (f == nullptr) {
        int err = errno;
        // A missing hub list file is normal for a gateway embedded in the
        // monitoring server: it serves the local hub then.
        if (startMode(gAnchor) && err == ENOENT && std::strcmp(name, hubFileName()) == 0) {
            if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open %s, errno=%d (ENOENT)", path, err);
        } else {
            RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open %s, errno=%d", path, err);
        }
    }
    return f;
}

LinkedList* WSQL_process_hub_file(WSQL_Anchor* anchor, FILE* stream) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    LinkedList* list = nullptr;
    WSQL_ResponseBuffer text;
    char line[kReadLine];
    bool ok = text.valid();
    while (ok && std::fgets(line, sizeof line, stream) != nullptr) ok = text.append(line) == WSQL_OK;
    KSH_XML doc;
    if (!ok) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to read the hub list file");
    } else if (doc.parseMessage(text.getBuffer(), static_cast<unsigned>(text.getLength())) != WSQL_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Hub list file does not parse: %s",
                    doc.getParseError() ? doc.getParseError() : "");
    } else {
        unsigned count = 0;
        if (doc.getArray("HUB", &count) == WSQL_OK) {
            for (KSH_DOMNode* h = doc.getCurrent(); h != nullptr; h = doc.getCurrent()) {
                if (!addFileHub(anchor, h, &list)) break;
                if (doc.nextNode() != WSQL_OK) break;
            }
        }
    }
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "%u hubs in the hub list file", list ? list->NumEntries() : 0u);
    RAS1_EXIT(ras);
    return list;
}

LinkedList* WSQL_build_hub_list(WSQL_Anchor* anchor) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    LinkedList* list = nullptr;
    if (FILE* f = WSQL_open_file(hubFileName(), WSQL_GetFileDirectory(), "read")) {
        list = WSQL_process_hub_file(anchor, f);
        std::fclose(f);
    }
    if (startMode(anchor) && (anchor->flags & WSQL_ANCHOR_LOCALHUB) == 0) appendLocalHub(anchor, &list);
    if (list == nullptr && anchor != nullptr && !startMode(anchor)) list = defaultHubList();
    RAS1_EXIT(ras);
    return list;
}

int WSQL_Add_New_Hub(const char* lmsName, const char* serviceName, const char* alias, const char* qualifier) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    RewriteGuard serialised;
    // The hub belongs to gHubList once added (and is gone when that failed).
    auto* hub = new WSQL_Hub(lmsName, serviceName, alias, qualifier);
    int rc = WSQL_KDH_AddHub(hub);
    if (rc == WSQL_OK) rc = addHubToFile(hub);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Remove_Hubs(const char* list) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    RewriteGuard serialised;
    HubFileRewrite rw;
    int rc = rw.open();
    if (rc == WSQL_OK) {
        const char* cursor = list != nullptr ? list : "";
        int target = nextTarget(&cursor);
        int counter = 0;
        bool lastBlank = false;
        char line[kRewriteLine];
        while (rw.readLine(line, sizeof line)) {
            const char* lt = std::strchr(line, '<');
            bool drop = false;
            if (lt != nullptr && WSQL_NCaseCompare(lt + 1, "HUB", 3) == 0) {
                drop = ++counter == target;
                // A HUB written on one line ends on the line it begins.
                if (drop && std::strstr(lt, "</HUB>") != nullptr) target = nextTarget(&cursor);
            } else if (lt != nullptr && counter == target) {
                drop = true;
                if (isClosingTag(lt + 1, "HUB")) target = nextTarget(&cursor);
            }
            if (drop) continue;
            bool blank = isBlankLine(line);
            if (blank && lastBlank) continue;
            lastBlank = blank;
            rw.write(line);
        }
        rc = rw.finish();
    }
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Remove hubs %s rc=%d", list ? list : "", rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Backup_and_Save(const char* name, const char* backupName, const char* newName) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const char* dir = WSQL_GetFileDirectory();
    char file[kPathSize], backup[kPathSize], fresh[kPathSize];
    if (!buildPath(file, sizeof file, dir, name) || !buildPath(backup, sizeof backup, dir, backupName) ||
        !buildPath(fresh, sizeof fresh, dir, newName)) {
        RAS1_EXIT_RC(ras, ENAMETOOLONG);
        return ENAMETOOLONG;
    }
    (void)std::remove(backup);
    int rc = std::rename(file, backup) == 0 ? 0 : errno;
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error: could not rename %s to %s: RC=%d", file, backup, rc);
    } else {
        rc = std::rename(fresh, file) == 0 ? 0 : errno;
        if (rc != 0) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Error: could not rename %s to %s: RC=%d", fresh, file, rc);
            // Put the current version back rather than leave no hub list file.
            if (std::rename(backup, file) != 0)
                RAS1_Printf(RAS1_THIS, __LINE__, "Error: could not rename %s to %s: RC=%d", backup, file, errno);
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
