"""Shows objects of Koru in gdb: what they are, not how they are laid out.

A compiler leaves most of the library's classes to the library's own debug information, and a
library is mostly installed without it. So objects are read from memory by their layout, which stays
the same as long as the library's name does. Only the entries of settings files and the records of
record files are in types that no header has, and these do need that information.
"""

import itertools
import json
import struct

import gdb
import gdb.printing

MOST = 1000  # characters that are read of a text
NEEDS_LIBRARY = "the rest needs libkoru's debug information"


def _quoted(text):
    """Text in quotes, as far as the terminal's character set has it."""
    charset = gdb.host_charset() if hasattr(gdb, "host_charset") else "ascii"
    quoted = json.dumps(text, ensure_ascii=False)
    return quoted.encode(charset, "backslashreplace").decode(charset)


def _read(address, size):
    return gdb.selected_inferior().read_memory(address, size).tobytes() if size > 0 else b""


class _Memory:
    """An object in memory. Places are given for 32 and for 64 bits: at(4, 8)."""

    def __init__(self, value):
        self.address = int(value.address)
        self.is_64_bits = value.address.type.sizeof == 8

    def at(self, on_32_bits=0, on_64_bits=0):
        return self.address + (on_64_bits if self.is_64_bits else on_32_bits)

    def fields(self, form, *place):
        """What lies there in the form of `struct`, little-endian and with nothing in between."""
        form = "<" + form
        return struct.unpack(form, _read(self.at(*place), struct.calcsize(form)))

    def word(self, *place):
        return self.fields("Q" if self.is_64_bits else "I", *place)[0]

    def flag(self, *place):
        return self.fields("?", *place)[0]

    def wide(self, on_32_bits, on_64_bits):
        """The text of a std::wstring."""
        size = self.word(on_32_bits + 4, on_64_bits + 8)
        characters = _read(self.word(on_32_bits, on_64_bits), 4 * min(size, MOST))
        return characters.decode("utf-32-le", "replace") + "..." * (size > MOST)

    def data(self, on_32_bits, on_64_bits):
        """The size of a std::vector of bytes, and the first of them."""
        first = self.word(on_32_bits, on_64_bits)
        size = self.word(on_32_bits + 4, on_64_bits + 8) - first
        shown = " ".join("%02x" % byte for byte in _read(first, min(size, 16)))
        return "%d bytes%s%s" % (size, ": " * (size > 0) + shown, " ..." * (size > 16))

    def mutex(self, *place):
        """The state of a Mutex: which thread holds it, and how often."""
        lock, count, owner = self.fields("III", *place)
        if lock == 0:
            return "free"
        return "held %s by %s" % ("once" if count == 1 else "%d times" % count, _thread(owner))


def _thread(number):
    for thread in gdb.selected_inferior().threads():
        if thread.ptid[1] == number:
            return "thread %d" % thread.num
    return "thread %d of the system" % number


class _Printer:
    """Shows an object in one text, `show`, after the name of its class."""

    def __init__(self, name, value):
        self.name = name
        self.memory = _Memory(value)

    def to_string(self):
        return "Koru::%s %s" % (self.name, self.show())


class PathPrinter(_Printer):
    def show(self):
        parts = ((4, 8), (28, 40), (52, 72))
        return _quoted("".join(self.memory.wide(*place) for place in parts))


class FilePrinter(_Printer):
    def show(self):
        memory = self.memory
        return "%s, %s, mode %s, lock %s" % (
            _quoted(memory.wide(148, 264)),
            "open" if memory.word(68, 128) else "closed",
            _mode(memory.word(172, 296)),
            memory.mutex(176, 304),
        )


def _mode(mode):
    bits = ((1, "READ"), (2, "WRITE"), (0x80000000, "BINARY"))
    return " | ".join(name for bit, name in bits if mode & bit) or str(mode)


class HoldingPrinter(FilePrinter):
    """A file that holds its content in an object of a type that only the library knows."""

    def held(self):
        type_ = _library_type(self.type)
        address = self.memory.word(200, 344)
        return type_ and gdb.Value(address).cast(type_.pointer()).dereference()

    def show(self):
        held = self.held()
        content = NEEDS_LIBRARY if held is None else "%s: %d" % (self.content, self.count(held))
        return "%s, %s" % (super().show(), content)

    def children(self):
        held = self.held()
        return iter(()) if held is None else self.each(held)


def _library_type(name):
    """A type with its fields, or None."""
    try:
        type_ = gdb.lookup_type(name)
    except gdb.error:
        return None
    return type_ if type_.fields() else None


def _size(vector):
    return int(vector["_M_impl"]["_M_finish"] - vector["_M_impl"]["_M_start"])


