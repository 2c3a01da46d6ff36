// wendrel-limit-probe PORT COUNT: with at most 256 open files, requests to COUNT distinct servers
// (127.0.0.1, 127.0.0.2, ... on PORT), one after another. Exits with 0 when every one succeeded,
// else prints the first failure and exits with 1.
#include "Wendrel.h"

#include <QCoreApplication>
#include <QEventLoop>
#include <QMetaEnum>
#include <QTimer>

#include <cstdio>
#include <sys/resource.h>

int main(int argc, char** argv) {
    rlimit limit{};
    getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = 256;
    if (argc != 3 || setrlimit(RLIMIT_NOFILE, &limit) != 0)
        return 2;
    QCoreApplication app(argc, argv);
    const quint16 port = quint16(QByteArray(argv[1]).toUInt());
    const int count = QByteArray(argv[2]).toInt();
    Wendrel client;
    for (int i = 0; i < count; ++i) {
        const QString host = QStringLiteral("127.0.%1.%2").arg(i / 250).arg(i % 250 + 1);
        QEventLoop loop;
        QNetworkReply::NetworkError outcome = QNetworkReply::TimeoutError;
        client.Get(host, QStringLiteral("/"), port, false, {}, {},
                   [&loop, &outcome](QNetworkReply::NetworkError error, const QByteArray&,
                                     const QByteArray&, bool) {
                       outcome = error;
                       QMetaObject::invokeMethod(&loop, &QEventLoop::quit, Qt::QueuedConnection);
                   },
                   10000, {});
        QTimer::singleShot(15000, &loop, &QEventLoop::quit);
        loop.exec();
        if (outcome != QNetworkReply::NoError) {
            std::printf("request %d to %s failed: %s\n", i, qPrintable(host),
                        QMetaEnum::fromType<QNetworkReply::NetworkError>().valueToKey(outcome));
            return 1;
        }
    }
    return 0;
}
