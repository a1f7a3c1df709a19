// The controller: launch and the port, the shared pointer's checks, the alert count and the idle
// timer, and termination (idle, from outside, deferred while requests are pending).
#include <QCoreApplication>
#include <QElapsedTimer>
#include <QEvent>
#include <chrono>
#include <csignal>
#include <memory>
#include <string>
#include <thread>
#include <unistd.h>

#include "UIAgent/QZTerminationRequests.h"
#include "UIAgent/QZUIAgentHandleMessage.h"
#include "UIAgent/QZUIController.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/UIAgent/QtTestEnvironment.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PortTestSupport.h"

namespace {

using namespace std::chrono_literals;
using glyphwell::testing::LogCapture;
using glyphwell::testing::SpinUntil;

constexpr auto kShortIdleDelay = 300ms;

class ControllerTest : public ::testing::Test {
protected:
    ControllerTest() {
        controller_ = std::make_unique<QZUIController>();
        controller_->setIdleDelay(kShortIdleDelay);
        QObject::connect(controller_.get(), &QZUIController::terminationAccepted, [this] {
            ++terminations_;
            terminatedAt_ = clock_.elapsed();
        });
        QObject::connect(controller_.get(), &QZUIController::alertCountChanged,
                         [this](qint64 count) { counts_.push_back(count); });
        clock_.start();
    }

    /// Handles one request of an unknown message id, as the port would.
    void SendUnknownRequest() {
        CFDataRef reply = QZUIAgentHandleMessage(nullptr, 3, nullptr, controller_.get());
        CFRelease(reply);
    }

    glyphwell::testing::AgentPortEnvironment environment_;
    std::unique_ptr<QZUIController> controller_;
    QElapsedTimer clock_;
    int terminations_ = 0;
    qint64 terminatedAt_ = -1;
    std::vector<qint64> counts_;
};

TEST_F(ControllerTest, LaunchingCreatesAndServesThePortAndSetsTheSharedController) {
    EXPECT_EQ(QZUIController::sharedController(), nullptr);
    controller_->applicationWillFinishLaunching();
    EXPECT_EQ(QZUIController::sharedController(), controller_.get());
    ASSERT_NE(controller_->messagePort(), nullptr);
    EXPECT_TRUE(CFMessagePortIsValid(controller_->messagePort()));

    // A client on another thread reaches the controller through the socket.
    LogCapture log;
    SInt32 status = 1;
    CFDataRef reply = nullptr;
    std::thread client([&] {
        CFMessagePortRef remote = CFMessagePortCreateRemote(nullptr, kQZUIAgentPortName);
        if (!remote)
            return;
        status = CFMessagePortSendRequest(remote, 3, nullptr, 5, 5, kCFRunLoopDefaultMode, &reply);
        CFMessagePortInvalidate(remote);
        CFRelease(remote);
    });
    SpinUntil([&] { return controller_->terminateTimer() != nullptr; });
    client.join();
    EXPECT_EQ(status, kCFMessagePortSuccess);
    ASSERT_NE(reply, nullptr);
    EXPECT_EQ(CFDataGetLength(reply), 0);
    CFRelease(reply);
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{"unknown msgid: 3"}));
}

TEST_F(ControllerTest, ASecondLaunchReportsTheFailedCheckAndKeepsThePort) {
    controller_->applicationWillFinishLaunching();
    CFMessagePortRef port = controller_->messagePort();
    LogCapture log;
    controller_->applicationWillFinishLaunching();
    const std::vector<std::string> lines = log.Texts();
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_EQ(lines[0].rfind("*** Assertion failure in "
                             "QZUIController::applicationWillFinishLaunching, "
                             "UIAgent/QZUIController.cpp:",
                             0),
              0u);
    EXPECT_EQ(lines[1], "Invalid parameter not satisfying: sSharedController == nil");
    EXPECT_EQ(controller_->messagePort(), port);
    EXPECT_TRUE(CFMessagePortIsValid(port));
}

