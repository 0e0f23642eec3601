// kshlst: locked, iterable circular list (see include/kshlst.h).
//
// Values leave the list in two steps: the element is unlinked from the ring
// first, and only then is the destroy callback run. The callback may use the
// list again (the lock is recursive) and always finds it consistent.
#include "kshlst.h"

#include <cstdlib>
#include <new>

#include "ras1/ras1.h"
#include "wsql_rc.h"

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define KSHLST_ASAN 1
#endif
#elif defined(__SANITIZE_ADDRESS__)
#define KSHLST_ASAN 1
#endif
#ifdef KSHLST_ASAN
#include <sanitizer/asan_interface.h>
// Room not in use stays poisoned, so touching a removed element is still
// reported as a use after free.
#define KSHLST_POISON(p, n) ASAN_POISON_MEMORY_REGION((p), (n))
#define KSHLST_UNPOISON(p, n) ASAN_UNPOISON_MEMORY_REGION((p), (n))
#else
#define KSHLST_POISON(p, n) ((void)(p), (void)(n))
#define KSHLST_UNPOISON(p, n) ((void)(p), (void)(n))
#endif

RAS1_UNIT("kshlst");

namespace {
// The most elements (live and marked) one list links: the counts are 16-bit.
constexpr unsigned kMaxLinked = 0xFFFF;

// Element blocks: a header word chaining the blocks, then the cells. The
// first block of a list holds 4 cells, each next one twice as many, up to 256
// (a leaf's short list costs one small allocation, a long one few).
union Cell {
    Cell* nextFree;
    alignas(LinkedListElem) unsigned char room[sizeof(LinkedListElem)];
};
struct alignas(Cell) BlockHeader {
    void* next;
    uint32_t cells;
};
constexpr uint32_t kFirstBlockCells = 4;
constexpr uint32_t kMaxBlockCells = 256;

Cell* cellsOf(void* block) { return reinterpret_cast<Cell*>(static_cast<BlockHeader*>(block) + 1); }
}  // namespace

// ---------------------------------------------------------------- WSQL_Lock

WSQL_Lock::WSQL_Lock() {
    int rc = BSS1_InitializeLock(&lock);
    if (rc != 0) RAS1_Printf(RAS1_THIS, __LINE__, "lock initialisation failed, rc %d", rc);
}

WSQL_Lock::~WSQL_Lock() { BSS1_DestroyLock(&lock); }

void WSQL_Lock::Lock() { BSS1_GetLock(&lock); }

void WSQL_Lock::Unlock() { BSS1_ReleaseLock(&lock); }

// ----------------------------------------------------------- LinkedListElem

LinkedListElem::LinkedListElem(void* v, LinkedListElem* before) : value(v), removed(0) {
    if (before == nullptr) {
        prev = this;
        next = this;
        return;
    }
    next = before;
    prev = before->prev;
    prev->next = this;
    before->prev = this;
}

LinkedListElem::~LinkedListElem() {
    prev->next = next;
    next->prev = prev;
}

// --------------------------------------------------------------- LinkedList

LinkedList::LinkedList(Destructor d) : destructor(d) {
    lock = new (std::nothrow) WSQL_Lock();
    ownsLock = lock != nullptr ? 1 : 0;
}

LinkedList::LinkedList(WSQL_Lock* l, Destructor d) : lock(l), destructor(d) {}

LinkedList::~LinkedList() {
    int ras = RAS1_Sync(RAS1_THIS);
    Lock();
    if (iteratorCount != 0) {
        if (ras & (RAS1_STATE | RAS1_DETAIL))
            RAS1_Printf(RAS1_THIS, __LINE__, "Deleting linked list %p with %d iterators still using it.",
                        (void*)this, (int)iteratorCount);
        iteratorCount = 0;
    }
    Unlock();
    Clear();
    while (blocks != nullptr) {
        auto* block = static_cast<BlockHeader*>(blocks);
        blocks = block->next;
        KSHLST_UNPOISON(cellsOf(block), block->cells * sizeof(Cell));
        free(block);
    }
    if (ownsLock) delete lock;
    lock = nullptr;
}

