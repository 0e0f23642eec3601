// kshstrtspc: set-up of the special requests' layers at gateway start.
//
// The special requests (transform, export) keep no process-wide state yet,
// so there is nothing to prepare for them: both calls do nothing.
#include "kshstrt.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshstrtspc");

void WSQL_InitTransformLayer() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "The transform layer needs no set-up");
}

void WSQL_InitExportLayer() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "The export layer needs no set-up");
}
