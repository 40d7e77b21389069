// Makes certificates and CMS messages for tests and fuzz seeds. They are encoded by the library that the services read
// them with; what a test needs beyond that is made by changing octets.
#ifndef VELTRA_TOOLS_MAKERS_CERTIFICATEMAKER_H
#define VELTRA_TOOLS_MAKERS_CERTIFICATEMAKER_H

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include <openssl/types.h>

namespace certificatemaker {

using Bytes = std::vector<std::uint8_t>;

enum class KeyKind {
    P256,
    RSA2048,
    Ed25519,
};

// A private key as PEM text, a certificate for it, in DER, whose serialNumber has these content octets, and the key as
// it signs. It is for digital signatures and no authority's. A key is made afresh each time.
struct Module {
    std::string key;
    Bytes certificate;
    std::shared_ptr<EVP_PKEY> signer;
};
Module module(const Bytes& serialNumber, KeyKind kind = KeyKind::P256);

// A CMS SignedData without signers that carries the certificates, in the order of a SET OF in DER.
Bytes certsOnlyMessage(const std::vector<Bytes>& certificates);

// A CMS SignedData that the module has signed and that carries its certificate.
Bytes signedMessage(const Module& module);

// A CMS message of another type, which carries plain data.
Bytes dataMessage();

} // namespace certificatemaker

#endif
