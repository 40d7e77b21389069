"""The data store on servers: a real nginx, Swift's S3 layer behind one, and servers that misbehave."""
import hashlib
import json
import os
import pathlib
import subprocess
import tempfile
import unittest
import urllib.parse

from forward_proxy import ForwardProxy
from harness import BIN, HONEST_MEMORY, SUCCESS, Case, ServiceTest, kilobytes
from hostile_server import HostileServer
from lab import CA_HOST, HOST, TRUST_OBJECT, Authority, NginxStore, SwiftStore

NOT_PERMITTED, MISMATCH, NO_SUCH_RECORD, TRANSPORT, STORAGE = 1, 2, 3, 4, 5
DATA_STORE, TRUST_URL = f"https://{HOST}:8443", f"http://{CA_HOST}:8080/orlotrustobject"
MEASURE_URL = f"https://{CA_HOST}:8443/orlotrustobject"


def routes(store, ca, plain_ca=None):
    """Where the store's hosts are: ports of this computer."""
    ports = {f"{HOST}:8443": store, f"{CA_HOST}:8443": ca, f"{CA_HOST}:8080": plain_ca}
    return {"connectTo": {host: f"127.0.0.1:{port}" for host, port in ports.items() if port}}


class Session:
    """A session of the library with options of the test's choice, in a process of its own."""

    def __init__(self, store, **options):
        self.folder = tempfile.TemporaryDirectory(prefix="veltra-session-")
        self.root = pathlib.Path(self.folder.name)
        (self.root / "etc/veltra").mkdir(parents=True)
        self.describe(store.describe(self.root))
        # The environment has no say.
        dead = {name: "http://127.0.0.1:1" for name in ("http_proxy", "https_proxy", "HTTPS_PROXY", "ALL_PROXY")}
        dead["SSLKEYLOGFILE"] = str(self.root / "keys")
        self.process = subprocess.Popen(
            [BIN / "store-session"], text=True, stdin=subprocess.PIPE, stdout=subprocess.PIPE,
            stderr=subprocess.DEVNULL,
            env={**os.environ, **dead, **HONEST_MEMORY, "VELTRA_DEVICE_ROOT": str(self.root)},
        )
        self.open(**options)

    def describe(self, store, **more):
        (self.root / "etc/veltra/device.json").write_text(json.dumps({"store": store, **more}))

    def run(self, *words):
        """Code and text of the error; 0 is success."""
        self.process.stdin.write(json.dumps(words) + "\n")
        self.process.stdin.flush()
        code, text = self.process.stdout.readline().rstrip("\n").split(" ", 1)
        return int(code), text

    def open(self, **options):
        usual = {"APTicket": {"$data": "74"}, "DataVersion": 1, "DSURL": DATA_STORE, "CAURL": f"https://{CA_HOST}:8443",
                 "TrustObjectDigest": {"$data": hashlib.sha256(TRUST_OBJECT).hexdigest()}, "HTTPTimeout": 10}
        code, text = self.run("open", usual | options)
        assert code == 0, text

    def put(self, instance, record=b"record"):
        (self.root / "record").write_bytes(record)
        return self.run("put", "psd2", instance, "/record")

    def get(self, instance):
        return self.run("get", "psd2", instance, "/got")

    def got(self):
        return (self.root / "got").read_bytes()

    def close(self):
        self.process.communicate()
        assert self.process.returncode == 0, self.process.returncode
        assert not (self.root / "keys").exists(), "keys are in a file"
        self.folder.cleanup()


class SessionTest(Case):
    """A case with a `store` that sessions use."""

    def session(self, **options):
        return self.closing(Session(self.store, **options))


class RemoteTest(ServiceTest, SessionTest):
    """Those whose store the service uses too."""

    def describe(self, vanter="VAN0001", **changes):
        store = self.store.describe(self.root, **changes)
        self.service.describe(answers={"VanterSerialNumber": vanter}, reverseProxy=None, store=store)

    def error_of_get(self):
        """Code and text of the library's error."""
        status, _, error = self.service.get()
        self.assertEqual((status, error["domain"]), (-1, "QDOrloErrorDomain"), error)
        return error["code"], error["description"]


