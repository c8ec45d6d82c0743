#!/usr/bin/env python3
"""A host for the Zafrel video editor extension, in Python with the standard library only.

It follows the README's "The host protocol": the extension is started with one end of a Unix
socket pair as its descriptor 3, gets `beginExtensionRequest` with the input items, sends its
report (`extensionDidFinishWithActivityTypes`) and is told `removeExtensionView`.

As a module::

    with EditorSession(extension_path) as session:
        session.begin(input_items("/home/me/rec.mp4", "My Recorder", "org.example.Recorder"))
        for types in session.reports():
            print(types)
            session.remove_view()
        status = session.wait()

Expected failures (the extension cannot start, dies, refuses the request, breaks the framing)
raise `HostError`, whose text is a complete message for the user. Leaving the `with` block
always ends the extension: the channel is closed (which the extension takes as
`removeExtensionView`), an extension still running after the grace period is killed, and the
process is reaped.

As a program::

    zafrel_host.py --movie PATH --app-name NAME --bundle-id ID [--attachment PATH]
                   [--share-message TEXT] [--tint #RRGGBB[AA]] [--extension PATH]

prints each report as one compact JSON array line on standard output, removes the view after
the first report and waits for the extension to exit. Exit status: 0 after a report and a normal
exit of the extension; 1 when the extension could not start, died, refused the request or ended
without a report; 2 for bad arguments. Without --extension the program named by the environment
variable ZAF_EXTENSION is run, else the first of /usr/local/libexec/zafrel/ and
/usr/libexec/zafrel/ zaf-video-editor-extension that exists. The extension's standard output
goes to this program's standard error, so that standard output holds the reports alone.
"""

from __future__ import annotations

import argparse
import json
import logging
import os
import re
import signal
import socket
import struct
import sys
import time
from collections.abc import Iterator
from typing import Any

PROTOCOL_VERSION = "1.0"
MAX_MESSAGE_BYTES = 1 << 20
CHANNEL_FD = 3
REPORT_METHOD = "extensionDidFinishWithActivityTypes"
UNSUPPORTED_PROTOCOL_VERSION = -32001

MOVIE_KEY = "ZafVideoEditorExtensionMovieURLKey"
APP_NAME_KEY = "ZafVideoEditorExtensionAppNameKey"
BUNDLE_IDENTIFIER_KEY = "ZafVideoEditorExtensionBundleIdentifierKey"
FILE_ATTACHMENT_KEY = "ZafVideoEditorExtensionFileAttachmentKey"
SHARE_MESSAGE_KEY = "ZafVideoEditorExtensionOverrideShareMessageKey"
TINT_COLOR_KEY = "ZafVideoEditorExtensionOverrideTintColorKey"
TINT_COLOR_TYPE = "application/x-zaf-color"

_VERSION = re.compile(r"(\d+)\.(\d+)")
_COLOR = re.compile(r"#[0-9A-Fa-f]{6}([0-9A-Fa-f]{2})?")
_INSTALLED = tuple(f"{prefix}/libexec/zafrel/zaf-video-editor-extension"
                   for prefix in ("/usr/local", "/usr"))

log = logging.getLogger("zafrel_host")


class HostError(Exception):
    """An expected failure of a session; its text is a complete message for the user."""


class RequestRefused(HostError):
    """The extension answered `beginExtensionRequest` with a JSON-RPC error."""

    def __init__(self, code: Any, message: str, data: Any = None) -> None:
        self.code, self.data = code, data
        if code == UNSUPPORTED_PROTOCOL_VERSION:
            theirs = data.get("protocolVersion") if isinstance(data, dict) else None
            text = (f"the extension does not speak protocol version {PROTOCOL_VERSION} "
                    f"(it speaks {theirs or 'another'}): {message}")
        else:
            text = f"the extension refused the request ({code}): {message}"
        super().__init__(text)


def input_item(title: str, value: str, mime_type: str = "text/plain") -> dict[str, Any]:
    """One input item: a title (one of the *_KEY names) and one attachment holding the value."""
    return {"title": title, "attachments": [{"type": mime_type, "value": value}]}


