#pragma once

#include "QUILImplementation/VcaRuleRetriever.h"

#include <QList>
#include <QString>

#include <functional>

// Records the rule operations, each as a line and the callback it was given; a test answers them
// later, or at once from onCall, which may also throw.
class FakeVcaRuleRetriever : public VcaRuleRetriever {
public:
    struct Call {
        QString what; // "live CAMERA" or "recording LOCATION,... TIMESTAMP_IN_HEX"
        ResponseCallback callback;
    };

    void getLiveVcaRule(const QString& cameraId, ResponseCallback callback) override {
        record("live " + cameraId, std::move(callback));
    }
    void getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                             ResponseCallback callback) override {
        record("recording " + locationIDs.join(',') + ' ' + QString::number(timestamp, 16),
               std::move(callback));
    }

    QList<Call> calls;
    std::function<void(const ResponseCallback&)> onCall;

private:
    void record(const QString& what, ResponseCallback callback) {
        calls.append({what, std::move(callback)});
        if (onCall)
            onCall(calls.last().callback);
    }
};
