#pragma once

#include <QString>

// Where the build put its outputs, for tests that run real binaries or load modules.
class BuildPaths {
public:
    static QString root();
    static QString bin(const QString& name) { return root() + QStringLiteral("/bin/") + name; }
    static QString plugins() { return root() + QStringLiteral("/plugins"); }
    static QString lib() { return root() + QStringLiteral("/lib"); }
};
