#include "WendrelUrl.h"

#include <gtest/gtest.h>

#include <ostream>

namespace {

struct UrlCase {
    const char* host;
    quint16 port;
    bool useSSL;
    const char* pathWithQuery;
    const char* expected;
};

void PrintTo(const UrlCase& c, std::ostream* out) {
    *out << c.host << ' ' << c.port << (c.useSSL ? " tls " : " ") << c.pathWithQuery;
}

class WendrelUrlTest : public ::testing::TestWithParam<UrlCase> {};

} // namespace

TEST_P(WendrelUrlTest, FormsTheUrlFromItsParts) {
    const UrlCase& c = GetParam();
    const QUrl url = WendrelUrl::fromParts(QString::fromUtf8(c.host), c.port, c.useSSL,
                                           QString::fromUtf8(c.pathWithQuery));
    EXPECT_EQ(url.toEncoded(), QByteArray(c.expected));
}

INSTANTIATE_TEST_SUITE_P(
    Table, WendrelUrlTest,
    ::testing::Values(
        UrlCase{"cam", 0, false, "/a", "http://cam/a"},
        UrlCase{"cam", 0, true, "/a", "https://cam/a"},
        UrlCase{"10.0.0.7", 8080, false, "/a?b", "http://10.0.0.7:8080/a?b"},
        UrlCase{"::1", 443, true, "/a", "https://[::1]:443/a"},
        // Already encoded: escapes and delimiters pass unchanged.
        UrlCase{"cam", 0, false, "/c.cgi?a=%26&b=%3D&c=%25&d=x&e=y",
                "http://cam/c.cgi?a=%26&b=%3D&c=%25&d=x&e=y"},
        UrlCase{"cam", 0, false, "/p%2Fq?x", "http://cam/p%2Fq?x"},
        // What may not appear in a URL at all is encoded; a stray "%" alone.
        UrlCase{"cam", 0, false, "/c.cgi?name=Parking Lot", "http://cam/c.cgi?name=Parking%20Lot"},
        UrlCase{"cam", 0, false, "/c.cgi?a=%zz&b=%26", "http://cam/c.cgi?a=%25zz&b=%26"},
        UrlCase{"cam", 0, false, "/c.cgi?name=#1", "http://cam/c.cgi?name=%231"},
        UrlCase{"cam", 0, false, "/c.cgi?name=A&B", "http://cam/c.cgi?name=A&B"},
        UrlCase{"cam", 0, false, "c.cgi", "http://cam/c.cgi"}));

TEST(WendrelUrlSchemes, OnlyHttpAndHttpsAreServed) {
    EXPECT_TRUE(WendrelUrl::isHttp(WendrelUrl::fromText("http://cam/x")));
    EXPECT_TRUE(WendrelUrl::isHttp(WendrelUrl::fromText("https://cam/x")));
    EXPECT_FALSE(WendrelUrl::isHttp(WendrelUrl::fromText("file:///etc/passwd")));
    EXPECT_FALSE(WendrelUrl::isHttp(WendrelUrl::fromText("ftp://cam/x")));
}
