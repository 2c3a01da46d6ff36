// Every failed request leaves one line in the log at the default level that says why, without
// the credentials in any form and with the server's own text escaped and cut.
#include "ReplyRecorder.h"
#include "Wendrel.h"

#include <QCoreApplication>
#include <QFile>
#include <QProcess>
#include <QRegularExpression>
#include <QSslKey>
#include <QSslServer>
#include <QSslSocket>
#include <QTcpServer>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <memory>
#include <ostream>

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

// Answers every whole request it reads with reply; with an empty reply it never answers.
class FixedServer {
public:
    FixedServer(const QByteArray& reply, QTcpServer* server)
        : server(server) {
        server->listen(QHostAddress::LocalHost, 0);
        QObject::connect(server, &QTcpServer::pendingConnectionAvailable, server, [=] {
            while (QTcpSocket* socket = server->nextPendingConnection()) {
                QObject::connect(socket, &QTcpSocket::readyRead, socket, [socket, reply] {
                    if (socket->readAll().contains("\r\n\r\n") && !reply.isEmpty())
                        socket->write(reply);
                });
            }
        });
    }

    quint16 port() const { return server->serverPort(); }

private:
    std::unique_ptr<QTcpServer> server;
};

// A self-signed certificate for 127.0.0.1, made with the openssl command.
bool makeCertificate(const QTemporaryDir& folder, QSslCertificate* certificate, QSslKey* key) {
    const QString certificatePath = folder.filePath(QStringLiteral("cert.pem"));
    const QString keyPath = folder.filePath(QStringLiteral("key.pem"));
    if (QProcess::execute("openssl",
                          {"req", "-x509", "-newkey", "ec", "-pkeyopt",
                           "ec_paramgen_curve:prime256v1", "-nodes", "-days", "2", "-subj",
                           "/CN=camera-7", "-keyout", keyPath, "-out", certificatePath}) != 0)
        return false;
    QFile keyFile(keyPath);
    if (!keyFile.open(QIODevice::ReadOnly))
        return false;
    *key = QSslKey(keyFile.readAll(), QSsl::Ec);
    const QList<QSslCertificate> certificates = QSslCertificate::fromPath(certificatePath);
    if (certificates.isEmpty() || key->isNull())
        return false;
    *certificate = certificates.first();
    return true;
}

struct Case {
    const char* name;
    QByteArray reply; // the server's answer to every request; none: it never answers
    QNetworkReply::NetworkError error;
    const char* reason; // a regular expression for the reason the log gives
};

void PrintTo(const Case& c, std::ostream* out) {
    *out << c.name;
}

class WendrelLogTest : public ::testing::TestWithParam<Case> {
protected:
    // Makes one request that fails, and returns the lines the log gained.
    QStringList failOnce(quint16 port, bool https, QNetworkReply::NetworkError expected,
                         uint timeout = 5000, const QString& user = USER) {
        const qsizetype before = logText().size();
        ReplyRecorder recorder;
        {
            Wendrel client;
            client.Get(HOST, QStringLiteral("/cgi-bin/admin/getparam.cgi?system_password=x"), port,
                       https, user, PASSWORD, recorder.callback(), timeout, {});
            EXPECT_TRUE(recorder.waitFor(1));
        }
        EXPECT_EQ(recorder.first().error, expected);
        return logText().mid(before).split('\n', Qt::SkipEmptyParts);
    }

    static void expectOneLine(const QStringList& lines, quint16 port, const QString& scheme,
                              const QString& reason) {
        ASSERT_EQ(lines.size(), 1) << qPrintable(lines.join('\n'));
        const QRegularExpression line(
            QStringLiteral(R"(\[Wendrel\] L2 platform/http/WendrelWorker\.cpp:\d+ GET )") +
            QRegularExpression::escape(QStringLiteral("%1://%2:%3/cgi-bin/admin/getparam.cgi")
                                           .arg(scheme, HOST)
                                           .arg(port)) +
            QStringLiteral(R"( failed after \d+ ms: )") + reason + '$');
        EXPECT_TRUE(line.match(lines.first()).hasMatch()) << qPrintable(lines.first());
        for (const QString& secret :
             {PASSWORD, QString::fromLatin1((USER + ':' + PASSWORD).toUtf8().toBase64()),
              QString::fromLatin1(PASSWORD.toUtf8().toBase64()), QStringLiteral("Authorization"),
              QStringLiteral("system_password")})
            EXPECT_FALSE(lines.first().contains(secret)) << qPrintable(secret);
    }
};

