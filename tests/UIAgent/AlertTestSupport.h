// Helpers of the alert tests: the English texts of the "Localized" table, a script of UI steps
// run while an alert is up, and files and URLs in a temporary directory.
#pragma once

#include <QAbstractButton>
#include <QCoreApplication>
#include <QFile>
#include <QLocale>
#include <QTimer>
#include <QTranslator>
#include <functional>
#include <gtest/gtest.h>
#include <vector>

#include "tests/support/Values.h"

namespace glyphwell::testing {

/// The English "Localized" table and an American English locale while it lives.
class EnglishTexts {
public:
    EnglishTexts() : previousLocale_(QLocale()) {
        QLocale::setDefault(QLocale(QLocale::English, QLocale::UnitedStates));
        EXPECT_TRUE(translator_.load(QStringLiteral(":/translations/Localized_en.qm")));
        QCoreApplication::installTranslator(&translator_);
    }
    ~EnglishTexts() {
        QCoreApplication::removeTranslator(&translator_);
        QLocale::setDefault(previousLocale_);
    }
    EnglishTexts(const EnglishTexts&) = delete;
    EnglishTexts& operator=(const EnglishTexts&) = delete;

private:
    QLocale previousLocale_;
    QTranslator translator_;
};

/// Steps carried out from the event loop, in order: each one's action runs once its condition
/// holds (polled every 10 ms). Meant to answer an alert while its modal run blocks the test.
/// When the steps are not all done after `patience`, `giveUp` runs (to end the alert) and the
/// test fails.
class UiScript {
public:
    struct Step {
        std::function<bool()> when;
        std::function<void()> action;
    };

    UiScript(std::vector<Step> steps, std::function<void()> giveUp,
             std::chrono::milliseconds patience = std::chrono::seconds(20))
        : steps_(std::move(steps)) {
        QObject::connect(&poll_, &QTimer::timeout, [this] {
            if (next_ < steps_.size() && steps_[next_].when())
                steps_[next_++].action();
        });
        poll_.start(10);
        failsafe_.setSingleShot(true);
        QObject::connect(&failsafe_, &QTimer::timeout, [this, giveUp] {
            ADD_FAILURE() << "the script stalled at step " << next_;
            giveUp();
        });
        failsafe_.start(patience);
    }
    bool done() const { return next_ == steps_.size(); }

private:
    std::vector<Step> steps_;
    size_t next_ = 0;
    QTimer poll_;
    QTimer failsafe_;
};

/// A file URL for `path`.
inline Ref FileURL(const QString& path) {
    return Ref(CFURLCreateWithFileSystemPath(nullptr, Str(path.toStdString()).as<CFStringRef>(),
                                             kCFURLPOSIXPathStyle, false));
}

/// Creates the file `path` with `contents`; returns the path.
inline QString WriteFile(const QString& path, const QByteArray& contents = QByteArray()) {
    QFile file(path);
    EXPECT_TRUE(file.open(QIODevice::WriteOnly)) << path.toStdString();
    file.write(contents);
    return path;
}

} // namespace glyphwell::testing
