#include "Trindle.h"

#include <QJsonDocument>
#include <QVariantMap>

#include <gtest/gtest.h>

namespace {

struct TreeCase {
    const char* label;
    QString xml;
    QByteArray tree; // as JSON, whose objects, arrays and strings are the tree's; "" for none
};

void PrintTo(const TreeCase& c, std::ostream* out) {
    *out << c.label;
}

class TrindleTreeTest : public ::testing::TestWithParam<TreeCase> {};

TEST_P(TrindleTreeTest, BuildsTheTree) {
    const QVariant tree = Trindle().parse(GetParam().xml);
    EXPECT_EQ(tree, QJsonDocument::fromJson(GetParam().tree).toVariant())
        << QJsonDocument::fromVariant(tree).toJson(QJsonDocument::Compact).constData();
}

INSTANTIATE_TEST_SUITE_P(
    Conventions, TrindleTreeTest,
    ::testing::Values(
        TreeCase{"EmptyElementIsEmptyText", "<a><b/><c></c></a>", R"({"a":{"b":"","c":""}})"},
        TreeCase{"RepeatedChildIsListInOrder", "<a><b>1</b><c>x</c><b>2</b><b>3</b></a>",
                 R"({"a":{"b":["1","2","3"],"c":"x"}})"},
        TreeCase{"RepeatedChildrenWithAttributes", R"(<a><b k="1"/><b k="2">t</b></a>)",
                 R"({"a":{"b":[{"@k":"1"},{"@k":"2","#text":"t"}]}})"},
        TreeCase{"RepeatsCountPerParent", "<a><p><b>1</b></p><p><b>2</b><b>3</b></p></a>",
                 R"({"a":{"p":[{"b":"1"},{"b":["2","3"]}]}})"},
        TreeCase{"EntitiesDecoded",
                 R"(<a t="&lt;&amp;&quot;">x &amp; y &#65;&#x42; &apos;&gt;</a>)",
                 R"({"a":{"@t":"<&\"","#text":"x & y AB '>"}})"},
        TreeCase{"CdataDecoded", "<a>x<![CDATA[<b>&amp;</b>]]>y</a>", R"({"a":"x<b>&amp;</b>y"})"},
        TreeCase{"CommentsAndInstructionsSkipped",
                 "<?xml version=\"1.0\"?><!-- c --><a><!-- x --><?pi data?><b>1<!-- y -->2</b>"
                 "</a><!-- after -->",
                 R"({"a":{"b":"12"}})"},
        TreeCase{"IndentationIsNoText", "<a>\n  <b>1</b>\n\t<c k=\"v\">\n    <d/>\n  </c>\n</a>\n",
                 R"({"a":{"b":"1","c":{"@k":"v","d":""}}})"},
        TreeCase{"TextOnlyElementKeepsItsBlanks", "<a><b>  x  </b><c> </c><d>\n</d></a>",
                 R"({"a":{"b":"  x  ","c":" ","d":"\n"}})"},
        TreeCase{"TextBesideChildrenKeptAsWritten", "<a>\n hello <b/>\n</a>",
                 R"({"a":{"b":"","#text":"\n hello "}})"},
        TreeCase{"NamesAsWritten", R"(<p:a xmlns:p="urn:x" p:k="1"><p:b>2</p:b></p:a>)",
                 R"({"p:a":{"@xmlns:p":"urn:x","@p:k":"1","p:b":"2"}})"},
        TreeCase{"EmptyIsInvalid", "", ""}, TreeCase{"BlanksAreInvalid", "   \n", ""},
        TreeCase{"UnclosedIsInvalid", "<a>", ""},
        TreeCase{"MismatchedIsInvalid", "<a><b></a></b>", ""},
        TreeCase{"TwoRootsAreInvalid", "<a/><b/>", ""},
        TreeCase{"TrailingTextIsInvalid", "<a/>trailing", ""},
        TreeCase{"UndeclaredEntityIsInvalid", "<a>&undeclared;</a>", ""},
        TreeCase{"OnlyACommentIsInvalid", "<!-- only a comment -->", ""}),
    [](const ::testing::TestParamInfo<TreeCase>& info) { return info.param.label; });

TEST(TrindleTest, NestingDepthIsBounded) {
    const auto nested = [](int depth) {
        return QString("<e>").repeated(depth) + "x" + QString("</e>").repeated(depth);
    };
    Trindle trindle;
    QVariant tree = trindle.parse(nested(256));
    for (int level = 0; level < 256; ++level)
        tree = tree.toMap().value("e");
    EXPECT_EQ(tree, QVariant("x"));
    EXPECT_FALSE(trindle.parse(nested(257)).isValid());
    EXPECT_FALSE(trindle.parse(nested(100000)).isValid());
}

TEST(TrindleTest, TransContentAsList) {
    const QVariantMap single{{"@k", "1"}};
    EXPECT_TRUE(Trindle::transContentAsList(QVariant()).isEmpty());
    EXPECT_EQ(Trindle::transContentAsList(QVariant("x")), QList<QVariant>{"x"});
    EXPECT_EQ(Trindle::transContentAsList(single), QList<QVariant>{single});
    EXPECT_EQ(Trindle::transContentAsList(QVariantList{"1", single}),
              (QList<QVariant>{"1", single}));
}

} // namespace
