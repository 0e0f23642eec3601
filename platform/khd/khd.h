// khd: mail and history export of the platform.
//
// KHD_SendMail sends a request's output as an e-mail over SMTP (libcurl):
// a MIME message with the text `message` (when given) and the output as an
// attachment named by the attachment title.
//
// KHD_ExportHistory stores the records of a snapshot data file in the
// warehouse table of a hub store. The data file holds fixed-length records;
// its header file (by default the data file's name with ".hdr" appended)
// describes their fields, tab-separated, each as NAME(char,OFFSET,LENGTH),
// for instance
//     SNAPSHOT.USERID(char,0,16)\tWRITETIME(char,16,16)\tSNAPSHOT.XMLDATA(char,32,32000)
// The part of NAME after its last '.' names the column; the record length is
// the largest OFFSET + LENGTH. Each record becomes one row of the table
// (default "WAREHOUSE.SNAPSHOT"), each field the value of its column with
// trailing blanks removed, and the host name goes into the column HOSTNAME.
// The rows are written through the SQL client layer (sql1) with the
// process's own login id, so user validation does not apply: to the local
// server's store when the server list is empty, else to the store of every
// server the list names (LMS names, looked up like any other).
//
// Results of both: 0 success; 2 bad argument (missing server, sender,
// receiver or file; a field with a line break; an unknown flag or a reserved
// argument that is not 0; a malformed header file); 5 the mail server cannot
// be reached, or a named server is not known; 7 no memory; 8 another
// failure (the mail server refused the message, the data file cannot be
// read or holds a partial record, the store refused the row). The failing
// detail is traced under the error class.
//
// Thread safety: every call may be made from any thread.
#pragma once

#include <cstddef>
#include <cstdint>

enum : int {
    KHD_OK = 0,
    KHD_BADARG = 2,
    KHD_UNREACHABLE = 5,
    KHD_NOMEM = 7,
    KHD_FAILED = 8,
};

// Flags of KHD_ExportHistory.
enum : uint32_t {
    KHD_SNAPSHOT = 0x80000000u,  // the data file holds snapshot records (the only kind known)
};

// Sends one message. `flags` must be 0.
//   server      "host", "host:port" (SMTP, port 25 by default) or an
//               smtp:// or smtps:// URL;
//   receiver    one or more addresses separated by ',' or ';';
//   sender      the envelope and From address;
//   subject     optional (null or empty: no subject); non-ASCII text is
//               sent encoded;
//   message     optional text, the first part of the message;
//   title       file name of the attachment (null or empty: "output.xml");
//   data        the attachment's bytes, `dataLength` of them (text/xml).
// Addresses are given bare or in angle brackets; an address holding a blank,
// a line break or another bracket is refused. Time limits: connecting
// KHD_CONNECT_TIMEOUT seconds (default 5), the whole exchange KHD_TIMEOUT
// (default 60).
[[nodiscard]] int KHD_SendMail(int flags, const char* server, const char* receiver, const char* sender,
                               const char* subject, const char* message, const char* title, const char* data,
                               size_t dataLength);

// Stores the records of `dataFile`. Arguments:
//   flags       KHD_SNAPSHOT;
//   dataFile    the record file;
//   headerFile  its header (null: dataFile + ".hdr");
//   table       the warehouse table (null: "WAREHOUSE.SNAPSHOT");
//   reserved5..reserved8, reserved10..reserved12, reserved14, reserved15:
//               must be 0 (kept for the calling convention of the history
//               export);
//   hostName    the value of the HOSTNAME column (null: empty);
//   serverList  names, each NUL-terminated, one after another, ended by an
//               empty name (a lone NUL or null: the local server).
[[nodiscard]] int KHD_ExportHistory(uint32_t flags, const char* dataFile, const char* headerFile, const char* table,
                                    long reserved5, long reserved6, long reserved7, long reserved8, const char* hostName,
                                    long reserved10, long reserved11, long reserved12, const char* serverList,
                                    long reserved14, long reserved15);
