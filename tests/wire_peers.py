"""Other D-Bus implementations as clients of a service that answers `echo` with the value it received.

Usage: wire_peers.py SOCKET"""
import sys

import dbus
import dbus.connection
from gi.repository import Gio, GLib

ADDRESS = "unix:path=" + sys.argv[1]
OBJECT, INTERFACE = "/test", "test.Interface"

# Each type, a value of it, and the echoed value: integers grow to 64 bits, structures become lists.
CASES = [
    ("y", 255, 255), ("b", True, True), ("n", -2**15, -2**15), ("q", 2**16 - 1, 2**16 - 1),
    ("i", -2**31, -2**31), ("u", 2**32 - 1, 2**32 - 1), ("x", -2**63, -2**63), ("t", 2**64 - 1, 2**64 - 1),
    ("d", -0.5, -0.5), ("s", "h\u00e9llo", "h\u00e9llo"), ("o", "/a/b", "/a/b"), ("g", "a{sv}", "a{sv}"),
    ("ay", [0, 255], [0, 255]), ("as", ["a", ""], ["a", ""]), ("ai", [], []), ("ad", [1.5, 2.5], [1.5, 2.5]),
    ("(is)", (1, "x"), [1, "x"]), ("a(yt)", [(1, 2), (3, 4)], [[1, 2], [3, 4]]),
    ("a{ss}", {"k": "v", "": "w"}, {"k": "v", "": "w"}), ("a{su}", {"k": 7}, {"k": 7}), ("a{yx}", {1: -1}, [[1, -1]]),
    ("aa{si}", [{"a": 1}, {}], [{"a": 1}, {}]),
]


def plain(value):
    """Converts the types of dbus-python to plain ones."""
    if isinstance(value, dict):
        return {str(key): plain(item) for key, item in value.items()}
    if isinstance(value, (list, tuple)):
        return [plain(item) for item in value]
    if isinstance(value, bool):
        return value
    for kind in (int, float, str):
        if isinstance(value, kind):
            return kind(value)
    raise TypeError(type(value))


def check(what, got, expected):
    if got != expected:
        sys.exit(f"{what}: {got!r} in place of {expected!r}")


def through_gio():
    connection = Gio.DBusConnection.new_for_address_sync(
        ADDRESS, Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT, None, None)
    for order in (Gio.DBusMessageByteOrder.LITTLE_ENDIAN, Gio.DBusMessageByteOrder.BIG_ENDIAN):
        for signature, value, expected in CASES:
            message = Gio.DBusMessage.new_method_call(None, OBJECT, INTERFACE, "echo")
            message.set_byte_order(order)
            message.set_body(GLib.Variant("(v)", (GLib.Variant(signature, value),)))
            answer, _ = connection.send_message_with_reply_sync(message, Gio.DBusSendMessageFlags.NONE, -1, None)
            answer.to_gerror()
            check(f"GIO, {order}, {signature}", plain(answer.get_body().unpack()[0]), [expected])
    message = Gio.DBusMessage.new_method_call(None, OBJECT, "org.freedesktop.DBus.Properties", "Get")
    message.set_body(GLib.Variant("(ss)", (INTERFACE, "none")))
    answer, _ = connection.send_message_with_reply_sync(message, Gio.DBusSendMessageFlags.NONE, -1, None)
    check("Get", answer.get_error_name(), "org.freedesktop.DBus.Error.UnknownProperty")


def through_libdbus():
    connection = dbus.connection.Connection(ADDRESS)
    service = connection.get_object(None, OBJECT, introspect=False)
    for signature, value, expected in CASES:
        boxed = {"a": dbus.Array, "(": dbus.Struct}.get(signature[0])
        if signature.startswith("a{"):
            boxed, inner = dbus.Dictionary, signature[2:-1]
        else:
            inner = signature[1:-1] if signature[0] == "(" else signature[1:]
        value = boxed(value, signature=inner, variant_level=1) if boxed else {
            "y": dbus.Byte, "b": dbus.Boolean, "n": dbus.Int16, "q": dbus.UInt16, "i": dbus.Int32, "u": dbus.UInt32,
            "x": dbus.Int64, "t": dbus.UInt64, "d": dbus.Double, "s": dbus.String, "o": dbus.ObjectPath,
            "g": dbus.Signature}[signature](value, variant_level=1)
        answer = connection.call_blocking(None, OBJECT, INTERFACE, "echo", "v", (value,))
        check(f"libdbus, {signature}", plain(answer), [bool(expected) if signature == "b" else expected])
    peer = dbus.Interface(service, "org.freedesktop.DBus.Peer")
    peer.Ping()
    check("GetAll", dict(dbus.Interface(service, "org.freedesktop.DBus.Properties").GetAll(INTERFACE)), {})
    if INTERFACE not in dbus.Interface(service, "org.freedesktop.DBus.Introspectable").Introspect():
        check("Introspect", None, INTERFACE)


through_gio()
through_libdbus()
