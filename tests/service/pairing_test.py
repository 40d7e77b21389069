"""Provisioning and pairing with a real HTTP server behind a real forward proxy, and the collection of crash logs."""
import json
import os
import pathlib
import select
import shutil
import signal
import subprocess
import sys
import tempfile
import unittest

from forward_proxy import ForwardProxy
from harness import BIN, Service
from lab import NginxStore, free_ports

TICKET = "the ticket"
PATCH = b"\x00patch\xff" * 1000

NGINX = """
pid {folder}/nginx.pid;
error_log {folder}/error.log;
events {{ }}
http {{
    log_format posts '$request_method $uri "$request_body" $http_via';
    client_body_temp_path {folder}/body; proxy_temp_path {folder}/proxied; fastcgi_temp_path {folder}/fastcgi;
    uwsgi_temp_path {folder}/uwsgi; scgi_temp_path {folder}/scgi;
    server {{
        listen 127.0.0.1:{http};
        listen 127.0.0.1:{https} ssl;
        ssl_certificate {folder}/cert.pem;
        ssl_certificate_key {folder}/key.pem;
        access_log {folder}/posts.log posts;
        location = /corvo/provision {{ return 204; }}
        location = /corvo/pair {{ return 200 "{ticket}"; }}
        location = /corvo/pair/result {{ proxy_pass http://127.0.0.1:{http}/sink; }}
        location = /lost/pair {{ return 200 "{ticket}"; }}
        location = /lost/pair/result {{ return 500; }}
        location = /sink {{ access_log off; return 204; }}
        location = /busy/provision {{ return 503; }}
        location = /moved/provision {{ return 302 http://127.0.0.1:{http}/corvo/provision; }}
        location = /huge/provision {{ root {folder}; error_page 405 =200 $uri; }}
    }}
}}
"""


class Network:
    """nginx as the pairing server and tinyproxy as the way to it."""

    def __init__(self):
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix="veltra-net-"))
        self.folder.chmod(0o755)  # nginx's worker runs as another user
        self.http, self.https = free_ports(2)
        subprocess.run(
            ["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-subj", "/CN=store", "-addext",
             "subjectAltName=IP:127.0.0.1", "-keyout", self.folder / "key.pem", "-out", self.folder / "cert.pem"], check=True, stderr=subprocess.DEVNULL,
        )
        (self.folder / "huge").mkdir()
        with open(self.folder / "huge/provision", "wb") as huge:
            huge.truncate(17 << 20)
        self.configure("nginx.conf", NGINX)
        # nginx goes to the background once it listens, and then writes its process id, before it answers anything.
        subprocess.run(["/usr/sbin/nginx", "-c", self.folder / "nginx.conf"], check=True, stderr=subprocess.DEVNULL)
        NginxStore.get_page(self.http, "/sink")
        self.server = os.pidfd_open(int((self.folder / "nginx.pid").read_text()))
        self.proxy = ForwardProxy(self.folder, f"ConnectPort {self.https}")

    def configure(self, name, text):
        values = {"folder": self.folder, "http": self.http, "https": self.https, "ticket": TICKET}
        (self.folder / name).write_text(text.format(**values))

    def posts(self):
        """Ends the server and tells which requests it had: method, path, body, and whether the proxy passed them on."""
        self.stop_server()
        posts = []
        for line in (self.folder / "posts.log").read_text().splitlines():
            method, path, rest = line.split(" ", 2)
            body, via = rest.rsplit('" ', 1)
            posts.append((method, path, body[1:], "tinyproxy" in via))
        return posts

    def stop_server(self):
        if self.server is None:
            return
        signal.pidfd_send_signal(self.server, signal.SIGQUIT)
        select.select([self.server], [], [])
        os.close(self.server)
        self.server = None

    def close(self):
        self.stop_server()
        self.proxy.close()
        shutil.rmtree(self.folder)


