// A small HTTP/1.1 server on 127.0.0.1 for tests and benchmarks: serves byte strings by path, and
// on demand drips them, drops the connection part-way, never answers, or redirects. It answers
// "Range: bytes=N-" with 206 when If-Range (if any) names its ETag or Last-Modified, unless told
// to ignore ranges; it can also change the file after the first answer. One thread and one
// response per connection; HEAD gets no body.
#pragma once

#include <arpa/inet.h>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <netinet/in.h>
#include <string>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace glyphwell::testing {

class LoopbackHTTPServer {
public:
    struct Resource {
        std::string body = {};
        /// Bytes sent per write, and the pause after each write but the last.
        size_t chunkSize = 1 << 20;
        std::chrono::milliseconds pauseBetweenChunks{0};
        /// Close the connection after this many body bytes (the full Content-Length announced).
        size_t dropAfter = std::string::npos;
        /// When set: answer "302 Found" with this Location instead of the body.
        std::string redirectTo = {};
        /// Read the request, then send nothing until the server stops.
        bool neverAnswer = false;
        /// The validators sent (none when empty).
        std::string etag = {};
        std::string lastModified = {};
        /// Range requests get the whole body with 200.
        bool ignoreRange = false;
        /// `dropAfter` applies to the first answer only.
        bool dropOnce = false;
        /// From the second answer on, this ETag instead; a 206 is sent whatever If-Range says.
        std::string changedETag = {};
    };

    /// Listens on 127.0.0.1, on a port the kernel chooses.
    LoopbackHTTPServer() {
        listener_ = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        if (listener_ < 0 || bind(listener_, reinterpret_cast<sockaddr*>(&address), length) != 0 ||
            listen(listener_, 16) != 0 ||
            getsockname(listener_, reinterpret_cast<sockaddr*>(&address), &length) != 0)
            return;
        port_ = ntohs(address.sin_port);
        acceptor_ = std::thread([this] { AcceptLoop(); });
    }

    /// Stops accepting, ends the responses in progress at their next write, and joins.
    ~LoopbackHTTPServer() {
        {
            std::lock_guard<std::mutex> lock(mutex_);
            stopping_ = true;
        }
        stopped_.notify_all();
        if (listener_ >= 0)
            shutdown(listener_, SHUT_RDWR);
        if (acceptor_.joinable())
            acceptor_.join();
        for (std::thread& connection : connections_)
            connection.join();
        if (listener_ >= 0)
            close(listener_);
    }

    LoopbackHTTPServer(const LoopbackHTTPServer&) = delete;
    LoopbackHTTPServer& operator=(const LoopbackHTTPServer&) = delete;

    bool IsListening() const { return port_ != 0; }

    /// Serves `resource` at `path` ("/name") from now on.
    void Serve(const std::string& path, Resource resource) {
        std::lock_guard<std::mutex> lock(mutex_);
        resources_[path] = std::make_shared<const Resource>(std::move(resource));
    }

    std::string URL(const std::string& path) const {
        return "http://127.0.0.1:" + std::to_string(port_) + path;
    }

    /// How many requests named `path` so far.
    int RequestCount(const std::string& path) const {
        std::lock_guard<std::mutex> lock(mutex_);
        const auto found = requestCounts_.find(path);
        return found == requestCounts_.end() ? 0 : found->second;
    }

    /// The value of the header `name` in the last request for `path`, empty when absent.
    std::string LastRequestHeader(const std::string& path, const std::string& name) const {
        std::lock_guard<std::mutex> lock(mutex_);
        const auto found = lastRequests_.find(path);
        return found == lastRequests_.end() ? std::string() : HeaderOf(found->second, name);
    }

    /// Waits until `path` was requested at least `count` times; false after `timeout`.
    bool WaitForRequests(const std::string& path, int count, std::chrono::milliseconds timeout) {
        std::unique_lock<std::mutex> lock(mutex_);
        return requested_.wait_for(lock, timeout, [&] { return requestCounts_[path] >= count; });
    }

private:
    void AcceptLoop() {
        for (;;) {
            const int connection = accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
            if (connection < 0) {
                const int error = errno;
                std::lock_guard<std::mutex> lock(mutex_);
                if (stopping_ || (error != EINTR && error != ECONNABORTED))
                    return;
                continue;
            }
            std::lock_guard<std::mutex> lock(mutex_);
            connections_.emplace_back([this, connection] {
                Respond(connection);
                close(connection);
            });
        }
    }

    /// Sends all of `bytes`; false when the peer went away.
    static bool SendAll(int fd, const char* bytes, size_t count) {
        while (count > 0) {
            const ssize_t sent = send(fd, bytes, count, MSG_NOSIGNAL);
            if (sent < 0 && errno == EINTR)
                continue;
            if (sent <= 0)
                return false;
            bytes += sent;
            count -= size_t(sent);
        }
        return true;
    }

