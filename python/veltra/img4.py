"""Img4 containers of images and manifests: what is in them, and whether a known root has signed it.

    image = Image(pathlib.Path("sepi.img4").read_bytes())
    trust = image.evaluate("kImg4DecodeSecureBootEc384Sha384", TrustDomain("site-domain"), "sepi")
    if trust.object["DGST"] == trust.payload_digest:
        boot(image.payload.data)

Nothing is copied but digests: all that an image gives out views its data, and an image does not change.

>>> image = Image(bytes.fromhex("3022 1604494d3450 160473657069 16074578616d706c65 040b") + b"hello world")
>>> image.kind, image.payload.type, image.payload.version, bytes(image.payload.data), image.manifest
('Payload', 'sepi', 'Example', b'hello world', None)
>>> image.evaluate(PROFILES[0])
Traceback (most recent call last):
    ...
veltra.img4.TrustError: Arguments refused: PARAM_ERROR
"""
from __future__ import annotations

import os
import pathlib
from collections.abc import Callable, Iterator, Mapping
from typing import TYPE_CHECKING, Any, NamedTuple, Union

from . import CodecError, Status, code, der, name, names
from ._codecs import ffi, lib

if TYPE_CHECKING:
    from _typeshed import ReadableBuffer

_SUBJECTS = names("Img4Subject", "Img4Subject")
_FAULTS = names("Img4Fault", "Img4Fault")
_KINDS = names("Img4Kind", "Img4Kind")
_CHAIN_FAULTS = names("Img4ChainFault", "Img4Chain")
_SIGNATURE_FAULTS = names("Img4SignatureFault", "Img4Signature")
_ENTRIES = {ffi.string(lib.Img4TrustProfiles[i].name).decode(): lib.Img4TrustProfiles[i] for i in range(lib.Img4NumTrustProfiles)}
PROFILES = tuple(_ENTRIES)  # the names of the trust profiles

# BOOLEAN, INTEGER, IA5String, OCTET STRING, SET of properties, and anything else.
Value = Union[bool, int, str, memoryview, "Properties", der.Item]
# Judges a property by its name and value; the third argument says whether it is the object's. False, or 0, refuses it.
Judge = Callable[[str, Value, bool], Union[bool, None]]


class Img4Error(CodecError):
    """What is refused. `property` is the name of the property at fault, `found` what stands in the place of what should, and
    `encoding` the fault of an item that is no strict DER."""

    property: str | None = None
    found: bytes = b""
    encoding: str | None = None


class TrustError(Img4Error):
    """Why a manifest is not trusted. For the step Chain `chain` says why, of which `certificate`, the root being 0; `signature`
    says what is wrong with the signature of that certificate or of the manifest."""

    chain: str = "Sound"
    certificate: int = 0
    signature: str = "Sound"


def _error(kind: type[Img4Error], buffer: der.Buffer, status: int, refusal: Any, **more: Any) -> Img4Error:
    encoding = refusal.encoding.fault
    tag = refusal.tag
    return kind(
        _SUBJECTS[refusal.subject], _FAULTS[refusal.fault] if refusal.fault else "", status, buffer.offset(refusal.place),
        property=name(tag & 0xFFFFFFFF) if tag == _tag(tag & 0xFFFFFFFF) else None,
        found=bytes(buffer.slice(refusal.found) or b""), encoding=der._FAULTS[encoding] if encoding else None, **more)


def _tag(number: int) -> int:
    return der.PRIVATE | der.CONSTRUCTED | number


def _value(item: der.Item) -> Value:
    if item.tag == der.BOOLEAN:
        return item.boolean()
    if item.tag == der.INTEGER:
        return item.integer()
    if item.tag == der.IA5_STRING:
        return str(item.content, "ascii", "surrogateescape")
    if item.tag == der.OCTET_STRING:
        return item.content
    return Properties(item._buffer, item._content, item.end) if item.tag == der.SET else item


class Properties(Mapping[str, Value]):
    """A dictionary of properties by their four-character codes, in order. Each is decoded when it is looked up, which raises
    DerError for a BOOLEAN or INTEGER that is none, or not in 64 bits; of those with the same name the first counts."""

    def __init__(self, buffer: der.Buffer, start: int, end: int) -> None:
        self._buffer = buffer
        self._start = start
        self._end = end

    def _elements(self) -> Iterator[der.Item]:
        return der.decode_range(self._buffer, self._start, self._end)

    def __iter__(self) -> Iterator[str]:
        found = set()
        for element in self._elements():
            number = element.tag & 0xFFFFFFFF
            if element.tag != _tag(number):
                raise Img4Error("Property", "Tag", Status.UNEXPECTED_TAG, element.offset)
            if number not in found:
                found.add(number)
                yield name(number)

    def __contains__(self, key: object) -> bool:
        return any(key == found for found in self)

    def __len__(self) -> int:
        return sum(1 for _ in self)

    def __getitem__(self, key: str) -> Value:
        tag = _tag(code(key))
        element = next((element for element in self._elements() if element.tag == tag), None)
        if element is None:
            raise KeyError(key)
        refusal = ffi.new("Img4Refusal *")
        content = self._buffer.item(element._content, element.end)
        status = lib.DERImg4DecodePropertyExplained(content, tag, ffi.new("Img4Property *"), refusal)
        if status:
            raise _error(Img4Error, self._buffer, status, refusal)
        _, value = next(iter(element))
        return _value(value)


