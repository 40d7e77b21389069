#include "tests/img4/TrustDomain.h"

#include "platform/Crypto.h"

#include <algorithm>
#include <functional>
#include <ostream>
#include <tuple>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

const std::uint32_t objectCode = fourCC(standardObject);

Bytes bytesOf(const DERItem& item) {
    return {item.data, item.data + item.length};
}

Bytes digestBy(const Img4TrustProfile& profile, const DERItem& data) {
    Bytes digest(profile.digestInfo->length);
    EXPECT_EQ(Img4DecodeComputeDigest(&data, digest.data(), digest.size(), &profile), DERSuccess);
    return digest;
}

// A property as a callback saw it.
struct Seen {
    DERTag tag;
    DERTag valueTag;
    Bytes value;
    std::uint32_t selector;

    bool operator==(const Seen& other) const = default;
};

void PrintTo(const Seen& seen, std::ostream* out) {
    *out << std::hex << seen.tag << " of " << seen.valueTag << " with selector " << seen.selector;
}

// Callbacks that note their calls. The one after `refuseAfter` properties is answered with `answer`.
struct Judge {
    std::vector<Seen> seen;
    std::size_t refuseAfter = SIZE_MAX;
    DERReturn answer = static_cast<DERReturn>(0x1234);
    Bytes trustedDigest; // none when empty
    int lookups = 0;
    DERReturn objectAnswer = DERSuccess;
    Bytes objectFound;
    std::vector<std::tuple<Bytes, DERTag, DERTag>> searches;
};

DERReturn judge(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    Judge& self = *static_cast<Judge*>(context);
    self.seen.push_back({tag, value->tag, bytesOf(value->content), selector});
    return self.seen.size() > self.refuseAfter ? self.answer : DERSuccess;
}

const std::uint8_t* lookUp(const Img4Record* record, void* context) {
    Judge& self = *static_cast<Judge*>(context);
    ++self.lookups;
    EXPECT_EQ(record->manifestHashed, 1) << "the record has its digest by then";
    return self.trustedDigest.empty() ? nullptr : self.trustedDigest.data();
}

DERReturn findObject(const DERItem* manb, DERTag tag, DERTag valueType, Img4Property* property, void* context) {
    Judge& self = *static_cast<Judge*>(context);
    self.searches.emplace_back(bytesOf(*manb), tag, valueType);
    property->value = viewOf(self.objectFound);
    return self.objectAnswer;
}

const std::vector<Seen> seenInManifest = {
    {propertyTag("ABCD"), DERTagInteger, {7}, Img4SelectorManifest},
    {propertyTag("BOOL"), DERTagBoolean, {0xFF}, Img4SelectorManifest},
    {propertyTag("DATA"), DERTagOctetString, filler(32), Img4SelectorManifest},
    {propertyTag("TEXT"), DERTagIA5String, {'t', 'e', 'x', 't'}, Img4SelectorManifest},
};

std::vector<Seen> seenInAll() {
    std::vector<Seen> seen = seenInManifest;
    seen.push_back({propertyTag("EFGH"), DERTagOctetString, filler(48, 2), Img4SelectorObject});
    seen.push_back({propertyTag("FLAG"), DERTagBoolean, {0x00}, Img4SelectorObject});
    seen.push_back({propertyTag("COUN"), DERTagInteger, {0x01, 0x2C}, Img4SelectorObject});
    return seen;
}

// A container with a payload, decoded.
struct Decoded {
    Bytes bytes;
    Img4Record record = {};

    explicit Decoded(const Bytes& manifest) : bytes(container(payload({}), manifest, {})) {
        EXPECT_EQ(Img4DecodeInit(bytes.data(), bytes.size(), &record), DERSuccess);
    }
};

const Img4TrustProfileEntry& fastEntry() {
    return entryOf(kImg4DecodeSecureBootEc256Sha256);
}

Bytes soundManifest(const Img4TrustProfileEntry& entry = fastEntry()) {
    const Signer& signer = signerOf(entry);
    return signer.manifest(standardManifest(), signer.standardChain());
}

using Evaluation = std::function<DERReturn(Img4Record*, const Img4TrustProfile&, Judge*)>;

struct EntryPoint {
    const char* name;
    bool withObject;
    Evaluation evaluate;
};

const EntryPoint entryPoints[] = {
    {"Img4DecodePerformTrustEvaluation", true,
     [](Img4Record* record, const Img4TrustProfile& profile, Judge* context) {
         return Img4DecodePerformTrustEvaluation(objectCode, record, judge, &profile, context);
     }},
    {"Img4DecodePerformTrustEvaluatation", true,
     [](Img4Record* record, const Img4TrustProfile& profile, Judge* context) {
         return Img4DecodePerformTrustEvaluatation(objectCode, record, judge, &profile, context);
     }},
    {"Img4DecodePerformTrustEvaluationWithCallbacks", true,
     [](Img4Record* record, const Img4TrustProfile& profile, Judge* context) {
         const Img4TrustCallbacks callbacks = {judge, nullptr, nullptr};
         return Img4DecodePerformTrustEvaluationWithCallbacks(objectCode, record, &callbacks, &profile, context);
     }},
    {"Img4DecodePerformTrustEvaluatationWithCallbacks", true,
     [](Img4Record* record, const Img4TrustProfile& profile, Judge* context) {
         const Img4TrustCallbacks callbacks = {judge, nullptr, nullptr};
         return Img4DecodePerformTrustEvaluatationWithCallbacks(objectCode, record, &callbacks, &profile, context);
     }},
    {"Img4DecodePerformManifestTrustEvaluationWithCallbacks", false,
     [](Img4Record* record, const Img4TrustProfile& profile, Judge* context) {
         const Img4TrustCallbacks callbacks = {judge, nullptr, nullptr};
         return Img4DecodePerformManifestTrustEvaluationWithCallbacks(record, &callbacks, &profile, context);
     }},
};