TEST_F(ControllerTest, ATakenNameIsLoggedAndTheAgentRunsOnWithoutAPort) {
    CFMessagePortContext context = {0, nullptr, nullptr, nullptr, nullptr};
    CFMessagePortRef other = CFMessagePortCreateLocal(nullptr, kQZUIAgentPortName,
                                                      QZUIAgentHandleMessage, &context, nullptr);
    ASSERT_NE(other, nullptr);
    LogCapture log;
    controller_->applicationWillFinishLaunching();
    EXPECT_EQ(controller_->messagePort(), nullptr);
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{"CFMessagePortCreateLocal returned nil"}));
    EXPECT_EQ(QZUIController::sharedController(), controller_.get());
    EXPECT_EQ(controller_->terminateTimer(), nullptr);
    CFMessagePortInvalidate(other);
    CFRelease(other);
}

TEST_F(ControllerTest, DestroyingTheControllerClearsTheSharedPointerAndInvalidatesThePort) {
    controller_->applicationWillFinishLaunching();
    CFMessagePortRef port = controller_->messagePort();
    CFRetain(port);
    LogCapture log;
    controller_.reset();
    EXPECT_EQ(QZUIController::sharedController(), nullptr);
    EXPECT_FALSE(CFMessagePortIsValid(port));
    EXPECT_TRUE(log.Texts().empty());
    CFRelease(port);

    // Also when the port could not be made: no dangling shared pointer.
    auto second = std::make_unique<QZUIController>();
    CFMessagePortContext context = {0, nullptr, nullptr, nullptr, nullptr};
    CFMessagePortRef other = CFMessagePortCreateLocal(nullptr, kQZUIAgentPortName,
                                                      QZUIAgentHandleMessage, &context, nullptr);
    second->applicationWillFinishLaunching();
    second.reset();
    EXPECT_EQ(QZUIController::sharedController(), nullptr);
    CFMessagePortInvalidate(other);
    CFRelease(other);
}

TEST_F(ControllerTest, TheIdleTimerIsArmedAndTerminationAnsweredNowOnlyWhenTheCountIsZero) {
    controller_->applicationWillFinishLaunching();
    EXPECT_EQ(controller_->terminateTimer(), nullptr);
    EXPECT_EQ(controller_->applicationShouldTerminate(), QZUIController::kTerminateNow);
    controller_->setAlertCount(1);
    EXPECT_EQ(controller_->terminateTimer(), nullptr);
    EXPECT_EQ(controller_->applicationShouldTerminate(), QZUIController::kTerminateLater);
    controller_->setAlertCount(2);
    controller_->setAlertCount(1);
    EXPECT_EQ(controller_->terminateTimer(), nullptr);
    controller_->setAlertCount(0);
    ASSERT_NE(controller_->terminateTimer(), nullptr);
    EXPECT_TRUE(controller_->terminateTimer()->isActive());
    EXPECT_TRUE(controller_->terminateTimer()->isSingleShot());
    EXPECT_EQ(controller_->terminateTimer()->interval(), 300);
    EXPECT_EQ(controller_->applicationShouldTerminate(), QZUIController::kTerminateNow);
    controller_->setAlertCount(1);
    EXPECT_EQ(controller_->terminateTimer(), nullptr);
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 2, 1, 0, 1}));
}

TEST_F(ControllerTest, AnAgentThatNeverServedARequestDoesNotQuit) {
    controller_->applicationWillFinishLaunching();
    SpinUntil([] { return false; }, 3 * kShortIdleDelay);
    EXPECT_EQ(terminations_, 0);
    EXPECT_TRUE(CFMessagePortIsValid(controller_->messagePort()));
}

TEST_F(ControllerTest, TheAgentAsksToTerminateTheIdleDelayAfterItsLastReply) {
    controller_->applicationWillFinishLaunching();
    // Taken before the request: the idle timer is armed while its reply goes out.
    const qint64 sentAt = clock_.elapsed();
    SendUnknownRequest();
    ASSERT_TRUE(SpinUntil([&] { return terminations_ > 0; }));
    EXPECT_GE(terminatedAt_ - sentAt, 300);
    EXPECT_EQ(terminations_, 1);
    EXPECT_TRUE(controller_->isTerminating());
    EXPECT_FALSE(CFMessagePortIsValid(controller_->messagePort()));
}

