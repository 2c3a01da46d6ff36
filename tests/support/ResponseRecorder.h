#pragma once

#include "PluginFramework.h"

#include <QList>

#include <memory>
#include <ostream>

// Keeps every answer given to its callbacks. The callbacks share the list, so they may outlive
// the recorder.
class ResponseRecorder {
public:
    struct Response {
        bool handled = false;
        QString code;
        QString message;
        QVariant payload;

        // Payloads compare with their types, as QVariant does.
        bool operator==(const Response& other) const;
    };

    ResponseCallback callback() const;
    QList<Response> responses() const { return *recorded; }

private:
    std::shared_ptr<QList<Response>> recorded = std::make_shared<QList<Response>>();
};

void PrintTo(const ResponseRecorder::Response& response, std::ostream* out);