TEST(Img4Trust, acceptsASoundManifestOfEveryProfileAtEveryEntryPoint) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        const Bytes manifest = soundManifest(entry);
        for (const EntryPoint& entryPoint : entryPoints) {
            SCOPED_TRACE(std::string(entry.name) + ", " + entryPoint.name);
            Decoded decoded(manifest);
            Img4Record& record = decoded.record;
            Judge context;
            EXPECT_EQ(entryPoint.evaluate(&record, *entry.profile, &context), DERSuccess);
            EXPECT_EQ(context.seen, entryPoint.withObject ? seenInAll() : seenInManifest);
            EXPECT_EQ(record.objp.data != nullptr, entryPoint.withObject);
            EXPECT_EQ(record.manifestHashed, 1);
            EXPECT_EQ(record.payloadHashed, 1);
            const std::uint64_t length = entry.profile->digestInfo->length;
            const auto prefix = [length](const std::uint8_t* digest) { return Bytes(digest, digest + length); };
            EXPECT_EQ(prefix(record.manifest.digest), digestBy(*entry.profile, record.manifestRaw));
            EXPECT_EQ(prefix(record.manifest.bodyDigest), digestBy(*entry.profile, record.manifest.body));
            EXPECT_EQ(prefix(record.payload.digest), digestBy(*entry.profile, record.payloadRaw));
        }
    }
}

// Changes to a manifest that its signature must not survive.
struct Forgery {
    const char* name;
    std::function<Bytes(const Signer&)> make;
};

Bytes replaceFirst(Bytes bytes, std::string_view from, char to) {
    *std::search(bytes.begin(), bytes.end(), from.begin(), from.end()) = static_cast<std::uint8_t>(to);
    return bytes;
}

Manifest withSignature(const Signer& signer, const std::function<void(Bytes&)>& change) {
    Manifest fields = standardManifest();
    Img4Record record;
    const Bytes sound = signer.manifest(fields, signer.standardChain());
    EXPECT_EQ(Img4DecodeInitManifest(sound.data(), sound.size(), &record), DERSuccess);
    fields.signature = bytesOf(record.manifest.signature);
    fields.certChain = join(signer.standardChain());
    change(fields.signature);
    return fields;
}

const Forgery forgeries[] = {
    {"octet of the body changed",
     [](const Signer& s) { return replaceFirst(s.manifest(standardManifest(), s.standardChain()), "text", 'T'); }},
    {"octet of the signature changed",
     [](const Signer& s) { return manifest(withSignature(s, [](Bytes& signature) { signature.back() ^= 1; })); }},
    {"octet behind the signature",
     [](const Signer& s) { return manifest(withSignature(s, [](Bytes& signature) { signature.push_back(0); })); }},
    {"no signature",
     [](const Signer& s) { return manifest(withSignature(s, [](Bytes& signature) { signature.clear(); })); }},
    {"signed by the issuer",
     [](const Signer& s) { return s.manifest(standardManifest(), s.standardChain(), s.issuerKey()); }},
    {"signature of the inside of the body",
     [](const Signer& s) {
         Manifest fields = standardManifest();
         fields.certChain = join(s.standardChain());
         Bytes body = manifestBody(fields);
         body[0] = 0x30;
         fields.signature = sign(s.leafKey(), 48, body);
         return manifest(fields);
     }},
    {"leaf's key changed in its last octet, which takes a point off its curve",
     [](const Signer& s) {
         Certificate leaf = s.leaf();
         leaf.publicKeyInfo.back() ^= 1;
         return s.manifest(standardManifest(), s.chainWith(s.issue(leaf)));
     }},
    {"no chain", [](const Signer& s) { return s.manifest(standardManifest(), {}); }},
    {"leaf's key exceeds what the verifier allows",
     [](const Signer& s) {
         static const Key rsa = makeMultiPrimeRSAKey(4104);
         static const Key ec = makeECKey("P-521");
         const Key& key = EVP_PKEY_is_a(s.leafKey().get(), "EC") == 1 ? ec : rsa;
         Certificate leaf = s.leaf();
         leaf.publicKeyInfo = publicKeyInfo(key);
         return s.manifest(standardManifest(), s.chainWith(s.issue(leaf)), key);
     }},
};

TEST(Img4Trust, refusesForgeriesUnderEveryProfile) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        for (const Forgery& row : forgeries) {
            SCOPED_TRACE(std::string(entry.name) + ", " + row.name);
            Decoded decoded(row.make(signerOf(entry)));
            Judge context;
            EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, entry.profile, &context),
                      Img4Failure);
            EXPECT_TRUE(context.seen.empty());
            EXPECT_EQ(decoded.record.manifestHashed, 1);
            EXPECT_EQ(decoded.record.payloadHashed, 0);
            EXPECT_EQ(decoded.record.manb.data, nullptr);
        }
    }
}

TEST(Img4Trust, refusesAKeyBeyond3072BitsWhereTheProfileSaysSo) {
    const Img4TrustProfileEntry& entry = entryOf(kImg4DecodeSecureBootRsa3kSha384);
    const Signer& signer = signerOf(entry);
    for (const unsigned bits : {3072U, 3080U}) {
        const Key key = makeMultiPrimeRSAKey(bits);
        Certificate leaf = signer.leaf();
        leaf.publicKeyInfo = publicKeyInfo(key);
        Decoded decoded(signer.manifest(standardManifest(), signer.chainWith(signer.issue(leaf)), key));
        Judge context;
        EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, entry.profile, &context),
                  bits == 3072 ? DERSuccess : Img4Failure);
    }
}

