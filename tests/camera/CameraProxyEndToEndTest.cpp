#include "BuildPaths.h"
#include "PluginQuenvarDefs.h"
#include "QtPrinters.h"
#include "Wendrel.h"
#include "camera/CameraProxy.h"

#include <QDeadlineTimer>
#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QRegularExpression>
#include <QTemporaryDir>
#include <QThread>

#include <gtest/gtest.h>

#include <condition_variable>
#include <memory>
#include <mutex>

namespace {

const QString USER = QStringLiteral("operator");
const QString PASS = QStringLiteral("p4ss:w&rd");
const QString CAMCTRL = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
const int DEADLINE_MS = 15000;
// The simulator logs a request before answering it; the slack covers a simulator that does not.
const int LOG_SLACK_MS = 2000;

// A completion callback's outcome, delivered on the client's thread.
class Completion {
public:
    void record(bool ok, const QVariant& value = QVariant()) {
        std::lock_guard<std::mutex> lock(mutex);
        ++count;
        success = ok;
        result = value;
        done.notify_all();
    }

    // True once the callback has been called, waiting up to the deadline.
    bool wait() {
        std::unique_lock<std::mutex> lock(mutex);
        return done.wait_for(lock, std::chrono::milliseconds(DEADLINE_MS),
                             [this] { return count > 0; });
    }

    int calls() {
        std::lock_guard<std::mutex> lock(mutex);
        return count;
    }

    bool succeeded() {
        std::lock_guard<std::mutex> lock(mutex);
        return success;
    }

    QVariant value() {
        std::lock_guard<std::mutex> lock(mutex);
        return result;
    }

private:
    std::mutex mutex;
    std::condition_variable done;
    int count = 0;
    bool success = false;
    QVariant result;
};

// One logged request: method, target as received, body.
struct LoggedRequest {
    QString method;
    QString target;
    QString body;

    bool operator==(const LoggedRequest& other) const {
        return method == other.method && target == other.target && body == other.body;
    }

    friend void PrintTo(const LoggedRequest& request, std::ostream* out) {
        *out << (request.method + QLatin1Char(' ') + request.target + QLatin1Char(' ') +
                 request.body)
                    .toStdString();
    }
};

// The simulated camera, with Digest authentication, on an ephemeral port.
class CameraSimulator {
public:
    ~CameraSimulator() {
        if (process.state() == QProcess::NotRunning)
            return;
        process.terminate();
        if (!process.waitForFinished(5000)) {
            process.kill();
            process.waitForFinished(5000);
        }
    }

    QString start() {
        if (!dir.isValid())
            return QStringLiteral("no temporary folder");
        logPath = dir.filePath(QStringLiteral("requests.log"));
        const QString program = BuildPaths::bin(QStringLiteral("quenvar-camsim"));
        process.start(program,
                      {QStringLiteral("--listen"), QStringLiteral("127.0.0.1:0"),
                       QStringLiteral("--auth"), QStringLiteral("digest"), QStringLiteral("--user"),
                       USER, QStringLiteral("--pass"), PASS, QStringLiteral("--log"), logPath});
        if (!process.waitForStarted(DEADLINE_MS))
            return QStringLiteral("cannot start %1: %2").arg(program, process.errorString());
        const QDeadlineTimer deadline(DEADLINE_MS);
        while (!process.canReadLine()) {
            if (deadline.hasExpired() || !process.waitForReadyRead(deadline.remainingTime()))
                return QStringLiteral("no listening line: %1")
                    .arg(QString::fromLocal8Bit(process.readAllStandardError()));
        }
        const QString line = QString::fromUtf8(process.readLine()).trimmed();
        static const QRegularExpression listening(
            QStringLiteral("^listening on http://127\\.0\\.0\\.1:(\\d+)$"));
        const QRegularExpressionMatch match = listening.match(line);
        if (!match.hasMatch())
            return QStringLiteral("unexpected first line: ") + line;
        port = match.captured(1).toUShort();
        return QString();
    }

