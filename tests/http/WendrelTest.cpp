#include "Wendrel.h"

#include "BuildPaths.h"
#include "CamsimProcess.h"
#include "EventLoopWait.h"
#include "ReplyRecorder.h"
#include "WendrelWorker.h"

#include <QElapsedTimer>
#include <QHostAddress>
#include <QProcess>
#include <QTcpServer>
#include <QTcpSocket>
#include <QTemporaryDir>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <stdexcept>
#include <thread>
#include <vector>

namespace {

using Said = std::vector<std::string>;
using ::testing::HasSubstr;
using ::testing::UnorderedElementsAreArray;

const int TIMEOUT_MS = 5000;
const QString USER = QStringLiteral("operator");
const QString PASSWORD = QStringLiteral("s3cret:pa ss");
const QString FORM = QStringLiteral("application/x-www-form-urlencoded");
const QString CAMCTRL = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
const QString GETPARAM = QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl");
const QString RATIO = CAMCTRL + "?getratio";
const std::string ZOOM = "NoError reached: zoom=1\r\n";
const std::string IDLE = "NoError reached: camctrl_c0_idleaction_enable='0'\r\n"
                         "camctrl_c0_idleaction_type='objtrack'\r\n"
                         "camctrl_c0_idleaction_interval='30'\r\n";

class WendrelTest : public ::testing::Test {
protected:
    void startCamsim(const QStringList& arguments = {}) {
        camsim = std::make_unique<CamsimProcess>(arguments);
        ASSERT_NE(camsim->port(), 0) << qPrintable(camsim->error());
    }

    void get(Wendrel& client, const QString& path, int id, uint timeout = TIMEOUT_MS) {
        EXPECT_TRUE(client.Get(CamsimProcess::host(), path, camsim->port(), false, {}, {},
                               recorder.callback(id), timeout, {}));
    }

