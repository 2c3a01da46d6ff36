#pragma once

#include "ListeningProcess.h"

#include <QJsonObject>
#include <QList>

// quenvar-host serve with the build's plugins on a free port, and client requests to it with its
// token. Its exit code from stop() is not 0 after a crash or, under ASan, a leak.
class ServedHost : public ListeningProcess {
public:
    static constexpr char TOKEN[] = "faults-test-token";

    struct Answer {
        int status = 0; // 0: no HTTP answer
        QJsonObject json;
        qint64 elapsedMs = -1;
    };

    static QJsonObject request(const QString& command, const QVariant& params);

    // The environment gets TOKEN as the host's token.
    bool serve(const QStringList& arguments = {},
               QProcessEnvironment environment = QProcessEnvironment::systemEnvironment());
    // Sends every request at once, each on a connection of its own, and returns the answers in
    // the same order.
    QList<Answer> post(const QList<QJsonObject>& requests) const;
};
