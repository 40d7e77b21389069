"""What `orloctl` finds out below the device root without the service: the log, the description of the device and crash
logs."""
import json
import os
import pathlib
import shutil
import subprocess
import tempfile
import unittest

SOURCE = pathlib.Path(__file__).resolve().parents[2]
ORLOCTL = pathlib.Path(os.environ["VELTRA_BIN"]) / "orloctl"
LOG = "private/var/log/com.tevari.VeltraOrloServices.log"
DESCRIPTION = "etc/veltra/device.json"


class Device(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="veltra-")
        self.addCleanup(folder.cleanup)
        self.root = pathlib.Path(folder.name)
        shutil.copytree(SOURCE / "examples/device", self.root, dirs_exist_ok=True)

    def start(self, *words):
        # One that does not print what is awaited is ended, which ends what it prints.
        return subprocess.Popen(["timeout", "60", ORLOCTL, *words], stdout=subprocess.PIPE, stderr=subprocess.PIPE,
                                text=True, env={**os.environ, "VELTRA_DEVICE_ROOT": str(self.root)},
                                restore_signals=False)  # so that a reader who goes away is a failed write

    def run_orloctl(self, *words):
        """Exit status, standard output and standard error."""
        with self.start(*words) as client:
            output, errors = client.communicate()
        return client.returncode, output, errors

    def json(self, *words):
        status, output, _ = self.run_orloctl("--json", *words)
        found = json.loads(output)
        self.assertEqual(found["exitStatus"], status)
        return found

    def write(self, path, contents):
        path = self.root / path
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(contents)


class Log(Device):
    def setUp(self):
        super().setUp()
        self.log = self.root / LOG
        self.log.parent.mkdir(parents=True)

    def test_the_last_lines_are_printed_whatever_their_size(self):
        self.assertEqual(self.json("log")["exitStatus"], 2)
        lines = [f"{number} " + "x" * length for number, length in enumerate((3, 70000, 0, 65534, 5, 1, 1, 1, 1, 1, 1))]
        self.log.write_text("\n".join(lines) + "\n")
        for words, count in (([], 10), (["-n", "0"], 0), (["-n", "1"], 1), (["-n", "8"], 8), (["-n", "12"], 11)):
            with self.subTest(words):
                self.assertEqual(self.json("log", *words)["lines"], lines[len(lines) - count:])
        self.assertEqual(self.json("log", "-f")["exitStatus"], 2)

    def test_a_log_is_followed_into_the_file_that_takes_its_place(self):
        self.log.write_text("first\nlast\n")
        with self.start("log", "-n", "1", "-f") as follower:
            self.assertEqual(follower.stdout.readline(), "last\n")
            with open(self.log, "a") as log:
                for part in ("ad", "ded\n\x1b[2J\n"):
                    log.write(part)
                    log.flush()
            self.assertEqual([follower.stdout.readline() for _ in range(2)], ["added\n", "\\u001b[2J\n"])
            self.log.rename(self.root / "rotated")
            self.log.write_text("anew\n")
            self.assertEqual(follower.stdout.readline(), "anew\n")
            os.truncate(self.log, 0)
            with open(self.log, "a") as log:
                log.write("cut\n")
            self.assertEqual(follower.stdout.readline(), "cut\n")
            follower.stdout.close()
            self.write(LOG, b"cut\nmore\n")
            self.assertEqual(follower.wait(), 2)


class Description(Device):
    def test_what_is_wrong_with_a_description_is_said(self):
        sound = self.json("check-device")
        self.assertEqual(sound, {"exitStatus": 0, "description": f"/{DESCRIPTION}", "sound": True})
        whole = json.loads((self.root / DESCRIPTION).read_text())
        subprocess.run(["openssl", "genpkey", "-algorithm", "EC", "-pkeyopt", "ec_paramgen_curve:P-256", "-out",
                        self.root / "other.pem"], check=True, stderr=subprocess.DEVNULL)
        key = {"mode": "key", "delayMs": 3600000}
        for changes, faults in (
            ({"stor": {}}, ["nobody reads stor; is store meant?"]),
            ({"componentAuth": key | {"key": "/etc/veltra/tesk-key.pem"}}, []),
            ({"componentAuth": key | {"key": "/other.pem"}},
             ["componentAuth.key is not the key of the certificate in registry"]),
            ({"componentAuth": key | {"key": f"/{DESCRIPTION}"}},
             ["componentAuth.key names no file with an unencrypted private key in PEM that signs"]),
            ({"registry": []}, ["registry has no AccessoryCertificate that is a certificate, which componentAuth.key "
                                "needs"]),
        ):
            with self.subTest(changes):
                file = self.root / "changed.json"
                file.write_text(json.dumps(whole | changes))
                found = self.json("check-device", file)
                self.assertEqual((found.get("faults", []), found["exitStatus"]), (faults, 5 if faults else 0))
        file.write_text('{\n"a"}')
        self.assertEqual(self.json("check-device", file)["faults"], ["It is malformed: a syntax error in line 2 at byte 4"])
        (self.root / DESCRIPTION).unlink()
        self.assertEqual(self.json("check-device")["exitStatus"], 2)


