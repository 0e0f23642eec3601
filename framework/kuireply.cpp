// kuireply: reading the rows of a server reply into an array of texts.
//
// A reply holds one TABLE with OBJECT and DATA; DATA holds one ROW per row and
// a ROW one element per selected column, named after it, its text the value
// (the SOAP envelope around the table is ignored).
#include <cstdlib>
#include <cstring>
#include <vector>

#include "kshxmlxp.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuireply");

namespace {

char* copyText(const char* s) {
    size_t n = s ? strlen(s) : 0;
    char* c = static_cast<char*>(malloc(n + 1));
    if (c) {
        if (n) memcpy(c, s, n);
        c[n] = '\0';
    }
    return c;
}

// Appends the values of the first `columns` children of `row` ("" for a
// missing element or one without text). False when memory is short.
bool takeRow(KSH_DOMNode* row, int columns, std::vector<char*>* out) {
    KSH_DOMNode* child = row->getFirstChild();
    for (int c = 0; c < columns; c++) {
        char* v = copyText(child ? child->getValue() : nullptr);
        if (!v) return false;
        out->push_back(v);
        if (child) child = row->getNextChild();
    }
    return true;
}

}  // namespace

int parseSoapResponseIntoArray(const char* reply, int* count, int columns, char*** values) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (count) *count = 0;
    if (values) *values = nullptr;
    int rc = (reply && values && columns > 0) ? 0 : 6;
    KSH_XML doc;
    if (rc == 0 && doc.parseMessage(reply, (unsigned)strlen(reply)) != 0) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Reply is not well-formed: %s", doc.getParseError() ? doc.getParseError() : "");
        rc = 6;
    }
    unsigned rows = 0;
    if (rc == 0 && doc.getArray("ROW", &rows) != 0) rc = 5;
    std::vector<char*> texts;
    for (unsigned r = 0; rc == 0 && r < rows; r++) {
        KSH_DOMNode* row = doc.getCurrent();
        if (!row || !takeRow(row, columns, &texts)) rc = 7;
        doc.nextNode();
    }
    char** array = nullptr;
    if (rc == 0) {
        array = static_cast<char**>(malloc(sizeof(char*) * (texts.size() + 1)));
        if (!array) rc = 7;
    }
    if (rc == 0) {
        for (size_t i = 0; i < texts.size(); i++) array[i] = texts[i];
        array[texts.size()] = nullptr;
        *values = array;
        if (count) *count = (int)texts.size();
    } else
        for (char* t : texts) free(t);
    RAS1_TRACE_IF(ras, RAS1_STATE, "Reply rows %u, rc %d", rows, rc);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

void releaseSoapResponseArray(char** values, int count) {
    if (!values) return;
    for (int i = 0; i < count; i++) free(values[i]);
    free(values);
}
