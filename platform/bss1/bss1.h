// bss1: base services of the platform: locks, environment, once-control,
// time (with a clock tests can replace), sleep and host information.
#pragma once

#include <pthread.h>

#include <atomic>
#include <cstddef>
#include <ctime>
#include <mutex>

// A mutual-exclusion lock. Recursive: a thread that holds it may take it again
// (a list's destroy callback may touch the list that called it).
struct BSS1_Lock {
    pthread_mutex_t mutex;
};

// Initialises `lock`; 0 on success, else the pthread error number.
int BSS1_InitializeLock(BSS1_Lock* lock);
void BSS1_GetLock(BSS1_Lock* lock);
void BSS1_ReleaseLock(BSS1_Lock* lock);
void BSS1_DestroyLock(BSS1_Lock* lock);

// The value of environment variable `name`, or `dflt` when it is unset or
// empty. The returned pointer stays valid until the variable is changed.
const char* BSS1_GetEnv(const char* name, const char* dflt);

// Once-control: BSS1_InitializeOnce runs `init(arg)` exactly once per control
// record, however many threads call it at the same time; later callers wait
// until the first run has returned.
struct BSS1_Once {
    std::once_flag flag;
    std::atomic<bool> done{false};
};
void BSS1_InitializeOnce(BSS1_Once* once, void (*init)(void*), void* arg);
// True once the initialisation of `once` has completed (one atomic load).
inline bool BSS1_OnceDone(const BSS1_Once* once) { return once->done.load(std::memory_order_acquire); }

// Time. Everything of the system that reads "now" goes through BSS1_Time, so
// that tests can freeze or step time with BSS1_SetClock instead of sleeping.
using BSS1_Clock = time_t (*)();
time_t BSS1_Time();
// Replaces the clock; null restores the system clock. Returns the previous one.
BSS1_Clock BSS1_SetClock(BSS1_Clock clock);
// Monotonic milliseconds, for time-outs (never replaced by the test clock).
long long BSS1_MonotonicMillis();
// Local broken-down time of `t` (reentrant).
void BSS1_LocalTime(time_t t, struct tm* out);

// Sleeps `millis` milliseconds.
void BSS1_Sleep(unsigned millis);

// Host information.
struct BSS1_HostInfo {
    char hostName[256];
    char systemName[64];
    char release[64];
    char machine[64];
    int cpuCount;
    long processId;
};
// Fills `info`; 0 on success, 8 when the system would not say.
int BSS1_Info(BSS1_HostInfo* info);

// Threads with a chosen stack size (the gateway sizes every thread it
// creates). A thread is released by joining it.
struct BSS1_Thread;
// Runs `body(arg)` on a new thread with `stackSize` bytes of stack (0: the
// system's default; a size below the system's minimum is raised to it).
// 0 with *thread set, or the pthread error number (*thread null).
int BSS1_CreateThread(BSS1_Thread** thread, size_t stackSize, void (*body)(void*), void* arg);
// Waits until the thread has ended and releases it. 0, or the error number.
int BSS1_JoinThread(BSS1_Thread* thread);
// Lets the thread run on by itself; it is released when it ends. 0, or the
// error number.
int BSS1_DetachThread(BSS1_Thread* thread);
// The system's minimum thread stack in bytes, 0 when it reports none.
size_t BSS1_MinThreadStack();
