#include "UIAgent/QZNetworkCheck.h"

#include <QAbstractButton>
#include <QMessageBox>
#include <QPushButton>
#include <atomic>

#include "UIAgent/AgentTesting.h"
#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZModalSession.h"

namespace {

std::atomic<QZNetworkFlagsSource> gFlagsSource{nullptr};

} // namespace

QZNetworkCheck::QZNetworkCheck() = default;

QZNetworkCheck::~QZNetworkCheck() {
    session_.reset();
    alert_.reset();
}

bool QZNetworkCheck::IsConnected() {
    const QZNetworkFlagsSource source = gFlagsSource.load();
    QZNetworkReachabilityFlags flags = 0;
    const bool known = source ? source(&flags) : QZGetDefaultRouteReachabilityFlags(&flags);
    return known && QZNetworkFlagsAllowConnection(flags);
}

void QZSetNetworkFlagsSourceForTesting(QZNetworkFlagsSource source) {
    gFlagsSource.store(source);
}

bool QZNetworkCheck::continueDownload() {
    if (IsConnected())
        return true;

    // Made afresh for each question, so that a check asked twice shows a clean alert.
    session_.reset();
    alert_ = std::make_unique<QMessageBox>();
    QMessageBox& alert = *alert_;
    alert.setWindowTitle(QZLocalizedString("QZ_NETWORK_ALERT_TITLE"));
    alert.setIcon(QMessageBox::Critical);
    alert.setTextFormat(Qt::PlainText);
    alert.setText(QZLocalizedString("Network is not connected."));
    alert.setInformativeText(QZLocalizedString(
        "You are not connected to the Internet. Do you want to cancel downloading?"));
    QPushButton* cancel = alert.addButton(QZLocalizedString("Cancel"), QMessageBox::RejectRole);
    QPushButton* proceed =
        alert.addButton(QZLocalizedString("Continue Download"), QMessageBox::AcceptRole);
    alert.setDefaultButton(cancel);
    alert.setEscapeButton(cancel);
    session_ = std::make_unique<QZModalSession>(&alert, QZModalSession::kQuestion);
    QZModalSession* session = session_.get();
    // The button ends the session with its response before the box hides itself.
    QObject::connect(&alert, &QMessageBox::buttonClicked, &alert,
                     [session, cancel, proceed](QAbstractButton* clicked) {
                         if (clicked == cancel)
                             session->End(kCancelResponse);
                         else if (clicked == proceed)
                             session->End(kContinueResponse);
                     });

    const int response = session_->Run();
    // The window's close button means Cancel too; a withdrawal from outside goes on.
    return response != kCancelResponse && response != kQZModalResponseCancel;
}

void QZNetworkCheck::withdraw() {
    if (session_)
        session_->End(kQZModalResponseAbort);
}
