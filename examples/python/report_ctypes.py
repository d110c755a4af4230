#!/usr/bin/python3
"""Sends one event to the reporting daemon through the C library, with ctypes and nothing else.

Use: report_ctypes.py [SOCKET]; the environment's LD_LIBRARY_PATH may name where libtally.so.1 is.
"""

import ctypes
import json
import sys
import threading

DEFAULT_TIMEOUT = -1
CALLBACK = ctypes.CFUNCTYPE(None, ctypes.c_void_p, ctypes.c_void_p)
POINTER, TEXT, TIME, STATUS = ctypes.c_void_p, ctypes.c_char_p, ctypes.c_int64, ctypes.c_int32


def declare(library, name, result, *arguments):
    function = getattr(library, name)
    function.restype = result
    function.argtypes = arguments
    return function


class Tally:
    """The few functions that this example needs."""

    def __init__(self):
        library = ctypes.CDLL("libtally.so.1")
        self.last_error = declare(library, "tally_last_error", TEXT)
        self.options_new = declare(library, "tally_options_new", POINTER)
        self.options_free = declare(library, "tally_options_free", None, POINTER)
        self.set_socket_path = declare(library, "tally_options_set_socket_path", STATUS, POINTER, TEXT)
        self.connect = declare(library, "tally_connect", POINTER, POINTER)
        self.disconnect = declare(library, "tally_disconnect", None, POINTER)
        self.from_json = declare(library, "tally_value_from_json", POINTER, TEXT)
        self.set_date = declare(library, "tally_dictionary_set_date", STATUS, POINTER, TEXT, ctypes.c_double)
        self.value_free = declare(library, "tally_value_free", None, POINTER)
        self.reply_error = declare(library, "tally_reply_error", TEXT, POINTER)
        self.reply_text = declare(library, "tally_reply_text", TEXT, POINTER)
        self.reply_free = declare(library, "tally_reply_free", None, POINTER)
        self.set_session_info = declare(library, "tally_set_session_info", POINTER, POINTER, POINTER, POINTER,
                                        POINTER, ctypes.c_size_t, TIME)
        self.start_config = declare(library, "tally_start_config", POINTER, POINTER, TIME)
        self.send_message_async = declare(library, "tally_send_message_async", STATUS, POINTER, ctypes.c_uint16,
                                          ctypes.c_uint16, POINTER, TIME, CALLBACK, POINTER)

    def check(self, reply):
        """Gives the reply back and raises what it says."""
        error = self.reply_error(reply)
        self.reply_free(reply)
        if error:
            raise RuntimeError(error.decode())


def report(tally, connection):
    info = tally.from_json(json.dumps({"SessionID": 1004, "ClientType": 5}).encode())
    tally.check(tally.set_session_info(connection, info, None, None, 0, DEFAULT_TIMEOUT))
    tally.value_free(info)
    tally.check(tally.start_config(connection, DEFAULT_TIMEOUT))

    answered = threading.Event()
    errors = []

    @CALLBACK  # Must live until it was called.
    def when_sent(reply, _context):
        error = tally.reply_error(reply)
        if error:
            errors.append(error.decode())
        answered.set()

    event = tally.from_json(json.dumps({"from": "ctypes", "stops": 2}).encode())
    tally.set_date(event, b"departed", 1.5)
    status = tally.send_message_async(connection, 3, 0, event, DEFAULT_TIMEOUT, when_sent, None)
    tally.value_free(event)
    if status != 0:
        raise RuntimeError(tally.last_error().decode())
    answered.wait()
    if errors:
        raise RuntimeError(errors[0])


def main():
    tally = Tally()
    options = tally.options_new()
    if len(sys.argv) > 1:
        tally.set_socket_path(options, sys.argv[1].encode())
    connection = tally.connect(options)
    tally.options_free(options)
    if not connection:
        raise SystemExit(tally.last_error().decode())
    try:
        report(tally, connection)
    finally:
        tally.disconnect(connection)
    print("reported")


if __name__ == "__main__":
    main()
