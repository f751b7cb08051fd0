#!/usr/bin/python3
"""Reports a recording of half a second over plain D-Bus, with GLib's main loop and without our library.

    sudo apt-get install python3-gi
    ./report.py
"""

import os
import sys

import gi

gi.require_version("Gio", "2.0")
from gi.repository import Gio, GLib  # noqa: E402

NAME = "com.tarno.halvox.reporting"
OBJECT = "/com/tarno/halvox/reporting"
INTERFACE = "com.tarno.halvox.HVReportingServiceProtocol"
SESSION = 1
TELEPHONY = 2  # service type
RECORD = 0x08000000 | 2  # the domain Session and the category Record
START, STOP = 1, 2  # types of messages


def socket_path():
    """The service's socket: the one that is named, else the user's, else the system's."""
    user = os.path.join(os.environ.get("XDG_RUNTIME_DIR", "/nonexistent"), "halvox/reporting.sock")
    system = "/run/halvox/reporting.sock"
    return os.environ.get("HALVOX_SOCKET") or (user if os.path.exists(user) else system)


class Recorder:
    def __init__(self, loop):
        self._loop = loop
        flags = Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT | Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION
        self._connection = Gio.DBusConnection.new_for_address_sync(
            f"unix:path={Gio.dbus_address_escape_value(socket_path())}", flags, None, None)

    def _call(self, member, signature, *arguments):
        self._connection.call_sync(NAME, OBJECT, INTERFACE, member, GLib.Variant(signature, arguments),
                                   None, Gio.DBusCallFlags.NONE, 5000, None)

    def _send(self, message, kind):
        # The inner list names the session. An empty outer list would mean all started sessions.
        self._call("sendMessage", "(a{sv}uqaax)", message, RECORD, kind, [[SESSION]])

    def begin(self):
        self._call("createReportingSession", "(x)", SESSION)
        self._call("setServiceType", "(qx)", TELEPHONY, SESSION)
        self._call("setConfiguration", "(a{sv}x)",
                   {"HostApplicationDisplayID": GLib.Variant("s", "com.example.recorder")}, SESSION)
        # The answer to a start comes when the session is stopped: do not wait for it here.
        self._connection.call(NAME, OBJECT, INTERFACE, "startReportingSessionForID",
                              GLib.Variant("(x)", (SESSION,)), None, Gio.DBusCallFlags.NONE, GLib.MAXINT32,
                              None, self._on_stopped)
        self._send({"sample_rate": GLib.Variant("d", 16000.0)}, START)

    def end(self):
        self._send({"seconds": GLib.Variant("d", 0.5)}, STOP)
        self._call("stopReportingSessionForID", "(x)", SESSION)
        return GLib.SOURCE_REMOVE

    def _on_stopped(self, connection, answer):
        connection.call_finish(answer)
        print("reported")
        self._loop.quit()


def main():
    loop = GLib.MainLoop()
    try:
        recorder = Recorder(loop)
        recorder.begin()
    except GLib.Error as error:
        sys.exit(f"report.py: {error.message}")
    GLib.timeout_add(500, recorder.end)
    loop.run()


if __name__ == "__main__":
    main()
