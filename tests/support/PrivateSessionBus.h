// D-Bus helpers: a private session bus (our own dbus-daemon, in DBUS_SESSION_BUS_ADDRESS while it
// lives) and a stand-in file manager that records its calls through the Qt event loop.
#pragma once

#include <QDBusConnection>
#include <QDBusMessage>
#include <QDBusVirtualObject>
#include <QFile>
#include <QProcess>
#include <QStringList>
#include <QTemporaryDir>
#include <string>
#include <vector>

#include "support/ScopedEnvironment.h"

namespace glyphwell::testing {

class PrivateSessionBus {
public:
    PrivateSessionBus() {
        if (!directory_.isValid())
            return;
        const QString config = directory_.filePath(QStringLiteral("session.conf"));
        QFile file(config);
        if (!file.open(QIODevice::WriteOnly))
            return;
        file.write(
            QStringLiteral(
                "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-Bus Bus Configuration "
                "1.0//EN\" \"http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd\">\n"
                "<busconfig><type>session</type><listen>unix:dir=%1</listen>"
                "<auth>EXTERNAL</auth><policy context=\"default\">"
                "<allow send_destination=\"*\" eavesdrop=\"true\"/>"
                "<allow eavesdrop=\"true\"/><allow own=\"*\"/></policy></busconfig>\n")
                .arg(directory_.path())
                .toUtf8());
        file.close();
        daemon_.setProgram(QStringLiteral("dbus-daemon"));
        daemon_.setArguments({QStringLiteral("--config-file=") + config, QStringLiteral("--nofork"),
                              QStringLiteral("--print-address")});
        daemon_.setProcessChannelMode(QProcess::SeparateChannels);
        daemon_.start();
        if (!daemon_.waitForStarted(10000))
            return;
        while (!daemon_.canReadLine() && daemon_.waitForReadyRead(10000)) {
        }
        address_ = QString::fromUtf8(daemon_.readLine()).trimmed();
        if (address_.isEmpty())
            return;
        environment_.Set("DBUS_SESSION_BUS_ADDRESS", address_.toUtf8().constData());
    }

    ~PrivateSessionBus() {
        if (daemon_.state() != QProcess::NotRunning) {
            daemon_.kill();
            daemon_.waitForFinished(10000);
        }
    }
    PrivateSessionBus(const PrivateSessionBus&) = delete;
    PrivateSessionBus& operator=(const PrivateSessionBus&) = delete;

    /// The bus's address; empty when the daemon could not be started.
    QString address() const { return address_; }

private:
    QTemporaryDir directory_;
    QProcess daemon_;
    QString address_;
    ScopedEnvironment environment_;
};

/// Owns org.freedesktop.FileManager1 on the bus at `address` and records every call to its
/// object, answering Introspect with a minimal description and ShowItems with an empty reply.
class FileManagerStandIn : public QDBusVirtualObject {
public:
    struct Call {
        QString member;    ///< "Introspect", "ShowItems", ...
        QStringList uris;  ///< ShowItems' first argument
        QString startupId; ///< ShowItems' second argument
    };

    explicit FileManagerStandIn(const QString& address)
        : name_(QStringLiteral("file-manager-stand-in:") + address),
          connection_(QDBusConnection::connectToBus(address, name_)) {
        registered_ = connection_.isConnected() &&
                      connection_.registerVirtualObject(
                          QStringLiteral("/org/freedesktop/FileManager1"), this) &&
                      connection_.registerService(QStringLiteral("org.freedesktop.FileManager1"));
    }
    ~FileManagerStandIn() override {
        connection_.unregisterObject(QStringLiteral("/org/freedesktop/FileManager1"));
        connection_.unregisterService(QStringLiteral("org.freedesktop.FileManager1"));
        QDBusConnection::disconnectFromBus(name_);
    }

    /// True when the service name and the object are registered.
    bool registered() const { return registered_; }
    /// The calls received, in order of arrival.
    const std::vector<Call>& calls() const { return calls_; }

    QString introspect(const QString&) const override {
        return QStringLiteral("<interface name=\"org.freedesktop.FileManager1\">"
                              "<method name=\"ShowItems\"><arg type=\"as\" direction=\"in\"/>"
                              "<arg type=\"s\" direction=\"in\"/></method></interface>");
    }

    bool handleMessage(const QDBusMessage& message, const QDBusConnection& connection) override {
        Call call{message.member(), {}, {}};
        if (message.member() == QStringLiteral("ShowItems") && message.arguments().size() == 2) {
            call.uris = message.arguments().at(0).toStringList();
            call.startupId = message.arguments().at(1).toString();
        }
        calls_.push_back(call);
        if (message.isReplyRequired()) {
            if (message.member() == QStringLiteral("Introspect"))
                connection.send(message.createReply(
                    QStringLiteral("<node>%1</node>").arg(introspect(message.path()))));
            else
                connection.send(message.createReply());
        }
        return true;
    }

private:
    QString name_;
    QDBusConnection connection_;
    bool registered_ = false;
    std::vector<Call> calls_;
};

} // namespace glyphwell::testing
