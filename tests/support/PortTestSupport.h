// Message port helpers: a private runtime directory, a port served on a thread, raw sockets.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <functional>
#include <future>
#include <mutex>
#include <string>
#include <thread>

#include "platform/CFData.h"
#include "platform/CFMessagePort.h"
#include "platform/CFString.h"
#include "support/ScopedEnvironment.h"

namespace glyphwell::testing {

/// Points XDG_RUNTIME_DIR at a new empty directory (mode 0700) while it lives.
class TemporaryRuntimeDirectory {
public:
    TemporaryRuntimeDirectory() {
        char pattern[] = "/tmp/gw-port-XXXXXX";
        const char* made = mkdtemp(pattern);
        path_ = made ? made : "";
        environment_.Set("XDG_RUNTIME_DIR", path_.c_str());
    }
    ~TemporaryRuntimeDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    TemporaryRuntimeDirectory(const TemporaryRuntimeDirectory&) = delete;
    TemporaryRuntimeDirectory& operator=(const TemporaryRuntimeDirectory&) = delete;

    const std::string& Path() const { return path_; }

private:
    std::string path_;
    ScopedEnvironment environment_;
};

inline CFStringRef CreateCFString(const std::string& text) {
    return CFStringCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(text.data()),
                                   CFIndex(text.size()), kCFStringEncodingUTF8, false);
}

inline CFDataRef CreateCFData(const std::string& bytes) {
    return CFDataCreate(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(bytes.data()),
                        CFIndex(bytes.size()));
}

inline std::string BytesOf(CFDataRef data) {
    if (!data || CFDataGetLength(data) == 0)
        return {};
    return std::string(reinterpret_cast<const char*>(CFDataGetBytePtr(data)),
                       size_t(CFDataGetLength(data)));
}

/// A local port served on its own thread; the handler returns the reply (owned, or null: empty).
class PortServer {
public:
    using Handler = std::function<CFDataRef(SInt32 msgid, CFDataRef data)>;

    PortServer(const std::string& name, Handler handler) : handler_(std::move(handler)) {
        std::promise<bool> started;
        std::future<bool> result = started.get_future();
        thread_ = std::thread([this, name, &started] { Run(name, started); });
        started_ = result.get();
    }
    ~PortServer() { Stop(); }
    PortServer(const PortServer&) = delete;
    PortServer& operator=(const PortServer&) = delete;

    /// False when the port could not be created.
    bool Started() const { return started_; }

    /// Invalidates the port on its thread and ends the thread.
    void Stop() {
        if (!thread_.joinable())
            return;
        stopping_ = true;
        {
            std::lock_guard<std::mutex> lock(mutex_);
            if (driver_)
                driver_->Wake();
        }
        thread_.join();
    }

private:
    static CFDataRef Callback(CFMessagePortRef, SInt32 msgid, CFDataRef data, void* info) {
        return static_cast<PortServer*>(info)->handler_(msgid, data);
    }

    void Run(const std::string& name, std::promise<bool>& started) {
        PollRunLoopDriver driver;
        SetRunLoopDriver(&driver);
        CFStringRef portName = CreateCFString(name);
        CFMessagePortContext context{0, this, nullptr, nullptr, nullptr};
        CFMessagePortRef port =
            CFMessagePortCreateLocal(kCFAllocatorDefault, portName, Callback, &context, nullptr);
        CFRelease(portName);
        if (port) {
            CFRunLoopSourceRef source =
                CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, port, 0);
            CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
            CFRelease(source);
        }
        {
            std::lock_guard<std::mutex> lock(mutex_);
            driver_ = &driver;
        }
        started.set_value(port != nullptr);
        while (port && !stopping_)
            driver.RunOnce(-1);
        if (port) {
            CFMessagePortInvalidate(port);
            CFRelease(port);
        }
        SetRunLoopDriver(nullptr);
        std::lock_guard<std::mutex> lock(mutex_);
        driver_ = nullptr;
    }

    Handler handler_;
    std::thread thread_;
    bool started_ = false;
    std::atomic<bool> stopping_{false};
    std::mutex mutex_;
    PollRunLoopDriver* driver_ = nullptr;
};

/// A blocking socket connected to `path`, or listening there (no server behind it); -1 on failure.
inline int RawSocket(const std::string& path, bool listening) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path)
        return -1;
    std::memcpy(address.sun_path, path.data(), path.size());
    const auto* named = reinterpret_cast<const sockaddr*>(&address);
    const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (descriptor >= 0 &&
        (listening ? bind(descriptor, named, sizeof address) != 0 || listen(descriptor, 16) != 0
                   : connect(descriptor, named, sizeof address) != 0)) {
        close(descriptor);
        return -1;
    }
    return descriptor;
}
inline int RawConnect(const std::string& path) {
    return RawSocket(path, false);
}
inline int RawListen(const std::string& path) {
    return RawSocket(path, true);
}

inline bool RawWrite(int descriptor, const std::string& bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t sent =
            send(descriptor, bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
        if (sent < 0 && errno == EINTR)
            continue;
        if (sent <= 0)
            return false;
        done += size_t(sent);
    }
    return true;
}

/// Reads until `count` bytes came, the peer closed, or `timeoutMs` passed without data.
inline std::string RawRead(int descriptor, size_t count, int timeoutMs = 5000) {
    std::string bytes;
    char buffer[65536];
    while (bytes.size() < count) {
        pollfd entry{descriptor, POLLIN, 0};
        if (poll(&entry, 1, timeoutMs) <= 0)
            break;
        const ssize_t got =
            recv(descriptor, buffer, std::min(sizeof buffer, count - bytes.size()), 0);
        if (got < 0 && errno == EINTR)
            continue;
        if (got <= 0)
            break;
        bytes.append(buffer, size_t(got));
    }
    return bytes;
}

/// True when the peer closed (end of stream or reset) within `timeoutMs`, sending nothing first.
inline bool RawSeesClose(int descriptor, int timeoutMs = 5000) {
    pollfd entry{descriptor, POLLIN, 0};
    if (poll(&entry, 1, timeoutMs) <= 0)
        return false;
    char byte;
    const ssize_t got = recv(descriptor, &byte, 1, 0);
    return got == 0 || (got < 0 && errno == ECONNRESET);
}

/// A request frame: msgid and length big-endian, then the body.
inline std::string RequestFrame(int32_t msgid, const std::string& body) {
    std::string frame;
    for (uint32_t value : {uint32_t(msgid), uint32_t(body.size())})
        for (int shift = 24; shift >= 0; shift -= 8)
            frame += char((value >> shift) & 0xFF);
    return frame + body;
}

} // namespace glyphwell::testing
