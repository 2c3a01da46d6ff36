#include "LiveRuleWatcher.h"

#include <QCryptographicHash>
#include <QDateTime>
#include <QDir>
#include <QFile>

namespace {

const QString RULE_SUFFIX = QStringLiteral(".xml");

QByteArray signatureOf(const QFileInfo& info) {
    QFile file(info.absoluteFilePath());
    if (!file.open(QIODevice::ReadOnly))
        return QByteArray();
    return QByteArray::number(info.lastModified().toMSecsSinceEpoch()) + ' ' +
           QByteArray::number(info.size()) + ' ' +
           QCryptographicHash::hash(file.readAll(), QCryptographicHash::Sha1).toHex();
}

} // namespace

LiveRuleWatcher::LiveRuleWatcher(const QString& folder, QObject* parent)
    : QObject(parent)
    , folder(folder) {
    settle.setSingleShot(true);
    settle.setInterval(SETTLE_MS);
    connect(&settle, &QTimer::timeout, this, [this]() { scan(true); });
    connect(&watcher, &QFileSystemWatcher::directoryChanged, &settle, qOverload<>(&QTimer::start));
    connect(&watcher, &QFileSystemWatcher::fileChanged, &settle, qOverload<>(&QTimer::start));
    watcher.addPath(folder);
    scan(false);
}

void LiveRuleWatcher::scan(bool report) {
    const QFileInfoList files =
        QDir(folder).entryInfoList({QStringLiteral("*") + RULE_SUFFIX}, QDir::Files, QDir::Name);
    QHash<QString, QByteArray> current;
    const QStringList watched = watcher.files();
    for (const QFileInfo& info : files) {
        const QString name = info.fileName();
        const QByteArray signature = signatureOf(info);
        current.insert(name, signature);
        if (!watched.contains(info.absoluteFilePath()))
            watcher.addPath(info.absoluteFilePath());
        if (report && signatures.value(name) != signature)
            emit changed(name.chopped(RULE_SUFFIX.size()));
    }
    signatures = current;
}
