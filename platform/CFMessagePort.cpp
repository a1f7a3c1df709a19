// Message ports: the port object and the public functions. The rest of the port is in
// MessagePortSocket.cpp (naming and binding), MessagePortServer.cpp (local ports) and
// MessagePortClient.cpp (remote ports); MessagePortInternal.h holds what they share.
#include "platform/CFMessagePort.h"

#include <algorithm>
#include <cerrno>

#include "platform/CFData.h"
#include "platform/CFString.h"
#include "platform/Log.h"
#include "platform/MessagePortInternal.h"

using glyphwell::AppLog;
using glyphwell::LogEscape;
using glyphwell::runtime::kMessagePortKind;

namespace {

__CFMessagePort* AsPort(CFTypeRef port) {
    return glyphwell::runtime::AsMutable<__CFMessagePort>(port, kMessagePortKind);
}

/// The run-loop source of a local port.
struct MessagePortSource final : __CFRunLoopSource {
    MessagePortSource(__CFMessagePort* servedPort, CFIndex sourceOrder)
        : __CFRunLoopSource(sourceOrder), port(servedPort) {
        CFRetain(port);
        port->local.source = this;
    }
    ~MessagePortSource() override {
        port->local.source = nullptr;
        CFRelease(port);
    }

    std::string Description() const override {
        return glyphwell::runtime::DescriptionPrefix(this, "CFRunLoopSource") +
               "{message port = " + port->nameText + "}";
    }
    void Schedule(RunLoopDriver* driver) override { port->Schedule(driver); }
    void Cancel(RunLoopDriver* driver) override { port->Cancel(driver); }

    __CFMessagePort* const port;
};

} // namespace

__CFMessagePort::~__CFMessagePort() {
    if (remote) {
        CloseDescriptor(client.descriptor);
    } else {
        // A port with a request in its callback is retained by that dispatch, and a scheduled
        // port by its source: nothing of this port is still running or watched here.
        if (valid.exchange(false))
            ShutDownLocal();
        CloseDescriptor(local.spareDescriptor);
        if (local.context.release && local.context.info)
            local.context.release(local.context.info);
    }
    CFRelease(name);
}

// ---------------------------------------------------------------------------------------------
// Public operations

CFTypeID CFMessagePortGetTypeID() {
    return kMessagePortKind;
}

CFMessagePortRef CFMessagePortCreateLocal(CFAllocatorRef, CFStringRef name,
                                          CFMessagePortCallBack callout,
                                          CFMessagePortContext* context, Boolean* shouldFreeInfo) {
    if (shouldFreeInfo)
        *shouldFreeInfo = true;
    GW_ASSERT(name != nullptr);
    if (!name)
        return nullptr;
    const std::string text = glyphwell::UTF8String(name).value_or("");
    const std::string path = glyphwell::port::SocketPathForName(text);

    const std::string logName = LogEscape(text); // the name as log lines show it
    int listening = TakeActivationSocket(logName);
    bool ownsFile = false;
    dev_t device = 0;
    ino_t inode = 0;
    if (listening < 0) {
        if (path.empty()) {
            AppLog("message port %s: no safe socket path for this name", logName.c_str());
            return nullptr;
        }
        listening = BindListeningSocket(logName, path, &device, &inode);
        if (listening < 0)
            return nullptr;
        ownsFile = true;
    }

    auto* port = new __CFMessagePort(name, text, false);
    port->local.listenDescriptor = listening;
    port->local.ownsSocketFile = ownsFile;
    port->socketPath = path;
    port->local.socketDevice = device;
    port->local.socketInode = inode;
    if (!port->OpenLocalDescriptors()) {
        AppLog("message port %s: cannot set up its event descriptors: %s", port->logName.c_str(),
               ErrorText(errno).c_str());
        CFRelease(port); // stops listening and removes the socket file
        return nullptr;
    }
    port->local.callout = callout;
    if (context) {
        port->local.context = *context;
        if (context->retain && context->info)
            port->local.context.info = const_cast<void*>(context->retain(context->info));
    }
    port->local.readBuffer.resize(kReadChunk);
    if (shouldFreeInfo)
        *shouldFreeInfo = false;
    return port;
}

