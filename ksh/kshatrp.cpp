// kshatrp: the attribute file parser.
#include "kshatrp.h"

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

#include "bss1/bss1.h"
#include "kgl/kgl.h"
#include "kshcat.h"
#include "kshcol.h"
#include "kshlst.h"
#include "kshreq.h"
#include "kshtab.h"
#include "kshutil.h"
#include "ras1/ras1.h"

RAS1_UNIT("kshatrp");

namespace {

// Size of a path buffer: a directory and a file name of the system.
constexpr size_t kPathSize = 4096;

// Column type codes of the catalog, indexed by the number on a type line;
// 0 leaves the type as it is.
constexpr int kTypeCodes[] = {
    0,     // 0  no type
    496,   // 1  integer
    452,   // 2  character
    452,   // 3
    496,   // 4  integer
    452,   // 5
    452,   // 6
    452,   // 7
    452,   // 8
    452,   // 9
    1022,  // 10 national character
    492,   // 11 64-bit integer
};

// Applications whose items at hide level 1 are still stored.
const char* const kServerApps[] = {"O4SRV", "KMQ"};
// Applications for which operation group 0 does not hide an item.
const char* const kOpGroupApps[] = {"O4SRV", "KOS", "KMQ"};

template <size_t N>
bool isOneOf(const char* app, const char* const (&apps)[N]) {
    for (const char* a : apps)
        if (WSQL_CaseCompare(app, a) == 0) return true;
    return false;
}

// atoi without its undefined cases: leading white space and a sign, then
// digits; out-of-range values are clamped to the int range.
int toInt(const char* text) {
    long v = strtol(text, nullptr, 10);
    if (v > INT_MAX) return INT_MAX;
    if (v < INT_MIN) return INT_MIN;
    return (int)v;
}

// Copies at most `max` characters of `value` into `field` (max+1 bytes).
void keep(char* field, int max, const char* value) { snprintf(field, (size_t)max + 1, "%.*s", max, value); }

}  // namespace

const WSQL_AttrParser::ParseEntry WSQL_AttrParser::_parseTable[] = {
    {"name", &WSQL_AttrParser::doAttribute},
    {"colu", &WSQL_AttrParser::doColumn},
    {"tabl", &WSQL_AttrParser::doTable},
    {"type", &WSQL_AttrParser::doType},
    {"appl", &WSQL_AttrParser::doApplication},
    {"slng", &WSQL_AttrParser::doLength},
    {"entr", &WSQL_AttrParser::doEntry},
    {"opgr", &WSQL_AttrParser::doOpGroup},
    {"vale", &WSQL_AttrParser::doVale},
    {"vali", &WSQL_AttrParser::doVali},
    {"scal", &WSQL_AttrParser::doScale},
    {"", nullptr},
};

WSQL_AttrParser::WSQL_AttrParser(WSQL_Catalog* catalog) : catalog_(catalog) {}

WSQL_AttrParser::~WSQL_AttrParser() {
    if (file_) fclose(file_);
    delete enums_;
    delete pending_;
}

WSQL_Catalog* WSQL_AttrParser::catalog() {
    if (!catalog_) catalog_ = WSQL_EnsureCatalog();
    return catalog_;
}

// ---- files and directories ---------------------------------------------

const char* WSQL_AttrParser::getDefaultEnv() {
    return BSS1_GetEnv("CT_ATTRLIB", nullptr) ? "CT_ATTRLIB" : "ATTRLIB";
}

const char* WSQL_AttrParser::getDefaultDir() {
    return BSS1_GetEnv("CT_ATTRLIB", BSS1_GetEnv("ATTRLIB", "."));
}

char* WSQL_AttrParser::getFullName(char* buffer, size_t size, const char* dir, const char* file) {
    int ras = RAS1_Sync(RAS1_THIS);
    if (!dir) dir = getDefaultDir();
    int n = snprintf(buffer, size, "%s/%s", dir, file ? file : "");
    if (n < 0 || (size_t)n >= size) return nullptr;
    if (ras & RAS1_FLOW) RAS1_Printf(RAS1_THIS, __LINE__, "Using %s as path to odi file", buffer);
    return buffer;
}

int WSQL_AttrParser::openFile(const char* path) {
    if (file_) closeFile();
    file_ = fopen(path, "r");
    if (file_) return 0;
    int err = errno;
    if (RAS1_Sync(RAS1_THIS) & RAS1_ERROR) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open %s, errno=%d", path, err);
    return 8;
}

int WSQL_AttrParser::getLine(char* buffer, int size) {
    if (!file_) return 2;
    if (size < 2 || !fgets(buffer, size, file_)) return 5;
    size_t n = strlen(buffer);
    if (n > 0 && buffer[n - 1] == '\n') buffer[n - 1] = '\0';
    return 0;
}

int WSQL_AttrParser::closeFile() {
    if (!file_) return 2;
    fclose(file_);
    file_ = nullptr;
    return 0;
}

