"""The client with a real daemon."""

from __future__ import annotations

import signal
import unittest

import tallow
from daemon import DaemonTest
from tallow import Item, Key, Person, contains, lacks


def mail(identifier: str, subject: str) -> Item:
    return Item(
        identifier,
        group="group/" + subject.split()[0],
        subject=subject,
        authors=[Person("Mara", "mara@example.org")],
        recipients=[Person(address="noor@example.org")],
        date_received=1.7e9,
        text="The fees are due.",
        others={Key.READ: True, Key.PRIORITY: -3},
    )


class ClientTest(DaemonTest):
    def setUp(self) -> None:
        super().setUp()
        self.daemon = self.start_daemon()
        self.client = tallow.Client("test", runtime_directory=str(self.runtime))
        self.addCleanup(self.client.close)

    def found(self, words: str, *conditions: tallow.Condition) -> list[str]:
        items = self.client.search(words, limit=None, conditions=conditions)
        return sorted(item.identifier for item in items)

    def test_finds_what_it_indexed_until_it_is_deleted(self) -> None:
        self.client.index(
            [mail("a", "harbour fees"), mail("b", "harbour repairs"), mail("c", "roof repairs")]
        )
        self.assertEqual(self.found("harb"), ["a", "b"])
        self.assertEqual(self.found("mara re"), ["b", "c"])
        places = [Key.AUTHORS, Key.SUBJECT]
        repairs = contains(Key.SUBJECT, "repairs")
        self.assertEqual(self.found("mara", repairs), ["b", "c"])
        self.assertEqual(self.found("mara", contains(Key.AUTHORS, "repairs")), [])
        self.assertEqual(self.found("mara", lacks(Key.SUBJECT, "repairs")), ["a"])
        self.assertEqual(self.found("", contains(places, "fees", "roof")), ["a", "c"])
        self.assertEqual(self.found("", contains(places, "fees", "roof"), repairs), ["c"])
        self.assertEqual(self.found("mara", lacks(places, "fees", "roof")), ["b"])
        self.assertEqual(self.found("mara", lacks(places, "fees"), repairs), ["b", "c"])
        self.assertEqual(len(self.client.search("mara", limit=2)), 2)

        self.client.delete(["a"])
        self.assertEqual(self.found("harb"), ["b"])
        with self.assertRaises(tallow.RefusedError) as refused:
            self.client.delete(["a"])
        self.assertEqual((refused.exception.domain, refused.exception.code), ("DocStore", 12))
        self.client.delete_groups(["group/roof"])
        self.assertEqual(self.found("mara"), ["b"])
        self.client.delete_all()
        self.assertEqual(self.found("mara"), [])

    def test_found_items_hold_what_lists_show(self) -> None:
        self.client.index([mail("a", "harbour fées 京都")])
        (item,) = self.client.search("harbour")
        self.assertEqual((item.identifier, item.group), ("a", "group/harbour"))
        self.assertEqual((item.subject, item.date_received), ("harbour fées 京都", 1.7e9))
        self.assertEqual(item.authors, [Person("Mara", "mara@example.org")])
        self.assertIn("fees are due", item.snippet or "")
        self.assertGreater(item.score or 0, 0)
        self.assertGreater(item.text_score or 0, 0)

    def test_stores_the_state_after_the_changes(self) -> None:
        self.assertIsNone(self.client.state())
        self.client.update([mail("a", "harbour fees")], [], b"\0\xff")
        with self.assertRaises(tallow.RefusedError):
            self.client.update([mail("b", "roof")], ["unknown"], b"later")
        self.assertEqual(self.client.state(), b"\0\xff")
        self.client.update([], ["a"], b"")
        self.assertEqual(self.client.state(), b"")
        self.assertEqual(self.found("harbour"), [])

    def test_tells_which_words_were_replaced(self) -> None:
        self.client.index([mail("a", "harbour fees"), mail("b", "harbour repairs")])
        self.assertEqual(self.found("repaired "), ["b"])
        (word,) = self.client.replaced_words()
        self.assertEqual((word.typed, word.reason), ("repaired", "stem"))
        self.assertEqual(self.found("harbour "), ["a", "b"])
        self.assertEqual(self.client.replaced_words(), [])

    def test_asks_the_diagnostic_service(self) -> None:
        self.client.index([mail("a", "harbour fees")])
        self.assertIn("hello", self.client.ping("hello"))
        statistics = self.client.statistics()
        self.assertIn(1, statistics.values())
        self.assertTrue(all(isinstance(value, (int, float)) for value in statistics.values()))

    def test_an_error_leaves_the_connection_usable(self) -> None:
        with self.assertRaises(tallow.RefusedError):
            self.client.index([Item("")])
        with self.assertRaises(tallow.RefusedError):
            self.client.search("")
        for wrong in ("a\0b", "\ud800"):
            with self.subTest(wrong), self.assertRaises(tallow.InvalidError):
                self.client.delete([wrong])
        with self.assertRaises(tallow.InvalidError):
            self.client.index([Item("a", others={Key.PRIORITY: 1 << 70})])
        self.client.index([mail("a", "harbour fees")])
        self.assertEqual(self.found("harbour"), ["a"])

    def test_survives_the_end_of_the_daemon(self) -> None:
        self.client.index([mail("a", "harbour fees")])
        self.daemon.send_signal(signal.SIGTERM)
        self.assertEqual(self.daemon.wait(timeout=60), 0)
        with self.assertRaises(tallow.UnreachableError) as gone:
            self.client.search("harbour")
        self.assertIn(str(self.runtime), str(gone.exception))
        self.start_daemon()
        self.assertEqual(self.found("harbour"), ["a"])


class BatchTest(DaemonTest):
    def test_sends_many_items_in_several_calls(self) -> None:
        self.start_daemon()
        with tallow.Client("test", runtime_directory=str(self.runtime)) as client:
            with self.assertRaises(tallow.InvalidError):
                client.index([Item("large", text="a" * (65 << 20))])
            large = b"<!--" + b"x" * (25 << 20) + b"-->"
            client.index(Item(f"item/{i}", subject=f"number{i}", html=large) for i in range(3))
            self.assertEqual([item.identifier for item in client.search("number2 ")], ["item/2"])
            self.assertEqual(len(client.search("number", limit=None)), 3)


if __name__ == "__main__":
    unittest.main()
