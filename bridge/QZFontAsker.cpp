// Map: a burst opens on a caller's first request (its pid asked of the bus at once, a 1 s timer
// started), moves to the waiting list when the timer ends, and is asked when no other question
// is on screen: languages and families become catalog fonts (fontconfig loaded for that moment
// only), the fonts one request, the request one asynchronous call. Its reply records a declined
// language or announces the installed fonts.
#include "bridge/QZFontAsker.h"

#include <glyphwell/client.h>
#include <malloc.h>
#include <poll.h>
#include <sys/epoll.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <set>

#include "bridge/QZApplicationName.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZFontLanguages.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"
#include "platform/ReadFile.h"

struct QZFontAsker::Burst {
    QZFontAsker* asker = nullptr;
    std::string sender;
    std::string desktopID;
    QZFontResourceWants wants;
    pid_t pid = 0;
    sd_bus_slot* pidQuery = nullptr;
    sd_event_source* timer = nullptr;
    // Set when the question is asked.
    std::string application; ///< the key declined languages are remembered under
    std::vector<std::string> askedLanguages;
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

/// Whether process `pid` runs: it exists and is not a zombie waiting for its parent.
bool ProcessExists(pid_t pid) {
    std::string stat;
    if (!glyphwell::ReadFileStart("/proc/" + std::to_string(pid) + "/stat", 1024, &stat))
        return false;
    const size_t end = stat.rfind(')');
    return end != std::string::npos && end + 2 < stat.size() && stat[end + 2] != 'Z' &&
           stat[end + 2] != 'X';
}

uint32_t EpollEvents(short events) {
    return ((events & POLLIN) ? uint32_t(EPOLLIN) : 0u) |
           ((events & POLLOUT) ? uint32_t(EPOLLOUT) : 0u);
}

} // namespace

QZFontAsker::QZFontAsker(sd_event* event, sd_bus* bus, QZDeclinedLanguages declined,
                         const char* portName)
    : event_(event), bus_(bus), declined_(std::move(declined)), portName_(portName ? portName : ""),
      hasPortName_(portName != nullptr) {}

QZFontAsker::~QZFontAsker() {
    sd_event_source_disable_unref(callSource_);
    glyphwell_call_free(call_);
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
        if (Ask(*burst))
            asking_ = std::move(burst);
    }
}

