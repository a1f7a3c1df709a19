// Map: a burst opens on a caller's first request (its pid asked of the bus at once, a 1 s timer
// started), moves to the waiting list when the timer ends, and is asked when no other question
// is on screen, by a worker process: it turns languages and families into catalog fonts, asks
// the agent and remembers a declined language, so that fontconfig, the catalog and the client
// library never stay resident here. The bridge logs each step it reports and announces the
// installed fonts.
#include "bridge/QZFontAsker.h"

#include <fcntl.h>
#include <limits.h>
#include <signal.h>
#include <spawn.h>
#include <sys/epoll.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/Log.h"
#include "platform/LogEscape.h"

struct QZFontAsker::Burst {
    QZFontAsker* asker = nullptr;
    std::string sender;
    std::string desktopID;
    QZFontResourceWants wants;
    pid_t pid = 0;
    sd_bus_slot* pidQuery = nullptr;
    sd_event_source* timer = nullptr;
    // Set when the question is asked.
    std::string fontNames; ///< the families offered, for the notification
    std::string displayName;

    ~Burst() {
        sd_bus_slot_unref(pidQuery);
        sd_event_source_disable_unref(timer);
    }
};

namespace {

std::string Escaped(std::string_view text) {
    return glyphwell::LogEscape(text);
}

/// The font-choice worker: installed beside the bridge.
std::string WorkerPath() {
    std::string path(PATH_MAX, '\0');
    const ssize_t length = readlink("/proc/self/exe", path.data(), path.size());
    path.resize(length > 0 ? size_t(length) : 0);
    return path.substr(0, path.rfind('/') + 1) + "glyphwell-bus-bridge-worker";
}

} // namespace

QZFontAsker::QZFontAsker(sd_event* event, sd_bus* bus, const char* portName)
    : event_(event), bus_(bus), portName_(portName ? portName : ""),
      hasPortName_(portName != nullptr), workerPath_(WorkerPath()) {}

QZFontAsker::~QZFontAsker() {
    EndWorker();
}

void QZFontAsker::Open(const std::string& sender) {
    if (open_.count(sender))
        return;
    if (open_.size() + waiting_.size() >= kMaximumBursts) {
        // One line for the first request dropped, one count when there is room again.
        if (dropped_++ == 0)
            glyphwell::AppLog("Dropping the font request of %s: %zu requests are waiting already",
                              Escaped(sender).c_str(), open_.size() + waiting_.size());
        return;
    }
    if (dropped_ > 1)
        glyphwell::AppLog("Dropped %zu more font requests while %zu were waiting", dropped_ - 1,
                          kMaximumBursts);
    dropped_ = 0;
    auto burst = std::make_unique<Burst>();
    burst->asker = this;
    burst->sender = sender;
    sd_bus_call_method_async(bus_, &burst->pidQuery, "org.freedesktop.DBus",
                             "/org/freedesktop/DBus", "org.freedesktop.DBus",
                             "GetConnectionUnixProcessID", OnProcessID, burst.get(), "s",
                             sender.c_str());
    if (sd_event_add_time_relative(event_, &burst->timer, CLOCK_MONOTONIC, kBurstMicroseconds, 0,
                                   OnBurstEnd, burst.get()) < 0) {
        glyphwell::AppLog("Dropping the font request of %s: no timer", Escaped(sender).c_str());
        return;
    }
    open_.emplace(sender, std::move(burst));
}

void QZFontAsker::Add(const std::string& sender, const std::string& desktopID,
                      const QZFontResourceWants& wants) {
    const auto open = open_.find(sender);
    if (open == open_.end())
        return;
    open->second->wants.Merge(wants);
    if (open->second->desktopID.empty())
        open->second->desktopID = desktopID;
}

int QZFontAsker::OnProcessID(sd_bus_message* reply, void* data, sd_bus_error*) {
    Burst& burst = *static_cast<Burst*>(data);
    burst.pidQuery = sd_bus_slot_unref(burst.pidQuery);
    uint32_t pid = 0;
    if (!sd_bus_message_is_method_error(reply, nullptr) &&
        sd_bus_message_read(reply, "u", &pid) > 0)
        burst.pid = pid_t(pid);
    return 0;
}

int QZFontAsker::OnBurstEnd(sd_event_source*, uint64_t, void* data) {
    Burst* burst = static_cast<Burst*>(data);
    QZFontAsker& asker = *burst->asker;
    burst->timer = sd_event_source_disable_unref(burst->timer);
    const auto open = asker.open_.find(burst->sender);
    if (open == asker.open_.end())
        return 0;
    // A burst of requests that asked for nothing servable ends here.
    if (!burst->wants.Empty())
        asker.waiting_.push_back(std::move(open->second));
    asker.open_.erase(open);
    asker.Next();
    return 0;
}

void QZFontAsker::Next() {
    while (!asking_ && !waiting_.empty()) {
        std::unique_ptr<Burst> burst = std::move(waiting_.front());
        waiting_.pop_front();
        if (Choose(*burst))
            asking_ = std::move(burst);
    }
}

