// The affinity table: loading its file (malformed lines skipped), the four
// look-up kinds, exact and subset matching of affinity ids, and the shipped
// table file.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <string>
#include <vector>

#include "aff1/aff1.h"

namespace {

std::string sourceDir() {
    const char* s = std::getenv("CSIT_SOURCE_DIR");
    return s ? s : ".";
}

class Aff1 : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/aff1_test.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir = tmpl;
        file = dir + "/table.tbl";
        write("# comment line\n"
              "\n"
              "8100|8100000000000000|ZAG|Sample agent|ZAG.AGENT\n"
              "  8200 | 82 |zag| Sample agent, processor | ZAG.CPU  \n"
              "8400||ZAG|Sample agent, disks|\n"
              "4100||O4SRV|Hub server|O4SRV.HUB\n"
              "81G0||BAD|not hexadecimal|\n"
              "9||TOO|few fields\n"
              "1|2|3|4|5|6\n"
              "||NOIDS|Without ids|\n");
        AFF1_SetTableFile(file.c_str());
    }
    void TearDown() override {
        AFF1_SetTableFile(nullptr);
        std::string cmd = "rm -rf '" + dir + "'";
        (void)system(cmd.c_str());
    }
    void write(const std::string& text) { std::ofstream(file) << text; }

    // The products (with the static id) of an array look-up, in order.
    std::vector<std::string> entries(int kind, const std::string& key, int* rc) {
        AFF1_EntryArray* a = nullptr;
        *rc = AFF1_GetEntries(kind, key.data(), key.size(), &a);
        std::vector<std::string> out;
        if (*rc != AFF1_OK) {
            EXPECT_EQ(a, nullptr);
            return out;
        }
        for (int i = 0; i < a->count; i++)
            out.push_back(std::string(AFF1_EntryAt(a, i)->product) + "/" + AFF1_EntryAt(a, i)->staticAffinity);
        AFF1_FreeEntryArray(a);
        return out;
    }

    std::string dir, file;
};

TEST_F(Aff1, LoadSkipsMalformedLinesAndTrimsFields) {
    int n = 0, bad = 0;
    ASSERT_EQ(AFF1_Load(&n, &bad), AFF1_OK);
    EXPECT_EQ(n, 5);
    EXPECT_EQ(bad, 3);
    AFF1_Entry e;
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_RESID, "ZAG.CPU", 7, &e), AFF1_OK);
    EXPECT_STREQ(e.staticAffinity, "8200");
    EXPECT_STREQ(e.dynamicAffinity, "82");
    EXPECT_STREQ(e.product, "zag");
    EXPECT_STREQ(e.text, "Sample agent, processor");

    // A field one character too long makes its line malformed; one of the
    // full width loads.
    write(std::string(32, 'A') + "||P|fits|\n" + std::string(33, 'A') + "||P|too long|\n" + "||P|" +
          std::string(256, 't') + "|\n");
    AFF1_SetTableFile(file.c_str());
    ASSERT_EQ(AFF1_Load(&n, &bad), AFF1_OK);
    EXPECT_EQ(n, 2);
    EXPECT_EQ(bad, 1);

    AFF1_SetTableFile((dir + "/missing.tbl").c_str());
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "x", 1, &e), AFF1_NOTABLE);
}

