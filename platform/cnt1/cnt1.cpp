// cnt1: module symbol loading (see cnt1.h).
#include "cnt1/cnt1.h"

#include <dlfcn.h>

#include <cctype>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "bss1/bss1.h"
#include "ras1/ras1.h"

RAS1_UNIT("cnt1");

namespace {

thread_local std::string tError;

std::mutex gMu;                          // guards gModules
std::map<std::string, void*> gModules;   // module name -> dlopen handle, never closed

// The folder this library was loaded from.
std::string ownFolder() {
    Dl_info info;
    if (dladdr(reinterpret_cast<void*>(&CNT1_Load), &info) == 0 || info.dli_fname == nullptr) return "";
    std::string f = info.dli_fname;
    size_t slash = f.rfind('/');
    return slash == std::string::npos ? "" : f.substr(0, slash);
}

std::vector<std::string> candidates(const std::string& name) {
    if (name.find('/') != std::string::npos) return {name};
    std::string lower = name;
    for (char& c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    std::vector<std::string> files = {"lib" + lower + ".so", "lib" + name + ".so", name + ".so", name};
    std::vector<std::string> folders;
    std::string path = BSS1_GetEnv("CNT1_PATH", "");
    for (size_t b = 0; b <= path.size();) {
        size_t e = path.find(':', b);
        if (e == std::string::npos) e = path.size();
        if (e > b) folders.push_back(path.substr(b, e - b));
        b = e + 1;
    }
    std::string own = ownFolder();
    if (!own.empty()) folders.push_back(own);
    std::vector<std::string> out;
    for (const std::string& d : folders) {
        for (const std::string& f : files) out.push_back(d + "/" + f);
    }
    for (const std::string& f : files) out.push_back(f);  // the loader's own search
    return out;
}

void* openModule(const std::string& name) {
    std::lock_guard<std::mutex> g(gMu);
    auto it = gModules.find(name);
    if (it != gModules.end()) return it->second;
    std::string errors;
    for (const std::string& file : candidates(name)) {
        void* h = dlopen(file.c_str(), RTLD_NOW | RTLD_LOCAL);
        if (h != nullptr) {
            gModules[name] = h;
            return h;
        }
        const char* e = dlerror();
        if (errors.empty() && e != nullptr) errors = e;
    }
    tError = "module " + name + " not found" + (errors.empty() ? "" : " (" + errors + ")");
    return nullptr;
}

}  // namespace

int CNT1_Load(const char* module, const char* symbol, void** address) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (address != nullptr) *address = nullptr;
    if (module == nullptr || *module == '\0' || symbol == nullptr || *symbol == '\0' || address == nullptr) {
        tError = "module, symbol and address are required";
        return CNT1_BADARG;
    }
    tError.clear();
    int rc = CNT1_OK;
    void* h = openModule(module);
    if (h == nullptr) {
        rc = CNT1_NOMODULE;
    } else {
        dlerror();
        *address = dlsym(h, symbol);
        if (*address == nullptr) {
            const char* e = dlerror();
            tError = std::string("symbol ") + symbol + " not found in " + module + (e != nullptr ? std::string(" (") + e + ")" : "");
            rc = CNT1_NOSYMBOL;
        }
    }
    RAS1_TRACE_IF(ras, RAS1_STATE, "load %s of %s: %d %s", symbol, module, rc, tError.c_str());
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

const char* CNT1_LastError() { return tError.c_str(); }
