#include "Trindle.h"

#include <QDebug>
#include <QVariantMap>

#include <gtest/gtest.h>

namespace {

QString describe(const QVariant& value) {
    QString text;
    QDebug(&text) << value;
    return text;
}

QVariant map(std::initializer_list<std::pair<QString, QVariant>> entries) {
    QVariantMap result;
    for (const auto& [key, value] : entries)
        result.insert(key, value);
    return result;
}

QVariant list(std::initializer_list<QVariant> entries) {
    return QVariantList(entries);
}

struct TreeCase {
    const char* label;
    QString xml;
    QVariant expected;
};

void PrintTo(const TreeCase& c, std::ostream* out) {
    *out << c.label;
}

class TrindleTreeTest : public ::testing::TestWithParam<TreeCase> {};

TEST_P(TrindleTreeTest, BuildsTheTree) {
    const QVariant tree = Trindle().parse(GetParam().xml);
    EXPECT_EQ(tree, GetParam().expected)
        << qPrintable(describe(tree)) << "\nexpected " << qPrintable(describe(GetParam().expected));
}

INSTANTIATE_TEST_SUITE_P(
    Conventions, TrindleTreeTest,
    ::testing::Values(
        TreeCase{"TextOnlyElementIsItsText", "<a>hi</a>", map({{"a", "hi"}})},
        TreeCase{"EmptyElementIsEmptyText", "<a><b/><c></c></a>",
                 map({{"a", map({{"b", ""}, {"c", ""}})}})},
        TreeCase{"AttributesUnderAt", R"(<a x="1" y='two'/>)",
                 map({{"a", map({{"@x", "1"}, {"@y", "two"}})}})},
        TreeCase{"TextBesideAttributes", R"(<a x="1">hi</a>)",
                 map({{"a", map({{"@x", "1"}, {"#text", "hi"}})}})},
        TreeCase{"RepeatedChildIsListInOrder", "<a><b>1</b><c>x</c><b>2</b><b>3</b></a>",
                 map({{"a", map({{"b", list({"1", "2", "3"})}, {"c", "x"}})}})},
        TreeCase{"RepeatedChildrenWithAttributes", R"(<a><b k="1"/><b k="2">t</b></a>)",
                 map({{"a", map({{"b", list({map({{"@k", "1"}}),
                                             map({{"@k", "2"}, {"#text", "t"}})})}})}})},
        TreeCase{
            "RepeatsCountPerParent", "<a><p><b>1</b></p><p><b>2</b><b>3</b></p></a>",
            map({{"a", map({{"p", list({map({{"b", "1"}}), map({{"b", list({"2", "3"})}})})}})}})},
        TreeCase{"EntitiesDecoded",
                 R"(<a t="&lt;&amp;&quot;">x &amp; y &#65;&#x42; &apos;&gt;</a>)",
                 map({{"a", map({{"@t", "<&\""}, {"#text", "x & y AB '>"}})}})},
        TreeCase{"CdataDecoded", "<a>x<![CDATA[<b>&amp;</b>]]>y</a>",
                 map({{"a", "x<b>&amp;</b>y"}})},
        TreeCase{"CommentsAndInstructionsSkipped",
                 "<?xml version=\"1.0\"?><!-- c --><a><!-- x --><?pi data?><b>1<!-- y -->2</b>"
                 "</a><!-- after -->",
                 map({{"a", map({{"b", "12"}})}})},
        TreeCase{"IndentationIsNoText", "<a>\n  <b>1</b>\n\t<c k=\"v\">\n    <d/>\n  </c>\n</a>\n",
                 map({{"a", map({{"b", "1"}, {"c", map({{"@k", "v"}, {"d", ""}})}})}})},
        TreeCase{"TextOnlyElementKeepsItsBlanks", "<a><b>  x  </b><c> </c><d>\n</d></a>",
                 map({{"a", map({{"b", "  x  "}, {"c", " "}, {"d", "\n"}})}})},
        TreeCase{"TextBesideChildrenKeptAsWritten", "<a>\n hello <b/>\n</a>",
                 map({{"a", map({{"b", ""}, {"#text", "\n hello "}})}})},
        TreeCase{"NamesAsWritten", R"(<p:a xmlns:p="urn:x" p:k="1"><p:b>2</p:b></p:a>)",
                 map({{"p:a", map({{"@xmlns:p", "urn:x"}, {"@p:k", "1"}, {"p:b", "2"}})}})},
        TreeCase{"EmptyIsInvalid", "", QVariant()},
        TreeCase{"BlanksAreInvalid", "   \n", QVariant()},
        TreeCase{"UnclosedIsInvalid", "<a>", QVariant()},
        TreeCase{"MismatchedIsInvalid", "<a><b></a></b>", QVariant()},
        TreeCase{"TwoRootsAreInvalid", "<a/><b/>", QVariant()},
        TreeCase{"TrailingTextIsInvalid", "<a/>trailing", QVariant()},
        TreeCase{"UndeclaredEntityIsInvalid", "<a>&undeclared;</a>", QVariant()},
        TreeCase{"OnlyACommentIsInvalid", "<!-- only a comment -->", QVariant()}),
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
    const QVariant single = map({{"@k", "1"}});
    EXPECT_TRUE(Trindle::transContentAsList(QVariant()).isEmpty());
    EXPECT_EQ(Trindle::transContentAsList(QVariant("x")), QList<QVariant>{"x"});
    EXPECT_EQ(Trindle::transContentAsList(single), QList<QVariant>{single});
    EXPECT_EQ(Trindle::transContentAsList(list({"1", single})), (QList<QVariant>{"1", single}));
}

} // namespace
