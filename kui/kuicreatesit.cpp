// kuicreatesit: the module state, the run flow of createsit, the login check,
// the coded result message and the release of the state.
#include "kuicreatesit.h"

#include <cstdio>
#include <cstring>

#include "kgl/kglcnmnt.h"
#include "kuibase.h"
#include "kuiimport.h"
#include "kuiopts.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "pfm1/pfm1.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuicreatesit");

// --- the module state (see kuistate.h)
const char* const KUI_QIBUSER = "&QIBUSER";
const char* const KUI_SITCLASS = "5140";

char** propertyName = nullptr;
char** propertyValue = nullptr;
int propertyCount = 0;
int propertySlots = 0;
char invalidNVPair = 'N';
char** elementArray = nullptr;
char** valueArray = nullptr;
int arrayCount = 0;
int arrayCapacity = 0;
char** vecValArray = nullptr;
int noOfVecRows = 0;
int vecSlotExist = 0;
char* distList = nullptr;
int distPresent = 0;
char objAcclArray[KUI_OBJACCL_SLOTS][KUI_OBJACCL_WIDTH];
int distInserted = 0;
int sitInserted = 0;
char* sitFileName = nullptr;
std::string displayFileName;
char* sitName = nullptr;
char* longSitName = nullptr;
char* baseSitName = nullptr;
char* basesitShortName = nullptr;
char* vemsVersion = nullptr;
char reev_days[10];
char reev_time[8];
int errCode = 0;
int sitFilePresent = 0;
int sitPresent = 0;
int baseSitNamePresent = 0;
int propOptPresent = 0;
int longNameExist = 0;
int duplicateFullName = 0;
int longNameDiscarded = 0;
int tdstDiscarded = 0;

namespace {

const char kNotLoggedIn[] =
    "User not logged in, login into the server using opcli login command and try executing the command again";
const char kOldVersion[] = "06.21";

const KGL_Contents kContents = {"createsit", "06.30", "creates situations on the hub monitoring server"};
bool registered = false;

// The message forms of constructErrMsg, by errCode. The format receives the
// message number, then the value (when the form has one).
enum class Value { None, SitOrLong, DupOrSit, Base, Long, File };
struct MessageForm {
    int code;
    const char* format;
    Value value;
};
const MessageForm kForms[] = {
    {1, "00%dE@S", Value::None},          {2, "00%dE@S", Value::None},
    {3, "00%dE@S", Value::None},          {6, "00%dE@S", Value::None},
    {7, "00%dE@S", Value::None},          {8, "00%dE@S", Value::None},
    {4, "00%dE@S@2@%s@HP", Value::DupOrSit}, {5, "00%dE@S@2@%s@HP", Value::Base},
    {9, "00%dE@S@2@%s@HP", Value::Long},  {11, "0%dE@C@1@%s", Value::File},
    {21, "0%dE@C@1@%s", Value::File},     {14, "0%dE@C", Value::None},
    {17, "0%dE@S@1@%s", Value::File},     {26, "0%dE@S@1@%s", Value::File},
    {39, "0%dE@S@1@%s", Value::Base},
};
// Codes written "0%dE@S" without a value.
const int kPlainCodes[] = {15, 16, 19, 22, 24, 27, 28, 29, 30, 31, 32, 33, 35, 36, 37, 38, 97, 99};

const char* valueFor(Value v) {
    switch (v) {
        case Value::SitOrLong: return kuiText(longNameExist ? longSitName : sitName);
        case Value::DupOrSit: return kuiText(duplicateFullName ? longSitName : sitName);
        case Value::Base: return kuiText(baseSitName);
        case Value::Long: return kuiText(longSitName);
        case Value::File: return displayFileName.c_str();
        case Value::None: break;
    }
    return "";
}

void releaseArray(char**& array, int used) {
    if (!array) return;
    for (int i = 0; i < used; i++) delete[] array[i];
    delete[] array;
    array = nullptr;
}

// The run from argument parsing to the creation step; its result is rc.
int runSteps(int argc, char** argv, char* msgBuf, char** respSlot, void* ctx) {
    int ras = RAS1_Sync(RAS1_THIS);
    parseArgs(argc, argv);
    int rc = checkLogin();
    if (rc == 0) rc = checkArguments(argc, argv, ctx);
    if (rc == 0) {
        rc = getVemsVersion(ctx, msgBuf, respSlot, &vemsVersion);
        // Any other failure of the version query counts as an internal error
        // (the run still ends with the query's own result).
        const int kind = (rc == 0 || rc == KUIR_SERVER || rc == KUIR_COMM) ? rc : KUIR_INTERNAL;
        KUI_QUERY_FAILED(ras, kind, "Server exception occurred while retrieving the VEMS version from the server",
                         "Communication error occurred, SOAP query failed while retrieving the VEMS version from the server",
                         "Internal error occurred while retrieving the VEMS version from the server");
    }
    if (rc == 0) KUI_TRACE_DETAIL(ras, "VEMS version is [%s] :", kuiText(vemsVersion));
    if (rc == 0 && sitFilePresent == 1) rc = createFromXMLFile(ctx, msgBuf, respSlot);
    else if (rc == 0 && sitPresent == 1 && baseSitNamePresent == 1) rc = createFromBaseSituation(ctx, msgBuf, respSlot);
    return rc;
}

}  // namespace

