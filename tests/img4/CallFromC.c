/* The header compiles as C11, and the shared library serves a C program. */
#include <stdio.h>

#include "img4/Img4Trust.h"

/* A manifest with the object "sepi", which carries "eksp" with the value true. */
static const uint8_t manifest[] = {
    0x30, 0x55, 0x16, 0x04, 0x49, 0x4D, 0x34, 0x4D, 0x02, 0x01, 0x00, 0x31, 0x45, 0xFF, 0x84, 0xEA, 0x85, 0x9C,
    0x42, 0x3E, 0x30, 0x3C, 0x16, 0x04, 0x4D, 0x41, 0x4E, 0x42, 0x31, 0x34, 0xFF, 0x84, 0xEA, 0x85, 0x9C, 0x50,
    0x0A, 0x30, 0x08, 0x16, 0x04, 0x4D, 0x41, 0x4E, 0x50, 0x31, 0x00, 0xFF, 0x87, 0x9B, 0x95, 0xE0, 0x69, 0x1C,
    0x30, 0x1A, 0x16, 0x04, 0x73, 0x65, 0x70, 0x69, 0x31, 0x12, 0xFF, 0x86, 0xAB, 0xAD, 0xE6, 0x70, 0x0B, 0x30,
    0x09, 0x16, 0x04, 0x65, 0x6B, 0x73, 0x70, 0x01, 0x01, 0xFF, 0x04, 0x01, 0x01, 0x30, 0x00};

static int check(bool good, const char* what) {
    if (!good)
        (void)fprintf(stderr, "failed: %s\n", what);
    return good ? 0 : 1;
}

static DERReturn sumOctets(const uint8_t* data, uint64_t length, uint8_t* out, void* context) {
    uint32_t* sum = context;
    for (uint64_t i = 0; i < length; ++i)
        *sum += data[i];
    for (int i = 0; i < Img4HashLength; ++i)
        out[i] = (uint8_t)*sum;
    return DERSuccess;
}

static DERReturn countProperties(DERTag tag, const Img4PropertyValue* value, uint32_t selector, void* context) {
    unsigned* count = context;
    *count += tag != 0 && value->tag == DERTagBoolean && selector == Img4SelectorObject;
    return DERSuccess;
}

int main(void) {
    const uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
    const uint32_t eksp = Img4FourCC('e', 'k', 's', 'p');
    Img4Record record;
    Img4DomainProfile domainProfile;
    Img4ChainRefusal refusal = {Img4ChainSound, 0};
    bool entitled = false;
    unsigned count = 0;
    uint32_t sum = 0;
    uint8_t hash[Img4HashLength];
    int failures = 0;
    failures += check(Img4DecodeInitManifest(manifest, sizeof manifest, &record) == DERSuccess, "initialisation");
    failures += check(Img4DecodeGetObjectPropertyBoolean(&record, sepi, eksp, &entitled) == DERSuccess && entitled,
                      "entitlement");
    failures += check(
        Img4DecodeCopyManifestHashWithCallback(&record, hash, sizeof hash, sumOctets, &sum) == DERSuccess && sum != 0,
        "callback");
    failures += check(Img4DecodeMakeDomainProfile(&Img4TrustProfiles[0], Img4TrustProfiles[0].root,
                                                  &Img4BuiltInTrustDomain, &domainProfile) == DERSuccess,
                      "domain profile");
    domainProfile.refusal = &refusal;
    failures += check(Img4DecodePerformTrustEvaluation(sepi, &record, countProperties, &domainProfile.profile,
                                                       &count) == Img4Failure &&
                          refusal.fault == Img4ChainLength && count == 0,
                      "refusal");
    return failures == 0 ? 0 : 1;
}
