// String helpers and the date/time stamp variable under a frozen clock.
#include "kshutil.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include "bss1/bss1.h"

namespace {

// Local time is UTC in this process, set before anything converts a time.
const bool utc = [] {
    setenv("TZ", "UTC", 1);
    tzset();
    return true;
}();

time_t frozenNow;
time_t frozenClock() { return frozenNow; }

time_t at(int year, int month, int day, int h, int m, int s) {
    struct tm t {};
    t.tm_year = year - 1900;
    t.tm_mon = month - 1;
    t.tm_mday = day;
    t.tm_hour = h;
    t.tm_min = m;
    t.tm_sec = s;
    return timegm(&t);
}

class FrozenClock : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(utc);
        frozenNow = at(2026, 12, 3, 14, 5, 9);
        BSS1_SetClock(frozenClock);
    }
    void TearDown() override { BSS1_SetClock(nullptr); }

    // The text with its variable replaced; "<rc N>" when parsing failed.
    static std::string expand(const char* text) {
        dateTimeVariableParms p;
        unsigned rc = parseDateTimeVariable(text, &p);
        if (rc != 0 && rc != 5) return "<rc " + std::to_string(rc) + ">";
        std::vector<char> out(strlen(text) + 1, '#');
        EXPECT_EQ(insertDateTimeValue(text, out.data(), &p), 0u);
        return out.data();
    }
};

std::vector<int> kinds(const dateTimeVariableParms& p) { return std::vector<int>(p.kinds, p.kinds + p.count); }

}  // namespace

TEST(CaseCompare, IgnoresCaseAndOrdersByTheFirstDifference) {
    EXPECT_EQ(WSQL_CaseCompare("abc", "ABC"), 0);
    EXPECT_LT(WSQL_CaseCompare("ab", "abc"), 0);
    EXPECT_GT(WSQL_CaseCompare("abd", "ABC"), 0);
    EXPECT_EQ(WSQL_CaseCompare("", ""), 0);
    EXPECT_EQ(WSQL_NCaseCompare("TSITDESC", "tsitx", 4), 0);
    EXPECT_NE(WSQL_NCaseCompare("TSITDESC", "tsitx", 5), 0);
    EXPECT_EQ(WSQL_NCaseCompare("abc", "xyz", 0), 0);
    // Shorter than n: the end of both strings stops the comparison.
    EXPECT_EQ(WSQL_NCaseCompare("ab", "AB", 10), 0);
    EXPECT_LT(WSQL_NCaseCompare("ab", "ABC", 10), 0);
    // Bytes above 127 compare as unsigned, not as negative chars.
    EXPECT_GT(WSQL_CaseCompare("\xC3\xA9", "z"), 0);
    EXPECT_EQ(WSQL_CaseCompare(nullptr, nullptr), 0);
    EXPECT_LT(WSQL_CaseCompare(nullptr, "a"), 0);
}

TEST(Strings, StrdupCopiesWholeOrExactLengthsAndUnpadDropsTrailingBlanks) {
    char* whole = WSQL_Strdup("abcdef");
    char* three = WSQL_Strdup("abcdef", 3);
    ASSERT_NE(whole, nullptr);
    ASSERT_NE(three, nullptr);
    EXPECT_STREQ(whole, "abcdef");
    EXPECT_STREQ(three, "abc");
    EXPECT_EQ(WSQL_Strdup(nullptr, 3), nullptr);
    free(whole);
    free(three);

    char inPlace[] = "AB   ";
    EXPECT_EQ(WSQL_CopyUnpad(nullptr, inPlace, 0), inPlace);
    EXPECT_STREQ(inPlace, "AB");

    char src[] = "A B ";
    char dst[8];
    memset(dst, '#', sizeof dst);
    EXPECT_EQ(WSQL_CopyUnpad(dst, src, 3), dst);
    EXPECT_STREQ(dst, "A B");
    EXPECT_STREQ(src, "A B ");  // the source stays as it was
    EXPECT_STREQ(WSQL_CopyUnpad(dst, src, 4), "A B");

    char blanks[] = "    ";
    EXPECT_STREQ(WSQL_CopyUnpad(dst, blanks, 0), "");
    EXPECT_STREQ(WSQL_CopyUnpad(nullptr, blanks, 0), "");
    // Tabs are not blanks; a length beyond the string stops at its end.
    char tab[] = "A\t";
    EXPECT_STREQ(WSQL_CopyUnpad(dst, tab, 6), "A\t");
}

