#!/usr/bin/python3
"""Sends one event to the reporting daemon with nothing but a D-Bus library (Debian: python3-dbus).

The daemon speaks D-Bus peer to peer on its socket: there is no bus, no name to ask for and nothing to install.

Use: report_dbus.py [SOCKET]
"""

import os
import sys

import dbus
import dbus.connection

PATH = "/com/quillon/tallyd"
INTERFACE = "com.quillon.tallyd.ClientSessionInterface"
SOCKET = os.environ.get("TALLY_ROOT", "") + "/run/tallyd/com.quillon.tallyd"


def some(dictionary):
    """What may be missing travels in an array: empty for nothing, else with the value as its only element."""
    return dbus.Array([dbus.Dictionary(dictionary, signature="sv")], signature="a{sv}")


NOTHING = dbus.Array([], signature="a{sv}")


class Session:
    def __init__(self, socket):
        self._connection = dbus.connection.Connection("unix:path=" + socket)

    def call(self, method, signature="", *arguments, timeout=30.0):
        return self._connection.call_blocking(
            None, PATH, INTERFACE, method, signature, arguments, timeout=timeout)

    def close(self):
        self._connection.close()


def main():
    session = Session(sys.argv[1] if len(sys.argv) > 1 else SOCKET)
    info = some({"SessionID": dbus.UInt32(1003), "ClientType": dbus.Int32(5)})
    session.call("SetSessionInfo", "aa{sv}aa{sv}as", info, NOTHING, dbus.Array([], signature="s"))
    states = session.call("StartConfig")
    print("reporting backends:", ", ".join(states[0]) if states else "none")
    event = some({
        "from": "Python",
        "departed": dbus.Struct((1.5,), signature="d"),  # A date: seconds since 1970.
        "stops": 2,
    })
    session.call("SendMessageWithCategory", "qqaa{sv}", dbus.UInt16(3), dbus.UInt16(0), event)
    session.call("FlushMessages")
    session.close()
    print("reported")


if __name__ == "__main__":
    main()