    void Respond(int fd) {
        std::string request;
        char buffer[4096];
        while (request.find("\r\n\r\n") == std::string::npos && request.size() < 65536) {
            const ssize_t received = recv(fd, buffer, sizeof buffer, 0);
            if (received <= 0)
                return;
            request.append(buffer, size_t(received));
        }
        const size_t methodEnd = request.find(' ');
        const size_t pathEnd = request.find(' ', methodEnd + 1);
        if (methodEnd == std::string::npos || pathEnd == std::string::npos)
            return;
        const bool head = request.compare(0, methodEnd, "HEAD") == 0;
        const std::string path = request.substr(methodEnd + 1, pathEnd - methodEnd - 1);
        std::shared_ptr<const Resource> shared;
        int number = 0;
        {
            std::lock_guard<std::mutex> lock(mutex_);
            number = ++requestCounts_[path];
            lastRequests_[path] = request;
            requested_.notify_all();
            const auto entry = resources_.find(path);
            if (entry != resources_.end())
                shared = entry->second;
        }
        const auto sendHeader = [fd](const std::string& status, size_t length) {
            const std::string header = "HTTP/1.1 " + status +
                                       "\r\nContent-Length: " + std::to_string(length) +
                                       "\r\nConnection: close\r\n\r\n";
            return SendAll(fd, header.data(), header.size());
        };
        if (!shared) {
            sendHeader("404 Not Found", 0);
            return;
        }
        const Resource& resource = *shared;
        if (resource.neverAnswer) {
            std::unique_lock<std::mutex> lock(mutex_);
            stopped_.wait(lock, [this] { return stopping_; });
            return;
        }
        if (!resource.redirectTo.empty()) {
            sendHeader("302 Found\r\nLocation: " + resource.redirectTo, 0);
            return;
        }
        const std::string etag =
            number > 1 && !resource.changedETag.empty() ? resource.changedETag : resource.etag;
        std::string validators;
        if (!etag.empty())
            validators += "\r\nETag: " + etag;
        if (!resource.lastModified.empty())
            validators += "\r\nLast-Modified: " + resource.lastModified;
        // A range is served when If-Range (if sent) matches, or always once the file "changed".
        size_t start = 0;
        const std::string ifRange = HeaderOf(request, "If-Range");
        const std::string range = HeaderOf(request, "Range");
        if (!resource.ignoreRange && range.rfind("bytes=", 0) == 0 &&
            (ifRange.empty() || ifRange == etag || ifRange == resource.lastModified ||
             (number > 1 && !resource.changedETag.empty())))
            start = std::strtoull(range.c_str() + 6, nullptr, 10);
        if (start > resource.body.size() || (start > 0 && start == resource.body.size())) {
            sendHeader("416 Range Not Satisfiable\r\nContent-Range: bytes */" +
                           std::to_string(resource.body.size()),
                       0);
            return;
        }
        const std::string status = start > 0 ? "206 Partial Content\r\nContent-Range: bytes " +
                                                   std::to_string(start) + "-" +
                                                   std::to_string(resource.body.size() - 1) + "/" +
                                                   std::to_string(resource.body.size())
                                             : "200 OK";
        if (!sendHeader(status + "\r\nContent-Type: application/octet-stream" + validators,
                        resource.body.size() - start) ||
            head)
            return;
        const size_t dropAfter =
            resource.dropOnce && number > 1 ? std::string::npos : resource.dropAfter;
        const size_t end =
            std::min(resource.body.size(), start + std::min(dropAfter, resource.body.size()));
        for (size_t offset = start; offset < end;) {
            const size_t count = std::min(resource.chunkSize, end - offset);
            if (!SendAll(fd, resource.body.data() + offset, count))
                return;
            offset += count;
            if (offset < end && resource.pauseBetweenChunks.count() > 0) {
                std::unique_lock<std::mutex> lock(mutex_);
                if (stopped_.wait_for(lock, resource.pauseBetweenChunks,
                                      [this] { return stopping_; }))
                    return;
            }
        }
        // A drop ends the connection at once, without the rest of the announced body.
        shutdown(fd, SHUT_RDWR);
    }

    /// The value of the header `name` in `request`, empty when absent.
    static std::string HeaderOf(const std::string& request, const std::string& name) {
        const std::string key = "\r\n" + name + ": ";
        const size_t found = request.find(key);
        if (found == std::string::npos)
            return {};
        const size_t start = found + key.size();
        return request.substr(start, request.find("\r\n", start) - start);
    }

    int listener_ = -1;
    unsigned short port_ = 0;
    std::thread acceptor_;
    mutable std::mutex mutex_;
    std::condition_variable stopped_;
    std::condition_variable requested_;
    bool stopping_ = false;
    std::vector<std::thread> connections_;
    std::map<std::string, std::shared_ptr<const Resource>> resources_;
    std::map<std::string, int> requestCounts_;
    std::map<std::string, std::string> lastRequests_;
};

} // namespace glyphwell::testing
