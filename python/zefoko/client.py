"""The client: one DEALER socket and one I/O thread, as a process of the framework's own.

Threads: the I/O thread alone uses the socket; the script's threads hand it messages through
a queue and a pipe that wakes it. Answers settle futures, calls of the script's services run
on a pool of threads, signals and memory events are delivered on one thread in their order:
no code of the script runs on the I/O thread.
"""

import concurrent.futures
import inspect
import itertools
import os
import queue
import struct
import threading
import time

import msgpack
import zmq

PROTOCOL_VERSION = 1


class _NoneType:
    """The ko value with no type at all (distinct from None, the void value)."""

    def __repr__(self):
        return "NONE"


NONE = _NoneType()


class RemoteError(Exception):
    """A call, lookup or subscription that the other side refused; the text is its own."""


class LinkError(RemoteError):
    """No link with the listening process, or it was lost while waiting."""


# ---- values -------------------------------------------------------------------------------

_INT_SIZES = {"c": 1, "C": 1, "w": 2, "W": 2, "i": 4, "I": 4, "l": 8, "L": 8}


def _ext_hook(code, data):
    if code == 1:  # an integer of another size: its type letter, then big-endian bytes
        letter = chr(data[0])
        return int.from_bytes(data[1:], "big", signed=letter.islower())
    if code == 2:
        return NONE
    if code == 3:  # a tuple: [name, member names, members]
        name, names, members = _unpack(data)
        return tuple(members)
    if code in (4, 5):  # a dynamic value, variadic arguments
        return _unpack(data)
    if code == 6:  # a kind without content
        return None
    return msgpack.ExtType(code, data)


def _default(value):
    if value is NONE:
        return msgpack.ExtType(2, b"")
    raise TypeError("cannot send %r to the robot's services" % (value,))


def _pack(value):
    return msgpack.packb(value, use_bin_type=True, default=_default)


def _pairs(pairs):
    try:
        return dict(pairs)
    except TypeError:  # keys that Python cannot hash: the pairs themselves
        return list(pairs)


def _unpack(data):
    return msgpack.unpackb(data, raw=False, ext_hook=_ext_hook, strict_map_key=False,
                           object_pairs_hook=_pairs, unicode_errors="surrogateescape")


# ---- the client ---------------------------------------------------------------------------


class Service:
    """A service of the directory: its methods as attributes (service.say("Hello"))."""

    def __init__(self, client, name, info):
        self._client = client
        self.name = name
        self.process = info.get("process", "")
        self.description, members = info.get("members", ["", []])
        self.methods = sorted({m[2] for m in members if m[0] == "m"})
        self.signals = sorted({m[2] for m in members if m[0] == "s"})

    def __getattr__(self, method):
        if method.startswith("__"):
            raise AttributeError(method)
        return lambda *args, timeout=None: self._client.call(self.name, method, *args,
                                                               timeout=timeout)

    def __repr__(self):
        return "<Service %s of %s>" % (self.name, self.process)


