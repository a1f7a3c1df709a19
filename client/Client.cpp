// The client library: requests built as property values and flattened, one connection per call
// to the agent's socket, written and read without blocking, the reply read back and checked.
// Frames are made and reassembled by the port's codec (protocol/MessagePortWire.h); a call uses
// its connection for one request only.
#include "glyphwell/client.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <memory>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFMessagePort.h"
#include "protocol/MessagePortWire.h"
#include "protocol/QZUIProtocol.h"
#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"

namespace {

/// One font of a request: PostScript name and family (may be empty).
struct Font {
    std::string postScriptName;
    std::string family;
};

/// Makes `path` absolute against the current directory; empty when that fails.
std::string AbsolutePath(const char* path) {
    std::error_code error;
    const std::filesystem::path absolute = std::filesystem::absolute(path, error);
    return error ? std::string() : absolute.lexically_normal().string();
}

/// True when `text` is valid UTF-8 (a string value can be made of it).
bool IsUTF8(const char* text) {
    TCFAdopted<CFStringRef> string(
        CFStringCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(text),
                                CFIndex(std::strlen(text)), kCFStringEncodingUTF8, false));
    return string != nullptr;
}

/// A new file URL of an absolute path (a directory URL when the path names a directory).
CFURLRef CreateFileURL(const std::string& path) {
    std::error_code error;
    const bool directory = std::filesystem::is_directory(path, error);
    return CFURLCreateFromFileSystemRepresentation(kCFAllocatorDefault,
                                                   reinterpret_cast<const UInt8*>(path.data()),
                                                   CFIndex(path.size()), directory);
}

/// `path` (non-empty) made absolute, when a file URL can be made of it; empty otherwise.
std::string FileURLPath(const char* path) {
    if (!path || !*path)
        return {};
    std::string absolute = AbsolutePath(path);
    TCFAdopted<CFURLRef> url(absolute.empty() ? nullptr : CreateFileURL(absolute));
    return url ? absolute : std::string();
}

/// Builds dictionaries from key/value pairs, each value adopted.
class DictionaryBuilder {
public:
    /// Adds `value` (a new reference, adopted; null is skipped) under `key`.
    void Add(CFStringRef key, CFTypeRef value) {
        // Adopted first, so that an allocation failure below releases it.
        TCFRetained<CFTypeRef> owned(value, kAdopted);
        if (!owned)
            return;
        keys_.emplace_back(key);
        values_.push_back(std::move(owned));
    }
    /// A new immutable dictionary of the pairs added.
    CFDictionaryRef Create() const {
        std::vector<const void*> keys(keys_.begin(), keys_.end());
        std::vector<const void*> values(values_.begin(), values_.end());
        return CFDictionaryCreate(kCFAllocatorDefault, keys.data(), values.data(),
                                  CFIndex(keys.size()), &kCFTypeDictionaryKeyCallBacks,
                                  &kCFTypeDictionaryValueCallBacks);
    }

private:
    std::vector<TCFRetained<CFTypeRef>> keys_;
    std::vector<TCFRetained<CFTypeRef>> values_;
};

/// A new array of `values` (each adopted).
CFArrayRef CreateArray(std::vector<TCFRetained<CFTypeRef>> values) {
    std::vector<const void*> pointers(values.begin(), values.end());
    return CFArrayCreate(kCFAllocatorDefault, pointers.data(), CFIndex(pointers.size()),
                         &kCFTypeArrayCallBacks);
}

/// The font attribute dictionary {NSFontNameAttribute, NSFontFamilyAttribute when given}.
CFDictionaryRef CreateFontAttributes(const Font& font) {
    DictionaryBuilder attributes;
    attributes.Add(NSFontNameAttribute, glyphwell::CreateString(font.postScriptName));
    if (!font.family.empty())
        attributes.Add(NSFontFamilyAttribute, glyphwell::CreateString(font.family));
    return attributes.Create();
}

/// How often a call retries connecting to an agent too busy to accept it.
constexpr long long kBusyRetryMilliseconds = 10;

