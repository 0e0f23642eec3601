// kuimsg: reading the message file and rendering coded messages; displayMsg.
//
// The file is read with the platform's streaming parser: a message file is a
// flat list of MESSAGE and CLASS elements under a MESSAGES root, so no
// document tree is needed.
#include "kuimsg.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <vector>

#include "kuisupport.h"
#include "opclictx.h"
#include "ras1/ras1.h"
#include "xml1/xml1.h"

RAS1_UNIT("kuimsg");

namespace {

// Collects the file's entries while it is parsed.
struct LoadState {
    std::string prefix;
    bool sawRoot = false;
    int depth = 0;
    std::string element;  // MESSAGE or CLASS being read, else empty
    std::string key;      // its id or letter
    std::string text;
    std::map<std::string, std::string> texts;
    std::map<char, std::string> classes;
};

const char* attribute(const char** atts, const char* name) {
    for (int i = 0; atts && atts[i] && atts[i + 1]; i += 2)
        if (strcmp(atts[i], name) == 0) return atts[i + 1];
    return nullptr;
}

void onStart(void* user, const char* name, const char** atts) {
    LoadState* st = static_cast<LoadState*>(user);
    st->depth++;
    if (st->depth == 1) {
        st->sawRoot = strcmp(name, "MESSAGES") == 0;
        const char* p = attribute(atts, "prefix");
        if (p) st->prefix = p;
        return;
    }
    if (st->depth != 2) return;
    const char* key = nullptr;
    if (strcmp(name, "MESSAGE") == 0) key = attribute(atts, "id");
    else if (strcmp(name, "CLASS") == 0) key = attribute(atts, "letter");
    if (!key) return;
    st->element = name;
    st->key = key;
    st->text.clear();
}

void onEnd(void* user, const char*) {
    LoadState* st = static_cast<LoadState*>(user);
    if (st->depth == 2 && !st->element.empty()) {
        // Line breaks and indentation inside a text become single blanks.
        std::string flat;
        for (char c : st->text) {
            bool blank = c == ' ' || c == '\n' || c == '\t' || c == '\r';
            if (blank && (flat.empty() || flat.back() == ' ')) continue;
            flat += blank ? ' ' : c;
        }
        while (!flat.empty() && flat.back() == ' ') flat.pop_back();
        if (st->element == "MESSAGE") st->texts[st->key] = flat;
        else if (st->key.size() == 1) st->classes[st->key[0]] = flat;
        st->element.clear();
    }
    st->depth--;
}

void onText(void* user, const char* s, int len) {
    LoadState* st = static_cast<LoadState*>(user);
    if (!st->element.empty()) st->text.append(s, (size_t)len);
}

// Splits a coded message into id, class and values; false when it is not one.
bool parseCoded(const std::string& coded, std::string* id, char* cls, std::vector<std::string>* values) {
    if (coded.size() < 6 || coded[4] != '@') return false;
    for (int i = 0; i < 3; i++)
        if (!isdigit((unsigned char)coded[i])) return false;
    if (!strchr("IWE", coded[3])) return false;
    *id = coded.substr(0, 4);
    *cls = coded[5];
    values->clear();
    if (coded.size() == 6) return true;
    if (coded.size() < 9 || coded[6] != '@' || (coded[7] != '1' && coded[7] != '2') || coded[8] != '@') return false;
    std::string rest = coded.substr(9);
    if (coded[7] == '1') {
        values->push_back(rest);
        return true;
    }
    size_t last = rest.rfind('@');
    if (last == std::string::npos) return false;
    values->push_back(rest.substr(0, last));
    values->push_back(rest.substr(last + 1));
    return true;
}

std::string substitute(const std::string& text, const std::vector<std::string>& values) {
    std::string out;
    for (size_t i = 0; i < text.size(); i++) {
        if (text[i] == '{' && i + 2 < text.size() && (text[i + 1] == '1' || text[i + 1] == '2') && text[i + 2] == '}') {
            size_t k = (size_t)(text[i + 1] - '1');
            if (k < values.size()) out += values[k];
            i += 2;
        } else out += text[i];
    }
    return out;
}

}  // namespace

