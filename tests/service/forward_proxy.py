"""A real forward proxy on loopback."""
import subprocess

from lab import free_ports


class ForwardProxy:
    """tinyproxy on loopback, with further `lines` of configuration."""

    def __init__(self, folder, *lines):
        self.port, = free_ports(1)
        configuration = folder / "tinyproxy.conf"
        usual = (f"Port {self.port}", "Listen 127.0.0.1", "Allow 127.0.0.1", "LogLevel Info")
        configuration.write_text("\n".join((*usual, *lines, "")))
        self.process = subprocess.Popen(["tinyproxy", "-d", "-c", configuration], stdout=subprocess.PIPE,
                                        stderr=subprocess.DEVNULL, text=True)
        while "Accepting connections" not in self.process.stdout.readline():
            assert self.process.poll() is None, "tinyproxy has ended"

    def close(self):
        """How many tunnels were asked for."""
        if self.process.poll() is None:
            self.process.terminate()
            return self.process.communicate()[0].count(": CONNECT ")
