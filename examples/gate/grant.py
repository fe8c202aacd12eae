#!/usr/bin/python3
"""Asks the gate: grant.py API METHOD, with the token's id on standard input.

Prints the token's user and ends with 0. Ends with 1 if the call is refused, and with 2 if there is no answer.
"""
import http.client
import os
import socket
import sys
from urllib.parse import quote, unquote


class Gate(http.client.HTTPConnection):
    def connect(self):
        self.sock = socket.socket(socket.AF_UNIX)
        self.sock.settimeout(3)
        self.sock.connect(os.environ.get("GATE_SOCKET", "/run/vemo-access-token-gate/calls.sock"))


try:
    gate = Gate("gate")
    gate.request("GET", "/grant/{}/{}".format(*(quote(name, safe="") for name in sys.argv[1:3])),
                 headers={"Authorization": "Bearer " + sys.stdin.readline().strip()})
    answer = gate.getresponse()
except (OSError, http.client.HTTPException) as error:
    print("no answer:", error, file=sys.stderr)
    sys.exit(2)
if answer.status == 200:
    print(unquote(answer.headers["X-Token-User"]))
else:
    print("refused" if answer.status in (401, 403) else "no answer", file=sys.stderr)
    sys.exit(1 if answer.status in (401, 403) else 2)
