#include "WendrelAuth.h"

#include <QCryptographicHash>
#include <QRandomGenerator>

#include <vector>

namespace {

// Enough for every camera of a large site; the table starts over when full.
const qsizetype MAX_KNOWN = 4096;

bool isSpace(char c) {
    return c == ' ' || c == '\t';
}

QByteArray readToken(const QByteArray& text, qsizetype& at) {
    const qsizetype start = at;
    while (at < text.size() && !isSpace(text[at]) && text[at] != ',' && text[at] != '=')
        ++at;
    return text.mid(start, at - start);
}

QByteArray readValue(const QByteArray& text, qsizetype& at) {
    if (at >= text.size() || text[at] != '"') {
        const qsizetype start = at;
        while (at < text.size() && text[at] != ',' && !isSpace(text[at]))
            ++at;
        return text.mid(start, at - start);
    }
    QByteArray value;
    for (++at; at < text.size() && text[at] != '"'; ++at) {
        if (text[at] == '\\' && at + 1 < text.size())
            ++at;
        value += text[at];
    }
    ++at;
    return value;
}

// Challenges are a scheme name followed by name=value parameters, all separated by commas.
std::vector<WendrelAuth::Challenge> parseChallenges(const QByteArray& text) {
    std::vector<WendrelAuth::Challenge> challenges;
    qsizetype at = 0;
    while (at < text.size()) {
        while (at < text.size() && (isSpace(text[at]) || text[at] == ','))
            ++at;
        const QByteArray token = readToken(text, at);
        if (token.isEmpty()) {
            ++at;
            continue;
        }
        qsizetype next = at;
        while (next < text.size() && isSpace(text[next]))
            ++next;
        if (next < text.size() && text[next] == '=' && !challenges.empty()) {
            at = next + 1;
            while (at < text.size() && isSpace(text[at]))
                ++at;
            challenges.back().params.insert(token.toLower(), readValue(text, at));
        } else {
            challenges.push_back({token.toLower(), {}});
        }
    }
    return challenges;
}

bool isSession(const WendrelAuth::Challenge& challenge) {
    return challenge.params.value("algorithm").compare("MD5-sess", Qt::CaseInsensitive) == 0;
}

bool usesQopAuth(const WendrelAuth::Challenge& challenge) {
    for (const QByteArray& qop : challenge.params.value("qop").split(',')) {
        if (qop.trimmed().compare("auth", Qt::CaseInsensitive) == 0)
            return true;
    }
    return false;
}

bool canAnswerDigest(const WendrelAuth::Challenge& challenge) {
    const QByteArray algorithm = challenge.params.value("algorithm", "MD5");
    return (algorithm.compare("MD5", Qt::CaseInsensitive) == 0 || isSession(challenge)) &&
           (!challenge.params.contains("qop") || usesQopAuth(challenge));
}

QByteArray md5Hex(const QByteArray& text) {
    return QCryptographicHash::hash(text, QCryptographicHash::Md5).toHex();
}

QByteArray quoted(const QByteArray& value) {
    QByteArray escaped = value;
    escaped.replace('\\', "\\\\").replace('"', "\\\"");
    return '"' + escaped + '"';
}

QByteArray newClientNonce() {
    quint32 words[2];
    QRandomGenerator::system()->fillRange(words);
    return QByteArray(reinterpret_cast<const char*>(words), sizeof words).toHex();
}

} // namespace

QByteArray WendrelAuth::before(const QString& origin, const QByteArray& method,
                               const QByteArray& target, const QString& user,
                               const QString& password) {
    const auto found = known.find(keyOf(origin, user, password));
    if (found == known.end())
        return {};
    return respond(found->challenge, method, target, user, password, newClientNonce(),
                   ++found->count);
}

QByteArray WendrelAuth::answer(const QString& origin, const QByteArray& challenges,
                               const QByteArray& method, const QByteArray& target,
                               const QString& user, const QString& password) {
    const Challenge challenge = choose(challenges);
    if (challenge.scheme.isEmpty())
        return {};
    if (known.size() >= MAX_KNOWN)
        known.clear();
    known.insert(keyOf(origin, user, password), Known{challenge, 1});
    return respond(challenge, method, target, user, password, newClientNonce(), 1);
}

void WendrelAuth::forget(const QString& origin, const QString& user, const QString& password) {
    known.remove(keyOf(origin, user, password));
}

WendrelAuth::Challenge WendrelAuth::choose(const QByteArray& challenges) {
    const std::vector<Challenge> offered = parseChallenges(challenges);
    for (const Challenge& challenge : offered) {
        if (challenge.scheme == "digest" && canAnswerDigest(challenge))
            return challenge;
    }
    for (const Challenge& challenge : offered) {
        if (challenge.scheme == "basic")
            return challenge;
    }
    return {};
}

QByteArray WendrelAuth::respond(const Challenge& challenge, const QByteArray& method,
                                const QByteArray& target, const QString& user,
                                const QString& password, const QByteArray& clientNonce,
                                quint32 count) {
    if (challenge.scheme == "basic")
        return "Basic " + (user.toUtf8() + ':' + password.toUtf8()).toBase64();

    const QByteArray realm = challenge.params.value("realm");
    const QByteArray nonce = challenge.params.value("nonce");
    const QByteArray countText = QByteArray::number(count, 16).rightJustified(8, '0');
    const bool qopAuth = usesQopAuth(challenge);
    QByteArray secret = md5Hex(user.toUtf8() + ':' + realm + ':' + password.toUtf8());
    if (isSession(challenge))
        secret = md5Hex(secret + ':' + nonce + ':' + clientNonce);
    const QByteArray request = md5Hex(method + ':' + target);
    const QByteArray response = qopAuth ? md5Hex(secret + ':' + nonce + ':' + countText + ':' +
                                                 clientNonce + ":auth:" + request)
                                        : md5Hex(secret + ':' + nonce + ':' + request);

    QByteArray header = "Digest username=" + quoted(user.toUtf8()) + ", realm=" + quoted(realm) +
                        ", nonce=" + quoted(nonce) + ", uri=" + quoted(target) +
                        ", response=" + quoted(response) +
                        ", algorithm=" + challenge.params.value("algorithm", "MD5");
    if (qopAuth)
        header += ", qop=auth, nc=" + countText + ", cnonce=" + quoted(clientNonce);
    if (challenge.params.contains("opaque"))
        header += ", opaque=" + quoted(challenge.params.value("opaque"));
    return header;
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
