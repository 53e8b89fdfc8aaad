#!/usr/bin/env python3
"""kmctl finger and kmctl auth: users, their fingers and passwords, and the auth tokens that these yield.

usage: users_test.py KMCTL [unittest arguments]
"""

import fcntl
import os
import pty
import select
import signal
import stat
import struct
import subprocess
import termios
import time

from kmctl_case import DONE, FAILURE, TEE_ERROR, USAGE, KmctlTest, main

TOKEN = struct.Struct("<BQQQ")  # version, challenge, secure id, authenticator id
TOKEN_END = struct.Struct(">IQ32s")  # type, time, MAC
PASSWORD, FINGERPRINT = 1, 2


class UsersTest(KmctlTest):
    def setUp(self):
        super().setUp()
        self.state = self.path("state")

    def token(self, name):
        """The numbers of a token's file: version, challenge, secure id, authenticator id, type, time, MAC."""
        content = self.read(name)
        self.assertEqual(len(content), 69)
        self.assertEqual(stat.S_IMODE(os.stat(self.path(name)).st_mode) & 0o077, 0, "others can read the token")
        return TOKEN.unpack(content[:TOKEN.size]) + TOKEN_END.unpack(content[TOKEN.size:])

    def failure(self, *arguments, expect):
        return self.json(*arguments, expect=expect)["error"]

    def enrol(self, uid=1000, password=b"swordfish\n", handle="user.handle", *more):
        self.write("password", password)
        return self.json("auth", "enrol", "--uid", str(uid), "--password-file", self.path("password"), "-o",
                         self.path(handle), *more)

    def ask(self, *more, uid=1000, password=b"swordfish\n", handle="user.handle", expect=DONE):
        self.write("password", password)
        return self.json("auth", "token", "--uid", str(uid), "--password-file", self.path("password"),
                         self.path(handle), "-o", self.path("token"), *more, expect=expect)


class Fingers(UsersTest):
    def test_are_enrolled_listed_and_removed(self):
        self.assertEqual(self.kmctl("finger", "list").stdout, b"no fingers are enrolled\n")
        self.assertEqual(self.json("finger", "list"), {"fingers": []})
        users = [1, 0x8000000000000002, 1]
        told = [self.json("finger", "enrol", str(user)) for user in users]
        self.assertEqual([one["secure_id"] for one in told], users)
        fingers = [one["finger"] for one in told]
        self.assertEqual(len(set(fingers)), 3)
        self.assertNotIn(0, fingers)
        self.assertEqual(self.json("finger", "list"), {"fingers": told})
        self.assertEqual(self.json("finger", "remove", str(fingers[1])), {"removed": fingers[1]})
        self.assertEqual(self.json("finger", "list"), {"fingers": [told[0], told[2]]})
        self.assertIn(f"finger {fingers[0]}, user 1", self.kmctl("finger", "list").stdout.decode())
        again = self.json("finger", "enrol", "0x2a")
        self.assertEqual(again["secure_id"], 42)
        self.assertNotIn(again["finger"], fingers, "an id is never used again")

    def test_what_is_not_there_is_refused(self):
        for arguments in (["touch", "77"], ["touch", "77", "-o", self.path("token")], ["remove", "77"]):
            told = self.failure("finger", *arguments, expect=TEE_ERROR)
            self.assertEqual(told["tee_result"]["name"], "TEE_ERROR_ITEM_NOT_FOUND")
            self.assertIn("finger list", told["hint"])
        told = self.failure("finger", "enrol", "0", expect=TEE_ERROR)
        self.assertIn("nobody", told["hint"])
        self.assert_folder_holds("state")

    def test_no_more_than_32_fit_in(self):
        for _ in range(32):
            self.kmctl("finger", "enrol", "5")
        told = self.failure("finger", "enrol", "5", expect=TEE_ERROR)
        self.assertEqual(told["tee_result"]["name"], "TEE_ERROR_OVERFLOW")
        self.assertIn("remove one", told["hint"])
        self.assertEqual(len(self.json("finger", "list")["fingers"]), 32)

    def test_a_touch_yields_a_token_of_the_fingers_user(self):
        finger = self.json("finger", "enrol", "1234567890")["finger"]
        told = self.json("finger", "touch", str(finger), "--challenge", "0x8000000000000011", "-o", self.path("token"))
        version, challenge, user, authenticator, kind, when, _ = self.token("token")
        self.assertEqual((version, challenge, user, kind), (0, 0x8000000000000011, 1234567890, FINGERPRINT))
        self.assertEqual(told["token"], {"type": "fingerprint", "secure_id": user, "authenticator_id": authenticator,
                                         "challenge": challenge, "timestamp_ms": when})
        self.assertEqual((told["finger"], told["output"]), (finger, self.path("token")))
        self.kmctl("finger", "touch", str(finger), "-o", self.path("token"))
        self.assertEqual(self.token("token")[1], 0)

    def test_the_keymaster_ta_believes_a_finger_once_the_device_is_provisioned(self):
        finger = str(self.json("finger", "enrol", "5")["finger"])
        told = self.json("finger", "touch", finger)
        self.assertEqual(told["keymaster_result"]["name"], "TEE_ERROR_ACCESS_DENIED")
        self.assertNotIn("output", told)
        self.assertIn(b"the Keymaster TA refused it (TEE_ERROR_ACCESS_DENIED)",
                      self.kmctl("finger", "touch", finger).stdout)
        self.kmctl("device", "provision", "--lock")
        self.assertEqual(self.json("finger", "touch", finger)["keymaster_result"], {"name": "TEE_SUCCESS", "value": 0})
        self.assertIn(b"the Keymaster TA took note of it", self.kmctl("finger", "touch", finger).stdout)

    def test_a_token_goes_to_standard_output_alone_when_it_is_asked_for_there(self):
        finger = str(self.json("finger", "enrol", "5")["finger"])
        result = self.kmctl("finger", "touch", finger, "-o", "-")
        self.assertEqual(len(result.stdout), 69)
        self.assertIn(b"touched", result.stderr)

    def test_numbers_that_are_none_are_wrong_usage(self):
        for arguments in (["enrol"], ["enrol", "alice"], ["enrol", "-1"], ["enrol", str(1 << 64)], ["touch"],
                          ["touch", str(1 << 32)], ["touch", "1", "--challenge", "x"], ["remove", ""]):
            with self.subTest(arguments=arguments):
                self.kmctl("finger", *arguments, expect=USAGE)
        self.assert_no_device()


