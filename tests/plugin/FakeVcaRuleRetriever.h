#pragma once

#include "QUILImplementation/VcaRuleRetriever.h"

#include <QList>
#include <QString>

#include <functional>

// Records the rule operations with the callbacks they were given; a test answers them later, or
// at once from onCall, which may also throw.
class FakeVcaRuleRetriever : public VcaRuleRetriever {
public:
    struct LiveCall {
        QString cameraId;
        ResponseCallback callback;
    };
    struct RecordingCall {
        QList<QString> locationIDs;
        quint64 timestamp = 0;
        ResponseCallback callback;
    };

    void getLiveVcaRule(const QString& cameraId, ResponseCallback callback) override {
        liveCalls.append({cameraId, std::move(callback)});
        if (onCall)
            onCall(liveCalls.last().callback);
    }
    void getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                             ResponseCallback callback) override {
        recordingCalls.append({locationIDs, timestamp, std::move(callback)});
        if (onCall)
            onCall(recordingCalls.last().callback);
    }

    QList<LiveCall> liveCalls;
    QList<RecordingCall> recordingCalls;
    std::function<void(const ResponseCallback&)> onCall;
};
