#include "tools/orloctl/TrustWords.h"

#include "der/DERDecode.h"
#include "tools/orloctl/CertificateText.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Words.h"
#include "tools/orloctl/Report.h"

namespace {

using Encodings = std::vector<DERItem>; // of certificates, the root first

// Type and value of one encoded property.
std::string valueText(const DERItem& encoding) {
    DERDecodedInfo element;
    Img4Property property;
    if (DERDecodeItem(&encoding, &element) != DERSuccess ||
        DERImg4DecodeProperty(&element.content, element.tag, &property) != DERSuccess)
        return "malformed";
    const auto value = derValue(property.valueTag, property.value);
    const bool isPlain = value.is_string() && property.valueTag != DERTagIA5String;
    return derTagName(property.valueTag) + " " + (isPlain ? value.get<std::string>() : value.dump());
}

// As much of it as a sentence takes.
std::string inSentence(const std::string& text) {
    return shortened(text, 128);
}

// What the constraint demands; empty when it is none.
std::string demandOf(const Img4Constraint& constraint) {
    switch (constraint.kind) {
    case DERTagBoolean:
    case DERTagInteger:
    case DERTagOctetString:
        return "must be " + valueText(constraint.encoding);
    case DERTagContextConstructed(0):
        return "must be there";
    case DERTagContextConstructed(1):
        return "must not be there";
    default:
        return "";
    }
}

// Why it is none, in a clause whose subject it is.
std::string malformedReason(const Img4Constraint& constraint, bool isRead) {
    if (!isRead)
        return derRefusalText(constraint.refusal.encoding);
    if (constraint.kind != 0)
        return "is " + derTagName(constraint.kind) + ", which is no kind of constraint";
    return constraint.refusal.fault == Img4FaultTag ? "is no dictionary of constraints"
                                                    : propertyReason(constraint.refusal);
}

void add(const Img4Constraint* constraint, void* context) {
    auto& [rows, broken] = *static_cast<TrustConstraints*>(context);
    const Img4Refusal& refusal = constraint->refusal;
    if (constraint->dictionary == 0 && refusal.fault != Img4FaultEncoding)
        return; // it is not about one of them
    DERDecodedInfo item = {};
    const bool isRead = DERDecodeItem(&constraint->encoding, &item) == DERSuccess;
    const std::uint64_t code = item.tag & DERTagNumberMask;
    const std::string dictionary = codeText(constraint->dictionary & DERTagNumberMask);
    const std::string owner = dictionary == "MANP" ? "the manifest" : dictionary == "OBJP" ? "the object" : dictionary;
    const std::string found = constraint->found.data != nullptr ? valueText(constraint->found) : "";
    std::string name = codeText(code);
    std::string demand = demandOf(*constraint);
    std::string reason = "The leaf certificate says that " + codeText(code, "\"") + " of " + owner + " " +
                         inSentence(demand) + ", and " +
                         (!found.empty()                       ? "it is " + inSentence(found)
                          : refusal.status == DEREndOfSequence ? "there is none"
                                                               : "one of the properties there is no strict DER");
    if (demand.empty()) {
        name = isRead ? derTagName(item.tag) : "one";
        demand = malformedReason(*constraint, isRead);
        reason = "Of the leaf's constraints on " + owner + ", " + name + " " + demand;
    }
    const bool isBroken = constraint->isChecked && refusal.fault != Img4FaultNone;
    const char* const state = !constraint->isChecked ? "not checked" : isBroken ? "broken" : "met";
    rows.push_back({{"dictionary", dictionary}, {"name", name}, {"demand", demand}, {"state", state}});
    if (!found.empty())
        rows.back()["found"] = found;
    if (isBroken && broken.empty())
        broken = reason;
}

// The fields of a certificate of the chain, absent when it is none.
Certificate certificateAt(const Encodings& chain, std::size_t number) {
    return (number < chain.size() ? readCertificate(chain[number]) : std::nullopt).value_or(Certificate());
}

// "certificate 1", with its name.
std::string call(const Encodings& chain, std::size_t number) {
    const Certificate certificate = certificateAt(chain, number);
    return (number == 0 ? "the root" : "certificate " + std::to_string(number)) +
           (certificate.tbs.subject.data != nullptr ? " (" + quotedText(nameText(certificate.tbs.subject)) + ")" : "");
}

// What is wrong with a signature or the key that verifies it; `otherwise` when it is over something else.
std::string signatureRemark(const Img4SignatureRefusal& refusal, const DERItem& key, const char* otherwise) {
    switch (refusal.fault) {
    case Img4SignatureKey:
        return ": the key is malformed";
    case Img4SignatureKeySize:
        return ", which has " + std::to_string(refusal.found) + " bits, and the profile takes " +
               std::to_string(refusal.least) + " to " + std::to_string(refusal.most);
    case Img4SignatureKeyNumbers:
        return ": the key has an even modulus or an unsound exponent";
    case Img4SignatureForm:
        return ": it has not the form that the algorithm demands, such as a SEQUENCE of two positive INTEGERs that fit "
               "the curve, or is no BIT STRING of whole octets";
    case Img4SignatureLength:
        return ": it has " + std::to_string(refusal.found) + " octets, and those of the key have " +
               std::to_string(refusal.most);
    default:
        return isKey(key) ? otherwise : ": the key is no uncompressed point of its curve";
    }
}

std::string chainReason(const TrustEvaluation& evaluation, const Encodings& chain, std::uint64_t count) {
    const Img4TrustRefusal& refusal = evaluation.refusal;
    const Img4DomainProfile& made = evaluation.profile->made;
    const std::uint32_t number = refusal.chain.certificate;
    const Certificate refused = certificateAt(chain, number);
    const DERTBSCert issuer = number != 0 ? certificateAt(chain, number - 1).tbs : DERTBSCert();
    const std::string demanded = algorithmName(*made.profile.signatureAlgorithmOid);
    DERDecodedInfo authority = {};
    std::string algorithm;
    std::string subject = call(chain, number);
    subject[0] = static_cast<char>(subject[0] - 'a' + 'A');
    switch (refusal.chain.fault) {
    case Img4ChainLength:
        return "The chain has " + std::to_string(count + 1) + (count == 0 ? " certificate" : " certificates") +
               ", the root included, and the profile demands " + std::to_string(made.chainLength);
    case Img4ChainEncoding:
        return subject + " " +
               (refusal.refusal.encoding.fault == DERFaultNone ? "is no certificate"
                                                               : derRefusalText(refusal.refusal.encoding));
    case Img4ChainCertificateSize:
        return subject + " is longer than 131071 octets";
    case Img4ChainKey:
        return subject + " has the key " + shortened(keyText(refused.tbs.subjectPublicKeyInfo), 512) +
               ", and the profile demands " +
               (DEROidCompare(made.profile.keyAlgorithmOid, &oidRsa) ? "RSA without parameters"
                                                                     : "EC on P-256 or P-384, an uncompressed point");
    case Img4ChainIssuer:
        return subject + " names the issuer " + quotedText(nameText(refused.tbs.issuer)) +
               ", and the one before it is " + call(chain, number - 1) +
               (nameText(refused.tbs.issuer) == nameText(issuer.subject) ? " in another encoding" : "");
    case Img4ChainSignatureAlgorithm:
        algorithm = algorithmText(refused.fields.signatureAlgorithm);
        return subject + " is signed with " + shortened(algorithm, 512) +
               (algorithm == demanded ? " and parameters, which it must not have"
                                      : ", and the profile demands " + demanded);
    case Img4ChainSignature:
        return "The signature on " + call(chain, number) + " does not verify under the key of " +
               call(chain, number - 1) +
               signatureRemark(refusal.signature, issuer.subjectPublicKeyInfo,
                               ": the certificate was changed, or another key of that name has signed it");
    case Img4ChainAuthority:
        DERDecodeItem(&made.domain.authorityName, &authority);
        return subject + " does not carry the common name of the secure-boot authority as a PrintableString: " +
               quotedText(authority.content);
    default:
        return subject + " has a malformed or empty list of extensions, or constraints that are no SET";
    }
}

std::string walkReason(const Img4Refusal& refusal, const char* owner) {
    return refusal.tag == 0 ? std::string("A property of ") + owner + " " + derRefusalText(refusal.encoding)
                            : derTagName(refusal.tag) + " of " + owner + " " + propertyReason(refusal);
}

} // namespace

