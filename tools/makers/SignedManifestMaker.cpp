#include "tools/makers/SignedManifestMaker.h"

#include <fstream>
#include <iterator>
#include <stdexcept>

#include <openssl/bn.h>
#include <openssl/ec.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "tools/makers/OpenSSL.h"

namespace signedmanifest {

using namespace img4maker;
using namespace makers;

namespace {

Key own(EVP_PKEY* key) {
    return {require(key), EVP_PKEY_free};
}

const EVP_MD* digestOf(std::uint64_t length) {
    if (length == 20)
        return EVP_sha1();
    return length == 32 ? EVP_sha256() : length == 48 ? EVP_sha384() : EVP_sha512();
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
    const Owner<BIO, BIO_free_all> file(require(BIO_new_file(pemFile.c_str(), "r")));
    return own(PEM_read_bio_PrivateKey(file.get(), nullptr, nullptr, nullptr));
}

Key makeRSAKey(unsigned bits) {
    return own(EVP_RSA_gen(bits));
}

Key makeMultiPrimeRSAKey(unsigned bits, const Bytes& exponent) {
    constexpr int primes = 3;
    EVP_PKEY* key = nullptr;
    const Owner<EVP_PKEY_CTX, EVP_PKEY_CTX_free> maker(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr));
    const Owner<BIGNUM, BN_free> e(BN_bin2bn(exponent.data(), static_cast<int>(exponent.size()), nullptr));
    require(EVP_PKEY_keygen_init(maker.get()));
    require(EVP_PKEY_CTX_set1_rsa_keygen_pubexp(maker.get(), e.get()));
    require(EVP_PKEY_CTX_set_rsa_keygen_bits(maker.get(), static_cast<int>(bits)));
    require(EVP_PKEY_CTX_set_rsa_keygen_primes(maker.get(), primes));
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

Bytes algorithm(const Bytes& oid, const Bytes& parameters) {
    return sequence({oid, parameters});
}

Bytes oid(const DERItem& content) {
    return item(DERTagObjectIdentifier, {content.data, content.data + content.length});
}

Bytes distinguishedName(std::string_view commonName, DERTag type) {
    const Bytes commonNameType = item(DERTagObjectIdentifier, {0x55, 0x04, 0x03});
    return sequence({set({sequence({commonNameType, item(type, Bytes(commonName.begin(), commonName.end()))})})});
}

Bytes subjectOf(const Bytes& certificate) {
    const unsigned char* start = certificate.data();
    const Owner<X509, X509_free> parsed(require(d2i_X509(nullptr, &start, static_cast<long>(certificate.size()))));
    return encode<X509_NAME>(X509_get_subject_name(parsed.get()), i2d_X509_NAME);
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
    const Bytes& inner = fields.innerAlgorithm.empty() ? fields.signatureAlgorithm : fields.innerAlgorithm;
    const Bytes tbs = sequence({context(0, integer(2)), integer(4711), inner, fields.issuer,
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
