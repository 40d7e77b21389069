"""Records and exports through the running service: what goes in, what stands in the store, and what cannot be lost."""
import os
import random
import subprocess
import threading
import time
import unittest

from harness import LOG, Service

STORE = "var/lib/orlo/store.db"
TICKET = "System/Library/Caches/apticket.der"
DEFAULT_LIST = {
    "pfcl": "MIR0001", "CtCl": "CVG0001", "IfCl": "ALS0001", "HmCl": "CVG0001-ALS0001", "GpC2": "CVG0001",
    "tcrt": "SCR0001-TMA0001", "dCfg": "CVG0001",
}
NO_PERMISSION = {"domain": "Orlo Error Domain", "code": 1008, "description": "Permission String nil"}


class OrloTest(unittest.TestCase):
    def setUp(self):
        self.service = Service()
        self.addCleanup(self.service.close)
        self.root = self.service.root

    def write(self, path, contents):
        (self.root / path).write_bytes(contents)

    def read(self, path):
        return (self.root / path).read_bytes()

    def answer(self, *words):
        """What the plug-in answered, without the name: (status code, dictionary, error)."""
        _, answer = self.service.orloctl(*words)
        response = answer["response"]
        return response["statusCode"], response.get("response"), response.get("error")

    def put(self, path="/tmp/in"):
        return self.answer("put-psd2", path)

    def get(self, path="/tmp/out"):
        return self.answer("get-psd2", path)

    def rows(self, statement):
        return self.service.run("sqlite3", self.root / STORE, statement).stdout.splitlines()


SUCCESS = (0, None, None)


class Psd2(OrloTest):
    def test_a_record_comes_out_as_it_went_in_and_replaces_what_was_there(self):
        for record in (os.urandom(16 << 20), b"", b"\0", os.urandom(5000), b"short"):
            with self.subTest(len(record)):
                self.write("tmp/in", record)
                self.assertEqual(self.put(), SUCCESS)
                self.assertEqual(self.get(), SUCCESS)
                self.assertEqual(self.read("tmp/out"), record)
                self.assertEqual(os.stat(self.root / "tmp/out").st_mode & 0o7777, 0o600)
        self.assertEqual(self.rows("SELECT data_version, class, instance, data FROM records"), ["2|psd2|VAN0001|short"])

    def test_a_get_without_record_leaves_the_file_as_it_was(self):
        self.write("tmp/out", b"as it was")
        status, dictionary, error = self.get()
        self.assertEqual((status, dictionary), (-1, {"psd2 get error": "Could not get from Orlo"}))
        self.assertEqual((error["domain"], error["code"]), ("QDOrloErrorDomain", 3))
        self.assertEqual(self.read("tmp/out"), b"as it was")
        self.get("/tmp/none")
        self.assertFalse((self.root / "tmp/none").exists())

    def test_a_put_says_what_is_wrong_with_its_path(self):
        os.mkfifo(self.root / "tmp/fifo")
        os.symlink("/etc/hostname", self.root / "tmp/outside")
        os.symlink("missing", self.root / "tmp/dangling")
        os.symlink("/tmp", self.root / "tmp/inside")
        wrong, unreadable = "psd2 path in request is wrong", "psd2 data not found in request"
        for path, reason in (
            ("/tmp/missing", wrong), ("", wrong), ("/tmp/outside", wrong), ("/tmp/dangling", wrong),
            ("/../../../../../../../../etc/hostname", wrong), ("x" * 70000, wrong), ("/tmp", unreadable),
            ("/tmp/inside", unreadable), ("/tmp/fifo", unreadable),
        ):
            with self.subTest(path[:40]):
                self.assertEqual(self.put(path), (-1, {"psd2 put error": reason}, None))
        for words in ([], ["psd2DataPath:=7"], ["psd2V4DataPath=/tmp/in"]):
            self.assertEqual(self.answer("call", "putPSD2", *words), (-1, {"psd2 put error": wrong}, None))
        self.assertFalse((self.root / STORE).exists())

    def test_a_get_that_cannot_open_its_file_has_neither_dictionary_nor_error(self):
        self.write("tmp/in", b"record")
        self.put()
        self.write("tmp/victim", b"as it was")
        os.mkfifo(self.root / "tmp/fifo")
        os.symlink("victim", self.root / "tmp/link")
        before = sorted(os.listdir(self.root / "tmp"))
        for path in ("", "/tmp", "/tmp/", "/missing/file", "/tmp/fifo", "/tmp/link", "/tmp/victim/file",
                     "/tmp/..", "x" * 70000):
            with self.subTest(path[:40]):
                self.assertEqual(self.get(path), (-1, None, None))
        self.assertEqual(self.answer("call", "getPSD2"), (-1, None, None))
        self.assertEqual(sorted(os.listdir(self.root / "tmp")), before)
        self.assertEqual(self.read("tmp/victim"), b"as it was")
        self.assertEqual(self.get("/../../../tmp/out"), SUCCESS)
        self.assertEqual(self.read("tmp/out"), b"record")

    def test_without_identity_or_ticket_nothing_is_put_or_got(self):
        self.write("tmp/in", b"record")
        put = (-1, {"psd2 put error": "Could not put in Orlo"}, NO_PERMISSION)
        get = (-1, {"psd2 get error": "Could not get from Orlo"}, NO_PERMISSION)
        os.rename(self.root / TICKET, self.root / "ticket")
        self.assertEqual((self.put(), self.get()), (put, get))
        os.rename(self.root / "ticket", self.root / TICKET)
        self.service.describe({})
        self.assertEqual((self.put(), self.get()), (put, get))