    QVariantMap params(const QVariantMap& extra = QVariantMap()) const {
        QVariantMap params{{KEY_HOST, QStringLiteral("127.0.0.1")},
                           {KEY_PORT, port},
                           {KEY_USE_SSL, false},
                           {KEY_USER, USER},
                           {KEY_PASS, PASS}};
        params.insert(extra);
        return params;
    }

    // The camera's requests so far, without the simulator's own state queries; waits briefly
    // for `count` of them.
    QList<LoggedRequest> cameraRequests(int count) const {
        QList<LoggedRequest> requests;
        const QDeadlineTimer deadline(LOG_SLACK_MS);
        do {
            requests = readLog();
            if (requests.size() >= count)
                break;
            QThread::msleep(20);
        } while (!deadline.hasExpired());
        return requests;
    }

    QJsonObject state() const {
        Wendrel client;
        auto completion = std::make_shared<Completion>();
        client.Get(
            QStringLiteral("127.0.0.1"), QStringLiteral("/_sim/state"), port, false, USER, PASS,
            [completion](QNetworkReply::NetworkError outcome, const QByteArray&,
                         const QByteArray& body,
                         bool) { completion->record(outcome == QNetworkReply::NoError, body); },
            DEADLINE_MS, QStringList());
        if (!completion->wait() || !completion->succeeded())
            return QJsonObject();
        return QJsonDocument::fromJson(completion->value().toByteArray()).object();
    }

    quint16 port = 0;

private:
    QList<LoggedRequest> readLog() const {
        QFile file(logPath);
        QList<LoggedRequest> requests;
        if (!file.open(QIODevice::ReadOnly))
            return requests;
        const QList<QByteArray> lines = file.readAll().split('\n');
        for (const QByteArray& line : lines) {
            const QList<QByteArray> fields = line.split('\t');
            if (fields.size() != 3 || fields[1].startsWith("/_sim/"))
                continue;
            requests.append({QString::fromUtf8(fields[0]), QString::fromUtf8(fields[1]),
                             QString::fromUtf8(fields[2])});
        }
        return requests;
    }

    QTemporaryDir dir;
    QString logPath;
    QProcess process;
};

class CameraProxyEndToEndTest : public ::testing::Test {
protected:
    void SetUp() override {
        const QString failure = camera.start();
        ASSERT_TRUE(failure.isEmpty()) << failure.toStdString();
    }

    std::shared_ptr<Completion> run(const std::function<void(std::shared_ptr<Completion>)>& start) {
        auto completion = std::make_shared<Completion>();
        start(completion);
        EXPECT_TRUE(completion->wait()) << "no completion";
        return completion;
    }

    std::shared_ptr<Completion>
    plain(void (CameraProxy::*operation)(const QVariantMap&, const std::function<void(bool)>&),
          const QVariantMap& params) {
        return run([&](std::shared_ptr<Completion> completion) {
            (proxy.*operation)(params, [completion](bool ok) { completion->record(ok); });
        });
    }

    std::shared_ptr<Completion>
    withMap(void (CameraProxy::*operation)(const QVariantMap&,
                                           const std::function<void(bool, const QVariantMap&)>&),
            const QVariantMap& params) {
        return run([&](std::shared_ptr<Completion> completion) {
            (proxy.*operation)(params, [completion](bool ok, const QVariantMap& result) {
                completion->record(ok, result);
            });
        });
    }

