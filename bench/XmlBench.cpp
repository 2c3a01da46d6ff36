// Trindle::parse and the whole live-rule conversion against a bare QXmlStreamReader pass that only
// reads tokens, over the same generated replies, and beside them what Qt's JSON parser and writer
// alone cost for the JSON rules. Rates are per byte of the reply in UTF-8.
#include "QUILImplementation/VcaRuleRetrieverPrivate.h"
#include "Trindle.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QUrl>
#include <QXmlStreamReader>

#include <benchmark/benchmark.h>

#include <string>

namespace {

using Private = VcaRuleRetriever::VcaRuleRetrieverPrivate;

const char* const RULE_TYPES[] = {"Intrusion",  "LineCrossing",  "Loitering",      "Counting",
                                  "ObjectLeft", "ObjectRemoved", "CrowdDetection", "Tampering"};
const int RULE_TYPE_COUNT = sizeof RULE_TYPES / sizeof RULE_TYPES[0];

// About 1 KB of JSON, members deliberately out of order so that sorting has work to do.
QString ruleJson(int index) {
    QString zone;
    for (int point = 0; point < 24; ++point) {
        if (point > 0)
            zone += QLatin1Char(',');
        zone += QStringLiteral("[%1,%2]")
                    .arg((index * 37 + point * 53) % 1920)
                    .arg((index * 11 + point * 29) % 1080);
    }
    return QStringLiteral(
               "{\"zone\":[%1],\"enabled\":true,\"sensitivity\":%2,"
               "\"objectFilter\":{\"minSize\":[24,48],\"maxSize\":[640,720],"
               "\"classes\":[\"person\",\"vehicle\",\"bicycle\"]},"
               "\"direction\":\"both\",\"dwellSeconds\":%3,\"id\":%4,"
               "\"schedule\":{\"mon\":[[0,1440]],\"tue\":[[0,1440]],\"wed\":[[480,1080]],"
               "\"thu\":[[480,1080]],\"fri\":[[480,1080]],\"sat\":[],\"sun\":[]},"
               "\"label\":\"Zone %4 near the loading bay\",\"colour\":\"#ff8800\","
               "\"actions\":{\"record\":true,\"notify\":[\"operator\",\"archive\"]}}")
        .arg(zone)
        .arg(50 + index % 50)
        .arg(index % 120)
        .arg(index);
}

// About 1 KB of XML per rule.
QString ruleXml(int index) {
    QString zone;
    for (int point = 0; point < 24; ++point)
        zone += QStringLiteral("<Point x=\"%1\" y=\"%2\"/>")
                    .arg((index * 37 + point * 53) % 1920)
                    .arg((index * 11 + point * 29) % 1080);
    return QStringLiteral("\r\n        <Enabled>true</Enabled>\r\n        <Sensitivity>%1"
                          "</Sensitivity>\r\n        <Zone>%2</Zone>\r\n        <Direction>both"
                          "</Direction>\r\n        <Label>Zone %3 near the loading bay</Label>"
                          "\r\n      ")
        .arg(50 + index % 50)
        .arg(zone)
        .arg(index);
}

QString encoded(const QString& text) {
    return QString::fromLatin1(QUrl::toPercentEncoding(text));
}

QString liveReply(int rules, bool json) {
    QString text =
        QStringLiteral("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\r\n<GetVCARulesRes>\r\n"
                       "  <Camera>\r\n    <CamName>Loading bay 1</CamName>\r\n"
                       "    <Rules Format=\"%1\">\r\n")
            .arg(json ? QStringLiteral("json") : QStringLiteral("xml"));
    for (int i = 0; i < rules; ++i)
        text += QStringLiteral("      <Rule Type=\"%1\" Name=\"%2\">%3</Rule>\r\n")
                    .arg(QLatin1String(RULE_TYPES[i % RULE_TYPE_COUNT]),
                         encoded(QStringLiteral("Zone ") + QString::number(i)),
                         json ? ruleJson(i) : ruleXml(i));
    text += QStringLiteral("    </Rules>\r\n  </Camera>\r\n</GetVCARulesRes>\r\n");
    return text;
}

QString recordingReply(int locations) {
    QString text =
        QStringLiteral("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<GetRecordingVCARulesRes>\n");
    for (int i = 0; i < locations; ++i) {
        const QString rules = QStringLiteral("{\"%1\":{\"Zone %2\":%3}}")
                                  .arg(QLatin1String(RULE_TYPES[i % RULE_TYPE_COUNT]),
                                       QString::number(i), ruleJson(i));
        text += QStringLiteral("  <Location>\n    <LocName>location-%1</LocName>\n"
                               "    <JsonRules>%2</JsonRules>\n"
                               "    <Projection>%3</Projection>\n"
                               "    <AnalysisEngine>%4</AnalysisEngine>\n  </Location>\n")
                    .arg(QString::number(i), encoded(rules),
                         encoded(QStringLiteral("{\"fov\":90,\"tilt\":%1}").arg(i % 45)),
                         encoded(QStringLiteral("{\"engine\":\"v2\",\"fps\":15}")));
    }
    text += QStringLiteral("</GetRecordingVCARulesRes>\n");
    return text;
}

void setBytes(benchmark::State& state, const QString& text) {
    const qsizetype bytes = text.toUtf8().size();
    state.SetBytesProcessed(state.iterations() * bytes);
    state.counters["replyBytes"] = static_cast<double>(bytes);
}

void bareReader(benchmark::State& state, const QString& text) {
    for (auto _ : state) {
        QXmlStreamReader reader(text);
        reader.setNamespaceProcessing(false);
        while (!reader.atEnd())
            reader.readNext();
        if (reader.hasError())
            state.SkipWithError("the generated reply is not well-formed");
        benchmark::DoNotOptimize(reader.tokenType());
    }
    setBytes(state, text);
}

void trindleParse(benchmark::State& state, const QString& text) {
    for (auto _ : state) {
        Trindle trindle;
        const QVariant tree = trindle.parse(text);
        if (!tree.isValid())
            state.SkipWithError("Trindle refused the generated reply");
        benchmark::DoNotOptimize(tree.constData());
    }
    setBytes(state, text);
}

void liveConversion(benchmark::State& state, const QString& text, bool json) {
    for (auto _ : state) {
        const QVariantMap result = Private::convertLiveReply(text, QStringLiteral("relay/1"));
        if (result.value(QStringLiteral("isJSON")).toBool() != json)
            state.SkipWithError("the reply took the wrong conversion");
        benchmark::DoNotOptimize(result.constBegin());
    }
    setBytes(state, text);
}

// What Qt's JSON alone costs for a JSON reply's rules: each rule's text parsed, and every rule
// written out once. Rated per byte of the whole reply, like the conversion it bounds.
void qtJsonAlone(benchmark::State& state, const QString& text, int rules) {
    QList<QByteArray> ruleTexts;
    for (int i = 0; i < rules; ++i)
        ruleTexts.append(ruleJson(i).toUtf8());
    for (auto _ : state) {
        QJsonObject all;
        for (int i = 0; i < rules; ++i)
            all.insert(QString::number(i), QJsonDocument::fromJson(ruleTexts.at(i)).object());
        benchmark::DoNotOptimize(QJsonDocument(all).toJson(QJsonDocument::Compact));
    }
    setBytes(state, text);
}

// Names are "xml/<what>/<reply>": the summary pairs each with "xml/bare/<reply>".
void registerReply(const std::string& label, const QString& text, bool live, bool json) {
    benchmark::RegisterBenchmark(("xml/bare/" + label).c_str(), bareReader, text);
    benchmark::RegisterBenchmark(("xml/parse/" + label).c_str(), trindleParse, text);
    if (live)
        benchmark::RegisterBenchmark(("xml/convert/" + label).c_str(), liveConversion, text, json);
}

} // namespace

int main(int argc, char** argv) {
    for (const int rules : {10, 100, 1000}) {
        const std::string label = "live-json-" + std::to_string(rules);
        const QString reply = liveReply(rules, true);
        registerReply(label, reply, true, true);
        benchmark::RegisterBenchmark(("xml/qtjson/" + label).c_str(), qtJsonAlone, reply, rules);
        registerReply("live-xml-" + std::to_string(rules), liveReply(rules, false), true, false);
    }
    registerReply("recording-100", recordingReply(100), false, false);

    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
