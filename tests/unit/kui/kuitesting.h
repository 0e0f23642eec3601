// Shared pieces of the command's unit tests: a fixture that gives every test
// a fresh module state and a fresh double, a runner for createsit, a base
// situation the double can serve, and an export-file writer.
#pragma once

#include <gtest/gtest.h>
#include <unicode/ucnv.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <optional>
#include <string>
#include <vector>

#include "kuicreatesit.h"
#include "kuidouble.h"
#include "kuistate.h"
#include "kuisupport.h"

struct KuiRunResult {
    int rc;
    std::string message;
    char done;
};

// Runs createsit with "opcli createsit" followed by `args`.
inline KuiRunResult kuiRun(const std::vector<std::string>& args) {
    std::vector<std::string> owned = {"opcli", "createsit"};
    owned.insert(owned.end(), args.begin(), args.end());
    std::vector<char*> argv;
    for (std::string& s : owned) argv.push_back(&s[0]);
    argv.push_back(nullptr);
    std::vector<char> buf(KUI_MSGBUF_SIZE, 'x');  // garbage the command must clear
    char* slot = nullptr;
    char done = 'N';
    int rc = createsit((int)owned.size(), argv.data(), buf.data(), &slot, 0, nullptr, &done, nullptr, nullptr);
    // Whatever the path: the completion flag is set and the buffer holds
    // the coded message only, never a statement.
    std::string message(buf.data());
    EXPECT_EQ(done, 'Y');
    EXPECT_EQ(message.find("SELECT"), std::string::npos) << message;
    EXPECT_EQ(message.find("INSERT"), std::string::npos) << message;
    EXPECT_NE(message.find('@'), std::string::npos) << "a coded message: " << message;
    return {rc, message, done};
}

// The 27 columns of a situation row, in the order the base query names them.
inline const std::vector<std::string>& kuiSituationColumns() {
    static const std::vector<std::string> columns = {
        "ADVISE",     "AFFINITIES", "ALERTLIST",  "AUTOSOPT", "AUTOSTART", "CMD",       "DESTNODE",
        "HUB",        "LOCFLAG",    "LSTCCSID",   "LSTDATE",  "LSTRELEASE", "LSTUSRPRF", "NOTIFYARGS",
        "NOTIFYOPTS", "OBJECTLOCK", "PDT",        "PRNAMES",  "QIBSCOPE",  "REEV_DAYS", "REEV_TIME",
        "REFLEXOK",   "SENDMSGQ",   "SITINFO",    "SITNAME",  "SOURCE",    "TEXT"};
    return columns;
}

// A plausible value for each situation column.
inline std::string kuiColumnValue(const std::string& column, const std::string& name) {
    if (column == "SITNAME") return name;
    if (column == "PDT") return "*IF *VALUE ZAG_CPU.BUSYPCT *GT 9000";
    if (column == "AUTOSTART") return "*YES";
    if (column == "ALERTLIST") return "*NO";
    if (column == "HUB") return "N";
    if (column == "REEV_DAYS") return "0";
    if (column == "REEV_TIME") return "001500";
    if (column == "TEXT") return "CPU busy";
    if (column == "SITINFO") return "SEV=Critical;OV=1;TFWD=Y";
    if (column == "LSTUSRPRF") return "OLDUSER";
    if (column == "AFFINITIES") return "ZAG#AFFINITY";
    return "";
}

// Serves base situation `name` (its row and its distribution `targets`).
inline void kuiServeBase(const std::string& name, const std::vector<std::string>& targets) {
    kuiFake().situations.insert(name);
    KuiRow row;
    for (const std::string& c : kuiSituationColumns()) row.emplace_back(c, kuiColumnValue(c, name));
    kuiFake().scripts.push_back({"FROM O4SRV.TSITDESC WHERE SITNAME =\"" + name + "\"", 0,
                                 kuiTableReply("O4SRV.TSITDESC", {row})});
    std::vector<KuiRow> dist;
    for (const std::string& t : targets) dist.push_back({{"NODEL", t}});
    kuiFake().scripts.push_back({"FROM O4SRV.TOBJACCL WHERE OBJNAME =\"" + name + "\"", 0,
                                 kuiTableReply("O4SRV.TOBJACCL", dist)});
}

