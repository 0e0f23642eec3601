// kshhub: the hub object and its topology cache (see kshhub.h).
#include "kshhub.h"

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "kshanchor.h"
#include "kshreq.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshhub");

// The anchor of the running gateway. Defined here until the gateway's start
// component owns it.
WSQL_Anchor* gAnchor = nullptr;

void WSQL_FreeText(void* text) { std::free(text); }

namespace {

const char kLocalPath[] = "CT/DS:{SERVER=SRVR01 USER=KSH}";
const char kRemotePath[] = "NCS:{SOCKET=%s} CT/DS:{SERVER=SRVR01 USER=KSH TERMPATH=INVOWNER OWNER=KSH}";
const char kAllLms[] = "*ALL_LMS";

// Room for one topology query with an escaped name of up to 255 bytes.
constexpr size_t kQuerySize = 768;

// Copies at most `max` characters of `src` (`len` < 0: up to the
// terminator) into `dst` (max + 1 bytes), trailing blanks removed.
void copyTrimmed(char* dst, size_t max, const char* src, int len) {
    size_t n = 0;
    if (src != nullptr) n = len < 0 ? strnlen(src, max) : (static_cast<size_t>(len) < max ? static_cast<size_t>(len) : max);
    if (n > 0) std::memcpy(dst, src, n);
    while (n > 0 && dst[n - 1] == ' ') n--;
    dst[n] = '\0';
}

// A malloc'd trimmed copy of `len` bytes (< 0: to the terminator).
char* dupTrimmed(const char* src, int len) {
    size_t n = src == nullptr ? 0 : len < 0 ? std::strlen(src) : strnlen(src, static_cast<size_t>(len));
    while (n > 0 && src[n - 1] == ' ') n--;
    char* out = static_cast<char*>(std::malloc(n + 1));
    if (out == nullptr) return nullptr;
    if (n > 0) std::memcpy(out, src, n);
    out[n] = '\0';
    return out;
}

char* dupText(const char* s) {
    const char* t = s != nullptr ? s : "";
    size_t n = std::strlen(t);
    char* out = static_cast<char*>(std::malloc(n + 1));
    if (out != nullptr) std::memcpy(out, t, n + 1);
    return out;
}

// Formats `fmt` with one name escaped for a double-quoted literal; false
// when the name does not fit.
bool formatQuery(char* out, size_t size, const char* fmt, const char* name) {
    char escaped[kQuerySize / 2];
    if (WSQL_EscapeLiteral(name, -1, escaped, sizeof escaped) < 0) return false;
    int n = std::snprintf(out, size, fmt, escaped);
    return n > 0 && static_cast<size_t>(n) < size;
}

bool onList(LinkedList* list, const char* user) {
    if (list == nullptr || user == nullptr) return false;
    LinkedListIter it(list);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        if (std::strcmp(static_cast<const char*>(v), user) == 0) return true;
    }
    return false;
}

Node* findNode(LinkedList* list, const char* name) {
    if (list == nullptr || name == nullptr) return nullptr;
    LinkedListIter it(list);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        Node* n = static_cast<Node*>(v);
        if (std::strcmp(n->getName(), name) == 0) return n;
    }
    return nullptr;
}

}  // namespace

// ---------------------------------------------------------------------------
// Cache entities
// ---------------------------------------------------------------------------

Application::Application(const char* n, int nl, const char* v, int vl, const char* l, int ll, const char* t, int tl) {
    copyTrimmed(name, WSQL_APPL_NAME_MAX, n, nl);
    copyTrimmed(version, WSQL_APPL_VERSION_MAX, v, vl);
    copyTrimmed(level, WSQL_APPL_LEVEL_MAX, l, ll);
    copyTrimmed(timestamp, WSQL_APPL_TIMESTAMP_MAX, t, tl);
}

Node::Node(const char* n, int length) : online(' '), refreshTime(0), members(nullptr), appls(nullptr) {
    copyTrimmed(name, WSQL_NODE_NAME_MAX, n, length);
    thrunode[0] = '\0';
}

Node::~Node() {
    delete members.load();
    delete appls.load();
}

