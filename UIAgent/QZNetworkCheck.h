// QZNetworkCheck: the question put before a font download starts. When the default route can be
// used right now (the reachability flags have "reachable" set and "connection required" clear),
// the download goes on without a word. Otherwise a critical alert says that the network is not
// connected and offers "Cancel" (the default button) or "Continue Download".
//
// Only the user stops the download, with Cancel or the window's close button: any other end of
// the alert, including its withdrawal from outside (the requesting application quit), answers
// "go on", and the caller decides what to make of the withdrawal.
//
// Main thread only.
#pragma once

#include <memory>

#include "desktop/QZNetworkReachability.h"

class QMessageBox;
class QZModalSession;

class QZNetworkCheck {
public:
    /// Response of the offline alert's first button, "Cancel".
    static constexpr int kCancelResponse = 1000;
    /// Response of its second button, "Continue Download".
    static constexpr int kContinueResponse = 1001;

    QZNetworkCheck();
    ~QZNetworkCheck();
    QZNetworkCheck(const QZNetworkCheck&) = delete;
    QZNetworkCheck& operator=(const QZNetworkCheck&) = delete;

    /// True to go on with the download: at once when the network is connected; otherwise after
    /// the offline alert, unless the user pressed Cancel or closed it. Runs the alert modally; may
    /// be called more than once.
    bool continueDownload();
    /// Ends this check's running offline alert with the abort response (the answer is then "go
    /// on"); nothing when no alert of this check is running.
    void withdraw();
    /// The offline alert while it is up, else null.
    QMessageBox* alert() const { return alert_.get(); }

    /// Whether the network counts as connected: the reachability flags could be read (from the
    /// routing table, QZGetDefaultRouteReachabilityFlags) and pass QZNetworkFlagsAllowConnection.
    static bool IsConnected();

private:
    std::unique_ptr<QMessageBox> alert_;
    std::unique_ptr<QZModalSession> session_;
};
