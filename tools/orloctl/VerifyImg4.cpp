#include "tools/orloctl/VerifyImg4.h"

#include <algorithm>

#include "tools/orloctl/CertificateText.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"
#include "tools/orloctl/Img4Properties.h"
#include "tools/orloctl/Img4Words.h"
#include "tools/orloctl/LocalFiles.h"
#include "tools/orloctl/ShowFile.h"
#include "tools/orloctl/TrustConstraints.h"
#include "tools/orloctl/TrustEvaluation.h"

namespace {

using nlohmann::ordered_json;

constexpr DERTag manifestPropertiesTag = Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'P'));

bool areEqual(const DERItem& one, const DERItem& other) {
    return std::equal(one.data, one.data + one.length, other.data, other.data + other.length);
}

// How far an evaluation has come, for comparison: certificates are counted before they are looked at.
std::pair<int, std::uint32_t> progressOf(const TrustEvaluation& evaluation) {
    const Img4ChainRefusal& chain = evaluation.refusal.chain;
    if (evaluation.refusal.refusal.subject != Img4SubjectChain)
        return {Img4ChainExtensions + 1, 0};
    return {chain.fault == Img4ChainLength ? 0 : chain.fault, chain.certificate};
}

const char* digestName(std::uint64_t length) {
    return length == 20 ? "SHA-1" : length == 32 ? "SHA-256" : "SHA-384";
}

class Verification {
public:
    // The findings go into `report`.
    Verification(const DERItem& file, const TrustDomain& domain, const VerifyRequest& request, Report& report)
        : file_(file),
          domain_(domain),
          object_(request.object),
          payloadDigest_(request.payloadDigest),
          report_(report) {}

    void run();

private:
    bool readFile();
    std::optional<TrustEvaluation> evaluate() const;
    std::vector<const DomainProfile*> candidates() const;

    void refuse(const TrustRefusal& refusal);
    void refuseUnknownRoot();
    void describe(const TrustEvaluation& evaluation);
    void addChain(const DomainProfile* profile);
    void addConstraints(const Img4Record& record);
    void addDigests(const TrustEvaluation& evaluation);
    void addProperties(const TrustEvaluation& evaluation);
    void judgePayload(const TrustEvaluation& evaluation);
    void addObjects(const DERItem& manb);
    ordered_json properties(const DERItem& dictionary, const std::string& where);
    void note(const std::string& text) { notes_.push_back(text); }

    DERItem file_;
    const TrustDomain& domain_;
    std::optional<std::uint32_t> object_;
    std::optional<std::uint32_t> payloadDigest_;
    Report& report_;
    Img4Record record_ = {};
    std::vector<DERItem> certificates_; // without the root
    std::uint64_t count_ = 0;           // of all of them
    ordered_json notes_ = ordered_json::array();
};

void Verification::refuse(const TrustRefusal& refusal) {
    const std::ptrdiff_t offset = refusal.place - file_.data;
    report_.ok = false;
    report_.problem = refusal.reason + " (at offset " + std::to_string(offset) + ").";
    report_.json["failedStep"] = refusal.step;
    if (refusal.certificate)
        report_.json["failedCertificate"] = *refusal.certificate;
    report_.json["problemOffset"] = offset;
}

bool Verification::readFile() {
    Img4Kind kind = Img4KindUnknown;
    Img4Refusal refusal = {};
    refusal.place = file_.data;
    const DERReturn result = Img4DecodeInitExplained(file_.data, file_.length, &record_, &kind, &refusal);
    report_.json["kind"] = img4show::kindName(kind);
    const std::string pem = pemProblem(file_);
    std::string reason;
    if (result != DERSuccess)
        reason = img4show::fileReason(file_, refusal);
    else if (kind == Img4KindUnsignedManifest)
        reason = "The manifest has neither a signature nor a chain";
    else if (kind == Img4KindPayload)
        reason = "The file is a bare payload, and only a manifest is signed";
    else if (record_.manifestRaw.data == nullptr)
        reason = "The container has no manifest, so that nothing vouches for its payload";
    else
        return true;
    refuse({"file", reason, result != DERSuccess ? refusal.place : file_.data, std::nullopt});
    if (!pem.empty())
        report_.problem = pem;
    return false;
}

