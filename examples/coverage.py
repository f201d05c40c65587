#!/usr/bin/python3
"""Prints what the coverage agent knows of every device, without any download.

Needs Debian's python3-dbus. The interpreter is the client: grant com.tarsil.private.kvragent to it.
"""
import os
import sys

import dbus

CACHE_ONLY = dbus.UInt64(1)
AGENT, PATH, INTERFACE = "com.tarsil.kvragent", "/com/tarsil/kvragent", "com.tarsil.kvragent.KVRAgentProtocol"

try:
    agent = dbus.Interface(dbus.SessionBus().get_object(AGENT, PATH), INTERFACE)
    infos = agent.GetAllDeviceInfosUsingPolicy(CACHE_ONLY, False)
except dbus.DBusException as error:
    if error.get_dbus_name() != "org.freedesktop.DBus.Error.AccessDenied":
        sys.exit(f"{error.get_dbus_message()}; kvrctl doctor finds the reason")
    entitlements = os.environ.get("KVR_DEVICE_ROOT", "/var/lib/kvragent/device") + "/Entitlements.plist"
    sys.exit(f"""{error.get_dbus_message()}; add this to the dictionary in {entitlements}:
    <key>{os.path.realpath("/proc/self/exe")}</key>
    <dict><key>com.tarsil.private.kvragent</key><true/></dict>
It grants the entitlement to every program that this interpreter runs.""")

for info in infos:
    device = info["device"]
    warranty = info.get("warranty", {}).get("DictionaryRepresentation", {})
    covered = "covered" if warranty.get("covered") else "not covered, as far as is known"
    print(f"{device.get('name', 'unnamed')}: {covered}")
