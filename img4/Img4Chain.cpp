#include "der/DERItemSpecs.h"
#include "img4/Img4TrustInternal.h"

#include <cstring>

using namespace img4;

namespace {

constexpr uint64_t largestCertificate = 0x1FFFF;

constexpr uint8_t commonNameOctets[] = {0x55, 0x04, 0x03};
constexpr DERItem oidCommonName = {commonNameOctets, sizeof commonNameOctets};

struct Certificate {
    DERSignedCertCrl fields;
    DERTBSCert tbs;
    DERItem key;
};

bool areEqual(const DERItem& one, const DERItem& other) {
    return one.length == other.length &&
           (one.length == 0 || std::memcmp(one.data, other.data, static_cast<std::size_t>(one.length)) == 0);
}

bool isAbsentOrNull(const DERItem& parameters) {
    constexpr uint8_t null[] = {0x05, 0x00};
    return !isPresent(parameters) || areEqual(parameters, {null, sizeof null});
}

bool parseAlgorithm(const DERItem& content, DERAlgorithmId* algorithm) {
    return parseContent(content, {DERAlgorithmIdItemSpecs, DERNumAlgorithmIdItemSpecs}, algorithm) == DERSuccess;
}

// The octets of a BIT STRING whose bits fill them.
bool parseOctets(const DERItem& bitString, DERItem* octets) {
    uint8_t unusedBits = 0;
    return DERParseBitString(&bitString, octets, &unusedBits) == DERSuccess && unusedBits == 0 && isPresent(*octets);
}

bool isNamedCurve(const DERItem& parameters, const DERItem* curve) {
    DERItem oid;
    return isWholeItem(parameters, DERTagObjectIdentifier, &oid) && DEROidCompare(&oid, curve);
}

// A key on either curve is judged by its own length; that the signature algorithm fits the profile is seen to
// elsewhere.
bool isPointOfItsCurve(const DERItem& key, const DERItem& parameters) {
    const NamedCurve* curve = curveOfPoint(key.length);
    return curve != nullptr && isNamedCurve(parameters, curve->oid);
}

bool parseKey(const DERItem& subjectPublicKeyInfo, KeyKind kind, DERItem* key) {
    DERSubjPubKeyInfo info;
    DERAlgorithmId algorithm;
    if (parseContent(subjectPublicKeyInfo, {DERSubjPubKeyInfoItemSpecs, DERNumSubjPubKeyInfoItemSpecs}, &info) !=
            DERSuccess ||
        !parseAlgorithm(info.algorithm, &algorithm) || !parseOctets(info.publicKey, key))
        return false;
    if (kind == KeyKind::RSA)
        return DEROidCompare(&algorithm.algorithm, &oidRsa) && isAbsentOrNull(algorithm.parameters);
    return DEROidCompare(&algorithm.algorithm, &oidEcPubKey) && isPointOfItsCurve(*key, algorithm.parameters);
}

Img4ChainFault parseCertificate(const DERItem& encoding, KeyKind kind, Certificate* certificate) {
    if (parseSequence(encoding, {DERSignedCertCrlItemSpecs, DERNumSignedCertCrlItemSpecs}, &certificate->fields) !=
            DERSuccess ||
        parseSequence(certificate->fields.tbs, {DERTBSCertItemSpecs, DERNumTBSCertItemSpecs}, &certificate->tbs) !=
            DERSuccess)
        return Img4ChainEncoding;
    return parseKey(certificate->tbs.subjectPublicKeyInfo, kind, &certificate->key) ? Img4ChainSound : Img4ChainKey;
}

// The encodings of the certificates, the root's first.
struct Encodings {
    DERItem certificates[longestChain];
    uint32_t count;
};

Img4ChainRefusal splitChain(const DERItem& certChain, uint32_t length, Encodings* encodings) {
    DERSequence rest;
    DERDecodedInfo decoded;
    DERDecodeSeqContentInit(&certChain, &rest);
    for (;;) {
        const uint8_t* start = rest.next;
        const DERReturn result = DERDecodeSeqNext(&rest, &decoded);
        if (result == DEREndOfSequence)
            return {encodings->count == length ? Img4ChainSound : Img4ChainLength, encodings->count};
        if (result != DERSuccess)
            return {Img4ChainEncoding, encodings->count};
        if (encodings->count == length)
            return {Img4ChainLength, encodings->count};
        const DERItem encoding = {start, static_cast<uint64_t>(rest.next - start)};
        if (encoding.length > largestCertificate)
            return {Img4ChainCertificateSize, encodings->count};
        encodings->certificates[encodings->count++] = encoding;
    }
}

bool verifySignature(const Certificate& issuer, const Certificate& issued, const Img4TrustProfile& profile,
                     Img4TrustRefusal* why) {
    const uint64_t length = profile.digestInfo->length;
    uint8_t digest[Img4LongestDigest];
    DERItem signature;
    if (parseOctets(issued.fields.signature, &signature))
        return length <= sizeof digest &&
               profile.computeDigest(&issued.fields.tbs, digest, length, &profile) == DERSuccess &&
               verifySignatureOf(profile, issuer.key, signature, digest, why) == DERSuccess;
    if (why != nullptr)
        why->signature.fault = Img4SignatureForm;
    return false;
}

bool isSignedWith(const Certificate& certificate, KeyKind kind, const DERItem* algorithmOid) {
    DERAlgorithmId algorithm;
    return parseAlgorithm(certificate.fields.signatureAlgorithm, &algorithm) &&
           DEROidCompare(&algorithm.algorithm, algorithmOid) &&
           (kind == KeyKind::EC || isAbsentOrNull(algorithm.parameters));
}

Img4ChainFault checkIssued(const Certificate& issuer, const Certificate& issued, KeyKind kind,
                           const Img4TrustProfile& profile, Img4TrustRefusal* why) {
    if (!areEqual(issued.tbs.issuer, issuer.tbs.subject))
        return Img4ChainIssuer;
    if (!isSignedWith(issued, kind, profile.signatureAlgorithmOid))
        return Img4ChainSignatureAlgorithm;
    return verifySignature(issuer, issued, profile, why) ? Img4ChainSound : Img4ChainSignature;
}

// Finds the common name among the attributes of one RelativeDistinguishedName, as a whole encoding.
bool findCommonName(const DERItem& attributes, DERItem* name) {
    DERSequence rest;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&attributes, &rest);
    while (DERDecodeSeqNext(&rest, &element) == DERSuccess) {
        DERAttributeTypeAndValue attribute;
        if (element.tag != DERTagSequence ||
            parseContent(element.content, {DERAttributeTypeAndValueItemSpecs, DERNumAttributeTypeAndValueItemSpecs},
                         &attribute) != DERSuccess)
            return false;
        *name = attribute.value;
        if (DEROidCompare(&attribute.type, &oidCommonName))
            return true;
    }
    return false;
}

