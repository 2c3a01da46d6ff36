#include "BuildPaths.h"

#include <QtGlobal>

QString BuildPaths::root() {
    const QString fromEnvironment = qEnvironmentVariable("QUENVAR_BUILD_DIR");
    return fromEnvironment.isEmpty() ? QStringLiteral(QUENVAR_DEFAULT_BUILD_DIR) : fromEnvironment;
}

QString BuildPaths::bin(const QString& name) {
    return root() + QStringLiteral("/bin/") + name;
}

QString BuildPaths::plugins() {
    return root() + QStringLiteral("/plugins");
}

QString BuildPaths::lib() {
    return root() + QStringLiteral("/lib");
}