def input_items(movie: str, app_name: str, bundle_id: str, *, attachment: str | None = None,
                share_message: str | None = None,
                tint: str | None = None) -> list[dict[str, Any]]:
    """The items for a recording: paths made absolute, the optional keys left out when None."""
    items = [input_item(MOVIE_KEY, os.path.abspath(movie)), input_item(APP_NAME_KEY, app_name),
             input_item(BUNDLE_IDENTIFIER_KEY, bundle_id)]
    if attachment is not None:
        items.append(input_item(FILE_ATTACHMENT_KEY, os.path.abspath(attachment)))
    if share_message is not None:
        items.append(input_item(SHARE_MESSAGE_KEY, share_message))
    if tint is not None:
        items.append(input_item(TINT_COLOR_KEY, tint, TINT_COLOR_TYPE))
    return items


def encode_frame(message: dict[str, Any]) -> bytes:
    """A message as the channel carries it: its length (4 bytes, little-endian), then its JSON."""
    body = json.dumps(message, separators=(",", ":")).encode()
    if len(body) > MAX_MESSAGE_BYTES:
        raise HostError(f"a message of {len(body)} bytes is more than the extension reads "
                        f"({MAX_MESSAGE_BYTES})")
    return struct.pack("<I", len(body)) + body


def decode_message(body: bytes) -> dict[str, Any]:
    """The JSON-RPC 2.0 object a frame's body holds; HostError when it holds none."""
    try:
        message = json.loads(body.decode("utf-8"))
    except (UnicodeDecodeError, json.JSONDecodeError) as error:
        raise HostError(f"the extension sent a message that is not UTF-8 JSON: {error}") from None
    if not isinstance(message, dict) or message.get("jsonrpc") != "2.0":
        raise HostError(f"the extension sent something other than a JSON-RPC 2.0 object: "
                        f"{body[:200]!r}")
    return message


def parse_version(text: Any) -> tuple[int, int] | None:
    """MAJOR.MINOR as two numbers; None when the text is not two decimal numbers and a dot."""
    match = _VERSION.fullmatch(text) if isinstance(text, str) else None
    return (int(match[1]), int(match[2])) if match else None


