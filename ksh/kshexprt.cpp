// kshexprt: the output of a request to a file or to the warehouse (see
// kshexprt.h).
#include "kshexprt.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "bss1/bss1.h"
#include "khd/khd.h"
#include "kshanchor.h"
#include "kshfile.h"
#include "kshhttp.h"
#include "kshssrv.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshexprt");

namespace {

// The header of the snapshot record: 80 bytes, no line end.
const char kSnapshotHeader[] = "SNAPSHOT.USERID(char,0,16)\tWRITETIME(char,16,16)\tSNAPSHOT.XMLDATA(char,32,32000)";
static_assert(sizeof kSnapshotHeader - 1 == 80, "the snapshot header is 80 bytes");

// Room per name of the export's server list.
constexpr size_t kListEntrySize = 129;

// Serialises warehouse exports: "kshsnap" is one file for all of them.
BSS1_Once gSnapshotOnce;
BSS1_Lock gSnapshotLock;
void initSnapshotLock(void*) { (void)BSS1_InitializeLock(&gSnapshotLock); }

class SnapshotGuard {
public:
    SnapshotGuard() {
        BSS1_InitializeOnce(&gSnapshotOnce, initSnapshotLock, nullptr);
        BSS1_GetLock(&gSnapshotLock);
    }
    ~SnapshotGuard() { BSS1_ReleaseLock(&gSnapshotLock); }
    SnapshotGuard(const SnapshotGuard&) = delete;
    SnapshotGuard& operator=(const SnapshotGuard&) = delete;
};

// Writes `n` bytes to `name` (mode `mode`): 0, or 8 with the error traces.
int writeWhole(const char* name, const char* mode, const char* data, size_t n) {
    FILE* f = fopen(name, mode);
    if (f == nullptr) {
        int err = errno;
        RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open \"%s\" - %d\\\"%s\"", name, err, strerror(err));
        return WSQL_FAULT;
    }
    size_t written = fwrite(data, 1, n, f);
    int err = errno;
    bool closed = fclose(f) == 0;
    if (written != n || !closed) {
        if (!closed) err = errno;
        RAS1_Printf(RAS1_THIS, __LINE__, "Error writing \"%s\" - %d\\\"%s\"", name, err, strerror(err));
        return WSQL_FAULT;
    }
    return WSQL_OK;
}

// The export's server list from the anchor's name list: each name with its
// terminator, one after another, and one more terminator. Malloc'd, or null.
char* nameList(const WSQL_LocalServer* local) {
    int count = local != nullptr && local->names != nullptr && local->numNames > 0 ? local->numNames : 0;
    char* list = static_cast<char*>(calloc(static_cast<size_t>(count) * kListEntrySize + 1, 1));
    char* p = list;
    for (int i = 0; p != nullptr && i < count; i++) {
        size_t n = strnlen(local->names[i], sizeof local->names[i]);
        if (n == 0) continue;  // an empty name would end the list early
        memcpy(p, local->names[i], n);
        p += n + 1;
    }
    return list;
}

}  // namespace

WSQL_ExportRequest::WSQL_ExportRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document)
    : WSQL_MetaRequest(hub, http, document),
      fileName(nullptr),
      pathBuffer(nullptr),
      outputFile(nullptr),
      outputStarted(0),
      warehouse(0),
      dateTimeParms{0, -1, 0, {0, 0, 0, 0, 0, 0}} {}

WSQL_ExportRequest::~WSQL_ExportRequest() {
    delete outputFile;
    free(pathBuffer);
}

int WSQL_ExportRequest::initOnce() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = writeWhole(WSQL_SNAPSHOT_HEADER_FILE, "w", kSnapshotHeader, sizeof kSnapshotHeader - 1);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_ExportRequest::parseXML() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_OK;
    unsigned n = 0;
    if (document->testElement("warehouse") == WSQL_OK) {
        warehouse = 1;
    } else if (document->getElementValue("filename", &fileName, &n) != WSQL_OK) {
        fileName = nullptr;
    } else {
        unsigned st = parseDateTimeVariable(fileName, &dateTimeParms);
        if (st != WSQL_OK && st != WSQL_NOTFOUND) {
            getHttp()->setRequestError(true, "Invalid export filename date/time stamp variable.", fileName, 0);
            rc = static_cast<int>(st);
        }
    }
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "CT_Export warehouse %d filename \"%s\"", warehouse, fileName ? fileName : "");
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_ExportRequest::constructPath() {
    int ras = RAS1_Sync(RAS1_THIS);
    WSQL_HttpServer* http = getHttp();
    pathBuffer = static_cast<char*>(calloc(WSQL_EXPORT_PATH_SIZE, 1));
    size_t nameLength = strlen(fileName);
    char* expanded = static_cast<char*>(malloc(nameLength + 1));
    if (pathBuffer == nullptr || expanded == nullptr) {
        free(expanded);
        http->setRequestMemoryError();
        return WSQL_NOMEM;
    }
    (void)insertDateTimeValue(fileName, expanded, &dateTimeParms);
    int rc = WSQL_OK;
    int n = 0;
    if (strchr(fileName, '/') != nullptr) {
        n = snprintf(pathBuffer, WSQL_EXPORT_PATH_SIZE, "%s", expanded);
    } else if (!staysInFileDirectory(expanded)) {
        RAS1_Printf(RAS1_THIS, __LINE__, "CT_Export filename \"%s\" refused", expanded);
        http->setRequestError(true, "Invalid export filename.", fileName, 0);
        rc = WSQL_BADINPUT;
    } else if (strlen(expanded) > 2) {
        const char* dir = WSQL_GetFileDirectory();
        size_t dn = strlen(dir);
        n = snprintf(pathBuffer, WSQL_EXPORT_PATH_SIZE, "%s%s%s", dir, dn > 0 && dir[dn - 1] == '/' ? "" : "/",
                     expanded);
    } else {
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "CT_Export filename \"%s\"", expanded);
        n = snprintf(pathBuffer, WSQL_EXPORT_PATH_SIZE, "%s", expanded);
    }
    // A cut path would name another file.
    if (rc == WSQL_OK && (n < 0 || static_cast<size_t>(n) >= WSQL_EXPORT_PATH_SIZE)) {
        http->setRequestError(true, "Export filename too long.", fileName, 0);
        rc = WSQL_BADINPUT;
    }
    free(expanded);
    if (rc == WSQL_OK) fileName = pathBuffer;
    if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "CT_Export path \"%s\" rc %d", pathBuffer, rc);
    return rc;
}

