#include "QUILImplementation/VcaRuleRetrieverPrivate.h"

#include "ClientResponse.h"
#include "LogText.h"
#include "PluginQuenvarDefs.h"
#include "QUILImplementation/JsonNormaliser.h"
#include "QuenvarLog.h"
#include "Trindle.h"

#include <QByteArray>
#include <QRegularExpression>
#include <QUrl>

#include <exception>
#include <optional>

namespace {

const char SOURCE_FILE[] = "src/QUILImplementation/VcaRuleRetriever";
// Fixed on purpose, not __LINE__: the existing logs of these failures show them at these lines,
// and log filters and the people reading the logs know them by them. Keep them whatever the
// layout of this file.
const int RECORDING_STATUS_FAILURE_LINE = 195;
const int RECORDING_PARSE_FAILURE_LINE = 204;

const qint32 REQUEST_TIMEOUT_MS = 15000;
const int LIVE_REQUEST_KIND = 1;
const int RECORDING_REQUEST_KIND = 4;

// Names in the parsed replies.
const QString LIVE_ROOT = QStringLiteral("GetVCARulesRes");
const QString CAMERA = QStringLiteral("Camera");
const QString CAM_NAME = QStringLiteral("CamName");
const QString RULES = QStringLiteral("Rules");
const QString RULE = QStringLiteral("Rule");
const QString FORMAT_ATTRIBUTE = QStringLiteral("@Format");
const QString TYPE_ATTRIBUTE = QStringLiteral("@Type");
const QString NAME_ATTRIBUTE = QStringLiteral("@Name");
const QString TEXT = QStringLiteral("#text");
const QString RECORDING_ROOT = QStringLiteral("GetRecordingVCARulesRes");
const QString LOCATION = QStringLiteral("Location");
const QString LOC_NAME = QStringLiteral("LocName");
const QString JSON_RULES = QStringLiteral("JsonRules");
const QString PROJECTION = QStringLiteral("Projection");
const QString ANALYSIS_ENGINE = QStringLiteral("AnalysisEngine");
const QString JSON_FORMAT = QStringLiteral("json");

const QString XML_DECLARATION = QStringLiteral("<?xml version='1.0' encoding='UTF-8'?>");
const QString EMPTY_RULES = QStringLiteral("<Rules></Rules>");
const QString RECORDING_XML_RULES_PREFIX = QStringLiteral(
    "<?xml version='1.0' encoding='UTF-8'?><Projection /><AE /><Rules Format = \"xml\">");
const QString RECORDING_XML_RULES_SUFFIX = QStringLiteral("</Rules>");
const QString EMPTY_JSON_OBJECT = QStringLiteral("{}");

const QRegularExpression CAM_NAME_START(QStringLiteral("<CamName>[^<]+"));
const QString CAM_NAME_END = QStringLiteral("</CamName>");
const qsizetype CAM_NAME_START_LENGTH = 9;
const QRegularExpression LIVE_ROOT_TAG(QStringLiteral("</?GetVCARulesRes>"));
const QRegularExpression CAMERA_TAG(QStringLiteral("</?Camera>"));
const QRegularExpression CAM_NAME_ELEMENT(QStringLiteral("<CamName>[^<]+</CamName>"));
const QString CR_LF = QStringLiteral("\r\n");
const QRegularExpression
    JSON_RULES_ELEMENT(QStringLiteral("<JsonRules>(.*?)<\\/JsonRules>|<JsonRules*.\\/>"));

QVariant valueAt(const QVariant& node, const QString& key) {
    return node.toMap().value(key);
}

QString percentDecoded(const QString& text) {
    return QUrl::fromPercentEncoding(text.toUtf8());
}

QString decodedOrEmptyObject(const QVariantMap& location, const QString& key) {
    const auto it = location.constFind(key);
    return it == location.constEnd() ? EMPTY_JSON_OBJECT : percentDecoded(it.value().toString());
}

// Keeps an identifier from adding elements to a command; ordinary identifiers pass unchanged.
QString xmlEscaped(const QString& text) {
    return text.toHtmlEscaped().replace(QLatin1Char('\''), QLatin1String("&apos;"));
}

// Spaces and tabs go from element text, stay in tags and before the first '>'.
QString withoutTextBlanks(const QString& text) {
    QString copy(text.size(), Qt::Uninitialized);
    QChar* out = copy.data();
    bool inText = false;
    for (const QChar c : text) {
        const char16_t unit = c.unicode();
        if (unit == u'>')
            inText = true;
        else if (unit == u'<')
            inText = false;
        else if (inText && (unit == u' ' || unit == u'\t'))
            continue;
        *out++ = c;
    }
    copy.truncate(out - copy.constData());
    return copy;
}

void logFailure(const char* tag, const QString& command, const char* error) {
    quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__, "%s, %s failed, %s", tag,
                     LogText::of(command).constData(), LogText::ofError(error).constData());
}

