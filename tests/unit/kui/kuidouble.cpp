// The scripted support-library double (see kuidouble.h).
#include "kuidouble.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "kshlst.h"
#include "kuisupport.h"

namespace {

KuiFakeServer fakeServer;

char* mallocCopy(const std::string& s) {
    char* c = static_cast<char*>(malloc(s.size() + 1));
    memcpy(c, s.c_str(), s.size() + 1);
    return c;
}

// A forced result for the next look-up of `kind`, or -1.
int forcedResult(const std::string& kind) {
    auto it = fakeServer.forced.find(kind);
    if (it == fakeServer.forced.end() || it->second.empty()) return -1;
    int rc = it->second.front();
    it->second.erase(it->second.begin());
    return rc;
}

const char kEnvelopeHead[] =
    "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"> <SOAP-ENV:Body>"
    "<SOAP-CHK:Success xmlns:SOAP-CHK = \"urn:test-chk\" xmlns=\"urn:test-attributes\">";
const char kEnvelopeTail[] = "</SOAP-CHK:Success></SOAP-ENV:Body></SOAP-ENV:Envelope>";

}  // namespace

KuiFakeServer& kuiFake() { return fakeServer; }
void kuiResetFake() { fakeServer = KuiFakeServer(); }

std::vector<std::string> KuiFakeServer::sent(const std::string& prefix) const {
    std::vector<std::string> out;
    for (const std::string& s : statements)
        if (s.compare(0, prefix.size(), prefix) == 0) out.push_back(s);
    return out;
}

std::string kuiTableReply(const std::string& table, const std::vector<KuiRow>& rows) {
    std::string r = kEnvelopeHead;
    r += "<TABLE name=\"" + table + "\">\n<OBJECT>" + table + "</OBJECT>\n";
    if (!rows.empty()) r += "<DATA>\n";
    for (const KuiRow& row : rows) {
        r += "<ROW>\n";
        for (const auto& [column, value] : row) {
            bool markup = value.find_first_of("<>&\"'") != std::string::npos;
            r += "<" + column + ">" + (markup ? "<![CDATA[" + value + "]]>" : value) + "</" + column + ">\n";
        }
        r += "</ROW>\n";
    }
    if (!rows.empty()) r += "</DATA>";
    r += "\n</TABLE>\n";
    return r + kEnvelopeTail;
}

std::string kuiInsertReply() {
    return std::string(kEnvelopeHead) + "<TABLE name=\"O4SRV.X\">\n<OBJECT>X</OBJECT>\n<DATA>\n<ROW>\n<RC>0</RC></ROW>\n"
                                        "</DATA>\n\n</TABLE>\n" + kEnvelopeTail;
}

std::string kuiFaultReply() {
    return "<SOAP-ENV:Envelope xmlns:SOAP-ENV=\"http://schemas.xmlsoap.org/soap/envelope/\"> <SOAP-ENV:Body>"
           "<SOAP-ENV:Fault>\n<faultcode>SOAP-ENV:Client</faultcode>\n<faultstring>refused</faultstring>"
           "</SOAP-ENV:Fault></SOAP-ENV:Body></SOAP-ENV:Envelope>";
}

// --- the doubled calls

int issueSoapRequest(void*, const char* sql, int, char** reply, int* replyLength) {
    fakeServer.statements.push_back(sql);
    *reply = nullptr;
    for (KuiScript& s : fakeServer.scripts) {
        if (s.uses == 0 || strstr(sql, s.match.c_str()) == nullptr) continue;
        if (s.uses > 0) s.uses--;
        if (s.rc != 0) return s.rc;
        *reply = mallocCopy(s.reply);
        if (replyLength) *replyLength = (int)s.reply.size();
        return 0;
    }
    *reply = mallocCopy(kuiInsertReply());
    return 0;
}

int getSitNamefromTNAME(void*, char*, char**, const char* fullName, char* shortName) {
    fakeServer.lookups.push_back(std::string("TNAME:") + fullName);
    shortName[0] = '\0';
    int forced = forcedResult("TNAME");
    if (forced >= 0) return forced;
    auto it = fakeServer.longNames.find(fullName);
    if (it == fakeServer.longNames.end()) return KUI_ABSENT;
    snprintf(shortName, KUI_SHORTNAME_SIZE, "%s", it->second.c_str());
    return 0;
}

int checkSitExistsinTSITDESC(void*, char*, char**, const char* name) {
    fakeServer.lookups.push_back(std::string("TSITDESC:") + name);
    int forced = forcedResult("TSITDESC");
    if (forced >= 0) return forced;
    return fakeServer.situations.count(name) ? 0 : KUI_ABSENT;
}

int checkUADVISORSituation(void*, char*, char**, const char* baseShortName, const char* baseName) {
    fakeServer.lookups.push_back(std::string("UADVISOR:") + baseShortName);
    int forced = forcedResult("UADVISOR");
    if (forced >= 0) return forced;
    if (strncmp(baseShortName, "UADVISOR", 8) == 0 || strncmp(baseName, "UADVISOR", 8) == 0) return KUI_BADINPUT;
    return fakeServer.situations.count(baseShortName) ? 0 : KUI_ABSENT;
}

int getVemsVersion(void*, char*, char**, char** version) {
    fakeServer.lookups.push_back("VERSION");
    *version = &fakeServer.version[0];
    return fakeServer.versionRc;
}

int GetEventID(LinkedList* list, void*) {
    fakeServer.lookups.push_back("EVENTS");
    if (fakeServer.eventRc != 0) return fakeServer.eventRc;
    for (const std::string& e : fakeServer.events)
        if (list->AppendEntry(strdup(e.c_str())) != 0) return KUI_INTERNAL;
    return 0;
}

void getUUID(char* buf) { snprintf(buf, KUI_UUID_SIZE, "ID%014d", ++fakeServer.uuids); }

void displayMsg(const char* id, int, const char*, int, int, int) { fakeServer.displayed.push_back(id); }

char getUserAuthorization() { return fakeServer.loggedIn ? 'Y' : 0; }
