"""What orloctl tells of a request: its reasons, what it waits for, and what becomes of one that is given up."""
import os
import pty
import re
import signal
import socket
import subprocess
import unittest

from harness import BIN, NAME, ServiceTest

NO_TICKET = "Could not read AP ticket: /System/Library/Caches/apticket.der"


class Reasons(ServiceTest):
    def reasons(self, *words):
        """The lines that orloctl gives as reasons of the failure, which it is."""
        status, answer = self.service.orloctl(*words)
        self.assertEqual(status, 1, answer)
        return [f"{message['source']}: {message['text']}" for message in answer["messages"]]

    def test_a_failure_comes_with_its_reasons(self):
        no_vanter = "ZPDevice: Could not get data instance string for identifier Vanter Serial Number"
        get_service = "ZPDevice: cannot get service"
        export, get, wrong = ["export"], ["get-psd2", "/tmp/out"], "ZPOrloServices: Wafton URL not a valid URL"
        for changes, words, reasons in (
            ({}, ["export", "nope"], ["ZPOrloExport: Key nope doesn't exist",
                                      "ZPOrloServices: Orlo Export Failed due to - Key doesn't exist - nope"]),
            ({}, ["call", "OrloExport", "ExportList=x"], ["ZPOrloServices: Expected a list"]),
            ({}, get, ["ZPOrlo: orloGet  - Failure : QDOrloErrorDomain (3): There is no record psd2 of VAN0001",
                       "ZPOrloServices: psd2 get returned an error"]),
            ({}, ["provision", "corvo"], ["ZPOrloServices: Corvo SC provisioning failed!!!"]),
            ({}, ["provision", "a b"], [wrong]),
            ({}, ["pair", "a b"], [wrong]),
            ({}, ["set-bcfg", "/missing"], []),
            ({"HWModelStr": "M5"}, ["get-tcrt"], []),
            ({"VanterSerialNumber": None}, ["export", "psd2"],
             [no_vanter, "ZPOrloExport: Error Reading Vanter SN",
              "ZPOrloServices: Orlo Export Failed due to - Error Reading Vanter SN"]),
            ({"VanterSerialNumber": None}, get,
             [no_vanter, "ZPOrlo: permission string nil", "ZPOrloServices: psd2 get returned an error"]),
            ({"HWModelStr": "M3", "componentAuth": {"mode": "fail"}}, ["put-tcrt"],
             ["ZPOrloServices: Top Module Authentication Failed. Failing the test"]),
            ({"HWModelStr": "M12", "registry": []}, ["get-tcrt"],
             [get_service, get_service, "ZPDevice: cannot get service. Giving up."]),
        ):
            with self.subTest(words, changes=changes):
                answers = {key: value for key, value in changes.items() if key[0].isupper()}
                self.service.describe(answers={"HWModelStr": "M12", "VanterSerialNumber": "VAN0001"} | answers,
                                      **{key: value for key, value in changes.items() if key[0].islower()})
                self.assertEqual(self.reasons(*words), reasons)
        self.service.describe(answers={"VanterSerialNumber": "VAN0001"})
        self.assertRegex(self.reasons("put-psd2", "/missing")[0], "- Received putPSD2$")
        self.service.put(b"record")
        self.assertEqual(self.reasons("get-psd2", "/missing/out"),
                         ["ZPOrloServices: Failed to open psd2 file handler"])
        (self.root / "System/Library/Caches/apticket.der").unlink()
        for words, source in ((export, "ZPOrloExport"), (["put-psd2", "/tmp/in"], "ZPOrlo")):
            self.assertEqual(self.reasons(*words)[0], f"{source}: {NO_TICKET}")
        (self.root / "etc/veltra/device.json").unlink()
        self.assertEqual(self.reasons("get-tcrt"),
                         ["framework: Device description /etc/veltra/device.json is missing or cannot be read"])

    def test_messages_are_shown_when_asked_for_or_after_a_failure(self):
        for words, status, first, count in (
            (["-v", "check-entitlement"], 0, "Plugin  - version 1.0.0.1", 6),
            (["check-entitlement"], 0, None, 0),
            (["export", "nope"], 1, "Key nope doesn't exist", 2),
            (["export", "nope", "-v"], 1, "Plugin  - version 1.0.0.1", 8),
        ):
            with self.subTest(words):
                found, answer = self.service.orloctl(*words)
                messages = answer.get("messages", [{"text": None}])
                self.assertEqual((found, messages[0]["text"], len(answer.get("messages", []))), (status, first, count))
                printed = self.service.run(BIN / "orloctl", *words, stderr=subprocess.PIPE).stderr
                self.assertEqual(len(re.findall(r"^ *ZP\w+: ", printed, re.MULTILINE)), count)


class Waiting(ServiceTest):
    """Beside a request whose server does not answer until it is released."""

    def setUp(self):
        super().setUp()
        self.service.describe(reverseProxy={"events": [{"status": 3, "afterMs": 0}]})
        server = self.closing(socket.create_server(("127.0.0.1", 0)))
        self.terminal, slave = pty.openpty()
        self.addCleanup(os.close, self.terminal)
        self.slow = self.start("provision", f"http://127.0.0.1:{server.getsockname()[1]}", stderr=slave)
        os.close(slave)
        self.connection = self.closing(server.accept()[0])

    def start(self, *words, **options):
        client = subprocess.Popen([BIN / "orloctl", *words], env=self.service.environment, stdout=subprocess.DEVNULL,
                                  **options)
        self.addCleanup(client.wait)
        return client

    def seen(self, pattern):
        """What the terminal of the slow request shows, once it has this."""
        shown = ""
        while not re.search(pattern, shown):
            shown += os.read(self.terminal, 65536).decode()
        return shown

    def given_up(self, says, *words):
        status, answer = self.service.orloctl(*words, "call", "x")
        self.assertEqual((status, says in answer["problem"]), (3, True), answer)

    def test_a_terminal_shows_what_the_service_does_and_what_a_request_waits_for(self):
        command = f"{BIN}/orloctl --timeout 3 get-tcrt"
        shown = self.service.run("script", "-qec", command, "/dev/null").stdout
        self.assertRegex(shown, r"\d s  waiting for another request: corvoSCProv, in hand for \d+ s\s\x1b\[K")
        self.assertIn("The service has dropped the request, which was still waiting", shown)
        state = self.service.orloctl("status")[1]
        self.assertEqual((state["requestInHand"]["command"], state["requestsWaiting"]), ("corvoSCProv", 0), state)
        self.assertGreaterEqual(state["requestInHand"]["seconds"], 1)
        self.seen(r"\A\d s  ZPOrloServices: Calling the provisioning\r\x1b\[K")
        self.connection.close()
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
                self.given_up(says, "--timeout", "1")
            finally:
                os.kill(stopped, signal.SIGCONT)

    def test_what_others_send_is_not_taken_for_a_message_of_the_service(self):
        for number in range(20):
            self.service.run("busctl", "--user", f"--destination=:1.{number}", "emit", "/" + NAME.replace(".", "/"),
                             "com.tevari.VeltraPluginServer", "Message", "iss", "4", "x", "forged")
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
