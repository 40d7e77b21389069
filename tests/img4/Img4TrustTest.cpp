// Trust evaluation: the order of its steps and what they leave behind, and manifests that are signed in earnest.
#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <algorithm>
#include <functional>
#include <set>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

// A container with a payload, decoded.
struct Decoded {
    Bytes bytes;
    Img4Record record = {};

    explicit Decoded(const Bytes& manifest) : bytes(container(payload({}), manifest, {})) {
        EXPECT_EQ(Img4DecodeInit(bytes.data(), bytes.size(), &record), DERSuccess);
    }
};

// Steps
//
// Every operation that an evaluation is given is replaced by one that notes its call in `calls` and fails when it is
// the one in `failing`. A digest consists of the first letter of what it is taken of.

constexpr std::uint8_t keyOctet = 0x4B;
constexpr DERItem leafKey = {&keyOctet, 1};
constexpr std::uint8_t constraintsOctet = 0x31;
constexpr DERItem constraints = {&constraintsOctet, 1};
constexpr DERReturn stepFailed = static_cast<DERReturn>(0x77);

struct Script {
    std::string failing;
    Bytes trustedDigest;
    Img4Record* record;
    std::string calls;

    DERReturn step(const std::string& call) {
        calls += call + "; ";
        return call == failing ? stepFailed : DERSuccess;
    }
    DERReturn digest(const std::uint8_t* data, std::uint64_t length, std::uint8_t* out, std::uint64_t outLength) {
        const std::pair<const char*, DERItem> sources[] = {
            {"manifest", record->manifestRaw}, {"body", record->manifest.body}, {"payload", record->payloadRaw}};
        for (const auto& [name, source] : sources) {
            if (data != source.data || length != source.length)
                continue;
            const DERReturn result = step(std::string("digest ") + name);
            std::memset(out, result == DERSuccess ? *name : 'x', outLength);
            return result;
        }
        return step("digest nothing known");
    }
    DERReturn verifyChain(const DERItem& chain, DERItem* key, DERItem* certProperties) {
        EXPECT_EQ(chain.data, record->manifest.certChain.data);
        const DERReturn result = step("chain");
        if (result == DERSuccess && key != nullptr)
            *key = leafKey;
        if (result == DERSuccess)
            *certProperties = constraints;
        return result;
    }
    void checkSignature(const DERItem& signature, const std::uint8_t* digest) const {
        EXPECT_EQ(signature.data, record->manifest.signature.data);
        EXPECT_EQ(digest, record->manifest.bodyDigest);
        EXPECT_EQ(digest[0], 'b');
    }
};

// Not all operations are given a context.
Script script;

DERReturn judge(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    EXPECT_EQ(value->tag, DERTagInteger);
    EXPECT_EQ(context, &script);
    const char name[] = {static_cast<char>(tag >> 24), static_cast<char>(tag >> 16), static_cast<char>(tag >> 8),
                         static_cast<char>(tag)};
    return script.step("judge " + std::string(name, sizeof name) + " of " + std::to_string(selector));
}

const std::uint8_t* lookUp(const Img4Record* record, void* context) {
    EXPECT_EQ(context, &script);
    EXPECT_EQ(record->manifestHashed, 1) << "the record has its digest by then";
    script.step("look up");
    return script.trustedDigest.empty() ? nullptr : script.trustedDigest.data();
}

// The object as a caller finds it, which stands in the out-value of a search that fails too.
const Bytes foundObject = property("EFGH", integer(2));

DERReturn findObject(const DERItem* manb, DERTag tag, DERTag valueType, Img4Property* property, void* context) {
    EXPECT_EQ(context, &script);
    EXPECT_EQ(manb->data, script.record->manb.data);
    EXPECT_EQ(tag, propertyTag("none"));
    EXPECT_EQ(valueType, DERTagSet);
    property->value = itemOf(foundObject);
    return script.step("object");
}

DERReturn checkConstraints(const Img4Record* record) {
    EXPECT_EQ(record, script.record);
    return script.step("constraints");
}