TEST_F(ControllerTest, ARequestDuringTheIdlePeriodStartsItAgain) {
    controller_->applicationWillFinishLaunching();
    SendUnknownRequest();
    SpinUntil([] { return false; }, kShortIdleDelay / 2);
    const qint64 secondSentAt = clock_.elapsed();
    SendUnknownRequest();
    ASSERT_TRUE(SpinUntil([&] { return terminations_ > 0; }));
    EXPECT_GE(terminatedAt_ - secondSentAt, 300);
    EXPECT_EQ(terminations_, 1);
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 0, 1, 0}));
}

TEST_F(ControllerTest, ARequestStillBeingReceivedKeepsTheAgentFromItsIdleExit) {
    controller_->applicationWillFinishLaunching();
    SendUnknownRequest();
    // A client that has sent the first bytes of a frame and is still sending.
    const int client =
        glyphwell::testing::RawConnect(glyphwell::port::SocketPathForName(QZ_UI_AGENT_PORT_NAME));
    ASSERT_GE(client, 0);
    const unsigned char head[] = {0, 0, 0, 3, 0, 0};
    ASSERT_EQ(write(client, head, sizeof head), ssize_t(sizeof head));
    SpinUntil([] { return false; }, 3 * kShortIdleDelay);
    EXPECT_EQ(terminations_, 0);
    // Once that client has gone, the idle exit follows.
    close(client);
    EXPECT_TRUE(SpinUntil([&] { return terminations_ > 0; }));
}

TEST_F(ControllerTest, SigtermWithNoRequestPendingTerminatesAtOnce) {
    controller_->applicationWillFinishLaunching();
    QZTerminationRequests requests;
    QObject::connect(&requests, &QZTerminationRequests::terminationRequested, controller_.get(),
                     &QZUIController::terminate);
    raise(SIGTERM);
    ASSERT_TRUE(SpinUntil([&] { return terminations_ > 0; }, 2s));
    EXPECT_FALSE(CFMessagePortIsValid(controller_->messagePort()));
}

TEST_F(ControllerTest, SigtermWhileARequestIsPendingTerminatesWhenTheCountReturnsToZero) {
    controller_->applicationWillFinishLaunching();
    QZTerminationRequests requests;
    QObject::connect(&requests, &QZTerminationRequests::terminationRequested, controller_.get(),
                     &QZUIController::terminate);
    controller_->setAlertCount(1);
    raise(SIGTERM);
    SpinUntil([&] { return controller_->isTerminationDeferred(); }, 2s);
    ASSERT_TRUE(controller_->isTerminationDeferred());
    SpinUntil([] { return false; }, 100ms);
    EXPECT_EQ(terminations_, 0);
    EXPECT_TRUE(CFMessagePortIsValid(controller_->messagePort()));

    controller_->setAlertCount(2);
    controller_->setAlertCount(1);
    SpinUntil([] { return false; }, 50ms);
    EXPECT_EQ(terminations_, 0);
    const qint64 idleAt = clock_.elapsed();
    controller_->setAlertCount(0);
    EXPECT_EQ(terminations_, 0); // not inside the request that brought the count to 0
    ASSERT_TRUE(SpinUntil([&] { return terminations_ > 0; }, 1s));
    EXPECT_LT(terminatedAt_ - idleAt, 300); // without waiting for the idle delay
    EXPECT_FALSE(CFMessagePortIsValid(controller_->messagePort()));
}

TEST_F(ControllerTest, TheApplicationsQuitEventIsRoutedThroughTheController) {
    controller_->applicationWillFinishLaunching();
    QZTerminationRequests requests;
    QObject::connect(&requests, &QZTerminationRequests::terminationRequested, controller_.get(),
                     &QZUIController::terminate);
    controller_->setAlertCount(1);
    QEvent quit(QEvent::Quit);
    QCoreApplication::sendEvent(QCoreApplication::instance(), &quit);
    EXPECT_TRUE(controller_->isTerminationDeferred());
    EXPECT_EQ(terminations_, 0);
    controller_->setAlertCount(0);
    ASSERT_TRUE(SpinUntil([&] { return terminations_ > 0; }, 1s));
}

} // namespace
