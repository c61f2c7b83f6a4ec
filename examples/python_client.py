#!/usr/bin/python3
"""Sends a message to veskreportingd using only its D-Bus interface.

There is no message bus: the connection goes to the daemon's own socket, and messages name no destination.
docs/wire.md describes the members. Needs GLib's D-Bus (Debian: python3-gi).

Exit status: 0 if the daemon has taken the message, 1 if something failed, 2 for wrong usage.
"""

import argparse
import os
import sys

from gi.repository import Gio, GLib

SOCKET = "/run/veskreportingd/com.corvane.veskreportingd"
OBJECT = "/com/corvane/veskreportingd/session"
INTERFACE = "com.corvane.veskreportingd.ClientSessionInterface"
TIMEOUT_MS = 30_000


class Session:
    """A session with the daemon, which lasts as long as the connection."""

    def __init__(self, socket):
        self._connection = Gio.DBusConnection.new_for_address_sync(
            "unix:path=" + Gio.dbus_address_escape_value(socket),
            Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT, None, None)

    def call(self, member, signature="()", arguments=()):
        """Calls a method and returns the values of its answer."""
        answer = self._connection.call_sync(
            None, OBJECT, INTERFACE, member, GLib.Variant(signature, arguments), None,
            Gio.DBusCallFlags.NONE, TIMEOUT_MS, None)
        return answer.unpack()

    def configure(self, session_info, user_info):
        self.call("setSessionInfo", "(a{sv}aa{sv}asb)", (session_info, [user_info], [], False))

    def start(self):
        """Returns the names of the enabled backends, or None if there is no storebag for the client type."""
        names, = self.call("startConfigWithCompletionHandler")
        return names[0] if names else None

    def send(self, category, message_type, payload):
        """Returns the backends' answer, or None. Optional values are sent as a list of at most one element."""
        results, = self.call("sendMessageWithCategory", "(qqaa{sv})", (category, message_type, [payload]))
        return results[0] if results else None

    def close(self):
        self._connection.close_sync(None)


def default_socket():
    return os.environ.get("VESKREPORTINGD_ROOT", "").rstrip("/") + SOCKET


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--socket", default=default_socket(), help="the daemon's socket (default: %(default)s)")
    parser.add_argument("--client-type", type=int, default=5, help="selects the storebag (default: %(default)s)")
    parser.add_argument("--client-name", default="Camera", help="on whose behalf to report (default: %(default)s)")
    parser.add_argument("--text", default="hello from Python", help="goes into the message (default: %(default)s)")
    options = parser.parse_args()

    try:
        session = Session(options.socket)
        session.configure({"sessionID": GLib.Variant("u", os.getpid()),
                           "clientType": GLib.Variant("i", options.client_type),
                           "clientVersion": GLib.Variant("u", 1),
                           # so that consent, sampling and filters apply
                           "requireUserInfo": GLib.Variant("b", True)},
                          {"clientName": GLib.Variant("s", options.client_name)})
        backends = session.start()
        if backends is None:
            sys.exit(f"no storebag for client type {options.client_type}")
        print("enabled backends:", ", ".join(backends) or "none")
        answer = session.send(3, 1, {"text": GLib.Variant("s", options.text), "number": GLib.Variant("x", -1),
                                     "nested": GLib.Variant("a{sv}", {"true": GLib.Variant("b", True)})})
        print("message:", answer or "accepted")
        session.close()
    except GLib.Error as error:
        sys.exit(f"{options.socket}: {error.message}")


if __name__ == "__main__":
    main()
