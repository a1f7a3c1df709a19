// QZFontDownloadConfirmation: asks whether the fonts a requesting application asked for may be
// downloaded (message id 2). The alert names the application, the font when only one display
// name is concerned, and the total download size; Skip (the default) or Download answer it.
//
// Construction also works out each requested font's display name in the user's preferred
// languages (localizedFontNamesDict, used by the download window) and the download size, counted
// once per downloadable asset. A display name too long for the alert's width is elided there, the
// full name in the texts' tooltip and accessible description. The confirmation is valid only when
// there is something to download.
//
// While it exists it watches the requesting application's process: when that process ends, the
// running alert of this confirmation is withdrawn (answered no), whatever other alert may be
// running above it, and requestingApplicationTerminated is emitted.
//
// Main thread only.
#pragma once

#include <QMessageBox>
#include <QString>
#include <QStringList>
#include <cstdint>
#include <memory>
#include <sys/types.h>

#include "cfutil/TCFRetained.h"
#include "platform/CFArray.h"
#include "platform/CFDictionary.h"

class QZModalSession;
class QZProcessWatch;

class QZFontDownloadConfirmation : public QMessageBox {
    Q_OBJECT

public:
    static constexpr int kDownloadTag = 2000;
    static constexpr int kSkipTag = 2001;

    /// Reads the request `properties` (may be null: every key absent), builds the alert and
    /// starts watching the requesting process. Does not retain `properties`.
    explicit QZFontDownloadConfirmation(CFDictionaryRef properties, QWidget* parent = nullptr);
    ~QZFontDownloadConfirmation() override;

    /// True when the download size is greater than 0.
    bool valid() const { return valid_; }
    void setValid(bool valid) { valid_ = valid; }
    /// Brings the alert to the front and runs it modally until it is answered or withdrawn; sets
    /// shouldDownload and suppressFurtherAlerts. When the requesting application has already
    /// ended, answers no without showing anything.
    void showAlert();
    /// Ends this confirmation's running alert with the abort response (answered no); nothing
    /// when it is not running.
    void withdraw();

    /// True when the user chose Download.
    bool shouldDownload() const { return shouldDownload_; }
    void setShouldDownload(bool flag) { shouldDownload_ = flag; }
    /// Always false: this alert has no suppression checkbox.
    bool suppressFurtherAlerts() const { return suppressFurtherAlerts_; }
    void setSuppressFurtherAlerts(bool flag) { suppressFurtherAlerts_ = flag; }
    /// PostScript name to display name, one entry per requested font that has both. Does not
    /// retain: valid while the confirmation lives (retain it to keep it longer).
    CFDictionaryRef localizedFontNamesDict() const { return localizedFontNamesDict_; }
    /// Retains `names` (may be null) and releases the previous dictionary.
    void setLocalizedFontNamesDict(CFDictionaryRef names);

    /// The requesting application's process id (0: none).
    pid_t targetAppPID() const { return targetAppPID_; }
    /// Stores `pid` and watches that process instead of the previous one (0 or below: none).
    void setTargetAppPID(pid_t pid);

    /// The application name shown.
    QString applicationName() const { return applicationName_; }
    /// The download size in bytes, each asset counted once.
    uint64_t totalDownloadSize() const { return totalDownloadSize_; }
    /// The button that answers `tag`, or null.
    QAbstractButton* buttonWithTag(int tag) const;

    /// The display name of the font described by `fontAttributes` (a request's font attribute
    /// dictionary) for the user's `languages`, most preferred first: a localised family name,
    /// else its family name, else its PostScript name; empty when it has none of them.
    /// `catalogAttributes` (may be null) is what the catalog says of the same font: its localised
    /// and family names stand in for those the request does not give. For each language in turn
    /// (as given and with its likely script: zh-TW is also read as zh-Hant-TW), the localised name
    /// under the longest key that is a prefix of it wins, the request's before the catalog's; the
    /// first language with one decides.
    static QString DisplayName(CFDictionaryRef fontAttributes, const QStringList& languages,
                               CFDictionaryRef catalogAttributes = nullptr);
    /// PostScript name to display name (DisplayName for QZPreferredLanguages()) for each element
    /// of `fonts` (font attribute dictionaries) that has a PostScript name; `assets` (may be null)
    /// is the catalog's answer for `fonts` (QZCopyDownloadableFontAttributesForRequests). A later
    /// font with the same PostScript name replaces the earlier entry. Returns a new dictionary;
    /// the caller releases it.
    static CFDictionaryRef CreateDisplayNames(CFArrayRef fonts, CFArrayRef assets);

signals:
    /// The requesting application ended while this confirmation existed.
    void requestingApplicationTerminated();

private:
    /// The headline and the detail; `onlyName` is the one display name concerned, or empty.
    void SetTexts(const QString& onlyName);
    /// Skip (the default) and Download, each ending the question with its tag.
    void AddButtons();
    /// The process watch's report: withdraws the alert when `pid` is the requesting application.
    void anApplicationDidTerminate(pid_t pid);

    bool shouldDownload_ = false;
    bool suppressFurtherAlerts_ = false;
    bool valid_ = false;
    bool targetTerminated_ = false;
    TCFRetained<CFDictionaryRef> localizedFontNamesDict_;
    pid_t targetAppPID_ = 0;
    QString applicationName_;
    uint64_t totalDownloadSize_ = 0;
    QAbstractButton* skipButton_ = nullptr;
    QAbstractButton* downloadButton_ = nullptr;
    std::unique_ptr<QZProcessWatch> watch_;
    std::unique_ptr<QZModalSession> session_;
};
