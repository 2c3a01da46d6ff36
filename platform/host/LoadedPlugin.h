#pragma once

#include "PluginFramework.h"

#include <QJsonObject>
#include <QStringList>

class QPluginLoader;

// One plugin in the host: where it came from, what its metadata says, and its object.
struct LoadedPlugin {
    QString id;           // "PluginID" of its metadata
    QString origin;       // the module's file, or how an in-process plugin was added
    QJsonObject metaData; // the whole metadata block: IID, className, MetaData
    QStringList commands; // "Commands" of its metadata: what other plugins may send it
    IPluginObjectBase* object = nullptr;
    QPluginLoader* loader = nullptr; // owned by the host; null for an in-process plugin
};