class StoreCases:
    """What holds for every store."""

    def test_records(self):
        for record in (os.urandom(16 << 20), b"", b"\0", b"short"):
            with self.subTest(len(record)):
                self.assertEqual(self.service.put(record), SUCCESS)
                self.assertEqual(self.service.get(), SUCCESS)
                self.assertEqual(self.service.read("tmp/out"), record)
        self.assertEqual(self.store.stored(), {"v2/records/psd2/VAN0001": b"short"})
        self.describe(vanter="VAN0002")
        code, text = self.error_of_get()
        self.assertEqual(code, NO_SUCH_RECORD)
        self.assertRegex(text, f"^GET {DATA_STORE}/.*/VAN0002: HTTP status 404")

    def test_export(self):
        self.assertEqual(self.service.answer("export", "psd2", "tcrt"), SUCCESS)
        (name, text), = self.store.stored().items()
        ticket = hashlib.sha256((self.root / "System/Library/Caches/apticket.der").read_bytes()).hexdigest()
        self.assertRegex(name, f"^v1/exports/{ticket}/[0-9]{{8}}T[0-9]{{6}}Z-[0-9a-f]{{16}}\\.json$")
        pairs = [{"class": "psd2", "instance": "VAN0001"}, {"class": "tcrt", "instance": "SCR0001-TMA0001"}]
        export = json.loads(text)
        self.assertEqual(export.pop("exportedAt")[:8].replace("-", ""), name.split("/")[3][:6])
        self.assertEqual(export, {"records": pairs, "ticket": ticket, "dataVersion": 1})
        self.assertEqual(self.service.answer("call", "OrloExport", "ExportList:=[]"), SUCCESS)
        self.assertEqual(len(self.store.stored()), 2)

    def check_names(self, names):
        """Each name is kept under itself, travels as RFC 3986 has it, and can neither leave its folder nor its line."""
        session = self.session()
        before = len(self.store.requests())
        for name in names:
            with self.subTest(name):
                self.assertEqual(session.put(name, name.encode()), (0, ""))
                self.assertEqual(session.get(name), (0, ""))
                self.assertEqual(session.got(), name.encode())
                method, path, status, grants, _ = self.store.requests()[-1]
                self.assertEqual(path.split("/records/psd2/")[1], urllib.parse.quote(name, safe=self.KEPT))
                self.assertEqual(urllib.parse.unquote(grants.split(";")[1]), "1:psd2:" + name)
        self.assertEqual(self.store.stored(), {f"v1/records/psd2/{name}": name.encode() for name in names})
        connections = {line[4] for line in self.store.requests()[before:] if "/records/" in line[1]}
        self.assertEqual(len(connections), 1, "a session makes one connection")


NAMES = ["S1", "a b", "100%", "a+b=c", "~-._", "...", "a%2Fb", "a:b", "?x=1&y", "#f", "é-日本", "a\\..\\b", "'\"<>"]


