"""The Python client against the real daemon: every request, its replies and
its refusals, on a temporary platform root holding plug-ins of its own."""

import base64
import os
import re
import shutil
import signal
import socket
import subprocess
import tempfile
import time
import unittest
import uuid
from xml.sax.saxutils import escape

from qvclient import Client, Date, QVDError, constants as k
from qvclient.frame import FrameReader

QVD = os.environ.get("QVD_PATH", "")
SOURCE = os.environ.get("QV_SOURCE_DIR", os.path.join(os.path.dirname(__file__), "..", ".."))

# The worked example of the protocol reference asks for this extension point.
CLOCK_POINT = "com.corvane.watchface.complication"
CLOCK_ID = "com.example.clock"
POINT = "com.example.point"
BUILD_DATE = Date(1793610900.0)  # 2026-11-02T09:15:00Z
FINGERPRINT = bytes.fromhex("abcdef0123456789")


def vmap_xml(value):
    """A value as the XML vmap form Info.vmap files use."""
    def item(v):
        if isinstance(v, bool):
            return "<true/>" if v else "<false/>"
        if isinstance(v, int):
            return "<integer>%d</integer>" % v
        if isinstance(v, float):
            return "<real>%r</real>" % v
        if isinstance(v, str):
            return "<string>%s</string>" % escape(v)
        if isinstance(v, bytes):
            return "<data>%s</data>" % base64.b64encode(v).decode()
        if isinstance(v, Date):
            return "<date>%s</date>" % v.to_datetime().strftime("%Y-%m-%dT%H:%M:%SZ")
        if isinstance(v, list):
            return "<array>%s</array>" % "".join(item(e) for e in v)
        return "<dict>%s</dict>" % "".join("<key>%s</key>%s" % (escape(key), item(e))
                                           for key, e in v.items())
    return '<?xml version="1.0" encoding="UTF-8"?>\n<vmap version="1.0">%s</vmap>\n' % item(value)


def write_bundle(root, name, version, point=POINT, info=None, attributes=None):
    """System/Library/PlugIns/<name>.ovx with identifier com.example.<name>."""
    bundle = os.path.join(root, "System/Library/PlugIns", name + ".ovx")
    os.makedirs(bundle)
    manifest = {"BXBundleIdentifier": "com.example." + name.lower(),
                "BXBundleShortVersionString": version,
                "BXExecutable": name,
                "XOExtension": {"XOExtensionPointIdentifier": point,
                                "XOExtensionProtocol": ["QVWidget"],
                                "XOExtensionAttributes": dict({"XOExtensionVersion": version,
                                                               "Kind": name.lower()},
                                                              **(attributes or {}))}}
    manifest.update(info or {})
    with open(os.path.join(bundle, "Info.vmap"), "w") as out:
        out.write(vmap_xml(manifest))
    return os.path.realpath(bundle)


def worked_example():
    """The hex of the frame in the protocol reference's worked example."""
    with open(os.path.join(SOURCE, "docs", "protocol.md")) as doc:
        text = doc.read()
    section = text.split("## Worked example", 1)[1]
    block = re.search(r"```hex\n(.*?)```", section, re.S).group(1)
    return bytes.fromhex(block)


