"""gdb's view of the pools of libObrMemPool: commands and printers that read memory and nothing else.

From the bottom up: layout (the format, byte by byte), memory (the program's bytes), pools (the
objects made of them and the ways through them), report, whois and check (what is told of them),
printers and commands. layout needs no gdb.
"""
