"""What orloctl tells of a request: its reasons, what it waits for, and what becomes of one that is given up."""
import os
import pty
import re
import signal
import subprocess
import unittest

from harness import BIN, INTERFACE, PATH, HeldTest, ServiceTest


class Reasons(ServiceTest):
    def test_messages_are_shown_when_asked_for_and_the_reasons_after_a_failure(self):
        for words, status, ends in (
            (["check-entitlement"], 0, []),
            (["-v", "check-entitlement"], 0, ["ZPOrloServices: Plugin  - version 1.0.0.1", *[""] * 5]),
            (["export", "nope"], 1, ["ZPOrloExport: Key nope doesn't exist", " Failed due to - Key doesn't exist - nope"]),
        ):
            with self.subTest(words):
                found, answer = self.service.orloctl(*words)
                told = [f"{message['source']}: {message['text']}" for message in answer.get("messages", [])]
                self.assertEqual((found, len(told)), (status, len(ends)), told)
                self.assertTrue(all(map(str.endswith, told, ends)), told)
                printed = self.service.run(BIN / "orloctl", *words, stderr=subprocess.PIPE).stderr
                self.assertEqual(len(re.findall(r"^ *(?:ZP\w+|framework): ", printed, re.MULTILINE)), len(ends))


class Waiting(HeldTest):
    def setUp(self):
        super().setUp()
        self.terminal, (self.slow, self.connection) = self.on_terminal(self.hold, "orloctl", "provision")

    def on_terminal(self, start, *words):
        """A terminal for the standard error of what is started, and what `start` gives."""
        terminal, slave = pty.openpty()
        self.addCleanup(os.close, terminal)
        started = start(*words, stdout=subprocess.DEVNULL, stderr=slave)
        os.close(slave)
        return terminal, started

    def seen(self, pattern, terminal=None):
        """What the terminal, that of the slow request or another one, shows once it has this."""
        shown = ""
        while not re.search(pattern, shown):
            shown += os.read(terminal or self.terminal, 65536).decode()
        return shown

    def test_a_terminal_shows_what_the_service_does_and_what_a_request_waits_for(self):
        command = f"{BIN}/orloctl --timeout 3 get-tcrt"
        shown = self.service.run("script", "-qec", command, "/dev/null").stdout
        self.assertRegex(shown, r"\d s  waiting for another request: corvoSCProv, in hand for \d+ s\s\x1b\[K")
        self.assertIn("The service has dropped the request, which was still waiting", shown)
        state = self.service.orloctl("status")[1]
        self.assertEqual((state["requestInHand"]["command"], state["requestsWaiting"]), ("corvoSCProv", 0), state)
        self.assertGreaterEqual(state["requestInHand"]["seconds"], 1)
        self.seen(r"\A\d s  ZPOrloServices: Calling the provisioning\r\x1b\[K")
        terminal, _ = self.on_terminal(self.popen, BIN / "orloctl", "-v", "check-entitlement")
        self.seen("waiting for another request", terminal)
        self.connection.close()
        self.seen(r"\r\x1b\[KZPOrloServices: Plugin", terminal)
        self.seen(r"\r\x1b\[Korloctl: The plug-in answered")
        self.assertEqual(self.service.orloctl("call", "x")[0], 4)
        self.assertNotIn("getTCRT", "".join(self.service.log()))

    def test_who_gives_up_learns_what_becomes_of_the_request(self):
        large = self.root / "large"
        self.service.write("large", b"")
        os.truncate(large, 20 << 20)
        status, answer = self.service.orloctl("call", "x", f"a@={large}")
        self.assertEqual((status, "is busy" in answer["problem"]), (3, True), answer)
        self.slow.send_signal(signal.SIGINT)
        self.seen(r"Interrupted while .* The service goes on with the request\.\r\n\Z")
        self.assertEqual(self.slow.wait(), 3)
        for stopped, says in ((self.service.pid, "It is not known whether the service goes on with the request."),
                              (self.service.bus.daemon.pid, "The request was not sent.")):
            os.kill(stopped, signal.SIGSTOP)
            try:
                status, answer = self.service.orloctl("--timeout", "1", "call", "x")
                self.assertEqual((status, says in answer["problem"]), (3, True), answer)
            finally:
                os.kill(stopped, signal.SIGCONT)

    def test_what_others_send_is_not_taken_for_a_message_of_the_service(self):
        for number in range(20):
            self.service.run("busctl", "--user", f"--destination=:1.{number}", "emit", PATH, INTERFACE, "Message",
                             "iss", "4", "x", "forged")
        self.connection.close()
        self.assertNotIn("forged", self.seen("orloctl: The plug-in answered"))


class Status(ServiceTest):
    def test_the_status_tells_of_the_service_and_the_description_without_starting_it(self):
        sound = {"exitStatus": 0, "service": "running", "bus": self.service.bus.address, "version": "1.0.0.1",
                 "deviceRoot": str(self.root), "store": "embedded: not opened yet", "requestsWaiting": 0,
                 "requestInHand": {}, "description": "sound"}
        self.assertEqual(self.service.orloctl("status"), (0, sound))
        self.service.describe(stor={})
        self.service.environment["VELTRA_DEVICE_ROOT"] = "/missing"  # the client's
        status, found = self.service.orloctl("status")
        self.assertIn("/missing", found["note"])
        self.assertEqual((status, found["description"]), (0, ["nobody reads stor; is store meant?"]))
        os.kill(self.service.pid, signal.SIGTERM)
        self.assertEqual(self.service.wait_end(), 0)
        status, found = self.service.orloctl("status")
        self.assertEqual((status, "is not running" in found["problem"]), (3, True), found)


if __name__ == "__main__":
    unittest.main()
