#include "QUILImplementation/VcaRuleRetriever.h"

#include "AllocationFault.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvarDefs.h"
#include "ResponseRecorder.h"

#include <gtest/gtest.h>

#include <functional>
#include <stdexcept>
#include <tuple>

namespace {

using Response = ResponseRecorder::Response;

const QString LIVE_REPLY =
    QStringLiteral("<GetVCARulesRes><Camera><CamName>c</CamName><Rules Format=\"json\">"
                   "<Rule Type=\"A\" Name=\"r\">1</Rule></Rules></Camera></GetVCARulesRes>");
const QVariantMap LIVE_RESULT{
    {"camID", "c"}, {"relayPath", "relay"}, {"isJSON", true}, {"rules", R"({"A":{"r":1}})"}};

QString recordingReply(const QString& locations) {
    return "<?xml version=\"1.0\"?>\n<GetRecordingVCARulesRes>\n" + locations +
           "</GetRecordingVCARulesRes>\n";
}

QVariantMap entry(const QString& vcaRules, bool isJson, const QString& projection = "{}",
                  const QString& analysisEngine = "{}") {
    return {{"vcaRules", vcaRules},
            {"projection", projection},
            {"analysisEngine", analysisEngine},
            {"isJSON", isJson}};
}

class VcaRuleRetrieverTest : public ::testing::Test {
protected:
    // Answers the last request sent.
    void reply(bool success, const QString& statusCode, const QString& text, bool flag) {
        tools.channel.reply(tools.channel.count() - 1, success, "message", "relay", statusCode,
                            text, flag);
    }

