#!/usr/bin/env python3
"""teed as a process: started, activated, stopped, killed, and asked by kmctl.

usage: teed_test.py TEED KMCTL [unittest arguments]
"""
import json
import os
import resource
import signal
import socket
import stat
import subprocess
import sys
import tempfile
import time
import unittest

TEED = KMCTL = ""
DONE, FAILURE, USAGE, NO_STATE, SOCKET_TAKEN = range(5)
NO_CONNECTION = 5
# A sanitizer's finding must not pass for an exit code.
FINDINGS = {"ASAN_OPTIONS": "exitcode=99", "UBSAN_OPTIONS": "exitcode=99", "LSAN_OPTIONS": "exitcode=99"}


def environment(**extra):
    kept = {k: v for k, v in os.environ.items() if not k.startswith("KEYMASTER_") or k == "KEYMASTER_TA_PATH"}
    return {**kept, **FINDINGS, **extra}


def wait_until(holds, seconds=20):
    end = time.monotonic() + seconds
    while not holds():
        if time.monotonic() > end:
            raise AssertionError("it did not happen")
        time.sleep(0.02)


class TeedTest(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="teed-test-")
        self.addCleanup(folder.cleanup)
        self.folder = folder.name
        self.state = self.path("state")
        self.socket = self.path("tee.sock")

    def path(self, name):
        return os.path.join(self.folder, name)

    def start(self, *arguments, ready=True, state=None, path=None, **how):
        """Starts teed, and waits until it takes connections."""
        process = subprocess.Popen([TEED, "--state", state or self.state, "--socket", path or self.socket, *arguments],
                                   stderr=subprocess.PIPE, text=True, env=environment(**how.pop("env", {})), **how)
        self.addCleanup(self.end, process)
        if ready:
            wait_until(lambda: self.takes_connections(path or self.socket) or process.poll() is not None)
            self.assertIsNone(process.poll(), "teed has ended")
        return process

    @staticmethod
    def end(process):
        if process.poll() is None:
            process.kill()
        process.wait()
        process.stderr.close()

    @staticmethod
    def takes_connections(path):
        with socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET) as probe:
            try:
                probe.connect(path)
                return True
            except OSError:
                return False

    def expect_end(self, process, code):
        _, said = process.communicate(timeout=30)
        self.assertEqual(process.returncode, code, said)
        return said

    def kmctl(self, *arguments, expect=DONE):
        result = subprocess.run([KMCTL, "--tee", "unix:" + self.socket, *arguments], capture_output=True, text=True,
                                env=environment(), cwd=self.folder, check=False)
        self.assertEqual(result.returncode, expect, f"kmctl {arguments}: {result.stdout} {result.stderr}")
        return result

    def status(self):
        return json.loads(self.kmctl("tee", "status", "--json").stdout)

    def sign(self):
        with open(self.path("letter"), "w", encoding="utf-8") as file:
            file.write("Dear reader")
        self.kmctl("sign", "key.blob", "letter", "-o", "letter.sig")
        self.kmctl("verify", "key.blob", "letter.sig", "letter")


