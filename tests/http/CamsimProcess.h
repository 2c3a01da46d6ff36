#pragma once

#include <QByteArray>
#include <QJsonObject>
#include <QList>
#include <QPair>
#include <QProcess>
#include <QString>
#include <QStringList>
#include <QTemporaryDir>

// quenvar-camsim as a child process on an ephemeral loopback port, logging to a temporary file;
// killed when this object goes.
class CamsimProcess {
public:
    using Headers = QList<QPair<QByteArray, QByteArray>>;

    struct Answer {
        int status = 0; // 0: no answer
        Headers headers;
        QByteArray body;
        QByteArray header(const QByteArray& name) const;
    };

    explicit CamsimProcess(const QStringList& arguments = {});
    ~CamsimProcess();
    CamsimProcess(const CamsimProcess&) = delete;
    CamsimProcess& operator=(const CamsimProcess&) = delete;

    // 0 when the simulator did not come up; error() then says why.
    quint16 port() const { return listeningPort; }
    QString error() const { return failure; }
    static QString host() { return QStringLiteral("127.0.0.1"); }

    QStringList logLines() const;
    // Polls the log until it has at least count lines or timeoutMs passed.
    bool waitForLogLines(int count, int timeoutMs = 3000) const;
    QJsonObject state() const;
    // Sets the fault through /_sim/fault; form is e.g. "mode=status&status=404".
    bool setFault(const QByteArray& form) const;
    // One plain HTTP exchange from this thread, with exactly the given headers added.
    Answer exchange(const QByteArray& method, const QString& target, const QByteArray& body = {},
                    const Headers& headers = {}) const;

private:
    QTemporaryDir folder;
    QProcess process;
    quint16 listeningPort = 0;
    QString failure;
};
