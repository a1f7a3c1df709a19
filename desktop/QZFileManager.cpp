#include "desktop/QZFileManager.h"

#include <QDBusMessage>
#include <QDBusPendingCall>
#include <QDBusPendingCallWatcher>

#include "platform/Log.h"

QDBusConnection QZCurrentSessionBus() {
    // The address is read here rather than left to the D-Bus library, which keeps the session
    // address it saw first for the life of the process. One named connection per address: a
    // changed address makes a new connection, the same address reuses the open one.
    const QString address = qEnvironmentVariable("DBUS_SESSION_BUS_ADDRESS");
    if (address.isEmpty())
        return QDBusConnection::sessionBus();
    const QString name = QStringLiteral("glyphwell-session-bus:") + address;
    QDBusConnection existing(name);
    if (existing.isConnected())
        return existing;
    // A connection under this name that lost its bus is dropped, so that a new one is made.
    QDBusConnection::disconnectFromBus(name);
    return QDBusConnection::connectToBus(address, name);
}

void QZRevealInFileManager(const QStringList& uris, const QString& startupId, QDBusConnection bus) {
    if (uris.isEmpty())
        return;
    if (!bus.isConnected()) {
        glyphwell::AppLog("Cannot reveal files in the file manager: no session bus (%s)",
                          qUtf8Printable(bus.lastError().message()));
        return;
    }
    // The activation: a call that the bus delivers only once the service runs (starting it when
    // it can be started), answered by the service itself.
    QDBusMessage activate = QDBusMessage::createMethodCall(
        QString::fromLatin1(kQZFileManagerService), QString::fromLatin1(kQZFileManagerPath),
        QStringLiteral("org.freedesktop.DBus.Introspectable"), QStringLiteral("Introspect"));
    activate.setAutoStartService(true);
    auto* watcher = new QDBusPendingCallWatcher(bus.asyncCall(activate));
    QObject::connect(
        watcher, &QDBusPendingCallWatcher::finished, watcher,
        [bus, uris, startupId](QDBusPendingCallWatcher* finished) {
            finished->deleteLater();
            QDBusMessage show = QDBusMessage::createMethodCall(
                QString::fromLatin1(kQZFileManagerService), QString::fromLatin1(kQZFileManagerPath),
                QString::fromLatin1(kQZFileManagerInterface), QStringLiteral("ShowItems"));
            show << uris << startupId;
            show.setAutoStartService(true);
            // Sent without waiting for an answer (send() marks calls "no reply
            // expected"): the file manager shows the items or it does not.
            bus.send(show);
        });
}
