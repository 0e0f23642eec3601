// anc1: numeric handle aliases (see anc1.h).
#include "anc1/anc1.h"

#include <cstdint>
#include <deque>
#include <mutex>
#include <vector>

#include "ras1/ras1.h"

RAS1_UNIT("anc1");

namespace {

struct Entry {
    void* object = nullptr;
    uint16_t generation = 0;  // of the alias currently issued (or last issued)
    bool used = false;
};

class AliasTable {
public:
    int reserve(void* object, unsigned* alias) {
        std::lock_guard<std::mutex> g(mu_);
        uint32_t slot;
        // Grow rather than reuse while few slots are free, so that a slot
        // comes back only after many others.
        if (free_.size() > kMinFree || (entries_.size() >= kMaxSlots && !free_.empty())) {
            slot = free_.front();
            free_.pop_front();
        } else if (entries_.size() < kMaxSlots) {
            slot = static_cast<uint32_t>(entries_.size());
            entries_.emplace_back();
        } else {
            return ANC1_FULL;
        }
        Entry& e = entries_[slot];
        if (++e.generation == 0) e.generation = 1;
        e.object = object;
        e.used = true;
        *alias = (static_cast<unsigned>(e.generation) << 16) | (slot + 1);
        return ANC1_OK;
    }
    int convert(unsigned alias, void** object) {
        std::lock_guard<std::mutex> g(mu_);
        Entry* e = find(alias);
        *object = e != nullptr ? e->object : nullptr;
        return e != nullptr ? ANC1_OK : ANC1_NOTFOUND;
    }
    int release(unsigned alias) {
        std::lock_guard<std::mutex> g(mu_);
        Entry* e = find(alias);
        if (e == nullptr) return ANC1_NOTFOUND;
        e->used = false;
        e->object = nullptr;
        free_.push_back((alias & 0xFFFFu) - 1);
        return ANC1_OK;
    }

private:
    static constexpr size_t kMinFree = 256;
    static constexpr size_t kMaxSlots = 0xFFFF;  // slot + 1 fits the low 16 bits

    Entry* find(unsigned alias) {
        uint32_t low = alias & 0xFFFFu;
        if (low == 0 || low > entries_.size()) return nullptr;
        Entry& e = entries_[low - 1];
        return e.used && e.generation == (alias >> 16) ? &e : nullptr;
    }

    std::mutex mu_;  // guards entries_ and free_
    std::vector<Entry> entries_;
    std::deque<uint32_t> free_;
};

AliasTable& table() {
    static AliasTable* t = new AliasTable;  // lives as long as the process
    return *t;
}

}  // namespace

int ANC1_Reserve(void* object, unsigned* alias) {
    if (object == nullptr || alias == nullptr) return ANC1_BADARG;
    int rc = table().reserve(object, alias);
    if (rc != ANC1_OK) RAS1_Printf(RAS1_THIS, __LINE__, "no alias left for %p", object);
    return rc;
}

int ANC1_Convert(unsigned alias, void** object) {
    if (object == nullptr) return ANC1_BADARG;
    return table().convert(alias, object);
}

int ANC1_Release(unsigned alias) { return table().release(alias); }
