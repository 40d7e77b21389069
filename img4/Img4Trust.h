// Trust in an Img4 manifest: whether a chain of certificates that ends in a known root signed it, whether it keeps to
// the constraints that the chain's last certificate, the leaf, carries, and what it says, property by property, for the
// caller to judge.
//
// Start with Img4DecodePerformTrustEvaluation, which does all of it to a record that one of the initialisations of
// Img4.h filled from a manifest or a container. A trust profile names the algorithms and the root; there are fourteen,
// each of them a constant object, listed in Img4TrustProfiles.
//
//   Img4Record record;
//   if (Img4DecodeInit(buffer, length, &record) == DERSuccess &&
//       Img4DecodePerformTrustEvaluation(object, &record, judgeProperty, &kImg4DecodeSecureBootEc384Sha384, judge) ==
//           DERSuccess)
//       ... the manifest is sound, judgeProperty has agreed to every property, and the object's image is trusted if the
//       digest in record.payload.digest is the one that a property of the object demands.
//
// Nothing is allocated here but what the cryptographic library needs during a call, and there is no shared state: one
// thread at a time uses a record, everything else may be used by any number of threads. Statuses are those of Img4.h.
// The verifiers of chains and signatures report every failure as Img4Failure.
#ifndef VELTRA_IMG4_TRUST_H
#define VELTRA_IMG4_TRUST_H

#include "img4/Img4.h"

