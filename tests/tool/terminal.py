#!/usr/bin/python3
"""Runs a program on a terminal of its own and prints what the terminal shows.

terminal.py [--columns N] [--modes FILE] [--answer TEXT REPLY]... PROGRAM ARGUMENTS...

When the terminal shows TEXT, REPLY is typed, as $'...' of the shell has it: return is \\r, Ctrl-C \\x03,
Ctrl-D \\x04. With several answers, one after the other. FILE receives a line for each, whether the terminal
showed then what was typed, and one at the end, whether its modes are those of the start.
The exit status is the program's, as a shell tells it; 99 when a TEXT or the program's end did not come.
"""

import argparse
import os
import pty
import signal
import sys
import termios
import time

import pexpect

TIMEOUT = 20  # seconds


def initial_modes():
    """The modes of a terminal that no program has touched."""
    own, other = pty.openpty()
    modes = termios.tcgetattr(other)
    os.close(own)
    os.close(other)
    return modes


def wait_until_it_sleeps(pid):
    """What shows a text and then reads takes a Ctrl-C that comes in between for none until the next key."""
    deadline = time.monotonic() + TIMEOUT
    while time.monotonic() < deadline:
        with open(f"/proc/{pid}/stat", encoding="ascii", errors="replace") as status:
            if status.read().rpartition(")")[2].split()[0] not in "RD":
                return
        time.sleep(0.001)


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--columns", type=int, default=80)
    parser.add_argument("--modes", default=os.devnull)
    parser.add_argument("--answer", nargs=2, action="append", default=[])
    parser.add_argument("command", nargs=argparse.REMAINDER)
    arguments = parser.parse_args()

    child = pexpect.spawn(arguments.command[0], arguments.command[1:],
                          dimensions=(24, arguments.columns), timeout=TIMEOUT,
                          # What runs in the background of a script ignores it.
                          preexec_fn=lambda: signal.signal(signal.SIGINT, signal.SIG_DFL))
    child.delaybeforesend = None
    child.ptyproc.delayafterclose = 0
    shown = b""
    with open(arguments.modes, "w", encoding="ascii") as modes:
        try:
            for text, reply in arguments.answer:
                child.expect_exact(os.fsencode(text))
                shown += child.before + child.after
                modes.write("typed: " + ("shown" if child.getecho() else "hidden") + "\n")
                wait_until_it_sleeps(child.pid)
                child.send(os.fsencode(reply))
            child.expect_exact(pexpect.EOF)
        except (pexpect.EOF, pexpect.TIMEOUT) as failure:
            print(failure, file=sys.stderr)
            child.close(force=True)
            return 99
        shown += child.before
        same = termios.tcgetattr(child.child_fd) == initial_modes()
        modes.write("modes: " + ("as before" if same else "changed") + "\n")
    child.wait()
    sys.stdout.buffer.write(shown.replace(b"\r\n", b"\n"))
    return 128 + child.signalstatus if child.signalstatus else child.exitstatus


sys.exit(main())
