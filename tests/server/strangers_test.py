#!/usr/bin/env python3
"""teed among programs that mean it no good, or have no room for it: floods, clients that never rest, false names, want
of threads, descriptors and readers.

usage: strangers_test.py TEED KMCTL [unittest arguments]
"""
import contextlib
import fcntl
import mmap
import os
import resource
import shutil
import signal
import socket
import struct
import subprocess
import sys
import time
import unittest

import teed_test
from teed_test import DONE, NO_CONNECTION, USAGE, wait_until

HELLO, OPEN_SESSION, INVOKE, SHARE_MEMORY, USE_SLOTS, REFUSED = 1, 2, 3, 5, 7, 0x8000
CROWDED = 3
SUCCESS, ACCESS_DENIED, NOT_SUPPORTED, OUT_OF_MEMORY, COMMUNICATION = 0, 0xFFFF0001, 0xFFFF000A, 0xFFFF000C, 0xFFFF000E
FROM_COMMS, FROM_THE_TA = 2, 4
LOGIN_PUBLIC, LOGIN_USER, LOGIN_APPLICATION = 0, 1, 4
TA = bytes.fromhex("fbacea43f4754df3866f76256aba994f")
IN_OUT = 3
MIB = 1 << 20
STRANGER = 54321  # a user that has nothing
AS_ROOT = os.geteuid() == 0

FLOOD = """
import socket, sys
while True:
    crowd = [socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET) for _ in range(64)]
    for one in crowd:
        one.setblocking(False)
        one.connect_ex(sys.argv[1])
    for one in crowd:
        one.close()
"""

# A program of its own: prints the result of a login as an application.
LOGIN = """
import socket, struct, sys
def ask(kind, body):
    tee.send(b"KTEE" + struct.pack("<HHII", 1, kind, len(body), 1) + body)
    return tee.recv(65536)
tee = socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET)
tee.connect(sys.argv[1])
ask(1, b"")
print(hex(struct.unpack_from("<I", ask(2, bytes.fromhex(sys.argv[2]) + struct.pack("<III", 4, 0, 0)), 16)[0]))
"""


def frame_of(kind, body):
    return b"KTEE" + struct.pack("<HHII", 1, kind, len(body), 1) + body


@contextlib.contextmanager
def sealed_file(size):
    file = os.memfd_create("test", os.MFD_CLOEXEC | os.MFD_ALLOW_SEALING)
    try:
        os.ftruncate(file, size)
        fcntl.fcntl(file, fcntl.F_ADD_SEALS, fcntl.F_SEAL_SHRINK | fcntl.F_SEAL_GROW | fcntl.F_SEAL_SEAL)
        yield file
    finally:
        os.close(file)


class Wire:
    """A client that speaks the wire itself."""

    def __init__(self, path, tee=None):
        self.tee = tee or socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET)
        self.tee.settimeout(60)
        if tee is None:
            self.tee.connect(path)

    def close(self):
        self.tee.close()

    def ask(self, kind, body=b"", files=()):
        """Sends a request; gives the answer's kind and body, or None when the server has closed."""
        frame = frame_of(kind, body)
        with contextlib.suppress(BrokenPipeError):  # what was said before that is still to be read
            socket.send_fds(self.tee, [frame], files) if files else self.tee.send(frame)
        try:
            answer = self.tee.recv(1 << 16)
        except ConnectionResetError:
            answer = self.tee.recv(1 << 16)
        return (struct.unpack_from("<H", answer, 6)[0], answer[16:]) if answer else None

    def result(self, kind, body=b"", files=()):
        told = self.ask(kind, body, files)
        return struct.unpack_from("<I", told[1])[0] if told and told[0] == kind | REFUSED else told

    def log_in(self, method):
        return self.result(OPEN_SESSION, TA + struct.pack("<III", method, 0, 0))

    def session(self):
        """The number of a new one."""
        result, _, number = struct.unpack_from("<III", self.ask(OPEN_SESSION, TA + bytes(12))[1])
        return number if result == SUCCESS else None

    def share(self, size):
        with sealed_file(size) as file:
            return self.result(SHARE_MEMORY, struct.pack("<II", size, IN_OUT), [file])


