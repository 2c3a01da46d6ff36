#include "WendrelUrl.h"

#include <gtest/gtest.h>

#include <tuple>

TEST(WendrelUrlTest, FormsTheUrlFromItsParts) {
    // Host, port, TLS, path with query, and the URL they make.
    const std::tuple<const char*, quint16, bool, const char*, const char*> rows[] = {
        // Port 0 is the scheme's default.
        {"cam", 0, false, "/a", "http://cam/a"},
        {"cam", 0, true, "/a", "https://cam/a"},
        {"10.0.0.7", 8080, false, "/a?b", "http://10.0.0.7:8080/a?b"},
        {"::1", 443, true, "/a", "https://[::1]:443/a"},
        {"Cam-2.Example", 0, false, "/a", "http://cam-2.example/a"},
        {"caf\xc3\xa9", 0, false, "/a", "http://xn--caf-dma/a"},
        // Already encoded: escapes and delimiters pass unchanged.
        {"cam", 0, false, "/c.cgi?a=%26&b=%3D&c=%25&d=x&e=y",
         "http://cam/c.cgi?a=%26&b=%3D&c=%25&d=x&e=y"},
        // What may not appear in a URL at all is encoded; a stray "%" alone.
        {"cam", 0, false, "/c.cgi?name=Parking Lot", "http://cam/c.cgi?name=Parking%20Lot"},
        {"cam", 0, false, "/c.cgi?a=%zz&b=%26", "http://cam/c.cgi?a=%25zz&b=%26"},
        {"cam", 0, false, "/c.cgi?name=#1", "http://cam/c.cgi?name=%231"},
        {"cam", 0, false, "c.cgi", "http://cam/c.cgi"},
    };
    for (const auto& [host, port, useSSL, pathWithQuery, url] : rows)
        EXPECT_EQ(
            WendrelUrl::fromParts(host, port, useSSL, pathWithQuery).toEncoded().toStdString(),
            url);
}
