// anc1: numeric handle aliases. A process-wide table gives an object pointer
// an unsigned number that clients can hold (a persisted request's handle),
// converts the number back, and releases it.
//
// An alias is (generation << 16) | slot. A released slot is reused only
// after at least 256 others, and each reuse bumps its 16-bit generation, so
// an old alias resolves to nothing rather than to a newer object. 0 is never
// an alias. At most 65535 aliases are reserved at the same time.
//
// Thread safety: every call may be made from any thread.
#pragma once

enum : int {
    ANC1_OK = 0,
    ANC1_BADARG = 2,    // null object or result pointer
    ANC1_NOTFOUND = 5,  // the alias was never issued, or was released
    ANC1_FULL = 7,      // no slot left
};

// Reserves a new alias for `object` (not owned by the table).
[[nodiscard]] int ANC1_Reserve(void* object, unsigned* alias);
// The object of `alias`, or ANC1_NOTFOUND with *object null.
[[nodiscard]] int ANC1_Convert(unsigned alias, void** object);
// Releases `alias`; later conversions of it fail.
int ANC1_Release(unsigned alias);
