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


def told_by_help(verb=()):
    """The verb, with its operands and options; and those below it."""
    text = run(*verb, "--help")
    operands = re.search(r"Usage: orloctl(.*)", text)[1].split("[OPTIONS]")[1]
    options = re.findall(r"^  (-\S+(?:, *--\S+)?)(?: ([A-Z-]+))?", text, re.MULTILINE)
    told = {" ".join(verb): (
        [word.strip("[].") for word in operands.split() if word != "SUBCOMMAND"],
        [(re.split(", *", names), value) for names, value in options if verb == () or "--help" not in names],
    )}
    for name in re.findall(r"^  ([a-z][^\s,]*)", text.partition("Subcommands:")[2].partition("\n\n")[0], re.MULTILINE):
        told |= told_by_help((*verb, name))
    return told


def told_by_manual():
    verb = ""
    told = {"": ([], [])}
    for line in (SOURCE / "man/orloctl.1").read_text().splitlines():
        words = [word for word in line.split() if word not in ("Op", ",", "...")]
        names = [word for before, word in zip(words, words[1:]) if before == "Fl"]
        values = [word.upper() for before, word in zip(words, words[1:]) if before == "Ar"]
        if line.startswith(".It Ic "):
            verb = " ".join(words[2:words.index("Ar") if "Ar" in words else None])
            told[verb] = (values, [])
        elif line.startswith(".It Fl "):
            told[verb][1].append((["-" + name for name in names], "".join(values)))
    return told


class Help(unittest.TestCase):
    maxDiff = None

    def test_the_manual_has_the_verbs_operands_and_options_that_the_help_has(self):
        self.assertEqual(told_by_manual(), told_by_help())

    def test_the_manual_of_the_description_has_the_keys_that_are_known(self):
        known = re.findall(r'{"\w*", "(\w+)", ["a-z]', (SOURCE / "platform/linux/system/DescriptionCheck.cpp").read_text())
        told = re.findall(r"^\.(?:It Va|Va|Ss) (\w+)", (SOURCE / "man/veltra-device.json.5").read_text(), re.MULTILINE)
        self.assertLessEqual({"HWModelStr", "store", "s3"}, set(known))
        self.assertLessEqual(set(known), set(told))

    def test_the_manual_pages_are_sound(self):
        subprocess.run(["mandoc", "-Tlint", "-Wwarning", *(SOURCE / "man").glob("*.[1-9]")], check=True)

    def test_a_shell_is_offered_what_may_follow(self):
        for line, offered in (
            ("get-", ["get-tcrt", "get-psd2"]),
            ("show ", ["bcfg", "img4", "der", ":files"]),
            ("verify i", ["img4", ":files"]),
            ("show bcfg x --", ["--help", "--hmac-key-file", "--version", "--bus", "--timeout", "--json",
                                    "--verbose"]),
            ("show bcfg -- --", [":files"]),
            ("show bcfg --hmac-key-file ", [":files"]),
            ("--json crash-logs -o ", [":directories"]),
            ("crash-logs ", []),
            ("--bus s", ["system", "session"]),
            ("OrloExport CtCl psd", ["psd1", "psd2", "psdt"]),
            ("put-psd2 /bl", ["/blobs/"]),
            ("put-psd2 /blobs/hmac-key.bin /bl", []),
            ("verify img4 --profile kImg4DecodeSecureBootEc", ["kImg4DecodeSecureBootEc256Sha256",
                                                              "kImg4DecodeSecureBootEc384Sha384"]),
        ):
            with self.subTest(line):
                words = [word.split("\t")[0] for word in run("--complete", *line.split(" ")).splitlines()]
                self.assertEqual(words, offered)

    def test_an_unknown_verb_is_named_with_the_nearest(self):
        for word, says in (("shw", "; is show meant?"), ("getTCRt", "; is getTCRT meant?"), ("xyzzy", "")):
            done = subprocess.run([ORLOCTL, word], stderr=subprocess.PIPE, text=True)
            self.assertEqual(done.stderr, f'orloctl: There is no verb "{word}"{says} (orloctl --help says more)\n')


if __name__ == "__main__":
    unittest.main()
