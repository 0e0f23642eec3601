// kuiprops: validatePropertyNames, the interval check and the UTF-8
// conversion of names and values.
#include "kuiprops.h"

#include <unicode/ustring.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "kshlst.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuiprops");

namespace {

// Longest INTERVAL value: three digits of days, "/", six digits of time.
constexpr size_t kMaxIntervalLength = 10;

// Renames a property in place (the new name is never longer).
void rename(int i, const char* column) {
    snprintf(propertyName[i], strlen(propertyName[i]) + 1, "%s", column);
}

// Replaces value i by its UTF-8 form; false (errCode 99) when that is longer
// than the conversion buffers hold.
bool toUtf8(int i) {
    int ras = RAS1_Sync(RAS1_THIS);
    char* utf8 = kuiConvertToUtf8(propertyValue[i]);
    if (!utf8) {
        KUI_TRACE_ERROR(ras, "Internal error occurred while converting the value of property [%s]: its UTF-8 form "
                             "exceeds %d bytes",
                        propertyName[i], KUI_CONV_SIZE - 1);
        errCode = KUIE_INTERNAL;
        return false;
    }
    delete[] propertyValue[i];
    propertyValue[i] = utf8;
    return true;
}

// Traces `text` (which may name the value with %s), sets errCode 16, 1.
int intervalError(const char* text, const char* value) {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_ERROR(ras, text, value);
    errCode = KUIE_INTERVAL;
    return 1;
}

bool allDigits(const char* s) {
    for (; *s; s++)
        if (!isdigit((unsigned char)*s)) return false;
    return true;
}

int checkInterval(int i) {
    int ras = RAS1_Sync(RAS1_THIS);
    const char* value = propertyValue[i];
    const char* slash = strchr(value, '/');
    if (!slash || strlen(value) > kMaxIntervalLength) return intervalError("Property value [%s] must be given as XXX/XXXXXX for INTERVAL", value);
    memset(reev_days, 0, sizeof reev_days);
    memcpy(reev_days, value, (size_t)(slash - value));  // at most 9 characters: the value has at most 10
    if (!allDigits(reev_days)) return intervalError("REEV_DAYS must be positive INTEGER", value);
    KUI_TRACE_DETAIL(ras, "REEV_DAYS [%s] propertyValue [%s]", reev_days, value);
    if (reev_days[0] == '\0') {
        KUI_TRACE_DETAIL(ras, "Length of REEV_DAYS is 0, hence default its value to zero");
        snprintf(reev_days, sizeof reev_days, "0");
    } else if (strlen(reev_days) > 3) {
        return intervalError("Allowed length for REEV_DAYS is 3 but this is exceeded or it is negative", value);
    }
    memset(reev_time, 0, sizeof reev_time);
    if (strlen(slash + 1) != 6) return intervalError("Allowed length for REEV_TIME is 6 but this is not", value);
    memcpy(reev_time, slash + 1, 6);
    if (!allDigits(reev_time)) return intervalError("REEV_TIME must be positive INTEGER", value);
    char hour[3] = {reev_time[0], reev_time[1], 0}, min[3] = {reev_time[2], reev_time[3], 0},
         sec[3] = {reev_time[4], reev_time[5], 0};
    KUI_TRACE_DETAIL(ras, "HOUR: [%s] MIN: [%s] SEC: [%s]", hour, min, sec);
    if (atoi(hour) > 23 || atoi(min) > 59 || atoi(sec) > 59)
        return intervalError(
            "Hour , Min and Sec should be non negative and within the range of 23, 59 , 59 respectively", value);
    KUI_TRACE_DETAIL(ras, "REEV_TIME [%s] propertyValue [%s]", reev_time, value);
    return 0;
}

int checkDescription(int i, int*, LinkedList*) {
    int ras = RAS1_Sync(RAS1_THIS);
    rename(i, "TEXT");
    if (!toUtf8(i)) return 1;
    KUI_TRACE_DETAIL(ras, "Length of dst is:[%d]", (int)strlen(propertyValue[i]));
    KUI_TRACE_DETAIL(ras, "DESC : [%s] and destRet:[%d]", propertyValue[i], (int)strlen(propertyValue[i]));
    return 0;
}

int checkIntervalProperty(int i, int*, LinkedList*) { return checkInterval(i); }

int checkFormula(int i, int*, LinkedList*) {
    int ras = RAS1_Sync(RAS1_THIS);
    rename(i, "PDT");
    KUI_TRACE_DETAIL(ras, "FORMULA/PDT : [%s]", propertyValue[i]);
    if (propertyValue[i][0] == '\0') {
        errCode = KUIE_FORMULA;
        KUI_TRACE_ERROR(ras, "FORMULA should not be null");
        return 1;
    }
    if (!toUtf8(i)) return 1;
    KUI_TRACE_DETAIL(ras, "PDT:[%s] and destRet:[%d]", propertyValue[i], (int)strlen(propertyValue[i]));
    return 0;
}

int checkDistribution(int i, int* distFlag, LinkedList*) {
    int ras = RAS1_Sync(RAS1_THIS);
    *distFlag = 1;
    const char* v = propertyValue[i];
    if (v[strspn(v, " \t")] != '\0') {
        kuiReplace(distList, v);
        KUI_TRACE_DETAIL(ras, "DISTRIBUTION : [%s] and distList: [%s]", v, distList);
    } else if (!distList) {
        KUI_TRACE_DETAIL(ras,
                         "DISTRIBUTION contains either spaces or no value and hence no record will be inserted for "
                         "accesslist");
    }
    return 0;
}

int checkAdvice(int i, int*, LinkedList*) {
    int ras = RAS1_Sync(RAS1_THIS);
    rename(i, "ADVISE");
    if (!toUtf8(i)) return 1;
    KUI_TRACE_DETAIL(ras, "ADVICE:[%s] and destRet:[%d]", propertyValue[i], (int)strlen(propertyValue[i]));
    return 0;
}

int checkAction(int i, int*, LinkedList*) {
    int ras = RAS1_Sync(RAS1_THIS);
    rename(i, "CMD");
    KUI_TRACE_DETAIL(ras, "ACTION/CMD : [%s]", propertyValue[i]);
    if (propertyValue[i][0] == '\0') {
        kuiReplace(propertyValue[i], "*NONE");
        KUI_TRACE_DETAIL(ras, "ACTION is null, hence copying *NONE into it");
    } else if (!toUtf8(i)) {
        return 1;
    }
    KUI_TRACE_DETAIL(ras, "After copying, ACTION/CMD : [%s]", propertyValue[i]);
    return 0;
}

int checkRunOnStart(int i, int*, LinkedList*) {
    int ras = RAS1_Sync(RAS1_THIS);
    rename(i, "AUTOSTART");
    KUI_TRACE_DETAIL(ras, "RUNONSTART : [%s]", propertyValue[i]);
    bool yes = strcasecmp(propertyValue[i], "yes") == 0, no = strcasecmp(propertyValue[i], "no") == 0;
    if (!yes && !no) {
        errCode = KUIE_RUNONSTART;
        KUI_TRACE_ERROR(ras, "RUNONSTART should be either YES/yes or NO/no");
        return 1;
    }
    kuiReplace(propertyValue[i], yes ? "*YES" : "*NO");
    KUI_TRACE_DETAIL(ras, "After copying, RUNONSTART/AUTOSTART : [%s]", propertyValue[i]);
    return 0;
}

struct SitinfoFailure {
    int result;  // of validateVEC
    int code;    // errCode
    const char* text;
};
const SitinfoFailure kSitinfoFailures[] = {
    {1, KUIE_SEV, "The Severity (SEV) value in SITINFO [%s] property is invalid"},
    {2, KUIE_TFWD, "The VEC Forwarding (TFWD) value in SITINFO [%s] property is invalid"},
    {3, KUIE_TDST, "The VEC Destination (TDST) value in SITINFO [%s] property is invalid"},
    {4, KUIE_ATOM, "The ATOM value in SITINFO [%s] property is invalid"},
    {5, KUIE_COUNT, "The COUNT value in SITINFO [%s] property is invalid"},
    {6, KUIE_SITINFO, "The SITINFO [%s] property is invalid"},
};

int checkSitinfo(int i, int*, LinkedList* destinations) {
    int ras = RAS1_Sync(RAS1_THIS);
    KUI_TRACE_DETAIL(ras, "SITINFO: [%s]", propertyValue[i]);
    size_t size = strlen(propertyValue[i]) + 3;
    char* out = new char[size]();
    int vrc = validateVEC(propertyValue[i], destinations, &out);
    out[size - 1] = '\0';
    kuiReplace(propertyValue[i], out);
    delete[] out;
    KUI_TRACE_DETAIL(ras, "Modified SITINFO: [%s]", propertyValue[i]);
    for (const SitinfoFailure& f : kSitinfoFailures)
        if (f.result == vrc) {
            errCode = f.code;
            KUI_TRACE_ERROR(ras, f.text, propertyValue[i]);
            return 1;
        }
    return 0;
}

struct PropertyRule {
    const char* name;
    int (*check)(int index, int* distFlag, LinkedList* destinations);
};
const PropertyRule kProperties[] = {
    {"DESC", checkDescription},   {"DESCRIPTION", checkDescription}, {"INTERVAL", checkIntervalProperty},
    {"FORMULA", checkFormula},    {"DISTRIBUTION", checkDistribution}, {"ADVICE", checkAdvice},
    {"ACTION", checkAction},      {"RUNONSTART", checkRunOnStart},   {"SITINFO", checkSitinfo},
};

}  // namespace

