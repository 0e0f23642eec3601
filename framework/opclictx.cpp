// opclictx: the server context and the sealed login session on disk.
#include "opclictx.h"

#include <curl/curl.h>
#include <fcntl.h>
#include <sodium.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <vector>

#include "bss1/bss1.h"
#include "ras1/ras1.h"

RAS1_UNIT("opclictx");

namespace {

std::atomic<OPCLI_Context*> activeContext{nullptr};
std::once_flag curlInit;

const char kSessionFile[] = "session";
const char kKeyFile[] = "session.key";
const char kSealPrefix[] = "v1:";

long envMillis(const char* name, long dflt) {
    const char* v = BSS1_GetEnv(name, nullptr);
    if (!v) return dflt;
    char* end = nullptr;
    long n = strtol(v, &end, 10);
    return (end && *end == '\0' && n > 0) ? n : dflt;
}

std::string toHex(const unsigned char* p, size_t n) {
    static const char digits[] = "0123456789abcdef";
    std::string s;
    s.reserve(n * 2);
    for (size_t i = 0; i < n; i++) {
        s.push_back(digits[p[i] >> 4]);
        s.push_back(digits[p[i] & 15]);
    }
    return s;
}

int nibble(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

bool fromHex(const std::string& s, std::vector<unsigned char>* out) {
    if (s.size() % 2) return false;
    out->clear();
    for (size_t i = 0; i < s.size(); i += 2) {
        int hi = nibble(s[i]), lo = nibble(s[i + 1]);
        if (hi < 0 || lo < 0) return false;
        out->push_back((unsigned char)(hi * 16 + lo));
    }
    return true;
}

// Reads the whole file at `path` into *out. 0, 5 when it does not exist, 8.
int readFile(const std::string& path, std::string* out) {
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return errno == ENOENT ? OPCLI_NOTFOUND : OPCLI_FAULT;
    out->clear();
    char chunk[4096];
    ssize_t n;
    while ((n = read(fd, chunk, sizeof chunk)) > 0) out->append(chunk, (size_t)n);
    close(fd);
    return n < 0 ? OPCLI_FAULT : OPCLI_OK;
}

// Writes `data` to `path` through a temporary file renamed over it, mode 0600.
int writeFileAtomically(const std::string& path, const std::string& data) {
    std::string tmp = path + ".tmp";
    unlink(tmp.c_str());
    int fd = open(tmp.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
    if (fd < 0) return OPCLI_FAULT;
    bool ok = fchmod(fd, 0600) == 0;
    size_t off = 0;
    while (ok && off < data.size()) {
        ssize_t n = write(fd, data.data() + off, data.size() - off);
        if (n <= 0) ok = false;
        else off += (size_t)n;
    }
    ok = ok && fsync(fd) == 0;
    ok = (close(fd) == 0) && ok;
    if (ok && rename(tmp.c_str(), path.c_str()) == 0) return OPCLI_OK;
    unlink(tmp.c_str());
    return OPCLI_FAULT;
}

int ensureDir(const std::string& dir) {
    struct stat st;
    if (stat(dir.c_str(), &st) == 0) return S_ISDIR(st.st_mode) ? OPCLI_OK : OPCLI_FAULT;
    return mkdir(dir.c_str(), 0700) == 0 ? OPCLI_OK : OPCLI_FAULT;
}

// Loads the secret key, creating it when `create` is set and it is missing.
// A key file that group or others may access is refused (6).
int loadKey(const std::string& dir, bool create, unsigned char key[crypto_secretbox_KEYBYTES]) {
    int ras = RAS1_Sync(RAS1_THIS);
    std::string path = dir + "/" + kKeyFile;
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0 && errno == ENOENT && create) {
        randombytes_buf(key, crypto_secretbox_KEYBYTES);
        fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
        if (fd < 0) return OPCLI_FAULT;
        bool ok = fchmod(fd, 0600) == 0 &&
                  write(fd, key, crypto_secretbox_KEYBYTES) == (ssize_t)crypto_secretbox_KEYBYTES;
        ok = (close(fd) == 0) && ok;
        if (!ok) unlink(path.c_str());
        return ok ? OPCLI_OK : OPCLI_FAULT;
    }
    if (fd < 0) return errno == ENOENT ? OPCLI_BADINPUT : OPCLI_FAULT;
    struct stat st;
    int rc = OPCLI_OK;
    if (fstat(fd, &st) != 0) rc = OPCLI_FAULT;
    else if (st.st_mode & 077) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Key file %s may be read by others (mode %o): refused", path.c_str(),
                    (unsigned)(st.st_mode & 0777));
        rc = OPCLI_BADINPUT;
    } else if (read(fd, key, crypto_secretbox_KEYBYTES) != (ssize_t)crypto_secretbox_KEYBYTES)
        rc = OPCLI_BADINPUT;
    close(fd);
    if (rc && (ras & RAS1_STATE)) RAS1_Printf(RAS1_THIS, __LINE__, "Key file %s not usable (%d)", path.c_str(), rc);
    return rc;
}

bool hasLineBreak(const std::string& s) { return s.find_first_of("\r\n") != std::string::npos; }

}  // namespace

std::string OPCLI_SessionDir() {
    const char* home = BSS1_GetEnv("OPCLI_HOME", nullptr);
    if (home) return home;
    return std::string(BSS1_GetEnv("HOME", ".")) + "/.opcli";
}

