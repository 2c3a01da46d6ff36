#include "QUILImplementation/VcaRuleRetrieverPrivate.h"

#include <gtest/gtest.h>

namespace {

using Private = VcaRuleRetriever::VcaRuleRetrieverPrivate;

const QString XML_DECLARATION = QStringLiteral("<?xml version='1.0' encoding='UTF-8'?>");

QString liveReply(const QString& format, const QString& rules) {
    return QStringLiteral("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\r\n<GetVCARulesRes>\r\n"
                          "  <Camera>\r\n    <CamName>Front door</CamName>\r\n"
                          "    <Rules Format=\"%1\">\r\n%2    </Rules>\r\n  </Camera>\r\n"
                          "</GetVCARulesRes>\r\n")
        .arg(format, rules);
}

struct JsonCase {
    const char* label;
    QString rules;
    QString expected;
};

void PrintTo(const JsonCase& c, std::ostream* out) {
    *out << c.label;
}

class JsonRulesTest : public ::testing::TestWithParam<JsonCase> {};

TEST_P(JsonRulesTest, ConvertsToSortedCompactJson) {
    const QVariantMap result =
        Private::convertLiveReply(liveReply("json", GetParam().rules), "relay/1");
    EXPECT_EQ(result.value("rules").toString(), GetParam().expected);
    EXPECT_EQ(result.value("isJSON"), QVariant(true));
    EXPECT_EQ(result.value("camID").toString(), "Front door");
    EXPECT_EQ(result.value("relayPath").toString(), "relay/1");
    EXPECT_EQ(result.size(), 4);
}

INSTANTIATE_TEST_SUITE_P(
    LiveReply, JsonRulesTest,
    ::testing::Values(
        JsonCase{"NoRules", "", "{}"},
        JsonCase{"OneRule", R"(<Rule Type="A" Name="r1">{"x":1}</Rule>)",
                 R"({"A":{"r1":{"x":1}}})"},
        JsonCase{"EscapedBlankInName", R"(<Rule Type="A" Name="r%201">{"x":1}</Rule>)",
                 R"({"A":{"r 1":{"x":1}}})"},
        JsonCase{"Utf8InName", R"(<Rule Type="A" Name="caf%C3%A9">1</Rule>)",
                 "{\"A\":{\"caf\xC3\xA9\":1}}"},
        JsonCase{"PercentTwoInNameNotReplaced", R"(<Rule Type="A" Name="%252">1</Rule>)",
                 R"({"A":{"%2":1}})"},
        JsonCase{
            "LaterDuplicateWins",
            R"(<Rule Type="A" Name="r1">{"x":1}</Rule><Rule Type="A" Name="r1">{"x":2}</Rule>)",
            R"({"A":{"r1":{"x":2}}})"},
        JsonCase{"SortedAndCompact",
                 "<Rule Type=\"B\" Name=\"z\">\n  { \"b\" : 1,\n \"a\" : [ 1, 2 ] }\n</Rule>"
                 "<Rule Type=\"A\" Name=\"z\">true</Rule><Rule Type=\"B\" Name=\"a\">null</Rule>",
                 R"({"A":{"z":true},"B":{"a":null,"z":{"a":[1,2],"b":1}}})"},
        JsonCase{"QuoteInNameKept", R"(<Rule Type="A" Name="say%22hi&quot;">"x"</Rule>)",
                 R"({"A":{"say\"hi\"":"x"}})"},
        JsonCase{"BackslashInNameKept", R"(<Rule Type="A" Name="a%5Cb\n">1</Rule>)",
                 R"({"A":{"a\\b\\n":1}})"},
        JsonCase{"NameCannotAddMembers", R"(<Rule Type="A" Name="x%22:0,%22y">1</Rule>)",
                 R"({"A":{"x\":0,\"y":1}})"},
        JsonCase{"InvalidTextDropsTheRule",
                 R"(<Rule Type="A" Name="r1">{"x":1}</Rule><Rule Type="A" Name="r2">{x:</Rule>)",
                 R"({"A":{"r1":{"x":1}}})"},
        JsonCase{"OnlyRuleInvalidLeavesEmptyType", R"(<Rule Type="A" Name="r1">{x:</Rule>)",
                 R"({"A":{}})"},
        JsonCase{"InvalidLaterRuleRemovesEarlier",
                 R"(<Rule Type="A" Name="r1">1</Rule><Rule Type="A" Name="r1"/>)", R"({"A":{}})"},
        JsonCase{"RuleWithoutAttributes", "<Rule>5</Rule>", R"({"":{}})"},
        JsonCase{
            "EntitiesAndCdataInText",
            R"(<Rule Type="A" Name="r"><![CDATA[{"s":"<&>"}]]></Rule><Rule Type="A" Name="q">"&lt;"</Rule>)",
            R"({"A":{"q":"<","r":{"s":"<&>"}}})"}),
    [](const ::testing::TestParamInfo<JsonCase>& info) { return info.param.label; });

