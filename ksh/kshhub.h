// kshhub: one monitoring hub the gateway serves, and the cache of its
// topology.
//
// A WSQL_Hub carries the hub's names, its HTTP service, the connection path
// through which SQL reaches the hub's management server (the LMS), the
// shared ("global") SQL path with its state, the server's version, build,
// NLS capability and user-validation level, the users allowed to query or
// update through it, and a lazily built cache of the topology: situations
// and their templates, the managed objects of each template, the nodes and
// node lists those objects name and the applications installed at each node,
// with an online status refreshed at most every 120 seconds.
//
// Ownership: the hub owns every cached object. A Situation's template list
// shares its templates with the template cache; a ManagedObj's and a node
// list's Node lists point into the node cache. Nothing is evicted while the
// hub lives; pointers handed out stay valid until the hub is destroyed.
//
// Thread safety: requests of one hub run concurrently. The hub's lock
// (getLock) guards the server path and the global path. Cache building
// (look-ups that miss, node status refreshes) is serialised per hub by a
// second lock, so a node or template is cached once; reads of the cache
// take only the lists' own locks. Online flags and refresh times are atomic.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <ctime>

#include "bss1/bss1.h"
#include "kdh1/kdh1.h"
#include "kshdsr.h"
#include "kshlst.h"

class WSQL_Hub;

// List element destructor for lists of malloc'd texts (the user lists).
void WSQL_FreeText(void* text);

// Field widths of the cache entities (characters, without terminator).
enum : int {
    WSQL_NODE_NAME_MAX = 32,
    WSQL_APPL_NAME_MAX = 8,
    WSQL_APPL_VERSION_MAX = 10,
    WSQL_APPL_LEVEL_MAX = 2,
    WSQL_APPL_TIMESTAMP_MAX = 16,
};

// Node status refresh interval, seconds.
constexpr time_t WSQL_NODE_REFRESH_SECONDS = 120;

class Application {
public:
    // Copies at most the field widths of each text (lengths < 0: up to the
    // terminator); trailing blanks are removed.
    Application(const char* name, int nameLen, const char* version, int versionLen, const char* level,
                int levelLen, const char* timestamp, int timestampLen);
    virtual ~Application() = default;

    const char* getApplName() const { return name; }
    const char* getVersion() const { return version; }
    const char* getLevel() const { return level; }
    const char* getTimestamp() const { return timestamp; }

private:
    char name[WSQL_APPL_NAME_MAX + 1];
    char version[WSQL_APPL_VERSION_MAX + 1];
    char level[WSQL_APPL_LEVEL_MAX + 1];
    char timestamp[WSQL_APPL_TIMESTAMP_MAX + 1];
};

class Node {
public:
    // At most 32 characters of `name` (length < 0: up to the terminator),
    // trailing blanks removed. Online flag blank, no thru-node, refresh
    // time 0, no members, no applications.
    Node(const char* name, int length = -1);
    // Deletes the application list and the member list (not the members).
    virtual ~Node();
    Node(const Node&) = delete;
    Node& operator=(const Node&) = delete;

    const char* getName() const { return name; }
    const char* getThrunode() const { return thrunode; }
    // Copies at most 32 characters, trailing blanks removed.
    void setThrunode(const char* text, int length = -1);
    // Buffer of the thru-node (33 bytes) for a writer that fills it directly
    // before the node is shared.
    char* thrunodeBuffer() { return thrunode; }
    char getOnline() const { return online.load(std::memory_order_relaxed); }
    void setOnline(char flag) { online.store(flag, std::memory_order_relaxed); }
    // Members of a node list (Node*, not owned), or null for a plain
    // managed system.
    LinkedList* getNodeList() const { return members.load(std::memory_order_acquire); }
    // Takes `list` as the member list (a list without destructor).
    void addNodeList(LinkedList* list) { members.store(list, std::memory_order_release); }
    // Applications (Application*, owned), or null before they were loaded.
    LinkedList* getApplList() const { return appls.load(std::memory_order_acquire); }
    time_t getRefreshTime() const { return refreshTime.load(std::memory_order_relaxed); }
    void setRefreshTime(time_t t) { refreshTime.store(t, std::memory_order_relaxed); }

    // Loads the node's applications (only when it has none yet) from
    // SYSTEM.SYSAPPLS routed to the node, on the hub's shared path. 0 or the
    // SQL layer's status.
    int getNodeAppls(WSQL_Hub* hub);
    // The application named exactly `applName`, or null.
    Application* lookupNodeAppl(const char* applName) const;

private:
    char name[WSQL_NODE_NAME_MAX + 1];
    char thrunode[WSQL_NODE_NAME_MAX + 1];
    std::atomic<char> online;
    std::atomic<time_t> refreshTime;
    std::atomic<LinkedList*> members;
    std::atomic<LinkedList*> appls;
};

class ManagedObj {
public:
    // Name (trailing blanks removed) and node text (one node name or several
    // separated by commas), each `length` bytes (< 0: to the terminator).
    ManagedObj(const char* name, int nameLen, const char* node, int nodeLen);
    virtual ~ManagedObj();
    ManagedObj(const ManagedObj&) = delete;
    ManagedObj& operator=(const ManagedObj&) = delete;

