"""veltra.der beside pyasn1 and cryptography."""
import pathlib
import unittest

import budget  # noqa: F401
from cryptography import x509
from hypothesis import given, strategies
from pyasn1.codec.der import decoder, encoder
from pyasn1.type import univ
from veltra import der
from veltra.der import Option, Row

CERTIFICATE = next(pathlib.Path(__file__).parents[1].glob("img4/trust-domain/chains/*Rsa1k*/leaf.der")).read_bytes()
TREES = strategies.recursive(strategies.binary(max_size=300), lambda tree: strategies.lists(tree, max_size=4), max_leaves=12)
HEX = bytes.fromhex


def encoded(tree):
    if isinstance(tree, list):
        return der.encode(der.SEQUENCE, b"".join(map(encoded, tree)))
    return der.encode(der.OCTET_STRING, tree)


def decoded(item):
    return [decoded(child) for child in item] if item.constructed else bytes(item.content)


def other(tree):
    """The tree as pyasn1 has it."""
    if not isinstance(tree, list):
        return univ.OctetString(tree)
    sequence = univ.Sequence()
    sequence.clear()
    for place, child in enumerate(tree):
        sequence.setComponentByPosition(place, other(child))
    return sequence


class Der(unittest.TestCase):
    @given(TREES)
    def test_trees_are_encoded_as_by_pyasn1_and_decoded_again(self, tree):
        encoding = encoded(tree)
        self.assertEqual(encoding, encoder.encode(other(tree)))
        self.assertEqual(decoded(der.decode(encoding)), tree)

    @given(TREES, strategies.data())
    def test_what_is_accepted_of_a_changed_tree_pyasn1_accepts_with_the_same_contents(self, tree, data):
        encoding = encoded(tree)
        encoding[data.draw(strategies.integers(0, len(encoding) - 1))] = data.draw(strategies.integers(0, 255))
        encoding = encoding[: data.draw(strategies.integers(0, len(encoding)))]
        try:
            found = [(item.tag, bytes(item.encoding)) for _, item in der.walk(encoding)]
        except der.DerError as error:
            self.assertTrue(0 <= error.item_offset <= error.offset <= len(encoding))
            return
        if found and all(tag in (der.SEQUENCE, der.OCTET_STRING) for tag, _ in found):
            value, rest = decoder.decode(bytes(encoding))
            self.assertEqual(encoder.encode(value) + rest, encoding)

    def test_a_certificate_with_a_changed_octet_that_cryptography_reads_is_read_alike(self):
        accepted = 0
        for place in range(len(CERTIFICATE)):
            changed = CERTIFICATE[:place] + bytes([CERTIFICATE[place] ^ 0x20]) + CERTIFICATE[place + 1 :]
            try:
                theirs = x509.load_der_x509_certificate(changed)
                serial = theirs.serial_number
            except (ValueError, x509.InvalidVersion):
                continue
            fields = der.fill(changed, der.CERTIFICATE)
            self.assertEqual(fields["tbs"], theirs.tbs_certificate_bytes)
            self.assertEqual(int.from_bytes(der.fill(fields["tbs"], der.TBS_CERTIFICATE)["serialNumber"], "big"), serial)
            accepted += 1
        self.assertGreater(accepted, len(CERTIFICATE) // 2)  # most octets are of names, keys and signatures

    def test_refusals_name_the_fault_and_the_octet(self):
        table = [Row("number", der.INTEGER), Row("rest", der.SEQUENCE, Option.OPTIONAL | Option.SAVE_DER)]
        for octets, read, fault, offset in (
            ("3003 0201", der.decode, "ContentCutShort", 4),
            ("020105 1f1e00", lambda data: list(der.items(data)), "TagForm", 4),
            ("3004 3080 0000", lambda data: list(der.walk(data)), "LengthIndefinite", 3),
            ("3000", lambda data: der.fill(data, table), "Missing", 2),
            ("3003 040105", lambda data: der.fill(data, table), "Tag", 2),
            ("020105", lambda data: list(der.decode(data)), "NoSequence", 0),
            ("0202 0005", lambda data: der.decode(data).integer(), "", 2),
            ("0101 01", lambda data: der.decode(data).boolean(), "", 2),
            ("0302 0801", lambda data: der.decode(data).bits(), "", 2),
        ):
            with self.subTest(octets), self.assertRaises(der.DerError) as raised:
                read(HEX(octets))
            self.assertEqual((raised.exception.fault, raised.exception.offset), (fault, offset))

    def test_items_before_a_broken_one_come_first(self):
        walk = der.items(HEX("020105" * 300 + "0200 1f1e00"))
        self.assertEqual([next(walk).offset for _ in range(301)], list(range(0, 903, 3)))
        self.assertRaises(der.DerError, next, walk)

    def test_a_buffer_stays_while_an_item_is_there(self):
        data = bytearray(HEX("3003020105"))
        item = der.decode(memoryview(data)).__iter__().__next__()
        self.assertRaises(BufferError, data.clear)
        self.assertTrue(item.content.readonly)
        self.assertEqual((item.integer(), bytes(item.encoding)), (5, data[2:]))
        del item
        data.clear()

    def test_misuse_is_an_exception(self):
        released = memoryview(b"\2\1\5")
        released.release()
        rows = [Row("n", der.INTEGER)]
        for error, call in (
            (TypeError, lambda: der.decode("text")),
            (TypeError, lambda: der.decode(None)),
            (BufferError, lambda: der.decode(memoryview(b"\2\1\5\0\0\0")[::2])),
            (ValueError, lambda: der.decode(released)),
            (der.DerError, lambda: der.decode(b"")),
            (OverflowError, lambda: der.encode(-1, b"")),
            (OverflowError, lambda: der.encode(1 << 64, b"")),
            (OverflowError, lambda: der.fill(b"\x30\0", rows * 65536)),
            (TypeError, lambda: der.fill(b"\x30\0", [Row("n", "tag")])),
            (TypeError, lambda: der.encode_sequence(rows, {"n": 5})),
            (IndexError, lambda: der.Item(der.Buffer(b""), der.INTEGER, 0, 0, 1 << 62).integer()),
        ):
            with self.subTest(str(call.__code__.co_firstlineno)), self.assertRaises(error):
                call()
