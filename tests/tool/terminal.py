#!/usr/bin/python3 -I
"""Runs the tool on its own terminal and prints what the terminal shows.

terminal.py [--columns N] [--modes FILE] [--answer TEXT REPLY]... [--shell SCRIPT] -- ARGUMENTS...

The tool is that of VEMO_TEST_TOOL; with a script, sh runs that, and the tool is its $0.
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


def wait_until_it_sleeps(pid):
    """A program that shows a text and then reads does not see a Ctrl-C in between until the next key."""
    deadline = time.monotonic() + TIMEOUT
    while time.monotonic() < deadline:
        with open(f"/proc/{pid}/stat", encoding="ascii", errors="replace") as status:
            if status.read().rpartition(")")[2].split()[0] not in "RD":
                return
        time.sleep(0.001)


def talk(child, answers, modes):
    """Types the answers, and returns all that is shown until the end."""
    shown = b""
    for text, reply in answers:
        child.expect_exact(os.fsencode(text))
        shown += child.before + child.after
        modes.write("typed: " + ("shown" if child.getecho() else "hidden") + "\n")
        wait_until_it_sleeps(child.pid)
        child.send(os.fsencode(reply))
    child.expect_exact(pexpect.EOF)
    return shown + child.before


def main():
    end = sys.argv.index("--")
    parser = argparse.ArgumentParser()
    parser.add_argument("--columns", type=int, default=80)
    parser.add_argument("--modes", default=os.devnull)
    parser.add_argument("--answer", nargs=2, action="append", default=[])
    parser.add_argument("--shell")
    options = parser.parse_args(sys.argv[1:end])
    shell = ["sh", "-c", options.shell] if options.shell else []
    command = [*shell, os.environ["VEMO_TEST_TOOL"], *sys.argv[end + 1:]]
    # What runs in the background of a script ignores the signal.
    child = pexpect.spawn(command[0], command[1:], timeout=TIMEOUT, dimensions=(24, options.columns),
                          preexec_fn=lambda: signal.signal(signal.SIGINT, signal.SIG_DFL))
    child.delaybeforesend = None
    with open(options.modes, "w", encoding="ascii") as modes:
        try:
            shown = talk(child, options.answer, modes)
        except pexpect.ExceptionPexpect as failure:
            print("the terminal does not show what is expected:", failure, file=sys.stderr)
            child.kill(signal.SIGKILL)
            return 99
        untouched = termios.tcgetattr(pty.openpty()[1])
        same = termios.tcgetattr(child.child_fd) == untouched
        modes.write("modes: " + ("as before" if same else "changed") + "\n")
    sys.stdout.buffer.write(shown.replace(b"\r\n", b"\n"))
    child.wait()
    return child.exitstatus if child.signalstatus is None else 128 + child.signalstatus


sys.exit(main())
