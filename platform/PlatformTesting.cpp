#include "platform/PlatformTesting.h"

#include <atomic>

namespace glyphwell::port {

namespace {

std::atomic<ReplySendFunction> replySendFunction{nullptr};
std::atomic<AcceptFunction> acceptFunction{nullptr};

} // namespace

void SetReplySendFunctionForTesting(ReplySendFunction function) {
    replySendFunction = function;
}

ReplySendFunction ReplySend() {
    ReplySendFunction function = replySendFunction;
    return function ? function : &sendmsg;
}

void SetAcceptFunctionForTesting(AcceptFunction function) {
    acceptFunction = function;
}

AcceptFunction AcceptConnection() {
    AcceptFunction function = acceptFunction;
    return function ? function : &accept4;
}

} // namespace glyphwell::port
