"""What the module says again of the library's headers is what they say: functions, structs, numbers, words."""
import ctypes
import os
import re
import subprocess
import tempfile
import unittest
from pathlib import Path

import kstlib
from kstlib import _library, words

HEADERS = Path(os.environ["INSTALLED"], "usr/include/KSTLib")
TEXT = "".join(
    re.sub(r"/\*.*?\*/|//[^\n]*", "", header.read_text(), flags=re.S) for header in sorted(HEADERS.glob("*.h"))
)

# Names of a C header that have none here.
NOT_HERE = {"kKSTCredentialTypeMax", "kKSTRequirementTypeMax", "kKSTRequirementTypeInMemory"}

ENUMS = {
    "kKSTError": words.Status,
    "kKSTKernelError": words.KernelStatus,
    "kKSTScope": words.Scope,
    "kKSTCredentialType": words.CredentialType,
    "kKSTCredentialProperty": words.CredentialProperty,
    "kKSTRequirementType": words.RequirementType,
    "kKSTRequirementProperty": words.RequirementProperty,
    "kKSTRequirementState": words.RequirementState,
    "kKSTParameterType": words.ParameterType,
}

CONSTANTS = {
    "kKSTCredentialNoUser": words.NO_USER,
    "kKSTNoAgeLimit": words.NO_AGE_LIMIT,
    "kKSTPassphrasePurposeAny": words.ANY_PURPOSE,
    "kKSTPassphraseMaxLength": words.PASSPHRASE_MAX_LENGTH,
    "kKSTMaxParameters": words.MAX_PARAMETERS,
    "kKSTHandleSize": words.EXTERNAL_FORM_SIZE,
}

C_TYPES = {
    "KSTStatus": ctypes.c_int32,
    "KSTScope": ctypes.c_uint32,
    "KSTPassphrasePurpose": ctypes.c_uint32,
    "uint32_t": ctypes.c_uint32,
    "size_t": ctypes.c_size_t,
    "bool": ctypes.c_bool,
    "void": None,
    "const char*": ctypes.c_char_p,
    "KSTContextRef": ctypes.c_void_p,
    "KSTContextRef*": ctypes.POINTER(ctypes.c_void_p),
    "KSTCredential**": ctypes.POINTER(ctypes.c_void_p),
    "const KSTParameter*": ctypes.POINTER(_library.CParameter),
    "KSTDataBlock": _library.DataBlock,
    "KSTRequirementBlock": _library.RequirementBlock,
    "KSTStatusDataBlock": _library.StatusDataBlock,
    "KSTPolicyStatusBlock": _library.PolicyStatusBlock,
}


def run_c(statements):
    """The words that a C program prints."""
    with tempfile.TemporaryDirectory() as directory:
        source, program = Path(directory, "main.c"), Path(directory, "main")
        lines = ["#include <KSTLib/KSTLib.h>", "#include <KSTLib/Words.h>", "#include <inttypes.h>", "#include <stdio.h>"]
        source.write_text("\n".join([*lines, "int main(void) {", *statements, "return 0; }"]))
        subprocess.run(["cc", "-std=c11", f"-I{HEADERS.parent}", source, "-o", program], check=True)
        return subprocess.run([program], check=True, capture_output=True, text=True).stdout.splitlines()


def values_in_c(expressions):
    return [int(line) for line in run_c(f'printf("%" PRId64 "\\n", (int64_t)({value}));' for value in expressions)]


def texts_in_c(function, first, last):
    return run_c([f'for (int64_t i = {first}; i <= {last}; ++i) puts({function}(i));'])


def python_name(name, prefix):
    name = name.removeprefix(prefix).replace("KofN", "K_of_N")
    if name.isdigit():
        return f"PROPERTY_{name}"
    return re.sub(r"(?<=[a-z0-9])(?=[A-Z])", "_", name).upper()


