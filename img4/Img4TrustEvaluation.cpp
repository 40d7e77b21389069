#include "img4/Img4TrustInternal.h"

#include <cstring>

using namespace img4;

namespace {

bool isComplete(const Img4TrustProfile* profile) {
    return profile != nullptr && profile->computeDigest != nullptr && profile->verifyChain != nullptr &&
           profile->verifySignature != nullptr && profile->evaluateCertificateProperties != nullptr &&
           profile->digestInfo != nullptr;
}

// Stores the digest of `data` by the flow's computeDigest in the record. It is computed aside, so that one that fails
// leaves the record's digest and the flag that vouches for it as they were.
template <typename Flow>
DERReturn storeDigest(const Flow& flow, const DERItem& data, uint8_t (&digest)[Img4MaxDigestLength], uint8_t* flag) {
    uint8_t computed[Img4MaxDigestLength];
    std::memcpy(computed, digest, sizeof computed);
    if (const DERReturn result = flow.computeDigest(data, computed); result != DERSuccess)
        return result;
    std::memcpy(digest, computed, sizeof computed);
    if (flag != nullptr)
        *flag = 1;
    return DERSuccess;
}

// What both orders of steps work on.
struct Flow {
    Img4Record& record;
    Img4TrustCallbacks callbacks;
    void* context;
    Img4TrustRefusal* why; // null unless asked for

    Img4Refusal* refusal() const { return why != nullptr ? &why->refusal : nullptr; }

    // Passes the status of a step on that is about what stands at `place`, and has not said more about it by itself.
    DERReturn step(Img4Subject subject, DERReturn status, const uint8_t* place) const {
        enter(refusal(), subject);
        return status == DERSuccess ? status : refuse(refusal(), status, Img4FaultOther, place);
    }
    DERReturn findObject(uint32_t object) const;
    DERReturn judgeAll(Img4Subject subject, const DERItem& dictionary, uint32_t selector) const;
};

// The newer one: an evaluation under a profile.
struct Evaluation : Flow {
    const Img4TrustProfile& profile;

