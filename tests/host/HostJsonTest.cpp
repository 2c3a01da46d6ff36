#include "HostJson.h"

#include <gtest/gtest.h>

TEST(HostJsonTest, TakesOneJsonValueOfAnyKindAndNothingElse) {
    const std::pair<const char*, QVariant> accepted[] = {
        {R"({"host":"h","port":80,"useSSL":false})",
         QVariantMap{{"host", "h"}, {"port", 80.0}, {"useSSL", false}}},
        {R"("cam 1")", QStringLiteral("cam 1")},
        {" 12.5 ", 12.5},
        {"true", true},
        {R"(["a",1])", QVariantList{"a", 1.0}},
        {"null", QVariant()},
    };
    for (const auto& [json, expected] : accepted) {
        QVariant parameter(QStringLiteral("unset"));
        QString error;
        EXPECT_TRUE(HostJson::parseParameter(json, &parameter, &error)) << json;
        EXPECT_EQ(parameter.metaType(), expected.metaType()) << json;
        EXPECT_EQ(parameter, expected) << json;
    }
    for (const char* json : {"", "  ", "{", "cam1", "1 2", "1],[2", "1,2"}) {
        QVariant parameter;
        QString error;
        EXPECT_FALSE(HostJson::parseParameter(json, &parameter, &error)) << json;
        EXPECT_FALSE(error.isEmpty()) << json;
    }
}
