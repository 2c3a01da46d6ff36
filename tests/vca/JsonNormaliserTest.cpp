#include "QUILImplementation/JsonNormaliser.h"

#include "QUILImplementation/VcaRuleRetrieverPrivate.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <gtest/gtest.h>

#include <string_view>

namespace {

using namespace std::string_view_literals;

QByteArray compactByQt(const QJsonValue& value) {
    const QByteArray array = QJsonDocument(QJsonArray{value}).toJson(QJsonDocument::Compact);
    return array.mid(1, array.size() - 2);
}

// What Qt's own round trip makes of {NAME:TEXT}, with NAME as Qt writes it: the reference the
// normaliser must match.
std::string byQt(const QString& name, const QByteArray& text) {
    const QJsonValue value =
        QJsonDocument::fromJson('{' + compactByQt(name) + ':' + text + '}').object().value(name);
    return value.isUndefined() ? "(invalid)" : compactByQt(value).toStdString();
}

std::string normalised(const QString& name, const QByteArray& text) {
    const std::optional<QByteArray> value = JsonNormaliser::memberValue(name, text);
    return value ? value->toStdString() : "(invalid)";
}

// Rule names: plain, one that the texts below also use as a key, and ones that need escaping or
// that have no UTF-8 form (a lone surrogate).
const QString NAMES[] = {
    QStringLiteral("v"),
    QStringLiteral("w"),
    QStringLiteral(""),
    QString::fromUtf16(u"q\"b\\s/%22\u00e9\U0001F600"),
    QString::fromUtf16(u"n\nt\tz\0e", 7),
    QString::fromUtf16(u"\xdc00"),
    QString::fromUtf16(u"\xd800x"),
};

class JsonNormaliserTest : public testing::TestWithParam<const char*> {};

TEST_P(JsonNormaliserTest, WritesWhatQtsRoundTripWritesUnderAnyName) {
    for (const QString& name : NAMES)
        EXPECT_EQ(normalised(name, GetParam()), byQt(name, GetParam())) << qPrintable(name);
}

INSTANTIATE_TEST_SUITE_P(
    Texts, JsonNormaliserTest,
    testing::Values(
        // Structure: key order, the last of equal keys, nesting, empty containers.
        R"({"b":1,"a":{"d":[1,{"z":0,"y":1}],"c":null},"b":2})", R"({"a":1,"a":2,"a":3})",
        R"({"a":{"b":1},"a":{"c":2}})", R"([[],{},[{}],""])", R"( { "x" : [ true , false ] } )",
        R"({"b":1,"a":2,"c":3,"a":4,"b":5})", R"({"\u0061":1,"a":2})", R"({"":1,"\u0000":2})",
        // The wrapper: a later member of the name, other members, scalars, trailing garbage,
        // truncation.
        R"(1,"v":2)", R"(1,"w":2)", R"(1,"\u0076":2,"v":3,"w":{"v":4})", R"(1,"":2)",
        R"(1,"q\"b\\s/%22\u00e9\ud83d\ude00":2)", R"(1,"\udc00":2)", R"(1,"\ud800x":2)",
        R"("x","v":{"b":1,"a":2},"u":3)", "true", "null", "\"s\"", R"(1}{"a":2)", "", " ", "{",
        "[1,2", "[1,]", "{\"a\":1,}", "nul", "tru",
        // Numbers as Qt reads and writes them.
        "[0,-0,1,-1,123456789012345678,-123456789012345678]",
        "[1234567890123456789,9223372036854775807,9223372036854775808,-9223372036854775808]",
        "[-9223372036854775809,18446744073709551615,123456789012345678901234567890]",
        "[1.0,1.5,-0.0,0.0,1e2,1E+2,1e-2,0.1,0.0001,1e-7,1e15,1e16,1e21,1.5e300,-1e300]",
        "[9007199254740993,9007199254740993.0,12345678901234567.5,4.9e-324,0e0,-0e0]",
        "[1.7976931348623157e308,2.2250738585072014e-308,123456.789,9.2233720368547758e18]",
        "[1e400]", "[1e-400]", "[1.]", "[01]", "[-]", "[.5]", "[+1]", "[1e]", "[0x10]", "[NaN]",
        "[Infinity]",
        // Strings: escapes in, Qt's escapes out, Unicode kept as UTF-8.
        R"(["\u0000\u001f\u007f\b\f\n\r\t\"\\\/"])",
        "[\"\x7f\xc3\xa9\xe2\x82\xac\xf0\x9f\x98\x80\"]", R"(["\ud83d\ude00","\u00e9\u20ac"])",
        R"(["\ud800"])", R"(["\udc00x"])", R"(["\a\q"])", "[\"raw\ttab\"]", "[\"line\nbreak\"]",
        "[\"\xc3\"]", "[\"\xed\xa0\x80\"]",
        // Keys beyond the BMP, whose order in Qt depends on how the key was stored.
        "{\"\xef\xbf\xbf\":1,\"\xf0\x90\x80\x80\":2}", R"({"\uffff":1,"\ud800\udc00":2})",
        "{\"\xf0\x90\x80\x80\":1,\"\\uffff\":2}",
        // Invalid literals.
        "[truth]", "[nulll]", "[False]"));

TEST(JsonNormaliserTest, DeepTextsAndAnEmbeddedNulAreReadAsQtReadsThem) {
    std::vector<QByteArray> texts{QByteArray("1}\0{\"a\":2", 9)};
    // Both sides of Qt's limit.
    for (const int depth : {500, 1022, 1023, 1024, 5000})
        texts.push_back(QByteArray(depth, '[') + QByteArray(depth, ']'));
    for (const QByteArray& text : texts)
        EXPECT_EQ(normalised("v", text), byQt("v", text)) << text.size();
}

// Types and names in the order and escaping of a QJsonObject: blanks, controls, NUL, beyond the
// BMP, lone surrogates; separated by "|".
TEST(JsonNormaliserTest, RulesTextIsWhatQtWritesForTheSameMap) {
    const QStringList names =
        QStringView(u"b|\xffff|\U00010000|a\"q\\\n||\"\\/\b\f\n\r\t\x01\x1f\x7f|\0|"
                    u"\u00e9\u20ac\U0001F600|\xd800x|\xdc00|\xd83d|\xd83d\xd83d\xde00"sv)
            .toString()
            .split(u'|');
    VcaRuleRetriever::VcaRuleRetrieverPrivate::RulesByType rules;
    QJsonObject expected;
    for (const QString& type : names) {
        QJsonObject ofType;
        QMap<QString, QByteArray>& ours = rules[type];
        for (const QString& name : names) {
            ofType.insert(name, name.size());
            ours.insert(name, QByteArray::number(name.size()));
        }
        expected.insert(type, ofType);
    }
    rules.insert(QStringLiteral("empty"), {});
    expected.insert(QStringLiteral("empty"), QJsonObject());
    EXPECT_EQ(VcaRuleRetriever::VcaRuleRetrieverPrivate::rulesToJsonText(rules),
              QString::fromUtf8(QJsonDocument(expected).toJson(QJsonDocument::Compact)));
}

} // namespace
