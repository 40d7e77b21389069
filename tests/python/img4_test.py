"""veltra.img4 beside what cryptography makes of the same manifests."""
import gc
import hashlib
import os
import pathlib
import shutil
import subprocess
import tempfile
import threading
import unittest

import budget  # noqa: F401
from cryptography import x509
from cryptography.exceptions import InvalidSignature
from cryptography.hazmat.primitives.asymmetric import ec, padding, rsa
from cryptography.hazmat.primitives.hashes import SHA1, SHA256, SHA384
from hypothesis import given, strategies
from veltra import der, img4
from veltra.img4 import Image, Img4Error, TrustDomain, TrustError

FOLDER = pathlib.Path(__file__).parents[1] / "img4/trust-domain"
PROFILE = "kImg4DecodeSecureBootEc384Sha384"


def setUpModule():
    global DOMAIN, IMAGES
    with tempfile.TemporaryDirectory() as folder:
        subprocess.run([os.environ["VELTRA_BIN"] + "/make-signed-manifests", FOLDER, folder], check=True)
        IMAGES = {path.stem: path.read_bytes() for path in pathlib.Path(folder).glob("*.img4")}
    DOMAIN = TrustDomain(FOLDER)


def hash_of(profile):
    return next(kind() for end, kind in (("Sha1", SHA1), ("Ec256Sha256", SHA256), ("", SHA384)) if end in profile)


def verify(key, signature, octets, algorithm):
    """Whether cryptography finds the signature sound."""
    arguments = [padding.PKCS1v15(), algorithm] if isinstance(key, rsa.RSAPublicKey) else [ec.ECDSA(algorithm)]
    try:
        key.verify(bytes(signature), bytes(octets), *arguments)
    except InvalidSignature:
        return False
    return True


