// kuiimport: creating a situation from a situation export file (-i), and the
// builder of the situation column set that the base-situation path shares.
//
// An export file is UTF-8 text holding one XML document: a TABLE whose first
// child is the situation ROW (27 to 29 column elements, any order), followed
// by event-console slot rows (kuivec.h). A file beginning with "{AES" is
// enciphered and refused. Nothing is written to the server before every
// check has passed.
#pragma once

class KSH_DOMNode;

// Size of the buffer that carries the validated SITINFO to constructValues.
enum : int { KUI_SITINFO_SIZE = 256 };
// Longest export file name the command opens (with its terminator).
enum : int { KUI_FILENAME_SIZE = 512 };

// The whole -i path: reads and checks sitFileName, checks the names on the
// server (generating a short name when the name is taken but a long name
// exists), and writes the rows. 0, or the failing step's result.
[[nodiscard]] int createFromXMLFile(void* ctx, char* msgBuf, char** respSlot);

// Reads, parses and checks the export file and builds the column set and the
// slot rows. 0; 9 (errCode 11) the file cannot be opened; 8 empty (21),
// enciphered (26) or not parseable (17); 6 (7) not a valid export; or the
// event-destination query's result (errCode 97, 14, 99).
[[nodiscard]] int processFileName(const char* fileName, void* ctx);

// Checks the document's shape and every column of its ROW; sets sitName,
// longSitName, longNameExist, longNameDiscarded, tdstDiscarded and writes the
// validated SITINFO into *sitinfo (a KUI_SITINFO_SIZE buffer). 0, 6, or the
// event-destination query's result with errCode set.
[[nodiscard]] int validateSitExport(KSH_DOMNode* root, void* ctx, char** sitinfo);

// Builds the situation column set (elementArray, valueArray, arrayCount)
// from the children of `row`, replacing any set built before. Mode 0 (export
// file) takes SITNAME from sitName (curtailed) and SITINFO from *sitinfo;
// mode 1 (base situation) copies the row's values.
void constructValues(KSH_DOMNode* row, int mode, const char* const* sitinfo);
