// Evaluates trust in a signed manifest with a payload, as a program does that has the file in memory. Beside it the
// bare OpenSSL calls that an evaluation contains: the digests, the import of each public key, and the verifications,
// with everything that they need found beforehand. Both start from the octets of keys, since every manifest brings its
// own.
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/params.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "der/DERDecode.h"
#include "der/DERItemSpecs.h"
#include "img4/Img4Trust.h"
#include "tools/makers/SignedManifestMaker.h"

namespace {

using namespace signedmanifest;

DERReturn acceptProperty(DERTag /*tag*/, const Img4PropertyValue* value, std::uint32_t /*selector*/, void* context) {
    *static_cast<std::uint64_t*>(context) += value->content.length;
    return DERSuccess;
}

bool evaluateVeltra(const Bytes& file, const Img4TrustProfileEntry& entry) {
    Img4Record record;
    std::uint64_t octets = 0;
    return Img4DecodeInit(file.data(), file.size(), &record) == DERSuccess &&
           Img4DecodePerformTrustEvaluation(img4maker::fourCC(standardObject), &record, acceptProperty, entry.profile,
                                            &octets) == DERSuccess &&
           octets != 0;
}

// What one verification takes.
struct Signed {
    DERItem message;
    DERItem key; // the bits of a public key
    DERItem signature;
};

// What an evaluation of the file has to do, in items that view it.
struct Work {
    std::vector<Signed> verifications;
    std::vector<DERItem> digests; // without those that are verified
};

struct CertificateParts {
    DERItem tbs;
    DERItem key;
    DERItem signature;
};

CertificateParts split(const DERItem& certificate) {
    DERSignedCertCrl fields;
    DERTBSCert tbs;
    DERSubjPubKeyInfo info;
    CertificateParts parts;
    std::uint8_t unused = 0;
    if (DERParseSequence(&certificate, DERNumSignedCertCrlItemSpecs, DERSignedCertCrlItemSpecs, &fields,
                         sizeof fields) != DERSuccess ||
        DERParseSequence(&fields.tbs, DERNumTBSCertItemSpecs, DERTBSCertItemSpecs, &tbs, sizeof tbs) != DERSuccess ||
        DERParseSequenceContent(&tbs.subjectPublicKeyInfo, DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs,
                                &info, sizeof info) != DERSuccess ||
        DERParseBitString(&info.publicKey, &parts.key, &unused) != DERSuccess ||
        DERParseBitString(&fields.signature, &parts.signature, &unused) != DERSuccess)
        throw std::runtime_error("no certificate");
    parts.tbs = fields.tbs;
    return parts;
}

Work workOf(const Bytes& file, const Img4TrustProfileEntry& entry) {
    Img4Record record;
    if (Img4DecodeInit(file.data(), file.size(), &record) != DERSuccess)
        throw std::runtime_error("no container");
    Work work;
    CertificateParts issuer = split(*entry.root);
    DERSequence rest;
    DERDecodedInfo certificate;
    DERDecodeSeqContentInit(&record.manifest.certChain, &rest);
    for (const std::uint8_t* start = rest.next; DERDecodeSeqNext(&rest, &certificate) == DERSuccess;
         start = rest.next) {
        const CertificateParts issued = split({start, static_cast<std::uint64_t>(rest.next - start)});
        work.verifications.push_back({issued.tbs, issuer.key, issued.signature});
        issuer = issued;
    }
    work.verifications.push_back({record.manifest.body, issuer.key, record.manifest.signature});
    work.digests = {record.manifestRaw, record.payloadRaw};
    return work;
}

using PKey = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;
using Context = std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)>;

PKey import(const char* type, OSSL_PARAM* params) {
    EVP_PKEY* key = nullptr;
    const Context context(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr), EVP_PKEY_CTX_free);
    if (EVP_PKEY_fromdata_init(context.get()) == 1)
        EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_PUBLIC_KEY, params);
    return {key, EVP_PKEY_free};
}

PKey importPoint(const DERItem& bits) {
    char name[] = "P-384";
    if (bits.length == 65)
        name[2] = '2', name[3] = '5', name[4] = '6';
    OSSL_PARAM params[] = {
        OSSL_PARAM_construct_utf8_string(OSSL_PKEY_PARAM_GROUP_NAME, name, 0),
        OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, const_cast<std::uint8_t*>(bits.data), bits.length),
        OSSL_PARAM_construct_end()};
    return import("EC", params);
}

