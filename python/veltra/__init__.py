"""The codecs of the Veltra Orlo services: strict DER (`veltra.der`), Img4 containers and their trust (`veltra.img4`), and
SysConfig3 configuration blobs (`veltra.sysconfig3`).

Data goes in as any object with a contiguous buffer and is not copied: what is made of it keeps the buffer, and views that are
given out are slices of it. Octets that change meanwhile, a bytearray's for instance, are harmless to the program, but what was
found out about them no longer holds. Any number of threads may use an object; only iterators are for one at a time.
"""
from __future__ import annotations

from enum import IntEnum
from typing import Any

from ._codecs import ffi, lib

__all__ = ["CodecError", "Status", "code", "name"]


class Status(IntEnum):
    """The result of an operation of the libraries, as their headers say."""

    SUCCESS = lib.DERSuccess
    END_OF_SEQUENCE = lib.DEREndOfSequence
    UNEXPECTED_TAG = lib.DERUnexpectedTag
    DECODE_ERROR = lib.DERDecodeError
    INCOMPLETE_SEQUENCE = lib.DERIncompleteSequence
    PARAM_ERROR = lib.DERParamError
    BUFFER_OVERFLOW = lib.DERBufferOverflow
    FAILURE = 0xFFFFFFFF


class CodecError(ValueError):
    """Something was refused: at which `step`, for which `fault`, with which `status`, and at which `offset` of the data, if it
    has a place there. Steps and faults are the words that the libraries' headers have for them."""

    def __init__(self, step: str, fault: str, status: int, offset: int | None, **more: Any) -> None:
        super().__init__(step, fault, status, offset)
        self.step = step
        self.fault = fault
        self.status = Status(status)
        self.offset = offset
        self.__dict__.update(more)

    def __str__(self) -> str:
        place = "" if self.offset is None else f" at octet {self.offset}"
        reason = self.status.name if self.fault in ("", "Other") else self.fault
        return f"{self.step} refused{place}: {reason}"


def code(characters: str) -> int:
    """The number that a four-character code spells, the first character in the most significant byte.

    >>> hex(code("bCfg")), name(0x62436667)
    ('0x62436667', 'bCfg')
    """
    octets = str.encode(characters, "latin-1")
    if len(octets) != 4:
        raise ValueError(f"{characters!r} has not four characters")
    return int.from_bytes(octets, "big")


def name(number: int) -> str:
    """The four characters of a 32-bit number; those beyond ASCII are of Latin-1."""
    return number.to_bytes(4, "big").decode("latin-1")


def names(enumeration: str, prefix: str) -> dict[int, str]:
    """The words of an enumeration of the headers, without what they begin with."""
    elements: dict[int, str] = ffi.typeof(enumeration).elements
    return {value: name[len(prefix):] for value, name in elements.items()}
