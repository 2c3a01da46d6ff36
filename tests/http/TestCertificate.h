#pragma once

#include <QString>

// Makes folder/NAME.pem and folder/NAME.key with the openssl command: a self-signed certificate
// with the subject CN=NAME, or, given a signer, one for 127.0.0.1 signed by folder/SIGNER.key.
bool makeTestCertificate(const QString& folder, const QString& name, const QString& signer = {});