PKey importKey(const DERItem& bits, bool isEC) {
    if (isEC)
        return importPoint(bits);
    const unsigned char* start = bits.data;
    return {d2i_PublicKey(EVP_PKEY_RSA, nullptr, &start, static_cast<long>(bits.length)), EVP_PKEY_free};
}

bool verify(const Signed& work, bool isEC, const EVP_MD* md) {
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned length = 0;
    if (EVP_Digest(work.message.data, work.message.length, digest, &length, md, nullptr) != 1)
        return false;
    const PKey key = importKey(work.key, isEC);
    const Context verifier(EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr), EVP_PKEY_CTX_free);
    if (EVP_PKEY_verify_init(verifier.get()) != 1)
        return false;
    if (!isEC && (EVP_PKEY_CTX_set_rsa_padding(verifier.get(), RSA_PKCS1_PADDING) != 1 ||
                  EVP_PKEY_CTX_set_signature_md(verifier.get(), md) != 1))
        return false;
    return EVP_PKEY_verify(verifier.get(), work.signature.data, work.signature.length, digest, length) == 1;
}

bool evaluateOpenSSL(const Work& work, bool isEC, const EVP_MD* md) {
    for (const Signed& one : work.verifications)
        if (!verify(one, isEC, md))
            return false;
    for (const DERItem& data : work.digests) {
        unsigned char digest[EVP_MAX_MD_SIZE];
        if (EVP_Digest(data.data, data.length, digest, nullptr, md, nullptr) != 1)
            return false;
        benchmark::DoNotOptimize(digest);
    }
    return true;
}

template <typename Evaluate>
void run(benchmark::State& state, Evaluate evaluate) {
    for (auto _ : state)
        if (!evaluate()) {
            state.SkipWithError("the manifest was refused");
            break;
        }
}

struct Subject {
    const char* name;
    const Img4TrustProfile* profile;
};

const Subject subjects[] = {
    {"rsa1k", &kImg4DecodeSecureBootRsa1kSha1},
    {"rsa4k", &kImg4DecodeSecureBootRsa4kSha384},
    {"ec256", &kImg4DecodeSecureBootEc256Sha256},
    {"ec384", &kImg4DecodeSecureBootEc384Sha384},
};

// One file and what is known of it, alive as long as its benchmarks.
struct Prepared {
    Bytes file;
    const Img4TrustProfileEntry* entry = nullptr;
    Work work;
    EVP_MD* md = nullptr;
    bool isEC = false;
};

Prepared prepare(const Subject& subject) {
    Prepared prepared;
    for (unsigned i = 0; i < Img4NumTrustProfiles; ++i)
        if (Img4TrustProfiles[i].profile == subject.profile)
            prepared.entry = &Img4TrustProfiles[i];
    const Signer signer(TEST_TRUST_DOMAIN, *prepared.entry);
    prepared.file =
        img4maker::container(img4maker::payload({}), signer.manifest(standardManifest(), signer.standardChain()), {});
    prepared.work = workOf(prepared.file, *prepared.entry);
    const char* names[] = {"SHA1", "SHA256", "SHA384"};
    for (const char* name : names) {
        EVP_MD* md = EVP_MD_fetch(nullptr, name, nullptr);
        if (static_cast<std::uint64_t>(EVP_MD_get_size(md)) == subject.profile->digestInfo->length)
            prepared.md = md;
        else
            EVP_MD_free(md);
    }
    prepared.isEC = subject.profile->verifySignature == verify_signature_ecdsa;
    return prepared;
}

} // namespace

int main(int argc, char** argv) {
    std::vector<std::unique_ptr<const Prepared>> all;
    for (const Subject& subject : subjects) {
        all.push_back(std::make_unique<const Prepared>(prepare(subject)));
        const Prepared& it = *all.back();
        benchmark::RegisterBenchmark((std::string("trust/veltra/") + subject.name).c_str(), [&it](auto& state) {
            run(state, [&it] { return evaluateVeltra(it.file, *it.entry); });
        });
        benchmark::RegisterBenchmark((std::string("trust/openssl/") + subject.name).c_str(), [&it](auto& state) {
            run(state, [&it] { return evaluateOpenSSL(it.work, it.isEC, it.md); });
        });
    }
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
