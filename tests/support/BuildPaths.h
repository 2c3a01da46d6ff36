#pragma once

#include <QString>

// Where the build put its outputs, for tests that run real binaries or load modules.
class BuildPaths {
public:
    static QString root();
    static QString bin(const QString& name);
    static QString plugins();
    static QString lib();
};