// An export file: the situation row's (column, value) pairs (no value: an
// empty element) and the slot rows.
struct KuiExport {
    std::vector<std::pair<std::string, std::optional<std::string>>> columns;
    std::vector<std::vector<std::pair<std::string, std::optional<std::string>>>> slots;

    // The 27 columns of a situation named `name`.
    static KuiExport situation(const std::string& name) {
        KuiExport e;
        for (const std::string& c : kuiSituationColumns()) {
            std::string v = kuiColumnValue(c, name);
            if (c == "SITINFO") v = "SEV=Critical";
            e.columns.emplace_back(c, v.empty() ? std::nullopt : std::optional<std::string>(v));
        }
        return e;
    }
    void set(const std::string& column, std::optional<std::string> value) {
        for (auto& [c, v] : columns)
            if (c == column) {
                v = value;
                return;
            }
        columns.emplace_back(column, value);
    }
    void drop(const std::string& column) {
        for (size_t i = 0; i < columns.size(); i++)
            if (columns[i].first == column) columns.erase(columns.begin() + (long)i);
    }
    static std::string escape(const std::string& s) {
        std::string o;
        for (char c : s) {
            if (c == '<') o += "&lt;";
            else if (c == '&') o += "&amp;";
            else if (c == '>') o += "&gt;";
            else o += c;
        }
        return o;
    }
    static void element(std::string& out, const std::string& name, const std::optional<std::string>& v) {
        out += "  <" + name + ">" + (v ? escape(*v) : "") + "</" + name + ">\n";
    }
    std::string text() const {
        std::string t = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<TABLE>\n <ROW>\n";
        for (const auto& [c, v] : columns) element(t, c, v);
        t += " </ROW>\n";
        for (const auto& slot : slots) {
            t += " <ROW>\n";
            for (const auto& [c, v] : slot) element(t, c, v);
            t += " </ROW>\n";
        }
        return t + "</TABLE>\n";
    }
};

// A slot row for situation `id` with the map text `map`.
inline std::vector<std::pair<std::string, std::optional<std::string>>> kuiSlot(const std::string& id,
                                                                               const std::string& map) {
    return {{"ID", id},          {"OBJCLASS", "2250"},  {"SEQUENCE", "1"},       {"TYPE", "1"},
            {"LSTDATE", "1261206120000000"}, {"LSTUSRPRF", "SOMEONE"}, {"LSTRELEASE", "V630"},
            {"LOCFLAG", ""},     {"RESERVED", std::nullopt}, {"MAP", map}};
}

class KuiTest : public ::testing::Test {
protected:
    void SetUp() override {
        ucnv_setDefaultName("UTF-8");  // the framework's choice for a C-locale process
        kuiResetState();
        kuiResetFake();
        char tmpl[] = "/tmp/kuitest.XXXXXX";
        dir = mkdtemp(tmpl);
    }
    void TearDown() override {
        kuiResetState();
        std::string cmd = "rm -rf '" + dir + "'";
        if (system(cmd.c_str()) != 0) ADD_FAILURE() << "cannot remove " << dir;
    }
    // Writes `text` to a file of the test's folder and returns its path.
    std::string writeFile(const std::string& name, const std::string& text) {
        std::string path = dir + "/" + name;
        std::ofstream(path, std::ios::binary) << text;
        return path;
    }
    // Runs an import of `e`.
    KuiRunResult import(const KuiExport& e) { return kuiRun({"-i", writeFile("sit.xml", e.text())}); }

    std::string dir;
};
