#include "ClientResponse.h"

const QString ClientResponse::CODE_OK = QStringLiteral("0");
const QString ClientResponse::CODE_FAILED = QStringLiteral("-1");

void ClientResponse::send(const ResponseCallback& callback, bool handled, bool ok,
                          const QVariant& payload) {
    if (callback)
        callback(handled, code(ok), QString(), payload);
}
