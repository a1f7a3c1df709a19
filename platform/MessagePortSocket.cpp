// Socket naming and binding: the socket directory and path of a name, the listening socket that
// systemd hands over, the name lock, the takeover of a stale socket file, and binding.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "platform/HomeDirectory.h"
#include "platform/Log.h"
#include "platform/MessagePortInternal.h"

using glyphwell::AppLog;
using glyphwell::LogEscape;

namespace glyphwell::port::internal {

std::string ErrorText(int error) {
    char buffer[128];
    return strerror_r(error, buffer, sizeof buffer);
}

bool MakeAddress(const std::string& path, sockaddr_un* address) {
    std::memset(address, 0, sizeof *address);
    address->sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address->sun_path)
        return false;
    std::memcpy(address->sun_path, path.data(), path.size());
    return true;
}

void CloseDescriptor(int descriptor) {
    if (descriptor >= 0)
        close(descriptor); // Linux releases the descriptor even when close reports EINTR
}

namespace {

std::mutex activationMutex;

} // namespace

int TakeActivationSocket(const std::string& portName) {
    std::lock_guard<std::mutex> lock(activationMutex);
    const char* pidText = getenv("LISTEN_PID");
    const char* countText = getenv("LISTEN_FDS");
    if (!pidText && !countText)
        return -1;
    auto parse = [](const char* text) -> long {
        if (!text || !*text)
            return -1;
        char* end = nullptr;
        errno = 0;
        const long value = std::strtol(text, &end, 10);
        return errno || *end ? -1 : value;
    };
    const long pid = parse(pidText);
    const long count = parse(countText);
    unsetenv("LISTEN_PID");
    unsetenv("LISTEN_FDS");
    unsetenv("LISTEN_FDNAMES");
    if (pid != long(getpid()) || count < 1)
        return -1;
    // Like every descriptor of ours, the passed ones are not inherited by child processes.
    for (long passed = 0; passed < std::min(count, 64L); ++passed)
        fcntl(3 + int(passed), F_SETFD, FD_CLOEXEC);

    constexpr int kFirstPassedDescriptor = 3;
    int type = 0, listening = 0;
    socklen_t size = sizeof type;
    sockaddr_storage address{};
    socklen_t addressSize = sizeof address;
    const bool usable =
        getsockopt(kFirstPassedDescriptor, SOL_SOCKET, SO_TYPE, &type, &size) == 0 &&
        type == SOCK_STREAM &&
        (size = sizeof listening,
         getsockopt(kFirstPassedDescriptor, SOL_SOCKET, SO_ACCEPTCONN, &listening, &size) == 0) &&
        listening &&
        getsockname(kFirstPassedDescriptor, reinterpret_cast<sockaddr*>(&address), &addressSize) ==
            0 &&
        address.ss_family == AF_UNIX;
    if (!usable) {
        AppLog("message port %s: descriptor 3 from the service manager is not a listening Unix "
               "stream socket; not using it",
               portName.c_str());
        return -1;
    }
    const int flags = fcntl(kFirstPassedDescriptor, F_GETFL);
    if (flags >= 0)
        fcntl(kFirstPassedDescriptor, F_SETFL, flags | O_NONBLOCK);
    return kFirstPassedDescriptor;
}

/// An exclusive lock on the file `lockPath` (created when missing), or -1. Whoever holds the lock
/// removes the file before letting go (UnlockName), so a lock won on a file that was removed
/// meanwhile guards nothing: it is taken again on the file now at the path.
static int LockName(const std::string& lockPath) {
    for (int attempt = 0; attempt < 100; ++attempt) {
        const int lock = open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
        if (lock < 0)
            return -1;
        while (flock(lock, LOCK_EX) != 0 && errno == EINTR) {
        }
        struct stat held, current;
        if (fstat(lock, &held) == 0 && lstat(lockPath.c_str(), &current) == 0 &&
            held.st_dev == current.st_dev && held.st_ino == current.st_ino)
            return lock;
        CloseDescriptor(lock);
    }
    return -1;
}

/// Removes the lock file of LockName and lets the lock go; nothing for -1.
static void UnlockName(int lock, const std::string& lockPath) {
    if (lock < 0)
        return;
    unlink(lockPath.c_str());
    CloseDescriptor(lock);
}

