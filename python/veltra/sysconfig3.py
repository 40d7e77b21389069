"""SysConfig3 configuration blobs: read, changed, and encoded again.

>>> blob = Blob("bCfg", 0x30001)
>>> blob.payload["WCh0"] = b"\\1\\2"
>>> blob.payload["SrNm"] = PayloadEntry("C0FFEE", comment="serial number")
>>> blob.metadata["made by"] = "an example"
>>> again = Blob.decode(blob.encode())
>>> list(again.payload), again.payload["SrNm"], again == blob
(['WCh0', 'SrNm'], PayloadEntry(value='C0FFEE', comment='serial number'), True)
>>> del again.payload["WCh0"]
>>> again.payload.get("WCh0"), len(again.payload), dict(again.metadata)
(None, 1, {'made by': 'an example'})

Blobs of version 0x30002 carry HMACs, which a key makes and without which they are neither changed nor encoded.

>>> sealed = Blob("bCfg", 0x30002, key=b"a key of the site")
>>> sealed.metadata["n"] = b"\\5"
>>> sealed.hmac_is_valid(), sealed.hmacs == sealed.compute_hmacs(), Blob.decode(sealed.encode()).hmac_is_valid()
(True, True, False)

What the library reports goes to the logger "veltra.sysconfig3". A handler must not use the blob that reports, which
raises RuntimeError, nor one that another thread uses, which may be waiting for the handler. Payload keys are four-character
codes; texts are UTF-8, with what is none as lone surrogates, and cut to 2**24 octets.
"""
from __future__ import annotations

import atexit
import contextlib
import logging
import threading
from collections.abc import Iterator, MutableMapping
from typing import TYPE_CHECKING, Any, Callable, NamedTuple, NoReturn, TypeVar

from . import CodecError, Status, code, name, names
from ._codecs import ffi, lib
from .der import _FAULTS, Buffer

if TYPE_CHECKING:
    from _typeshed import ReadableBuffer

_log = logging.getLogger(__name__)
_log.addHandler(logging.NullHandler())
_SUBJECTS = names("SysConfig3Subject", "SysConfig3Subject")
_Result = TypeVar("_Result")


class BlobError(CodecError):
    """What the library refuses; `message` is what it reported last, if anything. The fault Unsupported is that of a magic or
    version that no blob has."""

    message: str = ""

    def __str__(self) -> str:
        return f"{super().__str__()}: {self.message}" if self.message else super().__str__()


class _Reports(threading.local):
    """What the library reported to this thread since the call in hand began."""

    last = ""
    raised: BaseException | None = None


_reports = _Reports()


def _keep(_: Any, raised: BaseException, __: Any) -> None:
    _reports.raised = raised


@ffi.def_extern(onerror=_keep)  # type: ignore[misc]
def veltraTakeMessage(text: Any, length: int) -> None:
    message = ffi.unpack(text, length).decode("utf-8", "replace")
    try:
        _log.warning("%s", message)
    finally:
        _reports.last = message  # after handlers that called the library too


lib.veltraTakeMessages(True)
atexit.register(lib.veltraTakeMessages, False)


def _call(operation: Callable[..., _Result], *arguments: Any) -> _Result:
    """Calls the library, and raises afterwards what a handler of messages raised meanwhile."""
    outer = _reports.raised
    _reports.last = ""
    _reports.raised = None
    try:
        result = operation(*arguments)
        if _reports.raised is not None:
            raise _reports.raised
        return result
    finally:
        _reports.raised = outer


def _make(create: Any, release: Any, *arguments: Any) -> Any:
    """Calls an operation that makes an object, which is released even when a handler of messages raises."""

    def owned() -> Any:
        return ffi.gc(create(*arguments), release)

    return _call(owned)


def _error(operation: str) -> BlobError:
    return BlobError(operation, "", Status.FAILURE, None, message=_reports.last)


def _text(pointer: Any) -> str | None:
    return ffi.string(pointer).decode("utf-8", "surrogateescape") if pointer else None


def _octets(text: str) -> bytes:
    octets = str.encode(text, "utf-8", "surrogateescape")
    if b"\0" in octets:
        raise ValueError("a text of a blob holds no NUL")
    return octets


def _data(read: Any, record: Any) -> bytes | None:
    out = ffi.new("SysConfigData *")
    return bytes(ffi.buffer(out.data, out.length)) if read(record, out) and out.data else None


def _view(data: ReadableBuffer) -> Any:
    buffer = Buffer(data)
    return buffer, ffi.new("SysConfigData *", (ffi.cast("uint8_t *", buffer.start), len(buffer.view)))


class PayloadEntry(NamedTuple):
    """The value of a payload entry: a text, data, or nothing for one with the deleted flag; and its comment."""

    value: str | bytes | None
    comment: str = "."


