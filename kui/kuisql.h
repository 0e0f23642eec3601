// kuisql: composing SQL statements in the message buffer and sending them.
//
// Every statement the command sends is composed in the framework's message
// buffer (KUI_MSGBUF_SIZE bytes). The composer never writes past it: a
// statement that does not fit is marked, and kuiSend refuses to send it
// (errCode 99), so truncated SQL never reaches the server.
//
// Literal values are made safe for the two places they travel through:
//   - the SQL literal: double quotes are doubled (escapeDoubleQuotes) by the
//     callers, single quotes doubled in single-quoted literals;
//   - the SOAP request: text inside a CDATA section may not hold "]]>", which
//     would end the section early; it is split over two sections. Outside a
//     CDATA section the support library escapes the text, except a value
//     holding "<![CDATA[", which is wrapped in a section of its own so that
//     it cannot open one.
#pragma once

#include <cstddef>

class KUI_Statement {
public:
    // Empties `buf` (KUI_MSGBUF_SIZE bytes) and composes into it.
    explicit KUI_Statement(char* buf);
    KUI_Statement(const KUI_Statement&) = delete;
    KUI_Statement& operator=(const KUI_Statement&) = delete;

    // Appends text as it is.
    KUI_Statement& add(const char* s);
    // Appends a literal's content inside a CDATA section ("]]>" split).
    KUI_Statement& addInCdata(const char* value);
    // Appends a literal's content outside any CDATA section.
    KUI_Statement& addOutsideCdata(const char* value);
    // Appends `value` with every double quote doubled, outside CDATA.
    KUI_Statement& addQuotedOutsideCdata(const char* value);
    // Appends `value` with single quotes doubled, inside CDATA.
    KUI_Statement& addSingleQuotedInCdata(const char* value);

    bool fits() const { return !overflow; }
    const char* text() const { return buf; }
    size_t length() const { return len; }

private:
    void append(const char* s, size_t n);

    char* buf;
    size_t len = 0;
    bool overflow = false;
};

// Sends a composed statement with issueSoapRequest. 0: *reply holds the
// reply (released by the caller with free; it may be a table or not);
// 4: communication error (no reply); 8: the statement did not fit the
// buffer (errCode 99 set and traced; nothing sent).
[[nodiscard]] int kuiSend(void* ctx, const KUI_Statement& st, char** reply);

// Sends a statement that writes rows and judges the reply: 0 success (the
// reply holds "</TABLE>"), 4 communication error, 7 server exception, 8 as
// kuiSend. The reply is released.
[[nodiscard]] int kuiSendUpdate(void* ctx, const KUI_Statement& st);
