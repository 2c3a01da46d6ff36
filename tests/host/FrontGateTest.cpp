#include "FrontGate.h"

#include <gtest/gtest.h>

namespace {

const char TOKEN[] = "0123456789abcdef-token";

struct GateCase {
    const char* name;
    const char* host; // null: no such header
    const char* origin;
    const char* authorization;
    int status;
};

void PrintTo(const GateCase& c, std::ostream* out) {
    *out << c.name;
}

class FrontGateTest : public ::testing::TestWithParam<GateCase> {};

TEST_P(FrontGateTest, AdmitsOnlyItsOwnNamesAndTheToken) {
    const GateCase& c = GetParam();
    // Listening on an IPv6 address, with one more name allowed, on port 8700.
    const FrontGate gate(TOKEN, {"fd00::5", "Console.Test"}, 8700);
    const FrontGate::Verdict verdict = gate.admit(c.host, c.origin, c.authorization);
    EXPECT_EQ(verdict.status, c.status);
    EXPECT_EQ(verdict.reason == nullptr, c.status == 0);
}

const char BEARER[] = "Bearer 0123456789abcdef-token";

INSTANTIATE_TEST_SUITE_P(
    Requests, FrontGateTest,
    ::testing::Values(
        GateCase{"Loopback", "127.0.0.1:8700", nullptr, BEARER, 0},
        GateCase{"Localhost", "localhost:8700", nullptr, BEARER, 0},
        GateCase{"LocalhostInCapitals", "LOCALHOST:8700", nullptr, BEARER, 0},
        GateCase{"Ipv6Loopback", "[::1]:8700", nullptr, BEARER, 0},
        GateCase{"ListenAddress", "[fd00::5]:8700", nullptr, BEARER, 0},
        GateCase{"AllowedName", "console.test:8700", nullptr, BEARER, 0},
        GateCase{"ListenAddressWithoutBrackets", "fd00::5:8700", nullptr, BEARER, 403},
        GateCase{"OtherPort", "127.0.0.1:8701", nullptr, BEARER, 403},
        GateCase{"NoPort", "127.0.0.1", nullptr, BEARER, 403},
        GateCase{"RebindingName", "attacker.example:8700", nullptr, BEARER, 403},
        GateCase{"NameWithSuffix", "localhost.attacker.example:8700", nullptr, BEARER, 403},
        GateCase{"NoHost", nullptr, nullptr, BEARER, 403},
        // A foreign page learns nothing about the token.
        GateCase{"ForeignHostWithoutToken", "attacker.example:8700", nullptr, nullptr, 403},
        GateCase{"OwnOrigin", "127.0.0.1:8700", "http://localhost:8700", BEARER, 0},
        GateCase{"AllowedOrigin", "127.0.0.1:8700", "http://console.test:8700", BEARER, 0},
        GateCase{"ForeignOrigin", "127.0.0.1:8700", "http://attacker.example", BEARER, 403},
        GateCase{"OwnOriginOverHttps", "127.0.0.1:8700", "https://127.0.0.1:8700", BEARER, 403},
        GateCase{"OwnOriginOtherPort", "127.0.0.1:8700", "http://127.0.0.1:8701", BEARER, 403},
        GateCase{"OpaqueOrigin", "127.0.0.1:8700", "null", BEARER, 403},
        GateCase{"OriginWithPath", "127.0.0.1:8700", "http://127.0.0.1:8700/x", BEARER, 403},
        GateCase{"NoToken", "127.0.0.1:8700", nullptr, nullptr, 401},
        GateCase{"EmptyToken", "127.0.0.1:8700", nullptr, "Bearer ", 401},
        GateCase{"WrongToken", "127.0.0.1:8700", nullptr, "Bearer 0123456789abcdef-tokeN", 401},
        GateCase{"TokenCutShort", "127.0.0.1:8700", nullptr, "Bearer 0123456789abcdef-toke", 401},
        GateCase{"TokenAndMore", "127.0.0.1:8700", nullptr, "Bearer 0123456789abcdef-token2", 401},
        GateCase{"TokenAsBasic", "127.0.0.1:8700", nullptr, "Basic 0123456789abcdef-token", 401},
        GateCase{"TokenWithoutScheme", "127.0.0.1:8700", nullptr, TOKEN, 401},
        GateCase{"SchemeInLowerCase", "127.0.0.1:8700", nullptr, "bearer 0123456789abcdef-token",
                 0},
        GateCase{"BlanksAroundToken", "127.0.0.1:8700", nullptr, "Bearer   0123456789abcdef-token ",
                 0}),
    [](const ::testing::TestParamInfo<GateCase>& info) { return std::string(info.param.name); });

TEST(FrontGateDefaultTest, AdmitsNothing) {
    EXPECT_EQ(FrontGate().admit("127.0.0.1:8700", nullptr, "Bearer x").status, 403);
}

TEST(FrontGatePortTest, DefaultPortMayBeLeftOut) {
    const FrontGate gate(TOKEN, {}, 80);
    EXPECT_EQ(gate.admit("localhost", "http://localhost", BEARER).status, 0);
    EXPECT_EQ(gate.admit("localhost:80", nullptr, BEARER).status, 0);
}

} // namespace