bool QZFontAsker::Ask(Burst& burst) {
    // A caller that quit while its burst waited is not asked about (the bus cannot give the
    // pid of a connection that has gone).
    if (burst.pid <= 0 || !ProcessExists(burst.pid)) {
        glyphwell::AppLog("Not asking about fonts for %s: it has quit",
                          Escaped(burst.sender).c_str());
        return false;
    }
    const std::string executable = QZExecutableName(burst.pid);
    const std::string desktopFile = QZDesktopEntryPath(burst.desktopID);
    burst.application = !burst.desktopID.empty() ? burst.desktopID : executable;
    burst.displayName = desktopFile.empty() ? std::string() : QZDesktopEntryName(desktopFile);
    if (burst.displayName.empty())
        burst.displayName = !executable.empty() ? executable : burst.sender;

    const auto catalog = QZCurrentDownloadableFontCatalog();
    std::vector<const QZDownloadableFont*> fonts;
    std::set<std::string> families;
    const auto offer = [&](const std::vector<const QZDownloadableFont*>& chosen) {
        for (const QZDownloadableFont* font : chosen)
            if (std::find(fonts.begin(), fonts.end(), font) == fonts.end()) {
                fonts.push_back(font);
                if (families.emplace(font->family).second && !font->family.empty())
                    burst.fontNames +=
                        (burst.fontNames.empty() ? "" : ", ") + std::string(font->family);
            }
    };
    std::string unserved;
    {
        // fontconfig's view lives only for this moment: a loaded configuration costs megabytes.
        const QZInstalledFontView installed;
        const time_t now = time(nullptr);
        for (const std::string& language : burst.wants.languages) {
            if (installed.CoversLanguage(language) ||
                declined_.IsDeclined(burst.application, language, now))
                continue;
            const auto chosen = QZCatalogFontsForLanguage(*catalog, language);
            if (chosen.empty())
                unserved += (unserved.empty() ? "" : ", ") + language;
            else
                burst.askedLanguages.push_back(language);
            offer(chosen);
        }
        for (const std::string& family : burst.wants.families) {
            if (installed.HasFamily(family))
                continue;
            const auto chosen = QZCatalogFontsForFamily(*catalog, family);
            if (chosen.empty())
                unserved += (unserved.empty() ? "" : ", ") + family;
            offer(chosen);
        }
    }
    malloc_trim(0);
    if (!unserved.empty())
        glyphwell::AppLog("No catalog font for %s, asked for by %s", Escaped(unserved).c_str(),
                          Escaped(burst.displayName).c_str());
    if (fonts.empty()) {
        if (unserved.empty())
            glyphwell::AppLog("Not asking about fonts for %s: what it asked for is installed or "
                              "was declined",
                              Escaped(burst.displayName).c_str());
        return false;
    }

    glyphwell_request* request = glyphwell_request_new(GLYPHWELL_ASK_DOWNLOAD);
    if (!request)
        return false;
    glyphwell_request_set_application_name(request, burst.displayName.c_str());
    if (!desktopFile.empty())
        glyphwell_request_set_bundle_path(request, desktopFile.c_str());
    glyphwell_request_set_process_id(request, burst.pid);
    for (const QZDownloadableFont* font : fonts)
        glyphwell_request_add_font(request, std::string(font->postScriptName).c_str(),
                                   std::string(font->family).c_str());
    const int status =
        glyphwell_call_start(request, hasPortName_ ? portName_.c_str() : nullptr, &call_);
    glyphwell_request_free(request);
    if (status < 0 ||
        sd_event_add_io(event_, &callSource_, glyphwell_call_get_fd(call_),
                        EpollEvents(glyphwell_call_get_events(call_)), OnCallEvent, this) < 0) {
        glyphwell::AppLog("Cannot ask the agent about the fonts for %s: %s",
                          Escaped(burst.displayName).c_str(), glyphwell_status_text(status));
        call_ = (glyphwell_call_free(call_), nullptr);
        return false;
    }
    glyphwell::AppLog("Asking to download %s for %s (process %d)", Escaped(burst.fontNames).c_str(),
                      Escaped(burst.displayName).c_str(), int(burst.pid));
    return true;
}

int QZFontAsker::OnCallEvent(sd_event_source*, int, uint32_t, void* data) {
    QZFontAsker& asker = *static_cast<QZFontAsker*>(data);
    glyphwell_reply* reply = nullptr;
    const int status = glyphwell_call_dispatch(asker.call_, &reply);
    if (status == GLYPHWELL_IN_PROGRESS) {
        sd_event_source_set_io_events(asker.callSource_,
                                      EpollEvents(glyphwell_call_get_events(asker.call_)));
        return 0;
    }
    const int result = glyphwell_reply_get_result(reply);
    glyphwell_reply_free(reply);
    asker.Finish(status, result);
    return 0;
}

void QZFontAsker::Finish(int status, int result) {
    callSource_ = sd_event_source_disable_unref(callSource_);
    call_ = (glyphwell_call_free(call_), nullptr);
    std::unique_ptr<Burst> burst = std::move(asking_);
    if (status < 0) {
        glyphwell::AppLog("The agent did not answer about the fonts for %s: %s",
                          Escaped(burst->displayName).c_str(), glyphwell_status_text(status));
    } else if (result == 1) {
        glyphwell::AppLog("Installed %s for %s", Escaped(burst->fontNames).c_str(),
                          Escaped(burst->displayName).c_str());
        Notify(burst->fontNames, burst->displayName);
    } else if (!ProcessExists(burst->pid)) {
        // The application quit and its question was withdrawn: nothing was declined.
    } else if (!burst->askedLanguages.empty() &&
               !declined_.Record(burst->application, burst->askedLanguages, time(nullptr))) {
        glyphwell::AppLog("Cannot remember the declined languages in %s",
                          Escaped(QZDeclinedLanguages::DefaultPath()).c_str());
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
