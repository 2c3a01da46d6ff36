#include "PluginTree.h"

#include "BuildPaths.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

PluginTree::PluginTree() {
    const QDir dir(root.path());
    valid = root.isValid() && dir.mkpath(QStringLiteral("plugins")) &&
            dir.mkpath(QStringLiteral("lib"));
    const QDir lib(BuildPaths::lib());
    for (const QString& name : lib.entryList({QStringLiteral("*.so*")}, QDir::Files))
        valid =
            valid && QFile::copy(lib.filePath(name), dir.filePath(QStringLiteral("lib/") + name));
}

bool PluginTree::isValid() const {
    return valid;
}

QString PluginTree::plugins() const {
    return QDir(root.path()).filePath(QStringLiteral("plugins"));
}

bool PluginTree::add(const QString& modulePath, const QString& name) {
    const QString target = name.isEmpty() ? QFileInfo(modulePath).fileName() : name;
    return QFile::copy(modulePath, QDir(plugins()).filePath(target));
}

bool PluginTree::addFile(const QString& name, const QByteArray& content) {
    QFile file(QDir(plugins()).filePath(name));
    return file.open(QIODevice::WriteOnly) && file.write(content) == content.size();
}
