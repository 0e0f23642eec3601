// CT_EMail / CT_Email through the real SOAP dispatch: the output of a batch
// mailed to a small SMTP server on loopback, the MESSAGE element written
// before each CT_Get, and the faults of missing fields and failed sends.
#include <gtest/gtest.h>

#include <string>

#include "kshemail.h"
#include "kshspc_fixture.h"
#include "platform/loopback.h"

namespace {

using spc::contains;
using spc::soapBody;

class EMail : public spc::SpecialTest {};

TEST_F(EMail, MailsTheOutputOfTheBatch) {
    loopback::MiniSmtp smtp;
    auto h = post("CT_EMail", "<server>" + smtp.address() + "</server><sender>gw@example.net</sender>"
                              "<receiver>ops@example.net</receiver><subject>Situations</subject>"
                              "<message>a &lt; b</message><attachmenttitle>sits.xml</attachmenttitle>"
                              "<request id=\"s\">" + spc::sitGet() + "</request>");
    EXPECT_EQ(lastRc, 0);
    ASSERT_FALSE(h->isRequestErrorSet()) << h->fault();
    const std::string body = soapBody(*h);
    // The message goes before the CT_Get's rows, escaped.
    EXPECT_EQ(body.rfind("<XML ID=\"s\"><MESSAGE>a &lt; b</MESSAGE>\n<TABLE name=\"O4SRV.TSITDESC\">", 0), 0u) << body;
    EXPECT_TRUE(contains(body, "<SITNAME>ZAG_CPU_Busy</SITNAME>"));
    std::lock_guard<std::mutex> g(smtp.mu);
    ASSERT_EQ(smtp.messages, 1);
    EXPECT_EQ(smtp.from, "<gw@example.net>");
    EXPECT_EQ(smtp.to, (std::vector<std::string>{"<ops@example.net>"}));
    EXPECT_TRUE(contains(smtp.data, "Subject: Situations\n"));
    EXPECT_TRUE(contains(smtp.data, "a < b"));
    EXPECT_EQ(loopback::unbase64(loopback::partBody(smtp.data, "filename=\"sits.xml\"")), body);
}

TEST_F(EMail, OtherSpellingWithoutOptionalFields) {
    loopback::MiniSmtp smtp;
    auto h = post("CT_Email", "<server>" + smtp.address() + "</server><sender>gw@example.net</sender>"
                              "<receiver>ops@example.net</receiver><request><insert><x>1</x></insert></request>");
    EXPECT_EQ(lastRc, 0);
    EXPECT_EQ(soapBody(*h), "<x>1</x>");
    std::lock_guard<std::mutex> g(smtp.mu);
    ASSERT_EQ(smtp.messages, 1);
    EXPECT_FALSE(contains(smtp.data, "Subject:"));
    EXPECT_EQ(loopback::unbase64(loopback::partBody(smtp.data, "filename=\"output.xml\"")), "<x>1</x>");
}

TEST_F(EMail, MissingFieldsAndFailedSends) {
    loopback::MiniSmtp smtp;
    const std::string server = "<server>" + smtp.address() + "</server>";
    struct {
        std::string inner;
        std::string fault;
    } cases[] = {
        // Every check runs; the first fault recorded is the answer.
        {"<subject>s</subject>", "Email server name/address missing."},
        {server + "<receiver>ops@example.net</receiver>", "Email sender name missing."},
        {server + "<sender>gw@example.net</sender>", "Email receiver name missing."},
        {server + "<sender>gw@example.net</sender><receiver>nobody@example.net</receiver>", "Unable to email data."},
        {"<server>127.0.0.1:1</server><sender>gw@example.net</sender><receiver>ops@example.net</receiver>",
         "Unable to email data."},
    };
    for (const auto& c : cases) {
        auto h = post("CT_EMail", c.inner);
        EXPECT_EQ(lastRc, 6) << c.inner;
        EXPECT_TRUE(h->isClientFault()) << c.inner;
        EXPECT_EQ(h->fault(), c.fault) << c.inner;
    }
    std::lock_guard<std::mutex> g(smtp.mu);
    EXPECT_EQ(smtp.messages, 0);
}

}  // namespace
