"""An HTTPS server that misbehaves in the way that a segment of a request's path names: the last, of a POST the first."""
import hashlib
import http.client
import http.server
import os
import socket
import ssl
import threading

CHUNK = b"10000\r\n" + bytes(0x10000) + b"\r\n"


class Handler(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"

    def log_message(self, *_):
        pass

    def handle_request(self):
        behaviour, *argument = self.path.split("/")[1 if self.command == "POST" else -1].split("-")
        with self.server.lock:
            self.server.seen.append((self.command, self.path))
            count = self.server.counts[self.path] = self.server.counts.get(self.path, 0) + 1
        try:
            getattr(self, behaviour, self.plain)(count, *argument)
        except (OSError, ssl.SSLError):
            self.close_connection = True

    do_GET = do_HEAD = do_PUT = do_POST = handle_request

    def body(self):
        body = self.rfile.read(int(self.headers.get("Content-Length", 0)))
        if self.command == "POST":
            self.server.posts.append((self.path, body, "tinyproxy" in self.headers.get("Via", "")))
        return body

    def answer(self, status, body=b"", **headers):
        self.send_response(status)
        for name, value in {"Content_Length": len(body), **headers}.items():
            self.send_header(name.replace("_", "-"), str(value))
        self.end_headers()
        if self.command != "HEAD":
            self.wfile.write(body)

    def drop(self):
        self.connection.shutdown(socket.SHUT_RDWR)
        self.close_connection = True

    def close_notify(self):
        """Ends the connection as what its protocol counts as an end: with TLS that is no mere end of the octets."""
        if self.server.context:
            self.connection.unwrap()
        self.drop()

    def plain(self, count, *_):
        self.body()
        with self.server.lock:
            fails = self.server.failing > 0
            self.server.failing -= fails
        self.answer(503 if fails else 200, self.server.trust_object)

    def status(self, count, status, reason=""):
        self.body()
        body = f"<Error><Code>{reason}</Code></Error>".encode() if reason else b""
        self.answer(int(status), body, Location="/v1/records/psd2/plain")

    def deaf(self, count):
        """A pairing server that fails when it is told of the result."""
        self.body()
        self.answer(500 if self.path.endswith("/result") else 200, self.server.trust_object)

    def busy(self, count, failures, *_):
        self.body()
        self.answer(*((200, b"in the end") if count > int(failures) else (503,)))

    def broken(self, count, failures):
        if count > int(failures):
            return self.busy(count, failures)
        self.body()
        self.drop()

    def stall(self, count):
        while self.connection.recv(65536):  # until the client gives up
            pass

    def trickle(self, count):
        self.send_response(200)
        self.send_header("Content-Length", "1000")
        self.end_headers()
        while not self.server.closing.wait(0.2):
            self.wfile.write(b"x")

    def endless(self, count, status="200"):
        self.send_response(int(status))
        self.send_header("Transfer-Encoding", "chunked")
        self.end_headers()
        while True:
            self.wfile.write(CHUNK)

    def headers_(self, count):
        self.send_response(200)
        self.flush_headers()
        while True:
            self.wfile.write(b"X-Filler: " + b"x" * 1000 + b"\r\n")

    def exact(self, count):
        """As large as an answer to a put may be."""
        self.body()
        self.answer(200, bytes(1 << 20))

    def announced(self, count):
        self.answer(200, b"a beginning", Content_Length=(64 << 20) + 1)
        self.stall(count)

    def half(self, count):
        self.body()
        self.answer(200, b"half", Content_Length=8)
        self.close_notify()

    def cut(self, count, seeming=""):
        """Half of an answer that does not say where it ends, though it, or an interim one before it, may seem to."""
        self.body()
        if seeming == "hint":
            self.wfile.write(b"HTTP/1.1 103 Early Hints\r\nContent-Length: 4\r\n\r\n")
        self.send_response(200)
        if seeming == "coding":
            self.send_header("Transfer-Encoding", "identity")
        self.end_headers()
        self.wfile.write(b"half")
        self.close_notify()

    def chunked(self, count):
        self.body()
        self.send_response(200)
        self.send_header("Transfer-Encoding", "chunked")
        self.end_headers()
        self.wfile.write(b"2\r\na\0\r\n1\r\nb\r\n0\r\n\r\n")

    def encoded(self, count):
        self.body()
        self.answer(200, b"\x1f\x8b", Content_Encoding="gzip")

    def idle(self, count):
        """Answers and ends the connection without a word about it."""
        self.plain(count)
        self.drop()

    def unasked(self, count):
        self.plain(count)
        self.answer(200, b"forged")
        self.server.finished.set()

    def relay(self, count, port, changed_bit):
        """Passes the request on to another server, with one bit of the body changed or none."""
        body = bytearray(self.body())
        body[0] ^= int(changed_bit)
        onward = http.client.HTTPConnection("127.0.0.1", int(port))
        onward.request(self.command, self.path, bytes(body), dict(self.headers.items()))
        answer = onward.getresponse()
        self.answer(answer.status, answer.read())
        onward.close()

    def keep(self, count, how="", *_):
        """An object store that knows conditions, with a weakness or a bad moment."""
        record, server = self.body(), self.server
        late = how == "late" and self.command == "PUT" and record == b"late"
        if late:  # carried out only when its client has gone and the put after it is answered
            try:
                self.stall(count)
            except OSError:
                pass
            assert server.answered.wait(60)
        if how == "busy" and self.command == "PUT" and count == 2:
            return self.answer(503)
        with server.lock:
            if how == "race" and self.command == "PUT" and server.racing > 0:
                server.racing -= 1
                server.objects[self.path] = os.urandom(8)
            is_held = how == "held" and self.command == "PUT" and server.racing > 0
            server.racing -= is_held
            kept = server.objects.get(self.path)
            tag = f'"{hashlib.md5(kept).hexdigest()}"' if kept is not None else None
            status = 200 if kept is not None else 404
            if self.command == "PUT":
                status = 200 if self.holds(tag, how) and not is_held else server.refusal
                if status == 200:
                    server.objects[self.path] = record
        if late:
            server.finished.set()
        elif how == "lost" and self.command == "PUT" and status == 200:
            self.drop()
        else:
            headers = {} if how == "tagless" or tag is None else {"ETag": tag}
            self.answer(status, kept or b"" if self.command != "PUT" else b"<Code>NoSuchKey</Code>", **headers)
            if how == "late" and record == b"after":
                server.answered.set()

    def holds(self, tag, how):
        wanted, unwanted = self.headers["If-Match"], self.headers["If-None-Match"]
        if wanted:
            return wanted == (tag and tag.strip('"') if how == "bare" else tag)
        return not unwanted or tag is None


class HostileServer(http.server.ThreadingHTTPServer):
    """Speaks plain HTTP without a certificate. `seen` has method and path of each request, `posts` path and body of
    each POST and whether a proxy passed it on."""

    daemon_threads = True

    def __init__(self, certificate, key, trust_object):
        super().__init__(("127.0.0.1", 0), Handler)
        self.trust_object, self.seen, self.posts, self.counts, self.failing = trust_object, [], [], {}, 0
        self.objects, self.racing, self.refusal = {}, 0, 412
        self.lock, self.closing, self.answered, self.finished = threading.Lock(), *(threading.Event() for _ in range(3))
        self.context = None
        if certificate:
            self.context = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
            self.context.load_cert_chain(certificate, key)
        threading.Thread(target=self.serve_forever, daemon=True).start()

    def finish_request(self, request, client_address):
        if not self.context:
            return super().finish_request(request, client_address)
        try:
            with self.context.wrap_socket(request, server_side=True) as secured:
                super().finish_request(secured, client_address)
        except OSError:
            pass  # a client that does not like the certificate goes

    def close(self):
        self.closing.set()
        self.shutdown()
        self.server_close()
