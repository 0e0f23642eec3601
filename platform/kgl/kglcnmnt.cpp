// kglcnmnt: the component inventory, a small table guarded by one mutex.
#include "kgl/kglcnmnt.h"

#include <cstring>
#include <mutex>
#include <vector>

#include "ras1/ras1.h"

RAS1_UNIT("kglcnmnt");

namespace {
std::mutex inventoryMutex;
std::vector<const KGL_Contents*> inventory;  // GUARDED_BY(inventoryMutex)
}  // namespace

int kglcnmnt(const KGL_Contents* contents) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!contents || !contents->name || !*contents->name) return KGL_CN_BADARG;
    std::lock_guard<std::mutex> g(inventoryMutex);
    for (const KGL_Contents*& c : inventory)
        if (strcmp(c->name, contents->name) == 0) {
            c = contents;
            return KGL_CN_OK;
        }
    inventory.push_back(contents);
    RAS1_TRACE_IF(ras, RAS1_STATE, "Component %s %s recorded", contents->name,
                  contents->version ? contents->version : "");
    return KGL_CN_OK;
}

const KGL_Contents* kglcnqry(const char* name) {
    if (!name) return nullptr;
    std::lock_guard<std::mutex> g(inventoryMutex);
    for (const KGL_Contents* c : inventory)
        if (strcmp(c->name, name) == 0) return c;
    return nullptr;
}

int kglcnrmv(const char* name) {
    if (!name) return KGL_CN_NOTFOUND;
    std::lock_guard<std::mutex> g(inventoryMutex);
    for (size_t i = 0; i < inventory.size(); i++)
        if (strcmp(inventory[i]->name, name) == 0) {
            inventory.erase(inventory.begin() + (long)i);
            return KGL_CN_OK;
        }
    return KGL_CN_NOTFOUND;
}
