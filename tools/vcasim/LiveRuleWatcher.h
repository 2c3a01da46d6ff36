#pragma once

#include <QFileSystemWatcher>
#include <QHash>
#include <QObject>
#include <QTimer>

// Watches the live rule files (FOLDER/C.xml) and reports each one that appears or changes, once
// per burst of file-system notifications: one write may notify several times, and a file that
// an editor replaces drops out of the watch and is added back.
class LiveRuleWatcher : public QObject {
    Q_OBJECT

public:
    static const int SETTLE_MS = 100;

    explicit LiveRuleWatcher(const QString& folder, QObject* parent = nullptr);

signals:
    void changed(const QString& cameraId);

private:
    void scan(bool report);

    QString folder;
    QFileSystemWatcher watcher;
    QTimer settle;
    QHash<QString, QByteArray> signatures; // file name to modification time, size and digest
};
