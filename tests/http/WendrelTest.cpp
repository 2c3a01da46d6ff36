#include "Wendrel.h"

#include "CamsimProcess.h"
#include "ReplyRecorder.h"

#include <QElapsedTimer>
#include <QHostAddress>
#include <QProcess>
#include <QTcpServer>
#include <QTcpSocket>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <memory>
#include <ostream>
#include <stdexcept>
#include <thread>
#include <vector>

namespace {

const uint TIMEOUT_MS = 5000;
const QString USER = QStringLiteral("operator");
const QString PASSWORD = QStringLiteral("s3cret:pa ss");
const QString FORM = QStringLiteral("application/x-www-form-urlencoded");
const QByteArray IDLE_FORM = "camctrl_c0_idleaction_enable=1&camctrl_c0_idleaction_type=objtrack&"
                             "camctrl_c0_idleaction_interval=60";

class WendrelTest : public ::testing::Test {
protected:
    void startCamsim(const QStringList& arguments = {}) {
        camsim = std::make_unique<CamsimProcess>(arguments);
        ASSERT_NE(camsim->port(), 0) << qPrintable(camsim->error());
    }

    QStringList authArguments(const char* scheme) const {
        return {QStringLiteral("--auth"), QString::fromLatin1(scheme),
                QStringLiteral("--user"), USER,
                QStringLiteral("--pass"), PASSWORD};
    }

    bool get(Wendrel& client, const QString& path, int id = 0, uint timeout = TIMEOUT_MS,
             const QString& user = {}, const QString& password = {}) {
        return client.Get(CamsimProcess::host(), path, camsim->port(), false, user, password,
                          recorder.callback(id), timeout, {});
    }

    std::unique_ptr<CamsimProcess> camsim;
    ReplyRecorder recorder;
};

struct AuthCase {
    const char* scheme;
    bool post;
};

class WendrelSchemeTest
    : public WendrelTest
    , public ::testing::WithParamInterface<AuthCase> {};

class WendrelRejectionTest
    : public WendrelTest
    , public ::testing::WithParamInterface<const char*> {};

struct StatusCase {
    int status;
    QNetworkReply::NetworkError error;
};

class WendrelStatusTest
    : public WendrelTest
    , public ::testing::WithParamInterface<StatusCase> {};

struct SizeCase {
    qint64 bytes;
    QNetworkReply::NetworkError error;
};

class WendrelBodySizeTest
    : public WendrelTest
    , public ::testing::WithParamInterface<SizeCase> {};

// A TLS camera with a certificate made for this run.
class WendrelTlsTest : public WendrelTest {
protected:
    static void SetUpTestSuite() {
        certificates = std::make_unique<QTemporaryDir>();
        QProcess openssl;
        openssl.setStandardOutputFile(QProcess::nullDevice());
        openssl.setStandardErrorFile(QProcess::nullDevice());
        openssl.start(QStringLiteral("openssl"),
                      {QStringLiteral("req"), QStringLiteral("-x509"), QStringLiteral("-newkey"),
                       QStringLiteral("ec"), QStringLiteral("-pkeyopt"),
                       QStringLiteral("ec_paramgen_curve:prime256v1"), QStringLiteral("-nodes"),
                       QStringLiteral("-days"), QStringLiteral("2"), QStringLiteral("-subj"),
                       QStringLiteral("/CN=127.0.0.1"), QStringLiteral("-addext"),
                       QStringLiteral("subjectAltName=IP:127.0.0.1"), QStringLiteral("-keyout"),
                       keyFile(), QStringLiteral("-out"), certificateFile()});
        const bool made = openssl.waitForFinished(static_cast<int>(TIMEOUT_MS)) &&
                          openssl.exitStatus() == QProcess::NormalExit && openssl.exitCode() == 0;
        ASSERT_TRUE(made) << "openssl could not make a test certificate";
    }

    static void TearDownTestSuite() { certificates.reset(); }

