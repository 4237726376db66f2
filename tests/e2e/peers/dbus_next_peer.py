#!/usr/bin/python3
"""Lives through a session of the service at the given address, on dbus-next, and prints each answer."""

import asyncio
import sys

from dbus_next import Message, MessageType, Variant
from dbus_next.aio import MessageBus

LIMIT_SECONDS = 30


async def main():
    bus = await MessageBus(bus_address=sys.argv[1]).connect()

    async def answer(member, signature="", *arguments):
        return await bus.call(Message(destination="net.quillon.quietvox",
                                      path="/net/quillon/quietvox/ReportingService",
                                      interface="net.quillon.quietvox.ReportingService",
                                      member=member, signature=signature, body=list(arguments)))

    async def call(member, signature="", *arguments):
        reply = await asyncio.wait_for(answer(member, signature, *arguments), LIMIT_SECONDS)
        return reply.error_name if reply.message_type is MessageType.ERROR else tuple(reply.body)

    async def validity(reporter):
        dictionary = (await call("ReporterIDValid", "x", reporter))[0]
        return " ".join(f"{key} {variant.value}" for key, variant in sorted(dictionary.items()))

    print("create", *await call("CreateReportingSession", "x", 7))
    print("type", *await call("SetServiceType", "qx", 2, 7))
    print("type of 7 is", *await call("GetServiceNameForReporterID", "x", 7))
    print("type of 0 is", *await call("GetServiceNameForReporterID", "x", 0))
    print("configure", *await call("SetConfiguration", "a{sv}x",
                                   {"HostApplicationDisplayID": Variant("s", "net.example.peer"),
                                    "rate": Variant("u", 48000)}, 7))
    print("valid", await validity(7))
    print("invalid", await validity(8))
    print("all", *await call("GetAllReporters"))
    started = asyncio.ensure_future(answer("StartReportingSessionForID", "x", 7))
    # The task has to run to send its call before the next one.
    await asyncio.wait([started], timeout=0)
    print("send", await call("SendMessage", "a{sv}uqbax",
                             {"frames": Variant("t", 2**64 - 1), "load": Variant("d", 0.5),
                              "note": Variant("s", "ä b"), "on": Variant("b", True),
                              "deep": Variant("a{sv}", {"list": Variant("ai", [1, 2])})},
                             0x08000003, 1, False, [7]))
    print("broadcast", await call("SendMessage", "a{sv}uqbax", {"n": Variant("i", -1)},
                                  7, 0, True, []))
    print("bad arguments", await call("CreateReportingSession", "s", "seven"))
    print("bad member", await call("NoSuchMember"))
    print("started is unanswered", not started.done())
    print("stop", *await call("StopReportingSessionForID", "x", 7))
    print("started", *(await asyncio.wait_for(started, LIMIT_SECONDS)).body)
    print("destroy", *await call("DestroyReportingSession", "x", 7))
    print("all", *await call("GetAllReporters"))
    bus.disconnect()


asyncio.run(main())
