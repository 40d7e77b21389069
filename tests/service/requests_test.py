"""Requests that wait for one another, what the bus is told meanwhile, and who gets the lines of a request."""
import json
import os
import signal
import subprocess
import time
import unittest
import xml.etree.ElementTree

from harness import INTERFACE, PIPES, SOURCE, SUCCESS, HeldTest, PrivateBus
from hostile_server import HostileServer

CLIENTS = [SOURCE / "examples/client/orlo-client.py", SOURCE / "examples/client/orlo-client.sh"]
# As installed, but anybody may connect, own names and receive what is not meant for somebody else.
POLICY = f"""<!DOCTYPE busconfig PUBLIC "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
  "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <listen>unix:tmpdir=/tmp</listen><auth>EXTERNAL</auth>
  <policy context="default">
    <allow user="*"/><allow own="*"/><allow send_destination="*"/><allow receive_sender="*"/>
  </policy>
  <include>{SOURCE}/packaging/com.tevari.VeltraOrloServices.conf</include>
</busconfig>"""


class Requests(HeldTest):
    def received(self):
        """The commands that the log tells of, in their order."""
        marks = [line.split('"messageStr": "') for line in self.service.log() if "] Received Request : " in line]
        return [mark[1].split('"')[0] for mark in marks]

    def test_the_bus_is_answered_while_a_request_is_in_hand(self):
        self.service.describe(store={"backend": "tape"})
        self.assertEqual(self.service.put(b"record")[0], -1)
        before = time.time_ns() // 1000
        _, connection = self.hold()
        self.wait_in_line("orloctl", "call", "x")
        known = self.service.properties()
        self.assertIn(known.pop("RequestStarted"), range(before, time.time_ns() // 1000))
        self.assertEqual(known, {
            "DeviceRoot": str(self.root), "RequestInHand": "corvoSCProv", "RequestsWaiting": 1, "Version": "1.0.0.1",
            "StoreState": "tape: could not be opened: There is no backend tape"})
        told = self.service.call("org.freedesktop.DBus.Introspectable", "Introspect", "--json=short")
        told = xml.etree.ElementTree.fromstring(json.loads(told)["data"][0])
        documented = xml.etree.ElementTree.parse(SOURCE / f"packaging/{INTERFACE}.xml").getroot()
        shapes = [{(part.tag, *sorted(part.items()), *(tuple(sorted(inner.items())) for inner in part))
                   for part in root.find(f"interface[@name='{INTERFACE}']")} for root in (told, documented)]
        self.assertEqual(*shapes)
        connection.close()
        self.service.describe(store=None)
        self.assertEqual(self.service.answer("export"), SUCCESS)
        self.assertEqual(self.service.properties(), known | {
            "RequestInHand": "", "RequestStarted": 0, "RequestsWaiting": 0, "StoreState": "embedded: opened"})

    def test_a_request_waits_its_turn_and_is_dropped_only_when_nobody_can_get_its_reply(self):
        client, connection = self.hold()
        first = self.wait_in_line("orloctl", "call", "first")
        gone = self.wait_in_line("orloctl", "call", "gone")
        silent = "busctl --user --expect-reply=no call com.tevari.VeltraOrloServices /com/tevari/VeltraOrloServices"
        self.wait_in_line(*f"/usr/bin/{silent} {INTERFACE} HandleMessage a{{sv}} 1 messageStr s silent".split())
        last = self.wait_in_line("orloctl", "call", "last")
        client.kill()
        gone.kill()
        self.service.await_property("RequestsWaiting", 3)
        self.assertEqual(self.service.properties()["RequestInHand"], "corvoSCProv")
        connection.close()
        for served in (first, last):
            served.communicate()
            self.assertEqual(served.returncode, 4)
        self.assertEqual(self.received(), ["corvoSCProv", "first", "silent", "last"])
        self.assertIn("Corvo SC provisioning failed!!!", "".join(self.service.log()))

    def test_at_a_stop_what_waits_gets_an_error_and_what_is_in_hand_its_answer(self):
        for number in (signal.SIGTERM, signal.SIGINT):
            with self.subTest(number):
                client, connection = self.hold()
                waiting = self.wait_in_line("orloctl", "call", "x")
                os.kill(self.service.pid, number)
                for refused in (waiting, self.popen("orloctl", "call", "x", **PIPES)):
                    self.assertIn("has not begun with the request", refused.communicate()[1])
                    self.assertEqual(refused.returncode, 3)
                self.assertEqual(self.service.properties()["RequestInHand"], "corvoSCProv")
                connection.close()
                self.assertIn('"BWCErrorDomain"', client.communicate()[0])
                self.assertEqual(self.service.wait_end(), 0)
                self.service.kill()
                self.service.start()
        self.assertNotIn("x", self.received())

    def test_without_the_bus_the_request_in_hand_is_served_to_its_end(self):
        _, connection = self.hold()
        self.wait_in_line("orloctl", "call", "x")
        self.service.bus.close()
        connection.close()
        self.assertEqual(self.service.wait_end(), 1)
        self.assertEqual(self.received(), ["corvoSCProv"])
        self.assertIn("Corvo SC provisioning failed!!!", self.service.log()[-1])
        self.service.kill()
        self.service.begin(PrivateBus())

    def flood(self, *words):
        return self.popen(SOURCE / "tests/service/flood", *map(str, words), stdout=subprocess.PIPE)

    @unittest.skipIf(os.environ.get("VELTRA_SANITIZED") == "1", "sanitizers take minutes to read messages of this size")
    def test_what_waits_is_bounded_by_memory(self):
        for _ in range(2):  # what was held is given back
            _, connection = self.hold()
            floods = [self.flood(1, 3, "noSuchCommand", 9)]
            self.service.await_property("RequestsWaiting", 1)
            floods.append(self.flood(4, 4, "noSuchCommand", 13))
            self.service.await_property("RequestsWaiting", 5)
            self.assertEqual(self.flood(1, 1, "noSuchCommand", 13).communicate()[0], "0 completed, 1 failed\n")
            connection.close()
            self.assertEqual([flood.communicate()[0] for flood in floods],
                             ["1 completed, 2 failed\n", "4 completed, 0 failed\n"])
        self.service.await_property("RequestInHand", "")
        self.assertEqual(self.flood(1, 1, "noSuchCommand", 20).communicate()[0], "1 completed, 0 failed\n")


class Messages(HeldTest):
    def watch(self, **options):
        watcher = self.popen(SOURCE / "tests/service/watch-bus", stdout=subprocess.PIPE, **options)
        self.assertEqual(watcher.stdout.readline(), "ready\n")
        return watcher

    @unittest.skipIf(os.geteuid(), "only root can be another user too")
    def test_the_lines_of_a_request_go_to_its_caller_alone_and_in_their_order(self):
        server = self.closing(HostileServer(None, None, b"the ticket"))
        self.service.stop()
        self.service.bus.close()
        self.service.write("bus.conf", POLICY.encode())
        self.root.chmod(0o755)
        self.service.begin(PrivateBus(f"--config-file={self.root}/bus.conf"))
        self.service.describe(vanter={"fail": "create"})
        watchers = [self.watch(), self.watch(user=65534, group=65534, extra_groups=[])]
        before = len(self.service.log())
        caller = self.popen(CLIENTS[0], "pair", f"http://127.0.0.1:{server.server_port}/plain", **PIPES)
        output, errors = caller.communicate()
        self.assertEqual(caller.returncode, 1, errors)
        self.service.run("busctl", "--user", "emit", "/", INTERFACE, "Done")
        for watcher, who in zip(watchers, ("another connection", "another user")):
            with self.subTest(who):
                heard = watcher.communicate()[0].split()
                self.assertEqual([name for name in heard if name in ("Message", "Done")], ["Done"])
        lines = output.splitlines()
        framework = [line for line in lines if " framework: " in line]
        self.assertEqual(len(framework), 4, output)
        self.assertEqual([line.split()[0] for line in framework], ["info", "error", "error", "error"])
        logged = [line.split("[", 1)[1] for line in self.service.log()[before:]]
        self.assertEqual([line[8:] for line in lines if line not in framework],
                         [line.split(":")[0] + ": " + line.split("] ", 1)[1] for line in logged])
        self.assertEqual(lines[-1], "error   ZPOrloServices: Corvo SC pairing failed!!!")

    def test_the_examples_do_what_they_say_and_follow_a_pairing_live(self):
        certificate = self.service.answer("get-tcrt")[1]["CertSerialNumber"]
        for client in CLIENTS:
            with self.subTest(client.name):
                def run(*words):
                    return self.service.run(client, *words, stderr=subprocess.PIPE)

                self.assertIn(f"CertSerialNumber: {certificate}\n", run("certificate").stdout)
                done = [run("export", *classes) for classes in ((), ("psd2", "tcrt"), ("none",))]
                self.assertEqual([export.returncode for export in done], [0, 0, 1], done)
                self.assertIn("Key doesn't exist - none", done[2].stderr)
                self.assertEqual(run("dance").returncode, 2)
                follower, connection = self.hold(client, "pair")
                while "ZPOrloServices: Calling the pairing" not in follower.stdout.readline():
                    self.assertIsNone(follower.poll())
                follower.send_signal(signal.SIGSTOP)  # a receiver that takes nothing keeps nobody waiting
                connection.close()
                self.service.busctl("0")
                follower.send_signal(signal.SIGCONT)
                output, errors = follower.communicate()
                self.assertRegex(output, r"error\s+ZPOrloServices: Corvo SC pairing failed!!!\n\Z")
                self.assertEqual((follower.returncode, errors != ""), (1, True))


if __name__ == "__main__":
    unittest.main()
