"""The module against keystrand-sim."""
import copy
import ctypes
import errno
import gc
import os
import pickle
import signal
import socket
import struct
import subprocess
import sys
import threading
import unittest
import warnings

import kstlib
from kstlib import CredentialProperty, CredentialType, RequirementProperty, RequirementState, RequirementType, _library, requirements
from kstlib.words import PASSPHRASE_MAX_LENGTH
from simulator import EXAMPLES, Simulator

POLICIES = (EXAMPLES / "policies.conf").read_text() + """
policy both = all-of(passphrase(purpose=1), passphrase(purpose=2))
policy typed = passphrase(purpose=3)
policy old = passcode(age=0)
policy seen = user-output
policy others = any-of(marker-4, continuity-unlock)
"""


def passphrase(text=b"open sesame"):
    return kstlib.Passphrase(bytearray(text))


def passphrase_credential(purpose, text=b"open sesame", user=None):
    return kstlib.Credential.from_passphrase(passphrase(text), purpose, user)


def finishes(thread):
    thread.join(30)
    return not thread.is_alive()


def exit_status_of_child(work):
    """Of a forked child that does some work, and is killed when it does not end."""
    child = os.fork()
    if child == 0:
        status = 1
        try:
            work()
            status = 0
        finally:
            os._exit(status)
    killer = threading.Timer(30, os.kill, (child, signal.SIGKILL))
    killer.start()
    try:
        return os.waitstatus_to_exitcode(os.waitpid(child, 0)[1])
    finally:
        killer.cancel()


class WithoutServiceTest(unittest.TestCase):
    def test_absent_service_is_told_in_words(self):
        # The library of this process may have had a connection before.
        ended = subprocess.run(
            [sys.executable, "-c", "import kstlib; kstlib.Context()"], capture_output=True, text=True, timeout=60
        )
        said = f"kstlib.errors.UnexpectedError: KSTContextCreate: {kstlib.status_text(-5)} (status -5)"
        self.assertEqual(ended.stderr.splitlines()[-1], said)

    def test_socket_that_nobody_serves_is_told_in_words(self):
        os.makedirs("/run/keystrand", exist_ok=True)
        try:
            with socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET) as server:
                server.bind("/run/keystrand/service.sock")
            ended = subprocess.run(
                [sys.executable, "-c", "import kstlib; kstlib.Context()"], capture_output=True, text=True, timeout=60
            )
        finally:
            os.unlink("/run/keystrand/service.sock")
        said = f"kstlib.errors.ConnectionFailedError: KSTContextCreate: {kstlib.status_text(-1111)}"
        self.assertEqual(ended.stderr.splitlines()[-1], f"{said} (status -1111: Connection refused)")

    def test_statuses_have_kinds(self):
        for status, kind in (
            (-3, kstlib.BadParameterError),
            (-4, kstlib.OutOfMemoryError),
            (-5, kstlib.UnexpectedError),
            (-7, kstlib.NotContainedError),
            (-1000, kstlib.KernelError),
            (-1001, kstlib.ConnectionFailedError),
            (-5095, kstlib.ConnectionFailedError),
            (-5096, kstlib.KernelError),
            (-6013, kstlib.KernelError),
            (42, kstlib.KernelError),
        ):
            error = kstlib.errors.error_for("KSTName", status)
            self.assertIs(type(error), kind, status)
            self.assertEqual(pickle.loads(pickle.dumps(error)).args, error.args)
        self.assertEqual(
            str(kstlib.errors.error_for("KSTName", -1111)),
            "KSTName: nobody serves the socket of the kernel service (status -1111: Connection refused)",
        )
        self.assertIsInstance(kstlib.errors.error_for("KSTName", -4), MemoryError)


