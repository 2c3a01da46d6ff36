#include "CamsimProcess.h"
#include "WendrelAuth.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

// What the other tests rely on of the camera without seeing it: the zoom stays within 1 and the
// maximum, every request stays one line in the log, and faults switch on while it runs.
TEST(CamsimTest, KeepsTheZoomInRangeLogsOneLineEachAndSwitchesFaults) {
    const CamsimProcess camsim;
    ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
    const QString cgi = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?");
    for (const auto& [ratio, zoom] : {std::pair("0", "1"), std::pair("35", "20")}) {
        camsim.exchange("GET", cgi + "setptmode=nonblock&setratio=" + ratio);
        EXPECT_EQ(camsim.exchange("GET", cgi + "getratio&getmaxratio").body.toStdString(),
                  "zoom=" + std::string(zoom) + "\r\nmaxratio=20\r\n");
    }
    EXPECT_EQ(camsim.exchange("POST", QStringLiteral("/any?x=%26&y"), "a\\b\nc\rd\te").status, 404);
    EXPECT_EQ(camsim.logLines().back(), "POST\t/any?x=%26&y\ta\\\\b\\nc\\rd\\te");

    ASSERT_TRUE(camsim.setFault("mode=status&status=503"));
    EXPECT_EQ(camsim.exchange("GET", cgi + "getratio").status, 503);
    ASSERT_TRUE(camsim.setFault("mode=oversize&bytes=300"));
    EXPECT_EQ(camsim.exchange("GET", cgi + "getratio").body.size(), 300);
}

// Only a nonce it issued, for the target it was computed for, with a nonce count not seen before.
TEST(CamsimTest, DigestAcceptsEachIssuedNonceCountOnce) {
    const CamsimProcess camsim({QStringLiteral("--auth"), QStringLiteral("digest")});
    ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
    const QString target = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio&name=A%20B");
    const CamsimProcess::Answer first = camsim.exchange("GET", target);
    ASSERT_EQ(first.status, 401);
    ASSERT_TRUE(first.challenge.contains("qop=\"auth\"")) << first.challenge.data();
    std::optional<WendrelChallenge> challenge = WendrelChallenge::choose(first.challenge);
    ASSERT_TRUE(challenge);
    const QByteArray nonce = challenge->nonce;
    // Where it goes, the nonce and the nonce count; the answer is always computed for target.
    const std::tuple<QString, QByteArray, quint32> attempts[] = {
        {target, nonce, 1},
        {target, nonce, 1},
        {target, nonce, 2},
        {target, "00112233445566778899aabbccddeeff", 3},
        {QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"), nonce, 4}};
    std::vector<std::string> outcomes;
    for (const auto& [path, issued, count] : attempts) {
        challenge->nonce = issued;
        const QByteArray authorization = WendrelAuth::respond(*challenge, "GET", target.toLatin1(),
                                                              "admin", "admin", "0a4f113b", count);
        const CamsimProcess::Answer answer =
            camsim.exchange("GET", path, {}, {{"Authorization", authorization}});
        outcomes.push_back(std::to_string(answer.status) +
                           (answer.challenge.contains("stale=true") ? " stale" : ""));
    }

    EXPECT_EQ(outcomes, (std::vector<std::string>{"200", "401 stale", "200", "401 stale", "401"}));
    EXPECT_EQ(camsim.logLines().size(), 2u);
}
