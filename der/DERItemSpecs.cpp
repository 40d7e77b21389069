#include "der/DERItemSpecs.h"

#include <cstddef>

namespace {

constexpr uint16_t required = 0;

template <typename Table>
constexpr uint16_t rowsOf(const Table& table) {
    return static_cast<uint16_t>(sizeof table / sizeof table[0]);
}

} // namespace

const DERItemSpec DERSignedCertCrlItemSpecs[] = {
    {offsetof(DERSignedCertCrl, tbs), DERTagSequence, DEROptionSaveDER},
    {offsetof(DERSignedCertCrl, signatureAlgorithm), DERTagSequence, required},
    {offsetof(DERSignedCertCrl, signature), DERTagBitString, required},
};
const uint16_t DERNumSignedCertCrlItemSpecs = rowsOf(DERSignedCertCrlItemSpecs);

const DERItemSpec DERTBSCertItemSpecs[] = {
    {offsetof(DERTBSCert, version), DERTagContextConstructed(0), DEROptionOptional},
    {offsetof(DERTBSCert, serialNumber), DERTagInteger, required},
    {offsetof(DERTBSCert, signatureAlgorithm), DERTagSequence, required},
    {offsetof(DERTBSCert, issuer), DERTagSequence, required},
    {offsetof(DERTBSCert, validity), DERTagSequence, required},
    {offsetof(DERTBSCert, subject), DERTagSequence, required},
    {offsetof(DERTBSCert, subjectPublicKeyInfo), DERTagSequence, required},
    {offsetof(DERTBSCert, issuerUniqueID), DERTagContextPrimitive(1), DEROptionOptional},
    {offsetof(DERTBSCert, subjectUniqueID), DERTagContextPrimitive(2), DEROptionOptional},
    {offsetof(DERTBSCert, extensions), DERTagContextConstructed(3), DEROptionOptional},
};
const uint16_t DERNumTBSCertItemSpecs = rowsOf(DERTBSCertItemSpecs);

const DERItemSpec DERSubjPubKeyInfoItemSpecs[] = {
    {offsetof(DERSubjPubKeyInfo, algorithm), DERTagSequence, required},
    {offsetof(DERSubjPubKeyInfo, publicKey), DERTagBitString, required},
};
const uint16_t DERNumSubjPubKeyInfoItemSpecs = rowsOf(DERSubjPubKeyInfoItemSpecs);

const DERItemSpec DERAlgorithmIdItemSpecs[] = {
    {offsetof(DERAlgorithmId, algorithm), DERTagObjectIdentifier, required},
    {offsetof(DERAlgorithmId, parameters), 0, DEROptionOptional | DEROptionAnyTag | DEROptionSaveDER},
};
const uint16_t DERNumAlgorithmIdItemSpecs = rowsOf(DERAlgorithmIdItemSpecs);

const DERItemSpec DERAttributeTypeAndValueItemSpecs[] = {
    {offsetof(DERAttributeTypeAndValue, type), DERTagObjectIdentifier, required},
    {offsetof(DERAttributeTypeAndValue, value), 0, DEROptionAnyTag | DEROptionSaveDER},
};
const uint16_t DERNumAttributeTypeAndValueItemSpecs = rowsOf(DERAttributeTypeAndValueItemSpecs);

const DERItemSpec DERExtensionItemSpecs[] = {
    {offsetof(DERExtension, extensionID), DERTagObjectIdentifier, required},
    {offsetof(DERExtension, critical), DERTagBoolean, DEROptionOptional},
    {offsetof(DERExtension, value), DERTagOctetString, required},
};
const uint16_t DERNumExtensionItemSpecs = rowsOf(DERExtensionItemSpecs);

const DERItemSpec DERRSAPubKeyPKCS1ItemSpecs[] = {
    {offsetof(DERRSAPubKeyPKCS1, modulus), DERTagInteger, DEROptionSignedInteger},
    {offsetof(DERRSAPubKeyPKCS1, publicExponent), DERTagInteger, DEROptionSignedInteger},
};
const uint16_t DERNumRSAPubKeyPKCS1ItemSpecs = rowsOf(DERRSAPubKeyPKCS1ItemSpecs);
