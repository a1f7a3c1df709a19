// The blocking client of a remote port: its kept connection (made again when the server dropped
// it), sending a request within its send timeout and waiting for the reply within its receive
// timeout, and Invalidate from another thread ending a request that waits.
#include <poll.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/CFData.h"
#include "platform/MessagePortInternal.h"

namespace glyphwell::port::internal {

int WaitFor(int descriptor, short events, const Deadline& deadline) {
    for (;;) {
        pollfd entry{descriptor, events, 0};
        const int milliseconds = deadline.RemainingMilliseconds();
        const int count = poll(&entry, 1, milliseconds);
        if (count > 0)
            return 1;
        if (count == 0) {
            if (milliseconds == 0 || deadline.RemainingMilliseconds() == 0)
                return 0;
            continue;
        }
        if (errno != EINTR)
            return -1;
    }
}

int ConnectTo(const std::string& path, const Deadline& deadline, int* error) {
    sockaddr_un address;
    if (!MakeAddress(path, &address)) {
        *error = ENAMETOOLONG;
        return -1;
    }
    const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (descriptor < 0) {
        *error = errno;
        return -1;
    }
    for (;;) {
        // connect waits while the server's queue is full, for as long as the send timeout of
        // the socket allows (zero: without limit; the shortest limit when the deadline passed).
        const int milliseconds = deadline.RemainingMilliseconds();
        timeval limit{};
        if (milliseconds >= 0) {
            limit.tv_sec = milliseconds / 1000;
            limit.tv_usec = milliseconds == 0 ? 1 : (milliseconds % 1000) * 1000;
        }
        setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
        if (connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ||
            errno == EISCONN)
            break;
        // An interrupted connect of a Unix socket has not begun: it is simply made again.
        if (errno == EINTR)
            continue;
        *error = errno;
        CloseDescriptor(descriptor);
        return -1;
    }
    const timeval none{};
    setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &none, sizeof none);
    return descriptor;
}
} // namespace glyphwell::port::internal

// --- remote ports ---------------------------------------------------------------------------

int __CFMessagePort::RemoteDescriptor() {
    std::lock_guard<std::mutex> lock(client.descriptorMutex);
    return client.descriptor;
}

void __CFMessagePort::CloseRemoteDescriptor() {
    std::lock_guard<std::mutex> lock(client.descriptorMutex);
    CloseDescriptor(client.descriptor);
    client.descriptor = -1;
}

int __CFMessagePort::Reconnect(const Deadline& deadline, int* error) {
    const int connected = ConnectTo(socketPath, deadline, error);
    std::lock_guard<std::mutex> lock(client.descriptorMutex);
    CloseDescriptor(client.descriptor);
    client.descriptor = -1;
    if (connected >= 0 && !valid) {
        CloseDescriptor(connected);
        return -1;
    }
    client.descriptor = connected;
    return connected;
}

void __CFMessagePort::InvalidateRemote() {
    if (!valid.exchange(false))
        return;
    {
        // Wake a request waiting on another thread; it closes the descriptor itself.
        std::lock_guard<std::mutex> lock(client.descriptorMutex);
        if (client.descriptor >= 0)
            shutdown(client.descriptor, SHUT_RDWR);
    }
    std::unique_lock<std::mutex> idle(client.requestMutex, std::try_to_lock);
    if (idle.owns_lock())
        CloseRemoteDescriptor();
}

namespace {

enum class SendOutcome { Sent, Timeout, PeerClosed, Failed };

SendOutcome SendFrame(int descriptor, const uint8_t* header, const UInt8* body, size_t bodyLength,
                      const Deadline& deadline, bool* sentAny) {
    constexpr size_t headerSize = glyphwell::port::kRequestHeaderSize;
    const size_t total = headerSize + bodyLength;
    size_t done = 0;
    while (done < total) {
        iovec pieces[2];
        int count = 0;
        if (done < headerSize)
            pieces[count++] = {const_cast<uint8_t*>(header) + done, headerSize - done};
        const size_t bodyDone = done > headerSize ? done - headerSize : 0;
        if (bodyDone < bodyLength)
            pieces[count++] = {const_cast<UInt8*>(body) + bodyDone, bodyLength - bodyDone};
        msghdr message{};
        message.msg_iov = pieces;
        message.msg_iovlen = size_t(count);
        const ssize_t sent = sendmsg(descriptor, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent > 0) {
            done += size_t(sent);
            *sentAny = true;
            continue;
        }
        if (sent < 0 && errno == EINTR)
            continue;
        if (sent == 0 || errno == EAGAIN || errno == EWOULDBLOCK) {
            const int ready = WaitFor(descriptor, POLLOUT, deadline);
            if (ready == 0)
                return SendOutcome::Timeout;
            if (ready < 0)
                return SendOutcome::Failed;
            continue;
        }
        return errno == EPIPE || errno == ECONNRESET ? SendOutcome::PeerClosed
                                                     : SendOutcome::Failed;
    }
    return SendOutcome::Sent;
}

} // namespace

