"""gdb's view of the pools of libObrMemPool: commands and printers that only read memory.

From the bottom up: layout (the format, byte by byte), memory (the program's bytes), pools (the objects
in them and the ways through them), report, whois and check (one command each), printers and commands.
layout needs no gdb.
"""