class StartTest(TeedTest):
    def test_kmctl_works_through_a_server_as_it_does_without(self):
        self.start()
        self.kmctl("generate", "key.blob")
        self.sign()
        subprocess.run([KMCTL, "--tee", "unix:" + self.socket, "export", "key.blob", "-o", "public.pem"], check=True,
                       cwd=self.folder, env=environment(), capture_output=True)
        checked = subprocess.run(["openssl", "dgst", "-sha256", "-verify", "public.pem", "-signature", "letter.sig",
                                  "letter"], cwd=self.folder, capture_output=True, text=True, check=False)
        self.assertIn("Verified OK", checked.stdout)

    def test_blobs_are_the_devices_whichever_way_it_is_used(self):
        teed = self.start()
        self.kmctl("generate", "key.blob")
        teed.terminate()
        self.expect_end(teed, DONE)
        embedded = subprocess.run([KMCTL, "--state", self.state, "characteristics", "key.blob"], cwd=self.folder,
                                  env=environment(), capture_output=True, check=False)
        self.assertEqual(embedded.returncode, DONE)

    def test_the_socket_is_the_users_own_unless_it_is_said_otherwise(self):
        self.start()
        self.assertEqual(stat.S_IMODE(os.stat(self.socket).st_mode), 0o600)
        other = self.path("other.sock")
        self.start("--socket-mode", "0666", state=self.path("other"), path=other)
        self.assertEqual(stat.S_IMODE(os.stat(other).st_mode), 0o666)

    def test_the_socket_is_in_the_state_folder_when_nobody_says(self):
        process = subprocess.Popen([TEED, "--state", self.state], stderr=subprocess.PIPE, env=environment())
        self.addCleanup(self.end, process)
        wait_until(lambda: self.takes_connections(os.path.join(self.state, "teed.sock")))

    def test_a_second_server_on_a_state_folder_is_refused_with_the_reason(self):
        self.start()
        second = self.start(ready=False, path=self.path("second.sock"))
        self.assertIn("is in use by another process", self.expect_end(second, NO_STATE))
        self.assertFalse(os.path.exists(self.path("second.sock")))
        self.kmctl("info")

    def test_an_embedded_device_holds_its_folder_against_a_server_and_the_other_way(self):
        self.start()
        embedded = subprocess.run([KMCTL, "--state", self.state, "info"], env=environment(), capture_output=True,
                                  check=False)
        self.assertEqual(embedded.returncode, NO_CONNECTION)

    def test_a_second_server_on_a_socket_is_refused(self):
        self.start()
        second = self.start(ready=False, state=self.path("second"))
        self.assertIn("another server answers", self.expect_end(second, SOCKET_TAKEN))
        self.kmctl("info")

    def test_a_stale_socket_is_replaced_and_nothing_else_is(self):
        with socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET) as dead:
            dead.bind(self.socket)
        self.start()
        self.kmctl("info")
        letter = self.path("letter")
        with open(letter, "w", encoding="utf-8") as file:
            file.write("Dear reader")
        second = self.start(ready=False, state=self.path("second"), path=letter)
        self.assertIn("is not a socket", self.expect_end(second, FAILURE))
        with open(letter, encoding="utf-8") as file:
            self.assertEqual(file.read(), "Dear reader")

    def test_a_wrong_command_line_is_wrong_usage(self):
        for arguments in (["--socket-mode", "999"], ["--socket-mode", "7777"], ["--socket-mode", ""], ["--trace", "all"],
                          ["--max-connections", "0"], ["--nonsense"], ["word"]):
            result = subprocess.run([TEED, *arguments], capture_output=True, env=environment(), check=False)
            self.assertEqual(result.returncode, USAGE, arguments)

    def test_a_folder_that_is_no_state_is_refused(self):
        os.mkdir(self.state)
        with open(os.path.join(self.state, "letter"), "w", encoding="utf-8"):
            pass
        self.assertIn("neither empty", self.expect_end(self.start(ready=False), NO_STATE))


class EndTest(TeedTest):
    def test_sigterm_and_sigint_end_it_and_its_socket(self):
        for number in (signal.SIGTERM, signal.SIGINT):
            teed = self.start()
            self.kmctl("info")
            teed.send_signal(number)
            self.expect_end(teed, DONE)
            self.assertFalse(os.path.exists(self.socket))

    def test_a_killed_server_leaves_blobs_that_open_and_a_socket_that_is_replaced(self):
        teed = self.start()
        self.kmctl("generate", "key.blob")
        for _ in range(3):
            teed.kill()
            teed.communicate()
            self.assertTrue(os.path.exists(self.socket))
            failed = self.kmctl("info", expect=NO_CONNECTION)
            self.assertIn("no server answers", failed.stderr)
            teed = self.start()
            self.sign()

    def test_a_client_that_is_killed_leaves_nothing(self):
        teed = self.start()
        descriptors = f"/proc/{teed.pid}/fd"
        self.kmctl("generate", "key.blob")
        wait_until(lambda: self.status()["connections"] == 1)
        before = len(os.listdir(descriptors))  # perhaps with those of the look just now, which end a moment later
        for n in range(10):
            accepted, looks = self.status()["accepted"], 0
            clients = [subprocess.Popen([KMCTL, "--tee", "unix:" + self.socket, "generate", f"{n}-{i}.blob"],
                                        cwd=self.folder, env=environment(), stdout=subprocess.DEVNULL,
                                        stderr=subprocess.DEVNULL) for i in range(3)]
            # Until there was one of them, at work or done; each look is a connection too.
            while self.status()["accepted"] <= accepted + looks + 1:
                looks += 1
            for client in clients:
                client.kill()
                client.wait()
        wait_until(lambda: self.status()["sessions"] == 0)
        wait_until(lambda: self.status()["connections"] == 1)
        now = self.status()
        self.assertEqual((now["tas"], now["shared_blocks"], now["shared_bytes"]), ([], 0, 0))
        wait_until(lambda: len(os.listdir(descriptors)) <= before)
        self.sign()

    def test_kmctl_ends_it_and_waits(self):
        teed = self.start()
        self.assertIn("ended", self.kmctl("tee", "stop").stdout)
        self.expect_end(teed, DONE)
        again = self.start()  # at once: the folder and the socket are free
        self.assertIsNone(again.poll())


