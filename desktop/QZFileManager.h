// Revealing files in the desktop's file manager through the freedesktop FileManager1 interface on
// the session bus. Two calls, in this order: an activation (an Introspect call to the service,
// which makes the bus start the file manager when it is not running yet, and whose answer says
// that it is up), then ShowItems with the files' URIs. Neither answer is waited for by the
// caller: the calls go out on the event loop, and failures change nothing but a log line.
#pragma once

#include <QDBusConnection>
#include <QString>
#include <QStringList>

inline constexpr char kQZFileManagerService[] = "org.freedesktop.FileManager1";
inline constexpr char kQZFileManagerPath[] = "/org/freedesktop/FileManager1";
inline constexpr char kQZFileManagerInterface[] = "org.freedesktop.FileManager1";

/// The session bus at the address that DBUS_SESSION_BUS_ADDRESS holds now; when it is unset or
/// empty, QDBusConnection::sessionBus() (the platform's default address). Unlike
/// QDBusConnection::sessionBus(), which keeps the address of its first use, a changed address
/// gives a connection to the new bus. The connection may be disconnected when there is no bus.
QDBusConnection QZCurrentSessionBus();

/// Activates the file manager and, once the activation has answered (successfully or not), asks
/// it to show `uris` (file URIs, in order) with `startupId` as the startup notification id
/// (empty: none). Returns at once; the calls are carried by `bus`'s event loop. With no
/// connection to the bus, logs one line and does nothing else. An empty list does nothing.
void QZRevealInFileManager(const QStringList& uris, const QString& startupId = QString(),
                           QDBusConnection bus = QZCurrentSessionBus());
