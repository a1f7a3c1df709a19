#include "UIAgent/FontDownloadWindowController.h"

#include <QCoreApplication>
#include <QDialog>
#include <QLabel>
#include <QLayout>
#include <QLocale>
#include <QMessageBox>
#include <QProgressBar>
#include <QPushButton>
#include <QThread>
#include <QTimer>
#include <algorithm>
#include <atomic>
#include <climits>
#include <cmath>
#include <limits>
#include <mutex>
#include <utility>

#include "UIAgent/AgentTesting.h"
#include "UIAgent/QZDictionaryValue.h"
#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZModalSession.h"
#include "UIAgent/QZNetworkCheck.h"
#include "desktop/QZCancelDownloadHandler.h"
#include "desktop/QZQtStrings.h"
#include "platform/CFError.h"
#include "platform/CFNumber.h"
#include "protocol/QZUIProtocol.h"
#include "ui_FontDownloadWindow.h"

namespace {

std::atomic<int> gLinksAlive{0};
/// The widest a word of the failure alert may be, in pixels.
constexpr int kMaxWordWidth = 320;

std::mutex& TapMutex() {
    static std::mutex mutex;
    return mutex;
}

QZDownloadProgressTap& Tap() {
    static QZDownloadProgressTap tap;
    return tap;
}

/// A progress size: the number under `key` as a 64-bit float; 0.0 when absent.
double SizeValue(CFDictionaryRef progress, CFStringRef key) {
    double size = 0.0;
    if (const auto number = QZGetTypedValue<CFNumberRef>(progress, key))
        CFNumberGetValue(number, kCFNumberFloat64Type, &size);
    return size;
}

/// A reported size as a byte count: truncated toward zero; NaN, negative and infinite sizes
/// count as 0, sizes beyond the largest count as the largest.
qint64 ByteCount(double size) {
    if (!(size > 0.0))
        return 0;
    if (size >= 9.2e18)
        return std::numeric_limits<qint64>::max();
    return static_cast<qint64>(size);
}

/// The display name of the first descriptor of `progress` by the rule of
/// fontNameFromProgressParameter.
QString DisplayName(CFDictionaryRef names, CFDictionaryRef progress) {
    const auto descriptors =
        QZGetTypedValue<CFArrayRef>(progress, kCTFontDescriptorMatchingDescriptors);
    if (!descriptors || CFArrayGetCount(descriptors) == 0)
        return QString();
    const auto postScriptName = QZGetTypedValue<CFStringRef>(
        QZGetTypedElement<CFDictionaryRef>(descriptors, 0), NSFontNameAttribute);
    const QString fallback = QZQString(postScriptName);
    if (fallback.isEmpty())
        return QString();
    const QString name = QZQString(QZGetTypedValue<CFStringRef>(names, postScriptName));
    return name.isEmpty() ? fallback : name;
}

/// Fills the failure alert for `error`: its description (else its domain and code) as the
/// headline, its failure reason as the detail, then "Continue Download" (the default) and
/// "Cancel" (also Escape). A word too wide for the alert (a long font name) is elided, the full
/// texts in the tooltip and accessible description. Returns the two buttons.
std::pair<QPushButton*, QPushButton*> SetUpErrorAlert(QMessageBox& alert, CFTypeRef error) {
    const auto errorRef = QZAsKind<CFErrorRef>(error);
    TCFRetained<CFDictionaryRef> userInfo(errorRef ? CFErrorCopyUserInfo(errorRef) : nullptr,
                                          kAdopted);
    QString description =
        QZQString(QZGetTypedValue<CFStringRef>(userInfo, kCFErrorLocalizedDescriptionKey));
    if (description.isEmpty() && errorRef)
        description =
            QZLocalizedFormat("QZ_ERROR_DOMAIN_CODE", {QZQString(CFErrorGetDomain(errorRef)),
                                                       QString::number(CFErrorGetCode(errorRef))});
    const QString reason =
        QZQString(QZGetTypedValue<CFStringRef>(userInfo, kCFErrorLocalizedFailureReasonKey));

    alert.setWindowTitle(QZLocalizedString("QZ_DOWNLOAD_ERROR_TITLE"));
    alert.setWindowFlag(Qt::WindowStaysOnTopHint);
    alert.setIcon(QMessageBox::Warning);
    alert.setTextFormat(Qt::PlainText);
    const QFontMetrics metrics = alert.fontMetrics();
    alert.setText(QZElideLongWords(description, metrics, kMaxWordWidth));
    if (!reason.isEmpty())
        alert.setInformativeText(QZElideLongWords(reason, metrics, kMaxWordWidth));
    // Each label whose text was shortened tells its full text (the reason names the font too).
    for (const auto& [name, full] : {std::pair{"qt_msgbox_label", description},
                                     std::pair{"qt_msgbox_informativelabel", reason}})
        if (auto* label = alert.findChild<QLabel*>(QLatin1String(name));
            label && label->text() != full) {
            label->setToolTip(full);
            label->setAccessibleDescription(full);
        }
    QPushButton* proceed =
        alert.addButton(QZLocalizedString("Continue Download"), QMessageBox::AcceptRole);
    QPushButton* cancel = alert.addButton(QZLocalizedString("Cancel"), QMessageBox::RejectRole);
    alert.setDefaultButton(proceed);
    alert.setEscapeButton(cancel);
    return {proceed, cancel};
}

} // namespace

