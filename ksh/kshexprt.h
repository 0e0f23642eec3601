// kshexprt: the export request (method CT_Export).
//
// The output of the request (its batch between prefix and suffix) goes
// either to a file or, with a "warehouse" element, to the warehouse:
//   - "filename": the name may hold a date/time variable ($yymmdd$ and the
//     like, see kshutil.h), replaced by the current local time. A name with
//     a "/" is a path of its own; any other name lies in the file directory
//     (a name of 1 or 2 characters is used as it is). A name without "/"
//     that begins with "." is refused, so that it cannot leave the file
//     directory, and so is a path longer than 260 characters.
//   - "warehouse": one snapshot record of 32032 bytes (user id of the last
//     CT_Get, write time, the first 32000 bytes of the output, blanks) is
//     written to the file "kshsnap" of the current directory and handed to
//     the platform's history export (KHD_ExportHistory), which stores it in
//     the hub store's warehouse table. The header "kshsnap.hdr" describing
//     the record is written once at gateway start (initOnce).
// With both elements the warehouse wins; with neither the result is 6.
//
// Concurrency: warehouse exports of this process are serialised by one
// lock held from writing "kshsnap" until the history export has read it,
// so two requests never share the file half-written. (Two gateway processes
// must not share a current directory.)
//
// Results: 0; 5 the file cannot be opened (client fault "Unable to open
// file."); 6 neither file nor warehouse, or a refused file name; 7 no
// memory; 8 snapshot or output file errors; the date/time parser's result
// for a bad variable (client fault "Invalid export filename date/time stamp
// variable."). A failed history export records the server fault "Error
// attempting to export to Data Warehouse." with result 0.
#pragma once

#include <cstddef>
#include <cstdint>
#include <ctime>

#include "kshmtrq.h"
#include "kshutil.h"

class WSQL_File;

// The snapshot files, in the process's current directory.
constexpr const char* WSQL_SNAPSHOT_FILE = "kshsnap";
constexpr const char* WSQL_SNAPSHOT_HEADER_FILE = "kshsnap.hdr";
// The snapshot record and its parts.
constexpr size_t WSQL_SNAPSHOT_RECORD_SIZE = 32032;
constexpr size_t WSQL_SNAPSHOT_DATA_OFFSET = 32;
constexpr size_t WSQL_SNAPSHOT_DATA_SIZE = 32000;
// Room of the path buffer, terminator included.
constexpr size_t WSQL_EXPORT_PATH_SIZE = 261;

class WSQL_ExportRequest : public WSQL_MetaRequest {
public:
    WSQL_ExportRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document);
    // Releases the path buffer and deletes the output file (closing it).
    ~WSQL_ExportRequest() override;

    // Writes the snapshot header file. 0, or 8 (traced).
    static int initOnce();

    int parseXML() override;
    // The prefix, then the output file is made and opened.
    int setupOutput() override;
    int processResults() override;

    // The path the output goes to (after setupOutput), or null.
    const char* getFileName() const { return fileName; }
    bool isWarehouse() const { return warehouse != 0; }

    // Fills `record` (WSQL_SNAPSHOT_RECORD_SIZE bytes) from the user id
    // field (16 bytes, not necessarily terminated), the time `now` and the
    // output. Exposed for tests.
    static void buildSnapshotRecord(char* record, const char* userid, time_t now, const char* data, size_t length);

private:
    int constructPath();
    int exportTable();

    char* fileName;          // the "filename" value in the document; then pathBuffer
    char* pathBuffer;        // WSQL_EXPORT_PATH_SIZE bytes (malloc), owned
    WSQL_File* outputFile;   // owned
    int32_t outputStarted;
    int16_t warehouse;
    dateTimeVariableParms dateTimeParms;
};
