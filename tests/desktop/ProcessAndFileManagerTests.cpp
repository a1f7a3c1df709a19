// The process-exit watch and the file-manager reveal when they have nothing to work with (the
// alert tests drive both for real: a dying child process, a stand-in file manager on a private
// bus).
#include <sys/wait.h>
#include <unistd.h>

#include "desktop/QZFileManager.h"
#include "desktop/QZProcessWatch.h"
#include "tests/desktop/DesktopTestEnvironment.h"
#include "tests/support/LogCapture.h"
#include "tests/support/ScopedEnvironment.h"

namespace {

using glyphwell::testing::LogCapture;

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

TEST(FileManagerReveal, WithoutASessionBusLogsOneLineAndSendsNothing) {
    glyphwell::testing::ScopedEnvironment environment;
    environment.Set("DBUS_SESSION_BUS_ADDRESS", "unix:path=/nonexistent/glyphwell-test-bus");
    LogCapture log;
    QZRevealInFileManager({QStringLiteral("file:///A.ttf")});
    QZRevealInFileManager({}); // nothing to show: not even a connection attempt

    const auto lines = log.Texts();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].rfind("Cannot reveal files in the file manager: no session bus (", 0), 0u)
        << lines[0];
}

} // namespace
