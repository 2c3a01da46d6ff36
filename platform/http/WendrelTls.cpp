#include "WendrelTls.h"

#include "Wendrel.h"
#include "WendrelLog.h"

#include <QSslSocket>

WendrelTls::WendrelTls(const WendrelSettings& settings)
    : caFile(settings.caFile)
    , insecure(settings.insecure) {
    if (insecure)
        wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                           "TLS certificate verification is off: any server is trusted");
    if (!settings.pinnedCertificatesFile.isEmpty()) {
        pins = QSslCertificate::fromPath(settings.pinnedCertificatesFile, QSsl::Pem);
        if (pins.isEmpty())
            wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                               "no PEM certificate read from the pinned certificates file %s",
                               qPrintable(settings.pinnedCertificatesFile));
    }
}

const std::optional<QSslConfiguration>& WendrelTls::configuration() {
    if (configured)
        return made;
    configured = true;
    if (insecure) {
        QSslConfiguration configuration = QSslConfiguration::defaultConfiguration();
        configuration.setPeerVerifyMode(QSslSocket::VerifyNone);
        made = configuration;
    } else if (!caFile.isEmpty()) {
        const QList<QSslCertificate> extra = QSslCertificate::fromPath(caFile, QSsl::Pem);
        if (extra.isEmpty())
            wendrelLog().print(KalbLogClient::Failure, __FILE__, __LINE__,
                               "no PEM certificate read from CA file %s", qPrintable(caFile));
        // Adding certificates stops Qt's on-demand loading of the system's roots: keep them.
        QSslConfiguration configuration = QSslConfiguration::defaultConfiguration();
        configuration.setCaCertificates(QSslConfiguration::systemCaCertificates() + extra);
        made = configuration;
    }
    return made;
}

bool WendrelTls::pinned(const QList<QSslCertificate>& chain) const {
    return !chain.isEmpty() && !chain.first().isNull() && pins.contains(chain.first());
}
