// Rule requests to a VCA plugin that never answers, answers garbage or answers twice, through
// the host's request channel: each client is answered exactly once, with the failure result.
#include "AnswerLedger.h"
#include "FaultyVcaPlugin.h"
#include "PluginHost.h"
#include "PluginQuenvar.h"

#include <QJsonArray>

#include <gtest/gtest.h>

#include <functional>

namespace {

const QString QUENVAR_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const QString VCA_ID = QStringLiteral("2F4484ECD91046658F567F2B3B0FDAFD");
// The wait that the plugin asks of the host for a rule request.
const qint64 HOST_DEADLINE_MS = 15000;
const qint64 PROMPT_MS = 5000;
const QString EMPTY_XML_RULES =
    QStringLiteral("<?xml version='1.0' encoding='UTF-8'?><Rules></Rules>");

QJsonObject metaData(const QString& id, const QStringList& commands = {}) {
    return {{"IID", QUENVAR_PLUGIN_INTERFACE_IID},
            {"MetaData",
             QJsonObject{{"PluginID", id}, {"Commands", QJsonArray::fromStringList(commands)}}}};
}

struct VcaCase {
    const char* name;
    QString command;
    QVariant params;
    bool handled;
    QString code;
    std::function<bool(const QVariant&)> payloadFits;
    bool waitsForDeadline = false;
};

QVariant recordingParams(const QString& location) {
    return QVariantMap{{"locationIDs", QStringList{location}}, {"timestamp", 1700000000}};
}

const VcaCase CASES[] = {
    {"LiveNeverAnswered", "retrieveVcaRawRuleInfo", "silent", false, "-1",
     [](const QVariant& payload) {
         return payload == QVariantMap{{"camID", ""},
                                       {"isJSON", false},
                                       {"relayPath", ""},
                                       {"rules", EMPTY_XML_RULES}};
     },
     true},
    {"LiveAnsweredWithGarbage", "retrieveVcaRawRuleInfo", "garbage", true, "0",
     [](const QVariant& payload) {
         const QVariantMap map = payload.toMap();
         return map.value("isJSON") == false && map.value("relayPath") == VCA_ID &&
                map.value("rules").toString().startsWith("<?xml");
     }},
    {"LiveAnsweredTwice", "retrieveVcaRawRuleInfo", "twice", true, "0",
     [](const QVariant& payload) { return payload.toMap().value("camID") == "first"; }},
    {"RecordingNeverAnswered", "getRecordingVCARule", recordingParams("silent"), false, "-1",
     [](const QVariant& payload) { return !payload.isValid(); }, true},
    {"RecordingAnsweredWithGarbage", "getRecordingVCARule", recordingParams("garbage"), true, "-1",
     [](const QVariant& payload) { return !payload.isValid(); }},
    {"RecordingAnsweredTwice", "getRecordingVCARule", recordingParams("twice"), true, "0",
     [](const QVariant& payload) { return payload.toMap().keys() == QStringList{"first"}; }},
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
        int id = 0;
        for (const VcaCase& c : CASES)
            plugin.Request(c.command, c.params, RequestSenderInfo(), ledger.callback(id++));
        ASSERT_TRUE(ledger.waitForAll(HOST_DEADLINE_MS + PROMPT_MS));
    }

    int id = 0;
    for (const VcaCase& c : CASES) {
        SCOPED_TRACE(c.name);
        const AnswerLedger::Entry answer = ledger.entry(id++);
        EXPECT_EQ(answer.calls, 1);
        EXPECT_EQ(answer.first.handled, c.handled);
        EXPECT_EQ(answer.first.code, c.code);
        EXPECT_EQ(answer.first.message, "");
        EXPECT_TRUE(c.payloadFits(answer.first.payload))
            << qPrintable(answer.first.payload.toString());
        // The host's timer is a coarse one, which may fire up to 5 % early.
        if (c.waitsForDeadline)
            EXPECT_GE(answer.elapsedMs, HOST_DEADLINE_MS * 95 / 100 - 100);
        else
            EXPECT_LT(answer.elapsedMs, PROMPT_MS);
    }
}
