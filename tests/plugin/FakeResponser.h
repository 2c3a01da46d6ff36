#pragma once

#include "PluginFramework.h"

// Counts the answers of the blocking operations; the plugin is expected to give none.
class FakeResponser : public IResponser {
public:
    void Respond(bool handled, const QString& code, const QString& message,
                 const QVariant& payload) override;

    int count = 0;
};