// The first common name decides.
bool isAuthority(const DERItem& subject, const DERItem& authorityName) {
    DERSequence rest;
    DERDecodedInfo relativeName;
    DERItem name;
    DERDecodeSeqContentInit(&subject, &rest);
    while (DERDecodeSeqNext(&rest, &relativeName) == DERSuccess && relativeName.tag == DERTagSet)
        if (findCommonName(relativeName.content, &name))
            return isPresent(authorityName) && areEqual(name, authorityName);
    return false;
}

// Takes the constraints from the leaf's extensions. RFC 5280 4.2 forbids two of the same kind.
bool findConstraints(const DERItem& extensions, const DERItem& oid, DERItem* certProperties) {
    DERItem list;
    DERItem content;
    DERSequence rest;
    DERDecodedInfo element;
    if (!isPresent(extensions))
        return true;
    if (!isWholeItem(extensions, DERTagSequence, &list) || list.length == 0)
        return false;
    DERDecodeSeqContentInit(&list, &rest);
    DERReturn result = DERDecodeSeqNext(&rest, &element);
    for (; result == DERSuccess; result = DERDecodeSeqNext(&rest, &element)) {
        DERExtension extension;
        if (element.tag != DERTagSequence ||
            parseContent(element.content, {DERExtensionItemSpecs, DERNumExtensionItemSpecs}, &extension) != DERSuccess)
            return false;
        if (!DEROidCompare(&extension.extensionID, &oid))
            continue;
        if (isPresent(*certProperties) || !isWholeItem(extension.value, DERTagSet, &content))
            return false;
        *certProperties = extension.value;
    }
    return result == DEREndOfSequence;
}

