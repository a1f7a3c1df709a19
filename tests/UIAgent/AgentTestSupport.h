// Helpers of the agent core's tests: a private socket directory, the agent's run-loop driver,
// flattened requests, expected bytes, and the alert on screen.
#pragma once

#include <QAbstractButton>
#include <QApplication>
#include <QMessageBox>
#include <QWidget>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include "UIAgent/QZQtRunLoopDriver.h"
#include "serialization/TCFFlattenContext.h"
#include "tests/support/Values.h"

namespace glyphwell::testing {

/// Points XDG_RUNTIME_DIR at a fresh private directory while it lives, so that the agent's port
/// never meets a real agent or another test; installs the agent's run-loop driver.
class AgentPortEnvironment {
public:
    AgentPortEnvironment() {
        char pattern[] = "/tmp/glyphwell-agent-test-XXXXXX";
        directory_ = mkdtemp(pattern) ? pattern : "";
        const char* previous = getenv("XDG_RUNTIME_DIR");
        hadPrevious_ = previous != nullptr;
        if (previous)
            previous_ = previous;
        setenv("XDG_RUNTIME_DIR", directory_.c_str(), 1);
        SetRunLoopDriver(&driver_);
    }
    ~AgentPortEnvironment() {
        SetRunLoopDriver(nullptr);
        if (hadPrevious_)
            setenv("XDG_RUNTIME_DIR", previous_.c_str(), 1);
        else
            unsetenv("XDG_RUNTIME_DIR");
        std::error_code ignored;
        if (!directory_.empty())
            std::filesystem::remove_all(directory_, ignored);
    }
    AgentPortEnvironment(const AgentPortEnvironment&) = delete;
    AgentPortEnvironment& operator=(const AgentPortEnvironment&) = delete;

private:
    std::string directory_;
    std::string previous_;
    bool hadPrevious_ = false;
    QZQtRunLoopDriver driver_;
};

/// The flattened bytes of `value`, as a request carries them.
inline Ref Flattened(CFTypeRef value) {
    CFMutableDataRef data = CFDataCreateMutable(nullptr, 0);
    {
        TCFFlattenContext context(data, false);
        context.Flatten(value);
    }
    return Ref(data);
}

/// The ASCII bytes of `text`, to write expected byte strings readably.
inline std::vector<uint8_t> Ascii(const std::string& text) {
    return std::vector<uint8_t>(text.begin(), text.end());
}

/// Concatenates byte pieces.
inline std::vector<uint8_t> Join(std::initializer_list<std::vector<uint8_t>> pieces) {
    std::vector<uint8_t> all;
    for (const auto& piece : pieces)
        all.insert(all.end(), piece.begin(), piece.end());
    return all;
}

/// The alert that is up and innermost, or null.
inline QMessageBox* AlertOnScreen() {
    return qobject_cast<QMessageBox*>(QApplication::activeModalWidget());
}

/// The button of `alert` whose text is `text`, or null.
inline QAbstractButton* ButtonWithText(QMessageBox* alert, const QString& text) {
    if (!alert)
        return nullptr;
    for (QAbstractButton* button : alert->buttons())
        if (button->text() == text)
            return button;
    return nullptr;
}

} // namespace glyphwell::testing