/// What the progress callback shares with the controller; see the header comment.
struct FontDownloadWindowController::Link : std::enable_shared_from_this<Link> {
    explicit Link(FontDownloadWindowController* owner) : controller(owner) { ++gLinksAlive; }
    ~Link() {
        if (const void* handler = stopHandler.load())
            CFRelease(handler);
        --gLinksAlive;
    }
    Link(const Link&) = delete;
    Link& operator=(const Link&) = delete;

    /// Set once the window has ended: every later callback answers false at once.
    std::atomic<bool> didCancel{false};
    std::atomic<double> currentDownloadedSize{0.0};
    std::atomic<double> totalDownloadSize{0.0};
    /// The matching's cancel handler (retained), published once.
    std::atomic<const void*> stopHandler{nullptr};

    /// Main thread only: the controller, null once it is destroyed.
    FontDownloadWindowController* controller;

    // Written before the matching starts, then read by the callback only.
    TCFRetained<CFDictionaryRef> names;
    QZDownloadProgressTap tap;

    // The callback's own: one call at a time.
    bool timerRequested = false;
    QString lastStatus;

    /// The progress callback.
    bool Progress(QZFontDescriptorMatchingState state, CFDictionaryRef progress);

    /// Calls the cancel handler, when one was published.
    void InvokeStopHandler() const { QZCancelDownloadHandlerInvoke(stopHandler.load()); }

    /// Runs `work` with the controller on the main thread and waits for it; nothing when the
    /// controller is gone by then.
    template <class Work> void OnMainThread(Work&& work) {
        QCoreApplication* application = QCoreApplication::instance();
        if (!application)
            return;
        std::shared_ptr<Link> self = shared_from_this();
        auto run = [self, &work] {
            if (self->controller)
                work(*self->controller);
        };
        // The matching never calls from the main thread; a blocking call to oneself would hang.
        if (QThread::currentThread() == application->thread())
            run();
        else
            QMetaObject::invokeMethod(application, run, Qt::BlockingQueuedConnection);
    }

    /// Hands `status` over when it differs from the last one.
    void SetStatus(const QString& status) {
        if (status == lastStatus)
            return;
        lastStatus = status;
        OnMainThread(
            [&status](FontDownloadWindowController& window) { window.setMainStatus(status); });
    }

    bool Downloading(CFDictionaryRef progress);
    bool Failed(CFDictionaryRef progress);
};

