// Hostile values end to end: what the simulated camera and VCA plugin actually received, and
// that no log or answer gives a password away.
#include "CameraCommands.h"
#include "CamsimProcess.h"
#include "ServedHost.h"

#include <QDir>
#include <QFile>
#include <QJsonDocument>
#include <QTemporaryDir>
#include <QUrlQuery>
#include <QXmlStreamReader>

#include <gtest/gtest.h>

#include <functional>
#include <memory>

namespace {

const QString HOSTILE = QString::fromUtf8("a&b=c#d%e?f g\r\nh+\xc3\xa9\xe4\xb8\xad;/");
const QString HOSTILE_OTHER = QStringLiteral("1&camctrl_c0_idleaction_type=preset");
const QString SECRET = QStringLiteral("Pw-7hQ2zX:secret");

// The target and body of the last logged camera request whose target holds marker.
struct Received {
    QString target;
    QString body;
};

Received lastReceived(const CamsimProcess& camsim, const QString& marker) {
    Received found;
    for (const std::string& line : camsim.logLines()) {
        const QStringList fields = QString::fromStdString(line).split('\t');
        if (fields.size() == 3 && fields.at(1).contains(marker))
            found = {fields.at(1), fields.at(2)};
    }
    return found;
}

// The names of a query's or form's items, joined by blanks.
std::string itemNames(const QString& query) {
    QStringList names;
    for (const auto& item : QUrlQuery(query).queryItems())
        names.append(item.first);
    return names.join(' ').toStdString();
}

// The texts of the elements called name in a command sent to the VCA plugin, one per line.
std::string elementTexts(const QString& xml, const QString& name) {
    QStringList texts;
    QXmlStreamReader reader(xml);
    while (!reader.atEnd()) {
        reader.readNext();
        if (reader.isStartElement() && reader.name() == name)
            texts.append(reader.readElementText());
    }
    if (reader.hasError())
        return "not XML: " + reader.errorString().toStdString() + " in " + xml.toStdString();
    return texts.join('\n').toStdString();
}

class HostileInputTest : public ::testing::Test {
protected:
    void SetUp() override {
        camsim = std::make_unique<CamsimProcess>();
        ASSERT_NE(camsim->port(), 0) << qPrintable(camsim->error());
        ASSERT_TRUE(host.start({"--vca-dir", vca.path()}));
    }

    ServedHost::Answer send(const char* command, const QVariant& params) {
        return host.post({{{"command", command}, {"params", QJsonValue::fromVariant(params)}}})
            .first();
    }

    QVariantMap camera(const QVariantMap& params) const {
        return CameraCommand{"", params}.to(camsim->host(), camsim->port(), "admin", "admin");
    }

    QString sentToVca(const QString& command) const {
        QFile log(QDir(vca.path()).filePath("requests.log"));
        if (!log.open(QIODevice::ReadOnly))
            return {};
        QString last;
        for (const QString& line : QString::fromUtf8(log.readAll()).split('\n')) {
            if (line.startsWith(command + '\t'))
                last = line.mid(command.size() + 1);
        }
        return last;
    }

    QJsonObject cameraState() const {
        return QJsonDocument::fromJson(QByteArray::fromStdString(camsim->state())).object();
    }

    std::unique_ptr<CamsimProcess> camsim;
    QTemporaryDir vca;
    ServedHost host;
};

} // namespace

TEST_F(HostileInputTest, PresetNameReachesTheCameraAsOneValue) {
    ASSERT_EQ(send("gotoSmartTrackingAdvPreset", camera({{"presetName", HOSTILE}})).status, 200);
    const Received received = lastReceived(*camsim, "ptztrack=track");
    EXPECT_EQ(itemNames(received.target.section('?', 1)), "ptztrack name");
    EXPECT_EQ(cameraState().value("lastPreset").toString().toStdString(), HOSTILE.toStdString());
}