def _elements(vector):
    first = vector["_M_impl"]["_M_start"]
    return (first[i] for i in range(_size(vector)))


class SettingsPrinter(HoldingPrinter):
    type = "Koru::SettingsTable"
    content = "entries"

    def count(self, table):
        return _size(table["entries_"])

    def each(self, table):
        sections = [_stored(name) for name in _elements(table["sections_"])]
        for entry in _elements(table["entries_"]):
            name = self.named(sections[int(entry["section"])], _stored(entry["key"]))
            yield _quoted(name)[1:-1], _quoted(_stored(entry["value"]))

    def named(self, section, key):
        return "[%s] %s" % (section, key)


class PropertyPrinter(SettingsPrinter):
    def named(self, section, key):
        return key


def _stored(text):
    """A text of a table: bytes or, if the size has all bits set, a wide string."""
    size = int(text["size_"])
    if size == 2 ** (8 * text["size_"].type.sizeof) - 1:
        return _Memory(text["wide_"].dereference()).wide(0, 0)
    text = _read(int(text["bytes_"]), min(size, MOST)).decode("utf-8", "replace")
    return text + "..." * (size > MOST)


class DataFilePrinter(HoldingPrinter):
    type = "Koru::RecordSet"
    content = "records"

    def count(self, records):
        return int(records["size_"])

    def each(self, records):
        numbers = itertools.count()
        block_type = _library_type("Koru::RecordSet::Block").pointer().pointer()
        for owner in _elements(records["blocks_"]):
            block = owner.address.cast(block_type).dereference()
            for record in _elements(block["records_"]):
                yield "[%d]" % next(numbers), record.dereference()


class RecordPrinter(_Printer):
    def show(self):
        return "%s, %s" % (_quoted(self.memory.wide(4, 8)), self.memory.data(28, 40))


class MutexPrinter(_Printer):
    def show(self):
        return self.memory.mutex()


class EventPrinter(_Printer):
    def show(self):
        return "%s, %s reset" % (
            "signalled" if self.memory.flag(77, 97) else "not signalled",
            "auto" if self.memory.flag(76, 96) else "manual",
        )


class ThreadPrinter(_Printer):
    def show(self):
        started, detached = self.memory.flag(16, 32), self.memory.flag(17, 33)
        if not started:
            return "not started" + ", to be detached" * detached
        end = "joined, detached or aborted" if detached else "not joined"
        return "0x%x, started, %s" % (self.memory.word(8, 16), end)


class DynamicLibraryPrinter(_Printer):
    def show(self):
        handle = self.memory.word(28, 40)
        state = "loaded, handle 0x%x" % handle if handle else "not loaded"
        return "%s, %s" % (_quoted(self.memory.wide(4, 8)), state)


class DateTimePrinter(_Printer):
    def show(self):
        fields = self.memory.fields("HBBBBBxIhB")
        year, month, day, hour, minute, second, millisecond, offset, parts = fields
        halves = []
        if parts & 1:
            halves.append("%04d-%02d-%02d" % (year, month, day))
        if parts & 2:
            halves.append("%02d:%02d:%02d.%03d" % (hour, minute, second, millisecond))
        return "%s, offset %d" % (" ".join(halves) or "without parts", offset)


class TimerPrinter(_Printer):
    def show(self):
        return "since %d.%03d" % self.memory.fields("II")


class UuidPrinter(_Printer):
    def show(self):
        digits = bytes(self.memory.fields("16B")).hex()
        ends = (0, 8, 12, 16, 20, 32)
        return "-".join(digits[a:b] for a, b in zip(ends, ends[1:]))


PRINTERS = {
    "DataFile": DataFilePrinter,
    "DataFile::Record": RecordPrinter,
    "DateTime": DateTimePrinter,
    "DynamicLibrary": DynamicLibraryPrinter,
    "Event": EventPrinter,
    "File": FilePrinter,
    "File::Path": PathPrinter,
    "InitializationFile": SettingsPrinter,
    "LogFile": FilePrinter,
    "Mutex": MutexPrinter,
    "PropertyFile": PropertyPrinter,
    "Thread": ThreadPrinter,
    "Timer": TimerPrinter,
    "Uuid": UuidPrinter,
}


def _maker(name, printer):
    # What a function returns is in no memory; gdb shows it as it can.
    return lambda value: None if value.address is None else printer(name, value)


def _collection():
    printers = gdb.printing.RegexpCollectionPrettyPrinter("koru")
    for name, printer in PRINTERS.items():
        printers.add_printer(name, "^Koru::%s$" % name, _maker(name, printer))
    return printers


gdb.printing.register_pretty_printer(gdb.current_objfile(), _collection(), replace=True)
