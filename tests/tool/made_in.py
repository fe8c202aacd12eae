#!/usr/bin/python3
"""Runs a program and prints the names of the files that are made in a directory meanwhile, also of those that go again.

made_in.py DIRECTORY PROGRAM ARGUMENTS...

The exit status is the program's.
"""

import ctypes
import os
import struct
import subprocess
import sys

IN_CREATE = 0x100


def main():
    libc = ctypes.CDLL(None, use_errno=True)
    watch = libc.inotify_init1(os.O_NONBLOCK | os.O_CLOEXEC)
    if watch < 0 or libc.inotify_add_watch(watch, os.fsencode(sys.argv[1]), IN_CREATE) < 0:
        sys.exit("cannot watch: " + os.strerror(ctypes.get_errno()))
    status = subprocess.run(sys.argv[2:], stdout=subprocess.DEVNULL, check=False).returncode
    try:
        events = os.read(watch, 1 << 20)
    except BlockingIOError:
        return status
    while events:
        length = struct.unpack_from("iIII", events)[3]
        print(events[16:16 + length].rstrip(b"\0").decode())
        events = events[16 + length:]
    return status


sys.exit(main())
