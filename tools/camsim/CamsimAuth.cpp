#include "CamsimAuth.h"

#include <QByteArray>
#include <QCryptographicHash>
#include <QRandomGenerator>

#include <httplib.h>

#include <algorithm>
#include <cctype>

namespace {

const char REALM[] = "quenvar-camsim";
const auto NONCE_LIFETIME = std::chrono::minutes(5);
const size_t MAX_NONCES = 1024;
const size_t MAX_COUNTS_PER_NONCE = 4096;

std::string md5Hex(const std::string& text) {
    return QCryptographicHash::hash(QByteArray::fromStdString(text), QCryptographicHash::Md5)
        .toHex()
        .toStdString();
}

std::string lower(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return text;
}

// The credentials after the scheme name, "Basic " or "Digest ", matched without case.
bool stripScheme(const std::string& header, const std::string& name, std::string* rest) {
    if (header.size() <= name.size() || lower(header.substr(0, name.size())) != lower(name) ||
        header[name.size()] != ' ')
        return false;
    *rest = header.substr(name.size() + 1);
    return true;
}

// name=value pairs separated by commas; a value is a token or a quoted string with \-escapes.
std::map<std::string, std::string> parseAuthParams(const std::string& text) {
    std::map<std::string, std::string> params;
    size_t at = 0;
    while (at < text.size()) {
        while (at < text.size() && (text[at] == ' ' || text[at] == ',' || text[at] == '\t'))
            ++at;
        const size_t equals = text.find('=', at);
        if (equals == std::string::npos)
            break;
        std::string name = lower(text.substr(at, equals - at));
        name.erase(name.find_last_not_of(" \t") + 1);
        at = equals + 1;
        while (at < text.size() && (text[at] == ' ' || text[at] == '\t'))
            ++at;
        std::string value;
        if (at < text.size() && text[at] == '"') {
            for (++at; at < text.size() && text[at] != '"'; ++at) {
                if (text[at] == '\\' && at + 1 < text.size())
                    ++at;
                value += text[at];
            }
            ++at;
        } else {
            const size_t end = std::min(text.find(',', at), text.size());
            value = text.substr(at, end - at);
            value.erase(value.find_last_not_of(" \t") + 1);
            at = end;
        }
        params[name] = value;
    }
    return params;
}

std::string paramOf(const std::map<std::string, std::string>& params, const std::string& name) {
    const auto found = params.find(name);
    return found == params.end() ? std::string() : found->second;
}

bool isNonceCount(const std::string& count) {
    return count.size() == 8 && std::all_of(count.begin(), count.end(),
                                            [](unsigned char c) { return std::isxdigit(c); });
}

} // namespace

CamsimAuth::CamsimAuth(Scheme scheme, std::string user, std::string password)
    : scheme(scheme)
    , user(std::move(user))
    , password(std::move(password)) {}

bool CamsimAuth::parseScheme(const std::string& text, Scheme* scheme) {
    if (text == "none")
        *scheme = Scheme::None;
    else if (text == "basic")
        *scheme = Scheme::Basic;
    else if (text == "digest")
        *scheme = Scheme::Digest;
    else
        return false;
    return true;
}

bool CamsimAuth::admit(const httplib::Request& req, httplib::Response& res) {
    if (scheme == Scheme::None)
        return true;
    const std::string header = req.get_header_value("Authorization");
    std::string credentials;
    if (scheme == Scheme::Basic) {
        if (stripScheme(header, "Basic", &credentials) && checkBasic(credentials))
            return true;
        challenge(res, false);
        return false;
    }
    const Verdict verdict = stripScheme(header, "Digest", &credentials)
                                ? checkDigest(req, credentials)
                                : Verdict::Rejected;
    if (verdict == Verdict::Accepted)
        return true;
    challenge(res, verdict == Verdict::Stale);
    return false;
}

bool CamsimAuth::checkBasic(const std::string& credentials) const {
    const QByteArray expected = QByteArray::fromStdString(user + ':' + password).toBase64();
    return QByteArray::fromStdString(credentials).trimmed() == expected;
}

CamsimAuth::Verdict CamsimAuth::checkDigest(const httplib::Request& req,
                                            const std::string& credentials) {
    const auto params = parseAuthParams(credentials);
    const std::string uri = paramOf(params, "uri");
    const std::string nonce = paramOf(params, "nonce");
    const std::string count = paramOf(params, "nc");
    const std::string clientNonce = paramOf(params, "cnonce");
    const std::string algorithm = paramOf(params, "algorithm");
    // httplib percent-decodes header values, so the uri parameter arrives decoded; the hash is
    // checked against the target as it was sent.
    if (paramOf(params, "username") != user || paramOf(params, "realm") != REALM ||
        uri != httplib::detail::decode_url(req.target, false) || paramOf(params, "qop") != "auth" ||
        !isNonceCount(count) || clientNonce.empty() || nonce.empty() ||
        (!algorithm.empty() && lower(algorithm) != "md5"))
        return Verdict::Rejected;

    const std::string secret = md5Hex(user + ':' + REALM + ':' + password);
    const std::string expected = md5Hex(secret + ':' + nonce + ':' + count + ':' + clientNonce +
                                        ":auth:" + md5Hex(req.method + ':' + req.target));
    if (lower(paramOf(params, "response")) != expected)
        return Verdict::Rejected;
    // Only a correct answer uses up a nonce count.
    return useNonce(nonce, lower(count));
}

CamsimAuth::Verdict CamsimAuth::useNonce(const std::string& nonce, const std::string& count) {
    std::lock_guard<std::mutex> lock(mutex);
    const auto found = nonces.find(nonce);
    if (found == nonces.end() || Clock::now() - found->second.issued > NONCE_LIFETIME)
        return Verdict::Stale;
    std::set<std::string>& counts = found->second.counts;
    if (counts.size() >= MAX_COUNTS_PER_NONCE || !counts.insert(count).second)
        return Verdict::Stale;
    return Verdict::Accepted;
}

std::string CamsimAuth::issueNonce() {
    quint32 words[4];
    QRandomGenerator::system()->fillRange(words);
    const std::string nonce =
        QByteArray(reinterpret_cast<const char*>(words), sizeof words).toHex().toStdString();

    std::lock_guard<std::mutex> lock(mutex);
    const Clock::time_point now = Clock::now();
    for (auto it = nonces.begin(); it != nonces.end();)
        it = now - it->second.issued > NONCE_LIFETIME ? nonces.erase(it) : std::next(it);
    if (nonces.size() >= MAX_NONCES) {
        nonces.erase(
            std::min_element(nonces.begin(), nonces.end(), [](const auto& a, const auto& b) {
                return a.second.issued < b.second.issued;
            }));
    }
    nonces.emplace(nonce, Nonce{now, {}});
    return nonce;
}

void CamsimAuth::challenge(httplib::Response& res, bool stale) {
    res.status = 401;
    if (scheme == Scheme::Basic) {
        res.set_header("WWW-Authenticate", std::string("Basic realm=\"") + REALM + '"');
    } else {
        res.set_header("WWW-Authenticate", std::string("Digest realm=\"") + REALM +
                                               "\", qop=\"auth\", algorithm=MD5, nonce=\"" +
                                               issueNonce() + '"' + (stale ? ", stale=true" : ""));
    }
    res.set_content("401 Unauthorized\n", "text/plain");
}