bool QZFontAsker::Choose(Burst& burst) {
    // A caller that quit while its burst waited is not asked about (the bus cannot give the
    // pid of a connection that has gone).
    if (!QZProcessRuns(burst.pid)) {
        glyphwell::AppLog("Not asking about fonts for %s: it has quit",
                          Escaped(burst.sender).c_str());
        return false;
    }
    QZFontChoiceRequest request{burst.sender, burst.desktopID, burst.wants,
                                burst.pid,    hasPortName_,    portName_};
    std::vector<std::string> arguments = QZFontChoiceArguments(request);
    std::vector<char*> argv = {workerPath_.data()};
    for (std::string& argument : arguments)
        argv.push_back(argument.data());
    argv.push_back(nullptr);

    int pipe[2];
    if (pipe2(pipe, O_CLOEXEC | O_NONBLOCK) < 0) {
        glyphwell::AppLog("Cannot choose the fonts for %s: %s", Escaped(burst.sender).c_str(),
                          std::strerror(errno));
        return false;
    }
    // The worker gets the default signal handling and mask (the bridge blocks the signals its
    // loop handles), /dev/null for input and the pipe for output.
    posix_spawn_file_actions_t actions;
    posix_spawnattr_t attributes;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, pipe[1], STDOUT_FILENO);
    posix_spawnattr_init(&attributes);
    sigset_t none, all;
    sigemptyset(&none);
    sigfillset(&all);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setsigdefault(&attributes, &all);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
    pid_t worker = 0;
    const int error =
        posix_spawn(&worker, workerPath_.c_str(), &actions, &attributes, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    posix_spawnattr_destroy(&attributes);
    close(pipe[1]);
    if (error != 0) {
        close(pipe[0]);
        glyphwell::AppLog("Cannot start %s: %s", Escaped(workerPath_).c_str(),
                          std::strerror(error));
        return false;
    }
    workerAnswer_.clear();
    choiceSize_ = std::string::npos;
    asked_ = false;
    int result = sd_event_add_child(event_, &workerExit_, worker, WEXITED, OnWorkerExit, this);
    if (result < 0) {
        kill(worker, SIGKILL);
        waitpid(worker, nullptr, 0);
        close(pipe[0]);
    } else {
        sd_event_source_set_child_process_own(workerExit_, 1);
        result = sd_event_add_io(event_, &workerOutput_, pipe[0], EPOLLIN, OnWorkerOutput, this);
        if (result < 0)
            close(pipe[0]);
        else
            sd_event_source_set_io_fd_own(workerOutput_, 1);
    }
    if (result >= 0)
        result = sd_event_add_time_relative(event_, &workerTimer_, CLOCK_MONOTONIC,
                                            kWorkerMicroseconds, 0, OnWorkerTimeout, this);
    if (result < 0) {
        EndWorker();
        glyphwell::AppLog("Cannot watch the font chooser for %s: %s", Escaped(burst.sender).c_str(),
                          std::strerror(-result));
        return false;
    }
    return true;
}

bool QZFontAsker::ReadWorkerOutput() {
    char buffer[16384];
    for (;;) {
        const ssize_t count = read(sd_event_source_get_io_fd(workerOutput_), buffer, sizeof buffer);
        if (count < 0 && errno == EINTR)
            continue;
        if (count == 0 || (count < 0 && errno != EAGAIN))
            sd_event_source_set_enabled(workerOutput_, SD_EVENT_OFF); // the worker's exit follows
        if (count <= 0)
            return true;
        if (workerAnswer_.size() + size_t(count) > kMaximumAnswerSize)
            return false;
        workerAnswer_.append(buffer, size_t(count));
    }
}

int QZFontAsker::OnWorkerOutput(sd_event_source*, int, uint32_t, void* data) {
    QZFontAsker& asker = *static_cast<QZFontAsker*>(data);
    if (!asker.ReadWorkerOutput()) {
        glyphwell::AppLog("Dropping the font request of %s: its font chooser wrote over %zu bytes",
                          Escaped(asker.asking_->sender).c_str(), kMaximumAnswerSize);
        asker.DropChoice();
        return 0;
    }
    if (!asker.Progress()) {
        glyphwell::AppLog("Dropping the font request of %s: its font chooser gave no answer",
                          Escaped(asker.asking_->sender).c_str());
        asker.DropChoice();
    }
    return 0;
}

int QZFontAsker::OnWorkerTimeout(sd_event_source*, uint64_t, void* data) {
    QZFontAsker& asker = *static_cast<QZFontAsker*>(data);
    glyphwell::AppLog("Dropping the font request of %s: its font chooser did not finish in %llu s",
                      Escaped(asker.asking_->sender).c_str(),
                      static_cast<unsigned long long>(kWorkerMicroseconds / 1000000));
    asker.DropChoice();
    return 0;
}

