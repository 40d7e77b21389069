// Any octets as a manifest or container whose trust is evaluated, with verifiers that accept every signature, so that
// the whole of a chain and everything behind it is read. Every view that comes out must lie inside the input, and what
// the real verifiers accept must pass with these too.
#include <cstring>

#include "fuzz/Fuzz.h"
#include "img4/Img4Trust.h"

namespace {

bool isIn(const DERItem& input, const DERItem& view) {
    return view.length == 0 || fuzz::isInside(view, input);
}

DERReturn acceptSignature(const DERItem* key, const DERItem* signature, const std::uint8_t* digest,
                          std::uint64_t length, const Img4TrustProfile* profile) {
    FUZZ_REQUIRE(key && signature && digest && length == profile->digestInfo->length);
    return DERSuccess;
}

DERReturn checkProperty(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    FUZZ_REQUIRE(isIn(*static_cast<const DERItem*>(context), value->content));
    FUZZ_REQUIRE(selector <= Img4SelectorObject && (tag >> 61) == 7); // private, constructed
    return DERSuccess;
}

bool initialise(const DERItem& input, Img4Record* record) {
    return Img4DecodeInit(input.data, input.length, record) == DERSuccess ||
           Img4DecodeInitManifest(input.data, input.length, record) == DERSuccess;
}

void evaluate(const DERItem& input, const Img4TrustProfileEntry& entry) {
    Img4DomainProfile accepting;
    Img4ChainRefusal refusal = {};
    FUZZ_REQUIRE(Img4DecodeMakeDomainProfile(&entry, entry.root, &Img4BuiltInTrustDomain, &accepting) == DERSuccess);
    accepting.profile.verifySignature = acceptSignature;
    accepting.refusal = &refusal;

    Img4Record record;
    FUZZ_REQUIRE(initialise(input, &record));
    DERItem key;
    DERItem properties;
    const DERReturn chain =
        accepting.profile.verifyChain(&record.manifest.certChain, &key, &properties, &accepting.profile);
    FUZZ_REQUIRE((chain == DERSuccess) == (refusal.fault == Img4ChainSound));
    FUZZ_REQUIRE(isIn(input, key) && isIn(input, properties));
    FUZZ_REQUIRE(chain == DERSuccess ? key.length != 0 : key.length == 0 && properties.length == 0);

    void* const context = const_cast<DERItem*>(&input);
    const std::uint32_t object = Img4FourCC('s', 'e', 'p', 'i');
    const DERReturn status =
        Img4DecodePerformTrustEvaluation(object, &record, checkProperty, &accepting.profile, context);
    FUZZ_REQUIRE(record.manifestHashed == 1);
    FUZZ_REQUIRE(status != DERSuccess || chain == DERSuccess);
    for (const DERItem& view : {record.manb, record.manp, record.objp, record.manifest.certProperties})
        FUZZ_REQUIRE(isIn(input, view));

    Img4Record strict;
    FUZZ_REQUIRE(initialise(input, &strict));
    if (Img4DecodePerformTrustEvaluation(object, &strict, checkProperty, entry.profile, context) == DERSuccess)
        FUZZ_REQUIRE(status == DERSuccess &&
                     std::memcmp(record.manifest.digest, strict.manifest.digest, sizeof strict.manifest.digest) == 0);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const DERItem input = fuzz::viewOf(data, size);
    Img4Record record;
    if (!initialise(input, &record) || record.manifestRaw.data == nullptr)
        return 0;
    // One of each kind of chain: three and two certificates, RSA and EC.
    const Img4TrustProfile* const kinds[] = {&kImg4DecodeSecureBootRsa1kSha1, &kImg4DecodeSecureBootRsa3kSha384,
                                             &kImg4DecodeLocalPolicyEc384Sha384, &kImg4DecodeSecureBootEc256Sha256};
    for (std::uint16_t i = 0; i < Img4NumTrustProfiles; ++i)
        for (const Img4TrustProfile* kind : kinds)
            if (Img4TrustProfiles[i].profile == kind)
                evaluate(input, Img4TrustProfiles[i]);
    return 0;
}