class PlainStore(RemoteTest, StoreCases):
    KEPT = ""

    def setUp(self):
        super().setUp()
        self.store = self.closing(NginxStore())
        self.describe()

    def test_names(self):
        self.check_names([*NAMES, "c/d", "x" * 255, "line\r\nOrlo-Permissions: 1:psd2:S2", "\t"])
        session = self.session()
        before = len(self.store.requests())
        for name in (".", "..", "../../x", "a/../b", "a/.", "/", "/a", "a/", "a//b", "a\0b", "x" * 513):
            with self.subTest(name[:10]):
                self.assertEqual((session.put(name)[0], session.get(name)[0]), (STORAGE, STORAGE))
        self.assertEqual(session.run("export", ["psd2"] * 700, ["x" * 12] * 700)[0], NOT_PERMITTED)
        self.assertEqual(len(self.store.requests()), before + 1)  # the trust object was fetched

    def test_what_a_server_refuses_is_answered_with_its_reason(self):
        (self.store.folder / "trust-object").write_bytes(b"another one")
        self.assertEqual(self.error_of_get(),
                         (NOT_PERMITTED, f"GET {DATA_STORE}/v2/records/psd2/VAN0001: HTTP status 403"))
        self.assertIn(": HTTP status 403", self.service.answer("export")[2]["description"])
        self.store.nginx.stop()
        self.assertIn(f"GET {TRUST_URL}: Failed to connect to ", self.service.get()[2]["description"])
        self.assertEqual(self.store.stored(), {})

    def test_the_session_says_which_requests_pass_through_the_devices_proxy(self):
        session = self.session()
        for options, tunnels in (({}, 0), ({"EnableProxy": True}, 1), ({"EnableProxySsl": "ForHttps"}, 0),
                                 ({"EnableProxy": True, "EnableProxySsl": "ForHttps"}, 3)):
            with self.subTest(options):
                proxy = self.closing(ForwardProxy(self.store.folder))
                settings = {"HTTPEnable": 1, "HTTPProxy": "127.0.0.1", "HTTPPort": proxy.port,
                            "HTTPSEnable": 1, "HTTPSProxy": "127.0.0.1", "HTTPSPort": proxy.port}
                session.describe(self.store.describe(session.root), reverseProxy={"proxy": settings})
                session.open(**options)
                self.assertEqual(session.run("trust", TRUST_URL), (0, ""))
                self.assertEqual(session.put("S1"), (0, ""))
                self.assertEqual(proxy.close(), tunnels)
        self.assertEqual(session.run("trust", TRUST_URL)[0], TRANSPORT)


class ObjectStore(RemoteTest, StoreCases):
    KEPT = "/"

    @classmethod
    def setUpClass(cls):
        cls.store = SwiftStore()
        cls.addClassCleanup(cls.store.close)

    def setUp(self):
        super().setUp()
        self.store.use_bucket(f"orlo-records-{os.urandom(4).hex()}")
        self.describe()

    def test_names(self):
        self.check_names([*NAMES, "x" * 512, "c/d e"])
        session = self.session()
        for data_class, instance in (("psd2", "a\nb"), ("psd2", "\x7f"), ("psd2", "a\x85"), ("psd2", "\uffff"),
                                     ("psd2", "a//b"), ("psd2", "c/.."), ("psd2", "/"), ("p/2", "S1"), ("..", "S1")):
            with self.subTest((data_class, instance)):
                self.assertEqual(session.run("get", data_class, instance, "/got")[0], STORAGE)

    def assert_refused(self, code, reason):
        """Neither a get, a put nor an export is done."""
        found, text = self.error_of_get()
        self.assertEqual((found, text.split(": ")[1]), (code, "HTTP status " + reason))
        self.assertEqual(self.service.put(b"x")[2]["code"], 1011)
        self.assertIn("HTTP status " + reason, self.service.answer("export")[2]["description"])

    def test_a_request_that_is_not_signed_as_it_should_be_stores_nothing(self):
        self.describe(s3={"region": "mars-1"})
        self.assert_refused(TRANSPORT, "400 AuthorizationHeaderMalformed")
        self.describe()
        self.service.write("store-key", f"{self.store.access_key}\nguessed\n".encode(), 0o600)
        self.assert_refused(NOT_PERMITTED, "403 SignatureDoesNotMatch")

        tampering = self.closing(HostileServer(*self.store.authority.certify("tampering"), TRUST_OBJECT))
        way = routes(tampering.server_port, self.store.store_port, self.store.ca_port)
        unchanged, changed = (f"relay-{self.store.values['PROXY']}-{bit}" for bit in (0, 1))
        self.describe(vanter=changed, **way)
        self.service.write("tmp/in", b"x")
        # Releases of Swift differ in the name.
        self.assertRegex(str(self.service.orloctl("-v", "put-psd2", "/tmp/in")),
                         "HTTP status 400 (BadDigest|XAmzContentSHA256Mismatch)")
        self.describe(vanter=unchanged, **way)
        self.assertEqual(self.service.put(b"x"), SUCCESS)
        self.assertEqual(self.store.stored(), {f"v2/records/psd2/{unchanged}": b"x"})