Img4ChainRefusal verifyCertificates(const ChainRules& rules, const Certificate* certificates,
                                    const DERItem& authorityName, const Img4TrustProfile& profile,
                                    Img4TrustRefusal* why) {
    for (uint32_t i = 1; i < rules.length; ++i) {
        const Img4ChainFault fault = checkIssued(certificates[i - 1], certificates[i], rules.key, profile, why);
        if (fault != Img4ChainSound)
            return {fault, i};
    }
    if (rules.authority && !isAuthority(certificates[1].tbs.subject, authorityName))
        return {Img4ChainAuthority, 1};
    return {Img4ChainSound, rules.length - 1};
}

bool arePresent(const ChainArguments& arguments) {
    const Img4TrustProfile* profile = arguments.profile;
    return arguments.certChain != nullptr && profile != nullptr && profile->computeDigest != nullptr &&
           profile->verifySignature != nullptr && profile->digestInfo != nullptr;
}

Img4ChainRefusal verify(const ChainRules& rules, const Img4TrustDomain& domain, const ChainArguments& arguments,
                        Encodings* encodings, Img4TrustRefusal* why) {
    if (const Img4ChainRefusal refusal = splitChain(*arguments.certChain, rules.length, encodings);
        refusal.fault != Img4ChainSound)
        return refusal;
    Certificate certificates[longestChain];
    for (uint32_t i = 0; i < rules.length; ++i) {
        const Img4ChainFault fault = parseCertificate(encodings->certificates[i], rules.key, &certificates[i]);
        if (fault != Img4ChainSound)
            return {fault, i};
    }
    Img4ChainRefusal refusal = verifyCertificates(rules, certificates, domain.authorityName, *arguments.profile, why);
    if (refusal.fault != Img4ChainSound)
        return refusal;
    const Certificate& leaf = certificates[rules.length - 1];
    if (!findConstraints(leaf.tbs.extensions, domain.manifestCertSpecOid, arguments.certProperties)) {
        *arguments.certProperties = {};
        return {Img4ChainExtensions, rules.length - 1};
    }
    *arguments.leafKey = leaf.key;
    return refusal;
}

// Says where the certificate that was refused begins, or in which octet it is no DER. The root is not in the input.
void explain(const DERItem& certChain, const Encodings& encodings, const Img4ChainRefusal& refusal,
             Img4TrustRefusal* why) {
    const uint32_t number = refusal.certificate;
    const DERItem& last = encodings.certificates[encodings.count - 1];
    const uint8_t* place = encodings.count == 1 ? certChain.data : last.data + last.length;
    if (number < encodings.count)
        place = number == 0 ? certChain.data : encodings.certificates[number].data;
    else if (refusal.fault == Img4ChainEncoding) {
        const DERItem rest = {place, static_cast<uint64_t>(certChain.data + certChain.length - place)};
        DERDecodedInfo decoded;
        DERDecodeItemExplained(&rest, &decoded, &why->refusal.encoding);
        place = why->refusal.encoding.place;
    }
    why->chain = refusal;
    why->refusal.place = place;
}

} // namespace

Img4ChainRefusal img4::verifyChain(const ChainRules& rules, const DERItem& root, const Img4TrustDomain& domain,
                                   const ChainArguments& arguments, Img4TrustRefusal* why) {
    if (arguments.leafKey == nullptr || arguments.certProperties == nullptr)
        return {Img4ChainParameters, 0};
    *arguments.leafKey = {};
    *arguments.certProperties = {};
    if (!arePresent(arguments))
        return {Img4ChainParameters, 0};
    Encodings encodings = {{root}, 1};
    const Img4ChainRefusal refusal = verify(rules, domain, arguments, &encodings, why);
    if (why != nullptr && refusal.fault != Img4ChainSound)
        explain(*arguments.certChain, encodings, refusal, why);
    return refusal;
}
