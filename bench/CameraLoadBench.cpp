// CameraProxy::stopPTZMovement through the real Wendrel against cameras on loopback, with a fixed
// number of operations in flight at all times. Prints one line of JSON: completed operations per
// second, latency percentiles and failures. With --qt-only, the same GETs go straight through one
// QNetworkAccessManager instead, to show what Qt's own HTTP client manages.
//
//   quenvar-bench-camera --ports 8001[,8002...] [--in-flight 64] [--count 20000] [--warmup 2000]
//                        [--qt-only]
#include "PluginQuenvarDefs.h"
#include "camera/CameraProxy.h"

#include <QCommandLineParser>
#include <QCoreApplication>
#include <QEventLoop>
#include <QJsonDocument>
#include <QJsonObject>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QTimer>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <functional>
#include <memory>
#include <mutex>
#include <sys/resource.h>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;
// Starts one operation on the camera of params; calls done once, with its success.
using Operation = std::function<void(const QVariantMap& params, std::function<void(bool)> done)>;

const QString STOP_PATH =
    QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop");

// Keeps inFlight operations going until count have completed, starting each new one from the
// callback of the one that ended. Callbacks may arrive on another thread (Wendrel's worker) and
// share the run's state, which outlives a run that gave up early.
class LoadRun {
public:
    LoadRun(const Operation& operation, const QList<QVariantMap>& cameras, int inFlight, int count)
        : state(std::make_shared<State>(operation, cameras, count))
        , inFlight(inFlight) {}

    // Returns once every operation has completed, or false when limitMs passed first; no new
    // operation starts after it returns.
    bool run(int limitMs) {
        QEventLoop loop;
        QTimer::singleShot(limitMs, &loop, &QEventLoop::quit);
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            state->loop = &loop;
            state->began = Clock::now();
        }
        for (int i = 0; i < std::min(inFlight, state->count); ++i)
            startNext(state);
        loop.exec();
        std::lock_guard<std::mutex> lock(state->mutex);
        state->loop = nullptr;
        state->stopped = true;
        return state->completed == state->count;
    }

    QJsonObject report() const {
        std::lock_guard<std::mutex> lock(state->mutex);
        const double seconds = std::chrono::duration<double>(state->ended - state->began).count();
        std::vector<double>& latencies = state->latencies;
        std::sort(latencies.begin(), latencies.end());
        const auto percentile = [&latencies](double fraction) {
            if (latencies.empty())
                return 0.0;
            return latencies[static_cast<size_t>(fraction *
                                                 static_cast<double>(latencies.size() - 1))];
        };
        return QJsonObject{{"ops", state->completed},
                           {"failures", state->failures},
                           {"seconds", seconds},
                           {"opsPerSecond", seconds > 0 ? state->completed / seconds : 0.0},
                           {"p50Ms", percentile(0.50)},
                           {"p99Ms", percentile(0.99)}};
    }

private:
    struct State {
        State(const Operation& operation, const QList<QVariantMap>& cameras, int count)
            : operation(operation)
            , cameras(cameras)
            , count(count) {
            latencies.reserve(static_cast<size_t>(count));
        }

        const Operation operation;
        const QList<QVariantMap> cameras;
        const int count;
        std::mutex mutex;
        QEventLoop* loop = nullptr;
        bool stopped = false;
        int started = 0;
        int completed = 0;
        int failures = 0;
        Clock::time_point began;
        Clock::time_point ended;
        std::vector<double> latencies;
    };

    static void startNext(const std::shared_ptr<State>& state) {
        QVariantMap params;
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            if (state->stopped || state->started == state->count)
                return;
            params = state->cameras.at(state->started % state->cameras.size());
            ++state->started;
        }
        const Clock::time_point start = Clock::now();
        state->operation(params, [state, start](bool ok) { finished(state, ok, start); });
    }

    static void finished(const std::shared_ptr<State>& state, bool ok, Clock::time_point start) {
        const Clock::time_point now = Clock::now();
        {
            std::lock_guard<std::mutex> lock(state->mutex);
            state->latencies.push_back(
                std::chrono::duration<double, std::milli>(now - start).count());
            if (!ok)
                ++state->failures;
            if (++state->completed == state->count) {
                state->ended = now;
                if (state->loop)
                    QMetaObject::invokeMethod(state->loop, &QEventLoop::quit, Qt::QueuedConnection);
                return;
            }
        }
        startNext(state);
    }

    const std::shared_ptr<State> state;
    const int inFlight;
};

// User and system time of every thread of this process, Qt's own included.
double processCpuSeconds() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    const auto seconds = [](const timeval& time) { return time.tv_sec + time.tv_usec / 1e6; };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

QList<QVariantMap> camerasOn(const QStringList& ports) {
    QList<QVariantMap> cameras;
    for (const QString& port : ports)
        cameras.append({{KEY_HOST, QStringLiteral("127.0.0.1")},
                        {KEY_PORT, port.toUInt()},
                        {KEY_USE_SSL, false}});
    return cameras;
}

} // namespace

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    QCommandLineParser parser;
    parser.addOptions({{"ports", "Comma-separated camera ports on 127.0.0.1.", "ports"},
                       {"in-flight", "Operations in flight at all times.", "n", "64"},
                       {"count", "Operations measured.", "n", "20000"},
                       {"warmup", "Operations run first, not measured.", "n", "2000"},
                       {"qt-only", "Send through QNetworkAccessManager alone."}});
    parser.process(app);
    const QList<QVariantMap> cameras =
        camerasOn(parser.value("ports").split(QLatin1Char(','), Qt::SkipEmptyParts));
    if (cameras.isEmpty()) {
        std::fprintf(stderr, "--ports is required\n");
        return 2;
    }
    const int inFlight = parser.value("in-flight").toInt();
    const int limitMs = 120000;

    CameraProxy proxy;
    QNetworkAccessManager network;
    const bool qtOnly = parser.isSet("qt-only");
    Operation operation = [&proxy](const QVariantMap& params, std::function<void(bool)> done) {
        proxy.stopPTZMovement(params, done);
    };
    if (qtOnly)
        operation = [&network](const QVariantMap& params, std::function<void(bool)> done) {
            const QUrl url(
                QStringLiteral("http://127.0.0.1:%1").arg(params.value(KEY_PORT).toUInt()) +
                STOP_PATH);
            QNetworkReply* reply = network.get(QNetworkRequest(url));
            QObject::connect(reply, &QNetworkReply::finished, reply, [reply, done] {
                reply->readAll();
                reply->deleteLater();
                done(reply->error() == QNetworkReply::NoError);
            });
        };

    LoadRun warmup(operation, cameras, inFlight, parser.value("warmup").toInt());
    if (!warmup.run(limitMs)) {
        std::fprintf(stderr, "warm-up did not complete\n");
        return 1;
    }
    LoadRun measured(operation, cameras, inFlight, parser.value("count").toInt());
    const double cpuBefore = processCpuSeconds();
    const bool complete = measured.run(limitMs);
    const double cpuSeconds = processCpuSeconds() - cpuBefore;
    QJsonObject report = measured.report();
    report.insert("cpuMicrosPerOp", cpuSeconds * 1e6 / std::max(1, report.value("ops").toInt()));
    report.insert("cameras", cameras.size());
    report.insert("inFlight", inFlight);
    report.insert("client", qtOnly ? "QNetworkAccessManager" : "CameraProxy");
    report.insert("qt", qVersion());
    std::printf("%s\n", QJsonDocument(report).toJson(QJsonDocument::Compact).constData());
    return complete ? 0 : 1;
}