class ManagementTest(TeedTest):
    def test_the_log_keeps_what_it_was_told_to(self):
        self.start("--keep-trace", "info")
        self.kmctl("info")
        lines = json.loads(self.kmctl("tee", "log", "--json").stdout)["lines"]
        self.assertTrue(lines)
        self.assertEqual({line["level"] for line in lines}, {"info"})
        self.assertEqual([line["number"] for line in lines], list(range(len(lines))))
        last = json.loads(self.kmctl("tee", "log", "--lines", "2", "--json").stdout)["lines"]
        self.assertEqual(last, lines[-2:])
        self.assertEqual(len(self.kmctl("tee", "log").stdout.splitlines()), len(lines))
        self.assertEqual(self.status()["trace_lines"], len(lines))

    def test_errors_alone_are_kept_by_default(self):
        self.start()
        self.kmctl("info")
        self.assertEqual(json.loads(self.kmctl("tee", "log", "--json").stdout), {"lines": []})

    def test_the_status_tells_of_the_device(self):
        teed = self.start()
        self.kmctl("info")
        now = self.status()
        self.assertEqual(now["pid"], teed.pid)
        self.assertEqual(now["state"], self.state)
        self.assertGreater(now["commands"], 0)
        self.assertEqual((now["sessions"], now["refused"], now["dropped"]), (0, 0, 0))
        self.assertIn(str(teed.pid), self.kmctl("tee", "status").stdout)

    def holding(self, *arguments):
        """Starts kmctl, which begins what it is told and waits for data until its input is closed."""
        process = subprocess.Popen([KMCTL, "--tee", "unix:" + self.socket, *arguments], stdin=subprocess.PIPE,
                                   stdout=subprocess.DEVNULL, env=environment(), cwd=self.folder)
        self.addCleanup(process.wait)
        self.addCleanup(process.stdin.close)
        return process

    def test_the_status_tells_of_a_ta_what_it_holds_as_text_and_as_json(self):
        self.start()
        self.kmctl("generate", "key.blob")
        holders = [self.holding("sign", "key.blob", "-", "-o", f"{n}.sig") for n in range(2)]
        wait_until(lambda: [ta["operations"] for ta in self.status()["tas"]] == [4])
        now = self.status()
        ta = now["tas"][0]
        # Each signature takes a session, a handle for the digest and one for RSA, and its key beside the TA's own
        # three: two that seal blobs, one that checks tokens.
        self.assertEqual((ta["sessions"], ta["operations"], ta["transient_objects"], ta["persistent_objects"]),
                         (2, 4, 5, 0))
        self.assertEqual(ta["heap_limit"], 512 * 1024)
        self.assertTrue(0 < ta["heap"] < ta["heap_peak"] < ta["heap_limit"], ta)
        told = [(line[:20].rstrip(), line[20:]) for line in self.kmctl("tee", "status").stdout.splitlines()]
        rows = (("teed", now["version"]), ("state", now["state"]), ("process", now["pid"]), ("up for ms", None),
                ("connections", None), ("  accepted", None), ("  refused", now["refused"]),
                ("  dropped", now["dropped"]), ("sessions", now["sessions"]), ("commands", now["commands"]),
                ("shared blocks", now["shared_blocks"]), ("shared bytes", now["shared_bytes"]),
                ("trace lines", now["trace_lines"]), ("  since start", now["trace_total"]), ("TA", ta["ta"]),
                ("  sessions", ta["sessions"]), ("  operations", ta["operations"]), ("  heap", ta["heap"]),
                ("  heap peak", ta["heap_peak"]), ("  heap limit", ta["heap_limit"]),
                ("  keys in memory", ta["transient_objects"]), ("  open objects", ta["persistent_objects"]))
        self.assertEqual([title for title, _ in told], [title for title, _ in rows])
        for (title, text), (_, number) in zip(told, rows):
            if number is not None:  # else it is another one with each look
                self.assertEqual(text, str(number), title)
        for holder in holders:
            holder.stdin.close()
            self.assertEqual(holder.wait(timeout=30), DONE)
        wait_until(lambda: self.status()["tas"] == [])

    def test_an_embedded_device_is_no_server(self):
        for command in ("status", "log", "stop"):
            result = subprocess.run([KMCTL, "--state", self.state, "tee", command], capture_output=True, text=True,
                                    env=environment(), check=False)
            self.assertEqual(result.returncode, USAGE)
            self.assertIn("is no server", result.stderr)
            self.assertFalse(os.path.exists(self.state))


