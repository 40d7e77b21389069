"""veltra.sysconfig3 beside dictionaries and the HMACs of Python."""
import contextlib
import copy
import hmac
import logging
import sys
import threading
import unittest
import unittest.mock
import weakref

import budget  # noqa: F401
from hypothesis import given, strategies
from veltra.sysconfig3 import Blob, BlobError, PayloadEntry

KEY = b"a key of the site"
TEXTS = strategies.text(strategies.characters(blacklist_categories=["Cs"], blacklist_characters="\0"), max_size=20)
VALUES = TEXTS | strategies.binary(min_size=1, max_size=300)
CODES = strategies.sampled_from(["WCh0", "MiGB", "\xff\xfe\0\1"])
ENTRIES = strategies.builds(PayloadEntry, VALUES, TEXTS.filter(bool))


def octets(value):
    return value.encode() if isinstance(value, str) else value


class SysConfig3(unittest.TestCase):
    @given(strategies.lists(strategies.tuples(CODES, ENTRIES | strategies.none())), strategies.dictionaries(TEXTS, VALUES))
    def test_entries_are_those_of_a_dictionary_and_the_hmacs_are_of_them(self, steps, metadata):
        blob, payload = Blob("dCfg", 0x30002, KEY), {}
        blob.metadata.update(metadata)
        for key, entry in steps:
            self.assertEqual(blob.payload.pop(key, None), payload.pop(key, None))
            if entry is not None:
                blob.payload[key] = payload[key] = entry
        again = Blob.decode(blob.encode())
        self.assertEqual((again, list(again.payload.items())), (blob, list(payload.items())))
        self.assertEqual(list(again.metadata.items()), list(metadata.items()))
        streams = [b"".join(key.encode("latin-1")[::-1] + octets(entry.comment) + octets(entry.value)
                            for key, entry in payload.items()),
                   b"".join(octets(key) + octets(value) for key, value in metadata.items())]
        self.assertEqual(again.hmacs, tuple(hmac.digest(KEY, stream, "sha256") for stream in [*streams, b"".join(streams)]))
        blob.metadata.clear()
        self.assertEqual((list(blob.metadata), len(blob.payload)), ([], len(payload)))

    def test_messages_reach_handlers_and_what_these_raise_the_caller(self):
        blob = Blob.decode(Blob("bCfg", 0x30002, KEY).encode())
        log, handler, messages = logging.getLogger("veltra.sysconfig3"), logging.Handler(), []
        log.addHandler(handler)
        self.addCleanup(log.removeHandler, handler)
        handler.emit = lambda record: messages.append((Blob().magic, record.getMessage()))
        with self.assertRaises(BlobError) as raised:
            blob.payload["WCh0"] = "text"
        self.assertEqual(("bCfg", raised.exception.message), messages[-1])
        self.assertIn(raised.exception.message, str(raised.exception))
        interrupt = unittest.mock.Mock(side_effect=[KeyboardInterrupt, None, None])
        for error, emit in ((RuntimeError, blob.close), (KeyboardInterrupt, interrupt)):
            handler.emit = lambda _, emit=emit: emit() or Blob()
            self.assertRaises(error, blob.hmac_is_valid)

    def test_what_interrupts_a_use_may_ask_the_blob(self):
        def interrupt(*_):
            with contextlib.suppress(RuntimeError):
                len(blob.payload)

        blob = Blob()
        sys.setprofile(interrupt)
        self.assertEqual(blob.magic, "bCfg")
        sys.setprofile(None)

    def test_threads_take_turns_until_one_closes_the_blob(self):
        blob, endings = Blob(), []

        def change(key):
            try:
                while True:
                    blob.payload[key] = b"x" * 100
                    self.assertEqual(Blob.decode(blob.encode()).magic, blob.magic)
                    del blob.payload[key]
            except Exception as error:
                endings.append(str(error))

        threads = [threading.Thread(target=change, args=[key]) for key in ("key1", "key2", "key3")]
        for thread in threads:
            thread.start()
        for _ in range(300):
            self.assertLessEqual(len(list(blob.payload)), 3)
        blob.close()
        for thread in threads:
            thread.join()
        self.assertEqual(endings, ["the blob is closed"] * 3)

    def test_misuse_is_an_exception(self):
        blob, closed = Blob(), Blob("bCfg", 0x30003)
        closed.payload["OldK"] = None
        encoding = closed.encode()
        closed.close()
        self.assertIsNone(weakref.ref(Blob())())
        self.assertIsNone(Blob.decode(encoding).payload["OldK"].value)  # the encoding belongs to the view
        for error, call in (
            (ValueError, lambda: closed.payload["WCh0"]),
            (ValueError, lambda: closed == blob),
            (KeyError, lambda: blob.payload["none"]),
            (KeyError, lambda: blob.metadata.__delitem__("none")),
            (ValueError, lambda: blob.payload["toolong"]),
            (ValueError, lambda: blob.metadata.__setitem__("a\0b", "text")),
            (BlobError, lambda: blob.metadata.__setitem__("empty", b"")),
            (BlobError, lambda: Blob(key=KEY)),
            (OverflowError, lambda: Blob("bCfg", 1 << 32)),
            (TypeError, lambda: blob.payload.__setitem__("WCh0", 5)),
            (TypeError, lambda: copy.copy(blob)),
            (BlobError, lambda: Blob.decode(encoding[:-1])),
        ):
            with self.subTest(line=call.__code__.co_firstlineno), self.assertRaises(error) as raised:
                call()
        self.assertEqual((raised.exception.fault, raised.exception.offset), ("ContentCutShort", len(encoding) - 1))
