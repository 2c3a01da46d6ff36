#include "HostJson.h"

#include <gtest/gtest.h>

struct ParameterCase {
    const char* json;
    QVariant expected;
};

class HostJsonParameterTest : public ::testing::TestWithParam<ParameterCase> {};

TEST_P(HostJsonParameterTest, ConvertsEveryKindOfValue) {
    QVariant parameter(QStringLiteral("unset"));
    QString error;
    ASSERT_TRUE(HostJson::parseParameter(GetParam().json, &parameter, &error)) << qPrintable(error);
    EXPECT_EQ(parameter.metaType(), GetParam().expected.metaType());
    EXPECT_EQ(parameter, GetParam().expected);
}

INSTANTIATE_TEST_SUITE_P(
    Values, HostJsonParameterTest,
    ::testing::Values(ParameterCase{R"({"host":"h","port":80,"useSSL":false})",
                                    QVariantMap{{"host", "h"}, {"port", 80.0}, {"useSSL", false}}},
                      ParameterCase{R"("cam 1")", QStringLiteral("cam 1")},
                      ParameterCase{" 12.5 ", 12.5}, ParameterCase{"true", true},
                      ParameterCase{R"(["a",1])", QVariantList{"a", 1.0}},
                      ParameterCase{"null", QVariant()}));

class HostJsonRejectTest : public ::testing::TestWithParam<const char*> {};

TEST_P(HostJsonRejectTest, RejectsWhatIsNotOneJsonValue) {
    QVariant parameter;
    QString error;
    EXPECT_FALSE(HostJson::parseParameter(GetParam(), &parameter, &error));
    EXPECT_FALSE(error.isEmpty());
}

INSTANTIATE_TEST_SUITE_P(Texts, HostJsonRejectTest,
                         ::testing::Values("", "  ", "{", "cam1", "1 2", "1],[2", "1,2"));
