"""Reads the bytes of the program, live or a core, and finds its registries.

Nothing here runs code of the program. Memory that cannot be read raises a Fault with its address, as
does every damage that the other files find.
"""

import gdb

from . import layout


class Fault(Exception):
    """Something at an address is damaged. The text begins with what it is."""

    def __init__(self, text, address):
        super().__init__(text)
        self.address = address


def read(address, length, what):
    """The `length` bytes of `what` at `address`."""
    try:
        return bytes(gdb.selected_inferior().read_memory(address, length))
    except (gdb.error, OverflowError):
        pointer = address % 2**64
        raise Fault(f"{what} at {pointer:#018x}: cannot be read", pointer) from None


def read_row(form, address, what):
    return form.parse(read(address, form.size, what))


def read_string(data, what):
    """The text of a std::string whose object has these 32 bytes."""
    string = layout.STRING.parse(data)
    if string.length > 2**20:
        raise Fault(f"{what}: a length of {string.length} bytes", string.text)
    text = read(string.text, string.length + 1, what)
    if text[-1] != 0:
        raise Fault(f"{what}: no end after its {string.length} bytes", string.text)
    return text[:-1]


def name_text(name):
    """A pool's name, for display. Bytes that are not UTF-8, and zeros, are escaped."""
    return name.decode("utf-8", "backslashreplace").replace("\0", "\\x00")


def registry_addresses():
    """The registries: one in each copy of the library that the program has.

    The first is found by its symbol, which needs no debug information and does not depend on the
    language of the current frame. The others need debug information.
    """
    if not gdb.selected_inferior().threads():
        raise gdb.GdbError("There is no program: run one, attach to one or load a core.")
    addresses = []
    try:
        with gdb.with_parameter("language", "c"):
            addresses.append(int(gdb.parse_and_eval("(long) &_ZN3OBR7MemPool8registryE")))
    except gdb.error:
        pass
    for objfile in gdb.objfiles():
        symbol = objfile.lookup_global_symbol("OBR::MemPool::registry")
        if symbol is not None:
            addresses.append(int(symbol.value().address))
    if not addresses:
        raise gdb.GdbError(
            "No pools are found: the program has not loaded libObrMemPool, or the library has neither\n"
            "debug information nor a symbol table. Use one that is not stripped, or load its symbols.")
    return list(dict.fromkeys(address % 2**64 for address in addresses))
