#pragma once

#include "PluginFramework.h"

// Counts the answers of the blocking operations; the plugin is expected to give none.
class FakeResponser : public IResponser {
public:
    void Respond(bool, const QString&, const QString&, const QVariant&) override { ++count; }

    int count = 0;
};
