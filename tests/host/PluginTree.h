#pragma once

#include <QTemporaryDir>

// A plugin folder of the test's choosing, with the build's shared libraries beside it where the
// plugins look for them (../lib).
class PluginTree {
public:
    PluginTree();

    bool isValid() const;
    QString plugins() const;
    // Copies a module under its own name, or under another one.
    bool add(const QString& modulePath, const QString& name = QString());
    bool addFile(const QString& name, const QByteArray& content);

private:
    QTemporaryDir root;
    bool valid = false;
};
