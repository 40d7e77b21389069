#!/usr/bin/env python3
"""lab.py nginx|swift|ceph DEVICE-ROOT: runs a store of this folder on loopback until its standard input ends or it is
interrupted, with certificates of its own, and has the device use it.

It writes the entry "store" into the device's description, takes the proxy out of it, since the servers are on this
computer, and prints the entry once they serve. What was stored is gone at the end. The tests use the classes.
"""
import getpass
import hashlib
import http.client
import json
import os
import pathlib
import re
import select
import shutil
import signal
import socket
import subprocess
import sys
import tempfile
import urllib.parse
import uuid
import xml.etree.ElementTree

HERE = pathlib.Path(__file__).resolve().parent
HOST, CA_HOST = "orlo-ds.tevari.example", "orlo-ca.tevari.example"
TRUST_OBJECT = b"the trust object of the lab\n"


def free_ports(count):
    """Ports that are all free at the same time."""
    probes = [socket.socket() for _ in range(count)]
    try:
        for probe in probes:
            probe.bind(("127.0.0.1", 0))
        return [probe.getsockname()[1] for probe in probes]
    finally:
        for probe in probes:
            probe.close()


def openssl(*words):
    subprocess.run(["openssl", *[str(word) for word in words]], check=True, stderr=subprocess.DEVNULL)


class Authority:
    """A certificate authority of the lab's own and what it certifies, in `folder`."""

    def __init__(self, folder):
        self.folder = folder
        self.certificate = folder / "ca.pem"
        openssl("req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:P-256", "-nodes", "-days", "2",
                "-subj", "/CN=Authority of the lab", "-keyout", folder / "ca.key", "-out", self.certificate)

    def certify(self, name, hosts=(HOST, CA_HOST), days=2, common_name="store"):
        """Makes <name>.key and <name>.pem; one for 0 days has expired."""
        names = ("-addext", "subjectAltName=" + ",".join("DNS:" + host for host in hosts)) if hosts else ()
        key, request, certificate = (self.folder / f"{name}.{suffix}" for suffix in ("key", "csr", "pem"))
        openssl("req", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:P-256", "-nodes", "-subj", "/CN=" + common_name,
                *names, "-keyout", key, "-out", request)
        openssl("x509", "-req", "-in", request, "-CA", self.certificate, "-CAkey", self.folder / "ca.key",
                "-CAcreateserial", "-copy_extensions", "copy", "-days", days, "-out", certificate)
        return certificate, key


class Server:
    """A process that is not a child of this one."""

    def __init__(self, pid):
        self.pid = pid
        self.ended = os.pidfd_open(pid)

    def stop(self, how=signal.SIGTERM):
        if self.ended is None:
            return
        try:
            signal.pidfd_send_signal(self.ended, how)
        except ProcessLookupError:
            pass
        select.select([self.ended], [], [])
        os.close(self.ended)
        self.ended = None