int WSQL_AttrParser::parseFile(const char* dir, const char* file) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Reading %s", file ? file : "");
    catalog();
    keep(currentFile_, WSQL_ATR_FILE_MAX, file ? file : "");
    char path[kPathSize];
    int rc = 0;
    if (!getFullName(path, sizeof path, dir, file)) {
        if (ras & RAS1_ERROR)
            RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open %s/%s, errno=%d", dir ? dir : "", file ? file : "",
                    ENAMETOOLONG);
        rc = 8;
    } else {
        rc = openFile(path);
    }
    if (rc == 0) {
        clearCurrentItem();
        char line[WSQL_ATR_LINE_SIZE];
        while (rc == 0 && getLine(line, sizeof line) == 0) rc = parse(line);
        (void)doPending();
        closeFile();
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_AttrParser::parseDir(const char* dir) {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    catalog();
    const char* path = dir;
    const char* openName = dir;
    char mode = KGL_BYPATH;
    if (!dir) {
        const char* envName = getDefaultEnv();
        path = getDefaultDir();
        if (ras & RAS1_STATE) RAS1_Printf(RAS1_THIS, __LINE__, "Read attr files in %s %s", envName, path);
        // The variable is read by name (it may list several directories);
        // with neither variable set, the current directory.
        if (BSS1_GetEnv(envName, nullptr)) {
            openName = envName;
            mode = KGL_BYENV;
        } else {
            openName = path;
        }
    }
    KGL_Dir* scan = nullptr;
    int rc = kglqpopd(openName, mode, &scan);
    if (rc != 0) {
        if (ras & RAS1_ERROR) RAS1_Printf(RAS1_THIS, __LINE__, "Unable to open directory %s, st=%d", openName, rc);
        RAS1_EXIT_RC(ras, rc);
        return rc;
    }
    // The scan gives names exactly as the directory holds them, so they are
    // used untrimmed; where is the directory the entry was found in.
    char name[KGL_NAMESIZE];
    char where[kPathSize];
    while (kglqprdd(scan, name, sizeof name) == 0) {
        if (!strstr(name, "atr") && !strstr(name, "ATR")) continue;
        bool located = kglqpqdr(scan, where, sizeof where) == 0 && where[0];
        rc = parseFile(located ? where : path, name);
    }
    kglqpcld(scan);
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

// ---- lines ---------------------------------------------------------------

char* WSQL_AttrParser::trim(char* text, int length) {
    size_t n = length < 0 ? strlen(text) : strnlen(text, (size_t)length);
    while (n > 0 && (text[n - 1] == ' ' || text[n - 1] == '\r' || text[n - 1] == '\n')) n--;
    size_t lead = 0;
    while (lead < n && text[lead] == ' ') lead++;
    memmove(text, text + lead, n - lead);
    text[n - lead] = '\0';
    return text;
}

char* WSQL_AttrParser::toUpper(char* text) {
    for (char* p = text; *p; p++)
        if (*p >= 'a' && *p <= 'z') *p = (char)(*p - 'a' + 'A');
    return text;
}

int WSQL_AttrParser::parse(char* line) {
    char* value = strchr(line, ' ');
    if (!value) return 0;
    while (*value == ' ') value++;
    if (strlen(line) < 4) return 0;
    // Only characters 2 to 4 are lower-cased: a keyword must begin with a
    // lower-case letter, which keeps capitalised prose lines out.
    for (int i = 1; i < 4; i++)
        if (line[i] >= 'A' && line[i] <= 'Z') line[i] = (char)(line[i] - 'A' + 'a');
    for (const ParseEntry* e = _parseTable; e->handler; e++)
        if (memcmp(line, e->keyword, 4) == 0) return (this->*(e->handler))(value);
    return handleUnknownElement(line, value);
}

int WSQL_AttrParser::handleUnknownElement(char*, char*) { return 0; }

// ---- keyword handlers ----------------------------------------------------

int WSQL_AttrParser::doAttribute(char* value) {
    int ras = RAS1_Sync(RAS1_THIS);
    trim(value, -1);
    char* attr = value;
    if (char* dot = strchr(value, '.')) {
        *dot = '\0';
        keep(objectName_, WSQL_ATR_NAME_MAX, value);
        attr = dot + 1;
        if (strchr(attr, '.')) {
            hideLevel_++;
            if (ras & RAS1_DETAIL) RAS1_Printf(RAS1_THIS, __LINE__, "Invalid attribute - %s", attr);
        }
    }
    WSQL_ConvertAttr(attr);  // the cleaning the request layer applies to the names it looks up
    keep(attributeName_, WSQL_ATR_NAME_MAX, attr);
    return 0;
}

int WSQL_AttrParser::doColumn(char* value) {
    keep(columnName_, WSQL_ATR_TABLE_MAX, toUpper(trim(value, -1)));
    return 0;
}

int WSQL_AttrParser::doTable(char* value) {
    toUpper(trim(value, -1));
    if (char* blank = strchr(value, ' ')) *blank = '\0';
    keep(tableName_, WSQL_ATR_TABLE_MAX, value);
    return 0;
}

int WSQL_AttrParser::doApplication(char* value) {
    keep(application_, WSQL_ATR_APPL_MAX, toUpper(trim(value, -1)));
    return 0;
}

int WSQL_AttrParser::doType(char* value) {
    trim(value, -1);
    int n = toInt(value);
    if (n >= 0 && n < (int)(sizeof kTypeCodes / sizeof kTypeCodes[0])) {
        if (kTypeCodes[n] != 0) type_ = kTypeCodes[n];
    } else if (RAS1_Sync(RAS1_THIS) & RAS1_ERROR) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Unknown column type %s.%s type=%s", application_, tableName_, value);
    }
    return 0;
}

int WSQL_AttrParser::doLength(char* value) {
    length_ = toInt(trim(value, -1));
    return 0;
}

int WSQL_AttrParser::doScale(char* value) {
    scale_ = toInt(trim(value, -1));
    return 0;
}

int WSQL_AttrParser::doEntry(char* value) {
    (void)doPending();
    trim(value, -1);
    if (WSQL_CaseCompare(value, "ATTR") == 0) return 0;
    hideLevel_ += WSQL_CaseCompare(value, "HIDDEN") == 0 ? 1 : 2;
    return 0;
}

int WSQL_AttrParser::doOpGroup(char* value) {
    if (toInt(value) == 0 && !isOneOf(application_, kOpGroupApps)) hideLevel_++;
    return 0;
}

int WSQL_AttrParser::doVale(char* value) {
    completePair(trim(value, -1), true);
    return 0;
}

int WSQL_AttrParser::doVali(char* value) {
    completePair(trim(value, -1), false);
    return 0;
}

void WSQL_AttrParser::completePair(const char* value, bool isVale) {
    if (!pending_) {
        pending_ = isVale ? new WSQL_Enum(value, nullptr) : new WSQL_Enum(nullptr, value);
        return;
    }
    WSQL_Enum* e = pending_;
    pending_ = nullptr;
    int rc = isVale ? e->addVale(value) : e->addVali(value);
    if (rc == 0) {
        if (!enums_) enums_ = new LinkedList(destroy_WSQL_Enum);
        if (enums_->AppendEntry(e) == 0) return;
    }
    delete e;  // half a pair, or no room in the list
}

// ---- items ---------------------------------------------------------------

void WSQL_AttrParser::makeNewItem() {
    attributeName_[0] = '\0';
    columnName_[0] = '\0';
    length_ = 4;
    type_ = 0;
    hideLevel_ = 0;
    scale_ = 0;
    delete enums_;
    enums_ = nullptr;
    delete pending_;
    pending_ = nullptr;
}

void WSQL_AttrParser::clearCurrentItem() {
    application_[0] = '\0';
    objectName_[0] = '\0';
    tableName_[0] = '\0';
    makeNewItem();
}

int WSQL_AttrParser::doPending() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int rc = 5;
    if (columnName_[0] && attributeName_[0]) {
        rc = storeOrDrop(ras);
        makeNewItem();
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_AttrParser::storeOrDrop(int ras) {
    bool visible = hideLevel_ <= 0 || (hideLevel_ == 1 && isOneOf(application_, kServerApps));
    // A hidden node column is kept as a hidden column: select lists built
    // from the catalog leave it out, but filters and explicit requests on it
    // still find its name and type.
    bool hiddenNode = !visible && strcmp(columnName_, "ORIGINNODE") == 0;
    if (!visible && !hiddenNode) {
        if (ras & RAS1_DETAIL)
            RAS1_Printf(RAS1_THIS, __LINE__, "Dropped %s.%s hide level %d", application_, attributeName_, hideLevel_);
        return 0;
    }
    if (!tableName_[0]) {
        // No table to put it in: "APPL." would be a table of no name.
        if (ras & RAS1_ERROR)
            RAS1_Printf(RAS1_THIS, __LINE__, "Attribute %s.%s has no table", application_, attributeName_);
        return 5;
    }
    return storeItem(hiddenNode);
}

int WSQL_AttrParser::storeItem(bool hidden) {
    int ras = RAS1_Sync(RAS1_THIS);
    char qualified[WSQL_ATR_APPL_MAX + WSQL_ATR_TABLE_MAX + 2];
    snprintf(qualified, sizeof qualified, "%s.%s", application_, tableName_);
    WSQL_Catalog* cat = catalog();
    WSQL_Table* table = cat->GetTable(qualified);
    if (!table) {
        auto* fresh = new WSQL_Table(qualified, objectName_, currentFile_);
        if (ras & (RAS1_DETAIL | RAS1_CATALOG))
            RAS1_Printf(RAS1_THIS, __LINE__, "Add table: %s[%s]", fresh->TableName(), fresh->ObjectName());
        int st = cat->AddTable(fresh);
        if (st != 0) delete fresh;
        table = st == 0 ? fresh : cat->GetTable(qualified);  // 6: someone else added it
        if (!table) return 7;
    }
    auto* column = new WSQL_Column(columnName_, attributeName_, hidden);
    column->SetType(type_);
    column->SetScale(scale_);
    if (enums_) {
        column->SetEnums(enums_);
        enums_ = nullptr;
    }
    if (table->AppendColumn(column) != 0) {
        delete column;
        return 7;
    }
    return 0;
}
