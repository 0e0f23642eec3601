// kshlst: the gateway's one container, a circular doubly linked list of
// untyped values with an optional lock, an optional destroy callback and
// iterators that make removal safe while a walk is in progress.
//
// While at least one iterator is registered on a list, removing an entry only
// marks it: it stays linked (so no iterator ever stands on freed memory) and
// is unlinked and handed to the destroy callback when the last iterator goes.
//
// Results: WSQL_OK (0) done, WSQL_NOTHING (2) an element could not be
// allocated (or the list is full), WSQL_NOTFOUND (5) no such entry.
//
// Counts are 16-bit: a list links at most 65535 elements, live and marked
// together. An add beyond that is refused with 2 and changes nothing.
//
// Elements come from small blocks the list allocates as it grows; the room of
// a removed element is reused by later adds and all of it is released when
// the list is destroyed (a list keeps the room of its largest size).
#pragma once

#include <cstdint>

#include "bss1/bss1.h"

// A lock of the platform (recursive: a destroy callback may use the list that
// calls it). Construction initialises the lock, destruction destroys it.
class WSQL_Lock {
public:
    WSQL_Lock();
    virtual ~WSQL_Lock();
    WSQL_Lock(const WSQL_Lock&) = delete;
    WSQL_Lock& operator=(const WSQL_Lock&) = delete;

    void Lock();
    void Unlock();

private:
    BSS1_Lock lock;
};

// One entry of a list. Allocated and freed by the list only; users never see
// it. A new element is linked immediately before `before` (the head, which in
// a ring is the tail position); with no neighbour it forms a ring of one.
// Destroying an element unlinks it (its neighbours are joined).
class LinkedListElem {
public:
    LinkedListElem(void* value, LinkedListElem* before);
    ~LinkedListElem();
    LinkedListElem(const LinkedListElem&) = delete;
    LinkedListElem& operator=(const LinkedListElem&) = delete;

    void* Value() const { return value; }
    void SetValue(void* v) { value = v; }
    LinkedListElem* Next() const { return next; }
    LinkedListElem* Prev() const { return prev; }
    void Next(LinkedListElem* e) { next = e; }
    void Prev(LinkedListElem* e) { prev = e; }
    // Marks the element removed; `how` is REMOVED (destroy the value later)
    // or HANDED_OUT (the value was given to a caller: never destroy it).
    void Remove(uint32_t how = REMOVED) { removed = how; }
    bool Removed() const { return removed != 0; }
    bool HandedOut() const { return removed == HANDED_OUT; }

    enum : uint32_t { REMOVED = 1, HANDED_OUT = 2 };

private:
    LinkedListElem* prev;
    LinkedListElem* next;
    void* value;        // compared by pointer identity
    uint32_t removed;   // non-zero once removed while iterators were registered
};

class LinkedListIter;

class LinkedList {
public:
    using Destructor = void (*)(void*);

    // Creates and owns its own lock; if that cannot be allocated the list
    // works unguarded.
    explicit LinkedList(Destructor destructor = nullptr);
    // Uses the caller's lock (null: no locking) and never destroys it; the
    // lock must outlive the list.
    LinkedList(WSQL_Lock* lock, Destructor destructor);
    // Clears the list (every value reaches the destructor) and destroys an
    // owned lock. Iterators must be destroyed before their list; one still
    // registered is traced and forgotten.
    virtual ~LinkedList();
    LinkedList(const LinkedList&) = delete;
    LinkedList& operator=(const LinkedList&) = delete;