class Objects(Mapping[str, Properties]):
    """The objects of a manifest, each with its properties."""

    def __init__(self, everything: Properties) -> None:
        self._everything = everything

    def __iter__(self) -> Iterator[str]:
        return (key for key in self._everything if key != "MANP")

    def __contains__(self, key: object) -> bool:
        return any(key == found for found in self)

    def __len__(self) -> int:
        return sum(1 for _ in self)

    def __getitem__(self, key: str) -> Properties:
        found = self._everything[key]
        if key == "MANP":
            raise KeyError(key)
        if not isinstance(found, Properties):
            raise Img4Error("Object", "ValueType", Status.UNEXPECTED_TAG, None, property=key)
        return found


class _Part:
    def __init__(self, buffer: der.Buffer, record: Any) -> None:
        self._buffer = buffer
        self._record = record

    def _asked(self, operation: Any, *results: str) -> list[Any] | None:
        out = [ffi.new(result) for result in results]
        status = operation(self._record, *out)
        if status and status != Status.END_OF_SEQUENCE:
            raise Img4Error(type(self).__name__, "", status, None)
        return None if status else [result[0] for result in out]

    def _properties(self, dictionary: Any) -> Properties:
        start = self._buffer.offset(dictionary.data) or 0
        return Properties(self._buffer, start, start + dictionary.length)

    def _digest(self, with_profile: Any, hash: Any, profile: str | None) -> bytes:
        known = None if profile is None else _ENTRIES[profile].profile
        out = ffi.new("uint8_t[]", lib.Img4HashLength if known is None else known.digestInfo.length)
        status = with_profile(self._record, out, len(out), known) if known is not None else hash(self._record, out, len(out))
        if status:
            raise Img4Error(type(self).__name__, "", status, None)
        return bytes(ffi.buffer(out))


class Payload(_Part):
    """The payload of an image."""

    @property
    def type(self) -> str:
        (number,) = self._asked(lib.Img4DecodeGetPayloadType, "uint32_t *") or [0]
        return name(number)

    @property
    def version(self) -> str:
        return str(self._buffer.slice(self._record.payload.version) or b"", "ascii", "surrogateescape")

    @property
    def data(self) -> memoryview:
        return self._buffer.slice(self._record.payload.data) or memoryview(b"")

    @property
    def keybag(self) -> memoryview | None:
        found = self._asked(lib.Img4DecodeGetPayloadKeybag, "DERItem *")
        return self._buffer.slice(found[0]) if found else None

    @property
    def compression(self) -> tuple[int, int] | None:
        """Algorithm, 0 or 1, and the uncompressed size."""
        found = self._asked(lib.Img4DecodeGetPayloadCompressionInfo, "uint32_t *", "uint32_t *")
        return (found[0], found[1]) if found else None

    @property
    def properties(self) -> Properties | None:
        exist = self._asked(lib.Img4DecodePayloadPropertiesExists, "bool *")
        found = self._asked(lib.Img4DecodeGetPayloadProperties, "DERItem *") if exist and exist[0] else None
        if not found:
            return None
        _, dictionary = next(self._properties(found[0])._elements())  # behind the magic
        return Properties(self._buffer, dictionary._content, dictionary.end)

    def digest(self, profile: str | None = None) -> bytes:
        """The digest of the whole payload: the profile's, or without one the SHA-1."""
        return self._digest(lib.Img4DecodeCopyPayloadDigest, lib.Img4DecodeCopyPayloadHash, profile)


