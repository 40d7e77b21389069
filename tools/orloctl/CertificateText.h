// Words for X.509 certificates (RFC 5280): whose they are, who issued them, with which key and algorithm. OpenSSL finds
// them; what it cannot read is shown by its octets, so that any octets have words. Only printable ASCII comes out.
#ifndef VELTRA_TOOLS_ORLOCTL_CERTIFICATETEXT_H
#define VELTRA_TOOLS_ORLOCTL_CERTIFICATETEXT_H

#include <cstddef>
#include <optional>
#include <string>

#include <nlohmann/json.hpp>

#include "der/DERItemSpecs.h"

struct Certificate {
    DERSignedCertCrl fields;
    DERTBSCert tbs;
};

// The fields of the encoded certificate; nothing when the outer structures are not those of a certificate.
std::optional<Certificate> readCertificate(const DERItem& encoding);

// The content of a Name in the form of RFC 2253, "CN=Tevari Root CA,O=Tevari". Octets that are no printable ASCII are
// escaped, and values that are no text are in hexadecimal.
std::string nameText(const DERItem& name);

// The content of a SubjectPublicKeyInfo: "RSA 4096 bits", "EC P-384"; of a key that cannot be read its octets.
std::string keyText(const DERItem& subjectPublicKeyInfo);

// Whether OpenSSL can read the key in that content: an EC key that it cannot is no point of its curve.
bool isKey(const DERItem& subjectPublicKeyInfo);

// An algorithm's object identifier: "sha384WithRSAEncryption" where the name is known, else numbers with dots. The
// second form takes the content of an AlgorithmIdentifier.
std::string algorithmName(const DERItem& oid);
std::string algorithmText(const DERItem& identifier);

// "subject", "issuer", "key", "signatureAlgorithm", "serialNumber" and the "sha256" of the encoding; with a
// "fault" instead when it is no certificate.
nlohmann::ordered_json certificateJson(const DERItem& encoding);

#endif