    DERReturn computeDigest(const DERItem& data, uint8_t* out) const {
        return profile.computeDigest(&data, out, profile.digestInfo->length, &profile);
    }
    bool isTrustedDigest() const;
    DERReturn verifySignature() const;
    DERReturn checkLeaf() const;
    DERReturn run(const uint32_t* object) const;
};

bool Evaluation::isTrustedDigest() const {
    if (callbacks.lookupTrustedDigest == nullptr)
        return false;
    const uint8_t* trusted = callbacks.lookupTrustedDigest(&record, context);
    return trusted != nullptr &&
           std::memcmp(trusted, record.manifest.digest, static_cast<std::size_t>(profile.digestInfo->length)) == 0;
}

DERReturn Evaluation::verifySignature() const {
    Img4ManifestRecord& manifest = record.manifest;
    DERItem leafKey = {};
    if (const DERReturn result =
            verifyChainOf({&manifest.certChain, &leafKey, &manifest.certProperties, &profile}, why);
        result != DERSuccess)
        return step(Img4SubjectChain, result,
                    why != nullptr && why->refusal.place != nullptr ? why->refusal.place : manifest.certChain.data);
    if (const DERReturn result = storeDigest(*this, manifest.body, manifest.bodyDigest, nullptr); result != DERSuccess)
        return step(Img4SubjectBodyDigest, result, manifest.body.data);
    return step(Img4SubjectSignature, verifySignatureOf(profile, leafKey, manifest.signature, manifest.bodyDigest, why),
                manifest.signature.data);
}

DERReturn Flow::findObject(uint32_t object) const {
    const DERTag tag = Img4PropertyTag(object);
    Img4Property found = {};
    enter(refusal(), Img4SubjectObject);
    const DERReturn result =
        callbacks.findObject != nullptr
            ? step(Img4SubjectObject, callbacks.findObject(&record.manb, tag, DERTagSet, &found, context),
                   record.manb.data)
            : findProperty(record.manb, tag, DERTagSet, &found, refusal());
    if (result == DERSuccess)
        record.objp = found.value;
    return result;
}

DERReturn Evaluation::checkLeaf() const {
    if (why != nullptr && profile.evaluateCertificateProperties == Img4DecodeEvaluateCertificateProperties)
        return checkConstraints(record, &why->refusal);
    return step(Img4SubjectConstraints, profile.evaluateCertificateProperties(&record), record.manifest.certChain.data);
}

// The steps that the two orders have in common, between the signature and, in one of them, the manifest's digest.
template <typename AnyFlow>
DERReturn evaluateContents(const AnyFlow& flow, const uint32_t* object, bool verified) {
    Img4Record& record = flow.record;
    DERReturn result = findManifestDictionaries(record, &record.manb, &record.manp, flow.refusal());
    if (result == DERSuccess && object != nullptr)
        result = flow.findObject(*object);
    if (result == DERSuccess && verified)
        result = flow.checkLeaf();
    // A record without payload has nothing to digest.
    if (result == DERSuccess && hasContent(record.payload.data))
        result = flow.step(Img4SubjectPayloadDigest,
                           storeDigest(flow, record.payloadRaw, record.payload.digest, &record.payloadHashed),
                           record.payloadRaw.data);
    if (result == DERSuccess)
        result = flow.judgeAll(Img4SubjectManifestProperties, record.manp, Img4SelectorManifest);
    if (result == DERSuccess && object != nullptr)
        result = flow.judgeAll(Img4SubjectObjectProperties, record.objp, Img4SelectorObject);
    return result;
}

// Evaluates the manifest alone when `object` is null.
DERReturn Evaluation::run(const uint32_t* object) const {
    DERReturn result = storeDigest(*this, record.manifestRaw, record.manifest.digest, &record.manifestHashed);
    if (result != DERSuccess)
        return step(Img4SubjectManifestDigest, result, record.manifestRaw.data);
    const bool verified = !isTrustedDigest();
    if (verified)
        result = verifySignature();
    return result == DERSuccess ? evaluateContents(*this, object, verified) : result;
}

DERReturn evaluate(const uint32_t* object, Img4Record* record, const Img4TrustCallbacks* callbacks,
                   const Img4TrustProfile* profile, void* context, Img4TrustRefusal* why = nullptr) {
    if (record == nullptr || callbacks == nullptr || callbacks->evaluateProperty == nullptr || !isComplete(profile) ||
        !isPresent(record->manifestRaw))
        return DERParamError;
    if (profile->digestInfo->length > Img4MaxDigestLength)
        return DERBufferOverflow;
    return Evaluation{{*record, *callbacks, context, why}, *profile}.run(object);
}

bool isJudgedType(DERTag valueTag) {
    return valueTag == DERTagBoolean || valueTag == DERTagInteger || valueTag == DERTagOctetString ||
           valueTag == DERTagIA5String;
}

DERReturn judge(const DERDecodedInfo& element, const uint8_t* start, uint32_t selector,
                Img4PropertyCallback evaluateProperty, void* context, Img4Refusal* refusal) {
    Img4Property property;
    const Img4Subject subject = refusal != nullptr ? refusal->subject : Img4SubjectProperty;
    // Tags that are not private and constructed name no property, and are refused here.
    const DERReturn result = DERImg4DecodePropertyExplained(&element.content, element.tag, &property, refusal);
    if (refusal != nullptr)
        refusal->subject = subject;
    if (result != DERSuccess)
        return result;
    if (refusal != nullptr)
        refusal->encoding.tag = property.valueTag;
    if (!isJudgedType(property.valueTag))
        return refuse(refusal, DERUnexpectedTag, Img4FaultValueType, start);
    const Img4PropertyValue value = {property.value, property.valueTag};
    const DERReturn judged = evaluateProperty(property.tag, &value, selector, context);
    return judged == DERSuccess ? judged : refuse(refusal, judged, Img4FaultOther, start);
}

DERReturn judgeAll(const DERItem& dictionary, uint32_t selector, Img4PropertyCallback evaluateProperty, void* context,
                   Img4Refusal* refusal = nullptr) {
    DERSequence rest;
    DERDecodedInfo element;
    const uint8_t* start = dictionary.data;
    DERDecodeSeqContentInit(&dictionary, &rest);
    DERReturn result = DERDecodeSeqNext(&rest, &element);
    for (; result == DERSuccess; result = DERDecodeSeqNext(&rest, &element)) {
        if (const DERReturn judged = judge(element, start, selector, evaluateProperty, context, refusal);
            judged != DERSuccess)
            return judged;
        start = rest.next;
    }
    return result == DEREndOfSequence ? DERSuccess : refuseSearch(result, dictionary, rest.next, refusal);
}

DERReturn Flow::judgeAll(Img4Subject subject, const DERItem& dictionary, uint32_t selector) const {
    enter(refusal(), subject);
    return ::judgeAll(dictionary, selector, callbacks.evaluateProperty, context, refusal());
}

} // namespace

DERReturn Img4DecodePerformTrustEvaluation(uint32_t object, Img4Record* record, Img4PropertyCallback evaluateProperty,
                                           const Img4TrustProfile* profile, void* context) {
    const Img4TrustCallbacks callbacks = {evaluateProperty, nullptr, nullptr};
    return evaluate(&object, record, &callbacks, profile, context);
}

DERReturn Img4DecodePerformTrustEvaluatation(uint32_t object, Img4Record* record, Img4PropertyCallback evaluateProperty,
                                             const Img4TrustProfile* profile, void* context) {
    return Img4DecodePerformTrustEvaluation(object, record, evaluateProperty, profile, context);
}

DERReturn Img4DecodePerformTrustEvaluationWithCallbacks(uint32_t object, Img4Record* record,
                                                        const Img4TrustCallbacks* callbacks,
                                                        const Img4TrustProfile* profile, void* context) {
    return evaluate(&object, record, callbacks, profile, context);
}

DERReturn Img4DecodePerformTrustEvaluatationWithCallbacks(uint32_t object, Img4Record* record,
                                                          const Img4TrustCallbacks* callbacks,
                                                          const Img4TrustProfile* profile, void* context) {
    return evaluate(&object, record, callbacks, profile, context);
}

