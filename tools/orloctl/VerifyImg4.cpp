#include "tools/orloctl/VerifyImg4.h"

#include <algorithm>

#include "tools/orloctl/CertificateText.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Words.h"
#include "tools/orloctl/LocalFiles.h"
#include "tools/orloctl/ShowFile.h"
#include "tools/orloctl/TrustWords.h"

namespace {

using nlohmann::ordered_json;

constexpr std::size_t mostCertificates = 100;
constexpr DERTag manifestPropertiesTag = Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'P'));

bool areEqual(const DERItem& one, const DERItem& other) {
    return std::equal(one.data, one.data + one.length, other.data, other.data + other.length);
}

DERReturn agree(DERTag, const Img4PropertyValue*, std::uint32_t, void*) {
    return DERSuccess;
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
        : domain_(domain), request_(request), report_(report), findings_(file, report) {}

    void run() {
        report_.json = {{"length", findings_.file().length}, {"trustDomain", domain_.name}, {"trusted", false}};
        if (readFile()) {
            for (DerItems items(record_.manifest.certChain); items.next(); ++count_)
                if (count_ < mostCertificates)
                    certificates_.push_back(items.encoding());
            if (const auto evaluation = evaluate())
                describe(*evaluation);
            else
                refuseRoot();
        }
        report_.json["notes"] = findings_.notes();
    }

private:
    void refuse(const char* step, const std::uint8_t* place, const std::string& reason) {
        report_.json["failedStep"] = step;
        findings_.fault(place, reason);
    }

    bool readFile() {
        const std::uint8_t* const file = findings_.file().data;
        report_.json["kind"] = kindName(Img4KindUnknown);
        (void)isPem(findings_); // that says more than what is no DER about it
        const Img4Kind kind = readImg4(findings_, &record_);
        report_.json["kind"] = kindName(kind);
        if (kind == Img4KindUnsignedManifest)
            findings_.fault(file, "The manifest has neither a signature nor a chain");
        else if (kind == Img4KindPayload)
            findings_.fault(file, "The file is a bare payload, and only a manifest is signed");
        else if (record_.manifestRaw.data == nullptr)
            findings_.fault(file, "The container has no manifest, so that nothing vouches for its payload");
        if (!report_.ok())
            report_.json["failedStep"] = "file";
        return report_.ok();
    }

    // Under the profiles whose root the first certificate names as its issuer, and under all of them when that cannot
    // be told: the first that trusts the manifest, else the one that has come furthest. None when there are several and
    // it names the root of none. Every property is agreed to.
    std::optional<TrustEvaluation> evaluate() const {
        const Img4TrustCallbacks callbacks = {agree, nullptr, nullptr};
        const auto first = certificates_.empty() ? std::nullopt : readCertificate(certificates_.front());
        std::optional<TrustEvaluation> best;
        for (const DomainProfile& profile : domain_.profiles) {
            const auto root = readCertificate(profile.made.root);
            if (domain_.profiles.size() > 1 && first && !(root && areEqual(first->tbs.issuer, root->tbs.subject)))
                continue;
            TrustEvaluation evaluation = {&profile, record_, {}, DERSuccess};
            evaluation.status = Img4DecodePerformTrustEvaluationExplained(
                request_.object ? &*request_.object : nullptr, &evaluation.record, &callbacks, &profile.made.profile,
                nullptr, &evaluation.refusal);
            if (evaluation.status == DERSuccess)
                return evaluation;
            if (!best || progressOf(evaluation) > progressOf(*best))
                best = evaluation;
        }
        return best;
    }

    void refuseRoot() {
        const auto first = readCertificate(certificates_.front());
        refuse("chain", certificates_.front().data,
               "No known root has signed this chain: certificate 1 (" + quotedText(nameText(first->tbs.subject)) +
                   ") names the issuer " + quotedText(nameText(first->tbs.issuer)) +
                   ", and no root of the trust domain has that name");
        report_.json["failedCertificate"] = 1;
        addChain(nullptr);
    }

    void describe(const TrustEvaluation& evaluation) {
        const Img4TrustProfileEntry& entry = *evaluation.profile->entry;
        const Img4TrustRefusal& refusal = evaluation.refusal;
        report_.json["profile"] = entry.name;
        report_.json["root"] = entry.rootName;
        TrustConstraints constraints = readConstraints(evaluation.record);
        if (evaluation.status != DERSuccess) {
            const auto [step, reason] = explainRefusal(evaluation, certificates_, count_, constraints);
            refuse(step, refusal.refusal.place, reason);
            if (refusal.refusal.subject == Img4SubjectChain && refusal.chain.fault != Img4ChainLength)
                report_.json["failedCertificate"] = refusal.chain.certificate;
        }
        addChain(evaluation.profile);
        if (evaluation.record.manifest.certProperties.data != nullptr)
            report_.json["constraints"] = std::move(constraints.rows);
        addDigests(evaluation);
        addProperties(evaluation.record);
        if (evaluation.status == DERSuccess && request_.payloadDigest)
            judgePayload(evaluation);
        if (!report_.ok())
            return;
        report_.json["trusted"] = true;
        report_.json["result"] = "trusted under " + std::string(entry.name) +
                                 ": the chain ends in a known root, the manifest's signature verifies, and the leaf's "
                                 "constraints on the manifest " +
                                 (request_.object ? "and on \"" + codeText(*request_.object) + "\" " : "") + "are met" +
                                 (request_.payloadDigest ? ", and the payload is the object's" : "");
    }

    void addChain(const DomainProfile* profile) {
        ordered_json chain = ordered_json::array();
        if (profile != nullptr) {
            chain.push_back({{"number", 0}, {"role", "root"}});
            chain.back().update(certificateJson(profile->made.root));
        }
        for (std::size_t i = 0; i < certificates_.size(); ++i) {
            chain.push_back({{"number", i + 1},
                             {"role", i + 1 == count_ ? "leaf" : "intermediate"},
                             {"offset", findings_.offsetOf(certificates_[i].data)},
                             {"length", certificates_[i].length}});
            chain.back().update(certificateJson(certificates_[i]));
        }
        report_.json["chain"] = std::move(chain);
        if (count_ > certificates_.size())
            findings_.note(std::to_string(count_ - certificates_.size()) + " further certificates are not shown");
    }

    void addDigests(const TrustEvaluation& evaluation) {
        const Img4Record& record = evaluation.record;
        const Img4Refusal& refusal = evaluation.refusal.refusal;
        const std::uint64_t length = evaluation.profile->made.profile.digestInfo->length;
        ordered_json& digests = report_.json["digests"] = {{"algorithm", digestName(length)}};
        if (record.manifestHashed != 0)
            digests["manifest"] = hexText({record.manifest.digest, length});
        if (refusal.fault == Img4FaultNone || refusal.subject > Img4SubjectBodyDigest)
            digests["body"] = hexText({record.manifest.bodyDigest, length});
        if (record.payloadHashed != 0)
            digests["payload"] = hexText({record.payload.digest, length});
    }

    void addProperties(const Img4Record& record) {
        if (record.manp.data == nullptr)
            return;
        report_.json["manifestProperties"] = properties(record.manp, "the manifest");
        report_.json["objects"] = objects(record.manb);
        if (record.objp.data != nullptr)
            report_.json["object"] = {{"name", codeText(*request_.object)},
                                      {"properties", properties(record.objp, "the object")}};
        if (record.payloadHashed == 0 || request_.payloadDigest)
            return;
        report_.json["payload"] = "not judged";
        findings_.note(record.objp.data == nullptr
                           ? "No object was named, so nothing says that the payload belongs to this manifest"
                           : "Whether the payload is this object's was not judged: name the property with the "
                             "payload's digest (--payload-digest)");
    }

    // What is wrong with a value is no reason against trust, which is about who says it; but it is worth a note.
    ordered_json properties(const DERItem& dictionary, const std::string& where) {
        Report shown;
        Findings findings(findings_.file(), shown);
        ordered_json json = report_.lists.add(readProperties(dictionary, where, findings));
        if (!shown.ok() && report_.ok())
            findings_.note(shown.problem.substr(0, shown.problem.size() - 1));
        return json;
    }

    ordered_json objects(const DERItem& manb) {
        return report_.lists.add([manb](const auto& take) {
            for (DerItems items(manb); items.next();) {
                const std::uint64_t code = items.item().tag & DERTagNumberMask;
                if (items.item().tag == Img4PropertyTag(code) && items.item().tag != manifestPropertiesTag &&
                    !take({codeText(code), {}}))
                    return;
            }
        });
    }

    // Whether the payload is the one that the trusted object speaks of.
    void judgePayload(const TrustEvaluation& evaluation) {
        const Img4Record& record = evaluation.record;
        const std::uint64_t length = evaluation.profile->made.profile.digestInfo->length;
        const std::string digest = digestName(length);
        const DERTag tag = Img4PropertyTag(*request_.payloadDigest);
        const std::string demand = codeText(*request_.payloadDigest, "\"") + " of " + codeText(*request_.object, "\"");
        Img4Property property = {};
        std::string reason;
        if (record.payloadHashed == 0)
            reason = "The file has no payload that could be compared with " + demand;
        else if (DERImg4DecodeFindProperty(&record.objp, tag, DERTagOctetString, &property) != DERSuccess)
            reason = "The payload cannot be compared: there is no sound OCTET STRING " + demand;
        else if (property.value.length != length)
            reason = "The digest in " + demand + " has " + std::to_string(property.value.length) + " octets, and " +
                     digest + " has " + std::to_string(length);
        else if (!areEqual({record.payload.digest, length}, property.value))
            reason = "The payload is not the object's: its " + digest + " is another than " + demand + " demands";
        report_.json["payload"] = reason.empty() ? "the object's" : "not the object's";
        if (!reason.empty())
            refuse("payload", property.value.data != nullptr ? property.value.data : record.objp.data, reason);
    }

    const TrustDomain& domain_;
    const VerifyRequest& request_;
    Report& report_;
    Findings findings_;
    Img4Record record_ = {};
    std::vector<DERItem> certificates_; // without the root, as far as they are strict DER and shown
    std::uint64_t count_ = 0;           // of all of them
};

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
