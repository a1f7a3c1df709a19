// Bringing the agent's windows to the front. On X11 the window is raised and activated through
// the window manager. On Wayland a client cannot raise itself: it asks the compositor through
// xdg-activation. A token handed to the agent by whoever started it (XDG_ACTIVATION_TOKEN, else
// DESKTOP_STARTUP_ID) lets the compositor grant the request; the token is used once and removed
// from the environment, as the convention says. Without one, Qt's Wayland plugin asks the
// compositor for a token itself. A compositor that grants nothing leaves the window behind others:
// that is logged once per run.
//
// Main thread only.
#pragma once

#include <QString>
#include <chrono>

class QWidget;

/// Raises `window` (shown) and asks for it to become the active window.
void QZBringToFront(QWidget* window);

/// The activation token the environment carries (XDG_ACTIVATION_TOKEN, else DESKTOP_STARTUP_ID),
/// or a null string. Both variables are removed: a token is good for one activation only.
QString QZTakeActivationToken();

/// How long a window may take to become active on Wayland before "not activated" is logged.
inline constexpr std::chrono::milliseconds kQZActivationPatience{1500};