class BusySlots:
    """A client's slots with the same request in them again and again: as soon as one is taken the next lies there.

    The command makes an RSA key. It is long enough for a program like this one to be always ahead of the server.
    """

    SIZE, ANSWER_WORD, REQUEST, ANSWER = 135168, 128 // 4, 4096, 69632
    TYPES = 0x653

    def __init__(self, client):
        self.client = client
        with sealed_file(self.SIZE) as file:
            self.memory = mmap.mmap(file, self.SIZE)
            self.result = client.result(USE_SLOTS, files=[file])
        self.words = memoryview(self.memory).cast("I")
        self.answers = []
        wish = struct.pack("<I", 3) + b"".join(
            struct.pack("<IIQQ", tag, 0, value, 0)
            for tag, value in ((0x10000002, 1), (0x30000003, 2048), (0x500000C8, 65537)))
        slots = struct.pack("<5I", self.TYPES, 0, 0, 0, len(wish)) + wish + struct.pack("<II", 0, 8192)
        frame = frame_of(INVOKE, struct.pack("<II", client.session(), 13) + slots)
        self.memory[self.REQUEST:self.REQUEST + len(frame)] = frame
        self.length = len(frame)

    def start(self):
        wait_until(lambda: self.words[0] == 1)  # the server sleeps
        self.words[0] = self.length
        self.client.tee.send(b"\0")

    def go_on(self, until, seconds):
        """Whether `until` has come true."""
        end = time.monotonic() + seconds
        while not until() and time.monotonic() < end:
            if self.words[0] == 0:
                self.words[0] = self.length
            if self.words[self.ANSWER_WORD] > 1:
                self.answers.append(struct.unpack_from("<4I", self.memory, self.ANSWER + 16))
                self.words[self.ANSWER_WORD] = 0
        return until()

    def close(self):
        self.words.release()
        self.memory.close()


class StrangersTest(teed_test.TeedTest):
    def setUp(self):
        super().setUp()
        self.processes = []
        self.addCleanup(self.end_processes)

    def wire(self, tee=None):
        client = Wire(self.socket, tee)
        self.addCleanup(client.close)
        return client

    def greeted(self):
        client = self.wire()
        self.assertEqual(client.result(HELLO), SUCCESS)
        return client

    def taken(self, most=64):
        """Connects until it is refused; gives those that were taken, and with what it was refused."""
        clients = []
        for _ in range(most):
            client = self.wire()
            told = client.ask(HELLO)
            if told is None or told[0] == REFUSED:
                return clients, told
            clients.append(client)
        return clients, "nothing"

    def in_a_process(self, work):
        """What `work` gives, a small number, in a process of its own."""
        child = os.fork()
        if child == 0:
            code = 255
            with contextlib.suppress(BaseException):
                code = work()
            os._exit(code)
        return os.waitstatus_to_exitcode(os.waitpid(child, 0)[1])

    def in_a_process_that_stays(self, work):
        """Whether `work` holds in a process of its own, which keeps what it has until end_processes."""
        reading, writing = os.pipe()
        child = os.fork()
        if child == 0:
            with contextlib.suppress(BaseException):
                os.write(writing, b"\1" if work() else b"\0")
                signal.pause()
            os._exit(1)
        self.processes.append(child)
        os.close(writing)
        with os.fdopen(reading, "rb") as pipe:
            return pipe.read(1) == b"\1"

    def end_processes(self):
        while self.processes:
            child = self.processes.pop()
            os.kill(child, signal.SIGKILL)
            os.waitpid(child, 0)

    def start_as_stranger(self, *arguments, **how):
        """Starts teed as a user without rights, who must be able to read what it consists of."""
        os.chmod(self.folder, 0o777)
        able = subprocess.run([teed_test.TEED, "--version"], user=STRANGER, capture_output=True, check=False).returncode
        if able != 0:
            self.skipTest("SKIPPED: other users can't run what lies in this build folder")
        return self.start("--socket-mode", "0666", *arguments, user=STRANGER, **how)


