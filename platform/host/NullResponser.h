#pragma once

#include "PluginFramework.h"

// For the blocking subscription calls, whose answers the host does not use.
class NullResponser : public IResponser {
public:
    void Respond(bool, const QString&, const QString&, const QVariant&) override {}
};