class NginxStore:
    """nginx as the store and as the server of the trust object."""

    configuration = "nginx-store.conf"
    ports = ("PROXY", "ACCOUNT", "CONTAINER", "OBJECT", "UNUSED")

    def __init__(self):
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix="veltra-store-"))
        self.store_port, self.ca_port, *ports = free_ports(2 + len(self.ports))
        self.values = {
            "FOLDER": self.folder, "STORE": self.store_port, "CA": self.ca_port, "USER": getpass.getuser(),
            "DIGEST": hashlib.sha256(TRUST_OBJECT).hexdigest(), **dict(zip(self.ports, ports)),
        }
        self.authority = Authority(self.folder)
        self.authority.certify("store")
        (self.folder / "trust-object").write_bytes(TRUST_OBJECT)
        (self.folder / "store").mkdir()
        self.servers = []
        try:
            self.start()
        except BaseException:
            self.close()
            raise

    def start(self):
        configuration = self.configure(self.configuration)
        # nginx goes to the background once it listens, and then writes its process id, before it answers anything. Its
        # worker writes the records as the user of the lab.
        as_user = ["-g", "user root;"] if os.geteuid() == 0 else []
        subprocess.run(["/usr/sbin/nginx", *as_user, "-c", configuration], check=True, stderr=subprocess.DEVNULL)
        self.get_page(self.ca_port)
        self.nginx = Server(int((self.folder / "nginx.pid").read_text()))
        self.servers.append(self.nginx)

    @staticmethod
    def get_page(port, path="/"):
        connection = http.client.HTTPConnection("127.0.0.1", port)
        connection.request("GET", path)
        connection.getresponse().read()
        connection.close()

    def configure(self, name):
        """A copy of a file of the example with its places filled in."""
        text = (HERE / name).read_text()
        for place, value in self.values.items():
            text = text.replace(f"@{place}@", str(value))
        path = self.folder / name
        path.write_text(text)
        return path

    def describe(self, root, **changes):
        """The "store" of a device description; the files that it names are put below the device root `root`."""
        shutil.copy(self.authority.certificate, root / "store-ca.pem")
        return {
            "backend": "remote", "caFile": "/store-ca.pem",
            "connectTo": {f"{HOST}:8443": f"127.0.0.1:{self.store_port}",
                          f"{CA_HOST}:8443": f"127.0.0.1:{self.store_port}",
                          f"{CA_HOST}:8080": f"127.0.0.1:{self.ca_port}"}, **changes,
        }

    def requests(self):
        """Method, path, status, grants and connection of each request so far."""
        lines = (self.folder / "requests.log").read_text().splitlines()
        plain = [re.sub(r"\\x([0-9A-F]{2})", lambda escape: chr(int(escape[1], 16)), line) for line in lines]
        return [line.split(" ") for line in plain][1:]  # without that of the start

    def stored(self):
        """What the store holds: name and bytes."""
        store = self.folder / "store"
        return {str(path.relative_to(store)): path.read_bytes() for path in store.rglob("*") if path.is_file()}

    def close(self):
        for server in reversed(self.servers):
            server.stop()
        shutil.rmtree(self.folder)


class ObjectStore(NginxStore):
    """An S3-compatible object store behind nginx."""

    configuration = "nginx-s3.conf"
    region, access_key, secret = "eu-bench-1", "orlo:bench", "a-secret/of+the=lab"
    patience = ()  # options of curl
    conditional = {}

    def start(self):
        super().start()
        self.use_bucket("orlo-records")

    def use_bucket(self, name):
        """Makes a bucket, which is the store from now on."""
        self.bucket = name
        self.s3("PUT")

    def s3(self, method, path=""):
        """The body of the answer to a signed request about the bucket, past nginx."""
        user = ":".join(urllib.parse.quote(text, safe="") for text in (self.access_key, self.secret))
        url = f"http://{user}@127.0.0.1:{self.values['PROXY']}/{self.bucket}{path}"
        return subprocess.run(
            ["curl", "-sSf", "-X", method, "--aws-sigv4", f"aws:amz:{self.region}:s3", "-H",
             "x-amz-content-sha256: UNSIGNED-PAYLOAD", *self.patience, url], check=True, stdout=subprocess.PIPE,
        ).stdout

    def describe(self, root, **changes):
        key_file = root / "store-key"
        key_file.write_text(f"{self.access_key}\n{self.secret}\n")
        key_file.chmod(0o600)
        s3 = {"region": self.region, "bucket": self.bucket, "accessKeyFile": "/store-key", **self.conditional}
        return super().describe(root, **{"s3": s3 | changes.pop("s3", {})}, **changes)

    def stored(self):
        names = [key.text for key in xml.etree.ElementTree.fromstring(self.s3("GET")).iterfind(".//{*}Key")]
        return {name: self.s3("GET", "/" + urllib.parse.quote(name, safe="/~")) for name in names}


