"""The service as its host sees it: requests, refusals, the configuration blob, and what it survives."""
import fcntl
import itertools
import json
import os
import signal
import subprocess
import unittest

from harness import BIN, LOG, NAME, PIPES, SOURCE, ServiceTest, kilobytes

RESULT = "tmp/new_bCfg"


class Frame(ServiceTest):
    def test_start_up_is_logged(self):
        lines = self.service.log()[:2]
        self.assertEqual([line.split("] ", 1)[1] for line in lines],
                         [f"{NAME}  - version 1.0.0.1", f"Launching  Plugin - {NAME}"])
        self.assertRegex(lines[0], r"^\d{4}-\d\d-\d\d (0[1-9]|1[0-2]):\d\d:\d\d-\[main:\d+\] ")

    def test_any_client_of_the_bus_is_answered_and_malformed_arguments_are_refused_with_the_key(self):
        for body, says in (
            ("0", "ba{sv} true 0"),
            ("2 messageStr s setGlobalbCfg messageDict a{sv} 1 bcfgDataPath s /blobs/every-kind.bin",
             'ba{sv} true 2 "name" s "setGlobalbCfg" "statusCode" x 0'),
            ("1 messageDict a{sv} 1 depth d 1.5", '"messageDict.depth" has the D-Bus type "d"'),
            ("1 messageStr x 1", '"messageStr" is no text'),
            ("1 messageDict s x", '"messageDict" is no dictionary'),
            ("1 message s x", 'no key "message"'),
        ):
            with self.subTest(body):
                self.assertIn(says, self.service.busctl(*body.split()))

    def test_a_request_cannot_forge_a_log_line(self):
        forged = "x\n2026-01-01 01:01:01-[main:1] forged"
        self.service.describe(answers={"HWModelStr": forged, "VanterSerialNumber": forged})
        self.service.orloctl("call", forged, "a=b\nc")
        self.service.orloctl("export", "psd2", forged)
        self.assertFalse([line for line in self.service.log() if line.startswith("2026-01-01 01:01:01-")])

    def test_an_answer_that_no_message_can_carry_is_an_error_reply(self):
        self.service.write("sys/tesk/cert.der", bytes(15 << 20))
        status, answer = self.service.orloctl("get-tcrt")
        self.assertEqual((status, "Message too long" in answer["problem"]), (3, True), answer)
        self.assertEqual(self.service.orloctl("call", "x")[0], 4)


class Survival(ServiceTest):
    def flood(self, calls, command):
        done = self.service.run(SOURCE / "tests/service/flood", "8", calls, command)
        self.assertEqual(done.stdout, f"{calls} completed, 0 failed\n")

    def test_a_flood_is_served_in_flat_memory(self):
        held = []
        for _ in range(4):  # all that wait at once are held by the first two
            self.flood(300, "setGlobalbCfg")
            self.flood(5000, "noSuchCommand")
            held.append(kilobytes("VmRSS", self.service.pid))
        # Wide enough for what an allocator keeps; a kilobyte lost at each request would be beyond it.
        self.assertLess(held[3] - max(held[:2]), 6 * 1024)

    def test_a_start_that_cannot_serve_says_why_and_has_its_exit_status(self):
        for status, says, arguments, environment in (
            (1, f"{NAME}: cannot own this name .* another process owns it already", [], {}),
            (1, 'cannot reach the bus "unix:path=/nonexistent"', [], {"VELTRA_BUS": "unix:path=/nonexistent"}),
            (1, 'device root "/nonexistent": No such', [], {"VELTRA_DEVICE_ROOT": "/nonexistent"}),
            (2, "takes no arguments but", ["--halp"], {}),
            (0, "^VeltraOrloServices 1\\.0\\.0\\.1$", ["--version"], {}),
            (0, "^Usage: VeltraOrloServices ", ["--help"], {}),
        ):
            with self.subTest(says, arguments=arguments):
                done = subprocess.run([BIN / "VeltraOrloServices", *arguments], text=True, stdout=subprocess.PIPE,
                                      stderr=subprocess.PIPE, env={**self.service.environment, **environment})
                self.assertEqual(done.returncode, status)
                self.assertRegex(done.stdout if status == 0 else done.stderr, says)


