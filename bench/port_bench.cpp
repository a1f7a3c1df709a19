// The message port's request round trip, next to a bare Unix-socket exchange of the same frames
// in the same run.
//
// BM_PortRoundTrip sends a request with an unknown message id through a remote port to a local
// port served by a PollRunLoopDriver on its own thread; the callback answers with an empty reply,
// as the agent does for unknown ids. BM_BareSocketRoundTrip writes the same request frame on a
// plain connected Unix stream socket to a thread that reads it with blocking reads and writes
// the same 4-byte empty reply back: no run loop, no frame reassembly, no property values. The
// ratio of the two is what the port's machinery costs on top of the kernel's round trip.
//
// Both measure wall time (two threads take part); the argument is the request body's size.
#include <benchmark/benchmark.h>

#include <poll.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <future>
#include <string>
#include <thread>
#include <vector>

#include "platform/CFData.h"
#include "platform/CFMessagePort.h"
#include "platform/CFRunLoop.h"
#include "platform/CFString.h"

namespace {

CFStringRef PortName() {
    return CFSTR("org.glyphwell.Bench.Port");
}

bool WriteAll(int descriptor, const void* bytes, size_t length) {
    const char* at = static_cast<const char*>(bytes);
    while (length > 0) {
        const ssize_t sent = send(descriptor, at, length, MSG_NOSIGNAL);
        if (sent < 0 && errno == EINTR)
            continue;
        if (sent <= 0)
            return false;
        at += sent;
        length -= size_t(sent);
    }
    return true;
}

bool ReadAll(int descriptor, void* bytes, size_t length) {
    char* at = static_cast<char*>(bytes);
    while (length > 0) {
        const ssize_t got = recv(descriptor, at, length, 0);
        if (got < 0 && errno == EINTR)
            continue;
        if (got <= 0)
            return false;
        at += got;
        length -= size_t(got);
    }
    return true;
}

/// The local port, served on its own thread for the whole run.
class PortServerThread {
public:
    PortServerThread() {
        std::promise<bool> started;
        std::future<bool> ready = started.get_future();
        thread_ = std::thread([this, &started] {
            glyphwell::PollRunLoopDriver driver;
            glyphwell::SetRunLoopDriver(&driver);
            CFMessagePortRef port = CFMessagePortCreateLocal(
                kCFAllocatorDefault, PortName(),
                [](CFMessagePortRef, SInt32, CFDataRef, void*) -> CFDataRef { return nullptr; },
                nullptr, nullptr);
            if (port) {
                CFRunLoopSourceRef source =
                    CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, port, 0);
                CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
                CFRelease(source);
            }
            driver_.store(&driver);
            started.set_value(port != nullptr);
            while (port && !stopping_)
                driver.RunOnce(-1);
            if (port) {
                CFMessagePortInvalidate(port);
                CFRelease(port);
            }
            glyphwell::SetRunLoopDriver(nullptr);
            driver_.store(nullptr);
        });
        ok_ = ready.get();
    }
    ~PortServerThread() {
        stopping_ = true;
        // The driver lives until the thread's loop ends, which Wake lets it do.
        if (glyphwell::PollRunLoopDriver* driver = driver_.load())
            driver->Wake();
        thread_.join();
    }
    bool Ok() const { return ok_; }

private:
    std::thread thread_;
    std::atomic<bool> stopping_{false};
    std::atomic<glyphwell::PollRunLoopDriver*> driver_{nullptr};
    bool ok_ = false;
};

/// A bare server: one connection, blocking reads of each request frame, a 4-byte empty reply.
class BareServerThread {
public:
    BareServerThread(const std::string& path) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
        listener_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        if (bind(listener_, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
            listen(listener_, 4) != 0)
            return;
        thread_ = std::thread([this] {
            const int connection = accept(listener_, nullptr, nullptr);
            std::vector<char> body;
            unsigned char header[8];
            while (ReadAll(connection, header, sizeof header)) {
                const size_t length = size_t(header[4]) << 24 | size_t(header[5]) << 16 |
                                      size_t(header[6]) << 8 | header[7];
                body.resize(length);
                const unsigned char reply[4] = {0, 0, 0, 0};
                if (!ReadAll(connection, body.data(), length) ||
                    !WriteAll(connection, reply, sizeof reply))
                    break;
            }
            close(connection);
        });
        client_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        if (connect(client_, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
            close(client_);
            client_ = -1;
        }
    }
    ~BareServerThread() {
        if (client_ >= 0)
            close(client_); // the server's read ends
        if (thread_.joinable())
            thread_.join();
        close(listener_);
    }
    int Client() const { return client_; }

private:
    int listener_ = -1;
    int client_ = -1;
    std::thread thread_;
};

std::string runtimeDirectory;

CFDataRef RequestBody(size_t size) {
    std::vector<UInt8> bytes(size, 0x5A);
    return CFDataCreate(kCFAllocatorDefault, bytes.data(), CFIndex(size));
}

void BM_PortRoundTrip(benchmark::State& state) {
    static PortServerThread server;
    if (!server.Ok()) {
        state.SkipWithError("the local port could not be created");
        return;
    }
    CFMessagePortRef remote = CFMessagePortCreateRemote(kCFAllocatorDefault, PortName());
    if (!remote) {
        state.SkipWithError("no connection to the local port");
        return;
    }
    CFDataRef body = RequestBody(size_t(state.range(0)));
    for (auto _ : state) {
        CFDataRef reply = nullptr;
        const SInt32 status = CFMessagePortSendRequest(
            remote, 0x7A11, body, 10, kCFMessagePortWaitForever, kCFRunLoopDefaultMode, &reply);
        if (status != kCFMessagePortSuccess) {
            state.SkipWithError("a request failed");
            break;
        }
        CFRelease(reply);
    }
    state.SetItemsProcessed(state.iterations());
    CFRelease(body);
    CFRelease(remote);
}

void BM_BareSocketRoundTrip(benchmark::State& state) {
    static int runs = 0;
    BareServerThread server(runtimeDirectory + "/bare-" + std::to_string(++runs));
    if (server.Client() < 0) {
        state.SkipWithError("the bare server could not be set up");
        return;
    }
    std::vector<char> frame(8 + size_t(state.range(0)), 0x5A);
    const uint32_t length = uint32_t(state.range(0));
    const unsigned char header[8] = {0,
                                     0,
                                     0x7A,
                                     0x11,
                                     uint8_t(length >> 24),
                                     uint8_t(length >> 16),
                                     uint8_t(length >> 8),
                                     uint8_t(length)};
    std::memcpy(frame.data(), header, sizeof header);
    for (auto _ : state) {
        unsigned char reply[4];
        if (!WriteAll(server.Client(), frame.data(), frame.size()) ||
            !ReadAll(server.Client(), reply, sizeof reply)) {
            state.SkipWithError("the bare exchange failed");
            break;
        }
    }
    state.SetItemsProcessed(state.iterations());
}

BENCHMARK(BM_PortRoundTrip)->Arg(0)->Arg(2048)->Arg(1 << 20)->UseRealTime();
BENCHMARK(BM_BareSocketRoundTrip)->Arg(0)->Arg(2048)->Arg(1 << 20)->UseRealTime();

} // namespace

int main(int argc, char** argv) {
    char pattern[] = "/tmp/gw-port-bench-XXXXXX";
    if (!mkdtemp(pattern))
        return 1;
    runtimeDirectory = pattern;
    setenv("XDG_RUNTIME_DIR", pattern, 1);
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    std::error_code ignored;
    std::filesystem::remove_all(runtimeDirectory, ignored);
    return 0;
}