    static QString certificateFile() { return certificates->filePath(QStringLiteral("cert.pem")); }
    static QString keyFile() { return certificates->filePath(QStringLiteral("key.pem")); }

    void SetUp() override {
        startCamsim({QStringLiteral("--tls-cert"), certificateFile(), QStringLiteral("--tls-key"),
                     keyFile()});
    }

    void getOverTls(Wendrel& client) {
        client.Get(CamsimProcess::host(), QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"),
                   camsim->port(), true, {}, {}, recorder.callback(), TIMEOUT_MS, {});
        ASSERT_TRUE(recorder.waitFor(1));
    }

    static std::unique_ptr<QTemporaryDir> certificates;
};

std::unique_ptr<QTemporaryDir> WendrelTlsTest::certificates;

// Takes one request as raw bytes and never answers.
class RequestCapture {
public:
    RequestCapture() { server.listen(QHostAddress::LocalHost, 0); }
    quint16 port() const { return server.serverPort(); }

    QByteArray take(int expectedBodySize) {
        if (!server.waitForNewConnection(static_cast<int>(TIMEOUT_MS)))
            return {};
        socket.reset(server.nextPendingConnection());
        QByteArray request;
        while (!request.contains("\r\n\r\n") ||
               request.size() - request.indexOf("\r\n\r\n") - 4 < expectedBodySize) {
            if (!socket->waitForReadyRead(static_cast<int>(TIMEOUT_MS)))
                break;
            request += socket->readAll();
        }
        return request;
    }

private:
    QTcpServer server;
    std::unique_ptr<QTcpSocket> socket;
};

struct OutgoingCase {
    const char* name;
    std::function<void(Wendrel&, quint16 port, HttpReplyCallback)> send;
    std::vector<QByteArray> present;
    std::vector<QByteArray> absent;
    int bodySize;
};

void PrintTo(const OutgoingCase& c, std::ostream* out) {
    *out << c.name;
}

class WendrelOutgoingTest : public ::testing::TestWithParam<OutgoingCase> {};

} // namespace

TEST_P(WendrelSchemeTest, RequestWithTheRightCredentialsSucceeds) {
    const AuthCase& c = GetParam();
    startCamsim(authArguments(c.scheme));
    Wendrel client;
    if (c.post)
        client.Post(CamsimProcess::host(), IDLE_FORM, QStringLiteral("/cgi-bin/admin/setparam.cgi"),
                    camsim->port(), false, USER, PASSWORD, FORM, recorder.callback(), TIMEOUT_MS);
    else
        get(client, QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"), 0, TIMEOUT_MS, USER,
            PASSWORD);
    ASSERT_TRUE(recorder.waitFor(1));

    const ReplyRecorder::Reply reply = recorder.reply();
    EXPECT_EQ(reply.error, QNetworkReply::NoError);
    EXPECT_TRUE(reply.reachedServer);
    EXPECT_NE(reply.thread, QThread::currentThread());
    EXPECT_TRUE(reply.headers.contains("Content-Type: text/plain\r\n")) << reply.headers.data();
    if (c.post) {
        EXPECT_TRUE(reply.body.contains("camctrl_c0_idleaction_interval='60'"));
        EXPECT_EQ(camsim->state().value("idleInterval").toString(), QStringLiteral("60"));
        EXPECT_EQ(camsim->logLines(), QStringList{QStringLiteral("POST\t/cgi-bin/admin/"
                                                                 "setparam.cgi\t") +
                                                  QString::fromLatin1(IDLE_FORM)});
    } else {
        EXPECT_TRUE(reply.body.contains("camctrl_c0_idleaction_enable='0'"));
        EXPECT_EQ(camsim->logLines(),
                  QStringList{QStringLiteral("GET\t/cgi-bin/admin/getparam.cgi?camctrl\t")});
    }
    EXPECT_EQ(recorder.calls(), 1);
}

