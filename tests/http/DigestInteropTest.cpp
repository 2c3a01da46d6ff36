#include "ListeningProcess.h"
#include "ReplyRecorder.h"
#include "Wendrel.h"

#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

namespace {

using Lines = std::vector<std::string>;

const int TIMEOUT_MS = 10000;
const QString PASSWORD = QStringLiteral("s3cret, or \"not\"?");
const QString OPERATOR = QStringLiteral("operator");
const QString JASON = QStringLiteral("J\u00e4s\u00f8n Doe");
// Three requests in turn: the first is challenged, the others answer in advance.
const QString PATHS[] = {"/a", "/cgi-bin/b.cgi?x=%26&y", "/c"};

std::string ok(const std::string& text) {
    return "NoError reached: ok " + text;
}

struct Exchange {
    const char* name;
    QStringList serverArguments;
    QString user;
    QString password; // the client's
    Lines said;       // the replies to the three requests
    Lines logged;     // the server's verdicts, one per request it received
};

const Exchange EXCHANGES[] = {
    {"Sha256ListedFirst",
     {"--offer", "SHA-256,MD5,Basic"},
     OPERATOR,
     PASSWORD,
     {ok("SHA-256 username"), ok("SHA-256 username"), ok("SHA-256 username")},
     {"/a none", "/a digest ok SHA-256 username",
      "/cgi-bin/b.cgi?x=%26&y digest ok SHA-256 username", "/c digest ok SHA-256 username"}},
    {"Sha512_256WithUserhash",
     {"--offer", "SHA-512-256", "--userhash"},
     JASON,
     PASSWORD,
     {ok("SHA-512-256 userhash"), ok("SHA-512-256 userhash"), ok("SHA-512-256 userhash")},
     {"/a none", "/a digest ok SHA-512-256 userhash",
      "/cgi-bin/b.cgi?x=%26&y digest ok SHA-512-256 userhash",
      "/c digest ok SHA-512-256 userhash"}},
    {"Sha256SessNonAsciiUser",
     {"--offer", "SHA-256-sess"},
     JASON,
     PASSWORD,
     {ok("SHA-256-sess username*"), ok("SHA-256-sess username*"), ok("SHA-256-sess username*")},
     {"/a none", "/a digest ok SHA-256-sess username*",
      "/cgi-bin/b.cgi?x=%26&y digest ok SHA-256-sess username*",
      "/c digest ok SHA-256-sess username*"}},
    {"UnsupportedAlgorithmSkipped",
     {"--offer", "SHA3-256,SHA-512-256-sess"},
     OPERATOR,
     PASSWORD,
     {ok("SHA-512-256-sess username"), ok("SHA-512-256-sess username"),
      ok("SHA-512-256-sess username")},
     {"/a none", "/a digest ok SHA-512-256-sess username",
      "/cgi-bin/b.cgi?x=%26&y digest ok SHA-512-256-sess username",
      "/c digest ok SHA-512-256-sess username"}},
    {"Md5WithoutQop",
     {"--offer", "MD5", "--no-qop"},
     OPERATOR,
     PASSWORD,
     {ok("MD5 username"), ok("MD5 username"), ok("MD5 username")},
     {"/a none", "/a digest ok MD5 username", "/cgi-bin/b.cgi?x=%26&y digest ok MD5 username",
      "/c digest ok MD5 username"}},
    {"StaleNonceAnsweredAgain",
     {"--offer", "SHA-256", "--nonce-uses", "1"},
     OPERATOR,
     PASSWORD,
     {ok("SHA-256 username"), ok("SHA-256 username"), ok("SHA-256 username")},
     {"/a none", "/a digest ok SHA-256 username", "/cgi-bin/b.cgi?x=%26&y digest stale",
      "/cgi-bin/b.cgi?x=%26&y digest ok SHA-256 username", "/c digest stale",
      "/c digest ok SHA-256 username"}},
    {"BasicAlone",
     {"--offer", "Basic"},
     OPERATOR,
     PASSWORD,
     {ok("Basic"), ok("Basic"), ok("Basic")},
     {"/a none", "/a basic ok", "/cgi-bin/b.cgi?x=%26&y basic ok", "/c basic ok"}},
    // After Digest worked over plain HTTP, the server asks for Basic: never sent.
    {"DowngradeRefused",
     {"--offer", "SHA-256,Basic", "--basic-after-digest"},
     OPERATOR,
     PASSWORD,
     {ok("SHA-256 username"), "AuthenticationRequiredError reached: digest unasked SHA-256",
      "AuthenticationRequiredError reached: none"},
     {"/a none", "/a digest ok SHA-256 username", "/cgi-bin/b.cgi?x=%26&y digest unasked SHA-256",
      "/c none"}},
    {"WrongPassword",
     {"--offer", "SHA-512-256"},
     OPERATOR,
     "wrong",
     {"AuthenticationRequiredError reached: digest wrong",
      "AuthenticationRequiredError reached: digest wrong",
      "AuthenticationRequiredError reached: digest wrong"},
     {"/a none", "/a digest wrong", "/cgi-bin/b.cgi?x=%26&y none",
      "/cgi-bin/b.cgi?x=%26&y digest wrong", "/c none", "/c digest wrong"}},
};

// Failures name the row, not its bytes.
void PrintTo(const Exchange& row, std::ostream* out) {
    *out << row.name;
}

class DigestInteropTest : public ::testing::TestWithParam<Exchange> {};

// Against a server that checks every answer on its own, with Python's hashlib.
TEST_P(DigestInteropTest, ServerAcceptsWhatItShould) {
    const Exchange& row = GetParam();
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert(QStringLiteral("PYTHONUTF8"), QStringLiteral("1")); // the user's name
    ListeningProcess server;
    ASSERT_TRUE(server.start(
        QStringLiteral(QUENVAR_PYTHON3),
        QStringList{QStringLiteral(DIGEST_SERVER), "--user", row.user, "--password", PASSWORD} +
            row.serverArguments,
        environment))
        << qPrintable(server.errorOutput());
    ReplyRecorder recorder;
    Wendrel client(WendrelSettings{});
    for (int i = 0; i < 3; ++i) {
        ASSERT_TRUE(client.Get("127.0.0.1", PATHS[i], server.port(), false, row.user, row.password,
                               recorder.callback(i), TIMEOUT_MS, {}));
        ASSERT_TRUE(recorder.waitFor(i + 1, TIMEOUT_MS));
    }
    EXPECT_EQ(recorder.said(), row.said);
    const QStringList logged = server.errorOutput().split(QLatin1Char('\n'), Qt::SkipEmptyParts);
    Lines lines;
    for (const QString& line : logged)
        lines.push_back(line.toStdString());
    EXPECT_EQ(lines, row.logged);
}

INSTANTIATE_TEST_SUITE_P(Exchanges, DigestInteropTest, ::testing::ValuesIn(EXCHANGES),
                         [](const auto& info) { return std::string(info.param.name); });

} // namespace
