"""veltra.der beside pyasn1 and cryptography."""
import gc
import pathlib
import unittest

import budget  # noqa: F401
from cryptography import x509
from hypothesis import given, strategies
from pyasn1.codec.der import decoder, encoder
from veltra import der
from veltra.der import Row

CERTIFICATE = next(pathlib.Path(__file__).parents[1].glob("img4/trust-domain/chains/*Rsa1k*/leaf.der")).read_bytes()
TREES = strategies.recursive(strategies.binary(max_size=300), lambda tree: strategies.lists(tree, max_size=4), max_leaves=12)


def encoded(tree):
    if isinstance(tree, list):
        return der.encode(der.SEQUENCE, b"".join(map(encoded, tree)))
    return der.encode(der.OCTET_STRING, tree)


def decoded(item):
    return [decoded(child) for child in item] if item.constructed else bytes(item.content)


class Der(unittest.TestCase):
    @given(TREES, strategies.data())
    def test_what_is_accepted_of_a_changed_tree_pyasn1_accepts_with_the_same_contents(self, tree, data):
        encoding = encoded(tree)
        self.assertEqual((decoded(der.decode(encoding)), der.decode(encoding).encoding), (tree, encoding))
        encoding[data.draw(strategies.integers(0, len(encoding) - 1))] = data.draw(strategies.integers(0, 255))
        try:
            tags = {item.tag for _, item in der.walk(encoding)}
        except der.DerError as error:
            self.assertTrue(0 <= error.item_offset <= error.offset <= len(encoding))
            return
        if tags <= {der.SEQUENCE, der.OCTET_STRING}:
            value, rest = decoder.decode(bytes(encoding))
            self.assertEqual(encoder.encode(value) + rest, encoding)

    def test_a_certificate_with_a_changed_octet_that_cryptography_reads_is_read_alike(self):
        for place in range(len(CERTIFICATE)):
            changed = CERTIFICATE[:place] + bytes([CERTIFICATE[place] ^ 0x20]) + CERTIFICATE[place + 1 :]
            try:
                theirs = x509.load_der_x509_certificate(changed)
                serial = theirs.serial_number
            except (ValueError, x509.InvalidVersion):
                continue
            tbs = der.fill(changed, der.CERTIFICATE)["tbs"]
            found = int.from_bytes(der.fill(tbs, der.TBS_CERTIFICATE)["serialNumber"], "big")
            self.assertEqual((tbs, found), (theirs.tbs_certificate_bytes, serial))

    def test_a_walk_goes_to_any_depth_and_out_again(self):
        nested = b""
        for _ in range(1000):
            nested = der.encode(der.SEQUENCE, nested)
        depths = [depth for depth, _ in der.walk(nested + b"\2\1\5")]
        self.assertEqual(depths, [*range(1000), 0])

    def test_items_before_a_broken_one_come_first_and_keep_the_buffer(self):
        data = bytearray(b"\2\1\5" * 300 + b"\2\0\x1f\x1e\0")
        walk = der.items(memoryview(data))
        found = [next(walk) for _ in range(301)]
        self.assertEqual([item.offset for item in found], list(range(0, 903, 3)))
        with self.assertRaises(der.DerError) as raised:
            next(walk)
        self.assertEqual((raised.exception.fault, raised.exception.offset), ("TagForm", 903))
        self.assertRaises(BufferError, data.clear)
        del walk, found
        data.clear()
        cycle = [der.Buffer(data)]
        cycle += [cycle[0].start, cycle]
        del cycle
        gc.collect()

    def test_misuse_is_an_exception(self):
        rows, whole = [Row("n", der.INTEGER)], [Row("n", der.INTEGER, der.Option.SAVE_DER)]
        self.assertEqual(der.fill(b"\x30\3\2\1\5", whole)["n"], b"\2\1\5")
        for error, call in (
            (TypeError, lambda: der.decode("text")),
            (BufferError, lambda: der.decode(memoryview(b"\2\1\5\0\0\0")[::2])),
            (der.DerError, lambda: list(der.decode(b"\2\1\5"))),
            (der.DerError, lambda: der.decode(b"\2\1\xff").integer()),
            (OverflowError, lambda: der.encode(1 << 64, b"")),
            (der.DerError, lambda: der.fill(b"\x30\0", rows)),
            (OverflowError, lambda: der.fill(b"\x30\0", rows * 65536)),
            (TypeError, lambda: der.encode_sequence(rows, {"n": 5})),
            (der.DerError, lambda: der.encode_sequence(rows, {"N": b""})),
            (IndexError, lambda: der.Item(der.Buffer(b""), der.INTEGER, 0, 0, 1 << 62).integer()),
        ):
            with self.subTest(line=call.__code__.co_firstlineno), self.assertRaises(error):
                call()
