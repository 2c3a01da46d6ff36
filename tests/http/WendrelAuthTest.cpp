#include "WendrelAuth.h"

#include <QFile>

#include <gtest/gtest.h>

#include <ostream>
#include <string>

namespace {

using Refusal = WendrelAuth::Answer::Refusal;

const QString MUFASA = QStringLiteral("Mufasa");
const QString CIRCLE = QStringLiteral("Circle of Life");
const QString JASON = QStringLiteral("J\u00e4s\u00f8n Doe");
const QString ORIGIN = QStringLiteral("http cam 80");

// RFC 7616, section 3.9.1.
const QByteArray RFC_CHALLENGE_TAIL = "realm=\"http-auth@example.org\", qop=\"auth, auth-int\", "
                                      "nonce=\"7ypf/xlj9XXwfDPEoM4URrv/xwf94BcCAzFZH4GiTo0v\", "
                                      "opaque=\"FQhe/qaU925kfnzjCev0ciny7QMkPqMAFRtzCUYo5tdS\"";
const QByteArray RFC_CNONCE = "f2/wE4q74E6zIJEtWaHKaf5wv/H5QzzpXusqGemxURZJ";
const QByteArray RFC_ANSWER_HEAD =
    "realm=\"http-auth@example.org\", uri=\"/dir/index.html\", algorithm=";
const QByteArray RFC_ANSWER_MIDDLE = ", nonce=\"7ypf/xlj9XXwfDPEoM4URrv/xwf94BcCAzFZH4GiTo0v\", "
                                     "nc=00000001, cnonce=\"" +
                                     RFC_CNONCE + "\", qop=auth, response=\"";
const QByteArray RFC_ANSWER_TAIL = "\", opaque=\"FQhe/qaU925kfnzjCev0ciny7QMkPqMAFRtzCUYo5tdS\"";

QByteArray rfcChallenge(const QByteArray& algorithm) {
    return "Digest algorithm=" + algorithm + ", " + RFC_CHALLENGE_TAIL;
}

QByteArray rfcAnswer(const QByteArray& username, const QByteArray& algorithm,
                     const QByteArray& response) {
    return "Digest " + username + ", " + RFC_ANSWER_HEAD + algorithm + RFC_ANSWER_MIDDLE +
           response + RFC_ANSWER_TAIL;
}

struct Vector {
    const char* name;
    QByteArray challenges;
    QString user;
    QString password;
    QByteArray target;
    QByteArray clientNonce;
    quint32 count;
    QByteArray expected;
};

// Expected answers from the RFCs (the SHA-512-256 one as corrected by erratum 4897; the printed
// one is wrong) and, for the forms the RFCs do not show, from Python's hashlib.
const Vector VECTORS[] = {
    {"Rfc7616Md5", rfcChallenge("MD5"), MUFASA, CIRCLE, "/dir/index.html", RFC_CNONCE, 1,
     rfcAnswer("username=\"Mufasa\"", "MD5", "8ca523f5e9506fed4657c9700eebdbec")},
    {"Rfc7616Sha256ListedFirst", rfcChallenge("SHA-256") + ", " + rfcChallenge("MD5"), MUFASA,
     CIRCLE, "/dir/index.html", RFC_CNONCE, 1,
     rfcAnswer("username=\"Mufasa\"", "SHA-256",
               "753927fa0e85d155564e2e272a28d1802ca10daf4496794697cf8db5856cb6c1")},
    {"Rfc7616Sha512_256UserhashErratum4897",
     "Digest realm=\"api@example.org\", qop=\"auth\", algorithm=SHA-512-256, "
     "nonce=\"5TsQWLVdgBdmrQ0XsxbDODV+57QdFR34I9HAbC/RVvkK\", "
     "opaque=\"HRPCssKJSGjCrkzDg8OhwpzCiGPChXYjwrI2QmXDnsOS\", charset=UTF-8, userhash=true",
     JASON, "Secret, or not?", "/doe.json", "NTg6RKcb9boFIAS3KrFK9BGeh+iDa/sm6jUMp2wds69v", 1,
     "Digest username=\"793263caabb707a56211940d90411ea4a575adeccb7e360aeb624ed06ece9b0b\", "
     "realm=\"api@example.org\", uri=\"/doe.json\", algorithm=SHA-512-256, "
     "nonce=\"5TsQWLVdgBdmrQ0XsxbDODV+57QdFR34I9HAbC/RVvkK\", nc=00000001, "
     "cnonce=\"NTg6RKcb9boFIAS3KrFK9BGeh+iDa/sm6jUMp2wds69v\", qop=auth, "
     "response=\"3798d4131c277846293534c3edc11bd8a5e4cdcbff78b05db9d95eeb1cec68a5\", "
     "opaque=\"HRPCssKJSGjCrkzDg8OhwpzCiGPChXYjwrI2QmXDnsOS\", userhash=true"},
    {"NonAsciiUserAsUsernameStar", rfcChallenge("SHA-256") + ", charset=UTF-8", JASON, CIRCLE,
     "/dir/index.html", RFC_CNONCE, 1,
     rfcAnswer("username*=UTF-8''J%C3%A4s%C3%B8n%20Doe", "SHA-256",
               "c5329432b688d2821a9caba0e2ecb6b74604959469eb41c6595dcea281451bed")},
    {"Md5Sess", rfcChallenge("MD5-sess"), MUFASA, CIRCLE, "/dir/index.html", RFC_CNONCE, 1,
     rfcAnswer("username=\"Mufasa\"", "MD5-sess", "e783283f46242139c486a698fec7211d")},
    {"Sha256Sess", rfcChallenge("sha-256-SESS"), MUFASA, CIRCLE, "/dir/index.html", RFC_CNONCE, 1,
     rfcAnswer("username=\"Mufasa\"", "SHA-256-sess",
               "2fd51b3a77ad75bad6afad6003e818d767133c46d9e2749e7f5232ae1ea3efd7")},
    {"Sha512_256SessSecondRequest", rfcChallenge("SHA-512-256-sess"), MUFASA, CIRCLE,
     "/dir/index.html", RFC_CNONCE, 2,
     rfcAnswer("username=\"Mufasa\"", "SHA-512-256-sess",
               "3f0b079c78edc3f154dc32cd155ef358aab704e07c9fda1f425282a15cc97cf7")
         .replace("nc=00000001", "nc=00000002")},
    {"Rfc2617",
     "Digest realm=\"testrealm@host.com\", qop=\"auth,auth-int\", "
     "nonce=\"dcd98b7102dd2f0e8b11d0f600bfb0c093\", "
     "opaque=\"5ccc069c403ebaf9f0171e9517f40e41\"",
     MUFASA, "Circle Of Life", "/dir/index.html", "0a4f113b", 1,
     "Digest username=\"Mufasa\", realm=\"testrealm@host.com\", uri=\"/dir/index.html\", "
     "algorithm=MD5, nonce=\"dcd98b7102dd2f0e8b11d0f600bfb0c093\", nc=00000001, "
     "cnonce=\"0a4f113b\", qop=auth, response=\"6629fae49393a05397450978507c4ef1\", "
     "opaque=\"5ccc069c403ebaf9f0171e9517f40e41\""},
    {"WithoutQop", "Digest realm=\"r\", nonce=\"n\"", MUFASA, "Circle Of Life", "/dir/index.html",
     "0a4f113b", 1,
     "Digest username=\"Mufasa\", realm=\"r\", uri=\"/dir/index.html\", algorithm=MD5, "
     "nonce=\"n\", response=\"e2f9f8bed08c50a66181679ee5b58085\""},
    {"QuotesEscapedAndEmptyOpaqueEchoed", "Digest realm=\"a\\\"b\\\\\", nonce=n, opaque=\"\"",
     "x\"y", "p", "/", "c", 1,
     "Digest username=\"x\\\"y\", realm=\"a\\\"b\\\\\", uri=\"/\", algorithm=MD5, nonce=\"n\", "
     "response=\"f37058d5a06a2044a8ade2469b5e32c2\", opaque=\"\""},
    {"Basic", "Basic realm=\"cam\"", MUFASA, "Circle Of Life", "/", "", 1,
     "Basic TXVmYXNhOkNpcmNsZSBPZiBMaWZl"},
};

// Failures name the row, not its bytes.
template <typename Row>
void printRow(const Row& row, std::ostream* out) {
    *out << row.name;
}
void PrintTo(const Vector& row, std::ostream* out) {
    printRow(row, out);
}

class WendrelAuthVectorTest : public ::testing::TestWithParam<Vector> {};

TEST_P(WendrelAuthVectorTest, AnswersAsTheReferenceDoes) {
    const Vector& row = GetParam();
    const std::optional<WendrelChallenge> chosen = WendrelChallenge::choose(row.challenges);
    ASSERT_TRUE(chosen);
    EXPECT_EQ(WendrelAuth::respond(*chosen, "GET", row.target, row.user, row.password,
                                   row.clientNonce, row.count)
                  .toStdString(),
              row.expected.toStdString());
}

INSTANTIATE_TEST_SUITE_P(Vectors, WendrelAuthVectorTest, ::testing::ValuesIn(VECTORS),
                         [](const auto& info) { return std::string(info.param.name); });

struct Choice {
    const char* name;
    QByteArray challenges;
    const char* chosen; // "Basic", the Digest algorithm's name, or "" when refused
};

QByteArray repeated(const char* format, int count) {
    QByteArray text;
    for (int i = 0; i < count; ++i)
        text += (i ? ", " : "") + QByteArray(format).replace("%d", QByteArray::number(i));
    return text;
}

// All of a literal, NUL bytes too.
template <size_t size>
QByteArray bytes(const char (&literal)[size]) {
    return QByteArray(literal, size - 1);
}

const QByteArray LONG_VALUE(WendrelChallenge::maxValueBytes, 'v');

const Choice CHOICES[] = {
    {"Sha256ListedBeforeMd5", "Digest nonce=a, algorithm=SHA-256, Digest nonce=b", "SHA-256"},
    {"FirstSupportedNotStrongest", "Digest nonce=b, Digest nonce=a, algorithm=SHA-256", "MD5"},
    {"UnsupportedSkipped",
     "Digest nonce=a, algorithm=SHA3-256, Digest nonce=b, qop=auth, algorithm=SHA-512-256-sess",
     "SHA-512-256-sess"},
    {"DigestAfterBasic", "Basic realm=x, Digest realm=x, nonce=a, algorithm=SHA-256", "SHA-256"},
    {"DigestBeforeBasic", "Digest realm=x, nonce=a, algorithm=MD5-sess, qop=auth, Basic",
     "MD5-sess"},
    {"SchemesAndNamesIgnoreCase", "DIGEST NONCE=a, Algorithm=sha-512-256", "SHA-512-256"},
    {"BasicWhenNoDigestCanBeAnswered", "Digest nonce=a, algorithm=SHA3-256, Basic realm=x",
     "Basic"},
    {"AfterToken68", "Negotiate YII+/x==, Digest nonce=a", "MD5"},
    {"UnkeptParameterUnbounded", "Digest nonce=a, domain=\"" + QByteArray(20000, 'd') + '"', "MD5"},
    {"LongestValues",
     "Digest nonce=\"" + LONG_VALUE + "\", realm=" + LONG_VALUE + ", opaque=" + LONG_VALUE, "MD5"},
    {"MostParameters", "Digest nonce=a, " + repeated("p%d=x", WendrelChallenge::maxParameters - 1),
     "MD5"},
    {"MostChallenges",
     repeated("Other%d", WendrelChallenge::maxChallenges - 1) + ", Digest nonce=a", "MD5"},
    {"UnsupportedAlgorithmOnly", "Digest nonce=a, algorithm=SHA3-256", ""},
    {"AuthIntOnly", "Digest nonce=a, qop=\"auth-int\"", ""},
    {"SessionWithoutQop", "Digest nonce=a, algorithm=MD5-sess", ""},
    {"WithoutNonce", "Digest realm=x", ""},
    {"OtherSchemeOnly", "Negotiate", ""},
    {"Nothing", "", ""},
    {"UnclosedQuote", "Digest nonce=\"a, Basic realm=x", ""},
    {"ParameterBeforeScheme", "nonce=a, Digest nonce=a", ""},
    {"TextAfterQuotedValue", "Digest nonce=\"a\"b", ""},
    {"RepeatedParameter", "Digest nonce=a, nonce=b", ""},
    {"ValueTooLong", "Digest nonce=a, realm=\"" + LONG_VALUE + "x\"", ""},
    {"TooManyParameters", "Digest nonce=a, " + repeated("p%d=x", WendrelChallenge::maxParameters),
     ""},
    {"TooManyChallenges", repeated("Other%d", WendrelChallenge::maxChallenges) + ", Digest nonce=a",
     ""},
    {"CarriageReturnInRealm", QByteArray("Digest nonce=a, realm=\"x\ry\""), ""},
    {"LineFeedInNonce", QByteArray("Digest nonce=\"a\nb\""), ""},
    {"NulInOpaque", bytes("Digest nonce=a, opaque=\"x\0y\""), ""},
    {"EscapedLineFeed", "Digest nonce=\"a\\\nb\"", ""},
    {"DeleteInRealm", "Digest nonce=a, realm=\"x\x7fy\"", ""},
    {"HugeField", "Digest nonce=a, " + repeated("parameter%d=\"xxxxxxxx\"", 10000), ""},
};

void PrintTo(const Choice& row, std::ostream* out) {
    printRow(row, out);
}

class WendrelChallengeChoiceTest : public ::testing::TestWithParam<Choice> {};

TEST_P(WendrelChallengeChoiceTest, ChoosesTheFirstSupportedDigestAndRefusesMalformedFields) {
    const Choice& row = GetParam();
    const std::optional<WendrelChallenge> chosen = WendrelChallenge::choose(row.challenges);
    std::string said;
    if (chosen)
        said = chosen->scheme == WendrelChallenge::Scheme::Basic
                   ? "Basic"
                   : chosen->algorithmName().toStdString();
    EXPECT_EQ(said, row.chosen);

    WendrelAuth auth;
    const WendrelAuth::Answer answer =
        auth.answer(ORIGIN, row.challenges, "GET", "/", MUFASA, CIRCLE, false);
    EXPECT_EQ(answer.refusal, *row.chosen ? Refusal::None : Refusal::Unanswerable);
    EXPECT_EQ(answer.authorization.isEmpty(), !*row.chosen);
    EXPECT_EQ(auth.cacheBytes() == 0, !*row.chosen);
}

INSTANTIATE_TEST_SUITE_P(Choices, WendrelChallengeChoiceTest, ::testing::ValuesIn(CHOICES),
                         [](const auto& info) { return std::string(info.param.name); });

bool hasLineBreakOrNul(const QByteArray& value) {
    return value.contains('\r') || value.contains('\n') || value.contains('\0');
}

struct Hostile {
    const char* name;
    QByteArray challenges;
    QString user;
    QByteArray target;
    const char* contains; // in the answer; "" when it is refused
};

const Hostile HOSTILE[] = {
    {"UserNameWithLineBreaks", "Digest nonce=a", "admin\"\r\n\r\nGET /x HTTP/1.1\r\nX: ", "/",
     "username*=UTF-8''admin%22%0D%0A%0D%0AGET%20%2Fx%20HTTP%2F1.1%0D%0AX%3A%20,"},
    {"UserNameWithNul", "Digest nonce=a", QString::fromLatin1("a\0b", 3), "/",
     "username*=UTF-8''a%00b,"},
    {"UserNameWithLineBreaksHashed", "Digest nonce=a, qop=auth, userhash=true", "a\r\nb", "/",
     "userhash=true"},
    {"BasicUserNameWithLineBreaks", "Basic", "a\r\nb", "/", "Basic YQ0KYjpDaXJjbGUgb2YgTGlmZQ=="},
    {"TargetWithLineBreak", "Digest nonce=a", MUFASA, "/a\r\nX: y", ""},
    {"RealmWithLineBreak", "Digest nonce=a, realm=\"r\r\nX: y\"", MUFASA, "/", ""},
    {"OpaqueWithNul", bytes("Digest nonce=a, opaque=\"\0\""), MUFASA, "/", ""},
};

void PrintTo(const Hostile& row, std::ostream* out) {
    printRow(row, out);
}

class WendrelAuthHostileTest : public ::testing::TestWithParam<Hostile> {};

// Whatever the server or the caller gives, no header value holds CR, LF or NUL.
TEST_P(WendrelAuthHostileTest, NeverPutsLineBreaksOrNulInTheHeader) {
    const Hostile& row = GetParam();
    WendrelAuth auth;
    const WendrelAuth::Answer answer =
        auth.answer(ORIGIN, row.challenges, "GET", row.target, row.user, CIRCLE, false);
    EXPECT_FALSE(hasLineBreakOrNul(answer.authorization));
    const QByteArray next = auth.before(ORIGIN, "GET", row.target, row.user, CIRCLE);
    EXPECT_FALSE(hasLineBreakOrNul(next));
    if (*row.contains) {
        EXPECT_EQ(answer.refusal, Refusal::None);
        EXPECT_TRUE(answer.authorization.contains(row.contains)) << answer.authorization.data();
        EXPECT_FALSE(next.isEmpty());
    } else {
        EXPECT_EQ(answer.refusal, Refusal::Unanswerable);
        EXPECT_TRUE(answer.authorization.isEmpty() && next.isEmpty());
    }
}

INSTANTIATE_TEST_SUITE_P(Hostile, WendrelAuthHostileTest, ::testing::ValuesIn(HOSTILE),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(WendrelAuthTest, AnswersInAdvanceOnlyTheSameCredentialsAtTheSameOrigin) {
    WendrelAuth auth;
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/a", MUFASA, CIRCLE).isEmpty());
    const WendrelAuth::Answer first =
        auth.answer(ORIGIN, rfcChallenge("SHA-256"), "GET", "/a", MUFASA, CIRCLE, false);
    EXPECT_EQ(first.scheme, "Digest");
    EXPECT_TRUE(first.authorization.contains("nc=00000001")) << first.authorization.data();

    const QByteArray next = auth.before(ORIGIN, "GET", "/b", MUFASA, CIRCLE);
    EXPECT_TRUE(next.contains("uri=\"/b\"") && next.contains("nc=00000002")) << next.data();
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/b", MUFASA, "other").isEmpty());
    EXPECT_TRUE(auth.before("http cam 81", "GET", "/b", MUFASA, CIRCLE).isEmpty());

    auth.forget(ORIGIN, MUFASA, CIRCLE);
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/b", MUFASA, CIRCLE).isEmpty());
    EXPECT_EQ(auth.cacheBytes(), 0);
}

// A stale nonce is no rejection: the new nonce is answered with the same credentials, counting
// afresh.
TEST(WendrelAuthTest, StaleNonceAnsweredWithTheNewNonce) {
    WendrelAuth auth;
    auth.answer(ORIGIN, "Digest nonce=old, qop=auth", "GET", "/", MUFASA, CIRCLE, false);
    auth.accepted(ORIGIN, MUFASA, CIRCLE);
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/", MUFASA, CIRCLE).contains("nc=00000002"));
    const WendrelAuth::Answer renewed = auth.answer(
        ORIGIN, "Digest nonce=new, qop=auth, stale=true", "GET", "/", MUFASA, CIRCLE, false);
    EXPECT_TRUE(renewed.authorization.contains("nonce=\"new\", nc=00000001"))
        << renewed.authorization.data();
    const QByteArray next = auth.before(ORIGIN, "GET", "/", MUFASA, CIRCLE);
    EXPECT_TRUE(next.contains("nonce=\"new\", nc=00000002")) << next.data();
    EXPECT_EQ(auth.answer(ORIGIN, "Basic", "GET", "/", MUFASA, CIRCLE, false).refusal,
              Refusal::Downgrade);
}

TEST(WendrelAuthTest, BasicRefusedOverPlainHttpOnceDigestWorked) {
    const QByteArray digest = "Digest nonce=a, qop=auth, algorithm=SHA-256";
    WendrelAuth auth;
    const auto answer = [&auth](const QByteArray& challenges, const QString& password,
                                bool https = false) {
        return auth.answer(https ? "https cam 443" : ORIGIN, challenges, "GET", "/", MUFASA,
                           password, https);
    };
    // Answered, but never confirmed: no memory of it yet.
    answer(digest, CIRCLE);
    EXPECT_EQ(answer("Basic", CIRCLE).refusal, Refusal::None);

    answer(digest, CIRCLE);
    auth.accepted(ORIGIN, MUFASA, CIRCLE);
    const WendrelAuth::Answer refused = answer("Basic realm=x", CIRCLE);
    EXPECT_EQ(refused.refusal, Refusal::Downgrade);
    EXPECT_EQ(refused.scheme, "Basic");
    EXPECT_TRUE(refused.authorization.isEmpty());
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/", MUFASA, CIRCLE).isEmpty());
    // Digest is still answered; rejected credentials do not lose the memory.
    EXPECT_EQ(answer(digest + ", Basic", CIRCLE).scheme, "Digest");
    auth.forget(ORIGIN, MUFASA, CIRCLE);
    EXPECT_EQ(answer("Basic", CIRCLE).refusal, Refusal::Downgrade);
    // Other credentials, and https, where Basic is not in clear.
    EXPECT_EQ(answer("Basic", "other").refusal, Refusal::None);
    answer(digest, CIRCLE, true);
    auth.accepted("https cam 443", MUFASA, CIRCLE);
    EXPECT_EQ(answer("Basic", CIRCLE, true).refusal, Refusal::None);
}

// Basic answered for a second request while the first, carrying Digest, was under way: once the
// Digest one is accepted, Basic is not sent in advance.
TEST(WendrelAuthTest, DigestAcceptedDropsBasicAnsweredMeanwhile) {
    WendrelAuth auth;
    auth.answer(ORIGIN, "Digest nonce=a", "GET", "/", MUFASA, CIRCLE, false);
    auth.answer(ORIGIN, "Basic", "GET", "/", MUFASA, CIRCLE, false);
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/", MUFASA, CIRCLE).startsWith("Basic "));
    auth.accepted(ORIGIN, MUFASA, CIRCLE);
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/", MUFASA, CIRCLE).isEmpty());
}

// Resident memory in bytes, 0 where it cannot be read.
qint64 residentBytes() {
    QFile file(QStringLiteral("/proc/self/statm"));
    if (!file.open(QIODevice::ReadOnly))
        return 0;
    const QList<QByteArray> fields = file.readAll().split(' ');
    return fields.size() > 1 ? fields[1].toLongLong() * 4096 : 0;
}

#if defined(__SANITIZE_ADDRESS__)
const bool SANITIZED = true;
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
const bool SANITIZED = true;
#else
const bool SANITIZED = false;
#endif
#else
const bool SANITIZED = false;
#endif

// Many user names, each challenged with the largest challenge kept: the cache stays within its
// bound, dropping the least recently used; a larger challenge is refused and leaves nothing.
TEST(WendrelAuthTest, CacheStaysWithinItsBytesUnderManyUsersAndHugeChallenges) {
    const QByteArray largest = "Digest algorithm=SHA-256, qop=auth, realm=\"" + LONG_VALUE +
                               "\", nonce=\"" + LONG_VALUE + "\", opaque=\"" + LONG_VALUE + "\", " +
                               repeated("p%d=xxxxxxxx", 27);
    const QByteArray huge = largest + ", " + repeated("parameter%d=\"xxxxxxxx\"", 4000);
    const int users = 5000;
    const qint64 residentBefore = residentBytes();
    WendrelAuth auth;
    for (int i = 0; i < users; ++i) {
        const QString user = "user" + QString::number(i);
        ASSERT_EQ(auth.answer(ORIGIN, largest, "GET", "/", user, CIRCLE, false).refusal,
                  Refusal::None);
        ASSERT_EQ(auth.answer(ORIGIN, huge, "GET", "/", user + 'x', CIRCLE, false).refusal,
                  Refusal::Unanswerable);
        ASSERT_LE(auth.cacheBytes(), WendrelAuth::maxCacheBytes);
        // Kept in use, so never the least recently used.
        ASSERT_FALSE(auth.before(ORIGIN, "GET", "/", "user0", CIRCLE).isEmpty()) << i;
    }
    EXPECT_GT(auth.cacheBytes(), WendrelAuth::maxCacheBytes * 9 / 10);
    EXPECT_FALSE(
        auth.before(ORIGIN, "GET", "/", "user" + QString::number(users - 1), CIRCLE).isEmpty());
    EXPECT_TRUE(auth.before(ORIGIN, "GET", "/", "user1", CIRCLE).isEmpty());
    // With the allocator's slack; an unbounded cache would hold 5,000 x 1.9 KiB here.
    if (!SANITIZED && residentBefore > 0) {
        EXPECT_LT(residentBytes() - residentBefore, 3 * WendrelAuth::maxCacheBytes);
    }
}

// The memory of where Digest worked is bounded too: the oldest goes first.
TEST(WendrelAuthTest, DigestMemoryBounded) {
    WendrelAuth auth;
    const int users = 20000;
    for (int i = 0; i < users; ++i)
        auth.accepted(ORIGIN, "user" + QString::number(i), CIRCLE);
    const auto basic = [&auth](int user) {
        return auth
            .answer(ORIGIN, "Basic", "GET", "/", "user" + QString::number(user), CIRCLE, false)
            .refusal;
    };
    EXPECT_EQ(basic(users - 1), Refusal::Downgrade);
    EXPECT_EQ(basic(0), Refusal::None);
}

TEST(WendrelAuthTest, TargetAsQtSendsIt) {
    EXPECT_EQ(WendrelAuth::target(QUrl("http://cam:81/a/b.cgi?x=%26&y#f")), "/a/b.cgi?x=%26&y");
    EXPECT_EQ(WendrelAuth::target(QUrl("http://cam?q")), "/?q");
}

} // namespace
