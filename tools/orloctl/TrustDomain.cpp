#include "tools/orloctl/TrustDomain.h"

#include <filesystem>

#include "tools/orloctl/LocalFiles.h"

namespace {

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

// Reads a file for a domain, which keeps it and has the folder's name.
DERReturn readFile(const char* name, bool mayBeMissing, DERItem* contents, void* context) {
    TrustDomain& domain = *static_cast<TrustDomain*>(context);
    const std::string path = domain.name + "/" + name;
    std::error_code problem; // a root that is there and cannot be looked at is not passed over
    if (mayBeMissing && !std::filesystem::exists(path, problem) && !problem)
        return DEREndOfSequence;
    domain.files.push_back(std::make_unique<const Value::Data>(readLocalFile(path)));
    *contents = {domain.files.back()->data(), domain.files.back()->size()};
    return DERSuccess;
}

} // namespace

TrustDomain trustDomain(const std::optional<std::string>& folder, const std::optional<std::string>& profile) {
    TrustDomain domain = {folder.value_or("built in"), {}, {}};
    Img4DomainFile file;
    std::uint16_t count = 0;
    domain.profiles.resize(entriesNamed(profile).size());
    const DERReturn status = Img4ReadDomainFolder(profile ? profile->c_str() : nullptr, folder ? readFile : nullptr,
                                                  &domain, domain.profiles.data(), &count, &file);
    if (status == DEREndOfSequence)
        throw UsageError(domain.name + " has no root of any profile");
    if (status != DERSuccess)
        throw UsageError(domain.name + "/" + file.name + " is not one " + file.kind + " in DER");
    domain.profiles.resize(count);
    return domain;
}