class EditorSession:
    """One run of the extension: started on construction, ended by close() or the with block."""

    def __init__(self, extension: str, *, grace: float = 10.0,
                 answer_timeout: float = 60.0) -> None:
        self.grace, self.answer_timeout = grace, answer_timeout
        self.status: int | None = None  # the exit code, or minus the signal that ended it
        self._next_id = 1
        self._buffer = bytearray()
        self._deadline: float | None = None  # for the channel's close, once the view is removed
        # Our end is close-on-exec (Python's default): the extension sees the channel close
        # when this process ends, however it ends.
        self._sock, theirs = socket.socketpair(socket.AF_UNIX, socket.SOCK_STREAM)
        try:
            if theirs.fileno() == CHANNEL_FD:  # dup2 onto itself would keep close-on-exec
                theirs, moved = theirs.dup(), theirs
                moved.close()
            env = dict(os.environ, ZAF_EXTENSION_CHANNEL_FD=str(CHANNEL_FD))
            actions = [(os.POSIX_SPAWN_DUP2, theirs.fileno(), CHANNEL_FD),
                       (os.POSIX_SPAWN_DUP2, 2, 1)]
            # Python ignores SIGPIPE and SIGXFSZ; the extension gets the defaults back.
            self.pid = os.posix_spawn(extension, [extension], env, file_actions=actions,
                                      setsigdef=(signal.SIGPIPE, signal.SIGXFSZ), setsigmask=())
        except OSError as error:
            self._sock.close()
            raise HostError(f"cannot start the extension {extension}: {error.strerror}") from None
        finally:
            theirs.close()  # a copy kept here would hide the extension's death from us

    def __enter__(self) -> EditorSession:
        return self

    def __exit__(self, *exc_info: object) -> None:
        self.close()

    def begin(self, items: list[dict[str, Any]]) -> str:
        """Sends beginExtensionRequest and returns the extension's protocol version.

        RequestRefused for an error answer (the request may be sent again); HostError when the
        extension ends, breaks the protocol, speaks another major version or does not answer.
        """
        request_id, self._next_id = self._next_id, self._next_id + 1
        self._send({"jsonrpc": "2.0", "id": request_id, "method": "beginExtensionRequest",
                    "params": {"protocolVersion": PROTOCOL_VERSION, "inputItems": items}})
        deadline = time.monotonic() + self.answer_timeout
        while True:
            try:
                message = self._receive(deadline)
            except TimeoutError:
                raise HostError(f"the extension did not answer within "
                                f"{self.answer_timeout:g} s") from None
            if message is None:
                raise HostError(f"the extension ended before it answered ({self.describe_end()})")
            if "method" not in message:
                break
            self._ignore(message)
        if message.get("id") not in (request_id, None):  # null: our request was unreadable
            raise HostError(f"the extension answered request {message.get('id')!r}, "
                            f"not {request_id}")
        if "error" in message:
            error = message["error"] if isinstance(message["error"], dict) else {}
            raise RequestRefused(error.get("code"), str(error.get("message", "")),
                                 error.get("data"))
        result = message.get("result")
        if not isinstance(result, dict) or result.get("accepted") is not True:
            raise HostError(f"the extension did not accept the request: {json.dumps(result)}")
        version = result.get("protocolVersion", "1.0")  # extensions before the version send none
        parsed = parse_version(version)
        if parsed is None:
            raise HostError(f"the extension answered a malformed protocol version {version!r}")
        if parsed[0] != parse_version(PROTOCOL_VERSION)[0]:
            raise HostError(f"the extension speaks protocol version {version}, "
                            f"this host {PROTOCOL_VERSION}")
        return version

    def reports(self) -> Iterator[list[str]]:
        """Each report's activity types, until the extension closes the channel.

        After remove_view() the wait is bounded by the grace period. HostError on a broken message.
        """
        while True:
            try:
                message = self._receive(self._deadline)
            except TimeoutError:
                log.warning("the extension did not close the channel within %g s of the removal",
                            self.grace)
                return
            if message is None:
                return
            params = message.get("params")
            if message.get("method") != REPORT_METHOD:
                self._ignore(message)
            elif (isinstance(params, list) and len(params) == 1 and isinstance(params[0], list)
                  and all(isinstance(t, str) for t in params[0])):
                yield params[0]
            else:
                raise HostError(f"the extension sent a malformed report: "
                                f"{json.dumps(params)[:200]}")

    def remove_view(self) -> None:
        """Sends removeExtensionView: the extension tears the editor down and exits."""
        if self._deadline is None:
            self._deadline = time.monotonic() + self.grace
        try:
            self._send({"jsonrpc": "2.0", "method": "removeExtensionView"})
        except HostError as error:
            log.info("%s", error)  # it has gone already; wait() tells how it ended

    def wait(self) -> int:
        """Closes the channel, waits for the extension, kills it when it is still running after
        the grace period, and returns its exit status (minus the signal that ended it)."""
        self._sock.close()
        deadline = time.monotonic() + self.grace
        while self.status is None and not self._reap(os.WNOHANG) and time.monotonic() < deadline:
            time.sleep(0.05)
        if self.status is None:
            log.warning("the extension (pid %d) did not exit within %g s; killing it",
                        self.pid, self.grace)
            os.kill(self.pid, signal.SIGKILL)
            self._reap(0)
        return self.status

    close = wait

    def describe_end(self) -> str:
        """How the extension ended, for a message; waits for it first."""
        status = self.wait()
        return f"killed by signal {-status}" if status < 0 else f"exit status {status}"

    def _reap(self, flags: int) -> bool:
        pid, status = os.waitpid(self.pid, flags)
        if pid:
            self.status = os.waitstatus_to_exitcode(status)
        return bool(pid)

    def _ignore(self, message: dict[str, Any]) -> None:
        """Skips a notification this host does not know; a request gets 'method not found'."""
        log.info("ignoring the extension's message %s", json.dumps(message)[:200])
        if "id" in message and "method" in message:
            self._send({"jsonrpc": "2.0", "id": message["id"],
                        "error": {"code": -32601, "message": "method not found"}})

    def _send(self, message: dict[str, Any]) -> None:
        try:
            self._sock.sendall(encode_frame(message))
        except OSError as error:
            raise HostError(f"cannot write to the extension: {error.strerror}") from None

    def _receive(self, deadline: float | None) -> dict[str, Any] | None:
        """The next message; None when the extension closed the channel between messages."""
        header = self._read(4, deadline)
        if header is None:
            return None
        (length,) = struct.unpack("<I", header)
        if length > MAX_MESSAGE_BYTES:
            raise HostError(f"the extension sent a frame of {length} bytes, "
                            f"more than {MAX_MESSAGE_BYTES}")
        body = self._read(length, deadline)
        if body is None:
            raise HostError("the extension closed the channel in the middle of a message")
        return decode_message(body)

    def _read(self, count: int, deadline: float | None) -> bytes | None:
        """count bytes; None at the channel's close; TimeoutError at the deadline."""
        while len(self._buffer) < count:
            timeout = None if deadline is None else max(deadline - time.monotonic(), 0.001)
            self._sock.settimeout(timeout)
            try:
                chunk = self._sock.recv(65536)
            except ConnectionResetError:
                chunk = b""
            if not chunk:
                if self._buffer:
                    raise HostError("the extension closed the channel in the middle of a message")
                return None
            self._buffer += chunk
        data = bytes(self._buffer[:count])
        del self._buffer[:count]
        return data