class Pairing(unittest.TestCase):
    def setUp(self):
        self.network = Network()
        self.addCleanup(self.network.close)
        self.service = Service()
        self.addCleanup(self.service.close)
        self.describe()
        self.write("var/mobile/Vanter.BE-Prod.fw", PATCH)
        self.write("var/lib/vanter/firmware.bin", b"as delivered")
        trace = self.service.root / "calibrated"
        self.write("usr/local/bin/q21isp", f'#!/bin/sh\necho "$@" > {trace}\necho calibration loaded\n'.encode())
        (self.service.root / "usr/local/bin/q21isp").chmod(0o755)

    def write(self, path, contents):
        path = self.service.root / path
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(contents)

    def read(self, path):
        return (self.service.root / path).read_bytes()

    def describe(self, status=1, fail=None, **proxy):
        settings = {}
        for scheme in ("HTTP", "HTTPS"):
            settings |= {scheme + "Enable": 1, scheme + "Proxy": "127.0.0.1", scheme + "Port": self.network.proxy.port}
        description = {
            "answers": {"HWModelStr": "M12x"},
            "reverseProxy": {"events": [{"status": status, "afterMs": 0}], "proxy": settings | proxy},
            "vanter": {"firmware": "/var/lib/vanter/firmware.bin"} | ({"fail": fail} if fail else {}),
        }
        (self.service.root / "etc/veltra/device.json").write_text(json.dumps(description))

    def url(self, server, scheme="http"):
        return f"{scheme}://127.0.0.1:{getattr(self.network, scheme)}/{server}"

    def fails(self, verb, url):
        """The error of a request that fails; the service then still answers."""
        status, answer = self.service.orloctl(verb, url)
        self.assertEqual((status, answer["response"]["statusCode"]), (1, -1), answer)
        self.assertEqual(self.service.orloctl("call", "x")[0], 4)
        return answer["response"].get("error")

    def test_provisioning_passes_through_the_proxy_or_without_one(self):
        success = (0, {"exitStatus": 0, "response": {"name": "corvoSCProv", "statusCode": 0}})
        self.assertEqual(self.service.orloctl("provision", self.url("corvo")), success)
        self.describe(status=3)  # no proxy to be had: the server is tried all the same
        self.assertEqual(self.service.orloctl("provision", self.url("corvo/")), success)
        path = "/corvo/provision"
        self.assertEqual(self.network.posts(), [("POST", path, "-", True), ("POST", path, "-", False)])

    def test_provisioning_fails_with_the_reason(self):
        for server, code in (("busy", 503), ("moved", 302), ("missing", 404), ("huge", 23)):
            with self.subTest(server):
                error = self.fails("provision", self.url(server))
                self.assertEqual((error["domain"], error["code"]), ("BWCErrorDomain", code), error)
        with self.subTest("a certificate that nobody vouches for, behind the tunnel of the proxy"):
            self.assertEqual(self.fails("provision", self.url("corvo", "https"))["code"], 60)
        for proxy in ("", "user:secret@127.0.0.1"):
            with self.subTest("a proxy that the description does not name", proxy=proxy):
                self.describe(HTTPProxy=proxy)
                error = self.fails("provision", self.url("corvo"))
                self.assertEqual((error["code"], "secret" in error["description"]), (5, False), error)
        with self.subTest("neither http nor https"):
            self.assertEqual(self.fails("provision", "file:///etc/hostname")["domain"], "BWCErrorDomain")
            self.assertEqual(self.fails("provision", "corvo")["domain"], "BWCErrorDomain")
        self.network.proxy.close()
        with self.subTest("no proxy where the description says that there is one"):
            self.describe()
            self.assertEqual(self.fails("provision", self.url("corvo"))["code"], 7)

    def test_pairing_installs_the_patch_calibrates_and_tells_the_server(self):
        self.assertEqual(
            self.service.orloctl("pair", self.url("corvo")),
            (0, {"exitStatus": 0, "response": {"name": "corvoSCPair", "statusCode": 0}}),
        )
        self.assertEqual(self.read("var/lib/vanter/firmware.bin"), PATCH)
        self.assertEqual(self.read("calibrated"), b"-ns /tmp/q21_isp_load.txt\n")
        self.assertEqual(
            self.network.posts(), [("POST", "/corvo/pair", "-", True), ("POST", "/corvo/pair/result", "0", True)]
        )

    def test_programs_get_a_clean_start_however_the_service_was_started(self):
        trace = self.service.root / "calibrated"
        self.write("usr/local/bin/q21isp", f"#!/bin/sh\nexec > {trace}\ngrep SigIgn /proc/self/status\n"
                                           "exec ls /proc/self/fd\n".encode())
        for case, change in (("standard error closed", "os.close(2)"),
                             ("nobody reads standard error", "r, w = os.pipe(); os.dup2(w, 2)")):
            with self.subTest(case):
                self.service.stop()
                # Python ignores SIGPIPE, and what it executes inherits that.
                self.service.start(sys.executable, "-c",
                                   f"import os, sys; {change}; os.execv(sys.argv[1], sys.argv[1:])")
                (self.service.root / "etc/veltra/device.json").unlink()  # of which the console is told
                self.assertEqual(self.service.orloctl("call", "x")[0], 4)
                self.describe()
                self.assertEqual(self.service.orloctl("pair", self.url("corvo"))[0], 0)
                ignored, *descriptors = trace.read_text().splitlines()
                self.assertEqual(int(ignored.split()[1], 16) >> (signal.SIGPIPE - 1) & 1, 0)
                self.assertEqual(descriptors, ["0", "1", "2", "3"])  # the last one is the listing's own

    def test_pairing_fails_with_the_updater_and_the_server_hears_of_it(self):
        for step in ("create", "isDone", "queryInfo", "performNextStage"):
            with self.subTest(step):
                self.describe(fail=step)
                error = self.fails("pair", self.url("corvo"))
                self.assertEqual((error["domain"], error["code"]), ("BWCErrorDomain", -1))
        self.describe(fail="create")
        self.assertEqual(self.fails("pair", self.url("lost"))["code"], 500)
        self.assertEqual(self.read("var/lib/vanter/firmware.bin"), b"as delivered")
        self.assertFalse((self.service.root / "calibrated").exists())
        results = [post[2] for post in self.network.posts() if post[1] == "/corvo/pair/result"]
        self.assertEqual(results, ["-1"] * 4)