const Img4TrustProfile scripted = {
    [](const DERItem* data, std::uint8_t* out, std::uint64_t length, const Img4TrustProfile* profile) {
        EXPECT_EQ(profile, &scripted);
        return script.digest(data->data, data->length, out, length);
    },
    [](const DERItem* chain, DERItem* key, DERItem* certProperties, const Img4TrustProfile*) {
        return script.verifyChain(*chain, key, certProperties);
    },
    [](const DERItem* key, const DERItem* signature, const std::uint8_t* digest, std::uint64_t length,
       const Img4TrustProfile* profile) {
        EXPECT_EQ(key->data, leafKey.data);
        EXPECT_EQ(length, profile->digestInfo->length);
        script.checkSignature(*signature, digest);
        return script.step("signature");
    },
    checkConstraints,
    &kQDSupportDigestInfoSha256,
    nullptr,
    nullptr};

const Img4SignatureWithChainVerifier verifyBoth = [](const DERItem* chain, const DERItem* signature,
                                                     const std::uint8_t* digest, DERItem* properties, void*) {
    script.checkSignature(*signature, digest);
    return script.verifyChain(*chain, nullptr, properties);
};

const Img4DigestFunction hash = [](const std::uint8_t* data, std::uint64_t length, std::uint8_t* out, void*) {
    return script.digest(data, length, out, Img4HashLength);
};

// A step of a flow, with what it leaves in the record. Some belong only to flows with callbacks (c), without (n), with
// an object (o) or with a signature to be verified (s). A step without a call is one that nobody is asked for.
struct Step {
    const char* call;
    const char* needs;
    const char* leaves;
    Img4Subject subject = Img4SubjectNone;
};

const Step newerSteps[] = {
    {"digest manifest", "", "manifest", Img4SubjectManifestDigest},
    {"look up", "c", ""},
    {"chain", "s", "constraints", Img4SubjectChain},
    {"digest body", "s", "body", Img4SubjectBodyDigest},
    {"signature", "s", "", Img4SubjectSignature},
    {"", "", "dictionaries"},
    {"object", "co", "object", Img4SubjectObject},
    {"", "no", "object"},
    {"constraints", "s", "", Img4SubjectConstraints},
    {"digest payload", "", "payload", Img4SubjectPayloadDigest},
    {"judge ABCD of 0", "", "", Img4SubjectManifestProperties},
    {"judge BCDE of 0", "", "", Img4SubjectManifestProperties},
    {"judge EFGH of 1", "o", "", Img4SubjectObjectProperties},
};

const Step olderSteps[] = {
    {"digest body", "", "body"}, {"chain", "", "constraints"},
    {"", "", "dictionaries"},    {"", "", "object"},
    {"constraints", "", ""},     {"digest payload", "", "payload"},
    {"judge ABCD of 0", "", ""}, {"judge BCDE of 0", "", ""},
    {"judge EFGH of 1", "", ""}, {"digest manifest", "", "manifest"},
};

const Img4TrustCallbacks allCallbacks = {judge, lookUp, findObject};
const std::uint32_t sepi = fourCC("sepi");
const std::uint32_t none = fourCC("none"); // which the callback finds, and the search in the manifest does not

Img4TrustRefusal refusal;

// `has` is what steps may need, and e where the refusal is explained; `trusted` is the digest that the callback gives
// out.
struct Flow {
    const char* name;
    std::string_view has;
    DERReturn (*evaluate)(Img4Record*);
    Bytes trusted = {};
    std::span<const Step> steps = newerSteps;
};