class Img4(unittest.TestCase):
    def test_digests_chains_and_signatures_are_those_of_cryptography(self):
        self.assertEqual((sorted(IMAGES), DOMAIN.profiles), (sorted(img4.PROFILES), img4.PROFILES))
        for profile, data in IMAGES.items():
            image, name, algorithm = Image(data), hash_of(profile).name, hash_of(profile)
            payload = list(der.decode(data))[1].encoding
            manifest = next(iter(list(der.decode(data))[2])).encoding
            trust = image.evaluate(profile, DOMAIN, "sepi")
            self.assertEqual(image.manifest.digest(), hashlib.sha1(manifest).digest())
            self.assertEqual(
                (trust.payload_digest, trust.manifest_digest, trust.body_digest, image.payload.digest(profile)),
                tuple(hashlib.new(name, part).digest() for part in (payload, manifest, image.manifest.body, payload)))
            chain = [x509.load_der_x509_certificate(bytes(one)) for one in image.manifest.chain]
            for issuer, one in zip(chain, chain[1:]):
                self.assertTrue(verify(issuer.public_key(), one.signature, one.tbs_certificate_bytes, algorithm))
            self.assertTrue(verify(chain[-1].public_key(), image.manifest.signature, image.manifest.body, algorithm))

    @given(strategies.data())
    def test_a_changed_image_is_refused_at_a_place_in_it_or_signs_the_same(self, data):
        image = Image(IMAGES[PROFILE])
        changed = bytearray(IMAGES[PROFILE])
        place = data.draw(strategies.integers(0, len(changed) - 1))
        changed[place] = data.draw(strategies.integers(0, 255))
        try:
            other = Image(changed)
            trust = other.evaluate(PROFILE, DOMAIN, "sepi")
        except Img4Error as error:
            self.assertTrue(error.step and error.offset is not None and 0 <= error.offset <= len(changed))
            self.assertNotEqual(changed, IMAGES[PROFILE])
        else:
            self.assertEqual((other.manifest.body, dict(trust.manifest)), (image.manifest.body, dict(image.manifest.properties)))
            key = x509.load_der_x509_certificate(bytes(other.manifest.chain[-1])).public_key()
            self.assertTrue(verify(key, other.manifest.signature, other.manifest.body, SHA384()))

    def test_properties_are_typed_and_judged(self):
        image, seen = Image(IMAGES[PROFILE]), []
        trust = image.evaluate(PROFILE, DOMAIN, "sepi", lambda *found: seen.append(found))
        manifest, entries = image.manifest.properties, image.manifest.objects["sepi"]
        self.assertEqual(seen, [(*pair, False) for pair in manifest.items()] + [(*pair, True) for pair in entries.items()])
        self.assertEqual({name: type(value) for name, value in manifest.items()},
                         {"ABCD": int, "BOOL": bool, "DATA": memoryview, "TEXT": str})
        self.assertEqual((dict(trust.object), entries["COUN"], sorted(image.manifest.objects)), (dict(entries), 300, ["boot", "sepi"]))
        self.assertEqual((image.kind, image.payload.type, image.restore_info, img4.length(IMAGES[PROFILE][:40])),
                         ("Container", "sepi", None, len(IMAGES[PROFILE])))

    def test_refusals_of_trust_name_the_step_and_the_place(self):
        image = Image(IMAGES[PROFILE])
        data = IMAGES[PROFILE]
        leaf = data.index(image.manifest.chain[-1])
        for expected, arguments, place in (
            (("Object", "Absent", "Sound", "Sound"), {"object": "none"}, None),
            (("ManifestProperties", "Other", "Sound", "Sound"), {"judge": lambda name, *_: name != "TEXT"}, None),
            (("Chain", "Other", "Signature", "Mismatch"), {}, leaf + len(image.manifest.chain[-1]) - 1),
            (("Signature", "Other", "Sound", "Mismatch"), {}, data.index(image.manifest.body) + len(image.manifest.body) - 1),
            (("Chain", "Other", "Signature", "Mismatch"), {"domain": None}, None),
        ):
            changed = bytearray(data)
            if place is not None:
                changed[place] ^= 1
            with self.subTest(expected), self.assertRaises(TrustError) as raised:
                Image(changed).evaluate(PROFILE, **{"domain": DOMAIN, **arguments})
            error = raised.exception
            self.assertEqual((error.step, error.fault, error.chain, error.signature), expected)
        self.assertEqual(error.offset, leaf)

    def test_a_trusted_digest_stands_for_the_signature(self):
        data = bytearray(IMAGES[PROFILE])
        data[data.index(Image(IMAGES[PROFILE]).manifest.signature) + 10] ^= 1
        image = Image(data)
        trust = image.evaluate(PROFILE, DOMAIN, "sepi", trusted_digest=image.manifest.digest(PROFILE))
        self.assertEqual((trust.body_digest, trust.constraints), (None, None))
        self.assertRaises(TrustError, image.evaluate, PROFILE, DOMAIN, "sepi", None, bytes(48))
        self.assertRaises(ValueError, image.evaluate, PROFILE, DOMAIN, "sepi", None, bytes(47))

    def test_the_folder_of_a_domain_is_read_or_refused(self):
        with tempfile.TemporaryDirectory() as folder:
            copy = pathlib.Path(folder)
            for name in ("authority-name.der", "manifest-cert-spec-oid.der"):
                self.assertRaises(FileNotFoundError, TrustDomain, folder)
                shutil.copy(FOLDER / name, folder)
            self.assertRaisesRegex(Img4Error, "no root", TrustDomain, folder)
            shutil.copy(FOLDER / "LOCAL_EC384_SHA384_ROOT_CA_CERTIFICATE.der", folder)
            self.assertIn(PROFILE, TrustDomain(folder).profiles + TrustDomain(folder, TrustDomain(folder).profiles[0]).profiles)
            (copy / "authority-name.der").write_bytes(b"\x13\1")
            self.assertRaisesRegex(Img4Error, "authority-name.der.*PrintableString", TrustDomain, folder)

    def test_misuse_is_an_exception(self):
        image, data = Image(IMAGES[PROFILE]), bytearray(IMAGES[PROFILE])
        view = Image(data).payload.data  # which keeps the data
        self.assertRaises(BufferError, data.clear)
        del view
        gc.collect()
        data.clear()
        for error, call in (
            (TypeError, lambda: Image("text")),
            (Img4Error, lambda: Image(b"")),
            (Img4Error, lambda: img4.length(b"\x30\5")),
            (ValueError, lambda: image.evaluate("none", DOMAIN)),
            (ValueError, lambda: image.evaluate(PROFILE, TrustDomain(profile=img4.PROFILES[0]))),
            (ValueError, lambda: image.evaluate(PROFILE, DOMAIN, "toolong")),
            (ZeroDivisionError, lambda: image.evaluate(PROFILE, DOMAIN, judge=lambda *_: 1 / 0)),
            (KeyError, lambda: image.payload.digest("none")),
            (KeyError, lambda: image.manifest.objects["MANP"]),
            (KeyError, lambda: image.manifest.properties["none"]),
            (ValueError, lambda: TrustDomain(profile="none")),
        ):
            with self.subTest(str(call.__code__.co_firstlineno)), self.assertRaises(error):
                call()

    def test_threads_evaluate_one_image_at_once_and_within_an_evaluation(self):
        image, found = Image(IMAGES[PROFILE]), []

        def judge(*_):
            found.append(image.evaluate(PROFILE, DOMAIN, "sepi").payload_digest)

        threads = [threading.Thread(target=image.evaluate, args=(PROFILE, DOMAIN, "sepi", judge)) for _ in range(4)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        self.assertEqual(found, [image.payload.digest(PROFILE)] * len(threads) * 7)
