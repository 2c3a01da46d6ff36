#pragma once

#include <QByteArray>
#include <QString>
#include <QStringList>

// The command line of quenvar-host.
class HostOptions {
public:
    enum class Mode { Request, Serve, Help };

    static const int DEFAULT_TIMEOUT_MS = 30000;
    static const quint16 DEFAULT_PORT = 8700;

    // Parses the arguments after the program's name; false, with a message, for a usage error.
    bool parse(const QStringList& arguments, QString* error);
    static QString usage();

    Mode mode = Mode::Help;
    QString pluginDir; // empty: the plugins folder beside the executable's folder
    QString vcaDir;
    int timeoutMs = DEFAULT_TIMEOUT_MS;
    QString listenHost = QStringLiteral("127.0.0.1");
    quint16 listenPort = DEFAULT_PORT;
    QStringList allowedHosts; // further names of serve's Host header, without a port
    QString tokenFile;
    bool verbose = false;
    QString command;
    bool hasParams = false;
    QByteArray paramsJson;
};
