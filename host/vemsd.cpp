// vemsd: the gateway's host process (see vemsd.h).
//
// Signals: SIGTERM, SIGINT and SIGUSR1 are blocked before any thread exists,
// so every thread inherits the mask and the main thread alone takes them
// with sigtimedwait; no work is done in a signal handler. The gateway thread
// raises SIGUSR1 when kshstart returns, so the main thread also learns of a
// gateway that ended by itself.
#include "vemsd.h"

#include <signal.h>
#include <strings.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>

#include "bss1/bss1.h"
#include "kdh1/kdh1.h"
#include "kshanchor.h"
#include "kshstrt.h"
#include "ras1/ras1.h"
#include "sql1/sql1.h"

RAS1_UNIT("vemsd");

namespace fs = std::filesystem;

namespace {

// How long vemsd waits for the listener after starting the gateway.
constexpr int kListenWaitMillis = 20000;

// The host side of the anchor's calls. Set before the gateway starts and
// read-only afterwards.
struct HostState {
    WSQL_LocalServer local{};
    bool validate = true;
};
HostState gHost;

int serverInformation(void** /*hostField*/, WSQL_LocalServer** localServer) {
    *localServer = &gHost.local;
    return 0;
}

int configurationCompare(const char* name, const char* value) {
    if (name == nullptr || value == nullptr || strcasecmp(name, "VALIDATE") != 0) return 1;
    return strcasecmp(value, gHost.validate ? "YES" : "NO") == 0 ? 0 : 1;
}

// "VV.RR" -> VVRR.
int versionNumber(const char* v) { return (v[0] - '0') * 1000 + (v[1] - '0') * 100 + (v[3] - '0') * 10 + (v[4] - '0'); }

void describeLocalServer(const SQL1_StoreInfo& info, bool validate) {
    WSQL_LocalServer& l = gHost.local;
    std::snprintf(l.alias, sizeof l.alias, "%s", info.hubNode);
    l.aliasLength = static_cast<int32_t>(std::strlen(l.alias));
    std::snprintf(l.lmsName, sizeof l.lmsName, "%s", info.hubNode);
    l.version = std::strlen(info.version) == 5 ? versionNumber(info.version) : 0;
    l.build = info.build;
    l.options = info.nls ? WSQL_LOCAL_NLS : 0u;
    l.hubNodeRef = 0;
    l.numNames = 0;
    l.names = nullptr;
    gHost.validate = validate;
}

// Creates or opens the store, registers it as the local server and fills
// the local server record. 0 or 1 (reported).
int prepareStore(const VemsdOptions& o, const std::string& storePath) {
    const bool fresh = !fs::exists(storePath);
    std::string password = o.adminPassword;
    const std::string secretPath = (fs::path(o.home) / "initial-admin-password").string();
    if (fresh && password.empty()) {
        password = vemsdRandomPassword();
        if (password.empty()) {
            std::fprintf(stderr, "vemsd: no randomness for the administrator's password\n");
            return VEMSD_EXIT_FAILED;
        }
    }
    const std::string dataDir = (fs::path(vemsdDataDir()) / "store").string();
    SQL1_StoreOptions opts;
    opts.serverVersion = o.serverVersion.c_str();
    opts.validate = o.validate ? 1 : 0;
    opts.dataDir = dataDir.c_str();
    opts.adminUser = o.admin.c_str();
    opts.adminPassword = password.empty() ? nullptr : password.c_str();
    opts.local = 1;
    int rc = SQL1_CreateStore(storePath.c_str(), &opts);
    SQL1_StoreInfo info{};
    if (rc == SQL1_OK) rc = SQL1_GetStoreInfo(storePath.c_str(), &info);
    if (rc == SQL1_OK) rc = SQL1_RegisterServer(info.hubNode, storePath.c_str(), &opts);
    if (rc != SQL1_OK) {
        std::fprintf(stderr, "vemsd: the hub store %s cannot be used (status %d): %s\n", storePath.c_str(), rc,
                     SQL1_LastError());
        return VEMSD_EXIT_FAILED;
    }
    if (fresh && o.adminPassword.empty()) {
        int err = vemsdWriteSecret(secretPath, password);
        if (err != 0) {
            std::fprintf(stderr, "vemsd: cannot write %s: %s\n", secretPath.c_str(), std::strerror(err));
            return VEMSD_EXIT_FAILED;
        }
        std::printf("vemsd: new hub store; administrator %s, password %s (also in %s)\n", o.admin.c_str(),
                    password.c_str(), secretPath.c_str());
    }
    describeLocalServer(info, o.validate);
    std::printf("vemsd: hub %s, store %s, server version %s, user validation %s\n", info.hubNode, storePath.c_str(),
                info.version, o.validate ? "on" : "off");
    return 0;
}

void gatewayThread(void* anchor) {
    (void)kshstart(static_cast<WSQL_Anchor*>(anchor));
    // Tell the main thread that the gateway has ended.
    (void)kill(getpid(), SIGUSR1);
}

// Waits for one of the blocked signals for at most `millis`; the signal, or
// 0 after the time.
int waitSignal(const sigset_t& set, long millis) {
    struct timespec limit = {millis / 1000, (millis % 1000) * 1000000L};
    siginfo_t info;
    int sig = sigtimedwait(&set, &info, &limit);
    return sig > 0 ? sig : 0;
}

// Waits until the listener is up and says where. A signal that comes first
// is returned (0 once listening).
int awaitListener(const sigset_t& set, const VemsdOptions& o) {
    for (long waited = 0; waited < kListenWaitMillis; waited += 20) {
        if (int port = KDH1_BoundPort()) {
            std::printf("vemsd: listening on http://%s:%d/\n", o.listen.c_str(), port);
            std::fflush(stdout);
            return 0;
        }
        if (int sig = waitSignal(set, 20)) return sig;
    }
    std::fprintf(stderr, "vemsd: the gateway is not listening yet on %s:%d\n", o.listen.c_str(), o.port);
    return 0;
}

// The gateway keeps files of its own in the current folder (the export
// snapshot files): run in the home, so that two servers on one machine never
// share them. Relative folder settings are made absolute first.
int enterHome(const std::string& home) {
    for (const char* name : {"KSH_DIRECTORY", "CT_ATTRLIB", "ATTRLIB", "AFF1_TABLE", "RAS1_LOG"}) {
        const char* v = getenv(name);
        if (v && *v && *v != '/') setenv(name, fs::absolute(v).c_str(), 1);
    }
    if (chdir(fs::absolute(home).c_str()) != 0) {
        std::fprintf(stderr, "vemsd: cannot enter %s: %s\n", home.c_str(), std::strerror(errno));
        return VEMSD_EXIT_FAILED;
    }
    return 0;
}

int run(const VemsdOptions& o) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    std::string error;
    if (vemsdPrepareHome(o.home, vemsdDataDir(), &error) != 0) {
        std::fprintf(stderr, "vemsd: %s\n", error.c_str());
        return VEMSD_EXIT_FAILED;
    }
    vemsdSetEnvironment(o.home);
    SQL1_SetHome(fs::absolute(o.home).c_str());
    const std::string storePath = fs::absolute(o.store.empty() ? fs::path(o.home) / "hub.db" : fs::path(o.store));
    if (prepareStore(o, storePath) != 0) return VEMSD_EXIT_FAILED;
    if (enterHome(o.home) != 0) return VEMSD_EXIT_FAILED;
    if (KDH1_SetListenAddress(o.listen.c_str(), o.port) != KDH1_STC_OK) {
        std::fprintf(stderr, "vemsd: cannot listen on %s:%d\n", o.listen.c_str(), o.port);
        return VEMSD_EXIT_FAILED;
    }