// The host calls reply handlers from its own code, where nothing may escape. An exception before
// the handler has answered fails the request with the reply's flag; one from the answer itself
// (the client's callback) is only logged, so the client is answered exactly once.
template <typename Handler>
void guarded(const char* tag, const QString& command, bool flag, const ResponseCallback& callback,
             Handler&& handler) {
    bool answered = false;
    const ResponseCallback once = [&answered, &callback](bool handled, const QString& code,
                                                         const QString& message,
                                                         const QVariant& payload) {
        answered = true;
        if (callback)
            callback(handled, code, message, payload);
    };
    try {
        handler(once);
        return;
    } catch (const std::exception& error) {
        logFailure(tag, command, error.what());
    } catch (...) {
        logFailure(tag, command, nullptr);
    }
    if (answered)
        return;
    try {
        ClientResponse::send(callback, flag, false, QVariant());
    } catch (...) {
        logFailure(tag, command, nullptr);
    }
}

} // namespace

void VcaRuleRetriever::VcaRuleRetrieverPrivate::getLiveVcaRule(const QString& cameraId,
                                                               ResponseCallback callback) {
    if (!requestChannel) {
        ClientResponse::send(callback, false, false, QVariant());
        return;
    }
    send(LIVE_REQUEST_KIND, VCA_CMD_GET_VCA_RULES, liveRequestXml(cameraId),
         [callback = std::move(callback)](bool success, const QString&, const QString& relayPath,
                                          const QString& statusCode, const QString& replyText,
                                          bool flag) {
             guarded("queryLiveVCARuleCB", VCA_CMD_GET_VCA_RULES, flag, callback,
                     [&](const ResponseCallback& once) {
                         queryLiveVCARuleCB(success, relayPath, statusCode, replyText, flag, once);
                     });
         });
}

void VcaRuleRetriever::VcaRuleRetrieverPrivate::getRecordingVcaRule(
    const QList<QString>& locationIDs, quint64 timestamp, ResponseCallback callback) {
    if (!requestChannel) {
        ClientResponse::send(callback, false, false, QVariant());
        return;
    }
    send(RECORDING_REQUEST_KIND, VCA_CMD_GET_RECORDING_VCA_RULES,
         recordingRequestXml(locationIDs, timestamp),
         [callback = std::move(callback)](bool success, const QString&, const QString&,
                                          const QString& statusCode, const QString& replyText,
                                          bool flag) {
             guarded("queryRecordingVCARuleCB", VCA_CMD_GET_RECORDING_VCA_RULES, flag, callback,
                     [&](const ResponseCallback& once) {
                         queryRecordingVCARuleCB(success, statusCode, replyText, flag, once);
                     });
         });
}

void VcaRuleRetriever::VcaRuleRetrieverPrivate::send(int kind, const QString& command,
                                                     const QString& content,
                                                     PluginReplyCallback reply) const {
    PluginRequestInfo info;
    info.flag = false;
    info.timeoutMs = REQUEST_TIMEOUT_MS;
    info.content = content;
    info.callback = std::move(reply);
    const IPluginRequestChannel::Context context = requestChannel->GetRequestContext();
    requestChannel->SendRequest(PLUGIN_ID, context, kind, command, info);
}

QString VcaRuleRetriever::VcaRuleRetrieverPrivate::liveRequestXml(const QString& cameraId) {
    return VCA_GET_VCA_RULES_FORMAT.arg(xmlEscaped(cameraId));
}