// A profile whose operations can be told to fail, and that says which of them were called.
struct ScriptedProfile {
    Img4TrustProfile profile = *fastEntry().profile;
    std::string failing; // the call, counted by name
    std::string calls;

    ScriptedProfile() {
        profile.computeDigest = [](const DERItem* data, std::uint8_t* out, std::uint64_t length,
                                   const Img4TrustProfile* self) {
            std::memset(out, 0x55, length); // as one that fails half-way
            return of(self).answer("digest", [&] { return Img4DecodeComputeDigest(data, out, length, self); });
        };
        profile.verifyChain = [](const DERItem* chain, DERItem* leafKey, DERItem* properties,
                                 const Img4TrustProfile* self) {
            Img4TrustProfile plain = *self;
            plain.computeDigest = Img4DecodeComputeDigest;
            plain.verifySignature = verify_signature_ecdsa;
            return of(self).answer("chain",
                                   [&] { return verify_chain_img4_ecdsa256(chain, leafKey, properties, &plain); });
        };
        profile.verifySignature = [](const DERItem* key, const DERItem* signature, const std::uint8_t* digest,
                                     std::uint64_t length, const Img4TrustProfile* self) {
            return of(self).answer("signature",
                                   [&] { return verify_signature_ecdsa(key, signature, digest, length, self); });
        };
    }

    static ScriptedProfile& of(const Img4TrustProfile* self) {
        return *const_cast<ScriptedProfile*>(reinterpret_cast<const ScriptedProfile*>(self));
    }

    DERReturn answer(const std::string& call, const std::function<DERReturn()>& real) {
        calls += call + " ";
        return calls == failing ? static_cast<DERReturn>(0x77) : real();
    }
};

// Where an evaluation ends when one operation after the other fails, and what it leaves in the record.
struct Stop {
    const char* failing;
    std::uint8_t manifestHashed;
    bool certProperties;
    bool bodyDigest;
    bool dictionaries;
    std::uint8_t payloadHashed;
};

const Stop stops[] = {
    {"digest ", 0, false, false, false, 0},
    {"digest chain ", 1, false, false, false, 0},
    {"digest chain digest ", 1, true, false, false, 0},
    {"digest chain digest signature ", 1, true, true, false, 0},
    {"digest chain digest signature digest ", 1, true, true, true, 0},
    {"", 1, true, true, true, 1},
};

TEST(Img4Trust, stopsAtTheFirstStepThatFails) {
    const Bytes manifest = soundManifest();
    Img4Record bare;
    ASSERT_EQ(Img4DecodeInitManifest(manifest.data(), manifest.size(), &bare), DERSuccess);
    const Bytes manifestDigest = digestBy(*fastEntry().profile, bare.manifestRaw);
    const Bytes bodyDigest = digestBy(*fastEntry().profile, bare.manifest.body);
    for (const Stop& row : stops) {
        SCOPED_TRACE(row.failing);
        Decoded decoded(manifest);
        const Img4Record& record = decoded.record;
        ScriptedProfile scripted;
        scripted.failing = row.failing;
        Judge context;
        const bool succeeds = scripted.failing.empty();
        EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, &scripted.profile, &context),
                  succeeds ? DERSuccess : static_cast<DERReturn>(0x77));
        if (!succeeds) {
            EXPECT_EQ(scripted.calls, scripted.failing);
        }
        EXPECT_EQ(record.manifestHashed, row.manifestHashed);
        // What was computed before the failure stays.
        EXPECT_EQ(std::memcmp(record.manifest.digest, manifestDigest.data(), manifestDigest.size()) == 0,
                  row.manifestHashed != 0);
        EXPECT_EQ(std::memcmp(record.manifest.bodyDigest, bodyDigest.data(), bodyDigest.size()) == 0, row.bodyDigest);
        EXPECT_EQ(record.manifest.certProperties.data != nullptr, row.certProperties);
        EXPECT_EQ(record.manb.data != nullptr, row.dictionaries);
        EXPECT_EQ(record.objp.data != nullptr, row.dictionaries);
        EXPECT_EQ(record.payloadHashed, row.payloadHashed);
        EXPECT_EQ(context.seen.empty(), !succeeds);
    }
}

TEST(Img4Trust, keepsWhatItHasWhenADigestFailsToBeComputedAgain) {
    for (const char* failing : {"digest ", "digest chain digest ", "digest chain digest signature digest "}) {
        Decoded decoded(soundManifest());
        Judge context;
        ASSERT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, fastEntry().profile, &context),
                  DERSuccess);
        Img4Record before;
        std::memcpy(&before, &decoded.record, sizeof before);
        ScriptedProfile scripted;
        scripted.failing = failing;
        EXPECT_NE(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, &scripted.profile, &context),
                  DERSuccess);
        EXPECT_EQ(std::memcmp(&before, &decoded.record, sizeof before), 0) << failing;
    }
}

TEST(Img4Trust, endsWithTheResultOfTheCallbackThatRefuses) {
    const Bytes manifest = soundManifest();
    for (std::size_t accepted = 0; accepted < seenInAll().size(); ++accepted) {
        Decoded decoded(manifest);
        Judge context;
        context.refuseAfter = accepted;
        EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, fastEntry().profile, &context),
                  context.answer);
        EXPECT_EQ(context.seen.size(), accepted + 1);
        EXPECT_EQ(decoded.record.payloadHashed, 1);
    }
}

