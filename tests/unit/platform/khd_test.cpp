// Mail and history export: a message sent to a small SMTP server on
// loopback (envelope, headers, the attachment decoded), refused arguments,
// and snapshot records stored in real hub stores through the SQL layer.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sqlite3.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "khd/khd.h"
#include "platform/loopback.h"
#include "sql1/sql1.h"

namespace {

using loopback::MiniSmtp;
using loopback::partBody;
using loopback::unbase64;

std::string sourceDir() {
    const char* s = std::getenv("CSIT_SOURCE_DIR");
    return s ? s : ".";
}

bool contains(const std::string& s, const std::string& part) { return s.find(part) != std::string::npos; }

TEST(KhdMail, SendsTheOutputAsAnAttachment) {
    MiniSmtp smtp;
    std::string output = "<TABLE name=\"X\">\n<ROW>a &amp; b</ROW>\n</TABLE>\n";
    output += std::string(3000, 'x');  // longer than one base64 line
    ASSERT_EQ(KHD_SendMail(0, smtp.address().c_str(), "ops@example.net; <audit@example.net>", "<gw@example.net>",
                           "Daily report", "See the attachment.", "report.xml", output.data(), output.size()),
              KHD_OK);
    std::lock_guard<std::mutex> g(smtp.mu);
    EXPECT_EQ(smtp.messages, 1);
    EXPECT_EQ(smtp.from, "<gw@example.net>");
    EXPECT_EQ(smtp.to, (std::vector<std::string>{"<ops@example.net>", "<audit@example.net>"}));
    EXPECT_TRUE(contains(smtp.data, "Subject: Daily report\n"));
    EXPECT_TRUE(contains(smtp.data, "From: <gw@example.net>\n"));
    EXPECT_TRUE(contains(smtp.data, "To: <ops@example.net>, <audit@example.net>\n"));
    EXPECT_TRUE(contains(smtp.data, "See the attachment."));
    EXPECT_TRUE(contains(smtp.data, "filename=\"report.xml\""));
    EXPECT_EQ(unbase64(partBody(smtp.data, "filename=\"report.xml\"")), output);
}

TEST(KhdMail, OptionalPartsAndEncodedSubject) {
    MiniSmtp smtp;
    // No subject, no message, no title: the attachment alone, named output.xml.
    ASSERT_EQ(KHD_SendMail(0, smtp.address().c_str(), "ops@example.net", "gw@example.net", nullptr, nullptr, nullptr,
                           "<a/>", 4),
              KHD_OK);
    {
        std::lock_guard<std::mutex> g(smtp.mu);
        EXPECT_FALSE(contains(smtp.data, "Subject:"));
        EXPECT_EQ(unbase64(partBody(smtp.data, "filename=\"output.xml\"")), "<a/>");
    }
    // A subject with non-ASCII text travels as an encoded word; quotes in
    // the title cannot end the file name early.
    ASSERT_EQ(KHD_SendMail(0, ("smtp://" + smtp.address()).c_str(), "ops@example.net", "gw@example.net",
                           "Bericht \xC3\xBC" "ber Platten", nullptr, "a\"b.xml", "<a/>", 4),
              KHD_OK);
    std::lock_guard<std::mutex> g(smtp.mu);
    EXPECT_TRUE(contains(smtp.data, "Subject: =?UTF-8?B?QmVyaWNodCDDvGJlciBQbGF0dGVu?=\n"));
    EXPECT_TRUE(contains(smtp.data, "filename=\"a_b.xml\""));
}

TEST(KhdMail, RefusedArgumentsSendNothing) {
    MiniSmtp smtp;
    const std::string s = smtp.address();
    struct {
        const char* server;
        const char* receiver;
        const char* sender;
        const char* subject;
        int rc;
    } cases[] = {
        {nullptr, "a@b", "c@d", nullptr, KHD_BADARG},
        {s.c_str(), nullptr, "c@d", nullptr, KHD_BADARG},
        {s.c_str(), "a@b", nullptr, nullptr, KHD_BADARG},
        {s.c_str(), " ; ", "c@d", nullptr, KHD_BADARG},
        {s.c_str(), "a@b", "c d@e", nullptr, KHD_BADARG},
        {s.c_str(), "a@b>\r\nRCPT TO:<x@y", "c@d", nullptr, KHD_BADARG},
        {s.c_str(), "a@b", "c@d", "Hi\r\nBcc: x@y", KHD_BADARG},
        {"http://127.0.0.1:1", "a@b", "c@d", nullptr, KHD_BADARG},
        {s.c_str(), "nobody@here", "c@d", nullptr, KHD_FAILED},  // the server refuses the receiver
    };
    for (const auto& c : cases)
        EXPECT_EQ(KHD_SendMail(0, c.server, c.receiver, c.sender, c.subject, nullptr, nullptr, "x", 1), c.rc)
            << (c.receiver ? c.receiver : "(null)");
    EXPECT_EQ(KHD_SendMail(1, s.c_str(), "a@b", "c@d", nullptr, nullptr, nullptr, "x", 1), KHD_BADARG);
    std::lock_guard<std::mutex> g(smtp.mu);
    EXPECT_EQ(smtp.messages, 0);
}

// ---------------------------------------------------------------- export

class KhdExport : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/khd_test.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir = tmpl;
        setenv("SQL1_PWHASH", "min", 1);
        static int serial = 0;
        serial++;
        local = dir + "/local.db";
        other = dir + "/other.db";
        otherName = "KHDOTHER" + std::to_string(serial);
        std::string data = sourceDir() + "/data/store";
        SQL1_StoreOptions o;
        o.dataDir = data.c_str();
        o.adminPassword = "adminpw";
        o.minimalHash = 1;
        o.validate = 1;
        o.local = 1;
        ASSERT_EQ(SQL1_RegisterServer(("KHDLOCAL" + std::to_string(serial)).c_str(), local.c_str(), &o), 0);
        o.local = 0;
        ASSERT_EQ(SQL1_RegisterServer(otherName.c_str(), other.c_str(), &o), 0);
        dataFile = dir + "/kshsnap";
        std::ofstream(dataFile + ".hdr")
            << "SNAPSHOT.USERID(char,0,16)\tWRITETIME(char,16,16)\tSNAPSHOT.XMLDATA(char,32,32000)";
    }
    void TearDown() override {
        std::string cmd = "rm -rf '" + dir + "'";
        (void)system(cmd.c_str());
    }

    static std::string record(const std::string& user, const std::string& time, const std::string& data) {
        std::string r(32032, ' ');
        r.replace(0, user.size(), user);
        r.replace(16, time.size(), time);
        r.replace(32, std::min<size_t>(data.size(), 32000), data.substr(0, 32000));
        return r;
    }
    void writeData(const std::string& bytes) { std::ofstream(dataFile, std::ios::binary) << bytes; }

    std::vector<std::vector<std::string>> rows(const std::string& store) {
        std::vector<std::vector<std::string>> out;
        sqlite3* db = nullptr;
        EXPECT_EQ(sqlite3_open_v2(store.c_str(), &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
        sqlite3_stmt* st = nullptr;
        sqlite3_prepare_v2(db,
                           "SELECT USERID, WRITETIME, HOSTNAME, XMLDATA, length(XMLDATA) FROM \"WAREHOUSE.SNAPSHOT\" "
                           "ORDER BY rowid",
                           -1, &st, nullptr);
        while (st && sqlite3_step(st) == SQLITE_ROW) {
            std::vector<std::string> r;
            for (int i = 0; i < 5; i++) r.emplace_back(reinterpret_cast<const char*>(sqlite3_column_text(st, i)));
            out.push_back(r);
        }
        sqlite3_finalize(st);
        sqlite3_close(db);
        return out;
    }
    int exportNow(const char* list = nullptr, const char* host = "hubhost") {
        return KHD_ExportHistory(KHD_SNAPSHOT, dataFile.c_str(), 0, 0, 0, 0, 0, 0, host, 0, 0, 0, list, 0, 0);
    }

    std::string dir, local, other, otherName, dataFile;
};

TEST_F(KhdExport, StoresEachRecordInTheLocalWarehouse) {
    std::string big(33000, 'd');
    big.replace(0, 6, "<DATA>");
    writeData(record("sysadmin", "1260304050607000", "<TABLE/>") + record("ops", "1260304050608000", big));
    ASSERT_EQ(exportNow("\0"), KHD_OK);
    auto r = rows(local);
    ASSERT_EQ(r.size(), 2u);
    EXPECT_EQ(r[0], (std::vector<std::string>{"sysadmin", "1260304050607000", "hubhost", "<TABLE/>", "8"}));
    EXPECT_EQ(r[1][0], "ops");
    EXPECT_EQ(r[1][3].size(), 32000u);
    EXPECT_EQ(r[1][3], big.substr(0, 32000));
    EXPECT_TRUE(rows(other).empty());
}

TEST_F(KhdExport, ServerListNamesTheStoresAndBadInputStoresNothing) {
    writeData(record("ops", "1260304050607000", "<x/>"));
    std::string list = otherName + std::string(1, '\0');
    ASSERT_EQ(exportNow(list.c_str(), nullptr), KHD_OK);
    auto r = rows(other);
    ASSERT_EQ(r.size(), 1u);
    EXPECT_EQ(r[0][2], "");
    EXPECT_TRUE(rows(local).empty());

    std::string unknown = std::string("NOSUCHSERVER") + '\0';
    EXPECT_EQ(exportNow(unknown.c_str()), KHD_UNREACHABLE);

    // A partial record, a missing file, a malformed header, wrong flags or
    // a reserved argument: nothing is stored.
    writeData(record("ops", "1260304050607000", "<x/>").substr(0, 32031));
    EXPECT_EQ(exportNow(), KHD_FAILED);
    EXPECT_EQ(KHD_ExportHistory(KHD_SNAPSHOT, (dir + "/none").c_str(), (dataFile + ".hdr").c_str(), 0, 0, 0, 0, 0,
                                nullptr, 0, 0, 0, nullptr, 0, 0),
              KHD_FAILED);
    writeData(record("ops", "1260304050607000", "<x/>"));
    EXPECT_EQ(KHD_ExportHistory(0, dataFile.c_str(), 0, 0, 0, 0, 0, 0, nullptr, 0, 0, 0, nullptr, 0, 0), KHD_BADARG);
    EXPECT_EQ(KHD_ExportHistory(KHD_SNAPSHOT, dataFile.c_str(), 0, 0, 1, 0, 0, 0, nullptr, 0, 0, 0, nullptr, 0, 0),
              KHD_BADARG);
    EXPECT_EQ(KHD_ExportHistory(KHD_SNAPSHOT, dataFile.c_str(), 0, "WAREHOUSE.SNAPSHOT; DROP", 0, 0, 0, 0, nullptr, 0,
                                0, 0, nullptr, 0, 0),
              KHD_BADARG);
    std::ofstream(dataFile + ".hdr") << "USERID(char,0,16)\tXMLDATA(text,16,100)";
    EXPECT_EQ(exportNow(), KHD_BADARG);
    std::ofstream(dataFile + ".hdr") << "USER;ID(char,0,16)";
    EXPECT_EQ(exportNow(), KHD_BADARG);
    EXPECT_TRUE(rows(local).empty());
    EXPECT_EQ(rows(other).size(), 1u);
}

}  // namespace