class CrashLogs(Device):
    def setUp(self):
        super().setUp()
        self.logs, self.varrow = "private/var/logs/", "private/var/mobile/Library/Logs/Varrow/"
        (self.root / self.logs).mkdir(parents=True)
        self.copies = self.root / "copies"
        self.write("System/Library/Quennel/SystemVersion.plist",
                           b"<plist><dict><key>ProductBuildVersion</key><string>21A55</string></dict></plist>")

    def collect(self):
        return self.json("crash-logs", "-o", self.copies)

    def test_the_collected_files_are_listed_and_copied(self):
        panic = b'{"os_version": "Quennel 3.1 (21A55)"}\npanic\n'
        rows = (  # newest first
            (self.logs + "a.log", b"first\x00\xff", False, "a.log", "2023-11-14T22:13:20Z"),
            (self.logs + "panic-full-1.ips", panic, True, "panic-full-1.ips", "2023-11-14T22:13:19Z"),
            (self.varrow + "a.log", b"second", False, "2-a.log", "2023-11-14T22:13:19Z"),
        )
        expected = []
        for number, (name, contents, is_panic, copy, date) in enumerate(rows):
            self.write(name, contents)
            os.utime(self.root / name, ns=(0, 1_700_000_000_000_000_000 - number))
            expected.append({"name": "/" + name, "date": date, "size": len(contents), "panic": is_panic,
                             "copy": str(self.copies / copy)})
        self.assertEqual(self.collect(), {"exitStatus": 0, "status": 0, "logs": expected})
        for name, contents, _, copy, _ in rows:
            self.assertEqual((self.copies / copy).read_bytes(), contents)
            self.assertEqual((self.copies / copy).stat().st_mtime_ns, (self.root / name).stat().st_mtime_ns)
        self.assertEqual(len(os.listdir(self.copies)), 3)

    def test_what_cannot_be_looked_at_is_missed_and_said_so(self):
        header = b'{"os_version": "21A55"}\n'
        self.write(self.logs + "panic-huge.log", header)
        os.truncate(self.root / self.logs / "panic-huge.log", 1 << 42)  # a hole, more than memory or a disk holds
        os.mkfifo(self.root / self.logs / "fifo.log")
        os.symlink("/etc/hostname", self.root / self.logs / "out.log")
        (self.root / self.varrow).parent.mkdir(parents=True)
        os.symlink("/", self.root / self.varrow.rstrip("/"))
        answer = self.collect()
        self.assertEqual((answer["exitStatus"], [log["size"] for log in answer["logs"]]), (2, [1 << 42]))
        self.assertEqual((self.copies / "panic-huge.log").stat().st_size, 1 << 42)
        with open(self.copies / "panic-huge.log", "rb") as copy:
            self.assertEqual(copy.read(len(header) + 1), header + b"\0")
        self.assertEqual({entry["name"] for entry in answer["missed"] if entry["note"]},
                         {f"/{self.logs}fifo.log", f"/{self.logs}out.log", f"/{self.varrow}"})
        self.root = "/missing"
        self.assertIn("device root /missing: No such file", self.json("crash-logs")["problem"])

    def test_a_log_that_cannot_be_copied_holds_up_no_other(self):
        copies = self.copies
        (copies / "directory.log").mkdir(parents=True)
        os.symlink(copies / "victim", copies / "link.log")
        os.mkfifo(copies / "fifo.log")
        (copies / "earlier.log").write_bytes(b"earlier")
        os.link(copies / "earlier.log", copies / "hard link")
        no_text = b"\xff" * 251 + b".log"  # a legal name; as text it is three times as long
        longest = b"a" * 250 + b".ips"
        for name in (b"directory.log", b"link.log", b"fifo.log", b"earlier.log", no_text, longest):
            self.write(self.logs + os.fsdecode(name), name[:9])
        self.write(self.varrow + os.fsdecode(longest), b"second")
        previous = os.umask(0)
        self.addCleanup(os.umask, previous)
        answer = self.collect()
        self.assertEqual((answer["exitStatus"], len(answer["logs"])), (2, 7))
        self.assertIn(str(copies), answer["problem"])
        copied = {"earlier.log": b"earlier.l", "\ufffd" * 83 + ".log": no_text[:9], os.fsdecode(longest): longest[:9],
                  "2-" + "a" * 249 + ".ips": b"second"}
        failed = {"directory.log", "link.log", "fifo.log"}
        self.assertEqual({log["copy"] for log in answer["logs"] if "copy" in log}, {f"{copies}/{name}" for name in copied})
        self.assertEqual({log["note"].split(": ")[0] for log in answer["logs"] if "note" in log},
                         {f"not copied to {copies}/{name}" for name in failed})
        self.assertEqual(set(os.listdir(copies)), copied.keys() | failed | {"hard link"})
        for name, contents in copied.items():
            self.assertEqual((copies / name).read_bytes(), contents)
            self.assertEqual((copies / name).stat().st_mode & 0o7777, 0o600)
        self.assertEqual((copies / "hard link").read_bytes(), b"earlier")

    def test_the_list_for_people(self):
        self.assertEqual(self.run_orloctl("crash-logs"), (0, "status: 45\nlogs: none\n", ""))
        self.assertEqual(self.run_orloctl("crash-logs", "-o", "/dev/null/folder")[:2], (2, ""))
        self.write(self.logs + "a\n.log", b"x" * 1000)
        os.utime(self.root / self.logs / "a\n.log", (0, 1_700_000_000))
        header = "status: 0\nlogs:\n  DATE                          SIZE  PANIC  NAME\n"
        line = "  2023-11-14T22:13:20Z          1000  false  /private/var/logs/a\\n.log"
        self.assertEqual(self.run_orloctl("crash-logs"), (0, f"{header}{line}\n", ""))
        (self.copies / "a\n.log").mkdir(parents=True)
        status, printed, errors = self.run_orloctl("crash-logs", "-o", self.copies)
        self.assertEqual((status, printed.startswith(f"{header}{line}  not copied to ")), (2, True), printed)
        self.assertTrue(errors.startswith("orloctl: Not all logs were copied to "), errors)


if __name__ == "__main__":
    unittest.main()
