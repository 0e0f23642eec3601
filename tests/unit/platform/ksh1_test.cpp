// The SOAP client against a small HTTP server on loopback: what it posts,
// what it hands back, and how it fails (HTTP errors, refused connections,
// an endpoint that never answers, endpoints that are not http URLs).
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "ksh1/ksh1.h"
#include "platform/loopback.h"

namespace {

using loopback::MiniHttp;

bool contains(const std::string& s, const std::string& part) { return s.find(part) != std::string::npos; }

TEST(Ksh1, PostsTheEnvelopeAndHandsBackTheAnswer) {
    MiniHttp server;
    server.body = "<SOAP-ENV:Envelope><SOAP-ENV:Body><r>1 &amp; 2</r></SOAP-ENV:Body></SOAP-ENV:Envelope>";
    const std::string envelope = "<SOAP-ENV:Envelope><SOAP-ENV:Body><CT_Get/></SOAP-ENV:Body></SOAP-ENV:Envelope>";
    char* response = nullptr;
    unsigned long length = 0;
    ASSERT_EQ(KSH1_SoapRequest(server.url().c_str(), envelope.c_str(), envelope.size(), &response, &length, KSH1_SOAP11),
              KSH1_OK);
    ASSERT_NE(response, nullptr);
    EXPECT_EQ(std::string(response, length), server.body);
    EXPECT_EQ(response[length], '\0');
    EXPECT_EQ(KSH1_LastHttpStatus(), 200);
    free(response);

    auto reqs = server.requests();
    ASSERT_EQ(reqs.size(), 1u);
    EXPECT_EQ(reqs[0].rfind("POST /soap HTTP/1.1\r\n", 0), 0u);
    EXPECT_TRUE(contains(reqs[0], "Content-Type: text/xml; charset=utf-8\r\n"));
    EXPECT_TRUE(contains(reqs[0], "SOAPAction: \"\"\r\n"));
    EXPECT_EQ(reqs[0].substr(reqs[0].size() - envelope.size()), envelope);

    // Only `length` bytes of the text are sent; a second call on this
    // thread reuses the connection; an empty answer is an empty text.
    server.body = "";
    response = nullptr;
    length = 7;
    ASSERT_EQ(KSH1_SoapRequest(server.url().c_str(), "<a/>trailing", 4, &response, &length, KSH1_SOAP11), KSH1_OK);
    ASSERT_NE(response, nullptr);
    EXPECT_EQ(length, 0u);
    EXPECT_STREQ(response, "");
    free(response);
    reqs = server.requests();
    ASSERT_EQ(reqs.size(), 2u);
    EXPECT_EQ(reqs[1].substr(reqs[1].size() - 4), "<a/>");
    EXPECT_EQ(server.connections(), 1);
}

TEST(Ksh1, FailuresLeaveTheResponseAlone) {
    MiniHttp server;
    server.status = 500;
    server.body = "<fault/>";
    char* response = nullptr;
    unsigned long length = 0;
    EXPECT_EQ(KSH1_SoapRequest(server.url().c_str(), "<a/>", 4, &response, &length, KSH1_SOAP11), KSH1_HTTPERROR);
    EXPECT_EQ(KSH1_LastHttpStatus(), 500);
    EXPECT_EQ(response, nullptr);
    EXPECT_EQ(length, 0u);

    // Nobody listens on the port of a server that has gone.
    std::string gone;
    {
        MiniHttp closed;
        gone = closed.url();
    }
    EXPECT_EQ(KSH1_SoapRequest(gone.c_str(), "<a/>", 4, &response, &length, KSH1_SOAP11), KSH1_UNREACHABLE);
    EXPECT_EQ(response, nullptr);

    // Only http and https: a local file is never read.
    EXPECT_EQ(KSH1_SoapRequest("file:///etc/hostname", "<a/>", 4, &response, &length, KSH1_SOAP11), KSH1_HTTPERROR);
    EXPECT_EQ(KSH1_SoapRequest("gopher://127.0.0.1/", "<a/>", 4, &response, &length, KSH1_SOAP11), KSH1_HTTPERROR);
    EXPECT_EQ(response, nullptr);
    EXPECT_EQ(KSH1_SoapRequest(nullptr, "<a/>", 4, &response, &length, KSH1_SOAP11), KSH1_BADARG);
    EXPECT_EQ(KSH1_SoapRequest(server.url().c_str(), "<a/>", 4, &response, &length, 0x1), KSH1_BADARG);
    EXPECT_EQ(server.requests().size(), 1u);
}

TEST(Ksh1, AnEndpointThatNeverAnswersTimesOut) {
    MiniHttp server(/*silent=*/true);
    setenv("KSH1_TIMEOUT", "1", 1);
    char* response = nullptr;
    unsigned long length = 0;
    EXPECT_EQ(KSH1_SoapRequest(server.url().c_str(), "<a/>", 4, &response, &length, KSH1_SOAP11), KSH1_UNREACHABLE);
    EXPECT_EQ(response, nullptr);
    EXPECT_EQ(server.requests().size(), 1u);
    unsetenv("KSH1_TIMEOUT");
}

}  // namespace
