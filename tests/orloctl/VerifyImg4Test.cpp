#include "tools/orloctl/VerifyImg4.h"

#include "platform/Crypto.h"
#include "tests/img4/TrustDomain.h"
#include "tests/orloctl/PrintedReport.h"

#include <algorithm>
#include <regex>
#include <vector>

#include <gtest/gtest.h>

namespace {

using namespace signedmanifest;
using namespace img4maker;
using nlohmann::ordered_json;
using Report = PrintedReport;

const Img4TrustProfileEntry& ec384 = entryOf(kImg4DecodeSecureBootEc384Sha384);
const Img4TrustProfileEntry& rsa3k = entryOf(kImg4DecodeSecureBootRsa3kSha384);
const Img4TrustProfileEntry& rsa4k = entryOf(kImg4DecodeSecureBootRsa4kSha384);
const Img4TrustProfileEntry& localPolicy = entryOf(kImg4DecodeLocalPolicyEc384Sha384);

Bytes soundManifest(const Img4TrustProfileEntry& profile) {
    const Signer& signer = signerOf(profile);
    return signer.manifest(standardManifest(), signer.standardChain());
}

TrustDomain testDomain(const std::optional<std::string>& profile = std::nullopt) {
    return trustDomain(TEST_TRUST_DOMAIN, profile);
}

Report verify(const Bytes& bytes, const TrustDomain& domain = testDomain(), const std::string& object = "",
              const std::string& payloadDigest = "") {
    VerifyRequest request;
    if (!object.empty())
        request.object = fourCharacterCode("--object", object);
    if (!payloadDigest.empty())
        request.payloadDigest = fourCharacterCode("--payload-digest", payloadDigest);
    return verifyImg4({bytes.data(), bytes.size()}, domain, request);
}

// A file that is refused, and what is said of it.
struct RefusalCase {
    const char* step;
    const char* problem;
    Bytes bytes;
    const Img4TrustProfileEntry* profile = nullptr; // all of them
    const char* object = "";
    const char* payloadDigest = "";
};

// The manifest that `profile` signs with a leaf whose constraints are these.
Bytes constrained(const List& constraints, Manifest fields = standardManifest()) {
    const Signer& signer = signerOf(ec384);
    return signer.manifest(std::move(fields), signer.chainWith(signer.issue(signer.leaf(constraints))));
}

// A sound manifest that this leaf of the profile has signed.
Bytes signedBy(const Certificate& leaf, const Img4TrustProfileEntry& profile = ec384) {
    const Signer& signer = signerOf(profile);
    return signer.manifest(standardManifest(), signer.chainWith(signer.issue(leaf)));
}

// A sound manifest of `profile` whose leaf has this in a field.
Bytes withLeaf(const Img4TrustProfileEntry& profile, Bytes Certificate::*field, const Bytes& value) {
    Certificate leaf = signerOf(profile).leaf({});
    leaf.*field = value;
    return signedBy(leaf, profile);
}

// `bytes` with the first octet of `text` in it changed.
Bytes changedAt(Bytes bytes, std::string_view text) {
    const auto place = std::search(bytes.begin(), bytes.end(), text.begin(), text.end());
    if (place == bytes.end())
        throw std::runtime_error("there is no such text");
    *place ^= 1;
    return bytes;
}

Bytes withChain(const Img4TrustProfileEntry& profile, const List& chain) {
    return signerOf(profile).manifest(standardManifest(), chain);
}

Bytes withSignature(const Img4TrustProfileEntry& profile, const Bytes& signature) {
    Manifest fields = standardManifest();
    fields.certChain = join(signerOf(profile).standardChain());
    fields.signature = signature;
    return manifest(fields);
}

// A manifest whose object has digests that are and are not that of a payload.
Bytes withDigests() {
    const Bytes image = payload({});
    Bytes digest(crypto::sha384Size);
    EXPECT_TRUE(crypto::sha384(image.data(), image.size(), digest.data()));
    return constrained(
        {}, {.objects = {object("sepi", {property("DGST", octets(digest)), property("ELSE", octets(filler(48))),
                                         property("SHRT", octets({digest.begin(), digest.begin() + 20})),
                                         property("FLAG", boolean(true))})}});
}

std::vector<RefusalCase> refusalCases() {
    Certificate unusedBits = signerOf(ec384).leaf({});
    unusedBits.unusedBits = 1;
    const Bytes digests = withDigests(), image = container(payload({}), digests, {});
    return {
        {"file", "The file is empty", Bytes{}},
        {"file", "has neither a signature nor a chain", unsignedManifest({})},
        {"file", "is a bare payload", payload({})},
        {"file", "The container has no manifest", container(payload({}), {}, {})},

        {"chain", "The chain has 1 certificate, the root included", withChain(ec384, {}), &ec384},
        {"chain", "The chain has 3 certificates", withChain(ec384, List(2, signerOf(ec384).standardChain().back()))},
        {"chain", "Certificate 1 is no certificate", withChain(ec384, {sequence({integer(1)})})},
        {"chain", "Certificate 1 is no strict DER: the length is indefinite", withChain(ec384, {{0x30, 0x80}})},
        {"chain", "Certificate 1 is longer than 131071 octets", withChain(ec384, {sequence({octets(filler(131071))})})},
        {"chain", "has the key EC P-384, and the profile demands RSA without parameters", soundManifest(ec384), &rsa4k},
        {"chain", R"(CA,O=Tevari", and the one before it is the root ("CN=Tevari RSA 3072)", soundManifest(rsa4k),
         &rsa3k},
        {"chain", R"(issuer "CN=Nobody", and the one before it is certificate 1 ("CN=)",
         withLeaf(localPolicy, &Certificate::issuer, distinguishedName("Nobody"))},
        {"chain", "No known root has signed this chain",
         withLeaf(ec384, &Certificate::issuer, distinguishedName("Nobody"))},
        {"signature", "the key is no uncompressed point of its curve",
         withLeaf(ec384, &Certificate::publicKeyInfo, lastChanged(signerOf(ec384).leaf().publicKeyInfo))},
        {"signature", "the key has an even modulus or an unsound exponent", // 65536
         withLeaf(rsa3k, &Certificate::publicKeyInfo, lastChanged(signerOf(rsa3k).leaf().publicKeyInfo))},
        {"chain", "is signed with ecdsa-with-SHA256, and the profile demands ecdsa-with-SHA384",
         withLeaf(ec384, &Certificate::signatureAlgorithm, algorithm(oid(oidSha256Ecdsa)))},
        {"signature", ": the key is malformed",
         withLeaf(rsa3k, &Certificate::publicKeyInfo,
                  sequence({algorithm(oid(oidRsa), {0x05, 0x00}), bitString({1})}))},
        {"signature", ", which has 4096 bits, and the profile takes",
         withLeaf(rsa3k, &Certificate::publicKeyInfo, signerOf(rsa4k).leaf().publicKeyInfo)},
        {"chain", "is signed with sha384WithRSAEncryption and parameters, which it must not have",
         withLeaf(rsa3k, &Certificate::signatureAlgorithm, algorithm(oid(oidSha384Rsa), integer(1)))},
        {"chain",
         R"(The signature on certificate 1 ("CN=Uevari Manifest Signing,O=Tevari") does not verify under the )"
         R"(key of the root ("CN=Tevari Local P-384 Root CA,O=Tevari"): the certificate was changed)",
         changedAt(soundManifest(ec384), "Tevari Manifest Signing")},
        {"chain", "is no BIT STRING of whole octets", signedBy(unusedBits)},
        {"chain", "empty list of extensions", withLeaf(ec384, &Certificate::extensions, extensions({}))},

        {"signature", R"(Signing,O=Tevari"): the manifest's body was changed)",
         changedAt(soundManifest(ec384), "text")},
        {"signature", "it has 511 octets, and those of the key have 512", withSignature(rsa4k, filler(511))},
        {"signature", "it has not the form that the algorithm demands", withSignature(ec384, filler(48))},

        {"object", R"(The manifest has no "xyzt")", soundManifest(ec384), nullptr, "xyzt"},

        {"constraints", "The leaf certificate carries no constraints", withLeaf(ec384, &Certificate::extensions, {})},
        {"constraints", R"(says that "ABCD" of the manifest must be INTEGER 8, and it is INTEGER 7)",
         constrained({object("MANP", {property("ABCD", integer(8))})})},
        {"constraints", R"(says that "NONE" of the object must be there, and there is none)",
         constrained({object("OBJP", {mustBePresent("NONE")})}), nullptr, "sepi"},
        {"constraints", R"(says that "ABCD" of the manifest must not be there, and it is INTEGER 7)",
         constrained({object("MANP", {mustBePresent("TEXT"), mustBeAbsent("ABCD")})})},
        {"constraints", R"("ABCD" is IA5String, which is no kind of constraint)",
         constrained({object("MANP", {property("ABCD", ia5("text"))})})},
        {"constraints", R"(private "NEWP" is no dictionary of constraints)", constrained({object("NEWP", {})})},
        {"constraints", "is no strict DER: the header is cut short", constrained({object("MANP", {{0x30}})})},
        {"constraints", R"(private "MANP" is INTEGER instead of SET)", constrained({property("MANP", integer(1))})},

        {"properties", R"(private "LIST" of the manifest is SEQUENCE, and only BOOLEAN,)",
         constrained({}, {.properties = {property("LIST", sequence({}))}})},
        {"properties", R"(private "LIST" of the object is SEQUENCE)",
         constrained({}, {.objects = {object("sepi", {property("LIST", sequence({}))})}}), nullptr, "sepi"},

        {"payload", "its SHA-384 is another than \"ELSE\" of \"sepi\" demands", image, nullptr, "sepi", "ELSE"},
        {"payload", "\"SHRT\" of \"sepi\" has 20 octets, and SHA-384 has 48", image, nullptr, "sepi", "SHRT"},
        {"payload", "no sound OCTET STRING \"FLAG\" of \"sepi\"", image, nullptr, "sepi", "FLAG"},
        {"payload", "The file has no payload", digests, nullptr, "sepi", "DGST"},
    };
}

