#include "tools/orloctl/TrustDomain.h"

#include <filesystem>

#include "tools/orloctl/CertificateText.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

constexpr DERTag printableString = 19;

std::vector<const Img4TrustProfileEntry*> entriesNamed(const std::optional<std::string>& profile) {
    std::vector<const Img4TrustProfileEntry*> entries;
    std::string known;
    for (std::uint16_t i = 0; i < Img4NumTrustProfiles; ++i) {
        const Img4TrustProfileEntry& entry = Img4TrustProfiles[i];
        known += std::string("\n  ") + entry.name;
        if (!profile || *profile == entry.name)
            entries.push_back(&entry);
    }
    if (entries.empty())
        throw UsageError("There is no profile \"" + *profile + "\"; there are" + known);
    return entries;
}

DomainProfile makeProfile(const Img4TrustProfileEntry& entry, const DERItem& root, const Img4TrustDomain& domain) {
    DomainProfile profile = {&entry, {}};
    Img4DecodeMakeDomainProfile(&entry, &root, &domain, &profile.made);
    return profile;
}

// Reads the file of a domain, which keeps it, and the content of the one item with the tag `tag` that fills it.
DERItem readItem(TrustDomain& domain, const std::string& path, DERTag tag, const char* what, DERItem* content) {
    domain.files.push_back(std::make_unique<const Value::Data>(readLocalFile(path)));
    const DERItem file = {domain.files.back()->data(), domain.files.back()->size()};
    DerItems items(file);
    if (!items.next() || items.item().tag != tag || items.encoding().length != file.length ||
        (tag == DERTagSequence && !readCertificate(file)))
        throw UsageError(path + " is not one " + what + " in DER");
    *content = items.item().content;
    return file;
}

} // namespace

TrustDomain builtInTrustDomain(const std::optional<std::string>& profile) {
    TrustDomain domain = {"built in", {}, {}};
    for (const Img4TrustProfileEntry* entry : entriesNamed(profile))
        domain.profiles.push_back(makeProfile(*entry, *entry->root, Img4BuiltInTrustDomain));
    return domain;
}

TrustDomain readTrustDomain(const std::string& folder, const std::optional<std::string>& profile) {
    TrustDomain domain = {folder, {}, {}};
    Img4TrustDomain names = {};
    DERItem content;
    const auto entries = entriesNamed(profile);
    names.authorityName =
        readItem(domain, folder + "/authority-name.der", printableString, "PrintableString", &content);
    readItem(domain, folder + "/manifest-cert-spec-oid.der", DERTagObjectIdentifier, "OBJECT IDENTIFIER",
             &names.manifestCertSpecOid);
    for (const Img4TrustProfileEntry* entry : entries) {
        const std::string path = folder + "/" + entry->rootName + ".der";
        std::error_code problem; // a root that is there and cannot be looked at is not passed over
        if (profile || std::filesystem::exists(path, problem) || problem)
            domain.profiles.push_back(
                makeProfile(*entry, readItem(domain, path, DERTagSequence, "certificate", &content), names));
    }
    if (domain.profiles.empty())
        throw UsageError(folder + " has no root of any profile");
    return domain;
}