const Flow flows[] = {
    {"plain", "nos",
     [](auto record) { return Img4DecodePerformTrustEvaluation(sepi, record, judge, &scripted, &script); }},
    {"plain by its other name", "nos",
     [](auto record) { return Img4DecodePerformTrustEvaluatation(sepi, record, judge, &scripted, &script); }},
    {"with callbacks", "cos",
     [](auto record) {
         return Img4DecodePerformTrustEvaluationWithCallbacks(none, record, &allCallbacks, &scripted, &script);
     }},
    {"trusted", "co",
     [](auto record) {
         return Img4DecodePerformTrustEvaluatationWithCallbacks(none, record, &allCallbacks, &scripted, &script);
     },
     Bytes(32, 'm')},
    {"manifest alone", "cs",
     [](auto record) {
         return Img4DecodePerformManifestTrustEvaluationWithCallbacks(record, &allCallbacks, &scripted, &script);
     },
     lastChanged(Bytes(32, 'm'))},
    {"explained", "cose",
     [](auto record) {
         return Img4DecodePerformTrustEvaluationExplained(&none, record, &allCallbacks, &scripted, &script, &refusal);
     }},
    {"explained, manifest alone", "cse",
     [](auto record) {
         return Img4DecodePerformTrustEvaluationExplained(nullptr, record, &allCallbacks, &scripted, &script, &refusal);
     }},
    {"by parts",
     "",
     [](auto record) {
         return Img4DecodeEvaluateTrustWithCallbacks(sepi, record, judge, verifyBoth, checkConstraints, hash, &script);
     },
     {},
     olderSteps},
};

std::set<std::string> leftIn(const Img4Record& record) {
    const std::pair<const char*, bool> all[] = {
        {"manifest", record.manifestHashed == 1 && record.manifest.digest[0] == 'm'},
        {"constraints", record.manifest.certProperties.data == &constraintsOctet},
        {"body", record.manifest.bodyDigest[0] == 'b'},
        {"dictionaries", record.manb.data != nullptr && record.manp.data != nullptr},
        {"object", record.objp.data != nullptr},
        {"payload", record.payloadHashed == 1 && record.payload.digest[0] == 'p'},
        {"a digest that failed",
         record.manifest.digest[0] == 'x' || record.manifest.bodyDigest[0] == 'x' || record.payload.digest[0] == 'x'},
        {"a flag of a digest that failed", (record.manifestHashed == 1 && record.manifest.digest[0] != 'm') ||
                                               (record.payloadHashed == 1 && record.payload.digest[0] != 'p')},
    };
    std::set<std::string> left;
    for (const auto& [name, isLeft] : all)
        if (isLeft)
            left.insert(name);
    return left;
}

Bytes scriptedManifest() {
    Manifest fields;
    fields.properties = {property("ABCD", integer(7)), property("BCDE", integer(8))};
    fields.objects = {object("sepi", {property("EFGH", integer(300))})};
    return manifest(fields);
}

// `calls` and `left` are what is expected when the step `failing` fails, or none does.
void checkFlow(const Flow& flow, const Step& failing, DERReturn result, const std::string& calls,
               const std::set<std::string>& left) {
    SCOPED_TRACE(std::string(flow.name) + ", failing: " + failing.call);
    Decoded decoded(scriptedManifest());
    refusal = {};
    script = {failing.call, flow.trusted, &decoded.record, {}};
    EXPECT_EQ(flow.evaluate(&decoded.record), result);
    EXPECT_EQ(script.calls, calls);
    EXPECT_EQ(leftIn(decoded.record), left);
    if (flow.has.find('e') != std::string_view::npos) {
        EXPECT_EQ(refusal.refusal.subject, failing.subject);
        EXPECT_EQ(refusal.refusal.fault, result == DERSuccess ? Img4FaultNone : Img4FaultOther);
        EXPECT_EQ(refusal.refusal.status, result);
        EXPECT_EQ(refusal.refusal.place != nullptr, result != DERSuccess);
    }

    // What an earlier evaluation has left stays.
    Img4Record before;
    script.failing = {};
    EXPECT_EQ(flow.evaluate(&decoded.record), DERSuccess);
    std::memcpy(&before, &decoded.record, sizeof before);
    script.failing = failing.call;
    EXPECT_EQ(flow.evaluate(&decoded.record), result);
    EXPECT_EQ(std::memcmp(&before, &decoded.record, sizeof before), 0);
}

TEST(Img4TrustSteps, areTakenInOrderUpToTheFirstThatFails) {
    for (const Flow& flow : flows) {
        std::string calls;
        std::set<std::string> left;
        for (const Step& step : flow.steps) {
            if (std::string_view(step.needs).find_first_not_of(flow.has) != std::string_view::npos)
                continue;
            calls += *step.call != 0 ? step.call + std::string("; ") : "";
            if (*step.call != 0 && step.call != std::string_view("look up"))
                checkFlow(flow, step, stepFailed, calls, left);
            if (*step.leaves != 0)
                left.insert(step.leaves);
        }
        checkFlow(flow, {"", "", ""}, DERSuccess, calls, left);
    }
}