TEST(VerifyImg4, saysWhyItRefusesAndWhere) {
    const std::regex certificate("[Cc]ertificate (\\d)");
    for (const RefusalCase& row : refusalCases()) {
        const auto profile = row.profile != nullptr ? std::optional<std::string>(row.profile->name) : std::nullopt;
        const Report report = verify(row.bytes, testDomain(profile), row.object, row.payloadDigest);
        EXPECT_FALSE(report.ok()) << row.problem;
        EXPECT_NE(report.problem.find(row.problem), std::string::npos) << row.problem << "\n" << report.problem;
        EXPECT_EQ(report.json["failedStep"], row.step) << row.problem;
        std::smatch named;
        const bool namesOne = row.step == std::string("chain") && std::regex_search(report.problem, named, certificate);
        EXPECT_EQ(report.json.value("failedCertificate", 0), namesOne ? std::stoi(named[1]) : 0) << row.problem;
        EXPECT_LE(report.json["problemOffset"], row.bytes.size()) << row.problem;
        EXPECT_EQ(report.json["trusted"], false);
        EXPECT_EQ(report.json.value("payload", ""), *row.payloadDigest != '\0' ? "not the object's" : "");
    }
}

// Somebody who does not know the key must not get the words of a forged manifest onto the screen as if they counted.
TEST(VerifyImg4, showsPropertiesOnlyOnceTheSignatureWasVerified) {
    const Report forged = verify(changedAt(soundManifest(ec384), "text"), testDomain(), "sepi");
    EXPECT_FALSE(forged.json.contains("manifestProperties"));
    EXPECT_FALSE(forged.json.contains("objects"));
    EXPECT_EQ(forged.json["constraints"][0]["state"], "not checked");
    EXPECT_EQ(forged.json["chain"].size(), 2U);

    const Report incomplete = verify(soundManifest(ec384), testDomain(), "xyzt");
    EXPECT_EQ(incomplete.json["objects"], ordered_json({"boot", "sepi"}));
    EXPECT_FALSE(incomplete.json.contains("object"));
}

