// Test helper: a real nginx serving a folder on a loopback port, with a private configuration
// (static files: ETag, Last-Modified, 304 answers and byte ranges), stopped with the object.
// Not running when nginx is not installed.
#pragma once

#include <arpa/inet.h>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <string>
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
        std::filesystem::create_directories(prefix + "/tmp");
        const std::string configuration = prefix + "/nginx.conf", temporary = prefix + "/tmp";
        // A port the kernel just handed out is free unless another process takes it meanwhile.
        for (int attempt = 0; attempt < 5 && access(binary, X_OK) == 0 && pid_ < 0; ++attempt) {
            port_ = Connect(0);
            std::ofstream(configuration)
                << "daemon off; master_process off; pid " << prefix << "/nginx.pid; error_log "
                << prefix << "/error.log;\nevents { worker_connections 64; }\nhttp { access_log "
                << "off; default_type application/octet-stream; client_body_temp_path " << temporary
                << "; proxy_temp_path " << temporary << "; fastcgi_temp_path " << temporary
                << "; uwsgi_temp_path " << temporary << "; scgi_temp_path " << temporary
                << ";\n  server { listen 127.0.0.1:" << port_ << "; root " << root << "; "
                << directives << " } }\n";
            pid_ = fork();
            if (pid_ == 0) {
                execl(binary, binary, "-q", "-p", prefix.c_str(), "-c", configuration.c_str(),
                      static_cast<char*>(nullptr));
                _exit(127);
            }
            int status = 0;
            for (int i = 0; i < 200 && Connect(port_) == 0; ++i) {
                if (waitpid(pid_, &status, WNOHANG) == pid_)
                    pid_ = -1; // it could not start (the port was taken): try another
                if (pid_ < 0)
                    break;
                std::this_thread::sleep_for(std::chrono::milliseconds(25));
            }
        }
    }
    ~NginxServer() {
        int status = 0;
        if (pid_ > 0 && kill(pid_, SIGTERM) == 0)
            waitpid(pid_, &status, 0);
    }
    NginxServer(const NginxServer&) = delete;
    NginxServer& operator=(const NginxServer&) = delete;

    bool IsRunning() const { return pid_ > 0; }
    std::string URL(const std::string& path) const {
        return "http://127.0.0.1:" + std::to_string(port_) + path;
    }

private:
    /// With `port` 0: a port the kernel chooses. Otherwise: `port` when something listens on it,
    /// else 0.
    static unsigned short Connect(unsigned short port) {
        const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_port = htons(port);
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        const auto* generic = reinterpret_cast<sockaddr*>(&address);
        const bool done =
            port == 0 ? bind(fd, generic, length) == 0 &&
                            getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length) == 0
                      : connect(fd, generic, length) == 0;
        close(fd);
        return done ? ntohs(address.sin_port) : 0;
    }

    pid_t pid_ = -1;
    unsigned short port_ = 0;
};

} // namespace glyphwell::testing
