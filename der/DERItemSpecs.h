// Item-spec tables of the X.509 structures (RFC 5280) and of the PKCS #1 public key (RFC 8017), for
// DERParseSequenceToObject and its kin.
//
// Each table comes with its number of rows and with the record that it fills: row k fills the k-th item of the record.
// The items view content octets, except where a field is said to hold the whole encoding. Fields of optional items are
// absent when the structure leaves them out and the record was zeroed.
#ifndef VELTRA_DER_ITEM_SPECS_H
#define VELTRA_DER_ITEM_SPECS_H

#include "der/DERTypes.h"

#ifdef __cplusplus
extern "C" {
#endif

// Certificate and CertificateList (RFC 5280 4.1, 5.1).
typedef struct DERSignedCertCrl {
    // The to-be-signed part as a whole encoding, which is what the signature covers.
    DERItem tbs;
    DERItem signatureAlgorithm;
    DERItem signature;
} DERSignedCertCrl;
DER_API extern const DERItemSpec DERSignedCertCrlItemSpecs[];
DER_API extern const uint16_t DERNumSignedCertCrlItemSpecs;

// TBSCertificate (RFC 5280 4.1).
typedef struct DERTBSCert {
    // Optional. The content of the [0] wrapper: an encoded INTEGER.
    DERItem version;
    DERItem serialNumber;
    DERItem signatureAlgorithm;
    DERItem issuer;
    DERItem validity;
    DERItem subject;
    DERItem subjectPublicKeyInfo;
    // Optional.
    DERItem issuerUniqueID;
    // Optional.
    DERItem subjectUniqueID;
    // Optional. The content of the [3] wrapper: an encoded SEQUENCE OF Extension.
    DERItem extensions;
} DERTBSCert;
DER_API extern const DERItemSpec DERTBSCertItemSpecs[];
DER_API extern const uint16_t DERNumTBSCertItemSpecs;

// SubjectPublicKeyInfo (RFC 5280 4.1).
typedef struct DERSubjPubKeyInfo {
    DERItem algorithm;
    // The content of the BIT STRING, for DERParseBitString.
    DERItem publicKey;
} DERSubjPubKeyInfo;
DER_API extern const DERItemSpec DERSubjPubKeyInfoItemSpecs[];
DER_API extern const uint16_t DERNumSubjPubKeyInfoItemSpecs;

// AlgorithmIdentifier (RFC 5280 4.1.1.2).
typedef struct DERAlgorithmId {
    DERItem algorithm;
    // Optional, of any type: the whole encoding.
    DERItem parameters;
} DERAlgorithmId;
DER_API extern const DERItemSpec DERAlgorithmIdItemSpecs[];
DER_API extern const uint16_t DERNumAlgorithmIdItemSpecs;

// AttributeTypeAndValue (RFC 5280 4.1.2.4).
typedef struct DERAttributeTypeAndValue {
    DERItem type;
    // Of any type: the whole encoding.
    DERItem value;
} DERAttributeTypeAndValue;
DER_API extern const DERItemSpec DERAttributeTypeAndValueItemSpecs[];
DER_API extern const uint16_t DERNumAttributeTypeAndValueItemSpecs;

// Extension (RFC 5280 4.1).
typedef struct DERExtension {
    DERItem extensionID;
    // Optional, for DERParseBooleanWithDefault with the default false.
    DERItem critical;
    DERItem value;
} DERExtension;
DER_API extern const DERItemSpec DERExtensionItemSpecs[];
DER_API extern const uint16_t DERNumExtensionItemSpecs;

// RSAPublicKey (RFC 8017 A.1.1). Encoding keeps both numbers non-negative.
typedef struct DERRSAPubKeyPKCS1 {
    DERItem modulus;
    DERItem publicExponent;
} DERRSAPubKeyPKCS1;
DER_API extern const DERItemSpec DERRSAPubKeyPKCS1ItemSpecs[];
DER_API extern const uint16_t DERNumRSAPubKeyPKCS1ItemSpecs;

#ifdef __cplusplus
}
#endif

#endif