// The profiles whose root the first certificate names as its issuer, and all of them when that cannot be told. None
// when there are several and it names the root of none.
std::vector<const DomainProfile*> Verification::candidates() const {
    const auto first = certificates_.empty() ? std::nullopt : readCertificate(certificates_.front());
    std::vector<const DomainProfile*> named;
    for (const DomainProfile& profile : domain_.profiles) {
        const auto root = readCertificate(profile.made.root);
        if (domain_.profiles.size() == 1 || !first || (root && areEqual(first->tbs.issuer, root->tbs.subject)))
            named.push_back(&profile);
    }
    return named;
}

// The first that trusts the manifest, else the one that has come furthest.
std::optional<TrustEvaluation> Verification::evaluate() const {
    std::optional<TrustEvaluation> best;
    for (const DomainProfile* profile : candidates()) {
        const TrustEvaluation evaluation = evaluateTrust(record_, *profile, object_);
        if (evaluation.status == DERSuccess)
            return evaluation;
        if (!best || progressOf(evaluation) > progressOf(*best))
            best = evaluation;
    }
    return best;
}

void Verification::refuseUnknownRoot() {
    const auto first = readCertificate(certificates_.front());
    refuse({"chain",
            "No known root has signed this chain: its first certificate (\"" + nameText(first->tbs.subject) +
                "\") names the issuer \"" + nameText(first->tbs.issuer) +
                "\", and no root of the trust domain has "
                "that name",
            certificates_.front().data, 1});
}

void Verification::addChain(const DomainProfile* profile) {
    ordered_json chain = ordered_json::array();
    if (profile != nullptr) {
        chain.push_back({{"number", 0}, {"role", "root"}});
        chain.back().update(certificateJson(profile->made.root));
    }
    for (std::size_t i = 0; i < certificates_.size(); ++i) {
        chain.push_back({{"number", i + 1},
                         {"role", i + 1 == count_ ? "leaf" : "intermediate"},
                         {"offset", certificates_[i].data - file_.data},
                         {"length", certificates_[i].length}});
        chain.back().update(certificateJson(certificates_[i]));
    }
    report_.json["chain"] = std::move(chain);
    if (count_ > certificates_.size())
        note(std::to_string(count_ - certificates_.size()) + " further certificates are not shown");
}

void Verification::addConstraints(const Img4Record& record) {
    constexpr const char* states[] = {"met", "broken", "not checked"};
    if (record.manifest.certProperties.data == nullptr)
        return;
    ordered_json constraints = ordered_json::array();
    for (const TrustConstraint& constraint : readConstraints(record)) {
        constraints.push_back({{"dictionary", constraint.dictionary},
                               {"name", constraint.name},
                               {"demand", constraint.demand},
                               {"state", states[constraint.state]}});
        if (!constraint.found.empty())
            constraints.back()["found"] = constraint.found;
    }
    report_.json["constraints"] = std::move(constraints);
}

void Verification::addDigests(const TrustEvaluation& evaluation) {
    const Img4Record& record = evaluation.record;
    const std::uint64_t length = evaluation.profile->made.profile.digestInfo->length;
    ordered_json digests = {{"algorithm", digestName(length)}};
    if (record.manifestHashed != 0)
        digests["manifest"] = hexText({record.manifest.digest, length}, length);
    if (evaluation.refusal.refusal.fault == Img4FaultNone || evaluation.refusal.refusal.subject > Img4SubjectBodyDigest)
        digests["body"] = hexText({record.manifest.bodyDigest, length}, length);
    if (record.payloadHashed != 0)
        digests["payload"] = hexText({record.payload.digest, length}, length);
    report_.json["digests"] = std::move(digests);
}

// What is wrong with a value is no reason against trust, which is about who says it; but it is worth a note.
ordered_json Verification::properties(const DERItem& dictionary, const std::string& where) {
    Report shown;
    img4show::Findings findings(file_, shown);
    ordered_json json = report_.lists.add(img4show::readProperties(dictionary, where, findings));
    if (!shown.ok && report_.ok)
        note(shown.problem.substr(0, shown.problem.size() - 1));
    return json;
}

void Verification::addObjects(const DERItem& manb) {
    report_.json["objects"] = report_.lists.add([manb](const auto& take) {
        for (DerItems items(manb); items.next();) {
            const std::uint64_t code = items.item().tag & DERTagNumberMask;
            if (items.item().tag == Img4PropertyTag(code) && items.item().tag != manifestPropertiesTag &&
                !take({codeText(code), {}}))
                return;
        }
    });
}

