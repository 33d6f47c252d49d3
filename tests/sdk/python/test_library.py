# SPDX-License-Identifier: Apache-2.0
"""Finding the library: importing loads nothing, and a library that cannot be used is one clear error."""

import os
import subprocess
import sys
import tempfile
import unittest

import kesto

TRY = """
import kesto
for attempt in range(2):
    try:
        kesto.Client()
    except kesto.LibraryError as error:
        print(error)
"""


def run(program: str, library: str | None) -> str:
    environment = {**os.environ, "KESTO_LIBRARY": library or ""}
    finished = subprocess.run([sys.executable, "-c", program], env=environment, capture_output=True, text=True,
                              timeout=20)
    return finished.stdout + finished.stderr


class Library(unittest.TestCase):
    def test_importing_loads_nothing(self) -> None:
        self.assertEqual(run("import kesto; print(kesto.Status(5).name)", "/nowhere/libkesto.so.0"), "NOT_CONNECTED\n")

    def test_a_missing_library_is_an_error_that_says_what_to_do(self) -> None:
        expected = ("libkesto cannot be loaded (/nowhere/libkesto.so.0: cannot open shared object file: No such file "
                    "or directory): install it (./dev install, then ldconfig), or set KESTO_LIBRARY to the path of "
                    "libkesto.so.0\n")
        self.assertEqual(run(TRY, "/nowhere/libkesto.so.0"), expected * 2)

    def test_an_older_library_is_an_error_that_names_what_it_lacks(self) -> None:
        with tempfile.TemporaryDirectory() as directory:
            older = os.path.join(directory, "libkesto.so.0")
            source = 'const char* kesto_error_text(int status) { return status ? "no" : "yes"; }'
            subprocess.run([*os.environ["KESTO_C_COMPILER"].split(), "-shared", "-fPIC", "-x", "c", "-", "-o", older],
                           input=source, text=True, check=True)
            self.assertEqual(run(TRY, older), f"{older} has no function kesto_version: install the libkesto that "
                                              "belongs to this package\n" * 2)

    def test_the_library_tells_its_version_and_its_texts(self) -> None:
        self.assertRegex(kesto.version(), r"^\d+\.\d+\.\d+$")
        self.assertEqual(kesto.error_text(kesto.Status.QUEUE_FULL), "the queue is full")


if __name__ == "__main__":
    unittest.main()
