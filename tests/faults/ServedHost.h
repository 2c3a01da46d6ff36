#pragma once

#include "ListeningProcess.h"

#include <QJsonObject>
#include <QList>

// quenvar-host serve with the build's plugins on a free port, and client requests to it. Its
// exit code from stop() is not 0 after a crash or, under ASan, a leak.
class ServedHost : public ListeningProcess {
public:
    struct Answer {
        int status = 0; // 0: no HTTP answer
        QJsonObject json;
        qint64 elapsedMs = -1;
    };

    static QJsonObject request(const QString& command, const QVariant& params);

    bool serve(const QStringList& arguments = {},
               const QProcessEnvironment& environment = QProcessEnvironment::systemEnvironment());
    // Sends every request at once, each on a connection of its own, and returns the answers in
    // the same order.
    QList<Answer> post(const QList<QJsonObject>& requests) const;
};
