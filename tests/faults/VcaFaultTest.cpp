// Rule requests from another thread to a VCA plugin that never answers (or only after the
// deadline), answers garbage or answers twice, through the host's request channel: the plugin
// is called in the host's main thread, and each client is answered exactly once, later, with the
// failure result.
#include "AnswerLedger.h"
#include "PluginHost.h"
#include "PluginQuenvar.h"

#include <QCoreApplication>
#include <QJsonArray>
#include <QJsonDocument>
#include <QThread>

#include <gtest/gtest.h>

#include <thread>

namespace {

const QString QUENVAR_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const QString VCA_ID = QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD");
// The wait that the plugin asks of the host for a rule request.
const qint64 HOST_DEADLINE_MS = 15000;
const qint64 PROMPT_MS = 5000;

// Misbehaves as the request asks: an identifier holding "silent" is never answered, "garbage" is
// answered with text that is no XML, and "twice" twice, for "first" and then for "second".
class FaultyVcaPlugin : public IPluginObjectBase {
    Q_OBJECT

public:
    bool InitialPluginBase(IFrameworkTools*) override { return true; }
    void Request(const QString& command, const QVariant& params, const RequestSenderInfo&,
                 ResponseCallback callback) override {
        EXPECT_EQ(QThread::currentThread(), QCoreApplication::instance()->thread());
        const QString content = params.toString();
        const QString reply =
            command == "GetVCARules"
                ? "<GetVCARulesRes><Camera><CamName>%1</CamName><Rules Format=\"json\">"
                  "<Rule Type=\"Intrusion\" Name=\"Door\">{}</Rule></Rules></Camera>"
                  "</GetVCARulesRes>"
                : "<GetRecordingVCARulesRes><Location><LocName>%1</LocName>"
                  "<JsonRules>{}</JsonRules></Location></GetRecordingVCARulesRes>";
        if (content.contains("silent")) {
            unanswered.append(callback);
        } else if (content.contains("garbage")) {
            callback(true, "0", QString(),
                     "<GetVCARulesRes><Camera><CamName>cam</CamName><Rules Format=\"json\">"
                     "<Rule Type=\"&bogus;\" Name=\"%zz\">{not json\x01</Rule><![CDATA[\xff");
        } else if (content.contains("twice")) {
            callback(true, "0", QString(), reply.arg("first"));
            callback(true, "0", QString(), reply.arg("second"));
        }
    }
    void RequestBlock(const QString&, const QVariant&, const RequestSenderInfo&,
                      IResponser&) override {}
    void SubscribeEventBlock(const QString&, const QString&, const QVariant&,
                             const RequestSenderInfo&, IResponser&) override {}
    void UnsubscribeEventBlock(const QString&, const QVariant&, IResponser&) override {}

    QList<ResponseCallback> unanswered;

signals:
    void vcaMetadataChanged(const QString& cameraID);
};

QJsonObject metaData(const QString& id, const QStringList& commands = {}) {
    return {{"IID", QUENVAR_PLUGIN_INTERFACE_IID},
            {"MetaData",
             QJsonObject{{"PluginID", id}, {"Commands", QJsonArray::fromStringList(commands)}}}};
}

QVariant recordingParams(const QString& location) {
    return QVariantMap{{"locationIDs", QStringList{location}}, {"timestamp", 1700000000}};
}

struct VcaCase {
    const char* name;
    QString command;
    QVariant params;
    QString answer; // as compact JSON; a final * stands for any rest
    bool waitsForDeadline = false;
};

const QString LIVE = QStringLiteral("retrieveVcaRawRuleInfo");
const QString RECORDING = QStringLiteral("getRecordingVCARule");
const VcaCase CASES[] = {
    {"LiveNeverAnswered", LIVE, "silent",
     R"({"code":"-1","handled":false,"message":"","payload":{"camID":"","isJSON":false,)"
     R"("relayPath":"","rules":"<?xml version='1.0' encoding='UTF-8'?><Rules></Rules>"}})",
     true},
    {"LiveAnsweredWithGarbage", LIVE, "garbage",
     R"({"code":"0","handled":true,"message":"","payload":{"camID":"cam","isJSON":false,)"
     R"("relayPath":"2F4484ECD91046658F567F2B3B0FDAFD","rules":"<?xml*)"},
    {"LiveAnsweredTwice", LIVE, "twice",
     R"({"code":"0","handled":true,"message":"","payload":{"camID":"first","isJSON":true,)"
     R"("relayPath":"2F4484ECD91046658F567F2B3B0FDAFD",)"
     R"("rules":"{\"Intrusion\":{\"Door\":{}}}"}})"},
    {"RecordingNeverAnswered", RECORDING, recordingParams("silent"),
     R"({"code":"-1","handled":false,"message":"","payload":null})", true},
    {"RecordingAnsweredWithGarbage", RECORDING, recordingParams("garbage"),
     R"({"code":"-1","handled":true,"message":"","payload":null})"},
    {"RecordingAnsweredTwice", RECORDING, recordingParams("twice"),
     R"({"code":"0","handled":true,"message":"","payload":{"first":{"analysisEngine":"{}",)"
     R"("isJSON":true,"projection":"{}","vcaRules":"{}"}}})"},
};

} // namespace

TEST(VcaFaultTest, EveryRuleRequestIsAnsweredOnceWithTheFailureResult) {
    // The plugins outlive the host, which drops what is still pending for them first.
    FaultyVcaPlugin vca;
    PluginQuenvar plugin;
    AnswerLedger ledger;
    {
        PluginHost host;
        ASSERT_TRUE(host.addPlugin(&vca, metaData(VCA_ID, {"GetVCARules", "GetRecordingVCARules"}),
                                   "faulty VCA plugin"));
        ASSERT_TRUE(host.addPlugin(&plugin, metaData(QUENVAR_ID), "PluginQuenvar"));
        host.start();

        // All at once: the two that wait for the host's deadline wait together.
        std::thread([&] {
            int id = 0;
            for (const VcaCase& c : CASES)
                plugin.Request(c.command, c.params, RequestSenderInfo(), ledger.callback(id++));
        }).join();
        EXPECT_EQ(ledger.calls(), 0) << "answered within the request";
        ASSERT_TRUE(ledger.waitForAll(HOST_DEADLINE_MS + PROMPT_MS));
        for (const ResponseCallback& late : vca.unanswered)
            late(true, "0", QString(), "<GetVCARulesRes/>");
        QCoreApplication::processEvents();
    }

    int id = 0;
    for (const VcaCase& c : CASES) {
        SCOPED_TRACE(c.name);
        const AnswerLedger::Entry answer = ledger.entry(id++);
        EXPECT_EQ(answer.calls, 1);
        const QString text = QJsonDocument(answer.first).toJson(QJsonDocument::Compact);
        if (c.answer.endsWith('*'))
            EXPECT_TRUE(text.startsWith(c.answer.chopped(1))) << qPrintable(text);
        else
            EXPECT_EQ(text, c.answer);
        // The host's timer is a precise one; the margin is for rounding to milliseconds.
        if (c.waitsForDeadline)
            EXPECT_GE(answer.elapsedMs, HOST_DEADLINE_MS - 5);
        else
            EXPECT_LT(answer.elapsedMs, PROMPT_MS);
    }
}

#include "VcaFaultTest.moc"
