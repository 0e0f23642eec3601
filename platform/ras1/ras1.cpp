// ras1: trace configuration, formatting and the one writer all threads share.
#include "ras1/ras1.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <mutex>
#include <string>

// Starts at 1 so that a unit's first RAS1_Sync (generation 0) reads the configuration.
std::atomic<unsigned> RAS1_generation{1};

namespace {

// The configuration and the output descriptor. Guarded by configMutex; the
// writer takes writeMutex only, so tracing never waits for a reconfiguration
// longer than one line.
std::mutex configMutex;
std::string traceConfig;   // GUARDED_BY(configMutex)
bool configured = false;  // GUARDED_BY(configMutex)
std::mutex writeMutex;
int logFd = 2;            // GUARDED_BY(writeMutex)

struct LevelName {
    const char* name;
    int bits;
};
const LevelName kLevels[] = {
    {"ERROR", RAS1_ERROR}, {"FLOW", RAS1_FLOW},     {"STATE", RAS1_STATE}, {"CATALOG", RAS1_CATALOG},
    {"DUMP", RAS1_DUMP},   {"DETAIL", RAS1_DETAIL}, {"ALL", RAS1_ALL},     {"NONE", 0},
};

// "STATE+ERROR" -> bits; -1 when a word is unknown.
int parseLevel(const std::string& text) {
    int bits = 0;
    size_t pos = 0;
    while (pos <= text.size()) {
        size_t plus = text.find('+', pos);
        std::string word = text.substr(pos, plus == std::string::npos ? std::string::npos : plus - pos);
        bool known = false;
        for (const LevelName& l : kLevels) {
            if (strcasecmp(word.c_str(), l.name) == 0) {
                bits |= l.bits;
                known = true;
            }
        }
        if (!known) return -1;
        if (plus == std::string::npos) break;
        pos = plus + 1;
    }
    return bits;
}

std::string trim(const std::string& s) {
    size_t b = 0, e = s.size();
    while (b < e && isspace((unsigned char)s[b])) b++;
    while (e > b && isspace((unsigned char)s[e - 1])) e--;
    return s.substr(b, e - b);
}

void openLog(const char* path) {
    std::lock_guard<std::mutex> g(writeMutex);
    if (logFd > 2) close(logFd);
    logFd = 2;
    if (path && *path) {
        int fd = open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
        if (fd >= 0) logFd = fd;
    }
}

void ensureConfigured() {
    std::lock_guard<std::mutex> g(configMutex);
    if (configured) return;
    const char* config = getenv("RAS1_TRACE");
    traceConfig = config ? config : "";
    openLog(getenv("RAS1_LOG"));
    configured = true;
}

void writeLine(const char* unit, int line, const char* text, size_t textLen) {
    struct timeval tv;
    gettimeofday(&tv, nullptr);
    struct tm tmv;
    localtime_r(&tv.tv_sec, &tmv);
    char head[128];
    int n = snprintf(head, sizeof head, "%04d-%02d-%02d %02d:%02d:%02d.%03d [%ld] %s:%d ", tmv.tm_year + 1900,
                     tmv.tm_mon + 1, tmv.tm_mday, tmv.tm_hour, tmv.tm_min, tmv.tm_sec, (int)(tv.tv_usec / 1000),
                     (long)syscall(SYS_gettid), unit, line);
    if (n < 0) return;
    if ((size_t)n >= sizeof head) n = sizeof head - 1;
    while (textLen > 0 && (text[textLen - 1] == '\n' || text[textLen - 1] == '\r')) textLen--;
    std::string rec;
    rec.reserve((size_t)n + textLen + 1);
    rec.append(head, (size_t)n).append(text, textLen).push_back('\n');
    std::lock_guard<std::mutex> g(writeMutex);
    size_t off = 0;
    while (off < rec.size()) {
        ssize_t w = write(logFd, rec.data() + off, rec.size() - off);
        if (w <= 0) break;
        off += (size_t)w;
    }
}

}  // namespace

