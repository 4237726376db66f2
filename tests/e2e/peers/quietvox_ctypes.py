"""A program that reports through the C interface by foreign-function calls alone.

usage: quietvox_ctypes.py LIBRARY

Where the service is, the environment says (QUIETVOX_SOCKET and the directories of the switch). Prints
what the library answers, line by line.
"""

import ctypes
import sys

PLAYBACK = 0x08000003


class Counters(ctypes.Structure):
    """QuietVoxCounters."""

    _fields_ = [("size", ctypes.c_size_t)] + [
        (name, ctypes.c_uint64)
        for name in ("sent", "droppedQueueFull", "droppedDisabled", "droppedConnectionLost",
                     "droppedRefused", "droppedInvalid", "connections", "queuedMessages",
                     "queuedBytes")]


DROPPED = ctypes.CFUNCTYPE(None, ctypes.c_void_p, ctypes.POINTER(Counters))


class Options(ctypes.Structure):
    """QuietVoxReporterOptions."""

    _fields_ = [("size", ctypes.c_size_t),
                ("socketPath", ctypes.c_char_p),
                ("configurationDirectory", ctypes.c_char_p),
                ("runtimeDirectory", ctypes.c_char_p),
                ("maximumQueuedBytes", ctypes.c_uint64),
                ("maximumQueuedMessages", ctypes.c_uint64),
                ("flags", ctypes.c_uint32),
                ("shortestReconnectDelay", ctypes.c_uint32),
                ("longestReconnectDelay", ctypes.c_uint32),
                ("endTimeLimit", ctypes.c_uint32),
                ("realtimePeriod", ctypes.c_uint32),
                ("dropReportInterval", ctypes.c_uint32),
                ("dropped", DROPPED),
                ("context", ctypes.c_void_p)]


def load(path):
    """The library, with the types that are not int."""
    library = ctypes.CDLL(path)
    pointer = ctypes.c_void_p
    library.quietvox_error_text.restype = ctypes.c_char_p
    library.quietvox_payload_new.restype = pointer
    library.quietvox_realtime_begin.restype = pointer
    library.quietvox_session_reporter_id.restype = ctypes.c_int64
    for name, types in {
            "reporter_flush": [pointer, ctypes.c_uint32],
            "reporter_counters": [pointer, ctypes.POINTER(Counters)],
            "reporter_is_reporting_enabled": [pointer],
            "reporter_close": [pointer],
            "session_open": [pointer, ctypes.c_int64, ctypes.c_uint16, ctypes.POINTER(pointer)],
            "session_reporter_id": [pointer],
            "session_configure": [pointer, pointer],
            "session_start": [pointer],
            "session_send": [pointer, pointer, ctypes.c_uint32, ctypes.c_uint16],
            "session_stop": [pointer],
            "session_destroy": [pointer],
            "realtime_open": [pointer, ctypes.c_size_t, ctypes.c_size_t, ctypes.POINTER(pointer)],
            "realtime_begin": [pointer],
            "realtime_commit": [pointer, ctypes.c_uint32, ctypes.c_uint16],
            "realtime_close": [pointer],
            "payload_clear": [pointer],
            "payload_error": [pointer],
            "payload_free": [pointer],
            "payload_set_int": [pointer, ctypes.c_char_p, ctypes.c_int64],
            "payload_set_double": [pointer, ctypes.c_char_p, ctypes.c_double],
            "payload_set_string": [pointer, ctypes.c_char_p, ctypes.c_char_p],
            "payload_begin_array": [pointer, ctypes.c_char_p],
            "payload_end_array": [pointer]}.items():
        getattr(library, "quietvox_" + name).argtypes = types
    return library


def main():
    library = load(sys.argv[1])

    def say(what, error):
        print(what, library.quietvox_error_text(error).decode())

    drops = []
    callback = DROPPED(lambda _, counters: drops.append(counters.contents.droppedInvalid))
    options = Options(size=ctypes.sizeof(Options), endTimeLimit=5000, dropped=callback)
    reporter = ctypes.c_void_p()
    say("open", library.quietvox_reporter_open(ctypes.byref(options), ctypes.byref(reporter)))
    print("enabled", library.quietvox_reporter_is_reporting_enabled(reporter))
    session = ctypes.c_void_p()
    say("session", library.quietvox_session_open(reporter, 7, 2, ctypes.byref(session)))
    print("reporter", library.quietvox_session_reporter_id(session))

    payload = library.quietvox_payload_new()
    library.quietvox_payload_set_string(payload, b"HostApplicationDisplayID", b"net.example.ctypes")
    say("configure", library.quietvox_session_configure(session, payload))
    say("start", library.quietvox_session_start(session))
    library.quietvox_payload_clear(payload)
    library.quietvox_payload_set_int(payload, b"frames", 480)
    library.quietvox_payload_begin_array(payload, b"levels")
    library.quietvox_payload_set_double(payload, None, -3.5)
    say("open array", library.quietvox_session_send(session, payload, PLAYBACK, 1))
    library.quietvox_payload_end_array(payload)
    say("send", library.quietvox_session_send(session, payload, PLAYBACK, 1))

    queue = ctypes.c_void_p()
    say("queue", library.quietvox_realtime_open(session, 16, 256, ctypes.byref(queue)))
    message = library.quietvox_realtime_begin(queue)
    library.quietvox_payload_set_int(message, b"frames", 960)
    say("commit", library.quietvox_realtime_commit(queue, PLAYBACK, 0))
    say("stop", library.quietvox_session_stop(session))
    say("flush", library.quietvox_reporter_flush(reporter, 60000))
    counters = Counters(size=ctypes.sizeof(Counters))
    say("counters", library.quietvox_reporter_counters(reporter, ctypes.byref(counters)))
    print("sent", counters.sent, "invalid", counters.droppedInvalid)
    library.quietvox_payload_free(payload)
    library.quietvox_realtime_close(queue)
    library.quietvox_session_destroy(session)
    library.quietvox_reporter_close(reporter)
    print("told of", sum(drops))
    say("nothing", library.quietvox_session_start(None))


main()
