#include "tools/orloctl/TrustDomain.h"

#include <filesystem>

#include "der/DERDecode.h"
#include "tools/orloctl/CertificateText.h"
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

DERItem viewOf(const Value::Data& data) {
    return {data.data(), data.size()};
}

// The content of the one item with the tag `tag` that fills the file.
DERItem wholeItem(const std::string& path, const Value::Data& file, DERTag tag, const char* what) {
    const DERItem encoding = viewOf(file);
    DERDecodedInfo item;
    if (DERDecodeItem(&encoding, &item) != DERSuccess || item.tag != tag ||
        item.content.data + item.content.length != encoding.data + encoding.length)
        throw UsageError(path + " is not one " + what + " in DER");
    return item.content;
}

// Reads the files of a domain, which keeps them.
class Reader {
public:
    Reader(std::string folder, TrustDomain& domain) : folder_(std::move(folder)), domain_(domain) {}

    Img4TrustDomain names();
    DERItem root(const Img4TrustProfileEntry& entry);
    bool hasRoot(const Img4TrustProfileEntry& entry) const;

private:
    std::string path(const std::string& file) const { return folder_ + "/" + file; }
    std::string rootPath(const Img4TrustProfileEntry& entry) const {
        return path(std::string(entry.rootName) + ".der");
    }
    const Value::Data& read(const std::string& file);

    std::string folder_;
    TrustDomain& domain_;
};

const Value::Data& Reader::read(const std::string& file) {
    return *domain_.files.emplace_back(std::make_unique<const Value::Data>(readLocalFile(file)));
}

// A root that is there and cannot be looked at is not passed over.
bool Reader::hasRoot(const Img4TrustProfileEntry& entry) const {
    std::error_code problem;
    return std::filesystem::exists(rootPath(entry), problem) || problem;
}

Img4TrustDomain Reader::names() {
    const std::string authority = path("authority-name.der");
    const std::string oid = path("manifest-cert-spec-oid.der");
    const Value::Data& name = read(authority);
    wholeItem(authority, name, printableString, "PrintableString");
    return {viewOf(name), wholeItem(oid, read(oid), DERTagObjectIdentifier, "OBJECT IDENTIFIER")};
}

DERItem Reader::root(const Img4TrustProfileEntry& entry) {
    const Value::Data& certificate = read(rootPath(entry));
    wholeItem(rootPath(entry), certificate, DERTagSequence, "certificate");
    if (!readCertificate(viewOf(certificate)))
        throw UsageError(rootPath(entry) + " is not one certificate in DER");
    return viewOf(certificate);
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
    Reader reader(folder, domain);
    const auto entries = entriesNamed(profile);
    const Img4TrustDomain names = reader.names();
    for (const Img4TrustProfileEntry* entry : entries)
        if (profile || reader.hasRoot(*entry))
            domain.profiles.push_back(makeProfile(*entry, reader.root(*entry), names));
    if (domain.profiles.empty())
        throw UsageError(folder + " has no root of any profile");
    return domain;
}
