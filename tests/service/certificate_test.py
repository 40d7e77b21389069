"""The top module's certificate and its authentication, as the host sees them, with openssl as the judge."""
import json
import sqlite3
import subprocess
import time
import unittest

from harness import Service

RELAY, AUTHENTICATOR = "TeskAuthI2CRelayInterface", "TevariAuthCPAID"
PREFIXES = ("M3", "M8", "M9", "M4", "M11", "M12")
NO_DISPLAY = {"domain": "TcrtAuthErrorDomain", "code": 401, "description": "Top Module Tesk Authentication Failed"}
DUMMY = "DummyCertificateSerialNumber"


class TopModuleTest(unittest.TestCase):
    def setUp(self):
        self.service = Service()
        self.addCleanup(self.service.close)
        self.description = json.loads((self.service.root / "etc/veltra/device.json").read_text())

    def describe(self, model="M3", holder=RELAY, **sections):
        """Changes the device: `holder` names the class of the service that has the certificate, None removes it."""
        self.description["answers"].pop("HWModelStr", None)
        self.description["answers"].update({} if model is None else {"HWModelStr": model})
        chip = {"class": "Chip", "properties": {"AccessoryCertificate": {"$file": "/sys/tesk/cert.der", "as": "data"}}}
        self.description["registry"] = [{"class": holder, "children": [chip]}] if holder else []
        self.description.update(sections)
        (self.service.root / "etc/veltra/device.json").write_text(json.dumps(self.description))

    def hold(self, contents):
        (self.service.root / "sys/tesk/cert.der").write_bytes(contents)

    def example(self, name):
        return (self.service.root / "sys/tesk" / name).read_bytes()

    def call(self, verb):
        """Exit status, and the response's dictionary and error."""
        status, answer = self.service.orloctl(verb)
        self.assertEqual(answer["response"]["statusCode"], 0 if status == 0 else -1, answer)
        return status, answer["response"].get("response"), answer["response"].get("error")

    def get(self):
        status, found, error = self.call("get-tcrt")
        self.assertEqual((status, error), (0, None))
        return found

    def openssl(self, *words, stdin=b""):
        return subprocess.run(
            ["openssl", *map(str, words)], input=stdin, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, check=True
        ).stdout

    def certificate(self, key, serial):
        """A certificate in PEM and in DER."""
        pem = self.openssl("req", "-x509", "-new", "-key", key, "-subj", f"/CN=Module {serial}", "-set_serial", serial)
        return pem, self.openssl("x509", "-outform", "DER", stdin=pem)

    def message(self, *certificates):
        """A certificates-only message."""
        words = []
        for number, pem in enumerate(certificates):
            path = self.service.root / f"part{number}.pem"
            path.write_bytes(pem)
            words += ["-certfile", path]
        return self.openssl("crl2pkcs7", "-nocrl", "-outform", "DER", *words)

    def key(self, name, *kind):
        path = self.service.root / name
        self.openssl("genpkey", *kind, "-out", path)
        return path