QString
VcaRuleRetriever::VcaRuleRetrieverPrivate::recordingRequestXml(const QList<QString>& locationIDs,
                                                               quint64 timestamp) {
    QString locations;
    for (const QString& id : locationIDs)
        locations += VCA_LOCATION_FORMAT.arg(xmlEscaped(id));
    // The dispatcher hands over a 32-bit time; its low 32 bits are that time, sign included.
    const auto queryTime = static_cast<qint32>(static_cast<quint32>(timestamp));
    return VCA_GET_RECORDING_VCA_RULES_FORMAT.arg(QString::number(queryTime), locations);
}

bool VcaRuleRetriever::VcaRuleRetrieverPrivate::replyFailed(bool success,
                                                            const QString& statusCode) {
    if (!success)
        return true;
    // Text that is not hexadecimal, or too large for 32 bits, reads as 0.
    bool ok = false;
    const uint status = statusCode.toUInt(&ok, 16);
    return ok && (status & 0x80000000u) != 0;
}

void VcaRuleRetriever::VcaRuleRetrieverPrivate::queryLiveVCARuleCB(
    bool success, const QString& relayPath, const QString& statusCode, const QString& replyText,
    bool flag, const ResponseCallback& callback) {
    const bool failed = replyFailed(success, statusCode);
    if (failed)
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, __LINE__,
                         "%s, getLiveVcaRule failed, %s", "getLiveVcaRule",
                         LogText::of(statusCode).constData());
    // A failed fetch still carries the converted map: subscribers of change events get it.
    ClientResponse::send(callback, flag, !failed, QVariant(convertLiveReply(replyText, relayPath)));
}

void VcaRuleRetriever::VcaRuleRetrieverPrivate::queryRecordingVCARuleCB(
    bool success, const QString& statusCode, const QString& replyText, bool flag,
    const ResponseCallback& callback) {
    if (replyFailed(success, statusCode)) {
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, RECORDING_STATUS_FAILURE_LINE,
                         "%s, queryRecordingVCARuleCB failed, %s", "queryRecordingVCARuleCB",
                         LogText::of(statusCode).constData());
        ClientResponse::send(callback, flag, false, QVariant());
        return;
    }
    const QVariant result = convertRecordingReply(replyText);
    if (!result.isValid()) {
        quenvarLog.print(KalbLogClient::Failure, SOURCE_FILE, RECORDING_PARSE_FAILURE_LINE,
                         "%s, parse message failed, %s", "queryRecordingVCARuleCB",
                         LogText::of(replyText).constData());
        ClientResponse::send(callback, flag, false, QVariant());
        return;
    }
    ClientResponse::send(callback, flag, true, result);
}

QVariantMap VcaRuleRetriever::VcaRuleRetrieverPrivate::convertLiveReply(const QString& replyText,
                                                                        const QString& relayPath) {
    Trindle trindle;
    const QVariant parsed = trindle.parse(replyText);
    QVariantMap result;
    if (isJsonFormat(parsed))
        convertJsonRules(parsed, relayPath, result);
    else
        convertXmlRules(replyText, relayPath, result);
    return result;
}

bool VcaRuleRetriever::VcaRuleRetrieverPrivate::isJsonFormat(const QVariant& parsedReply) {
    const QVariant rules = valueAt(valueAt(valueAt(parsedReply, LIVE_ROOT), CAMERA), RULES);
    return valueAt(rules, FORMAT_ATTRIBUTE).toString() == JSON_FORMAT;
}

void VcaRuleRetriever::VcaRuleRetrieverPrivate::convertJsonRules(const QVariant& parsedReply,
                                                                 const QString& relayPath,
                                                                 QVariantMap& result) {
    const QVariantMap camera = valueAt(valueAt(parsedReply, LIVE_ROOT), CAMERA).toMap();
    const QList<QVariant> rules = Trindle::transContentAsList(valueAt(camera.value(RULES), RULE));
    result.insert(VCA_KEY_CAM_ID, camera.value(CAM_NAME).toString());
    result.insert(VCA_KEY_RELAY_PATH, relayPath);
    result.insert(VCA_KEY_IS_JSON, true);

    RulesByType rulesByType;
    for (const QVariant& entry : rules) {
        const QVariantMap rule = entry.toMap();
        const QString name = percentDecoded(rule.value(NAME_ATTRIBUTE).toString());
        // The text is read as the member of that name of a wrapper object, the name written as a
        // JSON string: a quote or a backslash in it keeps the rule.
        const std::optional<QByteArray> value =
            JsonNormaliser::memberValue(name, rule.value(TEXT).toString().toUtf8());
        QMap<QString, QByteArray>& rulesOfType = rulesByType[rule.value(TYPE_ATTRIBUTE).toString()];
        if (value)
            rulesOfType.insert(name, *value);
        else
            rulesOfType.remove(name);
    }
    result.insert(VCA_KEY_RULES, rulesToJsonText(rulesByType));
}

