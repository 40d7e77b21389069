"""veltra.sysconfig3 beside dictionaries and the HMACs of Python."""
import hmac
import logging
import threading
import unittest
import unittest.mock

import budget  # noqa: F401
from hypothesis import given, strategies
from veltra.sysconfig3 import Blob, BlobError, PayloadEntry

KEY = b"a key of the site"
LOG = logging.getLogger("veltra.sysconfig3")
TEXTS = strategies.text(strategies.characters(blacklist_categories=["Cs"], blacklist_characters="\0"), max_size=20)
VALUES = TEXTS | strategies.binary(min_size=1, max_size=300)
CODES = ["WCh0", "MiGB", "\xff\xfe\0\1"]
PAYLOAD = strategies.builds(PayloadEntry, VALUES | strategies.none(), TEXTS.map(lambda text: text or "."))
CODE = strategies.sampled_from(CODES)
STEPS = strategies.lists(strategies.tuples(CODE, PAYLOAD) | strategies.tuples(TEXTS, VALUES) | CODE | TEXTS)


def octets(value):
    return value.encode() if isinstance(value, str) else value


class SysConfig3(unittest.TestCase):
    @given(strategies.integers(0x30001, 0x30003), STEPS)
    def test_entries_are_those_of_a_dictionary_whatever_is_set_and_deleted(self, version, steps):
        blob = Blob("dCfg", version, KEY if version == 0x30002 else None)
        payload, metadata = {}, {}
        for step in steps:
            key, *value = [step] if isinstance(step, str) else step
            is_payload = key in CODES
            model, entries = (payload, blob.payload) if is_payload else (metadata, blob.metadata)
            if not value:
                self.assertEqual(key in entries, model.pop(key, None) is not None)
                entries.pop(key, None)
            elif is_payload and value[0].value is None and version < 0x30003:
                self.assertRaises(BlobError, entries.__setitem__, key, value[0])
            else:
                model.pop(key, None)
                model[key] = entries[key] = value[0]
        again = Blob.decode(blob.encode())
        self.assertEqual(again, blob)
        self.assertEqual((list(again.payload.items()), list(again.metadata.items())),
                         (list(payload.items()), list(metadata.items())))
        if version == 0x30002:
            streams = [b"".join(key.encode("latin-1")[::-1] + octets(entry.comment) + octets(entry.value)
                                for key, entry in payload.items()),
                       b"".join(octets(key) + octets(value) for key, value in metadata.items())]
            self.assertEqual(again.hmacs, tuple(hmac.digest(KEY, stream, "sha256") for stream in [*streams, b"".join(streams)]))

    @given(strategies.data())
    def test_a_changed_blob_is_refused_at_a_place_in_it_or_read(self, data):
        blob = Blob("bCfg", 0x30003)
        blob.payload["WCh0"], blob.metadata["key"] = b"\1\2", "text"
        encoding = bytearray(blob.encode())
        place = data.draw(strategies.integers(0, len(encoding) - 1))
        encoding[place] = data.draw(strategies.integers(0, 255))
        try:
            changed = Blob.decode(encoding)
        except BlobError as error:
            self.assertTrue(0 <= error.offset <= len(encoding))
        else:
            self.assertEqual(Blob.decode(changed.encode()), changed)

    def test_refusals_name_step_place_and_fault(self):
        sound = bytes(Blob("bCfg", 0x30001).encode())
        for data, expected in (
            (b"", ("Blob", "HeaderCutShort", 0)),
            (sound[:-1], ("Blob", "ContentCutShort", len(sound) - 1)),
            (sound.replace(b"gfCb", b"gfCx"), ("Magic", "", 4)),
            (sound.replace(b"\1\0\3\0", b"\1\0\3\1"), ("Version", "", 10)),
        ):
            with self.subTest(expected), self.assertRaises(BlobError) as raised:
                Blob.decode(data)
            self.assertEqual((raised.exception.step, raised.exception.fault, raised.exception.offset), expected)

    def test_messages_go_to_the_log_and_into_the_error(self):
        blob = Blob.decode(Blob("bCfg", 0x30002, KEY).encode())
        with self.assertLogs(LOG) as log, self.assertRaises(BlobError) as raised:
            blob.payload["WCh0"] = "text"
        self.assertEqual(raised.exception.message, log.records[-1].getMessage())
        self.assertIn("HMAC", log.records[0].getMessage())
        blob.set_key(KEY)
        blob.payload["WCh0"] = "text"
        self.assertTrue(blob.hmac_is_valid())
        blob.set_key(b"another")
        self.assertFalse(blob.hmac_is_valid())
        blob.update_hmac()
        self.assertEqual(blob.hmacs, blob.compute_hmacs())

    def test_a_handler_that_uses_the_blob_or_raises_is_told_so_by_the_call(self):
        blob = Blob.decode(Blob("bCfg", 0x30002, KEY).encode())
        interrupt = unittest.mock.Mock(side_effect=KeyboardInterrupt)
        for error, emit in ((RuntimeError, lambda _: blob.close()), (KeyboardInterrupt, interrupt)):
            handler = logging.Handler()
            handler.emit = emit
            LOG.addHandler(handler)
            self.addCleanup(LOG.removeHandler, handler)
            self.assertRaises(error, blob.hmac_is_valid)
            LOG.removeHandler(handler)
        self.assertFalse(blob.hmac_is_valid())

    def test_threads_take_turns_until_one_closes_the_blob(self):
        blob, problems, barrier = Blob(), [], threading.Barrier(5)

        def change(number):
            barrier.wait()
            try:
                while True:
                    blob.payload[f"{number:04}"] = b"x" * 100
                    blob.metadata.update(blob.metadata, same=str(number))
                    self.assertEqual(Blob.decode(blob.encode()).magic, "bCfg")
                    del blob.payload[f"{number:04}"]
            except ValueError as error:
                if "closed" not in str(error):
                    problems.append(error)
            except BaseException as error:
                problems.append(error)

        threads = [threading.Thread(target=change, args=[number]) for number in range(4)]
        for thread in threads:
            thread.start()
        barrier.wait()
        for _ in range(500):
            self.assertLessEqual(len(list(blob.payload)), 4)
        blob.close()
        for thread in threads:
            thread.join()
        self.assertEqual(problems, [])

    def test_misuse_is_an_exception(self):
        blob, closed = Blob(), Blob()
        encoding = closed.encode()
        with closed:
            pass
        closed.close()
        self.assertEqual(Blob.decode(encoding), blob)  # it belongs to the view
        for error, call in (
            (ValueError, lambda: closed.payload["WCh0"]),
            (ValueError, closed.encode),
            (ValueError, lambda: closed == blob),
            (KeyError, lambda: blob.payload["none"]),
            (KeyError, lambda: blob.metadata.__delitem__("none")),
            (ValueError, lambda: blob.payload["toolong"]),
            (ValueError, lambda: blob.metadata.__setitem__("a\0b", "text")),
            (BlobError, lambda: blob.metadata.__setitem__("empty", b"")),
            (BlobError, lambda: blob.payload.__setitem__("\0\0\0\0", b"data")),
            (BlobError, lambda: Blob("none")),
            (BlobError, lambda: Blob(key=KEY)),
            (OverflowError, lambda: Blob("bCfg", 1 << 32)),
            (TypeError, lambda: blob.payload.__setitem__("WCh0", 5)),
            (TypeError, lambda: Blob.decode("text")),
            (TypeError, lambda: blob.set_key(None)),
        ):
            with self.subTest(str(call)), self.assertRaises(error):
                call()