def find_extension() -> str | None:
    """The extension named by ZAF_EXTENSION, else an installed one, else None."""
    named = os.environ.get("ZAF_EXTENSION")
    return named or next((path for path in _INSTALLED if os.access(path, os.X_OK)), None)


def parse_arguments(argv: list[str] | None) -> argparse.Namespace:
    parser = argparse.ArgumentParser(
        description="Opens the video editor extension on a recorded movie and prints the "
                    "activity types the user carried out as a JSON array.")
    for flag, metavar, text, required in (
            ("--movie", "PATH", "the recorded movie", True),
            ("--app-name", "NAME", "the recording application's display name", True),
            ("--bundle-id", "ID", "the recording application's identifier", True),
            ("--attachment", "PATH", "an extra file to share with the movie", False),
            ("--share-message", "TEXT", "text replacing the default share text", False),
            ("--tint", "COLOR", "tint colour, #RRGGBB or #RRGGBBAA", False),
            ("--extension", "PATH", "the extension program", False)):
        parser.add_argument(flag, metavar=metavar, help=text, required=required)
    args = parser.parse_args(argv)
    if not os.path.isfile(args.movie):
        parser.error(f"the movie {args.movie} is not a file")
    if args.attachment is not None and not os.path.isfile(args.attachment):
        parser.error(f"the attachment {args.attachment} is not a file")
    if not args.app_name or not args.bundle_id:
        parser.error("--app-name and --bundle-id must not be empty")
    if args.tint is not None and not _COLOR.fullmatch(args.tint):
        parser.error(f"the tint {args.tint} is not #RRGGBB or #RRGGBBAA")
    return args


def _stop(signum: int, _frame: object) -> None:
    signal.signal(signum, signal.SIG_DFL)  # a second one ends this host at once
    raise HostError(f"stopped by {signal.Signals(signum).name}")


def main(argv: list[str] | None = None) -> int:
    args = parse_arguments(argv)
    logging.basicConfig(format="zafrel_host: %(message)s", level=logging.WARNING)
    signal.signal(signal.SIGTERM, _stop)
    extension = args.extension or find_extension()
    if extension is None:
        log.error("no extension: give --extension or ZAF_EXTENSION, or install %s", _INSTALLED[-1])
        return 1
    items = input_items(args.movie, args.app_name, args.bundle_id, attachment=args.attachment,
                        share_message=args.share_message, tint=args.tint)
    reported = False
    try:
        session = EditorSession(extension)
    except HostError as error:
        log.error("%s", error)
        return 1
    with session:  # whatever happens below, the extension is ended and reaped
        try:
            session.begin(items)
            for types in session.reports():
                sys.stdout.write(json.dumps(types, separators=(",", ":")) + "\n")
                sys.stdout.flush()
                reported = True
                session.remove_view()
            status = session.wait()
        except (HostError, KeyboardInterrupt) as error:
            log.error("%s", str(error) or "interrupted")
            return 1
    if not reported:
        log.error("the extension ended without a report (%s)", session.describe_end())
        return 1
    if status != 0:
        log.error("the extension did not exit normally after its report (%s)",
                  session.describe_end())
        return 1
    return 0


if __name__ == "__main__":
    sys.exit(main())
