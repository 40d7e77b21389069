"""The service as its host sees it: requests, refusals, the configuration blob, and what it survives."""
import fcntl
import json
import os
import signal
import subprocess
import unittest

from harness import BIN, LOG, NAME, Service

RESULT = "tmp/new_bCfg"
SUCCESS = {"name": "setGlobalbCfg", "statusCode": 0}


class ServiceTest(unittest.TestCase):
    model = "M12x"

    def setUp(self):
        self.service = Service({"HWModelStr": self.model})
        self.addCleanup(self.service.close)

    def write(self, path, contents):
        (self.service.root / path).write_bytes(contents)

    def read(self, path):
        return (self.service.root / path).read_bytes()

    def set_bcfg(self, path):
        return self.service.orloctl("call", "setGlobalbCfg", f"bcfgDataPath={path}")


class ConfigurationBlob(ServiceTest):
    def test_the_same_input_gives_the_same_result_with_busctl(self):
        self.set_bcfg("/blobs/every-kind.bin")
        first = self.read(RESULT)
        words = "2 messageStr s setGlobalbCfg messageDict a{sv} 1 bcfgDataPath s /blobs/every-kind.bin".split()
        self.assertEqual(self.service.busctl(*words), 'ba{sv} true 2 "name" s "setGlobalbCfg" "statusCode" x 0')
        self.assertEqual(self.read(RESULT), first)

    def test_bad_input_leaves_an_empty_result_and_a_success(self):
        good = self.read("blobs/bCfg-30003.bin")
        self.write("empty", b"")
        self.write("truncated", good[:-1])
        self.write("noise", bytes(range(256)) * 64)
        self.write("huge-length", b"\x30\x88" + b"\x7f" * 8 + good)
        os.mkfifo(self.service.root / "fifo")
        os.symlink("/etc/hostname", self.service.root / "outside")
        os.symlink("/outside-chain/../../../../../../etc/hostname", self.service.root / "dots")
        paths = ["/missing", "/empty", "/truncated", "/noise", "/huge-length", "/fifo", "/blobs", "/outside", "/dots"]
        paths += ["/../../../../../../../../../../etc/hostname", "/blobs/bCfg-30002.bin", "x" * 70000, ""]
        for path in paths:
            with self.subTest(path[:40]):
                self.write(RESULT, b"earlier")
                self.assertEqual(self.set_bcfg(path), (0, {"exitStatus": 0, "response": SUCCESS}))
                self.assertEqual(self.read(RESULT), b"")
        for words in ([], ["bcfgDataPath:=7"], ["bcfgDataPath:=[]"]):
            with self.subTest(words):
                self.write(RESULT, b"earlier")
                self.assertEqual(self.service.orloctl("call", "setGlobalbCfg", *words)[0], 0)
                self.assertEqual(self.read(RESULT), b"")

    def test_the_result_never_goes_through_a_link_and_replaces_only_a_file(self):
        target = self.service.root / RESULT
        self.write("victim", b"untouched")
        for name, make in (
            ("link", lambda: os.symlink("/victim", target)),
            ("directory", lambda: os.mkdir(target)),
            ("fifo", lambda: os.mkfifo(target)),
        ):
            with self.subTest(name):
                make()
                before = os.lstat(target)
                self.assertEqual(self.set_bcfg("/blobs/every-kind.bin")[0], 0)
                self.assertEqual(os.lstat(target).st_ino, before.st_ino)
                self.assertEqual(os.listdir(target.parent), [target.name])
                os.rmdir(target) if name == "directory" else os.unlink(target)
        self.assertEqual(self.read("victim"), b"untouched")
        self.set_bcfg("/blobs/every-kind.bin")
        self.assertEqual(os.lstat(target).st_mode & 0o7777, 0o600)


class Entitlement(ServiceTest):
    def test_the_client_says_where_the_reason_stands(self):
        for entitled in (True, False):
            status, answer = self.service.orloctl("check-entitlement")
            response = {"name": "checkCorvoPostSwapEntitlement", "statusCode": 0,
                        "response": {"IsPostSwapEntitled": entitled}}
            self.assertEqual((status, answer["response"]), (0, response))
            self.assertEqual(LOG in answer.get("note", ""), not entitled)
            (self.service.root / "System/Library/Caches/apticket.der").unlink(missing_ok=True)


