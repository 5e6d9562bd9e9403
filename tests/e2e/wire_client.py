#!/usr/bin/python3
"""A client of axd written from docs/wire-protocol.md alone, run as one journey against the real
daemon on a fresh device root: register a plug-in, discover it by a rule, read its form, elect
it, hold and release it, say goodbye.

Usage: wire_client.py AXD_EXECUTABLE. Exit status 0 when every check held."""

import os
import plistlib
import shutil
import signal
import socket
import struct
import subprocess
import sys
import tempfile
import time
import uuid

try:
    import cbor2
except ImportError:
    sys.exit("wire_client.py needs the Debian package python3-cbor2 (scripts/bootstrap installs it)")

SIGNED = 1096286208  # a signed integer, zero or positive
ENVELOPE = 1096286209  # a property-list envelope
REQUEST, REPLY, CONTROL = 1, 2, 4
SERVICE = "org.annexa.annexa.axd"
PLUGIN_ID = "org.example.wire.viewer"


class Signed(int):
    """An integer that came with the signed tag."""


def untag(decoder, tag):
    if tag.tag == SIGNED:
        return Signed(tag.value)
    if tag.tag == ENVELOPE:
        return tag.value
    return tag


class Client:
    def __init__(self, path):
        self.sock = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self.sock.connect(path)
        self.next_id = 1

    def send_frame(self, kind, frame_id, item):
        body = cbor2.dumps(item)
        self.sock.sendall(struct.pack(">IBQ", 9 + len(body), kind, frame_id) + body)

    def read_exactly(self, count):
        data = b""
        while len(data) < count:
            chunk = self.sock.recv(count - len(data))
            if not chunk:
                raise ConnectionError("the daemon closed the connection")
            data += chunk
        return data

    def request(self, request_type, **fields):
        frame_id = self.next_id
        self.next_id += 1
        self.send_frame(REQUEST, frame_id, dict(request=request_type, version=3, **fields))
        length, kind, reply_id = struct.unpack(">IBQ", self.read_exactly(13))
        item = cbor2.loads(self.read_exactly(length - 9), tag_hook=untag)
        check(kind == REPLY and reply_id == frame_id, f"reply frame {kind}/{reply_id}")
        return item

    def match(self, rules):
        reply = self.request("match", rules=rules, flags=0)
        check("errorcode" not in reply, f"match failed: {reply}")
        return reply["matches"]

    def goodbye(self):
        self.send_frame(CONTROL, 0, {"control": "goodbye"})
        self.sock.close()


failures = []


def check(condition, what):
    if not condition:
        failures.append(what)
        print("FAILED:", what, file=sys.stderr)
    return condition


def wire_uuid(text):
    """A UUID value for "uuids" from the text of a form's "uuid"."""
    return cbor2.CBORTag(37, uuid.UUID(text).bytes)


def write_plugin(root):
    app = os.path.join(root, "Applications", "Viewer.app")
    plugin = os.path.join(app, "PlugIns", "Viewer.appex")
    os.makedirs(plugin)
    with open(os.path.join(app, "Info.plist"), "wb") as f:
        plistlib.dump({"QFBundleIdentifier": "org.example.wire"}, f)
    with open(os.path.join(plugin, "Info.plist"), "wb") as f:
        plistlib.dump({
            "QFBundleIdentifier": PLUGIN_ID,
            "QFBundleShortVersionString": "1.0",
            "QSExtension": {
                "QSExtensionPointIdentifier": "org.example.wire.point",
                "QSExtensionProtocol": "ViewerProtocol",
                "QSExtensionAttributes": {"ContentType": "image/png"},
            },
        }, f)
    return plugin


def check_form(form, plugin):
    check(isinstance(form["uuid"], str) and len(form["uuid"]) == 36, "uuid is text")
    check(form["identifier"] == PLUGIN_ID, "identifier")
    check(form["version"] == "1.0", f"version is text: {form['version']!r}")
    check(form["path"] == plugin, "path")
    check(form["containingPath"] == os.path.dirname(os.path.dirname(plugin)), "containingPath")
    check(form["systemResident"] is False, "systemResident")
    hub = form["hubProtocolVersion"]
    check(isinstance(hub, int) and not isinstance(hub, Signed), "hubProtocolVersion unsigned")
    modified = form["lastmodified"]
    check(isinstance(modified, Signed) and abs(modified - time.time()) < 86400,
          f"lastmodified is signed seconds: {modified!r}")
    check(form["info"]["QSExtensionAttributes"]["ContentType"] == "image/png", "info")
    check(form["bundleInfo"]["QFBundleIdentifier"] == PLUGIN_ID, "bundleInfo")
    check(form["annotations"] == {}, "no annotations yet")


def journey(client, plugin):
    check(client.request("add", paths=[plugin]) == {}, "add")
    by_id = {"QSExtensionIdentifier": PLUGIN_ID}
    found = client.match(dict(by_id, ContentType="?UT-CONFORMS:image/*"))
    if not check(len(found) == 1, f"one form found: {found}"):
        return
    form = found[0]
    check_form(form, plugin)
    check(client.match(dict(by_id, ContentType="?UT-CONFORMS:application/*")) == [],
          "an image is no application/*")

    uuids = [wire_uuid(form["uuid"])]
    check(client.request("annotate", uuids=uuids, annotations={"election": 1}) == {}, "elect")
    extension = {"note": "from python"}
    check(client.request("annotate", uuids=uuids, annotations={"extension": extension}) == {},
          "annotate extension")
    wrong = client.request("annotate", uuids=uuids, annotations={"election": "2"})
    check(wrong.get("errorcode") == 4, f"a string election is refused: {wrong}")
    elected = client.match(dict(by_id, QSUserElection="1"))
    check(len(elected) == 1 and elected[0]["annotations"] == {"election": 1, "extension": extension},
          f"the annotations merge: {elected}")

    held = client.request("lock", paths=[plugin], flags=2)
    token = held.get("uuids")
    check(isinstance(token, uuid.UUID), f"a hold token: {held}")
    check(client.match(by_id) == [], "a held plug-in is not discovered")
    refused = client.request("ready", uuids=uuids, flags=0)
    check(refused.get("errorcode") == 11, f"a held plug-in cannot be made ready: {refused}")
    check(client.request("lock", uuids=[token]) == {}, "release")
    check(len(client.match(by_id)) == 1, "released, it is discovered again")


def start_daemon(axd, root):
    socket_path = os.path.join(root, "run", "zyn", SERVICE)
    env = dict(os.environ, ANNEXA_ROOT=root, AXD_LOG="stderr")
    log = open(os.path.join(root, "axd.log"), "wb")
    daemon = subprocess.Popen([axd], env=env, stderr=log)
    for _ in range(1000):
        if daemon.poll() is not None:
            sys.exit(f"axd exited with status {daemon.returncode}")
        try:
            return daemon, Client(socket_path)
        except (FileNotFoundError, ConnectionRefusedError):
            time.sleep(0.01)
    daemon.kill()
    sys.exit("axd did not listen at " + socket_path)


def main():
    if len(sys.argv) != 2:
        sys.exit(__doc__)
    root = os.path.realpath(tempfile.mkdtemp(prefix="axd-wire-"))
    daemon, client = start_daemon(sys.argv[1], root)
    try:
        journey(client, write_plugin(root))
        client.goodbye()
    finally:
        daemon.send_signal(signal.SIGTERM)
        daemon.wait()
    if failures:
        print(open(os.path.join(root, "axd.log")).read(), file=sys.stderr)
        sys.exit(f"{len(failures)} check(s) failed")
    shutil.rmtree(root)


if __name__ == "__main__":
    main()
