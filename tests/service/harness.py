"""The real service on a bus and a device root of its own, driven by orloctl and busctl."""
import ctypes
import json
import os
import pathlib
import select
import shutil
import signal
import socket
import subprocess
import tempfile
import time
import unittest

SOURCE = pathlib.Path(__file__).resolve().parents[2]
BIN = pathlib.Path(os.environ["VELTRA_BIN"])
NAME = "com.tevari.VeltraOrloServices"
PATH, INTERFACE = "/" + NAME.replace(".", "/"), "com.tevari.VeltraPluginServer"
# The sanitizer keeps freed memory aside, which would hide what a test of memory looks for.
HONEST_MEMORY = {"ASAN_OPTIONS": "detect_leaks=1:quarantine_size_mb=1:thread_local_quarantine_size_kb=64"}
LOG = f"private/var/log/{NAME}.log"
DESCRIPTION = "etc/veltra/device.json"
SUCCESS = (0, None, None)  # of answer()
PIPES = {"stdout": subprocess.PIPE, "stderr": subprocess.PIPE}

# A service that start-service leaves behind becomes a child of the tests, which can then tell how it ended.
PR_SET_CHILD_SUBREAPER = 36
assert ctypes.CDLL(None).prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0) == 0


def kilobytes(figure, pid):
    """What the kernel tells of the memory of a process, "VmRSS" now or "VmHWM" at most."""
    status = pathlib.Path(f"/proc/{pid}/status").read_text()
    return int(status.split(figure + ":")[1].split()[0])


class PrivateBus:
    def __init__(self, configuration="--session"):
        self.daemon = subprocess.Popen(
            ["dbus-daemon", configuration, "--nofork", "--print-address=1"], stdout=subprocess.PIPE,
            stderr=subprocess.DEVNULL, text=True,
        )
        self.address = self.daemon.stdout.readline().strip()

    def close(self):
        self.daemon.terminate()
        self.daemon.wait()
        self.daemon.stdout.close()