class PassphraseTest(unittest.TestCase):
    def test_it_takes_its_bytes_away(self):
        source = bytearray(b"open sesame")
        seen = memoryview(source)
        with self.assertRaises(BufferError):
            kstlib.Passphrase(source)  # empty it cannot be made while it is looked at
        self.assertEqual(bytes(seen), bytes(11))
        seen.release()
        source = bytearray(b"open sesame")
        self.assertEqual(len(kstlib.Passphrase(source)), 11)
        self.assertEqual(source, b"")

    def test_it_is_wiped_where_it_is(self):
        for wiping in (kstlib.Passphrase.wipe, kstlib.Passphrase.__exit__, kstlib.Passphrase.__del__):
            secret = passphrase()
            kept = secret._bytes
            self.assertIn(b"open sesame", kept)
            wiping(secret)
            self.assertEqual(kept, bytes(PASSPHRASE_MAX_LENGTH + 1))
            self.assertEqual(len(secret), 0)

    def test_what_cannot_be_wiped_is_refused(self):
        for source in ("open sesame", b"open sesame"):
            with self.assertRaises(TypeError):
                kstlib.Passphrase(source)

    def test_limit(self):
        for length in (0, 1, PASSPHRASE_MAX_LENGTH):
            self.assertEqual(len(passphrase(b"x" * length)), length)
        with self.assertRaises(ValueError):
            passphrase(b"x" * (PASSPHRASE_MAX_LENGTH + 1))

    def test_it_is_neither_shown_nor_copied(self):
        self.assertNotIn("open", repr(passphrase()))
        for copying in (copy.copy, copy.deepcopy, pickle.dumps):
            with self.assertRaises(TypeError):
                copying(passphrase())

    def read(self, given):
        """What a process without a terminal reads, and what it leaves."""
        program = (
            "import kstlib, os, sys\n"
            "with kstlib.read_passphrase('Say it: ') as passphrase:\n"
            "    print(len(passphrase), bytes(passphrase._bytes[:len(passphrase)]), os.read(0, 100))"
        )
        ended = subprocess.run(
            [sys.executable, "-c", program], input=given, capture_output=True, start_new_session=True, timeout=60
        )
        return ended.stdout.decode().strip() or ended.stderr.decode().strip().splitlines()[-1]

    def test_reading_without_a_terminal(self):
        self.assertEqual(self.read(b"open sesame\nmore"), "11 b'open sesame' b'more'")
        self.assertEqual(self.read(b"open sesame"), "11 b'open sesame' b''")
        self.assertEqual(self.read(b"\n"), "0 b'' b''")
        self.assertEqual(self.read(b""), "EOFError: no passphrase")
        longest = b"x" * PASSPHRASE_MAX_LENGTH
        self.assertEqual(self.read(longest + b"\nmore"), f"128 {longest} b'more'")
        self.assertEqual(self.read(longest + b"x\nmore"), "ValueError: a passphrase has at most 128 bytes")


