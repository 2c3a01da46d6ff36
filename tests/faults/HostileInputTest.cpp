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

#include <memory>

namespace {

const QString HOSTILE = QString::fromUtf8("a&b=c#d%e?f g\r\nh+\xc3\xa9\xe4\xb8\xad;/");
const QString HOSTILE_OTHER = QStringLiteral("1&camctrl_c0_idleaction_type=preset");
const QString SECRET = QStringLiteral("Pw-7hQ2zX:secret");

// A command with hostile values: the items of the camera request whose target holds marker,
// and what the camera's state then holds at each path ("key" or "object/key").
struct CameraCase {
    const char* command;
    QVariantMap params;
    QString marker;
    std::string items;
    QList<QPair<QString, QString>> state;
};

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
        ASSERT_TRUE(host.serve({"--vca-dir", vca.path()}));
    }

    int send(const char* command, const QVariant& params) {
        return host.post({ServedHost::request(command, params)}).first().status;
    }

    // The names of the query and form items of the last camera request whose target holds
    // marker, joined by blanks.
    std::string receivedItems(const QString& marker) const {
        QStringList names;
        for (const std::string& line : camsim->logLines()) {
            const QStringList fields = QString::fromStdString(line).split('\t');
            if (fields.size() != 3 || !fields.at(1).contains(marker))
                continue;
            names.clear();
            for (const QString& items : {fields.at(1).section('?', 1), fields.at(2)}) {
                for (const auto& item : QUrlQuery(items).queryItems())
                    names.append(item.first);
            }
        }
        return names.join(' ').toStdString();
    }

    std::string cameraState(const QString& path) const {
        QJsonValue value =
            QJsonDocument::fromJson(QByteArray::fromStdString(camsim->state())).object();
        for (const QString& key : path.split('/'))
            value = value.toObject().value(key);
        return value.toString().toStdString();
    }

    QString sentToVca(const QString& command) const {
        QFile log(QDir(vca.path()).filePath("requests.log"));
        QString last;
        if (log.open(QIODevice::ReadOnly)) {
            for (const QString& line : QString::fromUtf8(log.readAll()).split('\n')) {
                if (line.startsWith(command + '\t'))
                    last = line.mid(command.size() + 1);
            }
        }
        return last;
    }

    std::unique_ptr<CamsimProcess> camsim;
    QTemporaryDir vca;
    ServedHost host;
};

} // namespace

TEST_F(HostileInputTest, PresetNameViewSizesAndIdleValuesReachTheCameraAsOneValueEach) {
    const CameraCase cases[] = {
        {"gotoSmartTrackingAdvPreset",
         {{"presetName", HOSTILE}},
         "ptztrack=track",
         "ptztrack name",
         {{"lastPreset", HOSTILE}}},
        {"areaZoom",
         {{"zoomCenterX", 1},
          {"zoomCenterY", 2},
          {"viewCellWidth", HOSTILE},
          {"viewCellHeight", HOSTILE_OTHER},
          {"resolutionWidth", HOSTILE_OTHER},
          {"resolutionHeight", HOSTILE},
          {"zoomRatio", 1}},
         "videosize=",
         "x y videosize resolution stretch",
         {{"center/videosize", HOSTILE + 'x' + HOSTILE_OTHER},
          {"center/resolution", HOSTILE_OTHER + 'x' + HOSTILE}}},
        {"setPTZIdleAction",
         {{"enabled", HOSTILE_OTHER}, {"interval", HOSTILE}},
         "setparam.cgi",
         "camctrl_c0_idleaction_enable camctrl_c0_idleaction_type camctrl_c0_idleaction_interval",
         {{"idleEnable", HOSTILE_OTHER}, {"idleType", "objtrack"}, {"idleInterval", HOSTILE}}},
    };
    for (const CameraCase& c : cases) {
        SCOPED_TRACE(c.command);
        ASSERT_EQ(send(c.command, CameraCommand{c.command, c.params}.to(camsim->port())), 200);
        EXPECT_EQ(receivedItems(c.marker), c.items);
        for (const auto& [path, value] : c.state)
            EXPECT_EQ(cameraState(path), value.toStdString()) << qPrintable(path);
    }
}

TEST_F(HostileInputTest, CameraAndLocationIdentifiersReachTheVcaPluginEscaped) {
    const QString camera = QStringLiteral("cam</Cam><Cam>x&y<z");
    const QStringList locations{"a</Loc><Loc>b", "c&d<", "</QueryTime>"};
    ASSERT_EQ(send("retrieveVcaRawRuleInfo", camera), 200);
    ASSERT_EQ(
        send("getRecordingVCARule", QVariantMap{{"locationIDs", locations}, {"timestamp", 7}}),
        200);
    EXPECT_EQ(elementTexts(sentToVca("GetVCARules"), "Cam"), camera.toStdString());
    const QString sent = sentToVca("GetRecordingVCARules");
    EXPECT_EQ(elementTexts(sent, "Loc"), locations.join('\n').toStdString());
    EXPECT_EQ(elementTexts(sent, "QueryTime"), "7");
}

TEST(CredentialsTest, NoPasswordInAnyLogOrAnswer) {
    CamsimProcess digest({"--auth", "digest", "--user", "admin", "--pass", SECRET});
    CamsimProcess basic({"--auth", "basic", "--user", "admin", "--pass", "another"});
    ASSERT_NE(digest.port(), 0);
    ASSERT_NE(basic.port(), 0);
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert("QT_LOGGING_RULES", "qt.network.*=true");
    ServedHost host;
    ASSERT_TRUE(host.serve({"--verbose"}, environment));

    // Accepted, rejected and never delivered.
    QList<QJsonObject> requests;
    for (const quint16 port : {digest.port(), basic.port(), quint16(1)}) {
        for (const CameraCommand& command : cameraCommands())
            requests.append(ServedHost::request(command.name, command.to(port, SECRET)));
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
                                QString::fromLatin1(("admin:" + SECRET).toUtf8().toBase64())})
        EXPECT_FALSE(everything.contains(form)) << qPrintable(form);
}
