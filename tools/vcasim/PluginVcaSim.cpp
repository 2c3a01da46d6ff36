#include "PluginVcaSim.h"

#include "LiveRuleWatcher.h"

#include <QDir>
#include <QFile>
#include <QRegularExpression>
#include <QXmlStreamReader>

#include <cstdio>

namespace {

const QString CMD_GET_VCA_RULES = QStringLiteral("GetVCARules");
const QString CMD_GET_RECORDING_VCA_RULES = QStringLiteral("GetRecordingVCARules");
const QString CODE_OK = QStringLiteral("0");
const QString CODE_NOT_FOUND = QStringLiteral("80000404");
const QString CODE_FAILED = QStringLiteral("-1");

void warn(const QString& message) {
    std::fprintf(stderr, "vcasim: %s\n", message.toLocal8Bit().constData());
    std::fflush(stderr);
}

// The decoded text of the first element called name; a request that is not well-formed XML
// (the camera id goes in unescaped) falls back to the raw text between the tags.
QString elementText(const QString& xml, const QString& name) {
    QXmlStreamReader reader(xml);
    while (!reader.atEnd()) {
        reader.readNext();
        if (reader.isStartElement() && reader.name() == name) {
            const QString text = reader.readElementText(QXmlStreamReader::IncludeChildElements);
            if (!reader.hasError())
                return text;
            break;
        }
    }
    const QRegularExpression raw(QStringLiteral("<%1>(.*?)</%1>").arg(name),
                                 QRegularExpression::DotMatchesEverythingOption);
    return raw.match(xml).captured(1);
}

// A name that stays inside its folder.
bool isPlainName(const QString& name) {
    return !name.isEmpty() && name != QStringLiteral(".") && name != QStringLiteral("..") &&
           !name.contains(QLatin1Char('/')) && !name.contains(QLatin1Char('\\')) &&
           !name.contains(QChar(0));
}

QString escapedLine(QString text) {
    text.replace(QLatin1Char('\\'), QStringLiteral("\\\\"));
    text.replace(QLatin1Char('\n'), QStringLiteral("\\n"));
    text.replace(QLatin1Char('\r'), QStringLiteral("\\r"));
    text.replace(QLatin1Char('\t'), QStringLiteral("\\t"));
    return text;
}

} // namespace

PluginVcaSim::PluginVcaSim() = default;

PluginVcaSim::~PluginVcaSim() = default;

bool PluginVcaSim::InitialPluginBase(IFrameworkTools*) {
    dataDir = qEnvironmentVariable("VCASIM_DIR");
    if (dataDir.isEmpty())
        return true;
    const QDir dir(dataDir);
    dir.mkpath(QStringLiteral("live"));
    dir.mkpath(QStringLiteral("recording"));
    watcher = new LiveRuleWatcher(dir.filePath(QStringLiteral("live")), this);
    connect(watcher, &LiveRuleWatcher::changed, this, &PluginVcaSim::vcaMetadataChanged);
    return true;
}

void PluginVcaSim::Request(const QString& command, const QVariant& params, const RequestSenderInfo&,
                           ResponseCallback callback) {
    const Answer result = answer(command, params.toString());
    if (callback)
        callback(result.handled, result.code, result.message, QVariant(result.text));
}

void PluginVcaSim::RequestBlock(const QString& command, const QVariant& params,
                                const RequestSenderInfo&, IResponser& responser) {
    const Answer result = answer(command, params.toString());
    responser.Respond(result.handled, result.code, result.message, QVariant(result.text));
}

void PluginVcaSim::SubscribeEventBlock(const QString&, const QString&, const QVariant&,
                                       const RequestSenderInfo&, IResponser&) {}

void PluginVcaSim::UnsubscribeEventBlock(const QString&, const QVariant&, IResponser&) {}

PluginVcaSim::Answer PluginVcaSim::answer(const QString& command, const QString& content) {
    logRequest(command, content);
    if (command == CMD_GET_VCA_RULES)
        return answerFromFiles(QStringLiteral("live"), elementText(content, QStringLiteral("Cam")));
    if (command == CMD_GET_RECORDING_VCA_RULES)
        return answerFromFiles(QStringLiteral("recording"),
                               elementText(content, QStringLiteral("QueryTime")));
    return Answer{false, CODE_FAILED, QStringLiteral("unknown command %1").arg(command), QString()};
}

PluginVcaSim::Answer PluginVcaSim::answerFromFiles(const QString& subfolder,
                                                   const QString& name) const {
    if (dataDir.isEmpty()) {
        warn(QStringLiteral("VCASIM_DIR is not set: no rules for \"%1\"").arg(name));
        return Answer{true, CODE_NOT_FOUND, QStringLiteral("VCASIM_DIR is not set"), QString()};
    }
    if (!isPlainName(name))
        return Answer{true, CODE_NOT_FOUND, QStringLiteral("no rules for \"%1\"").arg(name),
                      QString()};
    const QDir dir(QDir(dataDir).filePath(subfolder));
    QFile rules(dir.filePath(name + QStringLiteral(".xml")));
    if (!rules.open(QIODevice::ReadOnly))
        return Answer{true, CODE_NOT_FOUND, QStringLiteral("no rules for \"%1\"").arg(name),
                      QString()};
    Answer result{true, CODE_OK, QString(), QString::fromUtf8(rules.readAll())};
    QFile status(dir.filePath(name + QStringLiteral(".status")));
    if (status.open(QIODevice::ReadOnly))
        result.code = QString::fromUtf8(status.readAll()).trimmed();
    return result;
}

void PluginVcaSim::logRequest(const QString& command, const QString& content) {
    if (dataDir.isEmpty())
        return;
    const QByteArray line = (command + QLatin1Char('\t') + escapedLine(content)).toUtf8() + '\n';
    std::lock_guard<std::mutex> lock(logMutex);
    QFile log(QDir(dataDir).filePath(QStringLiteral("requests.log")));
    if (log.open(QIODevice::WriteOnly | QIODevice::Append))
        log.write(line);
}
