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

    def test_the_printed_chain_is_what_openssl_reads(self):
        for chain in (DOMAIN / "chains").iterdir():
            with self.subTest(chain.name):
                status, found = verify(self.folder / f"{chain.name}.im4m", "--trust-dir", DOMAIN)
                self.assertEqual((status, found["profile"]), (0, chain.name))
                files = [DOMAIN / f"{found['root']}.der", chain / "intermediate.der", chain / "leaf.der"]
                said = [openssl_says(file) for file in files if file.exists()]
                self.assertEqual([{key: shown[key] for key in said[0]} for shown in found["chain"]], said)

    def test_exit_statuses_and_one_json_object_for_every_outcome(self):
        container = self.folder / f"{EC384}.img4"
        other = self.folder / "kImg4DecodeSecureBootEc256Sha256.im4m"
        changed = self.folder / "changed"
        changed.write_bytes(container.read_bytes().replace(b"text", b"next"))
        trust = ["--trust-dir", DOMAIN]
        for status, words in (
            (0, [container, *trust]),
            (0, [container, *trust, "--profile", EC384, "--object", "sepi"]),
            (0, [container, "--trust-dir", self.domain(EC384_ROOT, *NAMES)]),
            (5, [container]),
            (5, [changed, *trust]),
            (5, [container, *trust, "--object", "none"]),
            (5, [other, *trust, "--profile", EC384]),
            (5, [other, "--trust-dir", self.domain(EC384_ROOT, *NAMES)]),
            (5, ["/dev/null", *trust]),
            (2, ["/nonexistent", *trust]),
            (5, [container, *trust, "--object", "sepi", "--payload-digest", "EFGH"]),
            (2, [container, *trust, "--payload-digest", "EFGH"]),
            (2, [container, *trust, "--object", "sepi", "--payload-digest", "E"]),
            (2, [container, *trust, "--object", "sepia"]),
            (2, [container, *trust, "--object", ""]),
            (2, [container, *trust, "--object", "s\x7fpi"]),
            (2, [container, *trust, "--profile", ""]),
            (2, [container, "--trust-dir", "/nonexistent"]),
            (2, [container, "--trust-dir", self.domain(EC384_ROOT)]),
            (2, [container, "--trust-dir", self.domain(*NAMES)]),
            (2, [container, "--trust-dir", self.domain(*NAMES), "--profile", EC384]),
            (2, []),
        ):
            with self.subTest(words=words):
                exit_status, found = verify(*words)
                self.assertEqual((exit_status, found["exitStatus"]), (status, status), found)
                self.assertEqual("problem" in found, status != 0)
                if status != 2:
                    self.assertEqual(found["trusted"], status == 0)
                    self.assertEqual("failedStep" in found, status != 0)

    def test_an_unknown_profile_is_answered_with_those_there_are(self):
        status, found = verify(self.folder / f"{EC384}.im4m", "--profile", "kImg4DecodeSecureBootEc521Sha512")
        self.assertEqual(status, 2)
        for chain in (DOMAIN / "chains").iterdir():
            self.assertIn(chain.name, found["problem"])

    def test_a_domain_whose_files_are_not_what_they_should_be_is_wrong_usage(self):
        for broken in (EC384_ROOT, *NAMES):
            for contents in (b"", b"\x04\x00", (DOMAIN / broken).read_bytes() + b"\x00"):
                with self.subTest(file=broken, length=len(contents)):
                    folder = self.domain(EC384_ROOT, *NAMES)
                    (folder / broken).write_bytes(contents)
                    status, found = verify(self.folder / f"{EC384}.im4m", "--trust-dir", folder)
                    self.assertEqual(status, 2)
                    self.assertIn(f"{folder}/{broken}", found["problem"])

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
