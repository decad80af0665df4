#!/usr/bin/env python3
"""Tests that scripts/terminal finds the command wherever the build folder is."""
import pathlib
import subprocess
import sys
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
COMMAND = pathlib.Path(sys.argv.pop(1))
BUILD = COMMAND.parent.parent
UNSHARE = ["unshare", "--mount", "--map-root-user"]
# On a tmpfs, so that nothing of it remains. The libraries are found where they were built.
ELSEWHERE = """
mount -t tmpfs none "$3"
mkdir "$3/build"
mount --bind "$1" "$3/build"
exec "$2" --check "$3/build/tools/kovabackup"
"""


class Terminal(unittest.TestCase):
    def check_below(self, folder):
        return subprocess.run(
            [*UNSHARE, "sh", "-ec", ELSEWHERE, "sh", BUILD, ROOT / "scripts/terminal", folder],
            capture_output=True, text=True, check=False)

    def test_the_build_may_be_below_a_folder_that_is_hidden(self):
        for folder in ("/var/lib", "/mnt", "/tmp"):
            with self.subTest(folder=folder):
                result = self.check_below(folder)
                self.assertEqual(result.returncode, 0, result.stdout + result.stderr)


if __name__ == "__main__":
    if subprocess.run([*UNSHARE, "true"], stderr=subprocess.DEVNULL, check=False).returncode != 0:
        print("skipped: no mount namespace")
        sys.exit(77)
    unittest.main()