TEST(Img4Trust, evaluatesManifestsWithoutPayloadOrObject) {
    const Signer& signer = signerOf(fastEntry());
    const Bytes bare = soundManifest();
    Img4Record record;
    Judge context;
    ASSERT_EQ(Img4DecodeInitManifest(bare.data(), bare.size(), &record), DERSuccess);
    EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &record, judge, fastEntry().profile, &context), DERSuccess);
    EXPECT_EQ(record.payloadHashed, 0);

    Decoded decoded(bare);
    EXPECT_EQ(Img4DecodePerformTrustEvaluation(fourCC("none"), &decoded.record, judge, fastEntry().profile, &context),
              DEREndOfSequence);
    EXPECT_NE(decoded.record.manb.data, nullptr);
    EXPECT_EQ(decoded.record.objp.data, nullptr);
    EXPECT_EQ(decoded.record.manifestHashed, 1);
    EXPECT_EQ(decoded.record.payloadHashed, 0);

    // A version-2 manifest that holds its objects in a SET has a sound signature and no dictionaries.
    Manifest second = standardManifest();
    second.version = 2;
    Bytes body = signer.manifest(second, signer.standardChain());
    ASSERT_EQ(Img4DecodeInitManifest(body.data(), body.size(), &record), DERSuccess);
    EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &record, judge, fastEntry().profile, &context), DERSuccess);
    const Bytes first = soundManifest();
    Bytes mixed = first;
    constexpr char magic[] = {'I', 'M', '4', 'M'};
    const auto found = std::search(mixed.begin(), mixed.end(), std::begin(magic), std::end(magic));
    mixed[static_cast<std::size_t>(found - mixed.begin()) + 6] = 2;
    ASSERT_EQ(Img4DecodeInitManifest(mixed.data(), mixed.size(), &record), DERSuccess);
    EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &record, judge, fastEntry().profile, &context),
              DERUnexpectedTag);
}

TEST(Img4Trust, aManifestWithoutConstraintsIsRefusedByTheCheckOfConstraints) {
    const Signer& signer = signerOf(fastEntry());
    Certificate leaf = signer.leaf();
    leaf.extensions = {};
    Decoded decoded(signer.manifest(standardManifest(), signer.chainWith(signer.issue(leaf))));
    Judge context;
    EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, fastEntry().profile, &context),
              DERDecodeError);
    EXPECT_NE(decoded.record.objp.data, nullptr);
    EXPECT_EQ(decoded.record.payloadHashed, 0);
    EXPECT_TRUE(context.seen.empty());
}

TEST(Img4Trust, aTrustedDigestStandsInForTheSignatureAndTheConstraints) {
    const Img4TrustCallbacks callbacks = {judge, lookUp, nullptr};
    Manifest fields = standardManifest();
    fields.signature = {1};
    fields.certChain = {};
    const Bytes unsound = manifest(fields);
    const DERItem view = viewOf(unsound);

    Decoded trusted(unsound);
    Judge context;
    context.trustedDigest = digestBy(*fastEntry().profile, view);
    EXPECT_EQ(Img4DecodePerformTrustEvaluationWithCallbacks(objectCode, &trusted.record, &callbacks,
                                                            fastEntry().profile, &context),
              DERSuccess);
    EXPECT_EQ(context.lookups, 1);
    EXPECT_EQ(context.seen, seenInAll());
    EXPECT_EQ(trusted.record.manifestHashed, 1);
    EXPECT_EQ(trusted.record.payloadHashed, 1);

    for (const bool any : {false, true}) {
        Decoded unknown(unsound);
        Judge other;
        if (any) {
            other.trustedDigest = context.trustedDigest;
            other.trustedDigest.back() ^= 1;
        }
        EXPECT_EQ(Img4DecodePerformTrustEvaluationWithCallbacks(objectCode, &unknown.record, &callbacks,
                                                                fastEntry().profile, &other),
                  Img4Failure);
        EXPECT_EQ(other.lookups, 1);
        EXPECT_TRUE(other.seen.empty());
    }
}

TEST(Img4Trust, anObjectFoundByTheCallerReplacesTheSearch) {
    const Img4TrustCallbacks callbacks = {judge, nullptr, findObject};
    const Bytes manifest = soundManifest();
    Decoded decoded(manifest);
    Judge context;
    context.objectFound = join({property("EFGH", integer(1))});
    EXPECT_EQ(Img4DecodePerformTrustEvaluationWithCallbacks(fourCC("none"), &decoded.record, &callbacks,
                                                            fastEntry().profile, &context),
              DERSuccess);
    ASSERT_EQ(context.searches.size(), 1U);
    EXPECT_EQ(context.searches[0], std::make_tuple(bytesOf(decoded.record.manb), propertyTag("none"), DERTagSet));
    EXPECT_EQ(bytesOf(decoded.record.objp), context.objectFound);
    EXPECT_EQ(context.seen.back(), (Seen{propertyTag("EFGH"), DERTagInteger, {1}, Img4SelectorObject}));

    Decoded refused(manifest);
    Judge other;
    other.objectAnswer = DERIncompleteSequence;
    EXPECT_EQ(Img4DecodePerformTrustEvaluationWithCallbacks(objectCode, &refused.record, &callbacks,
                                                            fastEntry().profile, &other),
              DERIncompleteSequence);
    EXPECT_EQ(refused.record.objp.data, nullptr);
}

