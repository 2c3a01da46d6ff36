#include "WendrelAuth.h"

#include <QCryptographicHash>

#include <gtest/gtest.h>

namespace {

const QByteArray RFC_CHALLENGE = "Digest realm=\"testrealm@host.com\", qop=\"auth,auth-int\", "
                                 "nonce=\"dcd98b7102dd2f0e8b11d0f600bfb0c093\", "
                                 "opaque=\"5ccc069c403ebaf9f0171e9517f40e41\"";
const QString USER = QStringLiteral("Mufasa");
const QString PASSWORD = QStringLiteral("Circle Of Life");
const QString ORIGIN = QStringLiteral("http cam 80");

QByteArray respond(const QByteArray& challenges, quint32 count = 1) {
    return WendrelAuth::respond(WendrelAuth::choose(challenges), "GET", "/dir/index.html", USER,
                                PASSWORD, "0a4f113b", count);
}

QByteArray md5Hex(const QByteArray& text) {
    return QCryptographicHash::hash(text, QCryptographicHash::Md5).toHex();
}

} // namespace

TEST(WendrelAuthTest, DigestAnswerMatchesTheRfcExample) {
    const QByteArray header = respond(RFC_CHALLENGE);
    EXPECT_TRUE(header.startsWith("Digest username=\"Mufasa\", realm=\"testrealm@host.com\""))
        << header.data();
    EXPECT_TRUE(header.contains("response=\"6629fae49393a05397450978507c4ef1\""));
    EXPECT_TRUE(header.contains("uri=\"/dir/index.html\""));
    EXPECT_TRUE(header.contains("qop=auth, nc=00000001, cnonce=\"0a4f113b\""));
    EXPECT_TRUE(header.contains("opaque=\"5ccc069c403ebaf9f0171e9517f40e41\""));
}

TEST(WendrelAuthTest, DigestWithoutQopUsesTheOlderForm) {
    const QByteArray header = respond("Digest realm=\"r\", nonce=\"n\"");
    EXPECT_FALSE(header.contains("cnonce="));
    EXPECT_TRUE(header.contains(
        "response=\"" +
        md5Hex(md5Hex("Mufasa:r:Circle Of Life") + ":n:" + md5Hex("GET:/dir/index.html")) + "\""));
}

TEST(WendrelAuthTest, DigestIsChosenBeforeBasicInEitherOrder) {
    EXPECT_EQ(WendrelAuth::choose("Basic realm=\"cam\", " + RFC_CHALLENGE).scheme, "digest");
    EXPECT_EQ(WendrelAuth::choose(RFC_CHALLENGE + ", Basic realm=\"cam\"").scheme, "digest");
    EXPECT_EQ(respond("Basic realm=\"cam\""), "Basic TXVmYXNhOkNpcmNsZSBPZiBMaWZl");
}

TEST(WendrelAuthTest, UnsupportedChallengesAreNotChosen) {
    for (const QByteArray& challenges :
         {QByteArray("Negotiate"), QByteArray("Digest realm=\"r\", nonce=\"n\", algorithm=SHA-256"),
          QByteArray("Digest realm=\"r\", nonce=\"n\", qop=\"auth-int\""), QByteArray()})
        EXPECT_TRUE(WendrelAuth::choose(challenges).scheme.isEmpty()) << challenges.data();
}

TEST(WendrelAuthTest, AnswersInAdvanceOnlyTheSameCredentialsAtTheSameOrigin) {
    WendrelAuth auth;
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/a", USER, PASSWORD).isEmpty());
    EXPECT_FALSE(auth.answer(ORIGIN, RFC_CHALLENGE, "GET", "/a", USER, PASSWORD).isEmpty());

    const QByteArray next = auth.before(ORIGIN, "GET", "/b", USER, PASSWORD);
    EXPECT_TRUE(next.contains("nc=00000002")) << next.data();
    EXPECT_TRUE(next.contains("uri=\"/b\""));
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/b", USER, QStringLiteral("other")).isEmpty());
    EXPECT_TRUE(auth.before(QStringLiteral("http cam 81"), "GET", "/b", USER, PASSWORD).isEmpty());

    auth.forget(ORIGIN, USER, PASSWORD);
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/b", USER, PASSWORD).isEmpty());
}

TEST(WendrelAuthTest, TargetIsPathAndQueryAsSent) {
    EXPECT_EQ(WendrelAuth::target(QUrl(QStringLiteral("http://cam:81/a/b.cgi?x=%26&y#f"))),
              "/a/b.cgi?x=%26&y");
    EXPECT_EQ(WendrelAuth::target(QUrl(QStringLiteral("http://cam?q"))), "/?q");
}
