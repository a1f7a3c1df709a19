// Helpers of the agent's tests: requests and the exact bytes of replies, a socket client, the
// English texts, scripted UI steps under a modal alert, a stand-in requester, a window watch.
#pragma once

#include <QAbstractButton>
#include <QApplication>
#include <QDialog>
#include <QDir>
#include <QFile>
#include <QLabel>
#include <QLocale>
#include <QMessageBox>
#include <QProgressBar>
#include <QPushButton>
#include <QTemporaryDir>
#include <QTimer>
#include <QTranslator>
#include <atomic>
#include <csignal>
#include <functional>
#include <optional>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

#include "UIAgent/AgentTesting.h"
#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZModalSession.h"
#include "UIAgent/QZQtRunLoopDriver.h"
#include "UIAgent/QZUIAgentHandleMessage.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/QtTestEnvironment.h"
#include "tests/support/FlattenedBytes.h"
#include "tests/support/PortTestSupport.h"
#include "tests/support/ScopedEnvironment.h"
#include "tests/support/Values.h"

namespace glyphwell::testing {

/// A private XDG_RUNTIME_DIR and the agent's run-loop driver while it lives.
class AgentPortEnvironment {
public:
    AgentPortEnvironment() { SetRunLoopDriver(&driver_); }
    ~AgentPortEnvironment() { SetRunLoopDriver(nullptr); }

private:
    TemporaryRuntimeDirectory directory_;
    QZQtRunLoopDriver driver_;
};

inline Ref Flattened(CFTypeRef value) {
    const std::vector<uint8_t> bytes = FlattenedBytes(value);
    return Ref(CFDataCreate(nullptr, bytes.data(), CFIndex(bytes.size())));
}

inline std::vector<uint8_t> Ascii(const std::string& text) {
    return {text.begin(), text.end()};
}

inline std::vector<uint8_t> Join(std::initializer_list<std::vector<uint8_t>> pieces) {
    std::vector<uint8_t> all;
    for (const auto& piece : pieces)
        all.insert(all.end(), piece.begin(), piece.end());
    return all;
}

/// A reply in hex: {Result, Suppress} as one-byte numbers (type 7), with `candidates` (the
/// array's bytes) the message id 1 reply that also holds them.
inline std::string Reply(bool result, bool suppress,
                         std::optional<std::vector<uint8_t>> candidates = {}) {
    auto flag = [](bool on) {
        return Hex(on ? "00 00 00 16  00 00 00 07  00 00 00 01  01"
                      : "00 00 00 16  00 00 00 07  00 00 00 01  00");
    };
    std::vector<uint8_t> bytes =
        Join({Hex(candidates ? "00 00 00 10  00 00 00 03" : "00 00 00 10  00 00 00 02"),
              Hex("00 00 00 07  00 00 00 12"), Ascii("QZUIPropertyResult"), flag(result),
              Hex("00 00 00 07  00 00 00 14"), Ascii("QZUIPropertySuppress"), flag(suppress)});
    if (candidates)
        bytes = Join({bytes, Hex("00 00 00 07  00 00 00 1D"),
                      Ascii("QZUIPropertyCandidateFontURLs"), *candidates});
    return ToHex(bytes);
}

/// The embedded "Localized" table of `language` installed while it lives.
class InstalledTable {
public:
    explicit InstalledTable(const QString& language) {
        loaded = translator_.load(QStringLiteral(":/translations/Localized_%1.qm").arg(language));
        if (loaded)
            QCoreApplication::installTranslator(&translator_);
    }
    ~InstalledTable() { QCoreApplication::removeTranslator(&translator_); }
    bool loaded = false;

private:
    QTranslator translator_;
};

/// The English table and an American English locale while it lives.
class EnglishTexts {
public:
    EnglishTexts() {
        EXPECT_TRUE(table_.loaded);
        QLocale::setDefault(QLocale(QLocale::English, QLocale::UnitedStates));
    }
    ~EnglishTexts() { QLocale::setDefault(previousLocale_); }

private:
    QLocale previousLocale_;
    InstalledTable table_{QStringLiteral("en")};
};

/// A script's give-up: ends the innermost modal run every 50 ms from now on.
inline void EndEveryModalRun() {
    auto* timer = new QTimer(QCoreApplication::instance());
    QObject::connect(timer, &QTimer::timeout, [] {
        if (QZModalSession* session = QZModalSession::Innermost())
            session->End(kQZModalResponseAbort);
    });
    timer->start(50);
}

/// Steps run from the event loop in order, each once its condition holds (polled every 10 ms),
/// to answer an alert while its modal run blocks the test. Not done after `patience`: the test
/// fails and `giveUp` runs.
class UiScript {
public:
    struct Step {
        std::function<bool()> when;
        std::function<void()> action;
    };

