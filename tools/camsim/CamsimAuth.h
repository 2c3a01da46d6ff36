#pragma once

#include <chrono>
#include <map>
#include <mutex>
#include <set>
#include <string>

namespace httplib {
struct Request;
struct Response;
} // namespace httplib

// HTTP authentication of the simulated camera: Basic, or Digest with MD5 and qop=auth. A Digest
// nonce is one this camera issued in the last five minutes, and each nonce count is accepted
// once; an expired nonce or a repeated count gets a fresh challenge marked stale.
class CamsimAuth {
public:
    enum class Scheme { None, Basic, Digest };

    CamsimAuth(Scheme scheme, std::string user, std::string password);

    // True when the request may pass; otherwise res holds a 401 with a challenge.
    bool admit(const httplib::Request& req, httplib::Response& res);

    static bool parseScheme(const std::string& text, Scheme* scheme);

private:
    enum class Verdict { Accepted, Rejected, Stale };
    using Clock = std::chrono::steady_clock;

    struct Nonce {
        Clock::time_point issued;
        std::set<std::string> counts;
    };

    bool checkBasic(const std::string& credentials) const;
    Verdict checkDigest(const httplib::Request& req, const std::string& credentials);
    Verdict useNonce(const std::string& nonce, const std::string& count);
    std::string issueNonce();
    void challenge(httplib::Response& res, bool stale);

    const Scheme scheme;
    const std::string user;
    const std::string password;
    std::mutex mutex;
    std::map<std::string, Nonce> nonces; // guarded by mutex
};
