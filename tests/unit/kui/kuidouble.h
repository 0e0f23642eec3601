// A double of the support library's server side for the command's unit
// tests: scripted look-up answers and replies per statement, and a record of
// every statement and look-up the command made. The text helpers
// (kuitext.cpp, kuireply.cpp) are the real ones.
#pragma once

#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

// One scripted reply: the first script whose `match` occurs in a statement
// answers it (`uses` times, -1 for ever) with `rc` and, when rc is 0, `reply`.
struct KuiScript {
    std::string match;
    int rc = 0;
    std::string reply;
    int uses = -1;
};

struct KuiFakeServer {
    bool loggedIn = true;
    std::string version = "06.30";
    int versionRc = 0;
    std::set<std::string> situations;              // short names in TSITDESC
    std::map<std::string, std::string> longNames;  // TNAME: full name -> short name
    int eventRc = 0;                               // GetEventID result
    std::vector<std::string> events;               // event destination ids
    std::vector<KuiScript> scripts;
    // Look-up results forced for the next calls of a kind ("TNAME",
    // "TSITDESC", "UADVISOR"), consumed front first.
    std::map<std::string, std::vector<int>> forced;

    std::vector<std::string> statements;  // every statement issueSoapRequest got
    std::vector<std::string> lookups;     // "TNAME:x", "TSITDESC:x", "UADVISOR:x", "VERSION", "EVENTS"
    std::vector<std::string> displayed;   // ids shown with displayMsg
    int uuids = 0;                        // identifiers handed out

    // Statements that begin with `prefix`.
    std::vector<std::string> sent(const std::string& prefix) const;
};

KuiFakeServer& kuiFake();
void kuiResetFake();

// A reply as the gateway writes it: the SOAP envelope around a TABLE with
// one ROW per entry, each ROW holding its (column, value) elements. Values
// holding markup characters are written as CDATA.
using KuiRow = std::vector<std::pair<std::string, std::string>>;
std::string kuiTableReply(const std::string& table, const std::vector<KuiRow>& rows);
// The reply of a successful INSERT.
std::string kuiInsertReply();
// A SOAP fault reply (no table).
std::string kuiFaultReply();
