"""What people are told about `orloctl`: its help, its manual page and what a shell completes."""
import os
import pathlib
import re
import subprocess
import unittest

SOURCE = pathlib.Path(__file__).resolve().parents[2]
ORLOCTL = pathlib.Path(os.environ["VELTRA_BIN"]) / "orloctl"


def run(*words):
    environment = {**os.environ, "VELTRA_DEVICE_ROOT": str(SOURCE / "examples/device")}
    return subprocess.run([ORLOCTL, *words], env=environment, stdout=subprocess.PIPE, text=True, check=True).stdout


def offered(*words):
    return [line.split("\t")[0] for line in run("--complete", *words).splitlines()]


def options_in(manual):
    return {f"--{name}" for name in re.findall(r"^\.It Fl (?:\w , Fl )?-([\w-]+)", manual, re.MULTILINE)}


class Help(unittest.TestCase):
    def test_the_manual_has_the_verbs_and_options_that_a_shell_is_offered(self):
        common, *verbs = re.split(r"^\.It Ic ", (SOURCE / "man/orloctl.1").read_text(), flags=re.MULTILINE)
        common = options_in(common)
        self.assertEqual(set(offered("--")), common)
        self.assertEqual({verb.split()[0]: options_in(verb) for verb in verbs},
                         {verb: set(offered(verb, "--")) - common for verb in offered("")})

    def test_the_manual_of_the_description_has_the_keys_that_are_known(self):
        known = re.findall(r'{"\w*", "(\w+)", ["a-z]', (SOURCE / "platform/linux/system/DescriptionCheck.cpp").read_text())
        told = re.findall(r"^\.(?:It Va|Va|Ss) (\w+)", (SOURCE / "man/veltra-device.json.5").read_text(), re.MULTILINE)
        self.assertLessEqual({"HWModelStr", "store", "s3"}, set(known))
        self.assertLessEqual(set(known), set(told))

    def test_the_manual_pages_are_sound(self):
        subprocess.run(["mandoc", "-Tlint", "-Wwarning", *(SOURCE / "man").glob("*.[1-9]")], check=True)

    def test_a_shell_is_offered_what_may_follow(self):
        for line, words in (
            ("get-", ["get-tcrt", "get-psd2"]),
            ("show ", ["bcfg", "img4", "der", ":files"]),
            ("verify i", ["img4", ":files"]),
            ("show bcfg x --", ["--help", "--hmac-key-file", "--version", "--bus", "--timeout", "--json",
                                    "--verbose"]),
            ("show bcfg -- --", [":files"]),
            ("show bcfg --hmac-key-file ", [":files"]),
            ("--json crash-logs -o ", [":directories"]),
            ("--bus s", ["system", "session"]),
            ("OrloExport CtCl psd", ["psd1", "psd2", "psdt"]),
            ("put-psd2 /bl", ["/blobs/"]),
            ("put-psd2 /blobs/hm", ["/blobs/hmac-key.bin"]),
            ("put-psd2 /blobs/hmac-key.bin /bl", []),
            ("verify img4 --profile kImg4DecodeSecureBootEc", ["kImg4DecodeSecureBootEc256Sha256",
                                                              "kImg4DecodeSecureBootEc384Sha384"]),
        ):
            with self.subTest(line):
                self.assertEqual(offered(*line.split(" ")), words)

    def test_wrong_usage_is_said(self):
        verb = 'There is no verb "{}"{} (orloctl --help says more)'
        for line, says in (
            ("shw", verb.format("shw", "; is show meant?")),
            ("getTCRt", verb.format("getTCRt", "; is getTCRT meant?")),
            ("xyzzy", verb.format("xyzzy", "")),
            ("call getTCRT :=1", '":=1" has no key'),
            ("call getTCRT x", '"x" is none of KEY=TEXT, KEY:=JSON and KEY@=FILE'),
            ("call getTCRT x=1 x=2", 'The key "x" is given twice'),
            ("crash-logs -o -", "Logs are copied into a directory, not to standard output"),
            ("show bcfg - --hmac-key-file -", "The file and the key cannot both come from standard input"),
            ("log --lines 1x", '"1x" is no number of lines'),
        ):
            with self.subTest(line):
                done = subprocess.run([ORLOCTL, *line.split()], stderr=subprocess.PIPE, text=True)
                self.assertEqual((done.returncode, done.stderr), (2, f"orloctl: {says}\n"))


if __name__ == "__main__":
    unittest.main()