TEST_F(Aff1, AffinityIdsMatchExactlyOrAsSubset) {
    AFF1_Entry e;
    // Exact: the same bit set, however many zero digits trail it; either
    // the static or the dynamic id.
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_AFFINITY, "81", 2, &e), AFF1_OK);
    EXPECT_STREQ(e.resid, "ZAG.AGENT");
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_AFFINITY, "8100000000", 10, &e), AFF1_OK);
    EXPECT_STREQ(e.resid, "ZAG.AGENT");
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_AFFINITY, "82000", 5, &e), AFF1_OK);
    EXPECT_STREQ(e.resid, "ZAG.CPU");
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_AFFINITY, "8", 1, &e), AFF1_NOTFOUND);  // a part is not the whole

    // Subset: every entry holding the key's bits, in file order.
    int rc = 0;
    EXPECT_EQ(entries(AFF1_BY_AFFINITY, "8", &rc), (std::vector<std::string>{"ZAG/8100", "zag/8200", "ZAG/8400"}));
    EXPECT_EQ(entries(AFF1_BY_AFFINITY, "84", &rc), (std::vector<std::string>{"ZAG/8400"}));
    EXPECT_EQ(entries(AFF1_BY_AFFINITY, "C", &rc), (std::vector<std::string>{}));  // no entry has both bits
    EXPECT_EQ(rc, AFF1_OK);
    // A key without bits matches nothing rather than everything.
    EXPECT_EQ(entries(AFF1_BY_AFFINITY, "000", &rc), (std::vector<std::string>{}));
    EXPECT_EQ(rc, AFF1_OK);

    // Keys that are not ids, or too long to be one.
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_AFFINITY, "8Z", 2, &e), AFF1_BADKEY);
    entries(AFF1_BY_AFFINITY, "x", &rc);
    EXPECT_EQ(rc, AFF1_BADKEY);
    std::string longKey(65, '8');
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_AFFINITY, longKey.data(), longKey.size(), &e), AFF1_NOTFOUND);
}

TEST_F(Aff1, ProductTextAndResidLookUps) {
    int rc = 0;
    // Products compare without regard to case.
    EXPECT_EQ(entries(AFF1_BY_PRODUCT, "ZAG", &rc), (std::vector<std::string>{"ZAG/8100", "zag/8200", "ZAG/8400"}));
    EXPECT_EQ(entries(AFF1_BY_PRODUCT, "nothing", &rc), (std::vector<std::string>{}));
    EXPECT_EQ(rc, AFF1_OK);

    AFF1_Entry e;
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "HUB SERVER", 10, &e), AFF1_OK);
    EXPECT_STREQ(e.product, "O4SRV");
    // The key length counts, not a terminator: "Hub serverXYZ" cut to 10.
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "Hub serverXYZ", 10, &e), AFF1_OK);
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "Hub", 3, &e), AFF1_NOTFOUND);
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "Without ids", 11, &e), AFF1_OK);
    EXPECT_STREQ(e.staticAffinity, "");
    EXPECT_STREQ(e.resid, "");
    ASSERT_EQ(AFF1_GetEntry(AFF1_BY_RESID, "o4srv.hub", 9, &e), AFF1_OK);
    EXPECT_STREQ(e.text, "Hub server");
    // A key longer than the resource id field cannot match it.
    std::string longResid(33, 'R');
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_RESID, longResid.data(), longResid.size(), &e), AFF1_NOTFOUND);

    EXPECT_EQ(AFF1_GetEntry(7, "x", 1, &e), AFF1_BADARG);
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "", 0, &e), AFF1_BADARG);
    EXPECT_EQ(AFF1_GetEntry(AFF1_BY_TEXT, "x", 1, nullptr), AFF1_BADARG);
}

TEST_F(Aff1, ShippedTableLoadsCleanlyFromBesideTheAttributeFiles) {
    AFF1_SetTableFile(nullptr);
    unsetenv("AFF1_TABLE");
    setenv("CT_ATTRLIB", (sourceDir() + "/data/attrlib").c_str(), 1);
    int n = 0, bad = -1;
    ASSERT_EQ(AFF1_Load(&n, &bad), AFF1_OK);
    EXPECT_GT(n, 5);
    EXPECT_EQ(bad, 0);
    // The environment variable wins over the attribute directory.
    setenv("AFF1_TABLE", file.c_str(), 1);
    ASSERT_EQ(AFF1_Load(&n, &bad), AFF1_OK);
    EXPECT_EQ(n, 5);
    unsetenv("AFF1_TABLE");
    unsetenv("CT_ATTRLIB");
}

}  // namespace