TEST_P(WendrelLogTest, SaysWhyTheRequestFailed) {
    const Case& row = GetParam();
    FixedServer server(row.reply, new QTcpServer);
    expectOneLine(failOnce(server.port(), false, row.error), server.port(), "http", row.reason);
}

const QByteArray EMPTY_BODY = "\r\nContent-Length: 0\r\n\r\n";

INSTANTIATE_TEST_SUITE_P(
    Failures, WendrelLogTest,
    ::testing::Values(
        Case{"ServerError", "HTTP/1.1 500 Internal Server Error" + EMPTY_BODY,
             QNetworkReply::InternalServerError, "HTTP 500 Internal Server Error"},
        Case{"BasicRejected",
             "HTTP/1.1 401 Unauthorized\r\nWWW-Authenticate: Basic realm=\"cam\"" + EMPTY_BODY,
             QNetworkReply::AuthenticationRequiredError, R"(credentials rejected \(Basic\))"},
        Case{"DigestRejected",
             "HTTP/1.1 401 Unauthorized\r\nWWW-Authenticate: Digest realm=\"cam\", "
             "nonce=\"abc\", qop=\"auth\"" +
                 EMPTY_BODY,
             QNetworkReply::AuthenticationRequiredError, R"(credentials rejected \(Digest\))"},
        Case{"Oversized", "HTTP/1.1 200 OK\r\nContent-Length: 9000000\r\n\r\n",
             QNetworkReply::UnknownContentError, R"(answer over the cap: body over 8388608 bytes)"},
        Case{"Malformed", "HTTP/9 banana\r\n\r\n", QNetworkReply::ProtocolFailure,
             R"(malformed answer \(HPE_\w+\))"},
        // The reason phrase is the server's: it cannot break the line, and is cut.
        Case{"ServerTextEscapedAndCut",
             "HTTP/1.1 503 Busy\x1b[31m\a" + QByteArray(300, 'z') + EMPTY_BODY,
             QNetworkReply::ServiceUnavailableError,
             R"(HTTP 503 Busy\\x1b\[31m\\x07z{240}\.\.\.)"}),
    [](const ::testing::TestParamInfo<Case>& info) { return std::string(info.param.name); });

TEST_F(WendrelLogTest, SaysTheConnectionWasRefused) {
    QTcpServer closed;
    ASSERT_TRUE(closed.listen(QHostAddress::LocalHost, 0));
    const quint16 port = closed.serverPort();
    closed.close();
    expectOneLine(failOnce(port, false, QNetworkReply::ConnectionRefusedError), port, "http",
                  "connection refused");
}

TEST_F(WendrelLogTest, SaysHowLongASilentServerWasWaitedFor) {
    FixedServer silent({}, new QTcpServer);
    expectOneLine(failOnce(silent.port(), false, QNetworkReply::TimeoutError, 300), silent.port(),
                  "http",
                  R"(timed out after \d+ ms waiting for the answer \(it waited \d+ ms for a )"
                  R"(connection\))");
}

TEST_F(WendrelLogTest, NamesAnUnsafeFieldWithoutItsValue) {
    FixedServer server("HTTP/1.1 200 OK" + EMPTY_BODY, new QTcpServer);
    const QStringList lines =
        failOnce(server.port(), false, QNetworkReply::ProtocolInvalidOperationError, 5000,
                 USER + "\r\nX-Smuggled: 1");
    expectOneLine(lines, server.port(), "http",
                  "refused without sending: the user name holds a control character");
    EXPECT_FALSE(lines.join('\n').contains("Smuggled"));
}

TEST_F(WendrelLogTest, NamesTheUntrustedCertificate) {
    QTemporaryDir folder;
    QSslCertificate certificate;
    QSslKey key;
    ASSERT_TRUE(makeCertificate(folder, &certificate, &key));
    auto* tls = new QSslServer;
    QSslConfiguration configuration = QSslConfiguration::defaultConfiguration();
    configuration.setLocalCertificate(certificate);
    configuration.setPrivateKey(key);
    tls->setSslConfiguration(configuration);
    FixedServer server("HTTP/1.1 200 OK" + EMPTY_BODY, tls);
    const QString fingerprint =
        QString::fromLatin1(certificate.digest(QCryptographicHash::Sha256).toHex(':'));
    expectOneLine(failOnce(server.port(), true, QNetworkReply::SslHandshakeFailedError),
                  server.port(), "https",
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
