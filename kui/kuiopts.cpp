// kuiopts: parseArgs and checkArguments.
#include "kuiopts.h"

#include <cstdlib>
#include <cstring>

#include "kshlst.h"
#include "kuiprops.h"
#include "kuistate.h"
#include "kuisupport.h"
#include "ras1/ras1.h"

RAS1_UNIT("kuiopts");

namespace {

// Longest situation or base situation name, in UTF-8 bytes.
constexpr size_t kMaxNameBytes = 256;

enum class Opt { None, Import, Base, Situation, Property };

struct OptionName {
    const char* text;
    Opt opt;
};
const OptionName kOptions[] = {
    {"-i", Opt::Import},    {"--import", Opt::Import},       {"-b", Opt::Base},
    {"--basedon", Opt::Base}, {"-s", Opt::Situation},        {"--situation", Opt::Situation},
    {"-p", Opt::Property},  {"--property", Opt::Property},   {"--properties", Opt::Property},
};

Opt optionOf(const char* arg) {
    for (const OptionName& o : kOptions)
        if (strcasecmp(arg, o.text) == 0) return o.opt;
    return Opt::None;
}

void freeText(void* p) { free(p); }

// Replaces an owned name by its UTF-8 form in a zero-filled KUI_CONV_SIZE
// buffer. A name too long for the conversion buffers keeps its bytes, cut to
// the buffer: it is longer than any name may be and checkArguments refuses it.
void convertName(char*& name) {
    char* utf8 = kuiConvertToUtf8(name);
    if (!utf8) {
        utf8 = new char[KUI_CONV_SIZE]();
        memcpy(utf8, name, strnlen(name, KUI_CONV_SIZE - 1));
    }
    delete[] name;
    name = utf8;
}

char* upperCopy(const char* s, size_t n) {
    char* c = new char[n + 1];
    for (size_t i = 0; i < n; i++) c[i] = (s[i] >= 'a' && s[i] <= 'z') ? (char)(s[i] - 'a' + 'A') : s[i];
    c[n] = '\0';
    return c;
}

// Takes the NAME=VALUE pairs that follow -p at argv[first]. A second -p goes
// on filling after the pairs already taken; more than MAX_PROPERTY_NUM pairs
// are refused (the pairs are marked invalid), never written past the arrays.
void takePairs(int argc, char** argv, int first) {
    int ras = RAS1_Sync(RAS1_THIS);
    propOptPresent = 1;
    if (!propertyName) {
        propertyName = new char*[MAX_PROPERTY_NUM]();
        propertyValue = new char*[MAX_PROPERTY_NUM]();
    }
    for (int j = first; j < argc && argv[j] && invalidNVPair == 'N'; j++) {
        KUI_TRACE_DETAIL(ras, "The NAME=VALUE pair from CLI:[%s] and position is [%d] and length:[%d]:", argv[j], j,
                         (int)strlen(argv[j]));
        const char* eq = strchr(argv[j], '=');
        if (!eq) {
            invalidNVPair = 'Y';
            break;
        }
        if (propertySlots >= MAX_PROPERTY_NUM) {
            KUI_TRACE_ERROR(ras, "More than %d NAME=VALUE pairs given with -p: [%s] and the rest are refused",
                            MAX_PROPERTY_NUM, argv[j]);
            invalidNVPair = 'Y';
            break;
        }
        int k = propertySlots++;
        propertyName[k] = upperCopy(argv[j], (size_t)(eq - argv[j]));
        propertyValue[k] = kuiDup(eq + 1);
        if (propertyName[k][0] != '\0') propertyCount++;
    }
}

}  // namespace

void parseArgs(int argc, char** argv) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    for (int i = 2; argv && i < argc && argv[i]; i++) {
        Opt opt = optionOf(argv[i]);
        bool hasNext = i + 1 < argc && argv[i + 1] != nullptr;
        if (opt == Opt::Import && hasNext) {
            sitFileName = argv[++i];
            sitFilePresent = 1;
            KUI_TRACE_DETAIL(ras, "Import filename from CLI:[%s]", sitFileName);
            char* utf8 = convertToUTF8(sitFileName);
            displayFileName = kuiText(utf8);
            delete[] utf8;
            KUI_TRACE_DETAIL(ras, "Export File name after UTF8 conversion: [%s]", displayFileName.c_str());
        } else if (opt == Opt::Base && hasNext) {
            kuiReplace(baseSitName, argv[++i]);
            baseSitNamePresent = 1;
            KUI_TRACE_DETAIL(ras, "BaseSituation from CLI:[%s]", baseSitName);
            convertName(baseSitName);
        } else if (opt == Opt::Situation && hasNext) {
            trimTheString(&argv[i + 1]);
            kuiReplace(sitName, argv[++i]);
            sitPresent = 1;
            KUI_TRACE_DETAIL(ras, "SITNAME is: [%s]", sitName);
            convertName(sitName);
        } else if (opt == Opt::Property) {
            takePairs(argc, argv, i + 1);
        }
    }
    RAS1_EXIT(ras);
}

int checkArguments(int argc, char** argv, void* ctx) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 0;
    if (!sitFilePresent && !sitPresent) {
        KUI_TRACE_ERROR(ras, "Either a -s or a -i option must be specified");
        errCode = KUIE_NOOPTION;
        rc = KUIR_FAIL;
    } else if (sitFilePresent == 1 && (sitPresent || baseSitNamePresent || propOptPresent)) {
        KUI_TRACE_ERROR(ras, "Cannot combine -s or -b or -p with -i option");
        errCode = KUIE_COMBINED;
        rc = KUIR_FAIL;
    } else if (sitPresent == 1 && baseSitNamePresent == 0) {
        KUI_TRACE_ERROR(ras, "When a situation name is specified, -b BASENAME option must be given");
        errCode = KUIE_NOBASE;
        rc = KUIR_FAIL;
    } else if (propOptPresent == 1 && (propertyCount == 0 || invalidNVPair == 'Y')) {
        KUI_TRACE_ERROR(ras, "The -p parameter must be given with one or more name=value pairs.");
        errCode = KUIE_BADPAIRS;
        rc = KUIR_FAIL;
    } else if (sitPresent == 1 && strlen(kuiText(sitName)) > kMaxNameBytes) {
        errCode = KUIE_SITNAMELEN;
        rc = KUIR_INVALID;
    } else if (baseSitNamePresent == 1 && strlen(kuiText(baseSitName)) > kMaxNameBytes) {
        errCode = KUIE_BASENAMELEN;
        rc = KUIR_INVALID;
    }
    if (rc == 0 && propertyCount >= 1) {
        bool tdst = false;
        for (int i = 0; argv && i < argc; i++)
            if (argv[i] && strstr(argv[i], "TDST")) tdst = true;
        LinkedList destinations(freeText);
        if (tdst) {
            rc = GetEventID(&destinations, ctx);
            if (rc == KUIR_ABSENT) errCode = KUIE_NOEIF;
            else if (rc == KUIR_SERVER) errCode = KUIE_SERVER;
            else if (rc == KUIR_COMM) errCode = KUIE_COMM;
            else if (rc != 0) errCode = KUIE_INTERNAL;
        }
        if (rc == 0) rc = validatePropertyNames(propertyCount, &distPresent, &destinations);
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
