# SPDX-License-Identifier: Apache-2.0
"""The package describes the interface as the compiler sees it in the headers: the places of all fields, the types of
all functions, and all numbers.

A program in C++ prints them; what it prints must equal what ctypes and the enumerations of the package say.
"""

import ctypes
import dataclasses
import enum
import os
import pathlib
import re
import subprocess
import tempfile
import unittest
from collections.abc import Iterator
from typing import Any

import kesto
from kesto import _library, answers

HEADERS = pathlib.Path(os.environ["KESTO_INCLUDE"])
STRUCTURES = {"kesto_format": _library.Format, "kesto_answer": _library.Answer,
              "kesto_state_change": _library.StateChange, "kesto_options": _library.Options,
              "kesto_statistics": _library.Statistics}
ENUMERATIONS: dict[str, type[enum.IntEnum]] = {
    "KESTO_": kesto.Status, "KESTO_STATE_": kesto.State, "KESTO_SERVICE_": kesto.ServiceType,
    "KESTO_CATEGORY_": kesto.Category, "KESTO_GROUP_": kesto.Group, "KESTO_EVENT_": kesto.EventType,
    "KESTO_OPERATION_": kesto.Operation}

PROGRAM = r"""
#include <kesto/playback.h>
#include <cstdio>
#include <type_traits>

// The kind of a type and its size in bytes: p (pointer), b (bool), f (float), u and i (integers without and with sign).
template <typename T> void show()
{
    if constexpr (std::is_void_v<T>)
        std::printf(" v");
    else if constexpr (std::is_enum_v<T>)
        show<std::underlying_type_t<T>>();
    else
        std::printf(" %c%zu", std::is_pointer_v<T> ? 'p' : std::is_same_v<T, bool> ? 'b'
                    : std::is_floating_point_v<T> ? 'f' : std::is_unsigned_v<T> ? 'u' : 'i', sizeof(T));
}
template <typename Result, typename... Arguments> void showFunction(const char* name, Result (*)(Arguments...))
{
    std::printf("%s", name);
    show<Result>();
    (show<Arguments>(), ...);
    std::printf("\n");
}
#define FUNCTION(name) showFunction(#name, name)
#define STRUCTURE(type) std::printf(#type " %zu\n", sizeof(type))
#define FIELD(type, name) std::printf(#type "." #name " %zu", offsetof(type, name)), \
    show<decltype(type::name)>(), std::printf("\n")
#define NUMBER(name) std::printf(#name " %lld\n", static_cast<long long>(name))

int main()
{
STATEMENTS
}
"""


def shown(kind: Any) -> str:
    if kind is None:
        return "v"
    size = ctypes.sizeof(kind)
    if kind is ctypes.c_bool:
        return f"b{size}"
    if kind is ctypes.c_double:
        return f"f{size}"
    if kind in (ctypes.c_uint16, ctypes.c_uint32, ctypes.c_uint64, ctypes.c_size_t):
        return f"u{size}"
    if kind in (ctypes.c_int, ctypes.c_int64):
        return f"i{size}"
    return f"p{size}"


def lines() -> Iterator[tuple[str, str]]:
    """What the program must do, and what it must print for it."""
    for name, structure in STRUCTURES.items():
        yield f"STRUCTURE({name});", f"{name} {ctypes.sizeof(structure)}"
        for field, kind, *_ in structure._fields_:
            yield f"FIELD({name}, {field});", f"{name}.{field} {getattr(structure, field).offset} {shown(kind)}"
    for name, kinds in _library.PROTOTYPES.items():
        yield f"FUNCTION({name});", " ".join([name, *map(shown, kinds)])
    for prefix, enumeration in ENUMERATIONS.items():
        for member in enumeration:
            yield f"NUMBER({prefix}{member.name});", f"{prefix}{member.name} {member.value}"


def names(kind: Any) -> list[str]:
    return [field.name for field in dataclasses.fields(kind)]


class Interface(unittest.TestCase):
    maxDiff = None

    def test_it_is_that_of_the_headers(self) -> None:
        statements, expected = zip(*lines())
        with tempfile.TemporaryDirectory() as directory:
            program = os.path.join(directory, "interface")
            subprocess.run([*os.environ["KESTO_CXX_COMPILER"].split(), "-std=c++17", f"-I{HEADERS}", "-x", "c++", "-",
                            "-x", "none", os.environ["KESTO_LIBRARY"], "-o", program],
                           input=PROGRAM.replace("STATEMENTS", "\n".join(statements)), text=True, check=True)
            printed = subprocess.run([program], check=True, capture_output=True, text=True, env={
                "LD_LIBRARY_PATH": os.path.dirname(os.environ["KESTO_LIBRARY"])}).stdout
        self.assertEqual(printed.splitlines(), list(expected))

    def test_every_field_and_every_number_of_the_headers_has_its_place(self) -> None:
        header = (HEADERS / "kesto/kesto.h").read_text() + (HEADERS / "kesto/playback.h").read_text()
        code = re.sub(r"//.*", "", header)
        for name, structure in STRUCTURES.items():
            match = re.search(rf"struct {name} \{{(.*?)\}}", code, re.DOTALL)
            assert match
            self.assertEqual(re.findall(r"(\w+);", match.group(1)), [field[0] for field in structure._fields_], name)
        named = {prefix + member.name for prefix, enumeration in ENUMERATIONS.items() for member in enumeration}
        numbers = set(re.findall(r"^ +(KESTO_\w+) = \d+", code, re.MULTILINE))
        self.assertEqual(numbers | set(re.findall(r"#define (KESTO_GROUP_\w+)", code)), named)

    def test_every_field_of_an_answer_a_change_and_the_counts_is_told(self) -> None:
        self.assertEqual(names(answers.Statistics), [field[0] for field in _library.Statistics._fields_])
        in_c = [field[0] for field in _library.Answer._fields_ if field[0] != "reporter_count"]
        self.assertEqual(names(answers.Answer), in_c)
        self.assertIn(f'KESTO_ERROR_DOMAIN "{answers._ERROR_DOMAIN}"', (HEADERS / "kesto/kesto.h").read_text())


if __name__ == "__main__":
    unittest.main()
