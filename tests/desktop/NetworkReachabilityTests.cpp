// The network check: the flag test, and the flags read from the routing table of network
// namespaces made by the test (root only; skipped where namespaces cannot be made).
#include <gtest/gtest.h>
#include <sched.h>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#include "desktop/QZNetworkReachability.h"

namespace {

TEST(NetworkFlags, ConnectedOnlyWhenReachableWithoutAConnectionToBringUp) {
    EXPECT_TRUE(QZNetworkFlagsAllowConnection(kQZNetworkReachabilityFlagsReachable));
    EXPECT_TRUE(
        QZNetworkFlagsAllowConnection(kQZNetworkReachabilityFlagsReachable | 1u << 3 | 1u << 17));
    EXPECT_FALSE(QZNetworkFlagsAllowConnection(kQZNetworkReachabilityFlagsReachable |
                                               kQZNetworkReachabilityFlagsConnectionRequired));
    EXPECT_FALSE(QZNetworkFlagsAllowConnection(kQZNetworkReachabilityFlagsConnectionRequired));
    EXPECT_FALSE(QZNetworkFlagsAllowConnection(0));
}

/// What a child process found in its own network namespace.
enum class Probe { Unavailable, Failed, NotReachable, Reachable };

/// Runs `setup` (shell commands) in a new network namespace, made in a child process, then reads
/// the flags there, waiting up to two seconds for them to become `expected` (a link's carrier
/// comes up asynchronously). The child never returns into the test.
Probe ProbeNamespace(const std::string& setup, Probe expected) {
    const pid_t child = fork();
    if (child < 0)
        return Probe::Unavailable;
    if (child == 0) {
        if (unshare(CLONE_NEWNET) != 0)
            _exit(int(Probe::Unavailable));
        const std::string script = "set -e; ip link set lo up; " + setup;
        if (std::system(script.c_str()) != 0)
            _exit(int(Probe::Unavailable));
        Probe found = Probe::Failed;
        for (int attempt = 0; attempt < 40; ++attempt) {
            QZNetworkReachabilityFlags flags = 0;
            if (!QZGetDefaultRouteReachabilityFlags(&flags))
                _exit(int(Probe::Failed));
            if ((flags & kQZNetworkReachabilityFlagsConnectionRequired) ||
                IsNetworkConnected() != QZNetworkFlagsAllowConnection(flags))
                _exit(int(Probe::Failed));
            found = (flags & kQZNetworkReachabilityFlagsReachable) ? Probe::Reachable
                                                                   : Probe::NotReachable;
            if (found == expected)
                break;
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
        _exit(int(found));
    }
    int status = 0;
    if (waitpid(child, &status, 0) != child || !WIFEXITED(status))
        return Probe::Failed;
    return Probe(WEXITSTATUS(status));
}

TEST(NetworkNamespace, ReachableOnlyByADefaultRouteOverARunningLink) {
    if (geteuid() != 0 || std::system("command -v ip >/dev/null 2>&1") != 0)
        GTEST_SKIP() << "network namespaces need root and the ip command";
    // A veth pair whose two ends stay in the namespace: both up gives a carrier.
    const std::string veth = "ip link add gw0 type veth peer name gw1; "
                             "ip link set gw0 up; ip link set gw1 up; ";
    const std::string v4 = veth + "ip addr add 10.211.0.1/24 dev gw0; ";
    const std::pair<std::string, Probe> cases[] = {
        {"ip addr add 10.211.0.1/24 dev lo", Probe::NotReachable},
        {v4 + "ip route add default via 10.211.0.2 dev gw0", Probe::Reachable},
        {veth + "ip -6 addr add fd00:211::1/64 dev gw0 nodad; "
                "ip -6 route add default via fd00:211::2 dev gw0",
         Probe::Reachable},
        // The peer goes down: gw0 stays up but stops running; its route stays in the table.
        {v4 + "ip route add default via 10.211.0.2 dev gw0; ip link set gw1 down; "
              "ip route show default | grep -q gw0",
         Probe::NotReachable},
        {v4 + "ip route add unreachable default", Probe::NotReachable},
    };
    for (const auto& [setup, expected] : cases) {
        const Probe found = ProbeNamespace(setup, expected);
        if (found == Probe::Unavailable)
            GTEST_SKIP() << "cannot make the namespace: " << setup;
        EXPECT_EQ(int(found), int(expected)) << setup;
    }
}

} // namespace