class HeadersTest(unittest.TestCase):
    def test_every_exported_name_is_wrapped_or_named(self):
        exported = Path("exported-symbols").read_text().split()[::2]
        wrapped = {*_library._PROTOTYPES, "gAllocatedBytes"}
        for name in exported:
            places = [
                name in wrapped,
                name in _library.SHORT_FORMS,
                name.startswith(_library.NOT_FOR_PYTHON),
            ]
            self.assertEqual(places.count(True), 1, name)
        self.assertLessEqual(wrapped | set(_library.SHORT_FORMS), set(exported))
        self.assertLessEqual(set(_library.SHORT_FORMS.values()), wrapped)

    def test_prototypes_are_those_of_the_headers(self):
        def type_of(text):
            text = re.sub(r"\s*\*\s*", "*", re.sub(r"\s+", " ", text)).strip()
            return C_TYPES[text] if text in C_TYPES else {True: ctypes.c_void_p}[text.endswith("*")]

        for name, (result, *arguments) in _library._PROTOTYPES.items():
            found = re.search(rf"([\w*]+)\s+{name}\(([^)]*)\)\s*KST_PUBLIC;", TEXT)
            self.assertIsNotNone(found, name)
            wanted = [type_of(re.sub(r"\w+$", "", part.strip())) for part in found[2].split(",")]
            self.assertEqual([result, *arguments], [type_of(found[1]), *wanted], name)

    def test_blocks_hand_over_what_the_headers_say(self):
        for name, block in C_TYPES.items():
            if not name.endswith("Block"):
                continue
            found = re.search(rf"KST_BLOCK\({name},([^;]*)\);", TEXT)
            handed = []
            for part in found[1].split(","):
                words_of_part = part.split()
                handed.append(ctypes.c_void_p if "*" in part else C_TYPES[words_of_part[0]])
            self.assertEqual(block.invoke_type._argtypes_, (ctypes.c_void_p, *handed), name)
            self.assertIsNone(block.invoke_type._restype_)

    def test_structs_have_the_same_layout(self):
        structs = {
            "KSTParameter": _library.CParameter,
            **{name: block for name, block in C_TYPES.items() if name.endswith("Block")},
        }
        expressions, wanted = [], []
        for name, struct in structs.items():
            expressions += [f"sizeof({name})", f"_Alignof({name})"]
            wanted += [ctypes.sizeof(struct), ctypes.alignment(struct)]
            for field, _ in struct._fields_:
                expressions += [f"offsetof({name}, {field})", f"sizeof((({name}*)0)->{field})"]
                wanted += [getattr(struct, field).offset, getattr(struct, field).size]
        self.assertEqual(values_in_c(expressions), wanted)

    def test_enumerations_have_the_same_names_and_values(self):
        named = set(re.findall(r"\b(kKST\w+)\b", TEXT)) - NOT_HERE
        # Of two prefixes that fit, the longer one is meant.
        prefix_of = {name: max((p for p in ENUMS if name.startswith(p)), key=len, default="") for name in named}
        for prefix, enumeration in ENUMS.items():
            names = sorted(name for name in named if prefix_of[name] == prefix)
            values = {python_name(n, prefix): v for n, v in zip(names, values_in_c(names))}
            self.assertEqual(values, {member.name: member.value for member in enumeration})

    def test_constants_have_the_same_values(self):
        self.assertEqual(values_in_c(CONSTANTS), list(CONSTANTS.values()))

    def test_words_are_the_same(self):
        for function, ours, first, last in (
            ("KSTStatusText", kstlib.status_text, -6100, 100),
            ("KSTRequirementTypeText", kstlib.requirement_type_text, 0, 999),
            ("KSTRequirementStateText", kstlib.requirement_state_text, 0, 10),
        ):
            self.assertEqual([ours(n) for n in range(first, last + 1)], texts_in_c(function, first, last), function)

    def test_leaves_are_met_by_the_same_credentials(self):
        theirs = values_in_c(f"KSTCredentialTypeForRequirementType({n})" for n in range(100))
        self.assertEqual([kstlib.credential_type_for(n) or 0 for n in range(100)], theirs)


if __name__ == "__main__":
    unittest.main()
