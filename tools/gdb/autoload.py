"""gdb loads this with the library, by a link that has the library's file name and "-gdb.py". The package
obrmempool is beside the file that the link leads to. For a program that is linked with the static
library, source this file."""

import os
import sys

import gdb

# If a script of the user's starts the program, __file__ is that script.
this_file = (lambda: None).__code__.co_filename
folder = os.path.dirname(os.path.realpath(this_file))
if folder not in sys.path:
    sys.path.insert(0, folder)

# No package would remove what Python writes beside them when root runs gdb.
wrote_none = sys.dont_write_bytecode
sys.dont_write_bytecode = True
import obrmempool.commands  # noqa: E402  (The path is set above.)
import obrmempool.printers  # noqa: E402

sys.dont_write_bytecode = wrote_none
obrmempool.printers.register(gdb.current_objfile())
