// A small HTTP/1.1 responder on loopback for the support library's tests: it
// answers each POST with what the test's handler returns, keeps connections
// alive, and records the bodies it received and the connections it accepted.
#pragma once

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

struct StubReply {
    int status = 200;
    std::string body;
    int delayMs = 0;  // wait before answering
};

class HttpStub {
public:
    using Handler = std::function<StubReply(const std::string& body)>;

    explicit HttpStub(Handler h) : handler(std::move(h)) {
        listener = socket(AF_INET, SOCK_STREAM, 0);
        int one = 1;
        setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
        sockaddr_in a{};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        a.sin_port = 0;
        bind(listener, reinterpret_cast<sockaddr*>(&a), sizeof a);
        listen(listener, 8);
        socklen_t len = sizeof a;
        getsockname(listener, reinterpret_cast<sockaddr*>(&a), &len);
        port = ntohs(a.sin_port);
        worker = std::thread([this] { serve(); });
    }
    ~HttpStub() {
        stopping = true;
        worker.join();
        close(listener);
    }
    HttpStub(const HttpStub&) = delete;
    HttpStub& operator=(const HttpStub&) = delete;

    std::string url() const { return "http://127.0.0.1:" + std::to_string(port) + "/"; }
    std::vector<std::string> bodies() {
        std::lock_guard<std::mutex> g(mutex);
        return received;
    }
    int connections() const { return accepted.load(); }

private:
    // Bounded wait for readability, so that the worker notices `stopping`.
    bool readable(int fd) {
        pollfd p{fd, POLLIN, 0};
        return poll(&p, 1, 50) > 0;
    }

    void serve() {
        std::vector<int> open;
        std::vector<std::string> pending;
        while (!stopping) {
            if (readable(listener)) {
                int c = accept(listener, nullptr, nullptr);
                if (c >= 0) {
                    accepted++;
                    open.push_back(c);
                    pending.emplace_back();
                }
            }
            for (size_t i = 0; i < open.size(); i++) {
                if (open[i] < 0 || !readable(open[i])) continue;
                char chunk[65536];
                ssize_t n = read(open[i], chunk, sizeof chunk);
                if (n <= 0) {
                    close(open[i]);
                    open[i] = -1;
                    continue;
                }
                pending[i].append(chunk, (size_t)n);
                answerComplete(open[i], pending[i]);
            }
        }
        for (int c : open)
            if (c >= 0) close(c);
    }

    // Answers every complete request at the front of `data`.
    void answerComplete(int fd, std::string& data) {
        for (;;) {
            size_t end = data.find("\r\n\r\n");
            if (end == std::string::npos) return;
            size_t length = 0;
            size_t cl = data.find("Content-Length:");
            if (cl != std::string::npos && cl < end) length = std::stoul(data.substr(cl + 15));
            if (data.size() < end + 4 + length) return;
            std::string body = data.substr(end + 4, length);
            data.erase(0, end + 4 + length);
            {
                std::lock_guard<std::mutex> g(mutex);
                received.push_back(body);
            }
            StubReply r = handler(body);
            if (r.delayMs) std::this_thread::sleep_for(std::chrono::milliseconds(r.delayMs));
            std::string out = "HTTP/1.1 " + std::to_string(r.status) + " X\r\nContent-Type: text/xml\r\nContent-Length: " +
                              std::to_string(r.body.size()) + "\r\n\r\n" + r.body;
            if (write(fd, out.data(), out.size()) < 0) return;
        }
    }

    Handler handler;
    int listener = -1;
    int port = 0;
    std::atomic<bool> stopping{false};
    std::atomic<int> accepted{0};
    std::mutex mutex;
    std::vector<std::string> received;
    std::thread worker;
};

// A reply body in the gateway's shape: a TABLE with one ROW per entry, each
// ROW holding its (column, value) elements.
inline std::string stubTable(const std::vector<std::vector<std::pair<std::string, std::string>>>& rows) {
    std::string r =
        "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"> <SOAP-ENV:Body>"
        "<SOAP-CHK:Success xmlns:SOAP-CHK = \"urn:test\" xmlns=\"urn:test-attributes\"><TABLE name=\"T\">\n<OBJECT>T"
        "</OBJECT>\n";
    if (!rows.empty()) r += "<DATA>\n";
    for (const auto& row : rows) {
        r += "<ROW>\n";
        for (const auto& [c, v] : row) r += "<" + c + ">" + v + "</" + c + ">\n";
        r += "</ROW>\n";
    }
    if (!rows.empty()) r += "</DATA>";
    return r + "\n</TABLE>\n</SOAP-CHK:Success></SOAP-ENV:Body></SOAP-ENV:Envelope>";
}

inline std::string stubFault() {
    return "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"><SOAP-ENV:Body>"
           "<SOAP-ENV:Fault>\n<faultcode>SOAP-ENV:Client</faultcode>\n<faultstring>no</faultstring></SOAP-ENV:Fault>"
           "</SOAP-ENV:Body></SOAP-ENV:Envelope>";
}
