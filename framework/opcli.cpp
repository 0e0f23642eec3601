// opcli: the command-line framework.
//
//   opcli login --server URL --user USER [--password PASS]
//   opcli logout
//   opcli createsit (-i FILE | -s NAME -b BASE [-p NAME=VALUE ...])
//   opcli help [COMMAND]
//
// Exit status: 0 when the command succeeded, 1 otherwise.
//
// Where things are found at run time:
//   session       $OPCLI_HOME/session (default ~/.opcli/session)
//   command module $OPCLI_MODULE_PATH (a ':'-list of folders, or the path of
//                 the library itself), else ../lib beside the opcli binary,
//                 else the binary's own folder, else the loader's search path
//   message files $OPCLI_MSGDIR, else ../share/createsit beside the binary,
//                 else the binary's own folder
//   trace         $RAS1_LOG, else $OPCLI_HOME/trace.log (levels: $RAS1_TRACE)
#include <dlfcn.h>
#include <langinfo.h>
#include <sys/stat.h>
#include <unicode/ucnv.h>
#include <unistd.h>

#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "bss1/bss1.h"
#include "kuimsg.h"
#include "kuisupport.h"
#include "opclictx.h"
#include "ras1/ras1.h"

RAS1_UNIT("opcli");

namespace {

const char kModuleFile[] = "libcreatesit.so";
const char kMessageFile[] = "kuicreatesitErr.xml";
// The gateway takes user ids and passwords of at most 16 characters.
constexpr size_t kMaxCredential = 16;

// The command entry of a command module.
using CommandEntry = int (*)(int argc, char** argv, char* msgBuf, char** respSlot, int, void*, char* done, void*,
                             void* serverCtx);

std::string binaryDir() {
    char path[4096];
    ssize_t n = readlink("/proc/self/exe", path, sizeof path - 1);
    if (n <= 0) return ".";
    path[n] = '\0';
    std::string p(path);
    size_t slash = p.rfind('/');
    return slash == std::string::npos ? "." : p.substr(0, slash);
}

bool readable(const std::string& path) { return access(path.c_str(), R_OK) == 0; }

std::string messageDir() {
    const char* env = BSS1_GetEnv("OPCLI_MSGDIR", nullptr);
    if (env) return env;
    std::string bin = binaryDir();
    std::string share = bin + "/../share/createsit";
    if (readable(share + "/" + kMessageFile)) return share;
    return bin;
}

std::vector<std::string> moduleCandidates() {
    std::vector<std::string> out;
    const char* env = BSS1_GetEnv("OPCLI_MODULE_PATH", nullptr);
    if (env) {
        std::string list(env);
        size_t pos = 0;
        while (pos <= list.size()) {
            size_t colon = list.find(':', pos);
            std::string item = list.substr(pos, colon == std::string::npos ? std::string::npos : colon - pos);
            if (!item.empty()) {
                bool isLibrary = item.size() > 3 && item.compare(item.size() - 3, 3, ".so") == 0;
                out.push_back(isLibrary ? item : item + "/" + kModuleFile);
            }
            if (colon == std::string::npos) break;
            pos = colon + 1;
        }
    }
    std::string bin = binaryDir();
    out.push_back(bin + "/../lib/" + kModuleFile);
    out.push_back(bin + "/" + kModuleFile);
    out.push_back(kModuleFile);  // the loader's own search path
    return out;
}

// The process's code page is what the command converts its arguments from.
// Under the plain C locale that is ASCII, which would turn every non-ASCII
// byte of a name into a substitute; such a process is taken to speak UTF-8.
void setUpCodePage() {
    setlocale(LC_ALL, "");
    const char* cs = nl_langinfo(CODESET);
    if (!cs || strcmp(cs, "ANSI_X3.4-1968") == 0 || strcasecmp(cs, "US-ASCII") == 0 || strcasecmp(cs, "ASCII") == 0)
        ucnv_setDefaultName("UTF-8");
}

// Trace lines are diagnostics, not output: unless RAS1_LOG names a file they
// go to trace.log in the session folder (when it can be made), so that the
// terminal shows only the command's own messages.
void setUpTrace() {
    if (BSS1_GetEnv("RAS1_LOG", nullptr)) return;
    std::string dir = OPCLI_SessionDir();
    struct stat st;
    if (stat(dir.c_str(), &st) != 0 && mkdir(dir.c_str(), 0700) != 0) return;
    RAS1_Configure(nullptr, (dir + "/trace.log").c_str());
}

// --- help texts

const char kUsage[] =
    "usage: opcli COMMAND [ARGUMENTS]\n"
    "commands:\n"
    "  login      log in to a hub monitoring server and keep the session\n"
    "  logout     forget the session\n"
    "  createsit  create a situation on the hub monitoring server\n"
    "  help       explain a command: opcli help COMMAND\n";

const char kLoginHelp[] =
    "opcli login --server URL --user USER [--password PASS]\n"
    "  Logs in to the hub monitoring server whose SOAP service answers at URL\n"
    "  (e.g. http://127.0.0.1:15200/). When the server can be reached the login\n"
    "  is checked with a harmless query; a refused login is not kept. Without\n"
    "  --password the password is read from the first line of standard input.\n"
    "  The session is kept in $OPCLI_HOME/session (default ~/.opcli/session),\n"
    "  mode 0600; the password is stored sealed with a key kept beside it\n"
    "  (session.key, mode 0600), never in clear text.\n";

const char kLogoutHelp[] =
    "opcli logout\n"
    "  Removes the session kept by opcli login.\n";

const char kCreatesitHelp[] =
    "opcli createsit -i FILE\n"
    "opcli createsit -s NAME -b BASE [-p NAME=VALUE ...]\n"
    "  Creates a situation on the hub monitoring server you are logged in to.\n"
    "\n"
    "  -i, --import FILE       create the situation a situation export file\n"
    "                          describes (cannot be combined with -s, -b, -p)\n"
    "  -s, --situation NAME    name of the new situation; a name of more than 31\n"
    "                          characters or with characters outside Latin-1 is\n"
    "                          a long name, kept beside a generated short name\n"
    "                          (servers of version 06.21 and later)\n"
    "  -b, --basedon BASE      existing situation to copy (required with -s)\n"
    "  -p, --property, --properties NAME=VALUE ...\n"
    "                          properties that replace the base's values; -p\n"
    "                          must be the last option (at most 7 pairs):\n"
    "      DESC, DESCRIPTION   description\n"
    "      INTERVAL            sampling interval DDD/HHMMSS, e.g. 000/001500\n"
    "      FORMULA             predicate formula (not empty)\n"
    "      DISTRIBUTION        comma list of managed systems and lists; a blank\n"
    "                          value distributes the situation nowhere\n"
    "      ADVICE              expert advice\n"
    "      ACTION              action command (empty: none)\n"
    "      RUNONSTART          YES or NO\n"
    "      SITINFO             KEY=VALUE items separated by ';': SEV (Fatal,\n"
    "                          Critical, Minor, Warning, Harmless, Informational,\n"
    "                          Unknown), TFWD (Y or N), TDST (event destination\n"
    "                          ids), ATOM (attribute name), COUNT (positive)\n"
    "\n"
    "  Options are recognised in any letter case. The result is one message;\n"
    "  the exit status is 0 when the situation was created, 1 otherwise.\n";

const char kHelpHelp[] =
    "opcli help [COMMAND]\n"
    "  Lists the commands, or explains one of them.\n";

// --- commands

int runLogin(int argc, char** argv);
int runLogout(int argc, char** argv);
int runCreatesit(int argc, char** argv);
int runHelp(int argc, char** argv);

struct Command {
    const char* name;
    int (*run)(int argc, char** argv);  // argv[0] is "opcli", argv[1] the command
    const char* help;
};

const Command kCommands[] = {
    {"login", runLogin, kLoginHelp},
    {"logout", runLogout, kLogoutHelp},
    {"createsit", runCreatesit, kCreatesitHelp},
    {"help", runHelp, kHelpHelp},
};

const Command* findCommand(const char* name) {
    for (const Command& c : kCommands)
        if (strcmp(c.name, name) == 0) return &c;
    return nullptr;
}

int runHelp(int argc, char** argv) {
    if (argc < 3) {
        fputs(kUsage, stdout);
        return 0;
    }
    const Command* c = findCommand(argv[2]);
    if (!c) {
        fprintf(stderr, "opcli: no command named %s\n%s", argv[2], kUsage);
        return 1;
    }
    fputs(c->help, stdout);
    return 0;
}

// Asks the server for its hub node; 0 with *hub, 4 unreachable, 7 refused.
int verifyLogin(OPCLI_Context* ctx, std::string* hub) {
    std::vector<char> buf(KUI_MSGBUF_SIZE, '\0');
    snprintf(buf.data(), buf.size(), "<![CDATA[SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = \"HUBNODE\"]]>");
    char* reply = nullptr;
    int rc = issueSoapRequest(ctx, buf.data(), 0, &reply, nullptr);
    if (rc != KUI_OK || !reply) return KUI_COMM;
    if (!strstr(reply, "</TABLE>")) rc = KUI_SERVER;
    char** values = nullptr;
    int count = 0;
    if (rc == KUI_OK && parseSoapResponseIntoArray(reply, &count, 1, &values) == 0 && count > 0) *hub = values[0];
    releaseSoapResponseArray(values, count);
    free(reply);
    return rc;
}

int runLogin(int argc, char** argv) {
    OPCLI_Session s;
    bool havePassword = false;
    struct Flag {
        const char* name;
        std::string* value;
    } flags[] = {{"--server", &s.server}, {"--user", &s.user}, {"--password", &s.password}};
    for (int i = 2; i < argc; i++) {
        bool known = false;
        for (Flag& f : flags) {
            size_t n = strlen(f.name);
            if (strcmp(argv[i], f.name) == 0 && i + 1 < argc) *f.value = argv[++i];
            else if (strncmp(argv[i], f.name, n) == 0 && argv[i][n] == '=') *f.value = argv[i] + n + 1;
            else continue;
            known = true;
            if (f.value == &s.password) havePassword = true;
        }
        if (!known) {
            fprintf(stderr, "opcli login: unexpected argument %s\n%s", argv[i], kLoginHelp);
            return 1;
        }
    }
    if (!havePassword && !std::getline(std::cin, s.password)) s.password.clear();
    if (!s.password.empty() && s.password.back() == '\r') s.password.pop_back();
    if (s.server.compare(0, 7, "http://") != 0 && s.server.compare(0, 8, "https://") != 0) {
        fprintf(stderr, "opcli login: --server must be an http:// or https:// URL\n");
        return 1;
    }
    if (s.user.empty() || s.user.size() > kMaxCredential || s.password.size() > kMaxCredential) {
        fprintf(stderr, "opcli login: the user (not empty) and the password may have at most %zu characters\n",
                kMaxCredential);
        return 1;
    }
    OPCLI_Context ctx;
    ctx.useSession(s);
    int rc = verifyLogin(&ctx, &s.hub);
    if (rc == KUI_SERVER) {
        fprintf(stderr, "opcli login: the server at %s refused the login of %s\n", s.server.c_str(), s.user.c_str());
        return 1;
    }
    if (rc == KUI_COMM)
        fprintf(stderr, "opcli login: the server at %s cannot be reached; the login is kept unchecked\n",
                s.server.c_str());
    if (OPCLI_SaveSession(s) != OPCLI_OK) {
        fprintf(stderr, "opcli login: the session cannot be saved in %s\n", OPCLI_SessionDir().c_str());
        return 1;
    }
    printf("Logged in to %s as %s.\n", s.hub.empty() ? s.server.c_str() : s.hub.c_str(), s.user.c_str());
    return 0;
}

int runLogout(int argc, char**) {
    if (argc > 2) {
        fprintf(stderr, "opcli logout takes no arguments\n");
        return 1;
    }
    int rc = OPCLI_RemoveSession();
    if (rc == OPCLI_FAULT) {
        fprintf(stderr, "opcli logout: the session in %s cannot be removed\n", OPCLI_SessionDir().c_str());
        return 1;
    }
    printf(rc == OPCLI_OK ? "Logged out.\n" : "No session to remove.\n");
    return 0;
}

// Loads the command module and finds `symbol` in it. The module stays loaded
// until the process ends: opcli runs one command, and the libraries under
// the module keep process-wide caches that must stay reachable.
CommandEntry loadCommand(const char* symbol) {
    std::string errors;
    for (const std::string& path : moduleCandidates()) {
        bool bare = path.find('/') == std::string::npos;
        if (!bare && !readable(path)) continue;
        void* handle = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
        if (handle) {
            void* sym = dlsym(handle, symbol);
            if (sym) return reinterpret_cast<CommandEntry>(sym);
            errors += path + ": no entry " + symbol + "\n";
            dlclose(handle);
        } else {
            const char* e = dlerror();
            errors += std::string(e ? e : path.c_str()) + "\n";
        }
    }
    fprintf(stderr, "opcli: the command module %s cannot be loaded\n%s", kModuleFile, errors.c_str());
    return nullptr;
}

int runCreatesit(int argc, char** argv) {
    OPCLI_Context ctx;
    ctx.messageDir = messageDir();
    OPCLI_Session s;
    int src = OPCLI_LoadSession(&s);
    if (src == OPCLI_OK) ctx.useSession(s);
    else if (src != OPCLI_NOTFOUND)
        fprintf(stderr, "opcli: the session in %s is not usable; log in again\n", OPCLI_SessionDir().c_str());
    OPCLI_Context::setActive(&ctx);

    CommandEntry entry = loadCommand("createsit");
    if (!entry) return 1;

    // The command may trim its arguments in place: it gets copies.
    std::vector<std::unique_ptr<char[]>> owned;
    std::vector<char*> args;
    for (int i = 0; i < argc; i++) {
        const char* a = i == 0 ? "opcli" : argv[i];
        size_t n = strlen(a) + 1;
        owned.emplace_back(new char[n]);
        memcpy(owned.back().get(), a, n);
        args.push_back(owned.back().get());
    }
    args.push_back(nullptr);
    std::vector<char> msg(KUI_MSGBUF_SIZE, '\0');
    char* slot = nullptr;
    char done = 'N';
    int rc = entry(argc, args.data(), msg.data(), &slot, 0, nullptr, &done, nullptr, &ctx);
    msg.back() = '\0';
    if (done != 'Y') fprintf(stderr, "opcli: createsit did not complete\n");

    KUI_MessageFile messages;
    if (messages.load(KUI_MessagePath(ctx.messageDir, kMessageFile)) != 0)
        fprintf(stderr, "opcli: the message file %s cannot be read; the result is shown coded\n", kMessageFile);
    std::string line;
    char severity = messages.render(msg.data(), ctx.hub.empty() ? ctx.serverUrl : ctx.hub, &line);
    fputs(line.c_str(), severity == 'I' ? stdout : stderr);
    OPCLI_Context::setActive(nullptr);
    return (rc == 0 && done == 'Y') ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    setUpCodePage();
    setUpTrace();
    if (argc < 2) {
        fputs(kUsage, stderr);
        return 1;
    }
    const Command* c = findCommand(argv[1]);
    if (!c) {
        fprintf(stderr, "opcli: no command named %s\n%s", argv[1], kUsage);
        return 1;
    }
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_TRACE_IF(ras, RAS1_STATE, "opcli %s", argv[1]);
    return c->run(argc, argv);
}
