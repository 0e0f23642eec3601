// kshfile: the file server and WSQL_File (see kshfile.h).
#include "kshfile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>

#include "bss1/bss1.h"
#include "kdh1/kdh1.h"
#include "kshhttp.h"
#include "kshutil.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshfile");

namespace {

struct MimeEntry {
    const char* extension;
    uint32_t media;
};
// Searched in order; an entry matches an extension of the same length and
// characters.
const MimeEntry WSQL_mime_map[] = {
    {"htm", KDH1_MEDIA_HTML}, {"html", KDH1_MEDIA_HTML}, {"txt", KDH1_MEDIA_TEXT}, {"kpl", KDH1_MEDIA_TEXT},
    {"xml", KDH1_MEDIA_XML},  {"xsl", KDH1_MEDIA_XML},   {"xul", KDH1_MEDIA_XML},  {"wsdl", KDH1_MEDIA_XML},
    {"css", KDH1_MEDIA_CSS},  {"pdf", KDH1_MEDIA_PDF},
};

constexpr uint32_t kNoMemoryStatus = 0x5C4C8002u;
constexpr const char kDefaultFile[] = "/kshhsoap.htm";
constexpr const char kHubFile[] = "kshxhubs.xml";

// HTTP dates are English whatever the process locale.
const char kDays[7][4] = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
const char kMonths[12][4] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun", "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};

// "%a, %d %b %Y %H:%M:%S GMT" of `t`.
void httpDate(time_t t, char* out, size_t size) {
    struct tm tm;
    gmtime_r(&t, &tm);
    snprintf(out, size, "%s, %02d %s %04d %02d:%02d:%02d GMT", kDays[tm.tm_wday % 7], tm.tm_mday,
             kMonths[tm.tm_mon % 12], tm.tm_year + 1900, tm.tm_hour, tm.tm_min, tm.tm_sec);
}

// False for a name that could reach outside the file directory or a hidden
// file: a backslash, ".." anywhere, or a path component beginning with a dot
// (the name itself included).
bool nameAllowed(const char* name) {
    if (strstr(name, "..") || strchr(name, '\\')) return false;
    for (const char* p = name; *p; p++)
        if (*p == '.' && (p == name || p[-1] == '/')) return false;
    return true;
}

// The real path of `dir`, resolved once per thread (the directory is fixed
// after start); empty when it does not resolve.
const std::string& realDirectory(const char* dir) {
    thread_local std::string cachedDir, cachedBase;
    if (cachedBase.empty() || cachedDir != dir) {
        char* resolved = realpath(dir, nullptr);
        cachedDir = dir;
        cachedBase = resolved ? resolved : "";
        free(resolved);
    }
    return cachedBase;
}

// The real path of the file open on `fd`, which is what was opened whatever
// links led there (no window between checking and opening).
bool openedPath(int fd, const char* full, std::string* out) {
    char link[32], target[4096];
    snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
    ssize_t n = readlink(link, target, sizeof target - 1);
    if (n > 0) {
        out->assign(target, static_cast<size_t>(n));
        return true;
    }
    char* resolved = realpath(full, nullptr);  // no /proc: resolve by name
    if (resolved) out->assign(resolved);
    free(resolved);
    return resolved != nullptr;
}

// Opens `full` for reading when it is a regular file whose real path lies
// inside the real path of `dir`: the descriptor and its status, or -1
// (missing, not a regular file, or a link leading out).
int openInside(const char* dir, const char* full, struct stat* st) {
    int ras = RAS1_Sync(RAS1_THIS);
    const std::string& base = realDirectory(dir);
    int fd = base.empty() ? -1 : ::open(full, O_RDONLY | O_CLOEXEC | O_NONBLOCK);  // a FIFO must not block us
    std::string real;
    if (fd >= 0 && (fstat(fd, st) != 0 || !S_ISREG(st->st_mode) || !openedPath(fd, full, &real))) real.clear();
    bool inside = !real.empty() && real.compare(0, base.size(), base) == 0 &&
                  (real[base.size()] == '/' || base.back() == '/');
    if (fd >= 0 && !inside) {
        if (!real.empty() && (ras & RAS1_DETAIL)) RAS1_Printf(RAS1_THIS, __LINE__, "%s resolves outside %s", full, base.c_str());
        ::close(fd);
        fd = -1;
    }
    return fd;
}

