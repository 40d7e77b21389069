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

TrustDomain trustDomain(const std::optional<std::string>& folder, const std::optional<std::string>& profile) {
    TrustDomain domain = {folder.value_or("built in"), {}, {}};
    Img4TrustDomain names = Img4BuiltInTrustDomain;
    DERItem content;
    const auto entries = entriesNamed(profile);
    if (folder) {
        names.authorityName =
            readItem(domain, *folder + "/authority-name.der", printableString, "PrintableString", &content);
        readItem(domain, *folder + "/manifest-cert-spec-oid.der", DERTagObjectIdentifier, "OBJECT IDENTIFIER",
                 &names.manifestCertSpecOid);
    }
    for (const Img4TrustProfileEntry* entry : entries) {
        const std::string path = domain.name + "/" + entry->rootName + ".der";
        std::error_code problem; // a root that is there and cannot be looked at is not passed over
        if (folder && !profile && !std::filesystem::exists(path, problem) && !problem)
            continue;
        const DERItem root = folder ? readItem(domain, path, DERTagSequence, "certificate", &content) : *entry->root;
        domain.profiles.push_back({entry, {}});
        Img4DecodeMakeDomainProfile(entry, &root, &names, &domain.profiles.back().made);
    }
    if (domain.profiles.empty())
        throw UsageError(domain.name + " has no root of any profile");
    return domain;
}