INSTANTIATE_TEST_SUITE_P(Schemes, WendrelSchemeTest,
                         ::testing::Values(AuthCase{"none", false}, AuthCase{"none", true},
                                           AuthCase{"basic", false}, AuthCase{"basic", true},
                                           AuthCase{"digest", false}, AuthCase{"digest", true}));

TEST_P(WendrelRejectionTest, WrongPasswordEndsWithAuthenticationRequiredOnce) {
    startCamsim(authArguments(GetParam()));
    auto client = std::make_unique<Wendrel>();
    get(*client, QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"), 0, TIMEOUT_MS, USER,
        QStringLiteral("wrong"));
    ASSERT_TRUE(recorder.waitFor(1));
    client.reset();

    EXPECT_EQ(recorder.reply().error, QNetworkReply::AuthenticationRequiredError);
    EXPECT_TRUE(recorder.reply().reachedServer);
    EXPECT_EQ(recorder.calls(), 1);
    EXPECT_TRUE(camsim->logLines().isEmpty());
}

TEST_P(WendrelRejectionTest, CredentialsAreNotCarriedOverToTheNextRequest) {
    startCamsim(authArguments(GetParam()));
    Wendrel client;
    const QString path = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio");
    get(client, path, 0, TIMEOUT_MS, USER, PASSWORD);
    ASSERT_TRUE(recorder.waitFor(1));
    get(client, path, 1, TIMEOUT_MS, USER, QStringLiteral("wrong"));
    ASSERT_TRUE(recorder.waitFor(2));
    get(client, path, 2);
    ASSERT_TRUE(recorder.waitFor(3));

    EXPECT_EQ(recorder.reply(0).error, QNetworkReply::NoError);
    EXPECT_EQ(recorder.reply(1).error, QNetworkReply::AuthenticationRequiredError);
    EXPECT_EQ(recorder.reply(2).error, QNetworkReply::AuthenticationRequiredError);
    EXPECT_EQ(camsim->logLines().size(), 1);
}

INSTANTIATE_TEST_SUITE_P(Schemes, WendrelRejectionTest, ::testing::Values("basic", "digest"));

TEST_F(WendrelTest, CredentialsInAFullUrlAnswerTheChallengeButAreNotSent) {
    startCamsim(authArguments("basic"));
    Wendrel client;
    const QString url = QStringLiteral("http://") + USER + QLatin1Char(':') +
                        QString::fromLatin1(QUrl::toPercentEncoding(PASSWORD)) + QLatin1Char('@') +
                        CamsimProcess::host() + QLatin1Char(':') + QString::number(camsim->port()) +
                        QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio");
    client.Get(url, {}, {}, recorder.callback(), TIMEOUT_MS);
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, QNetworkReply::NoError);
    EXPECT_EQ(camsim->logLines(),
              QStringList{QStringLiteral("GET\t/cgi-bin/camctrl/camctrl.cgi?getratio\t")});
}

TEST_P(WendrelStatusTest, ErrorStatusMapsToQtsErrorWithTheBody) {
    const StatusCase& c = GetParam();
    startCamsim({QStringLiteral("--fault"), QStringLiteral("status"),
                 QStringLiteral("--fault-status"), QString::number(c.status)});
    Wendrel client;
    get(client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"));
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, c.error);
    EXPECT_EQ(recorder.reply().body, "simulated status " + QByteArray::number(c.status) + "\n");
    EXPECT_TRUE(recorder.reply().reachedServer);
    EXPECT_EQ(recorder.calls(), 1);
}

INSTANTIATE_TEST_SUITE_P(Statuses, WendrelStatusTest,
                         ::testing::Values(StatusCase{404, QNetworkReply::ContentNotFoundError},
                                           StatusCase{500, QNetworkReply::InternalServerError},
                                           StatusCase{403, QNetworkReply::ContentAccessDenied},
                                           StatusCase{503,
                                                      QNetworkReply::ServiceUnavailableError}));

