// The one QApplication of the agent's test executable. Widgets need an application object, and a
// process may hold only one, so every test file of tests/UIAgent includes this header: the
// environment is registered once (an inline variable, whatever the number of files including
// it), creates the application before the first test and destroys it after the last.
//
// The tests run on Qt's offscreen platform (the test registration sets QT_QPA_PLATFORM; the
// environment sets it too when the executable is started by hand). The questions' input guard is
// off (GLYPHWELL_INPUT_GUARD_MS=0) unless the environment says otherwise, so that tests may press
// a button as soon as its window is up; the guard's own tests turn it on.
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
        // The agent's windows closing must not end anything: tests run many of them.
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