class Client(ServiceTest):
    def test_exit_statuses_and_one_json_object_for_every_outcome(self):
        for status, words in (
            (0, ["set-bcfg", "/blobs/every-kind.bin"]),
            (1, ["set-bcfg", "/missing"]),
            (2, ["call", "x", "word"]),
            (2, ["call", "x", "a:={"]),
            (2, ["call", "x", 'a:=[{"$data": "0"}]']),
            (2, ["call", "x", "a@=/nonexistent"]),
            (2, ["call", "x", "a=1", "a=2"]),
            (2, ["no-such-verb"]),
            (3, ["--bus", "unix:path=/nonexistent", "call", "x"]),
            (4, ["call", "x"]),
            (5, ["show", "bcfg", "/dev/null"]),
            (0, ["show", "-"]),
            (2, ["show", self.root / "images/container.img4", "--hmac-key-file", self.root / "blobs/hmac-key.bin"]),
            (2, ["show", self.root / "blobs/every-kind.bin", "--hmac-key-file", "/dev/null"]),
            (2, ["crash-logs", "-o", "-"]),
            (2, ["put-psd2"]),
            (2, ["get-psd2", "/tmp/out", "-o", self.root / "out"]),
        ):
            with self.subTest(words), open(self.root / "blobs/every-kind.bin") as blob:
                exit_status, answer = self.service.orloctl(*words, stdin=blob)
                self.assertEqual((exit_status, answer["exitStatus"]), (status, status), answer)
                self.assertEqual("problem" in answer, status != 0)

    def test_output_that_is_lost_is_a_failure(self):
        reader, closed_pipe = os.pipe()
        os.close(reader)
        with open("/dev/full", "w") as full, open(closed_pipe, "w") as closed:
            for words in (["check-entitlement"], ["show", "img4", self.root / "images/container.img4"], ["--help"]):
                for form, output in itertools.product(([], ["--json"]), (closed, full, None)):
                    with self.subTest(words=words, form=form, output=output):
                        lost = self.popen("orloctl", *form, *words, stdout=output, stderr=subprocess.PIPE,
                                          preexec_fn=None if output else lambda: os.close(1))
                        self.assertIn("Cannot write to standard output", lost.communicate()[1])
                        self.assertEqual(lost.returncode, 2)

    def test_what_is_printed_neither_works_the_terminal_nor_tells_a_password(self):
        hostile = "x\x1b[2J\x7f\u0085\u009b\u200f\u202e\u2066"
        url = f"http://user:secret@a b{hostile}\n"
        for words in (["call", hostile], ["provision", url], ["set-bcfg", hostile], ["show", "der", hostile]):
            for form in ([], ["--json"]):
                with self.subTest(words, form=form):
                    done = self.service.run(BIN / "orloctl", *form, *words, stderr=subprocess.STDOUT)
                    self.assertRegex(done.stdout, r"\A[\n -~]+\Z")
                    self.assertNotIn("secret", done.stdout)
                    self.assertIn(r"\u001b[2J\u007f\u0085\u009b\u200f\u202e\u2066", done.stdout)
        self.assertIn(hostile, self.service.orloctl("call", hostile)[1]["problem"])

    def test_words_become_texts_json_values_and_file_contents(self):
        self.service.write("bytes", b"\x00\xff")
        words = ["t=a=b", 'j:={"d": {"$data": "0badcafe"}, "n": [1, true]}', f"f@={self.root}/bytes"]
        self.service.orloctl("call", "x", *words)
        self.assertIn('request.messageDict : {"f": <00ff>, "j": {"d": <0badcafe>, "n": [1, true]}, "t": "a=b"}',
                      "".join(self.service.log()))

    def test_a_copy_is_a_new_file_for_its_owner(self):
        copy, words = self.root / "copy", ["set-bcfg", "/blobs/every-kind.bin", "-o"]
        self.service.write("copy", b"earlier")
        self.assertEqual(self.service.orloctl(*words, copy)[0], 0)
        self.assertEqual((copy.read_bytes(), copy.stat().st_mode & 0o7777), (self.service.read(RESULT), 0o600))
        (self.root / "link").symlink_to(copy)
        self.service.write("copy", b"kept")
        for target in ("link", "blobs", "missing/copy"):
            status, answer = self.service.orloctl(*words, self.root / target)
            self.assertEqual((status, answer["response"]["statusCode"]), (2, 0))
            self.assertIn("Cannot write", answer["note"])
        self.assertEqual(self.service.orloctl("get-tcrt", "-o", self.root)[0], 2)
        self.assertEqual(copy.read_bytes(), b"kept")

    def test_what_is_missing_in_an_answer_is_said_with_the_place_where_the_reason_stands(self):
        self.assertNotIn("note", self.service.orloctl("check-entitlement")[1])
        (self.root / "System/Library/Caches/apticket.der").unlink()
        status, answer = self.service.orloctl("check-entitlement")
        self.assertEqual((status, LOG in answer["note"]), (0, True), answer)
        self.assertEqual(answer["response"]["response"], {"IsPostSwapEntitled": False})
        self.service.write("sys/tesk/cert.der", b"")
        status, answer = self.service.orloctl("get-tcrt", "-o", self.root / "copy")
        self.assertEqual((status, "is empty" in answer["problem"]), (1, True), answer)
        self.assertFalse((self.root / "copy").exists())

    def test_clients_that_rewrite_at_once_get_each_its_own_result(self):
        expected = {}
        for blob in ("/blobs/every-kind.bin", "/blobs/holds-WCh0.bin"):
            self.service.orloctl("set-bcfg", blob)
            expected[blob] = self.service.read(RESULT)
        clients = [(blob, self.popen("orloctl", "set-bcfg", blob, "-o", "-", text=False, **PIPES))
                   for blob in [*expected] * 10]
        for blob, client in clients:
            self.assertEqual(client.communicate()[0], expected[blob])

    def test_waiting_for_another_client_is_said_and_ends_with_the_timeout_or_an_interruption(self):
        lock = self.root / "var/lib/orlo/orloctl.lock"
        words = ["set-bcfg", "/blobs/every-kind.bin"]
        self.service.orloctl(*words)
        with open(lock) as held:
            fcntl.flock(held, fcntl.LOCK_EX)
            for seconds, end, says in (("1", lambda client: None, "Time is up"),
                                       ("60", lambda client: client.send_signal(signal.SIGINT), "Interrupted"),
                                       ("60", lambda client: fcntl.flock(held, fcntl.LOCK_UN), None)):
                with self.subTest(says):
                    client = self.popen("orloctl", "--json", "--timeout", seconds, *words, **PIPES)
                    self.assertIn("waiting for another orloctl", client.stderr.readline())
                    end(client)
                    output, _ = client.communicate()
                    self.assertEqual(client.returncode, 3 if says else 0)
                    if says:
                        self.assertRegex(json.loads(output)["problem"], f"^{says}.*The request was not sent\\.$")
        lock.chmod(0o666)
        self.assertEqual(self.service.orloctl(*words)[0], 2)


if __name__ == "__main__":
    unittest.main()