class Blob:
    """A blob. Any number of threads may use it, of which one is served at a time; once closed it raises ValueError. In a
    process that forked while another thread used it, it stays in use."""

    def __init__(self, magic: str = "bCfg", version: int = 0x30001, key: ReadableBuffer | None = None) -> None:
        if key is None:
            made = _make(lib.allocSysConfig3, lib.deallocSysConfig3, code(magic), version)
        else:
            buffer, view = _view(key)
            made = _make(lib.allocSysConfig3WithHMACKey, lib.deallocSysConfig3, code(magic), version, view[0])
        if not made:
            raise _error("new blob")
        self._own(made)

    @classmethod
    def decode(cls, data: ReadableBuffer) -> Blob:
        """Decodes the blob at the start of the data, which is not needed afterwards."""
        buffer = Buffer(data)
        refusal = ffi.new("SysConfig3Refusal *")
        made = _make(lib.decodeSysConfig3Explained, lib.deallocSysConfig3, buffer.start, len(buffer.view), refusal)
        if not made:
            encoding = refusal.encoding
            place = buffer.offset(encoding.place if encoding.fault else refusal.place)
            fault = _FAULTS[encoding.fault] if encoding.fault else "" if refusal.status else "Unsupported"
            raise BlobError(_SUBJECTS[refusal.subject], fault, refusal.status or Status.FAILURE, place, message=_reports.last)
        blob = cls.__new__(cls)
        blob._own(made)
        return blob

    def _own(self, made: Any) -> None:
        self._object: Any = made
        self._lock = threading.RLock()
        self._is_used = False

    @property
    def payload(self) -> Payload:
        return Payload(self)

    @property
    def metadata(self) -> Metadata:
        return Metadata(self)

    def __reduce__(self) -> NoReturn:
        raise TypeError("a blob is not copied or pickled; its encoding can be")

    def _use(self, operation: Callable[..., _Result], *arguments: Any) -> _Result:
        """Calls the operation with the library's object and the arguments; no one else uses the object meanwhile."""
        with self._lock:
            if self._is_used:  # by a handler of messages or of signals, or a finalizer
                raise RuntimeError("the blob is in use by the same thread")
            if self._object is None:
                raise ValueError("the blob is closed")
            self._is_used = True
            try:
                return _call(operation, self._object, *arguments)
            finally:
                self._is_used = False

    def _change(self, operation: Callable[..., bool], *arguments: Any) -> None:
        if not self._use(operation, *arguments):
            raise _error("change")

    def close(self) -> None:
        """Releases what the blob owns, now, unless that is done."""

        def release(made: Any) -> None:
            self._object = None
            ffi.release(made)

        with contextlib.suppress(ValueError):
            self._use(release)

    def __enter__(self) -> Blob:
        return self

    def __exit__(self, *_: object) -> None:
        self.close()

    def __eq__(self, other: object) -> bool:
        """Whether magic, version, the entries in their order, and the HMACs are equal."""
        if not isinstance(other, Blob) or other is self:
            return other is self
        first, second = sorted((self, other), key=id)
        return first._use(lambda one: second._use(lambda two: bool(lib.sysConfig3ObjectsAreEqual(one, two))))

    __hash__ = None  # type: ignore[assignment]

    @property
    def magic(self) -> str:
        return name(self._use(lib.sysConfig3GetMagic))

    @property
    def version(self) -> int:
        return int(self._use(lib.sysConfig3GetVersion))

    def encode(self) -> memoryview:
        """The encoding, which belongs to the view."""
        out = ffi.new("SysConfigData *")
        if not self._use(lib.encodeSysConfig3, out):
            raise _error("encoding")
        return memoryview(ffi.buffer(ffi.gc(out.data, lib.free, out.length), out.length)).toreadonly()

    def set_key(self, key: ReadableBuffer) -> None:
        """Registers another key for the HMACs, or with an empty one none. The HMACs stay as they are."""
        buffer, view = _view(key)
        self._change(lib.sysConfig3SetHMACKey, view[0])

    def hmac_is_valid(self) -> bool:
        """Whether all three HMACs match the entries under the key. Each that does not is reported."""
        return bool(self._use(lib.sysConfig3IsValidHMAC))

    def update_hmac(self) -> None:
        """Makes the three HMACs with the key."""
        self._change(lib.sysConfig3UpdateHMAC)

    @property
    def hmacs(self) -> tuple[bytes | None, ...]:
        """The HMACs of payload, metadata and both; nothing for one that is absent."""
        reads = (lib.sysConfig3ManifestGetPayloadHMAC, lib.sysConfig3ManifestGetMetadataHMAC, lib.sysConfig3ManifestGetFullHMAC)
        return self._use(lambda made: tuple(_data(read, lib.sysConfig3GetManifest(made)) for read in reads))

    def compute_hmacs(self) -> tuple[bytes, ...]:
        """The HMACs that update_hmac would make."""
        made = []
        for create in (lib.sysConfig3CreatePayloadHMAC, lib.sysConfig3CreateMetadataHMAC, lib.sysConfig3CreateFullHMAC):
            out = ffi.new("SysConfigData *")
            if not self._use(create, out) or not out.data:
                raise _error("HMAC")
            made.append(bytes(ffi.buffer(ffi.gc(out.data, lib.free), out.length)))
        return tuple(made)