// The file part of a lower-cased path: from the first slash after the
// service name, else the default file.
const char* filePart(const char* path, const char* serviceName) {
    const char* at = serviceName ? strstr(path, serviceName) : nullptr;
    const char* slash = at ? strchr(at + strlen(serviceName), '/') : nullptr;
    return slash ? slash : BSS1_GetEnv("KSH_DEFAULTFILE", kDefaultFile);
}

void sendNotFound(WSQL_HttpServer* server, const char* name, const char* full) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "No such file: %s", full);
    server->parseQueryString();
    if (const char* xsl = server->getQueryValue("xsl")) {
        server->addXSLReference(xsl);
        server->writeXMLHeader(0, nullptr);
        server->append("<REQUEST>\n<PARMS>\n<error>Not found</error>\n</PARMS>\n</REQUEST>");
    } else {
        server->writeHeaders(KDH1_STC_OK, KDH1_MEDIA_HTML, 0, 0, nullptr);
        server->append("<HTML><HEAD><TITLE>File ");
        server->appendText(name);
        server->append(" not found</TITLE></HEAD><BODY><H3>File <EM>");
        server->appendText(name);
        server->append("</EM> not found</H3> </BODY></HTML>");
    }
    server->writeClientBuffer();
}

// Reads up to `n` bytes (fewer only at the end of the file); -1 on error.
ssize_t readChunk(int fd, char* p, size_t n) {
    size_t got = 0;
    while (got < n) {
        ssize_t k = ::read(fd, p + got, n - got);
        if (k < 0 && errno == EINTR) continue;
        if (k < 0) return -1;
        if (k == 0) break;
        got += static_cast<size_t>(k);
    }
    return static_cast<ssize_t>(got);
}

// Streams an open file in chunks of the response buffer's capacity.
void sendFile(WSQL_HttpServer* server, int fd, const struct stat& st, const char* name) {
    int ras = RAS1_Sync(RAS1_THIS);
    uint32_t media = WSQL_FileServer::determineMediaType(name);
    char date[40];
    httpDate(st.st_mtime, date, sizeof date);
    KDH1_sendhdr_struct modified = {KDH1_HDR_LASTMODIFIED, static_cast<uint32_t>(strlen(date)), date};
    uint64_t size = static_cast<uint64_t>(st.st_size);
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Serving file: %s, size=%d, media=%d", name, (int)size, (int)media);
    server->writeHeaders(KDH1_STC_OK, media, size, 1, &modified);

    WSQL_ResponseBuffer* b = server->getBuffer();
    b->clear();
    char* chunk = b->getBuffer();
    const size_t capacity = b->getMaxLength();
    for (;;) {
        ssize_t n = readChunk(fd, chunk, capacity);
        if (n < 0) RAS1_Printf(RAS1_THIS, __LINE__, "Error reading %s - %d - %s", name, errno, strerror(errno));
        if (n <= 0) break;
        bool full = static_cast<size_t>(n) == capacity;
        int rc = server->writeClient(chunk, static_cast<size_t>(n));
        if (ras & RAS1_DETAIL)
            RAS1_Printf(RAS1_THIS, __LINE__, full ? "file: %s Sent %d bytes" : "finished file: %s Sent %d bytes", name,
                        (int)n);
        // A client that is gone takes no more: stop reading.
        if (!full || rc != 0) break;
    }
    chunk[0] = '\0';
    b->clear();
}

}  // namespace

const char* WSQL_FileServer::fileDirectory() { return BSS1_GetEnv("KSH_DIRECTORY", "HTML"); }