bool FontDownloadWindowController::Link::Progress(QZFontDescriptorMatchingState state,
                                                  CFDictionaryRef progress) {
    if (tap)
        tap(state, progress);
    if (didCancel.load())
        return false;
    if (!stopHandler.load()) {
        const void* handler =
            progress
                ? CFDictionaryGetValue(progress, kCTFontDescriptorMatchingCancelDownloadHandler)
                : nullptr;
        if (handler && CFGetTypeID(handler) == QZCancelDownloadHandlerGetTypeID()) {
            CFRetain(handler);
            const void* none = nullptr;
            if (!stopHandler.compare_exchange_strong(none, handler))
                CFRelease(handler);
        }
    }

    switch (state) {
    case kCTFontDescriptorMatchingDidFinish: {
        TCFRetained<CFArrayRef> result(
            QZGetTypedValue<CFArrayRef>(progress, kCTFontDescriptorMatchingResult));
        OnMainThread(
            [&result](FontDownloadWindowController& window) { window.matchingDidFinish(result); });
        return true;
    }
    case kCTFontDescriptorMatchingWillBeginQuerying: {
        const QString name = DisplayName(names, progress);
        SetStatus(name.isNull() ? QZLocalizedString("QZ_PREPARING_TO_DOWNLOAD")
                                : QZLocalizedFormat("QZ_PREPARING_TO_DOWNLOAD_FONT", {name}));
        return true;
    }
    case kCTFontDescriptorMatchingWillBeginDownloading:
    case kCTFontDescriptorMatchingDownloading:
    case kCTFontDescriptorMatchingDidFinishDownloading:
        return Downloading(progress);
    case kCTFontDescriptorMatchingDidFailWithError:
        return Failed(progress);
    default:
        return true;
    }
}

bool FontDownloadWindowController::Link::Downloading(CFDictionaryRef progress) {
    const QString name = DisplayName(names, progress);
    const QString status = name.isNull() ? QZLocalizedString("QZ_DOWNLOADING_FONTS")
                                         : QZLocalizedFormat("QZ_DOWNLOADING_FONT", {name});
    const bool statusChanged = status != lastStatus;
    lastStatus = status;

    const double downloaded = SizeValue(progress, kCTFontDescriptorMatchingTotalDownloadedSize);
    const double total = SizeValue(progress, kCTFontDescriptorMatchingTotalAssetSize);
    // A NaN never equals anything, so it always counts as a change.
    const bool sizesChanged =
        !(downloaded == currentDownloadedSize.load()) || !(total == totalDownloadSize.load());
    if (sizesChanged) {
        currentDownloadedSize.store(downloaded);
        totalDownloadSize.store(total);
    }
    const bool startTimer = !timerRequested && totalDownloadSize.load() > 0.0;
    if (startTimer)
        timerRequested = true;

    // One trip to the main thread for all that changed, in the order status, bar, size line.
    if (statusChanged || sizesChanged || startTimer)
        OnMainThread([&](FontDownloadWindowController& window) {
            if (statusChanged)
                window.setMainStatus(status);
            if (sizesChanged)
                window.setProgress(downloaded, total);
            if (startTimer)
                window.startRefreshTimer();
        });
    return true;
}

bool FontDownloadWindowController::Link::Failed(CFDictionaryRef progress) {
    TCFRetained<CFTypeRef> error(
        QZGetTypedValue<CFErrorRef>(progress, kCTFontDescriptorMatchingError));
    int response = 0;
    OnMainThread(
        [&](FontDownloadWindowController& window) { response = window.runErrorAlert(error); });
    if (response != kCancelResponse)
        return true;
    didCancel.store(true);
    OnMainThread([](FontDownloadWindowController& window) {
        window.endWindow(kQZModalResponseAbort, false);
    });
    return false;
}

/// A fixed size, so that tiling compositors float the window rather than tile it: the designed
/// width, and the height of the contents with room for a second line of status.
static void FixWindowSize(QDialog& window) {
    int height = window.sizeHint().height();
    if (QLayout* layout = window.layout(); layout && layout->hasHeightForWidth())
        height = layout->totalHeightForWidth(window.minimumWidth());
    height += window.fontMetrics().lineSpacing();
    window.setFixedSize(std::max(window.minimumWidth(), window.sizeHint().width()), height);
}

FontDownloadWindowController::FontDownloadWindowController(CFArrayRef descriptors, QObject* parent)
    : QObject(parent), descriptors_(descriptors), link_(std::make_shared<Link>(this)) {}

FontDownloadWindowController::~FontDownloadWindowController() {
    endWindow(kQZModalResponseAbort, true);
    link_->controller = nullptr;
    session_.reset();
    window_.reset();
}

void FontDownloadWindowController::setLocalizedFontNamesDict(CFDictionaryRef names) {
    localizedFontNamesDict_ = TCFRetained<CFDictionaryRef>(names);
}

QDialog* FontDownloadWindowController::window() {
    if (!window_) {
        window_ = std::make_unique<QDialog>();
        ui_ = std::make_unique<Ui::FontDownloadWindow>();
        ui_->setupUi(window_.get());
        windowDidLoad();
    }
    return window_.get();
}

