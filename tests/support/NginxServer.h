// Test helper: a real nginx serving a folder on a loopback port, with a private configuration
// (static files: ETag, Last-Modified, 304 answers and byte ranges), stopped and removed with the
// object. Not running when nginx is not installed.
#pragma once

#include <arpa/inet.h>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <netinet/in.h>
#include <string>
#include <sys/socket.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace glyphwell::testing {

class NginxServer {
public:
    /// Serves `root` on 127.0.0.1 at a free port; the configuration and logs go to `prefix`.
    /// `directives` are added to the server block (e.g. "limit_rate 1m;").
    NginxServer(const std::string& root, const std::string& prefix,
                const std::string& directives = "") {
        const char* binary = "/usr/sbin/nginx";
        if (access(binary, X_OK) != 0)
            return;
        std::filesystem::create_directories(prefix + "/tmp");
        for (int attempt = 0; attempt < 5 && pid_ <= 0; ++attempt) {
            port_ = FreePort();
            const std::string configuration = prefix + "/nginx.conf";
            std::ofstream(configuration)
                << "daemon off; master_process off; pid " << prefix << "/nginx.pid;\n"
                << "error_log " << prefix << "/error.log;\n"
                << "events { worker_connections 64; }\n"
                << "http { access_log off; default_type application/octet-stream;\n"
                << "  client_body_temp_path " << prefix << "/tmp; proxy_temp_path " << prefix
                << "/tmp; fastcgi_temp_path " << prefix << "/tmp; uwsgi_temp_path " << prefix
                << "/tmp; scgi_temp_path " << prefix << "/tmp;\n"
                << "  server { listen 127.0.0.1:" << port_ << "; root " << root << "; "
                << directives << " } }\n";
            const pid_t child = fork();
            if (child == 0) {
                execl(binary, binary, "-q", "-p", prefix.c_str(), "-c", configuration.c_str(),
                      static_cast<char*>(nullptr));
                _exit(127);
            }
            pid_ = child;
            if (!WaitUntilListening()) {
                Stop();
                pid_ = -1;
            }
        }
    }
    ~NginxServer() { Stop(); }
    NginxServer(const NginxServer&) = delete;
    NginxServer& operator=(const NginxServer&) = delete;

    bool IsRunning() const { return pid_ > 0; }
    std::string URL(const std::string& path) const {
        return "http://127.0.0.1:" + std::to_string(port_) + path;
    }

private:
    static unsigned short FreePort() {
        const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        bind(fd, reinterpret_cast<sockaddr*>(&address), length);
        getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
        close(fd);
        return ntohs(address.sin_port);
    }

    bool WaitUntilListening() {
        for (int i = 0; i < 200; ++i) {
            int status = 0;
            if (waitpid(pid_, &status, WNOHANG) == pid_) {
                pid_ = -1;
                return false;
            }
            const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
            sockaddr_in address{};
            address.sin_family = AF_INET;
            address.sin_port = htons(port_);
            address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
            const bool connected =
                connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
            close(fd);
            if (connected)
                return true;
            std::this_thread::sleep_for(std::chrono::milliseconds(25));
        }
        return false;
    }

    void Stop() {
        if (pid_ <= 0)
            return;
        kill(pid_, SIGTERM);
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
    }

    pid_t pid_ = -1;
    unsigned short port_ = 0;
};

} // namespace glyphwell::testing
