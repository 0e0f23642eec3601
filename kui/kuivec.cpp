// kuivec: checking, keeping and writing event-console slot rows.
#include "kuivec.h"

#include <cstring>

#include "kshxmlxp.h"
#include "kuisql.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuivec");

namespace {

// The columns of a slot row, in the order they are stored and written.
const char* const kVecColumns[KUI_VEC_COLUMNS] = {"ID",        "OBJCLASS",   "SEQUENCE", "TYPE",     "LSTDATE",
                                                  "LSTUSRPRF", "LSTRELEASE", "LOCFLAG",  "RESERVED", "MAP"};
enum : int { kIdColumn = 0, kUserColumn = 5, kMapColumn = 9 };

int columnOf(const char* name) {
    for (int i = 0; i < KUI_VEC_COLUMNS; i++)
        if (strcmp(name, kVecColumns[i]) == 0) return i;
    return -1;
}

int invalidRow() {
    errCode = KUIE_BADEXPORT;
    return KUIR_INVALID;
}

// Checks one slot row and stores its values at row*10. Each value goes to
// the place of its column, so a file that lists the elements in another
// order still writes every value into its own column; a column given twice
// is refused.
int takeRow(KSH_DOMNode* row, int index) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (row->getNumChildren() != KUI_VEC_COLUMNS) {
        KUI_TRACE_ERROR(ras, "Invalid VEC SLOT details, The number of elements is less than 10");
        return invalidRow();
    }
    char** values = vecValArray + (size_t)index * KUI_VEC_COLUMNS;
    for (KSH_DOMNode* e = row->getFirstChild(); e; e = row->getNextChild()) {
        const char* name = e->getName();
        const char* value = e->getValue();
        int c = name && *name ? columnOf(name) : -2;
        if (c == -2) {
            KUI_TRACE_ERROR(ras, "Invalid VEC SLOT details, The element name is NULL");
            return invalidRow();
        }
        if (c < 0 || values[c]) {
            KUI_TRACE_ERROR(ras, "Invalid VEC SLOT details, Invalid TAG [%s] found", name);
            return invalidRow();
        }
        if (c == kIdColumn && (!value || strcmp(value, kuiText(sitName)) != 0)) {
            KUI_TRACE_ERROR(ras, "Invalid VEC SLOT details, The SITNAME and ID are not unique");
            return invalidRow();
        }
        if (c == kMapColumn && !value) {
            KUI_TRACE_ERROR(ras, "Invalid VEC SLOT details, The value for MAP is NULL");
            return invalidRow();
        }
        values[c] = kuiDup(value);
    }
    return KUIR_OK;
}

}  // namespace

int validateAndConstructVECDetails(int rows, KSH_DOMNode* table) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = KUIR_OK;
    if (!table || rows <= 0) rc = invalidRow();
    if (rc == KUIR_OK) {
        table->getFirstChild();  // the situation row
        vecValArray = new char*[(size_t)rows * KUI_VEC_COLUMNS]();
    }
    for (int r = 0; rc == KUIR_OK && r < rows; r++) {
        KSH_DOMNode* row = table->getNextChild();
        rc = row ? takeRow(row, r) : invalidRow();
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int insertVECDetails(void* ctx, char* msgBuf, char**) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    msgBuf[0] = '\0';
    int rc = KUIR_OK;
    for (int r = 0; rc == KUIR_OK && vecValArray && r < noOfVecRows; r++) {
        char** v = vecValArray + (size_t)r * KUI_VEC_COLUMNS;
        KUI_Statement st(msgBuf);
        st.add("INSERT INTO O4SRV.EVNTMAP(ID,OBJCLASS,SEQUENCE,TYPE,LSTDATE,LSTUSRPRF,LSTRELEASE,LOCFLAG,RESERVED,MAP,"
               "QIBCLASSID) VALUES(\"");
        // Every value is escaped for its literal: quotes in the double-quoted
        // ones are doubled, apostrophes in the single-quoted MAP.
        st.addQuotedOutsideCdata(sitName);
        for (int c = 1; c < KUI_VEC_COLUMNS - 1; c++)
            st.add("\", \"").addQuotedOutsideCdata(c == kUserColumn ? KUI_QIBUSER : v[c]);
        st.add("\", N'<![CDATA[").addSingleQuotedInCdata(v[kMapColumn]).add("]]>', \"2250\"").add(")");
        KUI_TRACE_DETAIL(ras, "SOAP request for inserting VEC SLOT details into EVNTMAP table is [%s] ", st.text());
        rc = kuiSendUpdate(ctx, st);
        if (rc == KUIR_OK) {
            KUI_TRACE_DETAIL(ras, "VEC SLOT details successfully inserted into EVNTMAP for situation : [%s]",
                             kuiText(sitName));
        } else if (rc == KUIR_COMM || rc == KUIR_SERVER) {
            KUI_QUERY_FAILED(ras, rc,
                             "Server exception occurred, SOAP query failed during insertion of VEC SLOT details in "
                             "to EVNTMAP",
                             "Communication error occurred, SOAP query failed during insertion of VEC SLOT details "
                             "in to EVNTMAP",
                             nullptr);
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
