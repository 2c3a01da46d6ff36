#pragma once

#include "QUILImplementation/VcaRuleRetriever.h"

#include <QByteArray>
#include <QList>
#include <QMap>
#include <QString>
#include <QVariant>
#include <QVariantMap>

// The retriever's state and the conversions of the VCA plugin's replies. Reply handlers hold
// nothing of this object, so an answer that arrives after the retriever is gone is still
// converted and answered. Exported for the tests and benchmarks.
class QUENVAR_EXPORT VcaRuleRetriever::VcaRuleRetrieverPrivate {
public:
    void getLiveVcaRule(const QString& cameraId, ResponseCallback callback);
    void getRecordingVcaRule(const QList<QString>& locationIDs, quint64 timestamp,
                             ResponseCallback callback);

    static QString liveRequestXml(const QString& cameraId);
    static QString recordingRequestXml(const QList<QString>& locationIDs, quint64 timestamp);

    // Reply handlers: each answers callback exactly once.
    static void queryLiveVCARuleCB(bool success, const QString& relayPath,
                                   const QString& statusCode, const QString& replyText, bool flag,
                                   const ResponseCallback& callback);
    static void queryRecordingVCARuleCB(bool success, const QString& statusCode,
                                        const QString& replyText, bool flag,
                                        const ResponseCallback& callback);
    // Whether the host reported failure or the VCA plugin's hexadecimal status code has bit 31.
    static bool replyFailed(bool success, const QString& statusCode);

    // Live reply to the result map: JSON form when the rules declare it, XML form otherwise.
    static QVariantMap convertLiveReply(const QString& replyText, const QString& relayPath);
    static bool isJsonFormat(const QVariant& parsedReply);
    static void convertJsonRules(const QVariant& parsedReply, const QString& relayPath,
                                 QVariantMap& result);
    static void convertXmlRules(const QString& replyText, const QString& relayPath,
                                QVariantMap& result);
    // Rule type to the compact JSON text of each rule of that type, by name; both in Qt's order
    // of JSON keys, which is QString's.
    using RulesByType = QMap<QString, QMap<QString, QByteArray>>;
    static QString rulesToJsonText(const RulesByType& rulesByType);

    // Recording reply to the result map, by location name; invalid when the text is not XML.
    static QVariant convertRecordingReply(const QString& replyText);
    // The raw contents of the JsonRules elements, in document order.
    static QList<QString> extractJsonRules(const QString& text);

    // Owned by the host; null when the host handed out none.
    IPluginRequestChannel* requestChannel = nullptr;

private:
    // One request to the VCA plugin, from this plugin; reply answers it later.
    void send(int kind, const QString& command, const QString& content,
              PluginReplyCallback reply) const;
};