void Verification::addProperties(const TrustEvaluation& evaluation) {
    const Img4Record& record = evaluation.record;
    if (record.manp.data == nullptr)
        return;
    report_.json["manifestProperties"] = properties(record.manp, "the manifest");
    addObjects(record.manb);
    if (record.objp.data != nullptr)
        report_.json["object"] = {{"name", codeText(*object_)}, {"properties", properties(record.objp, "the object")}};
    if (record.payloadHashed == 0 || payloadDigest_)
        return;
    report_.json["payload"] = "not judged";
    note(record.objp.data == nullptr
             ? "No object was named, so nothing says that the payload belongs to this manifest"
             : "Whether the payload is this object's was not judged: name the property with the payload's digest "
               "(--payload-digest)");
}

// Whether the payload is the one that the trusted object speaks of.
void Verification::judgePayload(const TrustEvaluation& evaluation) {
    const Img4Record& record = evaluation.record;
    const std::uint64_t length = evaluation.profile->made.profile.digestInfo->length;
    const std::string demand = quotedCode(*payloadDigest_) + " of " + quotedCode(*object_);
    Img4Property property;
    std::string reason;
    const std::uint8_t* place = record.objp.data;
    if (record.payloadHashed == 0)
        reason = "The file has no payload that could be compared with " + demand;
    else if (DERImg4DecodeFindProperty(&record.objp, Img4PropertyTag(*payloadDigest_), DERTagOctetString, &property) !=
             DERSuccess)
        reason = quotedCode(*object_) + " has no sound property " + quotedCode(*payloadDigest_) +
                 " with an OCTET STRING, with which the payload could be compared";
    else if (place = property.value.data; property.value.length != length)
        reason = "The digest in " + demand + " has " + std::to_string(property.value.length) + " octets, and " +
                 digestName(length) + " has " + std::to_string(length);
    else if (!areEqual({record.payload.digest, length}, property.value))
        reason = "The payload is not the object's: its " + std::string(digestName(length)) + " is another than " +
                 demand + " demands";
    report_.json["payload"] = reason.empty() ? "the object's" : "not the object's";
    if (!reason.empty())
        refuse({"payload", reason, place, std::nullopt});
}

void Verification::describe(const TrustEvaluation& evaluation) {
    const Img4TrustProfileEntry& entry = *evaluation.profile->entry;
    report_.json["profile"] = entry.name;
    report_.json["root"] = entry.rootName;
    if (evaluation.status != DERSuccess)
        refuse(explainRefusal(evaluation));
    addChain(evaluation.profile);
    addConstraints(evaluation.record);
    addDigests(evaluation);
    addProperties(evaluation);
    if (evaluation.status == DERSuccess && payloadDigest_)
        judgePayload(evaluation);
    if (!report_.ok)
        return;
    report_.json["trusted"] = true;
    report_.json["result"] = "trusted under " + std::string(entry.name) +
                             ": the chain ends in a known root, the manifest's signature verifies, and the leaf's "
                             "constraints on the manifest " +
                             (object_ ? "and on \"" + codeText(*object_) + "\" " : "") + "are met" +
                             (payloadDigest_ ? ", and the payload is the object's" : "");
}

void Verification::run() {
    report_.json["length"] = file_.length;
    report_.json["trustDomain"] = domain_.name;
    report_.json["trusted"] = false;
    if (readFile()) {
        certificates_ = certificatesOf(record_.manifest.certChain, &count_);
        if (const auto evaluation = evaluate()) {
            describe(*evaluation);
        } else {
            refuseUnknownRoot();
            addChain(nullptr);
        }
    }
    report_.json["notes"] = std::move(notes_);
}

} // namespace

Report verifyImg4(const DERItem& file, const TrustDomain& domain, const VerifyRequest& request) {
    Report report;
    Verification(file, domain, request, report).run();
    return report;
}

std::uint32_t fourCharacterCode(const std::string& option, const std::string& text) {
    const auto isPrintable = [](char character) { return character >= 0x20 && character <= 0x7E; };
    if (text.size() != 4 || !std::all_of(text.begin(), text.end(), isPrintable))
        throw UsageError(option + " takes four characters, such as sepi");
    return Img4FourCC(text[0], text[1], text[2], text[3]);
}