TEST_F(WendrelTest, UnknownPathIsContentNotFoundWithTheBody) {
    startCamsim();
    Wendrel client;
    get(client, QStringLiteral("/no/such/thing"));
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, QNetworkReply::ContentNotFoundError);
    EXPECT_EQ(recorder.reply().body, "no such endpoint: /no/such/thing\n");
}

TEST_F(WendrelTest, PathWithQueryGoesOutAsAlreadyEncoded) {
    startCamsim();
    Wendrel client;
    get(client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?ptztrack=track&name=A%26B%3DC%25D E"));
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, QNetworkReply::NoError);
    EXPECT_EQ(camsim->logLines(),
              QStringList{QStringLiteral(
                  "GET\t/cgi-bin/camctrl/camctrl.cgi?ptztrack=track&name=A%26B%3DC%25D%20E\t")});
    EXPECT_EQ(camsim->state().value("lastPreset").toString(), QStringLiteral("A&B=C%D E"));
}

TEST_F(WendrelTlsTest, SelfSignedCertificateFailsByDefault) {
    Wendrel client{WendrelTlsSettings{}};
    getOverTls(client);
    EXPECT_EQ(recorder.reply().error, QNetworkReply::SslHandshakeFailedError);
    EXPECT_FALSE(recorder.reply().reachedServer);
    EXPECT_TRUE(camsim->logLines().isEmpty());
}

TEST_F(WendrelTlsTest, CertificateTrustedThroughTheEnvironmentIsAccepted) {
    qputenv("WENDREL_CA_FILE", certificateFile().toLocal8Bit());
    Wendrel client;
    qunsetenv("WENDREL_CA_FILE");
    getOverTls(client);
    EXPECT_EQ(recorder.reply().error, QNetworkReply::NoError);
    EXPECT_TRUE(recorder.reply().body.contains("camctrl_c0_idleaction_type='objtrack'"));
}

TEST_F(WendrelTlsTest, CertificateTrustedThroughTheSettingsIsAccepted) {
    WendrelTlsSettings settings;
    settings.caFile = certificateFile();
    Wendrel client(settings);
    getOverTls(client);
    EXPECT_EQ(recorder.reply().error, QNetworkReply::NoError);
}

TEST_F(WendrelTlsTest, InsecureSettingSkipsVerification) {
    WendrelTlsSettings settings;
    settings.insecure = true;
    Wendrel client(settings);
    getOverTls(client);
    EXPECT_EQ(recorder.reply().error, QNetworkReply::NoError);
}

TEST(WendrelTlsSettingsTest, InsecureOnlyForTheValueOne) {
    for (const char* value : {"1", "0", "yes", ""}) {
        qputenv("WENDREL_TLS_INSECURE", value);
        EXPECT_EQ(WendrelTlsSettings::fromEnvironment().insecure, QByteArray(value) == "1")
            << value;
    }
    qunsetenv("WENDREL_TLS_INSECURE");
}

