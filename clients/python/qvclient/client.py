"""A synchronous client: one connection to the daemon, one method per request."""

import os
import socket
import threading
import uuid

from . import constants as k
from .frame import FLAG_GOODBYE, FLAG_REPLY_EXPECTED, FrameError, FrameReader, encode_frame

__all__ = ["QVDError", "ProtocolError", "Client", "socket_path", "file_url"]

_READ_CHUNK = 64 << 10


class QVDError(Exception):
    """The daemon answered with an error reply."""

    def __init__(self, code, message, reply=None):
        super().__init__("error %d (%s): %s" % (code, k.ERROR_NAMES.get(code, "unknown"), message))
        self.code = code
        self.message = message
        self.reply = reply if reply is not None else {}


class ProtocolError(Exception):
    """The connection failed, ended, or the daemon broke the protocol."""


def socket_path(root=None, service=k.DEFAULT_SERVICE):
    """<root>/run/quorvex/mbx/<service>; the root is QV_ROOT, else "/"."""
    if root is None:
        root = os.environ.get("QV_ROOT") or "/"
    if not service or service in (".", "..") or "/" in service or any(ord(c) < 0x20 for c in service):
        raise ValueError("bad service name %r" % service)
    return os.path.join(root, k.SOCKET_DIRECTORY, service)


def file_url(path):
    """file://<path>, every byte but unreserved ones and '/' percent-encoded."""
    if not path.startswith("/"):
        raise ValueError("a file URL needs an absolute path: %r" % path)
    safe = b"abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-._~/"
    return "file://" + "".join(chr(b) if b in safe else "%%%02X" % b for b in os.fsencode(path))


def _uuid(value):
    if isinstance(value, uuid.UUID):
        return value
    if isinstance(value, str):
        return uuid.UUID(value)
    if isinstance(value, dict) and "uuid" in value:  # a plug-in form
        return _uuid(value["uuid"])
    if isinstance(value, tuple) and len(value) == 2:  # (path, uuid)
        return _uuid(value[1])
    raise TypeError("not a UUID, UUID text, plug-in form or (path, uuid): %r" % (value,))


def _path_of(value):
    if isinstance(value, dict):
        return value.get("path")
    if isinstance(value, tuple):
        return value[0]
    return None


