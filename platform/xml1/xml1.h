// xml1: the platform's streaming XML parser.
//
// A parser reads a document in one or more pieces and reports element starts,
// element ends and character data to callbacks, with a user-data pointer the
// caller chooses. Output strings are UTF-8, NUL-terminated except character
// data, which comes as (pointer, length) and may arrive in several pieces for
// one run of text (around references, at line ends, at piece boundaries).
// Attributes come as a null-terminated array alternating name and value.
//
// External entities are never loaded. A parser is used by one thread at a
// time; different parsers are independent.
#pragma once

// Opaque parser handle; created by XML1_ParserCreate, freed by XML1_ParserFree.
struct XML1_ParserStruct;
using XML1_Parser = XML1_ParserStruct*;

using XML1_Char = char;

using XML1_StartElementHandler = void (*)(void* userData, const XML1_Char* name, const XML1_Char** atts);
using XML1_EndElementHandler = void (*)(void* userData, const XML1_Char* name);
using XML1_CharacterDataHandler = void (*)(void* userData, const XML1_Char* s, int len);

enum : int {
    XML1_STATUS_ERROR = 0,  // the text is not well-formed (see XML1_GetErrorCode)
    XML1_STATUS_OK = 1,
};

enum : int { XML1_ERROR_NONE = 0 };

// A new parser; `encoding` null lets the document (or UTF-8) decide. Null
// when memory is short.
XML1_Parser XML1_ParserCreate(const XML1_Char* encoding);
// Prepares `parser` for a new document, keeping no handlers and no user data.
// 1 on success, 0 when the parser is in the middle of a callback.
int XML1_ParserReset(XML1_Parser parser, const XML1_Char* encoding);
void XML1_ParserFree(XML1_Parser parser);

// Registers callbacks (null: not reported) and the pointer they receive.
void XML1_SetElementHandler(XML1_Parser parser, XML1_StartElementHandler start, XML1_EndElementHandler end);
void XML1_SetCharacterDataHandler(XML1_Parser parser, XML1_CharacterDataHandler handler);
void XML1_SetUserData(XML1_Parser parser, void* userData);

// A buffer of at least `len` bytes owned by the parser, to be filled and then
// handed to XML1_ParseBuffer; null when none can be given.
void* XML1_GetBuffer(XML1_Parser parser, int len);
// Parses `len` bytes of the last buffer from XML1_GetBuffer. `isFinal` 1 marks
// the end of the document (an unfinished document is then an error).
// XML1_STATUS_OK or XML1_STATUS_ERROR.
int XML1_ParseBuffer(XML1_Parser parser, int len, int isFinal);
// Parses `len` bytes at `s` (copied by the parser as needed).
int XML1_Parse(XML1_Parser parser, const char* s, int len, int isFinal);
// Called from a callback: ends the parse in progress, which then returns
// XML1_STATUS_ERROR; no further callbacks are made. 1 on success.
int XML1_StopParser(XML1_Parser parser);

// The error of the last failed parse (XML1_ERROR_NONE when there is none),
// its English text (null for an unknown code; static storage), and the
// position the parser had reached (line from 1, column from 0).
int XML1_GetErrorCode(XML1_Parser parser);
const XML1_Char* XML1_ErrorString(int code);
unsigned long XML1_GetCurrentLineNumber(XML1_Parser parser);
unsigned long XML1_GetCurrentColumnNumber(XML1_Parser parser);
