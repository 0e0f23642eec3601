// kshemail: the e-mail request (methods CT_EMail and CT_Email).
//
// The output of the request (its batch of sub-requests between prefix and
// suffix) is mailed through the platform's mail service (KHD_SendMail) to
// the "receiver" from the "sender" through the mail "server", with the
// optional "subject", "message" (the text of the mail, also written into
// the output before each CT_Get as <MESSAGE>...</MESSAGE>) and
// "attachmenttitle" (the file name of the attached output).
//
// Results: 0; 6 a missing server, sender or receiver, or a mail that could
// not be sent (client faults "Email server name/address missing.", "Email
// sender name missing.", "Email receiver name missing.", "Unable to email
// data.").
#pragma once

#include "kshmtrq.h"

class WSQL_EMailRequest : public WSQL_MetaRequest {
public:
    WSQL_EMailRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document);
    ~WSQL_EMailRequest() override = default;

    int parseXML() override;
    // <MESSAGE>message</MESSAGE> (the text escaped) when a message was given.
    int insertRequestData() override;
    // Sends the output.
    int processResults() override;

private:
    // All point into the request document, or are null.
    char* server;
    char* sender;
    char* receiver;
    char* subject;
    char* message;
    char* attachmentTitle;
};
