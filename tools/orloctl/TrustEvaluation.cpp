#include "tools/orloctl/TrustEvaluation.h"

#include "der/DERDecode.h"
#include "tools/orloctl/CertificateText.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Words.h"
#include "tools/orloctl/TrustConstraints.h"

namespace {

using img4show::mostCharactersShown;

DERReturn agree(DERTag, const Img4PropertyValue*, std::uint32_t, void*) {
    return DERSuccess;
}

bool isRSA(const Img4TrustProfile& profile) {
    return DEROidCompare(profile.keyAlgorithmOid, &oidRsa);
}

std::string capitalised(std::string text) {
    if (text[0] >= 'a' && text[0] <= 'z')
        text[0] = static_cast<char>(text[0] - 'a' + 'A');
    return text;
}

std::string quoted(const std::string& text) {
    return "\"" + text + "\"";
}

// What is wrong with a signature or the key that verifies it; `otherwise` when it is over something else.
std::string signatureRemark(const Img4SignatureRefusal& refusal, const DERItem& key, const char* otherwise) {
    switch (refusal.fault) {
    case Img4SignatureKeySize:
        return ", which has " + std::to_string(refusal.found) + " bits, and the profile takes " +
               std::to_string(refusal.least) + " to " + std::to_string(refusal.most);
    case Img4SignatureForm:
        return ": it is no SEQUENCE of two positive INTEGERs that fit the curve";
    case Img4SignatureLength:
        return ": it has " + std::to_string(refusal.found) + " octets, and those of the key have " +
               std::to_string(refusal.most);
    default:
        const std::string fault = keyFault(key);
        return fault.empty() ? otherwise : ": the key " + fault;
    }
}

// Finds the words for a refused chain.
class ChainWords {
public:
    explicit ChainWords(const TrustEvaluation& evaluation);

    std::string reason() const;

private:
    std::string call(std::uint32_t number) const;
    std::string lengthReason() const;
    std::string keyReason() const;
    std::string issuerReason() const;
    std::string algorithmReason() const;
    std::string signatureReason() const;
    std::string authorityReason() const;

    const Img4TrustRefusal& refusal_;
    const Img4DomainProfile& made_;
    const std::uint32_t number_;        // of the refused certificate
    std::uint64_t count_ = 0;           // the root included
    std::vector<DERItem> encodings_;    // the root first
    std::optional<Certificate> issuer_; // the one before the refused one
    std::optional<Certificate> refused_;
};

ChainWords::ChainWords(const TrustEvaluation& evaluation)
    : refusal_(evaluation.refusal), made_(evaluation.profile->made), number_(refusal_.chain.certificate) {
    encodings_ = certificatesOf(evaluation.record.manifest.certChain, &count_);
    encodings_.insert(encodings_.begin(), made_.root);
    ++count_;
    if (number_ < encodings_.size())
        refused_ = readCertificate(encodings_[number_]);
    if (number_ != 0 && number_ <= encodings_.size())
        issuer_ = readCertificate(encodings_[number_ - 1]);
}

std::string ChainWords::call(std::uint32_t number) const {
    const std::string what = number == 0 ? "the root" : "certificate " + std::to_string(number);
    const auto certificate = number < encodings_.size() ? readCertificate(encodings_[number]) : std::nullopt;
    return certificate ? what + " (" + quoted(nameText(certificate->tbs.subject)) + ")" : what;
}

std::string ChainWords::lengthReason() const {
    return "The chain has " + std::to_string(count_) + (count_ == 1 ? " certificate" : " certificates") +
           ", the root included, and the profile demands " + std::to_string(made_.chainLength);
}

std::string ChainWords::keyReason() const {
    return capitalised(call(number_)) + " has the key " + keyText(refused_->tbs.subjectPublicKeyInfo) +
           ", and the profile demands " +
           (isRSA(made_.profile) ? "RSA without parameters" : "EC on P-256 or P-384, an uncompressed point");
}

std::string ChainWords::issuerReason() const {
    const std::string issuer = nameText(refused_->tbs.issuer);
    const std::string subject = nameText(issuer_->tbs.subject);
    return capitalised(call(number_)) + " names the issuer " + quoted(issuer) + ", and the one before it is " +
           (issuer == subject ? "the same in another encoding" : quoted(subject));
}

std::string ChainWords::algorithmReason() const {
    const std::string found = algorithmText(refused_->fields.signatureAlgorithm);
    const std::string demanded = algorithmName(*made_.profile.signatureAlgorithmOid);
    return capitalised(call(number_)) + " is signed with " + found +
           (found == demanded ? " and parameters, which it must not have" : ", and the profile demands " + demanded);
}

std::string ChainWords::signatureReason() const {
    DERItem signature;
    std::uint8_t unusedBits = 0;
    if (DERParseBitString(&refused_->fields.signature, &signature, &unusedBits) != DERSuccess || unusedBits != 0)
        return "The signature on " + call(number_) + " is no BIT STRING of whole octets";
    return "The signature on " + call(number_) + " does not verify under the key of " + call(number_ - 1) +
           signatureRemark(refusal_.signature, issuer_->tbs.subjectPublicKeyInfo,
                           ": the certificate was changed, or another key of that name has signed it");
}

std::string ChainWords::authorityReason() const {
    DERDecodedInfo name;
    const bool isText = DERDecodeItem(&made_.domain.authorityName, &name) == DERSuccess;
    return capitalised(call(number_)) + " does not carry the common name of the secure-boot authority, " +
           (isText ? quotedText(name.content, mostCharactersShown) : "which the domain leaves open") +
           ", as a PrintableString";
}

std::string ChainWords::reason() const {
    switch (refusal_.chain.fault) {
    case Img4ChainEncoding:
        return capitalised(call(number_)) + (refusal_.refusal.encoding.fault == DERFaultNone
                                                 ? " is no certificate"
                                                 : " is no strict DER: " + derFaultText(refusal_.refusal.encoding));
    case Img4ChainCertificateSize:
        return capitalised(call(number_)) + " is longer than 131071 octets";
    case Img4ChainLength:
        return lengthReason();
    case Img4ChainKey:
        return keyReason();
    case Img4ChainIssuer:
        return issuerReason();
    case Img4ChainSignatureAlgorithm:
        return algorithmReason();
    case Img4ChainSignature:
        return signatureReason();
    case Img4ChainAuthority:
        return authorityReason();
    case Img4ChainExtensions:
        return capitalised(call(number_)) +
               " has a malformed or empty list of extensions, or constraints that are no SET";
    default:
        return "The chain cannot be verified";
    }
}

std::string signatureReason(const TrustEvaluation& evaluation) {
    std::uint64_t count = 0;
    const auto leaf = readCertificate(certificatesOf(evaluation.record.manifest.certChain, &count).back());
    const std::string reason = "The manifest's signature does not verify under the key of the leaf";
    return leaf ? reason + " (" + quoted(nameText(leaf->tbs.subject)) + ")" +
                      signatureRemark(evaluation.refusal.signature, leaf->tbs.subjectPublicKeyInfo,
                                      ": the manifest's body was changed, or another key has signed it")
                : reason;
}

std::string walkReason(const Img4Refusal& refusal, const char* owner) {
    if (refusal.tag == 0)
        return std::string("A property of ") + owner + " is no strict DER: " + derFaultText(refusal.encoding);
    return derTagName(refusal.tag) + " of " + owner + " " + img4show::propertyReason(refusal);
}

std::string constraintReason(const Img4Record& record) {
    for (const TrustConstraint& constraint : readConstraints(record))
        if (constraint.state == TrustConstraint::Broken)
            return constraint.reason;
    return "The leaf certificate carries no constraints, without which nothing is trusted";
}

} // namespace

