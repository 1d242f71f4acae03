"""Clients that mean no good, on bare sockets. A program of its own, so that each is a process of its own:
hostile_clients.py SOCKET BEHAVIOUR [COUNT]. It prints one line of JSON when it has done its worst; the behaviours that
last go on until their standard input ends, and then print another."""

import array
import json
import os
import select
import socket
import struct
import sys

TYPHON = "com.vorlan.typhond.TyphonProtocol"
CONTENT = "com.vorlan.typhond.TyphonSilkpageSupportProtocol"
NO_REPLY_EXPECTED = 1
RETURN, ERROR = 2, 3
PATIENCE = 120


def aligned(data, to=8):
    return data + bytes(-len(data) % to)


def text(value, length="<I"):
    return struct.pack(length, len(value)) + value.encode() + b"\0"


def message(interface, member, signature="", body=b"", flags=0, descriptors=0, serial=1):
    """A method call, as it travels."""
    fields = [(1, "o", text("/com/vorlan/typhond")), (2, "s", text(interface)), (3, "s", text(member))]
    if signature:
        fields.append((8, "g", text(signature, "B")))
    if descriptors:
        fields.append((9, "u", struct.pack("<I", descriptors)))
    block = b""
    for code, kind, value in fields:
        block = aligned(block) + bytes((code, 1, ord(kind), 0)) + value
    return aligned(struct.pack("<cBBBIII", b"l", 1, flags, 1, len(body), serial, len(block)) + block) + body


class Replies:
    """Cuts what arrives into messages and counts them; replies are small, or come with descriptors."""

    def __init__(self):
        self.returns = 0
        self.errors = 0
        self.descriptors = 0
        self._buffer = b""

    def feed(self, data):
        self._buffer += data
        while len(self._buffer) >= 16:
            body, _, fields = struct.unpack_from("<III", self._buffer, 4)
            size = 16 + (fields + 7) // 8 * 8 + body
            if len(self._buffer) < size:
                return
            self.returns += self._buffer[1] == RETURN
            self.errors += self._buffer[1] == ERROR
            self._buffer = self._buffer[size:]

    @property
    def count(self):
        return self.returns + self.errors


