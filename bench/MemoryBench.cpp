// Many CameraProxy operations in flight at once against servers that accept and never answer:
// how much resident memory each one costs, and whether each is answered false once, at its
// deadline. Prints one line of JSON.
//
//   quenvar-bench-memory --ports 9001[,9002...] [--count 10000]
#include "PluginQuenvarDefs.h"
#include "ResidentMemory.h"
#include "camera/CameraProxy.h"

#include <QCommandLineParser>
#include <QCoreApplication>
#include <QEventLoop>
#include <QJsonDocument>
#include <QJsonObject>
#include <QTcpServer>
#include <QTimer>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <malloc.h>
#include <memory>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

// The camera proxy's request deadline.
const auto DEADLINE = std::chrono::milliseconds(10000);
const int SAMPLE_INTERVAL_MS = 50;

QVariantMap camera(quint16 port) {
    return {{KEY_HOST, QStringLiteral("127.0.0.1")}, {KEY_PORT, port}, {KEY_USE_SSL, false}};
}

// A port that refuses connections: one that was free a moment ago.
quint16 closedPort() {
    QTcpServer server;
    server.listen(QHostAddress::LocalHost, 0);
    return server.serverPort();
}

// What every operation reported; written on Wendrel's worker thread, read after all answered.
struct Answers {
    explicit Answers(size_t count)
        : submitted(count)
        , answered(count)
        , calls(count)
        , ok(count) {}

    std::vector<Clock::time_point> submitted;
    std::vector<Clock::time_point> answered;
    std::vector<int> calls;
    std::vector<char> ok;
    std::atomic<int> total{0};
};

} // namespace

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    QCommandLineParser parser;
    parser.addOptions({{"ports", "Comma-separated ports on 127.0.0.1 that never answer.", "ports"},
                       {"count", "Operations in flight.", "n", "10000"}});
    parser.process(app);
    QList<QVariantMap> cameras;
    for (const QString& port : parser.value("ports").split(QLatin1Char(','), Qt::SkipEmptyParts))
        cameras.append(camera(static_cast<quint16>(port.toUInt())));
    const int count = parser.value("count").toInt();
    if (cameras.isEmpty() || count <= 0) {
        std::fprintf(stderr, "--ports and a positive --count are required\n");
        return 2;
    }

    CameraProxy proxy;
    // One refused request sets up the client's network machinery before the baseline.
    {
        QEventLoop loop;
        proxy.stopPTZMovement(camera(closedPort()), [&loop](bool) {
            QMetaObject::invokeMethod(&loop, &QEventLoop::quit, Qt::QueuedConnection);
        });
        loop.exec();
    }
    const auto answers = std::make_shared<Answers>(static_cast<size_t>(count));
    malloc_trim(0);
    const qint64 baseline = residentBytes();
    qint64 peak = baseline;

    for (int i = 0; i < count; ++i) {
        answers->submitted[i] = Clock::now();
        proxy.stopPTZMovement(cameras.at(i % cameras.size()), [answers, i](bool ok) {
            answers->answered[i] = Clock::now();
            answers->ok[i] = ok;
            ++answers->calls[i];
            ++answers->total;
        });
    }

    // Sampled until every operation has answered, or well past the last deadline.
    QEventLoop loop;
    QTimer sampler;
    const Clock::time_point giveUp = Clock::now() + DEADLINE + std::chrono::seconds(5);
    QObject::connect(&sampler, &QTimer::timeout, &loop, [&] {
        peak = std::max(peak, residentBytes());
        if (answers->total.load() >= count || Clock::now() > giveUp)
            loop.quit();
    });
    sampler.start(SAMPLE_INTERVAL_MS);
    loop.exec();

    int answeredOnce = 0;
    int answeredFalse = 0;
    double earliestMs = 0;
    double latestMs = 0;
    bool first = true;
    for (int i = 0; i < count; ++i) {
        if (answers->calls[i] != 1)
            continue;
        ++answeredOnce;
        if (!answers->ok[i])
            ++answeredFalse;
        const double lateness = std::chrono::duration<double, std::milli>(
                                    answers->answered[i] - (answers->submitted[i] + DEADLINE))
                                    .count();
        earliestMs = first ? lateness : std::min(earliestMs, lateness);
        latestMs = first ? lateness : std::max(latestMs, lateness);
        first = false;
    }
    const QJsonObject report{{"count", count},
                             {"cameras", cameras.size()},
                             {"baselineBytes", baseline},
                             {"peakBytes", peak},
                             {"bytesPerOperation", double(peak - baseline) / count},
                             {"answeredOnce", answeredOnce},
                             {"answeredFalse", answeredFalse},
                             {"answers", answers->total.load()},
                             {"earliestAfterDeadlineMs", earliestMs},
                             {"latestAfterDeadlineMs", latestMs}};
    std::printf("%s\n", QJsonDocument(report).toJson(QJsonDocument::Compact).constData());
    return 0;
}
