// Every camera command against a camera that fails in each way a transport can, through
// quenvar-host and through the plugin in this process: each is answered once, promptly, with the
// failure result, and the host stays up and ends without a leak. No trace, log or answer gives
// the password away, whether the camera took it, refused it or was never reached.
#include "AnswerLedger.h"
#include "CameraCommands.h"
#include "CamsimProcess.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"
#include "ServedHost.h"

#include <QJsonDocument>
#include <QProcess>
#include <QRegularExpression>
#include <QTcpServer>
#include <QTcpSocket>
#include <QTemporaryDir>
#include <QUrl>

#include <gtest/gtest.h>

#include <memory>
#include <ostream>
#include <utility>
#include <vector>

namespace {

// The proxy's deadline for a camera request, and how soon any other failure must be answered.
const qint64 DEADLINE_MS = 10000;
const qint64 PROMPT_MS = 5000;
const QString SECRET = QStringLiteral("Pw-7hQ2zX:secret");

// Refusing and Garbled cameras are played by this process; Tls is the simulator with a
// self-signed certificate.
enum class Camera { Simulated, Refusing, Garbled, Tls };

struct FaultCase {
    const char* name;
    Camera camera;
    const char* reason; // what the log says at its default level, a regular expression
    const char* camsimArguments = "";
    bool waitsForDeadline = false;
};

void PrintTo(const FaultCase& c, std::ostream* out) {
    *out << c.name;
}

class CameraFaultTest : public ::testing::TestWithParam<FaultCase> {
protected:
    // Starts the failing camera and returns its port, 0 when it did not come up.
    quint16 startCamera(Camera camera, QStringList arguments) {
        if (camera == Camera::Refusing || camera == Camera::Garbled) {
            server.listen(QHostAddress::LocalHost, 0);
            const quint16 port = server.serverPort();
            if (camera == Camera::Refusing)
                server.close();
            // Bytes that are no HTTP at all, then hang up.
            QObject::connect(&server, &QTcpServer::newConnection, &server, [this] {
                while (QTcpSocket* socket = server.nextPendingConnection()) {
                    socket->write("\x16\x03 no status line\r\n\x01\x02\r\n\r\n");
                    socket->disconnectFromHost();
                }
            });
            return port;
        }
        if (camera == Camera::Tls) {
            const QString cert = certificates.filePath("cert.pem");
            const QString key = certificates.filePath("key.pem");
            if (QProcess::execute("openssl",
                                  {"req", "-x509", "-newkey", "ec", "-pkeyopt",
                                   "ec_paramgen_curve:prime256v1", "-nodes", "-days", "2", "-subj",
                                   "/CN=127.0.0.1", "-addext", "subjectAltName=IP:127.0.0.1",
                                   "-keyout", key, "-out", cert}) != 0)
                return 0;
            arguments << "--tls-cert" << cert << "--tls-key" << key;
        }
        // Faults come after authentication, so most cases take the password.
        camsim = std::make_unique<CamsimProcess>(
            QStringList{"--auth", "digest", "--user", "admin", "--pass", SECRET} + arguments);
        return camsim->port();
    }

    QTcpServer server;
    QTemporaryDir certificates;
    std::unique_ptr<CamsimProcess> camsim;
};

} // namespace

