// The one application object of the desktop test executable: process watches and D-Bus calls
// need an event loop. Runs on Qt's offscreen platform.
#pragma once

#include <QGuiApplication>
#include <cstdlib>
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

} // namespace glyphwell::testing
