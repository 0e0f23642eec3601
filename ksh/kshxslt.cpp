// kshxslt: the stylesheet transformer that does not transform (see kshxslt.h).
#include "kshxslt.h"

#include "ras1/ras1.h"

RAS1_UNIT("kshxslt");

int WSQL_XSLT::initOnce() {
    int ras = RAS1_Sync(RAS1_THIS);
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "No stylesheet engine: transforms report failure");
    return 0;
}

int WSQL_XSLT::transformObject(const char* input, uint32_t length, const char* stylesheet, char** output,
                               uint32_t* outputLength) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    (void)input;
    (void)output;
    (void)outputLength;
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Stylesheet \"%s\" not applied to %u bytes", stylesheet ? stylesheet : "",
                    length);
    RAS1_EXIT_RC(ras, WSQL_XSLT_FAILED);
    return WSQL_XSLT_FAILED;
}
