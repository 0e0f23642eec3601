// A reference host for the gateway load benchmark: one HTTP service of the
// HTTP service layer that reads each request's body and answers with the
// same fixed 200-byte SOAP document, until SIGTERM or SIGINT.
//   kdh1_fixed_host [--port N]     (port 0: any free port)
// Prints "PORT <n>" once listening.
#include <signal.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "kdh1/kdh1.h"
#include "ras1/ras1.h"

RAS1_UNIT("kdh1_fixed_host");

namespace {

// Exactly 200 bytes: an envelope with one row, the size of a small reply.
std::string fixedBody() {
    std::string b =
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?><SOAP-ENV:Envelope xmlns:SOAP-ENV="
        "\"http://schemas.xmlsoap.org/soap/envelope/\"><SOAP-ENV:Body><ROW><V>";
    const std::string tail = "</V></ROW></SOAP-ENV:Body></SOAP-ENV:Envelope>";
    b.append(200 - b.size() - tail.size(), 'x');
    return b + tail;
}
const std::string kBody = fixedBody();

int fixedService(KDH1_request_struct* r) {
    uint32_t type = 0, length = 0;
    if (KDH1_OpenEntity(r->handle, &type, &length) == KDH1_STC_OK) {
        char buffer[8192];
        for (uint32_t got = 0; got < length;) {
            uint32_t n = sizeof buffer;
            if (KDH1_Get(r->handle, buffer, &n) != KDH1_STC_OK || n == 0) break;
            got += n;
        }
    }
    KDH1_Response(r->handle, KDH1_STC_OK, 0, nullptr);
    KDH1_CreateEntity(r->handle, KDH1_MEDIA_XML, kBody.size());
    return static_cast<int>(KDH1_Put(r->handle, kBody.data(), kBody.size()));
}

}  // namespace

int main(int argc, char** argv) {
    int port = 0;
    for (int i = 1; i + 1 < argc; i += 2)
        if (std::strcmp(argv[i], "--port") == 0) port = std::atoi(argv[i + 1]);
    if (kBody.size() != 200) return 1;
    sigset_t stop;
    sigemptyset(&stop);
    sigaddset(&stop, SIGTERM);
    sigaddset(&stop, SIGINT);
    sigprocmask(SIG_BLOCK, &stop, nullptr);  // threads started below inherit the mask

    KDH1_SetListenAddress("127.0.0.1", port);
    KDH1_server_t server = 0;
    if (KDH1_New(&server, "soap", fixedService, nullptr, 0, 0) != 0) return 1;
    uint32_t rc = 0;
    std::thread listener([&] { rc = KDH1_Listen(server, 0); });
    for (int i = 0; i < 1000 && KDH1_BoundPort() == 0; i++) std::this_thread::sleep_for(std::chrono::milliseconds(10));
    if (KDH1_BoundPort() == 0) {
        KDH1_Delete(server);
        listener.join();
        std::fprintf(stderr, "kdh1_fixed_host: cannot listen (status %x)\n", rc);
        return 1;
    }
    std::printf("PORT %d\n", KDH1_BoundPort());
    std::fflush(stdout);
    int sig = 0;
    sigwait(&stop, &sig);
    if (RAS1_Sync(RAS1_THIS) & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "signal %d, stopping", sig);
    KDH1_Delete(server);
    listener.join();
    return 0;
}
