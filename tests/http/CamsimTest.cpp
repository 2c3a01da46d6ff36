#include "CamsimProcess.h"

#include <QCryptographicHash>
#include <QJsonArray>
#include <QJsonDocument>
#include <QRegularExpression>

#include <gtest/gtest.h>

#include <memory>

namespace {

const CamsimProcess::Headers FORM_HEADERS{{"Content-Type", "application/x-www-form-urlencoded"}};

class CamsimTest : public ::testing::Test {
protected:
    void start(const QStringList& arguments = {}) {
        camsim = std::make_unique<CamsimProcess>(arguments);
        ASSERT_NE(camsim->port(), 0) << qPrintable(camsim->error());
    }

    QByteArray get(const QString& target) { return camsim->exchange("GET", target).body; }

    std::unique_ptr<CamsimProcess> camsim;
};

QByteArray md5Hex(const QByteArray& text) {
    return QCryptographicHash::hash(text, QCryptographicHash::Md5).toHex();
}

// The Authorization value a client computes for a challenge's nonce.
QByteArray digestAnswer(const QByteArray& nonce, const QByteArray& target,
                        const QByteArray& count) {
    const QByteArray realm = "quenvar-camsim";
    const QByteArray clientNonce = "0a4f113b";
    const QByteArray secret = md5Hex("admin:" + realm + ":admin");
    const QByteArray response = md5Hex(secret + ":" + nonce + ":" + count + ":" + clientNonce +
                                       ":auth:" + md5Hex("GET:" + target));
    return "Digest username=\"admin\", realm=\"" + realm + "\", nonce=\"" + nonce + "\", uri=\"" +
           target + "\", qop=auth, nc=" + count + ", cnonce=\"" + clientNonce + "\", response=\"" +
           response + "\", algorithm=MD5";
}

QByteArray nonceOf(const CamsimProcess::Answer& answer) {
    const QRegularExpressionMatch match =
        QRegularExpression(QStringLiteral("nonce=\"([0-9a-f]+)\""))
            .match(QString::fromLatin1(answer.header("WWW-Authenticate")));
    return match.captured(1).toLatin1();
}

} // namespace

TEST_F(CamsimTest, StartsWithTheDocumentedState) {
    start();
    const QJsonObject state = camsim->state();
    EXPECT_EQ(state.value("zoom").toDouble(), 1.0);
    EXPECT_EQ(state.value("maxratio").toDouble(), 20.0);
    EXPECT_EQ(state.value("idleEnable").toString(), QStringLiteral("0"));
    EXPECT_EQ(state.value("idleType").toString(), QStringLiteral("objtrack"));
    EXPECT_EQ(state.value("idleInterval").toString(), QStringLiteral("30"));
    EXPECT_EQ(state.value("trackingType").toString(), QStringLiteral("autotracking"));
    EXPECT_EQ(state.value("lastPreset").toString(), QString());
    EXPECT_EQ(state.value("stopCount").toInt(-1), 0);
    EXPECT_TRUE(state.value("center").isObject());
}

TEST_F(CamsimTest, CameraControlRequestsChangeTheState) {
    start();
    const QString cgi = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
    EXPECT_EQ(get(cgi + "?getratio&getmaxratio"), "zoom=1\r\nmaxratio=20\r\n");
    get(cgi + "?x=320&y=-240&videosize=640x480&resolution=1920x1080&stretch=1");
    get(cgi + "?setptmode=nonblock&setratio=2.4");
    get(cgi + "?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop");
    get(cgi + "?ptztrack=track&name=Parking%20Lot");
    EXPECT_EQ(camsim->exchange("POST", cgi, "ptztrack=setSmartTracking", FORM_HEADERS).status, 200);
    EXPECT_EQ(get(cgi + "?ptztrack=getCurrentType"), "ptztrack_type=smarttracking\r\n");
    EXPECT_EQ(get(cgi + "?getratio"), "zoom=2.4\r\n");

    const QJsonObject state = camsim->state();
    EXPECT_EQ(state.value("zoom").toDouble(), 2.4);
    EXPECT_EQ(state.value("stopCount").toInt(), 1);
    EXPECT_EQ(state.value("lastPreset").toString(), QStringLiteral("Parking Lot"));
    EXPECT_EQ(state.value("trackingType").toString(), QStringLiteral("smarttracking"));
    const QJsonObject center = state.value("center").toObject();
    EXPECT_EQ(center.value("x").toInt(), 320);
    EXPECT_EQ(center.value("y").toInt(), -240);
    EXPECT_EQ(center.value("videosize").toString(), QStringLiteral("640x480"));
    EXPECT_EQ(center.value("resolution").toString(), QStringLiteral("1920x1080"));
}

TEST_F(CamsimTest, ZoomStaysWithinOneAndTheMaximum) {
    start();
    const QString cgi = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi");
    get(cgi + "?setptmode=nonblock&setratio=0");
    EXPECT_EQ(camsim->state().value("zoom").toDouble(), 1.0);
    get(cgi + "?setptmode=nonblock&setratio=35");
    EXPECT_EQ(camsim->state().value("zoom").toDouble(), 20.0);
}

