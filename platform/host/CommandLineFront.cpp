#include "CommandLineFront.h"

#include "HostJson.h"
#include "PendingAnswer.h"

#include <QCoreApplication>
#include <QTimer>

#include <cstdio>

namespace {

void printLine(const QByteArray& text) {
    const QByteArray line = text + '\n';
    std::fwrite(line.constData(), 1, static_cast<size_t>(line.size()), stdout);
    std::fflush(stdout);
}

void leaveEventLoop() {
    QMetaObject::invokeMethod(
        QCoreApplication::instance(), []() { QCoreApplication::exit(0); }, Qt::QueuedConnection);
}

} // namespace

CommandLineFront::CommandLineFront(IPluginObjectBase& plugin)
    : plugin(plugin) {}

int CommandLineFront::run(const QString& command, const QVariant& params, int timeoutMs) {
    auto pending = PendingAnswer::create();
    pending->setListener(&leaveEventLoop);
    QTimer deadline;
    deadline.setSingleShot(true);
    QObject::connect(&deadline, &QTimer::timeout, &leaveEventLoop);
    deadline.start(timeoutMs);

    plugin.Request(command, params, RequestSenderInfo{QStringLiteral("cli"), QString()},
                   pending->callback());
    if (pending->state() == PendingAnswer::State::Waiting)
        QCoreApplication::exec();
    pending->setListener(nullptr);

    if (pending->state() != PendingAnswer::State::Answered) {
        printLine(HostJson::notAnswered());
        return EXIT_NOT_ANSWERED;
    }
    printLine(HostJson::answer(pending->answer()));
    return EXIT_ANSWERED;
}
