#include "FrontGate.h"

#include <QCryptographicHash>

#include <openssl/crypto.h>

namespace {

QByteArray digest(const QByteArray& text) {
    return QCryptographicHash::hash(text, QCryptographicHash::Sha256);
}

// A name as it appears in a Host header: in lower case, an IPv6 address in brackets.
QByteArray hostName(const QString& name) {
    const QByteArray lower = name.toLower().toUtf8();
    return lower.contains(':') && !lower.startsWith('[') ? '[' + lower + ']' : lower;
}

// The token of an "Authorization: Bearer TOKEN" value; empty for anything else.
QByteArray bearerToken(const char* authorization) {
    const QByteArray value = QByteArray(authorization).trimmed();
    const qsizetype space = value.indexOf(' ');
    if (space < 0 || value.left(space).toLower() != "bearer")
        return QByteArray();
    return value.mid(space + 1).trimmed();
}

} // namespace

FrontGate::FrontGate(const QByteArray& token, const QStringList& extraNames, quint16 port)
    : tokenDigest(digest(token)) {
    const QStringList names = QStringList{QStringLiteral("127.0.0.1"), QStringLiteral("localhost"),
                                          QStringLiteral("::1")} +
                              extraNames;
    for (const QString& name : names) {
        authorities.insert(hostName(name) + ':' + QByteArray::number(port));
        // Clients leave the default port out.
        if (port == 80)
            authorities.insert(hostName(name));
    }
}

FrontGate::Verdict FrontGate::admit(const char* host, const char* origin,
                                    const char* authorization) const {
    if (!host || !authorities.contains(QByteArray(host).toLower()))
        return {403, "the Host header does not name this server"};
    if (origin) {
        const QByteArray value = QByteArray(origin).toLower();
        if (!value.startsWith("http://") || !authorities.contains(value.mid(7)))
            return {403, "requests from other origins are not served"};
    }
    const QByteArray token = bearerToken(authorization);
    // Digests have one length whatever was sent, and are compared in constant time.
    if (token.isEmpty() || tokenDigest.isEmpty() ||
        CRYPTO_memcmp(digest(token).constData(), tokenDigest.constData(),
                      static_cast<size_t>(tokenDigest.size())) != 0)
        return {401, "a bearer token is needed: Authorization: Bearer TOKEN"};
    return {};
}
