// kshmtrq: the meta request, base of every gateway request that is more
// than one SQL statement.
//
// processRequest runs one fixed order of steps, each returning a result and
// the first nonzero one ending the run:
//   1. parseCommonParms   the "stylesheet", "prefix" and "suffix" elements
//                         and the prefix and suffix files;
//   2. parseXML           (virtual) what the concrete request reads;
//   3. setupOutput        (virtual) the prefix text into the response;
//   4. retrieveData       (virtual) the batch of sub-requests;
//   5. finishOutput       (virtual) the suffix text; the response so far
//                         becomes the output data;
//   6. transformResults   the stylesheet step (which always fails here and
//                         appends "<transform>FAILED</transform>");
//   7. processResults     (virtual, no base version) what the request does
//                         with its output.
//
// The batch: every "request" element of the document, in document order,
// holds one sub-request as its first child element: "CT_Get" (a query run
// through the request engine), "CT_Redirect" (a SOAP envelope posted to
// another endpoint), "attach" (a file of the file directory copied into the
// output), "insert" (XML copied verbatim) or "execute" (a file run as a SOAP
// request). A request element with an "id" attribute has its output wrapped
// in <XML ID="..."> and </XML>. A failing sub-request writes its failure into
// the shared response; the batch goes on with the next one.
//
// Files (prefix, suffix, attach, execute) are named relative to the file
// directory (WSQL_GetFileDirectory). A name that could leave it (beginning
// with "/", or with a path component beginning with ".", which ".." is) is
// refused like a file that does not exist.
//
// Errors are recorded on the HTTP object (the first one counts): client
// faults for what the request asked wrongly, server faults for internal
// failures. Results: 0 success; 1 a file could not be read or a CT_Get could
// not be set up; 5 a missing element; 6 invalid input; 7 no memory; other
// values are those of the sub-requests and the concrete requests.
//
// Ownership: the request document belongs to whoever created the request
// (fragments made from it belong to the document). The prefix, suffix and
// transformed texts belong to the request (malloc'd, freed by the
// destructor). Child requests made by a batch step live for that step.
//
// Thread safety: a meta request is used by the one service thread that
// handles its HTTP request.
#pragma once

#include <cstddef>
#include <cstdint>

#include "kshreq.h"
#include "kshreqt.h"
#include "kshxslt.h"

class KSH_XML;
class WSQL_Hub;
class WSQL_HttpServer;

class WSQL_MetaRequest;

// One kind of batch step: the sub-request's tag (exact comparison) and the
// member that runs it on the fragment holding the sub-request.
struct WSQL_BatchStep {
    const char* tag;
    int (WSQL_MetaRequest::*run)(KSH_XML* fragment);
};

class WSQL_MetaRequest : public WSQL_Request {
public:
    // A request of `hub` for `http` reading `document` (not owned).
    WSQL_MetaRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document);
    ~WSQL_MetaRequest() override;
    WSQL_MetaRequest(const WSQL_MetaRequest&) = delete;
    WSQL_MetaRequest& operator=(const WSQL_MetaRequest&) = delete;

    // Runs the steps above: the first nonzero step result, or the result of
    // processResults.
    int processRequest();

    // The overridable steps. The base parseXML and insertRequestData do
    // nothing and return 0; insertRequestData runs before each CT_Get of the
    // batch.
    virtual int parseXML();
    virtual int setupOutput();
    virtual int finishOutput();
    virtual int retrieveData();
    virtual int insertRequestData();
    virtual int processResults() = 0;

    // The fixed steps, each 0 on success.
    int parseCommonParms();
    // Reads the file `name` of the file directory into *text (malloc'd,
    // NUL-terminated; the caller frees it) and *length (its string length).
    // A null name returns 0 and leaves the outputs alone. 1 when the name is
    // refused or the file cannot be read.
    int readFile(const char* name, char** text, uint32_t* length);
    // One CT_Get of the batch: `fragment` holds the CT_Get element.
    int getRequest(KSH_XML* fragment);
    // Parses the CT_Get of `fragment` into the sub-request record; its
    // strings then point into `parsed`, a fresh document the caller keeps as
    // long as the record is used. 0, or 1 (the error is set).
    int parseGetRequest(KSH_XML* fragment, KSH_XML* parsed);
    // An "attach" step: the fragment's root value names the file.
    int attachRequest(KSH_XML* fragment);
    // An "insert" step: the XML of the root's first child goes out verbatim.
    int insertRequest(KSH_XML* fragment);
    int transformResults();
    int insertXMLTagHeader();
    int insertXMLTagTrailer();

    // False when `name` is empty, begins with "/" or has a path component
    // beginning with "." (so also ".."): such a name could leave the file
    // directory.
    static bool staysInFileDirectory(const char* name);

    // The steps of a batch: CT_Get, CT_Redirect, attach, insert, execute.
    static const WSQL_BatchStep kBatchSteps[5];

    // Read access for tests and the concrete requests.
    const char* getOutputData() const { return outputData; }
    uint32_t getOutputLength() const { return outputLength; }
    int getTransformResult() const { return transformResult; }
    const WSQL_Request_t& getSubRequest() const { return subRequest; }

protected:
    // Replaces the table of batch steps (`count` entries, a static table
    // that outlives the request). Requests that only check documents (the
    // fuzz target) use it to leave out steps that reach the store or the
    // network.
    void setBatchSteps(const WSQL_BatchStep* table, size_t count) {
        batchSteps = table;
        batchStepCount = count;
    }

    // The batch steps that create child requests.
    int routeStep(KSH_XML* fragment);
    int executeStep(KSH_XML* fragment);
    // Records the response so far as the output data.
    void takeOutput();

    char* action;               // action string of the last CT_Get (static text or in a document)
    KSH_XML* document;          // not owned
    WSQL_XSLT transformer;
    int32_t transformResult;
    char* outputData;           // the response buffer's text, or transformedData
    uint32_t outputLength;
    char* transformedData;      // malloc'd by the transformer, owned
    uint32_t transformedLength;
    char* stylesheet;           // in the document, or null
    WSQL_Request_t subRequest;  // the current CT_Get (its strings point into a document of the step)
    WSQL_Hub* subHub;
    char* prefixName;           // in the document, or null
    char* prefixText;           // owned (malloc)
    uint32_t prefixLength;
    char* suffixName;
    char* suffixText;           // owned (malloc)
    uint32_t suffixLength;
    char* subRequestId;         // in the document, or null
    const WSQL_BatchStep* batchSteps;  // static table
    size_t batchStepCount;
};
