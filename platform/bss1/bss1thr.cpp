// bss1thr: threads with a chosen stack size (see bss1.h).
#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <new>

#include "bss1/bss1.h"

struct BSS1_Thread {
    pthread_t id;
    void (*body)(void*);
    void* arg;
    bool detached;  // the thread releases its record itself
};

namespace {
// A detached thread's record is freed by the thread; which of the two ends
// first is settled by an atomic exchange on `detached`.
void* threadMain(void* p) {
    auto* t = static_cast<BSS1_Thread*>(p);
    t->body(t->arg);
    if (__atomic_exchange_n(&t->detached, true, __ATOMIC_ACQ_REL)) delete t;
    return nullptr;
}
}  // namespace

size_t BSS1_MinThreadStack() {
    long v = sysconf(_SC_THREAD_STACK_MIN);
    return v > 0 ? static_cast<size_t>(v) : 0;
}

int BSS1_CreateThread(BSS1_Thread** thread, size_t stackSize, void (*body)(void*), void* arg) {
    if (thread == nullptr || body == nullptr) return EINVAL;
    *thread = nullptr;
    auto* t = new (std::nothrow) BSS1_Thread{};
    if (t == nullptr) return ENOMEM;
    t->body = body;
    t->arg = arg;
    pthread_attr_t attr;
    int rc = pthread_attr_init(&attr);
    if (rc == 0) {
        if (stackSize != 0) {
            size_t minimum = BSS1_MinThreadStack();
            rc = pthread_attr_setstacksize(&attr, stackSize < minimum ? minimum : stackSize);
        }
        if (rc == 0) rc = pthread_create(&t->id, &attr, threadMain, t);
        pthread_attr_destroy(&attr);
    }
    if (rc != 0) {
        delete t;
        return rc;
    }
    *thread = t;
    return 0;
}

int BSS1_JoinThread(BSS1_Thread* thread) {
    if (thread == nullptr) return EINVAL;
    int rc = pthread_join(thread->id, nullptr);
    delete thread;
    return rc;
}

int BSS1_DetachThread(BSS1_Thread* thread) {
    if (thread == nullptr) return EINVAL;
    int rc = pthread_detach(thread->id);
    if (rc != 0) return rc;
    // The thread may have ended already: then it left the record to us.
    if (__atomic_exchange_n(&thread->detached, true, __ATOMIC_ACQ_REL)) delete thread;
    return 0;
}