/// Milliseconds of the monotonic clock.
long long NowMilliseconds() {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<long long>(now.tv_sec) * 1000 + now.tv_nsec / 1000000;
}

} // namespace

struct glyphwell_request {
    int question = 0;
    std::string applicationName;
    std::string bundlePath;
    std::optional<int32_t> processID;
    std::vector<std::string> candidatePaths;
    std::vector<Font> fonts;
    bool suppress = false;
    /// The flattened request, made by Flatten and dropped by every change.
    std::string bytes;

    /// True when the request holds what its question needs.
    bool IsComplete() const {
        return question == GLYPHWELL_ASK_ACTIVATION ? !candidatePaths.empty() : !fonts.empty();
    }
    /// A new request dictionary.
    CFDictionaryRef CreateDictionary() const;
    /// Fills `bytes`; false when the request is incomplete or cannot be written.
    bool Flatten();
};

CFDictionaryRef glyphwell_request::CreateDictionary() const {
    DictionaryBuilder request;
    if (!applicationName.empty())
        request.Add(kQZUIPropertyApplicationName, glyphwell::CreateString(applicationName));
    if (!bundlePath.empty())
        request.Add(kQZUIPropertyBundleURL, CreateFileURL(bundlePath));
    if (question == GLYPHWELL_ASK_ACTIVATION) {
        if (!fonts.empty()) {
            request.Add(kQZUIPropertyFontName,
                        glyphwell::CreateString(fonts.front().postScriptName));
            request.Add(kQZUIPropertyRequestDictionary, CreateFontAttributes(fonts.front()));
        }
        std::vector<TCFRetained<CFTypeRef>> urls;
        for (const std::string& path : candidatePaths) {
            TCFRetained<CFTypeRef> url(CreateFileURL(path), kAdopted);
            urls.push_back(std::move(url));
        }
        request.Add(kQZUIPropertyCandidateFontURLs, CreateArray(std::move(urls)));
        return request.Create();
    }
    const int32_t pid = processID.value_or(static_cast<int32_t>(getpid()));
    request.Add(kQZUIPropertyProcessID,
                CFNumberCreate(kCFAllocatorDefault, kCFNumberIntType, &pid));
    std::vector<TCFRetained<CFTypeRef>> properties;
    for (const Font& font : fonts) {
        TCFRetained<CFTypeRef> attributes(CreateFontAttributes(font), kAdopted);
        properties.push_back(std::move(attributes));
    }
    request.Add(kQZUIPropertyFontProperties, CreateArray(std::move(properties)));
    if (suppress)
        request.Add(kQZUIPropertySuppress, CFRetain(kCFBooleanTrue));
    return request.Create();
}

bool glyphwell_request::Flatten() {
    if (!bytes.empty())
        return true;
    if (!IsComplete())
        return false;
    TCFAdopted<CFDictionaryRef> dictionary(CreateDictionary());
    TCFAdopted<CFMutableDataRef> buffer(CFDataCreateMutable(kCFAllocatorDefault, 0));
    if (!dictionary || !buffer)
        return false;
    TCFFlattenContext context(buffer, false);
    context.Flatten(dictionary);
    if (context.HasFailed())
        return false;
    bytes.assign(reinterpret_cast<const char*>(CFDataGetBytePtr(buffer)),
                 size_t(CFDataGetLength(buffer)));
    return true;
}

struct glyphwell_reply {
    int question = 0;
    int result = 0;
    int suppress = 0;
    std::vector<std::string> candidateURLs;
    std::string bytes;
};

namespace {

/// The 0/1 answer stored under `key`, or nothing when absent or not a number.
std::optional<int> ReadAnswer(CFDictionaryRef reply, CFStringRef key) {
    CFTypeRef value = CFDictionary::GetValue(reply, key);
    SInt32 number = 0;
    if (!value || CFGetTypeID(value) != CFNumberGetTypeID() ||
        !CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt32Type, &number))
        return std::nullopt;
    return number != 0 ? 1 : 0;
}

