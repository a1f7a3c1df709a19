// glyphwell-bus-bridge-worker: chooses the fonts for one burst of the bridge's requests, asks the
// agent about them and waits for its answer, writing each step to its standard output. Started
// by glyphwell-bus-bridge only.
#include <glyphwell/client.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include <ctime>

#include "bridge/QZDeclinedLanguages.h"
#include "bridge/QZFontChoice.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

bool Write(const std::string& text) {
    for (size_t written = 0; written < text.size();) {
        const ssize_t count = write(STDOUT_FILENO, text.data() + written, text.size() - written);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        written += size_t(count);
    }
    return true;
}

} // namespace

int main(int argc, char** argv) {
    // Killed with the bridge: nobody would read the answer.
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    QZFontChoiceRequest request;
    if (argc < 2 || !QZParseFontChoiceArguments(argc - 1, argv + 1, &request)) {
        std::fprintf(stderr,
                     "usage: %s sender=NAME desktop=ID "
                     "pid=PID [port=NAME] [language=TAG]... [family=NAME]...\n"
                     "Started by glyphwell-bus-bridge; not for direct use.\n",
                     argv[0]);
        return 2;
    }
    const QZFontChoice choice = QZChooseFonts(request);
    if (!Write(QZEncodeFontChoice(choice)))
        return 1;
    if (choice.fonts.empty())
        return 0;

    glyphwell_request* question = glyphwell_request_new(GLYPHWELL_ASK_DOWNLOAD);
    if (!question)
        return 1;
    glyphwell_request_set_application_name(question, choice.displayName.c_str());
    if (!choice.desktopFile.empty())
        glyphwell_request_set_bundle_path(question, choice.desktopFile.c_str());
    glyphwell_request_set_process_id(question, request.pid);
    for (const auto& [postScriptName, family] : choice.fonts)
        glyphwell_request_add_font(question, postScriptName.c_str(), family.c_str());
    glyphwell_call* call = nullptr;
    int status = glyphwell_call_start(
        question, request.hasPortName ? request.portName.c_str() : nullptr, &call);
    glyphwell_request_free(question);
    int result = 0;
    if (status >= 0) {
        if (!Write(QZEncodeQuestionAsking())) {
            glyphwell_call_free(call);
            return 1;
        }
        glyphwell_reply* reply = nullptr;
        while ((status = glyphwell_call_dispatch(call, &reply)) == GLYPHWELL_IN_PROGRESS) {
            pollfd wait = {glyphwell_call_get_fd(call), glyphwell_call_get_events(call), 0};
            poll(&wait, 1, -1);
        }
        result = glyphwell_reply_get_result(reply);
        glyphwell_reply_free(reply);
        glyphwell_call_free(call);
        // Skipped, not withdrawn because the application quit: not asked again for a while.
        QZDeclinedLanguages declined(QZDeclinedLanguages::DefaultPath());
        if (status >= 0 && result != 1 && !choice.askedLanguages.empty() &&
            QZProcessRuns(request.pid) &&
            !declined.Record(choice.application, choice.askedLanguages, time(nullptr)))
            glyphwell::AppLog("Cannot remember the declined languages in %s",
                              glyphwell::LogEscape(QZDeclinedLanguages::DefaultPath()).c_str());
    }
    return Write(QZEncodeQuestionOutcome(status, result, glyphwell_status_text(status))) ? 0 : 1;
}
