"""`orloctl verify img4` as a person or script runs it, on manifests that the tests' own trust domain has signed."""
import json
import os
import pathlib
import shutil
import subprocess
import tempfile
import unittest

BIN = pathlib.Path(os.environ["VELTRA_BIN"])
DOMAIN = pathlib.Path(__file__).resolve().parents[1] / "img4/trust-domain"
EC384 = "kImg4DecodeSecureBootEc384Sha384"
EC384_ROOT = "LOCAL_EC384_SHA384_ROOT_CA_CERTIFICATE.der"
NAMES = ("authority-name.der", "manifest-cert-spec-oid.der")


def run(*words):
    return subprocess.run([str(word) for word in words], stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)


def verify(*words):
    """Exit status and the one JSON object that orloctl prints."""
    done = run(BIN / "orloctl", "--json", "verify", "img4", *words)
    return done.returncode, json.loads(done.stdout)


def openssl_says(certificate):
    """The same fields as orloctl shows, in the same forms."""
    command = "openssl x509 -inform DER -noout -subject -issuer -serial -nameopt RFC2253 -in".split()
    said = dict(line.split("=", 1) for line in run(*command, certificate).stdout.splitlines())
    text = run(*"openssl x509 -inform DER -noout -text -in".split(), certificate).stdout
    algorithm = text.split("Signature Algorithm: ")[1].split()[0]
    bits = text.split("Public-Key: (")[1].split()[0]
    return {
        "subject": said["subject"], "issuer": said["issuer"], "serialNumber": said["serial"].lower(),
        "signatureAlgorithm": algorithm, "key": f"EC P-{bits}" if "id-ecPublicKey" in text else f"RSA {bits} bits",
    }


class Verify(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="veltra-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder)
        assert run(BIN / "make-signed-manifests", DOMAIN, cls.folder).returncode == 0

    def domain(self, *files):
        """A trust domain of its own with those files of the tests' domain."""
        folder = pathlib.Path(tempfile.mkdtemp(dir=self.folder))
        for file in files:
            shutil.copy(DOMAIN / file, folder)
        return folder

    def test_the_profile_that_has_signed_is_found_with_the_chain_that_openssl_reads(self):
        for chain in (DOMAIN / "chains").iterdir():
            with self.subTest(chain.name):
                manifest = self.folder / f"{chain.name}.im4m"
                status, found = verify(manifest, "--trust-dir", DOMAIN)
                self.assertEqual((status, found["profile"]), (0, chain.name))
                files = [DOMAIN / f"{found['root']}.der", chain / "intermediate.der", chain / "leaf.der"]
                said = [openssl_says(file) for file in files if file.exists()]
                self.assertEqual([{key: shown[key] for key in said[0]} for shown in found["chain"]], said)
                roles = ["root", "intermediate", "leaf"] if len(said) == 3 else ["root", "leaf"]
                self.assertEqual([shown["role"] for shown in found["chain"]], roles)
                algorithm = found["digests"]["algorithm"]
                self.assertIn(algorithm.replace("SHA-", "Sha"), chain.name)
                self.assertEqual(len(found["digests"]["body"]), {"SHA-1": 40, "SHA-256": 64, "SHA-384": 96}[algorithm])
                # A root that is built in has the name of the tests' root, and another key.
                status, found = verify(manifest)
                self.assertEqual((status, found["profile"]), (5, chain.name))
                self.assertIn("another key of that name has signed it", found["problem"])

    def test_exit_statuses_and_one_json_object_for_every_outcome(self):
        container = self.folder / f"{EC384}.img4"
        other = self.folder / "kImg4DecodeSecureBootEc256Sha256.im4m"
        trust = f"--trust-dir {DOMAIN}"
        alone, unnamed = self.domain(EC384_ROOT, *NAMES), self.domain(*NAMES)
        for status, words in (
            (0, f"{container} {trust} --profile {EC384} --object sepi"),
            (0, f"{container} --trust-dir {alone}"),
            (5, f"{container} {trust} --object none"),
            (5, f"{other} {trust} --profile {EC384}"),
            (5, f"{container} {trust} --object sepi --payload-digest EFGH"),
            (2, f"/nonexistent {trust}"),
            (2, f"{container} {trust} --payload-digest EFGH"),
            (2, f"{container} {trust} --object sepi --payload-digest E"),
            (2, f"{container} {trust} --object= "),
            (2, f"{container} {trust} --object s\x7fpi"),
            (2, f"{container} {trust} --profile= "),
            (2, f"{container} {trust} --profile kImg4DecodeSecureBootEc521Sha512"),
            (2, f"{container} --trust-dir /nonexistent"),
            (2, f"{container} --trust-dir {self.domain(EC384_ROOT)}"),
            (2, f"{container} --trust-dir {unnamed}"),
            (2, ""),
        ):
            with self.subTest(words=words):
                exit_status, found = verify(*words.split())
                self.assertEqual((exit_status, found["exitStatus"]), (status, status), found)
                self.assertEqual("problem" in found, status != 0)
                if status != 2:
                    self.assertEqual((found["trusted"], "failedStep" in found), (status == 0, status != 0))

    def test_a_domain_whose_files_are_not_what_they_should_be_is_wrong_usage(self):
        for broken in (EC384_ROOT, *NAMES):
            for contents in (b"", b"\x04\x00", (DOMAIN / broken).read_bytes() + b"\x00"):
                with self.subTest(file=broken, length=len(contents)):
                    folder = self.domain(EC384_ROOT, *NAMES)
                    (folder / broken).write_bytes(contents)
                    status, found = verify(self.folder / f"{EC384}.im4m", "--trust-dir", folder)
                    self.assertEqual(status, 2)
                    self.assertIn(f"{folder}/{broken}", found["problem"])

    def test_another_authority_than_the_chain_names_is_refused(self):
        folder = self.domain("ROOT_CA_CERTIFICATE.der", *NAMES)
        (folder / NAMES[0]).write_bytes(b"\x13\x06Nobody")
        status, found = verify(self.folder / "kImg4DecodeSecureBootRsa1kSha1.im4m", "--trust-dir", folder)
        self.assertEqual((status, found["failedStep"], found["failedCertificate"]), (5, "chain", 1))
        self.assertIn('common name of the secure-boot authority as a PrintableString: "Nobody"', found["problem"])

    def test_people_get_lines_and_the_reason_on_standard_error(self):
        file = self.folder / "kImg4DecodeSecureBootRsa4kSha384.img4"
        done = run(BIN / "orloctl", "verify", file, "--object", "sepi", "--trust-dir", DOMAIN)
        expected = (pathlib.Path(__file__).parent / "printed/verified.txt").read_text()
        self.assertEqual((done.stdout.replace(str(DOMAIN), "DOMAIN"), done.stderr), (expected, ""))
        done = run(BIN / "orloctl", "verify", "img4", file)
        self.assertIn("\ntrusted: false\n", done.stdout)
        self.assertTrue(done.stderr.startswith("orloctl: The signature on certificate 1 "), done.stderr)


if __name__ == "__main__":
    unittest.main()
