#include "QUILImplementation/VcaRuleRetrieverPrivate.h"

#include <gtest/gtest.h>

namespace {

QString liveReply(const QString& format, const QString& rules) {
    return QStringLiteral("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\r\n<GetVCARulesRes>\r\n"
                          "  <Camera>\r\n    <CamName>Front door</CamName>\r\n"
                          "    <Rules Format=\"%1\">\r\n%2    </Rules>\r\n  </Camera>\r\n"
                          "</GetVCARulesRes>\r\n")
        .arg(format, rules);
}

QVariantMap result(const QString& camId, bool isJson, const QString& rules) {
    return {{"camID", camId}, {"relayPath", "relay/1"}, {"isJSON", isJson}, {"rules", rules}};
}

// An XML-form result: the declaration leads the remaining text.
QVariantMap xml(const QString& camId, const QString& rules) {
    return result(camId, false, "<?xml version='1.0' encoding='UTF-8'?>" + rules);
}

struct ConversionCase {
    const char* label;
    QString reply;
    QVariantMap expected;
};

void PrintTo(const ConversionCase& row, std::ostream* out) {
    *out << row.label;
}

class VcaRuleConversionTest : public ::testing::TestWithParam<ConversionCase> {};

TEST_P(VcaRuleConversionTest, ConvertsTheLiveReply) {
    EXPECT_EQ(
        VcaRuleRetriever::VcaRuleRetrieverPrivate::convertLiveReply(GetParam().reply, "relay/1"),
        GetParam().expected);
}

// A JSON-form reply's rules and the result.
ConversionCase jsonCase(const char* label, const QString& rules, const QString& expected) {
    return {label, liveReply("json", rules), result("Front door", true, expected)};
}

INSTANTIATE_TEST_SUITE_P(
    LiveReplies, VcaRuleConversionTest,
    ::testing::Values(
        jsonCase("NoRules", "", "{}"),
        jsonCase("Utf8InName", R"(<Rule Type="A" Name="caf%C3%A9">1</Rule>)",
                 "{\"A\":{\"caf\xC3\xA9\":1}}"),
        jsonCase("DecodedOnce", R"(<Rule Type="A" Name="%252">1</Rule>)", R"({"A":{"%2":1}})"),
        jsonCase(
            "LaterDuplicateWins",
            R"(<Rule Type="A" Name="r1">{"x":1}</Rule><Rule Type="A" Name="r1">{"x":2}</Rule>)",
            R"({"A":{"r1":{"x":2}}})"),
        jsonCase("SortedAndCompact",
                 "<Rule Type=\"B\" Name=\"z\">\n  { \"b\" : 1,\n \"a\" : [ 1, 2 ] }\n</Rule>"
                 "<Rule Type=\"A\" Name=\"z\">true</Rule><Rule Type=\"B\" Name=\"a\">null</Rule>",
                 R"({"A":{"z":true},"B":{"a":null,"z":{"a":[1,2],"b":1}}})"),
        jsonCase("QuoteInNameKept", R"(<Rule Type="A" Name="x%22:0,%22y&quot;">"x"</Rule>)",
                 R"({"A":{"x\":0,\"y\"":"x"}})"),
        jsonCase("BackslashInNameKept", R"(<Rule Type="A" Name="a%5Cb\n">1</Rule>)",
                 R"({"A":{"a\\b\\n":1}})"),
        // The text is read as the member of the rule's name: a later member of that name wins,
        // members of other names do not count.
        jsonCase("LaterMemberOfTheNameWins", R"(<Rule Type="A" Name="r1">1, "r1": 2</Rule>)",
                 R"({"A":{"r1":2}})"),
        jsonCase("MemberOfAnotherNameIgnored", R"(<Rule Type="A" Name="r1">1, "v": 2</Rule>)",
                 R"({"A":{"r1":1}})"),
        jsonCase("QuoteBackslashAndEscapedQuoteInName",
                 R"(<Rule Type="A" Name="a&quot;b\c%22d">[1],"a\"b\\c\"d":{"x":2}</Rule>)",
                 R"({"A":{"a\"b\\c\"d":{"x":2}}})"),
        jsonCase("InvalidTextDropsTheRule",
                 R"(<Rule Type="A" Name="r1">{"x":1}</Rule><Rule Type="A" Name="r2">{x:</Rule>)",
                 R"({"A":{"r1":{"x":1}}})"),
        jsonCase("InvalidLaterRuleRemovesEarlier",
                 R"(<Rule Type="A" Name="r1">1</Rule><Rule Type="A" Name="r1"/>)", R"({"A":{}})"),
        jsonCase("EntitiesAndCdataInText",
                 R"(<Rule Type="A" Name="r"><![CDATA[{"s":"<&>"}]]></Rule>)"
                 R"(<Rule Type="A" Name="q">"&lt;"</Rule>)",
                 R"({"A":{"q":"<","r":{"s":"<&>"}}})"),
        ConversionCase{"UpperCaseJsonFormatIsXml",
                       liveReply("JSON", "<Rule Type=\"A\" Name=\"r\">1</Rule>\r\n"),
                       xml("Frontdoor", "<?xml version=\"1.0\" encoding=\"UTF-8\"?>"
                                        "<Rules Format=\"JSON\"><Rule Type=\"A\" Name=\"r\">1"
                                        "</Rule></Rules>")},
        ConversionCase{"WrappersAndTextBlanksRemoved",
                       "<GetVCARulesRes>\r\n<Camera>\r\n<CamName>Front door</CamName>\r\n"
                       "<Rules Format=\"xml\">\r\n<Rule Type=\"A b\">a b\tc</Rule>\n</Rules>\r\n"
                       "</Camera>\r\n</GetVCARulesRes>",
                       xml("Frontdoor", "<Rules Format=\"xml\"><Rule Type=\"A b\">abc</Rule>\n"
                                        "</Rules>")},
        ConversionCase{"LoneLineFeedsStay", "<Rules>\n<Rule/>\r\n<Rule/>\n</Rules>\r\n",
                       xml("", "<Rules>\n<Rule/><Rule/>\n</Rules>")},
        ConversionCase{"NothingLeft", "<GetVCARulesRes><Camera></Camera></GetVCARulesRes>\r\n",
                       xml("", "<Rules></Rules>")},
        ConversionCase{"NotXml", "not xml at all", xml("", "not xml at all")},
        ConversionCase{"NoCamNameStart", "<Camera><Rules/></Camera>", xml("", "<Rules/>")},
        ConversionCase{"NoCamNameEnd", "<Camera><CamName>cam 1<Rules/></Camera>",
                       xml("", "<CamName>cam1<Rules/>")},
        ConversionCase{"CamNameEndBeforeStart", "</CamName><CamName>x",
                       xml("", "</CamName><CamName>x")}),
    [](const ::testing::TestParamInfo<ConversionCase>& info) { return info.param.label; });

} // namespace
