// Small servers on loopback for the tests of the SOAP client, the mail
// layer and the requests built on them: an HTTP/1.1 server with canned
// answers and an SMTP server that keeps the messages it receives. Each
// listens on a port of its own, chosen by the system.
#pragma once

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace loopback {

// Answers every request with the configured status and body, keeping
// connections open (HTTP/1.1), and records what it received.
class MiniHttp {
public:
    explicit MiniHttp(bool silent = false) : silent(silent) {
        fd = socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in a{};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        int one = 1;
        setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
        bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a);
        listen(fd, 8);
        socklen_t n = sizeof a;
        getsockname(fd, reinterpret_cast<sockaddr*>(&a), &n);
        port = ntohs(a.sin_port);
        acceptor = std::thread([this] { acceptLoop(); });
    }
    ~MiniHttp() {
        stopping = true;
        shutdown(fd, SHUT_RDWR);
        close(fd);
        acceptor.join();
        std::lock_guard<std::mutex> g(mu);
        for (int c : conns) shutdown(c, SHUT_RDWR);
        for (auto& t : workers) t.join();
        for (int c : conns) close(c);
    }

    std::string url(const std::string& path = "/soap") const {
        return "http://127.0.0.1:" + std::to_string(port) + path;
    }
    std::vector<std::string> requests() {
        std::lock_guard<std::mutex> g(mu);
        return received;
    }
    int connections() {
        std::lock_guard<std::mutex> g(mu);
        return static_cast<int>(conns.size());
    }

    int status = 200;
    std::string body = "<answer/>";

private:
    void acceptLoop() {
        while (!stopping) {
            int c = accept(fd, nullptr, nullptr);
            if (c < 0) return;
            std::lock_guard<std::mutex> g(mu);
            conns.push_back(c);
            workers.emplace_back([this, c] { serve(c); });
        }
    }
    void serve(int c) {
        std::string in;
        char buf[4096];
        for (;;) {
            size_t end = in.find("\r\n\r\n");
            if (end != std::string::npos) {
                size_t cl = 0;
                size_t at = in.find("Content-Length: ");
                if (at != std::string::npos && at < end) cl = std::strtoul(in.c_str() + at + 16, nullptr, 10);
                if (in.size() >= end + 4 + cl) {
                    {
                        std::lock_guard<std::mutex> g(mu);
                        received.push_back(in.substr(0, end + 4 + cl));
                    }
                    in.erase(0, end + 4 + cl);
                    if (silent) continue;
                    std::string out = "HTTP/1.1 " + std::to_string(status) + " X\r\nContent-Type: text/xml\r\n" +
                                      "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
                    if (write(c, out.data(), out.size()) < 0) return;
                    continue;
                }
            }
            ssize_t n = read(c, buf, sizeof buf);
            if (n <= 0) return;
            in.append(buf, static_cast<size_t>(n));
        }
    }

    bool silent;
    int fd = -1;
    int port = 0;
    std::atomic<bool> stopping{false};
    std::thread acceptor;
    std::mutex mu;
    std::vector<int> conns;
    std::vector<std::thread> workers;
    std::vector<std::string> received;
};

// A one-message-at-a-time SMTP server: records the envelope and the data,
// refuses receivers that begin with "nobody".
class MiniSmtp {
public:
    MiniSmtp() {
        fd = socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in a{};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a);
        listen(fd, 4);
        socklen_t n = sizeof a;
        getsockname(fd, reinterpret_cast<sockaddr*>(&a), &n);
        port = ntohs(a.sin_port);
        worker = std::thread([this] { run(); });
    }
    ~MiniSmtp() {
        shutdown(fd, SHUT_RDWR);
        close(fd);
        worker.join();
    }
    std::string address() const { return "127.0.0.1:" + std::to_string(port); }

    std::mutex mu;
    std::string from;
    std::vector<std::string> to;
    std::string data;
    int messages = 0;

private:
    void run() {
        for (;;) {
            int c = accept(fd, nullptr, nullptr);
            if (c < 0) return;
            session(c);
            close(c);
        }
    }
    void say(int c, const std::string& line) { (void)!write(c, (line + "\r\n").data(), line.size() + 2); }
    bool readLine(int c, std::string& buf, std::string* line) {
        for (;;) {
            size_t e = buf.find("\r\n");
            if (e != std::string::npos) {
                *line = buf.substr(0, e);
                buf.erase(0, e + 2);
                return true;
            }
            char tmp[4096];
            ssize_t n = read(c, tmp, sizeof tmp);
            if (n <= 0) return false;
            buf.append(tmp, static_cast<size_t>(n));
        }
    }
    void session(int c) {
        std::string buf, line;
        say(c, "220 mini ready");
        while (readLine(c, buf, &line)) {
            std::string verb = line.substr(0, 4);
            if (verb == "EHLO" || verb == "HELO") {
                say(c, "250 mini");
            } else if (verb == "MAIL") {
                std::lock_guard<std::mutex> g(mu);
                from = line.substr(10);
                to.clear();
                say(c, "250 ok");
            } else if (verb == "RCPT") {
                std::string r = line.substr(8);
                if (r.rfind("<nobody", 0) == 0) {
                    say(c, "550 no such user");
                    continue;
                }
                std::lock_guard<std::mutex> g(mu);
                to.push_back(r);
                say(c, "250 ok");
            } else if (verb == "DATA") {
                say(c, "354 go on");
                std::string d;
                while (readLine(c, buf, &line) && line != ".") d += line + "\n";
                std::lock_guard<std::mutex> g(mu);
                data = d;
                messages++;
                say(c, "250 queued");
            } else if (verb == "QUIT") {
                say(c, "221 bye");
                return;
            } else {
                say(c, "250 ok");
            }
        }
    }
    int fd = -1;
    int port = 0;
    std::thread worker;
};

// Decodes base64 text, skipping line breaks and other characters.
inline std::string unbase64(const std::string& in) {
    std::string out;
    unsigned v = 0;
    int bits = 0;
    for (char ch : in) {
        const char* k = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
        const char* p = ch ? std::strchr(k, ch) : nullptr;
        if (p == nullptr) continue;
        v = (v << 6) | static_cast<unsigned>(p - k);
        bits += 6;
        if (bits >= 8) {
            bits -= 8;
            out += static_cast<char>((v >> bits) & 0xFF);
        }
    }
    return out;
}

// The base64 body of the MIME part whose headers hold `marker`.
inline std::string partBody(const std::string& message, const std::string& marker) {
    size_t at = message.find(marker);
    if (at == std::string::npos) return "";
    size_t start = message.find("\n\n", at);
    size_t end = message.find("\n--", start);
    return start == std::string::npos ? "" : message.substr(start + 2, end - start - 2);
}

}  // namespace loopback