TEST(DateTimeVariable, FindsDelimitsAndClassifiesTokens) {
    dateTimeVariableParms p;
    EXPECT_EQ(parseDateTimeVariable("no variable", &p), 5u);
    EXPECT_EQ(p.start, -1);
    EXPECT_EQ(parseDateTimeVariable("one $ only", &p), 5u);
    EXPECT_EQ(p.start, -1);

    EXPECT_EQ(parseDateTimeVariable("$yymmddhhmiss$", &p), 0u);
    EXPECT_EQ(p.count, 6);
    EXPECT_EQ(p.start, 0);
    EXPECT_EQ(p.end, 14);
    EXPECT_EQ(kinds(p), (std::vector<int>{1, 2, 3, 4, 5, 6}));

    EXPECT_EQ(parseDateTimeVariable("$yymmddhhmissxx$", &p), 0u);
    EXPECT_EQ(p.count, 6);
    EXPECT_EQ(p.end, 16);

    EXPECT_EQ(parseDateTimeVariable("x$hhmm$", &p), 0u);
    EXPECT_EQ(p.start, 1);
    EXPECT_EQ(p.end, 7);
    EXPECT_EQ(kinds(p), (std::vector<int>{4, 5}));
    EXPECT_EQ(parseDateTimeVariable("$yymm$", &p), 0u);
    EXPECT_EQ(kinds(p), (std::vector<int>{1, 2}));
    EXPECT_EQ(parseDateTimeVariable("$MoDdYy$", &p), 0u);
    EXPECT_EQ(kinds(p), (std::vector<int>{2, 3, 1}));
    EXPECT_EQ(parseDateTimeVariable("$hhhh$", &p), 0u);
    EXPECT_EQ(kinds(p), (std::vector<int>{4, 4}));
    EXPECT_EQ(parseDateTimeVariable("$HHMM$", &p), 0u);
    EXPECT_EQ(kinds(p), (std::vector<int>{4, 5}));
    EXPECT_EQ(parseDateTimeVariable("$zzdd$", &p), 0u);
    EXPECT_EQ(kinds(p), (std::vector<int>{0, 3}));
    // Only the first variable counts.
    EXPECT_EQ(parseDateTimeVariable("a$dd$b$hh$", &p), 0u);
    EXPECT_EQ(p.end, 5);

    EXPECT_EQ(parseDateTimeVariable("$mmdd$", &p), 6u);
    EXPECT_EQ(parseDateTimeVariable("$ddmm$", &p), 6u);
    EXPECT_EQ(parseDateTimeVariable("a$yym$", &p), 6u);
    // The text ends in the middle of a token past the closing '$'.
    EXPECT_EQ(parseDateTimeVariable("$a$b", &p), 6u);
    // Six tokens running past the '$' that closed the variable.
    EXPECT_EQ(parseDateTimeVariable("$yyd$dhhmissxx", &p), 6u);
}

TEST(DateTimeVariable, VariablesBeyondSixteenBitOffsetsAreRefused) {
    std::string far(40000, 'x');
    far += "$dd$";
    dateTimeVariableParms p;
    EXPECT_EQ(parseDateTimeVariable(far.c_str(), &p), 6u);
    std::string near(100, 'x');
    near += "$dd$";
    EXPECT_EQ(parseDateTimeVariable(near.c_str(), &p), 0u);
    EXPECT_EQ(p.start, 100);
}

TEST_F(FrozenClock, VariablesAreReplacedByTheCurrentLocalDateAndTime) {
    EXPECT_EQ(expand("exp$yymmdd$.xml"), "exp261203.xml");
    EXPECT_EQ(expand("x$dd$y"), "x03y");
    EXPECT_EQ(expand("$yymmddhhmiss$"), "261203140509");
    EXPECT_EQ(expand("$yymmddhhmissxx$"), "261203140509");
    EXPECT_EQ(expand("t$hhmi$ $hh$"), "t1405 $hh$");
    EXPECT_EQ(expand("a$zzss$b"), "azz09b");  // an unknown pair keeps its characters
    EXPECT_EQ(expand("plain"), "plain");
    EXPECT_EQ(expand("$mmdd$"), "<rc 6>");

    frozenNow = at(2031, 1, 9, 0, 0, 0);
    EXPECT_EQ(expand("$moddyyhhmiss$"), "010931000000");
}

TEST_F(FrozenClock, TimestampHasCenturyDigitDateTimeAndZeroMilliseconds) {
    char buf[32];
    memset(buf, '#', sizeof buf);
    genTimeStamp(buf);
    EXPECT_STREQ(buf, "1261203140509000");
    EXPECT_EQ(buf[17], '#');  // nothing written past the terminator

    frozenNow = at(1999, 7, 4, 23, 59, 58);
    genTimeStamp(buf);
    EXPECT_STREQ(buf, "0990704235958000");
}