class Manifest(_Part):
    """The manifest of an image."""

    @property
    def version(self) -> int:
        return int.from_bytes(self._buffer.slice(self._record.manifest.version) or b"", "big")

    @property
    def body(self) -> memoryview:
        """What the signature covers."""
        return self._buffer.slice(self._record.manifest.body) or memoryview(b"")

    @property
    def signature(self) -> memoryview | None:
        return self._buffer.slice(self._record.manifest.signature)

    @property
    def chain(self) -> list[memoryview]:
        """The certificates, from the one that the root has signed to the leaf."""
        return [certificate.encoding for certificate in self._properties(self._record.manifest.certChain)._elements()]

    def _dictionaries(self) -> tuple[Properties, Properties]:
        found = ffi.new("DERItem[2]")
        refusal = ffi.new("Img4Refusal *")
        status = lib.Img4DecodeFindDictionariesExplained(self._record, found, found + 1, refusal)
        if status:
            raise _error(Img4Error, self._buffer, status, refusal)
        return self._properties(found[0]), self._properties(found[1])

    @property
    def properties(self) -> Properties:
        """The manifest's own properties. Who says so is not known before an evaluation of trust."""
        return self._dictionaries()[1]

    @property
    def objects(self) -> Objects:
        return Objects(self._dictionaries()[0])

    def digest(self, profile: str | None = None) -> bytes:
        """The digest of the whole manifest: the profile's, or without one the SHA-1."""
        return self._digest(lib.Img4DecodeCopyManifestDigest, lib.Img4DecodeCopyManifestHash, profile)


class _State:
    """What the callbacks below need, and what they raised."""

    raised: BaseException | None = None
    contents: der.Buffer | None = None

    def __init__(self, function: Callable[..., int]) -> None:
        self.function = function

    def check(self) -> None:
        if self.raised is not None:
            try:
                raise self.raised
            finally:
                self.raised = None


def _keep(_: Any, raised: BaseException, traceback: Any) -> None:
    """Keeps what a callback raised, an interrupt before its first line included."""
    ffi.from_handle(traceback.tb_frame.f_locals["context"]).raised = raised


@ffi.def_extern(error=Status.FAILURE, onerror=_keep)  # type: ignore[misc]
def veltraReadDomainFile(file: Any, may_be_missing: bool, contents: Any, context: Any) -> int:
    return ffi.from_handle(context).function(file, may_be_missing, contents)  # type: ignore[no-any-return]


@ffi.def_extern(error=Status.FAILURE, onerror=_keep)  # type: ignore[misc]
def veltraJudge(tag: int, value: Any, selector: int, context: Any) -> int:
    return ffi.from_handle(context).function(tag, value, selector)  # type: ignore[no-any-return]


@ffi.def_extern(error=ffi.NULL, onerror=_keep)  # type: ignore[misc]
def veltraTrustedDigest(_: Any, context: Any) -> Any:
    return ffi.from_handle(context).contents.start


class TrustDomain:
    """The roots that end chains, and what else belongs to them: those that are built in, or those in a folder that
    scripts/make-trust-domain made. With a profile's name it is for that profile alone, and else for those whose roots are
    there. A file that is missing raises OSError, one that is not what its name says Img4Error."""

    def __init__(self, folder: str | os.PathLike[str] | None = None, profile: str | None = None) -> None:
        if profile is not None and profile not in _ENTRIES:
            raise ValueError(f"there is no profile {profile!r}")
        self._made = ffi.new("Img4FolderProfile[]", len(_ENTRIES))
        self._files: list[der.Buffer] = []
        count = self._read(None if folder is None else pathlib.Path(folder), profile)
        self._profiles = {ffi.string(self._made[i].entry.name).decode(): self._made[i] for i in range(count)}

    def _read(self, folder: pathlib.Path | None, profile: str | None) -> int:
        def read(file: Any, may_be_missing: bool, contents: Any) -> int:
            assert folder is not None
            try:
                self._files.append(der.Buffer((folder / ffi.string(file).decode()).read_bytes()))
            except FileNotFoundError:
                if may_be_missing:
                    return Status.END_OF_SEQUENCE
                raise
            contents[0] = self._files[-1].item()[0]
            return Status.SUCCESS

        state = _State(read)
        handle = ffi.new_handle(state)
        count = ffi.new("uint16_t *")
        file = ffi.new("Img4DomainFile *")
        name_of_profile = ffi.NULL if profile is None else profile.encode()
        reader = ffi.NULL if folder is None else lib.veltraReadDomainFile
        status = lib.Img4ReadDomainFolder(name_of_profile, reader, handle, self._made, count, file)
        state.check()
        if status == Status.END_OF_SEQUENCE:
            raise Img4Error(str(folder), "no root of any profile", status, None)
        if status:
            fault = f"not one {ffi.string(file.kind).decode()} in DER"
            raise Img4Error(f"{folder}/{ffi.string(file.name).decode()}", fault, status, None)
        return int(count[0])

    @property
    def profiles(self) -> tuple[str, ...]:
        return tuple(self._profiles)


