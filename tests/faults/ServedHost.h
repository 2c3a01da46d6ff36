#pragma once

#include "ListeningProcess.h"

#include <QJsonObject>
#include <QList>
#include <QProcessEnvironment>

// quenvar-host serve with the build's plugins on a free port, and client requests to it.
class ServedHost {
public:
    struct Answer {
        int status = 0; // 0: no HTTP answer
        QJsonObject json;
        qint64 elapsedMs = -1;
    };

    bool start(const QStringList& arguments = {},
               const QProcessEnvironment& environment = QProcessEnvironment::systemEnvironment());
    // Sends every {"command", "params"} request at once, each on a connection of its own, and
    // returns the answers in the same order.
    QList<Answer> post(const QList<QJsonObject>& requests) const;
    // Stops the host: its exit code, which is not 0 after a crash or, under ASan, a leak.
    int stop();
    QString errorOutput() const;

private:
    ListeningProcess process;
};
