// vemshome: vemsd's home folder, its environment and its secrets (see
// vemsd.h).
#include <fcntl.h>
#include <sys/random.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <system_error>

#include "ras1/ras1.h"
#include "vemsd.h"

RAS1_UNIT("vemshome");

namespace fs = std::filesystem;

#ifndef CSIT_DATA_DIR
#define CSIT_DATA_DIR "data"
#endif

namespace {

// What a home is made of: a folder of data/ copied (only the files with
// the given extension; empty: all) into a folder of the home, or one file.
struct HomePart {
    const char* from;       // below data/
    const char* to;         // below the home
    const char* extension;  // for folders
    bool folder;
};
const HomePart kParts[] = {
    {"HTML", "HTML", "", true},
    {"attrlib", "attrlib", ".atr", true},
    {"affinity", "affinity", ".tbl", true},
    {"kshxhubs.xml", "HTML/kshxhubs.xml", "", false},
    {"servers.conf", "servers.conf", "", false},
};

// Copies `from` to `to` unless `to` exists. False (with *error) on failure.
bool copyMissing(const fs::path& from, const fs::path& to, std::string* error) {
    std::error_code ec;
    if (fs::exists(to, ec)) return true;
    fs::create_directories(to.parent_path(), ec);
    if (!ec) fs::copy_file(from, to, fs::copy_options::skip_existing, ec);
    if (ec) {
        *error = "cannot copy " + from.string() + " to " + to.string() + ": " + ec.message();
        return false;
    }
    return true;
}

bool copyFolder(const fs::path& from, const fs::path& to, const char* extension, std::string* error) {
    std::error_code ec;
    fs::create_directories(to, ec);
    if (ec) {
        *error = "cannot create " + to.string() + ": " + ec.message();
        return false;
    }
    for (const fs::directory_entry& e : fs::directory_iterator(from, ec)) {
        if (!e.is_regular_file()) continue;
        if (*extension != '\0' && e.path().extension() != extension) continue;
        if (!copyMissing(e.path(), to / e.path().filename(), error)) return false;
    }
    if (ec) {
        *error = "cannot read " + from.string() + ": " + ec.message();
        return false;
    }
    return true;
}

}  // namespace

std::string vemsdDataDir() { return std::getenv("VEMSD_DATA_DIR") ? std::getenv("VEMSD_DATA_DIR") : CSIT_DATA_DIR; }

int vemsdPrepareHome(const std::string& home, const std::string& dataDir, std::string* error) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    std::error_code ec;
    fs::create_directories(home, ec);
    if (ec) {
        *error = "cannot create " + home + ": " + ec.message();
        return VEMSD_EXIT_FAILED;
    }
    const fs::path data(dataDir);
    for (const HomePart& p : kParts) {
        bool ok = p.folder ? copyFolder(data / p.from, fs::path(home) / p.to, p.extension, error)
                           : copyMissing(data / p.from, fs::path(home) / p.to, error);
        if (!ok) {
            RAS1_Printf(RAS1_THIS, __LINE__, "%s", error->c_str());
            return VEMSD_EXIT_FAILED;
        }
    }
    RAS1_EXIT_RC(ras, 0);
    return 0;
}

void vemsdSetEnvironment(const std::string& home) {
    const fs::path h = fs::absolute(home);
    setenv("KSH_DIRECTORY", (h / "HTML").c_str(), 0);
    setenv("CT_ATTRLIB", (h / "attrlib").c_str(), 0);
}

std::string vemsdRandomPassword() {
    static const char kAlphabet[] = "ABCDEFGHJKLMNPQRSTUVWXYZabcdefghijkmnopqrstuvwxyz23456789";
    const size_t n = sizeof kAlphabet - 1;  // 57 characters
    std::string out;
    while (out.size() < 16) {
        unsigned char bytes[32];
        if (getrandom(bytes, sizeof bytes, 0) != static_cast<ssize_t>(sizeof bytes)) return "";
        // Rejection sampling keeps every character equally likely.
        for (unsigned char b : bytes)
            if (b < 256 / n * n && out.size() < 16) out += kAlphabet[b % n];
    }
    return out;
}

int vemsdWriteSecret(const std::string& path, const std::string& password) {
    int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
    if (fd < 0) return errno;
    std::string text = password + "\n";
    int rc = ::write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) ? 0 : (errno ? errno : EIO);
    if (::close(fd) != 0 && rc == 0) rc = errno;
    if (rc != 0) ::unlink(path.c_str());
    return rc;
}