/// Reads the reply bytes of `question` into `*reply`; GLYPHWELL_ERROR_MALFORMED_REPLY when they
/// do not hold an intact dictionary with Result and Suppress.
int ParseReply(int question, const glyphwell::port::FrameBody& bytes, glyphwell_reply* reply) {
    if (bytes.Size() == 0)
        return GLYPHWELL_ERROR_MALFORMED_REPLY;
    TCFResurrectContext context(bytes.Data(), bytes.Size());
    TCFAdopted<CFDictionaryRef> dictionary(context.RetrieveCFDictionary());
    if (!dictionary || context.IsCorrupted())
        return GLYPHWELL_ERROR_MALFORMED_REPLY;
    const std::optional<int> result = ReadAnswer(dictionary, kQZUIPropertyResult);
    const std::optional<int> suppress = ReadAnswer(dictionary, kQZUIPropertySuppress);
    if (!result || !suppress)
        return GLYPHWELL_ERROR_MALFORMED_REPLY;
    reply->question = question;
    reply->result = *result;
    reply->suppress = *suppress;
    CFTypeRef urls = CFDictionary::GetValue(dictionary, kQZUIPropertyCandidateFontURLs);
    if (question == GLYPHWELL_ASK_ACTIVATION && urls && CFGetTypeID(urls) == CFArrayGetTypeID()) {
        CFArrayRef array = static_cast<CFArrayRef>(urls);
        for (CFIndex i = 0, n = CFArrayGetCount(array); i < n; ++i) {
            CFTypeRef url = CFArrayGetValueAtIndex(array, i);
            std::string text;
            if (url && CFGetTypeID(url) == CFURLGetTypeID() &&
                CFString::GetUTF8(CFURLGetString(static_cast<CFURLRef>(url)), text))
                reply->candidateURLs.push_back(std::move(text));
        }
    }
    reply->bytes.assign(reinterpret_cast<const char*>(bytes.Data()), bytes.Size());
    return GLYPHWELL_OK;
}

} // namespace

struct glyphwell_call {
    enum class Stage { kConnecting, kWriting, kReading, kDone };

    int fd = -1;
    int question = 0;
    Stage stage = Stage::kWriting;
    int outcome = GLYPHWELL_IN_PROGRESS;
    std::string output; ///< the request frame
    size_t written = 0;
    glyphwell::port::FrameAssembler input{glyphwell::port::FrameAssembler::Kind::Reply,
                                          kMessagePortMaxFrame}; ///< the reply frame
    std::vector<uint8_t> receiveBuffer;                          ///< for the reply's header

    ~glyphwell_call() { Close(); }
    void Close() {
        if (fd >= 0)
            close(fd);
        fd = -1;
    }
    /// Ends the call with `status`.
    int Finish(int status) {
        outcome = status;
        stage = Stage::kDone;
        Close();
        return status;
    }
    int Connect(const char* portName);
    int Write();
    int Read(glyphwell_reply** reply);
};

int glyphwell_call::Connect(const char* portName) {
    const std::string path =
        glyphwell::port::SocketPathForName(portName ? portName : kQZUIAgentPortNameText);
    sockaddr_un address{};
    if (path.empty() || path.size() >= sizeof address.sun_path)
        return Finish(GLYPHWELL_ERROR_NOT_RUNNING);
    fd = socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return Finish(GLYPHWELL_ERROR_TRANSPORT);
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0)
        return GLYPHWELL_IN_PROGRESS;
    if (errno == EINPROGRESS) {
        stage = Stage::kConnecting;
        return GLYPHWELL_IN_PROGRESS;
    }
    // EAGAIN: the agent's queue of connections is full. A Unix socket then has no connect in
    // progress that could end later: the caller learns it at once (TRANSPORT, errno EAGAIN).
    const int error = errno;
    Finish(error == ENOENT || error == ECONNREFUSED || error == ENOTDIR
               ? GLYPHWELL_ERROR_NOT_RUNNING
               : GLYPHWELL_ERROR_TRANSPORT);
    errno = error;
    return outcome;
}

