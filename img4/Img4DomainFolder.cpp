#include "img4/Img4DomainFolder.h"

#include <cstdio>
#include <cstring>

#include "der/DERDecode.h"
#include "der/DERItemSpecs.h"

namespace {

constexpr DERTag printableString = 19;

bool isCertificate(const DERItem& encoding) {
    DERSignedCertCrl fields;
    DERTBSCert tbs;
    return DERParseSequence(&encoding, DERNumSignedCertCrlItemSpecs, DERSignedCertCrlItemSpecs, &fields,
                            sizeof fields) == DERSuccess &&
           DERParseSequence(&fields.tbs, DERNumTBSCertItemSpecs, DERTBSCertItemSpecs, &tbs, sizeof tbs) == DERSuccess;
}

struct Folder {
    Img4DomainFileReader read;
    void* context;
    Img4DomainFile* file;

    // Reads a file, and the content of the one item with the tag `tag` that fills it.
    DERReturn readItem(const char* name, DERTag tag, const char* kind, bool mayBeMissing, DERItem* whole,
                       DERItem* content) const {
        snprintf(file->name, sizeof file->name, "%s.der", name);
        file->kind = kind;
        if (const DERReturn status = read(file->name, mayBeMissing, whole, context); status != DERSuccess)
            return status;
        DERDecodedInfo item;
        if (DERDecodeItem(whole, &item) != DERSuccess || item.tag != tag ||
            item.content.data + item.content.length != whole->data + whole->length)
            return DERDecodeError;
        *content = item.content;
        return DERSuccess;
    }

    DERReturn readRoot(const char* name, bool mayBeMissing, DERItem* root) const {
        DERItem content;
        const DERReturn status = readItem(name, DERTagSequence, "certificate", mayBeMissing, root, &content);
        return status == DERSuccess && !isCertificate(*root) ? DERDecodeError : status;
    }
};

bool isKnown(const char* profile) {
    for (uint16_t i = 0; i < Img4NumTrustProfiles; ++i)
        if (strcmp(Img4TrustProfiles[i].name, profile) == 0)
            return true;
    return false;
}

} // namespace

DERReturn Img4ReadDomainFolder(const char* profile, Img4DomainFileReader read, void* context,
                               Img4FolderProfile* profiles, uint16_t* count, Img4DomainFile* file) {
    const Folder folder = {read, context, file};
    Img4TrustDomain domain = Img4BuiltInTrustDomain;
    DERItem whole = {};
    DERItem content = {};
    DERReturn status = DERSuccess;
    *count = 0;
    if (profile != nullptr && !isKnown(profile))
        return DERParamError;
    if (read != nullptr)
        status = folder.readItem("authority-name", printableString, "PrintableString", false, &domain.authorityName,
                                 &content);
    if (read != nullptr && status == DERSuccess)
        status = folder.readItem("manifest-cert-spec-oid", DERTagObjectIdentifier, "OBJECT IDENTIFIER", false, &whole,
                                 &domain.manifestCertSpecOid);
    for (uint16_t i = 0; i < Img4NumTrustProfiles && status == DERSuccess; ++i) {
        const Img4TrustProfileEntry& entry = Img4TrustProfiles[i];
        if (profile != nullptr && strcmp(profile, entry.name) != 0)
            continue;
        whole = *entry.root;
        if (read != nullptr)
            status = folder.readRoot(entry.rootName, profile == nullptr, &whole);
        if (status == DERSuccess) {
            Img4FolderProfile& made = profiles[(*count)++];
            made.entry = &entry;
            Img4DecodeMakeDomainProfile(&entry, &whole, &domain, &made.made);
        } else if (status == DEREndOfSequence) {
            status = DERSuccess;
        }
    }
    return status == DERSuccess && *count == 0 ? DEREndOfSequence : status;
}