class Passwords(UsersTest):
    def test_a_password_yields_a_token_of_its_user(self):
        told = self.enrol()
        self.assertEqual(list(told), ["uid", "secure_id", "handle"])
        self.assertEqual((told["uid"], told["handle"]), (1000, self.path("user.handle")))
        self.assertEqual(len(self.read("user.handle")), 61)
        self.assertEqual(stat.S_IMODE(os.stat(self.path("user.handle")).st_mode) & 0o077, 0)
        answer = self.ask("--challenge", "17")
        version, challenge, user, authenticator, kind, when, _ = self.token("token")
        self.assertEqual((version, challenge, user, kind), (0, 17, told["secure_id"], PASSWORD))
        self.assertEqual(answer, {"output": self.path("token"),
                                  "token": {"type": "password", "secure_id": user, "authenticator_id": authenticator,
                                            "challenge": 17, "timestamp_ms": when}})
        self.assertIn(str(told["secure_id"]), self.kmctl("auth", "token", "--uid", "1000", "--password-file", "-",
                                                         self.path("user.handle"), "-o", self.path("token"),
                                                         data=b"swordfish").stdout.decode())

    def test_a_files_last_line_end_does_not_belong_to_the_password(self):
        self.enrol(password=b"two words \r\n")
        self.ask(password=b"two words ")
        self.ask(password=b"two words", expect=TEE_ERROR)

    def test_a_token_goes_to_standard_output(self):
        self.enrol()
        self.write("password", b"swordfish")
        result = self.kmctl("auth", "token", "--uid", "1000", "--password-file", self.path("password"),
                            self.path("user.handle"))
        self.assertEqual((len(result.stdout), result.stderr), (69, b""))

    def test_a_changed_password_keeps_the_user_and_a_new_one_does_not(self):
        first = self.enrol()
        self.write("old", b"swordfish")
        changed = self.enrol(1000, b"tuna", "new.handle", "--present-handle", self.path("user.handle"),
                             "--present-password-file", self.path("old"))
        self.assertEqual(changed["secure_id"], first["secure_id"])
        self.assertNotEqual(self.read("new.handle"), self.read("user.handle"))
        self.ask(password=b"tuna", handle="new.handle")
        self.ask(password=b"swordfish", handle="new.handle", expect=TEE_ERROR)
        self.assertNotEqual(self.enrol(1000, b"tuna", "third.handle")["secure_id"], first["secure_id"])

    def test_a_change_needs_the_present_password(self):
        self.enrol()
        self.write("old", b"tuna")
        self.write("password", b"salmon")
        told = self.failure("auth", "enrol", "--uid", "1000", "--password-file", self.path("password"),
                            "--present-handle", self.path("user.handle"), "--present-password-file", self.path("old"),
                            "-o", self.path("new.handle"), expect=TEE_ERROR)
        self.assertEqual((told["step"], told["tee_result"]["name"]), ("enrol_password", "TEE_ERROR_ACCESS_DENIED"))
        self.assertFalse(os.path.exists(self.path("new.handle")))

    def test_a_wrong_password_user_or_handle_is_refused_and_leaves_no_token(self):
        self.enrol()
        self.flipped("user.handle", 60, "forged.handle")
        for how in ({"password": b"tuna"}, {"uid": 1001}, {"handle": "forged.handle"}, {"handle": "letter.txt"}):
            with self.subTest(how=how):
                told = self.ask(expect=TEE_ERROR, **how)["error"]
                self.assertEqual(told["tee_result"]["name"], "TEE_ERROR_ACCESS_DENIED")
                self.assertEqual((told["step"], told["tee_origin"]), ("verify_password", "TRUSTED_APP"))
                self.assertNotIn("wait_ms", told)
                self.assertIn("wrong", told["hint"])
                self.assertFalse(os.path.exists(self.path("token")))
        handle = self.path("user.handle")
        self.state = self.path("another device")
        self.ask(handle=handle, expect=TEE_ERROR)

    def test_after_five_failures_even_the_right_password_has_to_wait(self):
        self.enrol()
        for _ in range(5):
            self.assertEqual(self.ask(password=b"tuna", expect=TEE_ERROR)["error"]["tee_result"]["name"],
                             "TEE_ERROR_ACCESS_DENIED")
        told = self.ask(expect=TEE_ERROR)["error"]
        self.assertEqual(told["tee_result"]["name"], "TEE_ERROR_BUSY")
        self.assertGreater(told["wait_ms"], 0)
        self.assertLessEqual(told["wait_ms"], 30000)
        self.assertIn("until the time has passed", told["hint"])
        self.assertIn("--wait", told["hint"])
        self.assertRegex(told["message"], r"TEE_ERROR_BUSY from TRUSTED_APP, wait \d+ ms$")
        self.assertFalse(os.path.exists(self.path("token")))
        self.ask("--wait")  # sits it out, half a minute
        self.assertEqual(len(self.read("token")), 69)
        self.ask()
        other = self.enrol(1001, b"salmon", "other.handle")
        self.ask(uid=1001, password=b"salmon", handle="other.handle")
        self.assertEqual(self.token("token")[2], other["secure_id"], "one user's failures are not another's")

    def test_passwords_that_are_none_are_refused_before_anything_is_asked(self):
        empty = self.write("empty", b"\n")
        for command in (["enrol", "-o", self.path("handle")], ["token", self.data]):
            self.kmctl("auth", *command, "--uid", "1", "--password-file", empty, expect=FAILURE)
            self.kmctl("auth", *command, "--uid", "1", "--password-file", self.path("none"), expect=FAILURE)
        self.assert_no_device()
        long = self.write("long", b"x" * 1025)
        told = self.failure("auth", "enrol", "--uid", "1", "--password-file", long, "-o", self.path("handle"),
                            expect=TEE_ERROR)
        self.assertIn("1 to 1024 bytes", told["hint"])

    def test_handles_are_not_overwritten_by_mistake(self):
        self.enrol()
        kept = self.read("user.handle")
        arguments = ["auth", "enrol", "--uid", "1000", "--password-file", self.path("password"), "-o"]
        self.kmctl(*arguments, self.path("user.handle"), expect=FAILURE)
        self.kmctl(*arguments, self.path("password"), "--force", expect=USAGE)
        self.kmctl(*arguments, self.path("user.handle"), "--force", "--present-handle", self.path("user.handle"),
                   expect=USAGE)
        self.kmctl(*arguments, self.path("no/such/folder"), expect=FAILURE)
        self.assertEqual(self.read("user.handle"), kept)
        self.kmctl(*arguments, self.path("user.handle"), "--force")
        self.assertNotEqual(self.read("user.handle"), kept)
        self.kmctl("auth", "token", "--uid", "1000", "--password-file", "-", "-", expect=USAGE)
        self.kmctl("auth", "token", "--password-file", self.path("password"), self.path("user.handle"), expect=USAGE)
        self.kmctl("auth", "enrol", "--uid", "1000", "--present-password-file", self.path("password"), "-o", "x",
                   expect=USAGE)


