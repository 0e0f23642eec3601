// The support library's text helpers: the SITINFO rules, name classes,
// identifiers, escaping, trimming and conversion.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <set>
#include <string>

#include "kshlst.h"
#include "kuisupport.h"

namespace {

// Runs validateVEC; *out receives the text written.
int vec(const std::string& in, LinkedList* destinations, std::string* out) {
    std::vector<char> buf(in.size() + 3, '#');
    char* p = buf.data();
    int rc = validateVEC(in.c_str(), destinations, &p);
    EXPECT_LE(strlen(p), in.size() + 1);
    *out = p;
    return rc;
}

TEST(KuiText, SitinfoItemsAreCheckedAndNormalised) {
    LinkedList destinations([](void* p) { free(p); });
    ASSERT_EQ(destinations.AppendEntry(strdup("0")), 0);
    ASSERT_EQ(destinations.AppendEntry(strdup("12")), 0);
    std::string out;
    EXPECT_EQ(vec("sev=critical; tfwd = y ;TDST= 12 ,,0;ATOM=ZAG_DISK.MOUNT;COUNT=007;OV=9;;", &destinations, &out), 0);
    EXPECT_EQ(out, "SEV=Critical;TFWD=Y;TDST=12,0;ATOM=ZAG_DISK.MOUNT;COUNT=7;OV=9;");
    struct Case {
        const char* text;
        int rc;
    } cases[] = {
        {"SEV=Severe", 1},  {"SEV=", 1},           {"TFWD=Yes", 2},          {"TDST=5", 3},
        {"TDST= , ", 3},    {"ATOM=9lives", 4},    {"ATOM=A.B.C", 4},        {"ATOM=A-B", 4},
        {"COUNT=0", 5},     {"COUNT=-2", 5},       {"COUNT=1234567890", 5},  {"COUNT=x", 5},
        {"SEV", 6},         {"=x", 6},             {"SEV=Minor;sev=Fatal", 6}, {"ATOM=Name_1", 0},
        {"COUNT=999999999", 0}, {"", 0},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(vec(c.text, &destinations, &out), c.rc) << c.text;
        if (c.rc) EXPECT_EQ(out, c.text) << "an invalid text is handed back unchanged";
    }
    // Without destinations (facility disabled) a TDST item is dropped.
    LinkedList none;
    EXPECT_EQ(vec("SEV=Minor;TDST=5", &none, &out), 0);
    EXPECT_EQ(out, "SEV=Minor;");
}

TEST(KuiText, LongNamesHaveMoreThan31CharactersOrNonLatinOnes) {
    EXPECT_FALSE(isLongName(std::string(31, 'a').c_str()));
    EXPECT_TRUE(isLongName(std::string(32, 'a').c_str()));
    std::string latin;  // 31 two-byte Latin-1 characters: 62 bytes, still short
    for (int i = 0; i < 31; i++) latin += "\xC3\xA9";
    EXPECT_FALSE(isLongName(latin.c_str()));
    EXPECT_FALSE(hasNonLatin(latin.c_str()));
    EXPECT_TRUE(hasNonLatin("abc\xC4\x80"));  // U+0100, the first beyond Latin-1
    EXPECT_TRUE(isLongName("\xE6\x97\xA5"));
    EXPECT_TRUE(hasNonLatin("\xF0\x9F\x98\x80"));
    EXPECT_FALSE(hasNonLatin("\xE6\x97"));  // a cut sequence is read byte by byte, never past the end
    EXPECT_FALSE(hasNonLatin(""));
    EXPECT_FALSE(isLongName(nullptr));
}

TEST(KuiText, IdentifiersAreUniqueWithinAndAcrossProcesses) {
    std::set<std::string> seen;
    char id[KUI_UUID_SIZE];
    for (int i = 0; i < 20000; i++) {
        memset(id, '#', sizeof id);
        getUUID(id);
        ASSERT_EQ(strlen(id), 16u);
        ASSERT_EQ(strspn(id, "0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZ"), 16u) << id;
        ASSERT_TRUE(seen.insert(id).second) << id;
    }
    // Children made at the same moment each hand back their identifiers.
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    for (int c = 0; c < 4; c++) {
        pid_t pid = fork();
        if (pid == 0) {
            close(fds[0]);
            for (int i = 0; i < 500; i++) {
                getUUID(id);
                if (write(fds[1], id, 16) != 16) _exit(1);
            }
            _exit(0);
        }
    }
    close(fds[1]);
    char block[16];
    int read16 = 0;
    while (read(fds[0], block, 16) == 16) {
        ASSERT_TRUE(seen.insert(std::string(block, 16)).second);
        read16++;
    }
    close(fds[0]);
    for (int c = 0; c < 4; c++) {
        int status = 0;
        wait(&status);
        EXPECT_EQ(WEXITSTATUS(status), 0);
    }
    EXPECT_EQ(read16, 2000);
}

TEST(KuiText, QuotesAreDoubledAndBlanksTrimmed) {
    char* t = new char[16];
    strcpy(t, "a\"b\"\"");
    escapeDoubleQuotes(&t, 0);
    EXPECT_STREQ(t, "a\"\"b\"\"\"\"");
    delete[] t;
    char text[] = " \t name with blanks \r\n";
    char* p = text;
    trimTheString(&p);
    EXPECT_STREQ(p, "name with blanks");
    char blank[] = "   ";
    p = blank;
    trimTheString(&p);
    EXPECT_STREQ(p, "");
}

TEST(KuiText, ConversionGivesANewUtf8Copy) {
    // The process code page is UTF-8 (this ICU fixes it so; opcli asks for it
    // where ICU follows the locale): the text comes back as it is.
    const char* in = "caf\xC3\xA9 \xE6\x97\xA5";
    char* u = convertToUTF8(in);
    EXPECT_STREQ(u, in);
    EXPECT_NE(u, in);
    delete[] u;
    EXPECT_EQ(convertToUTF8(nullptr), nullptr);
}

}  // namespace