struct XmlCase {
    const char* label;
    QString reply;
    QString camId;
    QString rules;
};

void PrintTo(const XmlCase& c, std::ostream* out) {
    *out << c.label;
}

class XmlRulesTest : public ::testing::TestWithParam<XmlCase> {};

TEST_P(XmlRulesTest, ConvertsToXmlText) {
    const QVariantMap result = Private::convertLiveReply(GetParam().reply, "relay/2");
    EXPECT_EQ(result.value("camID").toString(), GetParam().camId);
    EXPECT_EQ(result.value("rules").toString(), XML_DECLARATION + GetParam().rules);
    EXPECT_EQ(result.value("isJSON"), QVariant(false));
    EXPECT_EQ(result.value("relayPath").toString(), "relay/2");
    EXPECT_EQ(result.size(), 4);
}

INSTANTIATE_TEST_SUITE_P(
    LiveReply, XmlRulesTest,
    ::testing::Values(
        XmlCase{"WrappersRemovedBlanksGone",
                "<GetVCARulesRes>\r\n<Camera>\r\n<CamName>Front door</CamName>\r\n"
                "<Rules Format=\"xml\">\r\n<Rule Type=\"A b\">a b\tc</Rule>\n</Rules>\r\n"
                "</Camera>\r\n</GetVCARulesRes>",
                "Frontdoor", "<Rules Format=\"xml\"><Rule Type=\"A b\">abc</Rule>\n</Rules>"},
        XmlCase{"UpperCaseJsonFormat",
                liveReply("JSON", "<Rule Type=\"A\" Name=\"r\">1</Rule>\r\n"), "Frontdoor",
                "<?xml version=\"1.0\" encoding=\"UTF-8\"?><Rules Format=\"JSON\">"
                "<Rule Type=\"A\" Name=\"r\">1</Rule></Rules>"},
        XmlCase{"LoneLineFeedsStay", "<Rules>\n<Rule/>\r\n<Rule/>\n</Rules>\r\n", "",
                "<Rules>\n<Rule/><Rule/>\n</Rules>"},
        XmlCase{"EmptyReply", "", "", "<Rules></Rules>"},
        XmlCase{"NothingLeft", "<GetVCARulesRes><Camera></Camera></GetVCARulesRes>\r\n", "",
                "<Rules></Rules>"},
        XmlCase{"NotXml", "not xml at all", "", "not xml at all"},
        XmlCase{"NoCamNameStart", "<Camera><Rules/></Camera>", "", "<Rules/>"},
        XmlCase{"NoCamNameEnd", "<Camera><CamName>cam 1<Rules/></Camera>", "",
                "<CamName>cam1<Rules/>"},
        XmlCase{"CamNameEndBeforeStart", "</CamName><CamName>x", "", "</CamName><CamName>x"}),
    [](const ::testing::TestParamInfo<XmlCase>& info) { return info.param.label; });

TEST(VcaRuleConversionTest, JsonFormatNeedsTheExactWord) {
    for (const char* format : {"JSON", "Json", "json ", "xml", ""})
        EXPECT_FALSE(Private::convertLiveReply(liveReply(format, ""), "").value("isJSON").toBool())
            << format;
    EXPECT_TRUE(Private::convertLiveReply(liveReply("json", ""), "").value("isJSON").toBool());
}

TEST(VcaRuleConversionTest, ExtractJsonRulesTakesEachElementOnce) {
    EXPECT_EQ(Private::extractJsonRules("<JsonRules>a</JsonRules><JsonRules/>x<JsonRules />"
                                        "<JsonRules></JsonRules><JsonRules>b</JsonRules>c"
                                        "</JsonRules>"),
              (QList<QString>{"a", "", "", "", "b"}));
    EXPECT_TRUE(Private::extractJsonRules("<Rules/>").isEmpty());
}

} // namespace