uint32_t WSQL_FileServer::determineMediaType(const char* name) {
    const char* dot = name ? strchr(name, '.') : nullptr;
    if (!dot) return KDH1_MEDIA_TEXT;
    const char* ext = dot + 1;
    for (const MimeEntry& e : WSQL_mime_map)
        if (strcmp(e.extension, ext) == 0) return e.media;
    return KDH1_MEDIA_OTHER;
}

void WSQL_FileServer::convertMVSFilename(const char* qualifier, const char* name, char* out) {
    int ras = RAS1_Sync(RAS1_THIS);
    size_t n = 0;
    for (const char* p = name ? name : ""; *p && *p != '.' && n < 8; p++) out[n++] = static_cast<char>(toupper((unsigned char)*p));
    out[n++] = '.';
    for (const char* p = qualifier ? qualifier : ""; *p && n < 17; p++) out[n++] = static_cast<char>(toupper((unsigned char)*p));
    out[n] = '\0';
    if (ras & RAS1_DETAIL)
        RAS1_Printf(RAS1_THIS, __LINE__, "\"%s\" and \"%s\" converted to \"%s\"", qualifier ? qualifier : "",
                    name ? name : "", out);
}

int WSQL_FileServer::serveFile(WSQL_HttpServer* server, const char* serviceName) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const char* pathInfo = server->getPathInfo();
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Serving file with path info = %s", pathInfo);
    char* path = WSQL_Strdup(pathInfo);
    char* full = nullptr;
    if (!path) {
        server->returnError(kNoMemoryStatus, "Unable to allocate memory for filename.", 0);
    } else {
        for (char* p = path; *p; p++) *p = static_cast<char>(tolower((unsigned char)*p));
        const char* part = filePart(path, serviceName);
        const char* name = part[0] ? part + 1 : nullptr;
        if (name && strcmp(name, kHubFile) == 0) name = BSS1_GetEnv("KSH_HUB_FILE", kHubFile);
        if (!name) {
            server->returnError(KDH1_STC_BADREQUEST, "No file was specified.", 0);
        } else if (!nameAllowed(name)) {
            server->returnError(KDH1_STC_BADREQUEST, "Illegal filename specified", 0);
        } else {
            if (!*name) name = "default.htm";
            const char* dir = fileDirectory();
            size_t size = strlen(dir) + strlen(name) + 2;
            full = static_cast<char*>(malloc(size));
            if (!full) {
                server->returnError(kNoMemoryStatus, "Unable to allocate memory for filename.", 0);
            } else {
                snprintf(full, size, "%s/%s", dir, name);
                struct stat st;
                int fd = server->getBuffer() || server->setBuffer(0) == 0 ? openInside(dir, full, &st) : -1;
                if (fd >= 0) {
                    sendFile(server, fd, st, name);
                    ::close(fd);
                } else if (!server->getBuffer()) {
                    server->returnError(kNoMemoryStatus, "Unable to obtain memory.", 0);
                } else {
                    sendNotFound(server, name, full);
                }
            }
        }
    }
    free(full);
    free(path);
    RAS1_EXIT_RC(ras, 0);
    return WSQL_OK;
}

// ---------------------------------------------------------------- WSQL_File

WSQL_File::WSQL_File(const char* name, WSQL_File_Open_Mode mode)
    : openMode(mode), bytesWritten(0), fileName(WSQL_Strdup(name ? name : "")), path{}, stream(nullptr) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Filename: \"%s\"", fileName ? fileName : "");
}

WSQL_File::~WSQL_File() {
    close();
    free(fileName);
}

int WSQL_File::open(WSQL_HttpServer* server) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const char* how = openMode == WSQL_FILE_READ ? "r" : openMode == WSQL_FILE_WRITE ? "w" : nullptr;
    int rc = WSQL_OK;
    if (!how || !fileName) {
        rc = WSQL_BADINPUT;
    } else if (!(stream = fopen(fileName, how))) {
        int err = errno;
        RAS1_Printf(RAS1_THIS, __LINE__, "File Export check \"%s\" - %d", fileName, err);
        if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open \"%s\" - %d", fileName, err);
        if (server) server->setRequestError(true, "Unable to open file.", fileName, 0);
        rc = WSQL_NOTFOUND;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_File::read(char* buffer, size_t length, WSQL_HttpServer* server, size_t* got) {
    if (got) *got = 0;
    if (!stream) return WSQL_NOTFOUND;
    size_t n = fread(buffer, 1, length, stream);
    if (got) *got = n;
    if (n > 0 || length == 0) return WSQL_OK;
    if (ferror(stream)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error reading %s - %d - %s", fileName, errno, strerror(errno));
        return WSQL_FAULT;
    }
    return WSQL_NOTFOUND;
}