void FontDownloadWindowController::windowDidLoad() {
    QDialog& window = *window_;
    // Above other windows, like a panel of the system; closing it is the same as Cancel.
    window.setWindowFlags(Qt::Dialog | Qt::CustomizeWindowHint | Qt::WindowTitleHint |
                          Qt::WindowCloseButtonHint | Qt::WindowStaysOnTopHint);
    window.setWindowTitle(QZLocalizedString("QZ_DOWNLOAD_WINDOW_TITLE"));
    // Scripts and window rules find the window by its role, whatever the language.
    window.setWindowRole(QStringLiteral("FontDownloadWindow"));
    ui_->cancelButton->setText(QZLocalizedString("Cancel"));
    connect(ui_->cancelButton, &QPushButton::clicked, this,
            &FontDownloadWindowController::cancelButtonPressed);
    connect(&window, &QDialog::rejected, this, &FontDownloadWindowController::cancelButtonPressed);

    ui_->progressIndicator->setRange(0, 100);
    ui_->progressIndicator->setValue(0);
    setMainStatus(QZLocalizedString("QZ_PREPARING_TO_DOWNLOAD"));
    ui_->minorStatusTextField->clear();
    ui_->progressIndicator->setAccessibleName(QZLocalizedString("QZ_DOWNLOAD_PROGRESS_NAME"));
    FixWindowSize(window);
    session_ = std::make_unique<QZModalSession>(&window);

    if (!descriptors_ || CFArrayGetCount(descriptors_) == 0)
        return;

    // The callback reads the names without the controller: a snapshot that nobody changes.
    if (localizedFontNamesDict_)
        link_->names.Adopt(CFDictionaryCreateCopy(kCFAllocatorDefault, localizedFontNamesDict_));
    {
        std::lock_guard<std::mutex> lock(TapMutex());
        link_->tap = Tap();
    }
    std::shared_ptr<Link> link = link_;
    const bool started = QZMatchFontDescriptorsWithProgressHandler(
        descriptors_, nullptr,
        [link](QZFontDescriptorMatchingState state, CFDictionaryRef progress) {
            return link->Progress(state, progress);
        });
    // No matching means no callback that could ever end the window.
    if (!started)
        endWindow(kQZModalResponseStop, false);
}

int FontDownloadWindowController::runModal() {
    window();
    if (ended_)
        return endCode_;
    const int code = session_->Run();
    // Ended by the window system rather than by one of the window's own paths: as Cancel.
    if (!ended_)
        endWindow(code, true);
    return code;
}

void FontDownloadWindowController::endWindow(int code, bool cancelTransfer) {
    if (ended_)
        return;
    ended_ = true;
    endCode_ = code;
    link_->didCancel.store(true);
    if (refreshTimer_) {
        refreshTimer_->stop();
        refreshTimer_->deleteLater();
        refreshTimer_ = nullptr;
    }
    // A failure alert above the window belongs to it: it goes with the window.
    if (errorSession_)
        errorSession_->End(kQZModalResponseAbort);
    if (session_)
        session_->End(code);
    if (window_)
        window_->hide();
    if (cancelTransfer)
        link_->InvokeStopHandler();
}

void FontDownloadWindowController::setMainStatus(const QString& status) {
    if (!ui_)
        return;
    QLabel* label = ui_->mainStatusTextField;
    // A long font name is elided, so that it stays inside the fixed-size window; the label still
    // tells the full text.
    const QString shown = QZElideLongWords(status, label->fontMetrics(), kMaxWordWidth);
    const QString full = shown == status ? QString() : status;
    if (label->text() == shown && label->toolTip() == full)
        return;
    label->setText(shown);
    label->setToolTip(full);
    label->setAccessibleDescription(full);
    emit mainStatusChanged(status);
}

QString FontDownloadWindowController::fontNameFromProgressParameter(
    CFDictionaryRef progressParameter) const {
    return DisplayName(localizedFontNamesDict_, progressParameter);
}

