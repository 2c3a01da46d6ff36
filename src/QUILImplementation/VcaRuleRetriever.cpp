#include "QUILImplementation/VcaRuleRetriever.h"

#include "ClientResponse.h"
#include "QUILImplementation/VcaRuleRetrieverPrivate.h"

VcaRuleRetriever::VcaRuleRetriever() = default;

VcaRuleRetriever::VcaRuleRetriever(IFrameworkTools* tools)
    : d(std::make_shared<VcaRuleRetrieverPrivate>()) {
    if (tools)
        d->requestChannel = tools->GetRequestChannel();
}

VcaRuleRetriever::VcaRuleRetriever(const VcaRuleRetriever& other) = default;
VcaRuleRetriever& VcaRuleRetriever::operator=(const VcaRuleRetriever& other) = default;
VcaRuleRetriever::~VcaRuleRetriever() = default;

void VcaRuleRetriever::getLiveVcaRule(const QString& cameraId, ResponseCallback callback) {
    if (d)
        d->getLiveVcaRule(cameraId, std::move(callback));
    else
        ClientResponse::send(callback, false, false, QVariant());
}

void VcaRuleRetriever::getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                                           ResponseCallback callback) {
    if (d)
        d->getRecordingVcaRule(locationIDs, timestamp, std::move(callback));
    else
        ClientResponse::send(callback, false, false, QVariant());
}
