"""A real forward proxy on loopback."""
import socket
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
        self.tunnels_until("Accepting connections")

    def tunnels_until(self, sign):
        """How many tunnels the log tells of before the line with `sign`."""
        count = 0
        for line in self.process.stdout:
            if sign in line:
                return count
            count += ": CONNECT " in line
        raise AssertionError("tinyproxy has ended")

    def tunnels(self):
        """How many tunnels were asked for since the last call. A request of this one marks the place in the log."""
        with socket.create_connection(("127.0.0.1", self.port)) as marker:
            marker.sendall(b"CONNECT 127.0.0.1:1 HTTP/1.0\r\n\r\n")
            marker.recv(1000)
        return self.tunnels_until(": CONNECT 127.0.0.1:1 ")

    def close(self):
        if self.process.poll() is None:
            self.process.terminate()
            self.process.communicate()
