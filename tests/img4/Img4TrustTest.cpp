// Trust evaluation: the order of its steps and what they leave behind, and manifests that are signed in earnest.
#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <numeric>
#include <tuple>

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
// Every operation that an evaluation is given is replaced by one that notes its call with what the record holds by
// then, and fails when it is the one in `failing`. A digest consists of the first letter of what it is taken of.

constexpr std::uint8_t keyOctet = 0x4B;
constexpr DERItem leafKey = {&keyOctet, 1};
constexpr std::uint8_t constraintsOctet = 0x31;
constexpr DERItem constraints = {&constraintsOctet, 1};
constexpr DERReturn stepFailed = static_cast<DERReturn>(0x77);

// The manifest's digest, the constraints, the body's digest, the dictionaries, the object and the payload's digest; and
// what must never be there: x for a digest that failed, ! for a flag without its digest.
std::string heldBy(const Img4Record& record) {
    const Img4ManifestRecord& manifest = record.manifest;
    const bool isManifest = manifest.digest[0] == 'm', isPayload = record.payload.digest[0] == 'p';
    const bool isFailed = manifest.digest[0] == 'x' || manifest.bodyDigest[0] == 'x' || record.payload.digest[0] == 'x';
    const auto flagged = [](bool isDigest, std::uint8_t flag, const char* letter) {
        return isDigest == (flag == 1) ? (isDigest ? letter : "") : "!";
    };
    return flagged(isManifest, record.manifestHashed, "m") +
           std::string(manifest.certProperties.data == &constraintsOctet ? "c" : "") +
           (manifest.bodyDigest[0] == 'b' ? "b" : "") + (record.manb.data && record.manp.data ? "d" : "") +
           (record.objp.data ? "o" : "") + flagged(isPayload, record.payloadHashed, "p") + (isFailed ? "x" : "");
}

using Calls = std::vector<std::string>;

struct Script {
    std::string failing;
    Bytes trustedDigest;
    Img4Record* record;
    Calls calls;

    DERReturn step(const std::string& call) {
        const std::string held = heldBy(*record);
        calls.push_back(call + (held.empty() ? "" : ": ") + held + "; ");
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
        if (result == DERSuccess) {
            *key = leafKey;
            *certProperties = constraints;
        }
        return result;
    }
    void checkSignature(const DERItem& signature, const std::uint8_t* digest) const {
        EXPECT_EQ(signature.data, record->manifest.signature.data);
        EXPECT_EQ(digest, record->manifest.bodyDigest);
        EXPECT_EQ(digest[0], 'b');
    }
    std::string text() const { return std::accumulate(calls.begin(), calls.end(), std::string()); }
};

// Not all operations are given a context.
Script script;

DERReturn judge(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    EXPECT_EQ(tag >> 8, propertyTag("AAAA") >> 8);
    EXPECT_EQ(value->tag, DERTagInteger);
    EXPECT_EQ(context, &script);
    return script.step(std::string("judge ") + static_cast<char>(tag) + " of " + std::to_string(selector));
}

const std::uint8_t* lookUp(const Img4Record* record, void* context) {
    EXPECT_EQ(context, &script);
    EXPECT_EQ(record, script.record);
    script.step("look up");
    return script.trustedDigest.empty() ? nullptr : script.trustedDigest.data();
}

// The object as a caller finds it, which stands in the out-value of a search that fails too.
const Bytes foundObject = property("AAAD", integer(2));

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
    DERItem key;
    script.checkSignature(*signature, digest);
    return script.verifyChain(*chain, &key, properties);
};

const Img4DigestFunction hash = [](const std::uint8_t* data, std::uint64_t length, std::uint8_t* out, void*) {
    return script.digest(data, length, out, Img4HashLength);
};

const Img4TrustCallbacks allCallbacks = {judge, lookUp, findObject};
const std::uint32_t sepi = fourCC("sepi");
const std::uint32_t none = fourCC("none"); // which the callback finds, and the search in the manifest does not

DERReturn evaluatePlainly(std::uint32_t object, Img4Record* record) {
    return Img4DecodePerformTrustEvaluatation(object, record, judge, &scripted, &script);
}

DERReturn evaluateByParts(std::uint32_t object, Img4Record* record) {
    return Img4DecodeEvaluateTrustWithCallbacks(object, record, judge, verifyBoth, checkConstraints, hash, &script);
}

