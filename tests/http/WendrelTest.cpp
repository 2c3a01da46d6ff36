#include "Wendrel.h"

#include "CamsimProcess.h"
#include "ReplyRecorder.h"
#include "TestCertificate.h"
#include "WendrelWorker.h"

#include <QElapsedTimer>
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

// Each client reads the environment as it is made. A pinned certificate is trusted as the
// identity of the camera that presents it, whatever name the camera was reached by, and vouches
// for nothing else; a CA file's certificate vouches for what it signed.
TEST_F(WendrelTest, CertificatesAreVerifiedUnlessTrusted) {
    QTemporaryDir folder;
    ASSERT_TRUE(makeTestCertificate(folder.path(), "camera-7") &&
                makeTestCertificate(folder.path(), "issued", "camera-7"));
    const auto serving = [&folder](const QString& name) {
        return QStringList{"--tls-cert", folder.filePath(name + ".pem"), "--tls-key",
                           folder.filePath(name + ".key")};
    };
    const CamsimProcess selfSigned(serving("camera-7"));
    const CamsimProcess issued(serving("issued"));
    ASSERT_TRUE(selfSigned.port() && issued.port())
        << qPrintable(selfSigned.error() + issued.error());

    const QString pinned = folder.filePath("camera-7.pem");
    const struct {
        const char* variable;
        QString value;
        const CamsimProcess& camera;
        bool trusted;
    } rows[] = {
        {"WENDREL_TLS_INSECURE", "0", selfSigned, false},
        {"WENDREL_TLS_INSECURE", "yes", selfSigned, false},
        {"WENDREL_TLS_INSECURE", "1", selfSigned, true},
        {"WENDREL_PINNED_CERTS", pinned, selfSigned, true},
        {"WENDREL_PINNED_CERTS", pinned, issued, false},
        {"WENDREL_CA_FILE", pinned, issued, true},
    };
    Said expected;
    for (const auto& row : rows) {
        qputenv(row.variable, row.value.toLocal8Bit());
        Wendrel client;
        qunsetenv(row.variable);
        client.Get(CamsimProcess::host(), GETPARAM, row.camera.port(), true, {}, {},
                   recorder.callback(int(expected.size())), TIMEOUT_MS, {});
        expected.push_back(row.trusted ? IDLE : "SslHandshakeFailedError unreached");
        ASSERT_TRUE(recorder.waitFor(int(expected.size())));
    }
    EXPECT_EQ(recorder.said(), expected);
    EXPECT_EQ(selfSigned.logLines().size() + issued.logLines().size(), 3u);
}

} // namespace