int KUI_MessageFile::load(const std::string& path) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    std::ifstream in(path, std::ios::binary);
    int rc = in ? 0 : 5;
    std::string data;
    if (rc == 0) {
        std::ostringstream ss;
        ss << in.rdbuf();
        data = ss.str();
    }
    LoadState st;
    XML1_Parser parser = rc == 0 ? XML1_ParserCreate(nullptr) : nullptr;
    if (rc == 0 && !parser) rc = 6;
    if (parser) {
        XML1_SetUserData(parser, &st);
        XML1_SetElementHandler(parser, onStart, onEnd);
        XML1_SetCharacterDataHandler(parser, onText);
        if (XML1_Parse(parser, data.data(), (int)data.size(), 1) != XML1_STATUS_OK || !st.sawRoot) {
            RAS1_Printf(RAS1_THIS, __LINE__, "Message file %s is not usable at line %lu: %s", path.c_str(),
                        XML1_GetCurrentLineNumber(parser), st.sawRoot ? "not well-formed" : "no MESSAGES root");
            rc = 6;
        }
        XML1_ParserFree(parser);
    }
    if (rc == 0) {
        if (!st.prefix.empty()) prefix_ = st.prefix;
        texts_ = std::move(st.texts);
        classes_ = std::move(st.classes);
    }
    RAS1_TRACE_IF(ras, RAS1_STATE, "Message file %s: %zu texts, rc %d", path.c_str(), texts_.size(), rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

const std::string* KUI_MessageFile::text(const std::string& id) const {
    auto it = texts_.find(id);
    return it == texts_.end() ? nullptr : &it->second;
}

const std::string* KUI_MessageFile::classText(char letter) const {
    auto it = classes_.find(letter);
    return it == classes_.end() ? nullptr : &it->second;
}

char KUI_MessageFile::render(const char* coded, const std::string& hub, std::string* out) const {
    std::string id;
    char cls = 0;
    std::vector<std::string> values;
    if (!coded || !parseCoded(coded, &id, &cls, &values)) {
        *out = std::string(coded ? coded : "") + "\n";
        return 0;
    }
    if (values.size() == 2 && values[1] == "HP") values[1] = hub;
    const std::string* t = text(id);
    *out = prefix_ + id + ": ";
    if (t) *out += substitute(*t, values);
    else
        for (size_t i = 0; i < values.size(); i++) *out += (i ? " " : "") + values[i];
    *out += "\n";
    const std::string* hint = cls == 'C' ? classText('C') : nullptr;
    if (hint) *out += "  " + *hint + "\n";
    return id[3];
}

std::string KUI_MessagePath(const std::string& dir, const char* file) {
    if (dir.empty()) return file ? file : "";
    return dir + "/" + (file ? file : "");
}

void displayMsg(const char* id, int, const char* file, int, int, int) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    OPCLI_Context* ctx = OPCLI_Context::active();
    std::string dir = ctx ? ctx->messageDir : std::string();
    std::string hub = ctx ? (ctx->hub.empty() ? ctx->serverUrl : ctx->hub) : std::string();
    KUI_MessageFile messages;
    if (messages.load(KUI_MessagePath(dir, file ? file : "kuicreatesitErr.xml")) != 0)
        RAS1_Printf(RAS1_THIS, __LINE__, "Message %s shown without its text", id ? id : "");
    // A bare id carries its class in the file's convention: shown as class S.
    std::string coded = std::string(id ? id : "") + "@S";
    std::string line;
    char severity = messages.render(coded.c_str(), hub, &line);
    FILE* to = (severity == 'I') ? stdout : stderr;
    fputs(line.c_str(), to);
    fflush(to);
    RAS1_EXIT(ras);
}