CFMessagePortRef CFMessagePortCreateRemote(CFAllocatorRef, CFStringRef name) {
    GW_ASSERT(name != nullptr);
    if (!name)
        return nullptr;
    const std::string text = glyphwell::UTF8String(name).value_or("");
    const std::string path = glyphwell::port::SocketPathForName(text);
    if (path.empty())
        return nullptr;
    // A server too busy to accept at once is still a server: the connection is then made by the
    // first request, within its send timeout.
    int error = 0;
    const int connection = ConnectTo(path, Deadline(0), &error);
    if (connection < 0 && error != EAGAIN)
        return nullptr;
    auto* port = new __CFMessagePort(name, text, true);
    port->socketPath = path;
    port->client.descriptor = connection;
    return port;
}

CFRunLoopSourceRef CFMessagePortCreateRunLoopSource(CFAllocatorRef, CFMessagePortRef local,
                                                    CFIndex order) {
    __CFMessagePort* port = AsPort(local);
    GW_ASSERT(port != nullptr);
    if (!port || port->remote || !port->valid)
        return nullptr;
    if (port->local.source) {
        CFRetain(port->local.source);
        return port->local.source;
    }
    return new MessagePortSource(port, order);
}

SInt32 CFMessagePortSendRequest(CFMessagePortRef remote, SInt32 msgid, CFDataRef data,
                                CFTimeInterval sendTimeout, CFTimeInterval receiveTimeout,
                                CFStringRef, CFDataRef* returnData) {
    if (returnData)
        *returnData = nullptr;
    __CFMessagePort* port = AsPort(remote);
    if (!port || !port->remote || !port->valid)
        return kCFMessagePortIsInvalid;
    if (data && CFDataGetLength(data) > CFIndex(kMessagePortMaxFrame))
        return kCFMessagePortTransportError;
    PortHold hold(port);
    std::lock_guard<std::mutex> lock(port->client.requestMutex);
    if (!port->valid)
        return kCFMessagePortIsInvalid;
    const SInt32 result = port->Exchange(msgid, data, sendTimeout, receiveTimeout, returnData);
    if (!port->valid)
        port->CloseRemoteDescriptor(); // what an Invalidate during the request left open
    return result;
}

Boolean CFMessagePortIsValid(CFMessagePortRef port) {
    const __CFMessagePort* object = AsPort(port);
    return object && object->valid;
}

void CFMessagePortInvalidate(CFMessagePortRef port) {
    __CFMessagePort* object = AsPort(port);
    if (!object)
        return;
    if (object->remote)
        object->InvalidateRemote();
    else
        object->InvalidateLocal();
}

Boolean CFMessagePortIsRemote(CFMessagePortRef port) {
    const __CFMessagePort* object = AsPort(port);
    return object && object->remote;
}

CFStringRef CFMessagePortGetName(CFMessagePortRef port) {
    const __CFMessagePort* object = AsPort(port);
    return object ? object->name : nullptr;
}

namespace glyphwell::port {

std::shared_ptr<PendingRequest> CurrentRequest() {
    return currentRequests.empty() ? nullptr : currentRequests.back();
}

/// The local port behind `port`, or null (after an assertion report) for anything else.
static __CFMessagePort* AsLocalPort(CFMessagePortRef port) {
    __CFMessagePort* object = AsPort(port);
    GW_ASSERT(object != nullptr && !object->remote);
    return object && !object->remote ? object : nullptr;
}

void SetStallTimeout(CFMessagePortRef local, std::chrono::milliseconds timeout) {
    if (__CFMessagePort* port = AsLocalPort(local))
        port->local.stallTimeout = std::max(timeout, std::chrono::milliseconds(1));
}

void SetUnfinishedRequestLimit(CFMessagePortRef local, size_t bytes) {
    if (__CFMessagePort* port = AsLocalPort(local))
        port->local.unfinishedLimit = bytes;
}

void SetConnectionLimitPerProcess(CFMessagePortRef local, size_t connections) {
    if (__CFMessagePort* port = AsLocalPort(local))
        port->local.connectionsPerProcessLimit = std::max<size_t>(connections, 1);
}

bool IsReceivingRequest(CFMessagePortRef local) {
    __CFMessagePort* port = AsLocalPort(local);
    return port && port->valid && port->IsReceiving();
}

} // namespace glyphwell::port
