#include "WendrelChallenge.h"

#include <QList>

#include <algorithm>
#include <cstring>

namespace {

// What Qt's header and the allocator add to each byte array's heap block.
const qsizetype ARRAY_OVERHEAD = 40;

enum class Parameter { Other, Realm, Nonce, Opaque, Algorithm, Qop, Stale, Userhash, Charset };

Parameter parameterOf(const QByteArray& name) {
    static const struct {
        const char* name;
        Parameter parameter;
    } known[] = {{"realm", Parameter::Realm},       {"nonce", Parameter::Nonce},
                 {"opaque", Parameter::Opaque},     {"algorithm", Parameter::Algorithm},
                 {"qop", Parameter::Qop},           {"stale", Parameter::Stale},
                 {"userhash", Parameter::Userhash}, {"charset", Parameter::Charset}};
    for (const auto& entry : known) {
        if (name == entry.name)
            return entry.parameter;
    }
    return Parameter::Other;
}

bool isWhite(char c) {
    return c == ' ' || c == '\t';
}

bool isAlphaNumeric(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

bool isTokenChar(char c) {
    return isAlphaNumeric(c) || (c != '\0' && std::strchr("!#$%&'*+-.^_`|~", c));
}

bool isToken68Char(char c) {
    return isAlphaNumeric(c) || (c != '\0' && std::strchr("-._~+/", c));
}

bool isTrue(const QByteArray& value) {
    return value.compare("true", Qt::CaseInsensitive) == 0;
}

// RFC 7235's challenge grammar over one field's text, leniently: a value may be any run of
// bytes up to a comma or white space.
class FieldReader {
public:
    explicit FieldReader(const QByteArray& text)
        : text(text) {}

    bool atEnd() const { return at >= text.size(); }
    char peek() const { return atEnd() ? '\0' : text[at]; }
    void advance() { ++at; }
    void skipWhite() {
        while (!atEnd() && isWhite(text[at]))
            ++at;
    }
    void skipSeparators() {
        while (!atEnd() && (isWhite(text[at]) || text[at] == ','))
            ++at;
    }

    QByteArray token() {
        const qsizetype start = at;
        while (!atEnd() && isTokenChar(text[at]))
            ++at;
        return text.mid(start, at - start);
    }

    // Skips the token68 that may follow a scheme (Negotiate's "abc=="), which only a comma or
    // the end may follow; reads nothing when what follows is a parameter instead.
    void skipToken68() {
        qsizetype end = at;
        while (end < text.size() && isToken68Char(text[end]))
            ++end;
        if (end == at)
            return;
        while (end < text.size() && text[end] == '=')
            ++end;
        while (end < text.size() && isWhite(text[end]))
            ++end;
        if (end == text.size() || text[end] == ',')
            at = end;
    }

    // Reads a token or a quoted string; false when a quoted string is not closed. When kept is
    // given, it receives the value, cut after one byte more than a value may hold.
    bool value(QByteArray* kept) {
        const qsizetype most = WendrelChallenge::maxValueBytes + 1;
        if (peek() != '"') {
            const qsizetype start = at;
            while (!atEnd() && text[at] != ',' && !isWhite(text[at]))
                ++at;
            if (kept)
                *kept = text.mid(start, std::min(at - start, most));
            return true;
        }
        for (++at; !atEnd() && text[at] != '"'; ++at) {
            if (text[at] == '\\' && ++at == text.size())
                return false;
            if (kept && kept->size() < most)
                kept->append(text[at]);
        }
        if (atEnd())
            return false;
        ++at;
        return true;
    }

private:
    const QByteArray& text;
    qsizetype at = 0;
};

WendrelChallenge::Scheme schemeOf(const QByteArray& name) {
    if (name == "digest")
        return WendrelChallenge::Scheme::Digest;
    if (name == "basic")
        return WendrelChallenge::Scheme::Basic;
    return WendrelChallenge::Scheme::Other;
}

void readAlgorithm(WendrelChallenge& challenge, QByteArray name) {
    challenge.session = name.endsWith("-sess");
    if (challenge.session)
        name.chop(5);
    if (name == "md5")
        challenge.algorithm = WendrelChallenge::Algorithm::Md5;
    else if (name == "sha-256")
        challenge.algorithm = WendrelChallenge::Algorithm::Sha256;
    else if (name == "sha-512-256")
        challenge.algorithm = WendrelChallenge::Algorithm::Sha512_256;
    else
        challenge.algorithm = WendrelChallenge::Algorithm::Unsupported;
}

// False when the value may not be kept: too long, or with a control character.
bool apply(WendrelChallenge& challenge, Parameter parameter, QByteArray value) {
    if (value.size() > WendrelChallenge::maxValueBytes || WendrelChallenge::hasControl(value))
        return false;
    value.squeeze();
    switch (parameter) {
    case Parameter::Realm:
        challenge.realm = value;
        break;
    case Parameter::Nonce:
        challenge.nonce = value;
        break;
    case Parameter::Opaque:
        challenge.opaque = value;
        challenge.hasOpaque = true;
        break;
    case Parameter::Algorithm:
        readAlgorithm(challenge, value.toLower());
        break;
    case Parameter::Qop:
        challenge.qop = WendrelChallenge::Qop::Unsupported;
        for (const QByteArray& qop : value.split(',')) {
            if (qop.trimmed().compare("auth", Qt::CaseInsensitive) == 0)
                challenge.qop = WendrelChallenge::Qop::Auth;
        }
        break;
    case Parameter::Stale:
        challenge.stale = isTrue(value);
        break;
    case Parameter::Userhash:
        challenge.userhash = isTrue(value);
        break;
    case Parameter::Charset:
        // RFC 7616 allows UTF-8 alone, which answers always use.
    case Parameter::Other:
        break;
    }
    return true;
}

} // namespace

std::optional<std::vector<WendrelChallenge>> WendrelChallenge::parse(const QByteArray& text) {
    std::vector<WendrelChallenge> challenges;
    FieldReader in(text);
    int parameters = 0;
    unsigned seen = 0; // a bit per Parameter: a repeated one makes the answer ambiguous
    for (in.skipSeparators(); !in.atEnd(); in.skipSeparators()) {
        const QByteArray name = in.token().toLower();
        if (name.isEmpty())
            return std::nullopt;
        in.skipWhite();
        if (in.peek() != '=') {
            if (challenges.size() == size_t(maxChallenges))
                return std::nullopt;
            challenges.emplace_back().scheme = schemeOf(name);
            parameters = 0;
            seen = 0;
            in.skipToken68();
            continue;
        }
        in.advance();
        if (challenges.empty() || ++parameters > maxParameters)
            return std::nullopt;
        in.skipWhite();
        WendrelChallenge& challenge = challenges.back();
        const Parameter parameter =
            challenge.scheme == Scheme::Digest ? parameterOf(name) : Parameter::Other;
        const bool keep = parameter != Parameter::Other;
        QByteArray value;
        if (!in.value(keep ? &value : nullptr))
            return std::nullopt;
        if (keep) {
            const unsigned bit = 1u << unsigned(parameter);
            if ((seen & bit) || !apply(challenge, parameter, value))
                return std::nullopt;
            seen |= bit;
        }
        in.skipWhite();
        if (!in.atEnd() && in.peek() != ',')
            return std::nullopt;
    }
    return challenges;
}

std::optional<WendrelChallenge> WendrelChallenge::choose(const QByteArray& text) {
    const std::optional<std::vector<WendrelChallenge>> challenges = parse(text);
    if (!challenges)
        return std::nullopt;
    for (const WendrelChallenge& challenge : *challenges) {
        if (challenge.scheme == Scheme::Digest && challenge.answerable())
            return challenge;
    }
    for (const WendrelChallenge& challenge : *challenges) {
        if (challenge.scheme == Scheme::Basic)
            return challenge;
    }
    return std::nullopt;
}

bool WendrelChallenge::hasControl(const QByteArray& value) {
    for (const char c : value) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            return true;
    }
    return false;
}

bool WendrelChallenge::answerable() const {
    switch (scheme) {
    case Scheme::Basic:
        return true;
    case Scheme::Digest:
        // A -sess answer needs the client nonce, which is sent with qop only.
        return algorithm != Algorithm::Unsupported && qop != Qop::Unsupported && !nonce.isEmpty() &&
               !(session && qop == Qop::None);
    case Scheme::Other:
        break;
    }
    return false;
}

QByteArray WendrelChallenge::algorithmName() const {
    QByteArray name;
    switch (algorithm) {
    case Algorithm::Md5:
        name = "MD5";
        break;
    case Algorithm::Sha256:
        name = "SHA-256";
        break;
    case Algorithm::Sha512_256:
        name = "SHA-512-256";
        break;
    case Algorithm::Unsupported:
        return {};
    }
    return session ? name + "-sess" : name;
}

qsizetype WendrelChallenge::heapBytes() const {
    qsizetype bytes = 0;
    for (const QByteArray* value : {&realm, &nonce, &opaque}) {
        if (value->capacity() > 0)
            bytes += value->capacity() + ARRAY_OVERHEAD;
    }
    return bytes;
}
