"""EditorSession against a stand-in extension that answers as each case says.

Run with: python3 -m unittest discover -s examples/python-host
"""

import os
import re
import sys
import tempfile
import unittest
from unittest import mock

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import zafrel_host as host  # noqa: E402

# The stand-in reads the request on the channel, does what STANDIN_CASE says, then reads on: it
# exits 0 when told removeExtensionView, 4 when the channel closes first.
STANDIN = r"""#!/usr/bin/env python3
import json, os, socket, struct, sys
case = os.environ["STANDIN_CASE"]
channel = socket.socket(fileno=int(os.environ["ZAF_EXTENSION_CHANNEL_FD"]))
def read():
    header = channel.recv(4, socket.MSG_WAITALL)
    if len(header) < 4: return None
    return json.loads(channel.recv(struct.unpack("<I", header)[0], socket.MSG_WAITALL))
def send(message):
    body = json.dumps(message).encode()
    channel.sendall(struct.pack("<I", len(body)) + body)
request = read()
assert request["params"]["protocolVersion"] == "1.0", request
answer = {"jsonrpc": "2.0", "id": request["id"], "result": {"accepted": True}}
report = {"jsonrpc": "2.0", "method": "extensionDidFinishWithActivityTypes", "params": [["a.b"]]}
if case == "report":
    send(answer); send({"jsonrpc": "2.0", "method": "laterAddition"}); send(report)
elif case == "major2":
    answer["result"]["protocolVersion"] = "2.1"; send(answer)
elif case == "refused":
    send({"jsonrpc": "2.0", "id": request["id"], "error": {"code": -32001, "message": "no",
          "data": {"protocolVersion": "2.0"}}})
elif case == "oversized":
    channel.sendall(struct.pack("<I", (1 << 20) + 1))
elif case == "not-json":
    channel.sendall(struct.pack("<I", 3) + b"\xff{}")
elif case == "truncated":
    channel.sendall(struct.pack("<I", 10) + b"{}"); sys.exit(0)
elif case == "bad-report":
    send(answer); report["params"] = ["a.b"]; send(report)
elif case == "dies":
    os.kill(os.getpid(), 9)
while (message := read()) is not None:
    if message.get("method") == "removeExtensionView":
        sys.exit(0)
sys.exit(4)
"""


class EditorSessionTest(unittest.TestCase):
    def setUp(self) -> None:
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.extension = os.path.join(folder.name, "standin")
        with open(self.extension, "w") as file:
            file.write(STANDIN)
        os.chmod(self.extension, 0o755)

    def run_case(self, case: str) -> tuple[list[list[str]], int]:
        with mock.patch.dict(os.environ, STANDIN_CASE=case):
            self.session = host.EditorSession(self.extension, grace=5, answer_timeout=5)
        with self.session as session:
            self.assertEqual(session.begin(host.input_items("m.mp4", "A", "org.a")), "1.0")
            reports = []
            for types in session.reports():
                reports.append(types)
                session.remove_view()
        return reports, session.status

    def test_report_then_removal(self) -> None:
        self.assertEqual(self.run_case("report"), ([["a.b"]], 0))

    def test_failures_are_host_errors_and_the_extension_is_reaped(self) -> None:
        for case, text in [("major2", "speaks protocol version 2.1"),
                           ("refused", "does not speak protocol version 1.0 (it speaks 2.0)"),
                           ("oversized", "frame of 1048577 bytes"),
                           ("not-json", "not UTF-8 JSON"),
                           ("truncated", "in the middle of a message"),
                           ("bad-report", "malformed report"),
                           ("dies", "ended before it answered (killed by signal 9)")]:
            with self.subTest(case):
                with self.assertRaisesRegex(host.HostError, re.escape(text)):
                    self.run_case(case)
                self.assertIsNotNone(self.session.status)

    def test_a_missing_extension_is_a_host_error(self) -> None:
        with self.assertRaisesRegex(host.HostError, "cannot start the extension /nonexistent"):
            host.EditorSession("/nonexistent")


if __name__ == "__main__":
    unittest.main()
