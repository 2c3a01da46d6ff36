#include "VcaRuleRetriever.h"

class VcaRuleRetriever::VcaRuleRetrieverPrivate {};

VcaRuleRetriever::VcaRuleRetriever() = default;
VcaRuleRetriever::VcaRuleRetriever(IFrameworkTools*) {}
VcaRuleRetriever::VcaRuleRetriever(const VcaRuleRetriever& other) = default;
VcaRuleRetriever& VcaRuleRetriever::operator=(const VcaRuleRetriever& other) = default;
VcaRuleRetriever::~VcaRuleRetriever() = default;

void VcaRuleRetriever::getLiveVcaRule(const QString&, ResponseCallback) {}
void VcaRuleRetriever::getRecordingVcaRule(const QList<QString>&, quint64, ResponseCallback) {}