TEST(Img4Trust, needsItsArguments) {
    const Img4TrustCallbacks callbacks = {judge, nullptr, nullptr};
    const Img4TrustCallbacks noJudge = {nullptr, lookUp, findObject};
    const Img4TrustProfile& sound = *fastEntry().profile;
    Decoded decoded(soundManifest());
    Img4Record* record = &decoded.record;
    Img4Record none = {};
    Judge context;
    const auto evaluate = [&](Img4Record* given, const Img4TrustCallbacks* by, const Img4TrustProfile* under) {
        return Img4DecodePerformTrustEvaluationWithCallbacks(objectCode, given, by, under, &context);
    };
    EXPECT_EQ(evaluate(nullptr, &callbacks, &sound), DERParamError);
    EXPECT_EQ(evaluate(&none, &callbacks, &sound), DERParamError);
    EXPECT_EQ(evaluate(record, nullptr, &sound), DERParamError);
    EXPECT_EQ(evaluate(record, &noJudge, &sound), DERParamError);
    EXPECT_EQ(evaluate(record, &callbacks, nullptr), DERParamError);
    for (void (*remove)(Img4TrustProfile&) :
         {+[](Img4TrustProfile& profile) { profile.computeDigest = nullptr; },
          +[](Img4TrustProfile& profile) { profile.verifyChain = nullptr; },
          +[](Img4TrustProfile& profile) { profile.verifySignature = nullptr; },
          +[](Img4TrustProfile& profile) { profile.evaluateCertificateProperties = nullptr; },
          +[](Img4TrustProfile& profile) { profile.digestInfo = nullptr; }}) {
        Img4TrustProfile incomplete = sound;
        remove(incomplete);
        EXPECT_EQ(evaluate(record, &callbacks, &incomplete), DERParamError);
    }
    Img4TrustProfile longDigest = sound;
    longDigest.digestInfo = &kQDSupportDigestInfoSha512;
    EXPECT_EQ(evaluate(record, &callbacks, &longDigest), DERBufferOverflow);
    EXPECT_EQ(record->manifestHashed, 0);
    EXPECT_TRUE(context.seen.empty());
}

// The SHA-1 flow

Bytes sha1Of(const DERItem& item) {
    Bytes digest(Img4HashLength);
    EXPECT_TRUE(crypto::sha1(item.data, static_cast<std::size_t>(item.length), digest.data()));
    return digest;
}

TEST(Img4TrustBySHA1, acceptsASoundManifest) {
    Decoded decoded(soundManifest(entryOf(kImg4DecodeSecureBootRsa1kSha1)));
    const Img4Record& record = decoded.record;
    Judge context;
    EXPECT_EQ(Img4DecodeEvaluateTrust(objectCode, &decoded.record, judge, &context), DERSuccess);
    EXPECT_EQ(context.seen, seenInAll());
    EXPECT_EQ(record.manifestHashed, 1);
    EXPECT_EQ(record.payloadHashed, 1);
    const auto prefix = [](const std::uint8_t* digest) { return Bytes(digest, digest + Img4HashLength); };
    EXPECT_EQ(prefix(record.manifest.digest), sha1Of(record.manifestRaw));
    EXPECT_EQ(prefix(record.manifest.bodyDigest), sha1Of(record.manifest.body));
    EXPECT_EQ(prefix(record.payload.digest), sha1Of(record.payloadRaw));
}

TEST(Img4TrustBySHA1, refusesForgeriesAndOtherProfiles) {
    const Img4TrustProfileEntry& entry = entryOf(kImg4DecodeSecureBootRsa1kSha1);
    std::vector<Bytes> refused = {soundManifest(entryOf(kImg4DecodeSecureBootRsa4kSha384))};
    for (const Forgery& row : forgeries)
        refused.push_back(row.make(signerOf(entry)));
    for (const Bytes& manifest : refused) {
        Decoded decoded(manifest);
        Judge context;
        EXPECT_EQ(Img4DecodeEvaluateTrust(objectCode, &decoded.record, judge, &context), Img4Failure);
        EXPECT_TRUE(context.seen.empty());
        EXPECT_EQ(decoded.record.manifestHashed, 0);
    }
}

// Parts that note their calls and fail at the one that is said.
struct ScriptedParts {
    std::string failing;
    std::string calls;

    static DERReturn answer(void* context, const char* call) {
        ScriptedParts& self = *static_cast<ScriptedParts*>(context);
        self.calls += call;
        return self.calls == self.failing ? static_cast<DERReturn>(0x55) : DERSuccess;
    }
};

ScriptedParts* partsOfCheck = nullptr;

const std::pair<const char*, std::pair<int, int>> partsThatFail[] = {
    {"body ", {0, 0}},
    {"body verify ", {0, 0}},
    {"body verify check ", {0, 0}},
    {"body verify check payload ", {0, 0}},
    {"body verify check payload property ", {1, 0}},
    {"body verify check payload property property ", {1, 0}},
    {"body verify check payload property property manifest ", {1, 0}},
    {"", {1, 1}},
};

