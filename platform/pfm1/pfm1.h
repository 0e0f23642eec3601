// pfm1: recovery frames. A guarded region runs a body and turns a C++
// exception escaping it (allocation failure included) into result 8 with a
// trace line naming the region. Signals are not caught.
#pragma once

#include <exception>
#include <new>

#include "ras1/ras1.h"

enum : int { PFM1_ABEND = 8 };  // result of a region that ended abnormally

// Records the abnormal end of region `where` under the error class.
void PFM1_ReportAbend(const char* where, const char* what);

// Runs `body` (returning int) inside a recovery frame.
template <class Body>
int PFM1_Guard(const char* where, Body&& body) noexcept {
    try {
        return body();
    } catch (const std::bad_alloc&) {
        PFM1_ReportAbend(where, "allocation failure");
    } catch (const std::exception& e) {
        PFM1_ReportAbend(where, e.what());
    } catch (...) {
        PFM1_ReportAbend(where, "unknown exception");
    }
    return PFM1_ABEND;
}
