// The one application object of the desktop test executable: process watches and D-Bus calls
// need an event loop. Runs on Qt's offscreen platform.
#pragma once

#include <QEventLoop>
#include <QGuiApplication>
#include <QTimer>
#include <chrono>
#include <cstdlib>
#include <functional>
#include <gtest/gtest.h>

namespace glyphwell::testing {

class DesktopTestEnvironment : public ::testing::Environment {
public:
    void SetUp() override {
        setenv("QT_QPA_PLATFORM", "offscreen", 0);
        static int argc = 1;
        static char name[] = "desktop_tests";
        static char* argv[] = {name, nullptr};
        application_ = new QGuiApplication(argc, argv);
    }
    void TearDown() override {
        delete application_;
        application_ = nullptr;
    }

private:
    QGuiApplication* application_ = nullptr;
};

inline ::testing::Environment* const kDesktopTestEnvironment =
    ::testing::AddGlobalTestEnvironment(new DesktopTestEnvironment);

/// Runs the event loop until `done` answers true or `timeout` has passed; returns `done()`.
inline bool SpinEventsUntil(const std::function<bool()>& done,
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