char* kuiDup(const char* s) {
    s = kuiText(s);
    size_t n = strlen(s) + 1;
    char* c = new char[n];
    memcpy(c, s, n);
    return c;
}

void kuiFree(char*& p) {
    delete[] p;
    p = nullptr;
}

void kuiReplace(char*& p, const char* s) {
    char* c = kuiDup(s);
    delete[] p;
    p = c;
}

bool kuiQueryFailed(RAS1_Unit& unit, int line, int ras, int rc, const KuiQueryTexts& texts) {
    const char* text;
    switch (rc) {
        case KUIR_SERVER: errCode = KUIE_SERVER; text = texts.server; break;
        case KUIR_COMM: errCode = KUIE_COMM; text = texts.comm; break;
        case KUIR_INTERNAL: errCode = KUIE_INTERNAL; text = texts.internal; break;
        default: return false;
    }
    if (text && (ras & RAS1_ERROR)) RAS1_Printf(unit, line, "%s", text);
    return true;
}

bool kuiOldServer() { return !vemsVersion || strncmp(vemsVersion, kOldVersion, 5) < 0; }

int checkLogin() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    if (!getUserAuthorization()) {
        errCode = sitPresent == 1 ? KUIE_NOLOGIN_SIT : KUIE_NOLOGIN;
        KUI_TRACE_ERROR(ras, "%s", kNotLoggedIn);
        rc = KUIR_NOLOGIN;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void constructErrMsg(int code, char* msgBuf) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (code == 0) {
        const char* name = valueFor(Value::SitOrLong);
        if (tdstDiscarded) snprintf(msgBuf, KUI_MSGBUF_SIZE, "0%dI@S@2@%s@HP", 34, name);
        else snprintf(msgBuf, KUI_MSGBUF_SIZE, "00%dI@S@2@%s@HP", 5, name);
    } else {
        bool done = false;
        for (const MessageForm& f : kForms)
            if (f.code == code) {
                if (f.value == Value::None) snprintf(msgBuf, KUI_MSGBUF_SIZE, f.format, code);
                else snprintf(msgBuf, KUI_MSGBUF_SIZE, f.format, code, valueFor(f.value));
                done = true;
            }
        for (int c : kPlainCodes)
            if (!done && c == code) {
                snprintf(msgBuf, KUI_MSGBUF_SIZE, "0%dE@S", code);
                done = true;
            }
        if (!done) snprintf(msgBuf, KUI_MSGBUF_SIZE, "0%dE@C", 99);
    }
    KUI_TRACE_ERROR(ras, "The Error/information message formed is %s", msgBuf);
    RAS1_EXIT(ras);
}

void deallocation() {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_DETAIL(ras, "Deallocating the allocated memory");
    kuiFree(sitName);
    kuiFree(longSitName);
    kuiFree(basesitShortName);
    kuiFree(baseSitName);
    kuiFree(distList);
    releaseArray(elementArray, arrayCount);
    releaseArray(valueArray, arrayCount);
    // Every filled slot is released, also those of pairs with an empty name
    // that propertyCount does not count.
    releaseArray(propertyName, propertySlots);
    releaseArray(propertyValue, propertySlots);
    releaseArray(vecValArray, noOfVecRows * 10);
    KUI_TRACE_DETAIL(ras, "deallocated the memory");
}

void kuiResetState() {
    deallocation();
    propertyCount = propertySlots = 0;
    invalidNVPair = 'N';
    arrayCount = arrayCapacity = 0;
    noOfVecRows = vecSlotExist = 0;
    distPresent = distInserted = sitInserted = 0;
    memset(objAcclArray, 0, sizeof objAcclArray);
    sitFileName = nullptr;
    displayFileName.clear();
    vemsVersion = nullptr;
    reev_days[0] = reev_time[0] = '\0';
    errCode = sitFilePresent = sitPresent = baseSitNamePresent = propOptPresent = 0;
    longNameExist = duplicateFullName = longNameDiscarded = tdstDiscarded = 0;
}

extern "C" int createsit(int argc, char** argv, char* msgBuf, char** respSlot, int, void*, char* done, void*,
                         void* serverCtx) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = KUIR_INTERNAL;
    if (msgBuf) {
        msgBuf[0] = '\0';
        // A C entry lets no exception out: an allocation failure ends the
        // run as an internal error, and the closing steps still run.
        rc = PFM1_Guard("createsit", [&] { return runSteps(argc, argv, msgBuf, respSlot, serverCtx); });
        msgBuf[0] = '\0';
        // A failed step always names its error: a failure must never be
        // reported with the message of a created situation.
        if (rc != 0 && errCode == 0) errCode = KUIE_INTERNAL;
        if (rc == 0 && longNameDiscarded == 1) displayMsg("098W", 0, "kuicreatesitErr.xml", 1, 0, 1);
        constructErrMsg(errCode, msgBuf);
    }
    deallocation();
    if (done) *done = 'Y';
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

extern "C" int cnt1entd(void) {
    int rc = kglcnmnt(&kContents);
    registered = registered || rc == KGL_CN_OK;
    return rc;
}

// The inventory keeps a pointer to kContents: take it back before the
// module's storage goes away.
__attribute__((destructor)) static void kuiUnregister() {
    if (registered) kglcnrmv(kContents.name);
}
