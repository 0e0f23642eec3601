// bss1: thin, checked wrappers over POSIX and the C library.
#include "bss1/bss1.h"

#include <sys/utsname.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

int BSS1_InitializeLock(BSS1_Lock* lock) {
    pthread_mutexattr_t attr;
    int rc = pthread_mutexattr_init(&attr);
    if (rc != 0) return rc;
    pthread_mutexattr_settype(&attr, PTHREAD_MUTEX_RECURSIVE);
    rc = pthread_mutex_init(&lock->mutex, &attr);
    pthread_mutexattr_destroy(&attr);
    return rc;
}

void BSS1_GetLock(BSS1_Lock* lock) { pthread_mutex_lock(&lock->mutex); }
void BSS1_ReleaseLock(BSS1_Lock* lock) { pthread_mutex_unlock(&lock->mutex); }
void BSS1_DestroyLock(BSS1_Lock* lock) { pthread_mutex_destroy(&lock->mutex); }

const char* BSS1_GetEnv(const char* name, const char* dflt) {
    const char* v = name ? getenv(name) : nullptr;
    return (v && *v) ? v : dflt;
}

void BSS1_InitializeOnce(BSS1_Once* once, void (*init)(void*), void* arg) {
    if (BSS1_OnceDone(once)) return;
    std::call_once(once->flag, [&] {
        init(arg);
        once->done.store(true, std::memory_order_release);
    });
}

namespace {
time_t systemClock() { return time(nullptr); }
std::atomic<BSS1_Clock> currentClock{&systemClock};
}  // namespace

time_t BSS1_Time() { return currentClock.load(std::memory_order_acquire)(); }

BSS1_Clock BSS1_SetClock(BSS1_Clock clock) {
    BSS1_Clock prev = currentClock.exchange(clock ? clock : &systemClock);
    return prev == &systemClock ? nullptr : prev;
}

long long BSS1_MonotonicMillis() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return (long long)ts.tv_sec * 1000 + ts.tv_nsec / 1000000;
}

void BSS1_LocalTime(time_t t, struct tm* out) { localtime_r(&t, out); }

void BSS1_Sleep(unsigned millis) {
    struct timespec ts{(time_t)(millis / 1000), (long)(millis % 1000) * 1000000L};
    while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
}

namespace {
// Copies at most size-1 bytes of src and terminates dst; a longer name is cut.
template <size_t N>
void copyField(char (&dst)[N], const char* src) {
    size_t n = strnlen(src, N - 1);
    memcpy(dst, src, n);
    dst[n] = '\0';
}
}  // namespace

int BSS1_Info(BSS1_HostInfo* info) {
    memset(info, 0, sizeof *info);
    struct utsname u;
    if (uname(&u) != 0) return 8;
    copyField(info->hostName, u.nodename);
    copyField(info->systemName, u.sysname);
    copyField(info->release, u.release);
    copyField(info->machine, u.machine);
    long cpus = sysconf(_SC_NPROCESSORS_ONLN);
    info->cpuCount = cpus > 0 ? (int)cpus : 1;
    info->processId = (long)getpid();
    return 0;
}