class CredentialTest(unittest.TestCase):
    def setUp(self):
        gc.collect()
        self.before = kstlib.allocated_bytes()

    def tearDown(self):
        self.assertEqual(kstlib.allocated_bytes(), self.before)

    def test_properties(self):
        with kstlib.Credential(CredentialType.PASSPHRASE_ENTERED) as credential:
            self.assertEqual(credential.type, CredentialType.PASSPHRASE_ENTERED)
            self.assertEqual(credential.number(CredentialProperty.USER_ID), kstlib.NO_USER)
            credential.set(CredentialProperty.PURPOSE, 0xFFFFFFFE)
            self.assertEqual(credential.number(CredentialProperty.PURPOSE), 0xFFFFFFFE)
            for text in (b"x" * 128, b"open sesame", b"", None):
                for value in (text, bytearray(text or b""), passphrase(text or b"")):
                    credential.set(CredentialProperty.PASSPHRASE, value)
                    self.assertEqual(credential.get(CredentialProperty.PASSPHRASE, bytes), text or b"")

    def test_signed_number(self):
        with kstlib.Credential(CredentialType.PASSCODE_VALIDATED, {CredentialProperty.PROPERTY_102: -2}) as credential:
            self.assertEqual(credential.number(CredentialProperty.PROPERTY_102), 0xFFFFFFFE)

    def test_what_was_handed_over_is_wiped(self):
        kept = []
        with passphrase_credential(1) as credential:
            self.assertEqual(credential.get(CredentialProperty.PASSPHRASE, lambda data: kept.append(data) or len(data)), 11)
        self.assertEqual(bytes(kept[0]), bytes(11))

    def test_wrong_properties(self):
        with kstlib.Credential(CredentialType.MARKER4) as credential:
            with self.assertRaises(kstlib.BadParameterError):
                credential.set(CredentialProperty.PURPOSE, 1)
            with self.assertRaises(kstlib.BadParameterError):
                credential.get(CredentialProperty.PURPOSE, bytes)
        with self.assertRaises(kstlib.BadParameterError):
            kstlib.Credential(13)
        with self.assertRaises(kstlib.BadParameterError):
            kstlib.Credential(CredentialType.MARKER4, {CredentialProperty.PASSPHRASE: passphrase()})

    def test_numbers_that_do_not_fit_are_refused(self):
        for wrong in (-1, 1 << 32):
            with self.assertRaises(OverflowError):
                kstlib.Credential(wrong)
        for wrong in (-(1 << 31) - 1, 1 << 32):
            with kstlib.Credential(CredentialType.PASSPHRASE_ENTERED) as credential, self.assertRaises(OverflowError):
                credential.set(CredentialProperty.PURPOSE, wrong)

    def test_closed_one(self):
        credential = passphrase_credential(1)
        credential.close()
        credential.close()
        with self.assertRaisesRegex(ValueError, "closed"):
            credential.set(CredentialProperty.PURPOSE, 1)
        with self.assertRaisesRegex(ValueError, "closed"):
            credential.type

    def test_dropped_one_is_wiped_and_freed(self):
        passphrase_credential(1)

    def test_dropped_while_another_thread_is_in_a_call(self):
        with _library.locked():
            held = [passphrase_credential(1)]
            thread = threading.Thread(target=held.clear)
            thread.start()
            self.assertTrue(finishes(thread), "the garbage collector waits for nobody")
            self.assertEqual(len(_library._dropped), 1)


class TreeTest(unittest.TestCase):
    def tree(self, depth):
        """A leaf below so many composites of one child, where the library finds it; and its copy."""
        leaf = struct.pack("=5I", RequirementType.PASSPHRASE_ENTERED, RequirementState.MISSING, 0, 4, 5)
        nodes = [ctypes.create_string_buffer(leaf, len(leaf))]
        for _ in range(depth):
            node = struct.pack("=5IQ", RequirementType.AND, RequirementState.MISSING, 0, 12, 1, ctypes.addressof(nodes[-1]))
            nodes.append(ctypes.create_string_buffer(node, len(node)))
        copied = requirements.copied_tree(ctypes.addressof(nodes[-1]))
        for node in nodes:
            ctypes.memset(node, 0xFF, len(node))
        return copied

    def test_deepest_tree_of_an_answer(self):
        # 20 bytes for each node, of the 4092 that an answer has for them.
        depth = 4092 // 20 - 1
        tree = self.tree(depth)
        self.assertEqual([leaf.purpose for leaf in tree.leaves()], [5])
        lines = str(tree).splitlines()
        self.assertEqual((len(lines), lines[0], lines[-1]), (depth + 1, "all of", "  " * depth + "a passphrase for purpose 5"))
        self.assertEqual(tree, self.tree(depth))
        self.assertNotEqual(tree, self.tree(depth - 1))
        self.assertEqual(hash(tree), hash(self.tree(depth)))
        self.assertEqual(repr(tree).count("Requirement("), depth + 1)

    def test_deeper_one_than_functions_call_each_other(self):
        tree = self.tree(20000)
        self.assertEqual([depth for depth, _ in tree.walk()], list(range(20001)))

    def test_numbers_without_a_name(self):
        odd = kstlib.Requirement(999, 7, 0)
        self.assertEqual(str(odd), "not a type of requirements: 999, state 7")


