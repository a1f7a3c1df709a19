// Load and soak program for the message port: parallel clients send requests through remote
// ports to a local port served in a child process, as the agent serves its own (a poll run loop,
// a callback answering each request with an empty reply, as the agent does for unknown message
// ids). It reports requests per second, the round trip's p50, p99 and maximum, and the server
// process's resident memory and open descriptors, sampled over the run.
//
//   port_load [--clients N] [--seconds S] [--body BYTES] [--sample SECONDS] [--idle N]
//             [--flooders N] [--work MICROSECONDS]
//
// --idle opens N more connections that stay silent for the whole run; --flooders runs N more
// clients that each queue 5,000 requests and hang up, once a second. --work makes the server's
// callback take that long per request (busy), as the agent's reading and answering does. Neither
// may hold up the measured clients. A soak is a long run: --seconds 600 --sample 60.
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "platform/CFData.h"
#include "platform/CFMessagePort.h"
#include "platform/CFRunLoop.h"
#include "platform/CFString.h"
#include "support/PortTestSupport.h"

namespace {

using Clock = std::chrono::steady_clock;
using glyphwell::testing::RawConnect;

struct Options {
    int clients = 20;
    double seconds = 10;
    size_t body = 256;
    double sample = 1;
    int idle = 0;
    int flooders = 0;
    double work = 0;
};

/// The server callback's busy time per request, in microseconds.
double serverWork = 0;

bool ParseOptions(int argc, char** argv, Options* options) {
    for (int i = 1; i + 1 < argc; i += 2) {
        const std::string flag = argv[i];
        const char* value = argv[i + 1];
        if (flag == "--clients")
            options->clients = std::atoi(value);
        else if (flag == "--seconds")
            options->seconds = std::atof(value);
        else if (flag == "--body")
            options->body = size_t(std::atol(value));
        else if (flag == "--sample")
            options->sample = std::atof(value);
        else if (flag == "--idle")
            options->idle = std::atoi(value);
        else if (flag == "--flooders")
            options->flooders = std::atoi(value);
        else if (flag == "--work")
            options->work = std::atof(value);
        else
            return false;
    }
    return argc % 2 == 1 && options->clients > 0 && options->seconds > 0 && options->sample > 0 &&
           options->idle >= 0 && options->flooders >= 0 && options->work >= 0;
}

CFStringRef PortName() {
    return CFSTR("org.glyphwell.Bench.Load");
}

CFDataRef EmptyReply(CFMessagePortRef, SInt32, CFDataRef, void*) {
    const auto until = Clock::now() + std::chrono::duration_cast<Clock::duration>(
                                          std::chrono::duration<double, std::micro>(serverWork));
    while (Clock::now() < until) {
    }
    return nullptr;
}

/// The server: a local port on a poll run loop, until killed. Writes one byte to `ready` once
/// the port listens (0 when it could not be made).
[[noreturn]] void RunServer(int ready) {
    glyphwell::PollRunLoopDriver driver;
    glyphwell::SetRunLoopDriver(&driver);
    CFMessagePortContext context{0, nullptr, nullptr, nullptr, nullptr};
    CFMessagePortRef port =
        CFMessagePortCreateLocal(kCFAllocatorDefault, PortName(), EmptyReply, &context, nullptr);
    const char started = port ? 1 : 0;
    if (write(ready, &started, 1) != 1 || !port)
        _exit(1);
    CFRunLoopSourceRef source = CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, port, 0);
    CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
    CFRelease(source);
    for (;;)
        driver.RunOnce(-1);
}

