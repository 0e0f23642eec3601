// kuiuuid: identifiers for generated short names.
//
// 16 base-36 digits (0-9, A-Z) encode 82 bits: the clock's seconds (32 bits),
// the process id (22 bits, the largest pid Linux hands out) and a counter
// (28 bits). The counter makes identifiers unique within a process, the pid
// among processes running at the same time; the counter starts at a random
// value so that a process that gets a recycled pid within the same second
// does not repeat its predecessor's identifiers.
#include <unistd.h>

#include <atomic>
#include <ctime>
#include <random>

#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuiuuid");

namespace {

unsigned initialCounter() {
    std::random_device rd;
    return rd() & 0x0FFFFFFFu;
}

std::atomic<unsigned> counter{initialCounter()};

}  // namespace

void getUUID(char* buf) {
    if (!buf) return;
    static const char digits[] = "0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZ";
    unsigned __int128 v = (unsigned __int128)((unsigned long long)time(nullptr) & 0xFFFFFFFFull) << 50;
    v |= (unsigned __int128)((unsigned long long)getpid() & 0x3FFFFFull) << 28;
    v |= (unsigned __int128)(counter.fetch_add(1) & 0x0FFFFFFFu);
    for (int i = 15; i >= 0; i--) {
        buf[i] = digits[(int)(v % 36)];
        v /= 36;
    }
    buf[16] = '\0';
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_TRACE_IF(ras, RAS1_DETAIL, "New identifier %s", buf);
}