int WSQL_ExportRequest::setupOutput() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    outputStarted = 0;
    int rc = WSQL_MetaRequest::setupOutput();
    if (rc == WSQL_OK && fileName != nullptr) rc = constructPath();
    if (rc == WSQL_OK && fileName != nullptr) {
        outputFile = new (std::nothrow) WSQL_File(fileName, WSQL_FILE_WRITE);
        if (outputFile == nullptr || outputFile->getName() == nullptr) {
            getHttp()->setRequestMemoryError();
            rc = WSQL_NOMEM;
        } else if (strlen(fileName) > 1) {
            rc = outputFile->open(getHttp());
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void WSQL_ExportRequest::buildSnapshotRecord(char* record, const char* userid, time_t now, const char* data,
                                             size_t length) {
    memset(record, ' ', WSQL_SNAPSHOT_RECORD_SIZE);
    memcpy(record, userid, strnlen(userid, WSQL_CREDENTIAL_SIZE));
    struct tm t;
    BSS1_LocalTime(now, &t);
    char stamp[48];
    snprintf(stamp, sizeof stamp, "%03d%02d%02d%02d%02d%02d%03d", t.tm_year, t.tm_mon + 1, t.tm_mday, t.tm_hour,
             t.tm_min, t.tm_sec, 0);
    memcpy(record + 16, stamp, 16);
    if (data != nullptr)
        memcpy(record + WSQL_SNAPSHOT_DATA_OFFSET, data, length < WSQL_SNAPSHOT_DATA_SIZE ? length : WSQL_SNAPSHOT_DATA_SIZE);
}

int WSQL_ExportRequest::exportTable() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    char* record = static_cast<char*>(malloc(WSQL_SNAPSHOT_RECORD_SIZE));
    if (record == nullptr) {
        RAS1_EXIT_RC(ras, WSQL_NOMEM);
        return WSQL_NOMEM;
    }
    buildSnapshotRecord(record, subRequest.userid, BSS1_Time(), outputData, outputLength);
    SnapshotGuard guard;
    int rc = writeWhole(WSQL_SNAPSHOT_FILE, "wb", record, WSQL_SNAPSHOT_RECORD_SIZE);
    free(record);
    if (rc == WSQL_OK) {
        const WSQL_LocalServer* local = gAnchor != nullptr ? gAnchor->localServer : nullptr;
        char host[sizeof local->alias + 1] = "";
        if (local != nullptr) snprintf(host, sizeof host, "%.*s", static_cast<int>(strnlen(local->alias, sizeof local->alias)), local->alias);
        char* list = nameList(local);
        int st = list != nullptr ? KHD_ExportHistory(KHD_SNAPSHOT, WSQL_SNAPSHOT_FILE, 0, 0, 0, 0, 0, 0, host, 0, 0, 0,
                                                     list, 0, 0)
                                 : KHD_NOMEM;
        if (st != KHD_OK) {
            RAS1_Printf(RAS1_THIS, __LINE__, "History export of \"%s\" failed: %d", WSQL_SNAPSHOT_FILE, st);
            getHttp()->setRequestError(false, "Error attempting to export to Data Warehouse.", nullptr, 0);
        }
        free(list);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_ExportRequest::processResults() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = WSQL_OK;
    if (fileName != nullptr) {
        if (outputFile != nullptr && strlen(fileName) > 1) {
            rc = outputFile->write(outputData != nullptr ? outputData : "", outputLength, getHttp());
            outputFile->close();
        }
    } else if (warehouse) {
        rc = exportTable();
    } else {
        rc = WSQL_BADINPUT;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
