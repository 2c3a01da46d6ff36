// Many distinct cameras, one request each, then nothing: whether the client lets go of their
// connections and of what it kept for each camera once the idle time-out has passed. The cameras
// are the loopback addresses 127.0.x.y on one port, each a server of its own to the client.
// Prints one line of JSON.
//
// Two baselines: before any camera ("cold"), and after a first round of --warmup other cameras
// ("warm"), by when the allocator and Qt's tables of sockets have grown to the working size that
// the connection limit allows. Growth past the warm baseline is what distinct cameras leave behind.
//
//   quenvar-bench-idle --port 9001 [--cameras 10000] [--warmup 1024] [--in-flight 64]
//                      [--idle-ms 2000]
#include "ResidentMemory.h"
#include "Wendrel.h"

#include <QCommandLineParser>
#include <QCoreApplication>
#include <QDir>
#include <QEventLoop>
#include <QFileInfo>
#include <QJsonDocument>
#include <QJsonObject>
#include <QTimer>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <malloc.h>
#include <memory>

namespace {

// Freed memory that the allocator still holds is given back first, so that what is left is
// what the process still uses.
qint64 trimmedResidentBytes() {
    malloc_trim(0);
    return residentBytes();
}

int openSockets() {
    int sockets = 0;
    const QDir fds(QStringLiteral("/proc/self/fd"));
    for (const QString& fd : fds.entryList(QDir::NoDotAndDotDot | QDir::System | QDir::Files)) {
        if (QFileInfo(fds.filePath(fd)).symLinkTarget().contains(QLatin1String("socket:")))
            ++sockets;
    }
    return sockets;
}

void runFor(int ms) {
    QEventLoop loop;
    QTimer::singleShot(ms, &loop, &QEventLoop::quit);
    loop.exec();
}

QString cameraHost(int index) {
    return QStringLiteral("127.0.%1.%2").arg(index / 250).arg(index % 250 + 1);
}

} // namespace

int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    QCommandLineParser parser;
    parser.addOptions({{"port", "The port the cameras answer on, on every loopback address.", "n"},
                       {"cameras", "Distinct cameras, one request each.", "n", "10000"},
                       {"warmup", "Other cameras before the warm baseline.", "n", "1024"},
                       {"in-flight", "Requests in flight at once.", "n", "64"},
                       {"idle-ms", "The client's idle time-out.", "ms", "2000"}});
    parser.process(app);
    const auto port = static_cast<quint16>(parser.value("port").toUInt());
    const int cameras = parser.value("cameras").toInt();
    const int warmup = std::max(0, parser.value("warmup").toInt());
    const int inFlight = std::max(1, parser.value("in-flight").toInt());
    const int idleMs = parser.value("idle-ms").toInt();
    if (port == 0 || cameras <= 0 || cameras + warmup > 250 * 256) {
        std::fprintf(stderr, "--port and --cameras (with --warmup, 1 to 64000) are required\n");
        return 2;
    }

    WendrelSettings settings;
    settings.idleTimeoutMs = idleMs;
    Wendrel client(settings);
    const QString path = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?vx=0&vy=0&vs=0&zoom=stop");
    std::atomic<int> answered{0};
    std::atomic<int> failed{0};
    const auto get = [&](int index) {
        client.Get(cameraHost(index), path, port, false, {}, {},
                   [&answered, &failed](QNetworkReply::NetworkError error, const QByteArray&,
                                        const QByteArray&, bool) {
                       if (error != QNetworkReply::NoError)
                           ++failed;
                       ++answered;
                   },
                   10000, {});
    };

    // Requests to cameras first to first + count, in flight at most inFlight at once; returns
    // the peak resident size meanwhile.
    const auto round = [&](int first, int count) {
        answered = 0;
        qint64 peak = residentBytes();
        int sent = 0;
        while (answered.load() < count) {
            while (sent < count && sent - answered.load() < inFlight)
                get(first + sent++);
            runFor(1);
            peak = std::max(peak, residentBytes());
        }
        return peak;
    };

    const int socketsBefore = openSockets();
    const qint64 cold = trimmedResidentBytes();
    round(cameras, warmup);
    runFor(idleMs + 1000);
    failed = 0;
    const qint64 warm = trimmedResidentBytes();

    const auto started = std::chrono::steady_clock::now();
    const qint64 peak = round(0, cameras);
    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
    const int socketsAtEnd = openSockets() - socketsBefore;

    runFor(idleMs + 1000);
    const QJsonObject report{{"cameras", cameras},
                             {"warmup", warmup},
                             {"failed", failed.load()},
                             {"seconds", seconds},
                             {"idleMs", idleMs},
                             {"openAtEnd", socketsAtEnd},
                             {"openAfterIdle", openSockets() - socketsBefore},
                             {"coldBytes", cold},
                             {"warmBytes", warm},
                             {"peakBytes", peak},
                             {"afterBytes", trimmedResidentBytes()}};
    std::printf("%s\n", QJsonDocument(report).toJson(QJsonDocument::Compact).constData());
    return 0;
}
