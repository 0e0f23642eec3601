// Support of the end-to-end tests (see e2efix.h).
#include "e2efix.h"

#include <curl/curl.h>
#include <fcntl.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <regex>
#include <sstream>
#include <stdexcept>
#include <thread>

extern char** environ;

namespace e2e {

namespace {

std::string envOr(const char* name, const char* dflt) {
    const char* v = std::getenv(name);
    return v != nullptr && *v != '\0' ? v : dflt;
}

// fork + exec of `argv` with `extraEnv` added to this process's environment,
// standard output and error into the given files.
pid_t spawn(const std::vector<std::string>& argv, const std::vector<std::string>& extraEnv, const fs::path& outFile,
            const fs::path& errFile) {
    std::vector<std::string> env;
    for (char** e = environ; *e != nullptr; ++e) env.emplace_back(*e);
    for (const std::string& x : extraEnv) env.push_back(x);
    std::vector<char*> cargv, cenv;
    for (const std::string& a : argv) cargv.push_back(const_cast<char*>(a.c_str()));
    cargv.push_back(nullptr);
    for (const std::string& e : env) cenv.push_back(const_cast<char*>(e.c_str()));
    cenv.push_back(nullptr);
    pid_t pid = fork();
    if (pid == 0) {
        int out = ::open(outFile.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        int err = ::open(errFile.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        int in = ::open("/dev/null", O_RDONLY);
        if (out < 0 || err < 0 || in < 0) _exit(127);
        dup2(in, 0);
        dup2(out, 1);
        dup2(err, 2);
        execve(cargv[0], cargv.data(), cenv.data());
        _exit(127);
    }
    return pid;
}

// Waits for `pid` at most `limitMillis`; the wait status, or -1 when it is
// still running.
int waitFor(pid_t pid, long limitMillis) {
    auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(limitMillis);
    for (;;) {
        int status = 0;
        pid_t r = waitpid(pid, &status, WNOHANG);
        if (r == pid) return status;
        if (std::chrono::steady_clock::now() > end) return -1;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
}

int exitCode(int waitStatus) { return waitStatus >= 0 && WIFEXITED(waitStatus) ? WEXITSTATUS(waitStatus) : -1; }

// Every child gets the fast password hash and a trace file of its own.
std::vector<std::string> childEnv(const fs::path& dir) {
    return {"SQL1_PWHASH=min", "RAS1_LOG=" + (dir / "trace.log").string()};
}

struct CurlInit {
    CurlInit() { curl_global_init(CURL_GLOBAL_ALL); }
    ~CurlInit() { curl_global_cleanup(); }
};

size_t collect(char* data, size_t size, size_t n, void* out) {
    static_cast<std::string*>(out)->append(data, size * n);
    return size * n;
}

}  // namespace

std::string sourceDir() { return envOr("CSIT_SOURCE_DIR", "."); }

TempDir::TempDir() {
    char tmpl[] = "/tmp/csit-e2e.XXXXXX";
    if (mkdtemp(tmpl) == nullptr) throw std::runtime_error("mkdtemp");
    dir = tmpl;
}

TempDir::~TempDir() {
    std::error_code ec;
    fs::remove_all(dir, ec);
}

std::string readFile(const fs::path& p) {
    std::ifstream in(p, std::ios::binary);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
}

void writeFile(const fs::path& p, const std::string& text) {
    std::ofstream out(p, std::ios::binary);
    out << text;
}

Vemsd::Vemsd(fs::path home, std::vector<std::string> args, bool withPassword)
    : homeDir(std::move(home)), extra(std::move(args)), password(withPassword) {}

Vemsd::~Vemsd() {
    if (pid > 0) {
        kill(pid, SIGKILL);
        waitFor(pid, 10000);
    }
}

std::string Vemsd::output() const { return readFile(homeDir.parent_path() / (homeDir.filename().string() + ".out")); }

bool Vemsd::start() {
    fs::path out = homeDir.parent_path() / (homeDir.filename().string() + ".out");
    fs::remove(out);
    std::vector<std::string> argv = {envOr("VEMSD", "vemsd"), "--home", homeDir.string(), "--port", "0"};
    if (password) argv.insert(argv.end(), {"--admin-password", kAdminPassword});
    argv.insert(argv.end(), extra.begin(), extra.end());
    pid = spawn(argv, childEnv(homeDir.parent_path()), out, out);
    if (pid <= 0) return false;
    static const std::regex listening("listening on http://[0-9.]+:([0-9]+)/");
    auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (std::chrono::steady_clock::now() < end) {
        std::smatch m;
        std::string text = readFile(out);
        if (std::regex_search(text, m, listening)) {
            listenPort = std::stoi(m[1]);
            return true;
        }
        int status = 0;
        if (waitpid(pid, &status, WNOHANG) == pid) {
            pid = -1;
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return false;
}

int Vemsd::stop(int limitSeconds) {
    if (pid <= 0) return -1;
    kill(pid, SIGTERM);
    int status = waitFor(pid, limitSeconds * 1000L);
    if (status < 0) {
        kill(pid, SIGKILL);
        waitFor(pid, 10000);
    }
    pid = -1;
    return exitCode(status);
}

Outcome opcli(const fs::path& opcliHome, const std::vector<std::string>& args) {
    Outcome r;
    fs::create_directories(opcliHome);
    static int counter = 0;
    fs::path out = opcliHome / ("out" + std::to_string(++counter));
    fs::path err = opcliHome / ("err" + std::to_string(counter));
    std::vector<std::string> argv = {envOr("OPCLI", "opcli")};
    argv.insert(argv.end(), args.begin(), args.end());
    std::vector<std::string> env = childEnv(opcliHome);
    env.push_back("OPCLI_HOME=" + opcliHome.string());
    env.push_back("OPCLI_CONNECT_TIMEOUT_MS=2000");
    env.push_back("OPCLI_TIMEOUT_MS=30000");
    pid_t pid = spawn(argv, env, out, err);
    r.status = pid > 0 ? exitCode(waitFor(pid, 120000)) : -1;
    r.out = readFile(out);
    r.err = readFile(err);
    return r;
}

Reply http(const std::string& method, const std::string& url, const std::string& body) {
    static CurlInit init;
    Reply r;
    CURL* c = curl_easy_init();
    curl_easy_setopt(c, CURLOPT_URL, url.c_str());
    curl_easy_setopt(c, CURLOPT_CUSTOMREQUEST, method.c_str());
    curl_easy_setopt(c, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(c, CURLOPT_CONNECTTIMEOUT, 5L);
    curl_easy_setopt(c, CURLOPT_TIMEOUT, 60L);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, &r.body);
    struct curl_slist* headers = nullptr;
    if (method == "POST") {
        headers = curl_slist_append(headers, "Content-Type: text/xml; charset=utf-8");
        curl_easy_setopt(c, CURLOPT_HTTPHEADER, headers);
        curl_easy_setopt(c, CURLOPT_POSTFIELDS, body.c_str());
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
    }
    r.transferOk = curl_easy_perform(c) == CURLE_OK;
    if (r.transferOk) curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, &r.status);
    curl_slist_free_all(headers);
    curl_easy_cleanup(c);
    return r;
}

std::string soap(const std::string& methodXml) {
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>"
           "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\">"
           "<SOAP-ENV:Body>" +
           methodXml + "</SOAP-ENV:Body></SOAP-ENV:Envelope>";
}

std::string ctSql(const std::string& table, const std::string& sql) {
    return soap(std::string("<CT_SQL><userid>sysadmin</userid><password>") + kAdminPassword + "</password><table>" +
                table + "</table><sql><![CDATA[" + sql + "]]></sql></CT_SQL>");
}

std::vector<std::string> query(const fs::path& path, const std::string& sql) {
    std::vector<std::string> rows;
    sqlite3* db = nullptr;
    if (sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READONLY, nullptr) != SQLITE_OK) {
        sqlite3_close(db);
        return rows;
    }
    sqlite3_busy_timeout(db, 5000);
    sqlite3_stmt* st = nullptr;
    if (sqlite3_prepare_v2(db, sql.c_str(), -1, &st, nullptr) == SQLITE_OK) {
        while (sqlite3_step(st) == SQLITE_ROW) {
            std::string row;
            for (int i = 0; i < sqlite3_column_count(st); ++i) {
                if (i > 0) row += '|';
                const unsigned char* t = sqlite3_column_text(st, i);
                row += t != nullptr ? reinterpret_cast<const char*>(t) : "NULL";
            }
            rows.push_back(row);
        }
    }
    sqlite3_finalize(st);
    sqlite3_close(db);
    return rows;
}

bool execute(const fs::path& path, const std::string& sql) {
    sqlite3* db = nullptr;
    bool ok = sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READWRITE, nullptr) == SQLITE_OK &&
              sqlite3_busy_timeout(db, 5000) == SQLITE_OK &&
              sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK;
    sqlite3_close(db);
    return ok;
}

std::string scalar(const fs::path& path, const std::string& sql) {
    std::vector<std::string> rows = query(path, sql);
    return rows.empty() ? "" : rows[0];
}

}  // namespace e2e
