#include "tools/orloctl/TrustEvaluation.h"

#include <algorithm>

#include "der/DERDecode.h"
#include "tools/orloctl/CertificateText.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"
#include "tools/orloctl/Img4Properties.h"
#include "tools/orloctl/Img4Words.h"
#include "tools/orloctl/TrustConstraints.h"

namespace {

using img4show::mostCharactersShown;

constexpr std::uint32_t manb = Img4FourCC('M', 'A', 'N', 'B');
constexpr std::uint32_t manp = Img4FourCC('M', 'A', 'N', 'P');

DERReturn agree(DERTag, const Img4PropertyValue*, std::uint32_t, void*) {
    return DERSuccess;
}

bool isRSA(const Img4TrustProfile& profile) {
    return DEROidCompare(profile.keyAlgorithmOid, &oidRsa);
}

// What a property is refused for, and where.
struct Cause {
    std::string reason; // a sentence without its full stop
    const std::uint8_t* place;
};

std::string capitalised(std::string text) {
    if (text[0] >= 'a' && text[0] <= 'z')
        text[0] = static_cast<char>(text[0] - 'a' + 'A');
    return text;
}

Cause headerCause(const std::string& what, const DERItem& rest) {
    const auto why = derHeaderFault(rest);
    return {what + " is no strict DER: " + (why ? why->reason : "it cannot be decoded"),
            rest.data + (why ? why->offset : 0)};
}

Cause propertyCause(const DERDecodedInfo& element, const std::string& owner) {
    Img4Property property;
    Img4Refusal refusal;
    DERImg4DecodePropertyExplained(&element.content, element.tag, &property, &refusal);
    return {derTagName(element.tag) + " of " + owner + " " + img4show::propertyReason(refusal), refusal.place};
}

// Why the decoder does not find the property `code` of the type `type` in `dictionary`, which is `owner`'s.
Cause lookupCause(const DERItem& dictionary, std::uint32_t code, DERTag type, const std::string& owner) {
    DerItems elements(dictionary);
    while (elements.next()) {
        const DERDecodedInfo& element = elements.item();
        Img4Property property;
        if (element.tag != Img4PropertyTag(code))
            continue;
        if (DERImg4DecodeProperty(&element.content, element.tag, &property) != DERSuccess)
            return propertyCause(element, owner);
        return {quotedCode(code) + " of " + owner + " is " + derTagName(property.valueTag) + " instead of " +
                    derTagName(type),
                elements.encoding().data};
    }
    if (elements.isBroken())
        return headerCause("An element of " + owner, elements.encoding());
    return {capitalised(owner) + " has no " + quotedCode(code), dictionary.data};
}

// Why the walk of the properties in `dictionary` ends early.
Cause walkCause(const DERItem& dictionary, const std::string& owner) {
    constexpr DERTag judged[] = {DERTagBoolean, DERTagInteger, DERTagOctetString, DERTagIA5String};
    DerItems elements(dictionary);
    while (elements.next()) {
        const DERDecodedInfo& element = elements.item();
        Img4Property property;
        if (element.tag != Img4PropertyTag(element.tag & DERTagNumberMask))
            return {derTagName(element.tag) + " of " + owner + " is no property", elements.encoding().data};
        if (DERImg4DecodeProperty(&element.content, element.tag, &property) != DERSuccess)
            return propertyCause(element, owner);
        if (std::find(std::begin(judged), std::end(judged), property.valueTag) == std::end(judged))
            return {derTagName(element.tag) + " of " + owner + " is " + derTagName(property.valueTag) +
                        ", and only BOOLEAN, INTEGER, OCTET STRING and IA5String can be judged",
                    elements.encoding().data};
    }
    if (elements.isBroken())
        return headerCause("A property of " + owner, elements.encoding());
    return {"The properties of " + owner + " cannot be judged", dictionary.data};
}

std::string quoted(const std::string& text) {
    return "\"" + text + "\"";
}

// Why a signature of that form cannot verify under the key, whatever it was made over; `otherwise` when it could.
std::string signatureRemark(const DERItem& key, const DERItem& signature, const Img4TrustProfile& profile,
                            const char* otherwise) {
    const auto bits = rsaBits(key);
    const std::size_t most = profile.verifySignature == verify_signature_rsa3k ? 3072 : 4096;
    if (const std::string fault = keyFault(key); !fault.empty())
        return ": the key " + fault;
    if (!bits)
        return otherwise;
    if (*bits < 1024 || *bits > most)
        return ", which has " + std::to_string(*bits) + " bits, and the profile takes 1024 to " + std::to_string(most);
    if (const std::size_t octets = (*bits + 7) / 8; octets != signature.length)
        return ": it has " + std::to_string(signature.length) + " octets, and those of the key have " +
               std::to_string(octets);
    return otherwise;
}

// Finds the words for a refused chain.
class ChainWords {
public:
    explicit ChainWords(const TrustEvaluation& evaluation);