// The calls of flows in which nothing fails, each with what the record holds before it.
const std::string begin = "digest manifest; ", lookedUp = begin + "look up: m; ";
const std::string verified = "chain: m; digest body: mc; signature: mcb; ";
const std::string checked = "constraints: mcbdo; digest payload: mcbdo; judge B of 0: mcbdop; judge C of 0: mcbdop; "
                            "judge D of 1: mcbdop; end: mcbdop; ";

// `trusted` is the digest that the callback gives out.
const struct Flow {
    const char* name;
    DERReturn (*evaluate)(Img4Record*);
    std::string calls;
    Bytes trusted = {};
} flows[] = {
    {"plain", [](auto record) { return evaluatePlainly(sepi, record); }, begin + verified + checked},
    {"with callbacks",
     [](auto record) {
         Img4TrustRefusal refusal;
         const DERReturn result =
             Img4DecodePerformTrustEvaluationExplained(&none, record, &allCallbacks, &scripted, &script, &refusal);
         EXPECT_EQ(refusal.signature.fault == Img4SignatureOther, script.failing == "signature");
         return result;
     },
     lookedUp + verified + "object: mcbd; " + checked},
    {"trusted",
     [](auto record) {
         return Img4DecodePerformTrustEvaluationWithCallbacks(none, record, &allCallbacks, &scripted, &script);
     },
     lookedUp + "object: md; digest payload: mdo; judge B of 0: mdop; judge C of 0: mdop; judge D of 1: mdop; "
                "end: mdop; ",
     Bytes(32, 'm')},
    {"manifest alone",
     [](auto record) {
         return Img4DecodePerformManifestTrustEvaluationWithCallbacks(record, &allCallbacks, &scripted, &script);
     },
     lookedUp + verified +
         "constraints: mcbd; digest payload: mcbd; judge B of 0: mcbdp; judge C of 0: mcbdp; end: mcbdp; ",
     lastChanged(Bytes(32, 'm'))},
    {"by parts", [](auto record) { return evaluateByParts(sepi, record); },
     "digest body; chain: b; constraints: cbdo; digest payload: cbdo; judge B of 0: cbdop; judge C of 0: cbdop; "
     "judge D of 1: cbdop; digest manifest: cbdop; end: mcbdop; "},
};

Bytes scriptedManifest() {
    Manifest fields;
    fields.properties = {property("AAAB", integer(7)), property("AAAC", integer(8))};
    fields.objects = {object("sepi", {property("AAAD", integer(300))})};
    return manifest(fields);
}

// The script of a flow in which the step `failing` fails, or none does.
Script play(const Flow& flow, const std::string& failing) {
    const DERReturn result = failing.empty() ? DERSuccess : stepFailed;
    Decoded decoded(scriptedManifest());
    script = {failing, flow.trusted, &decoded.record, {}};
    EXPECT_EQ(flow.evaluate(&decoded.record), result);
    script.step("end");
    const Script played = script;

    // What an earlier evaluation has left stays.
    Img4Record before;
    script.failing = {};
    EXPECT_EQ(flow.evaluate(&decoded.record), DERSuccess);
    std::memcpy(&before, &decoded.record, sizeof before);
    script.failing = failing;
    EXPECT_EQ(flow.evaluate(&decoded.record), result);
    EXPECT_EQ(std::memcmp(&before, &decoded.record, sizeof before), 0);
    return played;
}

TEST(Img4TrustSteps, areTakenInOrderUpToTheFirstThatFailsWhichLeavesNothing) {
    for (const Flow& flow : flows) {
        SCOPED_TRACE(flow.name);
        const Script whole = play(flow, "");
        EXPECT_EQ(whole.text(), flow.calls);
        std::string calls;
        for (const std::string& call : whole.calls) {
            const std::string name = call.substr(0, call.find_first_of(":;")), held = call.substr(name.size());
            calls += call;
            if (name != "look up" && name != "end") {
                EXPECT_EQ(play(flow, name).text(), calls + "end" + held) << name;
            }
        }
    }
}

