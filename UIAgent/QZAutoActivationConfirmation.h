// QZAutoActivationConfirmation: asks whether an application may use a font that is not installed
// but was found in font files on disk (message id 1). The alert names the application and the
// font (set in its own face), and the volume when the font file lies on another volume than the
// system's; it can reveal the candidate files in the file manager without ending the question,
// offers "don't warn again for this application", opens the agent's help at the alert's section,
// and answers no by itself when it has seen no keyboard, mouse or wheel input of the agent, and no
// press, toggle or focus through the accessibility bus, for the timeout (120 s), counting down
// visibly (and for screen readers at 60, 30 and 10 s left).
//
// The timeout and a withdrawal end this alert's own modal session only: when the alert ends or
// is shown again, no timer of it is left pending, so it can never end a later alert or window.
//
// Main thread only. Built by the request dispatcher, shown once with showAlert, read, destroyed.
#pragma once

#include <QString>
#include <chrono>
#include <memory>

#include "cfutil/TCFRetained.h"
#include "platform/CFArray.h"
#include "platform/CFDictionary.h"
#include "platform/CFURL.h"

class QAbstractButton;
class QCheckBox;
class QLabel;
class QMessageBox;
class QTextBrowser;
class QZModalSession;

class QZAutoActivationConfirmation {
public:
    static constexpr int kAllowTag = 2000;
    static constexpr int kDisallowTag = 2001;
    static constexpr int kShowInFileManagerTag = 2002;
    /// How long the alert waits without user input before it answers no.
    static constexpr std::chrono::milliseconds kTimeout{120000};

    /// Reads the request `properties` (may be null: every key absent) and sets the alert up.
    /// Does not retain `properties`; retains the values it keeps.
    explicit QZAutoActivationConfirmation(CFDictionaryRef properties);
    ~QZAutoActivationConfirmation();
    QZAutoActivationConfirmation(const QZAutoActivationConfirmation&) = delete;
    QZAutoActivationConfirmation& operator=(const QZAutoActivationConfirmation&) = delete;

    /// Runs the alert modally until it is answered, times out or is withdrawn; sets
    /// shouldActivate and suppressFurtherAlerts. "Show in File Manager" reveals the candidates
    /// and shows the alert again, with the checkbox as it was.
    void showAlert();
    /// Ends the running alert with the abort response (answered no, the checkbox as it is). Before
    /// showAlert, makes it answer no without showing anything; after it, does nothing.
    void withdraw();

    /// True only when the user pressed Allow.
    bool shouldActivate() const { return shouldActivate_; }
    /// True when the checkbox was ticked as the alert ended.
    bool suppressFurtherAlerts() const { return suppressFurtherAlerts_; }
    /// The request's candidate font URLs (an array, or null when the request had none); does not
    /// retain: valid while the confirmation lives.
    CFArrayRef candidateFonts() const { return candidateFonts_; }
    /// The request's font attribute dictionary, or null; does not retain.
    CFDictionaryRef request() const { return request_; }
    /// The requesting application's URL, or null; does not retain.
    CFURLRef applicationURL() const { return applicationURL_; }
    /// The font name shown.
    QString fontName() const { return fontName_; }
    /// The application name shown.
    QString applicationName() const { return applicationName_; }
    /// The name of the candidate's volume when it is not the system's, else a null string.
    QString volumeName() const { return volumeName_; }
    /// The alert; owned by the confirmation.
    QMessageBox* alert() const { return alert_.get(); }

    /// Fills the alert: icon, texts, buttons, checkbox, help button, font sample and countdown.
    /// Called by the constructor.
    void setupAlert();
    /// Reveals the candidate files in the file manager (activation, then ShowItems with their
    /// file URIs); candidates that are not file URLs, or whose text has no UTF-8 form, are left
    /// out. Returns at once.
    void showCandidatesInFinder();
    /// Opens the agent's help at the alert's section, in a window beside the alert; the question
    /// stays.
    void showHelp();

    /// The timeout of the next showing (tests shorten it).
    void setTimeout(std::chrono::milliseconds timeout) { timeout_ = timeout; }
    std::chrono::milliseconds timeout() const { return timeout_; }
    /// The time left before the running alert answers no by itself; the full timeout when it is
    /// not running.
    std::chrono::milliseconds remainingTime() const;

    /// The button that answers `tag`, or null.
    QAbstractButton* buttonWithTag(int tag) const;
    QAbstractButton* helpButton() const;
    QCheckBox* suppressionCheckBox() const;
    /// The font's name in its own face; null when the candidate file could not be loaded.
    QLabel* fontSampleLabel() const;
    /// The visible countdown of the timeout: a status region whose accessible name follows the
    /// text at 60, 30 and 10 s left (and when the timeout restarts), not every second.
    QLabel* countdownLabel() const;
    /// The help window once showHelp opened it, else null.
    QTextBrowser* helpWindow() const;

    /// The file URIs showCandidatesInFinder reveals for `candidates`, in order.
    static QStringList CandidateFileURIs(CFArrayRef candidates);

private:
    struct Widgets;

    /// Allow (the default), Disallow (also Escape) and Show in File Manager.
    void addAnswerButtons();
    /// The Help button, which opens the help without ending the question.
    void addHelpButton();
    /// The font's name in its own face, when the candidate file can be loaded.
    void addFontSample();
    void restartTimeout();
    void updateCountdown();
    void arrangeExtraWidgets();

    TCFRetained<CFArrayRef> candidateFonts_;
    TCFRetained<CFDictionaryRef> request_;
    TCFRetained<CFURLRef> applicationURL_;
    QString fontName_;
    QString applicationName_;
    QString volumeName_;
    std::unique_ptr<QMessageBox> alert_;
    std::unique_ptr<Widgets> widgets_;
    std::unique_ptr<QZModalSession> session_;
    std::chrono::milliseconds timeout_ = kTimeout;
    bool shouldActivate_ = false;
    bool suppressFurtherAlerts_ = false;
    bool withdrawn_ = false;
    bool answered_ = false;
};

/// The name of the volume holding the first of `candidateFonts` (a file URL), or a null string
/// when it lies on the system's root volume, or when it cannot be looked up (no candidate, not a
/// file URL, no such file).
QString getNonRootVolumeNameForFonts(CFArrayRef candidateFonts);