class Export(OrloTest):
    def exported(self):
        """The exports in the store, each as a dictionary from class to instance."""
        exports = {}
        for row in self.rows("SELECT id, class, instance FROM exports LEFT JOIN export_pairs ON id = export_id"):
            number, name, instance = row.split("|")
            exports.setdefault(number, {}).update({name: instance} if name else {})
        return list(exports.values())

    def test_each_export_stands_in_the_store_as_a_whole(self):
        self.assertEqual(self.answer("export"), SUCCESS)
        self.assertEqual(self.answer("export", "psd2", "tcrt", "psd2"), SUCCESS)
        self.assertEqual(self.answer("call", "OrloExport", "ExportList:=[]", "HTTPTimeout:=1"), SUCCESS)
        self.assertEqual(self.exported(), [DEFAULT_LIST, {"psd2": "VAN0001", "tcrt": "SCR0001-TMA0001"}, {}])
        self.assertEqual(self.rows("SELECT DISTINCT data_version FROM exports"), ["1"])


class Store(OrloTest):
    def mount(self, path, size):
        """Puts a small file system of its own at `path`, or skips the test where that is not allowed."""
        (self.root / path).mkdir(parents=True, exist_ok=True)
        command = ["mount", "-t", "tmpfs", "-o", f"size={size}", "veltra", self.root / path]
        if subprocess.run(command, stderr=subprocess.DEVNULL).returncode != 0:
            self.skipTest("mounting takes a privilege that this test has not")
        self.addCleanup(lambda: subprocess.run(["umount", "-l", self.root / path], check=True))

    def fill(self, path):
        with open(self.root / path, "wb", buffering=0) as file:
            for size in (65536, 1):
                try:
                    while True:
                        file.write(b"x" * size)
                except OSError:
                    pass

    def check_refused(self):
        """Neither a put nor an export is answered with success."""
        status, dictionary, error = self.put()
        self.assertEqual((status, dictionary), (-1, {"psd2 put error": "Could not put in Orlo"}))
        self.assertIn(error["code"], (1008, 1011), error)
        self.assertEqual(self.answer("export")[0], -1)

    def check_works(self, record):
        self.assertEqual(self.get(), SUCCESS)
        self.assertEqual(self.read("tmp/out"), record)
        self.write("tmp/in", b"a new one")
        self.assertEqual((self.put(), self.get(), self.answer("export")), (SUCCESS,) * 3)
        self.assertEqual(self.read("tmp/out"), b"a new one")
        self.assertEqual(self.rows("PRAGMA integrity_check"), ["ok"])

    def test_a_full_disk_is_an_error_until_there_is_room(self):
        self.mount("var/lib/orlo", "1m")
        self.fill("var/lib/orlo/filler")
        self.write("tmp/in", b"record")
        self.check_refused()
        os.remove(self.root / "var/lib/orlo/filler")
        self.assertEqual(self.put(), SUCCESS)
        self.write("tmp/in", os.urandom(2 << 20))
        self.check_refused_for_its_size()
        self.fill("var/lib/orlo/filler")
        self.check_refused()
        os.remove(self.root / "var/lib/orlo/filler")
        self.check_works(b"record")

    def check_refused_for_its_size(self):
        lines = self.service.messages_of(lambda: self.assertEqual(self.put()[0], -1))
        self.assertTrue([line for line in lines if "full" in line], lines)

    def test_a_read_only_store_is_an_error_until_it_can_be_written(self):
        self.mount("var/lib/orlo", "1m")
        self.write("tmp/in", b"record")
        self.assertEqual(self.put(), SUCCESS)
        remount = ["mount", "-o", "remount,ro", self.root / "var/lib/orlo"]
        subprocess.run(remount, check=True)
        self.check_refused()
        remount[2] = "remount,rw"
        subprocess.run(remount, check=True)
        self.check_works(b"record")

    def test_a_record_that_cannot_be_written_to_its_file_is_an_error(self):
        self.write("tmp/in", os.urandom(2 << 20))
        self.assertEqual(self.put(), SUCCESS)
        self.mount("small", "1m")
        self.write("small/out", b"as it was")
        status, dictionary, error = self.get("/small/out")
        self.assertEqual((status, dictionary, error["domain"]), (-1, None, "FileErrorDomain"))
        self.assertEqual(os.listdir(self.root / "small"), ["out"])
        self.assertEqual(self.read("small/out"), b"as it was")

    def test_a_killed_service_loses_no_answered_put_and_keeps_no_half_one(self):
        moments = random.Random(3)

        def record(number):
            return bytes([number]) * (1 + number * 997)

        unanswered = 0
        stored = record(0)
        self.write("tmp/in", stored)
        self.assertEqual(self.put(), SUCCESS)
        for number in range(1, 201):
            self.write("tmp/in", record(number))
            killing = number % 4 == 0
            if killing:
                logged = (self.root / LOG).stat().st_size

                def kill(delay=moments.uniform(0, 0.02)):
                    while (self.root / LOG).stat().st_size == logged:  # until the request is there
                        time.sleep(0)
                    time.sleep(delay)
                    os.kill(self.service.pid, 9)

                killer = threading.Thread(target=kill)
                killer.start()
            status, _ = self.service.orloctl("--timeout", "20", "put-psd2", "/tmp/in")
            unanswered += status != 0
            candidates = [record(number)] if status == 0 else [stored, record(number)]
            if not killing:
                self.assertEqual(status, 0)
                stored = record(number)
                continue
            killer.join()
            self.service.kill()
            self.service.start()
            self.assertEqual(self.get(), SUCCESS)
            stored = self.read("tmp/out")
            self.assertIn(stored, candidates, number)
        self.assertGreater(unanswered, 0)
        self.assertEqual(self.rows("PRAGMA integrity_check"), ["ok"])

    def test_two_services_share_a_store(self):
        other = Service(root=self.root)
        self.addCleanup(other.close)
        self.write("tmp/in", b"record")

        def work(service):
            for _ in range(15):
                for words in (["put-psd2", "/tmp/in"], ["export", "psd2"], ["get-psd2", f"/tmp/{service.pid}"]):
                    self.failures += service.orloctl(*words)[0] != 0

        self.failures = 0
        workers = [threading.Thread(target=work, args=(service,)) for service in (self.service, other)]
        for worker in workers:
            worker.start()
        for worker in workers:
            worker.join()
        self.assertEqual(self.failures, 0)
        self.assertEqual(self.rows("PRAGMA integrity_check; SELECT count(*) FROM exports"), ["ok", "30"])


if __name__ == "__main__":
    unittest.main()