// In both flows, a search that fails leaves the object of an earlier evaluation where it was.
TEST(Img4TrustSteps, endWhereTheDictionariesOrTheObjectAreMissing) {
    const auto withBody = [](std::uint64_t version, const Bytes& body) {
        return sequence({ia5("IM4M"), integer(version), body, octets({1}), sequence({})});
    };
    const std::tuple<Bytes, std::uint32_t, DERReturn, const char*> rows[] = {
        {scriptedManifest(), none, DEREndOfSequence, "do; "},
        {withBody(0, set({object("MANX", {})})), sepi, DEREndOfSequence, "o; "},
        {withBody(2, manifestBody({})), sepi, DERUnexpectedTag, "o; "},
    };
    for (const auto& [manifest, object, expected, held] : rows) {
        for (const auto& [evaluate, calls] :
             {std::pair(&evaluatePlainly,
                        std::string("digest manifest: o; chain: mo; digest body: mco; signature: mcbo; end: mcb")),
              std::pair(&evaluateByParts, std::string("digest body: o; chain: bo; end: cb"))}) {
            Decoded decoded(manifest);
            decoded.record.objp = itemOf(foundObject);
            script = {"", {}, &decoded.record, {}};
            EXPECT_EQ(evaluate(object, &decoded.record), expected);
            script.step("end");
            EXPECT_EQ(script.text(), calls + held);
            EXPECT_EQ(decoded.record.objp.data, foundObject.data());
        }
    }
}

TEST(Img4TrustSteps, needTheirArguments) {
    const Img4TrustCallbacks noJudge = {nullptr, lookUp, findObject};
    Decoded decoded(scriptedManifest());
    Img4Record* const record = &decoded.record;
    Img4Record empty = {};
    script = {"", {}, record, {}};
    const auto evaluate = Img4DecodePerformTrustEvaluatationWithCallbacks;
    expectNeedsAll(DERParamError, evaluate, sepi, record, &allCallbacks, &scripted, &script);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateTrustWithCallbacks, sepi, record, judge, verifyBoth,
                   checkConstraints, hash, &script);
    EXPECT_EQ(evaluatePlainly(sepi, &empty), DERParamError);
    EXPECT_EQ(evaluateByParts(sepi, &empty), DERParamError);
    EXPECT_EQ(evaluate(sepi, record, &noJudge, &scripted, &script), DERParamError);
    EXPECT_EQ(Img4DecodePerformTrustEvaluationExplained(&sepi, record, &allCallbacks, &scripted, &script, nullptr),
              DERParamError);
    for (std::size_t pointer = 0; pointer < 5; ++pointer) {
        Img4TrustProfile incomplete = scripted;
        std::memset(reinterpret_cast<std::uint8_t*>(&incomplete) + pointer * sizeof(void*), 0, sizeof(void*));
        EXPECT_EQ(evaluate(sepi, record, &allCallbacks, &incomplete, &script), DERParamError) << pointer;
    }
    Img4TrustProfile longDigest = scripted;
    longDigest.digestInfo = &kQDSupportDigestInfoSha512;
    EXPECT_EQ(evaluate(sepi, record, &allCallbacks, &longDigest, &script), DERBufferOverflow);
    EXPECT_EQ(script.text(), "");
}

// The walk over a dictionary's properties

const Bytes good = property("GOOD", integer(1));

DERReturn count(DERTag tag, const Img4PropertyValue* value, std::uint32_t selector, void* context) {
    EXPECT_EQ(tag, propertyTag("GOOD"));
    EXPECT_EQ(bytesOf(value->content), Bytes{1});
    EXPECT_EQ(selector, 9U);
    ++*static_cast<unsigned*>(context);
    return DERSuccess;
}

TEST(Img4PropertyWalk, judgesEveryPropertyOrSaysWhichIsNone) {
    const Bytes content = sequence({ia5("ABCD"), integer(1)});
    const std::tuple<const char*, Bytes, DERReturn, unsigned> rows[] = {
        {"the same property twice", join({good, good}), DERSuccess, 2},
        {"value that is a SET", join({good, property("ABCD", set({}))}), DERUnexpectedTag, 1},
        {"property in an application tag", item(0x6000000000000000 + fourCC("ABCD"), content), DERUnexpectedTag, 0},
        {"element cut short", join({good, Bytes{0xFF}}), DERDecodeError, 1},
    };
    for (const auto& [name, dictionary, expected, expectedSeen] : rows) {
        const DERItem view = itemOf(dictionary);
        unsigned seen = 0;
        EXPECT_EQ(Img4DecodeEvaluateDictionaryProperties(&view, 9, count, &seen), expected) << name;
        EXPECT_EQ(seen, expectedSeen) << name;
    }
    const DERItem view = itemOf(good);
    const Img4Record record = {};
    expectNeedsAll(DERParamError, Img4DecodeEvaluateDictionaryProperties, &view, 9, count, nullptr);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateManifestProperties, &record, count, nullptr);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateObjectProperties, &record, count, nullptr);
}

