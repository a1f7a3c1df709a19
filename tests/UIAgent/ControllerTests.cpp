// The controller: launch and the port, the shared pointer's checks, the alert count and the idle
// timer, and termination (idle, from outside, deferred while requests are pending).
#include <QElapsedTimer>
#include <csignal>
#include <memory>

#include "UIAgent/QZTerminationRequests.h"
#include "UIAgent/QZUIController.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/support/LogCapture.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;

constexpr auto kShortIdleDelay = 300ms;

class ControllerTest : public ::testing::Test {
protected:
    ControllerTest() {
        NewController();
        clock_.start();
    }
    /// A new controller (the previous one must be gone), its signals recorded.
    void NewController() {
        terminations_ = 0;
        controller_ = std::make_unique<QZUIController>();
        controller_->setIdleDelay(kShortIdleDelay);
        QObject::connect(controller_.get(), &QZUIController::terminationAccepted, [this] {
            ++terminations_;
            terminatedAt_ = clock_.elapsed();
        });
        QObject::connect(controller_.get(), &QZUIController::alertCountChanged,
                         [this](qint64 count) { counts_.push_back(count); });
    }

    AgentPortEnvironment environment_;
    std::unique_ptr<QZUIController> controller_;
    QElapsedTimer clock_;
    int terminations_ = 0;
    qint64 terminatedAt_ = -1;
    std::vector<qint64> counts_;
};

TEST_F(ControllerTest, LaunchingOpensThePortAndSetsTheSharedControllerOnceGoingUndoesBoth) {
    EXPECT_EQ(QZUIController::sharedController(), nullptr);
    controller_->applicationWillFinishLaunching();
    EXPECT_EQ(QZUIController::sharedController(), controller_.get());
    CFMessagePortRef port = controller_->messagePort();
    ASSERT_NE(port, nullptr);

    // A second launch reports the failed check and keeps the port.
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

    // Going, the controller clears the shared pointer and invalidates the port, without a word.
    CFRetain(port);
    log.Clear();
    controller_.reset();
    EXPECT_EQ(QZUIController::sharedController(), nullptr);
    EXPECT_FALSE(CFMessagePortIsValid(port));
    EXPECT_TRUE(log.Texts().empty());
    CFRelease(port);
}

TEST_F(ControllerTest, ATakenNameIsLoggedAndTheAgentRunsOnWithoutAPort) {
    CFMessagePortContext context = {0, nullptr, nullptr, nullptr, nullptr};
    Ref other(CFMessagePortCreateLocal(nullptr, kQZUIAgentPortName, QZUIAgentHandleMessage,
                                       &context, nullptr)); // as a second agent would hold it
    ASSERT_TRUE(other);
    LogCapture log;
    controller_->applicationWillFinishLaunching();
    EXPECT_EQ(controller_->messagePort(), nullptr);
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{"CFMessagePortCreateLocal returned nil"}));
    EXPECT_EQ(QZUIController::sharedController(), controller_.get());
    EXPECT_EQ(controller_->terminateTimer(), nullptr);
    // No dangling shared pointer either when the port could not be made.
    controller_.reset();
    EXPECT_EQ(QZUIController::sharedController(), nullptr);
    CFMessagePortInvalidate(other.as<CFMessagePortRef>());
}

TEST_F(ControllerTest, TheIdleTimerIsArmedAndTerminationAnsweredNowOnlyWhenTheCountIsZero) {
    controller_->applicationWillFinishLaunching();
    // After launch and after each count: the idle timer, and the answer to a termination request.
    auto state = [this] {
        const QTimer* timer = controller_->terminateTimer();
        const bool now = controller_->applicationShouldTerminate() == QZUIController::kTerminateNow;
        return (timer ? "timer " + std::to_string(timer->interval()) +
                            (timer->isActive() && timer->isSingleShot() ? " once" : "")
                      : std::string("no timer")) +
               (now ? ", now" : ", later");
    };
    std::vector<std::string> states{state()};
    for (qint64 count : {1, 2, 1, 0, 1}) {
        controller_->setAlertCount(count);
        states.push_back(state());
    }
    EXPECT_EQ(states, (std::vector<std::string>{"no timer, now", "no timer, later",
                                                "no timer, later", "no timer, later",
                                                "timer 300 once, now", "no timer, later"}));
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 2, 1, 0, 1}));
}

TEST_F(ControllerTest, NoIdleExitBeforeTheFirstRequestNorWhileOneIsStillBeingReceived) {
    controller_->applicationWillFinishLaunching();
    SpinUntil([] { return false; }, 3 * kShortIdleDelay);
    EXPECT_EQ(terminations_, 0);
    CFRelease(QZUIAgentHandleMessage(nullptr, 3, nullptr, controller_.get()));
    // A client that has sent the first bytes of a frame and is still sending.
    const int client = RawConnect(glyphwell::port::SocketPathForName(QZ_UI_AGENT_PORT_NAME));
    ASSERT_GE(client, 0);
    ASSERT_TRUE(RawWrite(client, std::string("\0\0\0\3\0\0", 6)));
    SpinUntil([] { return false; }, 3 * kShortIdleDelay);
    EXPECT_EQ(terminations_, 0);
    // Once that client has gone, the idle exit follows.
    close(client);
    EXPECT_TRUE(SpinUntil([&] { return terminations_ > 0; }));
}

TEST_F(ControllerTest, SigtermOrQuitTerminatesAtOnceOrWhenThePendingRequestsAreDone) {
    const std::pair<bool, bool> cases[] = {{true, false}, {true, true}, {false, true}};
    for (const auto& [signal, pending] : cases) {
        SCOPED_TRACE(std::string(signal ? "SIGTERM" : "the application's quit event") +
                     (pending ? " while a request is pending" : ""));
        controller_.reset();
        NewController();
        controller_->applicationWillFinishLaunching();
        QZTerminationRequests requests;
        QObject::connect(&requests, &QZTerminationRequests::terminationRequested, controller_.get(),
                         &QZUIController::terminate);
        if (pending)
            controller_->setAlertCount(1);
        if (signal) {
            raise(SIGTERM);
        } else {
            QEvent quit(QEvent::Quit);
            QCoreApplication::sendEvent(QCoreApplication::instance(), &quit);
        }
        qint64 idleAt = clock_.elapsed();
        if (pending) {
            ASSERT_TRUE(SpinUntil([&] { return controller_->isTerminationDeferred(); }, 2s));
            controller_->setAlertCount(2);
            controller_->setAlertCount(1);
            SpinUntil([] { return false; }, 100ms);
            EXPECT_EQ(terminations_, 0);
            EXPECT_TRUE(CFMessagePortIsValid(controller_->messagePort()));
            idleAt = clock_.elapsed();
            controller_->setAlertCount(0);
            EXPECT_EQ(terminations_, 0); // not inside the request that brought the count to 0
        }
        ASSERT_TRUE(SpinUntil([&] { return terminations_ > 0; }, 2s));
        EXPECT_LT(terminatedAt_ - idleAt, 300); // without waiting for the idle delay
        EXPECT_FALSE(CFMessagePortIsValid(controller_->messagePort()));
    }
}

} // namespace
