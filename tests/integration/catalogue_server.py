"""An HTTP server on this machine that can be hostile in many ways."""

import socket
import socketserver
import threading


class CatalogueServer:
    """Answers every request with `answer(connection, path)`, on a connection of its own."""

    def __init__(self):
        self.answer = whole(b"")
        # Paths in the order they were asked for, and how many connections are open.
        self.asked = []
        self.open = 0
        self.changed = threading.Condition()
        outer = self

        class Handler(socketserver.BaseRequestHandler):
            def handle(self):
                outer._serve(self.request)

        class Server(socketserver.ThreadingTCPServer):
            daemon_threads = True
            allow_reuse_address = True

            def handle_error(self, request, client_address):
                pass  # whoever is attacked hangs up

        self._server = Server(("127.0.0.1", 0), Handler)
        self.port = self._server.server_address[1]
        threading.Thread(target=self._server.serve_forever, args=(0.01,), daemon=True).start()

    def url(self, path="/catalogue.plist", host="127.0.0.1"):
        return f"http://{host}:{self.port}{path}"

    def close(self):
        self._server.shutdown()
        self._server.server_close()

    def _count(self, change, path=None):
        with self.changed:
            self.open += change
            if path is not None:
                self.asked.append(path)
            self.changed.notify_all()

    def _serve(self, connection):
        head = b""
        while b"\r\n\r\n" not in head:
            block = connection.recv(65536)
            if not block:
                return
            head += block
        path = head.split(b" ")[1].decode()
        self._count(1, path)
        try:
            self.answer(connection, path)
        finally:
            self._count(-1)

    def wait_until(self, condition, seconds=60):
        with self.changed:
            if not self.changed.wait_for(condition, seconds):
                raise AssertionError(f"asked for: {self.asked}, open: {self.open}")


def head(length=None, status="200 OK", more=""):
    length_line = "" if length is None else f"Content-Length: {length}\r\n"
    return f"HTTP/1.1 {status}\r\nConnection: close\r\n{length_line}{more}\r\n".encode()


def whole(body, **options):
    return lambda connection, path: connection.sendall(head(len(body), **options) + body)


def claiming(length, body):
    """The body under a length that it does not have."""
    return lambda connection, path: connection.sendall(head(length) + body)


def until_hung_up(connection):
    try:
        while connection.recv(65536):
            pass
    except OSError:
        pass


def stalling(beginning=b""):
    """Sends this much, then nothing until the other end hangs up."""
    def answer(connection, path):
        connection.sendall(beginning)
        until_hung_up(connection)
    return answer


def dripping(body, seconds):
    """A byte now and then, so that it never stalls for long."""
    def answer(connection, path):
        connection.sendall(head(len(body)))
        for byte in body:
            connection.sendall(bytes([byte]))
            connection.settimeout(seconds)
            try:
                if not connection.recv(1):
                    return
            except socket.timeout:
                pass
    return answer


def resetting(beginning):
    """Breaks off with a reset instead of an end."""
    def answer(connection, path):
        connection.sendall(beginning)
        connection.setsockopt(socket.SOL_SOCKET, socket.SO_LINGER, b"\1\0\0\0\0\0\0\0")
        connection.close()
    return answer


def redirecting(target):
    """Sends on to what `target` says, a text or a function of the path."""
    def answer(connection, path):
        location = target(path) if callable(target) else target
        connection.sendall(head(0, "302 Found", f"Location: {location}\r\n"))
    return answer


def endless(start):
    """Sends `start`, and then zeros for as long as somebody takes them."""
    def answer(connection, path):
        connection.sendall(start)
        while True:
            connection.sendall(bytes(1 << 16))
    return answer