void Node::setThrunode(const char* text, int length) { copyTrimmed(thrunode, WSQL_NODE_NAME_MAX, text, length); }

int Node::getNodeAppls(WSQL_Hub* hub) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (getApplList() != nullptr) {
        RAS1_EXIT_RC(ras, 0);
        return 0;
    }
    char sql[kQuerySize];
    if (!formatQuery(sql, sizeof sql, "SELECT APPL_NAME, VERSION, LEVEL, TIMESTAMP FROM SYSTEM.SYSAPPLS AT (\"%s\")",
                     name)) {
        RAS1_EXIT_RC(ras, WSQL_NOMEM);
        return WSQL_NOMEM;
    }
    DS_SQLSelect query(hub, sql);
    query.useGlobalPath();
    int rc = query.login(0);
    if (rc == 0) rc = query.create(0, nullptr);
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to Create Application query at %.32s. %d", name, rc);
        RAS1_EXIT_RC(ras, rc);
        return rc;
    }
    rc = query.open();
    if (rc != 0) RAS1_Printf(RAS1_THIS, __LINE__, "Application query Open Error. %d at node %s", rc, name);
    LinkedList* list = nullptr;
    while (rc == 0 && (rc = query.fetch()) == 0) {
        SQL1_Sqlda* out = query.getOutputSQLDA();
        if (out == nullptr || out->used < 4) {
            rc = WSQL_BADINPUT;
            break;
        }
        SQL1_SqlVar* v = out->var;
        auto* appl = new Application(v[0].data, v[0].length, v[1].data, v[1].length, v[2].data, v[2].length,
                                     v[3].data, v[3].length);
        if (list == nullptr) list = new LinkedList(destroy_Application);
        if (list->AppendEntry(appl) != 0) delete appl;
    }
    if (rc == WSQL_ENDOFDATA) rc = 0;
    (void)query.close();
    (void)query.drop();
    // Published whole, so readers never see a list still being filled.
    if (rc == 0 && list != nullptr) {
        appls.store(list, std::memory_order_release);
    } else {
        delete list;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

Application* Node::lookupNodeAppl(const char* applName) const {
    int ras = RAS1_Sync(RAS1_THIS);
    LinkedList* list = getApplList();
    if (list == nullptr) {
        RAS1_TRACE_IF(ras, RAS1_DETAIL, "Appl list not initialized yet from Node: %.*s Appl %.*s Not Found", 32, name, 8,
                      applName);
        return nullptr;
    }
    LinkedListIter it(list);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        auto* a = static_cast<Application*>(v);
        if (applName != nullptr && std::strcmp(a->getApplName(), applName) == 0) {
            RAS1_TRACE_IF(ras, RAS1_DETAIL, "Appl %.*s found at Node: %.*s", 8, applName, 32, name);
            return a;
        }
    }
    RAS1_TRACE_IF(ras, RAS1_DETAIL, "Appl %.*s Not Found at Node: %.*s", 8, applName != nullptr ? applName : "", 32,
                  name);
    return nullptr;
}

ManagedObj::ManagedObj(const char* n, int nl, const char* nd, int ndl)
    : name(dupTrimmed(n, nl)), node(nullptr), msList(new LinkedList(nullptr)) {
    size_t len = nd == nullptr ? 0 : ndl < 0 ? std::strlen(nd) : strnlen(nd, static_cast<size_t>(ndl));
    node = static_cast<char*>(std::malloc(len + 1));
    if (node != nullptr) {
        if (len > 0) std::memcpy(node, nd, len);
        node[len] = '\0';
    }
}

ManagedObj::~ManagedObj() {
    delete msList;
    std::free(name);
    std::free(node);
}

void ManagedObj::addMS(Node* n) {
    if (n == nullptr) return;
    LinkedList* members = n->getNodeList();
    if (members == nullptr) {
        (void)msList->AppendEntry(n);
        return;
    }
    LinkedListIter it(members);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        if (!msList->OnList(v)) (void)msList->AppendEntry(v);
    }
}