class OnATerminal(UsersTest):
    def start(self, *arguments):
        """Starts kmctl on a terminal of its own; gives the process and the terminal's other end."""
        environment = self.environment()  # a device's server, if it starts one, is not the terminal's
        process, terminal = pty.fork()
        if process == 0:
            os.chdir(self.folder)
            os.execve(self.program, [self.program, *arguments], environment)
        return process, terminal

    def read_until(self, terminal, text):
        """What the terminal shows, up to `text`; everything when that is None."""
        shown = b""
        end = time.monotonic() + 120
        while time.monotonic() < end and (text is None or text not in shown):
            if select.select([terminal], [], [], 1)[0]:
                try:
                    more = os.read(terminal, 4096)
                except OSError:  # the program has ended
                    more = b""
                if not more:
                    break
                shown += more
        return shown

    def converse(self, answers, *arguments):
        """Answers each question, and gives what the terminal showed on the whole and the exit code."""
        process, terminal = self.start(*arguments)
        shown = b""
        for question, answer in answers:
            shown += self.read_until(terminal, question)
            self.assertIn(question, shown)
            os.write(terminal, answer)
        shown += self.read_until(terminal, None)
        os.close(terminal)
        return shown, os.waitpid(process, 0)[1]

    def test_passwords_are_asked_for_and_not_shown(self):
        shown, status = self.converse([(b"New password of user 1000: ", b"swordfish\n"),
                                       (b"The same again: ", b"swordfish\n")],
                                      "auth", "enrol", "--uid", "1000", "-o", self.path("user.handle"))
        self.assertEqual(status, 0, shown)
        self.assertNotIn(b"swordfish", shown)
        shown, status = self.converse([(b"Password of user 1000: ", b"swordfish\n")],
                                      "auth", "token", "--uid", "1000", self.path("user.handle"),
                                      "-o", self.path("token"))
        self.assertEqual(status, 0, shown)
        self.assertNotIn(b"swordfish", shown)
        self.token("token")
        shown, status = self.converse([(b"Present password of user 1000: ", b"swordfish\n"),
                                       (b"New password of user 1000: ", b"tuna\n"), (b"The same again: ", b"tuna\n")],
                                      "auth", "enrol", "--uid", "1000", "--present-handle", self.path("user.handle"),
                                      "-o", self.path("new.handle"))
        self.assertEqual(status, 0, shown)
        self.ask(password=b"tuna", handle="new.handle")

    def test_two_answers_that_differ_and_an_empty_one_are_refused(self):
        for answers in ([(b"New password", b"swordfish\n"), (b"again: ", b"tuna\n")], [(b"New password", b"\n")]):
            shown, status = self.converse(answers, "auth", "enrol", "--uid", "1000", "-o", self.path("user.handle"))
            self.assertEqual(os.waitstatus_to_exitcode(status), FAILURE, shown)
            self.assertFalse(os.path.exists(self.path("user.handle")))

    def test_a_signal_ends_the_question_and_the_terminal_shows_again_what_is_typed(self):
        leader, follower = pty.openpty()

        def take_terminal():
            fcntl.ioctl(0, termios.TIOCSCTTY, 0)
            signal.signal(signal.SIGINT, signal.SIG_DFL)  # which whoever runs the tests may ignore

        process = subprocess.Popen([self.program, "auth", "enrol", "--uid", "1", "-o", self.path("user.handle")],
                                   stdin=follower, stdout=follower, stderr=follower, env=self.environment(),
                                   start_new_session=True, preexec_fn=take_terminal)
        self.assertIn(b"New password", self.read_until(leader, b": "))
        self.assertEqual(termios.tcgetattr(follower)[3] & termios.ECHO, 0)
        process.send_signal(signal.SIGINT)
        self.assertEqual(process.wait(timeout=60), -signal.SIGINT)
        self.assertNotEqual(termios.tcgetattr(follower)[3] & termios.ECHO, 0)
        os.close(leader)
        os.close(follower)

    def test_without_a_terminal_there_is_nobody_to_ask(self):
        result = subprocess.run([self.program, "auth", "token", "--uid", "1", self.data, "--json"], capture_output=True,
                                env=self.environment(), check=False, start_new_session=True, stdin=subprocess.DEVNULL)
        self.assertEqual(result.returncode, USAGE)
        self.assertIn(b"--password-file", result.stderr)
        self.assert_no_device()


if __name__ == "__main__":
    main(__doc__)
