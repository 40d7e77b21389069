// The folder of a trust domain, as scripts/make-trust-domain makes it: which files it has, and what must be in them.
// Linked into programs, not part of the library.
#ifndef VELTRA_IMG4_DOMAINFOLDER_H
#define VELTRA_IMG4_DOMAINFOLDER_H

#include "img4/Img4Trust.h"

#ifdef __cplusplus
extern "C" {
#endif

// A trust profile with the root of one domain.
typedef struct Img4FolderProfile {
    const Img4TrustProfileEntry* entry;
    Img4DomainProfile made;
} Img4FolderProfile;

// Gives out the contents of the folder's file `name`; they stay for as long as the profiles are used. Returns
// DEREndOfSequence, when the file may be missing, if it is; anything else but DERSuccess ends the reading. In C++ it
// may throw.
typedef DERReturn (*Img4DomainFileReader)(const char* name, bool mayBeMissing, DERItem* contents, void* context);

// The file at which the reading ended, and what its name says is in it.
typedef struct Img4DomainFile {
    char name[128];
    const char* kind; // "certificate", for instance
} Img4DomainFile;

// Makes the profile of that name, or without a name those whose roots are in the folder, in the order of
// Img4TrustProfiles, which `profiles` has room for all of. Without a reader they are those of the built-in domain.
// Returns DERParamError for a name that no profile has, before anything is read, the reader's result, DERDecodeError
// for a file that is not one item of its kind in DER, and DEREndOfSequence when there is no root.
DERReturn Img4ReadDomainFolder(const char* profile, Img4DomainFileReader read, void* context,
                               Img4FolderProfile* profiles, uint16_t* count, Img4DomainFile* file);

#ifdef __cplusplus
}
#endif

#endif