TEST(Img4TrustBySHA1, runsThePartsInOrderAndStopsAtTheFirstThatFails) {
    Manifest fields;
    fields.properties = {property("ABCD", integer(1))};
    fields.objects = {object(standardObject, {property("EFGH", integer(2))})};
    const Bytes manifest = img4maker::manifest(fields);
    for (const auto& [failing, flags] : partsThatFail) {
        SCOPED_TRACE(failing);
        Decoded decoded(manifest);
        ScriptedParts parts;
        parts.failing = failing;
        partsOfCheck = &parts;
        const DERReturn result = Img4DecodeEvaluateTrustWithCallbacks(
            objectCode, &decoded.record,
            [](DERTag, const Img4PropertyValue*, std::uint32_t, void* context) {
                return ScriptedParts::answer(context, "property ");
            },
            [](const DERItem*, const DERItem*, const std::uint8_t*, DERItem*, void* context) {
                return ScriptedParts::answer(context, "verify ");
            },
            [](const Img4Record*) { return ScriptedParts::answer(partsOfCheck, "check "); },
            [](const std::uint8_t* data, std::uint64_t, std::uint8_t* out, void* context) {
                std::fill(out, out + Img4HashLength, data[0]);
                const char* what = data[0] == 0x31                    ? "body "
                                   : data[5] == 'M' && data[7] == 'P' ? "payload "
                                                                      : "manifest ";
                return ScriptedParts::answer(context, what);
            },
            &parts);
        EXPECT_EQ(result, parts.failing.empty() ? DERSuccess : static_cast<DERReturn>(0x55));
        if (!parts.failing.empty()) {
            EXPECT_EQ(parts.calls, parts.failing);
        }
        EXPECT_EQ(decoded.record.payloadHashed, flags.first);
        EXPECT_EQ(decoded.record.manifestHashed, flags.second);
    }
}

TEST(Img4TrustBySHA1, endsWhereTheDictionariesOrTheObjectAreMissing) {
    const Img4TrustProfileEntry& entry = entryOf(kImg4DecodeSecureBootRsa1kSha1);
    const Signer& signer = signerOf(entry);
    const Bytes body = set({object("MANX", {})});
    const Bytes signature = octets(sign(signer.leafKey(), Img4HashLength, body));
    const Bytes withoutDictionaries =
        sequence({ia5("IM4M"), integer(0), body, signature, sequence(signer.standardChain())});
    for (const auto& [manifest, code] :
         {std::pair(withoutDictionaries, objectCode), {soundManifest(entry), fourCC("none")}}) {
        Decoded decoded(manifest);
        Judge context;
        EXPECT_EQ(Img4DecodeEvaluateTrust(code, &decoded.record, judge, &context), DEREndOfSequence);
        EXPECT_NE(decoded.record.manifest.certProperties.data, nullptr) << "the signature was verified before";
        EXPECT_EQ(decoded.record.objp.data, nullptr);
        EXPECT_EQ(decoded.record.payloadHashed, 0);
        EXPECT_TRUE(context.seen.empty());
    }
}

TEST(Img4TrustBySHA1, needsItsArguments) {
    Decoded decoded(soundManifest(entryOf(kImg4DecodeSecureBootRsa1kSha1)));
    Img4Record none = {};
    const auto evaluate = [&](Img4Record* record, Img4PropertyCallback by, Img4SignatureWithChainVerifier verify,
                              Img4CertificateCheck check, Img4DigestFunction digest) {
        Judge context;
        return Img4DecodeEvaluateTrustWithCallbacks(objectCode, record, by, verify, check, digest, &context);
    };
    const Img4SignatureWithChainVerifier verify = [](const DERItem* chain, const DERItem* signature,
                                                     const std::uint8_t* digest, DERItem* properties, void*) {
        return img4_verify_signature_with_chain(chain, signature, digest, properties);
    };
    const Img4DigestFunction sha1 = [](const std::uint8_t* data, std::uint64_t length, std::uint8_t* out, void*) {
        return sha1_digest(data, length, out);
    };
    const auto check = Img4DecodeEvaluateCertificateProperties;
    EXPECT_EQ(evaluate(nullptr, judge, verify, check, sha1), DERParamError);
    EXPECT_EQ(evaluate(&none, judge, verify, check, sha1), DERParamError);
    EXPECT_EQ(evaluate(&decoded.record, nullptr, verify, check, sha1), DERParamError);
    EXPECT_EQ(evaluate(&decoded.record, judge, nullptr, check, sha1), DERParamError);
    EXPECT_EQ(evaluate(&decoded.record, judge, verify, nullptr, sha1), DERParamError);
    EXPECT_EQ(evaluate(&decoded.record, judge, verify, check, nullptr), DERParamError);
    EXPECT_EQ(evaluate(&decoded.record, judge, verify, check, sha1), DERSuccess);
}

// The walk

struct WalkCase {
    const char* name;
    Bytes dictionary;
    DERReturn expected;
    std::size_t seen;
};

const Bytes good = property("GOOD", integer(1));

const WalkCase walkCases[] = {
    {"nothing", {}, DERSuccess, 0},
    {"value that is a SET", join({good, property("ABCD", set({}))}), DERUnexpectedTag, 1},
    {"value that is NULL", property("ABCD", {0x05, 0x00}), DERUnexpectedTag, 0},
    {"name that is another", item(propertyTag("ABCD"), sequence({ia5("ABCE"), integer(1)})), DERUnexpectedTag, 0},
    {"property in a universal tag", item(DERTagSet, sequence({ia5("ABCD"), integer(1)})), DERUnexpectedTag, 0},
    {"property in an application tag", item(0x6000000000000000 + fourCC("ABCD"), sequence({ia5("ABCD"), integer(1)})),
     DERUnexpectedTag, 0},
    {"property in a primitive tag", item(0xC000000000000000 + fourCC("ABCD"), sequence({ia5("ABCD"), integer(1)})),
     DERUnexpectedTag, 0},
    {"third element", item(propertyTag("ABCD"), sequence({ia5("ABCD"), integer(1), integer(2)})), DERUnexpectedTag, 0},
    {"octets behind the property",
     item(propertyTag("ABCD"), join({sequence({ia5("ABCD"), integer(1)}), Bytes{0x05, 0x00}})), DERBufferOverflow, 0},
    {"element cut short", join({good, Bytes{0xFF}}), DERDecodeError, 1},
    {"the same property twice", join({good, good}), DERSuccess, 2},
};

