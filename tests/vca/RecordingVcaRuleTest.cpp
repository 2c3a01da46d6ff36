#include "FakeFrameworkTools.h"
#include "QUILImplementation/VcaRuleRetriever.h"
#include "RecordedAnswer.h"

#include <gtest/gtest.h>

namespace {

const QString XML_RULES_PREFIX = QStringLiteral(
    "<?xml version='1.0' encoding='UTF-8'?><Projection /><AE /><Rules Format = \"xml\">");

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

// Answers one recording request with the reply and returns what the client received.
RecordedAnswer answerRecording(const QString& statusCode, const QString& replyText,
                               bool success = true, bool flag = true) {
    FakeFrameworkTools tools;
    VcaRuleRetriever retriever(&tools);
    auto answer = std::make_shared<RecordedAnswer>();
    retriever.getRecordingVcaRule({"L1", "L2"}, 1700000000, RecordedAnswer::recorder(answer));
    tools.channel.reply(0, success, "message", "relay", statusCode, replyText, flag);
    EXPECT_EQ(answer->calls, 1);
    EXPECT_TRUE(answer->message.isEmpty());
    return *answer;
}

struct StatusCase {
    bool success;
    QString statusCode;
    QString code;
};

class RecordingStatusTest : public ::testing::TestWithParam<StatusCase> {};

TEST_P(RecordingStatusTest, FailsOnHostFailureOrBit31) {
    const QString reply = recordingReply("<Location><LocName>L1</LocName></Location>");
    for (const bool flag : {true, false}) {
        const RecordedAnswer answer =
            answerRecording(GetParam().statusCode, reply, GetParam().success, flag);
        EXPECT_EQ(answer.handled, flag);
        EXPECT_EQ(answer.code, GetParam().code);
        if (GetParam().code == "0")
            EXPECT_EQ(answer.payload, QVariant(QVariantMap{{"L1", entry("", true)}}));
        else
            EXPECT_FALSE(answer.payload.isValid());
    }
}

INSTANTIATE_TEST_SUITE_P(
    StatusCodes, RecordingStatusTest,
    ::testing::Values(StatusCase{true, "80000000", "-1"}, StatusCase{true, "FFFFFFFF", "-1"},
                      StatusCase{true, "0x8000ABCD", "-1"}, StatusCase{false, "0", "-1"},
                      StatusCase{true, "0", "0"}, StatusCase{true, "1", "0"},
                      StatusCase{true, "7fffffff", "0"}, StatusCase{true, "100000000", "0"},
                      StatusCase{true, "xyz", "0"}));

struct ReplyCase {
    const char* label;
    QString locations;
    QVariantMap expected;
};

void PrintTo(const ReplyCase& c, std::ostream* out) {
    *out << c.label;
}

class RecordingReplyTest : public ::testing::TestWithParam<ReplyCase> {};

TEST_P(RecordingReplyTest, AnswersOneEntryPerLocation) {
    const RecordedAnswer answer = answerRecording("0", recordingReply(GetParam().locations));
    EXPECT_EQ(answer.code, "0");
    EXPECT_EQ(answer.payload, QVariant(GetParam().expected));
}

INSTANTIATE_TEST_SUITE_P(
    Replies, RecordingReplyTest,
    ::testing::Values(
        ReplyCase{"JsonForm",
                  "<Location><LocName>L1</LocName><JsonRules>{\"A\":%20\"caf%C3%A9\"}</JsonRules>"
                  "<Projection>%7B%22p%22%3A1%7D</Projection>"
                  "<AnalysisEngine>%7B%22e%22%3A2%7D</AnalysisEngine></Location>",
                  {{"L1", entry("{\"A\": \"caf\xC3\xA9\"}", true, "{\"p\":1}", "{\"e\":2}")}}},
        ReplyCase{"XmlForm",
                  "<Location>\n  <LocName>L1</LocName>\n  <JsonRules><Rule Type=\"A\">x \n\t y"
                  "</Rule><Rule Type=\"B\"/></JsonRules>\n</Location>\n",
                  {{"L1", entry(XML_RULES_PREFIX +
                                    "<Rule Type=\"A\">x y</Rule><Rule Type=\"B\"/></Rules>",
                                false)}}},
        ReplyCase{"EmptyAndSelfClosingRules",
                  "<Location><LocName>L1</LocName><JsonRules></JsonRules></Location>"
                  "<Location><LocName>L2</LocName><JsonRules/></Location>"
                  "<Location><LocName>L3</LocName><JsonRules /></Location>",
                  {{"L1", entry("", true)}, {"L2", entry("", true)}, {"L3", entry("", true)}}},
        ReplyCase{"WhiteSpaceBeforeJsonMakesXmlForm",
                  "<Location><LocName>L1</LocName><JsonRules>\n  {\"a\":1}</JsonRules></Location>",
                  {{"L1", entry(XML_RULES_PREFIX + " {\"a\":1}</Rules>", false)}}},
        ReplyCase{"AbsentAndEmptyProjection",
                  "<Location><LocName>L1</LocName><JsonRules>{}</JsonRules></Location>"
                  "<Location><LocName>L2</LocName><JsonRules>{}</JsonRules><Projection/>"
                  "<AnalysisEngine></AnalysisEngine></Location>",
                  {{"L1", entry("{}", true)}, {"L2", entry("{}", true, "", "")}}},
        ReplyCase{"LaterLocNameStands",
                  "<Location><LocName>L1</LocName><JsonRules>{\"n\":1}</JsonRules></Location>"
                  "<Location><LocName>L1</LocName><JsonRules>{\"n\":2}</JsonRules></Location>",
                  {{"L1", entry("{\"n\":2}", true)}}},
        ReplyCase{"NoLocName",
                  "<Location><JsonRules>{}</JsonRules></Location>",
                  {{"", entry("{}", true)}}},
        ReplyCase{"NoLocation", "", {}},
        ReplyCase{"FewerRuleContentsThanLocations",
                  "<Location><LocName>L1</LocName><JsonRules><Rule/></JsonRules></Location>"
                  "<Location><LocName>L2</LocName></Location>"
                  "<Location><LocName>L3</LocName><Projection>p</Projection></Location>",
                  {{"L1", entry(XML_RULES_PREFIX + "<Rule/></Rules>", false)},
                   {"L2", entry("", true)},
                   {"L3", entry("", true, "p")}}}),
    [](const ::testing::TestParamInfo<ReplyCase>& info) { return info.param.label; });

TEST(RecordingVcaRuleTest, SelfClosingRootIsAnEmptyMap) {
    const RecordedAnswer answer = answerRecording("0", "<GetRecordingVCARulesRes/>");
    EXPECT_EQ(answer.code, "0");
    EXPECT_TRUE(answer.payload.isValid());
    EXPECT_EQ(answer.payload, QVariant(QVariantMap()));
}

TEST(RecordingVcaRuleTest, ReplyThatIsNotXmlFails) {
    for (const QString& reply : {QString(), QStringLiteral("not xml"),
                                 QStringLiteral("<GetRecordingVCARulesRes><Location>")}) {
        for (const bool flag : {true, false}) {
            const RecordedAnswer answer = answerRecording("0", reply, true, flag);
            EXPECT_EQ(answer.handled, flag);
            EXPECT_EQ(answer.code, "-1");
            EXPECT_FALSE(answer.payload.isValid());
        }
    }
}

} // namespace