/// True when the name's socket file can be bound: there is none, or nothing listens on it (a
/// stale file left by a server that ended without removing it, removed here). False when a live
/// server answers (no log line: the caller says what it means) or, after one log line, when the
/// file is not a socket or cannot be checked or removed.
static bool ClearStaleSocket(const std::string& portName, const std::string& path,
                             const sockaddr_un& address) {
    struct stat status;
    if (lstat(path.c_str(), &status) != 0) {
        if (errno == ENOENT)
            return true;
        AppLog("message port %s: cannot check %s: %s", portName.c_str(), LogEscape(path).c_str(),
               ErrorText(errno).c_str());
        return false;
    }
    if (!S_ISSOCK(status.st_mode)) {
        AppLog("message port %s: %s exists and is not a socket", portName.c_str(),
               LogEscape(path).c_str());
        return false;
    }
    const int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (probe < 0) {
        AppLog("message port %s: socket: %s", portName.c_str(), ErrorText(errno).c_str());
        return false;
    }
    const int result = connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    const int error = errno;
    CloseDescriptor(probe);
    if (result == 0 || error == EAGAIN || error == EINPROGRESS)
        return false; // the name is taken by a running server
    if (error != ECONNREFUSED) {
        AppLog("message port %s: cannot check %s: %s", portName.c_str(), LogEscape(path).c_str(),
               ErrorText(error).c_str());
        return false;
    }
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        AppLog("message port %s: cannot remove the stale socket %s: %s", portName.c_str(),
               LogEscape(path).c_str(), ErrorText(errno).c_str());
        return false;
    }
    return true;
}

/// A socket bound to `address` (mode 0600) and listening, and its file's identity; -1 after one
/// log line (none when a server bound the name first).
static int BindAndListen(const std::string& portName, const std::string& path,
                         const sockaddr_un& address, dev_t* device, ino_t* inode) {
    const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (descriptor < 0) {
        AppLog("message port %s: socket: %s", portName.c_str(), ErrorText(errno).c_str());
        return -1;
    }
    if (bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        if (errno != EADDRINUSE)
            AppLog("message port %s: cannot bind %s: %s", portName.c_str(), LogEscape(path).c_str(),
                   ErrorText(errno).c_str());
        CloseDescriptor(descriptor);
        return -1;
    }
    chmod(path.c_str(), 0600);
    struct stat status;
    if (listen(descriptor, SOMAXCONN) != 0 || stat(path.c_str(), &status) != 0) {
        AppLog("message port %s: cannot listen on %s: %s", portName.c_str(),
               LogEscape(path).c_str(), ErrorText(errno).c_str());
        unlink(path.c_str());
        CloseDescriptor(descriptor);
        return -1;
    }
    *device = status.st_dev;
    *inode = status.st_ino;
    return descriptor;
}

int BindListeningSocket(const std::string& portName, const std::string& path, dev_t* device,
                        ino_t* inode) {
    sockaddr_un address;
    if (!MakeAddress(path, &address))
        return -1;
    // Two servers starting at once must not both take over the same stale file: the check,
    // unlink and bind run under a lock on a file beside the socket, removed once bound.
    const std::string lockPath = path + ".lock";
    const int lock = LockName(lockPath);
    int listening = -1;
    if (ClearStaleSocket(portName, path, address))
        listening = BindAndListen(portName, path, address, device, inode);
    UnlockName(lock, lockPath);
    return listening;
}
} // namespace glyphwell::port::internal

namespace glyphwell::port {

std::string SocketDirectory() {
    std::string directory;
    const char* runtimeDirectory = getenv("XDG_RUNTIME_DIR");
    if (runtimeDirectory && runtimeDirectory[0] == '/') {
        directory = runtimeDirectory;
    } else {
        directory = glyphwell::HomeDirectory();
        if (directory.empty()) {
            AppLog("message port: no socket directory: neither XDG_RUNTIME_DIR nor a home "
                   "directory is known");
            return {};
        }
        while (directory.size() > 1 && directory.back() == '/')
            directory.pop_back();
        directory += directory == "/" ? ".glyphwell" : "/.glyphwell";
        // In the user's home no other user can take the name first; it is still checked, since
        // a home may be shared or its permissions loose.
        const uid_t user = geteuid();
        std::string refusal;
        struct stat status;
        if (mkdir(directory.c_str(), 0700) != 0 && errno != EEXIST)
            refusal = "cannot create it: " + ErrorText(errno);
        else if (lstat(directory.c_str(), &status) != 0)
            refusal = "cannot check it: " + ErrorText(errno);
        else if (S_ISLNK(status.st_mode))
            refusal = "it is a symbolic link";
        else if (!S_ISDIR(status.st_mode))
            refusal = "it is not a directory";
        else if (status.st_uid != user)
            refusal =
                Format("it is owned by uid %u, not %u", unsigned(status.st_uid), unsigned(user));
        else if ((status.st_mode & 077) != 0)
            refusal = Format("its mode %04o lets other users in", unsigned(status.st_mode & 07777));
        if (!refusal.empty()) {
            AppLog("message port: refused the socket directory %s: %s",
                   LogEscape(directory).c_str(), refusal.c_str());
            return {};
        }
    }
    while (directory.size() > 1 && directory.back() == '/')
        directory.pop_back();
    return directory;
}

std::string SocketPathForName(const std::string& name) {
    if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos ||
        name.find('\0') != std::string::npos)
        return {};
    const std::string directory = SocketDirectory();
    if (directory.empty())
        return {};
    std::string path = directory == "/" ? "/" + name : directory + "/" + name;
    if (path.size() >= sizeof(sockaddr_un::sun_path))
        return {};
    return path;
}
} // namespace glyphwell::port