class ManagerTest(TeedTest):
    """What systemd does for a service, done by hand."""

    def activated(self, listener, count="1", **how):
        """Starts teed with `listener` as its descriptor 3."""
        code = ("import os, sys; os.dup2(int(sys.argv[1]), 3); os.environ['LISTEN_PID'] = str(os.getpid()); "
                "os.environ['LISTEN_FDS'] = sys.argv[2]; os.execv(sys.argv[3], sys.argv[3:])")
        process = subprocess.Popen([sys.executable, "-c", code, str(listener.fileno()), count, TEED, "--state",
                                    self.state], stderr=subprocess.PIPE, text=True, pass_fds=[listener.fileno()],
                                   env=environment(**how))
        self.addCleanup(self.end, process)
        return process

    def listener(self, kind=socket.SOCK_SEQPACKET, listening=True):
        listener = socket.socket(socket.AF_UNIX, kind)
        self.addCleanup(listener.close)
        listener.bind(self.socket)
        if listening:
            listener.listen()
        return listener

    def test_a_passed_socket_is_served_and_left_to_its_owner(self):
        teed = self.activated(self.listener())
        self.kmctl("info")
        teed.terminate()
        self.expect_end(teed, DONE)
        self.assertTrue(os.path.exists(self.socket))

    def test_a_client_that_came_before_the_server_is_served(self):
        listener = self.listener()
        client = subprocess.Popen([KMCTL, "--tee", "unix:" + self.socket, "info"], env=environment(),
                                  stdout=subprocess.DEVNULL)
        self.addCleanup(client.wait)
        time.sleep(0.2)
        self.assertIsNone(client.poll())
        self.activated(listener)
        self.assertEqual(client.wait(timeout=30), DONE)

    def test_a_socket_of_another_kind_is_refused(self):
        for kind, listening in ((socket.SOCK_STREAM, True), (socket.SOCK_SEQPACKET, False), (socket.SOCK_DGRAM, False)):
            said = self.expect_end(self.activated(self.listener(kind, listening)), FAILURE)
            self.assertIn("SOCK_SEQPACKET", said)
            os.unlink(self.socket)
        said = self.expect_end(self.activated(self.listener(), count="2"), FAILURE)
        self.assertIn("one socket", said)

    def test_sockets_that_are_meant_for_another_process_do_not_count(self):
        self.start(env={"LISTEN_PID": "1", "LISTEN_FDS": "1"})
        self.kmctl("info")

    def notified(self, address, expected_name):
        manager = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self.addCleanup(manager.close)
        manager.bind(address)
        manager.settimeout(20)
        teed = self.start(ready=False, env={"NOTIFY_SOCKET": expected_name})
        ready = manager.recv(4096).decode().splitlines()
        self.assertEqual(ready[0], "READY=1")
        self.assertTrue(ready[1].startswith("STATUS="))
        self.kmctl("info")  # without waiting: it is ready when it says so
        teed.terminate()
        self.assertEqual(manager.recv(4096).decode(), "STOPPING=1")
        self.expect_end(teed, DONE)

    def test_the_manager_is_told_when_it_is_ready_and_when_it_stops(self):
        self.notified(self.path("notify"), self.path("notify"))

    def test_the_managers_socket_may_have_no_file(self):
        self.notified("\0" + self.path("notify"), "@" + self.path("notify"))


class WantTest(TeedTest):
    def test_a_server_without_descriptors_left_goes_on_with_those_it_has(self):
        limit = 60

        def little():
            resource.setrlimit(resource.RLIMIT_NOFILE, (limit, limit))

        self.start(preexec_fn=little)
        crowd = []
        try:
            for _ in range(limit):
                client = socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET)
                client.settimeout(1)
                client.connect(self.socket)
                crowd.append(client)
            time.sleep(0.5)
        finally:
            for client in crowd:
                client.close()
        self.kmctl("info")


if __name__ == "__main__":
    if len(sys.argv) < 3:
        sys.exit(__doc__)
    TEED, KMCTL = (os.path.abspath(sys.argv.pop(1)) for _ in range(2))
    unittest.main(verbosity=1)
