// kshatrp: the attribute file parser. Reads the attribute files of an
// attribute directory and turns each attribute they describe into a column
// of a table of the catalog (kshcat).
//
// An attribute file is plain text, one keyword line at a time:
//
//     entr ATTR                     begins an item (ATTR, HIDDEN, or other),
//                                   storing the one before it
//     appl ZAG                      application code (kept from item to item)
//     tabl DISK                     server table (kept from item to item)
//     name ZAG_DISK.Space_Status    object (attribute group) . attribute
//     colu STATUS                   server column
//     type 4                        column type (see doType)
//     scal 0                        decimal scale
//     vale Full                     display text ...
//     vali 2                        ... of the stored value 2
//
// Because an item is stored only when the next entry line (or the end of
// the file) arrives, the appl and tabl lines of a new table belong after
// the entr line of its first attribute.
//
// A keyword is matched on its first four letters, which must begin with a
// lower-case letter; the value follows the first space. Unknown lines are
// skipped; problems show only in the trace. A file is read only when its
// name holds "atr" or "ATR".
//
// The parser fills the catalog given to its constructor, or the
// process-wide one (created on first use). The parser is not thread-safe;
// one parser reads one directory at a time.
//
// Every step is virtual so that a derived parser can replace it (a test or
// fuzz harness may read from memory by replacing openFile).
#pragma once

#include <cstddef>
#include <cstdio>

class LinkedList;
class WSQL_Catalog;
class WSQL_Enum;

// Widths of the item fields (characters, without the terminator).
enum : int {
    WSQL_ATR_APPL_MAX = 9,
    WSQL_ATR_NAME_MAX = 79,   // object and attribute names
    WSQL_ATR_TABLE_MAX = 11,  // table and column names
    WSQL_ATR_FILE_MAX = 263,
    WSQL_ATR_LINE_SIZE = 1024,  // a longer line is read in pieces
};

class WSQL_AttrParser {
public:
    // `catalog` is filled; null means the process-wide catalog. The parser
    // does not own it.
    explicit WSQL_AttrParser(WSQL_Catalog* catalog = nullptr);
    // Closes an open file and deletes a pending item's enumerations.
    virtual ~WSQL_AttrParser();
    WSQL_AttrParser(const WSQL_AttrParser&) = delete;
    WSQL_AttrParser& operator=(const WSQL_AttrParser&) = delete;

    // Reads one attribute file `dir`/`file` (dir null: the default
    // directory). Records `file` as the attribute file name of every table
    // it creates, so that WSQL_Catalog::RemoveAttributeFile(file) can take
    // them out again. Returns 0 after a normal end of file, 8 when the file
    // cannot be opened.
    virtual int parseFile(const char* dir, const char* file);
    // Reads every attribute file of `dir`; with null, of the directory that
    // CT_ATTRLIB designates, else ATTRLIB, else "." (a variable may list
    // several directories separated by ':'). Returns the status of the last
    // file read (0 when none), or the directory scan's status (kgl.h) when
    // the directory cannot be opened.
    virtual int parseDir(const char* dir);
    // 0, or 8 when `path` cannot be opened for reading.
    virtual int openFile(const char* path);
    // Next line (newline removed) into `buffer` of `size` bytes: 0; 5 at end
    // of file; 2 when no file is open.
    virtual int getLine(char* buffer, int size);
    // 0, or 2 when no file is open.
    virtual int closeFile();
    // "CT_ATTRLIB" when that variable is set, otherwise "ATTRLIB".
    virtual const char* getDefaultEnv();
    // The value of CT_ATTRLIB, else of ATTRLIB, else ".".
    virtual const char* getDefaultDir();
    // Writes "dir/file" (dir null: getDefaultDir()) into `buffer` of `size`
    // bytes and returns it; null when it does not fit.
    virtual char* getFullName(char* buffer, size_t size, const char* dir, const char* file);
    // Handles one line (modified in place); returns the handler's status.
    virtual int parse(char* line);
    // Stores the item collected so far: 0 stored (or dropped as the
    // visibility rule says), 5 nothing to store, 7 the table or column could
    // not be added.
    virtual int doPending();
    // Lines with no known keyword; ignores them and returns 0.
    virtual int handleUnknownElement(char* line, char* value);

    // Keyword handlers; each takes the line's value (modified in place) and
    // returns 0.
    virtual int doEntry(char* value);
    virtual int doAttribute(char* value);
    virtual int doColumn(char* value);
    virtual int doTable(char* value);
    // Type line values: 1, 4 integer (496); 2, 3, 5-9 fixed character (452);
    // 10 national character (1022); 11 64-bit integer (492); 0 and unknown
    // numbers leave the type as it is.
    virtual int doType(char* value);
    virtual int doLength(char* value);
    virtual int doApplication(char* value);
    virtual int doOpGroup(char* value);
    virtual int doVale(char* value);
    virtual int doVali(char* value);
    virtual int doScale(char* value);

    // Removes leading spaces and trailing spaces, CR and LF in place from
    // the first `length` characters of `text` (-1: all of it); tabs stay.
    static char* trim(char* text, int length);
    // Upper-cases `text` in place.
    static char* toUpper(char* text);
    // Empties the whole item, application, object and table included.
    void clearCurrentItem();
    // Starts a new item: keeps application, object and table name.
    void makeNewItem();

    // The catalog being filled (created when the parser fills the
    // process-wide one and there is none yet).
    WSQL_Catalog* catalog();

protected:
    struct ParseEntry {
        char keyword[5];
        int (WSQL_AttrParser::*handler)(char* value);
    };
    static const ParseEntry _parseTable[];

    FILE* file_ = nullptr;
    char currentFile_[WSQL_ATR_FILE_MAX + 1] = "";

    // The current item.
    char application_[WSQL_ATR_APPL_MAX + 1] = "";
    char objectName_[WSQL_ATR_NAME_MAX + 1] = "";
    char attributeName_[WSQL_ATR_NAME_MAX + 1] = "";
    char tableName_[WSQL_ATR_TABLE_MAX + 1] = "";
    char columnName_[WSQL_ATR_TABLE_MAX + 1] = "";
    int length_ = 4;
    int type_ = 0;
    int hideLevel_ = 0;
    int scale_ = 0;
    LinkedList* enums_ = nullptr;  // owned until handed to a column
    WSQL_Enum* pending_ = nullptr;  // owned

private:
    // Applies the visibility rule to a complete item: 0 stored or dropped,
    // 5 no table named, 7 not added.
    int storeOrDrop(int ras);
    // Adds the item to the catalog as a column (hidden or not). 0 or 7.
    int storeItem(bool hidden);
    // Completes the pending value pair with `value` as the vale or vali.
    void completePair(const char* value, bool isVale);

    WSQL_Catalog* catalog_;
};