class ServiceTest(unittest.TestCase):
    """With a kernel side."""

    @classmethod
    def setUpClass(cls):
        cls.sim = cls.enterClassContext(Simulator(POLICIES))

    def setUp(self):
        gc.collect()
        self.sim.ctl("fault", "clear")
        for type in CredentialType:
            kstlib.global_context.remove_type(type)
        self.sim.ctl("requests", "clear")
        self.before = kstlib.allocated_bytes()
        self.assertEqual(self.contexts(), [])

    def contexts(self):
        return [line.split()[1] for line in self.sim.ctl("contexts")]

    def account(self):
        gc.collect()
        return kstlib.allocated_bytes() - self.before


class ContextTest(ServiceTest):
    def test_story(self):
        with kstlib.Context() as context:
            answer = context.verify_policy("unlock")
            self.assertFalse(answer)
            self.assertEqual(str(answer.missing), "a passphrase for purpose 1")
            self.assertEqual(answer.missing.purpose, 1)
            with passphrase() as secret:
                context.add_passphrase(secret, 1)
            self.assertEqual(context.verify_policy("unlock"), kstlib.Answer(True))
            self.assertEqual(self.sim.credentials(self.contexts()[0]), [(2, str(os.getuid()))])
        self.assertEqual(self.contexts(), [])
        self.assertEqual(self.account(), 1)

    def test_tree_is_a_value(self):
        with kstlib.Context() as context:
            settings, pay = (context.verify_policy(f"com.example.{name}").missing for name in ("settings", "pay"))
        gc.collect()
        self.assertEqual(
            str(settings),
            "any of\n  a passcode of the last 300 seconds\n  all of\n    a biometric match\n"
            "    a passphrase for any purpose",
        )
        self.assertEqual(str(pay), "2 of\n  a passcode\n  a biometric match\n  a passphrase for purpose 2")
        self.assertEqual([leaf.type for leaf in settings.leaves()], [1, 3, 2])
        self.assertEqual([node.priority for _, node in pay.walk()], [0, 0, 1, 0])
        self.assertEqual([depth for depth, _ in settings.walk()], [0, 1, 1, 2, 2])
        biometry = pay.children[1]
        self.assertEqual(len(biometry.properties[RequirementProperty.PROPERTY_301]), 32)
        self.assertEqual(len(biometry.properties[RequirementProperty.PROPERTY_300]), 16)
        self.assertEqual(biometry.age_limit, kstlib.NO_AGE_LIMIT)
        self.assertNotEqual(settings, pay)
        self.assertEqual(hash(settings), hash(copy.deepcopy(settings)))
        self.assertEqual(settings, pickle.loads(pickle.dumps(settings)))

    def test_other_leaves(self):
        with kstlib.Context() as context:
            seen = context.verify_policy("seen").missing
            self.assertEqual(str(seen), "output displayed to the user")
            self.assertEqual(len(seen.properties[RequirementProperty.PROPERTY_400]), 32)
            self.assertEqual(kstlib.credential_type_for(seen.type), CredentialType.USER_OUTPUT_DISPLAYED)
            self.assertEqual(str(context.verify_policy("others").missing), "any of\n  marker 4\n  a continuity unlock")
            self.assertEqual(str(context.verify_policy("com.example.retired").missing), "what no credential gives")

    def test_credential_that_is_too_old(self):
        with kstlib.Context() as context, kstlib.Credential(CredentialType.PASSCODE_VALIDATED) as passcode:
            self.sim.ctl("clock", "set", 2_000_000_000)
            context.add(passcode)
            self.sim.ctl("clock", "advance", 1)
            missing = context.verify_policy("old").missing
            self.sim.ctl("clock", "real")
        self.assertEqual(str(missing), "a passcode of the last 0 seconds, too old")
        self.assertEqual(missing.state, RequirementState.TOO_OLD)

    def test_credentials_go_in_and_out(self):
        with kstlib.Context() as context, passphrase_credential(2) as second:
            handle = self.contexts()[0]
            context.add(second)
            context.add_passphrase(passphrase(), 1, user=7)
            self.assertEqual(self.sim.credentials(handle), [(2, str(os.getuid())), (2, "7")])
            self.assertTrue(context.contains(CredentialType.PASSPHRASE_ENTERED))
            self.assertFalse(context.contains(CredentialType.MARKER4))
            self.assertTrue(context.contains_passphrase(1))
            self.assertFalse(context.contains_passphrase(3))
            context.remove_passphrases(1)
            self.assertFalse(context.contains_passphrase(1))
            with passphrase_credential(2, b"another", user=9) as other:
                context.replace_passphrases(other)
            self.assertEqual(self.sim.credentials(handle), [(2, "9")])
            context.add(second)
            context.remove(second)
            self.assertEqual(self.sim.credentials(handle), [(2, "9")])
            context.remove_type(CredentialType.PASSPHRASE_ENTERED)
            self.assertEqual(self.sim.credentials(handle), [])
        self.assertEqual(self.account(), 1)

    def test_global_context(self):
        place = kstlib.global_context
        self.assertEqual(str(place.verify_policy("unlock").missing), "a passphrase for purpose 1")
        with passphrase_credential(1) as credential, kstlib.Context() as context:
            place.add(credential)
            self.assertTrue(place.verify_policy("unlock"))
            self.assertFalse(context.verify_policy("unlock"), "global credentials of no age")
            self.assertTrue(context.verify_policy("unlock", max_global_credential_age=3600))
            self.assertEqual(len(self.sim.credentials()), 1)
            place.remove(credential)
            self.assertEqual(self.sim.credentials(), [])
            place.add_passphrase(passphrase(), 1)
            place.replace_passphrases(credential)
            self.assertEqual(len(self.sim.credentials()), 1)
            place.remove_passphrases(1)
            self.assertEqual(self.sim.credentials(), [])
            place.add(credential)
            place.remove_type(CredentialType.PASSPHRASE_ENTERED)
        self.assertEqual(self.sim.credentials(), [])

    def test_preflight_uses_nothing_up(self):
        constraint = b"passphrase(purpose=2, once)"
        with kstlib.Context() as context:
            context.add_passphrase(passphrase(), 2)
            self.assertTrue(context.verify_acl_constraint(constraint, preflight=True))
            self.assertTrue(context.verify_acl_constraint(constraint))
            self.assertFalse(context.verify_acl_constraint(constraint))

    def test_parameters(self):
        kinds = kstlib.ParameterType
        everything = [
            kstlib.Parameter(kinds.NUMBER1, -1),
            kstlib.Parameter(kinds.BYTES2, bytes(16)),
            kstlib.Parameter(kinds.DATA, b"x" * 1000),
        ]
        me = kstlib.Parameter(kinds.USER_ID, os.getuid())
        with kstlib.Context() as context:
            context.add_passphrase(passphrase(), 1)
            self.assertTrue(context.verify_policy("unlock", parameters=[me, *everything]))
            self.assertTrue(context.verify_acl_constraint(b"policy unlock", parameters=[me]))
            somebody = kstlib.Parameter(kinds.USER_ID, 4242)
            self.assertFalse(context.verify_policy("unlock", parameters=[*everything, somebody]))
            self.assertFalse(kstlib.global_context.verify_policy("unlock", parameters=[somebody]))
            self.assertTrue(context.verify_policy("unlock", parameters=[kstlib.Parameter(kinds.NUMBER5, 5)] * 10))
            for wrong in (
                [kstlib.Parameter(kinds.NUMBER5, 5)] * 11,
                [kstlib.Parameter(kinds.DATA, b"x" * 1001)],
                [kstlib.Parameter(kinds.NUMBER1, b"123")],
                [kstlib.Parameter(8)],
            ):
                with self.assertRaises(kstlib.BadParameterError):
                    context.verify_policy("unlock", parameters=wrong)
            with self.assertRaises(OverflowError):
                context.verify_policy("unlock", parameters=[kstlib.Parameter(1 << 32)])

    def test_names_of_policies(self):
        with kstlib.Context() as context:
            with self.assertRaises(kstlib.KernelError) as caught:
                context.verify_policy("x" * 128)
            self.assertEqual(caught.exception.status, kstlib.KernelStatus.NO_SUCH_POLICY)
            self.assertEqual(str(caught.exception), "KSTContextVerifyPolicyEx: no such policy (status -6013)")
            with self.assertRaises(kstlib.BadParameterError):
                context.verify_policy("x" * 129)
            with self.assertRaises(ValueError):
                context.verify_policy("unlock\0ed")
            with self.assertRaises(kstlib.BadParameterError):
                context.verify_acl_constraint(b"")
            with self.assertRaises(kstlib.KernelError):
                context.verify_acl_constraint(b"nonsense")

    def test_external_form(self):
        with kstlib.Context() as context:
            context.add_passphrase(passphrase(), 1)
            form = context.external_form(bytes)
            self.assertEqual(form.hex(), self.contexts()[0])
            with kstlib.Context.open(form) as same:
                self.assertTrue(same.verify_policy("unlock"))
            self.assertEqual(len(self.contexts()), 1, "who opened it does not destroy it")
        for wrong in (form, b"", form[:15], form + b"x"):
            with self.assertRaises(kstlib.KSTError) as caught:
                kstlib.Context.open(wrong)
            self.assertIsNone(caught.exception.status)
            self.assertIn("log", str(caught.exception))

    def test_external_form_of_a_context_that_is_gone(self):
        with kstlib.Context() as context:
            kstlib.Context.open(context.external_form(bytes)).close(destroy=True)
            with self.assertRaises(kstlib.KSTError) as caught:
                context.external_form(bytes)
            self.assertIsNone(caught.exception.status)
            context.close(destroy=False)
        self.assertEqual(self.account(), 1)

    def test_failed_end_frees_the_object(self):
        self.sim.ctl("fault", "command=2", "status=-42", "perform", "times=3")
        with self.assertRaises(kstlib.KernelError) as caught:
            with kstlib.Context():
                pass
        self.assertEqual(caught.exception.status, -42)
        with self.assertRaises(ZeroDivisionError):
            with kstlib.Context():
                raise ZeroDivisionError
        with self.assertRaises(kstlib.KernelError):
            kstlib.Context().close()
        self.assertEqual(self.account(), 3)

    def test_closed_one(self):
        context = kstlib.Context()
        context.close()
        context.close()
        for use in (
            lambda: context.verify_policy("unlock"),
            lambda: context.contains(1),
            lambda: context.external_form(bytes),
            lambda: context.remove_type(1),
        ):
            with self.assertRaisesRegex(ValueError, "closed"):
                use()
        self.assertEqual(self.sim.commands(), [1, 2])

    def test_dropped_one_warns_and_stays(self):
        with warnings.catch_warnings(record=True) as caught:
            warnings.simplefilter("always")
            handle = kstlib.Context().external_form(bytes)
            gc.collect()
        self.assertEqual([warning.category for warning in caught], [ResourceWarning])
        self.assertEqual(self.account(), 1)
        kstlib.Context.open(handle).close(destroy=True)

    def test_numbers_that_do_not_fit_are_refused(self):
        with kstlib.Context() as context:
            for use in (
                lambda: context.contains((1 << 32) + 2),
                lambda: context.contains_passphrase(-1),
                lambda: context.remove_passphrases(1 << 32),
                lambda: context.verify_policy("unlock", max_global_credential_age=1 << 32),
            ):
                with self.assertRaises(OverflowError):
                    use()
            self.assertEqual(self.sim.commands(), [1])

    def test_failures(self):
        for fault, error, status in (
            ("command=3 status=-42", kstlib.KernelError, -42),
            ("command=3 reply=2", kstlib.UnexpectedError, -5),
            ("command=3 reply=24", kstlib.BadParameterError, -3),
            ("command=3 hang-up", kstlib.ConnectionFailedError, -1000 - errno.ECONNRESET),
        ):
            with kstlib.Context() as context:
                self.sim.ctl("fault", *fault.split())
                with self.assertRaises(error) as caught:
                    context.verify_policy("unlock")
                self.assertEqual(caught.exception.status, status)
        self.assertEqual(self.account(), 4)


