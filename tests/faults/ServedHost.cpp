#include "ServedHost.h"

#include "BuildPaths.h"
#include "EventLoopWait.h"

#include <QElapsedTimer>
#include <QJsonDocument>

#include <httplib.h>

#include <atomic>
#include <thread>
#include <vector>

namespace {

// Longer than any answer may take: the host's own wait is 30 s.
const int READ_TIMEOUT_S = 40;

} // namespace

QJsonObject ServedHost::request(const QString& command, const QVariant& params) {
    return {{"command", command}, {"params", QJsonValue::fromVariant(params)}};
}

bool ServedHost::serve(const QStringList& arguments, QProcessEnvironment environment) {
    environment.insert(QStringLiteral("QUENVAR_HOST_TOKEN"), QLatin1String(TOKEN));
    return start(BuildPaths::bin("quenvar-host"),
                 QStringList{"serve", "--listen", "127.0.0.1:0"} + arguments, environment);
}

QList<ServedHost::Answer> ServedHost::post(const QList<QJsonObject>& requests) const {
    QList<Answer> answers(requests.size());
    std::atomic<qsizetype> open{requests.size()};
    std::vector<std::thread> senders;
    QElapsedTimer clock;
    clock.start();
    for (qsizetype i = 0; i < requests.size(); ++i) {
        const std::string body = QJsonDocument(requests.at(i)).toJson().toStdString();
        senders.emplace_back([this, body, &answer = answers[i], &clock, &open] {
            httplib::Client client("127.0.0.1", port());
            client.set_bearer_token_auth(TOKEN);
            client.set_read_timeout(READ_TIMEOUT_S, 0);
            const httplib::Result result = client.Post("/api/request", body, "application/json");
            answer.elapsedMs = clock.elapsed();
            if (result) {
                answer.status = result->status;
                answer.json =
                    QJsonDocument::fromJson(QByteArray::fromStdString(result->body)).object();
            }
            --open;
        });
    }
    // A camera played by this process answers in its event loop.
    runEventLoopUntil([&open] { return open == 0; }, (READ_TIMEOUT_S + 5) * 1000);
    for (std::thread& sender : senders)
        sender.join();
    return answers;
}
