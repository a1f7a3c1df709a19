// The Qt run-loop driver: readiness reaches the callback until the descriptor is unwatched, also
// while a callback of its own waits (nesting is proven through the agent's socket by DispatchTest).
#include <QEventLoop>
#include <QTimer>
#include <fcntl.h>
#include <unistd.h>

#include "UIAgent/QZQtRunLoopDriver.h"
#include "tests/UIAgent/QtTestEnvironment.h"

namespace {

using glyphwell::testing::SpinUntil;
using namespace std::chrono_literals;

class Pipe {
public:
    Pipe() { EXPECT_EQ(pipe2(ends, O_NONBLOCK | O_CLOEXEC), 0); }
    ~Pipe() {
        close(ends[0]);
        close(ends[1]);
    }
    void Put() { EXPECT_EQ(write(ends[1], "x", 1), 1); }
    bool Take() {
        char byte;
        return read(ends[0], &byte, 1) == 1;
    }
    int ends[2] = {-1, -1};
};

TEST(QtRunLoopDriver, ReadinessReachesTheCallbackUntilUnwatched) {
    QZQtRunLoopDriver driver;
    Pipe pipe;
    int reads = 0, writes = 0;
    driver.Watch(pipe.ends[0], true, false, [&](bool readable, bool writable) {
        reads += readable;
        writes += writable;
        pipe.Take();
    });
    pipe.Put();
    ASSERT_TRUE(SpinUntil([&] { return reads == 1; }));
    EXPECT_EQ(writes, 0);

    // Write interest on the other end: an empty pipe is writable at once.
    bool writable = false;
    driver.Watch(pipe.ends[1], false, true, [&](bool, bool w) {
        writable = w;
        driver.Watch(pipe.ends[1], false, false, [](bool, bool) {});
    });
    ASSERT_TRUE(SpinUntil([&] { return writable; }));

    driver.Unwatch(pipe.ends[0]);
    pipe.Put();
    SpinUntil([] { return false; }, 50ms);
    EXPECT_EQ(reads, 1);
}

TEST(QtRunLoopDriver, ADescriptorUnwatchedWhileItsCallbackWaitsIsNoLongerPolled) {
    // Regression: a request waiting for the user keeps its connection's callback running; when
    // the client goes away meanwhile, the port unwatches and closes the descriptor, and Qt warned
    // about polling a closed socket.
    static std::vector<std::string> warnings;
    warnings.clear();
    QtMessageHandler previous =
        qInstallMessageHandler([](QtMsgType, const QMessageLogContext&, const QString& text) {
            warnings.push_back(text.toStdString());
        });
    QZQtRunLoopDriver driver;
    auto* waiting = new Pipe;
    Pipe other;
    bool unwatched = false;
    driver.Watch(waiting->ends[0], true, false, [&](bool, bool) {
        if (!waiting->Take())
            return;
        // The user takes a while; meanwhile the descriptor goes away.
        other.Put();
        SpinUntil([&] { return unwatched; });
        SpinUntil([] { return false; }, 50ms);
    });
    driver.Watch(other.ends[0], true, false, [&](bool, bool) {
        other.Take();
        driver.Unwatch(waiting->ends[0]);
        delete waiting;
        unwatched = true;
    });
    Pipe* const first = waiting;
    first->Put();
    ASSERT_TRUE(SpinUntil([&] { return unwatched; }));
    SpinUntil([] { return false; }, 100ms);
    qInstallMessageHandler(previous);
    EXPECT_EQ(warnings, std::vector<std::string>{});
}

} // namespace
