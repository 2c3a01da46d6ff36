#pragma once

#include <QProcess>
#include <QTemporaryDir>

// A tool that serves HTTP (quenvar-host serve, quenvar-camsim), started on a free port: its first
// line of output names the address. Stopped with SIGTERM when destroyed. Its standard error
// goes to a file, which tests read while it runs.
class ListeningProcess {
public:
    ~ListeningProcess();

    bool start(const QString& program, const QStringList& arguments,
               const QProcessEnvironment& environment = QProcessEnvironment::systemEnvironment());
    quint16 port() const;
    QString errorOutput() const;
    // Polls standard error until it holds text; false when the deadline passes first.
    bool waitForErrorOutput(const QString& text, int timeoutMs = 10000) const;
    // Stops the process; returns its exit code, or -1 when it did not end normally.
    int stop();

private:
    QTemporaryDir folder;
    QProcess process;
    quint16 listenPort = 0;
};
