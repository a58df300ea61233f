#!/usr/bin/env python3
"""Tests of install-packages against made-up dpkg-query, apt-get, apt-cache and id."""
import os
import subprocess
import tempfile
import unittest
from pathlib import Path

PROGRAM = Path(__file__).resolve().parent / "install-packages"

# The made-up commands keep the installed packages in the file "installed" and append what they are asked to "calls".
COMMANDS = {
    "dpkg-query": """shift 4
missing=0
for name; do grep -x "$name installed" "$STATE/installed" || missing=1; done
exit $missing""",
    "apt-cache": """[ -e "$STATE/lists" ] || exit 100""",
    "apt-get": """echo "apt-get $*" >>"$STATE/calls"
case "$*" in
*update) [ ! -e "$STATE/offline" ] || exit 100; touch "$STATE/lists"; rm -f "$STATE/old-lists" ;;
*) [ -e "$STATE/lists" ] && [ ! -e "$STATE/old-lists" ] || exit 100
   for name; do echo "$name installed" >>"$STATE/installed"; done ;;
esac""",
    "id": """cat "$STATE/uid" """,
}
UPDATE = "apt-get -q -o DPkg::Lock::Timeout=300 update"
INSTALL = "apt-get -q -y -o DPkg::Lock::Timeout=300 install --no-install-recommends "
BENCHMARKS = ["libbenchmark-dev", "nlohmann-json3-dev", "libsystemd-dev", "systemd"]
# All but the first are there.
OTHERS = "".join(f"{name} installed\n" for name in BENCHMARKS[1:])


class InstallPackagesTest(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.state = Path(folder.name)
        for name, text in COMMANDS.items():
            command = self.state / "bin" / name
            command.parent.mkdir(exist_ok=True)
            command.write_text("#!/bin/sh\n" + text + "\n", encoding="utf-8")
            command.chmod(0o755)
        self.write("installed", "")
        self.write("uid", "0")

    def write(self, name, text=""):
        (self.state / name).write_text(text, encoding="utf-8")

    def run_program(self, *arguments):
        environment = dict(os.environ, STATE=str(self.state), PATH=f"{self.state}/bin:{os.environ['PATH']}")
        return subprocess.run([PROGRAM, *arguments], env=environment, capture_output=True, text=True, check=False)

    def calls(self):
        calls = self.state / "calls"
        return calls.read_text(encoding="utf-8").splitlines() if calls.exists() else []

    def test_says_and_does_nothing_when_everything_is_there(self):
        self.write("installed", "".join(f"{name} installed\n" for name in BENCHMARKS))
        done = self.run_program("benchmarks")
        self.assertEqual((done.returncode, done.stdout, done.stderr, self.calls()), (0, "", "", []))

    def test_installs_only_what_is_missing_and_says_why(self):
        self.write("installed", OTHERS)
        self.write("lists")
        done = self.run_program("benchmarks")
        self.assertEqual((done.returncode, self.calls()), (0, [INSTALL + "libbenchmark-dev"]))
        self.assertIn("  libbenchmark-dev         benchmark framework\n", done.stdout)

    def test_a_package_whose_name_only_begins_alike_does_not_count(self):
        self.write("installed", OTHERS + "libbenchmark-dev-extra installed\n")
        self.write("lists")
        self.run_program("benchmarks")
        self.assertEqual(self.calls(), [INSTALL + "libbenchmark-dev"])

    def test_fetches_the_lists_once_where_the_machine_has_none(self):
        done = self.run_program("benchmarks")
        self.assertEqual((done.returncode, self.calls()), (0, [UPDATE, INSTALL + " ".join(BENCHMARKS)]))

    def test_fetches_old_lists_anew_and_tries_again(self):
        self.write("lists")
        self.write("old-lists")
        done = self.run_program("benchmarks")
        install = INSTALL + " ".join(BENCHMARKS)
        self.assertEqual((done.returncode, self.calls()), (0, [install, UPDATE, install]))

    def test_a_failure_names_the_packages(self):
        self.write("offline")
        done = self.run_program("benchmarks")
        self.assertEqual((done.returncode, self.calls()), (1, [UPDATE]))
        self.assertEqual(done.stderr,
                         "install-packages: apt-get could not install: " + " ".join(BENCHMARKS) + "\n")

    def test_an_ordinary_user_gets_the_command_for_an_administrator(self):
        self.write("uid", "1000")
        done = self.run_program("benchmarks")
        self.assertEqual((done.returncode, self.calls()), (3, []))
        self.assertIn("  sudo apt-get update && sudo apt-get install --no-install-recommends "
                      + " ".join(BENCHMARKS) + "\n", done.stderr)

    def test_a_package_of_two_groups_is_installed_once(self):
        self.write("lists")
        self.run_program("tests", "benchmarks")
        self.assertEqual(self.calls()[0].split().count("nlohmann-json3-dev"), 1)

    def test_an_unknown_group_is_refused_with_the_known_ones(self):
        done = self.run_program("nonsense")
        self.assertEqual((done.returncode, self.calls()), (2, []))
        self.assertEqual(done.stderr, 'install-packages: there is no group "nonsense"; the groups are: '
                                      "build pipewire sound tests benchmarks sanitizers checks coverage package\n")


if __name__ == "__main__":
    unittest.main()