    FakeFrameworkTools tools;
    VcaRuleRetriever retriever{&tools};
    ResponseRecorder answers;
};

// An identifier adds no elements and holds no placeholders; the time is signed, as the host's.
TEST_F(VcaRuleRetrieverTest, SendsRecordsWithTheIdentifiersEscaped) {
    const QString id = QString::fromUtf8("caf\xC3\xA9 %1 %2 {} a&b<c>d\"e'f");
    retriever.getLiveVcaRule(id, answers.callback());
    retriever.getRecordingVcaRule({id, "L2"}, 1700000000, answers.callback());
    retriever.getRecordingVcaRule({}, static_cast<quint64>(qint64(-5)), answers.callback());

    QStringList sent;
    for (const FakeRequestChannel::Sent& request : tools.channel.sent()) {
        EXPECT_EQ(request.pluginID, PLUGIN_ID);
        EXPECT_EQ(request.context, FakeRequestChannel::contextValue());
        EXPECT_FALSE(request.info.flag);
        EXPECT_EQ(request.info.timeoutMs, 15000);
        EXPECT_TRUE(request.info.extra.isEmpty());
        sent << QString::number(request.kind) + " " + request.command + " " + request.info.content;
    }
    const QString escaped =
        QString::fromUtf8("caf\xC3\xA9 %1 %2 {} a&amp;b&lt;c&gt;d&quot;e&apos;f");
    EXPECT_EQ(sent.join('\n').toStdString(),
              ("1 GetVCARules <GetVCARules><Cam>" + escaped + "</Cam></GetVCARules>\n" +
               "4 GetRecordingVCARules <GetRecordingVCARules><QueryTime>1700000000</QueryTime>" +
               "<Loc>" + escaped + "</Loc><Loc>L2</Loc></GetRecordingVCARules>\n" +
               "4 GetRecordingVCARules <GetRecordingVCARules><QueryTime>-5</QueryTime>" +
               "</GetRecordingVCARules>")
                  .toStdString());
    EXPECT_TRUE(answers.responses().isEmpty());
}

// The first reply argument is mirrored; the status is hexadecimal, failing with bit 31.
TEST_F(VcaRuleRetrieverTest, StatusDecidesTheCodeOfLiveAndRecordingAnswers) {
    // The reply's success and status, and whether the answer fails.
    const std::tuple<bool, const char*, bool> rows[] = {
        {false, "0", true},       {true, "80000404", true},   {true, "80000000", true},
        {true, "FFFFFFFF", true}, {true, "0x8000ABCD", true}, {true, "0", false},
        {true, "1", false},       {true, "7fffffff", false},  {true, "180000000", false},
        {true, "xyz", false},     {true, "", false}};
    const QString recording = recordingReply("<Location><LocName>L1</LocName></Location>");
    QList<Response> expected;
    bool flag = false;
    for (const auto& [success, status, failed] : rows) {
        flag = !flag;
        retriever.getLiveVcaRule("c", answers.callback());
        reply(success, status, LIVE_REPLY, flag);
        retriever.getRecordingVcaRule({"L1"}, 1, answers.callback());
        reply(success, status, recording, flag);
        const QString code = failed ? "-1" : "0";
        const QVariant recorded = failed ? QVariant() : QVariantMap{{"L1", entry("", true)}};
        expected << Response{flag, code, "", LIVE_RESULT} << Response{flag, code, "", recorded};
    }
    EXPECT_EQ(answers.responses(), expected);
}

const QString XML_RULES_PREFIX = QStringLiteral(
    "<?xml version='1.0' encoding='UTF-8'?><Projection /><AE /><Rules Format = \"xml\">");

struct RecordingCase {
    const char* label;
    QString reply;
    QVariant expected; // invalid: the answer is "-1"
};

void PrintTo(const RecordingCase& row, std::ostream* out) {
    *out << row.label;
}

class RecordingReplyTest
    : public VcaRuleRetrieverTest
    , public ::testing::WithParamInterface<RecordingCase> {};

TEST_P(RecordingReplyTest, AnswersOneEntryPerLocation) {
    retriever.getRecordingVcaRule({"L1", "L2"}, 1700000000, answers.callback());
    reply(true, "0", GetParam().reply, true);
    const QString code = GetParam().expected.isValid() ? "0" : "-1";
    EXPECT_EQ(answers.responses(), (QList<Response>{{true, code, "", GetParam().expected}}));
}

INSTANTIATE_TEST_SUITE_P(
    Replies, RecordingReplyTest,
    ::testing::Values(
        // Absent projection and engine are "{}", empty ones empty.
        RecordingCase{
            "EmptyElements",
            recordingReply("<Location><LocName>L1</LocName><JsonRules></JsonRules><Projection/>"
                           "<AnalysisEngine></AnalysisEngine></Location>"
                           "<Location><LocName>L2</LocName><JsonRules/></Location>"
                           "<Location><LocName>L3</LocName><JsonRules /></Location>"),
            QVariantMap{
                {"L1", entry("", true, "", "")}, {"L2", entry("", true)}, {"L3", entry("", true)}}},
        RecordingCase{"WhiteSpaceBeforeJsonMakesXmlForm",
                      recordingReply("<Location><LocName>L1</LocName><JsonRules>\n  {\"a\":1}"
                                     "</JsonRules></Location>"),
                      QVariantMap{{"L1", entry(XML_RULES_PREFIX + " {\"a\":1}</Rules>", false)}}},
        RecordingCase{
            "LaterLocNameStands",
            recordingReply("<Location><LocName>L1</LocName><JsonRules>{\"n\":1}</JsonRules>"
                           "</Location><Location><LocName>L1</LocName><JsonRules>{\"n\":2}"
                           "</JsonRules></Location>"),
            QVariantMap{{"L1", entry("{\"n\":2}", true)}}},
        RecordingCase{"NoLocation", recordingReply(""), QVariantMap{}},
        RecordingCase{"SelfClosingRoot", "<GetRecordingVCARulesRes/>", QVariantMap{}},
        // Rules text that is not JSON is XML, with its blanks simplified.
        RecordingCase{
            "XmlFormAndFewerRuleContentsThanLocations",
            recordingReply("<Location>\n  <LocName>L1</LocName>\n  <JsonRules><Rule Type=\"A\">x \n"
                           "\t y</Rule><Rule Type=\"B\"/></JsonRules>\n</Location>"
                           "<Location><LocName>L2</LocName></Location>"
                           "<Location><LocName>L3</LocName><Projection>p</Projection></Location>"),
            QVariantMap{{"L1", entry(XML_RULES_PREFIX +
                                         "<Rule Type=\"A\">x y</Rule><Rule Type=\"B\"/></Rules>",
                                     false)},
                        {"L2", entry("", true)},
                        {"L3", entry("", true, "p")}}},
        RecordingCase{"EmptyText", "", QVariant()}, RecordingCase{"NotXml", "not xml", QVariant()},
        RecordingCase{"Unterminated", "<GetRecordingVCARulesRes><Location>", QVariant()}),
    [](const ::testing::TestParamInfo<RecordingCase>& info) { return info.param.label; });

TEST_F(VcaRuleRetrieverTest, ReplyAfterTheRetrieverIsGoneIsStillAnswered) {
    {
        VcaRuleRetriever shortLived(&tools);
        shortLived.getLiveVcaRule("c", answers.callback());
        shortLived.getRecordingVcaRule({"L"}, 1, answers.callback());
    }
    tools.channel.reply(0, true, "", "r", "0", "", true);
    tools.channel.reply(1, true, "", "r", "0", "<GetRecordingVCARulesRes/>", true);
    ASSERT_EQ(answers.responses().size(), 2);
    EXPECT_EQ(answers.responses()[1], (Response{true, "0", "", QVariantMap{}}));
}

// What a reply handler does when something throws inside it: an allocation failing (the one
// exception its own code can meet) before it has answered gives "-1" with the reply's flag; the
// client's callback throwing is not answered again. Either way the client is answered exactly
// once and nothing reaches the host. Each allocation of each handler fails in turn.
TEST_F(VcaRuleRetrieverTest, ReplyHandlersAnswerExactlyOnceWhateverThrowsInside) {
    const struct {
        const char* name;
        bool live;
        const char* status;
        QString text;
        const char* code; // when nothing fails
    } replies[] = {
        {"live", true, "0", LIVE_REPLY, "0"},
        {"live, failed", true, "80000404", LIVE_REPLY, "-1"},
        {"recording", false, "0",
         recordingReply("<Location><LocName>L1</LocName><JsonRules>{\"a\":1}</JsonRules>"
                        "<Projection>%7B%7D</Projection></Location>"),
         "0"},
        {"recording, failed", false, "80000001", "", "-1"},
        {"recording, not XML", false, "0", "not xml", "-1"},
    };
    for (const auto& reply : replies) {
        SCOPED_TRACE(reply.name);
        bool allocationFailed = true;
        for (int count = 0; allocationFailed; ++count) {
            QList<Response> received;
            bool clientThrows = false;
            const ResponseCallback callback = [&](bool handled, const QString& code,
                                                  const QString& message, const QVariant&) {
                AllocationFault::disarm();
                received.append({handled, code, message, QVariant()});
                if (clientThrows)
                    throw std::runtime_error("client failed");
            };
            if (reply.live)
                retriever.getLiveVcaRule("c", callback);
            else
                retriever.getRecordingVcaRule({"L1"}, 1, callback);
            const PluginReplyCallback handler = tools.channel.sent().last().info.callback;
            const bool flag = count % 2 == 0;

            AllocationFault::failAfter(count);
            EXPECT_NO_THROW(handler(true, "", "relay", reply.status, reply.text, flag));
            allocationFailed = AllocationFault::happened();
            AllocationFault::disarm();
            const QString code = allocationFailed ? "-1" : reply.code;
            ASSERT_EQ(received, (QList<Response>{{flag, code, "", QVariant()}})) << count;

            if (!allocationFailed) {
                clientThrows = true;
                received.clear();
                EXPECT_NO_THROW(handler(true, "", "relay", reply.status, reply.text, flag));
                EXPECT_EQ(received, (QList<Response>{{flag, reply.code, "", QVariant()}}));
            }
        }
    }
}

class NoChannelTools : public FakeFrameworkTools {
public:
    IPluginRequestChannel* GetRequestChannel() override { return nullptr; }
};

TEST(VcaRuleRetrieverUnavailableTest, AnswersFailureWithoutPrivateObjectOrChannel) {
    NoChannelTools noChannel;
    ResponseRecorder answers;
    for (VcaRuleRetriever retriever :
         {VcaRuleRetriever(), VcaRuleRetriever(&noChannel), VcaRuleRetriever(nullptr)}) {
        retriever.getLiveVcaRule("c", answers.callback());
        retriever.getRecordingVcaRule({"L"}, 1, answers.callback());
        retriever.getLiveVcaRule("c", ResponseCallback());
    }
    EXPECT_EQ(answers.responses(), QList<Response>(6, Response{false, "-1", "", QVariant()}));
}

} // namespace
