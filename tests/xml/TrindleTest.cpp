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
    const TreeCase& c = GetParam();
    Trindle trindle;
    const QVariant tree = trindle.parse(c.xml);
    EXPECT_EQ(tree, c.expected) << qPrintable(describe(tree)) << "\nexpected "
                                << qPrintable(describe(c.expected));
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
        TreeCase{"AttributeAndChildOfOneName", R"(<a b="1"><b>2</b></a>)",
                 map({{"a", map({{"@b", "1"}, {"b", "2"}})}})},
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
        TreeCase{"EntitiesFromTheDocumentType",
                 R"(<!DOCTYPE a [<!ENTITY who "world">]><a>hello &who;</a>)",
                 map({{"a", "hello world"}})},
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
        TreeCase{"CdataBlanksBesideChildrenKept", "<a><![CDATA[ ]]><b/></a>",
                 map({{"a", map({{"b", ""}, {"#text", " "}})}})},
        TreeCase{"LineEndsNormalised", "<a>1\r\n2</a>", map({{"a", "1\n2"}})},
        TreeCase{"NamesAsWritten", R"(<p:a xmlns:p="urn:x" p:k="1"><p:b>2</p:b></p:a>)",
                 map({{"p:a", map({{"@xmlns:p", "urn:x"}, {"@p:k", "1"}, {"p:b", "2"}})}})}),
    [](const ::testing::TestParamInfo<TreeCase>& info) { return info.param.label; });

class TrindleInvalidTest : public ::testing::TestWithParam<const char*> {};

TEST_P(TrindleInvalidTest, GivesAnInvalidVariant) {
    Trindle trindle;
    const QVariant tree = trindle.parse(QString::fromUtf8(GetParam()));
    EXPECT_FALSE(tree.isValid()) << qPrintable(describe(tree));
}

INSTANTIATE_TEST_SUITE_P(Malformed, TrindleInvalidTest,
                         ::testing::Values("", "   \n", "plain text", "<a>", "<a></b>", "<a/><b/>",
                                           "<a/>trailing", "<a x=1/>", "<a x='1' x='2'/>",
                                           "<a>&undeclared;</a>", "<a><b></a></b>",
                                           "<!-- only a comment -->", "<?xml version=\"1.0\"?>"));

TEST(TrindleTest, RepeatedChildrenKeepDocumentOrderAtScale) {
    QString xml = QStringLiteral("<r>");
    for (int i = 0; i < 1000; ++i)
        xml += QStringLiteral("<e n=\"%1\">%1</e>").arg(i);
    xml += QStringLiteral("</r>");
    Trindle trindle;
    const QList<QVariant> entries =
        Trindle::transContentAsList(trindle.parse(xml).toMap().value("r").toMap().value("e"));
    ASSERT_EQ(entries.size(), 1000);
    for (int i = 0; i < 1000; ++i) {
        const QVariantMap entry = entries.at(i).toMap();
        ASSERT_EQ(entry.value("@n").toString(), QString::number(i));
        ASSERT_EQ(entry.value("#text").toString(), QString::number(i));
    }
}

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
    EXPECT_TRUE(Trindle::transContentAsList(QVariant()).isEmpty());
    EXPECT_EQ(Trindle::transContentAsList(QVariant("x")), QList<QVariant>{"x"});
    EXPECT_EQ(Trindle::transContentAsList(QVariant("")), QList<QVariant>{""});
    const QVariant single = map({{"@k", "1"}});
    EXPECT_EQ(Trindle::transContentAsList(single), QList<QVariant>{single});
    EXPECT_EQ(Trindle::transContentAsList(list({"1", single})), (QList<QVariant>{"1", single}));

    Trindle trindle;
    const QVariantMap one = trindle.parse("<a><b>1</b></a>").toMap().value("a").toMap();
    EXPECT_EQ(Trindle::transContentAsList(one.value("b")), QList<QVariant>{"1"});
    EXPECT_TRUE(Trindle::transContentAsList(one.value("missing")).isEmpty());
}

} // namespace
