#pragma once

#include "PluginFramework.h"
#include "QuenvarExport.h"

#include <QList>
#include <QString>

#include <memory>

// Fetches VCA rules from the host's VCA plugin and answers with them converted. Copies share
// one private object.
class QUENVAR_EXPORT VcaRuleRetriever {
public:
    class VcaRuleRetrieverPrivate;

    VcaRuleRetriever();
    explicit VcaRuleRetriever(IFrameworkTools* tools);
    VcaRuleRetriever(const VcaRuleRetriever& other);
    VcaRuleRetriever& operator=(const VcaRuleRetriever& other);
    virtual ~VcaRuleRetriever();

    virtual void getLiveVcaRule(const QString& cameraId, ResponseCallback callback);
    virtual void getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                                     ResponseCallback callback);

private:
    std::shared_ptr<VcaRuleRetrieverPrivate> d;
};