class FloodTest(StrangersTest):
    def test_who_comes_and_goes_all_the_while_neither_keeps_others_out_nor_the_server_from_ending(self):
        teed = self.start()
        flood = [subprocess.Popen([sys.executable, "-c", FLOOD, self.socket]) for _ in range(4)]
        try:
            for _ in range(5):
                wait_until(lambda: subprocess.run(
                    [teed_test.KMCTL, "--tee", "unix:" + self.socket, "tee", "status"], capture_output=True,
                    env=teed_test.environment(), check=False, timeout=60).returncode == DONE, seconds=60)
            teed.send_signal(signal.SIGTERM)
            self.expect_end(teed, DONE)
        finally:
            for one in flood:
                one.kill()
                one.wait()


class RestlessTest(StrangersTest):
    def test_a_client_that_never_rests_does_not_keep_the_server_from_ending(self):
        teed = self.start()
        slots = BusySlots(self.greeted())
        self.addCleanup(slots.close)
        if slots.result == NOT_SUPPORTED:
            self.skipTest("SKIPPED: slots take two processors")
        slots.start()
        self.assertTrue(slots.go_on(lambda: len(slots.answers) == 1, seconds=60))
        teed.send_signal(signal.SIGTERM)
        self.assertTrue(slots.go_on(lambda: teed.poll() is not None, seconds=30), f"{len(slots.answers)} answers")
        # One may have been on its way when the server was told.
        late = [answer[:2] for answer in slots.answers if answer != (SUCCESS, FROM_THE_TA, slots.TYPES, 0)]
        self.assertIn(late, ([], [(COMMUNICATION, FROM_COMMS)]))
        self.expect_end(teed, DONE)