class Trust(NamedTuple):
    """What an evaluation has found of a trusted manifest. `body_digest` and `constraints`, the encoding of what the leaf
    demands, are absent when a trusted digest stood for the signatures."""

    manifest_digest: bytes
    body_digest: bytes | None
    payload_digest: bytes | None
    constraints: memoryview | None
    manifest: Properties
    object: Properties | None


class Image:
    """A container, or a payload or manifest alone, as `kind` says: Container, Payload, Manifest or UnsignedManifest."""

    def __init__(self, data: ReadableBuffer) -> None:
        self._buffer = der.Buffer(data)
        self._record = ffi.new("Img4Record *")
        kind = ffi.new("Img4Kind *")
        refusal = ffi.new("Img4Refusal *")
        status = lib.Img4DecodeInitExplained(self._buffer.start, len(self._buffer.view), self._record, kind, refusal)
        if status:
            raise _error(Img4Error, self._buffer, status, refusal)
        self.kind = _KINDS[kind[0]]

    @property
    def payload(self) -> Payload | None:
        """The payload, unless its data is empty."""
        exists = ffi.new("bool *")
        lib.Img4DecodePayloadExists(self._record, exists)
        return Payload(self._buffer, self._record) if exists[0] else None

    @property
    def manifest(self) -> Manifest | None:
        return Manifest(self._buffer, self._record) if self._record.manifestRaw.data else None

    @property
    def restore_info(self) -> Properties | None:
        found = self._record.restoreInfo.properties
        return _Part(self._buffer, self._record)._properties(found) if found.data else None

    def evaluate(
        self, profile: str, domain: TrustDomain | None = None, object: str | None = None, judge: Judge | None = None,
        trusted_digest: ReadableBuffer | None = None
    ) -> Trust:
        """Whether the manifest, and with it the object of that name, is to be trusted under a profile of the domain. It is
        when its chain ends in the profile's root, its signature verifies, the leaf's constraints are met, and `judge` refuses
        no property; otherwise TrustError is raised, what `judge` raised, or DerError for a value that it cannot be given. A
        manifest with the trusted digest needs neither chain nor signature. Whether the payload is the object's is the caller's
        to compare."""
        if domain is None:
            domain = TrustDomain(profile=profile)  # which keeps what is known
        known = domain._profiles.get(profile)
        if known is None:
            raise ValueError(f"the domain has no root for the profile {profile!r}")
        algorithms = known.made.profile
        length = algorithms.digestInfo.length

        def run(tag: int, value: Any, selector: int) -> int:
            start = self._buffer.offset(value.content.data) or 0
            item = der.Item(self._buffer, value.tag, start, start, start + value.content.length)
            agreed = None if judge is None else judge(name(tag & 0xFFFFFFFF), _value(item), selector == lib.Img4SelectorObject)
            return Status.SUCCESS if agreed is None or agreed else Status.FAILURE

        state = _State(run)
        handle = ffi.new_handle(state)
        callbacks = ffi.new("Img4TrustCallbacks *", {"evaluateProperty": lib.veltraJudge})
        if trusted_digest is not None:
            state.contents = der.Buffer(trusted_digest)
            if len(state.contents.view) != length:
                raise ValueError(f"the profile's digests have {length} octets")
            callbacks.lookupTrustedDigest = lib.veltraTrustedDigest
        number = ffi.NULL if object is None else ffi.new("uint32_t *", code(object))
        record = ffi.new("Img4Record *", self._record[0])  # evaluations change theirs
        refusal = ffi.new("Img4TrustRefusal *")
        status = lib.Img4DecodePerformTrustEvaluationExplained(
            number, record, callbacks, ffi.addressof(algorithms), handle, refusal)
        state.check()
        if status:
            raise _error(TrustError, self._buffer, status, refusal.refusal, chain=_CHAIN_FAULTS[refusal.chain.fault],
                         certificate=refusal.chain.certificate, signature=_SIGNATURE_FAULTS[refusal.signature.fault])
        part = _Part(self._buffer, record)
        is_signed = bool(record.manifest.certProperties.data)
        return Trust(
            bytes(record.manifest.digest[0:length]),
            bytes(record.manifest.bodyDigest[0:length]) if is_signed else None,
            bytes(record.payload.digest[0:length]) if record.payloadHashed else None,
            self._buffer.slice(record.manifest.certProperties),
            part._properties(record.manp),
            part._properties(record.objp) if object is not None else None)


def length(data: ReadableBuffer) -> int:
    """The length of the container whose first octets are given, which need to reach no further than its magic."""
    buffer = der.Buffer(data)
    total = ffi.new("uint64_t *")
    status = lib.Img4DecodeParseLengthFromBuffer(buffer.start, len(buffer.view), total)
    if status:
        raise Img4Error("Container", "", status, 0)
    return int(total[0])
