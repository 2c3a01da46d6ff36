#include "QUILImplementation/VcaRuleRetriever.h"

#include "FakeFrameworkTools.h"
#include "RecordedAnswer.h"

#include <gtest/gtest.h>

namespace {

const QString PLUGIN_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const QString EMPTY_XML_RULES =
    QStringLiteral("<?xml version='1.0' encoding='UTF-8'?><Rules></Rules>");

class VcaRuleRetrieverTest : public ::testing::Test {
protected:
    FakeFrameworkTools tools;
    VcaRuleRetriever retriever{&tools};
    std::shared_ptr<RecordedAnswer> answer = std::make_shared<RecordedAnswer>();

    FakeRequestChannel::Sent onlyRequest() const {
        EXPECT_EQ(tools.channel.count(), 1);
        return tools.channel.sent().value(0);
    }
};

struct EscapeCase {
    QString id;
    QString escaped;
};

class RequestEscapingTest
    : public VcaRuleRetrieverTest
    , public ::testing::WithParamInterface<EscapeCase> {};

TEST_P(RequestEscapingTest, LiveRequestCarriesTheCameraEscaped) {
    retriever.getLiveVcaRule(GetParam().id, RecordedAnswer::recorder(answer));
    EXPECT_EQ(onlyRequest().info.content,
              "<GetVCARules><Cam>" + GetParam().escaped + "</Cam></GetVCARules>");
}

TEST_P(RequestEscapingTest, RecordingRequestCarriesEachLocationEscaped) {
    retriever.getRecordingVcaRule({GetParam().id, "L2"}, 1700000000,
                                  RecordedAnswer::recorder(answer));
    EXPECT_EQ(onlyRequest().info.content,
              "<GetRecordingVCARules><QueryTime>1700000000</QueryTime><Loc>" + GetParam().escaped +
                  "</Loc><Loc>L2</Loc></GetRecordingVCARules>");
}

INSTANTIATE_TEST_SUITE_P(
    Identifiers, RequestEscapingTest,
    ::testing::Values(EscapeCase{"Cam-01_x.y", "Cam-01_x.y"},
                      EscapeCase{"caf\xC3\xA9 %1 %2 {}", "caf\xC3\xA9 %1 %2 {}"},
                      EscapeCase{"", ""},
                      EscapeCase{"a&b<c>d\"e'f", "a&amp;b&lt;c&gt;d&quot;e&apos;f"},
                      EscapeCase{"1</Cam><Cam>2", "1&lt;/Cam&gt;&lt;Cam&gt;2"}));

TEST_F(VcaRuleRetrieverTest, LiveRequestRecord) {
    retriever.getLiveVcaRule("cam1", RecordedAnswer::recorder(answer));
    const FakeRequestChannel::Sent sent = onlyRequest();
    EXPECT_EQ(sent.pluginID, PLUGIN_ID);
    EXPECT_EQ(sent.context, FakeRequestChannel::contextValue());
    EXPECT_EQ(sent.kind, 1);
    EXPECT_EQ(sent.command, "GetVCARules");
    EXPECT_FALSE(sent.info.flag);
    EXPECT_EQ(sent.info.timeoutMs, 15000);
    EXPECT_TRUE(sent.info.extra.isEmpty());
    EXPECT_TRUE(static_cast<bool>(sent.info.callback));
    EXPECT_EQ(answer->calls, 0);
}

TEST_F(VcaRuleRetrieverTest, RecordingRequestRecord) {
    retriever.getRecordingVcaRule({}, 5, RecordedAnswer::recorder(answer));
    const FakeRequestChannel::Sent sent = onlyRequest();
    EXPECT_EQ(sent.pluginID, PLUGIN_ID);
    EXPECT_EQ(sent.context, FakeRequestChannel::contextValue());
    EXPECT_EQ(sent.kind, 4);
    EXPECT_EQ(sent.command, "GetRecordingVCARules");
    EXPECT_FALSE(sent.info.flag);
    EXPECT_EQ(sent.info.timeoutMs, 15000);
    EXPECT_TRUE(sent.info.extra.isEmpty());
    EXPECT_EQ(sent.info.content,
              "<GetRecordingVCARules><QueryTime>5</QueryTime></GetRecordingVCARules>");
    EXPECT_EQ(answer->calls, 0);
}

TEST_F(VcaRuleRetrieverTest, RecordingRequestWritesANegativeTime) {
    retriever.getRecordingVcaRule({"L1"}, static_cast<quint64>(qint64(-5)),
                                  RecordedAnswer::recorder(answer));
    EXPECT_EQ(onlyRequest().info.content,
              "<GetRecordingVCARules><QueryTime>-5</QueryTime><Loc>L1</Loc>"
              "</GetRecordingVCARules>");
}

struct LiveOutcomeCase {
    bool success;
    QString statusCode;
    QString code;
};

class LiveOutcomeTest
    : public VcaRuleRetrieverTest
    , public ::testing::WithParamInterface<LiveOutcomeCase> {};

TEST_P(LiveOutcomeTest, AnswersTheCodeWithTheConvertedMap) {
    const QString reply =
        QStringLiteral("<GetVCARulesRes><Camera><CamName>c</CamName><Rules Format=\"json\">"
                       "<Rule Type=\"A\" Name=\"r\">1</Rule></Rules></Camera></GetVCARulesRes>");
    for (const bool flag : {true, false}) {
        retriever.getLiveVcaRule("c", RecordedAnswer::recorder(answer));
        tools.channel.reply(tools.channel.count() - 1, GetParam().success, "message", "relay",
                            GetParam().statusCode, reply, flag);
        EXPECT_EQ(answer->handled, flag);
        EXPECT_EQ(answer->code, GetParam().code);
        EXPECT_TRUE(answer->message.isEmpty());
        const QVariantMap expected{{"camID", "c"},
                                   {"relayPath", "relay"},
                                   {"isJSON", true},
                                   {"rules", R"({"A":{"r":1}})"}};
        EXPECT_EQ(answer->payload, QVariant(expected));
    }
    EXPECT_EQ(answer->calls, 2);
}

INSTANTIATE_TEST_SUITE_P(
    StatusCodes, LiveOutcomeTest,
    ::testing::Values(LiveOutcomeCase{false, "0", "-1"}, LiveOutcomeCase{true, "80000404", "-1"},
                      LiveOutcomeCase{true, "80000000", "-1"},
                      LiveOutcomeCase{true, "FFFFFFFF", "-1"}, LiveOutcomeCase{true, "0", "0"},
                      LiveOutcomeCase{true, "1", "0"}, LiveOutcomeCase{true, "7FFFFFFF", "0"},
                      LiveOutcomeCase{true, "180000000", "0"}, LiveOutcomeCase{true, "xyz", "0"},
                      LiveOutcomeCase{true, "", "0"}));

TEST_F(VcaRuleRetrieverTest, FailedLiveFetchWithEmptyTextAnswersTheEmptyXmlForm) {
    for (const bool flag : {true, false}) {
        retriever.getLiveVcaRule("c", RecordedAnswer::recorder(answer));
        tools.channel.reply(tools.channel.count() - 1, false, QString(), "relay/9", QString(),
                            QString(), flag);
        EXPECT_EQ(answer->handled, flag);
        EXPECT_EQ(answer->code, "-1");
        const QVariantMap expected{
            {"camID", ""}, {"relayPath", "relay/9"}, {"isJSON", false}, {"rules", EMPTY_XML_RULES}};
        EXPECT_EQ(answer->payload, QVariant(expected));
    }
}

TEST_F(VcaRuleRetrieverTest, ReplyAfterTheRetrieverIsGoneIsStillAnswered) {
    {
        VcaRuleRetriever shortLived(&tools);
        shortLived.getLiveVcaRule("c", RecordedAnswer::recorder(answer));
        shortLived.getRecordingVcaRule({"L"}, 1, RecordedAnswer::recorder(answer));
    }
    tools.channel.reply(0, true, QString(), "r", "0", QString(), true);
    EXPECT_EQ(answer->code, "0");
    tools.channel.reply(1, true, QString(), "r", "0", "<GetRecordingVCARulesRes/>", true);
    EXPECT_EQ(answer->code, "0");
    EXPECT_EQ(answer->calls, 2);
}

class NoChannelTools : public FakeFrameworkTools {
public:
    IPluginRequestChannel* GetRequestChannel() override { return nullptr; }
};

TEST(VcaRuleRetrieverUnavailableTest, AnswersFailureWithoutPrivateObjectOrChannel) {
    NoChannelTools noChannel;
    const VcaRuleRetriever withoutChannel(&noChannel);
    const VcaRuleRetriever withoutTools(nullptr);
    for (VcaRuleRetriever retriever : {VcaRuleRetriever(), withoutChannel, withoutTools}) {
        auto live = std::make_shared<RecordedAnswer>();
        auto recording = std::make_shared<RecordedAnswer>();
        live->handled = recording->handled = true;
        retriever.getLiveVcaRule("c", RecordedAnswer::recorder(live));
        retriever.getRecordingVcaRule({"L"}, 1, RecordedAnswer::recorder(recording));
        for (const auto& answer : {live, recording}) {
            EXPECT_EQ(answer->calls, 1);
            EXPECT_FALSE(answer->handled);
            EXPECT_EQ(answer->code, "-1");
            EXPECT_TRUE(answer->message.isEmpty());
            EXPECT_FALSE(answer->payload.isValid());
        }
        retriever.getLiveVcaRule("c", ResponseCallback());
    }
}

} // namespace