TEST_F(CamsimTest, IdleActionParametersAreReadAndWrittenDecoded) {
    start();
    const CamsimProcess::Answer written =
        camsim->exchange("POST", QStringLiteral("/cgi-bin/admin/setparam.cgi"),
                         "camctrl_c0_idleaction_enable=1&camctrl_c0_idleaction_type=obj+track&"
                         "camctrl_c0_idleaction_interval=4%35",
                         FORM_HEADERS);
    EXPECT_EQ(written.status, 200);
    EXPECT_EQ(get(QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl")),
              "camctrl_c0_idleaction_enable='1'\r\ncamctrl_c0_idleaction_type='obj track'\r\n"
              "camctrl_c0_idleaction_interval='45'\r\n");
}

TEST_F(CamsimTest, PresetListNamesThreePresetsTwoWithARule) {
    start();
    const QJsonArray presets =
        QJsonDocument::fromJson(get(QStringLiteral("/VCA/PTZAdv/PresetWithRule")))
            .object()
            .value("PresetInfo")
            .toArray();
    ASSERT_EQ(presets.size(), 3);
    int withRule = 0;
    for (const QJsonValue& preset : presets) {
        EXPECT_FALSE(preset.toObject().value("Name").toString().isEmpty());
        withRule += preset.toObject().value("HasRule").toBool() ? 1 : 0;
    }
    EXPECT_EQ(withRule, 2);
}

TEST_F(CamsimTest, LogKeepsTheRawTargetAndEscapesTheBody) {
    start();
    camsim->exchange("POST", QStringLiteral("/any?x=%26&y"), "a\\b\nc\rd\te",
                     {{"Content-Type", "text/plain"}});
    get(QStringLiteral("/_sim/state"));
    EXPECT_EQ(camsim->logLines(),
              QStringList{QStringLiteral("POST\t/any?x=%26&y\ta\\\\b\\nc\\rd\\te")});
}

TEST_F(CamsimTest, FaultControlSwitchesModesAndRejectsUnknownOnes) {
    start();
    const QString target = QStringLiteral("/cgi-bin/camctrl/camctrl.cgi?getratio");
    ASSERT_TRUE(camsim->setFault("mode=status&status=418"));
    EXPECT_EQ(camsim->exchange("GET", target).status, 418);
    EXPECT_FALSE(camsim->setFault("mode=sideways"));
    EXPECT_EQ(camsim->exchange("GET", target).status, 418);
    ASSERT_TRUE(camsim->setFault("mode=none"));
    EXPECT_EQ(camsim->exchange("GET", target).status, 200);
}

TEST_F(CamsimTest, DigestAcceptsEachNonceCountOnce) {
    start({QStringLiteral("--auth"), QStringLiteral("digest")});
    const QByteArray target = "/cgi-bin/camctrl/camctrl.cgi?getratio&name=A%20B";
    const CamsimProcess::Answer challenge = camsim->exchange("GET", QString::fromLatin1(target));
    ASSERT_EQ(challenge.status, 401);
    EXPECT_TRUE(challenge.header("WWW-Authenticate").contains("qop=\"auth\""));
    const QByteArray nonce = nonceOf(challenge);
    ASSERT_FALSE(nonce.isEmpty());

    const CamsimProcess::Headers first{{"Authorization", digestAnswer(nonce, target, "00000001")}};
    EXPECT_EQ(camsim->exchange("GET", QString::fromLatin1(target), {}, first).status, 200);
    const CamsimProcess::Answer replay =
        camsim->exchange("GET", QString::fromLatin1(target), {}, first);
    EXPECT_EQ(replay.status, 401);
    EXPECT_TRUE(replay.header("WWW-Authenticate").contains("stale=true"));
    const CamsimProcess::Headers second{{"Authorization", digestAnswer(nonce, target, "00000002")}};
    EXPECT_EQ(camsim->exchange("GET", QString::fromLatin1(target), {}, second).status, 200);
    EXPECT_EQ(camsim->logLines().size(), 2);
}

TEST_F(CamsimTest, DigestRejectsAnUnissuedNonceAndAnotherTarget) {
    start({QStringLiteral("--auth"), QStringLiteral("digest")});
    const QByteArray target = "/cgi-bin/camctrl/camctrl.cgi?getratio";
    const QByteArray nonce = nonceOf(camsim->exchange("GET", QString::fromLatin1(target)));
    const CamsimProcess::Headers made{
        {"Authorization", digestAnswer("00112233445566778899aabbccddeeff", target, "00000001")}};
    EXPECT_EQ(camsim->exchange("GET", QString::fromLatin1(target), {}, made).status, 401);
    const CamsimProcess::Headers elsewhere{
        {"Authorization", digestAnswer(nonce, target, "00000001")}};
    EXPECT_EQ(
        camsim
            ->exchange("GET", QStringLiteral("/cgi-bin/admin/getparam.cgi?camctrl"), {}, elsewhere)
            .status,
        401);
    EXPECT_TRUE(camsim->logLines().isEmpty());
}