    // Links `v` as the new first entry. 0, or 2.
    [[nodiscard]] int AddEntry(void* v);
    // Links `v` as the new last entry. 0, or 2.
    [[nodiscard]] int AppendEntry(void* v);
    // Removes the first live entry holding `v`; its value goes to the
    // destructor (at once, or when the last iterator finishes). 0, or 5.
    int RemoveEntry(void* v);
    // Replaces the value of the first live entry holding `oldValue`; the
    // destructor is not called on `oldValue`. 0, or 5.
    int ChangeValue(void* oldValue, void* newValue);
    // Unlinks the first live entry and returns its value, or null on an empty
    // list. The destructor is NOT applied: ownership of the value passes to
    // the caller, who frees it. With iterators registered the entry is only
    // marked (and later unlinked without the destructor).
    void* RemoveFirst();
    // 1 when a live entry holds `v`, else 0.
    int OnList(void* v);
    // Number of live entries.
    unsigned NumEntries() const { return numEntries; }
    // Removes every entry; values reach the destructor in list order (at once,
    // or when the last iterator finishes).
    void Clear();

    // Acquire and release the list's lock if it has one.
    void Lock();
    void Unlock();

    // First linked element (live or marked), or null. REQUIRES: the list's
    // lock held by the caller when other threads use the list.
    LinkedListElem* getHead() const { return head; }

private:
    friend class LinkedListIter;

    unsigned mark() const { return markCount; }
    void incrMark() { ++markCount; }
    void decrMark() { --markCount; }
    void newIterator() { ++iteratorCount; }
    // Lowers the iterator count; the last iterator to finish unlinks every
    // marked element. REQUIRES: lock held.
    void iteratorFinished();
    // First live element holding `v`, or null. REQUIRES: lock held.
    LinkedListElem* findEntry(void* v);
    // Removes `e` (marks it while iterators are registered). REQUIRES: lock held.
    void removeEntry(LinkedListElem* e);
    // Links a new element before the head; `asHead` makes it the head. 0 or 2.
    int linkEntry(void* v, bool asHead);
    // Unlinks `e` from the ring and frees it; returns its value. REQUIRES: lock.
    void* unlinkElem(LinkedListElem* e);
    // Calls the destructor on each value of the detached chain `first` (linked
    // through Next, null-terminated) and frees the elements.
    void destroyChain(LinkedListElem* first);
    // Element room from the list's blocks; null when no block can be had.
    void* allocElem();
    // Destroys `e` (unlinking it) and keeps its room for reuse.
    void freeElem(LinkedListElem* e);

    uint16_t markCount = 0;      // marked entries still linked
    uint16_t iteratorCount = 0;  // registered iterators
    uint16_t ownsLock = 0;       // 1 when `lock` was created here
    uint16_t numEntries = 0;     // live entries
    LinkedListElem* head = nullptr;
    WSQL_Lock* lock = nullptr;
    Destructor destructor = nullptr;
    void* blocks = nullptr;     // element blocks, chained through their first word
    void* freeCells = nullptr;  // room of removed elements, chained
    uint32_t blockUsed = 0;     // cells handed out from the newest block
    uint32_t blockCells = 0;    // cells in the newest block
};

// A walk over a list. Registering (construction) and finishing (destruction)
// take the list's lock; so does each Next() and Remove(). The iterator must be
// destroyed before its list.
class LinkedListIter {
public:
    explicit LinkedListIter(LinkedList* l);
    virtual ~LinkedListIter();
    LinkedListIter(const LinkedListIter&) = delete;
    LinkedListIter& operator=(const LinkedListIter&) = delete;

    // Value of the next live entry, or null at the end; after the end the next
    // call starts a new walk at the head. A stored null value cannot be told
    // from the end of the walk.
    void* Next();
    // Removes the entry last returned by Next(). 0, or 5 when there is none
    // (before the first Next(), after the end, or already removed).
    int Remove();
    // Starts the walk again at the head on the next Next(). Takes no lock.
    void Reset() {
        current = nullptr;
        start = nullptr;
    }

private:
    // Moves `current` to its successor; null on coming back to `start`.
    void step();

    LinkedListElem* current = nullptr;  // element of the value last returned
    LinkedListElem* start = nullptr;    // head when the walk began
    LinkedList* list;
};