class Service:
    """A running service on a bus and an example device of its own. At the end it must end cleanly, with nothing that the
    sanitizer finds leaked."""

    def __init__(self):
        self.root = pathlib.Path(tempfile.mkdtemp(prefix="veltra-"))
        shutil.copytree(SOURCE / "examples/device", self.root, dirs_exist_ok=True)
        for folder in ("tmp", "private/var/log"):
            (self.root / folder).mkdir(parents=True)
        self.begin(PrivateBus())

    def begin(self, bus):
        """Starts the service on this bus."""
        self.bus = bus
        self.environment = {
            **os.environ,
            "VELTRA_DEVICE_ROOT": str(self.root),
            "VELTRA_BUS": self.bus.address,
            "DBUS_SESSION_BUS_ADDRESS": self.bus.address,
            **HONEST_MEMORY,
        }
        self.start()

    def start(self, *starter):
        """Starts the service, through a program that ends as it when one is named."""
        self.pid = int(self.run(SOURCE / "scripts/start-service", *starter, BIN / "VeltraOrloServices").stdout)
        self.ended = os.pidfd_open(self.pid)

    def kill(self):
        """Ends the service at once, unless it has ended."""
        signal.pidfd_send_signal(self.ended, signal.SIGKILL)
        self.wait_end()
        os.waitid(os.P_PIDFD, self.ended, os.WEXITED)
        os.close(self.ended)

    def stop(self):
        """Ends the service as its manager does, unless it has ended, and checks that it ended cleanly."""
        signal.pidfd_send_signal(self.ended, signal.SIGTERM)
        status = self.wait_end(60)
        self.kill()
        assert status == 0, f"the service ended with status {status}"

    def close(self):
        try:
            self.stop()
        finally:
            self.bus.close()
            shutil.rmtree(self.root)

    def describe(self, **sections):
        """Replaces sections of the device's description, but for "answers", of which the named ones are replaced; None
        takes out what it stands for."""
        description = json.loads((self.root / DESCRIPTION).read_text())
        description |= sections | {"answers": description["answers"] | sections.get("answers", {})}
        for part in (description, description["answers"]):
            for key in [key for key, value in part.items() if value is None]:
                del part[key]
        (self.root / DESCRIPTION).write_text(json.dumps(description))

    def write(self, path, contents, mode=0o644):
        path = self.root / path
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(contents)
        path.chmod(mode)

    def read(self, path):
        return (self.root / path).read_bytes()

    def run(self, *command, **options):
        return subprocess.run(
            [str(word) for word in command], env=self.environment, stdout=subprocess.PIPE, text=True, **options
        )

    def orloctl(self, *words, **options):
        """Exit status and the one JSON object that orloctl prints."""
        done = self.run(BIN / "orloctl", "--json", *words, **options)
        return done.returncode, json.loads(done.stdout)

    def answer(self, *words):
        """What the plug-in answered, without the name: (status code, dictionary, error)."""
        response = self.orloctl(*words)[1]["response"]
        return response["statusCode"], response.get("response"), response.get("error")

    def put(self, record):
        self.write("tmp/in", record)
        return self.answer("put-psd2", "/tmp/in")

    def get(self, path="/tmp/out"):
        return self.answer("get-psd2", path)

    def call(self, interface, method, *arguments):
        """What busctl prints of a call."""
        return self.run("busctl", "--user", "--timeout=300", "call", NAME, PATH, interface, method, *arguments,
                        stderr=subprocess.STDOUT).stdout.strip()

    def busctl(self, *body):
        return self.call(INTERFACE, "HandleMessage", "a{sv}", *body)

    def properties(self):
        got, = json.loads(self.call("org.freedesktop.DBus.Properties", "GetAll", "s", INTERFACE, "--json=short"))["data"]
        return {name: value["data"] for name, value in got.items()}

    def await_property(self, name, value):
        """Waits until the property has this value."""
        while self.properties()[name] != value:
            pass

    def log(self):
        path = self.root / LOG
        return path.read_text().splitlines() if path.exists() else []

    def wait_end(self, seconds=None):
        """The exit status, or the number of the signal that ended the service as a negative number; None when it still
        runs after that time."""
        if not select.select([self.ended], [], [], seconds)[0]:
            return None
        ending = os.waitid(os.P_PIDFD, self.ended, os.WEXITED | os.WNOWAIT)
        return ending.si_status if ending.si_code == os.CLD_EXITED else -ending.si_status


class Case(unittest.TestCase):
    def closing(self, opened):
        """`opened`, which is closed when the case has ended."""
        self.addCleanup(opened.close)
        return opened


class ServiceTest(Case):
    """A case with a running service."""

    def setUp(self):
        self.service = self.closing(Service())
        self.root = self.service.root

    def popen(self, program, *words, **options):
        """Starts a program, of the build unless its name is a path, that talks to the service."""
        client = subprocess.Popen([BIN / program, *words], env=self.service.environment, **{"text": True, **options})
        self.enterContext(client)
        self.addCleanup(client.kill)
        return client


class HeldTest(ServiceTest):
    """A case with a server that keeps a request in hand for as long as it likes."""

    def setUp(self):
        super().setUp()
        self.server = self.closing(socket.create_server(("127.0.0.1", 0)))
        self.url = f"http://127.0.0.1:{self.server.getsockname()[1]}/"
        self.service.describe(reverseProxy=None)

    def hold(self, *client, **options):
        """A client whose request is in hand, and the connection that ends it when it is closed."""
        client = self.popen(*client or ("orloctl", "--json", "provision"), self.url, **PIPES | options)
        return client, self.closing(self.server.accept()[0])

    def wait_in_line(self, *client):
        """A client whose request waits."""
        waiting = self.service.properties()["RequestsWaiting"]
        client = self.popen(*client, **PIPES)
        self.service.await_property("RequestsWaiting", waiting + 1)
        return client