class Frame(ServiceTest):
    def test_unknown_commands_are_completed_without_response_object(self):
        self.assertEqual(self.service.busctl("0"), "ba{sv} true 0")
        self.assertEqual(self.service.busctl("1", "messageStr", "s", "setglobalbcfg"), "ba{sv} true 0")
        status, answer = self.service.orloctl("call", "noSuchCommand")
        self.assertEqual((status, answer["exitStatus"]), (4, 4))
        lines = self.service.messages_of(lambda: self.service.busctl("0"))
        self.assertEqual(lines[0], "Plugin  - version 1.0.0.1")
        self.assertEqual(lines[2:], ["request.messageDict : (null)", "Hardware Model : M12x"])

    def test_start_up_is_logged(self):
        messages = [line.split("] ", 1)[1] for line in self.service.log()[:2]]
        self.assertEqual(messages, [f"{NAME}  - version 1.0.0.1", f"Launching  Plugin - {NAME}"])
        self.assertRegex(self.service.log()[0], r"^\d{4}-\d\d-\d\d (0[1-9]|1[0-2]):\d\d:\d\d-\[main:\d+\] ")

    def test_malformed_arguments_are_refused_with_the_key(self):
        for body, says in (
            (["1", "messageDict", "a{sv}", "1", "depth", "d", "1.5"], '"messageDict.depth" has the D-Bus type "d"'),
            (["1", "messageStr", "x", "1"], '"messageStr" is no text'),
            (["1", "messageDict", "s", "x"], '"messageDict" is no dictionary'),
            (["1", "message", "s", "x"], 'no key "message"'),
        ):
            with self.subTest(says):
                self.assertIn(says, self.service.busctl(*body))
        for depth, expected in ((29, 4), (30, 2)):
            status, answer = self.service.orloctl("call", "x", f"deep:={'[' * depth}1{']' * depth}")
            self.assertEqual(status, expected, answer)

    def test_a_request_cannot_forge_a_log_line(self):
        forged = "x\n2026-01-01 01:01:01-[main:1] forged"
        self.service.describe({"HWModelStr": forged, "VanterSerialNumber": forged})
        self.service.orloctl("call", forged, "a=b\nc")
        self.service.orloctl("export", "psd2", forged)
        self.assertFalse([line for line in self.service.log() if line.startswith("2026-01-01 01:01:01-")])

    def test_the_device_description_may_be_missing_or_malformed(self):
        description = self.service.root / "etc/veltra/device.json"
        for make in (lambda: description.write_text("{"), description.unlink):
            make()
            lines = self.service.messages_of(lambda: self.service.busctl("0"))
            self.assertEqual(lines[3], "Hardware Model : (null)")