// The constraints that a leaf certificate carries, of manifest or object alone
Bytes onManifest(const List& elements) {
    return set({object("MANP", elements)});
}

Bytes onObject(const List& elements) {
    return set({object("OBJP", elements)});
}

const std::tuple<const char*, Bytes, DERReturn> constraintCases[] = {
    {"none", set({}), DERSuccess},
    {"BOOLEAN met", onManifest({property("FLAG", boolean(true))}), DERSuccess},
    {"BOOLEAN broken", onManifest({property("FLAG", boolean(false))}), Img4Failure},
    {"INTEGER met", onManifest({property("NUMB", integer(0x1234))}), DERSuccess},
    {"INTEGER of another length", onManifest({property("NUMB", integer(0x12))}), Img4Failure},
    {"value of a missing property", onManifest({property("NONE", integer(1))}), DEREndOfSequence},
    {"presence met", onManifest({mustBePresent("TEXT")}), DERSuccess},
    {"presence broken", onManifest({mustBePresent("NONE")}), DEREndOfSequence},
    {"absence met", onManifest({mustBeAbsent("NONE")}), DERSuccess},
    {"absence broken", onManifest({mustBeAbsent("TEXT")}), DERUnexpectedTag},
    {"text, which constrains nothing", onManifest({property("TEXT", ia5("text"))}), DERUnexpectedTag},
    {"constraint with another name", onManifest({item(propertyTag("FLAG"), sequence({ia5("NUMB"), boolean(true)}))}),
     DERUnexpectedTag},
    {"constraint that is no property", onManifest({integer(1)}), DERDecodeError},
    {"the second broken", onManifest({property("FLAG", boolean(true)), mustBePresent("NONE")}), DEREndOfSequence},
    {"object's met", onObject({property("SIZE", integer(5)), mustBeAbsent("FLAG")}), DERSuccess},
    {"both, the object's broken",
     set({object("MANP", {mustBePresent("TEXT")}), object("OBJP", {mustBeAbsent("SIZE")})}), DERUnexpectedTag},
    {"measurement's that is nothing at all", set({item(propertyTag("manx"), {})}), DERSuccess},
    {"another kind", set({object("KIND", {})}), DERUnexpectedTag},
    {"manifest's in a SEQUENCE", set({property("MANP", sequence({}))}), DERUnexpectedTag},
    {"SEQUENCE", sequence({}), DERUnexpectedTag},
    {"no DER", {0x31}, DERDecodeError},
};

// With a listener the check goes on behind a failure, and comes to the same.
void passOver(const Img4Constraint*, void*) {}

TEST(Img4Constraints, bindManifestAndObject) {
    const Bytes manp =
        join({property("FLAG", boolean(true)), property("NUMB", integer(0x1234)), property("TEXT", ia5("text"))});
    const Bytes objp = property("SIZE", integer(5));
    for (const auto& [name, certProperties, expected] : constraintCases) {
        SCOPED_TRACE(name);
        Img4Record record = {};
        record.manp = itemOf(manp);
        record.objp = itemOf(objp);
        record.manifest.certProperties = itemOf(certProperties);
        EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), expected);
        EXPECT_EQ(Img4DecodeEvaluateCertificatePropertiesExplained(&record, passOver, nullptr), expected);
    }
}

