// The host's request JSON on any text: the body of POST /api/request, read as the HTTP front
// reads it, and PARAMS_JSON of quenvar-host request. Whatever is read goes back out as an answer.
#include "HostJson.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

namespace {

void answerWith(const QVariant& parameter) {
    const QByteArray json =
        HostJson::answer(ClientAnswer{true, QStringLiteral("0"), {}, parameter});
    // The answer is one line of JSON.
    if (json.contains('\n') || !QJsonDocument::fromJson(json).isObject())
        std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QByteArray text(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));

    const QJsonDocument document = QJsonDocument::fromJson(text);
    const QJsonObject body = document.object();
    if (body.value(QStringLiteral("command")).isString())
        answerWith(HostJson::parameter(body.value(QStringLiteral("params"))));

    QVariant parameter;
    QString error;
    if (HostJson::parseParameter(text, &parameter, &error))
        answerWith(parameter);
    else if (error.isEmpty())
        std::abort();
    return 0;
}