    CameraSimulator camera;
    CameraProxy proxy;
};

TEST_F(CameraProxyEndToEndTest, StopReachesTheCamera) {
    const int before = camera.state().value(QStringLiteral("stopCount")).toInt();

    const auto stopped = plain(&CameraProxy::stopPTZMovement, camera.params());

    EXPECT_TRUE(stopped->succeeded());
    EXPECT_EQ(stopped->calls(), 1);
    EXPECT_EQ(camera.state().value(QStringLiteral("stopCount")).toInt(), before + 1);
    EXPECT_EQ(
        camera.cameraRequests(1),
        QList<LoggedRequest>({{"GET", CAMCTRL + "?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop", ""}}));
}

TEST_F(CameraProxyEndToEndTest, WrongPasswordFailsAndChangesNothing) {
    const int before = camera.state().value(QStringLiteral("stopCount")).toInt();

    const auto stopped = plain(&CameraProxy::stopPTZMovement, camera.params({{KEY_PASS, "wrong"}}));

    EXPECT_FALSE(stopped->succeeded());
    EXPECT_EQ(camera.state().value(QStringLiteral("stopCount")).toInt(), before);
}

TEST_F(CameraProxyEndToEndTest, AreaZoomCentresAndZooms) {
    const QJsonObject before = camera.state();
    ASSERT_EQ(before.value(QStringLiteral("zoom")).toDouble(), 1.0);
    ASSERT_EQ(before.value(QStringLiteral("maxratio")).toDouble(), 20.0);

    const auto zoomed = plain(&CameraProxy::areaZoom, camera.params({{KEY_ZOOM_CENTER_X, 320},
                                                                     {KEY_ZOOM_CENTER_Y, 240},
                                                                     {KEY_VIEW_CELL_WIDTH, 640},
                                                                     {KEY_VIEW_CELL_HEIGHT, 480},
                                                                     {KEY_RESOLUTION_WIDTH, 1920},
                                                                     {KEY_RESOLUTION_HEIGHT, 1080},
                                                                     {KEY_ZOOM_RATIO, 1.6}}));

    EXPECT_TRUE(zoomed->succeeded());
    EXPECT_EQ(zoomed->calls(), 1);
    const QJsonObject after = camera.state();
    EXPECT_EQ(after.value(QStringLiteral("zoom")).toDouble(), 1.6);
    const QJsonObject center = after.value(QStringLiteral("center")).toObject();
    EXPECT_EQ(center.value(QStringLiteral("x")).toInt(), 320);
    EXPECT_EQ(center.value(QStringLiteral("y")).toInt(), 240);
    EXPECT_EQ(center.value(QStringLiteral("videosize")).toString(), "640x480");
    EXPECT_EQ(center.value(QStringLiteral("resolution")).toString(), "1920x1080");
    EXPECT_EQ(
        camera.cameraRequests(3),
        QList<LoggedRequest>(
            {{"GET", CAMCTRL + "?getratio&getmaxratio", ""},
             {"GET", CAMCTRL + "?x=320&y=240&videosize=640x480&resolution=1920x1080&stretch=1", ""},
             {"GET", CAMCTRL + "?setptmode=nonblock&setratio=1.6", ""}}));
}

// The released proxy takes its client along; the zoom it started still reports exactly once.
TEST_F(CameraProxyEndToEndTest, ReleasingTheProxyMidZoomReportsOnce) {
    auto released = std::make_unique<CameraProxy>();
    auto completion = std::make_shared<Completion>();
    released->areaZoom(camera.params({{KEY_ZOOM_RATIO, 2}}),
                       [completion](bool ok) { completion->record(ok); });

    released.reset();

    ASSERT_TRUE(completion->wait());
    EXPECT_EQ(completion->calls(), 1);
}

TEST_F(CameraProxyEndToEndTest, IdleActionIsWrittenAndReadBack) {
    const auto written = plain(&CameraProxy::setPTZIdleAction,
                               camera.params({{KEY_ENABLED, 1}, {KEY_INTERVAL, 45}}));
    const auto read = withMap(&CameraProxy::getPTZIdleAction, camera.params());

    EXPECT_TRUE(written->succeeded());
    EXPECT_TRUE(read->succeeded());
    EXPECT_EQ(read->value().toMap(), QVariantMap({{KEY_ENABLED, QStringLiteral("1")},
                                                  {KEY_INTERVAL, QStringLiteral("45")}}));
    const QJsonObject state = camera.state();
    EXPECT_EQ(state.value(QStringLiteral("idleEnable")).toVariant().toString(), "1");
    EXPECT_EQ(state.value(QStringLiteral("idleType")).toString(), "objtrack");
    EXPECT_EQ(state.value(QStringLiteral("idleInterval")).toVariant().toString(), "45");
    EXPECT_EQ(
        camera.cameraRequests(2),
        QList<LoggedRequest>({{"POST", "/cgi-bin/admin/setparam.cgi",
                               "camctrl_c0_idleaction_enable=1&camctrl_c0_idleaction_type=objtrack"
                               "&camctrl_c0_idleaction_interval=45"},
                              {"GET", "/cgi-bin/admin/getparam.cgi?camctrl", ""}}));
}

TEST_F(CameraProxyEndToEndTest, TrackingTypeIsSwitchedAndReadBack) {
    const auto smart =
        plain(&CameraProxy::setPTZTrackingType, camera.params({{KEY_TYPE, "smarttracking"}}));
    const QString afterSmart = camera.state().value(QStringLiteral("trackingType")).toString();
    const auto read =
        withMap(&CameraProxy::getPTZTrackingType, camera.params({{KEY_NODE_ID, "node-1"}}));
    const auto automatic =
        plain(&CameraProxy::setPTZTrackingType, camera.params({{KEY_TYPE, "autotracking"}}));

    EXPECT_TRUE(smart->succeeded());
    EXPECT_EQ(afterSmart, "smarttracking");
    EXPECT_TRUE(read->succeeded());
    EXPECT_EQ(read->value().toMap(), QVariantMap({{KEY_TYPE, QStringLiteral("smarttracking")},
                                                  {KEY_NODE_ID, QStringLiteral("node-1")}}));
    EXPECT_TRUE(automatic->succeeded());
    EXPECT_EQ(camera.state().value(QStringLiteral("trackingType")).toString(), "autotracking");
    EXPECT_EQ(camera.cameraRequests(3),
              QList<LoggedRequest>({{"POST", CAMCTRL, "ptztrack=setSmartTracking"},
                                    {"GET", CAMCTRL + "?ptztrack=getCurrentType", ""},
                                    {"POST", CAMCTRL, "ptztrack=setAutoTracking"}}));
}

// The simulated camera's presets: Entrance and Parking Lot carry a rule, Lobby does not.
TEST_F(CameraProxyEndToEndTest, ListsPresetsAndGoesToThemByName) {
    const auto listed = run([&](std::shared_ptr<Completion> completion) {
        proxy.getSmartTrackingAdvPresetList(camera.params(),
                                            [completion](bool ok, QList<QString> names) {
                                                completion->record(ok, QStringList(names));
                                            });
    });
    EXPECT_TRUE(listed->succeeded());
    EXPECT_EQ(listed->value().toStringList(), QStringList({"Entrance", "Parking Lot"}));

    for (const QString name : {"Parking Lot", "a b&auto=stop"}) {
        const auto moved = run([&](std::shared_ptr<Completion> completion) {
            proxy.gotoSmartTrackingAdvPreset(
                camera.params({{KEY_PRESET_NAME, name}}),
                [completion](bool ok, const QVariant& answer) { completion->record(ok, answer); });
        });
        EXPECT_TRUE(moved->succeeded());
        EXPECT_EQ(moved->value().typeId(), QMetaType::QString);
        EXPECT_TRUE(moved->value().toString().contains(name))
            << moved->value().toString().toStdString();
        EXPECT_EQ(camera.state().value(QStringLiteral("lastPreset")).toString(), name);
    }
    // The name's "&auto=stop" stayed inside the name.
    EXPECT_EQ(camera.state().value(QStringLiteral("stopCount")).toInt(), 0);
    EXPECT_EQ(
        camera.cameraRequests(3),
        QList<LoggedRequest>({{"GET", "/VCA/PTZAdv/PresetWithRule", ""},
                              {"GET", CAMCTRL + "?ptztrack=track&name=Parking%20Lot", ""},
                              {"GET", CAMCTRL + "?ptztrack=track&name=a%20b%26auto%3Dstop", ""}}));
}

} // namespace