class SharesTest(StrangersTest):
    def test_of_the_connections_a_user_has_three_quarters_and_a_process_one(self):
        self.start("--max-connections", "8")
        wait_until(lambda: self.status()["connections"] == 1)  # the one that asks
        mine, refused = self.taken()
        self.assertEqual(len(mine), 2)
        self.assertEqual(refused, (REFUSED, struct.pack("<I", CROWDED)))
        told = [self.in_a_process_that_stays(lambda: self.wire().ask(HELLO)[0] != REFUSED) for _ in range(5)]
        self.assertEqual(told, [True] * 4 + [False])  # 2 + 4 are the user's 6

    def test_however_few_there_may_be_one_is_served(self):
        for count in ("1", "2", "3"):
            teed = self.start("--max-connections", count)
            wait_until(lambda: self.kmctl_code("info") == DONE)
            teed.terminate()
            self.expect_end(teed, DONE)

    def kmctl_code(self, *arguments):
        return subprocess.run([teed_test.KMCTL, "--tee", "unix:" + self.socket, *arguments], capture_output=True,
                              env=teed_test.environment(), check=False).returncode

    def test_of_the_shared_memory_a_process_has_one_quarter_and_a_user_three(self):
        self.start("--max-memory", "1")
        mine, also_mine = self.greeted(), self.greeted()
        self.assertEqual([mine.share(MIB // 2), also_mine.share(MIB // 2)], [SUCCESS, SUCCESS])
        self.assertEqual([mine.share(1), also_mine.share(1)], [OUT_OF_MEMORY, OUT_OF_MEMORY])
        told = [self.in_a_process_that_stays(lambda: self.greeted().share(MIB) == SUCCESS) for _ in range(3)]
        self.assertEqual(told, [True, True, False])
        self.end_processes()
        mine.close()
        wait_until(lambda: self.status()["shared_bytes"] == MIB // 2)
        self.assertEqual(also_mine.share(MIB // 2), SUCCESS)

    def test_what_no_server_could_keep_to_is_wrong_usage(self):
        for option in ("--max-connections", "--max-sessions", "--max-memory"):
            for value in ("0", "-1", "65537", "18446744073709551616", "many", ""):
                told = subprocess.run([teed_test.TEED, option, value, "--state", self.state], capture_output=True,
                                      env=teed_test.environment(), check=False, timeout=60)
                self.assertEqual(told.returncode, USAGE, (option, value))
        self.assertFalse(os.path.exists(self.state))


class NamesTest(StrangersTest):
    def test_a_program_is_who_it_is(self):
        self.start()
        self.assertEqual(self.greeted().log_in(LOGIN_APPLICATION), SUCCESS)

    def test_a_process_that_is_gone_is_no_program(self):
        self.start()
        tee = socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET)
        self.assertEqual(self.in_a_process(lambda: tee.connect(self.socket) or 0), 0)
        client = self.wire(tee)
        self.assertEqual(client.result(HELLO), SUCCESS)
        self.assertEqual(client.log_in(LOGIN_APPLICATION), ACCESS_DENIED)
        self.assertEqual([client.log_in(LOGIN_PUBLIC), client.log_in(LOGIN_USER)], [SUCCESS, SUCCESS])

    @unittest.skipUnless(AS_ROOT, "SKIPPED: only root can be somebody else")
    def test_a_process_that_the_server_may_not_look_at_is_no_program(self):
        self.start_as_stranger()
        client = self.greeted()
        self.assertEqual(client.log_in(LOGIN_APPLICATION), ACCESS_DENIED)
        self.assertEqual([client.log_in(LOGIN_PUBLIC), client.log_in(LOGIN_USER)], [SUCCESS, SUCCESS])

    def test_a_file_that_is_mounted_over_a_program_is_not_that_program(self):
        apart = ["unshare", "--user", "--map-root-user", "--mount", "sh", "-c"]
        if subprocess.run([*apart, "true"], capture_output=True, check=False).returncode != 0:
            self.skipTest("SKIPPED: no user namespace can be made here")
        self.start()
        own = os.path.realpath(sys.executable)
        victim = self.path("victim")
        shutil.copy("/bin/true", victim)
        login = [LOGIN, self.socket, TA.hex()]
        forged = subprocess.run([*apart, f"mount --bind {own} {victim} && exec {victim} -c \"$@\"", "sh", *login],
                                capture_output=True, text=True, check=False, timeout=60,
                                env={**os.environ, "PYTHONHOME": sys.base_prefix})
        self.assertEqual((forged.stdout.strip(), forged.stderr), (hex(ACCESS_DENIED), ""))
        honest = subprocess.run([*apart, f"exec {own} -c \"$@\"", "sh", *login], capture_output=True, text=True,
                                check=False, timeout=60)
        self.assertEqual((honest.stdout.strip(), honest.stderr), (hex(SUCCESS), ""))


class WantTest(StrangersTest):
    @unittest.skipUnless(AS_ROOT, "SKIPPED: root alone can start it as a user with a limit of its own")
    def test_who_finds_no_thread_is_told_that_the_server_is_busy_and_is_not_counted(self):
        self.start_as_stranger(preexec_fn=lambda: resource.setrlimit(resource.RLIMIT_NPROC, (8, 8)))
        clients, refused = self.taken()
        self.assertEqual(refused, (REFUSED, struct.pack("<I", CROWDED)))
        self.assertTrue(0 < len(clients) < 8, len(clients))
        self.kmctl("info", expect=NO_CONNECTION)
        for client in clients:
            client.close()
        wait_until(lambda: self.kmctl_status() == 1)

    def kmctl_status(self):
        try:
            return self.status()["connections"]
        except AssertionError:
            return None  # the last ones have not gone yet

    def test_a_descriptor_that_there_is_no_room_for_is_want_of_memory(self):
        teed = self.start()
        client = self.greeted()
        # Its standard streams have the three that are left. With less than it watches poll(2) would fail.
        usual = resource.prlimit(teed.pid, resource.RLIMIT_NOFILE, (3, resource.getrlimit(resource.RLIMIT_NOFILE)[1]))
        self.assertEqual(client.share(4096), OUT_OF_MEMORY)
        resource.prlimit(teed.pid, resource.RLIMIT_NOFILE, usual)
        self.assertEqual(client.share(4096), SUCCESS)
        self.assertEqual(self.status()["dropped"], 0)

    def test_nobody_has_to_read_its_trace(self):
        teed = self.start("--trace", "debug")
        teed.stderr.close()
        for _ in range(3):
            self.kmctl("info")
        teed.terminate()
        self.assertEqual(teed.wait(timeout=30), DONE)


if __name__ == "__main__":
    if len(sys.argv) < 3:
        sys.exit(__doc__)
    teed_test.TEED, teed_test.KMCTL = (os.path.abspath(sys.argv.pop(1)) for _ in range(2))
    unittest.main(verbosity=1)