int QZFontAsker::OnWorkerExit(sd_event_source*, const siginfo_t* info, void* data) {
    QZFontAsker& asker = *static_cast<QZFontAsker*>(data);
    // The worker has written all it will: what the pipe still holds is read now.
    const bool read = asker.ReadWorkerOutput() && asker.Progress();
    QZFontQuestionTail tail;
    const bool answered =
        read && info->si_code == CLD_EXITED && info->si_status == 0 &&
        asker.choiceSize_ != std::string::npos &&
        QZDecodeQuestionTail(std::string_view(asker.workerAnswer_).substr(asker.choiceSize_),
                             &tail) &&
        (tail.ended || !tail.asking);
    if (!answered) {
        const std::string sender = Escaped(asker.asking_->sender);
        if (info->si_code != CLD_EXITED)
            glyphwell::AppLog("Dropping the font request of %s: its font chooser was ended by "
                              "signal %d",
                              sender.c_str(), info->si_status);
        else if (info->si_status != 0)
            glyphwell::AppLog("Dropping the font request of %s: its font chooser ended with "
                              "status %d",
                              sender.c_str(), info->si_status);
        else
            glyphwell::AppLog("Dropping the font request of %s: its font chooser gave no answer",
                              sender.c_str());
        asker.DropChoice();
        return 0;
    }
    asker.EndWorker();
    if (tail.ended && !tail.asking)
        glyphwell::AppLog("Cannot ask the agent about the fonts for %s: %s",
                          Escaped(asker.asking_->displayName).c_str(),
                          Escaped(tail.statusText).c_str());
    if (tail.ended && tail.asking)
        asker.Finish(tail.status, tail.result, tail.statusText);
    else
        asker.DropChoice();
    return 0;
}

bool QZFontAsker::Progress() {
    if (choiceSize_ == std::string::npos) {
        const size_t size = QZFontChoiceSize(workerAnswer_);
        if (size == std::string::npos)
            return true;
        QZFontChoice choice;
        if (!QZDecodeFontChoice(std::string_view(workerAnswer_).substr(0, size), &choice))
            return false;
        choiceSize_ = size;
        Chosen(choice);
    }
    static const std::string kAsking = QZEncodeQuestionAsking();
    if (!asked_ && workerAnswer_.compare(choiceSize_, kAsking.size(), kAsking) == 0) {
        // The question is up: the user takes the time they need.
        asked_ = true;
        workerTimer_ = sd_event_source_disable_unref(workerTimer_);
        glyphwell::AppLog("Asking to download %s for %s (process %d)",
                          Escaped(asking_->fontNames).c_str(),
                          Escaped(asking_->displayName).c_str(), int(asking_->pid));
    }
    return true;
}

void QZFontAsker::EndWorker() {
    workerTimer_ = sd_event_source_disable_unref(workerTimer_);
    workerOutput_ = sd_event_source_disable_unref(workerOutput_);
    workerExit_ = sd_event_source_disable_unref(workerExit_);
    workerAnswer_ = std::string();
}

void QZFontAsker::DropChoice() {
    EndWorker();
    asking_.reset();
    Next();
}

void QZFontAsker::Chosen(const QZFontChoice& choice) {
    Burst& burst = *asking_;
    burst.displayName = choice.displayName;
    burst.fontNames = choice.fontNames;
    if (!choice.unserved.empty())
        glyphwell::AppLog("No catalog font for %s, asked for by %s",
                          Escaped(choice.unserved).c_str(), Escaped(burst.displayName).c_str());
    if (choice.fonts.empty() && choice.unserved.empty())
        glyphwell::AppLog("Not asking about fonts for %s: what it asked for is installed or "
                          "was declined",
                          Escaped(burst.displayName).c_str());
}

void QZFontAsker::Finish(int status, int result, const std::string& statusText) {
    std::unique_ptr<Burst> burst = std::move(asking_);
    if (status < 0) {
        glyphwell::AppLog("The agent did not answer about the fonts for %s: %s",
                          Escaped(burst->displayName).c_str(), Escaped(statusText).c_str());
    } else if (result == 1) {
        glyphwell::AppLog("Installed %s for %s", Escaped(burst->fontNames).c_str(),
                          Escaped(burst->displayName).c_str());
        Notify(burst->fontNames, burst->displayName);
    }
    Next();
}

void QZFontAsker::Notify(const std::string& fonts, const std::string& application) {
    // Only a running notification server is asked: none is started for us.
    sd_bus_message* message = nullptr;
    if (sd_bus_message_new_method_call(bus_, &message, "org.freedesktop.Notifications",
                                       "/org/freedesktop/Notifications",
                                       "org.freedesktop.Notifications", "Notify") < 0)
        return;
    sd_bus_message_set_auto_start(message, 0);
    const std::string body = (fonts.empty() ? std::string("The fonts") : fonts) +
                             " can now be used. " + application +
                             " may need a restart to show them.";
    if (sd_bus_message_append(message, "susssasa{sv}i", "Glyphwell", uint32_t(0),
                              "preferences-desktop-font", "Fonts installed", body.c_str(), 0, 0,
                              int32_t(-1)) >= 0)
        sd_bus_call_async(bus_, nullptr, message, nullptr, nullptr, 0);
    sd_bus_message_unref(message);
}