SitTemplate::SitTemplate(const char* n, int nl, const char* s, int sl) : state(dupTrimmed(s, sl)), moList(nullptr) {
    copyTrimmed(name, WSQL_NODE_NAME_MAX, n, nl);
}

SitTemplate::~SitTemplate() {
    delete moList.load();
    std::free(state);
}

void SitTemplate::buildMSLists(WSQL_Hub* hub) {
    LinkedList* mos = getMOList();
    if (mos == nullptr) return;
    LinkedListIter it(mos);
    for (void* v = it.Next(); v != nullptr; v = it.Next()) {
        auto* mo = static_cast<ManagedObj*>(v);
        const char* text = mo->getNode();
        while (text != nullptr && *text != '\0') {
            const char* comma = std::strchr(text, ',');
            size_t len = comma != nullptr ? static_cast<size_t>(comma - text) : std::strlen(text);
            char nodeName[WSQL_NODE_NAME_MAX + 1];
            while (len > 0 && *text == ' ') {
                text++;
                len--;
            }
            copyTrimmed(nodeName, WSQL_NODE_NAME_MAX, text, static_cast<int>(len));
            if (nodeName[0] != '\0') mo->addMS(hub->lookupCachedNode(nodeName));
            text = comma != nullptr ? comma + 1 : nullptr;
        }
    }
}

Situation::Situation(const char* n, LinkedList* t) : name(dupText(n)), templates(t) {}

Situation::~Situation() {
    delete templates;
    std::free(name);
}

void destroy_Node(void* item) { delete static_cast<Node*>(item); }
void destroy_SitTemplate(void* item) { delete static_cast<SitTemplate*>(item); }
void destroy_ManagedObj(void* item) { delete static_cast<ManagedObj*>(item); }
void destroy_Situation(void* item) { delete static_cast<Situation*>(item); }
void destroy_Application(void* item) { delete static_cast<Application*>(item); }

// ---------------------------------------------------------------------------
// Hub
// ---------------------------------------------------------------------------

WSQL_Hub::WSQL_Hub(const char* lms, const char* service, const char* aliasName, const char* qualifier)
    : lmsName(nullptr), serviceName(dupText(service)), alias(dupText(aliasName)) {
    if (qualifier != nullptr && *qualifier != '\0') {
        size_t n = std::strlen(lms != nullptr ? lms : "") + std::strlen(qualifier) + 3;
        lmsName = static_cast<char*>(std::malloc(n));
        if (lmsName != nullptr) std::snprintf(lmsName, n, "%s[%s]", lms != nullptr ? lms : "", qualifier);
    } else {
        lmsName = dupText(lms);
    }
    for (char* p = serviceName; p != nullptr && *p != '\0'; p++) *p = static_cast<char>(std::tolower(static_cast<unsigned char>(*p)));
    (void)BSS1_InitializeLock(&lock);
    (void)BSS1_InitializeLock(&cacheLock);
    situations = new LinkedList(destroy_Situation);
    templates = new LinkedList(destroy_SitTemplate);
    nodes = new LinkedList(destroy_Node);
    retiredIds = new LinkedList(WSQL_FreeText);
}

WSQL_Hub::~WSQL_Hub() {
    BSS1_GetLock(&lock);
    delete nodeStatusQuery;
    nodeStatusQuery = nullptr;
    if (globalPath != nullptr && SQL1_IsCurrent(globalPathHdl)) (void)globalPathHdl.object->ops->release(globalPathHdl);
    globalPath = nullptr;
    globalPathHdl = SQL1_Handle{};
    std::free(lmsName);
    std::free(serviceName);
    std::free(alias);
    std::free(serverPath);
    std::free(nodeId.load());
    // Situations first: their lists point at templates the template cache
    // owns; templates point at nodes.
    delete situations;
    delete templates;
    delete nodes;
    delete retiredIds;
    delete queryUsers;
    delete updateUsers;
    BSS1_ReleaseLock(&lock);
    BSS1_DestroyLock(&cacheLock);
    BSS1_DestroyLock(&lock);
}

void WSQL_Hub::setHubIsNLS(bool on) {
    if (on) {
        flags.fetch_or(WSQL_HUB_NLS);
    } else {
        flags.fetch_and(~WSQL_HUB_NLS);
    }
}

