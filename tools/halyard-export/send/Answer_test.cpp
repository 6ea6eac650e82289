#include <gtest/gtest.h>

#include "send/Answer.h"
#include "send/Compression.h"
#include "send/TlsTrouble.h"

namespace halyard::exporting {
namespace {

using namespace std::chrono_literals;

Verdict verdictOnStatus(int status) {
    Answer answer;
    answer.status = status;
    return verdictOn(answer);
}

TEST(AnswerTest, EveryStatusHasItsVerdict) {
    for (const int status : {200, 201, 202, 204, 299}) {
        EXPECT_EQ(verdictOnStatus(status), Verdict::Accepted) << status;
    }
    for (const int status : {0, 429, 502, 503, 504}) {
        EXPECT_EQ(verdictOnStatus(status), Verdict::Later) << status;
    }
    for (const int status : {401, 403}) {
        EXPECT_EQ(verdictOnStatus(status), Verdict::Refused) << status;
    }
    for (const int status : {100, 301, 302, 400, 404, 413, 500, 501, 505}) {
        EXPECT_EQ(verdictOnStatus(status), Verdict::Dropped) << status;
    }
}

TEST(AnswerTest, BackOffDoublesUpToFiveMinutes) {
    EXPECT_EQ(delayAfter(1, 1, 0s), 1s);
    EXPECT_EQ(delayAfter(1, 0, 0s), 500ms);
    EXPECT_EQ(delayAfter(4, 1, 0s), 8s);
    EXPECT_EQ(delayAfter(1000, 1, 0s), 5min);
    EXPECT_EQ(delayAfter(1000, 0, 0s), 150s);
}

TEST(AnswerTest, WhatTheReceiverAsksForHoldsUpToAnHour) {
    EXPECT_EQ(delayAfter(1, 1, 90s), 90s);
    EXPECT_EQ(delayAfter(1000, 1, 90s), 5min);
    EXPECT_EQ(delayAfter(1, 1, 100h), 1h);
}

TEST(AnswerTest, APartialSuccessIsRead) {
    const std::string body("\x0a\x07\x08\x05\x12\x03why", 9);
    EXPECT_EQ(partialSuccessIn(body).rejected, 5U);
    EXPECT_EQ(partialSuccessIn(body).message, "why");
}

TEST(AnswerTest, NonsenseRejectsNothing) {
    EXPECT_EQ(partialSuccessIn("").rejected, 0U);
    EXPECT_EQ(partialSuccessIn("<html>").rejected, 0U);
    EXPECT_EQ(partialSuccessIn(std::string("\x0a\x7f\x08", 3)).rejected, 0U);
    // -1
    EXPECT_EQ(partialSuccessIn("\x0a\x0b\x08\xff\xff\xff\xff\xff\xff\xff\xff\xff\x01").rejected,
              0U);
}

TEST(TlsTroubleTest, AMissingCertificateIsNamedByItsKey) {
    EXPECT_EQ(troubleWithoutCertificate("SSL routines::tlsv13 alert certificate required", true),
              "the receiver asks for a certificate of the client's: set client_certificate and "
              "client_key in [export]");
    for (const bool broke : {false, true}) {
        const char* const why = broke ? "Broken pipe" : "sslv3 alert handshake failure";
        EXPECT_EQ(troubleWithoutCertificate(why, broke),
                  std::string("the receiver broke off (") + why +
                      "), as one does that asks for a certificate of the client's: "
                      "client_certificate and client_key in [export]");
    }
}

TEST(TlsTroubleTest, OtherTroubleStaysWhatItIs) {
    for (const char* const why :
         {"Could not resolve host: nowhere", "SSL certificate problem: self-signed certificate"}) {
        EXPECT_EQ(troubleWithoutCertificate(why, false), why);
    }
}

TEST(CompressionTest, MakesAGzipFile) {
    Gzip gzip;
    const std::string packed(gzip.compressed(std::string(10'000, 'a')));
    ASSERT_GT(packed.size(), 18U);
    EXPECT_LT(packed.size(), 200U);
    EXPECT_EQ(packed.substr(0, 3), "\x1f\x8b\x08");
}

TEST(CompressionTest, MakesTheSameOfTheSameWhateverWasBefore) {
    Gzip gzip;
    const std::string first(gzip.compressed("one and only one"));
    (void)gzip.compressed(std::string(100'000, 'x'));
    EXPECT_EQ(gzip.compressed("one and only one"), first);
}

} // namespace
} // namespace halyard::exporting
