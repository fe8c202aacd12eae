#!/usr/bin/python3
"""The tool on many tokens: how long each command takes alone, and beside a program that creates a token each 100 ms; its
memory, and how long it keeps the other waiting. Prints a table.

usage: many.py TOOL CREATIONS DIRECTORY [TOKENS]
TOOL and CREATIONS (tests/tool/creations.cpp): built with the redirection linked in. DIRECTORY: for the store, of some
1.5 kB for each token; it must not be there, and stays.
"""
import os
import random
import sqlite3
import string
import subprocess
import sys
import time

TOOL, CREATIONS = map(os.path.abspath, sys.argv[1:3])
DIRECTORY = sys.argv[3]
TOKENS = int(sys.argv[4]) if len(sys.argv) > 4 else 1000000
READING = (["list", "--count"], ["stats"], ["list", "-o", "jsonl"], ["list", "--limit", "20"], ["export", "FILE"], ["doctor"])
CHANGING = (["revoke", "--function", "Mail", "--yes"], ["import", "--in-steps", "FILE"])


def make_store(path):
    draw = random.Random(1)
    letters = string.ascii_letters + string.digits
    now = int(time.time())

    def rows():
        for number in range(TOKENS):
            yield ("".join(draw.choices(letters, k=draw.randint(127, 255))), "" if number % 3 else f"session-{number % 997}",
                   draw.choice([0, 1, 33, 65534, 1000 + number % 50]), now + draw.randint(86400, 10**7),
                   draw.choice([1, 5, 10, -1, 1000]), now - draw.randint(0, 10**6),
                   draw.choice(["VPN", "Mail", "Web", "Backup", f"Example {number % 20}"]),
                   '{"Example.File":{"method":["get","list"]},"Example.Page":{"method":["get"]}}',
                   "{}" if number % 2 else f'{{"device":"phone","number":{number}}}')

    database = sqlite3.connect(path)
    database.execute("PRAGMA journal_mode = OFF")
    database.execute("PRAGMA synchronous = OFF")
    database.executemany("INSERT INTO token VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?)", rows())
    database.commit()
    database.execute("PRAGMA journal_mode = DELETE")
    database.close()


def run(command):
    """The seconds and kilobytes that a command takes."""
    start = time.monotonic()
    with subprocess.Popen([TOOL, *command], stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                          stderr=subprocess.DEVNULL) as tool:
        _, status, usage = os.wait4(tool.pid, 0)
        tool.returncode = os.waitstatus_to_exitcode(status)
    if tool.returncode not in (0, 5):
        sys.exit(f"{command[0]} ended with {tool.returncode}")
    return time.monotonic() - start, usage.ru_maxrss


def run_beside(command):
    """The same, and the output of the other program."""
    with subprocess.Popen([CREATIONS, "100"], stdin=subprocess.PIPE, stdout=subprocess.PIPE) as beside:
        seconds, kilobytes = run(command)
        calls, there, longest = map(int, beside.communicate()[0].split())
    return seconds, kilobytes, calls, calls - there, longest


def make_empty():
    subprocess.run([TOOL, "init"], check=True, stdout=subprocess.DEVNULL)


os.mkdir(DIRECTORY, 0o755)
os.environ["VEMO_REDIRECT_DIR"] = os.path.join(DIRECTORY, "session")
database = os.path.join(DIRECTORY, "session/vemo-access-token.db")
make_empty()
make_store(database)
exported = os.path.join(DIRECTORY, "exported")
print(f"{TOKENS} tokens\n\n| Command | Seconds alone | beside | Memory, MB | Calls beside | lost | longest, ms |\n"
      "|---|---|---|---|---|---|---|")
for words in READING + CHANGING:
    arguments = [exported if word == "FILE" else word for word in words]
    if words in CHANGING:
        alone = ""
    else:
        alone = f"{run(arguments)[0]:.1f}"
    seconds, kilobytes, calls, lost, longest = run_beside(arguments)
    print(f"| `{' '.join(words)}` | {alone} | {seconds:.1f} | {kilobytes / 1024:.0f} | {calls} | {lost} | {longest} |",
          flush=True)
os.unlink(database)
make_empty()
seconds, kilobytes = run(["import", "--in-steps", exported])
print(f"| the same into an empty store | {seconds:.1f} | | {kilobytes / 1024:.0f} | | | |")