void* LinkedList::allocElem() {
    if (freeCells != nullptr) {
        Cell* c = static_cast<Cell*>(freeCells);
        KSHLST_UNPOISON(c, sizeof(Cell));
        freeCells = c->nextFree;
        return c;
    }
    if (blocks == nullptr || blockUsed == blockCells) {
        uint32_t cells = blocks == nullptr ? kFirstBlockCells
                                           : (blockCells < kMaxBlockCells ? blockCells * 2 : kMaxBlockCells);
        void* block = malloc(sizeof(BlockHeader) + cells * sizeof(Cell));
        if (block == nullptr) return nullptr;
        static_cast<BlockHeader*>(block)->next = blocks;
        static_cast<BlockHeader*>(block)->cells = cells;
        KSHLST_POISON(cellsOf(block), cells * sizeof(Cell));
        blocks = block;
        blockCells = cells;
        blockUsed = 0;
    }
    Cell* c = cellsOf(blocks) + blockUsed++;
    KSHLST_UNPOISON(c, sizeof(Cell));
    return c;
}

void LinkedList::freeElem(LinkedListElem* e) {
    e->~LinkedListElem();
    Cell* c = reinterpret_cast<Cell*>(e);
    c->nextFree = static_cast<Cell*>(freeCells);
    freeCells = c;
    KSHLST_POISON(c, sizeof(Cell));
}

void LinkedList::Lock() {
    if (lock) lock->Lock();
}

void LinkedList::Unlock() {
    if (lock) lock->Unlock();
}

int LinkedList::linkEntry(void* v, bool asHead) {
    if ((unsigned)numEntries + markCount >= kMaxLinked) return WSQL_NOTHING;
    void* room = allocElem();
    if (room == nullptr) return WSQL_NOTHING;
    LinkedListElem* e = new (room) LinkedListElem(v, head);
    if (head == nullptr || asHead) head = e;
    ++numEntries;
    return WSQL_OK;
}

int LinkedList::AddEntry(void* v) {
    Lock();
    int rc = linkEntry(v, true);
    Unlock();
    return rc;
}

int LinkedList::AppendEntry(void* v) {
    Lock();
    int rc = linkEntry(v, false);
    Unlock();
    return rc;
}

LinkedListElem* LinkedList::findEntry(void* v) {
    LinkedListElem* e = head;
    if (e == nullptr) return nullptr;
    do {
        if (e->Value() == v && !e->Removed()) return e;
        e = e->Next();
    } while (e != head);
    return nullptr;
}

void* LinkedList::unlinkElem(LinkedListElem* e) {
    if (e->Next() == e)
        head = nullptr;
    else if (e == head)
        head = e->Next();
    void* v = e->Value();
    freeElem(e);
    return v;
}

void LinkedList::removeEntry(LinkedListElem* e) {
    if (iteratorCount != 0) {
        if (e->Removed()) return;
        --numEntries;
        e->Remove();
        incrMark();
        return;
    }
    if (!e->Removed()) --numEntries;
    bool destroy = !e->HandedOut();
    void* v = unlinkElem(e);
    if (destructor && destroy) destructor(v);
}

int LinkedList::RemoveEntry(void* v) {
    Lock();
    int rc = WSQL_NOTFOUND;
    LinkedListElem* e = findEntry(v);
    if (e != nullptr) {
        removeEntry(e);
        rc = WSQL_OK;
    }
    Unlock();
    return rc;
}

int LinkedList::ChangeValue(void* oldValue, void* newValue) {
    Lock();
    int rc = WSQL_NOTFOUND;
    LinkedListElem* e = findEntry(oldValue);
    if (e != nullptr) {
        e->SetValue(newValue);
        rc = WSQL_OK;
    }
    Unlock();
    return rc;
}

