// Hostile values end to end: what the simulated camera and VCA plugin actually received.
#include "AnswerLedger.h"
#include "CameraCommands.h"
#include "CamsimProcess.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"
#include "ServedHost.h"

#include <QDir>
#include <QFile>
#include <QJsonDocument>
#include <QTcpServer>
#include <QTcpSocket>
#include <QTemporaryDir>
#include <QUrlQuery>
#include <QXmlStreamReader>

#include <gtest/gtest.h>

#include <memory>
#include <utility>

namespace {

const QString HOSTILE = QString::fromUtf8("a&b=c#d%e?f g\r\nh+\xc3\xa9\xe4\xb8\xad;/");
const QString HOSTILE_OTHER = QStringLiteral("1&camctrl_c0_idleaction_type=preset");

// A command with hostile values: the items of the camera request whose target holds marker,
// and what the camera's state then holds at each path ("key" or "object/key"). Parameters and
// state are blank-separated key=value pairs, where H stands for HOSTILE and O for HOSTILE_OTHER,
// and L for the Latin-1 bytes of HOSTILE as the simulator, which reads UTF-8, shows them.
struct CameraCase {
    const char* command;
    const char* params;
    const char* marker;
    const char* items;
    const char* state;
};

QVariantMap hostile(const char* text) {
    QVariantMap map = keyValues(text);
    for (QVariant& value : map)
        value = value.toString()
                    .replace('H', HOSTILE)
                    .replace('O', HOSTILE_OTHER)
                    .replace('L', QString::fromUtf8(HOSTILE.toLatin1()));
    return map;
}

class HostileInputTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
        ASSERT_TRUE(host.serve({"--vca-dir", vca.path()}));
    }

    int send(const char* command, const QVariant& params) {
        return host.post({ServedHost::request(command, params)}).first().status;
    }

    // The names of the query and form items of the last camera request whose target holds
    // marker, joined by blanks.
    std::string receivedItems(const QString& marker) const {
        QStringList names;
        for (const std::string& line : camsim.logLines()) {
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
            QJsonDocument::fromJson(QByteArray::fromStdString(camsim.state())).object();
        for (const QString& key : path.split('/'))
            value = value.toObject().value(key);
        return value.toString().toStdString();
    }

    // The texts of the elements called name in the last command sent to the VCA plugin, one
    // per line.
    std::string sentToVca(const QString& command, const QString& name) const {
        QFile log(QDir(vca.path()).filePath("requests.log"));
        QString xml;
        if (log.open(QIODevice::ReadOnly)) {
            for (const QString& line : QString::fromUtf8(log.readAll()).split('\n')) {
                if (line.startsWith(command + '\t'))
                    xml = line.mid(command.size() + 1);
            }
        }
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

    CamsimProcess camsim;
    QTemporaryDir vca;
    ServedHost host;
};

} // namespace

TEST_F(HostileInputTest, PresetNameViewSizesAndIdleValuesReachTheCameraAsOneValueEach) {
    const CameraCase cases[] = {
        {"gotoSmartTrackingAdvPreset", "presetName=H", "ptztrack=track", "ptztrack name",
         "lastPreset=H"},
        {"areaZoom",
         "zoomCenterX=1 zoomCenterY=2 viewCellWidth=H viewCellHeight=O resolutionWidth=O "
         "resolutionHeight=H zoomRatio=1",
         "videosize=", "x y videosize resolution stretch",
         "center/videosize=HxO center/resolution=OxH"},
        {"setPTZIdleAction", "enabled=O interval=H", "setparam.cgi",
         "camctrl_c0_idleaction_enable camctrl_c0_idleaction_type camctrl_c0_idleaction_interval",
         "idleEnable=O idleType=objtrack idleInterval=L"},
    };
    for (const CameraCase& c : cases) {
        SCOPED_TRACE(c.command);
        QVariantMap params = CameraCommand{c.command, ""}.to(camsim.port());
        params.insert(hostile(c.params));
        ASSERT_EQ(send(c.command, params), 200);
        EXPECT_EQ(receivedItems(c.marker), c.items);
        const QVariantMap state = hostile(c.state);
        for (auto value = state.begin(); value != state.end(); ++value)
            EXPECT_EQ(cameraState(value.key()), value->toString().toStdString());
    }
}

TEST_F(HostileInputTest, CameraAndLocationIdentifiersReachTheVcaPluginEscaped) {
    const QString camera = QStringLiteral("cam</Cam><Cam>x&y<z");
    const QStringList locations{"a</Loc><Loc>b", "c&d<", "</QueryTime>"};
    ASSERT_EQ(send("retrieveVcaRawRuleInfo", camera), 200);
    ASSERT_EQ(
        send("getRecordingVCARule", QVariantMap{{"locationIDs", locations}, {"timestamp", 7}}),
        200);
    EXPECT_EQ(sentToVca("GetVCARules", "Cam"), camera.toStdString());
    EXPECT_EQ(sentToVca("GetRecordingVCARules", "Loc"), locations.join('\n').toStdString());
    EXPECT_EQ(sentToVca("GetRecordingVCARules", "QueryTime"), "7");
}

// Credentials that would add to a camera request's header lines: every camera command is
// answered with the failure result, once, and nothing reaches the camera, which challenges every
// request for Digest credentials.
TEST(HostileCredentialsTest, NoCameraCommandSendsCredentialsThatBreakTheLine) {
    QTcpServer camera;
    ASSERT_TRUE(camera.listen(QHostAddress::LocalHost, 0));
    int connections = 0;
    QObject::connect(&camera, &QTcpServer::newConnection, &camera, [&camera, &connections] {
        while (QTcpSocket* socket = camera.nextPendingConnection()) {
            ++connections;
            QObject::connect(socket, &QTcpSocket::readyRead, socket, [socket] {
                socket->readAll();
                socket->write("HTTP/1.1 401 Unauthorized\r\nWWW-Authenticate: Digest "
                              "realm=\"cam\", nonce=\"n\", qop=\"auth\"\r\n"
                              "Content-Length: 0\r\n\r\n");
            });
        }
    });
    FakeFrameworkTools tools;
    auto plugin = std::make_unique<PluginQuenvar>();
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    const std::pair<QString, QString> credentials[] = {
        {"admin\"\r\n\r\nGET /cgi-bin/admin/setparam.cgi?system_password=pwned HTTP/1.1\r\n"
         "Host: cam\r\nX-Smuggled: ",
         "pw"},
        {"admin", "pw\nX-Smuggled: 1"},
        {QString::fromLatin1("admin\0", 6), "pw"}};
    AnswerLedger ledger;
    int id = 0;
    for (const auto& [user, password] : credentials) {
        for (const CameraCommand& command : cameraCommands()) {
            QVariantMap params = command.to(camera.serverPort(), password);
            params.insert("user", user);
            plugin->Request(command.name, params, RequestSenderInfo(), ledger.callback(id++));
        }
    }
    ASSERT_TRUE(ledger.waitForAll(5000));
    plugin.reset();
    for (int i = 0; i < id; ++i) {
        const AnswerLedger::Entry entry = ledger.entry(i);
        EXPECT_EQ(entry.calls, 1) << i;
        EXPECT_EQ(entry.first.value("code").toString(), "-1") << i;
    }
    EXPECT_EQ(connections, 0);
}