// In both flows, a search that fails leaves the object of an earlier evaluation where it was.
TEST(Img4TrustSteps, endWhereTheDictionariesOrTheObjectAreMissing) {
    const auto withBody = [](std::uint64_t version, const Bytes& body) {
        return sequence({ia5("IM4M"), integer(version), body, octets({1}), sequence({})});
    };
    const std::tuple<const char*, Bytes, std::uint32_t, DERReturn, bool> rows[] = {
        {"no object", scriptedManifest(), none, DEREndOfSequence, true},
        {"no dictionaries", withBody(0, set({object("MANX", {})})), sepi, DEREndOfSequence, false},
        {"dictionaries of another version", withBody(2, manifestBody({})), sepi, DERUnexpectedTag, false},
    };
    for (const auto& [name, manifest, object, expected, hasDictionaries] : rows) {
        for (const bool byParts : {false, true}) {
            SCOPED_TRACE(name);
            Decoded decoded(manifest);
            Img4Record& record = decoded.record;
            record.objp = itemOf(foundObject);
            script = {"", {}, &record, {}};
            EXPECT_EQ(byParts ? Img4DecodeEvaluateTrustWithCallbacks(object, &record, judge, verifyBoth,
                                                                     checkConstraints, hash, &script)
                              : Img4DecodePerformTrustEvaluation(object, &record, judge, &scripted, &script),
                      expected);
            EXPECT_EQ(script.calls,
                      byParts ? "digest body; chain; " : "digest manifest; chain; digest body; signature; ");
            EXPECT_EQ(leftIn(record).count("dictionaries") != 0, hasDictionaries);
            EXPECT_EQ(record.objp.data, foundObject.data());
        }
    }
}

TEST(Img4TrustSteps, sayWhichPropertyIsNone) {
    const Bytes broken = item(propertyTag("BCDE"), {});
    Manifest ofManifest, ofObject;
    ofManifest.properties = {property("ABCD", integer(7)), broken};
    ofManifest.objects = {object("sepi", {})};
    ofObject.objects = {object("sepi", {property("EFGH", integer(7)), broken})};
    const Img4TrustCallbacks callbacks = {judge, nullptr, nullptr};
    for (const auto& [fields, subject] :
         {std::pair(&ofManifest, Img4SubjectManifestProperties), std::pair(&ofObject, Img4SubjectObjectProperties)}) {
        Decoded decoded(manifest(*fields));
        script = {"", {}, &decoded.record, {}};
        EXPECT_EQ(
            Img4DecodePerformTrustEvaluationExplained(&sepi, &decoded.record, &callbacks, &scripted, &script, &refusal),
            DERDecodeError);
        EXPECT_EQ(refusal.refusal.subject, subject);
        EXPECT_EQ(refusal.refusal.fault, Img4FaultEncoding);
        EXPECT_EQ(refusal.refusal.encoding.fault, DERFaultHeaderCutShort);
        EXPECT_EQ(refusal.refusal.tag, propertyTag("BCDE"));
    }
}

TEST(Img4TrustSteps, needNoPayload) {
    const Bytes manifest = scriptedManifest();
    Img4Record record;
    ASSERT_EQ(Img4DecodeInitManifest(manifest.data(), manifest.size(), &record), DERSuccess);
    script = {"", {}, &record, {}};
    EXPECT_EQ(Img4DecodePerformTrustEvaluation(sepi, &record, judge, &scripted, &script), DERSuccess);
    EXPECT_EQ(record.payloadHashed, 0);
    EXPECT_EQ(script.calls.find("payload"), std::string::npos);
}

