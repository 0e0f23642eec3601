// Support of the end-to-end tests: the real vemsd started on a free loopback
// port with a home of its own, the real opcli run with a home of its own,
// HTTP requests with libcurl, and a look into a hub store with SQLite.
//
// The programs come from the environment CTest sets: VEMSD and OPCLI (the
// binaries), CSIT_SOURCE_DIR (the source tree, for data/).
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>
#include <vector>

namespace e2e {

namespace fs = std::filesystem;

std::string sourceDir();

// A temporary folder, removed with everything in it at the end.
class TempDir {
public:
    TempDir();
    ~TempDir();
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    const fs::path& path() const { return dir; }

private:
    fs::path dir;
};

std::string readFile(const fs::path& p);
void writeFile(const fs::path& p, const std::string& text);

// The administrator's password of every store the tests create.
constexpr const char* kAdminPassword = "e2e-Secret1";

// One vemsd process.
class Vemsd {
public:
    // `args` follow the defaults --home HOME --port 0 and, with
    // `withPassword`, --admin-password kAdminPassword.
    explicit Vemsd(fs::path home, std::vector<std::string> args = {}, bool withPassword = true);
    // Kills the process when a test left it running.
    ~Vemsd();
    Vemsd(const Vemsd&) = delete;
    Vemsd& operator=(const Vemsd&) = delete;

    // Starts it and waits until it says it is listening. False when it
    // ended or did not listen in time.
    bool start();
    // SIGTERM, then waits for the end (at most `limitSeconds`). The exit
    // status, or -1 when it did not end (it is killed then) or died of a
    // signal.
    int stop(int limitSeconds = 60);
    bool running() const { return pid > 0; }
    int port() const { return listenPort; }
    std::string url() const { return "http://127.0.0.1:" + std::to_string(listenPort) + "/"; }
    const fs::path& home() const { return homeDir; }
    fs::path store() const { return homeDir / "hub.db"; }
    std::string output() const;

private:
    fs::path homeDir;
    std::vector<std::string> extra;
    bool password;
    pid_t pid = -1;
    int listenPort = 0;
};

struct Outcome {
    int status = -1;  // exit status, -1 when it did not end normally
    std::string out;
    std::string err;
};

// Runs the real opcli with OPCLI_HOME = `opcliHome`.
Outcome opcli(const fs::path& opcliHome, const std::vector<std::string>& args);

struct Reply {
    long status = 0;  // HTTP status, 0 when the transfer failed
    std::string body;
    bool transferOk = false;
};
Reply http(const std::string& method, const std::string& url, const std::string& body = "");

// A SOAP envelope around `method` XML, and a CT_SQL request of the admin.
std::string soap(const std::string& methodXml);
std::string ctSql(const std::string& table, const std::string& sql);

// The rows of `sql` on the store at `path`, each row's columns joined with
// '|' (NULL as "NULL").
std::vector<std::string> query(const fs::path& path, const std::string& sql);
// Runs `sql` on the store at `path` (test set-up); true when it succeeded.
bool execute(const fs::path& path, const std::string& sql);
// The single value of `sql` (first column of the first row), "" when none.
std::string scalar(const fs::path& path, const std::string& sql);

}  // namespace e2e
