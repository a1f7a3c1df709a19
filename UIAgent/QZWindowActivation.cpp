#include "UIAgent/QZWindowActivation.h"

#include <QGuiApplication>
#include <QPointer>
#include <QTimer>
#include <QWidget>
#include <QWindow>

#include "platform/Log.h"

namespace {

bool IsWayland() {
    return QGuiApplication::platformName().startsWith(QLatin1String("wayland"));
}

/// Logs once per run that the compositor did not activate a window of the agent.
void LogNotActivatedOnce() {
    static bool logged = false;
    if (logged)
        return;
    logged = true;
    glyphwell::AppLog("The compositor did not activate the agent's window; it may be behind "
                      "other windows");
}

} // namespace

QString QZTakeActivationToken() {
    QString token = qEnvironmentVariable("XDG_ACTIVATION_TOKEN");
    if (token.isEmpty())
        token = qEnvironmentVariable("DESKTOP_STARTUP_ID");
    // The environment is changed only when it holds a token: transfer threads read it too.
    for (const char* name : {"XDG_ACTIVATION_TOKEN", "DESKTOP_STARTUP_ID"})
        if (qEnvironmentVariableIsSet(name))
            qunsetenv(name);
    return token.isEmpty() ? QString() : token;
}

void QZBringToFront(QWidget* window) {
    if (!window)
        return;
    window->raise();
    if (!IsWayland()) {
        window->activateWindow();
        return;
    }
    // Qt's Wayland plugin hands XDG_ACTIVATION_TOKEN to the compositor with the activation
    // request and asks for a token of its own when there is none. A token under the older name
    // is moved to the name the plugin reads, and removed once the request is made.
    const QString token = QZTakeActivationToken();
    if (!token.isEmpty())
        qputenv("XDG_ACTIVATION_TOKEN", token.toUtf8());
    window->activateWindow();
    if (!token.isEmpty())
        qunsetenv("XDG_ACTIVATION_TOKEN");

    QPointer<QWidget> watched(window);
    QTimer::singleShot(kQZActivationPatience, window, [watched] {
        if (watched && watched->isVisible() && !watched->isActiveWindow())
            LogNotActivatedOnce();
    });
}