    std::unique_ptr<CamsimProcess> camsim;
    ReplyRecorder recorder;
};

class WendrelSchemeTest
    : public WendrelTest
    , public ::testing::WithParamInterface<const char*> {};

// User name and password answer the challenge of their own request only, in every operation.
TEST_P(WendrelSchemeTest, AnswersTheChallengeWithTheRightCredentialsOnly) {
    const QString scheme = QString::fromLatin1(GetParam());
    startCamsim({"--auth", scheme, "--user", USER, "--pass", PASSWORD});
    const QString host = CamsimProcess::host();
    const quint16 port = camsim->port();
    auto client = std::make_unique<Wendrel>();
    // One at a time, so that the camera logs them in order.
    client->Get(host, GETPARAM, port, false, USER, PASSWORD, recorder.callback(0), TIMEOUT_MS, {});
    ASSERT_TRUE(recorder.waitFor(1));
    client->Post(host, "camctrl_c0_idleaction_interval=60", "/cgi-bin/admin/setparam.cgi", port,
                 false, USER, PASSWORD, FORM, recorder.callback(1), TIMEOUT_MS);
    ASSERT_TRUE(recorder.waitFor(2));
    client->Get(host, RATIO, port, false, USER, "wrong", recorder.callback(2), TIMEOUT_MS, {});
    ASSERT_TRUE(recorder.waitFor(3));
    client->Get(host, RATIO, port, false, {}, {}, recorder.callback(3), TIMEOUT_MS, {});
    ASSERT_TRUE(recorder.waitFor(4));
    // Credentials written into a URL answer the challenge, but are not sent as written.
    client->Get("http://" + USER + ':' + QString::fromLatin1(QUrl::toPercentEncoding(PASSWORD)) +
                    '@' + host + ':' + QString::number(port) + RATIO,
                {}, {}, recorder.callback(4), TIMEOUT_MS);
    ASSERT_TRUE(recorder.waitFor(5));
    client->Post("http://" + host + ':' + QString::number(port) + CAMCTRL,
                 "ptztrack=setSmartTracking", USER, PASSWORD, FORM, recorder.callback(5),
                 TIMEOUT_MS, {});
    ASSERT_TRUE(recorder.waitFor(6));
    client->Put(host, "{}", "/things/1", port, false, USER, PASSWORD, "application/json",
                recorder.callback(6), TIMEOUT_MS);
    ASSERT_TRUE(recorder.waitFor(7));
    client->Delete(host, "id=1", "/things", port, false, USER, PASSWORD, FORM, recorder.callback(7),
                   TIMEOUT_MS);
    ASSERT_TRUE(recorder.waitFor(8));
    client.reset();

    EXPECT_NE(recorder.first(0).thread, QThread::currentThread());
    EXPECT_THAT(recorder.first(0).headers.toStdString(), HasSubstr("Content-Type: text/plain\r\n"));
    const bool open = scheme == "none";
    const std::string refused =
        open ? ZOOM : "AuthenticationRequiredError reached: 401 Unauthorized\n";
    EXPECT_EQ(recorder.said(),
              (Said{IDLE, "NoError reached: camctrl_c0_idleaction_interval='60'\r\n", refused,
                    refused, ZOOM, "NoError reached: ptztrack_type=smarttracking\r\n",
                    "ContentNotFoundError reached: no such endpoint: /things/1\n",
                    "ContentNotFoundError reached: no such endpoint: /things\n"}));
    const std::string ratio = "GET\t" + RATIO.toStdString() + '\t';
    std::vector<std::string> logged{"GET\t" + GETPARAM.toStdString() + '\t',
                                    "POST\t/cgi-bin/admin/setparam.cgi\t"
                                    "camctrl_c0_idleaction_interval=60"};
    if (open)
        logged.insert(logged.end(), {ratio, ratio});
    logged.insert(logged.end(),
                  {ratio, "POST\t" + CAMCTRL.toStdString() + "\tptztrack=setSmartTracking",
                   "PUT\t/things/1\t{}", "DELETE\t/things\tid=1"});
    EXPECT_EQ(camsim->logLines(), logged);
}

INSTANTIATE_TEST_SUITE_P(Schemes, WendrelSchemeTest, ::testing::Values("none", "basic", "digest"));

// The camera holds every answer back: deadlines end requests in their own order, and what is
// left when a client goes, even from its own callback, is cancelled; each ends exactly once.
TEST_F(WendrelTest, DeadlinesAndDestructionEndEachRequestOnce) {
    startCamsim({"--fault", "delay", "--fault-delay-ms", "10000"});
    auto client = std::make_unique<Wendrel>();
    QElapsedTimer elapsed;
    elapsed.start();
    get(*client, RATIO, 0, 450);
    get(*client, RATIO, 1, 150);
    get(*client, RATIO, 2, 300);
    get(*client, RATIO, 3, 0);
    ASSERT_TRUE(recorder.waitFor(3));
    EXPECT_GE(elapsed.elapsed(), 450);
    EXPECT_EQ(recorder.order(), (std::vector<int>{1, 2, 0}));
    EXPECT_EQ(recorder.said()[0], "TimeoutError reached");
    get(*client, RATIO, 4, 0);
    client.reset();

    auto* doomed = new Wendrel;
    get(*doomed, RATIO, 5, 0);
    const HttpReplyCallback record = recorder.callback(6);
    doomed->Get(CamsimProcess::host(), RATIO, camsim->port(), false, {}, {},
                [doomed, record](const auto&... reply) {
                    record(reply...);
                    delete doomed;
                },
                100, {});
    ASSERT_TRUE(recorder.waitFor(7));

    const std::string timeout = "TimeoutError";
    const std::string cancelled = "OperationCanceledError";
    EXPECT_EQ(recorder.said(false),
              (Said{timeout, timeout, timeout, cancelled, cancelled, cancelled, timeout}));
}

// More requests than one camera gets connections: the later ones, with shorter deadlines, end
// while still waiting for a connection, once each, and are never sent.
TEST_F(WendrelTest, QueuedRequestsExpireWithoutBeingSent) {
    startCamsim({"--fault", "delay", "--fault-delay-ms", "10000"});
    const int held = WendrelWorker::connectionsPerOrigin;
    const int requests = held + 24;
    {
        Wendrel client;
        for (int id = 0; id < held; ++id)
            get(client, RATIO, id, 1500);
        for (int id = held; id < requests; ++id)
            get(client, RATIO, id, 200);
        ASSERT_TRUE(recorder.waitFor(requests, 4000));
    }
    EXPECT_EQ(recorder.said(false), Said(requests, "TimeoutError"));
    EXPECT_LE(camsim->logLines().size(), size_t(held));
}

TEST_F(WendrelTest, CallsFromSeveralThreadsAreEachAnsweredOnce) {
    startCamsim();
    const int threads = 4;
    const int perThread = 25;
    {
        Wendrel client;
        // A callback that throws stops neither the client nor the process.
        client.Get(CamsimProcess::host(), RATIO, camsim->port(), false, {}, {},
                   [](const auto&...) { throw std::runtime_error("callback failure"); }, TIMEOUT_MS,
                   {});
        std::vector<std::thread> callers;
        for (int first = 0; first < threads * perThread; first += perThread) {
            callers.emplace_back([&, first] {
                for (int id = first; id < first + perThread; ++id)
                    get(client, RATIO + "&n=" + QString::number(id), id);
            });
        }
        for (std::thread& caller : callers)
            caller.join();
        ASSERT_TRUE(recorder.waitFor(threads * perThread, 10000));
    }

    std::vector<std::string> logged{"GET\t" + RATIO.toStdString() + '\t'};
    for (int id = 0; id < threads * perThread; ++id)
        logged.push_back("GET\t" + RATIO.toStdString() + "&n=" + std::to_string(id) + '\t');
    EXPECT_EQ(recorder.said(), Said(threads * perThread, ZOOM));
    EXPECT_THAT(camsim->logLines(), UnorderedElementsAreArray(logged));
}

TEST_F(WendrelTest, CertificatesAreVerifiedUnlessTrusted) {
    QTemporaryDir folder;
    const QString certificate = folder.filePath(QStringLiteral("cert.pem"));
    const QString key = folder.filePath(QStringLiteral("key.pem"));
    ASSERT_EQ(QProcess::execute("openssl",
                                {"req", "-x509", "-newkey", "ec", "-pkeyopt",
                                 "ec_paramgen_curve:prime256v1", "-nodes", "-days", "2", "-subj",
                                 "/CN=127.0.0.1", "-addext", "subjectAltName=IP:127.0.0.1",
                                 "-keyout", key, "-out", certificate}),
              0)
        << "openssl could not make a test certificate";
    startCamsim({"--tls-cert", certificate, "--tls-key", key});

    // Each client reads the environment as it is made.
    const std::pair<const char*, QString> environments[] = {{"WENDREL_TLS_INSECURE", "0"},
                                                            {"WENDREL_TLS_INSECURE", "yes"},
                                                            {"WENDREL_TLS_INSECURE", "1"},
                                                            {"WENDREL_CA_FILE", certificate}};
    for (int id = 0; id < 4; ++id) {
        qputenv(environments[id].first, environments[id].second.toLocal8Bit());
        Wendrel client;
        qunsetenv(environments[id].first);
        client.Get(CamsimProcess::host(), GETPARAM, camsim->port(), true, {}, {},
                   recorder.callback(id), TIMEOUT_MS, {});
        ASSERT_TRUE(recorder.waitFor(id + 1));
    }

    const std::string refused = "SslHandshakeFailedError unreached";
    EXPECT_EQ(recorder.said(), (Said{refused, refused, IDLE, IDLE}));
    EXPECT_EQ(camsim->logLines().size(), 2u);
}

// A pinned certificate is trusted as the identity of the camera that presents it, whatever name
// the camera was reached by, and vouches for nothing else; a CA file's certificate vouches for
// what it signed.
TEST_F(WendrelTest, APinnedCertificateIsTrustedAsItselfOnly) {
    QTemporaryDir folder;
    const auto path = [&folder](const char* name) { return folder.filePath(name); };
    const auto openssl = [](const QStringList& arguments) {
        return QProcess::execute("openssl", arguments) == 0;
    };
    // The camera's own self-signed certificate, named otherwise than the address used; and one
    // that its key signed for that address.
    ASSERT_TRUE(
        openssl({"req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1",
                 "-nodes", "-days", "2", "-subj", "/CN=camera-7", "-keyout", path("pinned.key"),
                 "-out", path("pinned.pem")}));
    ASSERT_TRUE(openssl({"req", "-new", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1",
                         "-nodes", "-subj", "/CN=127.0.0.1", "-keyout", path("issued.key"), "-out",
                         path("issued.csr")}));
    QFile extensions(path("issued.ext"));
    ASSERT_TRUE(extensions.open(QIODevice::WriteOnly) &&
                extensions.write("subjectAltName=IP:127.0.0.1\n") > 0);
    extensions.close();
    ASSERT_TRUE(openssl({"x509", "-req", "-in", path("issued.csr"), "-CA", path("pinned.pem"),
                         "-CAkey", path("pinned.key"), "-CAcreateserial", "-days", "2", "-extfile",
                         path("issued.ext"), "-out", path("issued.pem")}));
    const CamsimProcess pinnedCamera(
        {"--tls-cert", path("pinned.pem"), "--tls-key", path("pinned.key")});
    const CamsimProcess issuedCamera(
        {"--tls-cert", path("issued.pem"), "--tls-key", path("issued.key")});
    ASSERT_NE(pinnedCamera.port(), 0) << qPrintable(pinnedCamera.error());
    ASSERT_NE(issuedCamera.port(), 0) << qPrintable(issuedCamera.error());

    const struct {
        const CamsimProcess& camera;
        const char* pins;
        const char* caFile;
        const char* said;
    } rows[] = {
        {pinnedCamera, "pinned.pem", "", IDLE.c_str()},
        {issuedCamera, "pinned.pem", "", "SslHandshakeFailedError unreached"},
        {pinnedCamera, "", "", "SslHandshakeFailedError unreached"},
        {issuedCamera, "", "pinned.pem", IDLE.c_str()},
    };
    Said expected;
    int id = 0;
    for (const auto& row : rows) {
        WendrelSettings settings;
        settings.pinnedCertificatesFile = *row.pins ? path(row.pins) : QString();
        settings.caFile = *row.caFile ? path(row.caFile) : QString();
        Wendrel client(settings);
        client.Get(CamsimProcess::host(), GETPARAM, row.camera.port(), true, {}, {},
                   recorder.callback(id), TIMEOUT_MS, {});
        ASSERT_TRUE(recorder.waitFor(++id));
        expected.push_back(row.said);
    }
    EXPECT_EQ(recorder.said(), expected);
}

// With few descriptors to spare, many cameras one after another: idle connections to earlier
// cameras are closed to make room, so that every request succeeds.
TEST(WendrelLimitTest, ManyCamerasWithFewDescriptors) {
    // Every loopback address reaches it: each address is a camera of its own.
    QTcpServer server;
    ASSERT_TRUE(server.listen(QHostAddress::AnyIPv4, 0));
    QObject::connect(&server, &QTcpServer::newConnection, &server, [&server] {
        while (QTcpSocket* socket = server.nextPendingConnection()) {
            QObject::connect(socket, &QTcpSocket::readyRead, socket, [socket] {
                if (socket->readAll().contains("\r\n\r\n"))
                    socket->write("HTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nok");
            });
            QObject::connect(socket, &QTcpSocket::disconnected, socket, &QObject::deleteLater);
        }
    });
    QProcess probe;
    probe.start(BuildPaths::bin(QStringLiteral("wendrel-limit-probe")),
                {QString::number(server.serverPort()), QStringLiteral("1000")});
    ASSERT_TRUE(
        runEventLoopUntil([&probe] { return probe.state() == QProcess::NotRunning; }, 120000));
    EXPECT_EQ(probe.exitStatus(), QProcess::NormalExit);
    EXPECT_EQ(probe.exitCode(), 0) << probe.readAllStandardOutput().constData();
}

TEST_F(WendrelTest, UnreachableAddressesAreAnsweredOnceWithoutReachingAServer) {
    QTcpServer closed;
    ASSERT_TRUE(closed.listen(QHostAddress::LocalHost, 0));
    const quint16 port = closed.serverPort();
    closed.close();
    {
        Wendrel client;
        client.Get(CamsimProcess::host(), "/", port, false, {}, {}, recorder.callback(0),
                   TIMEOUT_MS, {});
        client.Get("ftp://127.0.0.1/x", {}, {}, recorder.callback(1), TIMEOUT_MS);
        client.Get({}, "/x", 0, false, {}, {}, recorder.callback(2), TIMEOUT_MS, {});
        ASSERT_TRUE(recorder.waitFor(3));
    }

    EXPECT_EQ(recorder.said(),
              (Said{"ConnectionRefusedError unreached", "ProtocolUnknownError unreached",
                    "HostNotFoundError unreached"}));
}

} // namespace
