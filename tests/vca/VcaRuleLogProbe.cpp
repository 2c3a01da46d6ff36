#include "FakeFrameworkTools.h"
#include "QUILImplementation/VcaRuleRetriever.h"

#include <QCoreApplication>

#include <cstdio>

// Runs the three failing replies once, for a test that reads the log they leave.
int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    FakeFrameworkTools tools;
    VcaRuleRetriever retriever(&tools);
    int answers = 0;
    const ResponseCallback count = [&answers](bool, const QString&, const QString&,
                                              const QVariant&) { ++answers; };
    retriever.getLiveVcaRule("cam", count);
    retriever.getRecordingVcaRule({"L1"}, 1, count);
    retriever.getRecordingVcaRule({"L1"}, 1, count);
    tools.channel.reply(0, true, QString(), "relay", "80000404", QString(), true);
    tools.channel.reply(1, true, QString(), "relay", "80000001", "<x/>", true);
    tools.channel.reply(2, true, QString(), "relay", "0", "not xml", true);
    std::printf("answers=%d\n", answers);
    return answers == 3 ? 0 : 1;
}