TEST(Img4TrustSteps, needTheirArguments) {
    const Img4TrustCallbacks noJudge = {nullptr, lookUp, findObject};
    Decoded decoded(scriptedManifest());
    Img4Record* const record = &decoded.record;
    Img4Record empty = {};
    script = {"", {}, record, {}};
    const auto evaluate = Img4DecodePerformTrustEvaluationWithCallbacks;
    const auto evaluateByParts = Img4DecodeEvaluateTrustWithCallbacks;
    expectNeedsAll(DERParamError, evaluate, sepi, record, &allCallbacks, &scripted, &script);
    expectNeedsAll(DERParamError, evaluateByParts, sepi, record, judge, verifyBoth, checkConstraints, hash, &script);
    EXPECT_EQ(evaluate(sepi, &empty, &allCallbacks, &scripted, &script), DERParamError);
    EXPECT_EQ(evaluate(sepi, record, &noJudge, &scripted, &script), DERParamError);
    EXPECT_EQ(evaluateByParts(sepi, &empty, judge, verifyBoth, checkConstraints, hash, &script), DERParamError);
    EXPECT_EQ(Img4DecodePerformTrustEvaluationExplained(&sepi, record, &allCallbacks, &scripted, &script, nullptr),
              DERParamError);
    const auto expectNeeds = [&](auto... members) {
        const auto without = [&](auto member) {
            Img4TrustProfile incomplete = scripted;
            incomplete.*member = nullptr;
            EXPECT_EQ(evaluate(sepi, record, &allCallbacks, &incomplete, &script), DERParamError);
        };
        (without(members), ...);
    };
    expectNeeds(&Img4TrustProfile::computeDigest, &Img4TrustProfile::verifyChain, &Img4TrustProfile::verifySignature,
                &Img4TrustProfile::evaluateCertificateProperties, &Img4TrustProfile::digestInfo);
    Img4TrustProfile longDigest = scripted;
    longDigest.digestInfo = &kQDSupportDigestInfoSha512;
    EXPECT_EQ(evaluate(sepi, record, &allCallbacks, &longDigest, &script), DERBufferOverflow);
    EXPECT_EQ(script.calls, "");
}

// Manifests that are signed in earnest

// What a callback saw of manifest and object, encoded again.
struct Seen {
    Bytes of[2];
};

DERReturn note(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    Bytes& seen = static_cast<Seen*>(context)->of[selector];
    const Bytes name = {static_cast<std::uint8_t>(tag >> 24), static_cast<std::uint8_t>(tag >> 16),
                        static_cast<std::uint8_t>(tag >> 8), static_cast<std::uint8_t>(tag)};
    seen = join({seen, item(tag, sequence({item(DERTagIA5String, name), item(value->tag, bytesOf(value->content))}))});
    return DERSuccess;
}

void expectDigest(const std::uint8_t* stored, const DERItem& data, const Img4TrustProfile& profile) {
    Bytes digest(profile.digestInfo->length);
    EXPECT_EQ(Img4DecodeComputeDigest(&data, digest.data(), digest.size(), &profile), DERSuccess);
    EXPECT_EQ(Bytes(stored, stored + digest.size()), digest);
}

// Evaluates the manifest, by parts when no profile is given, and expects either all marks of success or nothing seen.
void expectEvaluation(DERReturn expected, const Bytes& manifest, const Img4TrustProfile* profile) {
    Decoded decoded(manifest);
    Img4Record& record = decoded.record;
    Seen seen;
    EXPECT_EQ(profile != nullptr ? Img4DecodePerformTrustEvaluation(sepi, &record, note, profile, &seen)
                                 : Img4DecodeEvaluateTrust(sepi, &record, note, &seen),
              expected);
    EXPECT_EQ(record.payloadHashed, expected == DERSuccess);
    if (expected != DERSuccess) {
        EXPECT_TRUE(seen.of[0].empty());
        return;
    }
    const Img4TrustProfile& used = profile != nullptr ? *profile : kImg4DecodeSecureBootRsa1kSha1;
    EXPECT_EQ(seen.of[0], bytesOf(record.manp));
    EXPECT_EQ(seen.of[1], bytesOf(record.objp));
    EXPECT_EQ(record.manifestHashed, 1);
    expectDigest(record.manifest.digest, record.manifestRaw, used);
    expectDigest(record.manifest.bodyDigest, record.manifest.body, used);
    expectDigest(record.payload.digest, record.payloadRaw, used);
}