bool WSQL_Hub::copyServerPath(char* buffer, size_t size) {
    BSS1_GetLock(&lock);
    bool ok = serverPath != nullptr && std::strlen(serverPath) < size;
    if (ok) std::snprintf(buffer, size, "%s", serverPath);
    BSS1_ReleaseLock(&lock);
    return ok;
}

bool WSQL_Hub::hasServerPath() {
    BSS1_GetLock(&lock);
    bool has = serverPath != nullptr;
    BSS1_ReleaseLock(&lock);
    return has;
}

void WSQL_Hub::setQueryUserList(LinkedList* users) {
    delete queryUsers;
    queryUsers = users;
}

void WSQL_Hub::setUpdateUserList(LinkedList* users) {
    delete updateUsers;
    updateUsers = users;
}

int WSQL_Hub::setServerPath(const char* lms, const char* nodeIdentifier) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    BSS1_GetLock(&lock);
    const char* idText = nodeIdentifier != nullptr ? nodeIdentifier : "";
    char* current = nodeId.load();
    if (current == nullptr || std::strcmp(current, idText) != 0) {
        char* copy = dupText(idText);
        if (copy != nullptr) {
            nodeId.store(copy, std::memory_order_release);
            if (current != nullptr && retiredIds->AppendEntry(current) != 0) {
                // Cannot be kept for its readers: leaking it is the safe choice.
            }
        }
    }
    const WSQL_LocalServer* local = gAnchor != nullptr ? gAnchor->localServer : nullptr;
    size_t idLen = std::strlen(idText);
    bool isLocal = local != nullptr && local->aliasLength >= 0 && static_cast<size_t>(local->aliasLength) == idLen &&
                   idLen < sizeof local->alias && std::memcmp(local->alias, idText, idLen) == 0;
    std::free(serverPath);
    serverPath = nullptr;
    int length = 0;
    if (isLocal) {
        serverPath = dupText(kLocalPath);
        setValidate((gAnchor->flags & WSQL_ANCHOR_VALIDATE) != 0 ? WSQL_VALIDATE_ON : WSQL_VALIDATE_OFF);
        setLMSVersion(local->version);
        setLMSBuild(local->build);
        setHubIsNLS((local->options & WSQL_LOCAL_NLS) != 0);
    } else {
        const char* name = lms != nullptr ? lms : "";
        size_t n = std::strlen(kRemotePath) + std::strlen(name) + 1;
        serverPath = static_cast<char*>(std::malloc(n));
        if (serverPath != nullptr) std::snprintf(serverPath, n, kRemotePath, name);
    }
    if (serverPath != nullptr) length = static_cast<int>(std::strlen(serverPath));
    RAS1_TRACE_IF(ras, RAS1_DETAIL, "Path to LMS %s(%s) set to %s", lms != nullptr ? lms : "", idText,
                  serverPath != nullptr ? serverPath : "");
    BSS1_ReleaseLock(&lock);
    RAS1_EXIT_RC(ras, length);
    return length;
}

int WSQL_Hub::verifyUser(const char* user) const {
    if (queryUsers == nullptr && updateUsers == nullptr) return WSQL_ACCESS_UPDATE;
    if (onList(updateUsers, user)) return WSQL_ACCESS_UPDATE;
    if (onList(queryUsers, user)) return WSQL_ACCESS_QUERY;
    return WSQL_ACCESS_NONE;
}

void WSQL_Hub::dropGlobalPathLocked() {
    int ras = RAS1_Sync(RAS1_THIS);
    const char* path = serverPath != nullptr ? serverPath : "";
    if (nodeStatusQuery != nullptr) {
        RAS1_TRACE_IF(ras, RAS1_DETAIL, "Dropping Global Node Status Request to LMS %s(%s) set to %s", lmsName,
                      getNodeID(), path);
        nodeStatusStale.store(true);
    }
    if (SQL1_IsCurrent(globalPathHdl) && globalPathHdl.object == globalPath) {
        RAS1_TRACE_IF(ras, RAS1_DETAIL, "Dropping Global Path to LMS %s(%s) set to %s", lmsName, getNodeID(), path);
        (void)globalPathHdl.object->ops->release(globalPathHdl);
    }
    globalPathHdl = SQL1_Handle{};
    globalPath = nullptr;
    setGlobalState(DS_SQLRequest::SQL_NOTLOGGEDON);
    setValidate(WSQL_VALIDATE_UNKNOWN);
}