#ifdef __cplusplus
extern "C" {
#endif

// Callbacks
//
// `context` is the pointer given to the evaluation.

// The dictionary that a property comes from.
enum {
    Img4SelectorManifest = 0, // "MANP"
    Img4SelectorObject = 1    // the evaluated object
};

typedef struct Img4PropertyValue {
    DERItem content;
    DERTag tag; // BOOLEAN, INTEGER, OCTET STRING or IA5String
} Img4PropertyValue;

// Judges one property. Anything but DERSuccess stops the evaluation, which returns it.
typedef DERReturn (*Img4PropertyCallback)(DERTag tag, const Img4PropertyValue* value, uint32_t selector, void* context);

// Gives out the digest of a manifest that was found trustworthy before, as long as the profile's digests, or null.
typedef const uint8_t* (*Img4TrustedDigestCallback)(const Img4Record* record, void* context);

// Finds the object that a property tag names in the value of "MANB", in place of DERImg4DecodeFindProperty and under
// the same contract.
typedef DERReturn (*Img4FindObjectCallback)(const DERItem* manb, DERTag tag, DERTag valueType, Img4Property* property,
                                            void* context);

typedef struct Img4TrustCallbacks {
    Img4PropertyCallback evaluateProperty;
    // Optional. When the digest that it gives out is the manifest's, neither chain nor signature nor the leaf's
    // constraints are looked at.
    Img4TrustedDigestCallback lookupTrustedDigest;
    // Optional.
    Img4FindObjectCallback findObject;
} Img4TrustCallbacks;

// Evaluation
//
// The steps, in order. The first that fails gives the status and ends the evaluation; what the steps before it have
// left in the record stays there.
//
//   1. Everything that is needed must be there (DERParamError): the record with a manifest, the callbacks that are not
//      optional, and all of the profile's operations with its digest description. A digest of more than
//      Img4MaxDigestLength octets is DERBufferOverflow.
//   2. The digest of manifestRaw goes into manifest.digest, and manifestHashed is set.
//   3. A trusted digest that equals it ends the checking of signatures: step 6 is next.
//   4. The profile's verifyChain runs over the chain. The leaf's constraints go into manifest.certProperties.
//   5. The digest of manifest.body goes into manifest.bodyDigest, and the profile's verifySignature runs over it with
//      the leaf's key.
//   6. manb and manp are found, as for every lookup of Img4.h.
//   7. The object's properties, a SET, become objp.
//   8. Unless step 3 ended the checking, the profile's evaluateCertificateProperties runs.
//   9. If there is a payload, the digest of payloadRaw goes into payload.digest, and payloadHashed is set. The
//      comparison with the digest that the object demands is the caller's, since the property's name is.
//  10. evaluateProperty judges the properties in manp, in order,
//  11. and then those in objp.

// Evaluates the manifest and its object with the four-character code `object`. The first form has no optional
// callbacks. Each form goes by two names.
IMG4_API DERReturn Img4DecodePerformTrustEvaluation(uint32_t object, Img4Record* record,
                                                    Img4PropertyCallback evaluateProperty,
                                                    const Img4TrustProfile* profile, void* context);
IMG4_API DERReturn Img4DecodePerformTrustEvaluatation(uint32_t object, Img4Record* record,
                                                      Img4PropertyCallback evaluateProperty,
                                                      const Img4TrustProfile* profile, void* context);
IMG4_API DERReturn Img4DecodePerformTrustEvaluationWithCallbacks(uint32_t object, Img4Record* record,
                                                                 const Img4TrustCallbacks* callbacks,
                                                                 const Img4TrustProfile* profile, void* context);
IMG4_API DERReturn Img4DecodePerformTrustEvaluatationWithCallbacks(uint32_t object, Img4Record* record,
                                                                   const Img4TrustCallbacks* callbacks,
                                                                   const Img4TrustProfile* profile, void* context);

// The same without an object: steps 7 and 11 are left out. Constraints on the object bind nothing then, unless an
// earlier evaluation has left one in objp.
IMG4_API DERReturn Img4DecodePerformManifestTrustEvaluationWithCallbacks(Img4Record* record,
                                                                         const Img4TrustCallbacks* callbacks,
                                                                         const Img4TrustProfile* profile,
                                                                         void* context);

// Evaluation by parts
//
// The older order of steps, with digests of Img4HashLength octets: the body's digest into manifest.bodyDigest, chain
// and signature, manb and manp, objp, the leaf's constraints, the payload's digest (and payloadHashed), the properties
// of manifest and object, and last the manifest's digest (and manifestHashed).

// Verifies `chain`, the content of the manifest's chain, and with its leaf the `signature` over the Img4HashLength
// octets at `digest`. Gives out the leaf's constraints, or an absent item.
typedef DERReturn (*Img4SignatureWithChainVerifier)(const DERItem* chain, const DERItem* signature,
                                                    const uint8_t* digest, DERItem* certProperties, void* context);

// Checks the manifest and the evaluated object against the leaf's constraints.
typedef DERReturn (*Img4CertificateCheck)(const Img4Record* record);

// With the profile kImg4DecodeSecureBootRsa1kSha1.
IMG4_API DERReturn Img4DecodeEvaluateTrust(uint32_t object, Img4Record* record, Img4PropertyCallback evaluateProperty,
                                           void* context);

// With parts of the caller's, none of which may be null.
IMG4_API DERReturn Img4DecodeEvaluateTrustWithCallbacks(uint32_t object, Img4Record* record,
                                                        Img4PropertyCallback evaluateProperty,
                                                        Img4SignatureWithChainVerifier verify,
                                                        Img4CertificateCheck checkCertificate,
                                                        Img4DigestFunction digest, void* context);

// The parts that Img4DecodeEvaluateTrust consists of; as callbacks they need a function around them that takes the
// context.
IMG4_API DERReturn img4_verify_signature_with_chain(const DERItem* chain, const DERItem* signature,
                                                    const uint8_t* digest, DERItem* certProperties);
IMG4_API DERReturn sha1_digest(const uint8_t* data, uint64_t length, uint8_t* out);

// Properties

// Has every property in manp or objp, which an evaluation has filled, judged by `evaluateProperty`. Properties that are
// absent need no judgement.
IMG4_API DERReturn Img4DecodeEvaluateManifestProperties(const Img4Record* record, Img4PropertyCallback evaluateProperty,
                                                        void* context);
IMG4_API DERReturn Img4DecodeEvaluateObjectProperties(const Img4Record* record, Img4PropertyCallback evaluateProperty,
                                                      void* context);

// The same for `dictionary`, the content of any SET of properties. Returns the first result of the callback that is not
// DERSuccess, DERUnexpectedTag for a value of another type than Img4PropertyValue names and for an element that is no
// property, and otherwise the status of the element that could not be decoded.
IMG4_API DERReturn Img4DecodeEvaluateDictionaryProperties(const DERItem* dictionary, uint32_t selector,
                                                          Img4PropertyCallback evaluateProperty, void* context);

// Constraints
//
// The leaf certificate limits what its key may sign. manifest.certProperties is the whole encoding of a SET of
// properties, whose values are SETs of properties in turn: "MANP" constrains manp, "OBJP" constrains objp (and nothing
// when that is absent or empty), "manx" belongs to measurements and binds nothing here. A constraint binds the property
// with its tag:
//   BOOLEAN, INTEGER, OCTET STRING   the property must be there, with this very value
//   [0] constructed                  the property must be there, with any value
//   [1] constructed                  the property must not be there

// Returns DERDecodeError without certProperties, DERUnexpectedTag when they are no SET, for an element or a constraint
// of another kind, and for a property that must not be there; the status of the search, DEREndOfSequence at most times,
// for a property that should be there; and Img4Failure for a value that is another.
IMG4_API DERReturn Img4DecodeEvaluateCertificateProperties(const Img4Record* record);

// One constraint, or what stands in the place of one.
typedef struct Img4Constraint {
    DERTag dictionary; // the tag of the element of certProperties that it stands in
    DERItem encoding;
    DERTag kind;         // of its value; 0 when it is no constraint
    DERItem found;       // the whole encoding of the property that it binds; absent when there is none
    bool isChecked;      // false when what it binds was not evaluated, or binds nothing here
    Img4Refusal refusal; // Img4FaultNone when it is met
} Img4Constraint;

typedef void (*Img4ConstraintCallback)(const Img4Constraint* constraint, void* context);

// The same check, which hands every constraint to `callback`, goes on behind one that is not met, and returns the first
// failure.
IMG4_API DERReturn Img4DecodeEvaluateCertificatePropertiesExplained(const Img4Record* record,
                                                                    Img4ConstraintCallback callback, void* context);

// Digests

// What implements a digest.
struct Img4DigestImplementation;

typedef struct Img4DigestInfo {
    uint64_t length; // octets; a description with another length than its implementation has is DERParamError
    const DERItem* oid;
    const struct Img4DigestImplementation* implementation;
} Img4DigestInfo;

// FIPS 180-4. The last is longer than a record holds: a profile with it can verify signatures, but not evaluate.
IMG4_API extern const Img4DigestInfo kQDSupportDigestInfoSha1;
IMG4_API extern const Img4DigestInfo kQDSupportDigestInfoSha256;
IMG4_API extern const Img4DigestInfo kQDSupportDigestInfoSha384;
IMG4_API extern const Img4DigestInfo kQDSupportDigestInfoSha512;

#define Img4LongestDigest 64

// Digests `data` with the profile's digest into the `length` octets at `out`. Returns DERBufferOverflow unless that is
// the digest's length, Img4Failure when the digest could not be computed for want of memory; then `out` is all zero.
IMG4_API DERReturn Img4DecodeComputeDigest(const DERItem* data, uint8_t* out, uint64_t length,
                                           const Img4TrustProfile* profile);

// A digest over data that comes in pieces: Init, Update for each piece, Final, ReturnHash. The state needs no
// preparation. After a successful Init there must be one Final, whatever happens in between, since that releases what
// the cryptographic library holds for the state; ReturnHash may follow any number of times. Img4Failure says that
// memory has run out, after which the state has no digest and needs no Final, though one does no harm. DERParamError
// also says that an operation is out of turn.
typedef struct Img4DigestState {
    void* running;       // null unless between Init and Final
    uint64_t hashLength; // of the profile given to Init; the other operations take no profile of another length
    uint8_t hash[Img4LongestDigest];
} Img4DigestState;

IMG4_API DERReturn Img4DecodeDigestInit(Img4DigestState* state, const Img4TrustProfile* profile);
IMG4_API DERReturn Img4DecodeDigestUpdate(Img4DigestState* state, const DERItem* data, const Img4TrustProfile* profile);
IMG4_API DERReturn Img4DecodeDigestFinal(Img4DigestState* state, const Img4TrustProfile* profile);

// Copies the digest to `out`, which holds `length` octets: at least the digest's length, or the result is
// DERBufferOverflow.
IMG4_API DERReturn Img4DecodeDigestReturnHash(const Img4DigestState* state, uint8_t* out, uint64_t length,
                                              const Img4TrustProfile* profile);

// Signatures
//
// Each verifies `signature` over the `length` octets at `digest`, which must be as long as the profile's digest. Any
// failure is Img4Failure.

// RSASSA-PKCS1-v1_5 (RFC 8017 8.2.2) with the DigestInfo of the profile's digest. `key` is an RSAPublicKey. The modulus
// must be odd, have at least 1024 bits, and at most 4096 or 3072; the exponent must be odd, at least 3 and less than
// the modulus; the signature must be as long as the modulus.
IMG4_API DERReturn verify_signature_rsa(const DERItem* key, const DERItem* signature, const uint8_t* digest,
                                        uint64_t length, const Img4TrustProfile* profile);
IMG4_API DERReturn verify_signature_rsa3k(const DERItem* key, const DERItem* signature, const uint8_t* digest,
                                          uint64_t length, const Img4TrustProfile* profile);

// ECDSA (FIPS 186-4 6) on the curve that `key`, a point in uncompressed form (ANSI X9.63), has the length for: P-256 or
// P-384. `signature` is the strict DER of a SEQUENCE of the INTEGERs r and s (RFC 3279 2.2.3) and nothing behind it.
IMG4_API DERReturn verify_signature_ecdsa(const DERItem* key, const DERItem* signature, const uint8_t* digest,
                                          uint64_t length, const Img4TrustProfile* profile);

// Chains
//
// `certChain` holds certificates (RFC 5280) one after the other, from the one that the root has signed to the leaf; the
// root itself is stored in the program. A verifier demands
//   - that the chain has exactly its length, the root included, and that no certificate exceeds 131071 octets;
//   - that every key is of its kind: RSA with absent or NULL parameters, or EC on P-256 or P-384, whichever
//     the profile's own is, an uncompressed point that is as long as its curve's;
//   - of every certificate that its issuer is, octet for octet, the subject of the one before, that it names the
//     profile's signature algorithm, and that the profile's verifySignature accepts its signature under the key before;
//   - that the leaf's list of extensions, when it has one, is not empty.
// It gives out the leaf's key as the signature verifiers take it, and as `certProperties` the SET in the leaf's
// extension oidTevariImg4ManifestCertSpec, absent when there is none. Both are absent after a failure. Neither dates
// nor the other extensions are looked at: a manifest outlives the certificates that it was signed with.

typedef DERReturn Img4ChainVerifier(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                    const Img4TrustProfile* profile);

// Three certificates, RSA. The one in the middle must carry the common name of the domain's secure-boot authority.
IMG4_API Img4ChainVerifier verify_chain_img4_v1;

// Two certificates, RSA.
IMG4_API Img4ChainVerifier verify_chain_img4_v2;
IMG4_API Img4ChainVerifier verify_chain_img4_v2_rsa3k;
IMG4_API Img4ChainVerifier verify_chain_img4_v2_BRX1;
IMG4_API Img4ChainVerifier verify_chain_img4_x86;
IMG4_API Img4ChainVerifier verify_chain_img4_ddi;
IMG4_API Img4ChainVerifier verify_chain_img4_ddi_global;
IMG4_API Img4ChainVerifier verify_chain_img4_ddi_fake;
IMG4_API Img4ChainVerifier verify_chain_img4_ddi_fake_global;
IMG4_API Img4ChainVerifier verify_chain_img4_marda_local_policy;

// Two certificates, EC.
IMG4_API Img4ChainVerifier verify_chain_img4_ecdsa256;
IMG4_API Img4ChainVerifier verify_chain_img4_ecdsa384;

// Three certificates, EC.
IMG4_API Img4ChainVerifier verify_chain_img4_ecdsa384_local_policy;
IMG4_API Img4ChainVerifier verify_chain_img4_ecdsa384_qa;

// Profiles

IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa1kSha1;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa3kSha384;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384BRX1;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384X86;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDI;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDIGlobal;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDIFake;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDIFakeGlobal;
IMG4_API extern const Img4TrustProfile kImg4DecodeLocalPolicyRsa4kSha384;
IMG4_API extern const Img4TrustProfile kImg4DecodeLocalPolicyEc384Sha384;
IMG4_API extern const Img4TrustProfile kImg4DecodeLocalPolicyEc384Sha384QA;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootEc256Sha256;
IMG4_API extern const Img4TrustProfile kImg4DecodeSecureBootEc384Sha384;

// The object identifiers that the profiles are made of, as content octets (RFC 3279, RFC 4055, RFC 5480, RFC 5758).
IMG4_API extern const DERItem oidSha1Rsa;
IMG4_API extern const DERItem oidSha384Rsa;
IMG4_API extern const DERItem oidSha256Ecdsa;
IMG4_API extern const DERItem oidSha384Ecdsa;
IMG4_API extern const DERItem oidRsa;
IMG4_API extern const DERItem oidEcPrime256v1;
IMG4_API extern const DERItem oidAnsip384r1;

// All of them, for programs that list profiles or look one up by its name.
typedef struct Img4TrustProfileEntry {
    const char* name; // that of the object, for instance "kImg4DecodeSecureBootEc384Sha384"
    const Img4TrustProfile* profile;
    // The name of the root, for instance "LOCAL_EC384_SHA384_ROOT_CA_CERTIFICATE"; with ".der" behind it, that of its
    // file in a domain's folder.
    const char* rootName;
    const DERItem* root;  // the one that is built in, an encoded certificate
    uint32_t chainLength; // certificates, the root included
} Img4TrustProfileEntry;
IMG4_API extern const Img4TrustProfileEntry Img4TrustProfiles[];
IMG4_API extern const uint16_t Img4NumTrustProfiles;

// Domains
//
// The roots, the name of the secure-boot authority and the object identifier of the constraints' extension belong to a
// trust domain, one of which is built in. A program can bring another along, without a build of its own: it makes a
// profile of it and hands the `profile` inside to any evaluation.

typedef struct Img4TrustDomain {
    // A whole encoded PrintableString: the common name of the secure-boot authority, for chains of three RSA
    // certificates only.
    DERItem authorityName;
    // Content octets.
    DERItem manifestCertSpecOid;
} Img4TrustDomain;

// The one that is built in. The second is the object identifier in it.
IMG4_API extern const Img4TrustDomain Img4BuiltInTrustDomain;
IMG4_API extern const DERItem oidTevariImg4ManifestCertSpec;

// Why a chain was refused. The word that follows is about the certificate in question.
typedef enum Img4ChainFault {
    Img4ChainSound,
    Img4ChainParameters,         // an argument is missing
    Img4ChainEncoding,           // is no DER, or no certificate
    Img4ChainCertificateSize,    // exceeds 131071 octets
    Img4ChainLength,             // there are more or fewer than the verifier demands
    Img4ChainKey,                // has a key of another kind, curve or form
    Img4ChainIssuer,             // names another issuer than the subject of the one before
    Img4ChainSignatureAlgorithm, // names another signature algorithm, or parameters for it
    Img4ChainSignature,          // has a signature that does not verify
    Img4ChainAuthority,          // has another common name than the secure-boot authority
    Img4ChainExtensions          // has an empty or malformed list of extensions, or constraints that are no SET
} Img4ChainFault;

typedef struct Img4ChainRefusal {
    Img4ChainFault fault;
    uint32_t certificate; // its place in the chain; 0 is the root
} Img4ChainRefusal;

// A profile whose chains end in a root of the caller's. The items are views that the caller keeps alive.
typedef struct Img4DomainProfile {
    Img4TrustProfile profile; // what evaluations take
    Img4TrustDomain domain;
    DERItem root;
    uint32_t chainLength;
    // Optional: where verifyChain says why it refused a chain, or that it did not.
    Img4ChainRefusal* refusal;
} Img4DomainProfile;

// Why a signature was refused.
typedef enum Img4SignatureFault {
    Img4SignatureSound,
    Img4SignatureArguments,  // an argument is missing, or the profile has no such digest
    Img4SignatureKey,        // the key is malformed
    Img4SignatureKeySize,    // the modulus has `found` bits, and `least` to `most` are allowed
    Img4SignatureKeyNumbers, // the modulus is even, or the exponent is even, less than 3 or not less than the modulus
    Img4SignatureForm,       // it is no BIT STRING of whole octets, or no SEQUENCE of two positive INTEGERs that fit
    Img4SignatureLength,     // it has `found` octets, and the modulus has `most`
    Img4SignatureMismatch,   // it was made over something else or with another key, or the key is no point of its
                             // curve, or memory has run out
    Img4SignatureOther       // a verifier of the caller's says so
} Img4SignatureFault;

typedef struct Img4SignatureRefusal {
    Img4SignatureFault fault;
    uint64_t found;
    uint64_t least;
    uint64_t most;
} Img4SignatureRefusal;

// What an evaluation refused.
typedef struct Img4TrustRefusal {
    // The step, its status and the place in the input: for a certificate its start, or the octet of it that is no DER,
    // as `encoding` says then.
    Img4Refusal refusal;
    // Sound unless the chain was refused by a verifier of this library.
    Img4ChainRefusal chain;
    // Of the certificate that the chain was refused for, or of the manifest's signature.
    Img4SignatureRefusal signature;
} Img4TrustRefusal;

// Img4DecodePerformTrustEvaluationWithCallbacks, or without an `object` the evaluation of the manifest alone, and in
// *refusal, which may not be null, what was refused: with Img4FaultNone when nothing was.
IMG4_API DERReturn Img4DecodePerformTrustEvaluationExplained(const uint32_t* object, Img4Record* record,
                                                             const Img4TrustCallbacks* callbacks,
                                                             const Img4TrustProfile* profile, void* context,
                                                             Img4TrustRefusal* refusal);

// Makes *out the profile of `entry` with the root and the domain given. To learn why a chain is refused under a
// built-in profile, give entry->root and Img4BuiltInTrustDomain, and set out->refusal.
IMG4_API DERReturn Img4DecodeMakeDomainProfile(const Img4TrustProfileEntry* entry, const DERItem* root,
                                               const Img4TrustDomain* domain, Img4DomainProfile* out);

#ifdef __cplusplus
}
#endif

#endif
