#pragma once

#include <QByteArray>

#include <optional>
#include <vector>

// One challenge of a server's WWW-Authenticate field, reduced to what an answer uses. The field
// comes from the server, so every value kept is bounded in length and free of control characters:
// an answer may repeat it in a header.
class WendrelChallenge {
public:
    enum class Scheme { Other, Basic, Digest };
    enum class Algorithm { Unsupported, Md5, Sha256, Sha512_256 };
    enum class Qop { None, Auth, Unsupported }; // Unsupported: offered, but without auth

    // A field breaking one of these limits, or not read as challenges, is refused as a whole.
    static constexpr qsizetype maxValueBytes = 512; // each value kept (realm, nonce, opaque, ...)
    static constexpr int maxParameters = 32;        // in one challenge
    static constexpr int maxChallenges = 16;        // in the field, all header lines together

    // The challenges of the field's text (the values of its header lines joined by commas), in
    // order; none when the text is malformed or breaks a limit.
    static std::optional<std::vector<WendrelChallenge>> parse(const QByteArray& text);
    // The first Digest challenge that can be answered (RFC 7616, section 3.7), else the first
    // Basic one; none when the field is refused or offers neither.
    static std::optional<WendrelChallenge> choose(const QByteArray& text);

    // Whether value holds a control character (CR, LF and NUL among them): no header may.
    static bool hasControl(const QByteArray& value);

    bool answerable() const;
    // As an answer names it: "MD5", "SHA-256-sess", ...
    QByteArray algorithmName() const;
    // The heap bytes the values hold, for a cache's accounting.
    qsizetype heapBytes() const;

    Scheme scheme = Scheme::Other;
    Algorithm algorithm = Algorithm::Md5; // Digest's default
    bool session = false;                 // the algorithm's -sess form
    Qop qop = Qop::None;
    bool stale = false;
    bool userhash = false;
    bool hasOpaque = false; // an empty opaque is echoed too
    QByteArray realm;
    QByteArray nonce;
    QByteArray opaque;
};