int glyphwell_call::Write() {
    if (stage == Stage::kConnecting) {
        int error = 0;
        socklen_t length = sizeof error;
        if (getsockopt(fd, SOL_SOCKET, SO_ERROR, &error, &length) != 0)
            return Finish(GLYPHWELL_ERROR_TRANSPORT);
        if (error == EINPROGRESS || error == EAGAIN)
            return GLYPHWELL_IN_PROGRESS;
        if (error != 0)
            return Finish(error == ECONNREFUSED ? GLYPHWELL_ERROR_NOT_RUNNING
                                                : GLYPHWELL_ERROR_TRANSPORT);
        stage = Stage::kWriting;
    }
    while (written < output.size()) {
        const ssize_t sent =
            send(fd, output.data() + written, output.size() - written, MSG_NOSIGNAL);
        if (sent < 0) {
            if (errno == EINTR)
                continue;
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return GLYPHWELL_IN_PROGRESS;
            return Finish(errno == EPIPE || errno == ECONNRESET ? GLYPHWELL_ERROR_DISCONNECTED
                                                                : GLYPHWELL_ERROR_TRANSPORT);
        }
        written += size_t(sent);
    }
    stage = Stage::kReading;
    return GLYPHWELL_IN_PROGRESS;
}

int glyphwell_call::Read(glyphwell_reply** reply) {
    receiveBuffer.resize(glyphwell::port::kReplyHeaderSize);
    for (;;) {
        if (input.HasFrame()) {
            auto* made = new (std::nothrow) glyphwell_reply;
            if (!made)
                return Finish(GLYPHWELL_ERROR_NO_MEMORY);
            const int status = ParseReply(question, input.TakeFrame().body, made);
            if (status != GLYPHWELL_OK) {
                delete made;
                return Finish(status);
            }
            *reply = made;
            return Finish(GLYPHWELL_OK);
        }
        // Only the header goes through the buffer (its size), so nothing past the reply is read.
        bool drained = false;
        const ssize_t got = glyphwell::port::ReceiveInto(fd, input, receiveBuffer, &drained);
        if (got > 0 && input.Failed())
            return Finish(input.RefusedLength() > kMessagePortMaxFrame
                              ? GLYPHWELL_ERROR_MALFORMED_REPLY
                              : GLYPHWELL_ERROR_NO_MEMORY);
        if (got > 0)
            continue;
        if (got == 0)
            return Finish(GLYPHWELL_ERROR_DISCONNECTED);
        if (errno == EINTR)
            continue;
        if (errno == EAGAIN || errno == EWOULDBLOCK)
            return GLYPHWELL_IN_PROGRESS;
        return Finish(errno == ECONNRESET ? GLYPHWELL_ERROR_DISCONNECTED
                                          : GLYPHWELL_ERROR_TRANSPORT);
    }
}

/// Runs `body`, turning an allocation failure into GLYPHWELL_ERROR_NO_MEMORY, so that no C++
/// exception crosses the C interface.
template <class Body> int WithoutExceptions(Body&& body) noexcept {
    try {
        return body();
    } catch (const std::bad_alloc&) {
        return GLYPHWELL_ERROR_NO_MEMORY;
    } catch (const std::length_error&) {
        return GLYPHWELL_ERROR_NO_MEMORY;
    }
}

