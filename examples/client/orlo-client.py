#!/usr/bin/python3
"""orlo-client.py export [CLASS...] | certificate | pair URL

Talks to the service as any program can, on the bus that VELTRA_BUS names: exports the identities of the device's components,
reads the top module's certificate, or pairs with the server at URL and shows what the service logs meanwhile.
"""
import os
import sys

import dbus
import dbus.mainloop.glib
from gi.repository import GLib

NAME = "com.tevari.VeltraOrloServices"
PATH = "/com/tevari/VeltraOrloServices"
INTERFACE = "com.tevari.VeltraPluginServer"
LEVELS = {1: "default", 2: "info", 3: "debug", 4: "error"}


def open_bus():
    """The bus for the service's own variable, with signals and replies delivered by GLib's loop."""
    loop = dbus.mainloop.glib.DBusGMainLoop(set_as_default=True)
    chosen = os.environ.get("VELTRA_BUS") or "system"
    if chosen in ("system", "session"):
        return dbus.SystemBus() if chosen == "system" else dbus.SessionBus()
    return dbus.bus.BusConnection(chosen, mainloop=loop)


def request(bus, command, arguments, on_message=None):
    """The service's response; raises dbus.DBusException when there is none. `on_message` is called with the level, the
    source and the text of each line that the service logs for this request."""
    contents = {"messageStr": command, "messageDict": dbus.Dictionary(arguments, signature="sv")}
    if on_message:
        contents["messages"] = True
        bus.add_signal_receiver(on_message, "Message", INTERFACE, NAME, PATH)
    loop, outcome = GLib.MainLoop(), []

    def end(*answer):
        outcome.extend(answer)
        loop.quit()

    service = dbus.Interface(bus.get_object(NAME, PATH, introspect=False), INTERFACE)
    service.HandleMessage(dbus.Dictionary(contents, signature="sv"), reply_handler=end, error_handler=end,
                          timeout=3600)  # pairing may take minutes
    loop.run()
    if isinstance(outcome[0], Exception):
        raise outcome[0]
    return outcome[1]


def show(level, source, text):
    print(f"{LEVELS[level]:8}{source}: {text}", flush=True)


def main(verb="--help", *words):
    requests = {
        "export": ("OrloExport", {"ExportList": dbus.Array(words, signature="s")} if words else {}, None),
        "certificate": ("getTCRT", {}, None),
        "pair": ("corvoSCPair", {"waftonUrl": " ".join(words)}, show),
    }
    if verb not in requests:
        print(__doc__, file=sys.stderr)
        return 2
    try:
        response = request(open_bus(), *requests[verb])
    except dbus.DBusException as failure:
        print(failure.get_dbus_message(), file=sys.stderr)
        return 3
    for key, value in response.get("response", {}).items():
        print(f"{key}: {value}")
    if response["statusCode"] != 0:
        print(response.get("error", {}).get("description", "The service gives no reason."), file=sys.stderr)
    return 0 if response["statusCode"] == 0 else 1


if __name__ == "__main__":
    sys.exit(main(*sys.argv[1:]))