class KernelTest(ServiceTest):
    def test_environment_variables(self):
        for value in (b"x", b"\0" * 64, bytearray(b"seven"), b"", None):
            kstlib.set_environment_variable(7, value)
            self.assertEqual(kstlib.environment_variable(7, bytes), value or b"")
        with self.assertRaises(kstlib.BadParameterError):
            kstlib.set_environment_variable(7, b"x" * 65)

    def test_kernel_control(self):
        self.sim.ctl("fault", "control=77", "reply=256")
        reply = kstlib.kernel_control(77, b"\1", bytes)
        self.assertEqual((len(reply), reply[:3]), (256, b"\1\2\3"))
        self.sim.ctl("fault", "control=77", "reply=0")
        self.assertEqual(kstlib.kernel_control(77, None, bytes), b"")
        called = []
        with self.assertRaises(kstlib.KernelError):
            kstlib.kernel_control(77, b"x" * 256, called.append)
        with self.assertRaises(kstlib.BadParameterError):
            kstlib.kernel_control(77, b"x" * 257, called.append)
        self.assertEqual(called, [], "what a failure hands over means nothing")

    def test_acl_characteristics(self):
        acl = b"allow decrypt = policy unlock allow sign = passcode"
        self.assertEqual(
            kstlib.acl_characteristics(acl),
            b"".join(number.to_bytes(4, sys.byteorder) for number in (2, 1 << 2, 1 << 2, 1 << 1, 1 << 1)),
        )
        with self.assertRaises(kstlib.KernelError) as caught:
            kstlib.acl_characteristics(b"nonsense")
        self.assertEqual(caught.exception.status, kstlib.KernelStatus.BAD_CONSTRAINT)
        with self.assertRaises(kstlib.BadParameterError):
            kstlib.acl_characteristics(b"")


