"""Strict DER (ITU-T X.690), decoded lazily and in place.

>>> pair = decode(bytes.fromhex("3006 020105 0101ff"))
>>> [(item.tag == INTEGER, bytes(item.content)) for item in pair]
[(True, b'\\x05'), (False, b'\\xff')]
>>> first, second = pair
>>> first.integer(), second.boolean(), second.offset
(5, True, 5)
>>> decode(encode(SEQUENCE, encode(INTEGER, b"\\5") + encode(BOOLEAN, b"\\xff"))) == pair
True
>>> decode(b"\\x02\\x81\\x01\\x05")
Traceback (most recent call last):
    ...
veltra.der.DerError: item refused at octet 1: LengthForm

A table of rows names the items of a SEQUENCE; tables of the X.509 structures are here too.

>>> table = [Row("number", INTEGER), Row("flag", BOOLEAN, Option.OPTIONAL)]
>>> fields = fill(bytes.fromhex("3003 020105"), table)
>>> bytes(fields["number"]), fields["flag"]
(b'\\x05', None)
>>> encode_sequence(table, fields).hex(" ")
'30 03 02 01 05'
"""
from __future__ import annotations

from collections.abc import Iterator, Mapping, Sequence
from enum import IntFlag
from itertools import repeat
from typing import TYPE_CHECKING, Any, NamedTuple

from . import CodecError, Status, names
from ._codecs import ffi, lib

if TYPE_CHECKING:
    from _typeshed import ReadableBuffer

# Tag words: the class in bits 63-62, the constructed flag in bit 61, and the number.
BOOLEAN: int = lib.DERTagBoolean
INTEGER: int = lib.DERTagInteger
BIT_STRING: int = lib.DERTagBitString
OCTET_STRING: int = lib.DERTagOctetString
OBJECT_IDENTIFIER: int = lib.DERTagObjectIdentifier
IA5_STRING: int = lib.DERTagIA5String
SEQUENCE: int = lib.DERTagSequence
SET: int = lib.DERTagSet
CONSTRUCTED: int = 1 << 61
APPLICATION: int = 1 << 62
CONTEXT: int = 2 << 62
PRIVATE: int = 3 << 62

_FAULTS = names("DERFault", "DERFault")


class DerError(CodecError):
    """What the decoder or the encoder refuses. `item_offset` is the start of the item at fault; for a table, `row` is the first
    that was not matched, `tag` the tag that was refused, and `expected` that of the row."""

    item_offset: int | None = None
    row: int | None = None
    tag: int = 0
    expected: int = 0


class Buffer:
    """Octets of the caller's: they stay, and neither move nor change in number, while this or a view of them is there."""

    __slots__ = ("view", "start", "address")

    def __init__(self, data: ReadableBuffer) -> None:
        view = memoryview(data)
        if not view.c_contiguous:
            raise BufferError("the buffer is not contiguous")
        self.view = (view.cast("B") if view.nbytes else memoryview(b"")).toreadonly()
        # The view alone keeps the octets: Python's garbage collector crashes when it clears a view that cffi holds.
        self.start: Any = ffi.cast("const uint8_t *", ffi.from_buffer(self.view))
        self.address = int(ffi.cast("uintptr_t", self.start))

    def item(self, start: int = 0, end: int | None = None) -> Any:
        end = len(self.view) if end is None else end
        if not 0 <= start <= end <= len(self.view):
            raise IndexError("the buffer has no such octets")
        return ffi.new("DERItem *", (self.start + start, end - start))

    def offset(self, pointer: Any) -> int | None:
        offset = int(ffi.cast("uintptr_t", pointer)) - self.address
        return offset if 0 <= offset <= len(self.view) else None

    def slice(self, item: Any) -> memoryview | None:
        start = self.offset(item.data)
        return None if start is None else self.view[start : start + item.length]

    def error(self, step: str, status: int, refusal: Any) -> DerError:
        return DerError(
            step, _FAULTS[refusal.fault], status, self.offset(refusal.place), item_offset=self.offset(refusal.item),
            row=refusal.row, tag=refusal.tag, expected=refusal.expected)


