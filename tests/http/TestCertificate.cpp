#include "TestCertificate.h"

#include <QProcess>

bool makeTestCertificate(const QString& folder, const QString& name, const QString& signer) {
    const QString path = folder + '/' + name;
    const QString issuer = folder + '/' + signer;
    const QStringList subject =
        signer.isEmpty()
            ? QStringList{"-subj", "/CN=" + name}
            : QStringList{"-subj", "/CN=127.0.0.1", "-addext", "subjectAltName=IP:127.0.0.1",
                          "-CA",   issuer + ".pem", "-CAkey",  issuer + ".key"};
    return QProcess::execute(QStringLiteral("openssl"),
                             QStringList{"req", "-x509", "-newkey", "ec", "-pkeyopt",
                                         "ec_paramgen_curve:prime256v1", "-nodes", "-days", "2",
                                         "-keyout", path + ".key", "-out", path + ".pem"} +
                                 subject) == 0;
}
