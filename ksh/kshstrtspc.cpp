// kshstrtspc: set-up of the special requests' layers at gateway start: the
// stylesheet transformer and the export layer (its snapshot header file).
#include "kshexprt.h"
#include "kshstrt.h"
#include "kshxslt.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshstrtspc");

void WSQL_InitTransformLayer() {
    int ras = RAS1_Sync(RAS1_THIS);
    int rc = WSQL_XSLT::initOnce();
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Transform layer ready: %d", rc);
}

void WSQL_InitExportLayer() {
    int ras = RAS1_Sync(RAS1_THIS);
    // A header that cannot be written is traced by initOnce; warehouse
    // exports then fail on their own.
    int rc = WSQL_ExportRequest::initOnce();
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Export layer ready: %d", rc);
}