class Hostile:
    """One connection, past the handshake."""

    def __init__(self, path):
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.settimeout(PATIENCE)
        self.socket.connect(path)
        self.replies = Replies()
        self.socket.sendall(b"\0AUTH ANONYMOUS 61\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n")
        answer = b""
        while answer.count(b"\r\n") < 2:
            part = self.socket.recv(4096)
            if not part:
                raise ConnectionResetError
            answer += part

    def send(self, data, descriptors=()):
        rights = [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", descriptors))] if descriptors else []
        self.socket.sendmsg([data], rights)

    def receive(self, flags=0):
        """False when the connection has ended."""
        try:
            data, control, _, _ = self.socket.recvmsg(1 << 16, socket.CMSG_SPACE(16 * 4), flags)
        except BlockingIOError:
            return True
        except ConnectionError:
            return False
        for _, _, rights in control:
            for descriptor in array.array("i", rights):
                os.close(descriptor)
                self.replies.descriptors += 1
        self.replies.feed(data)
        return bool(data)

    def await_replies(self, count):
        while self.replies.count < count and self.receive():
            pass

    def await_end(self):
        """True when the daemon closes the connection."""
        while self.receive():
            pass
        return True

    def pump(self, data):
        """Sends it all, reading meanwhile; False when the connection has ended."""
        view = memoryview(data)
        while view:
            readable, writable, _ = select.select([self.socket], [self.socket], [], PATIENCE)
            try:
                if readable and not self.receive(socket.MSG_DONTWAIT):
                    return False
                if writable:
                    view = view[self.socket.send(view, socket.MSG_DONTWAIT):]
            except BlockingIOError:
                pass
            except ConnectionError:
                return False
        return True


def tell(**what):
    print(json.dumps(what), flush=True)


def told_to_stop(timeout=0):
    return bool(select.select([sys.stdin], [], [], timeout)[0])


def wait_to_stop():
    sys.stdin.read()


def flood(path, at_once):
    """Calls as fast as it can, reading the answers."""
    client = Hostile(path)
    burst = message(TYPHON, "updatingUserFonts") * at_once
    sent = 0
    tell(begun=True)
    while not told_to_stop():
        if not client.pump(burst):
            raise SystemExit("the flood was cut off")
        sent += at_once
    client.await_replies(sent)
    tell(sent=sent, returns=client.replies.returns, errors=client.replies.errors)


def never_reads(path, connections):
    """Asks for answers on every connection until the daemon has had enough."""
    burst = message("org.freedesktop.DBus.Introspectable", "Introspect") * 256
    sent = 0
    clients = [Hostile(path) for _ in range(connections)]
    for client in clients:
        try:
            while True:
                client.socket.sendall(burst)
                sent += 256
        except ConnectionError:
            pass
    tell(closed=len(clients), sent=sent)


def leaves_unread(path, connections):
    """On each of many connections, leaves less unread than the daemon minds."""
    burst = message("org.freedesktop.DBus.Introspectable", "Introspect") * 100
    clients = [Hostile(path) for _ in range(connections)]
    closed = set()
    # No longer than it takes: one that sends so much is read slowly.
    for _ in range(15):
        if closed:
            break
        for client in clients:
            try:
                client.socket.sendall(burst)
            except ConnectionError:
                closed.add(client)
    tell(closed=len(closed))
    wait_to_stop()


def half_messages(path, connections):
    """Sends half a message on every connection, and waits for what becomes of it."""
    body = bytes(1 << 20)
    whole = message(TYPHON, "resetIssuedFontsFor_reply", "s", struct.pack("<I", len(body)) + body + b"\0")
    clients = [Hostile(path) for _ in range(connections)]
    for client in clients:
        client.socket.sendall(whole[:len(whole) // 2])
    tell(waiting=len(clients))
    tell(closed=sum(client.await_end() for client in clients))


def hold_messages(path, connections):
    """Sends nearly all of a large message on every connection: much for the daemon to hold."""
    size = 15 << 20
    head = message(TYPHON, "resetIssuedFontsFor_reply", "s")
    head = head[:4] + struct.pack("<I", size) + head[8:]
    closed = 0
    clients = [Hostile(path) for _ in range(connections)]
    for client in clients:
        try:
            client.socket.sendall(head + bytes(size - 1))
        except ConnectionError:
            closed += 1
    tell(held=connections - closed, closed=closed)
    wait_to_stop()


def connects(path, count):
    """Opens connections and keeps them."""
    clients = []
    refused = 0
    for _ in range(count):
        try:
            clients.append(Hostile(path))
        except ConnectionError:
            refused += 1
    tell(kept=len(clients), refused=refused)
    wait_to_stop()


def connects_and_leaves(path, count):
    """Opens connections and drops them, some with half a handshake, some with a call on its way."""
    for number in range(count):
        client = socket.socket(socket.AF_UNIX)
        client.connect(path)
        try:
            if number % 3 > 0:
                client.sendall(b"\0AUTH ANONYMOUS 61\r\n")
            if number % 3 > 1:
                client.sendall(b"BEGIN\r\n" + message(TYPHON, "checkin"))
        except ConnectionError:
            pass  # Too many before it are not noticed as gone yet, so it was refused.
        client.close()
    tell(opened=count)


def many_descriptors(path, count):
    """Sends as many descriptors as the kernel passes at once, with every message."""
    null = os.open("/dev/null", os.O_RDONLY)
    closed = 0
    for _ in range(count):
        client = Hostile(path)
        client.send(message(TYPHON, "checkin", descriptors=253), [null] * 253)
        closed += client.await_end()
        closed -= client.replies.count
    tell(closed=closed)


def hidden_descriptors(path, count):
    """Sends an invalid message, and right behind it another one with descriptors."""
    null = os.open("/dev/null", os.O_RDONLY)
    large = 8 << 10
    first = message("no interface", "checkin", "s", struct.pack("<I", large) + bytes(large) + b"\0")
    second = message("no interface", "checkin", descriptors=253)
    closed = 0
    # Enough before them that both are there when the daemon comes to them.
    before = message(TYPHON, "updatingUserFonts") * 40
    for _ in range(count):
        client = Hostile(path)
        try:
            client.socket.sendall(before + first)
            client.send(second, [null] * 253)
        except ConnectionError:
            pass
        closed += client.await_end()
    tell(closed=closed)


def never_answered(path, count):
    """Calls the operation that is never answered, and now and then one that is."""
    client = Hostile(path)
    plain = message(CONTENT, "sendFonts_reply", "aa{sv}", struct.pack("<I", 0))
    silent = message(CONTENT, "sendFonts_reply", "aa{sv}", struct.pack("<I", 0), NO_REPLY_EXPECTED)
    # The answer to the last one says that the others have been handled.
    block = (plain + silent) * 16 + message(TYPHON, "updatingUserFonts")
    for number in range(count // 32):
        client.send(block)
        client.await_replies(number + 1)
    tell(sent=count // 32 * 32, returns=client.replies.returns, errors=client.replies.errors)


def check_ins(path, count):
    """Connects often, and then checks in on all connections at once, when it is told to."""
    clients = [Hostile(path) for _ in range(count)]
    tell(connected=len(clients))
    sys.stdin.readline()
    for client in clients:
        client.send(message(TYPHON, "checkin"))
    for client in clients:
        client.await_replies(1)
    tell(returns=sum(client.replies.returns for client in clients),
         errors=sum(client.replies.errors for client in clients),
         descriptors=sum(client.replies.descriptors for client in clients))
    wait_to_stop()


if __name__ == "__main__":
    behaviour = globals()[sys.argv[2]]
    behaviour(sys.argv[1], int(sys.argv[3]))
