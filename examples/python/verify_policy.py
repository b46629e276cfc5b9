#!/usr/bin/env python3
"""Asks whether a context satisfies a policy, adds the passphrases that are missing, asks again.

    verify_policy.py POLICY
"""
import ctypes
import os
import sys
from ctypes import POINTER, byref, c_bool, c_char_p, c_int32, c_size_t, c_uint32, c_void_p

PASSPHRASE_ENTERED = 2  # the type of the credential, and that of the requirement
# Properties of credentials; 200 of a requirement is the purpose that it asks for.
USER, PASSPHRASE, PURPOSE = 5, 200, 201


def block(*handed):
    """A block of C: a function and what it captured, which Python keeps in the function itself."""
    function = ctypes.CFUNCTYPE(None, c_void_p, *handed)
    fields = [("invoke", function), ("captured", c_void_p)]
    struct = type("Block", (ctypes.Structure,), {"_fields_": fields})
    return lambda callback: struct(function(lambda _, *args: callback(*args)), None), struct


policy_block, KSTPolicyBlock = block(c_bool, c_void_p)
requirement_block, KSTRequirementBlock = block(c_void_p)

lib = ctypes.CDLL("libKSTLib.so.1")
for name, result, *arguments in (
    ("KSTContextCreate", c_int32, POINTER(c_void_p)),
    ("KSTContextDelete", c_int32, c_void_p, c_bool),
    ("KSTContextAddCredential", c_int32, c_void_p, c_void_p),
    ("KSTContextVerifyPolicy", c_int32, c_void_p, c_char_p, KSTPolicyBlock),
    ("KSTCredentialCreate", c_int32, c_uint32, POINTER(c_void_p)),
    ("KSTCredentialSetProperty", c_int32, c_void_p, c_uint32, c_char_p, c_size_t),
    ("KSTCredentialDelete", None, c_void_p),
    ("KSTRequirementGetType", c_uint32, c_void_p),
    ("KSTRequirementGetPropertyData", c_int32, c_void_p, c_uint32, POINTER(c_void_p), POINTER(c_size_t)),
    ("KSTRequirementGetSubrequirements", None, c_void_p, KSTRequirementBlock),
):
    getattr(lib, name).restype = result
    getattr(lib, name).argtypes = arguments


def check(status):
    if status != 0:
        raise RuntimeError(f"status {status}")


def take_missing(requirement, purposes, depth=1):
    kind = lib.KSTRequirementGetType(requirement)
    data, length = c_void_p(), c_size_t()
    if kind == PASSPHRASE_ENTERED and lib.KSTRequirementGetPropertyData(
        requirement, PASSPHRASE, byref(data), byref(length)
    ) == 0:
        purposes.append(int.from_bytes(ctypes.string_at(data, length.value), "little"))
        print("  " * depth + f"a passphrase for purpose {purposes[-1]}")
        return
    print("  " * depth + f"a requirement of type {kind}")
    lib.KSTRequirementGetSubrequirements(
        requirement, requirement_block(lambda child: take_missing(child, purposes, depth + 1)))


def ask(context, policy):
    """Whether the policy is satisfied, and the purposes of the passphrases that are missing."""
    answer, purposes = [], []

    def take_answer(satisfied, requirement):
        answer.append(satisfied)
        print("satisfied" if satisfied else "not satisfied, missing:")
        if not satisfied:
            take_missing(requirement, purposes)

    print(f"asking about the policy {policy}")
    check(lib.KSTContextVerifyPolicy(context, policy.encode(), policy_block(take_answer)))
    return answer[0], purposes


def add_passphrase(context, purpose):
    passphrase = b"open sesame"  # a real client asks its user
    print(f"adding a passphrase for purpose {purpose}")
    credential = c_void_p()
    check(lib.KSTCredentialCreate(PASSPHRASE_ENTERED, byref(credential)))
    try:
        for number, data in (
            (USER, os.getuid().to_bytes(4, "little")),
            (PURPOSE, purpose.to_bytes(4, "little")),
            (PASSPHRASE, passphrase),
        ):
            check(lib.KSTCredentialSetProperty(credential, number, data, len(data)))
        check(lib.KSTContextAddCredential(context, credential))
    finally:
        lib.KSTCredentialDelete(credential)


def tell_story(policy):
    context = c_void_p()
    check(lib.KSTContextCreate(byref(context)))
    try:
        satisfied, purposes = ask(context, policy)
        for purpose in purposes:
            add_passphrase(context, purpose)
        return ask(context, policy)[0] if purposes else satisfied
    finally:
        if lib.KSTContextDelete(context, True) != 0:
            lib.KSTContextDelete(context, False)


if len(sys.argv) != 2:
    print("usage: verify_policy.py POLICY", file=sys.stderr)
    sys.exit(2)
try:
    sys.exit(0 if tell_story(sys.argv[1]) else 1)
except RuntimeError as error:
    sys.exit(f"verify_policy: {error}")