class ExceptionTest(ServiceTest):
    """What is raised while the library is in a call reaches the caller, and the call ends as always."""

    def test_what_process_raises(self):
        kept = []

        def fail(data):
            kept.append(data)
            raise ZeroDivisionError("of the caller")

        with kstlib.Context() as context, passphrase_credential(1) as credential:
            kstlib.set_environment_variable(7, b"seven")
            for use in (
                lambda: context.external_form(fail),
                lambda: credential.get(CredentialProperty.PASSPHRASE, fail),
                lambda: kstlib.environment_variable(7, fail),
            ):
                with self.assertRaisesRegex(ZeroDivisionError, "of the caller"):
                    use()
            self.assertEqual([bytes(data) for data in kept], [bytes(16), bytes(11), bytes(5)])
            self.assertFalse(context.verify_policy("unlock"))
        self.assertEqual(self.account(), 1)

    def test_what_is_raised_in_a_block(self):
        def fail(*_):
            raise ZeroDivisionError("in the block")

        with kstlib.Context() as context:
            question = (context._pointer, b"unlock", False, None, 0, 0)
            for error in (ZeroDivisionError, ZeroDivisionError):
                with self.assertRaisesRegex(error, "in the block"):
                    _library.collect(
                        "KSTContextVerifyPolicyEx", *question, block=_library.PolicyStatusBlock, take=fail
                    )
            self.assertEqual(self.account(), 17, "the tree is freed")
            self.assertFalse(context.verify_policy("unlock"))

    def test_first_of_several_is_raised(self):
        def fail(child):
            raised.append(child)
            raise ZeroDivisionError(len(raised))

        def take(status, satisfied, requirement):
            block = _library.RequirementBlock
            _library.collect("KSTRequirementGetSubrequirements", requirement, block=block, take=fail)

        raised = []
        with kstlib.Context() as context:
            question = (context._pointer, b"both", False, None, 0, 0)
            with self.assertRaises(ZeroDivisionError) as caught:
                _library.collect("KSTContextVerifyPolicyEx", *question, block=_library.PolicyStatusBlock, take=take)
            self.assertEqual((caught.exception.args, len(raised)), ((1,), 1), "the second child is not taken")

    def test_interrupt_during_a_call(self):
        with kstlib.Context() as context:
            self.sim.ctl("fault", "command=3", "delay=200")

            def interrupt():
                self.sim.ctl("wait", "requests=2", "timeout=30000")
                os.kill(os.getpid(), signal.SIGINT)

            thread = threading.Thread(target=interrupt)
            thread.start()
            with self.assertRaises(KeyboardInterrupt):
                context.verify_policy("unlock")
                threading.Event().wait(30)
            self.assertTrue(finishes(thread))
            self.assertEqual(self.account(), 17)
            self.assertFalse(context.verify_policy("unlock"))


