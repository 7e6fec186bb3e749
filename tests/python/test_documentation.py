"""The installed package, its page, and its type hints."""

from __future__ import annotations

import importlib.util
import os
import pathlib
import re
import subprocess
import sys
import unittest

from daemon import DaemonTest

SOURCE = pathlib.Path(os.environ["TALLOW_SOURCE"])


class InstalledTest(DaemonTest):
    def test_the_program_of_the_page_runs_with_the_installed_package(self) -> None:
        page = (SOURCE / "docs" / "python.md").read_text()
        (program,) = re.findall(r"```python\n(.*?)```", page, re.S)
        prefix = self.directory / "prefix"
        subprocess.run(
            [os.environ["TALLOW_CMAKE"], "--install", os.environ["TALLOW_BUILD"], "--prefix",
             str(prefix), "--component", "python3_tallow"],
            check=True, capture_output=True,
        )  # fmt: skip
        (package,) = prefix.rglob("tallow")
        self.assertTrue((package / "py.typed").exists())
        environment = {"PYTHONPATH": str(package.parent), "RUNTIME_DIRECTORY": str(self.runtime)}
        command = [sys.executable, "-B", "-c", program]
        without = subprocess.run(command, env=environment, capture_output=True, text=True)
        self.assertIn("UnreachableError: daemon not reachable at", without.stderr)
        self.start_daemon()
        with_daemon = subprocess.run(command, env=environment, capture_output=True, text=True)
        self.assertEqual(with_daemon.stderr, "")
        self.assertEqual(with_daemon.stdout, "example/1: Harbour fees for March\n")


class VersionTest(unittest.TestCase):
    def test_the_package_has_the_version_of_the_project(self) -> None:
        project = (SOURCE / "CMakeLists.txt").read_text()
        (version,) = re.findall(r"project\(tallowsearchd VERSION ([0-9.]+)", project)
        package = (SOURCE / "python" / "pyproject.toml").read_text()
        self.assertIn(f'version = "{version}"', package)


class TypesTest(unittest.TestCase):
    def test_type_hints_are_consistent(self) -> None:
        if importlib.util.find_spec("mypy") is None and os.environ.get("CI") != "true":
            self.skipTest("mypy is not installed")
        checked = subprocess.run(
            [sys.executable, "-m", "mypy", "--strict", "--cache-dir", os.devnull, "-p", "tallow"],
            cwd=SOURCE / "python", capture_output=True, text=True,
        )  # fmt: skip
        self.assertEqual(checked.returncode, 0, checked.stdout + checked.stderr)


if __name__ == "__main__":
    unittest.main()