class SwiftStore(ObjectStore):
    """Swift with its S3 layer, which knows no conditional puts."""

    conditional = {"conditional": False}

    def start(self):
        self.values |= {"SECRET": self.secret, "SUFFIX": os.urandom(8).hex()}
        ports = [self.values[kind] for kind in ("ACCOUNT", "CONTAINER", "OBJECT")]
        for folder in ("devices/d1", "recon"):
            (self.folder / folder).mkdir(parents=True)
        self.configure("swift.conf")
        subprocess.run([str(word) for word in (HERE / "swift-rings", self.folder, *ports)], check=True)
        starting = [
            subprocess.Popen([HERE.parents[1] / "scripts/start-service", HERE / "swift-server", kind,
                              self.configure(f"swift-{kind}.conf")], stdout=subprocess.PIPE, text=True)
            for kind in ("account", "container", "object", "proxy")
        ]
        for starter in starting:
            pid = starter.communicate()[0]
            if starter.returncode == 0:
                self.servers.append(Server(int(pid)))
        assert len(self.servers) == len(starting), "one of Swift's servers did not start"
        super().start()


class CephStore(ObjectStore):
    """Ceph's gateway, on a cluster of one that keeps everything in memory."""

    ports = ("PROXY", "MONITOR")
    patience = ("--retry", "120", "--retry-delay", "1", "--retry-connrefused")

    def start(self):
        cluster, disk = str(uuid.uuid4()), str(uuid.uuid4())
        members, keys, disk_key = (self.folder / name for name in ("members", "keyring", "osd/keyring"))
        self.values["CLUSTER"] = cluster
        configuration = self.configure("ceph.conf")
        for folder in ("mon", "osd"):
            (self.folder / folder).mkdir()

        # Each of the commands waits for the servers that it needs.
        def run(start, program, *words):
            return start([program, "-c", configuration, *words], stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)

        def do(*words):
            run(subprocess.run, *words).check_returncode()

        def serve(*words):
            self.servers.append(Server(run(subprocess.Popen, *words, "--foreground").pid))

        for name in ("mon.", "client.admin"):
            do("ceph-authtool", keys, "--create-keyring" if name == "mon." else "--gen-key", "--gen-key", "-n", name,
                "--cap", "mon", "allow *", "--cap", "osd", "allow *")
        do("monmaptool", "--create", "--addv", "a", f"[v2:127.0.0.1:{self.values['MONITOR']}]", "--fsid", cluster, members)
        do("ceph-mon", "-i", "a", "--mkfs", "--monmap", members, "--keyring", keys)
        serve("ceph-mon", "-i", "a")
        do("ceph", "osd", "new", disk, "0")
        do("ceph", "auth", "get-or-create", "osd.0", "mon", "allow profile osd", "osd", "allow *", "-o", disk_key)
        do("ceph-osd", "-i", "0", "--keyring", disk_key, "--mkfs", "--osd-uuid", disk)
        serve("ceph-osd", "-i", "0", "--keyring", disk_key)
        do("radosgw-admin", "user", "create", "--uid=orlo", "--display-name=orlo", f"--access-key={self.access_key}",
            f"--secret={self.secret}")
        serve("radosgw", "-n", "client.admin")
        super().start()


STORES = {"nginx": NginxStore, "swift": SwiftStore, "ceph": CephStore}


def main(kind, root):
    root = pathlib.Path(root)
    store = STORES[kind]()
    try:
        path = root / "etc/veltra/device.json"
        description = json.loads(path.read_text())
        description["store"] = store.describe(root)
        description.get("reverseProxy", {}).pop("proxy", None)
        path.write_text(json.dumps(description, indent=2) + "\n")
        print(json.dumps(description["store"]), flush=True)
        sys.stdin.read()
    except KeyboardInterrupt:
        pass
    finally:
        signal.signal(signal.SIGINT, signal.SIG_IGN)
        store.close()


if __name__ == "__main__":
    if len(sys.argv) != 3 or sys.argv[1] not in STORES:
        sys.exit("usage: lab.py nginx|swift|ceph DEVICE-ROOT")
    main(*sys.argv[1:])