    TrustRefusal explain() const;

private:
    std::string call(std::uint32_t number) const;
    std::string encodingReason() const;
    std::string lengthReason() const;
    std::string keyReason() const;
    std::string issuerReason() const;
    std::string algorithmReason() const;
    std::string signatureReason() const;
    std::string authorityReason() const;

    const TrustEvaluation& evaluation_;
    const Img4DomainProfile& made_;
    const std::uint32_t number_;        // of the refused certificate
    std::uint64_t count_ = 0;           // the root included
    std::vector<DERItem> encodings_;    // the root first
    std::optional<Certificate> issuer_; // the one before the refused one
    std::optional<Certificate> refused_;
};

ChainWords::ChainWords(const TrustEvaluation& evaluation)
    : evaluation_(evaluation), made_(evaluation.profile->made), number_(evaluation.refusal.certificate) {
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

std::string ChainWords::encodingReason() const {
    if (number_ < encodings_.size())
        return capitalised(call(number_)) + " is no certificate";
    const DERItem& chain = evaluation_.record.manifest.certChain;
    const DERItem& last = encodings_.back();
    const std::uint8_t* next = encodings_.size() == 1 ? chain.data : last.data + last.length;
    return headerCause(capitalised(call(number_)), {next, static_cast<std::uint64_t>(chain.data + chain.length - next)})
        .reason;
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
           signatureRemark(issuer_->tbs.subjectPublicKeyInfo, signature, made_.profile,
                           ": the certificate was changed, or another key of that name has signed it");
}

std::string ChainWords::authorityReason() const {
    DERDecodedInfo name;
    const bool isText = DERDecodeItem(&made_.domain.authorityName, &name) == DERSuccess;
    return capitalised(call(number_)) + " does not carry the common name of the secure-boot authority, " +
           (isText ? quotedText(name.content, mostCharactersShown) : "which the domain leaves open") +
           ", as a PrintableString";
}

TrustRefusal ChainWords::explain() const {
    const auto about = [this](const std::string& reason) {
        const DERItem& chain = evaluation_.record.manifest.certChain;
        const bool isThere = number_ != 0 && number_ < encodings_.size();
        return TrustRefusal{"chain", reason, isThere ? encodings_[number_].data : chain.data, number_};
    };
    switch (evaluation_.refusal.fault) {
    case Img4ChainEncoding:
        return about(encodingReason());
    case Img4ChainCertificateSize:
        return about(capitalised(call(number_)) + " is longer than 131071 octets");
    case Img4ChainLength:
        return {"chain", lengthReason(), evaluation_.record.manifest.certChain.data, std::nullopt};
    case Img4ChainKey:
        return about(keyReason());
    case Img4ChainIssuer:
        return about(issuerReason());
    case Img4ChainSignatureAlgorithm:
        return about(algorithmReason());
    case Img4ChainSignature:
        return about(signatureReason());
    case Img4ChainAuthority:
        return about(authorityReason());
    case Img4ChainExtensions:
        return about(capitalised(call(number_)) +
                     " has a malformed or empty list of extensions, or constraints that are no SET");
    default:
        return about("The chain cannot be verified");
    }
}

TrustRefusal refusalOf(const char* step, Cause cause) {
    return {step, std::move(cause.reason), cause.place, std::nullopt};
}

TrustRefusal signatureRefusal(const TrustEvaluation& evaluation) {
    std::uint64_t count = 0;
    const Img4ManifestRecord& manifest = evaluation.record.manifest;
    const auto leaf = readCertificate(certificatesOf(manifest.certChain, &count).back());
    std::string reason = "The manifest's signature does not verify under the key of the leaf";
    if (leaf)
        reason += " (" + quoted(nameText(leaf->tbs.subject)) + ")" +
                  signatureRemark(leaf->tbs.subjectPublicKeyInfo, manifest.signature, evaluation.profile->made.profile,
                                  ": the manifest's body was changed, or another key has signed it");
    return {"signature", reason, manifest.signature.data, std::nullopt};
}

TrustRefusal dictionaryRefusal(const Img4Record& record) {
    DERDecodedInfo body;
    std::uint32_t version = 0;
    if (record.manb.data != nullptr)
        return refusalOf("dictionaries", lookupCause(record.manb, manp, DERTagSet, "\"MANB\""));
    DERDecodeItem(&record.manifest.body, &body);
    DERParseInteger(&record.manifest.version, &version);
    return refusalOf("dictionaries",
                     lookupCause(body.content, manb, version == 2 ? DERTagSequence : DERTagSet, "the manifest's body"));
}

TrustRefusal constraintRefusal(const Img4Record& record) {
    for (const TrustConstraint& constraint : readConstraints(record))
        if (constraint.state == TrustConstraint::Broken)
            return {"constraints", constraint.reason, constraint.place, std::nullopt};
    return {"constraints", "The leaf certificate carries no constraints, without which nothing is trusted",
            record.manifest.certChain.data, std::nullopt};
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

Img4ChainRefusal judgeChain(const Img4Record& record, const DomainProfile& profile) {
    Img4DomainProfile made = profile.made;
    Img4ChainRefusal refusal = {Img4ChainParameters, 0};
    DERItem leafKey;
    DERItem certProperties;
    made.refusal = &refusal;
    made.profile.verifyChain(&record.manifest.certChain, &leafKey, &certProperties, &made.profile);
    return refusal;
}

TrustEvaluation evaluateTrust(const Img4Record& record, const DomainProfile& profile,
                              std::optional<std::uint32_t> object) {
    TrustEvaluation evaluation = {&profile, object, record, {Img4ChainParameters, 0}, DERSuccess};
    Img4DomainProfile made = profile.made;
    const Img4TrustCallbacks callbacks = {agree, nullptr, nullptr};
    made.refusal = &evaluation.refusal;
    evaluation.status = object ? Img4DecodePerformTrustEvaluationWithCallbacks(*object, &evaluation.record, &callbacks,
                                                                               &made.profile, nullptr)
                               : Img4DecodePerformManifestTrustEvaluationWithCallbacks(&evaluation.record, &callbacks,
                                                                                       &made.profile, nullptr);
    return evaluation;
}

// The steps in their order: the first that has not left its result in the record is the one that failed.
TrustRefusal explainRefusal(const TrustEvaluation& evaluation) {
    const Img4Record& record = evaluation.record;
    if (record.manifestHashed == 0)
        return {"digest", "The manifest's digest could not be computed", record.manifestRaw.data, std::nullopt};
    if (evaluation.refusal.fault != Img4ChainSound)
        return ChainWords(evaluation).explain();
    // The search for the dictionaries has other statuses.
    if (record.manb.data == nullptr && evaluation.status == Img4Failure)
        return signatureRefusal(evaluation);
    if (record.manp.data == nullptr)
        return dictionaryRefusal(record);
    if (evaluation.object && record.objp.data == nullptr)
        return refusalOf("object", lookupCause(record.manb, *evaluation.object, DERTagSet, "the manifest"));
    if (Img4DecodeEvaluateCertificateProperties(&record) != DERSuccess)
        return constraintRefusal(record);
    bool hasPayload = false;
    Img4DecodePayloadExists(&record, &hasPayload);
    if (hasPayload && record.payloadHashed == 0)
        return {"digest", "The payload's digest could not be computed", record.payloadRaw.data, std::nullopt};
    if (Img4DecodeEvaluateManifestProperties(&record, agree, nullptr) != DERSuccess)
        return refusalOf("properties", walkCause(record.manp, "the manifest"));
    return refusalOf("properties", walkCause(record.objp, "the object"));
}