class Survival(ServiceTest):
    def flood(self, calls, command):
        done = self.service.run(BIN / "flood", self.service.bus.address, "8", calls, command)
        self.assertEqual(done.stdout, f"{calls} completed, 0 failed\n")

    def test_a_flood_is_served_in_flat_memory(self):
        self.flood(1000, "setGlobalbCfg")
        before = self.service.resident_kilobytes()
        self.flood(10000, "noSuchCommand")
        self.flood(1000, "setGlobalbCfg")
        # Wide enough for what an allocator keeps; a kilobyte lost at each request would be far beyond it.
        self.assertLess(self.service.resident_kilobytes() - before, 8 * 1024)

    def test_a_client_that_dies_and_calls_during_a_call_leave_the_service_serving(self):
        clients = [
            subprocess.Popen([BIN / "flood", self.service.bus.address, "2", "3000", "setGlobalbCfg"],
                             stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
            for _ in range(3)
        ]
        self.assertEqual(self.set_bcfg("/blobs/every-kind.bin")[0], 0)
        for client in clients:
            client.kill()
            client.wait()
        self.assertEqual(self.set_bcfg("/blobs/every-kind.bin")[0], 0)

    def test_sigterm_ends_it_cleanly_after_the_request_in_hand(self):
        flood = subprocess.Popen([BIN / "flood", self.service.bus.address, "1", "3000", "setGlobalbCfg"],
                                 stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        self.assertEqual(self.set_bcfg("/blobs/every-kind.bin")[0], 0)
        os.kill(self.service.pid, signal.SIGTERM)
        self.assertEqual(self.service.wait_end(), 0)
        flood.kill()
        flood.wait()
        self.assertTrue(self.service.log()[-1].endswith("Writting new data to file"), self.service.log()[-1])
        self.assertEqual(self.service.orloctl("call", "x")[0], 3)

    def test_a_start_that_cannot_serve_says_why_and_has_its_exit_status(self):
        for status, says, arguments, environment in (
            (1, f"{NAME}: cannot own this name .* another process owns it already", [], {}),
            (1, 'cannot reach the bus "unix:path=/nonexistent"', [], {"VELTRA_BUS": "unix:path=/nonexistent"}),
            (1, 'device root "/nonexistent": No such', [], {"VELTRA_DEVICE_ROOT": "/nonexistent"}),
            (1, 'device root "/dev/null": Not a directory', [], {"VELTRA_DEVICE_ROOT": "/dev/null"}),
            (2, "takes no arguments but", ["--halp"], {}),
            (2, "takes no arguments but", ["--version", "--help"], {}),
            (0, "^VeltraOrloServices 1\\.0\\.0\\.1$", ["--version"], {}),
            (0, "^Usage: VeltraOrloServices ", ["--help"], {}),
        ):
            with self.subTest(says, arguments=arguments):
                before = len(self.service.log())
                done = subprocess.run([BIN / "VeltraOrloServices", *arguments], text=True, stdout=subprocess.PIPE,
                                      stderr=subprocess.PIPE, env={**self.service.environment, **environment})
                self.assertEqual(done.returncode, status)
                self.assertRegex(done.stdout if status == 0 else done.stderr, says)
                if arguments:
                    self.assertEqual(len(self.service.log()), before)


class Client(ServiceTest):
    def test_exit_statuses_and_one_json_object_for_every_outcome(self):
        for status, words in (
            (0, ["set-bcfg", "/blobs/every-kind.bin"]),
            (1, ["set-bcfg", "/missing"]),
            (2, ["call", "x", "word"]),
            (2, ["call", "x", "a:={"]),
            (2, ["call", "x", "a:=1.5"]),
            (2, ["call", "x", 'a:=[{"$data": "0"}]']),
            (2, ["call", "x", "a@=/nonexistent"]),
            (2, ["call", "x", "a=1", "a=2"]),
            (2, ["call"]),
            (2, ["no-such-verb"]),
            (3, ["--bus", "unix:path=/nonexistent", "call", "x"]),
            (4, ["call", "x"]),
            (5, ["show", "bcfg", "/dev/null"]),
            (0, ["show", self.service.root / "blobs/every-kind.bin"]),
            (2, ["show", "bcfg"]),
            (2, ["show", self.service.root / "images/container.img4", "--hmac-key-file",
                 self.service.root / "blobs/hmac-key.bin"]),
            (2, ["show", self.service.root / "blobs/every-kind.bin", "--hmac-key-file", "/dev/null"]),
            (2, ["show", self.service.root / "blobs/every-kind.bin", "--hmac-key-file", ""]),
            (2, ["crash-logs", "-o", "-"]),
        ):
            with self.subTest(words):
                exit_status, answer = self.service.orloctl(*words)
                self.assertEqual((exit_status, answer["exitStatus"]), (status, status), answer)
                self.assertEqual("problem" in answer, status != 0)

    def test_standard_input_is_a_file_too(self):
        with open(self.service.root / "blobs/every-kind.bin", "rb") as blob:
            done = self.service.run(BIN / "orloctl", "--json", "show", "-", stdin=blob)
        self.assertEqual(json.loads(done.stdout)["format"], "bcfg")

    def test_output_that_is_lost_is_a_failure(self):
        reader, closed_pipe = os.pipe()
        os.close(reader)
        full = os.open("/dev/full", os.O_WRONLY)
        for words in (["check-entitlement"], ["show", "img4", self.service.root / "images/container.img4"], ["--help"]):
            for form in ([], ["--json"]):
                for output in (closed_pipe, full, None):
                    with self.subTest(words=words, form=form, output=output):
                        close = None if output else lambda: os.close(1)
                        command = [str(word) for word in (BIN / "orloctl", *form, *words)]
                        done = subprocess.run(command, env=self.service.environment, stdout=output, preexec_fn=close,
                                              stderr=subprocess.PIPE, text=True)
                        self.assertEqual(done.returncode, 2)
                        self.assertIn("Cannot write to standard output", done.stderr)
        os.close(closed_pipe)
        os.close(full)

    def test_what_is_printed_neither_works_the_terminal_nor_tells_a_password(self):
        hostile = "x\x1b[2J\x7f\u0085\u009b\u200f\u202e\u2066"
        url = f"http://user:secret@a b{hostile}\n"
        says = {"call": f'The plug-in does not know the command "{hostile}".',
                "provision": f"Wafton URL not a valid URL:http://...@a b{hostile}\n"}
        for words in (["call", hostile], ["provision", url], ["set-bcfg", hostile], ["show", "der", hostile]):
            for form in ([], ["--json"]):
                with self.subTest(words, form=form):
                    done = self.service.run(BIN / "orloctl", *form, *words, stderr=subprocess.STDOUT)
                    self.assertRegex(done.stdout, r"\A[\n -~]+\Z")
                    self.assertNotIn("secret", done.stdout)
                    self.assertIn(r"\u001b[2J\u007f\u0085\u009b\u200f\u202e\u2066", done.stdout)
                    if form and words[0] in says:
                        answer = json.loads(done.stdout)
                        error = answer.get("response", {}).get("error", {})
                        self.assertEqual(error.get("description", answer.get("problem")), says[words[0]])

    def test_words_become_texts_json_values_and_file_contents(self):
        self.write("bytes", b"\x00\xff")
        words = ["t=a=b", 'j:={"d": {"$data": "0badcafe"}, "n": [1, true]}', f"f@={self.service.root}/bytes"]
        lines = self.service.messages_of(lambda: self.service.orloctl("call", "x", *words))
        self.assertEqual(
            lines[2], 'request.messageDict : {"f": <00ff>, "j": {"d": <0badcafe>, "n": [1, true]}, "t": "a=b"}'
        )

    def test_a_copy_is_a_new_file_for_its_owner_or_goes_to_standard_output(self):
        copy = self.service.root / "copy"
        copy.write_bytes(b"earlier")
        copy.chmod(0o644)
        self.assertEqual(self.service.orloctl("set-bcfg", "/blobs/every-kind.bin", "-o", copy)[0], 0)
        self.assertEqual(copy.read_bytes(), self.read(RESULT))
        self.assertEqual(copy.stat().st_mode & 0o7777, 0o600)
        done = subprocess.run([BIN / "orloctl", "set-bcfg", "/blobs/holds-WCh0.bin", "-o", "-"],
                              env=self.service.environment, stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        self.assertEqual(done.stdout, self.read(RESULT))
        self.assertTrue(done.stderr.startswith(b"response:\n  name: setGlobalbCfg\n  statusCode: 0\n"))
        (self.service.root / "link").symlink_to(copy)
        for target in ("link", "blobs", "missing/copy"):
            status, answer = self.service.orloctl("set-bcfg", "/blobs/holds-WCh0.bin", "-o", self.service.root / target)
            self.assertEqual((status, answer["response"]["statusCode"]), (2, 0))
            self.assertIn("Cannot write", answer["note"])
        self.assertNotEqual(copy.read_bytes(), self.read(RESULT))

    def test_clients_that_rewrite_at_once_get_each_its_own_result(self):
        blobs = ["/blobs/every-kind.bin", "/blobs/holds-WCh0.bin"]
        expected = []
        for blob in blobs:
            self.set_bcfg(blob)
            expected.append(self.read(RESULT))
        clients = []
        for number in range(20):
            copy = self.service.root / f"copy{number}"
            command = [BIN / "orloctl", "set-bcfg", blobs[number % 2], "-o", copy]
            clients.append((copy, subprocess.Popen(command, env=self.service.environment, stdout=subprocess.DEVNULL,
                                                   stderr=subprocess.DEVNULL)))
        for number, (copy, client) in enumerate(clients):
            self.assertEqual(client.wait(), 0)
            self.assertEqual(copy.read_bytes(), expected[number % 2])

    def test_waiting_for_another_client_is_said_and_ends_with_the_timeout_or_an_interruption(self):
        lock = self.service.root / "var/lib/orlo/orloctl.lock"
        self.set_bcfg_with_client()
        with open(lock) as held:
            fcntl.flock(held, fcntl.LOCK_EX)
            for end, says in ((None, "Time is up"), (signal.SIGINT, "Interrupted"),
                              (lambda: fcntl.flock(held, fcntl.LOCK_UN), None)):
                with self.subTest(says):
                    seconds = "1" if end is None else "60"
                    client = subprocess.Popen(
                        [BIN / "orloctl", "--json", "--timeout", seconds, "set-bcfg", "/blobs/every-kind.bin"],
                        env=self.service.environment, stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
                    self.assertIn("waiting for another orloctl", client.stderr.readline())
                    if callable(end):
                        end()
                    elif end:
                        client.send_signal(end)
                    output, _ = client.communicate()
                    self.assertEqual(client.returncode, 3 if says else 0)
                    if says:
                        self.assertTrue(json.loads(output)["problem"].startswith(says), output)
                        self.assertTrue(json.loads(output)["problem"].endswith("The request was not sent."), output)
        lock.chmod(0o666)
        self.assertEqual(self.set_bcfg_with_client()[0], 2)

    def set_bcfg_with_client(self):
        return self.service.orloctl("set-bcfg", "/blobs/every-kind.bin")

    def test_a_timeout_says_whether_the_service_goes_on_with_the_request(self):
        for stopped, says in ((self.service.pid, "The service goes on with the request."),
                              (self.service.bus.daemon.pid, "The request was not sent.")):
            os.kill(stopped, signal.SIGSTOP)
            try:
                status, answer = self.service.orloctl("--timeout", "1", "call", "x")
            finally:
                os.kill(stopped, signal.SIGCONT)
            self.assertEqual(status, 3)
            self.assertTrue(answer["problem"].endswith(says), answer)


if __name__ == "__main__":
    unittest.main()