TEST_P(CameraFaultTest, EveryCommandIsAnsweredOnceWithTheFailureResult) {
    const FaultCase& c = GetParam();
    const quint16 port =
        startCamera(c.camera, QString(c.camsimArguments).split(' ', Qt::SkipEmptyParts));
    ASSERT_NE(port, 0);
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert("QT_LOGGING_RULES", "qt.network.*=true");
    ServedHost host;
    ASSERT_TRUE(host.serve({"--verbose"}, ServedHost::TOKEN, environment));
    // The same requests in this process too, where the answers can be counted.
    FakeFrameworkTools tools;
    auto plugin = std::make_unique<PluginQuenvar>();
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    AnswerLedger ledger;
    QList<QByteArray> requests;
    for (const CameraCommand& command : cameraCommands()) {
        const QVariantMap params = command.to(port, SECRET, c.camera == Camera::Tls);
        plugin->Request(command.name, params, RequestSenderInfo(),
                        ledger.callback(static_cast<int>(requests.size())));
        requests.append(ServedHost::request(command.name, params));
    }
    // All at once: the ones that wait for the deadline wait together.
    const QList<ServedHost::Reply> answers = host.post(requests);
    ASSERT_TRUE(ledger.waitForAll(DEADLINE_MS + PROMPT_MS));
    plugin.reset();

    QString everything;
    for (int i = 0; i < static_cast<int>(answers.size()); ++i) {
        const CameraCommand& command = cameraCommands().at(i);
        SCOPED_TRACE(command.name);
        const AnswerLedger::Entry counted = ledger.entry(i);
        EXPECT_EQ(counted.calls, 1);
        EXPECT_EQ(answers.at(i).status, 200);
        for (const auto& [json, elapsedMs] :
             {std::pair(answers.at(i).json(), answers.at(i).elapsedMs),
              std::pair(counted.first, counted.elapsedMs)}) {
            // Undefined: any text.
            const QJsonValue payload = json.value("payload");
            const QJsonObject expected{
                {"handled", true},
                {"code", "-1"},
                {"message", ""},
                {"payload", command.failurePayload.isUndefined() && payload.isString()
                                ? payload
                                : command.failurePayload}};
            const QByteArray text = QJsonDocument(json).toJson(QJsonDocument::Compact);
            everything += text;
            EXPECT_EQ(json, expected) << text.constData();
            EXPECT_LT(elapsedMs, c.waitsForDeadline ? DEADLINE_MS + PROMPT_MS : PROMPT_MS);
            EXPECT_GE(elapsedMs, c.waitsForDeadline ? DEADLINE_MS - 500 : 0);
        }
    }
    EXPECT_EQ(host.stop(), 0) << qPrintable(host.errorOutput());
    const QRegularExpression reason(
        QStringLiteral(R"(\[Wendrel\] L2 \S+ \w+ https?://127\.0\.0\.1:)") + QString::number(port) +
        QStringLiteral(R"(/\S* failed after \d+ ms: )") + QString::fromLatin1(c.reason));
    EXPECT_TRUE(reason.match(host.errorOutput()).hasMatch()) << qPrintable(host.errorOutput());
    everything += host.errorOutput();
    for (const std::string& line : camsim ? camsim->logLines() : std::vector<std::string>())
        everything += QString::fromStdString(line);
    // The traces did run.
    EXPECT_TRUE(everything.contains("PluginQuenvar::Request")) << qPrintable(everything);
    for (const QString& form : {SECRET, QString::fromLatin1(QUrl::toPercentEncoding(SECRET)),
                                QString::fromLatin1(("admin:" + SECRET).toUtf8().toBase64())})
        EXPECT_FALSE(everything.contains(form)) << qPrintable(form);
}

INSTANTIATE_TEST_SUITE_P(
    Faults, CameraFaultTest,
    ::testing::Values(
        FaultCase{"ConnectionRefused", Camera::Refusing, "connection refused"},
        FaultCase{"ResetMidAnswer", Camera::Simulated,
                  "connection closed by the server (before any|in the middle of the) answer",
                  "--fault close"},
        FaultCase{"NoAnswerUntilTheDeadline", Camera::Simulated,
                  "timed out after 10\\d{3} ms waiting for the answer",
                  "--fault delay --fault-delay-ms 30000", true},
        FaultCase{"WrongCredentials", Camera::Simulated, "credentials rejected \\(Digest\\)",
                  "--pass the-right-one"},
        FaultCase{"WrongBasicCredentials", Camera::Simulated, "credentials rejected \\(Basic\\)",
                  "--auth basic --pass x"},
        FaultCase{"NotFound", Camera::Simulated, "HTTP 404 ", "--fault status --fault-status 404"},
        FaultCase{"ServerError", Camera::Simulated, "HTTP 500 ",
                  "--fault status --fault-status 500"},
        FaultCase{"MalformedAnswer", Camera::Garbled, "malformed answer \\(HPE_\\w+\\)"},
        FaultCase{"OversizedAnswer", Camera::Simulated, "answer over the cap: body over",
                  "--fault oversize"},
        FaultCase{"UntrustedCertificate", Camera::Tls,
                  "TLS handshake failed: .*self-signed.*SHA-256 [0-9a-f:]{95}"}),
    [](const ::testing::TestParamInfo<FaultCase>& info) { return info.param.name; });
