#pragma once

#include "QUILImplementation/VcaRuleRetriever.h"

#include <QList>
#include <QString>

// Records the rule operations with the callbacks they were given; a test answers them.
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
    }
    void getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                             ResponseCallback callback) override {
        recordingCalls.append({locationIDs, timestamp, std::move(callback)});
    }

    QList<LiveCall> liveCalls;
    QList<RecordingCall> recordingCalls;
};
