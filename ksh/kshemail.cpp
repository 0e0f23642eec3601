// kshemail: mailing the output of a request (see kshemail.h).
#include "kshemail.h"

#include "khd/khd.h"
#include "kshhttp.h"
#include "kshxmlxp.h"
#include "ras1/ras1.h"
#include "wsql_rc.h"

RAS1_UNIT("kshemail");

WSQL_EMailRequest::WSQL_EMailRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document)
    : WSQL_MetaRequest(hub, http, document),
      server(nullptr),
      sender(nullptr),
      receiver(nullptr),
      subject(nullptr),
      message(nullptr),
      attachmentTitle(nullptr) {}

int WSQL_EMailRequest::parseXML() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    const struct {
        const char* tag;
        char** field;
    } kFields[] = {
        {"server", &server},   {"sender", &sender},   {"receiver", &receiver},
        {"subject", &subject}, {"attachmenttitle", &attachmentTitle}, {"message", &message},
    };
    for (const auto& f : kFields) {
        unsigned n = 0;
        if (document->getElementValue(f.tag, f.field, &n) != WSQL_OK) *f.field = nullptr;
    }
    // Every check records its fault; the first one recorded is the answer.
    const struct {
        char* const* field;
        const char* fault;
    } kRequired[] = {
        {&server, "Email server name/address missing."},
        {&sender, "Email sender name missing."},
        {&receiver, "Email receiver name missing."},
    };
    int rc = WSQL_OK;
    for (const auto& r : kRequired) {
        if (*r.field != nullptr) continue;
        getHttp()->setRequestError(true, r.fault, nullptr, 0);
        rc = WSQL_BADINPUT;
    }
    if (ras & RAS1_STATE)
        RAS1_Printf(RAS1_THIS, __LINE__, "Email server \"%s\" sender \"%s\" receiver \"%s\"", server ? server : "",
                    sender ? sender : "", receiver ? receiver : "");
    RAS1_EXIT_RC(ras, rc);
    return rc;
}

int WSQL_EMailRequest::insertRequestData() {
    if (message == nullptr) return WSQL_OK;
    WSQL_HttpServer* http = getHttp();
    (void)http->append("<MESSAGE>");
    (void)http->appendText(message);
    (void)http->append("</MESSAGE>\n");
    return WSQL_OK;
}

int WSQL_EMailRequest::processResults() {
    int ras = RAS1_Sync(RAS1_THIS);
    RAS1_ENTRY(ras);
    int st = KHD_SendMail(0, server, receiver, sender, subject, message, attachmentTitle, outputData, outputLength);
    int rc = WSQL_OK;
    if (st != KHD_OK) {
        RAS1_Printf(RAS1_THIS, __LINE__, "Mail through \"%s\" to \"%s\" failed: %d", server, receiver, st);
        getHttp()->setRequestError(true, "Unable to email data.", nullptr, 0);
        rc = WSQL_BADINPUT;
    }
    RAS1_EXIT_RC(ras, rc);
    return rc;
}
