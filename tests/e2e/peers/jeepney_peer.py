#!/usr/bin/python3
"""Lives through a session of the service at the given address, on jeepney, and prints each answer."""

import sys

from jeepney import DBusAddress, MessageType, new_method_call
from jeepney.io.blocking import open_dbus_connection

LIMIT_SECONDS = 30
SERVICE = DBusAddress("/net/quillon/quietvox/ReportingService",
                      bus_name="net.quillon.quietvox",
                      interface="net.quillon.quietvox.ReportingService")

connection = open_dbus_connection(bus=sys.argv[1])
replies = {}


def post(member, signature=None, *arguments):
    message = new_method_call(SERVICE, member, signature, arguments)
    serial = next(connection.outgoing_serial)
    connection.send(message, serial=serial)
    return serial


def reply(serial):
    while serial not in replies:
        message = connection.receive(timeout=LIMIT_SECONDS)
        # The first of two replies counts.
        replies.setdefault(message.header.fields[5], message)
    return replies.pop(serial)


def call(member, signature=None, *arguments):
    message = reply(post(member, signature, *arguments))
    if message.header.message_type is MessageType.error:
        return message.header.fields[4]
    return message.body


def validity(reporter):
    answer = call("ReporterIDValid", "x", reporter)[0]
    return " ".join(f"{key} {value}" for key, (_, value) in sorted(answer.items()))


print("create", *call("CreateReportingSession", "x", 7))
print("type", *call("SetServiceType", "qx", 2, 7))
print("type of 7 is", *call("GetServiceNameForReporterID", "x", 7))
print("type of 0 is", *call("GetServiceNameForReporterID", "x", 0))
print("configure", *call("SetConfiguration", "a{sv}x",
                         {"HostApplicationDisplayID": ("s", "net.example.peer"),
                          "rate": ("u", 48000)}, 7))
print("valid", validity(7))
print("invalid", validity(8))
print("all", *call("GetAllReporters"))
started = post("StartReportingSessionForID", "x", 7)
print("send", call("SendMessage", "a{sv}uqbax",
                   {"frames": ("t", 2**64 - 1), "load": ("d", 0.5), "note": ("s", "ä b"),
                    "on": ("b", True), "deep": ("a{sv}", {"list": ("ai", [1, 2])})},
                   0x08000003, 1, False, [7]))
print("broadcast", call("SendMessage", "a{sv}uqbax", {"n": ("i", -1)}, 7, 0, True, []))
print("bad arguments", call("CreateReportingSession", "s", "seven"))
print("bad member", call("NoSuchMember"))
print("started is unanswered", started not in replies)
print("stop", *call("StopReportingSessionForID", "x", 7))
print("started", *reply(started).body)
print("destroy", *call("DestroyReportingSession", "x", 7))
print("all", *call("GetAllReporters"))
connection.close()