    const char* getName() const { return name; }
    const char* getNode() const { return node; }
    // The managed systems (Node*, not owned), never null.
    LinkedList* getMSList() const { return msList; }
    // A node list adds each member not yet listed; a plain node adds itself
    // (no duplicate check).
    void addMS(Node* node);

private:
    char* name;   // malloc'd
    char* node;   // malloc'd
    LinkedList* msList;
};

class SitTemplate {
public:
    // Template name (at most 32 characters, trailing blanks removed) and
    // state, each `length` bytes (< 0: to the terminator).
    SitTemplate(const char* name, int nameLen, const char* state, int stateLen);
    // Deletes the managed objects.
    virtual ~SitTemplate();
    SitTemplate(const SitTemplate&) = delete;
    SitTemplate& operator=(const SitTemplate&) = delete;

    const char* getTemplate() const { return name; }
    const char* getState() const { return state; }
    // Managed objects (ManagedObj*, owned), or null.
    LinkedList* getMOList() const { return moList.load(std::memory_order_acquire); }
    // Takes `list` (destructor deleting ManagedObj) as the managed objects.
    void setMOList(LinkedList* list) { moList.store(list, std::memory_order_release); }
    // For each managed object, looks up the nodes its node text names and
    // adds them (addMS).
    void buildMSLists(WSQL_Hub* hub);

private:
    char name[WSQL_NODE_NAME_MAX + 1];
    char* state;  // malloc'd
    std::atomic<LinkedList*> moList;
};

class Situation {
public:
    // Copies the name; takes `templates` (a list without destructor whose
    // templates belong to the template cache; may be null).
    Situation(const char* name, LinkedList* templates);
    virtual ~Situation();
    Situation(const Situation&) = delete;
    Situation& operator=(const Situation&) = delete;

    const char* getSitName() const { return name; }
    LinkedList* getTemplates() const { return templates; }

private:
    char* name;  // malloc'd
    LinkedList* templates;
};

// List element destructors of the cache lists.
void destroy_Node(void* item);
void destroy_SitTemplate(void* item);
void destroy_ManagedObj(void* item);
void destroy_Situation(void* item);
void destroy_Application(void* item);

// User access levels of verifyUser.
enum : int {
    WSQL_ACCESS_QUERY = 1,
    WSQL_ACCESS_UPDATE = 2,
    WSQL_ACCESS_NONE = 3,
};

// Hub validation levels (getValidate).
enum : int {
    WSQL_VALIDATE_UNKNOWN = 0,  // not yet known
    WSQL_VALIDATE_OFF = 1,      // the server does not validate users
    WSQL_VALIDATE_UNSURE = 2,   // older server, or the query failed
    WSQL_VALIDATE_ON = 3,       // the server validates users
};

// Hub flag bits.
enum : uint32_t { WSQL_HUB_NLS = 16 };

class WSQL_Hub {
public:
    // The LMS name ("%s[%s]" with the qualifier when one is given), a
    // lower-cased copy of the service name, the alias. Null texts read as
    // empty.
    WSQL_Hub(const char* lmsName, const char* serviceName, const char* alias, const char* qualifier);
    // Deletes the node status query, releases the shared path, frees the
    // names and every cached object; destroys the lock last.
    virtual ~WSQL_Hub();
    WSQL_Hub(const WSQL_Hub&) = delete;
    WSQL_Hub& operator=(const WSQL_Hub&) = delete;

    const char* getLMSName() const { return lmsName; }
    const char* getServiceName() const { return serviceName; }
    const char* getAliasName() const { return alias; }
    KDH1_server_t getKDHServer() const { return kdhServer; }
    void setKDHServer(KDH1_server_t handle) { kdhServer = handle; }
    void* getThreadID() const { return threadId; }
    void setThreadID(void* thread) { threadId = thread; }
    // The server path, or null. REQUIRES: the hub's lock, since a
    // connection failure frees it (copyServerPath takes the lock itself).
    const char* getServerPath() const { return serverPath; }
    // Copies the server path into `buffer` (size bytes) under the hub's
    // lock; false when there is none or it does not fit.
    bool copyServerPath(char* buffer, size_t size);
    bool hasServerPath();
    // The node identifier given to setServerPath (the hub's own node name),
    // or "" before it is known.
    const char* getNodeID() const {
        const char* id = nodeId.load(std::memory_order_acquire);
        return id != nullptr ? id : "";
    }
    int getValidate() const { return validate.load(std::memory_order_relaxed); }
    void setValidate(int level) { validate.store(level, std::memory_order_relaxed); }
    int getLMSVersion() const { return lmsVersion.load(std::memory_order_relaxed); }
    void setLMSVersion(int v) { lmsVersion.store(v, std::memory_order_relaxed); }
    int getLMSBuild() const { return lmsBuild.load(std::memory_order_relaxed); }
    void setLMSBuild(int b) { lmsBuild.store(b, std::memory_order_relaxed); }
    bool isHubNLS() const { return (flags.load(std::memory_order_relaxed) & WSQL_HUB_NLS) != 0; }
    void setHubIsNLS(bool on);
    DS_SQLRequest::SQLSTATE getGlobalState() const { return globalState.load(std::memory_order_relaxed); }
    void setGlobalState(DS_SQLRequest::SQLSTATE s) { globalState.store(s, std::memory_order_relaxed); }
    // The shared path. REQUIRES: the hub's lock to change it.
    SQL1_Handle getGlobalPathHdl() const { return globalPathHdl; }
    // Records a new shared path. REQUIRES: the hub's lock.
    void setGlobalPath(SQL1_Handle path) {
        globalPathHdl = path;
        globalPath = path.object;
    }
    BSS1_Lock* getLock() { return &lock; }

