// Test helper: collects every log line while it lives, and restores the previous sink after.
#pragma once

#include <mutex>
#include <string>
#include <vector>

#include "platform/Log.h"

namespace glyphwell::testing {

class LogCapture {
public:
    LogCapture() {
        previous_ = SetLogSink([this](const LogRecord& record) {
            std::lock_guard<std::mutex> lock(mutex_);
            records_.push_back({record.channel, record.level, std::string(record.text)});
        });
    }
    ~LogCapture() { SetLogSink(previous_); }
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    struct Line {
        LogChannel channel;
        int level;
        std::string text;
    };

    /// The texts of every line so far, in order.
    std::vector<std::string> Texts() const {
        std::lock_guard<std::mutex> lock(mutex_);
        std::vector<std::string> texts;
        for (const Line& line : records_)
            texts.push_back(line.text);
        return texts;
    }
    std::vector<Line> Lines() const {
        std::lock_guard<std::mutex> lock(mutex_);
        return records_;
    }
    void Clear() {
        std::lock_guard<std::mutex> lock(mutex_);
        records_.clear();
    }

private:
    mutable std::mutex mutex_;
    std::vector<Line> records_;
    LogSink previous_;
};

} // namespace glyphwell::testing