int RAS1_LevelFor(const char* config, const char* unitName) {
    int level = RAS1_ERROR;
    size_t bestLen = 0;
    std::string all = config ? config : "";
    size_t pos = 0;
    while (pos <= all.size()) {
        size_t comma = all.find(',', pos);
        std::string item = trim(all.substr(pos, comma == std::string::npos ? std::string::npos : comma - pos));
        pos = comma == std::string::npos ? all.size() + 1 : comma + 1;
        if (item.empty()) continue;
        size_t colon = item.find(':');
        if (colon == std::string::npos) {
            int bits = parseLevel(item);
            if (bits >= 0 && bestLen == 0) level = bits;  // a unit item always wins
            continue;
        }
        std::string prefix = trim(item.substr(0, colon));
        int bits = parseLevel(trim(item.substr(colon + 1)));
        if (bits < 0 || prefix.empty()) continue;
        if (strncasecmp(unitName, prefix.c_str(), prefix.size()) == 0 && prefix.size() >= bestLen) {
            level = bits;
            bestLen = prefix.size();
        }
    }
    return level;
}

int RAS1_Refresh(RAS1_Unit& unit) {
    ensureConfigured();
    unsigned gen;
    int level;
    {
        std::lock_guard<std::mutex> g(configMutex);
        gen = RAS1_generation.load(std::memory_order_relaxed);
        level = RAS1_LevelFor(traceConfig.c_str(), unit.name);
    }
    unit.level.store(level, std::memory_order_relaxed);
    unit.generation.store(gen, std::memory_order_release);
    return level;
}

void RAS1_Configure(const char* config, const char* logPath) {
    std::lock_guard<std::mutex> g(configMutex);
    const char* s = config ? config : getenv("RAS1_TRACE");
    traceConfig = s ? s : "";
    openLog(logPath ? logPath : getenv("RAS1_LOG"));
    configured = true;
    RAS1_generation.fetch_add(1, std::memory_order_release);
}

void RAS1_VPrintf(RAS1_Unit& unit, int line, const char* fmt, va_list ap) {
    char small[1024];
    va_list copy;
    va_copy(copy, ap);
    int n = vsnprintf(small, sizeof small, fmt, copy);
    va_end(copy);
    if (n < 0) return;
    if ((size_t)n < sizeof small) {
        writeLine(unit.name, line, small, (size_t)n);
        return;
    }
    std::string big((size_t)n + 1, '\0');
    vsnprintf(big.data(), big.size(), fmt, ap);
    writeLine(unit.name, line, big.data(), (size_t)n);
}

void RAS1_Printf(RAS1_Unit& unit, int line, const char* fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    RAS1_VPrintf(unit, line, fmt, ap);
    va_end(ap);
}

void RAS1_Event(RAS1_Unit& unit, int line, const char* func, RAS1_EventKind kind, long result) {
    switch (kind) {
        case RAS1_EV_ENTRY: RAS1_Printf(unit, line, "Entry %s", func); break;
        case RAS1_EV_EXIT: RAS1_Printf(unit, line, "Exit %s", func); break;
        case RAS1_EV_EXIT_RC: RAS1_Printf(unit, line, "Exit %s, rc=%ld", func, result); break;
    }
}

void RAS1_Dump(RAS1_Unit& unit, int line, const void* data, size_t length) {
    const unsigned char* p = static_cast<const unsigned char*>(data);
    RAS1_Printf(unit, line, "Dump of %zu bytes at %p", length, data);
    for (size_t off = 0; p && off < length; off += 16) {
        char hex[16 * 3 + 1] = {0};
        char txt[17] = {0};
        size_t n = length - off < 16 ? length - off : 16;
        for (size_t i = 0; i < n; i++) {
            snprintf(hex + i * 3, sizeof hex - i * 3, "%02X ", p[off + i]);
            txt[i] = isprint(p[off + i]) ? (char)p[off + i] : '.';
        }
        RAS1_Printf(unit, line, "  %08zX  %-48s %s", off, hex, txt);
    }
}