class Item:
    """One item of a buffer. Iterating over a constructed one decodes the items in it, each when its turn comes."""

    __slots__ = ("_buffer", "tag", "offset", "_content", "end")

    def __init__(self, buffer: Buffer, tag: int, offset: int, content: int, end: int) -> None:
        self._buffer = buffer
        self.tag = tag
        self.offset = offset  # of its first octet, in the data that was given to be decoded
        self._content = content
        self.end = end  # the offset behind it

    @property
    def constructed(self) -> bool:
        return bool(self.tag & CONSTRUCTED)

    @property
    def number(self) -> int:
        return self.tag & int(lib.DERTagNumberMask)

    @property
    def content(self) -> memoryview:
        return self._buffer.view[self._content : self.end]

    @property
    def encoding(self) -> memoryview:
        return self._buffer.view[self.offset : self.end]

    def __iter__(self) -> Iterator[Item]:
        if not self.constructed:
            raise DerError("item", "NoSequence", Status.UNEXPECTED_TAG, self.offset, item_offset=self.offset, tag=self.tag)
        return decode_range(self._buffer, self._content, self.end)

    def __eq__(self, other: object) -> bool:
        return isinstance(other, Item) and bool(self.encoding == other.encoding)

    def __hash__(self) -> int:
        return hash(bytes(self.encoding))

    def __repr__(self) -> str:
        return f"<Item {self.tag:#x} at {self.offset}, {self.end - self._content} octets>"

    def integer(self) -> int:
        """The content as a non-negative INTEGER below 2**64, whatever the tag."""
        return int(self._parsed("INTEGER", lib.DERParseInteger64, "uint64_t *")[0])

    def boolean(self) -> bool:
        """The content as a BOOLEAN."""
        return bool(self._parsed("BOOLEAN", lib.DERParseBoolean, "bool *")[0])

    def bits(self) -> tuple[memoryview, int]:
        """The content as a BIT STRING: its octets, and how many bits of the last one do not belong to it.

        >>> octets, unused = decode(bytes.fromhex("0302 04f0")).bits()
        >>> octets.hex(), unused
        ('f0', 4)
        """
        unused = ffi.new("uint8_t *")
        bits = self._parsed("BIT STRING", lambda item, out: lib.DERParseBitString(item, out, unused), "DERItem *")
        return self._buffer.slice(bits) or memoryview(b""), unused[0]

    def _parsed(self, kind: str, parse: Any, result: str) -> Any:
        out = ffi.new(result)
        status = parse(self._buffer.item(self._content, self.end), out)
        if status:
            raise DerError(kind, "", status, self._content, item_offset=self.offset, tag=self.tag)
        return out


def _known(buffer: Buffer, start: int, end: int, is_deep: bool) -> Iterator[list[list[int]]]:
    """Of some items at a time what is known of them, a list for each row of Glue.h."""
    buffer.item(start, end)
    most = 4
    count = ffi.new("uint16_t *")
    refusal = ffi.new("DERRefusal *")
    ends = ffi.new("uint64_t[]", [end])
    walk = ffi.new("ItemWalk *", (start, 0, ends))
    while True:
        if is_deep and len(ends) <= walk.depth + most:
            wider = ffi.new("uint64_t[]", 2 * len(ends) + most)
            ffi.memmove(wider, ends, ffi.sizeof(ends))
            ends = walk.ends = wider
        rows = ffi.new("uint64_t[]", lib.ItemRows * most)
        status = lib.veltraWalkItems(buffer.start, walk, is_deep, most, rows, count, refusal)
        yield [ffi.unpack(rows + row * most, count[0]) for row in range(lib.ItemRows)]
        if status:
            raise buffer.error("item", status, refusal)
        if count[0] < most:
            return
        most = min(4 * most, 256)


def decode_range(buffer: Buffer, start: int, end: int) -> Iterator[Item]:
    """The items from one offset of a buffer to another."""
    for _, *known in _known(buffer, start, end, False):
        yield from map(Item, repeat(buffer), *known)


def decode(data: ReadableBuffer) -> Item:
    """The item at the start of the data. Octets behind it are not looked at; `end` says where they begin."""
    buffer = Buffer(data)
    refusal = ffi.new("DERRefusal *")
    decoded = ffi.new("DERDecodedInfo *")
    status = lib.DERDecodeItemExplained(buffer.item(), decoded, refusal)
    if status:
        raise buffer.error("item", status, refusal)
    content = buffer.offset(decoded.content.data) or 0
    return Item(buffer, decoded.tag, 0, content, content + decoded.content.length)


def items(data: ReadableBuffer) -> Iterator[Item]:
    """The items that the data holds one behind the other, each decoded when its turn comes."""
    buffer = Buffer(data)
    return decode_range(buffer, 0, len(buffer.view))


