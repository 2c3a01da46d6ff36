#include "WendrelAuth.h"

#include <gtest/gtest.h>

namespace {

const QByteArray RFC_CHALLENGE = "Digest realm=\"testrealm@host.com\", qop=\"auth,auth-int\", "
                                 "nonce=\"dcd98b7102dd2f0e8b11d0f600bfb0c093\", "
                                 "opaque=\"5ccc069c403ebaf9f0171e9517f40e41\"";
const QString USER = QStringLiteral("Mufasa");
const QString PASSWORD = QStringLiteral("Circle Of Life");
const QString ORIGIN = QStringLiteral("http cam 80");

std::string respond(const QByteArray& challenges) {
    return WendrelAuth::respond(WendrelAuth::choose(challenges), "GET", "/dir/index.html", USER,
                                PASSWORD, "0a4f113b", 1)
        .toStdString();
}

} // namespace

TEST(WendrelAuthTest, AnswersTheChallengeItCanAnswerBest) {
    // The worked example of RFC 2617, and the older form without qop.
    EXPECT_EQ(respond(RFC_CHALLENGE),
              "Digest username=\"Mufasa\", realm=\"testrealm@host.com\", "
              "nonce=\"dcd98b7102dd2f0e8b11d0f600bfb0c093\", uri=\"/dir/index.html\", "
              "response=\"6629fae49393a05397450978507c4ef1\", algorithm=MD5, qop=auth, "
              "nc=00000001, cnonce=\"0a4f113b\", opaque=\"5ccc069c403ebaf9f0171e9517f40e41\"");
    EXPECT_EQ(respond("Digest realm=\"r\", nonce=\"n\""),
              "Digest username=\"Mufasa\", realm=\"r\", nonce=\"n\", uri=\"/dir/index.html\", "
              "response=\"e2f9f8bed08c50a66181679ee5b58085\", algorithm=MD5");
    EXPECT_EQ(respond("Basic realm=\"cam\", " + RFC_CHALLENGE), respond(RFC_CHALLENGE));
    EXPECT_EQ(respond(RFC_CHALLENGE + ", Basic realm=\"cam\""), respond(RFC_CHALLENGE));
    EXPECT_EQ(respond("Basic realm=\"cam\""), "Basic TXVmYXNhOkNpcmNsZSBPZiBMaWZl");
    for (const QByteArray& challenges :
         {QByteArray("Negotiate"), QByteArray("Digest realm=\"r\", nonce=\"n\", algorithm=SHA-256"),
          QByteArray("Digest realm=\"r\", nonce=\"n\", qop=\"auth-int\""), QByteArray()})
        EXPECT_TRUE(WendrelAuth::choose(challenges).scheme.isEmpty()) << challenges.data();
    // Digest covers the request target as Qt sends it.
    EXPECT_EQ(WendrelAuth::target(QUrl("http://cam:81/a/b.cgi?x=%26&y#f")), "/a/b.cgi?x=%26&y");
    EXPECT_EQ(WendrelAuth::target(QUrl("http://cam?q")), "/?q");
}

TEST(WendrelAuthTest, AnswersInAdvanceOnlyTheSameCredentialsAtTheSameOrigin) {
    WendrelAuth auth;
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/a", USER, PASSWORD).isEmpty());
    EXPECT_FALSE(auth.answer(ORIGIN, RFC_CHALLENGE, "GET", "/a", USER, PASSWORD).isEmpty());

    const QByteArray next = auth.before(ORIGIN, "GET", "/b", USER, PASSWORD);
    EXPECT_TRUE(next.contains("uri=\"/b\"") && next.contains("nc=00000002")) << next.data();
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/b", USER, QStringLiteral("other")).isEmpty());
    EXPECT_TRUE(auth.before(QStringLiteral("http cam 81"), "GET", "/b", USER, PASSWORD).isEmpty());

    auth.forget(ORIGIN, USER, PASSWORD);
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/b", USER, PASSWORD).isEmpty());
}
