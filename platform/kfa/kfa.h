// kfa: the thru-node resolver. Given a managed system of a hub, it names
// the node through which the hub reaches that system now, read from the
// node status rows of the hub's store (O4SRV.INODESTS, column THRUNODE).
//
// The gateway loads it by symbol (cnt1) as "KFARSVTN", from a module named
// KFAPRB when one is installed, else from the platform library itself.
//
// Thread safety: may be called from any thread.
#pragma once

extern "C" {

// Writes the thru-node of `managedSystem` on the hub whose LMS name is
// `lmsName` into `thruNode` (`size` bytes, always terminated); an empty text
// when the store has no row for it. Returns 0, or a status of the SQL layer
// (sql1.h) when the store cannot be read, with `thruNode` empty.
__attribute__((visibility("default"))) int KFARSVTN(const char* lmsName, const char* managedSystem, char* thruNode,
                                                    int size);
}
