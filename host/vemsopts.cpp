// vemsopts: vemsd's command line (see vemsd.h).
#include <strings.h>

#include <cctype>
#include <cstdlib>
#include <cstring>

#include "ras1/ras1.h"
#include "vemsd.h"

RAS1_UNIT("vemsopts");

namespace {

int setText(VemsdOptions* o, std::string VemsdOptions::*field, const char* value, std::string*) {
    o->*field = value;
    return 0;
}

int setPort(VemsdOptions* o, std::string VemsdOptions::*, const char* value, std::string* error) {
    char* end = nullptr;
    long v = std::strtol(value, &end, 10);
    if (*value == '\0' || *end != '\0' || v < 0 || v > 65535) {
        *error = std::string("--port needs a number from 0 to 65535, not '") + value + "'";
        return VEMSD_EXIT_USAGE;
    }
    o->port = static_cast<int>(v);
    return 0;
}

int setValidate(VemsdOptions* o, std::string VemsdOptions::*, const char* value, std::string* error) {
    if (strcasecmp(value, "yes") == 0) {
        o->validate = true;
    } else if (strcasecmp(value, "no") == 0) {
        o->validate = false;
    } else {
        *error = std::string("--validate takes yes or no, not '") + value + "'";
        return VEMSD_EXIT_USAGE;
    }
    return 0;
}

int setVersion(VemsdOptions* o, std::string VemsdOptions::*, const char* value, std::string* error) {
    bool ok = std::strlen(value) == 5 && value[2] == '.';
    for (int i : {0, 1, 3, 4}) ok = ok && std::isdigit(static_cast<unsigned char>(value[i]));
    if (!ok) {
        *error = std::string("--server-version takes VV.RR (e.g. 06.30), not '") + value + "'";
        return VEMSD_EXIT_USAGE;
    }
    o->serverVersion = value;
    return 0;
}

int setPassword(VemsdOptions* o, std::string VemsdOptions::*, const char* value, std::string* error) {
    size_t n = std::strlen(value);
    if (n < 1 || n > 16) {
        *error = "--admin-password takes 1 to 16 characters";
        return VEMSD_EXIT_USAGE;
    }
    o->adminPassword = value;
    return 0;
}

struct Flag {
    const char* name;
    int (*set)(VemsdOptions*, std::string VemsdOptions::*, const char*, std::string*);
    std::string VemsdOptions::*field;  // for setText
};
const Flag kFlags[] = {
    {"--home", setText, &VemsdOptions::home},
    {"--listen", setText, &VemsdOptions::listen},
    {"--port", setPort, nullptr},
    {"--store", setText, &VemsdOptions::store},
    {"--validate", setValidate, nullptr},
    {"--admin", setText, &VemsdOptions::admin},
    {"--admin-password", setPassword, nullptr},
    {"--server-version", setVersion, nullptr},
};

}  // namespace

const char* vemsdUsage() {
    return "usage: vemsd [--home DIR] [--listen ADDR] [--port N] [--store FILE] [--validate yes|no]\n"
           "             [--admin USER] [--admin-password PASS] [--server-version VV.RR]\n"
           "  --home            working folder, created on first start (default ./vems-home)\n"
           "  --listen, --port  address of the HTTP listener (default 127.0.0.1:15200; port 0: any free port)\n"
           "  --store           hub store file (default HOME/hub.db)\n"
           "  --validate        whether the hub validates users (default yes)\n"
           "  --admin           administrator of a new store (default sysadmin)\n"
           "  --admin-password  its password; without it a new store gets a random one, written to\n"
           "                    HOME/initial-admin-password\n"
           "  --server-version  the version the hub reports (default 06.30)\n";
}

int vemsdParseOptions(int argc, char** argv, VemsdOptions* options, std::string* error) {
    for (int i = 1; i < argc; ++i) {
        const char* arg = argv[i];
        if (std::strcmp(arg, "--help") == 0 || std::strcmp(arg, "-h") == 0) {
            options->help = true;
            continue;
        }
        const Flag* flag = nullptr;
        for (const Flag& f : kFlags)
            if (std::strcmp(arg, f.name) == 0) flag = &f;
        if (flag == nullptr) {
            *error = std::string("unknown option '") + arg + "'";
            return VEMSD_EXIT_USAGE;
        }
        if (i + 1 >= argc) {
            *error = std::string(arg) + " needs a value";
            return VEMSD_EXIT_USAGE;
        }
        int rc = flag->set(options, flag->field, argv[++i], error);
        if (rc != 0) return rc;
    }
    if (options->home.empty()) {
        *error = "--home must not be empty";
        return VEMSD_EXIT_USAGE;
    }
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "home %s listen %s:%d store %s validate %d admin %s version %s",
                    options->home.c_str(), options->listen.c_str(), options->port, options->store.c_str(),
                    options->validate ? 1 : 0, options->admin.c_str(), options->serverVersion.c_str());
    return 0;
}
