#include "tools/makers/SignedManifestMaker.h"

namespace signedmanifest {

using namespace img4maker;

Bytes oid(const DERItem& content) {
    return item(DERTagObjectIdentifier, {content.data, content.data + content.length});
}

Bytes mustBePresent(std::string_view name) {
    return property(name, context(0, {}));
}

Bytes mustBeAbsent(std::string_view name) {
    return property(name, context(1, {}));
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
    certificate.extensions = extensions({extension(oid(oidTevariImg4ManifestCertSpec), set(constraints))});
    certificate.digestLength = entry_.profile->digestInfo->length;
    return certificate;
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
