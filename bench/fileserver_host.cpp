// A minimal host for the file-server benchmark: serves one directory through
// the HTTP service layer and the gateway's file server until SIGTERM/SIGINT.
//   fileserver_host --dir DIR [--port N] [--threads N] [--workers N]
//   (port 0: any free port; threads and workers 0: the layer's defaults)
// Prints "PORT <n>" once listening.
#include <signal.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <thread>

#include "kdh1/kdh1.h"
#include "kshdhtp.h"
#include "kshfile.h"

namespace {

int fileService(KDH1_request_struct* r) {
    WSQL_KDHServer server(r);
    return WSQL_FileServer::serveFile(&server, "soap");
}

}  // namespace

int main(int argc, char** argv) {
    const char* dir = nullptr;
    int port = 0;
    KDH1_limits_struct limits{};
    for (int i = 1; i + 1 < argc; i += 2) {
        if (strcmp(argv[i], "--dir") == 0) dir = argv[i + 1];
        else if (strcmp(argv[i], "--port") == 0) port = atoi(argv[i + 1]);
        else if (strcmp(argv[i], "--threads") == 0) limits.networkThreads = (unsigned)atoi(argv[i + 1]);
        else if (strcmp(argv[i], "--workers") == 0) limits.maxWorkers = (unsigned)atoi(argv[i + 1]);
    }
    if (!dir) {
        fprintf(stderr, "usage: fileserver_host --dir DIR [--port N]\n");
        return 2;
    }
    setenv("KSH_DIRECTORY", dir, 1);
    sigset_t stop;
    sigemptyset(&stop);
    sigaddset(&stop, SIGTERM);
    sigaddset(&stop, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stop, nullptr);  // threads started below inherit the mask

    KDH1_SetListenAddress("127.0.0.1", port);
    KDH1_SetLimits(&limits);
    KDH1_server_t server = 0;
    if (KDH1_New(&server, "soap", fileService, nullptr, 0, 0) != 0) return 1;
    uint32_t rc = 0;
    std::thread listener([&] { rc = KDH1_Listen(server, 0); });
    for (int i = 0; i < 1000 && KDH1_BoundPort() == 0 && rc == 0; i++)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    if (KDH1_BoundPort() == 0) {
        KDH1_Delete(server);
        listener.join();
        fprintf(stderr, "fileserver_host: cannot listen (status %x)\n", rc);
        return 1;
    }
    printf("PORT %d\n", KDH1_BoundPort());
    fflush(stdout);
    int sig = 0;
    sigwait(&stop, &sig);
    KDH1_Delete(server);
    listener.join();
    return 0;
}
