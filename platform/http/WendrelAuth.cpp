#include "WendrelAuth.h"

#include <QCryptographicHash>
#include <QRandomGenerator>

#include <openssl/evp.h>

namespace {

using Algorithm = WendrelChallenge::Algorithm;

// Lower-case hex of the algorithm's hash; empty when it cannot be computed.
QByteArray hashHex(Algorithm algorithm, const QByteArray& text) {
    switch (algorithm) {
    case Algorithm::Md5:
        return QCryptographicHash::hash(text, QCryptographicHash::Md5).toHex();
    case Algorithm::Sha256:
        return QCryptographicHash::hash(text, QCryptographicHash::Sha256).toHex();
    case Algorithm::Sha512_256: {
        // Not SHA-512 cut short: SHA-512/256 starts from its own initial values.
        unsigned char digest[EVP_MAX_MD_SIZE];
        unsigned int size = 0;
        if (EVP_Digest(text.constData(), size_t(text.size()), digest, &size, EVP_sha512_256(),
                       nullptr) != 1)
            return {};
        return QByteArray(reinterpret_cast<const char*>(digest), int(size)).toHex();
    }
    case Algorithm::Unsupported:
        break;
    }
    return {};
}

QByteArray quoted(const QByteArray& value) {
    QByteArray escaped = value;
    escaped.replace('\\', "\\\\").replace('"', "\\\"");
    return '"' + escaped + '"';
}

// Printable ASCII only: what a quoted string carries as itself.
bool isQuotable(const QByteArray& text) {
    for (const char c : text) {
        if (c < 0x20 || c > 0x7e)
            return false;
    }
    return true;
}

// RFC 7616, section 3.4.4: username, username* or the user hash.
QByteArray usernameParameter(const WendrelChallenge& challenge, const QString& user) {
    const QByteArray bytes = user.toUtf8();
    if (challenge.userhash)
        return "username=" + quoted(hashHex(challenge.algorithm, bytes + ':' + challenge.realm));
    if (isQuotable(bytes))
        return "username=" + quoted(bytes);
    // RFC 8187's ext-value: attr-char stays, everything else is percent-encoded.
    return "username*=UTF-8''" + QUrl::toPercentEncoding(user, "!#$&+^`|");
}

QByteArray digestAnswer(const WendrelChallenge& challenge, const QByteArray& method,
                        const QByteArray& target, const QString& user, const QString& password,
                        const QByteArray& clientNonce, quint32 count) {
    const Algorithm algorithm = challenge.algorithm;
    const auto hash = [algorithm](const QByteArray& text) { return hashHex(algorithm, text); };
    const QByteArray& nonce = challenge.nonce;
    const QByteArray countText = QByteArray::number(count, 16).rightJustified(8, '0');
    const bool qopAuth = challenge.qop == WendrelChallenge::Qop::Auth;

    QByteArray secret = hash(user.toUtf8() + ':' + challenge.realm + ':' + password.toUtf8());
    if (challenge.session)
        secret = hash(secret + ':' + nonce + ':' + clientNonce);
    const QByteArray request = hash(method + ':' + target);
    const QByteArray response =
        qopAuth
            ? hash(secret + ':' + nonce + ':' + countText + ':' + clientNonce + ":auth:" + request)
            : hash(secret + ':' + nonce + ':' + request);
    if (response.isEmpty())
        return {};

    QByteArray header = "Digest " + usernameParameter(challenge, user) +
                        ", realm=" + quoted(challenge.realm) + ", uri=" + quoted(target) +
                        ", algorithm=" + challenge.algorithmName() + ", nonce=" + quoted(nonce);
    if (qopAuth)
        header += ", nc=" + countText + ", cnonce=" + quoted(clientNonce) + ", qop=auth";
    header += ", response=" + quoted(response);
    if (challenge.hasOpaque)
        header += ", opaque=" + quoted(challenge.opaque);
    if (challenge.userhash)
        header += ", userhash=true";
    return header;
}

QByteArray newClientNonce() {
    quint32 words[4];
    QRandomGenerator::system()->fillRange(words);
    return QByteArray(reinterpret_cast<const char*>(words), sizeof words).toHex();
}

} // namespace

