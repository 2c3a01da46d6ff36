#include "BuildPaths.h"

#include <QtGlobal>

QString BuildPaths::root() {
    const QString fromEnvironment = qEnvironmentVariable("QUENVAR_BUILD_DIR");
    return fromEnvironment.isEmpty() ? QStringLiteral(QUENVAR_DEFAULT_BUILD_DIR) : fromEnvironment;
}