class CrashLogs(unittest.TestCase):
    def setUp(self):
        self.service = Service()
        self.addCleanup(self.service.close)
        self.logs = self.service.root / "private/var/logs"
        self.logs.mkdir(parents=True)

    def test_the_collected_files_are_listed_and_copied(self):
        varrow = self.service.root / "private/var/mobile/Library/Logs/Varrow"
        varrow.mkdir(parents=True)
        version = self.service.root / "System/Library/Quennel/SystemVersion.plist"
        version.parent.mkdir(parents=True)
        version.write_text("<plist><dict><key>ProductBuildVersion</key><string>21A55</string></dict></plist>")
        panic = b'{"os_version": "Quennel 3.1 (21A55)"}\npanic\n'
        (self.logs / "panic-full-1.ips").write_bytes(panic)
        (varrow / "a.log").write_bytes(b"second")
        (self.logs / "a.log").write_bytes(b"first\x00\xff")
        paths = self.logs / "a.log", self.logs / "panic-full-1.ips", varrow / "a.log"
        for number, path in enumerate(paths):
            os.utime(path, ns=(0, 1_700_000_000_000_000_000 - number))
        copies = self.service.root / "copies/of logs"
        status, answer = self.service.orloctl("crash-logs", "-o", copies)
        self.assertEqual((status, answer["status"]), (0, 0))
        self.assertEqual([self.service.root / log["name"][1:] for log in answer["logs"]], list(paths))
        found = {log["name"]: log for log in answer["logs"]}
        expected = {
            "/private/var/logs/panic-full-1.ips": (True, panic, "panic-full-1.ips"),
            "/private/var/logs/a.log": (False, b"first\x00\xff", "a.log"),
            "/private/var/mobile/Library/Logs/Varrow/a.log": (False, b"second", "2-a.log"),
        }
        self.assertEqual(found.keys(), expected.keys())
        for name, (is_panic, contents, copy) in expected.items():
            self.assertEqual(found[name], {"name": name, "date": "2023-11-14T22:13:20Z" if name == "/private/var/logs/a.log"
                                           else "2023-11-14T22:13:19Z", "size": len(contents), "panic": is_panic,
                                           "copy": str(copies / copy)})
            self.assertEqual((copies / copy).read_bytes(), contents)
            self.assertEqual((copies / copy).stat().st_mtime_ns, (self.service.root / name[1:]).stat().st_mtime_ns)
        self.assertEqual(len(os.listdir(copies)), 3)

    def test_what_cannot_be_looked_at_is_missed_and_said_so(self):
        version = self.service.root / "System/Library/Quennel/SystemVersion.plist"
        version.parent.mkdir(parents=True)
        version.write_text("<plist><dict><key>ProductBuildVersion</key><string>21A55</string></dict></plist>")
        header = b'{"os_version": "21A55"}\n'
        (self.logs / "panic-huge.log").write_bytes(header)
        os.truncate(self.logs / "panic-huge.log", 1 << 42)  # a hole, more than memory or a disk holds
        os.mkfifo(self.logs / "fifo.log")
        os.symlink("/etc/hostname", self.logs / "out.log")
        varrow = self.service.root / "private/var/mobile/Library/Logs/Varrow"
        varrow.parent.mkdir(parents=True)
        os.symlink("/", varrow)
        copies = self.service.root / "copies"
        status, answer = self.service.orloctl("crash-logs", "-o", copies)
        self.assertEqual((status, [log["size"] for log in answer["logs"]]), (2, [1 << 42]))
        self.assertEqual((copies / "panic-huge.log").stat().st_size, 1 << 42)
        with open(copies / "panic-huge.log", "rb") as copy:
            self.assertEqual(copy.read(len(header) + 1), header + b"\0")
        self.assertEqual({entry["name"] for entry in answer["missed"] if entry["note"]},
                         {"/private/var/logs/fifo.log", "/private/var/logs/out.log",
                          "/private/var/mobile/Library/Logs/Varrow/"})
        missing = {**self.service.environment, "VELTRA_DEVICE_ROOT": "/missing"}
        done = subprocess.run([BIN / "orloctl", "crash-logs"], env=missing, capture_output=True, text=True)
        self.assertEqual((done.returncode, done.stdout), (2, ""))
        self.assertIn("device root /missing: No such file", done.stderr)

    def test_a_log_that_cannot_be_copied_holds_up_no_other(self):
        varrow = self.service.root / "private/var/mobile/Library/Logs/Varrow"
        varrow.mkdir(parents=True)
        copies = self.service.root / "copies"
        (copies / "directory.log").mkdir(parents=True)
        os.symlink(copies / "victim", copies / "link.log")
        os.mkfifo(copies / "fifo.log")
        (copies / "earlier.log").write_bytes(b"earlier")
        os.link(copies / "earlier.log", copies / "hard link")
        no_text = b"\xff" * 251 + b".log"  # a legal name; as text it is three times as long
        longest = b"a" * 250 + b".ips"
        for name in (b"directory.log", b"link.log", b"fifo.log", b"earlier.log", no_text, longest):
            (self.logs / os.fsdecode(name)).write_bytes(name[:9])
        (varrow / os.fsdecode(longest)).write_bytes(b"second")
        previous = os.umask(0)
        self.addCleanup(os.umask, previous)
        status, answer = self.service.orloctl("crash-logs", "-o", copies)
        self.assertEqual((status, answer["exitStatus"], len(answer["logs"])), (2, 2, 7))
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
        crash_logs = [BIN / "orloctl", "crash-logs"]
        self.assertEqual(self.service.run(*crash_logs).stdout, "status: 45\nlogs: none\n")
        self.assertEqual(self.service.run(*crash_logs, "-o", self.service.root / "copies").returncode, 0)
        (self.logs / "a\n.log").write_bytes(b"x" * 1000)
        os.utime(self.logs / "a\n.log", (0, 1_700_000_000))
        self.assertEqual(
            self.service.run(*crash_logs).stdout,
            "status: 0\nlogs:\n  DATE                          SIZE  PANIC  NAME\n"
            "  2023-11-14T22:13:20Z          1000  false  /private/var/logs/a\\n.log\n",
        )
        (self.service.root / "copies/a\n.log").mkdir()
        done = self.service.run(*crash_logs, "-o", self.service.root / "copies", stderr=subprocess.PIPE)
        self.assertEqual((done.returncode, len(done.stdout.splitlines())), (2, 4), done)
        self.assertIn("/private/var/logs/a\\n.log  not copied to ", done.stdout)
        self.assertTrue(done.stderr.startswith("orloctl: Not all logs were copied to "), done.stderr)

    def test_a_device_without_logs_is_a_success(self):
        self.assertEqual(self.service.orloctl("crash-logs"), (0, {"exitStatus": 0, "status": 45, "logs": []}))
        status, answer = self.service.orloctl("crash-logs", "-o", "/dev/null/folder")
        self.assertEqual((status, answer["exitStatus"]), (2, 2))
        self.assertIn("/dev/null/folder", answer["problem"])


if __name__ == "__main__":
    unittest.main()