def walk(data: ReadableBuffer) -> Iterator[tuple[int, Item]]:
    """All items, those in a constructed one behind it, each with its depth.

    >>> [(depth, item.offset) for depth, item in walk(bytes.fromhex("3005 3003 020105"))]
    [(0, 0), (1, 2), (2, 4)]
    """
    buffer = Buffer(data)
    for depths, *known in _known(buffer, 0, len(buffer.view), True):
        yield from zip(depths, map(Item, repeat(buffer), *known))


class Option(IntFlag):
    """What holds for a row of a table, as DERTypes.h says."""

    OPTIONAL = lib.DEROptionOptional
    ANY_TAG = lib.DEROptionAnyTag
    SKIP = lib.DEROptionSkip
    SAVE_DER = lib.DEROptionSaveDER
    SIGNED_INTEGER = lib.DEROptionSignedInteger
    WRITE_DER = lib.DEROptionWriteDER


class Row(NamedTuple):
    """An item of a SEQUENCE, in a table of them."""

    name: str
    tag: int
    options: Option = Option(0)


def _specs(table: Sequence[Row]) -> Any:
    size = ffi.sizeof("DERItem")
    return ffi.new("DERItemSpec[]", [(place * size, row.tag, row.options) for place, row in enumerate(table)])


def fill(data: ReadableBuffer, table: Sequence[Row]) -> dict[str, memoryview | None]:
    """The items of the SEQUENCE at the start of the data by the names of a table's rows; nothing for those that are missing."""
    buffer = Buffer(data)
    record = ffi.new("DERItem[]", len(table))
    size = ffi.sizeof(record)
    refusal = ffi.new("DERRefusal *")
    status = lib.DERParseSequenceExplained(buffer.item(), len(table), _specs(table), record, size, size, refusal)
    if status:
        raise buffer.error("SEQUENCE", status, refusal)
    return {row.name: buffer.slice(record[place]) for place, row in enumerate(table)}


def encode(tag: int, content: ReadableBuffer) -> bytearray:
    """One item; the content of a constructed one is that of several, one behind the other."""
    buffer = Buffer(content)
    out = bytearray(lib.DERLengthOfItem(tag, len(buffer.view)))
    _check(lib.DEREncodeItem(tag, len(buffer.view), buffer.start, ffi.from_buffer(out), ffi.new("uint64_t *", len(out))))
    return out


def encode_sequence(
    table: Sequence[Row], values: Mapping[str, ReadableBuffer | None], tag: int = SEQUENCE
) -> bytearray:
    """The SEQUENCE, or what the tag says, of the contents that a table's rows name; an optional one may be missing. A row whose
    value is a whole encoding, as `fill` gives out one with Option.SAVE_DER, needs Option.WRITE_DER."""
    given = [values.get(row.name) for row in table]
    for place, row in enumerate(table):
        if given[place] is None and not row.options & Option.OPTIONAL:
            raise DerError("encoding", "Missing", Status.INCOMPLETE_SEQUENCE, None, row=place, expected=row.tag)
    buffers = [Buffer(b"" if value is None else value) for value in given]
    record = ffi.new("DERItem[]", [(buffer.start, len(buffer.view)) for buffer in buffers])
    arguments = (tag, record, ffi.sizeof(record), len(table), _specs(table))
    length = ffi.new("uint64_t *")
    _check(lib.DERLengthOfEncodedSequenceFromObject(*arguments, length))
    out = bytearray(length[0])
    _check(lib.DEREncodeSequenceFromObject(*arguments, ffi.from_buffer(out), len(out), length))
    return out


def _check(status: int) -> None:
    if status:
        raise DerError("encoding", "", status, None)


def _table(record: str) -> tuple[Row, ...]:
    specs = getattr(lib, f"{record}ItemSpecs")
    fields = ffi.typeof(record).fields
    return tuple(Row(name, specs[place].tag, Option(specs[place].options)) for place, (name, _) in enumerate(fields))


CERTIFICATE = _table("DERSignedCertCrl")
TBS_CERTIFICATE = _table("DERTBSCert")
SUBJECT_PUBLIC_KEY_INFO = _table("DERSubjPubKeyInfo")
ALGORITHM_IDENTIFIER = _table("DERAlgorithmId")
ATTRIBUTE = _table("DERAttributeTypeAndValue")
EXTENSION = _table("DERExtension")
RSA_PUBLIC_KEY = _table("DERRSAPubKeyPKCS1")