std::vector<DERItem> certificatesOf(const DERItem& certChain, std::uint64_t* count) {
    std::vector<DERItem> certificates;
    DerItems items(certChain);
    for (*count = 0; items.next(); ++*count)
        if (*count < mostCertificates)
            certificates.push_back(items.encoding());
    return certificates;
}

TrustEvaluation evaluateTrust(const Img4Record& record, const DomainProfile& profile,
                              std::optional<std::uint32_t> object) {
    TrustEvaluation evaluation = {&profile, object, record, {}, DERSuccess};
    const Img4TrustCallbacks callbacks = {agree, nullptr, nullptr};
    evaluation.status =
        Img4DecodePerformTrustEvaluationExplained(object ? &*object : nullptr, &evaluation.record, &callbacks,
                                                  &profile.made.profile, nullptr, &evaluation.refusal);
    return evaluation;
}

TrustRefusal explainRefusal(const TrustEvaluation& evaluation) {
    const Img4TrustRefusal& refusal = evaluation.refusal;
    const std::uint8_t* const place = refusal.refusal.place;
    switch (refusal.refusal.subject) {
    case Img4SubjectChain:
        return {"chain", ChainWords(evaluation).reason(), place,
                refusal.chain.fault == Img4ChainLength ? std::nullopt : std::optional(refusal.chain.certificate)};
    case Img4SubjectSignature:
        return {"signature", signatureReason(evaluation), place, std::nullopt};
    case Img4SubjectBody:
    case Img4SubjectManb:
        return {"dictionaries", img4show::lookupReason(refusal.refusal), place, std::nullopt};
    case Img4SubjectObject:
        return {"object", img4show::lookupReason(refusal.refusal), place, std::nullopt};
    case Img4SubjectConstraints:
        return {"constraints", constraintReason(evaluation.record), place, std::nullopt};
    case Img4SubjectManifestProperties:
        return {"properties", walkReason(refusal.refusal, "the manifest"), place, std::nullopt};
    case Img4SubjectObjectProperties:
        return {"properties", walkReason(refusal.refusal, "the object"), place, std::nullopt};
    case Img4SubjectPayloadDigest:
        return {"digest", "The payload's digest could not be computed", place, std::nullopt};
    default:
        return {"digest", "The manifest's digest could not be computed", place, std::nullopt};
    }
}
