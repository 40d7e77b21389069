"""Records, exports and certificates through the running service: what goes in, what the store has, what stays."""
import json
import os
import random
import subprocess
import time
import unittest

from harness import DESCRIPTION, LOG, SUCCESS, ServiceTest

STORE = "var/lib/orlo/store.db"
CERTIFICATE = "sys/tesk/cert.der"


class OrloTest(ServiceTest):
    def rows(self, statement):
        return self.service.run("sqlite3", self.root / STORE, statement).stdout.splitlines()


class Records(OrloTest):
    def test_a_record_comes_out_as_it_went_in_and_replaces_what_was_there(self):
        for record in (os.urandom(16 << 20), b"", b"\0", b"short"):
            with self.subTest(len(record)):
                self.assertEqual((self.service.put(record), self.service.get()), (SUCCESS, SUCCESS))
                self.assertEqual(self.service.read("tmp/out"), record)
                self.assertEqual(os.stat(self.root / "tmp/out").st_mode & 0o7777, 0o600)
        certificate = self.service.read(CERTIFICATE)
        self.assertEqual(self.service.answer("put-tcrt"), SUCCESS)
        self.assertEqual(self.rows("SELECT data_version, class, instance, hex(data) FROM records ORDER BY class"), [
            f"2|psd2|VAN0001|{b'short'.hex().upper()}", f"1|tcrt|SCR0001-TMA0001|{certificate.hex().upper()}"])

    def test_a_local_file_passes_through_the_device_and_leaves_nothing_there(self):
        (self.root / "local").write_bytes(b"\0record")
        self.assertEqual(self.service.answer("put-psd2", "--local", self.root / "local"), SUCCESS)
        status, answer = self.service.orloctl("get-psd2", "-o", self.root / "copy")
        self.assertEqual((status, answer["result"]), (0, f"{self.root}/copy, 7 bytes"), answer)
        self.assertEqual((self.root / "copy").read_bytes(), b"\0record")
        self.service.describe(answers={"VanterSerialNumber": None})
        for words in (["put-psd2", "--local", self.root / "local"], ["get-psd2", "-o", self.root / "other"]):
            self.assertEqual(self.service.answer(*words)[0], -1)
        self.assertFalse((self.root / "other").exists())
        self.assertEqual(os.listdir(self.root / "tmp"), [])

    def test_the_instance_of_each_class_is_made_of_what_the_client_lists(self):
        self.service.describe(answers={"VanterUID": "VUID", "LoddenUID": "LUID"})
        description = json.loads(self.service.read(DESCRIPTION))
        given = description["answers"] | description["tansu"]
        expected = {}
        for row in self.service.orloctl("list-classes")[1]["classes"]:
            expected[row["class"]] = "-".join(str(given[name]) for name in row["instance"].split("-"))
        status, answer = self.service.orloctl("export", *expected, "psd2")
        self.assertEqual((status, answer["result"]), (0, "29 classes exported"), answer)
        self.assertEqual(dict(row.split("|") for row in self.rows("SELECT class, instance FROM export_pairs")), expected)

    def test_a_path_leads_neither_out_of_the_device_nor_to_what_is_no_file(self):
        self.service.put(b"record")
        for name, target in (("outside", "/etc/hostname"), ("inside", "/tmp"), ("link", "in")):
            os.symlink(target, self.root / "tmp" / name)
        os.mkfifo(self.root / "tmp/fifo")
        before = sorted(os.listdir(self.root / "tmp"))
        for path in ("/tmp/outside", "/../../../../../../../../etc/hostname", "/tmp/inside", "/tmp/fifo", "x" * 70000):
            with self.subTest(path[:40]):
                self.assertEqual(self.service.answer("put-psd2", path)[0], -1)
        for path in ("/tmp/outside", "/tmp/link", "/tmp/fifo", "/tmp/..", "x" * 70000):
            with self.subTest(path[:40]):
                self.assertEqual(self.service.get(path), (-1, None, None))
        self.assertEqual(sorted(os.listdir(self.root / "tmp")), before)
        self.assertEqual(self.service.get("/../../../tmp/out"), SUCCESS)
        self.assertEqual(self.service.read("tmp/out"), b"record")


class GetTcrt(ServiceTest):
    def openssl(self, words, stdin=b""):
        return subprocess.run(["openssl", *words.split()], cwd=self.root, input=stdin, stdout=subprocess.PIPE,
                              stderr=subprocess.DEVNULL, check=True).stdout

    def test_openssl_agrees_on_the_serial_number_of_the_first_certificate(self):
        self.openssl("genpkey -out key.pem -algorithm EC -pkeyopt ec_paramgen_curve:P-384")
        # The second one is shorter than most, so that sorting would put it in front.
        self.openssl("req -x509 -new -key key.pem -subj /CN=M -set_serial 7 -out second.pem")
        for number in (0x7F, 0x80, 0x5A << 152, 0xFF << 152, -5):
            self.openssl(f"req -x509 -new -key key.pem -subj /CN=Module -set_serial {number} -out first.pem")
            octets = number.to_bytes(number.bit_length() // 8 + 1, "big", signed=True).hex()
            for form in ("x509 -in first.pem", "crl2pkcs7 -nocrl -certfile first.pem -certfile second.pem"):
                with self.subTest(number=number, form=form):
                    contents = self.openssl(form + " -outform DER")
                    self.service.write(CERTIFICATE, contents)
                    found = {"CertData": contents.hex(), "CertSerialNumber": octets}
                    self.assertEqual(self.service.answer("get-tcrt"), (0, found, None))
                    self.assertEqual(self.service.orloctl("get-tcrt", "-o", self.root / "copy")[0], 0)
                    self.assertEqual(self.service.read("copy"), contents)


class Store(OrloTest):
    def test_a_killed_service_loses_no_answered_put_and_keeps_no_half_one(self):
        moments = random.Random(3)
        unanswered = 0
        for number in range(1, 41):
            answered, killed = (bytes([kind, number]) * (1 + number * 4985) for kind in range(2))
            self.assertEqual(self.service.put(answered), SUCCESS)
            self.service.write("tmp/in", killed)
            log = self.root / LOG
            logged, delay = log.stat().st_size, moments.uniform(0, 0.02)
            client = self.popen("orloctl", "--timeout", "20", "put-psd2", "/tmp/in", stderr=subprocess.DEVNULL,
                                stdout=subprocess.DEVNULL)
            while log.stat().st_size == logged:  # until the request is in hand
                pass
            time.sleep(delay)
            self.service.kill()
            is_answered = client.wait() == 0
            self.service.start()
            unanswered += not is_answered
            self.assertEqual(self.service.get(), SUCCESS)
            self.assertIn(self.service.read("tmp/out"), [killed] if is_answered else [killed, answered])
        self.assertGreater(unanswered, 0)
        self.assertEqual(self.rows("PRAGMA integrity_check"), ["ok"])


if __name__ == "__main__":
    unittest.main()
