#!/usr/bin/python3 -IS
"""Runs the tool on a terminal of its own and prints what the terminal shows.

terminal.py [--columns N] [--modes FILE] [--answer TEXT REPLY]... [--shell SCRIPT] -- ARGUMENTS...

The tool is that of VEMO_TEST_TOOL; with a script, sh runs that, and the tool is its $0.
When the terminal shows TEXT, REPLY is typed, as $'...' of the shell has it: return is \\r, Ctrl-C \\x03,
Ctrl-D \\x04. With several answers, one after the other. FILE receives a line for each, whether the terminal
showed then what was typed, and one at the end, whether its modes are those of the start.
The exit status is the program's, as a shell tells it; 99 when a TEXT or the program's end did not come.
"""

import fcntl
import os
import pty
import select
import signal
import struct
import sys
import termios
import time

TIMEOUT = 20  # seconds
FLAGS = 3  # where termios.tcgetattr() has the local ones


def command_line():
    """Returns the options by their names, the answers as pairs, and what to run."""
    options = {"--columns": "80", "--modes": os.devnull, "--shell": ""}
    answers = []
    rest = iter(os.fsencode(argument) for argument in sys.argv[1:])
    for option in rest:
        if option == b"--":
            break
        if option == b"--answer":
            answers.append((next(rest), next(rest)))
        else:
            options[option.decode()] = next(rest)
    script = options["--shell"]
    return options, answers, [*(["sh", "-c", script] if script else []), os.environ["VEMO_TEST_TOOL"], *rest]


def start(command, columns):
    """Returns the process that runs the command, and the terminal that all its streams are on."""
    pid, terminal = pty.fork()
    if pid == 0:
        fcntl.ioctl(0, termios.TIOCSWINSZ, struct.pack("4H", 24, columns, 0, 0))
        signal.signal(signal.SIGINT, signal.SIG_DFL)  # what runs in the background of a script ignores it
        os.execvp(command[0], command)
    return pid, terminal


def initial_modes():
    """Returns the modes of a terminal that no program has touched."""
    own, other = pty.openpty()
    modes = termios.tcgetattr(other)
    os.close(own)
    os.close(other)
    return modes


def read_on(terminal):
    """Returns what the terminal shows next, and nothing when all programs have closed it."""
    if not select.select([terminal], [], [], TIMEOUT)[0]:
        raise TimeoutError
    try:
        return os.read(terminal, 1 << 16)
    except OSError:
        return b""


def wait_until_it_sleeps(pid):
    """What shows a text and then reads takes a Ctrl-C that comes in between for none until the next key."""
    deadline = time.monotonic() + TIMEOUT
    while time.monotonic() < deadline:
        with open(f"/proc/{pid}/stat", encoding="ascii", errors="replace") as status:
            if status.read().rpartition(")")[2].split()[0] not in "RD":
                return
        time.sleep(0.001)


def talk(pid, terminal, answers, modes):
    """Types the answers, and returns all that is shown until the end."""
    shown = b""
    answered = 0  # bytes of it
    for text, reply in answers:
        while text not in shown[answered:]:
            more = read_on(terminal)
            if not more:
                raise EOFError
            shown += more
        answered = shown.index(text, answered) + len(text)
        hidden = not termios.tcgetattr(terminal)[FLAGS] & termios.ECHO
        modes.write("typed: " + ("hidden" if hidden else "shown") + "\n")
        wait_until_it_sleeps(pid)
        os.write(terminal, reply)
    while more := read_on(terminal):
        shown += more
    return shown


def main():
    options, answers, command = command_line()
    pid, terminal = start(command, int(options["--columns"]))
    with open(options["--modes"], "w", encoding="ascii") as modes:
        try:
            shown = talk(pid, terminal, answers, modes)
        except (EOFError, TimeoutError) as failure:
            print("the terminal does not show what is expected:", repr(failure), file=sys.stderr)
            os.kill(pid, signal.SIGKILL)
            return 99
        same = termios.tcgetattr(terminal) == initial_modes()
        modes.write("modes: " + ("as before" if same else "changed") + "\n")
    sys.stdout.buffer.write(shown.replace(b"\r\n", b"\n"))
    status = os.waitstatus_to_exitcode(os.waitpid(pid, 0)[1])
    return status if status >= 0 else 128 - status


sys.exit(main())