TEST_F(HostileInputTest, ViewSizesReachTheCameraAsOneValueEach) {
    ASSERT_EQ(send("areaZoom", camera({{"zoomCenterX", 1},
                                       {"zoomCenterY", 2},
                                       {"viewCellWidth", HOSTILE},
                                       {"viewCellHeight", HOSTILE_OTHER},
                                       {"resolutionWidth", HOSTILE_OTHER},
                                       {"resolutionHeight", HOSTILE},
                                       {"zoomRatio", 1}}))
                  .status,
              200);
    const Received received = lastReceived(*camsim, "videosize=");
    EXPECT_EQ(itemNames(received.target.section('?', 1)), "x y videosize resolution stretch");
    const QJsonObject center = cameraState().value("center").toObject();
    EXPECT_EQ(center.value("videosize").toString().toStdString(),
              (HOSTILE + 'x' + HOSTILE_OTHER).toStdString());
    EXPECT_EQ(center.value("resolution").toString().toStdString(),
              (HOSTILE_OTHER + 'x' + HOSTILE).toStdString());
}

TEST_F(HostileInputTest, IdleValuesReachTheCameraAsOneValueEach) {
    ASSERT_EQ(send("setPTZIdleAction", camera({{"enabled", HOSTILE_OTHER}, {"interval", HOSTILE}}))
                  .status,
              200);
    const Received received = lastReceived(*camsim, "setparam.cgi");
    EXPECT_EQ(itemNames(received.body), "camctrl_c0_idleaction_enable camctrl_c0_idleaction_type "
                                        "camctrl_c0_idleaction_interval");
    const QJsonObject state = cameraState();
    EXPECT_EQ(state.value("idleEnable").toString().toStdString(), HOSTILE_OTHER.toStdString());
    EXPECT_EQ(state.value("idleType").toString().toStdString(), "objtrack");
    EXPECT_EQ(state.value("idleInterval").toString().toStdString(), HOSTILE.toStdString());
}

TEST_F(HostileInputTest, CameraIdentifierReachesTheVcaPluginEscaped) {
    const QString camera = QStringLiteral("cam</Cam><Cam>x&y<z");
    ASSERT_EQ(send("retrieveVcaRawRuleInfo", camera).status, 200);
    EXPECT_EQ(elementTexts(sentToVca("GetVCARules"), "Cam"), camera.toStdString());
}

TEST_F(HostileInputTest, LocationIdentifiersReachTheVcaPluginEscaped) {
    const QStringList locations{"a</Loc><Loc>b", "c&d<", "</QueryTime>"};
    ASSERT_EQ(send("getRecordingVCARule", QVariantMap{{"locationIDs", locations}, {"timestamp", 7}})
                  .status,
              200);
    const QString sent = sentToVca("GetRecordingVCARules");
    EXPECT_EQ(elementTexts(sent, "Loc"), locations.join('\n').toStdString());
    EXPECT_EQ(elementTexts(sent, "QueryTime"), "7");
}

TEST(CredentialsTest, NoPasswordInAnyLogOrAnswer) {
    const QString user = QStringLiteral("operator");
    CamsimProcess digest({"--auth", "digest", "--user", user, "--pass", SECRET});
    CamsimProcess basic({"--auth", "basic", "--user", user, "--pass", "another"});
    ASSERT_NE(digest.port(), 0);
    ASSERT_NE(basic.port(), 0);
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert("QT_LOGGING_RULES", "qt.network.*=true");
    ServedHost host;
    ASSERT_TRUE(host.start({"--verbose"}, environment));

    // Accepted, rejected and never delivered.
    QList<QJsonObject> requests;
    for (const quint16 port : {digest.port(), basic.port(), quint16(1)}) {
        for (const CameraCommand& command : cameraCommands())
            requests.append({{"command", command.name},
                             {"params", QJsonObject::fromVariantMap(
                                            command.to("127.0.0.1", port, user, SECRET))}});
    }
    QString everything;
    for (const ServedHost::Answer& answer : host.post(requests))
        everything += QJsonDocument(answer.json).toJson();
    EXPECT_EQ(host.stop(), 0);
    everything += host.errorOutput();
    for (const CamsimProcess* camsim : {&digest, &basic}) {
        for (const std::string& line : camsim->logLines())
            everything += QString::fromStdString(line);
    }

    // The traces did run.
    EXPECT_TRUE(everything.contains("PluginQuenvar::Request")) << qPrintable(everything);
    for (const QString& form : {SECRET, QString::fromLatin1(QUrl::toPercentEncoding(SECRET)),
                                QString::fromLatin1((user + ':' + SECRET).toUtf8().toBase64())})
        EXPECT_FALSE(everything.contains(form)) << qPrintable(form);
}