    sigset_t set;
    sigemptyset(&set);
    for (int s : {SIGTERM, SIGINT, SIGUSR1}) sigaddset(&set, s);
    sigprocmask(SIG_BLOCK, &set, nullptr);

    WSQL_Anchor anchor;
    anchor.parmPresent = 1;
    anchor.startParm = "START";
    anchor.serverInfo = serverInformation;
    anchor.configCompare = configurationCompare;
    BSS1_Thread* thread = nullptr;
    int rc = BSS1_CreateThread(&thread, 0, gatewayThread, &anchor);
    if (rc != 0) {
        std::fprintf(stderr, "vemsd: cannot start the gateway thread: %s\n", std::strerror(rc));
        return VEMSD_EXIT_FAILED;
    }
    int sig = awaitListener(set, o);
    while (sig == 0) sig = waitSignal(set, 60000);
    int status = VEMSD_EXIT_OK;
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "signal %d", sig);
    if (sig == SIGUSR1) {
        std::fprintf(stderr, "vemsd: the gateway ended by itself\n");
        status = VEMSD_EXIT_FAILED;
    } else {
        std::printf("vemsd: %s, stopping\n", sig == SIGTERM ? "SIGTERM" : "SIGINT");
        std::fflush(stdout);
        (void)kshstop(&anchor);
    }
    (void)BSS1_JoinThread(thread);
    SQL1_Shutdown();
    std::printf("vemsd: stopped\n");
    RAS1_EXIT_RC(ras, status);
    return status;
}

}  // namespace

int main(int argc, char** argv) {
    VemsdOptions options;
    std::string error;
    if (vemsdParseOptions(argc, argv, &options, &error) != 0) {
        std::fprintf(stderr, "vemsd: %s\n%s", error.c_str(), vemsdUsage());
        return VEMSD_EXIT_USAGE;
    }
    if (options.help) {
        std::fputs(vemsdUsage(), stdout);
        return VEMSD_EXIT_OK;
    }
    setvbuf(stdout, nullptr, _IOLBF, 0);
    return run(options);
}