    // Takes the lists (malloc'd texts; a list created with destructor
    // WSQL_FreeText); a previous list is deleted. Null: no list.
    void setQueryUserList(LinkedList* users);
    void setUpdateUserList(LinkedList* users);

    // Sets the server path for `lmsName` and keeps a copy of
    // `nodeIdentifier` (the hub's node name). Returns the length of the path.
    int setServerPath(const char* lmsName, const char* nodeIdentifier);
    // 2 (update allowed), 1 (query only) or 3 (no access) for `user`.
    int verifyUser(const char* user) const;
    // Drops the shared path and the server path after a connection-level
    // failure (150 to 199); other statuses change nothing. Returns 0.
    int setGlobalPathStatus(int status);

    // The cached templates (SitTemplate*) of `situation` that have managed
    // objects, or null. A situation is queried once for the hub's life.
    LinkedList* getCachedTempsForSit(const char* situation);
    // The templates of `situation` from the server, resolved through the
    // template cache (null when none has managed objects).
    LinkedList* getTempsForSit(const char* situation);
    // Resolves each template of `list` (which is consumed) through the
    // template cache; the cached ones that have managed objects, or null.
    LinkedList* getCachedTemplates(LinkedList* list);
    // Queries the managed objects of `tmpl`; the number found.
    int getMOsForTemp(SitTemplate* tmpl);
    // The cached node of that name (looked up on first use), or null.
    Node* lookupCachedNode(const char* name);
    // Queries and caches a node; null when the query cannot run.
    Node* lookupNode(const char* name);
    // Refreshes the online flags of the members of the node list `nodeList`
    // (at most every 120 seconds). 0 or the SQL layer's status.
    int refreshCachedNodeStatus(const char* nodeList);

    // Number of queries the topology cache has sent to the server (for
    // tests and diagnostics).
    unsigned getCacheQueryCount() const { return cacheQueries.load(std::memory_order_relaxed); }

private:
    // Runs `sql` as an auxiliary request and converts its rows (type of
    // WSQL_Request::GetResults); null when the query cannot run.
    LinkedList* runAuxQuery(const char* sql, int resultsType, char* hubName, int hubNameSize);
    // Node cache helpers. REQUIRES: cacheLock.
    Node* findCachedNode(const char* name) const;
    Node* lookupNodeLocked(const char* name);
    void primeNodeCache();
    int refreshLocked(Node* list);
    int prepareNodeStatusQuery();
    // Drops the shared path and node status query. REQUIRES: lock.
    void dropGlobalPathLocked();

    char* lmsName;
    char* serviceName;
    char* alias;
    KDH1_server_t kdhServer = 0;
    void* threadId = nullptr;
    char* serverPath = nullptr;  // GUARDED_BY(lock)
    // Published atomically; a replaced identifier is kept in retiredIds
    // until the hub goes, since readers hold it without a lock.
    std::atomic<char*> nodeId{nullptr};
    LinkedList* retiredIds = nullptr;
    std::atomic<int> validate{WSQL_VALIDATE_UNKNOWN};
    std::atomic<int> lmsVersion{0};
    std::atomic<int> lmsBuild{0};
    std::atomic<uint32_t> flags{0};
    std::atomic<DS_SQLRequest::SQLSTATE> globalState{DS_SQLRequest::SQL_NOTLOGGEDON};
    SQL1_Handle globalPathHdl{};     // GUARDED_BY(lock)
    SQL1_Object* globalPath = nullptr;  // GUARDED_BY(lock)
    BSS1_Lock lock;
    DS_SQLSelect* nodeStatusQuery = nullptr;  // GUARDED_BY(cacheLock)
    // Set when the shared path was dropped: the node status query is then
    // deleted by its next user (it may be in use right now).
    std::atomic<bool> nodeStatusStale{false};
    std::atomic<bool> nodesPrimed{false};
    LinkedList* situations = nullptr;         // Situation*, owned
    LinkedList* templates = nullptr;          // SitTemplate*, owned
    LinkedList* nodes = nullptr;              // Node*, owned
    LinkedList* queryUsers = nullptr;
    LinkedList* updateUsers = nullptr;
    BSS1_Lock cacheLock;                      // serialises cache building
    std::atomic<unsigned> cacheQueries{0};
};