extern "C" {

const char* glyphwell_status_text(int status) {
    switch (status) {
    case GLYPHWELL_OK:
        return "success";
    case GLYPHWELL_IN_PROGRESS:
        return "in progress";
    case GLYPHWELL_ERROR_INVALID_ARGUMENT:
        return "invalid argument";
    case GLYPHWELL_ERROR_NO_MEMORY:
        return "out of memory";
    case GLYPHWELL_ERROR_NOT_RUNNING:
        return "the font agent is not running and cannot be started";
    case GLYPHWELL_ERROR_TIMED_OUT:
        return "no reply came in time";
    case GLYPHWELL_ERROR_DISCONNECTED:
        return "the font agent went away before replying";
    case GLYPHWELL_ERROR_MALFORMED_REPLY:
        return "the reply cannot be read";
    case GLYPHWELL_ERROR_TRANSPORT:
        return "the connection to the font agent failed";
    default:
        return "unknown status";
    }
}

glyphwell_request* glyphwell_request_new(int question) {
    if (question != GLYPHWELL_ASK_ACTIVATION && question != GLYPHWELL_ASK_DOWNLOAD)
        return nullptr;
    auto* request = new (std::nothrow) glyphwell_request;
    if (request)
        request->question = question;
    return request;
}

void glyphwell_request_free(glyphwell_request* request) {
    delete request;
}

int glyphwell_request_set_application_name(glyphwell_request* request, const char* name) {
    return WithoutExceptions([&]() -> int {
        if (!request || !name || !IsUTF8(name))
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        request->applicationName = name;
        request->bytes.clear();
        return GLYPHWELL_OK;
    });
}

int glyphwell_request_set_bundle_path(glyphwell_request* request, const char* path) {
    return WithoutExceptions([&]() -> int {
        std::string absolute = FileURLPath(path);
        if (!request || absolute.empty())
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        request->bundlePath = std::move(absolute);
        request->bytes.clear();
        return GLYPHWELL_OK;
    });
}

int glyphwell_request_set_process_id(glyphwell_request* request, int32_t pid) {
    if (!request || request->question != GLYPHWELL_ASK_DOWNLOAD)
        return GLYPHWELL_ERROR_INVALID_ARGUMENT;
    request->processID = pid;
    request->bytes.clear();
    return GLYPHWELL_OK;
}

int glyphwell_request_add_candidate_file(glyphwell_request* request, const char* path) {
    return WithoutExceptions([&]() -> int {
        std::string absolute = FileURLPath(path);
        if (!request || request->question != GLYPHWELL_ASK_ACTIVATION || absolute.empty())
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        request->candidatePaths.push_back(std::move(absolute));
        request->bytes.clear();
        return GLYPHWELL_OK;
    });
}

int glyphwell_request_add_font(glyphwell_request* request, const char* postscript_name,
                               const char* family) {
    return WithoutExceptions([&]() -> int {
        if (!request || !postscript_name || !*postscript_name || !IsUTF8(postscript_name) ||
            (family && !IsUTF8(family)))
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        if (request->question == GLYPHWELL_ASK_ACTIVATION && !request->fonts.empty())
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        request->fonts.push_back(Font{postscript_name, family ? family : ""});
        request->bytes.clear();
        return GLYPHWELL_OK;
    });
}

int glyphwell_request_set_suppress(glyphwell_request* request, int suppress) {
    if (!request || request->question != GLYPHWELL_ASK_DOWNLOAD)
        return GLYPHWELL_ERROR_INVALID_ARGUMENT;
    request->suppress = suppress != 0;
    request->bytes.clear();
    return GLYPHWELL_OK;
}

int glyphwell_request_get_bytes(glyphwell_request* request, const void** bytes, size_t* length) {
    return WithoutExceptions([&]() -> int {
        if (!request || !bytes || !length || !request->Flatten())
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        *bytes = request->bytes.data();
        *length = request->bytes.size();
        return GLYPHWELL_OK;
    });
}

int glyphwell_call_start(glyphwell_request* request, const char* port_name, glyphwell_call** call) {
    if (call)
        *call = nullptr;
    return WithoutExceptions([&]() -> int {
        if (!request || !call || !request->Flatten())
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        std::unique_ptr<glyphwell_call> made(new (std::nothrow) glyphwell_call);
        if (!made)
            return GLYPHWELL_ERROR_NO_MEMORY;
        made->question = request->question;
        uint8_t header[glyphwell::port::kRequestHeaderSize];
        glyphwell::port::StoreRequestHeader(request->question, uint32_t(request->bytes.size()),
                                            header);
        made->output.assign(reinterpret_cast<const char*>(header), sizeof header);
        made->output += request->bytes;
        const int status = made->Connect(port_name);
        if (status < 0) {
            const int error = errno;
            made.reset();
            errno = error;
            return status;
        }
        *call = made.release();
        return GLYPHWELL_OK;
    });
}

int glyphwell_call_get_fd(const glyphwell_call* call) {
    return call ? call->fd : -1;
}

short glyphwell_call_get_events(const glyphwell_call* call) {
    if (!call)
        return 0;
    switch (call->stage) {
    case glyphwell_call::Stage::kConnecting:
    case glyphwell_call::Stage::kWriting:
        return POLLOUT;
    case glyphwell_call::Stage::kReading:
        return POLLIN;
    default:
        return 0;
    }
}

int glyphwell_call_dispatch(glyphwell_call* call, glyphwell_reply** reply) {
    return WithoutExceptions([&]() -> int {
        if (!call || !reply)
            return GLYPHWELL_ERROR_INVALID_ARGUMENT;
        *reply = nullptr;
        if (call->stage == glyphwell_call::Stage::kDone)
            return call->outcome;
        if (call->stage != glyphwell_call::Stage::kReading) {
            const int status = call->Write();
            if (status != GLYPHWELL_IN_PROGRESS || call->stage != glyphwell_call::Stage::kReading)
                return status;
        }
        return call->Read(reply);
    });
}

void glyphwell_call_free(glyphwell_call* call) {
    delete call;
}

int glyphwell_request_send(glyphwell_request* request, const char* port_name, int timeout_ms,
                           glyphwell_reply** reply) {
    if (reply)
        *reply = nullptr;
    if (!reply)
        return GLYPHWELL_ERROR_INVALID_ARGUMENT;
    glyphwell_call* call = nullptr;
    int status = glyphwell_call_start(request, port_name, &call);
    const long long deadline = timeout_ms < 0 ? -1 : NowMilliseconds() + timeout_ms;
    // An agent too busy to accept the connection is tried again, every few milliseconds.
    while (status == GLYPHWELL_ERROR_TRANSPORT && errno == EAGAIN) {
        long long wait = kBusyRetryMilliseconds;
        if (deadline >= 0) {
            const long long left = deadline - NowMilliseconds();
            if (left <= 0) {
                status = GLYPHWELL_ERROR_TIMED_OUT;
                break;
            }
            wait = std::min(wait, left);
        }
        poll(nullptr, 0, int(wait));
        status = glyphwell_call_start(request, port_name, &call);
    }
    while (status >= 0) {
        status = glyphwell_call_dispatch(call, reply);
        if (status != GLYPHWELL_IN_PROGRESS)
            break;
        long long wait = -1;
        if (deadline >= 0) {
            wait = deadline - NowMilliseconds();
            if (wait <= 0) {
                status = GLYPHWELL_ERROR_TIMED_OUT;
                break;
            }
        }
        pollfd entry{glyphwell_call_get_fd(call), glyphwell_call_get_events(call), 0};
        if (poll(&entry, 1, wait > INT32_MAX ? INT32_MAX : int(wait)) < 0 && errno != EINTR) {
            status = GLYPHWELL_ERROR_TRANSPORT;
            break;
        }
    }
    glyphwell_call_free(call);
    return status == GLYPHWELL_IN_PROGRESS ? GLYPHWELL_ERROR_TRANSPORT : status;
}

int glyphwell_reply_get_result(const glyphwell_reply* reply) {
    return reply ? reply->result : -1;
}

int glyphwell_reply_get_suppress(const glyphwell_reply* reply) {
    return reply ? reply->suppress : -1;
}

size_t glyphwell_reply_get_candidate_count(const glyphwell_reply* reply) {
    return reply ? reply->candidateURLs.size() : 0;
}

const char* glyphwell_reply_get_candidate_url(const glyphwell_reply* reply, size_t index) {
    if (!reply || index >= reply->candidateURLs.size())
        return nullptr;
    return reply->candidateURLs[index].c_str();
}

const void* glyphwell_reply_get_bytes(const glyphwell_reply* reply, size_t* length) {
    if (length)
        *length = reply ? reply->bytes.size() : 0;
    return reply ? reply->bytes.data() : nullptr;
}

void glyphwell_reply_free(glyphwell_reply* reply) {
    delete reply;
}

} // extern "C"