int OPCLI_SaveSession(const OPCLI_Session& s) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = OPCLI_OK;
    if (hasLineBreak(s.server) || hasLineBreak(s.user) || hasLineBreak(s.hub)) rc = OPCLI_BADINPUT;
    if (rc == OPCLI_OK && sodium_init() < 0) rc = OPCLI_FAULT;
    std::string dir = OPCLI_SessionDir();
    if (rc == OPCLI_OK) rc = ensureDir(dir);
    unsigned char key[crypto_secretbox_KEYBYTES];
    if (rc == OPCLI_OK) rc = loadKey(dir, true, key);
    if (rc == OPCLI_OK) {
        std::vector<unsigned char> sealed(crypto_secretbox_NONCEBYTES + crypto_secretbox_MACBYTES + s.password.size());
        randombytes_buf(sealed.data(), crypto_secretbox_NONCEBYTES);
        crypto_secretbox_easy(sealed.data() + crypto_secretbox_NONCEBYTES,
                              reinterpret_cast<const unsigned char*>(s.password.data()), s.password.size(),
                              sealed.data(), key);
        std::string text = "# opcli session: written by \"opcli login\", removed by \"opcli logout\"\n";
        text += "server=" + s.server + "\n";
        text += "user=" + s.user + "\n";
        text += "hub=" + s.hub + "\n";
        text += std::string("password=") + kSealPrefix + toHex(sealed.data(), sealed.size()) + "\n";
        rc = writeFileAtomically(dir + "/" + kSessionFile, text);
    }
    sodium_memzero(key, sizeof key);
    if (rc) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to save the session in %s (%d)", dir.c_str(), rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int OPCLI_LoadSession(OPCLI_Session* s) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    std::string dir = OPCLI_SessionDir();
    std::string text;
    int rc = readFile(dir + "/" + kSessionFile, &text);
    std::string sealedHex;
    *s = OPCLI_Session();
    size_t pos = 0;
    while (rc == OPCLI_OK && pos < text.size()) {
        size_t end = text.find('\n', pos);
        if (end == std::string::npos) end = text.size();
        std::string line = text.substr(pos, end - pos);
        pos = end + 1;
        if (line.empty() || line[0] == '#') continue;
        size_t eq = line.find('=');
        if (eq == std::string::npos) {
            rc = OPCLI_BADINPUT;
            break;
        }
        std::string k = line.substr(0, eq), v = line.substr(eq + 1);
        if (k == "server") s->server = v;
        else if (k == "user") s->user = v;
        else if (k == "hub") s->hub = v;
        else if (k == "password") sealedHex = v;
    }
    if (rc == OPCLI_OK && (s->server.empty() || sealedHex.compare(0, strlen(kSealPrefix), kSealPrefix) != 0))
        rc = OPCLI_BADINPUT;
    std::vector<unsigned char> sealed;
    if (rc == OPCLI_OK && (!fromHex(sealedHex.substr(strlen(kSealPrefix)), &sealed) ||
                           sealed.size() < crypto_secretbox_NONCEBYTES + crypto_secretbox_MACBYTES))
        rc = OPCLI_BADINPUT;
    if (rc == OPCLI_OK && sodium_init() < 0) rc = OPCLI_FAULT;
    unsigned char key[crypto_secretbox_KEYBYTES];
    if (rc == OPCLI_OK) rc = loadKey(dir, false, key);
    if (rc == OPCLI_OK) {
        size_t clearLen = sealed.size() - crypto_secretbox_NONCEBYTES - crypto_secretbox_MACBYTES;
        std::vector<unsigned char> clear(clearLen + 1);
        if (crypto_secretbox_open_easy(clear.data(), sealed.data() + crypto_secretbox_NONCEBYTES,
                                       sealed.size() - crypto_secretbox_NONCEBYTES, sealed.data(), key) != 0)
            rc = OPCLI_BADINPUT;
        else s->password.assign(reinterpret_cast<char*>(clear.data()), clearLen);
        sodium_memzero(clear.data(), clear.size());
        sodium_memzero(key, sizeof key);
    }
    if (rc != OPCLI_OK) *s = OPCLI_Session();
    if (rc != OPCLI_OK && rc != OPCLI_NOTFOUND) RAS1_Printf(RAS1_THIS, __LINE__, "Session in %s not usable (%d)", dir.c_str(), rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int OPCLI_RemoveSession() {
    std::string path = OPCLI_SessionDir() + "/" + kSessionFile;
    if (unlink(path.c_str()) == 0) return OPCLI_OK;
    return errno == ENOENT ? OPCLI_NOTFOUND : OPCLI_FAULT;
}

OPCLI_Context::OPCLI_Context() {
    connectTimeoutMs = envMillis("OPCLI_CONNECT_TIMEOUT_MS", connectTimeoutMs);
    totalTimeoutMs = envMillis("OPCLI_TIMEOUT_MS", totalTimeoutMs);
}

OPCLI_Context::~OPCLI_Context() {
    if (curl) curl_easy_cleanup(static_cast<CURL*>(curl));
    if (!password.empty()) sodium_memzero(&password[0], password.size());
    OPCLI_Context* self = this;
    activeContext.compare_exchange_strong(self, nullptr);
}

void OPCLI_Context::useSession(const OPCLI_Session& s) {
    serverUrl = s.server;
    user = s.user;
    password = s.password;
    hub = s.hub;
    loggedIn = true;
}

void* OPCLI_Context::httpHandle() {
    std::call_once(curlInit, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    if (!curl) curl = curl_easy_init();
    return curl;
}

OPCLI_Context* OPCLI_Context::active() { return activeContext.load(); }
void OPCLI_Context::setActive(OPCLI_Context* ctx) { activeContext.store(ctx); }
