#include "tools/makers/SignedManifestMaker.h"

#include <fstream>
#include <iterator>
#include <stdexcept>

#include <openssl/bn.h>
#include <openssl/ec.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

namespace signedmanifest {

using namespace img4maker;

namespace {

Key own(EVP_PKEY* key) {
    if (key == nullptr)
        throw std::runtime_error("no key");
    return {key, EVP_PKEY_free};
}

Bytes contentOf(const DERItem& item) {
    return {item.data, item.data + item.length};
}

const EVP_MD* digestOf(std::uint64_t length) {
    switch (length) {
    case 20:
        return EVP_sha1();
    case 32:
        return EVP_sha256();
    case 48:
        return EVP_sha384();
    default:
        return EVP_sha512();
    }
}

Bytes time(std::string_view text) {
    return item(0x17, Bytes(text.begin(), text.end()));
}

} // namespace

Bytes readFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file)
        throw std::runtime_error("cannot read " + path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

Key readKey(const std::string& pemFile) {
    const std::unique_ptr<BIO, decltype(&BIO_free)> file(BIO_new_file(pemFile.c_str(), "r"), BIO_free);
    return own(file != nullptr ? PEM_read_bio_PrivateKey(file.get(), nullptr, nullptr, nullptr) : nullptr);
}

Key makeRSAKey(unsigned bits) {
    return own(EVP_RSA_gen(bits));
}

Key makeMultiPrimeRSAKey(unsigned bits, const Bytes& exponent) {
    constexpr int primes = 3;
    EVP_PKEY* key = nullptr;
    const std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)> maker(
        EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr), EVP_PKEY_CTX_free);
    const std::unique_ptr<BIGNUM, decltype(&BN_free)> e(
        BN_bin2bn(exponent.data(), static_cast<int>(exponent.size()), nullptr), BN_free);
    if (EVP_PKEY_keygen_init(maker.get()) != 1 || EVP_PKEY_CTX_set1_rsa_keygen_pubexp(maker.get(), e.get()) != 1 ||
        EVP_PKEY_CTX_set_rsa_keygen_bits(maker.get(), static_cast<int>(bits)) != 1 ||
        EVP_PKEY_CTX_set_rsa_keygen_primes(maker.get(), primes) != 1 || EVP_PKEY_generate(maker.get(), &key) != 1)
        throw std::runtime_error("cannot make a key");
    return own(key);
}

Key makeECKey(const char* curve) {
    return own(EVP_EC_gen(curve));
}

Bytes publicKeyInfo(const Key& key) {
    unsigned char* encoding = nullptr;
    const int length = i2d_PUBKEY(key.get(), &encoding);
    Bytes bytes(encoding, encoding + length);
    OPENSSL_free(encoding);
    return bytes;
}

Bytes publicKeyBits(const Key& key) {
    unsigned char* bits = nullptr;
    const int length = i2d_PublicKey(key.get(), &bits);
    Bytes bytes(bits, bits + length);
    OPENSSL_free(bits);
    return bytes;
}

Bytes sign(const Key& key, std::uint64_t digestLength, const Bytes& message) {
    const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> signer(EVP_MD_CTX_new(), EVP_MD_CTX_free);
    std::size_t length = 0;
    if (EVP_DigestSignInit(signer.get(), nullptr, digestOf(digestLength), nullptr, key.get()) != 1 ||
        EVP_DigestSign(signer.get(), nullptr, &length, message.data(), message.size()) != 1)
        throw std::runtime_error("cannot sign");
    Bytes signature(length);
    if (EVP_DigestSign(signer.get(), signature.data(), &length, message.data(), message.size()) != 1)
        throw std::runtime_error("cannot sign");
    signature.resize(length);
    return signature;
}

Bytes bitString(const Bytes& octets, std::uint8_t unusedBits) {
    return item(DERTagBitString, join({Bytes(1, unusedBits), octets}));
}

Bytes algorithm(const Bytes& oid, const Bytes& parameters) {
    return sequence({oid, parameters});
}

Bytes oid(const DERItem& content) {
    return item(DERTagObjectIdentifier, contentOf(content));
}

Bytes distinguishedName(std::string_view commonName, DERTag type) {
    const Bytes commonNameType = item(DERTagObjectIdentifier, {0x55, 0x04, 0x03});
    return sequence({set({sequence({commonNameType, item(type, Bytes(commonName.begin(), commonName.end()))})})});
}