int WSQL_Hub::setGlobalPathStatus(int status) {
    if (!SQL1_IsConnectionLost(status)) return 0;
    BSS1_GetLock(&lock);
    if (globalPath != nullptr) dropGlobalPathLocked();
    std::free(serverPath);
    serverPath = nullptr;
    BSS1_ReleaseLock(&lock);
    return 0;
}

// ---------------------------------------------------------------------------
// Topology cache
// ---------------------------------------------------------------------------

LinkedList* WSQL_Hub::runAuxQuery(const char* sql, int resultsType, char* hubName, int hubNameSize) {
    cacheQueries.fetch_add(1);
    auto* req = new WSQL_Request(this, nullptr);
    LinkedList* result = nullptr;
    int rc = req->InitializeAuxReq(sql);
    if (rc == 0) rc = req->Start();
    if (rc == 0) result = req->GetResults(static_cast<ResultsType>(resultsType), hubName, hubNameSize);
    (void)req->Done(rc);
    delete req;
    return result;
}

LinkedList* WSQL_Hub::getCachedTempsForSit(const char* situation) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (situation == nullptr) return nullptr;
    auto find = [&]() -> Situation* {
        LinkedListIter it(situations);
        for (void* v = it.Next(); v != nullptr; v = it.Next()) {
            auto* s = static_cast<Situation*>(v);
            if (std::strcmp(s->getSitName(), situation) == 0) return s;
        }
        return nullptr;
    };
    Situation* sit = find();
    if (sit == nullptr) {
        BSS1_GetLock(&cacheLock);
        sit = find();
        if (sit == nullptr) {
            sit = new Situation(situation, getTempsForSit(situation));
            if (situations->AppendEntry(sit) != 0) {
                // Not cached: hand back nothing rather than a list nobody owns.
                delete sit;
                sit = nullptr;
            }
        }
        BSS1_ReleaseLock(&cacheLock);
    }
    LinkedList* result = sit != nullptr ? sit->getTemplates() : nullptr;
    RAS1_EXIT(ras);
    return result;
}

LinkedList* WSQL_Hub::getTempsForSit(const char* situation) {
    char sql[kQuerySize];
    if (!formatQuery(sql, sizeof sql, "SELECT TEMPLATE, STATE FROM O4SRV.TTMPLSIT WHERE NAME = \"%s\"", situation))
        return nullptr;
    LinkedList* list = runAuxQuery(sql, RESULTS_TEMPLATES, nullptr, 0);
    return list != nullptr ? getCachedTemplates(list) : nullptr;
}

LinkedList* WSQL_Hub::getCachedTemplates(LinkedList* list) {
    BSS1_GetLock(&cacheLock);
    auto* result = new LinkedList(nullptr);
    for (void* v = list->RemoveFirst(); v != nullptr; v = list->RemoveFirst()) {
        auto* t = static_cast<SitTemplate*>(v);
        SitTemplate* cached = nullptr;
        {
            LinkedListIter it(templates);
            for (void* c = it.Next(); c != nullptr; c = it.Next()) {
                if (std::strcmp(static_cast<SitTemplate*>(c)->getTemplate(), t->getTemplate()) == 0) {
                    cached = static_cast<SitTemplate*>(c);
                    break;
                }
            }
        }
        if (cached != nullptr) {
            delete t;
        } else {
            (void)getMOsForTemp(t);
            if (templates->AppendEntry(t) != 0) {
                delete t;
                continue;
            }
            cached = t;
        }
        LinkedList* mos = cached->getMOList();
        if (mos != nullptr && mos->NumEntries() > 0) (void)result->AppendEntry(cached);
    }
    delete list;
    if (result->NumEntries() == 0) {
        delete result;
        result = nullptr;
    }
    BSS1_ReleaseLock(&cacheLock);
    return result;
}

