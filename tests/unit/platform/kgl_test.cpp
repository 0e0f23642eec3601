// Directory scan: what a scan yields, in which order, and from which directory.
#include "kgl/kgl.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <utility>
#include <vector>

namespace {

class KglDirTest : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/kgltestXXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        root_ = tmpl;
    }
    void TearDown() override {
        std::string cmd = "rm -rf '" + root_ + "'";
        ASSERT_EQ(system(cmd.c_str()), 0);
    }
    std::string mkdir_(const std::string& rel) {
        std::string p = root_ + "/" + rel;
        EXPECT_EQ(mkdir(p.c_str(), 0700), 0);
        return p;
    }
    void touch(const std::string& path) {
        FILE* f = fopen(path.c_str(), "w");
        ASSERT_NE(f, nullptr);
        fclose(f);
    }
    // Every (directory, name) pair the scan yields, in order.
    static std::vector<std::pair<std::string, std::string>> drain(KGL_Dir* scan) {
        std::vector<std::pair<std::string, std::string>> out;
        char name[KGL_NAMESIZE];
        char dir[KGL_NAMESIZE];
        while (kglqprdd(scan, name, sizeof name) == KGL_OK) {
            EXPECT_EQ(kglqpqdr(scan, dir, sizeof dir), KGL_OK);
            out.emplace_back(dir, name);
        }
        return out;
    }
    std::string root_;
};

TEST_F(KglDirTest, YieldsRegularFilesSortedAndSkipsDirectories) {
    std::string d = mkdir_("a");
    touch(d + "/zeta.atr");
    touch(d + "/alpha.atr");
    touch(d + "/Mid");
    mkdir_("a/sub.atr");
    ASSERT_EQ(symlink((d + "/alpha.atr").c_str(), (d + "/link.atr").c_str()), 0);
    ASSERT_EQ(symlink("/nonexistent/x", (d + "/dangling.atr").c_str()), 0);

    KGL_Dir* scan = nullptr;
    ASSERT_EQ(kglqpopd(d.c_str(), KGL_BYPATH, &scan), KGL_OK);
    char dir[KGL_NAMESIZE];
    EXPECT_EQ(kglqpqdr(scan, dir, sizeof dir), KGL_BADARG);  // nothing returned yet
    auto got = drain(scan);
    std::vector<std::pair<std::string, std::string>> want = {
        {d, "Mid"}, {d, "alpha.atr"}, {d, "link.atr"}, {d, "zeta.atr"}};
    EXPECT_EQ(got, want);
    char name[KGL_NAMESIZE];
    EXPECT_EQ(kglqprdd(scan, name, sizeof name), KGL_NOTFOUND);  // stays at the end
    EXPECT_EQ(kglqpqdr(scan, dir, sizeof dir), KGL_BADARG);
    EXPECT_EQ(kglqpcld(scan), KGL_OK);
}

TEST_F(KglDirTest, AVariableListsDirectoriesReadInOrderAndMissingOnesAreLeftOut) {
    std::string a = mkdir_("one");
    std::string b = mkdir_("two");
    touch(a + "/x.atr");
    touch(b + "/a.atr");
    std::string list = b + "::" + root_ + "/missing:" + a;
    setenv("KGL_TEST_LIST", list.c_str(), 1);

    KGL_Dir* scan = nullptr;
    ASSERT_EQ(kglqpopd("KGL_TEST_LIST", KGL_BYENV, &scan), KGL_OK);
    std::vector<std::pair<std::string, std::string>> want = {{b, "a.atr"}, {a, "x.atr"}};
    EXPECT_EQ(drain(scan), want);
    kglqpcld(scan);

    // The variable's name is not a path, and a path is not a variable.
    EXPECT_EQ(kglqpopd("KGL_TEST_LIST", KGL_BYPATH, &scan), KGL_NOTFOUND);
    EXPECT_EQ(scan, nullptr);
    unsetenv("KGL_TEST_LIST");
    EXPECT_EQ(kglqpopd("KGL_TEST_LIST", KGL_BYENV, &scan), KGL_NOTFOUND);
    setenv("KGL_TEST_LIST", (root_ + "/missing").c_str(), 1);
    EXPECT_EQ(kglqpopd("KGL_TEST_LIST", KGL_BYENV, &scan), KGL_NOTFOUND);
    unsetenv("KGL_TEST_LIST");
}

TEST_F(KglDirTest, BadArgumentsAndSmallFieldsAreRefusedWithoutOverrun) {
    KGL_Dir* scan = reinterpret_cast<KGL_Dir*>(1);
    EXPECT_EQ(kglqpopd(nullptr, KGL_BYPATH, &scan), KGL_BADARG);
    EXPECT_EQ(scan, nullptr);
    EXPECT_EQ(kglqpopd("", KGL_BYPATH, &scan), KGL_BADARG);
    EXPECT_EQ(kglqpopd(root_.c_str(), 'X', &scan), KGL_BADARG);
    EXPECT_EQ(kglqpopd((root_ + "/nope").c_str(), KGL_BYPATH, &scan), KGL_NOTFOUND);
    touch(root_ + "/plain");
    EXPECT_EQ(kglqpopd((root_ + "/plain").c_str(), KGL_BYPATH, &scan), KGL_NOTFOUND);
    EXPECT_EQ(kglqprdd(nullptr, nullptr, 0), KGL_BADARG);
    EXPECT_EQ(kglqpcld(nullptr), KGL_BADARG);

    // A name that does not fit the field is skipped, not cut; the next one
    // that fits is returned. A directory that does not fit gives KGL_NOROOM.
    std::string d = mkdir_("n");
    touch(d + "/abcdefgh");
    touch(d + "/b");
    ASSERT_EQ(kglqpopd(d.c_str(), KGL_BYPATH, &scan), KGL_OK);
    char small[4];
    ASSERT_EQ(kglqprdd(scan, small, sizeof small), KGL_OK);
    EXPECT_STREQ(small, "b");
    EXPECT_EQ(kglqpqdr(scan, small, sizeof small), KGL_NOROOM);
    EXPECT_STREQ(small, "");
    kglqpcld(scan);
}

}  // namespace
