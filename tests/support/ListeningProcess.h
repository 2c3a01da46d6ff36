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
    QString errorOutput() const;
    // Stops the process; returns its exit code, or -1 when it did not end normally.
    int stop();

private:
    QTemporaryDir folder;
    QProcess process;
    quint16 listenPort = 0;
};
