// Makes keys, certificates (RFC 5280) and CMS messages (RFC 5652), sound ones and broken ones, for tests, fuzz seeds
// and benchmarks. They are put together field by field, so that a test can change any of them and still have the whole
// signed.
#ifndef VELTRA_TOOLS_MAKERS_CERTIFICATEMAKER_H
#define VELTRA_TOOLS_MAKERS_CERTIFICATEMAKER_H

#include <memory>
#include <string>

#include <openssl/evp.h>

#include "tools/makers/Img4Maker.h"

namespace certificatemaker {

using img4maker::Bytes;
using img4maker::List;
using Key = std::shared_ptr<EVP_PKEY>;

Key readKey(const std::string& pemFile);
// Of three primes, found sooner than two, where the bits have room for them. The public exponent is big-endian.
Key makeRSAKey(unsigned bits, const Bytes& exponent = {0x01, 0x00, 0x01});
Key makeECKey(const char* curve);

// The key as certificates carry it (SubjectPublicKeyInfo), and the bits inside, as signature verifiers take them.
Bytes publicKeyInfo(const Key& key);
Bytes publicKeyBits(const Key& key);

// A signature over `message` with the digest of that many octets; 0 where the kind of key brings its own.
Bytes sign(const Key& key, std::uint64_t digestLength, const Bytes& message);

// `unusedBits` is only claimed: all octets are kept.
Bytes bitString(const Bytes& octets, std::uint8_t unusedBits = 0);
Bytes oid(const Bytes& content);
Bytes algorithm(const Bytes& oid, const Bytes& parameters = {});
Bytes distinguishedName(std::string_view commonName, DERTag type = 0x13);

// The subject of a certificate, a whole encoding.
Bytes subjectOf(const Bytes& certificate);

// One Extension, and the field [3] with a list of them.
Bytes extension(const Bytes& oid, const Bytes& value);
Bytes extensions(const List& list);

// The fields of a certificate, each a whole encoding; `extensions` is left out when empty.
struct Certificate {
    Bytes serialNumber = img4maker::integer(4711);
    Bytes signatureAlgorithm;
    Bytes innerAlgorithm; // that of the to-be-signed part, when it is another
    Bytes issuer;
    Bytes subject;
    Bytes publicKeyInfo;
    Bytes extensions;
    std::uint8_t unusedBits = 0;    // of the signature
    std::uint64_t digestLength = 0; // of the digest that is signed
};
Bytes issue(const Certificate& fields, const Key& issuer);

enum class KeyKind {
    P256,
    RSA2048,
    Ed25519,
};

// A private key as PEM text and a certificate for it, in DER, whose serialNumber has these content octets. It is for
// digital signatures and no authority's. A key is made afresh each time.
struct Module {
    std::string key;
    Bytes certificate;
};
Module module(const Bytes& serialNumber, KeyKind kind = KeyKind::P256);

// A CMS SignedData without signers that carries the certificates, in the order of a SET OF in DER.
Bytes certsOnlyMessage(List certificates);

// A CMS SignedData that carries the module's certificate and a signer, whose signature is none.
Bytes signedMessage(const Module& module);

// A CMS message of another type, which carries plain data.
Bytes dataMessage();

} // namespace certificatemaker

#endif
