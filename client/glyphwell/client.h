/* libglyphwell-client: ask the Glyphwell user-interface agent its two questions from C, C++ or
 * any language with a C foreign-function interface.
 *
 *   - GLYPHWELL_ASK_ACTIVATION: may an application use a font that is not installed but was found
 *     in font files on disk?
 *   - GLYPHWELL_ASK_DOWNLOAD: may the fonts an application asked for be downloaded? After the
 *     user agrees (or when the request says not to ask), the agent downloads and installs them.
 *
 * Build a request, send it, read the reply. The agent may keep a question on screen for minutes:
 * give a timeout, or use the asynchronous calls (glyphwell_call_*) from a main loop: they hand
 * out a file descriptor to poll and never block.
 *
 * Errors are negative glyphwell_status values; glyphwell_status_text describes each. Every object
 * belongs to its creator, who frees it; an object may be used from any thread, but by one
 * thread at a time. Strings passed in are UTF-8 and copied; strings handed out stay valid until
 * their object is freed.
 */
#ifndef GLYPHWELL_CLIENT_H
#define GLYPHWELL_CLIENT_H

#include <stddef.h>
#include <stdint.h>

#if defined(GLYPHWELL_CLIENT_BUILD)
#define GLYPHWELL_CLIENT_API __attribute__((visibility("default")))
#else
#define GLYPHWELL_CLIENT_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Results of the calls below: 0 or positive for success, negative for an error. */
typedef enum glyphwell_status {
    GLYPHWELL_OK = 0,
    /* glyphwell_call_dispatch: the exchange goes on; poll again. */
    GLYPHWELL_IN_PROGRESS = 1,
    /* A null object, an unknown question, text that is not UTF-8, an option the question does
     * not take, or a request without what its question needs (see glyphwell_request_send). */
    GLYPHWELL_ERROR_INVALID_ARGUMENT = -1,
    GLYPHWELL_ERROR_NO_MEMORY = -2,
    /* Nothing listens on the agent's socket: the agent is not running, and nothing (such as its
     * systemd socket unit) starts it on demand. */
    GLYPHWELL_ERROR_NOT_RUNNING = -3,
    /* No reply came within the timeout. The question is withdrawn from the screen. */
    GLYPHWELL_ERROR_TIMED_OUT = -4,
    /* The agent closed the connection before replying (it quit or crashed). */
    GLYPHWELL_ERROR_DISCONNECTED = -5,
    /* The reply is empty, longer than 64 MiB, not a readable dictionary, or lacks the answer. */
    GLYPHWELL_ERROR_MALFORMED_REPLY = -6,
    /* Any other failure of the socket (errno tells more, when the caller looks at once). */
    GLYPHWELL_ERROR_TRANSPORT = -7
} glyphwell_status;

/* The two questions; their values are the message ids on the wire. */
typedef enum glyphwell_question {
    GLYPHWELL_ASK_ACTIVATION = 1,
    GLYPHWELL_ASK_DOWNLOAD = 2
} glyphwell_question;

typedef struct glyphwell_request glyphwell_request;
typedef struct glyphwell_reply glyphwell_reply;
typedef struct glyphwell_call glyphwell_call;

/* A short English description of `status` (a static string; never null, also for values that
 * are not a glyphwell_status). */
GLYPHWELL_CLIENT_API const char* glyphwell_status_text(int status);

/* A new empty request for `question`, or null for an unknown question or when out of memory.
 * Free it with glyphwell_request_free. */
GLYPHWELL_CLIENT_API glyphwell_request* glyphwell_request_new(int question);
/* Frees `request`; null is a no-op. Calls in progress that were started from it are not
 * affected (they hold their own copy of the bytes). */
GLYPHWELL_CLIENT_API void glyphwell_request_free(glyphwell_request* request);

/* The application's display name shown in the question. Optional: without it the agent names
 * the application after its desktop file. Replaces an earlier name. */
GLYPHWELL_CLIENT_API int glyphwell_request_set_application_name(glyphwell_request* request,
                                                                const char* name);
/* The application's desktop file or bundle directory (its icon and fallback name are shown).
 * A relative path is made absolute against the current directory. Optional. */
GLYPHWELL_CLIENT_API int glyphwell_request_set_bundle_path(glyphwell_request* request,
                                                           const char* path);
/* GLYPHWELL_ASK_DOWNLOAD only: the requesting application's process id. The question is
 * withdrawn when that process exits. Defaults to the caller's own process. */
GLYPHWELL_CLIENT_API int glyphwell_request_set_process_id(glyphwell_request* request, int32_t pid);
/* GLYPHWELL_ASK_ACTIVATION only: adds a font file that holds the font asked for (made absolute
 * like the bundle path). At least one is needed. */
GLYPHWELL_CLIENT_API int glyphwell_request_add_candidate_file(glyphwell_request* request,
                                                              const char* path);