/// Round trips counted per microsecond up to 1 ms, then per 10 µs up to 100 ms, then one bucket.
class Histogram {
public:
    void Add(double microseconds) {
        size_t bucket = microseconds < 1000     ? size_t(microseconds)
                        : microseconds < 100000 ? 1000 + size_t((microseconds - 1000) / 10)
                                                : kBuckets - 1;
        ++counts_[std::min(bucket, kBuckets - 1)];
        ++total_;
        maximum_ = std::max(maximum_, microseconds);
    }
    void Merge(const Histogram& other) {
        for (size_t i = 0; i < kBuckets; ++i)
            counts_[i] += other.counts_[i];
        total_ += other.total_;
        maximum_ = std::max(maximum_, other.maximum_);
    }
    /// The round trip below which `fraction` of them lie, in microseconds.
    double Quantile(double fraction) const {
        const uint64_t wanted = uint64_t(fraction * double(total_));
        uint64_t seen = 0;
        for (size_t i = 0; i < kBuckets; ++i) {
            seen += counts_[i];
            if (seen > wanted)
                return i < 1000 ? double(i) : 1000 + double(i - 1000) * 10;
        }
        return maximum_;
    }
    uint64_t Total() const { return total_; }
    double Maximum() const { return maximum_; }

private:
    static constexpr size_t kBuckets = 1000 + 9900 + 1;
    std::vector<uint64_t> counts_ = std::vector<uint64_t>(kBuckets);
    uint64_t total_ = 0;
    double maximum_ = 0;
};

struct ClientResult {
    Histogram roundTrips;
    uint64_t errors = 0;
};

void RunClient(const Options& options, const std::atomic<bool>& stop, ClientResult* result) {
    CFMessagePortRef remote = CFMessagePortCreateRemote(kCFAllocatorDefault, PortName());
    if (!remote) {
        ++result->errors;
        return;
    }
    std::vector<UInt8> bytes(options.body, 'b');
    CFDataRef body = CFDataCreate(kCFAllocatorDefault, bytes.data(), CFIndex(bytes.size()));
    while (!stop.load(std::memory_order_relaxed)) {
        const Clock::time_point start = Clock::now();
        CFDataRef reply = nullptr;
        const SInt32 status =
            CFMessagePortSendRequest(remote, 1000, body, 10, 10, kCFRunLoopDefaultMode, &reply);
        const double elapsed =
            std::chrono::duration<double, std::micro>(Clock::now() - start).count();
        if (status == kCFMessagePortSuccess && reply && CFDataGetLength(reply) == 0)
            result->roundTrips.Add(elapsed);
        else
            ++result->errors;
        if (reply)
            CFRelease(reply);
    }
    CFRelease(body);
    CFRelease(remote);
}

/// Queues 5,000 empty requests on a new connection and hangs up, once a second until `stop`.
void RunFlooder(const std::string& path, const std::atomic<bool>& stop) {
    std::string frames;
    for (int i = 0; i < 5000; ++i)
        frames.append("\x00\x00\x03\xE8\x00\x00\x00\x00", 8);
    while (!stop.load(std::memory_order_relaxed)) {
        const int descriptor = RawConnect(path);
        if (descriptor < 0)
            continue;
        size_t done = 0;
        while (done < frames.size()) {
            const ssize_t sent =
                send(descriptor, frames.data() + done, frames.size() - done, MSG_NOSIGNAL);
            if (sent <= 0)
                break;
            done += size_t(sent);
        }
        close(descriptor);
        for (int tick = 0; tick < 10 && !stop.load(std::memory_order_relaxed); ++tick)
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
}

/// The server's resident memory in KiB (VmRSS) and its open descriptors.
std::pair<long, long> SampleProcess(pid_t server) {
    long residentKiB = -1;
    std::ifstream status("/proc/" + std::to_string(server) + "/status");
    for (std::string line; std::getline(status, line);)
        if (line.rfind("VmRSS:", 0) == 0)
            residentKiB = std::atol(line.c_str() + 6);
    long descriptors = 0;
    std::error_code error;
    for (auto it =
             std::filesystem::directory_iterator("/proc/" + std::to_string(server) + "/fd", error);
         !error && it != std::filesystem::directory_iterator(); it.increment(error))
        ++descriptors;
    return {residentKiB, descriptors};
}

} // namespace