char* kuiConvertToUtf8(const char* text) {
    int ras = RAS1_Sync(RAS1_THIS);
    // One unit more than a value may fill tells a value that did not fit
    // from one that filled the buffer exactly.
    UChar wide[KUI_CONV_SIZE + 1];
    u_memset(wide, 0, KUI_CONV_SIZE + 1);
    u_uastrncpy(wide, kuiText(text), KUI_CONV_SIZE);
    int32_t units = u_strlen(wide);
    KUI_TRACE_DETAIL(ras, "Length of dst is:[%d]", (int)units);
    if (units >= KUI_CONV_SIZE) return nullptr;
    char* utf8 = new char[KUI_CONV_SIZE]();
    int32_t length = 0;
    UErrorCode status = U_ZERO_ERROR;
    u_strToUTF8(utf8, KUI_CONV_SIZE - 1, &length, wide, units, &status);
    if (U_FAILURE(status) || length > KUI_CONV_SIZE - 1) {
        delete[] utf8;
        return nullptr;
    }
    utf8[length] = '\0';
    return utf8;
}

int validatePropertyNames(int count, int* distFlag, LinkedList* destinations) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    reev_days[0] = '\0';
    reev_time[0] = '\0';
    int rc = 0;
    for (int i = 0; rc == 0 && i < count && i < propertySlots; i++) {
        const PropertyRule* rule = nullptr;
        for (const PropertyRule& r : kProperties)
            if (strcmp(propertyName[i], r.name) == 0) rule = &r;
        if (rule) {
            rc = rule->check(i, distFlag, destinations);
        } else {
            errCode = KUIE_PROPNAME;
            KUI_TRACE_ERROR(ras, "Property name [%s] is invalid", propertyName[i]);
            rc = 1;
        }
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