void VcaRuleRetriever::VcaRuleRetrieverPrivate::convertXmlRules(const QString& replyText,
                                                                const QString& relayPath,
                                                                QVariantMap& result) {
    QString copy = withoutTextBlanks(replyText);

    QString camId;
    const QRegularExpressionMatch start = CAM_NAME_START.match(copy);
    const qsizetype end = copy.indexOf(CAM_NAME_END);
    if (start.hasMatch() && end >= 0) {
        const qsizetype first = start.capturedStart() + CAM_NAME_START_LENGTH;
        if (end >= first)
            camId = copy.mid(first, end - first);
    }
    result.insert(VCA_KEY_CAM_ID, camId);
    result.insert(VCA_KEY_RELAY_PATH, relayPath);
    result.insert(VCA_KEY_IS_JSON, false);

    copy.remove(LIVE_ROOT_TAG);
    copy.remove(CAMERA_TAG);
    copy.remove(CAM_NAME_ELEMENT);
    copy.remove(CR_LF);
    result.insert(VCA_KEY_RULES, XML_DECLARATION + (copy.isEmpty() ? EMPTY_RULES : copy));
}

QString VcaRuleRetriever::VcaRuleRetrieverPrivate::rulesToJsonText(const RulesByType& rulesByType) {
    QByteArray json;
    json.append('{');
    for (auto type = rulesByType.constBegin(); type != rulesByType.constEnd(); ++type) {
        if (type != rulesByType.constBegin())
            json.append(',');
        JsonNormaliser::appendString(json, type.key());
        json.append(":{");
        const QMap<QString, QByteArray>& rulesOfType = type.value();
        for (auto rule = rulesOfType.constBegin(); rule != rulesOfType.constEnd(); ++rule) {
            if (rule != rulesOfType.constBegin())
                json.append(',');
            JsonNormaliser::appendString(json, rule.key());
            json.append(':').append(rule.value());
        }
        json.append('}');
    }
    json.append('}');
    return QString::fromUtf8(json);
}

QVariant
VcaRuleRetriever::VcaRuleRetrieverPrivate::convertRecordingReply(const QString& replyText) {
    Trindle trindle;
    const QVariant parsed = trindle.parse(replyText);
    if (!parsed.isValid() || parsed.isNull())
        return {};
    const QList<QVariant> locations =
        Trindle::transContentAsList(valueAt(valueAt(parsed, RECORDING_ROOT), LOCATION));
    const QList<QString> contents = extractJsonRules(replyText.simplified());

    QVariantMap result;
    for (qsizetype i = 0; i < locations.size(); ++i) {
        const QVariantMap location = locations.at(i).toMap();
        // A location beyond the last JsonRules element gets the empty content.
        const QString content = i < contents.size() ? contents.at(i) : QString();
        const bool json = content.isEmpty() || content.startsWith(QLatin1Char('{'));
        QVariantMap entry;
        entry.insert(VCA_KEY_VCA_RULES,
                     json ? percentDecoded(location.value(JSON_RULES).toString())
                          : RECORDING_XML_RULES_PREFIX + content + RECORDING_XML_RULES_SUFFIX);
        entry.insert(VCA_KEY_PROJECTION, decodedOrEmptyObject(location, PROJECTION));
        entry.insert(VCA_KEY_ANALYSIS_ENGINE, decodedOrEmptyObject(location, ANALYSIS_ENGINE));
        entry.insert(VCA_KEY_IS_JSON, json);
        result.insert(location.value(LOC_NAME).toString(), entry);
    }
    return result;
}

QList<QString> VcaRuleRetriever::VcaRuleRetrieverPrivate::extractJsonRules(const QString& text) {
    QList<QString> contents;
    QRegularExpressionMatchIterator matches = JSON_RULES_ELEMENT.globalMatch(text);
    while (matches.hasNext())
        contents.append(matches.next().captured(1));
    return contents;
}
