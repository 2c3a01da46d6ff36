#include "FakeVcaRuleRetriever.h"

void FakeVcaRuleRetriever::getLiveVcaRule(const QString& cameraId, ResponseCallback callback) {
    liveCalls.append({cameraId, std::move(callback)});
}

void FakeVcaRuleRetriever::getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                                               ResponseCallback callback) {
    recordingCalls.append({locationIDs, timestamp, std::move(callback)});
}
