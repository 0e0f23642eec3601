// CT_Affinity through the real SOAP dispatch, over an affinity table file
// of the test's own: the four keys, subset matching, the order of the keys,
// the XML of the entries between prefix and suffix, and the faults.
#include <gtest/gtest.h>

#include <string>

#include "aff1/aff1.h"
#include "kshaffin.h"
#include "kshspc_fixture.h"

namespace {

using spc::soapBody;

class Affinity : public spc::SpecialTest {
protected:
    void SetUp() override {
        spc::SpecialTest::SetUp();
        std::string table = dir + "/affinity.tbl";
        std::ofstream(table) << "8100|8100000000000000|ZAG|Sample agent|ZAG.AGENT\n"
                                "8200||ZAG|Disks & <mounts>|ZAG.DISK\n"
                                "4100||O4SRV|Hub server|\n"
                                "||BARE||\n";
        AFF1_SetTableFile(table.c_str());
    }
    void TearDown() override {
        AFF1_SetTableFile(nullptr);
        spc::SpecialTest::TearDown();
    }
};

const char kAgent[] =
    "<AFFINITY><STATIC>8100</STATIC><DYNAMIC>8100000000000000</DYNAMIC><TEXT>Sample agent</TEXT>"
    "<PRODUCT>ZAG</PRODUCT><RESID>ZAG.AGENT</RESID></AFFINITY>\n";
const char kDisk[] =
    "<AFFINITY><STATIC>8200</STATIC><TEXT>Disks &amp; &lt;mounts&gt;</TEXT><PRODUCT>ZAG</PRODUCT>"
    "<RESID>ZAG.DISK</RESID></AFFINITY>\n";
const char kHub[] = "<AFFINITY><STATIC>4100</STATIC><TEXT>Hub server</TEXT><PRODUCT>O4SRV</PRODUCT></AFFINITY>\n";

std::string data(const std::string& entries) { return "\n<DATA>\n" + entries + "</DATA>\n"; }

TEST_F(Affinity, EachKeyFindsItsEntries) {
    struct {
        std::string inner;
        std::string body;
    } cases[] = {
        {"<id>81</id>", data(kAgent)},                                   // exact, trailing zeros do not count
        {"<id match=\"SUBSET\">8</id>", data(std::string(kAgent) + kDisk)},  // every entry with the key's bits
        {"<product>zag</product>", data(std::string(kAgent) + kDisk)},
        {"<text>hub server</text>", data(kHub)},
        {"<resid>ZAG.DISK</resid>", data(kDisk)},
        // The first key present counts: the product is not looked at.
        {"<product>O4SRV</product><id>4100</id>", data(kHub)},
        // Empty static, dynamic and resource id: TEXT and PRODUCT stay.
        {"<product>BARE</product>", data("<AFFINITY><TEXT></TEXT><PRODUCT>BARE</PRODUCT></AFFINITY>\n")},
        {"<product>NONE</product>", ""},  // an empty array writes nothing
    };
    for (const auto& c : cases) {
        auto h = post("CT_Affinity", c.inner);
        ASSERT_FALSE(h->isRequestErrorSet()) << c.inner << ": " << h->fault();
        EXPECT_EQ(soapBody(*h), c.body) << c.inner;
    }
}

TEST_F(Affinity, EntriesGoBetweenPrefixAndSuffix) {
    file("pre.xml", "<affinities>");
    file("post.xml", "</affinities>");
    auto h = post("CT_Affinity", "<prefix>pre.xml</prefix><suffix>post.xml</suffix><resid>zag.agent</resid>");
    EXPECT_EQ(soapBody(*h), "<affinities>" + data(kAgent) + "</affinities>");
}

TEST_F(Affinity, FaultsOfMissingKeysAndFailedLookUps) {
    struct {
        std::string inner;
        std::string fault;
        bool client;
    } cases[] = {
        {"<other>1</other>", "Specify id, product, resid or text", true},
        {"<id/><product>ZAG</product>", "Unable to retrieve id.", true},
        {"<product></product>", "Unable to retrieve product.", true},
        {"<text/>", "Unable to retrieve text.", true},
        {"<resid/>", "Unable to retrieve resource id.", true},
        // A look-up that finds nothing, or a key that is no affinity id,
        // fails the request without a DATA element.
        {"<text>nothing like it</text>", "Unable to start request (5)", false},
        {"<id match=\"exact\">8</id>", "Unable to start request (5)", false},  // no entry is exactly 8
        {"<id>XYZ</id>", "Unable to start request (6)", false},
    };
    for (const auto& c : cases) {
        auto h = post("CT_Affinity", c.inner);
        EXPECT_EQ(h->fault(), c.fault) << c.inner;
        EXPECT_EQ(h->isClientFault(), c.client) << c.inner;
        EXPECT_FALSE(spc::contains(h->sent, "<DATA>")) << c.inner;
    }
    AFF1_SetTableFile((dir + "/missing.tbl").c_str());
    auto noTable = post("CT_Affinity", "<product>ZAG</product>");
    EXPECT_EQ(noTable->fault(), "Unable to start request (8)");
}

}  // namespace
