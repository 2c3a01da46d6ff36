// Every failed request leaves one line in the log at the default level that says why, without
// the credentials in any form and with the server's own text escaped and cut.
#include "CamsimProcess.h"
#include "ReplyRecorder.h"
#include "ScriptedServer.h"
#include "TestCertificate.h"
#include "Wendrel.h"

#include <QCoreApplication>
#include <QFile>
#include <QRegularExpression>
#include <QSslCertificate>

#include <gtest/gtest.h>

namespace {

const QString HOST = QStringLiteral("127.0.0.1");
const QString USER = QStringLiteral("operator");
const QString PASSWORD = QStringLiteral("pa55:w0rd");

QString logPath() {
    static QTemporaryDir folder;
    return folder.filePath(QStringLiteral("wendrel.log"));
}

QString logText() {
    QFile file(logPath());
    return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
}

// Makes one request that fails, and expects the log to have gained one line that gives reason.
void expectOneLine(quint16 port, bool https, QNetworkReply::NetworkError error,
                   const QString& reason, uint timeout = 5000, const QString& user = USER) {
    const qsizetype before = logText().size();
    ReplyRecorder recorder;
    {
        Wendrel client;
        client.Get(HOST, QStringLiteral("/cgi-bin/admin/getparam.cgi?system_password=x"), port,
                   https, user, PASSWORD, recorder.callback(), timeout, {});
        ASSERT_TRUE(recorder.waitFor(1));
    }
    EXPECT_EQ(recorder.first().error, error);
    const QStringList lines = logText().mid(before).split('\n', Qt::SkipEmptyParts);
    ASSERT_EQ(lines.size(), 1) << qPrintable(lines.join('\n'));
    const QRegularExpression line(
        QStringLiteral(
            R"(\[Wendrel\] L2 platform/http/WendrelWorker\.cpp:\d+ GET %1://127\.0\.0\.1:%2)"
            R"(/cgi-bin/admin/getparam\.cgi failed after \d+ ms: %3$)")
            .arg(https ? "https" : "http")
            .arg(port)
            .arg(reason));
    EXPECT_TRUE(line.match(lines.first()).hasMatch()) << qPrintable(lines.first());
    for (const QString& secret :
         {PASSWORD, QString::fromLatin1((USER + ':' + PASSWORD).toUtf8().toBase64()),
          QString::fromLatin1(PASSWORD.toUtf8().toBase64()), QStringLiteral("Authorization"),
          QStringLiteral("system_password"), QStringLiteral("Smuggled")})
        EXPECT_FALSE(lines.first().contains(secret)) << qPrintable(secret);
}

struct Case {
    const char* name;
    QByteArray reply; // the server's answer to every request; none: it never answers
    QNetworkReply::NetworkError error;
    const char* reason; // a regular expression for the reason the log gives
    uint timeout = 5000;
    QString user = USER;
};

const QByteArray EMPTY_BODY = "\r\nContent-Length: 0\r\n\r\n";

const Case CASES[] = {
    {"Refused", {}, QNetworkReply::ConnectionRefusedError, "connection refused"},
    {"Silent",
     {},
     QNetworkReply::TimeoutError,
     R"(timed out after \d+ ms waiting for the answer \(it waited \d+ ms for a )"
     R"(connection\))",
     300},
    {"ServerError", "HTTP/1.1 500 Internal Server Error" + EMPTY_BODY,
     QNetworkReply::InternalServerError, "HTTP 500 Internal Server Error"},
    {"BasicRejected",
     "HTTP/1.1 401 Unauthorized\r\nWWW-Authenticate: Basic realm=\"cam\"" + EMPTY_BODY,
     QNetworkReply::AuthenticationRequiredError, R"(credentials rejected \(Basic\))"},
    {"DigestRejected",
     "HTTP/1.1 401 Unauthorized\r\nWWW-Authenticate: Digest realm=\"cam\", "
     "nonce=\"abc\", qop=\"auth\"" +
         EMPTY_BODY,
     QNetworkReply::AuthenticationRequiredError, R"(credentials rejected \(Digest\))"},
    {"Oversized", "HTTP/1.1 200 OK\r\nContent-Length: 9000000\r\n\r\n",
     QNetworkReply::UnknownContentError, R"(answer over the cap: body over 8388608 bytes)"},
    {"Malformed", "HTTP/9 banana\r\n\r\n", QNetworkReply::ProtocolFailure,
     R"(malformed answer \(HPE_\w+\))"},
    // The reason phrase is the server's: it cannot break the line, and is cut.
    {"ServerTextEscapedAndCut", "HTTP/1.1 503 Busy\x1b[31m\a" + QByteArray(300, 'z') + EMPTY_BODY,
     QNetworkReply::ServiceUnavailableError, R"(HTTP 503 Busy\\x1b\[31m\\x07z{240}\.\.\.)"},
    // Named without its value.
    {"UnsafeField", "HTTP/1.1 200 OK" + EMPTY_BODY, QNetworkReply::ProtocolInvalidOperationError,
     "refused without sending: the user name holds a control character", 5000,
     USER + "\r\nX-Smuggled: 1"},
};

TEST(WendrelLogTest, SaysWhyTheRequestFailed) {
    for (const Case& row : CASES) {
        SCOPED_TRACE(row.name);
        ScriptedServer server({}, {row.reply});
        const quint16 port = server.serverPort();
        if (row.error == QNetworkReply::ConnectionRefusedError)
            server.close();
        expectOneLine(port, false, row.error, row.reason, row.timeout, row.user);
    }
}

TEST(WendrelTlsLogTest, NamesTheUntrustedCertificate) {
    QTemporaryDir folder;
    ASSERT_TRUE(makeTestCertificate(folder.path(), "camera-7"));
    const CamsimProcess camera({"--tls-cert", folder.filePath("camera-7.pem"), "--tls-key",
                                folder.filePath("camera-7.key")});
    ASSERT_NE(camera.port(), 0) << qPrintable(camera.error());
    const QString fingerprint =
        QString::fromLatin1(QSslCertificate::fromPath(folder.filePath("camera-7.pem"))
                                .first()
                                .digest(QCryptographicHash::Sha256)
                                .toHex(':'));
    expectOneLine(camera.port(), true, QNetworkReply::SslHandshakeFailedError,
                  R"(TLS handshake failed: .*self-signed.* \(peer certificate: subject )"
                  R"(camera-7, issuer camera-7, SHA-256 )" +
                      fingerprint + R"(\))");
}

} // namespace

// The logging library reads where to write when it is first used, which is after this.
int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    qputenv("KALBLOG_FILE", logPath().toLocal8Bit());
    qputenv("KALBLOG_LEVEL", "2");
    ::testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