// Marked entries are skipped: their values are already on their way to the
// destructor and must not be handed out as well.
void* LinkedList::RemoveFirst() {
    Lock();
    void* v = nullptr;
    LinkedListElem* e = head;
    if (e != nullptr) {
        while (e->Removed() && e->Next() != head) e = e->Next();
        if (!e->Removed()) {
            v = e->Value();
            --numEntries;
            if (iteratorCount != 0) {
                e->Remove(LinkedListElem::HANDED_OUT);
                incrMark();
            } else {
                unlinkElem(e);
            }
        }
    }
    Unlock();
    return v;
}

int LinkedList::OnList(void* v) {
    Lock();
    int on = findEntry(v) != nullptr ? 1 : 0;
    Unlock();
    return on;
}

void LinkedList::destroyChain(LinkedListElem* first) {
    while (first != nullptr) {
        LinkedListElem* e = first;
        first = e->Next();
        bool destroy = !e->HandedOut();
        void* v = e->Value();
        // The element is already out of the ring: make it a ring of one so
        // that its destructor's unlink touches nothing else.
        e->Next(e);
        e->Prev(e);
        freeElem(e);
        if (destructor && destroy) destructor(v);
    }
}

void LinkedList::Clear() {
    Lock();
    LinkedListElem* chain = nullptr;
    if (iteratorCount != 0) {
        LinkedListElem* e = head;
        if (e != nullptr) {
            do {
                if (!e->Removed()) {
                    e->Remove();
                    incrMark();
                }
                e = e->Next();
            } while (e != head);
        }
        numEntries = 0;
    } else if (head != nullptr) {
        // Detach the whole ring as a null-terminated chain in list order.
        head->Prev()->Next(nullptr);
        chain = head;
        head = nullptr;
        numEntries = 0;
        markCount = 0;
    }
    destroyChain(chain);
    Unlock();
}

// The last iterator unlinks every marked element in one pass along the ring,
// then the values reach the destructor in ring order.
void LinkedList::iteratorFinished() {
    if (iteratorCount != 0) --iteratorCount;
    if (iteratorCount != 0 || markCount == 0 || head == nullptr) return;
    LinkedListElem* first = nullptr;
    LinkedListElem* last = nullptr;
    LinkedListElem* e = head;
    unsigned linked = (unsigned)numEntries + markCount;
    for (unsigned i = 0; i < linked && markCount != 0; ++i) {
        LinkedListElem* next = e->Next();
        if (e->Removed()) {
            decrMark();
            if (e->Next() == e)
                head = nullptr;
            else if (e == head)
                head = next;
            e->Prev()->Next(next);
            next->Prev(e->Prev());
            e->Next(nullptr);
            if (last)
                last->Next(e);
            else
                first = e;
            last = e;
        }
        e = next;
    }
    markCount = 0;
    destroyChain(first);
}

// ----------------------------------------------------------- LinkedListIter

LinkedListIter::LinkedListIter(LinkedList* l) : list(l) {
    if (list == nullptr) return;
    list->Lock();
    list->newIterator();
    list->Unlock();
}

LinkedListIter::~LinkedListIter() {
    if (list == nullptr) return;
    list->Lock();
    list->iteratorFinished();
    list->Unlock();
}

void LinkedListIter::step() {
    current = current->Next();
    if (current == start) current = nullptr;
}

void* LinkedListIter::Next() {
    if (list == nullptr) return nullptr;
    list->Lock();
    if (current == nullptr) {
        start = list->getHead();
        current = start;
    } else {
        step();
    }
    while (current != nullptr && current->Removed()) step();
    void* v = current != nullptr ? current->Value() : nullptr;
    list->Unlock();
    return v;
}

int LinkedListIter::Remove() {
    if (list == nullptr) return WSQL_NOTFOUND;
    list->Lock();
    int rc = WSQL_NOTFOUND;
    if (current != nullptr && !current->Removed()) {
        list->removeEntry(current);
        rc = WSQL_OK;
    }
    list->Unlock();
    return rc;
}
