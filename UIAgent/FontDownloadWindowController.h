// FontDownloadWindowController: the progress window of a font download (message id 2, after the
// user agreed). Loading its window starts the font matching
// (QZMatchFontDescriptorsWithProgressHandler) for the descriptors it was made with; the matching's
// progress callbacks, which arrive on the matching's worker thread, become a status line, a size
// line ("757 kB of 1.5 MB") and a progress bar in bytes, and an alert when a font fails ("Continue
// Download" or "Cancel"). The window stays above other windows and ends when the matching finishes,
// when the user presses Cancel (the transfer in flight is aborted), when a failure is answered with
// Cancel, or when the requesting application goes away. `matches` then holds the matched fonts, if
// the matching finished.
//
// Threads. Every change of the window is made on the main thread: the callback hands it over
// with a blocking queued call, so that changes keep the callbacks' order. The callback shares
// with the controller only a small link object (shared ownership): an atomic "ended" flag, the
// two byte sizes as atomics, and the cancel handler, published once. The worker never touches the
// controller itself; the hand-offs look the controller up on the main thread, where it may
// already be gone. So the main thread never waits for the worker, the controller may be
// destroyed whenever its owner is done with it, and once the window has ended every later
// callback answers false (stop) without a trip to the main thread.
//
// Main thread only, but for the callback.
#pragma once

#include <QObject>
#include <QPointer>
#include <QString>
#include <QTimer>
#include <functional>
#include <memory>

#include "cfutil/TCFRetained.h"
#include "desktop/QZFontService.h"
#include "platform/CFArray.h"
#include "platform/CFDictionary.h"

class QDialog;
class QLabel;
class QMessageBox;
class QProgressBar;
class QPushButton;
class QZModalSession;

namespace Ui {
class FontDownloadWindow;
}

class FontDownloadWindowController : public QObject {
    Q_OBJECT

public:
    /// Responses of the failure alert's buttons, in the order they are added.
    static constexpr int kContinueDownloadResponse = 1000;
    static constexpr int kCancelResponse = 1001;
    /// How often the size line is refreshed while a download runs, in milliseconds.
    static constexpr int kRefreshIntervalMs = 500;

    /// A controller for `descriptors` (an array of font attribute dictionaries; retained). The
    /// window is not loaded yet.
    explicit FontDownloadWindowController(CFArrayRef descriptors, QObject* parent = nullptr);
    /// Ends the window if it has not ended (the transfer in flight is aborted) and releases
    /// everything; a matching still running finds the window gone and stops at its next callback.
    ~FontDownloadWindowController() override;

    /// PostScript name to display name (may be null: no confirmation was shown). Retains it.
    /// Set before the window is loaded.
    void setLocalizedFontNamesDict(CFDictionaryRef names);
    CFDictionaryRef localizedFontNamesDict() const { return localizedFontNamesDict_; }
    /// The descriptors given at construction. Does not retain.
    CFArrayRef descriptors() const { return descriptors_; }

    /// The window; the first call loads it (windowDidLoad), which starts the matching.
    QDialog* window();
    /// Runs the window modally (loading it first when needed) until it ends; returns the code it
    /// ended with: kQZModalResponseStop (finished or Cancel), kQZModalResponseAbort (a failure
    /// answered with Cancel, or the requesting application went away). Returns at once when the
    /// window ended before the run began.
    int runModal();
    /// True once the window has ended, by whatever path.
    bool hasEnded() const { return ended_; }

    /// The matched fonts (font attribute dictionaries) when the matching finished, else null.
    /// Does not retain.
    CFArrayRef matches() const { return matches_; }

    /// Puts `status` into the main status line.
    void setMainStatus(const QString& status);
    /// The display name of the first descriptor named by `progressParameter`: its entry in the
    /// display-name dictionary, else its PostScript name; a null string when the dictionary names
    /// no descriptor with a PostScript name.
    QString fontNameFromProgressParameter(CFDictionaryRef progressParameter) const;
    /// The bar in bytes (main thread, handed over by the callback). A total beyond the bar's int
    /// range scales both down alike; a total of 0 (or NaN, or negative) leaves the bar empty.
    void setProgress(double downloaded, double total);
    /// Refreshes the size line from the last reported sizes.
    void periodicUpdateTimeFired();
    /// The Cancel button's action, also run when the matching finishes: ends the window (run
    /// answered kQZModalResponseStop) and cancels the transfer in flight.
    void cancelButtonPressed();
    /// The requesting application went away (or its client did): ends the window's own run with
    /// kQZModalResponseAbort, whatever modal run may be up above it, and stops the matching.
    void requestingApplicationTerminated();

    /// Outlets of the window; null until it is loaded.
    QPushButton* cancelButton() const;
    QLabel* mainStatusTextField() const;
    QLabel* minorStatusTextField() const;
    QProgressBar* progressIndicator() const;
    /// The size-line refresh timer while it runs (a child of the window named "refreshTimer"),
    /// else null.
    QTimer* refreshTimer() const { return refreshTimer_; }
    /// The failure alert while it is up, else null.
    QMessageBox* errorAlert() const { return errorAlert_; }

    /// Whether the download may begin: the network check with its offline alert (QZNetworkCheck).
    static bool continueDownloadWithNetworkReachabilityCheck();

    /// Matchings started by controllers whose last callback has not returned yet (or whose
    /// controller still exists).
    static int MatchingRunsInProgress();

signals:
    /// The main status line changed to `status`.
    void mainStatusChanged(const QString& status);

private:
    struct Link;

    /// Sets up the loaded window and starts the matching.
    void windowDidLoad();
    /// Ends the window once: marks the link, stops the refresh timer, ends a failure alert that is
    /// up, hides the window and ends its own modal run with `code`. With `cancelTransfer`, also
    /// calls the matching's cancel handler.
    void endWindow(int code, bool cancelTransfer);
    /// Main thread, from the callback: the first size line and the refresh timer.
    void startRefreshTimer();
    /// Main thread, from the callback: stores the result and ends the window.
    void matchingDidFinish(CFArrayRef result);
    /// Main thread, from the callback: the failure alert for `error`; its response, or 0 when it
    /// could not be shown.
    int runErrorAlert(CFTypeRef error);

    TCFRetained<CFArrayRef> descriptors_;
    TCFRetained<CFArrayRef> matches_;
    TCFRetained<CFDictionaryRef> localizedFontNamesDict_;
    std::shared_ptr<Link> link_;
    std::unique_ptr<QDialog> window_;
    std::unique_ptr<Ui::FontDownloadWindow> ui_;
    std::unique_ptr<QZModalSession> session_;
    QPointer<QTimer> refreshTimer_;
    QMessageBox* errorAlert_ = nullptr;
    QZModalSession* errorSession_ = nullptr;
    bool ended_ = false;
    int endCode_ = 0;
};
