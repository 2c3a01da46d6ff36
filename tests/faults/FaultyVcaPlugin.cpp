#include "FaultyVcaPlugin.h"

namespace {

const QString GARBAGE =
    QStringLiteral("<GetVCARulesRes><Camera><CamName>cam</CamName><Rules Format=\"json\">"
                   "<Rule Type=\"&bogus;\" Name=\"%zz\">{not json\x01</Rule><![CDATA[\xff");

QString liveReply(const QString& camera) {
    return QStringLiteral("<GetVCARulesRes><Camera><CamName>%1</CamName><Rules Format=\"json\">"
                          "<Rule Type=\"Intrusion\" Name=\"Door\">{}</Rule></Rules></Camera>"
                          "</GetVCARulesRes>")
        .arg(camera);
}

QString recordingReply(const QString& location) {
    return QStringLiteral("<GetRecordingVCARulesRes><Location><LocName>%1</LocName>"
                          "<JsonRules>{}</JsonRules></Location></GetRecordingVCARulesRes>")
        .arg(location);
}

} // namespace

void FaultyVcaPlugin::Request(const QString& command, const QVariant& params,
                              const RequestSenderInfo&, ResponseCallback callback) {
    const QString content = params.toString();
    const bool live = command == QStringLiteral("GetVCARules");
    const auto reply = live ? liveReply : recordingReply;
    if (content.contains(QStringLiteral("silent"))) {
        unanswered.append(callback);
    } else if (content.contains(QStringLiteral("garbage"))) {
        callback(true, QStringLiteral("0"), QString(), GARBAGE);
    } else if (content.contains(QStringLiteral("twice"))) {
        callback(true, QStringLiteral("0"), QString(), reply(QStringLiteral("first")));
        callback(true, QStringLiteral("0"), QString(), reply(QStringLiteral("second")));
    }
}
