"""Wire formats, and a daemon that answers badly."""

from __future__ import annotations

import os
import pathlib
import random
import re
import socket
import struct
import unittest
from collections.abc import Callable

import tallow
from daemon import DaemonTest, FalseDaemon, greet, read_line
from tallow import Item, Key, Person, connection, marshal, records, wire
from tallow.client import SEARCH_SERVICE


class MarshalTest(unittest.TestCase):
    def round_trip(self, signature: str, *values: object) -> None:
        writer = marshal.Writer()
        for kind, value in zip(marshal.split_signature(signature), values, strict=True):
            writer.put(kind, value)
        reader = marshal.Reader(bytes(writer.data))
        self.assertEqual(reader.get_all(signature), list(values))
        self.assertEqual(reader.at, len(writer.data))

    def test_values_come_back(self) -> None:
        self.round_trip("ysx", 255, "", -1 << 63)
        self.round_trip("yaay", 1, [b"", b"\0\xff", b"abc"])
        self.round_trip("yt", 1, (1 << 64) - 1)
        self.round_trip("ya(sss)b", 1, [("a", "b", "é"), ("", "", "")], True)
        self.round_trip("as", ["a", "bc"])
        self.round_trip("ayd", b"\0", 0.5)

    def test_known_bytes(self) -> None:
        writer = marshal.Writer()
        writer.put("y", 7)
        writer.put("as", ["é"])
        self.assertEqual(writer.data, b"\7\0\0\0\7\0\0\0\2\0\0\0\xc3\xa9\0")

    def test_every_truncation_is_refused(self) -> None:
        writer = marshal.Writer()
        writer.put("aay", [b"abc", b"d"])
        writer.put("(sx)", ("text", 5))
        for size in range(len(writer.data)):
            with self.subTest(size=size), self.assertRaises(tallow.ProtocolError):
                marshal.Reader(bytes(writer.data[:size])).get_all("aay(sx)")

    def test_malformed_signatures_are_refused(self) -> None:
        for signature in ("a", "(s", "z", "a" * 50 + "y", "(" * 40 + ")" * 40):
            with self.subTest(signature), self.assertRaises(tallow.ProtocolError):
                marshal.Reader(bytes(64)).get_all(signature)

    def test_variants_that_nest_end(self) -> None:
        with self.assertRaises(tallow.ProtocolError):
            marshal.Reader(b"\1v\0" * 100).get("v")


class RecordTest(unittest.TestCase):
    def test_items_come_back(self) -> None:
        item = Item(
            "a", group="g", subject="s", html=b"\0", authors=[Person("n", "a"), Person()],
            mailboxes=["x", ""], date_created=-0.5, others={142: True, 146: -1, 999: "new"},
        )  # fmt: skip
        back = records.decode_item(records.encode_item(item))
        self.assertEqual(back, item)

    def test_known_bytes(self) -> None:
        item = Item("id", subject="hi", date_received=1.0)
        self.assertEqual(
            records.encode_item(item).hex(),
            "0a06" "080d" "1a026869" + "0a0b" "0865" "31000000000000f03f" + "12026964",
        )  # fmt: skip

    def test_conditions_need_an_attribute_and_a_text(self) -> None:
        for keys, texts in (([], ["a"]), (Key.SUBJECT, [])):
            with self.assertRaises(tallow.InvalidError):
                tallow.lacks(keys, *texts)

    def test_numbers_at_the_limits(self) -> None:
        for number in (0, 127, 128, (1 << 63) - 1, -1, -1 << 63):
            (read,) = wire.numbers_and_parts(wire.field_int(4, number))
            self.assertEqual(wire.signed(read[2]), number)

    def test_damaged_records_are_refused_or_read(self) -> None:
        data = records.encode_item(Item("id", subject="hi", authors=[Person("n", "a")]))
        random_bytes = random.Random(7)
        for _ in range(3000):
            damaged = bytearray(data[: random_bytes.randrange(len(data) + 1)])
            for _ in range(random_bytes.randrange(3)):
                if damaged:
                    damaged[random_bytes.randrange(len(damaged))] = random_bytes.randrange(256)
            try:
                records.decode_item(bytes(damaged))
            except tallow.ProtocolError:
                pass


class Recorded(connection.Connection):
    """Reads from given bytes in place of a socket."""

    def __init__(self, data: bytes) -> None:
        super().__init__("/", "service", 0)
        self._left = data
        self._serial = 1

    def _receive(self, size: int) -> bytes:
        if size > len(self._left):
            raise tallow.UnreachableError("the end")
        part, self._left = self._left[:size], self._left[size:]
        return part