int WSQL_Hub::getMOsForTemp(SitTemplate* tmpl) {
    char sql[kQuerySize];
    if (!formatQuery(sql, sizeof sql, "SELECT NAME,NODE FROM O4SRV.TMANOBJS WHERE TEMPLATE = \"%s\"",
                     tmpl->getTemplate()))
        return 0;
    LinkedList* list = runAuxQuery(sql, RESULTS_MANAGEDOBJS, nullptr, 0);
    int count = list != nullptr ? static_cast<int>(list->NumEntries()) : 0;
    if (count > 0) {
        tmpl->setMOList(list);
        tmpl->buildMSLists(this);
    } else {
        delete list;
    }
    return count;
}

Node* WSQL_Hub::findCachedNode(const char* name) const { return findNode(nodes, name); }

Node* WSQL_Hub::lookupCachedNode(const char* name) {
    if (name == nullptr) return nullptr;
    Node* n = nodesPrimed.load() ? findCachedNode(name) : nullptr;
    if (n != nullptr) return n;
    BSS1_GetLock(&cacheLock);
    if (!nodesPrimed.load()) primeNodeCache();
    n = findCachedNode(name);
    if (n == nullptr) n = lookupNodeLocked(name);
    BSS1_ReleaseLock(&cacheLock);
    return n;
}

void WSQL_Hub::primeNodeCache() {
    Node* all = findCachedNode(kAllLms);
    if (all == nullptr) all = lookupNodeLocked(kAllLms);
    if (all == nullptr) return;
    LinkedList* members = all->getNodeList();
    if (members != nullptr) {
        LinkedListIter it(members);
        for (void* v = it.Next(); v != nullptr; v = it.Next()) {
            auto* m = static_cast<Node*>(v);
            m->setThrunode(m->getName());
        }
    }
    nodesPrimed.store(true);
}

Node* WSQL_Hub::lookupNode(const char* name) {
    BSS1_GetLock(&cacheLock);
    Node* n = lookupNodeLocked(name);
    BSS1_ReleaseLock(&cacheLock);
    return n;
}

Node* WSQL_Hub::lookupNodeLocked(const char* name) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char sql[kQuerySize];
    bool ok = std::strcmp(name, kAllLms) == 0
                  ? formatQuery(sql, sizeof sql,
                                "SELECT NODE,NODETYPE FROM O4SRV.TNODELST WHERE NODELIST = \"%s\" OR NODELIST = \"*HUB\"",
                                kAllLms)
                  : formatQuery(sql, sizeof sql, "SELECT NODE,NODETYPE FROM O4SRV.TNODELST WHERE NODELIST = \"%s\"", name);
    if (!ok) {
        RAS1_EXIT(ras);
        return nullptr;
    }
    auto* node = new Node(name);
    LinkedList* rows = runAuxQuery(sql, RESULTS_NODES, node->thrunodeBuffer(), WSQL_NODE_NAME_MAX);
    if (rows == nullptr) {
        delete node;
        RAS1_EXIT(ras);
        return nullptr;
    }
    if (node->getThrunode()[0] == '\0') node->setThrunode(node->getName());
    if (rows->NumEntries() > 0) {
        // Members already cached are replaced by the cached node; the others
        // join the cache. The list is complete before the node is shared.
        auto* members = new LinkedList(nullptr);
        for (void* v = rows->RemoveFirst(); v != nullptr; v = rows->RemoveFirst()) {
            auto* m = static_cast<Node*>(v);
            Node* cached = findCachedNode(m->getName());
            if (cached != nullptr) {
                delete m;
                m = cached;
            } else {
                if (m->getThrunode()[0] == '\0') m->setThrunode(m->getName());
                if (nodes->AppendEntry(m) != 0) {
                    delete m;
                    continue;
                }
            }
            (void)members->AppendEntry(m);
        }
        node->addNodeList(members);
    }
    delete rows;
    if (nodes->AppendEntry(node) != 0) {
        delete node;
        node = nullptr;
    }
    RAS1_EXIT(ras);
    return node;
}