QByteArray WendrelAuth::before(const QString& origin, const QByteArray& method,
                               const QByteArray& target, const QString& user,
                               const QString& password) {
    Known* found = known.find(keyOf(origin, user, password));
    if (!found)
        return {};
    return respond(found->challenge, method, target, user, password, newClientNonce(),
                   ++found->count);
}

WendrelAuth::Answer WendrelAuth::answer(const QString& origin, const QByteArray& challenges,
                                        const QByteArray& method, const QByteArray& target,
                                        const QString& user, const QString& password, bool https) {
    const QByteArray key = keyOf(origin, user, password);
    const std::optional<WendrelChallenge> chosen = WendrelChallenge::choose(challenges);
    if (!chosen) {
        known.remove(key);
        return {{}, Answer::Refusal::Unanswerable, {}};
    }
    const bool basic = chosen->scheme == WendrelChallenge::Scheme::Basic;
    const QByteArray scheme = basic ? "Basic" : "Digest";
    if (basic && !https && digestWorked.find(key)) {
        known.remove(key);
        return {{}, Answer::Refusal::Downgrade, scheme};
    }
    const QByteArray authorization =
        respond(*chosen, method, target, user, password, newClientNonce(), 1);
    if (authorization.isEmpty()) {
        known.remove(key);
        return {{}, Answer::Refusal::Unanswerable, scheme};
    }
    known.insert(key, Known{*chosen, 1}, chosen->heapBytes());
    return {authorization, Answer::Refusal::None, scheme};
}

void WendrelAuth::accepted(const QString& origin, const QString& user, const QString& password) {
    const QByteArray key = keyOf(origin, user, password);
    if (!digestWorked.find(key))
        digestWorked.insert(key, {}, 0);
    // A Basic challenge answered while the Digest request was under way: ask again, so that
    // answer() decides.
    const Known* found = known.find(key);
    if (found && found->challenge.scheme == WendrelChallenge::Scheme::Basic)
        known.remove(key);
}

void WendrelAuth::forget(const QString& origin, const QString& user, const QString& password) {
    known.remove(keyOf(origin, user, password));
}

QByteArray WendrelAuth::respond(const WendrelChallenge& challenge, const QByteArray& method,
                                const QByteArray& target, const QString& user,
                                const QString& password, const QByteArray& clientNonce,
                                quint32 count) {
    QByteArray header;
    if (challenge.scheme == WendrelChallenge::Scheme::Basic)
        header = "Basic " + (user.toUtf8() + ':' + password.toUtf8()).toBase64();
    else if (challenge.scheme == WendrelChallenge::Scheme::Digest && challenge.answerable())
        header = digestAnswer(challenge, method, target, user, password, clientNonce, count);
    // The last guard before the wire: no control character, CR, LF and NUL above all.
    return WendrelChallenge::hasControl(header) ? QByteArray() : header;
}

QByteArray WendrelAuth::target(const QUrl& url) {
    if (url.path().isEmpty())
        return "/" + url.toEncoded(QUrl::RemoveScheme | QUrl::RemoveAuthority |
                                   QUrl::RemoveFragment | QUrl::RemovePath);
    return url.toEncoded(QUrl::RemoveScheme | QUrl::RemoveAuthority | QUrl::RemoveFragment |
                         QUrl::NormalizePathSegments);
}

QByteArray WendrelAuth::keyOf(const QString& origin, const QString& user, const QString& password) {
    QCryptographicHash hash(QCryptographicHash::Sha256);
    for (const QString& part : {origin, user, password}) {
        const QByteArray bytes = part.toUtf8();
        hash.addData(QByteArray::number(bytes.size()) + ':' + bytes);
    }
    return hash.result();
}