Bytes subjectOf(const Bytes& certificate) {
    const unsigned char* start = certificate.data();
    const std::unique_ptr<X509, decltype(&X509_free)> parsed(
        d2i_X509(nullptr, &start, static_cast<long>(certificate.size())), X509_free);
    if (parsed == nullptr)
        throw std::runtime_error("no certificate");
    unsigned char* name = nullptr;
    const int length = i2d_X509_NAME(X509_get_subject_name(parsed.get()), &name);
    Bytes encoding(name, name + length);
    OPENSSL_free(name);
    return encoding;
}

Bytes mustBePresent(std::string_view name) {
    return property(name, context(0, {}));
}

Bytes mustBeAbsent(std::string_view name) {
    return property(name, context(1, {}));
}

Bytes extension(const DERItem& id, const Bytes& value) {
    return sequence({oid(id), octets(value)});
}

Bytes extensions(const List& list) {
    return context(3, sequence(list));
}

Signer::Signer(const std::string& domainFolder, const Img4TrustProfileEntry& entry)
    : entry_(entry),
      rootKey_(readKey(domainFolder + "/keys/" + entry.rootName + ".pem")),
      leafKey_(readKey(domainFolder + "/keys/" + entry.name + "-leaf.pem")) {
    const std::string chain = domainFolder + "/chains/" + entry.name;
    leaf_ = readFile(chain + "/leaf.der");
    if (entry.chainLength == 3) {
        intermediate_ = readFile(chain + "/intermediate.der");
        intermediateKey_ = readKey(domainFolder + "/keys/" + entry.name + "-intermediate.pem");
    }
    issuerName_ = subjectOf(intermediateKey_ ? intermediate_ : readFile(domainFolder + "/" + entry.rootName + ".der"));
}

List Signer::standardChain() const {
    return chainWith(leaf_);
}

List Signer::chainWith(const Bytes& leaf) const {
    return intermediateKey_ ? List{intermediate_, leaf} : List{leaf};
}

Certificate Signer::leaf(const List& constraints) const {
    const bool isEC = EVP_PKEY_is_a(leafKey_.get(), "EC") == 1;
    Certificate certificate;
    certificate.signatureAlgorithm =
        algorithm(oid(*entry_.profile->signatureAlgorithmOid), isEC ? Bytes{} : Bytes{0x05, 0x00});
    certificate.issuer = issuerName_;
    certificate.subject = distinguishedName("Manifest Signing of a Test");
    certificate.publicKeyInfo = publicKeyInfo(leafKey_);
    certificate.extensions = extensions({extension(oidTevariImg4ManifestCertSpec, set(constraints))});
    return certificate;
}

Bytes Signer::issue(const Certificate& fields, const Key& issuer) const {
    const Bytes tbs = sequence({context(0, integer(2)), integer(4711), fields.signatureAlgorithm, fields.issuer,
                                sequence({time("260101000000Z"), time("460101000000Z")}), fields.subject,
                                fields.publicKeyInfo, fields.extensions});
    const std::uint64_t digestLength =
        fields.digestLength == 0 ? entry_.profile->digestInfo->length : fields.digestLength;
    return sequence({tbs, fields.signatureAlgorithm, bitString(sign(issuer, digestLength, tbs), fields.unusedBits)});
}

Bytes Signer::manifest(Manifest fields, const List& chain) const {
    return manifest(std::move(fields), chain, leafKey_);
}

Bytes Signer::manifest(Manifest fields, const List& chain, const Key& key) const {
    fields.certChain = join(chain);
    fields.signature = sign(key, entry_.profile->digestInfo->length, manifestBody(fields));
    return img4maker::manifest(fields);
}

Manifest standardManifest() {
    Manifest fields;
    fields.properties = {property("ABCD", integer(7)), property("BOOL", boolean(true)),
                         property("DATA", octets(filler(32))), property("TEXT", ia5("text"))};
    fields.objects = {object("boot", {property("EFGH", octets(filler(48, 1)))}),
                      object(standardObject, {property("EFGH", octets(filler(48, 2))), property("FLAG", boolean(false)),
                                              property("COUN", integer(300))})};
    return fields;
}

} // namespace signedmanifest