_Value = TypeVar("_Value")


class _Entries(MutableMapping[str, _Value]):
    """The entries of one kind in their order, which setting one that is there ends. The keys are those at the start of an
    iteration. As an operation of the library, `_get` and `_delete` take the object and the key in C."""

    _count: Any
    _head: Any
    _next: Any
    _get: Any
    _delete: Any

    def __init__(self, blob: Blob) -> None:
        self._blob = blob

    def _key(self, key: str) -> Any:
        raise NotImplementedError

    def _key_of(self, entry: Any) -> str:
        raise NotImplementedError

    def _value_of(self, entry: Any) -> _Value:
        raise NotImplementedError

    def __len__(self) -> int:
        return int(self._blob._use(self._count))

    def __iter__(self) -> Iterator[str]:
        def keys(made: Any) -> list[str]:
            found = []
            entry = self._head(made)
            while entry:
                found.append(self._key_of(entry))
                entry = self._next(entry)
            return found

        return iter(self._blob._use(keys))

    def __getitem__(self, key: str) -> _Value:
        def read(made: Any, wanted: Any) -> _Value:
            entry = self._get(made, wanted)
            if not entry:
                raise KeyError(key)
            return self._value_of(entry)

        return self._blob._use(read, self._key(key))

    def __delitem__(self, key: str) -> None:
        def delete(made: Any, wanted: Any) -> bool:
            if not self._get(made, wanted):
                raise KeyError(key)
            return bool(self._delete(made, wanted))

        self._blob._change(delete, self._key(key))

    def clear(self) -> None:
        for key in self:
            with contextlib.suppress(KeyError):
                del self[key]

    def _add(self, add: Any, made: Any) -> None:
        if not made:
            raise _error("entry")
        self._blob._change(add, made)


class Payload(_Entries[PayloadEntry]):
    """The payload entries of a blob by their four-character codes."""

    _count = lib.sysConfig3GetPayloadEntryCount
    _head = lib.sysConfig3GetHeadPayloadEntry
    _next = lib.sysConfig3PayloadEntryGetNextEntry
    _get = lib.sysConfig3GetPayloadEntryForKey
    _delete = lib.sysConfig3DeletePayloadEntryForKey

    def _key(self, key: str) -> int:
        return code(key)

    def _key_of(self, entry: Any) -> str:
        return name(lib.sysConfig3PayloadEntryGetKey(entry))

    def _value_of(self, entry: Any) -> PayloadEntry:
        text = _text(lib.sysConfig3PayloadEntryGetString(entry))
        value = text if text is not None else _data(lib.sysConfig3PayloadEntryGetData, entry)
        return PayloadEntry(value, _text(lib.sysConfig3PayloadEntryGetComment(entry)) or "")

    def __setitem__(self, key: str, value: PayloadEntry | str | ReadableBuffer | None) -> None:
        entry = value if isinstance(value, PayloadEntry) else PayloadEntry(value)  # type: ignore[arg-type]
        number, comment, release = code(key), _octets(entry.comment), lib.deallocSysConfig3PayloadEntry
        if entry.value is None:
            made = _make(lib.allocSysConfig3PayloadEntryDeleted, release, number, comment)
        elif isinstance(entry.value, str):
            made = _make(lib.allocSysConfig3PayloadEntryWithString, release, number, comment, _octets(entry.value))
        else:
            buffer = Buffer(entry.value)
            made = _make(lib.allocSysConfig3PayloadEntryWithData, release, number, comment, buffer.start, len(buffer.view))
        self._add(lib.sysConfig3AddPayloadEntry, made)


class Metadata(_Entries["str | bytes"]):
    """The metadata entries of a blob. Of a key the first 256 octets of UTF-8 count."""

    _count = lib.sysConfig3GetMetadataEntryCount
    _head = lib.sysConfig3GetHeadMetadataEntry
    _next = lib.sysConfig3MetadataEntryGetNextEntry
    _get = lib.sysConfig3GetMetadataEntryForKey
    _delete = lib.sysConfig3DeleteMetadataEntryForKey

    def _key(self, key: str) -> bytes:
        return _octets(key)

    def _key_of(self, entry: Any) -> str:
        return _text(lib.sysConfig3MetadataEntryGetKey(entry)) or ""

    def _value_of(self, entry: Any) -> str | bytes:
        text = _text(lib.sysConfig3MetadataEntryGetString(entry))
        return text if text is not None else _data(lib.sysConfig3MetadataEntryGetData, entry) or b""

    def __setitem__(self, key: str, value: str | ReadableBuffer) -> None:
        create, release = lib.allocSysConfig3MetadataEntry, lib.deallocSysConfig3MetadataEntry
        if isinstance(value, str):
            made = _make(create, release, _octets(key), ffi.NULL, 0, _octets(value))
        else:
            buffer = Buffer(value)
            made = _make(create, release, _octets(key), buffer.start, len(buffer.view), ffi.NULL)
        self._add(lib.sysConfig3AddMetadataEntry, made)