@unittest.skipUnless(QVD and os.access(QVD, os.X_OK), "QVD_PATH names no daemon binary")
class DaemonTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.root = os.path.realpath(tempfile.mkdtemp(prefix="qvd-py-"))
        cls.alpha = write_bundle(cls.root, "Alpha", "1.0")
        cls.beta = write_bundle(cls.root, "Beta", "2.0")
        cls.clock = write_bundle(
            cls.root, "Clock", "2.4.1", point=CLOCK_POINT,
            info={"BXBundleDisplayName": "World Clock", "DTBuildDate": BUILD_DATE,
                  "SigningFingerprint": FINGERPRINT},
            attributes={"Refresh": 900, "AlwaysOn": True, "Battery": 0.15})
        cls.log = open(os.path.join(cls.root, "qvd.log"), "w+b")
        env = {"QV_ROOT": cls.root, "PATH": "/usr/bin:/bin", "QV_LOG": "debug",
               "QV_LOG_PRIVATE": "1"}
        cls.daemon = subprocess.Popen([QVD], env=env, stdin=subprocess.DEVNULL,
                                      stdout=subprocess.DEVNULL, stderr=cls.log)
        cls.addClassCleanup(cls.stop)
        deadline = time.monotonic() + 10
        while b"with a plug-in cache limit of" not in cls.daemon_log():
            if cls.daemon.poll() is not None or time.monotonic() > deadline:
                raise RuntimeError("qvd did not start:\n" + cls.daemon_log().decode(errors="replace"))
            time.sleep(0.02)
        cls.qvd = Client(root=cls.root, timeout=10)

    @classmethod
    def stop(cls):
        if getattr(cls, "qvd", None):
            cls.qvd.close()
        cls.daemon.send_signal(signal.SIGTERM)
        try:
            status = cls.daemon.wait(10)
        except subprocess.TimeoutExpired:
            cls.daemon.kill()
            cls.daemon.wait()
            status = "killed"
        cls.log.close()
        shutil.rmtree(cls.root, ignore_errors=True)
        if status != 0:
            raise RuntimeError("qvd ended with %s" % status)

    @classmethod
    def daemon_log(cls):
        cls.log.seek(0)
        return cls.log.read()

    def assertRefused(self, code, message, call, *args, **kwargs):
        with self.assertRaises(QVDError) as caught:
            call(*args, **kwargs)
        self.assertEqual((caught.exception.code, caught.exception.message), (code, message))
        return caught.exception

    def identifiers(self, rules, client=None):
        return [form["identifier"] for form in (client or self.qvd).match(rules)]

    def notifications(self):
        path = os.path.join(self.root, "run/quorvex/notify", k.ANNOTATION_CHANGE_NOTIFICATION)
        try:
            with open(path) as counter:
                return int(counter.read() or 0)
        except FileNotFoundError:
            return 0

    def form_of(self, path):
        return self.qvd.find(path=path)

    # ---------------------------------------------------------------- match

    def test_match_answers_forms_of_matching_plug_ins(self):
        forms = self.qvd.match({"XOExtensionPointName": CLOCK_POINT}, sync=True)
        self.assertEqual([f["identifier"] for f in forms], [CLOCK_ID])
        form = forms[0]
        self.assertEqual(form["path"], self.clock)
        self.assertIs(form["systemResident"], True)
        self.assertEqual(form["version"], "2.4.1")
        self.assertIsInstance(form["hubProtocolVersion"], int)
        self.assertEqual(str(uuid.UUID(form["uuid"])).upper(), form["uuid"])
        self.assertIsInstance(form["lastmodified"], int)
        info = form["bundleInfo"]
        self.assertEqual((info["DTBuildDate"], info["SigningFingerprint"]), (BUILD_DATE, FINGERPRINT))
        self.assertNotIn("BXBundleInfoVmapURL", info)
        attributes = form["info"]["XOExtensionAttributes"]
        self.assertEqual((attributes["Refresh"], attributes["AlwaysOn"], attributes["Battery"]),
                         (900, True, 0.15))
        self.assertEqual(attributes["XOExtensionPointName"], CLOCK_POINT)
        self.assertEqual(form["localizedDisplayName"], "World Clock")
        self.assertIsInstance(form["annotations"], dict)
        self.assertEqual(list(form["extensions"]), ["."])
        self.assertTrue(form["service-extension"].startswith("qvx1;"))

    def test_match_rules_and_operators(self):
        both = ["com.example.alpha", "com.example.beta"]
        cases = [
            ({"XOExtensionPointName": POINT}, both),
            ({"XOExtensionPointName": POINT, "XOExtensionVersion": ">=2"}, both[1:]),
            ({"XOExtensionPointName": POINT, "XOExtensionVersion": "<>2.0"}, both[:1]),
            ({"XOExtensionPointName": POINT, "XOExtensionVersion": "<10"}, both),  # by value
            ({"XOExtensionPointName": POINT, "Kind": ["gamma", "beta"]}, both[1:]),
            ({"XOExtensionPointName": POINT, "Missing": False}, both),
            ({"XOExtensionPointName": POINT, "Missing": True}, []),
            ({"XOExtensionPointName": POINT, "Kind": True}, both),
            ({"XOExtensionPointName": POINT, "Kind": "?unknown:x"}, []),
            ({"XOExtensionPointName": POINT, "XOExtensionContainingApp": False}, []),
            ({"BXBundleIdentifier": "com.example.alpha"}, both[:1]),
            ({"XOExtensionIdentifier": "com.example.beta"}, both[1:]),
            ({"XOExtensionPointName": "nothing.here"}, []),
        ]
        for rules, expected in cases:
            with self.subTest(rules=rules):
                self.assertEqual(self.identifiers(rules), expected)
        beta = self.form_of(self.beta)
        self.assertEqual(self.identifiers({"com.corvane.uuid": beta["uuid"]}), both[1:])
        self.assertRefused(k.ERROR_INVALID_REQUEST, "invalid request format (bad rules dictionary)",
                           self.qvd.match, ["not", "a", "map"])
        self.assertRefused(k.ERROR_DENIED, "unauthorized discovery flag (QVDiscoverAll)",
                           self.qvd.match, None, k.DISCOVER_ALL)

    def test_the_worked_example_of_the_reference_is_answered(self):
        frame = worked_example()
        with socket.socket(socket.AF_UNIX) as raw:
            raw.settimeout(10)
            raw.connect(self.qvd.path)
            raw.sendall(frame)
            reader, replies = FrameReader(), []
            while not replies:
                chunk = raw.recv(65536)
                self.assertTrue(chunk, "the daemon closed the connection")
                replies = reader.feed(chunk)
        self.assertEqual((replies[0].flags, replies[0].in_reply_to), (2, 1))
        self.assertEqual([f["identifier"] for f in replies[0].body["matches"]], [CLOCK_ID])

    # ---------------------------------------------------------------- find

    def test_find_by_uuid_and_by_path(self):
        by_path = self.qvd.find(path=self.alpha)
        self.assertEqual(by_path["identifier"], "com.example.alpha")
        by_uuid = self.qvd.find(uuid=by_path["uuid"])
        self.assertEqual((by_uuid["path"], by_uuid["uuid"]), (self.alpha, by_path["uuid"]))
        self.assertEqual(self.qvd.find(path="file://" + self.alpha)["uuid"], by_path["uuid"])
        # A path that names something decides, whatever the UUID says.
        beta = self.qvd.find(uuid=by_path["uuid"], path=self.beta)
        self.assertEqual(beta["identifier"], "com.example.beta")

    def test_find_of_what_is_not_there_is_an_error_reply(self):
        self.assertRefused(k.ERROR_NOT_FOUND, "Cannot locate PlugIn", self.qvd.find,
                           uuid=uuid.UUID(int=1))
        self.assertRefused(k.ERROR_NOT_FOUND, "Cannot locate PlugIn", self.qvd.find,
                           path=self.root + "/nothing.ovx")
        # Only a file URL names a bundle; a bare path in the request finds nothing.
        self.assertRefused(k.ERROR_NOT_FOUND, "Cannot locate PlugIn", self.qvd.request, "find",
                           {k.PATHS_KEY: self.alpha})

    # ---------------------------------------------------------------- annotations

    def test_annotate_shows_in_find_and_posts_a_notification(self):
        alpha = self.form_of(self.alpha)
        before = self.notifications()
        self.qvd.annotate([alpha], {"election": 1, "extension": {"colour": "red"}, "other": 5})
        self.assertEqual(self.form_of(self.alpha)["annotations"],
                         {"election": 1, "extension": {"colour": "red"}})
        self.assertEqual(self.notifications(), before + 1)
        elected = {"XOExtensionPointName": POINT, "XOUserElection": "1"}
        self.assertIn("com.example.alpha", self.identifiers(elected))
        # An unknown UUID is looked up by its parallel path.
        self.qvd.annotate([(self.alpha, uuid.UUID(int=2))], {"election": 0})
        self.assertEqual(self.form_of(self.alpha)["annotations"]["election"], 0)
        self.assertNotIn("com.example.alpha", self.identifiers(elected))
        self.assertRefused(k.ERROR_INVALID_REQUEST, "invalid request format (annotation election)",
                           self.qvd.annotate, [alpha], {"election": "1"})
        self.assertRefused(k.ERROR_INVALID_REQUEST, "no such plugin (uuid not found)",
                           self.qvd.annotate, [uuid.UUID(int=3)], {"election": 1})

    def test_bulk_annotate_replaces_the_extension_only(self):
        beta = self.form_of(self.beta)
        self.qvd.annotate([beta], {"election": 1, "extension": {"old": True}})
        self.qvd.bulk_annotate({beta["uuid"]: {"new": [1, 2]}})
        self.assertEqual(self.form_of(self.beta)["annotations"],
                         {"election": 1, "extension": {"new": [1, 2]}})
        self.assertRefused(k.ERROR_INVALID_VALUE, "annotations values must be dictionaries",
                           self.qvd.bulk_annotate, {beta["uuid"]: 1})
        self.assertRefused(k.ERROR_INVALID_VALUE, "invalid plug-in UUID value", self.qvd.request,
                           "bulk-annotate", {k.ANNOTATIONS_KEY: {"not-a-uuid": {}}})
        self.assertRefused(k.ERROR_REGISTRY_FAILURE, "no plug-in with the requested uuid",
                           self.qvd.bulk_annotate, {uuid.UUID(int=4): {}})

    # ---------------------------------------------------------------- holds

    def test_a_hold_hides_a_plug_in_until_released(self):
        rules = {"XOExtensionPointName": CLOCK_POINT}
        clock = self.form_of(self.clock)
        token = self.qvd.hold([self.clock])
        self.assertIsInstance(token, uuid.UUID)
        self.assertEqual(self.identifiers(rules), [])
        self.assertEqual(self.qvd.find(uuid=clock["uuid"])["identifier"], CLOCK_ID, "find sees it")
        self.assertRefused(k.ERROR_DENIED,
                           "access to plugin %s denied: the plug-in is on hold" % CLOCK_ID,
                           self.qvd.ready, [clock])
        self.qvd.release(token, uuid.UUID(int=5))
        self.assertEqual(self.identifiers(rules), [CLOCK_ID])

        # A hold ends with the connection that took it.
        with Client(root=self.root, timeout=10) as holder:
            holder.hold([self.clock])
            self.assertEqual(self.identifiers(rules), [])
        deadline = time.monotonic() + 5
        while not self.identifiers(rules) and time.monotonic() < deadline:
            time.sleep(0.02)
        self.assertEqual(self.identifiers(rules), [CLOCK_ID])

        self.assertRefused(k.ERROR_BAD_PATH, "absolute path required: relative", self.qvd.hold,
                           ["relative"])
        self.assertRefused(k.ERROR_BAD_PATH, "invalid path: /nonexistent/x.ovx", self.qvd.hold,
                           ["/nonexistent/x.ovx"])
        self.assertRefused(k.ERROR_BAD_PATH, "no plug-in at path:" + self.root, self.qvd.hold,
                           [self.root])

    # ---------------------------------------------------------------- activation

    def test_ready_and_access(self):
        alpha = self.form_of(self.alpha)
        self.qvd.ready([alpha], sync=True)
        self.assertRefused(
            k.ERROR_DENIED, "Transmission of environment variables requires the "
            "com.corvane.developer.quorvex.provide-environment host entitlement",
            self.qvd.ready, [alpha], environment={"A": "1"})
        tokens = self.qvd.access([alpha, self.form_of(self.beta)])
        self.assertEqual(len(tokens), 2)
        self.assertTrue(tokens[0].startswith("qvx1;") and self.alpha in tokens[0], tokens)
        self.assertTrue(self.beta in tokens[1], tokens)
        self.assertRefused(k.ERROR_INVALID_REQUEST, "invalid request format (uuid)",
                           self.qvd.request, "access", {})
        self.assertRefused(k.ERROR_INVALID_REQUEST, "invalid request (bad uuid array)",
                           self.qvd.request, "access", {k.UUIDS_KEY: ["text"]})

    # ---------------------------------------------------------------- installation

    def test_add_registers_and_remove_needs_the_manager_entitlement(self):
        late = write_bundle(self.root, "Late", "3.0", point="com.example.later")
        self.assertRefused(k.ERROR_NOT_FOUND, "Cannot locate PlugIn", self.qvd.find, path=late)
        self.qvd.add([late])
        self.assertEqual(self.qvd.find(path=late)["identifier"], "com.example.late")
        self.assertRefused(k.ERROR_DENIED, "caller lacks entitlement for this operation",
                           self.qvd.remove, [late])
        self.assertEqual(self.qvd.find(path=late)["identifier"], "com.example.late")
        self.assertRefused(k.ERROR_BAD_PATH, "invalid plugin path: " + self.root + "/gone.ovx",
                           self.qvd.add, [self.root + "/gone.ovx"])
        self.assertRefused(k.ERROR_REGISTRY_FAILURE, "unable to register plug-in at " + self.root,
                           self.qvd.add, [self.root])
        self.qvd.remove([])  # asks for the entitlement per path: none here
        self.qvd.bulk(0x7)

    # ---------------------------------------------------------------- envelope

    def test_envelope_errors(self):
        self.assertRefused(k.ERROR_INVALID_REQUEST, "unrecognized request", self.qvd.request, "nope")
        self.assertRefused(k.ERROR_INVALID_REQUEST, "invalid request format (missing type)",
                           self.qvd.request, 12)
        with Client(root=self.root, version=4, timeout=10) as newer:
            self.assertRefused(k.ERROR_VERSION_MISMATCH,
                               "unsupported protocol version 4 (current 3)", newer.bulk)
        with Client(root=self.root, version=2, timeout=10) as older:
            # Accepted, but forms travel only to version-3 clients.
            self.assertEqual(older.match({"XOExtensionPointName": CLOCK_POINT}), [])
            self.assertIsNone(older.find(path=self.clock))


if __name__ == "__main__":
    unittest.main()
