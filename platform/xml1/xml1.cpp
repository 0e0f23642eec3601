// xml1: the streaming parser, over Expat. A parser handle is the Expat
// parser itself; the callback shapes are Expat's with char strings.
#include "xml1/xml1.h"

#include <expat.h>

#include <type_traits>

#include "ras1/ras1.h"

RAS1_UNIT("xml1");

static_assert(std::is_same_v<XML_Char, XML1_Char>, "the parser must report char (UTF-8) strings");
static_assert(std::is_same_v<XML_StartElementHandler, XML1_StartElementHandler>);
static_assert(std::is_same_v<XML_EndElementHandler, XML1_EndElementHandler>);
static_assert(std::is_same_v<XML_CharacterDataHandler, XML1_CharacterDataHandler>);

namespace {
XML_Parser native(XML1_Parser p) { return reinterpret_cast<XML_Parser>(p); }
}  // namespace

XML1_Parser XML1_ParserCreate(const XML1_Char* encoding) {
    XML_Parser p = XML_ParserCreate(encoding);
    if (p == nullptr) RAS1_Printf(RAS1_THIS, __LINE__, "parser creation failed");
    return reinterpret_cast<XML1_Parser>(p);
}

int XML1_ParserReset(XML1_Parser parser, const XML1_Char* encoding) {
    return XML_ParserReset(native(parser), encoding) == XML_TRUE ? 1 : 0;
}

void XML1_ParserFree(XML1_Parser parser) {
    if (parser != nullptr) XML_ParserFree(native(parser));
}

void XML1_SetElementHandler(XML1_Parser parser, XML1_StartElementHandler start, XML1_EndElementHandler end) {
    XML_SetElementHandler(native(parser), start, end);
}

void XML1_SetCharacterDataHandler(XML1_Parser parser, XML1_CharacterDataHandler handler) {
    XML_SetCharacterDataHandler(native(parser), handler);
}

void XML1_SetUserData(XML1_Parser parser, void* userData) { XML_SetUserData(native(parser), userData); }

void* XML1_GetBuffer(XML1_Parser parser, int len) { return XML_GetBuffer(native(parser), len); }

int XML1_ParseBuffer(XML1_Parser parser, int len, int isFinal) {
    return XML_ParseBuffer(native(parser), len, isFinal) == XML_STATUS_OK ? XML1_STATUS_OK : XML1_STATUS_ERROR;
}

int XML1_Parse(XML1_Parser parser, const char* s, int len, int isFinal) {
    return XML_Parse(native(parser), s, len, isFinal) == XML_STATUS_OK ? XML1_STATUS_OK : XML1_STATUS_ERROR;
}

int XML1_StopParser(XML1_Parser parser) {
    return XML_StopParser(native(parser), XML_FALSE) == XML_STATUS_OK ? 1 : 0;
}

int XML1_GetErrorCode(XML1_Parser parser) { return (int)XML_GetErrorCode(native(parser)); }

// Expat answers null for codes it does not know; codes outside 0..63 are kept
// from the enum conversion altogether (that range covers every code Expat has).
const XML1_Char* XML1_ErrorString(int code) {
    if (code < 0 || code > 63) return nullptr;
    return XML_ErrorString((enum XML_Error)code);
}

unsigned long XML1_GetCurrentLineNumber(XML1_Parser parser) {
    return (unsigned long)XML_GetCurrentLineNumber(native(parser));
}

unsigned long XML1_GetCurrentColumnNumber(XML1_Parser parser) {
    return (unsigned long)XML_GetCurrentColumnNumber(native(parser));
}
