#!/usr/bin/env python3
"""Prints what the coverage agent knows of every device, without any download.

Needs dbus-python. The interpreter is the client: grant com.tarsil.private.kvragent to it.
"""
import dbus

agent = dbus.Interface(
    dbus.SessionBus().get_object("com.tarsil.kvragent", "/com/tarsil/kvragent"),
    "com.tarsil.kvragent.KVRAgentProtocol",
)
CACHE_ONLY = dbus.UInt64(1)

for info in agent.GetAllDeviceInfosUsingPolicy(CACHE_ONLY, False):
    device = info["device"]
    warranty = info.get("warranty", {}).get("DictionaryRepresentation", {})
    covered = "covered" if warranty.get("covered") else "not covered, as far as is known"
    print(f"{device.get('name', 'unnamed')}: {covered}")
