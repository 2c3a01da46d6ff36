#pragma once

#include "PluginFramework.h"

#include <memory>

// What a response callback received. The callback shares it, so it may outlive the test's frame.
struct RecordedAnswer {
    int calls = 0;
    bool handled = false;
    QString code;
    QString message;
    QVariant payload;

    static ResponseCallback recorder(const std::shared_ptr<RecordedAnswer>& answer) {
        return [answer](bool handled, const QString& code, const QString& message,
                        const QVariant& payload) {
            ++answer->calls;
            answer->handled = handled;
            answer->code = code;
            answer->message = message;
            answer->payload = payload;
        };
    }
};