TEST(VerifyImg4, hostileNamesStayWithinTheLine) {
    Certificate leaf = signerOf(ec384).leaf({});
    leaf.subject = distinguishedName("a,O=b\x1B[31m\n\"+\\;<> ");
    EXPECT_EQ(verify(signedBy(leaf)).json["chain"][1]["subject"], R"(CN=a\,O=b\1B[31m\0A\"\+\\\;\<\>\ )");
    leaf.subject = sequence({integer(1), integer(2)});
    leaf.serialNumber = integer(0xC8); // with an octet before it that keeps the number positive
    const ordered_json shown = verify(signedBy(leaf)).json["chain"][1];
    EXPECT_EQ(shown["subject"], "#020101020102");
    EXPECT_EQ(shown["serialNumber"], "c8");
    const Report value = verify(constrained({}, {.properties = {property("EVIL", ia5("\x1B[2J\nresult: trusted"))}}));
    EXPECT_FALSE(value.says("\x1B") || value.says("\nresult: trusted\n"));
}

TEST(VerifyImg4, notesAMalformedValueThatTheChainVouchesFor) {
    const Report report = verify(constrained({}, {.properties = {property("BAD!", item(DERTagBoolean, {1}))}}));
    EXPECT_TRUE(report.ok()) << report.problem;
    EXPECT_EQ(report.json["notes"].size(), 1U);
    EXPECT_FALSE(report.json["notes"][0].get<std::string>().ends_with('.'));
    EXPECT_TRUE(report.says("\n  \"BAD!\" of the manifest has a value that is not DER: a BOOLEAN is 00 or FF"));
}

TEST(VerifyImg4, judgesThePayloadWhenItIsAskedTo) {
    const Report report = verify(container(payload({}), withDigests(), {}), testDomain(), "sepi", "DGST");
    EXPECT_EQ(report.json["payload"], "the object's");
    EXPECT_EQ(report.json["trusted"], true) << report.problem;
    EXPECT_TRUE(report.json.contains("object") && report.says("\nnotes: none")) << report.text;
}

TEST(VerifyImg4, boundsWhatItShows) {
    Manifest fields = standardManifest();
    for (unsigned i = 0; i < 1500; ++i)
        fields.objects.push_back(object(largeObjectName(i % 1000), {}));
    const Report report = verify(constrained({object("MANP", {property("NONE", octets(Bytes(300, 7)))})}, fields));
    const std::string demand = report.json["constraints"][0]["demand"];
    EXPECT_GT(demand.size(), 600U);
    EXPECT_FALSE(report.says(demand) || report.problem.find(demand) != std::string::npos);
    EXPECT_EQ(report.json["objects"].size(), 1502U);
    EXPECT_TRUE(report.says(" and 502 more\n"));

    const Report chain = verify(withChain(ec384, List(150, sequence({}))));
    EXPECT_EQ(chain.json["chain"].size(), 101U); // with the root
    EXPECT_TRUE(chain.says("50 further certificates are not shown"));
}

} // namespace