int WSQL_Hub::refreshCachedNodeStatus(const char* nodeList) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    Node* list = lookupCachedNode(nodeList);
    int rc = 0;
    if (list != nullptr) {
        BSS1_GetLock(&cacheLock);
        rc = refreshLocked(list);
        BSS1_ReleaseLock(&cacheLock);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_Hub::prepareNodeStatusQuery() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (nodeStatusQuery != nullptr && (nodeStatusStale.exchange(false) ||
                                       nodeStatusQuery->CurrentState() != DS_SQLRequest::SQL_CREATED)) {
        delete nodeStatusQuery;
        nodeStatusQuery = nullptr;
    }
    if (nodeStatusQuery != nullptr) return 0;
    nodeStatusStale.store(false);
    static const char kSql[] = "SELECT O4ONLINE,ORIGINNODE,PRODUCT FROM O4SRV.INODESTS WHERE PRODUCT = ? OR  PRODUCT = ?;";
    auto* q = new DS_SQLSelect(this, kSql);
    q->useGlobalPath();
    int rc = q->login(0);
    if (rc == 0) rc = q->create(0, nullptr);
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to Create NodeStatus query %s %s. status %d", alias, lmsName, rc);
        delete q;
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to locate NodeStatus query %s %s. status %d", alias, lmsName, rc);
        return WSQL_NOTFOUND;
    }
    (void)ras;
    nodeStatusQuery = q;
    return 0;
}

int WSQL_Hub::refreshLocked(Node* list) {
    int ras = RAS1_Sync(RAS1_THIS);
    time_t now = BSS1_Time();
    if (now <= list->getRefreshTime() + WSQL_NODE_REFRESH_SECONDS) return 0;
    list->setRefreshTime(now);
    int rc = prepareNodeStatusQuery();
    if (rc != 0) return rc;
    cacheQueries.fetch_add(1);
    DS_SQLSelect* q = nodeStatusQuery;
    if (q->setInputValue(0, "EM", -1) != 0 || q->setInputValue(1, "SM", -1) != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "NodeStatus query Set Input Error. %d node %s", -1, list->getName());
        return 1;
    }
    rc = q->open();
    if (rc != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "NodeStatus query Open Error. %d node %s", rc, list->getName());
        return rc;
    }
    LinkedList* members = list->getNodeList();
    while ((rc = q->fetch()) == 0) {
        SQL1_Sqlda* out = q->getOutputSQLDA();
        if (out == nullptr || out->used < 3) {
            rc = WSQL_NOTFOUND;
            break;
        }
        const SQL1_SqlVar& onl = out->var[0];
        const SQL1_SqlVar& origin = out->var[1];
        if (origin.length >= 33) {
            rc = WSQL_NOTFOUND;
            RAS1_TRACE_IF(ras, RAS1_DETAIL, "NodeStatus Node Name incorrect length=%d s/b 32. status=%d", origin.length, rc);
            RAS1_Printf(RAS1_THIS, __LINE__, "NodeStatus query SQLDA error. %d", rc);
            break;
        }
        char name[WSQL_NODE_NAME_MAX + 1];
        copyTrimmed(name, WSQL_NODE_NAME_MAX, origin.data, origin.length);
        Node* member = findNode(members, name);
        if (member == nullptr) continue;
        char flag = onl.length > 0 && onl.data != nullptr ? onl.data[0] : ' ';
        if (member->getApplList() == nullptr && flag == 'Y') {
            cacheQueries.fetch_add(1);
            int st = member->getNodeAppls(this);
            if (st != 0) RAS1_Printf(RAS1_THIS, __LINE__, "Application query error. %d at %.32s", st, member->getName());
        }
        member->setOnline(flag);
        member->setRefreshTime(now);
        RAS1_TRACE_IF(ras, RAS1_DETAIL, "Node %s Online=%.1s", member->getName(), &flag);
    }
    if (rc == WSQL_ENDOFDATA) rc = 0;
    (void)q->close();
    return rc;
}