class HostileTest(SessionTest):
    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="veltra-hostile-")
        self.addCleanup(folder.cleanup)
        self.authority = Authority(pathlib.Path(folder.name))
        self.server = self.serve()
        self.store = self

    def serve(self, **certificate):
        return self.closing(HostileServer(*self.authority.certify("store", **certificate), TRUST_OBJECT))

    def describe(self, root, **changes):
        (root / "ca.pem").write_bytes(self.authority.certificate.read_bytes())
        here = self.server.server_port
        return {"backend": "remote", "caFile": "/ca.pem", **routes(here, here), **changes}


class Failures(HostileTest):
    """Servers that misbehave or are not who they should be; every exchange ends in bounded time and memory."""

    def test_a_certificate_that_does_not_hold_is_a_failure_that_says_why(self):
        for certificate, changes, reason in (
            ({"hosts": ("elsewhere.example",)}, {}, "no alternative certificate subject name matches"),
            ({"hosts": (), "common_name": CA_HOST}, {}, "hostname mismatch"),
            ({"days": 0}, {}, "certificate has expired"),
            ({}, {"caFile": None}, "self-signed certificate|unable to get local issuer certificate"),
        ):
            with self.subTest(certificate):
                self.server = self.serve(**certificate)
                session = self.session()
                session.put("plain")  # what is kept of it is not what the next description trusts
                before = len(self.server.seen)
                session.describe({key: value for key, value in self.describe(session.root, **changes).items() if value})
                session.open()
                for code, text in (session.get("plain"), session.put("plain"), session.run("export", ["psd2"], ["S1"])):
                    self.assertEqual(code, TRANSPORT)
                    self.assertRegex(text, f"^GET {MEASURE_URL}: .*({reason})")
                self.assertEqual(self.server.seen[before:], [])

    def test_each_misbehaviour_is_an_error_with_its_reason(self):
        hasty, patient = self.session(HTTPTimeout=1), self.session(HTTPTimeout=60)
        both = (
            ("status-403-AccessDenied", NOT_PERMITTED, "HTTP status 403 AccessDenied"),
            ("status-403-\u2028<", NOT_PERMITTED, "HTTP status 403"),
            ("status-404-NoSuchBucket", TRANSPORT, "HTTP status 404 NoSuchBucket"),
            ("status-307", TRANSPORT, "HTTP status 307"),
            ("status-206", TRANSPORT, "HTTP status 206"),
            ("trickle", TRANSPORT, "timed out"),
            ("headers_", TRANSPORT, "The answer has too many headers"),
            ("half", TRANSPORT, "with 4 bytes"),
            ("endless-500", TRANSPORT, "HTTP status 500"),
            ("encoded", TRANSPORT, "Content-Encoding"),
        )
        rows = [("get", *row) for row in both] + [("put", *row) for row in both] + [
            ("get", "status-404", NO_SUCH_RECORD, "HTTP status 404"),
            ("put", "status-404", TRANSPORT, "HTTP status 404"),
            ("get", "cut", TRANSPORT, "The answer does not say where it ends"),
            ("get", "cut-hint", TRANSPORT, "The answer does not say where it ends"),
            ("get", "cut-coding", TRANSPORT, "The answer does not say where it ends"),
            ("get", "endless", TRANSPORT, "larger than 67108864 bytes"),
            ("get", "announced", TRANSPORT, "larger than 67108864 bytes"),
            ("put", "endless", TRANSPORT, "larger than 1048576 bytes"),
        ]
        for verb, behaviour, code, reason in rows:
            with self.subTest((verb, behaviour)):
                session = hasty if reason == "timed out" else patient
                result, text = session.get(behaviour) if verb == "get" else session.put(behaviour, bytes(4 << 20))
                self.assertEqual(result, code, text)
                name = urllib.parse.quote(behaviour, safe="")
                self.assertTrue(text.startswith(f"{verb.upper()} {DATA_STORE}/v1/records/psd2/{name}: "), text)
                self.assertRegex(text, reason)
        self.assertEqual({path for _, path in self.server.seen if path.endswith("plain")}, set(), "was redirected")
        self.assertEqual([session.get(name) for session in (hasty, patient) for name in ("plain", "chunked")],
                         [(0, "")] * 4)
        self.assertEqual(patient.put("exact", b"record"), (0, ""))
        self.assertLess(kilobytes("VmHWM", patient.process.pid), 200 << 10)

    def test_only_what_may_pass_is_tried_again_and_only_so_often(self):
        rows = (
            ({}, "busy-1", TRANSPORT, 1),
            ({"HTTPMaxAttempts": 3}, "busy-2", 0, 3),
            ({"HTTPMaxAttempts": 3}, "broken-2", 0, 3),
            ({"HTTPMaxAttempts": 2}, "broken-3", TRANSPORT, 3),  # a kept connection that broke does not count
            ({"HTTPMaxAttempts": 3}, "status-404", NO_SUCH_RECORD, 1),
            ({"HTTPMaxAttempts": 3}, "status-403", NOT_PERMITTED, 1),
            ({"HTTPMaxAttempts": 3}, "announced", TRANSPORT, 1),
            ({"HTTPMaxAttempts": 3}, "cut", TRANSPORT, 1),
            ({"HTTPMaxAttempts": -5, "HTTPTimeout": -5}, "busy-5", TRANSPORT, 1),
            ({"HTTPMaxAttempts": "9", "HTTPTimeout": "9"}, "busy-7", TRANSPORT, 1),
            ({"HTTPMaxAttempts": 2**63 - 1, "HTTPTimeout": 2**63 - 1}, "busy-2-x", 0, 3),
        )
        session = self.session()
        for options, behaviour, code, requests in rows:
            with self.subTest((options, behaviour)):
                session.open(**options)
                before = len(self.server.seen)
                self.assertEqual(session.get(behaviour)[0], code)
                seen = [line for line in self.server.seen[before:] if line[1].endswith(behaviour)]
                self.assertEqual(len(seen), requests)
        session.open()
        self.assertEqual(session.put("broken-1")[0], TRANSPORT, "a put that may be carried out twice is sent once")
        session.open(HTTPMaxAttempts=4, MultiRequestMaxAttempts=3)
        for failing, code in ((2, 0), (3, TRANSPORT)):
            session.put("plain")  # fetches the trust object
            before = len(self.server.seen)
            self.server.failing = failing
            self.assertEqual(session.run("export", ["psd2"], ["S1"])[0], code)
            seen = self.server.seen[before:]
            self.assertEqual((len(seen), len(set(seen))), (3, 1), "each attempt is for the same export")

    def test_a_connection_that_the_server_ended_is_made_again(self):
        session = self.session()
        for behaviour in ("plain", "idle", "plain", "idle", "plain"):
            self.assertEqual((session.put(behaviour), session.get(behaviour)), ((0, ""), (0, "")))
        session.get("unasked")
        self.assertTrue(self.server.finished.wait(60))
        self.assertEqual((session.get("plain"), session.got()), ((0, ""), TRUST_OBJECT))

    def test_what_came_without_tls_is_measured_by_what_came_with_it(self):
        plain = self.closing(HostileServer(None, None, b"forged"))
        session = self.session()
        here = self.server.server_port
        session.describe(self.describe(session.root, **routes(here, here, plain.server_port)))
        session.open()
        rows = ((b"forged", TRUST_OBJECT, MISMATCH), (TRUST_OBJECT, TRUST_OBJECT, 0), (b"new", TRUST_OBJECT, MISMATCH),
                (b"new", b"new", 0))
        for plain.trust_object, self.server.trust_object, code in rows:
            before = len(self.server.seen)
            self.assertEqual(session.run("trust", TRUST_URL), (0, ""))
            outcomes = session.put("plain")[0], session.get("plain")[0], session.run("export", ["psd2"], ["plain"])[0]
            self.assertEqual(outcomes, (code,) * 3)
            seen = self.server.seen[before:]
            self.assertEqual(seen[0], ("GET", "/orlotrustobject"))
            self.assertEqual(len(seen), 4 if code == 0 else 1)

    def test_the_trust_object_is_checked_before_anything_is_sent(self):
        url = f"https://{CA_HOST}:8443/"
        session = self.session(HTTPTimeout=3)
        for behaviour in ("status-404", "endless", "stall"):
            self.assertEqual(session.run("trust", url + behaviour)[0], TRANSPORT, behaviour)
        self.server.trust_object = b""
        self.assertEqual(session.run("trust", url), (TRANSPORT, f"GET {url}: The trust object is empty"))
        self.server.trust_object = b"another one"
        session.open()
        self.assertEqual(session.put("plain")[0], MISMATCH)
        self.server.trust_object = TRUST_OBJECT
        for other in ("file:///etc/hostname", "no url", "", "http://" + HOST + ":8443", "https://user:secret@h:8443",
                      "https://:secret@h", "https://user:secret@h:999999", "HTTPS", 7, None):
            session.open(DSURL=other)
            for code, text in (session.put("plain"), session.run("trust", str(other))):
                self.assertEqual((code, "secret" in text), (TRANSPORT, False), other)
        self.assertEqual([line for line in self.server.seen if line[0] == "PUT"], [])