class GetTcrt(TopModuleTest):
    def test_openssl_agrees_on_certificate_and_serial_number(self):
        keys = (
            self.key("rsa.pem", "-algorithm", "RSA", "-pkeyopt", "rsa_keygen_bits:2048"),
            self.key("ec.pem", "-algorithm", "EC", "-pkeyopt", "ec_paramgen_curve:P-384"),
        )
        numbers = (0x01, 0x7F, 0x80, 0x7B << 56, 0x9A << 56, 0x5A << 152, 0x81 << 144, 0xFF << 152, -5)
        for key in keys:
            for number in numbers:
                pem, der = self.certificate(key, number)
                octets = number.to_bytes(number.bit_length() // 8 + 1, "big", signed=True).hex()
                for contents in (der, self.message(pem)):
                    with self.subTest(key=key.name, number=number, bare=contents is der):
                        self.hold(contents)
                        found = self.get()
                        self.assertEqual(found["CertSerialNumber"], octets)
                        self.assertEqual(self.judge(bytes.fromhex(found["CertData"]), contents is der), (number, der))

    def judge(self, contents, is_bare):
        """Serial number and certificate as openssl reads them."""
        pem = self.openssl("x509" if is_bare else "pkcs7", "-inform", "DER", *([] if is_bare else ["-print_certs"]),
                           stdin=contents)
        serial = self.openssl("x509", "-noout", "-serial", stdin=pem).split(b"=")[1]
        return int(serial, 16), self.openssl("x509", "-outform", "DER", stdin=pem)

    def test_the_first_certificate_of_several_counts_and_the_bytes_stay_as_they_are(self):
        key = self.key("ec.pem", "-algorithm", "EC", "-pkeyopt", "ec_paramgen_curve:P-256")
        # The second one is the shorter, so that sorting would put it in front.
        first, second = self.certificate(key, 0x1234567890)[0], self.certificate(key, 7)[0]
        self.hold(self.message(first, second))
        copy = self.service.root / "copy"
        status, answer = self.service.orloctl("get-tcrt", "-o", copy)
        self.assertEqual(status, 0, answer)
        self.assertEqual(copy.read_bytes(), self.example("cert.der"))
        shown = self.openssl("pkcs7", "-inform", "DER", "-in", copy, "-print_certs")
        self.assertEqual(self.openssl("x509", "-noout", "-serial", stdin=shown), b"serial=1234567890\n")
        self.assertEqual(answer["response"]["response"]["CertSerialNumber"], "1234567890")

    def test_what_is_no_certificate_has_no_serial_number_but_is_handed_out(self):
        good, message = self.example("cert.der"), self.example("cert.p7c")
        no_certificates = self.message()
        for contents in (b"\x00", good[:-1], good + b"\x00", bytes(range(256)), message + b"\x00", no_certificates,
                         b"\x30\x80", b"\x30\x84\x7f\xff\xff\xff"):
            with self.subTest(contents[-8:]):
                self.hold(contents)
                lines = self.service.messages_of(
                    lambda: self.assertEqual(
                        self.get(), {"CertData": contents.hex(), "CertSerialNumber": DUMMY}
                    )
                )
                self.assertEqual(lines[-1], "Unable to read Certificate Serial Number")
        self.hold(b"")
        copy = self.service.root / "copy"
        status, answer = self.service.orloctl("get-tcrt", "-o", copy)
        self.assertEqual((status, answer["response"]["response"]), (1, {"CertSerialNumber": DUMMY}))
        self.assertIn("is empty", answer["problem"])
        self.assertFalse(copy.exists())
        self.hold(message)
        self.assertEqual(self.get()["CertSerialNumber"], "009a3c5e71d2046b88")

    def test_what_no_message_can_carry_is_an_error_reply(self):
        self.hold(bytes(15 << 20))
        status, answer = self.service.orloctl("get-tcrt")
        self.assertEqual((status, "Message too long" in answer["problem"]), (3, True), answer)
        self.hold(self.example("cert.p7c"))
        self.get()

    def test_a_copy_that_cannot_be_written_leaves_the_answer(self):
        status, answer = self.service.orloctl("get-tcrt", "-o", self.service.root)
        self.assertEqual((status, answer["response"]["statusCode"]), (2, 0), answer)


class PutTcrt(TopModuleTest):
    def records(self):
        path = self.service.root / "var/lib/orlo/store.db"
        if not path.exists():
            return {}
        with sqlite3.connect(path) as store:
            return {(row[0], row[1]): row[2] for row in store.execute("SELECT class, instance, data FROM records")}

    def assert_refused(self, says):
        """The request fails for the display, and the log says why."""
        lines = self.service.messages_of(lambda: self.assertEqual(self.call("put-tcrt"), (1, None, NO_DISPLAY)))
        self.assertEqual(lines[-3:-1], says)
        self.assertEqual(self.records(), {})

    def test_the_record_comes_out_of_the_store_as_the_same_bytes(self):
        certificate, message = self.example("cert.der"), self.example("cert.p7c")
        families = [(f"x{prefix}y", holder, contents) for prefix in PREFIXES
                    for holder, contents in ((RELAY, certificate), (AUTHENTICATOR, message))]
        for model, holder, contents in families + [
            ("M1", RELAY, b"no certificate \x00\xff"), (None, RELAY, bytes(range(256)) * 256), ("M4", RELAY, b""),
            ("M4", RELAY, self.message()),
        ]:
            with self.subTest((model, holder)):
                self.describe(model, holder)
                self.hold(contents)
                self.assertEqual(self.call("put-tcrt"), (0, None, None))
                self.assertEqual(self.records(), {("tcrt", "SCR0001-TMA0001"): contents})

    def test_a_chip_that_answers_too_late_or_never_fails_after_10_seconds_and_the_service_serves_on(self):
        for chip in ({"mode": "silent"}, {"mode": "pass", "delayMs": 10500}):
            self.describe("M3", componentAuth=chip)
            start = time.monotonic()
            self.assert_refused(
                ["Display Auth not completed within 10 secs. Timeout has occurred", "Top Module Auth Passsed : 0"]
            )
            self.assertGreaterEqual(time.monotonic() - start, 10)
        # The late answer comes while this request waits for its own, which is not taken for it.
        self.describe("M3", componentAuth={"mode": "fail", "delayMs": 2000})
        self.assert_refused(["Starting Top Module Auth : M3", "Top Module Auth Passsed : 0"])
        self.describe("M3", componentAuth={"mode": "pass"})
        self.assertEqual(self.call("put-tcrt"), (0, None, None))


if __name__ == "__main__":
    unittest.main()
