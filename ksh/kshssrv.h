// kshssrv: the hubs the gateway serves and the hub list file.
//
// gHubList holds one WSQL_Hub per served hub, in the order of the hub list
// file, the local hub last. The hub list file (KSH_HUB_FILE, default
// "kshxhubs.xml", in the file directory) is an XML document with root
// ENTERPRISE and one HUB element per hub (Alias, LMS_Name, optional
// Service_Name and Access lists). It is read at start and rewritten when a
// client adds or removes hubs: the new version is written beside the file as
// "_NAME", checked (every write, flush, sync and close), and only then the
// current file becomes the backup "_NAME~" and the new version takes its
// place. A rewrite that fails leaves the current file as it was.
//
// Thread safety: gHubList is guarded by its own lock (walk it with a
// LinkedListIter). WSQL_Add_New_Hub and WSQL_Remove_Hubs are serialised
// against each other by a lock of this component, since they share the
// new-version and backup files.
#pragma once

#include <cstdio>

#include "kshlst.h"

class WSQL_Hub;
struct WSQL_Anchor;

// The hubs of the running gateway (WSQL_Hub*, owned by the list), or null
// before the gateway has built them.
extern LinkedList* gHubList;

// The file directory (KSH_DIRECTORY, default "HTML") as the running gateway
// read it at start; before that, the current value of the variable.
const char* WSQL_GetFileDirectory();
// Records `dir` as the file directory (startServer does it). The text is
// copied.
void WSQL_SetFileDirectory(const char* dir);

// The first hub of gHubList whose alias equals `alias` ignoring case, or
// null. The hub stays valid while the gateway runs.
WSQL_Hub* searchHubList(const char* alias);

// Opens "directory/name" (directory null: the file directory). Mode "read"
// opens for reading, any other mode for writing (truncating). The stream, or
// null (traced). The caller closes it with fclose.
FILE* WSQL_open_file(const char* name, const char* directory, const char* mode);

// Reads the hubs of an open hub list file. A new list (destructor deleting
// the hubs, owned by the caller), or null when the file names no hub. A HUB
// with the alias "soap" sets WSQL_ANCHOR_LOCALHUB in `anchor` (when given).
LinkedList* WSQL_process_hub_file(WSQL_Anchor* anchor, FILE* stream);

// The hub list of a starting gateway: the file's hubs, in START mode the
// local hub appended when the file did not name it, outside START mode (with
// an anchor) a default hub when there is none. New list owned by the caller,
// or null.
LinkedList* WSQL_build_hub_list(WSQL_Anchor* anchor);

// Starts a new hub (its service thread) and adds it to gHubList and to the
// hub list file. 0, the thread-creation status, -1 when a file cannot be
// opened, 8 when the new version cannot be written completely (the file is
// then unchanged), or the status of the swap. `qualifier` may be null.
int WSQL_Add_New_Hub(const char* lmsName, const char* serviceName, const char* alias, const char* qualifier);

// Removes the hubs at the positions `list` names ("#2#5": the 2nd and 5th
// HUB of the file, ascending) from the hub list file. Running hubs are not
// touched; the removal takes effect at the next start. 0, -1 when a file
// cannot be opened, 8 when the new version cannot be written completely
// (the file is then unchanged), or the status of the swap.
int WSQL_Remove_Hubs(const char* list);

// Swaps a completely written new version in (all names in the file
// directory): deletes the old backup, renames the current file to the
// backup, then the new version to the current name. The status of the last
// rename attempted (0 or errno).
int WSQL_Backup_and_Save(const char* name, const char* backupName, const char* newName);

// Test hook for the rewrite: a function called before every write of the
// new-version file with the running count (1, 2, ...); a non-zero result
// makes that write fail. Null: no hook.
using WSQL_HubFileWriteHook = int (*)(unsigned writeNumber);
void WSQL_SetHubFileWriteHook(WSQL_HubFileWriteHook hook);
