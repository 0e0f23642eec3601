// vemsd: the host process of the gateway, standing in for the monitoring
// server. It prepares its home folder and hub store, describes the local
// server to the gateway through the anchor record, runs kshstart on a thread
// of its own and calls kshstop on SIGTERM or SIGINT.
//
// The sources: vemsd.cpp (the run: store, anchor, gateway thread, signals),
// vemsopts.cpp (the command line), vemshome.cpp (the home folder).
#pragma once

#include <string>

// Exit statuses.
enum : int {
    VEMSD_EXIT_OK = 0,      // stopped by a signal, everything ended
    VEMSD_EXIT_FAILED = 1,  // the home, the store or the gateway could not be set up
    VEMSD_EXIT_USAGE = 2,   // bad command line
};

struct VemsdOptions {
    std::string home = "./vems-home";
    std::string listen = "127.0.0.1";
    int port = 15200;
    std::string store;  // empty: HOME/hub.db
    bool validate = true;
    std::string admin = "sysadmin";
    std::string adminPassword;  // empty: a random one for a new store
    std::string serverVersion = "06.30";
    bool help = false;
};

// Parses argv into *options. 0, or VEMSD_EXIT_USAGE with the reason in
// *error.
int vemsdParseOptions(int argc, char** argv, VemsdOptions* options, std::string* error);
// The usage text.
const char* vemsdUsage();

// The folder vemsd copies its home from: VEMSD_DATA_DIR, else the data/
// folder of the source tree vemsd was built from.
std::string vemsdDataDir();
// Creates what is missing of the home folder from `dataDir` (never
// overwriting a file): HOME/HTML with the front end files and the hub list
// file, HOME/attrlib with the attribute files, HOME/servers.conf. 0, or
// VEMSD_EXIT_FAILED with the reason in *error.
int vemsdPrepareHome(const std::string& home, const std::string& dataDir, std::string* error);
// Sets the gateway's environment defaults for `home` (file directory,
// attribute directory); variables already set keep their values.
void vemsdSetEnvironment(const std::string& home);
// A random password of 16 letters and digits, or "" when the system gives no
// randomness.
std::string vemsdRandomPassword();
// Writes `password` to `path` with mode 0600 (the file must not exist yet).
// 0, or errno.
int vemsdWriteSecret(const std::string& path, const std::string& password);
