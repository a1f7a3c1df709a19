// glyphwell-bus-bridge: serves the session bus's font-install requests
// (org.freedesktop.PackageKit's Modify2 and Modify InstallFontconfigResources) by asking the
// agent to download catalog fonts.
//
// The bridge owns the name only when nobody else provides it: when another connection owns it,
// or a D-Bus service file on the bus's search path provides it, the bridge logs one line and
// ends with status 0. It never queues for the name nor replaces its owner, lets a provider that
// asks take it over (and then ends), and gives it up on SIGTERM and SIGINT. Every font request
// gets the success reply at once, before any work; the other methods of the two interfaces get
// org.freedesktop.DBus.Error.NotSupported.
#pragma once

/// The bus name the bridge serves.
inline constexpr char kQZFontInstallBusName[] = "org.freedesktop.PackageKit";

/// Runs the bridge on the session bus ($DBUS_SESSION_BUS_ADDRESS) until it is stopped or loses
/// its name; the process's exit status: 0 after a normal end or when the name is provided by
/// someone else, 1 when the bus cannot be used.
int QZRunBusBridge();
