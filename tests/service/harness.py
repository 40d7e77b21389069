"""The real service on a bus and a device root of its own, driven by orloctl and busctl."""
import json
import os
import pathlib
import select
import shutil
import subprocess
import tempfile

SOURCE = pathlib.Path(__file__).resolve().parents[2]
BIN = pathlib.Path(os.environ["VELTRA_BIN"])
NAME = "com.tevari.VeltraOrloServices"
LOG = f"private/var/log/{NAME}.log"


class PrivateBus:
    def __init__(self):
        self.daemon = subprocess.Popen(
            ["dbus-daemon", "--session", "--nofork", "--print-address=1"], stdout=subprocess.PIPE,
            stderr=subprocess.DEVNULL, text=True,
        )
        self.address = self.daemon.stdout.readline().strip()

    def close(self):
        self.daemon.terminate()
        self.daemon.wait()
        self.daemon.stdout.close()


class Service:
    """A running service. `description` replaces the example device's description; None leaves it as it is."""

    def __init__(self, description=None):
        self.root = pathlib.Path(tempfile.mkdtemp(prefix="veltra-"))
        shutil.copytree(SOURCE / "examples/device", self.root, dirs_exist_ok=True)
        for folder in ("tmp", "private/var/log"):
            (self.root / folder).mkdir(parents=True)
        if description is not None:
            self.describe(description)
        self.bus = PrivateBus()
        self.environment = {
            **os.environ,
            "VELTRA_DEVICE_ROOT": str(self.root),
            "VELTRA_BUS": self.bus.address,
            "DBUS_SESSION_BUS_ADDRESS": self.bus.address,
        }
        self.pid = int(self.run(SOURCE / "scripts/start-service", BIN / "VeltraOrloServices").stdout)
        self.ended = os.pidfd_open(self.pid)

    def close(self):
        try:
            os.kill(self.pid, 9)
        except ProcessLookupError:
            pass
        os.close(self.ended)
        self.bus.close()
        shutil.rmtree(self.root)

    def describe(self, answers):
        (self.root / "etc/veltra/device.json").write_text(json.dumps({"answers": answers}))

    def run(self, *command, **options):
        return subprocess.run(
            [str(word) for word in command], env=self.environment, stdout=subprocess.PIPE, text=True, **options
        )

    def orloctl(self, *words):
        """Exit status and the one JSON object that orloctl prints."""
        done = self.run(BIN / "orloctl", "--json", *words)
        return done.returncode, json.loads(done.stdout)

    def busctl(self, *body):
        return self.run(
            "busctl", "--user", "call", NAME, "/" + NAME.replace(".", "/"), "com.tevari.VeltraPluginServer",
            "HandleMessage", "a{sv}", *body, stderr=subprocess.STDOUT,
        ).stdout.strip()

    def log(self):
        path = self.root / LOG
        return path.read_text().splitlines() if path.exists() else []

    def messages_of(self, act):
        """The messages, without time and line number, that the log gains while `act` runs."""
        before = len(self.log())
        act()
        return [line.split("] ", 1)[1] for line in self.log()[before:]]

    def resident_kilobytes(self):
        for line in pathlib.Path(f"/proc/{self.pid}/status").read_text().splitlines():
            if line.startswith("VmRSS:"):
                return int(line.split()[1])
        raise AssertionError("the service has no memory figure")

    def wait_end(self):
        select.select([self.ended], [], [])
