// Turning the font requests that arrive on the bus into download questions for the agent.
//
// Requests from one caller that arrive within 1 s of its first form one burst; a burst becomes
// one message id 2 request naming the application and carrying the caller's pid, so that the
// agent withdraws the question when the application quits. One question is on screen at a time;
// up to kMaximumBursts more wait, the rest are logged and dropped. The agent is asked through
// libglyphwell-client's asynchronous calls on the bridge's event loop: nothing here blocks.
#pragma once

#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

#include <deque>
#include <map>
#include <memory>
#include <string>

#include "bridge/QZDeclinedLanguages.h"
#include "bridge/QZFontResources.h"

struct glyphwell_call;

class QZFontAsker {
public:
    static constexpr size_t kMaximumBursts = 64;
    static constexpr uint64_t kBurstMicroseconds = 1000000;

    /// Uses `event` and `bus` (not retained: they outlive the asker); `portName` is the agent's
    /// port (null: the agent's own).
    QZFontAsker(sd_event* event, sd_bus* bus, QZDeclinedLanguages declined, const char* portName);
    ~QZFontAsker();
    QZFontAsker(const QZFontAsker&) = delete;
    QZFontAsker& operator=(const QZFontAsker&) = delete;

    /// Opens a burst for the bus client `sender` (its unique name) unless one is open, and asks
    /// the bus for its pid. Call it before replying to the request: a client may close its
    /// connection once it has the reply, and the bus then no longer knows its pid.
    void Open(const std::string& sender);
    /// Adds what `sender` asked for, with the desktop file id it gave (may be empty), to its
    /// open burst; nothing when none is open (the queue was full).
    void Add(const std::string& sender, const std::string& desktopID,
             const QZFontResourceWants& wants);

private:
    struct Burst;
    static int OnProcessID(sd_bus_message* reply, void* burst, sd_bus_error*);
    static int OnBurstEnd(sd_event_source*, uint64_t, void* burst);
    static int OnCallEvent(sd_event_source*, int, uint32_t, void* asker);
    /// Starts the next waiting burst's question when none is on screen.
    void Next();
    /// Asks the agent about `burst`; false when there is nothing to ask or the call failed.
    bool Ask(Burst& burst);
    void Finish(int status, int result);
    void Notify(const std::string& fonts, const std::string& application);

    sd_event* event_;
    sd_bus* bus_;
    QZDeclinedLanguages declined_;
    std::string portName_;
    bool hasPortName_ = false;
    std::map<std::string, std::unique_ptr<Burst>> open_; ///< by sender
    std::deque<std::unique_ptr<Burst>> waiting_;
    std::unique_ptr<Burst> asking_; ///< the burst whose question is on screen
    size_t dropped_ = 0;            ///< requests dropped since the queue was last short of full
    glyphwell_call* call_ = nullptr;
    sd_event_source* callSource_ = nullptr;
};