int WSQL_File::read(WSQL_ResponseBuffer** out, size_t length, WSQL_HttpServer* server) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (length == 0) length = 4096;
    uint64_t size = getFileSize();
    auto* b = new (std::nothrow) WSQL_ResponseBuffer(size > 1 ? static_cast<size_t>(size) : 0);
    char* piece = static_cast<char*>(malloc(length));
    int rc = WSQL_OK;
    if (!b || !b->valid() || !piece) {
        delete b;
        b = nullptr;
        if (server) server->setRequestMemoryError();
        rc = WSQL_NOMEM;
    }
    // The buffer fits the file, so appending grows it only for a file that
    // grew since its size was taken.
    while (rc == WSQL_OK) {
        size_t n = 0;
        int st = read(piece, length, server, &n);
        if (st != WSQL_OK) {
            rc = st == WSQL_FAULT ? WSQL_FAULT : WSQL_OK;
            break;
        }
        if (b->append(piece, n) != WSQL_OK) {
            if (server) server->setRequestMemoryError();
            rc = WSQL_NOMEM;
        }
    }
    free(piece);
    *out = b;
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_File::readRecord(char* buffer, size_t size, WSQL_HttpServer* server) {
    if (!stream || size < 2) return WSQL_NOTFOUND;
    if (fgets(buffer, static_cast<int>(size > INT32_MAX ? INT32_MAX : size), stream)) return WSQL_OK;
    if (ferror(stream)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Error reading %s - %d - %s", fileName, errno, strerror(errno));
        return WSQL_FAULT;
    }
    return WSQL_NOTFOUND;
}

int WSQL_File::write(const char* data, size_t length, WSQL_HttpServer* server) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!stream) return WSQL_OK;
    size_t n = fwrite(data, 1, length, stream);
    bytesWritten += static_cast<uint32_t>(n);
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "%d bytes written to \"%s\"", (int)n, fileName);
    if (n == length) return WSQL_OK;
    RAS1_Printf(RAS1_THIS, __LINE__, "Error writing to \"%s\" - \"%s\"", fileName, strerror(errno));
    if (server) server->setRequestError(false, "Error writing to file.", fileName, 0);
    return WSQL_FAULT;
}

void WSQL_File::close() {
    if (stream) fclose(stream);
    stream = nullptr;
}

int WSQL_File::buildPath() {
    if (path[0] || !fileName) return WSQL_OK;
    const char* dir = WSQL_FileServer::fileDirectory();
    size_t dn = strlen(dir);
    const char* sep = dn > 0 && dir[dn - 1] == '/' ? "" : "/";
    int n = strchr(fileName, '/') ? snprintf(path, sizeof path, "%s", fileName)
                                   : snprintf(path, sizeof path, "%s%s%s", dir, sep, fileName);
    // A cut path would name another file: keep none.
    if (n < 0 || static_cast<size_t>(n) >= sizeof path) {
        path[0] = '\0';
        RAS1_Printf(RAS1_THIS, __LINE__, "Path for \"%s\" too long", fileName);
        return WSQL_NOMEM;
    }
    return WSQL_OK;
}

uint64_t WSQL_File::getFileSize() {
    int ras = RAS1_Sync(RAS1_THIS);
    struct stat st;
    uint64_t size = buildPath() == WSQL_OK && path[0] && stat(path, &st) == 0 ? static_cast<uint64_t>(st.st_size) + 1 : 0;
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "File size = %d", (int)size);
    return size;
}
