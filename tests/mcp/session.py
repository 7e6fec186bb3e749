"""A client of `tallow mcp` that compares everything it gets with the protocol's schema."""

from __future__ import annotations

import json
import os
import pathlib
import subprocess
from typing import Any

import jsonschema

PROGRAM = os.environ["TALLOW_PROGRAM"]
SCHEMA = json.loads((pathlib.Path(__file__).parent / "messages.json").read_text())
jsonschema.Draft7Validator.check_schema(SCHEMA)
END_SECONDS = 120


def check(value: Any, definition: str) -> None:
    schema = {"$ref": "#/definitions/" + definition.replace("/", "~1"), **SCHEMA}
    jsonschema.Draft7Validator(schema).validate(value)


class Session:
    """One run of the program, with its input and output as pipes."""

    def __init__(self, environment: dict[str, str], *arguments: str) -> None:
        self._process = subprocess.Popen(
            [PROGRAM, "mcp", *arguments],
            env=environment, stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.PIPE,
        )  # fmt: skip
        self._id = 0

    def send(self, line: bytes) -> None:
        assert self._process.stdin is not None
        self._process.stdin.write(line + b"\n")
        self._process.stdin.flush()

    def read(self) -> Any:
        """The next line, which must be a message of the protocol."""
        assert self._process.stdout is not None
        line = self._process.stdout.readline()
        assert line.endswith(b"\n"), f"the server ended: {line!r}"
        value = json.loads(line.decode("utf-8"))
        check(value, "line")
        return value

    def exchange(self, line: bytes) -> Any:
        self.send(line)
        return self.read()

    def request(self, method: str, params: dict[str, Any] | None = None) -> Any:
        """The result of a request, or its error."""
        self._id += 1
        message: dict[str, Any] = {"jsonrpc": "2.0", "id": self._id, "method": method}
        if params is not None:
            message["params"] = params
        reply = self.exchange(json.dumps(message).encode())
        assert reply["id"] == self._id, reply
        if "error" in reply:
            return reply["error"]
        check(reply["result"], method)
        return reply["result"]

    def notify(self, method: str) -> None:
        self.send(json.dumps({"jsonrpc": "2.0", "method": method}).encode())

    def begin(self, version: str = "2025-06-18") -> Any:
        info = {"name": "test", "version": "0"}
        result = self.request(
            "initialize", {"protocolVersion": version, "capabilities": {}, "clientInfo": info}
        )
        self.notify("notifications/initialized")
        return result

    def call(self, name: str, **arguments: Any) -> Any:
        """What a tool gives: an object, or the text of its failure."""
        result = self.request("tools/call", {"name": name, "arguments": arguments})
        (content,) = result["content"]
        return content["text"] if result["isError"] else json.loads(content["text"])

    def end(self) -> tuple[int, str]:
        """Closes the input. Gives exit status and standard error; nothing else may be written."""
        output, errors = self._process.communicate(timeout=END_SECONDS)
        assert output == b"", output
        return self._process.returncode, errors.decode()

    def kill(self) -> None:
        if self._process.poll() is None:
            self._process.kill()
        self._process.communicate()
