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

const GateCase GATE_CASES[] = {
    {"Loopback", "127.0.0.1:8700", nullptr, BEARER, 0},
    {"Localhost", "localhost:8700", nullptr, BEARER, 0},
    {"LocalhostInCapitals", "LOCALHOST:8700", nullptr, BEARER, 0},
    {"Ipv6Loopback", "[::1]:8700", nullptr, BEARER, 0},
    {"ListenAddress", "[fd00::5]:8700", nullptr, BEARER, 0},
    {"AllowedName", "console.test:8700", nullptr, BEARER, 0},
    {"ListenAddressWithoutBrackets", "fd00::5:8700", nullptr, BEARER, 403},
    {"OtherPort", "127.0.0.1:8701", nullptr, BEARER, 403},
    {"NoPort", "127.0.0.1", nullptr, BEARER, 403},
    {"RebindingName", "attacker.example:8700", nullptr, BEARER, 403},
    {"NameWithSuffix", "localhost.attacker.example:8700", nullptr, BEARER, 403},
    {"NoHost", nullptr, nullptr, BEARER, 403},
    // A foreign page learns nothing about the token.
    {"ForeignHostWithoutToken", "attacker.example:8700", nullptr, nullptr, 403},
    {"OwnOrigin", "127.0.0.1:8700", "http://localhost:8700", BEARER, 0},
    {"AllowedOrigin", "127.0.0.1:8700", "http://console.test:8700", BEARER, 0},
    {"ForeignOrigin", "127.0.0.1:8700", "http://attacker.example", BEARER, 403},
    {"OwnOriginOverHttps", "127.0.0.1:8700", "https://127.0.0.1:8700", BEARER, 403},
    {"OwnOriginOtherPort", "127.0.0.1:8700", "http://127.0.0.1:8701", BEARER, 403},
    {"OpaqueOrigin", "127.0.0.1:8700", "null", BEARER, 403},
    {"OriginWithPath", "127.0.0.1:8700", "http://127.0.0.1:8700/x", BEARER, 403},
    {"NoToken", "127.0.0.1:8700", nullptr, nullptr, 401},
    {"EmptyToken", "127.0.0.1:8700", nullptr, "Bearer ", 401},
    {"WrongToken", "127.0.0.1:8700", nullptr, "Bearer 0123456789abcdef-tokeN", 401},
    {"TokenCutShort", "127.0.0.1:8700", nullptr, "Bearer 0123456789abcdef-toke", 401},
    {"TokenAndMore", "127.0.0.1:8700", nullptr, "Bearer 0123456789abcdef-token2", 401},
    {"TokenAsBasic", "127.0.0.1:8700", nullptr, "Basic 0123456789abcdef-token", 401},
    {"TokenWithoutScheme", "127.0.0.1:8700", nullptr, TOKEN, 401},
    {"SchemeInLowerCase", "127.0.0.1:8700", nullptr, "bearer 0123456789abcdef-token", 0},
    {"BlanksAroundToken", "127.0.0.1:8700", nullptr, "Bearer   0123456789abcdef-token ", 0},
};

INSTANTIATE_TEST_SUITE_P(Requests, FrontGateTest, ::testing::ValuesIn(GATE_CASES),
                         [](const ::testing::TestParamInfo<GateCase>& info) {
                             return std::string(info.param.name);
                         });

TEST(FrontGateDefaultTest, AdmitsNothing) {
    EXPECT_EQ(FrontGate().admit("127.0.0.1:8700", nullptr, "Bearer x").status, 403);
}

TEST(FrontGatePortTest, DefaultPortMayBeLeftOut) {
    const FrontGate gate(TOKEN, {}, 80);
    EXPECT_EQ(gate.admit("localhost", "http://localhost", BEARER).status, 0);
    EXPECT_EQ(gate.admit("localhost:80", nullptr, BEARER).status, 0);
}

} // namespace
