"""What `orloctl` finds out below the device root without the service: the log and the description of the device."""
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
        self.log = self.root / LOG
        self.log.parent.mkdir(parents=True)

    def start(self, *words):
        return subprocess.Popen([ORLOCTL, *words], env={**os.environ, "VELTRA_DEVICE_ROOT": str(self.root)},
                                stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)

    def run_json(self, *words):
        output, _ = self.start("--json", *words).communicate()
        return json.loads(output)


class Log(Device):
    def test_the_last_lines_are_printed_whatever_their_size(self):
        self.assertEqual(self.run_json("log")["exitStatus"], 2)
        lines = [f"{number} " + "x" * length for number, length in enumerate((3, 70000, 0, 65534, 5, 1, 1, 1, 1, 1, 1))]
        self.log.write_text("\n".join(lines) + "\n")
        for words, count in (([], 10), (["-n", "0"], 0), (["-n", "1"], 1), (["-n", "8"], 8), (["-n", "12"], 11)):
            with self.subTest(words):
                self.assertEqual(self.run_json("log", *words)["lines"], lines[len(lines) - count:])
        self.assertEqual(self.run_json("log", "-n", "1x")["exitStatus"], 2)
        self.assertEqual(self.run_json("log", "-f")["exitStatus"], 2)

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
            follower.terminate()


class Description(Device):
    def test_what_is_wrong_with_a_description_is_said(self):
        sound = self.run_json("check-device")
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
                found = self.run_json("check-device", file)
                self.assertEqual((found.get("faults", []), found["exitStatus"]), (faults, 5 if faults else 0))
        for text, fault in (("[]", "it is no object"), ('{\n"a"}', "a syntax error in line 2 at byte 4")):
            file.write_text(text)
            self.assertEqual(self.run_json("check-device", file)["faults"], ["It is malformed: " + fault])
        (self.root / DESCRIPTION).unlink()
        self.assertEqual(self.run_json("check-device")["exitStatus"], 2)


if __name__ == "__main__":
    unittest.main()