class Conditions(HostileTest):
    """A scripted object store, which records are put to on condition that nothing has changed."""

    conditional = {}

    def describe(self, root, **changes):
        (root / "key").write_text("id\nsecret\n")
        (root / "key").chmod(0o600)
        return super().describe(
            root, s3={"region": "eu", "bucket": "b", "accessKeyFile": "/key", **self.conditional}, **changes)

    def kept(self, name):
        return self.server.objects.get(f"/b/v1/records/psd2/{name}")

    def test_a_put_that_timed_out_never_overtakes_one_that_was_answered(self):
        for self.conditional, found, outcome in (({}, None, b"after"), ({}, b"before", b"after"),
                                                 ({"conditional": False}, None, b"late")):
            with self.subTest((self.conditional, found)):
                self.server.objects.clear()
                self.server.answered.clear()
                self.server.finished.clear()
                session = self.session()
                if found:
                    self.assertEqual(session.put("keep-late", found), (0, ""))
                session.open(HTTPTimeout=1)
                self.assertEqual(session.put("keep-late", b"late")[0], TRANSPORT)
                session.open()
                self.assertEqual(session.put("keep-late", b"after"), (0, ""))
                self.assertTrue(self.server.finished.wait(60))
                self.assertEqual(self.kept("keep-late"), outcome)

    def test_a_condition_that_does_not_hold_begins_anew(self):
        look, again, compare = "HEAD PUT", "HEAD PUT HEAD PUT", "HEAD PUT HEAD GET PUT"
        session = self.session()
        rows = (
            # name, refusal of a condition, puts of somebody else in between, outcome, requests
            ("keep", 412, 0, 0, look),
            ("keep-bare", 412, 0, 0, look),
            ("keep-bare", 412, 0, 0, again),
            ("keep-bare", 412, 0, 0, look),
            ("keep", 412, 0, 0, again),
            ("keep-held", 412, 1, 0, again),
            ("keep", 412, 0, 0, look),
            ("keep-held", 409, 1, 0, again),
            ("keep-race", 412, 1, 0, compare),
            ("keep-race", 404, 1, 0, compare),
            ("keep-race", 403, 1, NOT_PERMITTED, look),
            ("keep-lost", 412, 0, 0, "HEAD PUT PUT HEAD GET"),
            ("keep-tagless", 412, 0, 0, look),
            ("keep-tagless", 412, 0, TRANSPORT, "HEAD"),
            ("status-403", 412, 0, NOT_PERMITTED, "HEAD"),
            ("busy-1", 412, 0, TRANSPORT, "HEAD"),
        )
        for number, (name, refusal, racing, code, requests) in enumerate(rows):
            with self.subTest((number, name)):
                self.server.refusal, self.server.racing, before = refusal, racing, len(self.server.seen)
                record = b"record %d" % number
                self.assertEqual(session.put(name, record)[0], code)
                seen = [method for method, path in self.server.seen[before:] if path != "/orlotrustobject"]
                self.assertEqual(seen, requests.split())
                if code == 0:
                    self.assertEqual(self.kept(name), record)
        for attempts, code in ((1, TRANSPORT), (2, 0)):
            session.open(HTTPMaxAttempts=attempts)
            self.assertEqual(session.put(f"keep-busy-{attempts}")[0], code)
        session.open(HTTPTimeout=1)
        self.server.racing = 1000
        self.assertEqual(session.put("keep-race")[0], TRANSPORT)
        self.assertIn(self.server.racing, range(900, 999))


if __name__ == "__main__":
    unittest.main()