class Client:
    """A link with the process listening at `endpoint` ("tcp://127.0.0.1:5555",
    "ipc:///tmp/robot"). Through the network, give the listening process's public key
    (server_key) and a secret key of the script's own (secret_key), as zefoko keys writes
    them (the key files' paths or the 40 characters)."""

    def __init__(self, endpoint, name=None, heartbeat=0.5, dead_after=2.5, server_key=None,
                 secret_key=None, link_timeout=10.0):
        self.endpoint = endpoint
        self.name = name or "python %s (pid %d)" % (os.path.basename(__import__("sys").argv[0]) or "script", os.getpid())
        self._heartbeat = heartbeat
        self._dead_after = dead_after
        self._keys = (_key(server_key), _key(secret_key)) if server_key else None
        self._context = zmq.Context()
        self._lock = threading.Lock()
        self._linked = threading.Condition(self._lock)
        self._outbox = queue.Queue()
        self._wake_r, self._wake_w = os.pipe()
        self._ids = itertools.count(1)
        self._pending = {}  # id -> (future, peer, what)
        self._services = {}  # name -> {method: callable}, the script's own
        self._subscriptions = {}  # (service, signal) -> [callbacks]
        self._events = {}  # memory event -> callback
        self._peers = {}  # service -> peer of its owner
        self._self = 0
        self._up = False
        self._closing = False
        self._workers = concurrent.futures.ThreadPoolExecutor(32, "zefoko-call")
        self._deliveries = queue.Queue()
        self._delivery = threading.Thread(target=self._deliver, name="zefoko-delivery", daemon=True)
        self._delivery.start()
        self._thread = threading.Thread(target=self._run, name="zefoko-io", daemon=True)
        self._thread.start()
        with self._lock:
            if not self._linked.wait_for(lambda: self._up, link_timeout):
                pass
        if not self._up:
            self.close()
            raise LinkError("no process answers at %s within %g s" % (endpoint, link_timeout))

    # ---- the script's side ----

    def services(self):
        """The names of every service of the directory."""
        return self._request("list", 0, [], None, "listing of the directory").result()

    def service(self, name):
        info = self._lookup(name)
        return Service(self, name, info)

    def call(self, service, method, *args, timeout=None):
        """Calls a method by name and answers its result; raises RemoteError with the
        service's own error text, TimeoutError after `timeout` seconds."""
        future = self.call_async(service, method, *args)
        try:
            return future.result(timeout)
        except concurrent.futures.TimeoutError:
            raise TimeoutError("%s.%s gave no answer within %g s" % (service, method, timeout))

    def call_async(self, service, method, *args):
        """Starts a call; answers a concurrent.futures.Future of its result."""
        peer = self._owner(service)
        return self._request("call", peer, [service, method, 0], list(args),
                             "call of %s.%s" % (service, method))

    def post(self, service, method, *args):
        """Starts a method as a task of the module (its pCall) and answers the task id, to
        wait for (call(service, "wait", id, 0)) or stop (call(service, "stop", id))."""
        return self.call(service, "pCall", [method] + list(args))

    def trigger(self, service, signal, *args):
        """Triggers a signal of a service (one way)."""
        self._send("post", self._owner(service), 0, [service, signal], list(args))

    def subscribe(self, service, signal, callback):
        """Calls callback(*args) on each trigger of the signal, in order, on the client's
        delivery thread; answers a function that ends the subscription."""
        key = (service, signal)
        with self._lock:
            first = key not in self._subscriptions
            self._subscriptions.setdefault(key, []).append(callback)
        if first:
            try:
                self._request("subscribe", self._owner(service), [service, signal], None,
                              "subscription to %s.%s" % key).result()
            except Exception:
                with self._lock:
                    self._subscriptions.pop(key, None)
                raise

        def unsubscribe():
            with self._lock:
                callbacks = self._subscriptions.get(key, [])
                if callback in callbacks:
                    callbacks.remove(callback)
                last = not callbacks
                if last:
                    self._subscriptions.pop(key, None)
            if last:
                self._send("unsubscribe", self._peers.get(service, 0), next(self._ids),
                           [service, signal], None)
        return unsubscribe

    def register(self, name, methods, description=""):
        """Publishes a service of the script's own: `methods` maps names to callables,
        called with the arguments of each call on the client's threads."""
        with self._lock:
            self._services[name] = dict(methods)
        self._request("register", 0, [name], self._members(name, description),
                      "registration of " + name).result()

    def unregister(self, name):
        with self._lock:
            self._services.pop(name, None)
        self._request("unregister", 0, [name], None, "withdrawal of " + name).result()

    def subscribe_event(self, event, callback, memory="ZUMemory"):
        """Calls callback(key, value, message) when the memory event is raised."""
        module = self._events_service()
        with self._lock:
            self._events[event] = callback
        self.call(memory, "subscribeToEvent", event, module, "onEvent")

    def unsubscribe_event(self, event, memory="ZUMemory"):
        with self._lock:
            self._events.pop(event, None)
        self.call(memory, "unsubscribeToEvent", event, self._events_service())

    def close(self):
        if self._closing:
            return
        self._closing = True
        self._outbox.put(None)
        os.write(self._wake_w, b"x")
        self._thread.join(5)
        self._deliveries.put(None)
        self._workers.shutdown(wait=False, cancel_futures=True)
        self._fail_pending(None, "the client is closed")
        os.close(self._wake_r)
        os.close(self._wake_w)
        self._context.term()

    def __enter__(self):
        return self

    def __exit__(self, *exc):
        self.close()

    # ---- internals ----

    def _events_service(self):
        name = "python-events-%d-%d" % (os.getpid(), id(self))
        with self._lock:
            known = name in self._services
        if not known:
            def on_event(key, value, message):
                callback = self._events.get(key)
                if callback:
                    self._deliveries.put((callback, (key, value, message)))
            self.register(name, {"onEvent": on_event}, "The memory events of a Python script")
        return name

    def _members(self, name, description):
        members, ident = [], 100
        for method, fn in sorted(self._services[name].items()):
            try:
                arity = len(inspect.signature(fn).parameters)
            except (TypeError, ValueError):
                arity = 0
            members.append(["m", ident, method, "(" + "m" * arity + ")", "m", "", [], ["", ""]])
            ident += 1
        return [description, members]

    def _lookup(self, name):
        info = self._request("lookup", 0, [name], None, "lookup of " + name).result()
        with self._lock:
            self._peers[name] = info.get("peer", 0)
        return info

    def _owner(self, service):
        with self._lock:
            peer = self._peers.get(service)
        return peer if peer is not None else self._lookup(service).get("peer", 0)

    def _request(self, kind, to, fields, body, what):
        future = concurrent.futures.Future()
        with self._lock:
            if not self._up:
                future.set_exception(LinkError("Cannot send the %s: no link with %s now"
                                               % (what, self.endpoint)))
                return future
            ident = next(self._ids)
            self._pending[ident] = (future, to, what)
        self._send(kind, to, ident, fields, body)
        return future

    def _send(self, kind, to, ident, fields, body):
        header = _pack([kind, ident, to, self._self] + list(fields))
        frames = [header] if body is None and kind not in _BODY else [header, _pack(body)]
        self._outbox.put(frames)
        os.write(self._wake_w, b"x")

    def _fail_pending(self, peer, why):
        with self._lock:
            failed = [(i, p) for i, p in self._pending.items() if peer is None or p[1] == peer]
            for i, _ in failed:
                del self._pending[i]
        for _, (future, _, what) in failed:
            if not future.done():
                future.set_exception(LinkError("The %s is interrupted: %s" % (what, why)))

    def _deliver(self):
        while True:
            item = self._deliveries.get()
            if item is None:
                return
            callback, args = item
            try:
                callback(*args)
            except Exception as error:  # a script's callback never stops the deliveries
                print("zefoko: a callback failed: %r" % (error,))

    def _socket(self):
        s = self._context.socket(zmq.DEALER)
        s.setsockopt(zmq.LINGER, 0)
        s.setsockopt(zmq.IMMEDIATE, 1)
        s.setsockopt(zmq.RECONNECT_IVL, 100)
        if self._keys:
            server, secret = self._keys
            s.curve_serverkey = server.encode()
            s.curve_secretkey = secret.encode()
            s.curve_publickey = zmq.curve_public(secret.encode())
        s.connect(self.endpoint)
        return s

    def _run(self):
        sock = self._socket()
        poller = zmq.Poller()
        poller.register(sock, zmq.POLLIN)
        poller.register(self._wake_r, zmq.POLLIN)
        seen = next_hello = next_ping = time.monotonic()
        while True:
            for item, _ in poller.poll(min(100, int(self._heartbeat * 250))):
                if item is sock:
                    while True:
                        try:
                            frames = sock.recv_multipart(zmq.NOBLOCK)
                        except zmq.Again:
                            break
                        seen = time.monotonic()
                        self._handle(frames)
                elif item == self._wake_r:
                    os.read(self._wake_r, 4096)
            while True:
                try:
                    frames = self._outbox.get_nowait()
                except queue.Empty:
                    break
                if frames is None:
                    if self._up:
                        try:
                            sock.send_multipart([_pack(["bye", 0, 0, self._self])], zmq.NOBLOCK)
                        except zmq.ZMQError:
                            pass
                    sock.close()
                    return
                try:
                    sock.send_multipart(frames, zmq.NOBLOCK)
                except zmq.ZMQError:
                    pass
            now = time.monotonic()
            if self._up and now - seen > self._dead_after:
                self._lost("no sign of life for %.0f ms" % ((now - seen) * 1000))
                poller.unregister(sock)
                sock.close()
                sock = self._socket()
                poller.register(sock, zmq.POLLIN)
                next_hello = now
            elif self._up and now >= next_ping:
                next_ping = now + self._heartbeat
                try:
                    sock.send_multipart([_pack(["ping", 0, 0, self._self])], zmq.NOBLOCK)
                except zmq.ZMQError:
                    pass
            elif not self._up and now >= next_hello:
                next_hello = now + max(self._heartbeat, 0.25)
                seen = now
                try:
                    sock.send_multipart([_pack(["hello", 0, 0, 0, PROTOCOL_VERSION, self.name,
                                                os.getpid(), int(self._heartbeat * 1000)])],
                                        zmq.NOBLOCK)
                except zmq.ZMQError:
                    pass

    def _lost(self, why):
        with self._lock:
            self._up = False
            self._self = 0
            self._peers.clear()
            self._linked.notify_all()
        self._fail_pending(None, "the link with %s was lost (%s)" % (self.endpoint, why))

    def _handle(self, frames):
        try:
            header = _unpack(frames[0])
            kind, ident, to, source = header[:4]
            fields = header[4:]
            body = _unpack(frames[1]) if len(frames) > 1 else None
        except Exception as error:
            print("zefoko: a message that does not read: %r" % (error,))
            return
        if kind == "welcome":
            with self._lock:
                again = self._self != 0 or bool(self._services)
                self._self = fields[1]
                self._up = True
                self._linked.notify_all()
            self._workers.submit(self._restore)
        elif kind in ("bye", "reset") and self._up:
            self._lost("the listening process has stopped" if kind == "bye" else fields[0])
        elif kind in ("reply", "error"):
            with self._lock:
                entry = self._pending.pop(ident, None)
            if entry:
                future = entry[0]
                if kind == "reply":
                    future.set_result(body)
                else:
                    future.set_exception(RemoteError(fields[0]))
        elif kind == "call":
            self._workers.submit(self._serve, ident, source, fields, body)
        elif kind == "signal":
            with self._lock:
                callbacks = list(self._subscriptions.get((fields[0], fields[1]), []))
            for callback in callbacks:
                self._deliveries.put((callback, tuple(body)))
        elif kind == "service" and fields[0] == "unregistered":
            with self._lock:
                if self._peers.get(fields[1]) == fields[2]:
                    del self._peers[fields[1]]
        elif kind == "peer-gone":
            self._fail_pending(fields[0], "process #%d is gone (%s)" % (fields[0], fields[1]))

    def _restore(self):
        """After a welcome: the script's services, subscriptions and events again."""
        with self._lock:
            names = list(self._services)
            keys = list(self._subscriptions)
            events = list(self._events)
        for name in names:
            try:
                self._request("register", 0, [name], self._members(name, ""),
                              "registration of " + name).result(10)
            except Exception as error:
                print("zefoko: %s is not published: %s" % (name, error))
        for service, signal in keys:
            try:
                self._request("subscribe", self._owner(service), [service, signal], None,
                              "subscription to %s.%s" % (service, signal)).result(10)
            except Exception:
                pass
        if events and names:
            for event in events:
                try:
                    self.call("ZUMemory", "subscribeToEvent", event, self._events_service(),
                              "onEvent", timeout=10)
                except Exception:
                    pass

    def _serve(self, ident, source, fields, args):
        service, method = fields[0], fields[1]
        with self._lock:
            methods = self._services.get(service)
        try:
            if methods is None:
                raise RemoteError("Cannot find service '%s' in %s" % (service, self.name))
            if isinstance(method, int):
                names = sorted(methods)
                method = names[method - 100] if 0 <= method - 100 < len(names) else None
            fn = methods.get(method) if method is not None else None
            if fn is None:
                raise RemoteError("Cannot find method '%s' on %s" % (fields[1], service))
            result = fn(*args)
            self._send("reply", source, ident, [], result)
        except Exception as error:
            self._send("error", source, ident, [str(error)], None)


_BODY = {"register", "call", "reply", "post", "signal", "setproperty"}


def _key(value):
    if value is None:
        return None
    if len(value) == 40 and not os.path.exists(value):
        return value
    with open(value) as f:
        for line in f:
            line = line.strip()
            if line and not line.startswith("#"):
                return line
    raise ValueError("no key in " + value)
