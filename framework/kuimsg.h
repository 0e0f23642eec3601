// kuimsg: the message file of a command and the rendering of its coded
// result messages.
//
// A coded message is "NNNS@C", optionally followed by "@n" and n values each
// preceded by "@" (n is 1 or 2): NNN the message number, S its severity
// letter (I information, W warning, E error), C its class letter. Example:
// "005I@S@2@NEWSIT@HP". The message id is "NNNS" ("005I"); a value may itself
// hold "@": with two values the second is the last field and the first is
// everything between the count and it.
//
// Rendering (the message file's own comment says the same for its readers):
//   line 1   PREFIX + id + ": " + the text of the id, in which {1} and {2}
//            are replaced by the first and second value ("" when absent);
//            a second value "HP" stands for the hub the user is logged into
//            and is replaced by its name (the server URL when the hub name
//            is unknown)
//   line 2   class C only: two blanks and the CLASS C text of the file (what
//            to check in the environment: the server connection, the file)
//            Class S messages are about the situation or the command line
//            and have no second line.
// An id the file does not know renders as PREFIX + id + ": " followed by the
// values, so nothing the command reported is lost.
#pragma once

#include <map>
#include <string>

#include "opclictx.h"  // OPCLI_API

class OPCLI_API KUI_MessageFile {
public:
    // Reads the message file at `path`. 0; 5 the file cannot be read; 6 it is
    // not a message file (not well-formed, or no MESSAGES root).
    [[nodiscard]] int load(const std::string& path);

    // Text of message `id` ("005I"), or null.
    const std::string* text(const std::string& id) const;
    // Text of class `letter`, or null.
    const std::string* classText(char letter) const;
    const std::string& prefix() const { return prefix_; }

    // Renders `coded` as described above into *out (lines end with "\n").
    // Returns the severity letter, or 0 when `coded` is not a coded message
    // (then *out holds the text as it came, with a line end).
    char render(const char* coded, const std::string& hub, std::string* out) const;

private:
    std::string prefix_ = "CSIT";
    std::map<std::string, std::string> texts_;
    std::map<char, std::string> classes_;
};

// Path of message file `file` in folder `dir` ("" = current folder).
OPCLI_API std::string KUI_MessagePath(const std::string& dir, const char* file);
