#include "Wendrel.h"

WendrelTlsSettings WendrelTlsSettings::fromEnvironment()
{
    return {};
}

class Wendrel::WendrelPrivate {};

Wendrel::Wendrel() = default;
Wendrel::Wendrel(const WendrelTlsSettings&) {}
Wendrel::~Wendrel() = default;

bool Wendrel::Get(const QString&, const QString&, quint16, bool, const QString&, const QString&,
                  HttpReplyCallback, uint, const QStringList&)
{
    return false;
}
bool Wendrel::Get(const QString&, const QString&, const QString&, HttpReplyCallback, uint)
{
    return false;
}
bool Wendrel::Post(const QString&, const QByteArray&, const QString&, quint16, bool,
                   const QString&, const QString&, const QString&, HttpReplyCallback, uint)
{
    return false;
}
bool Wendrel::Post(const QString&, const QByteArray&, const QString&, const QString&,
                   const QString&, HttpReplyCallback, uint, const QStringList&)
{
    return false;
}
bool Wendrel::PostWithOAuth(const QString&, const QByteArray&, const QString&, quint16, bool,
                            const QString&, const QString&, const QString&, HttpReplyCallback,
                            uint)
{
    return false;
}
bool Wendrel::Delete(const QString&, const QByteArray&, const QString&, quint16, bool,
                     const QString&, const QString&, const QString&, HttpReplyCallback, uint)
{
    return false;
}
bool Wendrel::Put(const QString&, const QByteArray&, const QString&, quint16, bool,
                  const QString&, const QString&, const QString&, HttpReplyCallback, uint)
{
    return false;
}