/* Adds a font by PostScript name, with its family name (null or "" for none). For
 * GLYPHWELL_ASK_DOWNLOAD each call adds one font to download (at least one is needed); for
 * GLYPHWELL_ASK_ACTIVATION the one font asked for (a second call is an invalid argument). */
GLYPHWELL_CLIENT_API int glyphwell_request_add_font(glyphwell_request* request,
                                                    const char* postscript_name,
                                                    const char* family);
/* GLYPHWELL_ASK_DOWNLOAD only: non-zero when the user already chose not to be asked again; the
 * agent then downloads without showing the question. */
GLYPHWELL_CLIENT_API int glyphwell_request_set_suppress(glyphwell_request* request, int suppress);

/* The request's bytes as they go on the wire (the flattened request dictionary), for logs and
 * tests: stores a pointer and the length, valid until the request is next changed or freed.
 * GLYPHWELL_ERROR_INVALID_ARGUMENT for a request that misses what its question needs. */
GLYPHWELL_CLIENT_API int glyphwell_request_get_bytes(glyphwell_request* request, const void** bytes,
                                                     size_t* length);

/* Sends `request` to the agent and waits for its reply, at most `timeout_ms` milliseconds
 * (-1: without limit; users take their time). `port_name` is null for the agent, or another
 * port name (tests). On success stores a new reply in `*reply` (free it with
 * glyphwell_reply_free); on error `*reply` is null. GLYPHWELL_ERROR_INVALID_ARGUMENT when an
 * activation request has no candidate file or a download request has no font. An agent too busy
 * to accept the connection at once is tried again until the timeout. */
GLYPHWELL_CLIENT_API int glyphwell_request_send(glyphwell_request* request, const char* port_name,
                                                int timeout_ms, glyphwell_reply** reply);

/* Starts sending `request` without blocking. On success stores a new call in `*call`; poll its
 * descriptor (glyphwell_call_get_fd) for the events of glyphwell_call_get_events, and call
 * glyphwell_call_dispatch whenever they occur. Errors are those of glyphwell_request_send that
 * can be known at once (GLYPHWELL_ERROR_NOT_RUNNING among them; GLYPHWELL_ERROR_TRANSPORT with
 * errno EAGAIN when the agent is too busy to accept the connection: try again later); `*call`
 * is then null. */
GLYPHWELL_CLIENT_API int glyphwell_call_start(glyphwell_request* request, const char* port_name,
                                              glyphwell_call** call);
/* The call's socket (non-blocking, close-on-exec), or -1 once it has ended. The descriptor
 * stays the same for the whole call; do not read, write or close it. */
GLYPHWELL_CLIENT_API int glyphwell_call_get_fd(const glyphwell_call* call);
/* The poll(2) events to wait for now: POLLOUT while the request is being written, POLLIN
 * while the reply is awaited, 0 once the call has ended. */
GLYPHWELL_CLIENT_API short glyphwell_call_get_events(const glyphwell_call* call);
/* Moves the exchange on as far as it can without blocking. GLYPHWELL_IN_PROGRESS: poll again.
 * GLYPHWELL_OK: the reply is stored in `*reply` (a new reply the caller frees). Negative: the
 * call failed for good. Once ended, further calls return the same result again, without a
 * second reply. Safe to call when no event occurred. */
GLYPHWELL_CLIENT_API int glyphwell_call_dispatch(glyphwell_call* call, glyphwell_reply** reply);
/* Ends `call` and frees it; null is a no-op. A call still waiting for its reply is cancelled:
 * the agent withdraws the question from the screen. */
GLYPHWELL_CLIENT_API void glyphwell_call_free(glyphwell_call* call);

/* The answer: 1 when the user allowed (activation) or the download matched at least one font
 * (download), 0 otherwise. -1 for a null reply. */
GLYPHWELL_CLIENT_API int glyphwell_reply_get_result(const glyphwell_reply* reply);
/* 1 when the user chose not to be asked again, 0 otherwise; -1 for a null reply. */
GLYPHWELL_CLIENT_API int glyphwell_reply_get_suppress(const glyphwell_reply* reply);
/* Activation replies: the number of candidate font URLs passed back (0 for download replies). */
GLYPHWELL_CLIENT_API size_t glyphwell_reply_get_candidate_count(const glyphwell_reply* reply);
/* The candidate URL at `index` ("file:///..."), or null when `index` is out of range. */
GLYPHWELL_CLIENT_API const char* glyphwell_reply_get_candidate_url(const glyphwell_reply* reply,
                                                                   size_t index);
/* The reply's bytes as received, for logs and tests (valid while the reply lives). */
GLYPHWELL_CLIENT_API const void* glyphwell_reply_get_bytes(const glyphwell_reply* reply,
                                                           size_t* length);
/* Frees `reply`; null is a no-op. */
GLYPHWELL_CLIENT_API void glyphwell_reply_free(glyphwell_reply* reply);

#ifdef __cplusplus
}
#endif

#endif /* GLYPHWELL_CLIENT_H */
