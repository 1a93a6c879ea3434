"""What gdb loads with the library: beside it under the library's file name and "-gdb.py", or in the
folder where gdb looks for such files. The package obrmempool lies beside the file that this is when
links are followed. A program that has the library linked in statically sources this file."""

import os
import sys

import gdb

# Where a script of the user's starts the program, __file__ is still that script.
this_file = (lambda: None).__code__.co_filename
folder = os.path.dirname(os.path.realpath(this_file))
if folder not in sys.path:
    sys.path.insert(0, folder)

# What Python would keep beside them, where root runs gdb, no package would remove.
keeps_nothing = sys.dont_write_bytecode
sys.dont_write_bytecode = True
import obrmempool.commands  # noqa: E402  (The path is set above.)
import obrmempool.printers  # noqa: E402

sys.dont_write_bytecode = keeps_nothing
obrmempool.printers.register(gdb.current_objfile())
