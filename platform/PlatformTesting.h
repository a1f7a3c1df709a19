// Hooks that tests install into platform/ to inject faults. Product code reads them through the
// accessors below; nothing else in the product sets them.
#pragma once

#include <sys/socket.h>
#include <sys/types.h>

namespace glyphwell::port {

/// How local ports write replies: sendmsg(2) unless a test installs a hook (null restores it).
/// The hook is process-wide and must be installed while no port writes.
using ReplySendFunction = ssize_t (*)(int descriptor, const msghdr* message, int flags);
void SetReplySendFunctionForTesting(ReplySendFunction function);
ReplySendFunction ReplySend();

/// How local ports accept connections: accept4(2) unless a test installs a hook (null restores
/// it). The hook is process-wide and must be installed while no port accepts.
using AcceptFunction = int (*)(int descriptor, sockaddr* address, socklen_t* length, int flags);
void SetAcceptFunctionForTesting(AcceptFunction function);
AcceptFunction AcceptConnection();

} // namespace glyphwell::port