TEST_F(WendrelTest, DeadlineEndsTheRequestOnceWithTimeout) {
    startCamsim({QStringLiteral("--fault"), QStringLiteral("delay"),
                 QStringLiteral("--fault-delay-ms"), QStringLiteral("3000")});
    auto client = std::make_unique<Wendrel>();
    QElapsedTimer elapsed;
    elapsed.start();
    get(*client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"), 0, 300);
    ASSERT_TRUE(recorder.waitFor(1, 2000));
    EXPECT_GE(elapsed.elapsed(), 300);
    EXPECT_EQ(recorder.reply().error, QNetworkReply::TimeoutError);
    EXPECT_TRUE(recorder.reply().reachedServer);
    client.reset();
    EXPECT_EQ(recorder.calls(), 1);
}

TEST_F(WendrelTest, DeadlinesExpireInTheirOwnOrder) {
    startCamsim({QStringLiteral("--fault"), QStringLiteral("delay"),
                 QStringLiteral("--fault-delay-ms"), QStringLiteral("3000")});
    Wendrel client;
    const QString path = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio");
    get(client, path, 0, 450);
    get(client, path, 1, 150);
    get(client, path, 2, 300);
    get(client, path, 3, 0); // no deadline: waits for the answer
    ASSERT_TRUE(recorder.waitFor(3, 2000));
    EXPECT_EQ(recorder.order(), (std::vector<int>{1, 2, 0}));
    for (int id : {0, 1, 2})
        EXPECT_EQ(recorder.reply(id).error, QNetworkReply::TimeoutError) << id;
    EXPECT_EQ(recorder.calls(3), 0);
}

TEST_P(WendrelBodySizeTest, BodiesAreCappedAtEightMebibytes) {
    const SizeCase& c = GetParam();
    startCamsim();
    ASSERT_TRUE(camsim->setFault("mode=oversize&bytes=" + QByteArray::number(c.bytes)));
    Wendrel client;
    get(client, QStringLiteral("/VCA/PTZAdv/PresetWithRule"));
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, c.error);
    EXPECT_EQ(recorder.reply().body.size(), c.error == QNetworkReply::NoError ? c.bytes : 0);
    EXPECT_EQ(recorder.calls(), 1);
}

INSTANTIATE_TEST_SUITE_P(Sizes, WendrelBodySizeTest,
                         ::testing::Values(SizeCase{8 << 20, QNetworkReply::NoError},
                                           SizeCase{(8 << 20) + 1,
                                                    QNetworkReply::UnknownContentError}));

TEST_F(WendrelTest, ConnectionClosedMidAnswerIsReportedOnce) {
    startCamsim({QStringLiteral("--fault"), QStringLiteral("close")});
    Wendrel client;
    get(client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"));
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, QNetworkReply::RemoteHostClosedError);
    EXPECT_TRUE(recorder.reply().reachedServer);
    EXPECT_EQ(recorder.calls(), 1);
}

TEST_F(WendrelTest, RefusedConnectionNeverReachedTheServer) {
    QTcpServer closed;
    ASSERT_TRUE(closed.listen(QHostAddress::LocalHost, 0));
    const quint16 port = closed.serverPort();
    closed.close();
    Wendrel client;
    client.Get(CamsimProcess::host(), QStringLiteral("/"), port, false, {}, {}, recorder.callback(),
               TIMEOUT_MS, {});
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, QNetworkReply::ConnectionRefusedError);
    EXPECT_FALSE(recorder.reply().reachedServer);
    EXPECT_EQ(recorder.calls(), 1);
}

TEST_F(WendrelTest, UnservedAddressesAreAnsweredWithoutSending) {
    Wendrel client;
    client.Get(QStringLiteral("file:///etc/hostname"), {}, {}, recorder.callback(0), TIMEOUT_MS);
    client.Get(QStringLiteral("ftp://127.0.0.1/x"), {}, {}, recorder.callback(1), TIMEOUT_MS);
    client.Get(QString(), QStringLiteral("/x"), 0, false, {}, {}, recorder.callback(2), TIMEOUT_MS,
               {});
    ASSERT_TRUE(recorder.waitFor(3));
    EXPECT_EQ(recorder.reply(0).error, QNetworkReply::HostNotFoundError);
    EXPECT_EQ(recorder.reply(1).error, QNetworkReply::ProtocolUnknownError);
    EXPECT_EQ(recorder.reply(2).error, QNetworkReply::HostNotFoundError);
}