/// Writes the request frame, on the kept connection or a new one. True when it went out, with
/// the connection in `*connection`; otherwise false with the status in `*status`.
bool __CFMessagePort::SendRequestFrame(const uint8_t* header, const UInt8* body, size_t bodyLength,
                                       CFTimeInterval sendTimeout, int* connection,
                                       SInt32* status) {
    const Deadline sendDeadline(sendTimeout);
    // A kept connection that the server has dropped since (it ended while idle) fails the
    // send with EPIPE before any byte goes out; a new connection is then tried once.
    *connection = RemoteDescriptor();
    for (int attempt = 0;; ++attempt) {
        bool fresh = false;
        if (*connection < 0) {
            int error = 0;
            *connection = Reconnect(sendDeadline, &error);
            if (*connection < 0) {
                *status = !valid            ? kCFMessagePortIsInvalid
                          : error == EAGAIN ? kCFMessagePortSendTimeout
                                            : kCFMessagePortTransportError;
                return false;
            }
            fresh = true;
        }
        bool sentAny = false;
        const SendOutcome outcome =
            SendFrame(*connection, header, body, bodyLength, sendDeadline, &sentAny);
        if (outcome == SendOutcome::Sent)
            return true;
        CloseRemoteDescriptor();
        *connection = -1;
        if (!valid) {
            *status = kCFMessagePortIsInvalid;
            return false;
        }
        if (outcome == SendOutcome::PeerClosed && !sentAny && !fresh && attempt == 0)
            continue;
        *status = outcome == SendOutcome::Timeout      ? kCFMessagePortSendTimeout
                  : outcome == SendOutcome::PeerClosed ? kCFMessagePortBecameInvalidError
                                                       : kCFMessagePortTransportError;
        return false;
    }
}

/// Waits for the one reply frame on `connection` and hands its body out in `*returnData`.
SInt32 __CFMessagePort::ReceiveReply(int connection, CFTimeInterval receiveTimeout,
                                     CFDataRef* returnData) {
    const Deadline receiveDeadline(receiveTimeout);
    FrameAssembler reply(FrameAssembler::Kind::Reply, kMessagePortMaxFrame);
    if (client.receiveBuffer.empty())
        client.receiveBuffer.resize(kReadChunk);
    // Without a limit the receive simply blocks (an Invalidate on another thread ends it by
    // shutting the socket down); with one, poll keeps the deadline.
    const bool blocking = receiveDeadline.IsForever();
    while (!reply.HasFrame()) {
        if (!blocking) {
            const int ready = WaitFor(connection, POLLIN, receiveDeadline);
            if (ready <= 0 && valid) {
                CloseRemoteDescriptor();
                return ready == 0 ? kCFMessagePortReceiveTimeout : kCFMessagePortTransportError;
            }
        }
        if (!valid) {
            CloseRemoteDescriptor();
            return kCFMessagePortIsInvalid;
        }
        bool drained = false;
        const ssize_t got =
            ReceiveInto(connection, reply, client.receiveBuffer, &drained, blocking);
        if (got > 0 && reply.Failed()) {
            CloseRemoteDescriptor();
            return kCFMessagePortTransportError;
        }
        if (got > 0 || (got < 0 && (errno == EINTR || errno == EAGAIN || errno == EWOULDBLOCK)))
            continue;
        const bool closedByServer = got == 0 || errno == ECONNRESET;
        CloseRemoteDescriptor();
        if (!valid)
            return kCFMessagePortIsInvalid;
        return closedByServer ? kCFMessagePortBecameInvalidError : kCFMessagePortTransportError;
    }
    glyphwell::port::Frame frame = reply.TakeFrame();
    if (reply.BufferedBytes() != 0)
        CloseRemoteDescriptor(); // more than one reply: the connection is out of step
    *returnData = CreateDataAdopting(frame.body);
    return kCFMessagePortSuccess;
}

SInt32 __CFMessagePort::Exchange(SInt32 msgid, CFDataRef data, CFTimeInterval sendTimeout,
                                 CFTimeInterval receiveTimeout, CFDataRef* returnData) {
    const size_t bodyLength = data ? size_t(CFDataGetLength(data)) : 0;
    const UInt8* body = data && bodyLength ? CFDataGetBytePtr(data) : nullptr;
    uint8_t header[glyphwell::port::kRequestHeaderSize];
    glyphwell::port::StoreRequestHeader(msgid, uint32_t(bodyLength), header);

    int connection = -1;
    SInt32 status = kCFMessagePortSuccess;
    if (!SendRequestFrame(header, body, bodyLength, sendTimeout, &connection, &status))
        return status;
    if (!returnData) {
        // No one will read the reply: give the connection up so that it is never taken for
        // the reply of a later request.
        CloseRemoteDescriptor();
        return kCFMessagePortSuccess;
    }
    return ReceiveReply(connection, receiveTimeout, returnData);
}