int main(int argc, char** argv) {
    Options options;
    if (!ParseOptions(argc, argv, &options)) {
        std::fprintf(stderr, "usage: port_load [--clients N] [--seconds S] [--body BYTES] "
                             "[--sample SECONDS] [--idle N] [--flooders N] [--work US]\n");
        return 2;
    }
    char pattern[] = "/tmp/glyphwell-load-XXXXXX";
    if (!mkdtemp(pattern)) {
        std::perror("mkdtemp");
        return 1;
    }
    setenv("XDG_RUNTIME_DIR", pattern, 1);

    int ready[2];
    if (pipe(ready) != 0)
        return 1;
    serverWork = options.work;
    const pid_t server = fork();
    if (server == 0) {
        close(ready[0]);
        RunServer(ready[1]);
    }
    close(ready[1]);
    char started = 0;
    if (server < 0 || read(ready[0], &started, 1) != 1 || !started) {
        std::fprintf(stderr, "port_load: the server did not start\n");
        return 1;
    }
    close(ready[0]);

    std::vector<int> idle;
    const std::string path = glyphwell::port::SocketPathForName("org.glyphwell.Bench.Load");
    // Silent connections that stay open: raw sockets, never written to.
    for (int i = 0; i < options.idle; ++i)
        if (const int descriptor = RawConnect(path); descriptor >= 0)
            idle.push_back(descriptor);

    const auto [startKiB, startDescriptors] = SampleProcess(server);
    std::printf(
        "server pid %d: %ld KiB resident, %ld descriptors before the run "
        "(%d clients, %zu-byte requests, %zu silent connections, %d flooders, %g us of work "
        "per request)\n",
        int(server), startKiB, startDescriptors, options.clients, options.body, idle.size(),
        options.flooders, options.work);
    std::printf("%8s %12s %10s %12s %8s\n", "time s", "requests", "req/s", "RSS KiB", "fds");

    std::atomic<bool> stop{false};
    std::vector<ClientResult> results(size_t(options.clients));
    std::vector<std::thread> clients;
    const Clock::time_point begin = Clock::now();
    for (int i = 0; i < options.clients; ++i)
        clients.emplace_back(RunClient, std::cref(options), std::cref(stop), &results[size_t(i)]);
    for (int i = 0; i < options.flooders; ++i)
        clients.emplace_back(RunFlooder, std::cref(path), std::cref(stop));

    long maxKiB = startKiB, maxDescriptors = startDescriptors;
    const auto end = begin + std::chrono::duration_cast<Clock::duration>(
                                 std::chrono::duration<double>(options.seconds));
    auto nextSample = begin;
    while (Clock::now() < end) {
        nextSample += std::chrono::duration_cast<Clock::duration>(
            std::chrono::duration<double>(options.sample));
        std::this_thread::sleep_until(std::min(nextSample, end));
        const auto [kib, descriptors] = SampleProcess(server);
        maxKiB = std::max(maxKiB, kib);
        maxDescriptors = std::max(maxDescriptors, descriptors);
        // Counts read while clients run: approximate, for the trace only.
        uint64_t total = 0;
        for (const ClientResult& result : results)
            total += result.roundTrips.Total();
        const double elapsed = std::chrono::duration<double>(Clock::now() - begin).count();
        std::printf("%8.1f %12llu %10.0f %12ld %8ld\n", elapsed, (unsigned long long)total,
                    double(total) / elapsed, kib, descriptors);
        std::fflush(stdout);
    }
    stop = true;
    for (std::thread& client : clients)
        client.join();
    const double elapsed = std::chrono::duration<double>(Clock::now() - begin).count();
    const auto [endKiB, endDescriptors] = SampleProcess(server);

    Histogram all;
    uint64_t errors = 0;
    for (const ClientResult& result : results) {
        all.Merge(result.roundTrips);
        errors += result.errors;
    }
    std::printf("\n%llu requests in %.1f s: %.0f requests/s, %llu errors\n",
                (unsigned long long)all.Total(), elapsed, double(all.Total()) / elapsed,
                (unsigned long long)errors);
    std::printf("round trip: p50 %.0f us, p99 %.0f us, max %.0f us\n", all.Quantile(0.5),
                all.Quantile(0.99), all.Maximum());
    std::printf(
        "server resident memory: %ld KiB before, %ld KiB at most, %ld KiB after (%+.1f %%)\n",
        startKiB, maxKiB, endKiB, 100.0 * double(endKiB - startKiB) / double(startKiB));
    std::printf("server descriptors: %ld before, %ld at most, %ld after\n", startDescriptors,
                maxDescriptors, endDescriptors);

    for (int descriptor : idle)
        close(descriptor);
    kill(server, SIGTERM);
    waitpid(server, nullptr, 0);
    std::error_code ignored;
    std::filesystem::remove_all(pattern, ignored);
    return errors == 0 ? 0 : 1;
}
