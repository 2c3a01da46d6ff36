// Every camera command against a camera that fails in each way a transport can, through
// quenvar-host and through the plugin in this process: each is answered once, promptly, with the
// failure result, and the host stays up and ends without a leak.
#include "AnswerLedger.h"
#include "CameraCommands.h"
#include "CamsimProcess.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"
#include "ServedHost.h"

#include <QHostAddress>
#include <QJsonArray>
#include <QProcess>
#include <QTcpServer>
#include <QTcpSocket>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <memory>
#include <ostream>

namespace {

const QString CAMERA_USER = QStringLiteral("admin");
const QString CAMERA_PASSWORD = QStringLiteral("admin");
// The proxy's deadline for a camera request, and how soon any other failure must be answered.
const qint64 DEADLINE_MS = 10000;
const qint64 PROMPT_MS = 5000;

// What each command of cameraCommands() answers with when its camera request fails; undefined:
// any text, the camera's body as it came.
const QJsonValue FAILURE_PAYLOADS[] = {
    QJsonObject(),
    QJsonValue::Null,
    QJsonObject{{"nodeID", "n1"}, {"type", "autotracking"}},
    QJsonValue::Null,
    QJsonValue::Null,
    QJsonValue::Null,
    QJsonValue::Undefined,
    QJsonArray(),
};

// How the camera fails.
enum class Camera { Simulated, Refusing, Garbled };

struct FaultCase {
    const char* name;
    Camera camera;
    QStringList camsimArguments;
    bool tls = false;
    QString password = CAMERA_PASSWORD;
    bool waitsForDeadline = false;
};

void PrintTo(const FaultCase& c, std::ostream* out) {
    *out << c.name;
}

// Answers every connection with bytes that are no HTTP at all, then hangs up.
class GarbledCamera {
public:
    GarbledCamera() {
        server.listen(QHostAddress::LocalHost, 0);
        QObject::connect(&server, &QTcpServer::newConnection, [this] {
            while (QTcpSocket* socket = server.nextPendingConnection()) {
                socket->write("\x16\x03 no status line\r\n\x01\x02\r\n\r\n");
                socket->disconnectFromHost();
                QObject::connect(socket, &QTcpSocket::disconnected, socket, &QObject::deleteLater);
            }
        });
    }
    quint16 port() const { return server.serverPort(); }

private:
    QTcpServer server;
};

quint16 closedPort() {
    QTcpServer server;
    server.listen(QHostAddress::LocalHost, 0);
    return server.serverPort();
}

class CameraFaultTest : public ::testing::TestWithParam<FaultCase> {
protected:
    static void SetUpTestSuite() {
        certificates = std::make_unique<QTemporaryDir>();
        QProcess openssl;
        openssl.setStandardErrorFile(QProcess::nullDevice());
        openssl.start(QStringLiteral("openssl"),
                      {"req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1",
                       "-nodes", "-days", "2", "-subj", "/CN=127.0.0.1", "-addext",
                       "subjectAltName=IP:127.0.0.1", "-keyout", keyFile(), "-out",
                       certificateFile()});
        ASSERT_TRUE(openssl.waitForFinished() && openssl.exitCode() == 0);
    }
    static void TearDownTestSuite() { certificates.reset(); }
    static QString certificateFile() { return certificates->filePath("cert.pem"); }
    static QString keyFile() { return certificates->filePath("key.pem"); }

    // Starts the failing camera and returns its port.
    quint16 startCamera(const FaultCase& c) {
        switch (c.camera) {
        case Camera::Refusing:
            return closedPort();
        case Camera::Garbled:
            garbled = std::make_unique<GarbledCamera>();
            return garbled->port();
        case Camera::Simulated:
            break;
        }
        QStringList arguments = c.camsimArguments;
        if (c.tls)
            arguments << "--tls-cert" << certificateFile() << "--tls-key" << keyFile();
        camsim = std::make_unique<CamsimProcess>(arguments);
        return camsim->port();
    }

    static std::unique_ptr<QTemporaryDir> certificates;
    std::unique_ptr<CamsimProcess> camsim;
    std::unique_ptr<GarbledCamera> garbled;
};

std::unique_ptr<QTemporaryDir> CameraFaultTest::certificates;

} // namespace

