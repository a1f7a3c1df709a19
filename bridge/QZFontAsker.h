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

#include "bridge/QZFontChoice.h"
#include "bridge/QZFontResources.h"

class QZFontAsker {
public:
    static constexpr size_t kMaximumBursts = 64;
    static constexpr uint64_t kBurstMicroseconds = 1000000;
    /// A font-choice worker still running after this long is killed and its burst dropped (a
    /// first fontconfig scan of many fonts can take seconds).
    static constexpr uint64_t kWorkerMicroseconds = 30000000;
    /// A worker's answer over this size is not read: the worker is killed.
    static constexpr size_t kMaximumAnswerSize = 1 << 20;

    /// Uses `event` and `bus` (not retained: they outlive the asker); `portName` is the agent's
    /// port (null: the agent's own).
    QZFontAsker(sd_event* event, sd_bus* bus, const char* portName);
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
    /// Starts the next waiting burst's question when none is on screen.
    void Next();
    /// Starts the worker that chooses the fonts for `burst`; false when it could not start.
    bool Choose(Burst& burst);
    static int OnWorkerOutput(sd_event_source*, int fd, uint32_t, void* asker);
    static int OnWorkerExit(sd_event_source*, const siginfo_t* info, void* asker);
    static int OnWorkerTimeout(sd_event_source*, uint64_t, void* asker);
    /// Reads what the worker wrote; false when it wrote too much.
    bool ReadWorkerOutput();
    /// Ends the worker (killed and reaped if it still runs) and its event sources.
    void EndWorker();
    /// Drops the burst being chosen for and moves on.
    void DropChoice();
    /// Takes in what the worker has written so far; false when it is not a choice.
    bool Progress();
    /// Records the worker's choice in the burst and logs what it leaves out.
    void Chosen(const QZFontChoice& choice);
    /// Ends the question with the agent's answer (or the call's failure) and moves on.
    void Finish(int status, int result, const std::string& statusText);
    void Notify(const std::string& fonts, const std::string& application);

    sd_event* event_;
    sd_bus* bus_;
    std::string portName_;
    bool hasPortName_ = false;
    std::map<std::string, std::unique_ptr<Burst>> open_; ///< by sender
    std::deque<std::unique_ptr<Burst>> waiting_;
    std::unique_ptr<Burst> asking_; ///< the burst chosen for, or whose question is on screen
    std::string workerPath_;
    sd_event_source* workerExit_ = nullptr; ///< owns the worker process: kills and reaps it
    sd_event_source* workerOutput_ = nullptr;
    sd_event_source* workerTimer_ = nullptr;
    std::string workerAnswer_;
    size_t choiceSize_ = std::string::npos; ///< where the choice ends in the answer, once read
    bool asked_ = false;                    ///< the worker has put the question
    size_t dropped_ = 0; ///< requests dropped since the queue was last short of full
};
