// kshfile: the file server and the small file wrapper.
//
// WSQL_FileServer serves GET requests that are neither SOAP posts nor
// "action" requests from the gateway's file directory (KSH_DIRECTORY,
// default "HTML"): it maps the request path to a file name, refuses names
// that could leave the directory, picks the media type from the extension and
// streams the file through the request's response buffer.
//
// Names are checked after the path was decoded once (by the HTTP layer) and
// never decoded again: a name with a backslash, a component beginning with a
// dot or ".." anywhere is refused, and a name whose real path (symbolic links
// resolved) lies outside the file directory is answered as not found.
//
// WSQL_File wraps one C stream for the export request, which writes export
// files into the same directory.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>

class WSQL_HttpServer;
class WSQL_Hub;
class WSQL_ResponseBuffer;

// Bytes convertMVSFilename writes at most, its NUL included.
constexpr size_t WSQL_MVS_NAME_SIZE = 18;

class WSQL_FileServer {
public:
    // Serves one file request on `server`; `serviceName` is the lower-case
    // name of the hub's HTTP service (null: none). Returns 0.
    static int serveFile(WSQL_HttpServer* server, const char* serviceName);
    // The same for a hub (any type with getServiceName(), normally WSQL_Hub;
    // the template keeps this header free of the hub's definition).
    template <class Hub>
    static int serveFile(WSQL_HttpServer* server, Hub* hub) {
        return serveFile(server, hub ? static_cast<const char*>(hub->getServiceName()) : nullptr);
    }

    // The media code (KDH1_media_t) of a file name, from the text after its
    // first dot: 2 without a dot, 44 for an unknown extension.
    static uint32_t determineMediaType(const char* name);
    // Writes NAME.QUALIFIER into `out` (WSQL_MVS_NAME_SIZE bytes): the name up
    // to its first dot and the qualifier, each upper-cased and cut to 8.
    static void convertMVSFilename(const char* qualifier, const char* name, char* out);
    // The file directory: KSH_DIRECTORY, default "HTML".
    static const char* fileDirectory();
};

enum WSQL_File_Open_Mode : uint32_t {
    WSQL_FILE_READ = 1,
    WSQL_FILE_WRITE = 2,
};

class WSQL_File {
public:
    // Keeps a copy of `name` and the mode; nothing is opened yet.
    WSQL_File(const char* name, WSQL_File_Open_Mode mode);
    // Releases the name and closes a stream the caller left open.
    virtual ~WSQL_File();
    WSQL_File(const WSQL_File&) = delete;
    WSQL_File& operator=(const WSQL_File&) = delete;

    // Opens the name as given ("r" for read, "w" for write): 0, 6 for an
    // unknown mode, 5 when it cannot be opened (the server, when given,
    // records the client error "Unable to open file.").
    int open(WSQL_HttpServer* server);
    // Reads up to `length` bytes: 0 (with *got the count when given), 5 at the
    // end of the file (nothing read) or without a stream, 8 on a read error.
    int read(char* buffer, size_t length, WSQL_HttpServer* server, size_t* got = nullptr);
    // Reads the rest of the file into a new buffer sized to the file, handed
    // to the caller (delete) in *out; `length` is the piece read at a time (0:
    // 4096). 0 at the end of the file, 8 after a read error (what was read is
    // handed over), 7 when the buffer cannot be created (the server records a
    // memory error).
    int read(WSQL_ResponseBuffer** out, size_t length, WSQL_HttpServer* server);
    // Reads one line of at most size - 1 characters; results as read().
    int readRecord(char* buffer, size_t size, WSQL_HttpServer* server);
    // Writes `length` bytes: 0, or 8 on a short write (the server records the
    // server error "Error writing to file."). Without a stream it does nothing.
    int write(const char* data, size_t length, WSQL_HttpServer* server);
    void close();
    // Resolves the name against the file directory once (a name with a slash
    // is taken as it is): 0, or 7 when the result would not fit the path.
    int buildPath();
    // Size of the file at the built path plus one, 0 when it does not exist.
    uint64_t getFileSize();

    const char* getName() const { return fileName; }
    const char* getPath() const { return path; }
    uint32_t getBytesWritten() const { return bytesWritten; }

private:
    WSQL_File_Open_Mode openMode;
    uint32_t bytesWritten;
    char* fileName;     // malloc'd copy
    char path[260];     // at most 259 characters
    FILE* stream;
};
