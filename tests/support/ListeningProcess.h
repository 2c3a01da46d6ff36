#pragma once

#include <QProcess>
#include <QTemporaryDir>

// A tool that serves HTTP (quenvar-host serve, quenvar-camsim), started on a free port: its first
// line of output names the address. Stopped with SIGTERM when destroyed, and killed when the test
// process dies. Its standard error goes to a file, which tests read while it runs.
class ListeningProcess {
public:
    ~ListeningProcess() { stop(); }

    bool start(const QString& program, const QStringList& arguments,
               const QProcessEnvironment& environment = QProcessEnvironment::systemEnvironment());
    quint16 port() const { return listenPort; }
    // 0 once it has ended.
    qint64 processId() const { return process.processId(); }
    QString errorOutput() const;
    // The next line of standard output, trimmed; null when none came within timeoutMs.
    QString readLine(int timeoutMs);
    // Stops the process; returns its exit code, or -1 when it did not end normally.
    int stop();

private:
    QTemporaryDir folder;
    QProcess process;
    quint16 listenPort = 0;
};