TEST(Img4PropertyWalk, judgesEveryPropertyOrSaysWhichIsNone) {
    for (const WalkCase& row : walkCases) {
        const DERItem view = viewOf(row.dictionary);
        Judge context;
        EXPECT_EQ(Img4DecodeEvaluateDictionaryProperties(&view, 9, judge, &context), row.expected) << row.name;
        ASSERT_EQ(context.seen.size(), row.seen) << row.name;
        for (const Seen& seen : context.seen)
            EXPECT_EQ(seen, (Seen{propertyTag("GOOD"), DERTagInteger, {1}, 9}));
    }
    const DERItem view = viewOf(good);
    EXPECT_EQ(Img4DecodeEvaluateDictionaryProperties(nullptr, 0, judge, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeEvaluateDictionaryProperties(&view, 0, nullptr, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeEvaluateManifestProperties(nullptr, judge, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeEvaluateObjectProperties(nullptr, judge, nullptr), DERParamError);
}

// Constraints

struct ConstraintCase {
    const char* name;
    Bytes certProperties;
    DERReturn expected;
};

// The constraints of manifest or object alone.
Bytes onManifest(const List& constraints) {
    return set({object("MANP", constraints)});
}

Bytes onObject(const List& constraints) {
    return set({object("OBJP", constraints)});
}

const Bytes data = filler(20);

const ConstraintCase constraintCases[] = {
    {"none", set({}), DERSuccess},
    {"empty ones", set({object("MANP", {}), object("OBJP", {})}), DERSuccess},
    {"BOOLEAN met", onManifest({property("FLAG", boolean(true))}), DERSuccess},
    {"BOOLEAN broken", onManifest({property("FLAG", boolean(false))}), Img4Failure},
    {"INTEGER met", onManifest({property("NUMB", integer(0x1234))}), DERSuccess},
    {"INTEGER broken by an octet", onManifest({property("NUMB", integer(0x1235))}), Img4Failure},
    {"INTEGER of another length", onManifest({property("NUMB", integer(0x12))}), Img4Failure},
    {"OCTET STRING met", onManifest({property("DATA", octets(data))}), DERSuccess},
    {"OCTET STRING broken", onManifest({property("DATA", octets(filler(20, 1)))}), Img4Failure},
    {"value of another type", onManifest({property("FLAG", integer(0xFF))}), Img4Failure},
    {"value of a missing property", onManifest({property("NONE", integer(1))}), DEREndOfSequence},
    {"presence met", onManifest({mustBePresent("TEXT")}), DERSuccess},
    {"presence broken", onManifest({mustBePresent("NONE")}), DEREndOfSequence},
    {"absence met", onManifest({mustBeAbsent("NONE")}), DERSuccess},
    {"absence broken", onManifest({mustBeAbsent("TEXT")}), DERUnexpectedTag},
    {"text, which constrains nothing", onManifest({property("TEXT", ia5("text"))}), DERUnexpectedTag},
    {"SET as value", onManifest({property("TEXT", set({}))}), DERUnexpectedTag},
    {"primitive [0]", onManifest({property("TEXT", item(DERTagContextPrimitive(0), {}))}), DERUnexpectedTag},
    {"[2]", onManifest({property("TEXT", context(2, {}))}), DERUnexpectedTag},
    {"constraint with another name", onManifest({item(propertyTag("FLAG"), sequence({ia5("NUMB"), boolean(true)}))}),
     DERUnexpectedTag},
    {"constraint that is no property", onManifest({integer(1)}), DERDecodeError},
    {"the second broken", onManifest({property("FLAG", boolean(true)), mustBePresent("NONE")}), DEREndOfSequence},
    {"object's met", onObject({property("SIZE", integer(5)), mustBeAbsent("FLAG")}), DERSuccess},
    {"object's broken", onObject({property("SIZE", integer(6))}), Img4Failure},
    {"both, the object's broken",
     set({object("MANP", {mustBePresent("TEXT")}), object("OBJP", {mustBeAbsent("SIZE")})}), DERUnexpectedTag},
    {"measurement's", set({property("manx", integer(1)), object("MANP", {mustBePresent("TEXT")})}), DERSuccess},
    {"measurement's that is nothing at all", set({item(propertyTag("manx"), {})}), DERSuccess},
    {"another kind", set({object("KIND", {})}), DERUnexpectedTag},
    {"manifest's in a SEQUENCE", set({property("MANP", sequence({}))}), DERUnexpectedTag},
    {"manifest's with another name", set({item(propertyTag("MANP"), sequence({ia5("OBJP"), set({})}))}),
     DERUnexpectedTag},
    {"cut short", {0x31, 0x02, 0xFF, 0x80}, DERDecodeError},
    {"SEQUENCE", sequence({}), DERUnexpectedTag},
    {"no DER", {0x31}, DERDecodeError},
};

TEST(Img4Constraints, bindManifestAndObject) {
    const Bytes manp = join({property("FLAG", boolean(true)), property("NUMB", integer(0x1234)),
                             property("DATA", octets(data)), property("TEXT", ia5("text"))});
    const Bytes objp = property("SIZE", integer(5));
    for (const ConstraintCase& row : constraintCases) {
        Img4Record record = {};
        record.manp = viewOf(manp);
        record.objp = viewOf(objp);
        record.manifest.certProperties = viewOf(row.certProperties);
        EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), row.expected) << row.name;
    }
}

TEST(Img4Constraints, needPropertiesToBind) {
    const Bytes ofObject = onObject({mustBePresent("SIZE")});
    const Bytes ofManifest = onManifest({mustBeAbsent("FLAG")});
    const Bytes broken = {0xFF};
    Img4Record record = {};
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERDecodeError);

    record.manifest.certProperties = viewOf(ofObject);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERSuccess) << "no object was evaluated";
    record.objp = {broken.data(), 0};
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERSuccess) << "an object without properties";

    record.manifest.certProperties = viewOf(ofManifest);
    record.manp = viewOf(broken);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERDecodeError) << "a search that fails finds nothing";
}

