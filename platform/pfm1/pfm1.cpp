// pfm1: the report of an abnormal end.
#include "pfm1/pfm1.h"

RAS1_UNIT("pfm1");

void PFM1_ReportAbend(const char* where, const char* what) {
    // Always written: an abnormal end is an error whatever the trace level.
    RAS1_Printf(RAS1_THIS, __LINE__, "Abnormal end in %s: %s; result %d", where ? where : "?", what ? what : "?",
                PFM1_ABEND);
}
