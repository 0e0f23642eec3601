// opclictx: the server context of the command-line framework and the login
// session it is built from.
//
// One OPCLI_Context serves one command run: it holds the session (server URL,
// user, password), the one HTTP handle every SOAP request of the run reuses
// (so the connection stays open between requests), the server version last
// read, and what displayMsg needs (the folder of the message files and the
// hub name that renders the value "HP"). The framework creates it, makes it
// the active context (getUserAuthorization and displayMsg, which take no
// context argument, read that one) and hands it to the command as an opaque
// pointer.
//
// The session lives in $OPCLI_HOME/session (default ~/.opcli/session), mode
// 0600, one KEY=VALUE a line. The password is never stored in clear text: it
// is sealed with a secret key (libsodium secretbox: XSalsa20-Poly1305, a
// fresh random nonce for each save) kept in $OPCLI_HOME/session.key, 32
// random bytes created on the first login with mode 0600. A key file that
// others may read is refused. Removing the key makes stored sessions
// unreadable; "opcli logout" removes the session and keeps the key.
#pragma once

#include <string>

// Exported from the support library (built with hidden visibility).
#define OPCLI_API __attribute__((visibility("default")))

// Results of the session calls.
enum : int {
    OPCLI_OK = 0,
    OPCLI_NOTFOUND = 5,  // no session stored
    OPCLI_BADINPUT = 6,  // malformed session, value with a line break, key refused or wrong
    OPCLI_FAULT = 8,     // the file system refused (folder, write, rename), crypto library failure
};

struct OPCLI_API OPCLI_Session {
    std::string server;    // SOAP endpoint URL, e.g. http://127.0.0.1:15200/
    std::string user;
    std::string password;  // clear text in memory only
    std::string hub;       // hub name shown for "HP"; empty when unknown
};

// Folder of the session: $OPCLI_HOME, else $HOME/.opcli.
OPCLI_API std::string OPCLI_SessionDir();
// Writes `s` to the session file (creating the folder with mode 0700 and the
// key file when missing). The file is replaced atomically.
[[nodiscard]] OPCLI_API int OPCLI_SaveSession(const OPCLI_Session& s);
// Reads the session file into *s. 0, 5 (no session), 6, 8.
[[nodiscard]] OPCLI_API int OPCLI_LoadSession(OPCLI_Session* s);
// Removes the session file. 0, 5 when there was none, 8.
OPCLI_API int OPCLI_RemoveSession();

class OPCLI_API OPCLI_Context {
public:
    OPCLI_Context();
    // Releases the HTTP handle and wipes the password. When this context is
    // the active one, there is no active context afterwards.
    ~OPCLI_Context();
    OPCLI_Context(const OPCLI_Context&) = delete;
    OPCLI_Context& operator=(const OPCLI_Context&) = delete;

    // Takes over a session: fills server, user, password and hub and marks
    // the context logged in.
    void useSession(const OPCLI_Session& s);

    // The easy handle of this context (a CURL*), created on first use; null
    // when it cannot be made. Owned by the context.
    void* httpHandle();

    // The context read by calls without a context argument; null when none.
    static OPCLI_Context* active();
    static void setActive(OPCLI_Context* ctx);

    std::string serverUrl;
    std::string user;
    std::string password;
    std::string hub;
    std::string messageDir;  // folder of the message files; "" = current folder
    std::string version;     // server version last read by getVemsVersion
    bool loggedIn = false;
    long connectTimeoutMs = 5000;  // OPCLI_CONNECT_TIMEOUT_MS overrides
    long totalTimeoutMs = 60000;   // OPCLI_TIMEOUT_MS overrides

private:
    void* curl = nullptr;
};
