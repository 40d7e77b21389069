// The trust profiles, in the order in which they are listed: the one place that names them, their verifiers and their
// roots. Whoever includes this defines PROFILE first. cmake/WriteTrustDomain.cmake and scripts/make-trust-domain read
// the rows too; a row keeps to one line for their sake.
//
// name behind "kImg4Decode", verifier behind "verify_chain_img4_", kind, certificates in a chain, root
// clang-format off
PROFILE(SecureBootRsa1kSha1, v1, Rsa1k, 3, ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa3kSha384, v2_rsa3k, Rsa3k, 2, RSA3K_SHA384_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa4kSha384, v2, Rsa4k, 2, RSA4K_SHA384_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa4kSha384BRX1, v2_BRX1, Rsa4k, 2, RSA4K_SHA384_ROOT_CA_CERTIFICATE_BRX1)
PROFILE(SecureBootRsa4kSha384X86, x86, Rsa4k, 2, RSA4K_SHA384_X86_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa4kSha384DDI, ddi, Rsa4k, 2, RSA4K_SHA384_DDI_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa4kSha384DDIGlobal, ddi_global, Rsa4k, 2, RSA4K_SHA384_DDI_GLOBAL_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa4kSha384DDIFake, ddi_fake, Rsa4k, 2, RSA4K_SHA384_DDI_FAKE_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootRsa4kSha384DDIFakeGlobal, ddi_fake_global, Rsa4k, 2, RSA4K_SHA384_DDI_FAKE_GLOBAL_ROOT_CA_CERTIFICATE)
PROFILE(LocalPolicyRsa4kSha384, marda_local_policy, Rsa4k, 2, RSA4K_SHA384_LP_ROOT_CA_CERTIFICATE)
PROFILE(LocalPolicyEc384Sha384, ecdsa384_local_policy, Ec384, 3, EC384_SHA384_LP_ROOT_CA_CERTIFICATE)
PROFILE(LocalPolicyEc384Sha384QA, ecdsa384_qa, Ec384, 3, QA_EC384_SHA384_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootEc256Sha256, ecdsa256, Ec256, 2, LOCAL_EC256_SHA256_ROOT_CA_CERTIFICATE)
PROFILE(SecureBootEc384Sha384, ecdsa384, Ec384, 2, LOCAL_EC384_SHA384_ROOT_CA_CERTIFICATE)
// clang-format on
#undef PROFILE