TEST_F(WendrelTest, CallsFromSeveralThreadsAreEachAnsweredOnce) {
    startCamsim();
    Wendrel client;
    const int threads = 4;
    const int perThread = 25;
    std::atomic<int> accepted{0};
    std::vector<std::thread> callers;
    for (int t = 0; t < threads; ++t) {
        callers.emplace_back([&, t] {
            for (int i = 0; i < perThread; ++i) {
                const int id = t * perThread + i;
                if (get(client,
                        QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio&n=%1").arg(id), id))
                    ++accepted;
            }
        });
    }
    for (std::thread& caller : callers)
        caller.join();
    EXPECT_EQ(accepted, threads * perThread);
    ASSERT_TRUE(recorder.waitFor(threads * perThread, 10000));
    for (int id = 0; id < threads * perThread; ++id) {
        EXPECT_EQ(recorder.calls(id), 1) << id;
        EXPECT_EQ(recorder.reply(id).error, QNetworkReply::NoError) << id;
        EXPECT_TRUE(recorder.reply(id).body.contains("zoom=1")) << id;
    }
    EXPECT_EQ(camsim->logLines().size(), threads * perThread);
}

TEST_F(WendrelTest, DestructionAnswersRequestsInFlightWithOperationCanceled) {
    startCamsim({QStringLiteral("--fault"), QStringLiteral("delay"),
                 QStringLiteral("--fault-delay-ms"), QStringLiteral("10000")});
    auto client = std::make_unique<Wendrel>();
    const int requests = 10;
    for (int id = 0; id < requests; ++id)
        get(*client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"), id, 0);
    ASSERT_TRUE(camsim->waitForLogLines(1));
    client.reset();

    EXPECT_EQ(recorder.answered(), requests);
    for (int id = 0; id < requests; ++id) {
        EXPECT_EQ(recorder.calls(id), 1) << id;
        EXPECT_EQ(recorder.reply(id).error, QNetworkReply::OperationCanceledError) << id;
    }
}

TEST_F(WendrelTest, DestructionAnswersRequestsStillQueued) {
    startCamsim();
    auto client = std::make_unique<Wendrel>();
    for (int id = 0; id < 10; ++id)
        get(*client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"), id);
    client.reset();
    EXPECT_EQ(recorder.answered(), 10);
    for (int id = 0; id < 10; ++id)
        EXPECT_EQ(recorder.calls(id), 1) << id;
}

TEST_F(WendrelTest, ClientDestroyedInItsOwnCallbackAnswersTheRest) {
    startCamsim();
    RequestCapture silent;
    auto* client = new Wendrel;
    client->Get(CamsimProcess::host(), QStringLiteral("/"), silent.port(), false, {}, {},
                recorder.callback(1), 0, {});
    const HttpReplyCallback record = recorder.callback(0);
    client->Get(CamsimProcess::host(), QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"),
                camsim->port(), false, {}, {},
                [client, record](QNetworkReply::NetworkError error, const QByteArray& headers,
                                 const QByteArray& body, bool reachedServer) {
                    record(error, headers, body, reachedServer);
                    delete client;
                },
                TIMEOUT_MS, {});
    ASSERT_TRUE(recorder.waitFor(2));
    EXPECT_EQ(recorder.reply(0).error, QNetworkReply::NoError);
    EXPECT_EQ(recorder.reply(1).error, QNetworkReply::OperationCanceledError);
    EXPECT_EQ(recorder.calls(0), 1);
    EXPECT_EQ(recorder.calls(1), 1);
}

TEST_F(WendrelTest, ThrowingCallbackDoesNotStopTheClient) {
    startCamsim();
    Wendrel client;
    client.Get(CamsimProcess::host(), QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"),
               camsim->port(), false, {}, {},
               [](QNetworkReply::NetworkError, const QByteArray&, const QByteArray&, bool) {
                   throw std::runtime_error("callback failure");
               },
               TIMEOUT_MS, {});
    get(client, QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio"));
    ASSERT_TRUE(recorder.waitFor(1));
    EXPECT_EQ(recorder.reply().error, QNetworkReply::NoError);
}

TEST_P(WendrelOutgoingTest, SendsWhatTheOperationDescribes) {
    const OutgoingCase& c = GetParam();
    RequestCapture capture;
    ReplyRecorder recorder;
    auto client = std::make_unique<Wendrel>();
    c.send(*client, capture.port(), recorder.callback());
    const QByteArray request = capture.take(c.bodySize);
    for (const QByteArray& text : c.present)
        EXPECT_TRUE(request.contains(text)) << text.data() << " not in\n" << request.data();
    for (const QByteArray& text : c.absent)
        EXPECT_FALSE(request.contains(text)) << text.data() << " in\n" << request.data();
    client.reset();
    EXPECT_EQ(recorder.reply().error, QNetworkReply::OperationCanceledError);
}

INSTANTIATE_TEST_SUITE_P(
    Operations, WendrelOutgoingTest,
    ::testing::Values(
        OutgoingCase{"GetByHost",
                     [](Wendrel& client, quint16 port, HttpReplyCallback callback) {
                         client.Get(QStringLiteral("127.0.0.1"), QStringLiteral("/a.cgi?b=%26"),
                                    port, false, USER, PASSWORD, std::move(callback), TIMEOUT_MS,
                                    {QStringLiteral("X-Probe: one")});
                     },
                     {"GET /a.cgi?b=%26 HTTP/1.1\r\n", "X-Probe: one\r\n"},
                     // Credentials only ever answer a challenge.
                     {"Authorization", "operator"},
                     0},
        OutgoingCase{"GetByUrl",
                     [](Wendrel& client, quint16 port, HttpReplyCallback callback) {
                         client.Get(QStringLiteral("http://127.0.0.1:%1/u?v=%3D").arg(port), {}, {},
                                    std::move(callback), TIMEOUT_MS);
                     },
                     {"GET /u?v=%3D HTTP/1.1\r\n"},
                     {},
                     0},
        OutgoingCase{"PostByUrl",
                     [](Wendrel& client, quint16 port, HttpReplyCallback callback) {
                         client.Post(QStringLiteral("http://127.0.0.1:%1/p").arg(port), "x=1", {},
                                     {}, QStringLiteral("text/plain"), std::move(callback),
                                     TIMEOUT_MS, {QStringLiteral("X-Probe: two")});
                     },
                     {"POST /p HTTP/1.1\r\n", "Content-Type: text/plain\r\n", "X-Probe: two\r\n",
                      "\r\n\r\nx=1"},
                     {},
                     3},
        OutgoingCase{"PostWithOAuth",
                     [](Wendrel& client, quint16 port, HttpReplyCallback callback) {
                         client.PostWithOAuth(QStringLiteral("127.0.0.1"), "a=1",
                                              QStringLiteral("/token"), port, false, USER,
                                              QStringLiteral("t0ken"), FORM, std::move(callback),
                                              TIMEOUT_MS);
                     },
                     {"POST /token HTTP/1.1\r\n", "Authorization: Bearer t0ken\r\n",
                      "Content-Type: application/x-www-form-urlencoded\r\n", "\r\n\r\na=1"},
                     {"operator"},
                     3},
        OutgoingCase{
            "Put",
            [](Wendrel& client, quint16 port, HttpReplyCallback callback) {
                client.Put(QStringLiteral("127.0.0.1"), "{}", QStringLiteral("/things/1"), port,
                           false, {}, {}, QStringLiteral("application/json"), std::move(callback),
                           TIMEOUT_MS);
            },
            {"PUT /things/1 HTTP/1.1\r\n", "Content-Type: application/json\r\n", "\r\n\r\n{}"},
            {},
            2},
        OutgoingCase{"Delete",
                     [](Wendrel& client, quint16 port, HttpReplyCallback callback) {
                         client.Delete(QStringLiteral("127.0.0.1"), "id=1",
                                       QStringLiteral("/things"), port, false, {}, {}, FORM,
                                       std::move(callback), TIMEOUT_MS);
                     },
                     {"DELETE /things HTTP/1.1\r\n", "\r\n\r\nid=1"},
                     {},
                     4}),
    [](const ::testing::TestParamInfo<OutgoingCase>& info) {
        return std::string(info.param.name);
    });
