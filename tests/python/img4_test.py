"""veltra.img4 beside what cryptography makes of the same manifests."""
import hashlib
import os
import pathlib
import subprocess
import tempfile
import threading
import unittest

import budget  # noqa: F401
import veltra
from cryptography import x509
from cryptography.exceptions import InvalidSignature
from cryptography.hazmat.primitives.asymmetric import ec, padding, rsa
from cryptography.hazmat.primitives.hashes import SHA1, SHA256, SHA384
from hypothesis import given, strategies
from veltra import der, img4
from veltra.img4 import Image, Img4Error, TrustDomain, TrustError

FOLDER = pathlib.Path(__file__).parents[1] / "img4/trust-domain"
DOMAIN = TrustDomain(FOLDER)
PROFILE = "kImg4DecodeSecureBootEc384Sha384"
with tempfile.TemporaryDirectory() as made:
    subprocess.run([os.environ["VELTRA_BIN"] + "/make-signed-manifests", FOLDER, made], check=True)
    IMAGES = {path.stem: path.read_bytes() for path in pathlib.Path(made).glob("*.img4")}
DATA = IMAGES[PROFILE]


def is_sound(certificate, signature, octets, algorithm):
    """What cryptography says of the signature."""
    key = certificate.public_key()
    arguments = [padding.PKCS1v15(), algorithm] if isinstance(key, rsa.RSAPublicKey) else [ec.ECDSA(algorithm)]
    try:
        key.verify(bytes(signature), bytes(octets), *arguments)
    except InvalidSignature:
        return False
    return True


def sequence(*parts, tag=der.SEQUENCE):
    return der.encode(tag, b"".join(der.encode(der.IA5_STRING, part) if isinstance(part, bytes) else part for part in parts))


def named(name, value):
    return sequence(sequence(name, value), tag=der.PRIVATE | der.CONSTRUCTED | veltra.code(name.decode()))


