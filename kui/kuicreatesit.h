// kuicreatesit: the command entry of the createsit module, its run flow, the
// login check and the coded result message.
//
// The framework loads the module and calls createsit once per execution of
// the command; one call is one run, from argument parsing to the coded result
// message in the caller's message buffer. The command prints nothing itself:
// the framework renders the coded message from "kuicreatesitErr.xml".
//
// A coded result message is the message number (three digits), a severity
// letter (I or E), "@" and a class letter (S or C), optionally followed by
// "@", the number of values and each value preceded by "@", e.g.
// "005I@S@2@NEWSIT@HP" ("HP" stands for the hub).
#pragma once

#define KUI_EXPORT __attribute__((visibility("default")))

extern "C" {

// The command entry.
//   argc, argv   the argument vector; entries 0 and 1 ("opcli", "createsit")
//                are not scanned, options start at entry 2. The value of -s
//                is trimmed in place.
//   msgBuf       the caller's message buffer of KUI_MSGBUF_SIZE bytes: emptied
//                on entry, scratch space for every SQL statement, emptied
//                after the creation step, finally the coded result message
//   respSlot     passed unchanged to the support library's queries
//   a5, a6, a8   not used
//   done         set to 'Y' at the end of every run, whatever the result
//   serverCtx    the framework's server context, passed unchanged to every
//                support-library call that talks to the server
// Returns 0 when the situation was created, else the non-zero result of the
// step that failed.
KUI_EXPORT int createsit(int argc, char** argv, char* msgBuf, char** respSlot, int a5, void* a6, char* done, void* a8,
                         void* serverCtx);

// Hands the module's contents descriptor, named "createsit", to the
// component inventory (kglcnmnt). Returns the inventory's result. Takes no
// part in a run.
KUI_EXPORT int cnt1entd(void);

}  // extern "C"

// 0 when the support library reports a logged-in user; else errCode 3 (with
// -s) or 8, the not-logged-in trace, and 2.
int checkLogin();

// Writes the coded result message for `code` into msgBuf (KUI_MSGBUF_SIZE
// bytes).
void constructErrMsg(int code, char* msgBuf);
