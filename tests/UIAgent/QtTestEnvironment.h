// The one QApplication of the agent's test executable, registered once (an inline variable) and
// made before the first test, on Qt's offscreen platform. The questions' input guard is off unless
// the environment says otherwise, so that tests may press a button as soon as its window is up.
#pragma once

#include <QApplication>
#include <QCoreApplication>
#include <QEventLoop>
#include <QTimer>
#include <chrono>
#include <cstdlib>
#include <functional>
#include <gtest/gtest.h>

namespace glyphwell::testing {

class QtTestEnvironment : public ::testing::Environment {
public:
    void SetUp() override {
        setenv("QT_QPA_PLATFORM", "offscreen", 0);
        setenv("GLYPHWELL_INPUT_GUARD_MS", "0", 0);
        static int argc = 1;
        static char name[] = "uiagent_tests";
        static char* argv[] = {name, nullptr};
        application_ = new QApplication(argc, argv);
        QApplication::setQuitOnLastWindowClosed(false);
    }
    void TearDown() override {
        delete application_;
        application_ = nullptr;
    }

private:
    QApplication* application_ = nullptr;
};

inline ::testing::Environment* const kQtTestEnvironment =
    ::testing::AddGlobalTestEnvironment(new QtTestEnvironment);

/// Runs the event loop until `done` answers true or `timeout` has passed; returns `done()`.
inline bool SpinUntil(const std::function<bool()>& done,
                      std::chrono::milliseconds timeout = std::chrono::seconds(10)) {
    QEventLoop loop;
    QTimer poll;
    QObject::connect(&poll, &QTimer::timeout, &loop, [&] {
        if (done())
            loop.quit();
    });
    QTimer::singleShot(timeout, &loop, &QEventLoop::quit);
    poll.start(5);
    if (!done())
        loop.exec();
    return done();
}

} // namespace glyphwell::testing
