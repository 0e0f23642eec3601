// The streaming parser: callbacks with user data, errors with positions, reuse.
#include "xml1/xml1.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

namespace {

struct Events {
    std::string log;
};

void onStart(void* u, const char* name, const char** atts) {
    auto* e = static_cast<Events*>(u);
    e->log += "<" + std::string(name);
    for (int i = 0; atts[i]; i += 2) e->log += " " + std::string(atts[i]) + "=" + atts[i + 1];
    e->log += ">";
}
void onEnd(void* u, const char* name) { static_cast<Events*>(u)->log += "</" + std::string(name) + ">"; }
void onText(void* u, const char* s, int len) { static_cast<Events*>(u)->log += "[" + std::string(s, (size_t)len) + "]"; }

int parseInBuffer(XML1_Parser p, const char* text, int isFinal) {
    int len = (int)strlen(text);
    void* buf = XML1_GetBuffer(p, len + 1);
    if (buf == nullptr) return -1;
    memcpy(buf, text, (size_t)len + 1);
    return XML1_ParseBuffer(p, len, isFinal);
}

}  // namespace

TEST(Xml1, ReportsElementsAttributesAndDecodedTextToTheUserData) {
    XML1_Parser p = XML1_ParserCreate(nullptr);
    ASSERT_NE(p, nullptr);
    Events ev;
    XML1_SetUserData(p, &ev);
    XML1_SetElementHandler(p, onStart, onEnd);
    XML1_SetCharacterDataHandler(p, onText);
    EXPECT_EQ(parseInBuffer(p, "<a x='1' y=\"&lt;2\"><b>t&amp;u</b></a>", 1), XML1_STATUS_OK);
    // References arrive as pieces of their own, already turned into characters.
    EXPECT_EQ(ev.log, "<a x=1 y=<2><b>[t][&][u]</b></a>");
    EXPECT_EQ(XML1_GetErrorCode(p), XML1_ERROR_NONE);
    XML1_ParserFree(p);
}

TEST(Xml1, ErrorsCarryCodeTextAndPositionAndAResetParserParsesAgain) {
    XML1_Parser p = XML1_ParserCreate(nullptr);
    ASSERT_NE(p, nullptr);
    Events ev;
    XML1_SetUserData(p, &ev);
    XML1_SetElementHandler(p, onStart, onEnd);
    EXPECT_EQ(XML1_Parse(p, "<a>\n  <b></a>", 13, 1), XML1_STATUS_ERROR);
    int code = XML1_GetErrorCode(p);
    EXPECT_NE(code, XML1_ERROR_NONE);
    ASSERT_NE(XML1_ErrorString(code), nullptr);
    EXPECT_STREQ(XML1_ErrorString(code), "mismatched tag");
    EXPECT_EQ(XML1_GetCurrentLineNumber(p), 2u);
    EXPECT_EQ(XML1_GetCurrentColumnNumber(p), 7u);
    EXPECT_EQ(XML1_ErrorString(-1), nullptr);
    EXPECT_EQ(XML1_ErrorString(1000), nullptr);

    // Reset forgets handlers and user data; a fresh document parses cleanly.
    ASSERT_EQ(XML1_ParserReset(p, nullptr), 1);
    ev.log.clear();
    XML1_SetUserData(p, &ev);
    XML1_SetElementHandler(p, onStart, onEnd);
    EXPECT_EQ(parseInBuffer(p, "<c/>", 1), XML1_STATUS_OK);
    EXPECT_EQ(ev.log, "<c></c>");

    // An empty final text has no document element.
    ASSERT_EQ(XML1_ParserReset(p, nullptr), 1);
    EXPECT_EQ(XML1_Parse(p, "", 0, 1), XML1_STATUS_ERROR);
    EXPECT_STREQ(XML1_ErrorString(XML1_GetErrorCode(p)), "no element found");
    XML1_ParserFree(p);
}
