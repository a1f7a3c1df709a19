#include "UIAgent/QZUIController.h"

#include "UIAgent/QZUIAgentHandleMessage.h"
#include "platform/CFRunLoop.h"
#include "platform/CFString.h"
#include "platform/Log.h"
#include "protocol/QZUIProtocol.h"

namespace {

/// The controller that launched; set at launch, cleared when it is destroyed.
QZUIController* sSharedController = nullptr;

/// The file named by the controller's failed checks.
constexpr const char* kControllerSourceFile = "UIAgent/QZUIController.cpp";

} // namespace

QZUIController::QZUIController() = default;

QZUIController::~QZUIController() {
    if (messagePort_) {
        // The port's callback gets this controller as its info: a port that outlived it would
        // hand a dangling pointer to the next request. Invalidating stops the port for good.
        if (CFMessagePortIsValid(messagePort_))
            CFMessagePortInvalidate(messagePort_);
        CFRelease(messagePort_);
        messagePort_ = nullptr;
        if (sSharedController != this)
            glyphwell::AssertionFailure("sSharedController == self", "QZUIController::dealloc",
                                        kControllerSourceFile, __LINE__);
        sSharedController = nullptr;
    }
    // Also without a port (its creation failed): the shared pointer never outlives its object.
    if (sSharedController == this)
        sSharedController = nullptr;
    setTerminateTimer(nullptr);
}

QZUIController* QZUIController::sharedController() {
    return sSharedController;
}

void QZUIController::applicationWillFinishLaunching() {
    if (sSharedController != nullptr)
        glyphwell::AssertionFailure("sSharedController == nil",
                                    "QZUIController::applicationWillFinishLaunching",
                                    kControllerSourceFile, __LINE__);
    sSharedController = this;
    // A second launch of this controller keeps the port it serves: creating another under the
    // same name could only fail, and would lose the reference to the first.
    if (messagePort_)
        return;

    // The port does not own the controller: no retain or release callbacks.
    CFMessagePortContext context = {0, this, nullptr, nullptr, nullptr};
    messagePort_ = CFMessagePortCreateLocal(kCFAllocatorDefault, kQZUIAgentPortName,
                                            QZUIAgentHandleMessage, &context, nullptr);
    if (!messagePort_) {
        glyphwell::AppLog("CFMessagePortCreateLocal returned nil");
        return;
    }
    // Served in every loop of this thread, the modal sessions' nested loops included, so a
    // request that arrives while an alert is up is handled at once.
    CFRunLoopSourceRef source =
        CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, messagePort_, 0);
    if (source) {
        CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
        CFRelease(source);
    }
}

QZUIController::TerminateReply QZUIController::applicationShouldTerminate() {
    return alertCount_ == 0 ? kTerminateNow : kTerminateLater;
}

void QZUIController::applicationWillTerminate() {
    if (messagePort_ && CFMessagePortIsValid(messagePort_))
        CFMessagePortInvalidate(messagePort_);
}

void QZUIController::setAlertCount(int64_t count) {
    alertCount_ = count;
    if (count != 0) {
        if (terminateTimer_)
            terminateTimer_->stop();
        setTerminateTimer(nullptr);
    } else {
        auto* timer = new QTimer(this);
        timer->setSingleShot(true);
        // A precise timer: a coarse one may fire up to 5% early.
        timer->setTimerType(Qt::PreciseTimer);
        timer->setInterval(idleDelay_);
        connect(timer, &QTimer::timeout, this, &QZUIController::terminateTimerFired);
        timer->start();
        setTerminateTimer(timer);
        // A termination asked for while requests were pending is carried out now, once the
        // reply of the request that brought the count to 0 has gone out: that happens when the
        // port's callback has returned, so the termination waits for the next turn of the loop.
        if (terminationDeferred_)
            QTimer::singleShot(0, this, &QZUIController::terminate);
    }
    emit alertCountChanged(count);
}

void QZUIController::setTerminateTimer(QTimer* timer) {
    if (timer == terminateTimer_)
        return;
    QTimer* previous = terminateTimer_;
    terminateTimer_ = timer;
    if (timer)
        timer->setParent(this);
    delete previous;
}

void QZUIController::terminateTimerFired() {
    // A request still being received is work too: wait another idle delay rather than cut its
    // client off. A client that stops sending is closed by the port after its stall timeout.
    if (messagePort_ && glyphwell::port::IsReceivingRequest(messagePort_)) {
        if (terminateTimer_)
            terminateTimer_->start();
        return;
    }
    terminate();
}

void QZUIController::terminate() {
    if (terminated_)
        return;
    switch (applicationShouldTerminate()) {
    case kTerminateNow:
        terminated_ = true;
        terminationDeferred_ = false;
        // Stopped, not deleted: this may run inside the timer's own timeout signal.
        if (terminateTimer_)
            terminateTimer_->stop();
        applicationWillTerminate();
        emit terminationAccepted();
        break;
    case kTerminateLater:
        terminationDeferred_ = true;
        break;
    case kTerminateCancel:
        break;
    }
}