TEST(Img4Trust, isInWhatTheKeysOfAProfileSignAndInNothingElse) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        SCOPED_TRACE(entry.name);
        const Signer& signer = signerOf(entry);
        const Bytes chain = join(signer.standardChain());
        const Certificate demanding = signer.leaf({object("MANP", {property("ABCD", integer(8))})});
        const DERItem view = itemOf(chain);
        expectEvaluation(DERSuccess, signer.manifest(standardManifest(), signer.standardChain()), entry.profile);
        expectEvaluation(Img4Failure, signer.manifest(standardManifest(), signer.chainWith(signer.issue(demanding))),
                         entry.profile);
        for (const Img4TrustProfileEntry& other : allProfiles()) {
            DERItem key;
            DERItem certProperties;
            EXPECT_EQ(other.profile->verifyChain(&view, &key, &certProperties, other.profile),
                      other.profile == entry.profile ? DERSuccess : Img4Failure)
                << other.name;
        }
        EXPECT_EQ(entry.profile->verifySignature == verify_signature_rsa3k,
                  entry.profile == &kImg4DecodeSecureBootRsa3kSha384);
    }
}

// A standard manifest whose signature is changed after it was made.
Bytes withSignature(const Signer& signer, const std::function<void(Bytes&)>& change) {
    Manifest fields = standardManifest();
    Img4Record record;
    const Bytes sound = signer.manifest(fields, signer.standardChain());
    EXPECT_EQ(Img4DecodeInitManifest(sound.data(), sound.size(), &record), DERSuccess);
    fields.signature = bytesOf(record.manifest.signature);
    fields.certChain = join(signer.standardChain());
    change(fields.signature);
    return manifest(fields);
}

TEST(Img4Trust, isNotInForgeries) {
    for (const Img4TrustProfileEntry* entry : kindsOfProfile()) {
        SCOPED_TRACE(entry->name);
        const Signer& s = signerOf(*entry);
        Bytes otherBody = s.manifest(standardManifest(), s.standardChain());
        const std::string_view text = "text";
        *std::search(otherBody.begin(), otherBody.end(), text.begin(), text.end()) = 'T';
        const Bytes forgeries[] = {
            otherBody,
            withSignature(s, [](Bytes& signature) { signature.back() ^= 1; }),
            withSignature(s, [](Bytes& signature) { signature.push_back(0); }),
            withSignature(s, [](Bytes& signature) { signature.clear(); }),
            s.manifest(standardManifest(), s.standardChain(), s.issuerKey()),
            s.manifest(standardManifest(), {}),
        };
        for (const Bytes& forgery : forgeries) {
            SCOPED_TRACE(&forgery - forgeries);
            expectEvaluation(Img4Failure, forgery, entry->profile);
            if (entry->profile == &kImg4DecodeSecureBootRsa1kSha1)
                expectEvaluation(Img4Failure, forgery, nullptr);
        }
    }
}

TEST(Img4TrustBySHA1, isThatOfTheSmallestProfileWithKeysOfAnySize) {
    const Signer& signer = signerOf(entryOf(kImg4DecodeSecureBootRsa1kSha1));
    const Signer& other = signerOf(entryOf(kImg4DecodeSecureBootRsa4kSha384));
    const Key key = makeRSAKey(4096);
    Certificate leaf = signer.leaf();
    leaf.publicKeyInfo = publicKeyInfo(key);
    const List chain = signer.chainWith(signer.issue(leaf));
    expectEvaluation(DERSuccess, signer.manifest(standardManifest(), signer.standardChain()), nullptr);
    expectEvaluation(DERSuccess, signer.manifest(standardManifest(), chain, key), nullptr);
    expectEvaluation(Img4Failure, other.manifest(standardManifest(), other.standardChain()), nullptr);
    leaf.extensions = {};
    expectEvaluation(DERDecodeError, signer.manifest(standardManifest(), signer.chainWith(signer.issue(leaf)), key),
                     nullptr);
}

} // namespace