class DamagedReplyTest(unittest.TestCase):
    def test_damage_gives_an_error_of_this_package_or_values(self) -> None:
        item = records.encode_item(Item("a", subject="s"))
        body = marshal.Writer()
        body.put("aay", [item, item])
        failure = marshal.Writer()
        failure.put("(ssi)", ("message", "domain", 3))
        random_bytes = random.Random(5)
        for data in (reply(1, "aay", bytes(body.data)), reply(1, "ssi", bytes(failure.data), 3)):
            for _ in range(5000):
                damaged = bytearray(data)
                for _ in range(random_bytes.randrange(1, 4)):
                    damaged[random_bytes.randrange(len(damaged))] = random_bytes.randrange(256)
                try:
                    (items,) = Recorded(bytes(damaged))._reply("aay")
                    for one in items:
                        records.decode_item(one)
                except tallow.Error:
                    pass


def reply(serial: int, signature: str, body: bytes, kind: int = 2) -> bytes:
    fields = marshal.Writer()
    fields.data.extend(struct.pack("<cBBBII", b"l", kind, 0, 1, len(body), 1))
    fields.put("a(yv)", [(5, ("u", serial)), (8, ("g", signature))])
    fields.align(8)
    return bytes(fields.data) + body


class BadDaemonTest(DaemonTest):
    def client(self, speak: Callable[[socket.socket], None], timeout: float = 60) -> tallow.Client:
        daemon = FalseDaemon(self.runtime / SEARCH_SERVICE, speak)
        self.addCleanup(daemon.stop)
        client = tallow.Client("test", runtime_directory=str(self.runtime), timeout=timeout)
        self.addCleanup(client.close)
        return client

    def answered(self, data: bytes) -> tallow.Client:
        def speak(daemon: socket.socket) -> None:
            greet(daemon)
            daemon.recv(4096)
            daemon.sendall(data)
            while data and daemon.recv(4096):
                pass

        return self.client(speak)

    def greeted_by(self, answer: bytes) -> tallow.Client:
        def speak(daemon: socket.socket) -> None:
            read_line(daemon)
            daemon.sendall(answer)

        return self.client(speak)

    def test_no_socket_and_a_path_that_is_too_long(self) -> None:
        for directory in (str(self.runtime), "/" + "a" * 200):
            with self.subTest(directory), self.assertRaises(tallow.UnreachableError):
                tallow.Client("test", runtime_directory=directory).search("a")

    def expect(self, error: type[tallow.Error], client: tallow.Client) -> None:
        """Searches with a client, and makes room for the next false daemon."""
        with self.assertRaises(error):
            client.search("a")
        (self.runtime / SEARCH_SERVICE).unlink()

    def test_failures_of_a_call(self) -> None:
        def wait(daemon: socket.socket) -> None:
            greet(daemon)
            while daemon.recv(4096):
                pass

        self.expect(tallow.ProtocolError, self.greeted_by(b"REJECTED EXTERNAL\r\n"))
        self.expect(tallow.ProtocolError, self.greeted_by(b"OK " + b"a" * 4096))
        self.expect(tallow.UnreachableError, self.answered(b""))
        self.expect(tallow.TimedOutError, self.client(wait, timeout=0.05))
        self.expect(tallow.RefusedError, self.answered(reply(1, "", b"", kind=3)))

    def test_replies_with_other_content(self) -> None:
        good = marshal.Writer()
        good.put("aay", [records.encode_item(Item("a"))])
        body = bytes(good.data)
        cases = {
            "other type": reply(1, "as", body),
            "too short": reply(1, "aay", body[:-1]),
            "too long": reply(1, "aay", body + b"\0"),
            "no record": reply(1, "aay", b"\5\0\0\0\1\0\0\0\xff"),
            "large array": reply(1, "aay", b"\xff\xff\xff\x7f"),
            "not D-Bus": b"HTTP/1.1 400 Bad Request\r\n\r\n",
            "large body": struct.pack("<cBBBIII", b"l", 2, 0, 1, 1 << 31, 1, 0),
            "large header": struct.pack("<cBBBIII", b"l", 2, 0, 1, 0, 1, 1 << 31),
        }
        for name, data in cases.items():
            with self.subTest(name):
                self.expect(tallow.ProtocolError, self.answered(data))
        client = self.answered(reply(9, "s", b"") + reply(1, "aay", body))
        self.assertEqual([item.identifier for item in client.search("a")], ["a"])

    def test_calls_share_a_connection_until_it_is_closed(self) -> None:
        empty = b"\0\0\0\0"

        def speak(daemon: socket.socket) -> None:
            greet(daemon)
            for serial in (1, 2):
                daemon.recv(4096)
                daemon.sendall(reply(serial, "aay", empty))

        client = self.client(speak)
        self.assertEqual([client.search("a"), client.search("b")], [[], []])


class KeyTest(unittest.TestCase):
    def test_keys_are_those_of_the_records(self) -> None:
        text = pathlib.Path(os.environ["TALLOW_SOURCE"], "interfaces/tallow.proto").read_text()
        numbers = {name: int(number) for name, number in re.findall(r"^  (\w+) = (\d+);", text, re.M)}
        for key in Key:
            self.assertEqual(numbers[key.name], key.value)


if __name__ == "__main__":
    unittest.main()