    explicit UiScript(std::vector<Step> steps, std::function<void()> giveUp = EndEveryModalRun,
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

inline QMessageBox* AlertOnScreen() {
    return qobject_cast<QMessageBox*>(QApplication::activeModalWidget());
}

/// The alert up and innermost whose headline is `text`, else null.
inline QMessageBox* AlertWithText(const QString& text) {
    QMessageBox* alert = AlertOnScreen();
    return alert && alert->isVisible() && alert->text() == text ? alert : nullptr;
}

/// The button of `alert` whose text is the table's text for `key`, or null.
inline QAbstractButton* ButtonWithText(QMessageBox* alert, const char* key) {
    for (QAbstractButton* button : alert ? alert->buttons() : QList<QAbstractButton*>())
        if (button->text() == QZLocalizedString(key))
            return button;
    return nullptr;
}

inline void ClickButton(QMessageBox* alert, const char* key) {
    QAbstractButton* button = ButtonWithText(alert, key);
    ASSERT_NE(button, nullptr) << key;
    button->click();
}

/// A step that presses the button `key` of the innermost alert once it has one.
inline UiScript::Step PressWhenUp(const char* key) {
    return {[key] { return ButtonWithText(AlertOnScreen(), key) != nullptr; },
            [key] { ClickButton(AlertOnScreen(), key); }};
}

inline Ref FileURL(const QString& path) {
    return Ref(CFURLCreateWithFileSystemPath(nullptr, Str(path.toStdString()).as<CFStringRef>(),
                                             kCFURLPOSIXPathStyle, false));
}

inline QString WriteFile(const QString& path, const QByteArray& contents = QByteArray()) {
    QFile file(path);
    EXPECT_TRUE(file.open(QIODevice::WriteOnly)) << path.toStdString();
    file.write(contents);
    return path;
}

/// A temporary data home (and no other data directory) for the download catalog while it lives,
/// with private cache and configuration homes, so that the catalog's compiled indexes and the
/// user's publishers stay out of the tests and the tests out of the user's cache.
class PrivateDataHome {
public:
    PrivateDataHome() {
        environment_.Set("XDG_DATA_HOME", directory_.path().toUtf8().constData());
        environment_.Set("XDG_DATA_DIRS", directory_.filePath("none").toUtf8().constData());
        environment_.Set("XDG_CACHE_HOME", directory_.filePath("cache").toUtf8().constData());
        environment_.Set("XDG_CONFIG_HOME", directory_.filePath("config").toUtf8().constData());
        QDir().mkpath(directory_.filePath("glyphwell"));
    }
    QString FilePath(const QString& name) const { return directory_.filePath(name); }
    /// Writes the catalog; every "%1" in `json` stands for a SHA-256 of 64 zeros.
    void WriteCatalog(const QString& json) {
        WriteFile(FilePath("glyphwell/downloadable-fonts.json"),
                  QString(json).replace("%1", QString(64, u'0')).toUtf8());
    }

private:
    QTemporaryDir directory_;
    ScopedEnvironment environment_;
};

/// A child process that waits until it is killed; killed and reaped when this goes.
class PausedChild {
public:
    PausedChild() : pid_(fork()) {
        if (pid_ == 0)
            for (;;)
                pause();
    }
    ~PausedChild() {
        Kill();
        waitpid(pid_, nullptr, 0);
    }
    pid_t pid() const { return pid_; }
    void Kill() const { kill(pid_, SIGKILL); }

private:
    pid_t pid_;
};

/// One requested font: its PostScript name, and its family and names by language when given.
inline Ref
RequestedFont(const char* postScriptName, const char* family = nullptr,
              std::initializer_list<std::pair<const char*, const char*>> localized = {}) {
    auto newDictionary = [] {
        return Ref(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                             &kCFTypeDictionaryValueCallBacks));
    };
    auto set = [](const Ref& dictionary, CFTypeRef key, const Ref& value) {
        CFDictionarySetValue((CFMutableDictionaryRef)dictionary.get(), key, value.get());
    };
    Ref attributes = newDictionary(), names = newDictionary();
    set(attributes, NSFontNameAttribute, Str(postScriptName));
    if (family)
        set(attributes, NSFontFamilyAttribute, Str(family));
    for (const auto& [language, name] : localized)
        set(names, Str(language).get(), Str(name));
    if (localized.size())
        set(attributes, NSCTFontLocalizedFamilyNameAttribute, names);
    return attributes;
}

/// A message id 2 request from "Example Writer" (process `pid`) for `fonts`, maybe not to ask.
inline Ref DownloadRequest(std::initializer_list<CFTypeRef> fonts, SInt32 pid = 0,
                           bool suppress = false) {
    return Dict({{kQZUIPropertyApplicationName, Str("Example Writer").get()},
                 {kQZUIPropertyProcessID, Num(kCFNumberSInt32Type, pid).get()},
                 {kQZUIPropertyFontProperties, Array(fonts).get()},
                 {kQZUIPropertySuppress, suppress ? kCFBooleanTrue : kCFBooleanFalse}});
}

/// The dispatcher's reply in hex to `request` (null: no bytes) as message `msgid`.
inline std::string HandleRequest(SInt32 msgid, CFTypeRef request, void* controller = nullptr) {
    Ref bytes = request ? Flattened(request) : Ref();
    Ref reply(QZUIAgentHandleMessage(nullptr, msgid, bytes.as<CFDataRef>(), controller));
    return ToHex(reply.as<CFDataRef>());
}
inline std::string HandleDownloadRequest(CFTypeRef request) {
    return HandleRequest(2, request);
}

inline QDialog* ProgressWindowOnScreen() {
    for (QWidget* widget : QApplication::topLevelWidgets())
        if (widget->objectName() == QLatin1String("FontDownloadWindow") && widget->isVisible())
            return qobject_cast<QDialog*>(widget);
    return nullptr;
}

/// Watches the agent's windows while it lives: how many were shown (and progress windows), which
/// were activated, the progress bar after each change, the progress window when first hidden.
class WindowWatch : public QObject {
public:
    WindowWatch() { QCoreApplication::instance()->installEventFilter(this); }
    ~WindowWatch() override { QCoreApplication::instance()->removeEventFilter(this); }
    int windowsShown = 0;
    int progressWindowsShown = 0;
    std::vector<std::string> bar; ///< "value/maximum" after each value change
    bool hidden = false;
    std::string statusWhenHidden;
    bool timerRunningWhenHidden = false;
    std::vector<QObject*> activated; ///< windows in the order they were activated

protected:
    bool eventFilter(QObject* watched, QEvent* event) override {
        if (!watched->isWidgetType() || !static_cast<QWidget*>(watched)->isWindow())
            return false;
        auto* window = static_cast<QWidget*>(watched);
        if (event->type() == QEvent::WindowActivate)
            activated.push_back(watched);
        const bool progress = window->objectName() == QLatin1String("FontDownloadWindow");
        if (event->type() == QEvent::Show) {
            ++windowsShown;
            if (!progress)
                return false;
            ++progressWindowsShown;
            auto* bar = window->findChild<QProgressBar*>("progressIndicator");
            connect(bar, &QProgressBar::valueChanged, this, [this, bar](int value) {
                this->bar.push_back(std::to_string(value) + "/" + std::to_string(bar->maximum()));
            });
        } else if (event->type() == QEvent::Hide && progress && !hidden) {
            hidden = true;
            statusWhenHidden =
                window->findChild<QLabel*>("mainStatusTextField")->text().toStdString();
            auto* timer = window->findChild<QTimer*>("refreshTimer");
            timerRunningWhenHidden = timer && timer->isActive();
        }
        return false;
    }
};

} // namespace glyphwell::testing
