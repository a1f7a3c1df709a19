// The process-exit watch and the file-manager reveal over a private session bus.
#include <csignal>
#include <sys/wait.h>
#include <unistd.h>

#include "desktop/QZFileManager.h"
#include "desktop/QZProcessWatch.h"
#include "tests/desktop/DesktopTestEnvironment.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrivateSessionBus.h"

namespace {

using glyphwell::testing::FileManagerStandIn;
using glyphwell::testing::LogCapture;
using glyphwell::testing::PrivateSessionBus;
using glyphwell::testing::SpinEventsUntil;

/// A child that waits until it is killed.
pid_t StartPausedChild() {
    const pid_t child = fork();
    if (child == 0) {
        for (;;)
            pause();
    }
    return child;
}

TEST(ProcessWatch, ReportsTheExitOfTheWatchedProcessOnce) {
    const pid_t child = StartPausedChild();
    ASSERT_GT(child, 0);
    QZProcessWatch watch(child);
    std::vector<pid_t> reported;
    QObject::connect(&watch, &QZProcessWatch::processExited,
                     [&](pid_t pid) { reported.push_back(pid); });
    EXPECT_TRUE(watch.isWatching());

    kill(child, SIGKILL);
    EXPECT_TRUE(SpinEventsUntil([&] { return !reported.empty(); }));
    // A zombie keeps the descriptor readable; the report still comes once.
    SpinEventsUntil([] { return false; }, std::chrono::milliseconds(100));
    waitpid(child, nullptr, 0);
    EXPECT_EQ(reported, std::vector<pid_t>{child});
    EXPECT_TRUE(watch.hasExited());
    EXPECT_FALSE(watch.isWatching());
}

TEST(ProcessWatch, WatchesNothingForInvalidOrVanishedProcessesWithoutLogging) {
    const pid_t child = fork();
    if (child == 0)
        _exit(0);
    ASSERT_GT(child, 0);
    waitpid(child, nullptr, 0);

    LogCapture log;
    for (pid_t pid : {pid_t(0), pid_t(-4), child}) {
        QZProcessWatch watch(pid);
        EXPECT_FALSE(watch.isWatching()) << pid;
        EXPECT_FALSE(watch.hasExited()) << pid;
    }
    EXPECT_TRUE(log.Texts().empty());
}

TEST(FileManagerReveal, ActivatesTheFileManagerThenShowsTheItems) {
    PrivateSessionBus bus;
    ASSERT_FALSE(bus.address().isEmpty()) << "dbus-daemon did not start";
    FileManagerStandIn fileManager(bus.address());
    ASSERT_TRUE(fileManager.registered());

    QZRevealInFileManager({QStringLiteral("file:///fonts/A.ttf"), QStringLiteral("file:///B.otf")},
                          QStringLiteral("startup-1"));
    ASSERT_TRUE(SpinEventsUntil([&] { return fileManager.calls().size() >= 2; }));

    const auto& calls = fileManager.calls();
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].member, QStringLiteral("Introspect"));
    EXPECT_EQ(calls[1].member, QStringLiteral("ShowItems"));
    EXPECT_EQ(calls[1].uris, QStringList({QStringLiteral("file:///fonts/A.ttf"),
                                          QStringLiteral("file:///B.otf")}));
    EXPECT_EQ(calls[1].startupId, QStringLiteral("startup-1"));
}

TEST(FileManagerReveal, WithoutASessionBusLogsOneLineAndSendsNothing) {
    const bool wasSet = qEnvironmentVariableIsSet("DBUS_SESSION_BUS_ADDRESS");
    const QByteArray previous = qgetenv("DBUS_SESSION_BUS_ADDRESS");
    qputenv("DBUS_SESSION_BUS_ADDRESS", "unix:path=/nonexistent/glyphwell-test-bus");
    LogCapture log;
    QZRevealInFileManager({QStringLiteral("file:///A.ttf")});
    QZRevealInFileManager({}); // nothing to show: not even a connection attempt
    if (wasSet)
        qputenv("DBUS_SESSION_BUS_ADDRESS", previous);
    else
        qunsetenv("DBUS_SESSION_BUS_ADDRESS");

    const auto lines = log.Texts();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].rfind("Cannot reveal files in the file manager: no session bus (", 0), 0u)
        << lines[0];
}

} // namespace
