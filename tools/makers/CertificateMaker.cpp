#include "tools/makers/CertificateMaker.h"

#include <algorithm>
#include <stdexcept>

#include <openssl/bn.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

namespace certificatemaker {

using namespace img4maker;

namespace {

template <auto Free>
struct Release {
    void operator()(auto* object) const { Free(object); }
};
template <class Object, auto Free>
using Owner = std::unique_ptr<Object, Release<Free>>;
using Stream = Owner<BIO, BIO_free_all>;

// Passes on what the library made, or how often it succeeded.
template <class Result>
Result require(Result result) {
    if (!(result > Result{}))
        throw std::runtime_error("OpenSSL has failed");
    return result;
}

// The octets of an object, from the library's writer for its kind.
template <class Object>
Bytes encode(const Object* object, int (*write)(const Object*, unsigned char**)) {
    unsigned char* octets = nullptr;
    const int length = require(write(object, &octets));
    const Bytes bytes(octets, octets + length);
    OPENSSL_free(octets);
    return bytes;
}

Key own(EVP_PKEY* key) {
    return {require(key), EVP_PKEY_free};
}

const EVP_MD* digestOf(std::uint64_t length) {
    if (length == 0)
        return nullptr;
    return length == 20 ? EVP_sha1() : length == 32 ? EVP_sha256() : length == 48 ? EVP_sha384() : EVP_sha512();
}

Bytes time(std::string_view text) {
    return item(0x17, Bytes(text.begin(), text.end()));
}

Key makeKey(KeyKind kind) {
    return kind == KeyKind::RSA2048 ? makeRSAKey(2048)
           : kind == KeyKind::P256  ? makeECKey("P-256")
                                    : own(EVP_PKEY_Q_keygen(nullptr, nullptr, "ED25519"));
}

Bytes signatureAlgorithm(KeyKind kind) {
    return kind == KeyKind::RSA2048 ? algorithm(oid({0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x01, 0x0B}), {5, 0})
           : kind == KeyKind::P256  ? algorithm(oid({0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x04, 0x03, 0x02}))
                                    : algorithm(oid({0x2B, 0x65, 0x70}));
}

std::string pem(const Key& key) {
    const Stream stream(require(BIO_new(BIO_s_mem())));
    require(PEM_write_bio_PrivateKey(stream.get(), key.get(), nullptr, nullptr, 0, nullptr, nullptr));
    char* text = nullptr;
    const long length = BIO_get_mem_data(stream.get(), &text);
    return {text, static_cast<std::size_t>(length)};
}

// The message of the type with that number below PKCS #7.
Bytes message(std::uint8_t type, const Bytes& content) {
    return sequence({oid({0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x07, type}), context(0, content)});
}

Bytes signedData(List certificates, const List& signers) {
    std::ranges::sort(certificates);
    const Bytes none = sequence({oid({0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x07, 0x01})});
    return message(2, sequence({integer(1), set({}), none,
                                certificates.empty() ? Bytes{} : context(0, join(certificates)), set(signers)}));
}

} // namespace

Key readKey(const std::string& pemFile) {
    const Stream file(require(BIO_new_file(pemFile.c_str(), "r")));
    return own(PEM_read_bio_PrivateKey(file.get(), nullptr, nullptr, nullptr));
}

Key makeRSAKey(unsigned bits, const Bytes& exponent) {
    EVP_PKEY* key = nullptr;
    const Owner<EVP_PKEY_CTX, EVP_PKEY_CTX_free> maker(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr));
    const Owner<BIGNUM, BN_free> e(BN_bin2bn(exponent.data(), static_cast<int>(exponent.size()), nullptr));
    require(EVP_PKEY_keygen_init(maker.get()));
    require(EVP_PKEY_CTX_set1_rsa_keygen_pubexp(maker.get(), e.get()));
    require(EVP_PKEY_CTX_set_rsa_keygen_bits(maker.get(), static_cast<int>(bits)));
    require(EVP_PKEY_CTX_set_rsa_keygen_primes(maker.get(), bits > 1024 ? 3 : 2));
    require(EVP_PKEY_generate(maker.get(), &key));
    return own(key);
}

Key makeECKey(const char* curve) {
    return own(EVP_EC_gen(curve));
}