TrustConstraints readConstraints(const Img4Record& record) {
    TrustConstraints constraints;
    Img4DecodeEvaluateCertificatePropertiesExplained(&record, add, &constraints);
    return constraints;
}

TrustReason explainRefusal(const TrustEvaluation& evaluation, const std::vector<DERItem>& certificates,
                           std::uint64_t count, const TrustConstraints& constraints) {
    Encodings chain = certificates;
    chain.insert(chain.begin(), evaluation.profile->made.root);
    const Img4Refusal& refusal = evaluation.refusal.refusal;
    switch (refusal.subject) {
    case Img4SubjectChain:
        return {"chain", chainReason(evaluation, chain, count)};
    case Img4SubjectSignature:
        return {"signature", "The manifest's signature does not verify under the key of the leaf, " +
                                 call(chain, chain.size() - 1) +
                                 signatureRemark(evaluation.refusal.signature,
                                                 certificateAt(chain, chain.size() - 1).tbs.subjectPublicKeyInfo,
                                                 ": the manifest's body was changed, or another key has signed it")};
    case Img4SubjectBody:
    case Img4SubjectManb:
        return {"dictionaries", lookupReason(refusal)};
    case Img4SubjectObject:
        return {"object", lookupReason(refusal)};
    case Img4SubjectConstraints:
        return {"constraints", !constraints.broken.empty()
                                   ? constraints.broken
                                   : "The leaf certificate carries no constraints, without which nothing is trusted"};
    case Img4SubjectManifestProperties:
        return {"properties", walkReason(refusal, "the manifest")};
    case Img4SubjectObjectProperties:
        return {"properties", walkReason(refusal, "the object")};
    case Img4SubjectPayloadDigest:
        return {"digest", "The payload's digest could not be computed"};
    default:
        return {"digest", "The manifest's digest could not be computed"};
    }
}