TEST(Img4Constraints, needPropertiesToBind) {
    const Bytes ofObject = onObject({mustBePresent("SIZE")});
    const Bytes ofManifest = onManifest({mustBeAbsent("FLAG")});
    const Bytes broken = {0xFF};
    Img4Record record = {};
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERDecodeError);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateCertificateProperties, &record);
    expectNeedsAll(DERParamError, Img4DecodeEvaluateCertificatePropertiesExplained, &record, passOver, nullptr);

    record.manifest.certProperties = itemOf(ofObject);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERSuccess) << "no object was evaluated";
    record.objp = {broken.data(), 0};
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERSuccess) << "an object without properties";

    record.manifest.certProperties = itemOf(ofManifest);
    record.manp = itemOf(broken);
    EXPECT_EQ(Img4DecodeEvaluateCertificateProperties(&record), DERDecodeError) << "a search that fails finds nothing";
}

// Manifests that are signed in earnest

// Evaluates the manifest, by parts when no profile is given. Only where all is well is a property judged.
DERReturn evaluate(const Bytes& manifest, const Img4TrustProfile* profile) {
    Decoded decoded(manifest);
    unsigned judged = 0;
    const auto count = [](DERTag, const Img4PropertyValue*, std::uint32_t, void* context) {
        ++*static_cast<unsigned*>(context);
        return DERSuccess;
    };
    const DERReturn result = profile != nullptr
                                 ? Img4DecodePerformTrustEvaluation(sepi, &decoded.record, count, profile, &judged)
                                 : Img4DecodeEvaluateTrust(sepi, &decoded.record, count, &judged);
    EXPECT_EQ(judged != 0, result == DERSuccess);
    return result;
}

TEST(Img4Trust, isInWhatTheKeysOfAProfileSignAndInNothingElse) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        SCOPED_TRACE(entry.name);
        const Signer& signer = signerOf(entry);
        const Bytes chain = join(signer.standardChain());
        const Bytes demanding = signer.issue(signer.leaf({object("MANP", {property("ABCD", integer(8))})}));
        const DERItem view = itemOf(chain);
        EXPECT_EQ(evaluate(signer.manifest(standardManifest(), signer.standardChain()), entry.profile), DERSuccess);
        EXPECT_EQ(evaluate(signer.manifest(standardManifest(), signer.chainWith(demanding)), entry.profile),
                  Img4Failure);
        for (const Img4TrustProfileEntry& other : allProfiles()) {
            DERItem key, certProperties;
            EXPECT_EQ(other.profile->verifyChain(&view, &key, &certProperties, other.profile),
                      other.profile == entry.profile ? DERSuccess : Img4Failure)
                << other.name;
        }
        EXPECT_EQ(entry.profile->verifySignature == verify_signature_rsa3k,
                  entry.profile == &kImg4DecodeSecureBootRsa3kSha384);
    }
}

TEST(Img4Trust, isNotInForgeries) {
    for (const Img4TrustProfileEntry* entry : kindsOfProfile()) {
        const Signer& s = signerOf(*entry);
        const Bytes sound = s.manifest(standardManifest(), s.standardChain());
        Img4Record record;
        EXPECT_EQ(Img4DecodeInitManifest(sound.data(), sound.size(), &record), DERSuccess);
        const auto lastChangedOf = [&](const DERItem& part) {
            Bytes forgery = sound;
            forgery.at(static_cast<std::size_t>(part.data + part.length - sound.data()) - 1) ^= 1;
            return forgery;
        };
        const Bytes forgeries[] = {
            lastChangedOf(record.manifest.body),
            lastChangedOf(record.manifest.signature),
            s.manifest(standardManifest(), s.standardChain(), s.issuerKey()),
            s.manifest(standardManifest(), {}),
        };
        for (const Bytes& forgery : forgeries) {
            SCOPED_TRACE(entry->name + std::to_string(&forgery - forgeries));
            EXPECT_EQ(evaluate(forgery, entry->profile), Img4Failure);
            EXPECT_EQ(evaluate(forgery, nullptr), Img4Failure);
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
    EXPECT_EQ(evaluate(signer.manifest(standardManifest(), signer.standardChain()), nullptr), DERSuccess);
    EXPECT_EQ(evaluate(signer.manifest(standardManifest(), chain, key), nullptr), DERSuccess);
    EXPECT_EQ(evaluate(other.manifest(standardManifest(), other.standardChain()), nullptr), Img4Failure);
    leaf.extensions = {};
    EXPECT_EQ(evaluate(signer.manifest(standardManifest(), signer.chainWith(signer.issue(leaf)), key), nullptr),
              DERDecodeError);
}

} // namespace