Bytes publicKeyInfo(const Key& key) {
    return encode<EVP_PKEY>(key.get(), i2d_PUBKEY);
}

Bytes publicKeyBits(const Key& key) {
    return encode<EVP_PKEY>(key.get(), i2d_PublicKey);
}

Bytes sign(const Key& key, std::uint64_t digestLength, const Bytes& message) {
    const Owner<EVP_MD_CTX, EVP_MD_CTX_free> signer(EVP_MD_CTX_new());
    std::size_t length = static_cast<std::size_t>(EVP_PKEY_get_size(key.get()));
    Bytes signature(length);
    require(EVP_DigestSignInit(signer.get(), nullptr, digestOf(digestLength), nullptr, key.get()));
    require(EVP_DigestSign(signer.get(), signature.data(), &length, message.data(), message.size()));
    signature.resize(length);
    return signature;
}

Bytes bitString(const Bytes& octets, std::uint8_t unusedBits) {
    return item(DERTagBitString, join({Bytes(1, unusedBits), octets}));
}

Bytes oid(const Bytes& content) {
    return item(DERTagObjectIdentifier, content);
}

Bytes algorithm(const Bytes& oid, const Bytes& parameters) {
    return sequence({oid, parameters});
}

Bytes distinguishedName(std::string_view commonName, DERTag type) {
    return sequence(
        {set({sequence({oid({0x55, 0x04, 0x03}), item(type, Bytes(commonName.begin(), commonName.end()))})})});
}

Bytes subjectOf(const Bytes& certificate) {
    const unsigned char* start = certificate.data();
    const Owner<X509, X509_free> parsed(require(d2i_X509(nullptr, &start, static_cast<long>(certificate.size()))));
    return encode<X509_NAME>(X509_get_subject_name(parsed.get()), i2d_X509_NAME);
}

Bytes extension(const Bytes& oid, const Bytes& value) {
    return sequence({oid, octets(value)});
}

Bytes extensions(const List& list) {
    return context(3, sequence(list));
}

Bytes issue(const Certificate& fields, const Key& issuer) {
    const Bytes& inner = fields.innerAlgorithm.empty() ? fields.signatureAlgorithm : fields.innerAlgorithm;
    const Bytes tbs = sequence({context(0, integer(2)), fields.serialNumber, inner, fields.issuer,
                                sequence({time("260101000000Z"), time("460101000000Z")}), fields.subject,
                                fields.publicKeyInfo, fields.extensions});
    return sequence(
        {tbs, fields.signatureAlgorithm, bitString(sign(issuer, fields.digestLength, tbs), fields.unusedBits)});
}

Module module(const Bytes& serialNumber, KeyKind kind) {
    const Key key = makeKey(kind);
    const Bytes keyUsage = oid({0x55, 0x1D, 0x0F}), basicConstraints = oid({0x55, 0x1D, 0x13});
    Certificate fields;
    fields.serialNumber = item(DERTagInteger, serialNumber);
    fields.signatureAlgorithm = signatureAlgorithm(kind);
    fields.issuer = fields.subject = distinguishedName("Module", 0x0C);
    fields.publicKeyInfo = publicKeyInfo(key);
    fields.extensions = extensions(
        {sequence({keyUsage, boolean(true), octets(bitString({0x80}, 7))}), extension(basicConstraints, sequence({}))});
    fields.digestLength = kind == KeyKind::Ed25519 ? 0 : 32;
    return {pem(key), issue(fields, key)};
}

Bytes certsOnlyMessage(List certificates) {
    return signedData(std::move(certificates), {});
}

Bytes signedMessage(const Module& module) {
    const Bytes keyIdentifier = item(DERTagContextPrimitive(0), filler(20));
    const Bytes sha256 = algorithm(oid({0x60, 0x86, 0x48, 0x01, 0x65, 0x03, 0x04, 0x02, 0x01}));
    return signedData({module.certificate}, {sequence({integer(3), keyIdentifier, sha256,
                                                       signatureAlgorithm(KeyKind::P256), octets(filler(70))})});
}

Bytes dataMessage() {
    return message(1, octets(filler(7)));
}

} // namespace certificatemaker