class Client:
    """A connection to the daemon.

        with Client(root="/tmp/root") as qvd:
            forms = qvd.match({"XOExtensionPointName": "com.example.point"})

    Every request method returns what the reply carries, or raises QVDError
    for an error reply and ProtocolError when there is no usable reply.
    Requests from several threads are sent one at a time."""

    def __init__(self, root=None, service=k.DEFAULT_SERVICE, path=None,
                 version=k.PROTOCOL_VERSION, timeout=30.0):
        self.path = path or socket_path(root, service)
        self.version = version
        self._lock = threading.Lock()
        self._next_id = 1
        self._reader = FrameReader()
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._socket.settimeout(timeout)
        try:
            self._socket.connect(self.path)
        except OSError as error:
            self._socket.close()
            raise ProtocolError("cannot connect to %s: %s" % (self.path, error)) from error

    def __enter__(self):
        return self

    def __exit__(self, *exc):
        self.close()

    def close(self):
        """Says goodbye and closes the connection; holds taken on it end."""
        with self._lock:
            if self._socket is None:
                return
            try:
                self._socket.sendall(encode_frame(FLAG_GOODBYE, self._take_id()))
            except OSError:
                pass
            self._socket.close()
            self._socket = None

    def _take_id(self):
        message_id = self._next_id
        self._next_id += 1
        return message_id

    # ------------------------------------------------------------ exchange

    def send_raw(self, body):
        """Sends `body` (any encodable value) as a request; returns the reply
        body as it came, without looking for an error in it. The daemon
        answers only maps: anything else waits out the timeout."""
        with self._lock:
            if self._socket is None:
                raise ProtocolError("the connection is closed")
            request_id = self._take_id()
            try:
                self._socket.sendall(encode_frame(FLAG_REPLY_EXPECTED, request_id, body))
                while True:
                    chunk = self._socket.recv(_READ_CHUNK)
                    if not chunk:
                        self._reader.finish()
                        raise ProtocolError("the daemon closed the connection")
                    for frame in self._reader.feed(chunk):
                        if frame.is_reply and frame.in_reply_to == request_id:
                            return frame.body
                        # Anything else is passed over: a reply to an earlier,
                        # abandoned request, or a goodbye (the end of the
                        # stream, which follows it, is what counts).
            except (OSError, FrameError) as error:
                self._socket.close()
                self._socket = None
                raise ProtocolError(str(error)) from error
            except ProtocolError:
                self._socket.close()
                self._socket = None
                raise

    def request(self, name, keys=None, sync=False):
        """{"request": name, "version": ..., **keys} (and "sync": true); the
        reply body, or QVDError."""
        body = {k.REQUEST_KEY: name, k.VERSION_KEY: self.version}
        if sync:
            body[k.SYNC_KEY] = True
        body.update(keys or {})
        reply = self.send_raw(body)
        if not isinstance(reply, dict):
            raise ProtocolError("reply is not a map: %r" % (reply,))
        code = reply.get(k.ERROR_CODE_KEY, 0)
        text = reply.get(k.ERROR_KEY)
        if isinstance(code, bool) or not isinstance(code, int) or code < 0:
            raise ProtocolError("error code that is not one: %r" % (code,))
        if text is not None and not isinstance(text, str):
            raise ProtocolError("error text that is not text: %r" % (text,))
        if code != 0:
            raise QVDError(code, text if text is not None
                           else "unknown error returned by Quorvex subsystem", reply)
        if text is not None:
            raise ProtocolError("error without a code: %s" % text)
        return reply

    @staticmethod
    def _plugins(keys, plugins):
        """Sets "uuids" and, when every entry has a path, the parallel
        "paths" (the daemon looks there when it does not know a UUID)."""
        plugins = list(plugins)
        keys[k.UUIDS_KEY] = [_uuid(p) for p in plugins]
        paths = [_path_of(p) for p in plugins]
        if plugins and all(isinstance(p, str) for p in paths):
            keys[k.PATHS_KEY] = paths

    # ------------------------------------------------------------ requests

    def add(self, paths):
        """Registers the bundles at `paths` (absolute)."""
        self.request("add", {k.PATHS_KEY: list(paths)})

    def remove(self, paths):
        """Deregisters the bundles at `paths`; needs the manager entitlement."""
        self.request("remove", {k.PATHS_KEY: list(paths)})

    def bulk(self, flags=0):
        self.request("bulk", {k.FLAGS_KEY: flags})

    def match(self, rules=None, flags=0, sync=False):
        """The forms of the plug-ins that match `rules` (a dict), sorted by
        identifier, version and path."""
        keys = {k.FLAGS_KEY: flags}
        if rules is not None:
            keys[k.RULES_KEY] = rules
        return self.request("match", keys, sync).get(k.MATCHES_KEY, [])

    def find(self, uuid=None, path=None):
        """The form of one plug-in, by UUID or by bundle path (a plain
        absolute path or a file URL); raises QVDError code 15 when unknown."""
        keys = {}
        if uuid is not None:
            keys[k.UUIDS_KEY] = _uuid(uuid)
        if path is not None:
            keys[k.PATHS_KEY] = path if path.startswith("file:") else file_url(path)
        if not keys:
            raise TypeError("find needs a uuid or a path")
        return self.request("find", keys).get(k.MATCHES_KEY)

    def ready(self, plugins, environment=None, flags=0, sync=False):
        """Lets this host use `plugins` (UUIDs, UUID texts, forms, or
        (path, uuid) pairs). `environment` needs its own entitlement."""
        keys = {k.FLAGS_KEY: flags}
        self._plugins(keys, plugins)
        if environment is not None:
            keys[k.ENVIRONMENT_KEY] = environment
        self.request("ready", keys, sync)

    def access(self, plugins, flags=0, sync=False):
        """Read tokens for the plug-ins' bundles, in their order."""
        keys = {k.FLAGS_KEY: flags}
        self._plugins(keys, plugins)
        return self.request("access", keys, sync).get(k.EXTENSIONS_KEY, [])

    def annotate(self, plugins, annotation):
        """Sets "election" (a number) and/or "extension" (a dict) on each
        plug-in; other entries are dropped by the daemon."""
        keys = {k.ANNOTATIONS_KEY: annotation}
        self._plugins(keys, plugins)
        self.request("annotate", keys)

    def bulk_annotate(self, extensions):
        """Replaces the "extension" annotation of each plug-in:
        {uuid: dict}. The election is left as it is."""
        self.request("bulk-annotate", {k.ANNOTATIONS_KEY: {
            str(_uuid(key)).upper(): value for key, value in extensions.items()}})

    def hold(self, paths, flags=k.HOLD_PLUGIN_PATHS):
        """Holds the plug-ins at `paths` (applications when flags lack
        HOLD_PLUGIN_PATHS) until released or until this connection ends;
        returns the hold's token."""
        return self.request("lock", {k.PATHS_KEY: list(paths), k.FLAGS_KEY: flags})[k.UUIDS_KEY]

    lock = hold

    def release(self, *tokens):
        """Ends the holds with these tokens; unknown tokens are passed over."""
        self.request("lock", {k.UUIDS_KEY: [_uuid(t) for t in tokens]})
