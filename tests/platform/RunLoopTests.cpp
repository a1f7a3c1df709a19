// The poll driver and the per-thread run loop that local ports are served through.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <fstream>
#include <future>
#include <string>
#include <thread>

#include "platform/CFMessagePort.h"
#include "platform/CFRunLoop.h"
#include "support/PortTestSupport.h"
#include "support/Values.h"

using glyphwell::PollRunLoopDriver;
using namespace glyphwell::testing;

namespace {

struct Pipe {
    Pipe() {
        int ends[2];
        if (pipe(ends) == 0) {
            read = ends[0];
            write = ends[1];
        }
    }
    ~Pipe() {
        close(read);
        close(write);
    }
    int read = -1, write = -1;
};

/// Whether thread `tid` of this process is asleep in the kernel (state S in its stat line).
bool IsBlocked(pid_t tid) {
    std::ifstream stat("/proc/self/task/" + std::to_string(tid) + "/stat");
    std::string line;
    std::getline(stat, line);
    const size_t end = line.rfind(')'); // the command name may hold spaces and parentheses
    return end != std::string::npos && end + 2 < line.size() && line[end + 2] == 'S';
}

} // namespace

TEST(PollRunLoopDriver, NeverCallsACallbackUnwatchedEarlierInTheSameRound) {
    PollRunLoopDriver driver;
    Pipe first, second;
    ASSERT_EQ(write(first.write, "x", 1), 1);
    ASSERT_EQ(write(second.write, "x", 1), 1);
    int oldCalls = 0, newCalls = 0;
    // Whichever runs first replaces the other's registration: neither the old callback nor the
    // new one may run for that descriptor in this round, although it was ready.
    auto replaceOther = [&](int other) {
        ++oldCalls;
        driver.Unwatch(other);
        driver.Watch(other, true, false, [&](bool, bool) { ++newCalls; });
    };
    driver.Watch(first.read, true, false, [&](bool, bool) { replaceOther(second.read); });
    driver.Watch(second.read, true, false, [&](bool, bool) { replaceOther(first.read); });
    ASSERT_TRUE(driver.RunOnce(1000));
    EXPECT_EQ(oldCalls, 1);
    EXPECT_EQ(newCalls, 0);
    ASSERT_TRUE(driver.RunOnce(1000));
    EXPECT_EQ(newCalls, 1);
}

TEST(PollRunLoopDriver, ANestedRoundDoesNotReplayItsReadinessInTheOuterOne) {
    // Each pipe in turn is the trigger: its callback makes the other pipes readable and runs a
    // nested round, which serves them. Back in the outer round, they must not be called again
    // from what the nested round saw (whatever the poll order, some trigger comes first).
    PollRunLoopDriver driver;
    Pipe pipes[4];
    int calls[4] = {};
    for (int p = 0; p < 4; ++p) {
        ASSERT_EQ(fcntl(pipes[p].read, F_SETFL, O_NONBLOCK), 0);
        driver.Watch(pipes[p].read, true, false, [&, p](bool, bool) {
            char byte;
            ++calls[p];
            if (read(pipes[p].read, &byte, 1) == 1 && byte == 't') {
                for (Pipe& other : pipes)
                    if (&other != &pipes[p] && write(other.write, "o", 1) != 1)
                        ADD_FAILURE() << "cannot write to a pipe";
                driver.RunOnce(1000);
            }
        });
    }
    for (int trigger = 0; trigger < 4; ++trigger) {
        SCOPED_TRACE(trigger);
        std::fill(std::begin(calls), std::end(calls), 0);
        ASSERT_EQ(write(pipes[trigger].write, "t", 1), 1);
        ASSERT_TRUE(driver.RunOnce(1000));
        for (int p = 0; p < 4; ++p)
            EXPECT_EQ(calls[p], 1) << p;
    }
}

TEST(PollRunLoopDriver, WakeEndsAWaitFromAnotherThread) {
    PollRunLoopDriver driver;
    EXPECT_FALSE(driver.RunOnce(-1)) << "nothing watched: returns at once";
    Pipe idle;
    bool called = false;
    driver.Watch(idle.read, true, false, [&](bool, bool) { called = true; });
    // Wake once this thread is blocked in the wait, so that the wake has to end it.
    const pid_t waiter = gettid();
    std::thread waker([&] {
        while (!IsBlocked(waiter))
            std::this_thread::yield();
        driver.Wake();
    });
    EXPECT_TRUE(driver.RunOnce(-1));
    waker.join();
    EXPECT_FALSE(called);
}

TEST(RunLoop, SourcesAreServedByWhicheverDriverIsInstalled) {
    TemporaryRuntimeDirectory runtime;
    Ref name(CreateCFString("org.glyphwell.Test.Loop"));
    Ref port(CFMessagePortCreateLocal(kCFAllocatorDefault, name.as<CFStringRef>(), nullptr, nullptr,
                                      nullptr));
    ASSERT_TRUE(port);
    CFRunLoopSourceRef source =
        CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, port.as<CFMessagePortRef>(), 0);
    CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
    CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes); // no-op

    PollRunLoopDriver first, second;
    EXPECT_FALSE(first.RunOnce(0));
    glyphwell::SetRunLoopDriver(&first);
    EXPECT_TRUE(first.RunOnce(0));
    glyphwell::SetRunLoopDriver(&second);
    EXPECT_FALSE(first.RunOnce(0)) << "the source left the old driver";

    const int client = RawConnect(runtime.Path() + "/org.glyphwell.Test.Loop");
    ASSERT_GE(client, 0);
    ASSERT_TRUE(RawWrite(client, RequestFrame(1, "")));
    std::string reply;
    for (int round = 0; round < 100 && reply.size() < 4; ++round) {
        second.RunOnce(10);
        reply += RawRead(client, 4 - reply.size(), 0);
    }
    EXPECT_EQ(reply, std::string("\x00\x00\x00\x00", 4)) << "a port without callback replies empty";
    close(client);

    CFRunLoopRemoveSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
    EXPECT_FALSE(second.RunOnce(0));
    glyphwell::SetRunLoopDriver(nullptr);
    CFRelease(source);
}