class ThreadsTest(ServiceTest):
    def test_eight_threads(self):
        rounds, failures = 40, []

        def work(number):
            try:
                for _ in range(rounds):
                    with kstlib.Context() as context:
                        assert context.verify_policy("unlock").missing.purpose == 1
                        with passphrase_credential(1) as credential:
                            context.add(credential)
                            assert credential.get(CredentialProperty.PASSPHRASE, bytes) == b"open sesame"
                        assert context.verify_policy("unlock")
                        assert kstlib.environment_variable(number, bytes) == b""
            except BaseException as error:
                failures.append(error)

        threads = [threading.Thread(target=work, args=(number,)) for number in range(8)]
        for thread in threads:
            thread.start()
        self.assertTrue(all([finishes(thread) for thread in threads]))
        self.assertEqual(failures, [])
        self.assertEqual(self.account(), 8 * rounds, "each context leaves 1")
        self.assertEqual(self.contexts(), [])


class ForkTest(ServiceTest):
    def test_child_uses_a_context_and_leaves_it(self):
        with kstlib.Context() as context:

            def work():
                with context:
                    context.add_passphrase(passphrase(), 1)

            self.assertEqual(exit_status_of_child(work), 0)
            self.assertEqual(len(self.contexts()), 1)
            self.assertTrue(context.verify_policy("unlock"))

    def test_child_of_another_threads_call(self):
        with kstlib.Context() as context, kstlib.Context() as others:
            self.sim.ctl("fault", "command=3", "delay=1000")
            answers = []
            thread = threading.Thread(target=lambda: answers.append(others.verify_policy("unlock")))
            thread.start()
            self.sim.ctl("wait", "requests=3", "timeout=30000")
            self.assertEqual(exit_status_of_child(lambda: context.add_passphrase(passphrase(), 1)), 0)
            self.assertTrue(finishes(thread))
            self.assertEqual([bool(answer) for answer in answers], [False])
            self.assertTrue(context.verify_policy("unlock"))

    def test_child_of_a_block(self):
        def take(status, satisfied, requirement):
            return exit_status_of_child(lambda: context.add_passphrase(passphrase(), 1))

        with kstlib.Context() as context:
            question = (context._pointer, b"unlock", False, None, 0, 0)
            block = _library.PolicyStatusBlock
            self.assertEqual(_library.call_with_block("KSTContextVerifyPolicyEx", *question, block=block, take=take), 0)
            self.assertTrue(context.verify_policy("unlock"))


if __name__ == "__main__":
    unittest.main()
