#pragma once

#include "ListeningProcess.h"

#include <QByteArray>
#include <QList>
#include <QPair>
#include <QString>
#include <QStringList>
#include <QTemporaryDir>

#include <string>
#include <vector>

// quenvar-camsim as a child process on an ephemeral loopback port, logging to a temporary file;
// ended when this object goes.
class CamsimProcess {
public:
    using Headers = QList<QPair<QByteArray, QByteArray>>;

    struct Answer {
        int status = 0;       // 0: no answer
        QByteArray challenge; // WWW-Authenticate
        QByteArray body;
    };

    explicit CamsimProcess(const QStringList& arguments = {});

    // 0 when the simulator did not come up; error() then says why.
    quint16 port() const { return process.port(); }
    QString error() const {
        return port() ? QString() : "quenvar-camsim did not start: " + process.errorOutput();
    }
    static QString host() { return QStringLiteral("127.0.0.1"); }

    // The camera requests received so far, one "method TAB target TAB body" line each. The
    // simulator logs a request before it answers it.
    std::vector<std::string> logLines() const;
    // The camera's state as compact JSON, its keys in order.
    std::string state() const;
    // Sets the fault through /_sim/fault; form is e.g. "mode=status&status=404".
    bool setFault(const QByteArray& form) const;
    // One plain HTTP exchange from this thread, with exactly the given headers added.
    Answer exchange(const QByteArray& method, const QString& target, const QByteArray& body = {},
                    const Headers& headers = {}) const;

private:
    QTemporaryDir folder;
    ListeningProcess process;
};