DERReturn Img4DecodePerformManifestTrustEvaluationWithCallbacks(Img4Record* record, const Img4TrustCallbacks* callbacks,
                                                                const Img4TrustProfile* profile, void* context) {
    return evaluate(nullptr, record, callbacks, profile, context);
}

DERReturn Img4DecodePerformTrustEvaluationExplained(const uint32_t* object, Img4Record* record,
                                                    const Img4TrustCallbacks* callbacks,
                                                    const Img4TrustProfile* profile, void* context,
                                                    Img4TrustRefusal* refusal) {
    if (refusal == nullptr)
        return DERParamError;
    *refusal = Img4TrustRefusal{};
    const DERReturn result = evaluate(object, record, callbacks, profile, context, refusal);
    if (result == DERSuccess || refusal->refusal.subject == Img4SubjectNone)
        refusal->refusal.subject = result == DERSuccess ? Img4SubjectNone : Img4SubjectArguments;
    if (result != DERSuccess && refusal->refusal.fault == Img4FaultNone)
        refusal->refusal.fault = Img4FaultOther;
    return refusal->refusal.status = result;
}

DERReturn Img4DecodeEvaluateManifestProperties(const Img4Record* record, Img4PropertyCallback evaluateProperty,
                                               void* context) {
    return record != nullptr
               ? Img4DecodeEvaluateDictionaryProperties(&record->manp, Img4SelectorManifest, evaluateProperty, context)
               : DERParamError;
}

DERReturn Img4DecodeEvaluateObjectProperties(const Img4Record* record, Img4PropertyCallback evaluateProperty,
                                             void* context) {
    return record != nullptr
               ? Img4DecodeEvaluateDictionaryProperties(&record->objp, Img4SelectorObject, evaluateProperty, context)
               : DERParamError;
}

DERReturn Img4DecodeEvaluateDictionaryProperties(const DERItem* dictionary, uint32_t selector,
                                                 Img4PropertyCallback evaluateProperty, void* context) {
    return dictionary != nullptr && evaluateProperty != nullptr
               ? judgeAll(*dictionary, selector, evaluateProperty, context)
               : DERParamError;
}

namespace {

DERReturn verifyWithChain(const DERItem* chain, const DERItem* signature, const uint8_t* digest,
                          DERItem* certProperties, void* /*context*/) {
    return img4_verify_signature_with_chain(chain, signature, digest, certProperties);
}

// The older order, with the parts of a caller.
struct EvaluationByParts : Flow {
    Img4SignatureWithChainVerifier verify;
    Img4CertificateCheck checkCertificate;
    Img4DigestFunction digest;

    DERReturn computeDigest(const DERItem& data, uint8_t* out) const {
        return digest(data.data, data.length, out, context);
    }
    DERReturn checkLeaf() const { return checkCertificate(&record); }
    DERReturn run(uint32_t object) const;
};

DERReturn EvaluationByParts::run(uint32_t object) const {
    Img4ManifestRecord& manifest = record.manifest;
    DERReturn result = storeDigest(*this, manifest.body, manifest.bodyDigest, nullptr);
    if (result == DERSuccess)
        result =
            verify(&manifest.certChain, &manifest.signature, manifest.bodyDigest, &manifest.certProperties, context);
    if (result == DERSuccess)
        result = evaluateContents(*this, &object, true);
    return result == DERSuccess ? storeDigest(*this, record.manifestRaw, manifest.digest, &record.manifestHashed)
                                : result;
}

} // namespace

DERReturn Img4DecodeEvaluateTrust(uint32_t object, Img4Record* record, Img4PropertyCallback evaluateProperty,
                                  void* context) {
    return Img4DecodeEvaluateTrustWithCallbacks(object, record, evaluateProperty, verifyWithChain,
                                                Img4DecodeEvaluateCertificateProperties, hashWithSHA1, context);
}

DERReturn Img4DecodeEvaluateTrustWithCallbacks(uint32_t object, Img4Record* record,
                                               Img4PropertyCallback evaluateProperty,
                                               Img4SignatureWithChainVerifier verify,
                                               Img4CertificateCheck checkCertificate, Img4DigestFunction digest,
                                               void* context) {
    if (record == nullptr || evaluateProperty == nullptr || verify == nullptr || checkCertificate == nullptr ||
        digest == nullptr || !isPresent(record->manifestRaw))
        return DERParamError;
    return EvaluationByParts{
        {*record, {evaluateProperty, nullptr, nullptr}, context, nullptr}, verify, checkCertificate, digest}
        .run(object);
}

DERReturn img4_verify_signature_with_chain(const DERItem* chain, const DERItem* signature, const uint8_t* digest,
                                           DERItem* certProperties) {
    const Img4TrustProfile& profile = kImg4DecodeSecureBootRsa1kSha1;
    DERItem leafKey = {};
    if (const DERReturn result = verify_chain_img4_v1(chain, &leafKey, certProperties, &profile); result != DERSuccess)
        return result;
    return verify_signature_rsa(&leafKey, signature, digest, Img4HashLength, &profile);
}