class Img4(unittest.TestCase):
    def test_optional_parts_are_there(self):
        numbers = [der.encode(der.INTEGER, octet) for octet in (b"\1", b"\x10", b"\xff")]
        nested = sequence(named(b"flag", der.encode(der.BOOLEAN, b"\xff")), tag=der.SET)
        dictionary = sequence(named(b"numb", numbers[1]), named(b"dict", nested), named(b"less", numbers[2]), tag=der.SET)
        keys = der.encode(der.OCTET_STRING, b"keys")
        properties = sequence(sequence(b"PAYP", dictionary), tag=der.CONTEXT | der.CONSTRUCTED)
        payload = sequence(b"IM4P", b"type", b"1", keys, keys, sequence(*numbers[:2]), properties)
        restore_info = sequence(sequence(b"IM4R", dictionary), tag=der.CONTEXT | der.CONSTRUCTED | 1)
        image = Image(sequence(b"IMG4", payload, restore_info))
        self.assertEqual((image.payload.keybag, image.payload.compression, image.manifest), (b"keys", (1, 16), None))
        for found in (image.payload.properties, image.restore_info):
            self.assertEqual((list(found), len(found)), (["numb", "dict", "less"], 3))
            self.assertTrue("less" in found and "longer" not in found)
            self.assertEqual((found["numb"], dict(found["dict"])), (16, {"flag": True}))
            self.assertRaises(der.DerError, found.__getitem__, "less")
        with self.assertRaises(Img4Error) as raised:
            Image(payload.replace(b"PAYP", b"PAYX"))
        self.assertEqual((raised.exception.step, raised.exception.fault, raised.exception.found),
                         ("PayloadProperties", "Magic", b"PAYX"))

    def test_digests_chains_and_signatures_are_those_of_cryptography(self):
        self.assertEqual((sorted(IMAGES), DOMAIN.profiles), (sorted(img4.PROFILES), img4.PROFILES))
        for profile, data in IMAGES.items():
            kinds = (("Sha1", SHA1), ("Ec256Sha256", SHA256), ("", SHA384))
            algorithm = next(kind() for end, kind in kinds if end in profile)
            image = Image(data)
            _, payload, wrapper = der.decode(data)
            parts = [payload.encoding, next(iter(wrapper)).encoding, image.manifest.body]
            trust = image.evaluate(profile, DOMAIN, "sepi")
            self.assertEqual([trust.payload_digest, trust.manifest_digest, trust.body_digest],
                             [hashlib.new(algorithm.name, part).digest() for part in parts])
            self.assertEqual((image.payload.digest(profile), image.manifest.digest()),
                             (trust.payload_digest, hashlib.sha1(parts[1]).digest()))
            chain = [x509.load_der_x509_certificate(bytes(one)) for one in image.manifest.chain]
            for issuer, one in zip(chain, chain[1:]):
                self.assertTrue(is_sound(issuer, one.signature, one.tbs_certificate_bytes, algorithm))
            self.assertTrue(is_sound(chain[-1], image.manifest.signature, image.manifest.body, algorithm))

    @given(strategies.integers(0, len(DATA) - 1), strategies.integers(0, 255))
    def test_what_a_change_leaves_trusted_is_signed(self, place, octet):
        changed = bytearray(DATA)
        changed[place] = octet
        try:
            image = Image(changed)
            image.evaluate(PROFILE, DOMAIN, "sepi")
        except Img4Error as error:
            self.assertTrue(error.step and 0 <= error.offset <= len(changed))
        else:
            leaf = x509.load_der_x509_certificate(bytes(image.manifest.chain[-1]))
            self.assertTrue(is_sound(leaf, image.manifest.signature, image.manifest.body, SHA384()))

    def test_properties_are_typed_and_judged_by_any_number_of_threads(self):
        image, seen = Image(DATA), []
        manifest, entries = image.manifest.properties, image.manifest.objects["sepi"]

        def judge(*found):
            image.evaluate(PROFILE, DOMAIN, "sepi")
            seen.append(found)

        threads = [threading.Thread(target=image.evaluate, args=(PROFILE, DOMAIN, "sepi", judge)) for _ in range(4)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        for expected in [(*pair, False) for pair in manifest.items()] + [(*pair, True) for pair in entries.items()]:
            self.assertEqual(seen.count(expected), len(threads))
        self.assertEqual({name: type(value) for name, value in manifest.items()},
                         {"ABCD": int, "BOOL": bool, "DATA": memoryview, "TEXT": str})
        self.assertEqual((entries["COUN"], len(image.manifest.objects), list(image.manifest.objects)), (300, 2, ["boot", "sepi"]))
        self.assertEqual((image.kind, img4.length(DATA[:40])), ("Container", len(DATA)))

    def test_refusals_of_trust_name_the_step_and_the_place(self):
        manifest = Image(DATA).manifest
        for expected, arguments, broken in (
            (("Object", "Absent", "Sound", "Sound"), {"object": "none"}, None),
            (("ManifestProperties", "Other", "Sound", "Sound"), {"judge": lambda name, *_: int(name != "TEXT")}, None),
            (("Signature", "Other", "Sound", "Mismatch"), {"trusted_digest": bytes(48)}, manifest.signature),
            (("Chain", "Other", "Signature", "Mismatch"), {"domain": None}, None),
        ):
            changed = bytearray(DATA)
            if broken is not None:
                changed[DATA.index(broken) + len(broken) - 1] ^= 1
            image = Image(changed)
            with self.subTest(expected), self.assertRaises(TrustError) as raised:
                image.evaluate(PROFILE, **{"domain": DOMAIN, **arguments})
            error = raised.exception
            self.assertEqual((error.step, error.fault, error.chain, error.signature), expected)
            if error.step == "Signature":
                trust = image.evaluate(PROFILE, DOMAIN, trusted_digest=image.manifest.digest(PROFILE))
                self.assertIsNone(trust.body_digest)
        self.assertEqual((error.offset, error.certificate), (DATA.index(manifest.chain[-1]), 1))

    def test_misuse_is_an_exception(self):
        image, data = Image(DATA), bytearray(DATA)
        view = Image(data).payload.data
        self.assertRaises(BufferError, data.clear)
        view.release()
        data.clear()
        for error, call in (
            (Img4Error, lambda: Image(b"")),
            (Img4Error, lambda: img4.length(b"\x30\5")),
            (ValueError, lambda: image.evaluate(PROFILE, TrustDomain(profile=img4.PROFILES[0]))),
            (ValueError, lambda: image.evaluate(PROFILE, DOMAIN, "toolong")),
            (ValueError, lambda: image.evaluate(PROFILE, DOMAIN, trusted_digest=bytes(47))),
            (ZeroDivisionError, lambda: image.evaluate(PROFILE, DOMAIN, judge=lambda *_: 1 / 0)),
            (KeyError, lambda: image.payload.digest("none")),
            (KeyError, lambda: image.manifest.objects["MANP"]),
            (ValueError, lambda: TrustDomain(profile="none")),
            (FileNotFoundError, lambda: TrustDomain(FOLDER / "keys")),
        ):
            with self.subTest(line=call.__code__.co_firstlineno), self.assertRaises(error):
                call()
