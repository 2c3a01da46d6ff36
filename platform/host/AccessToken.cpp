#include "AccessToken.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <openssl/rand.h>
#include <unistd.h>

namespace {

const int RANDOM_BYTES = 32;

// The characters of a bearer token (RFC 6750), without the trailing "=" it may end with.
bool isTokenCharacter(char c) {
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') ||
           std::strchr("-._~+/", c) != nullptr;
}

QString systemError(const QString& what, const QString& path) {
    return QStringLiteral("cannot %1 %2: %3")
        .arg(what, path, QString::fromLocal8Bit(std::strerror(errno)));
}

} // namespace

QByteArray AccessToken::generate() {
    unsigned char bytes[RANDOM_BYTES];
    // OpenSSL's generator fails only without a seed from the system, which is not worth running
    // without.
    if (RAND_bytes(bytes, RANDOM_BYTES) != 1)
        std::abort();
    return QByteArray(reinterpret_cast<const char*>(bytes), RANDOM_BYTES)
        .toBase64(QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals);
}

bool AccessToken::acceptable(const QByteArray& token, QString* error) {
    qsizetype end = token.size();
    while (end > 0 && token.at(end - 1) == '=')
        --end;
    bool valid = end > 0;
    for (qsizetype i = 0; valid && i < end; ++i)
        valid = isTokenCharacter(token.at(i));
    if (!valid) {
        *error = QStringLiteral("the token may hold only A-Z a-z 0-9 - . _ ~ + / and end in =");
        return false;
    }
    if (token.size() < MIN_LENGTH) {
        *error = QStringLiteral("the token must be at least %1 characters long, not %2")
                     .arg(MIN_LENGTH)
                     .arg(token.size());
        return false;
    }
    return true;
}

bool AccessToken::writeFile(const QString& path, const QByteArray& token, QString* error) {
    const QFileInfo target(path);
    QByteArray temporary = QFile::encodeName(
        QFileInfo(QDir(target.absolutePath()), QStringLiteral(".%1.XXXXXX").arg(target.fileName()))
            .filePath());
    // mkstemp creates the file with mode 0600.
    const int fd = ::mkstemp(temporary.data());
    if (fd < 0) {
        *error = systemError(QStringLiteral("create a file beside"), path);
        return false;
    }
    const QByteArray content = token + '\n';
    const bool written = ::write(fd, content.constData(), static_cast<size_t>(content.size())) ==
                         static_cast<ssize_t>(content.size());
    const int writeErrno = errno;
    const bool closed = ::close(fd) == 0;
    if (!written || !closed) {
        if (!written)
            errno = writeErrno;
        *error = systemError(QStringLiteral("write"), QFile::decodeName(temporary));
        ::unlink(temporary.constData());
        return false;
    }
    if (std::rename(temporary.constData(), QFile::encodeName(path).constData()) != 0) {
        *error = systemError(QStringLiteral("write"), path);
        ::unlink(temporary.constData());
        return false;
    }
    return true;
}