void FontDownloadWindowController::setProgress(double downloaded, double total) {
    if (!ui_)
        return;
    // QProgressBar counts in int: beyond that, the bar shows the fraction done over the whole
    // int range. A total of 0 leaves the bar empty rather than turning it into a busy indicator.
    const double maximum = std::isfinite(total) && total > 0.0 ? total : 0.0;
    double value = std::isfinite(downloaded) && downloaded > 0.0 ? downloaded : 0.0;
    value = std::min(value, maximum);
    if (maximum > double(INT_MAX)) {
        ui_->progressIndicator->setRange(0, INT_MAX);
        ui_->progressIndicator->setValue(int(value / maximum * double(INT_MAX)));
        return;
    }
    ui_->progressIndicator->setRange(0, maximum > 0.0 ? int(maximum) : 1);
    ui_->progressIndicator->setValue(int(value));
}

void FontDownloadWindowController::startRefreshTimer() {
    if (ended_ || refreshTimer_)
        return;
    periodicUpdateTimeFired();
    // A child of the window, where a look at the window finds it.
    refreshTimer_ = new QTimer(window_.get());
    refreshTimer_->setObjectName(QStringLiteral("refreshTimer"));
    refreshTimer_->setTimerType(Qt::CoarseTimer);
    refreshTimer_->setInterval(kRefreshIntervalMs);
    connect(refreshTimer_, &QTimer::timeout, this,
            &FontDownloadWindowController::periodicUpdateTimeFired);
    refreshTimer_->start();
}

void FontDownloadWindowController::periodicUpdateTimeFired() {
    if (!ui_)
        return;
    const QString current = QZFormattedByteCount(ByteCount(link_->currentDownloadedSize.load()));
    const QString total = QZFormattedByteCount(ByteCount(link_->totalDownloadSize.load()));
    ui_->minorStatusTextField->setText(QZLocalizedFormat("%1$@ of %2$@", {current, total}));
}

void FontDownloadWindowController::cancelButtonPressed() {
    endWindow(kQZModalResponseStop, true);
}

void FontDownloadWindowController::requestingApplicationTerminated() {
    endWindow(kQZModalResponseAbort, true);
}

void FontDownloadWindowController::matchingDidFinish(CFArrayRef result) {
    if (ended_)
        return;
    matches_ = TCFRetained<CFArrayRef>(result);
    endWindow(kQZModalResponseStop, true);
}

int FontDownloadWindowController::runErrorAlert(CFTypeRef error) {
    if (ended_)
        return 0;
    struct Clear {
        FontDownloadWindowController* owner;
        ~Clear() {
            owner->errorAlert_ = nullptr;
            owner->errorSession_ = nullptr;
        }
    };
    try {
        // A child of the window, so that it stays above it.
        QMessageBox alert(window_.get());
        const auto [proceed, cancel] = SetUpErrorAlert(alert, error);
        QZModalSession session(&alert, QZModalSession::kQuestion);
        connect(&alert, &QMessageBox::buttonClicked, &alert,
                [&session, proceed, cancel](QAbstractButton* clicked) {
                    if (clicked == proceed)
                        session.End(kContinueDownloadResponse);
                    else if (clicked == cancel)
                        session.End(kCancelResponse);
                });
        Clear clear{this};
        errorAlert_ = &alert;
        errorSession_ = &session;
        const int response = session.Run();
        // Closed with the window's close button: as Cancel, never as a silent go-on.
        return response == kQZModalResponseCancel ? kCancelResponse : response;
    } catch (...) {
        // Nothing more can be asked: the matching stops at its next callback, and the window
        // stays until the user presses Cancel.
        link_->didCancel.store(true);
        return 0;
    }
}

QPushButton* FontDownloadWindowController::cancelButton() const {
    return ui_ ? ui_->cancelButton : nullptr;
}

QLabel* FontDownloadWindowController::mainStatusTextField() const {
    return ui_ ? ui_->mainStatusTextField : nullptr;
}

QLabel* FontDownloadWindowController::minorStatusTextField() const {
    return ui_ ? ui_->minorStatusTextField : nullptr;
}

QProgressBar* FontDownloadWindowController::progressIndicator() const {
    return ui_ ? ui_->progressIndicator : nullptr;
}

bool FontDownloadWindowController::continueDownloadWithNetworkReachabilityCheck() {
    QZNetworkCheck check;
    return check.continueDownload();
}

void QZSetDownloadProgressTapForTesting(QZDownloadProgressTap tap) {
    std::lock_guard<std::mutex> lock(TapMutex());
    Tap() = std::move(tap);
}

int FontDownloadWindowController::MatchingRunsInProgress() {
    return gLinksAlive.load();
}