TEST_P(CameraFaultTest, EveryCommandIsAnsweredOnceWithTheFailureResult) {
    const FaultCase& c = GetParam();
    const quint16 port = startCamera(c);
    ASSERT_NE(port, 0);
    ServedHost host;
    ASSERT_TRUE(host.start());
    // The same requests in this process too, where the answers can be counted.
    FakeFrameworkTools tools;
    auto plugin = std::make_unique<PluginQuenvar>();
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    AnswerLedger ledger;

    QList<QJsonObject> requests;
    for (const CameraCommand& command : cameraCommands()) {
        const QVariantMap params =
            command.to(CamsimProcess::host(), port, CAMERA_USER, c.password, c.tls);
        plugin->Request(command.name, params, RequestSenderInfo(),
                        ledger.callback(static_cast<int>(requests.size())));
        requests.append(
            {{"command", command.name}, {"params", QJsonObject::fromVariantMap(params)}});
    }
    // All at once: the ones that wait for the deadline wait together.
    const QList<ServedHost::Answer> answers = host.post(requests);
    ASSERT_TRUE(ledger.waitForAll(DEADLINE_MS + PROMPT_MS));
    plugin.reset();

    const auto check = [&c](const QJsonObject& answer, qint64 elapsedMs, qsizetype command) {
        SCOPED_TRACE(cameraCommands().at(command).name);
        EXPECT_EQ(answer.value("handled"), QJsonValue(true));
        EXPECT_EQ(answer.value("code"), QJsonValue("-1"));
        EXPECT_EQ(answer.value("message"), QJsonValue(""));
        if (FAILURE_PAYLOADS[command].isUndefined())
            EXPECT_TRUE(answer.value("payload").isString());
        else
            EXPECT_EQ(answer.value("payload"), FAILURE_PAYLOADS[command]);
        if (c.waitsForDeadline) {
            EXPECT_GE(elapsedMs, DEADLINE_MS - 500);
            EXPECT_LT(elapsedMs, DEADLINE_MS + PROMPT_MS);
        } else {
            EXPECT_LT(elapsedMs, PROMPT_MS);
        }
    };
    for (qsizetype i = 0; i < answers.size(); ++i) {
        ASSERT_EQ(answers.at(i).status, 200);
        check(answers.at(i).json, answers.at(i).elapsedMs, i);
        const AnswerLedger::Entry counted = ledger.entry(static_cast<int>(i));
        EXPECT_EQ(counted.calls, 1) << cameraCommands().at(i).name;
        check({{"handled", counted.handled},
               {"code", counted.code},
               {"message", counted.message},
               {"payload", QJsonValue::fromVariant(counted.payload)}},
              counted.elapsedMs, i);
    }
    EXPECT_EQ(host.stop(), 0) << qPrintable(host.errorOutput());
}

INSTANTIATE_TEST_SUITE_P(
    Faults, CameraFaultTest,
    ::testing::Values(
        FaultCase{"ConnectionRefused", Camera::Refusing, {}},
        FaultCase{"ResetMidAnswer", Camera::Simulated, {"--fault", "close"}},
        FaultCase{"NoAnswerUntilTheDeadline",
                  Camera::Simulated,
                  {"--fault", "delay", "--fault-delay-ms", "30000"},
                  false,
                  CAMERA_PASSWORD,
                  true},
        FaultCase{"WrongCredentials",
                  Camera::Simulated,
                  {"--auth", "digest", "--user", CAMERA_USER, "--pass", "the-right-one"}},
        FaultCase{"NotFound", Camera::Simulated, {"--fault", "status", "--fault-status", "404"}},
        FaultCase{"ServerError", Camera::Simulated, {"--fault", "status", "--fault-status", "500"}},
        FaultCase{"MalformedAnswer", Camera::Garbled, {}},
        FaultCase{"OversizedAnswer", Camera::Simulated, {"--fault", "oversize"}},
        FaultCase{"UntrustedCertificate", Camera::Simulated, {}, true}),
    [](const ::testing::TestParamInfo<FaultCase>& info) { return info.param.name; });
