#!/usr/bin/python3
"""Asks whether a context satisfies a policy, has its user enter the passphrases that are missing, asks again.

    verify_policy.py POLICY
"""
import sys
from textwrap import indent

import kstlib


def satisfy(context: kstlib.Context, policy: str) -> bool:
    missing: kstlib.Requirement | None = None
    while True:
        print("asking about the policy", policy)
        answer = context.verify_policy(policy)
        print("satisfied" if answer else f"not satisfied, missing:\n{indent(str(answer.missing), '  ')}")
        if answer.missing is None or answer.missing == missing:
            return answer.satisfied  # or what was added changed nothing
        missing = answer.missing
        for leaf in answer.missing.leaves():
            if leaf.purpose is not None:
                print("adding", leaf.text, flush=True)
                with kstlib.read_passphrase("passphrase: ") as passphrase:
                    context.add_passphrase(passphrase, leaf.purpose)


if len(sys.argv) != 2:
    print("usage: verify_policy.py POLICY", file=sys.stderr)
    sys.exit(2)
try:
    with kstlib.Context() as context:
        sys.exit(0 if satisfy(context, sys.argv[1]) else 1)
except (kstlib.KSTError, EOFError, ValueError) as error:
    sys.exit(f"verify_policy: {error}")