TEST(Img4Constraints, ofTheLeafAreCheckedByEveryProfile) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        const Signer& signer = signerOf(entry);
        for (const auto& [constraints, expected] :
             {std::pair<List, DERReturn>{{object("MANP", {property("ABCD", integer(8))})}, Img4Failure},
              {{object("OBJP", {mustBeAbsent("EFGH")})}, DERUnexpectedTag},
              {{object("OBJP", {mustBePresent("EFGH")}), object("MANP", {property("ABCD", integer(7))})},
               DERSuccess}}) {
            Decoded decoded(
                signer.manifest(standardManifest(), signer.chainWith(signer.issue(signer.leaf(constraints)))));
            Judge context;
            EXPECT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, entry.profile, &context),
                      expected)
                << entry.name;
            EXPECT_EQ(decoded.record.payloadHashed, expected == DERSuccess);
        }
    }
}

// Digests

TEST(Img4TrustDigests, areThoseOfFIPS180) {
    // FIPS 180-4's own example: "abc".
    const Bytes abc = {'a', 'b', 'c'};
    const std::pair<const Img4DigestInfo*, Bytes> rows[] = {
        {&kQDSupportDigestInfoSha1, {0xa9, 0x99, 0x3e, 0x36}},
        {&kQDSupportDigestInfoSha256, {0xba, 0x78, 0x16, 0xbf}},
        {&kQDSupportDigestInfoSha384, {0xcb, 0x00, 0x75, 0x3f}},
        {&kQDSupportDigestInfoSha512, {0xdd, 0xaf, 0x35, 0xa1}},
    };
    for (const auto& [info, start] : rows) {
        Img4TrustProfile profile = *fastEntry().profile;
        profile.digestInfo = info;
        const Bytes once = digestBy(profile, viewOf(abc));
        EXPECT_EQ(Bytes(once.begin(), once.begin() + 4), start);

        Img4DigestState state;
        Bytes inPieces(info->length + 1);
        EXPECT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
        for (const std::uint8_t& octet : abc) {
            const DERItem piece = {&octet, 1};
            EXPECT_EQ(Img4DecodeDigestUpdate(&state, &piece, &profile), DERSuccess);
        }
        EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), inPieces.size(), &profile), DERParamError)
            << "before its end";
        EXPECT_EQ(Img4DecodeDigestFinal(&state, &profile), DERSuccess);
        EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), info->length - 1, &profile), DERBufferOverflow);
        EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), inPieces.size(), &profile), DERSuccess);
        inPieces.pop_back();
        EXPECT_EQ(inPieces, once);
        EXPECT_EQ(Img4DecodeDigestFinal(&state, &profile), DERParamError) << "twice";

        for (const std::uint64_t length : {info->length - 1, info->length + 1}) {
            Bytes out(length);
            const DERItem view = viewOf(abc);
            EXPECT_EQ(Img4DecodeComputeDigest(&view, out.data(), length, &profile), DERBufferOverflow);
            EXPECT_EQ(out, Bytes(length));
        }
    }
}

TEST(Img4TrustDigests, areThoseOfOneDescriptionFromInitToReturnHash) {
    const Img4TrustProfile& profile = kImg4DecodeSecureBootEc256Sha256;
    const Img4TrustProfile& other = kImg4DecodeSecureBootEc384Sha384;
    const DERItem piece = {profile.digestInfo->oid->data, profile.digestInfo->oid->length};
    std::uint8_t out[Img4LongestDigest];
    Img4DigestState state;
    ASSERT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
    EXPECT_EQ(Img4DecodeDigestUpdate(&state, &piece, &other), DERParamError);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, out, sizeof out, &profile), DERParamError) << "before its end";
    EXPECT_EQ(Img4DecodeDigestFinal(&state, &other), DERParamError);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, out, sizeof out, &profile), DERParamError);

    // One that claims fewer octets than its implementation writes.
    const Img4DigestInfo tooShort = {20, profile.digestInfo->oid, other.digestInfo->implementation};
    Img4TrustProfile wrong = profile;
    wrong.digestInfo = &tooShort;
    EXPECT_EQ(Img4DecodeComputeDigest(&piece, out, tooShort.length, &wrong), DERParamError);
    EXPECT_EQ(Img4DecodeDigestInit(&state, &wrong), DERParamError);
}

TEST(Img4TrustDigests, areKeptByTheRecordAfterAnEvaluation) {
    Decoded decoded(soundManifest());
    Judge context;
    ASSERT_EQ(Img4DecodePerformTrustEvaluation(objectCode, &decoded.record, judge, fastEntry().profile, &context),
              DERSuccess);
    decoded.record.manifest.digest[0] ^= 0xFF; // tells the stored digest from one computed anew
    std::uint8_t digest[32];
    EXPECT_EQ(Img4DecodeCopyManifestDigest(&decoded.record, digest, sizeof digest, fastEntry().profile), DERSuccess);
    EXPECT_EQ(Bytes(digest, digest + 32), Bytes(decoded.record.manifest.digest, decoded.record.manifest.digest + 32));
}

} // namespace
