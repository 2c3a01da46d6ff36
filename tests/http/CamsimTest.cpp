#include "CamsimProcess.h"

#include <QCryptographicHash>
#include <QRegularExpression>

#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <vector>

namespace {

QByteArray md5Hex(const QByteArray& text) {
    return QCryptographicHash::hash(text, QCryptographicHash::Md5).toHex();
}

// The Authorization value a client computes for the nonce of a challenge to target.
QByteArray digestAnswer(const QByteArray& nonce, const QByteArray& target,
                        const QByteArray& count) {
    const QByteArray realm = "quenvar-camsim";
    const QByteArray clientNonce = "0a4f113b";
    const QByteArray response =
        md5Hex(md5Hex("admin:" + realm + ":admin") + ":" + nonce + ":" + count + ":" + clientNonce +
               ":auth:" + md5Hex("GET:" + target));
    return "Digest username=\"admin\", realm=\"" + realm + "\", nonce=\"" + nonce + "\", uri=\"" +
           target + "\", qop=auth, nc=" + count + ", cnonce=\"" + clientNonce + "\", response=\"" +
           response + "\", algorithm=MD5";
}

} // namespace

// What the camera tests rely on beyond what they see through the proxy.
TEST(CamsimTest, CameraRequestsChangeTheStateAndAreLoggedAsReceived) {
    const CamsimProcess camsim;
    ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
    const QString cgi = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
    const QByteArray idle = "camctrl_c0_idleaction_enable='1'\r\n"
                            "camctrl_c0_idleaction_type='obj track'\r\n"
                            "camctrl_c0_idleaction_interval='45'\r\n";
    struct Exchange {
        QByteArray method;
        QString target;
        QByteArray body;
        QByteArray answer; // status and body
    };
    const Exchange exchanges[] = {
        // Logged with the body escaped, so that every request stays one line.
        {"POST", QStringLiteral("/any?x=%26&y"), "a\\b\nc\rd\te", "404 no such endpoint: /any\n"},
        // The zoom stays within 1 and the maximum.
        {"GET", cgi + "?setptmode=nonblock&setratio=0", {}, "200 OK\r\n"},
        {"GET", cgi + "?getratio", {}, "200 zoom=1\r\n"},
        {"GET", cgi + "?setptmode=nonblock&setratio=35", {}, "200 OK\r\n"},
        {"GET", cgi + "?getratio&getmaxratio", {}, "200 zoom=20\r\nmaxratio=20\r\n"},
        {"GET",
         cgi + "?x=320&y=-240&videosize=640x480&resolution=1920x1080&stretch=1",
         {},
         "200 OK\r\n"},
        // Query and form values are decoded.
        {"GET",
         cgi + "?ptztrack=track&name=Parking%20Lot",
         {},
         "200 ptztrack_track='Parking Lot'\r\n"},
        {"POST", QStringLiteral("/cgi-bin/admin/setparam.cgi"),
         "camctrl_c0_idleaction_enable=1&camctrl_c0_idleaction_type=obj+track&"
         "camctrl_c0_idleaction_interval=4%35",
         "200 " + idle},
        {"GET", QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"), {}, "200 " + idle},
        {"GET",
         QStringLiteral("/VCA/PTZAdv/PresetWithRule"),
         {},
         R"(200 {"PresetInfo":[{"HasRule":true,"Name":"Entrance"},)"
         R"({"HasRule":false,"Name":"Lobby"},{"HasRule":true,"Name":"Parking Lot"}]})"},
    };
    std::vector<std::string> answers;
    std::vector<std::string> expected;
    std::vector<std::string> logged;
    for (const Exchange& exchange : exchanges) {
        const CamsimProcess::Answer answer =
            camsim.exchange(exchange.method, exchange.target, exchange.body,
                            {{"Content-Type", "application/x-www-form-urlencoded"}});
        answers.push_back(std::to_string(answer.status) + ' ' + answer.body.toStdString());
        expected.push_back(exchange.answer.toStdString());
        logged.push_back((exchange.method + '\t' + exchange.target.toUtf8() + '\t' + exchange.body)
                             .toStdString());
    }
    logged.front() = "POST\t/any?x=%26&y\ta\\\\b\\nc\\rd\\te";

    EXPECT_EQ(answers, expected);
    EXPECT_EQ(camsim.logLines(), logged);
    EXPECT_EQ(camsim.state(), R"({"center":{"resolution":"1920x1080","videosize":"640x480",)"
                              R"("x":320,"y":-240},"idleEnable":"1","idleInterval":"45",)"
                              R"("idleType":"obj track","lastPreset":"Parking Lot",)"
                              R"("maxratio":20,"stopCount":0,"trackingType":"autotracking",)"
                              R"("zoom":20})");
}

// Only a nonce it issued, for the target it was computed for, with a nonce count not seen before.
TEST(CamsimTest, DigestAcceptsEachIssuedNonceCountOnce) {
    const CamsimProcess camsim({QStringLiteral("--auth"), QStringLiteral("digest")});
    ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
    const QString target = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio&name=A%20B");
    const CamsimProcess::Answer first = camsim.exchange("GET", target);
    ASSERT_EQ(first.status, 401);
    ASSERT_TRUE(first.challenge.contains("qop=\"auth\"")) << first.challenge.data();
    const QByteArray nonce = QRegularExpression(QStringLiteral("nonce=\"([0-9a-f]+)\""))
                                 .match(QString::fromLatin1(first.challenge))
                                 .captured(1)
                                 .toLatin1();
    // Where it goes, the nonce and the nonce count; the answer is always computed for target.
    const std::tuple<QString, QByteArray, QByteArray> attempts[] = {
        {target, nonce, "00000001"},
        {target, nonce, "00000001"},
        {target, nonce, "00000002"},
        {target, "00112233445566778899aabbccddeeff", "00000003"},
        {QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"), nonce, "00000004"},
    };
    std::vector<std::string> outcomes;
    for (const auto& [path, issued, count] : attempts) {
        const CamsimProcess::Answer answer = camsim.exchange(
            "GET", path, {}, {{"Authorization", digestAnswer(issued, target.toLatin1(), count)}});
        outcomes.push_back(std::to_string(answer.status) +
                           (answer.challenge.contains("stale=true") ? " stale" : ""));
    }

    EXPECT_EQ(outcomes, (std::vector<std::string>{"200", "401 stale", "200", "401 stale", "401"}));
    EXPECT_EQ(camsim.logLines().size(), 2u);
}
