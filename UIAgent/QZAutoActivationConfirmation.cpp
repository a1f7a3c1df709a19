#include "UIAgent/QZAutoActivationConfirmation.h"

#include <QAccessible>
#include <QApplication>
#include <QCheckBox>
#include <QDialogButtonBox>
#include <QEvent>
#include <QFileInfo>
#include <QFontDatabase>
#include <QFontMetrics>
#include <QGridLayout>
#include <QLabel>
#include <QMessageBox>
#include <QPushButton>
#include <QTextBrowser>
#include <QTimer>
#include <QUrl>
#include <algorithm>
#include <iterator>
#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "UIAgent/QZAccessibility.h"
#include "UIAgent/QZDictionaryValue.h"
#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZModalSession.h"
#include "desktop/QZDesktopEntry.h"
#include "desktop/QZFileManager.h"
#include "desktop/QZQtStrings.h"
#include "desktop/QZVolumes.h"
#include "platform/CFNumber.h"
#include "protocol/QZUIProtocol.h"

// The help page is compiled into the agent's library, whose resources register only when
// something refers to them.
static void InitializeHelpResource() {
    static const bool initialized = [] {
        Q_INIT_RESOURCE(help);
        return true;
    }();
    (void)initialized;
}

namespace {

constexpr char kCountdownKey[] = "This question closes without an answer in %@.";
/// Seconds left at which the countdown is announced to screen readers.
constexpr qint64 kAnnouncedSeconds[] = {60, 30, 10};
constexpr int kIconSize = 64;
/// The widest a word (a long font or application name) may be in the alert, in pixels.
constexpr int kMaxWordWidth = 320;
/// Font files beyond this size are not loaded for the sample: it is a courtesy, not worth the
/// memory.
constexpr qint64 kMaximumSampleFontFileSize = 128 << 20;

/// A non-empty string value of `key`, else a null string.
QString GetNonEmptyString(CFDictionaryRef dictionary, CFStringRef key) {
    const QString text = QZQString(QZGetTypedValue<CFStringRef>(dictionary, key));
    return text.isEmpty() ? QString() : text;
}

/// The first element of `array` when it is a URL, else null. Does not retain.
CFURLRef FirstURL(CFArrayRef array) {
    if (!array || CFArrayGetCount(array) == 0)
        return nullptr;
    const void* first = CFArrayGetValueAtIndex(array, 0);
    return first && CFGetTypeID(first) == CFURLGetTypeID() ? static_cast<CFURLRef>(first) : nullptr;
}

/// "m:ss" for a number of seconds.
QString MinutesAndSeconds(qint64 seconds) {
    return QStringLiteral("%1:%2").arg(seconds / 60).arg(seconds % 60, 2, 10, QLatin1Char('0'));
}

} // namespace

/// The alert's widgets beyond those of QMessageBox, the timers, and the application-wide event
/// filter that restarts the timeout on user input.
struct QZAutoActivationConfirmation::Widgets : QObject {
    QZAutoActivationConfirmation* owner;
    std::vector<std::pair<QAbstractButton*, int>> buttons; ///< in the order they were added
    QPushButton* help = nullptr;
    QLabel* sample = nullptr;
    QLabel* countdown = nullptr;
    QTextBrowser* helpWindow = nullptr;
    int sampleFontId = -1;
    qint64 countdownSeconds = -1; ///< the count last shown; -1 before the first
    QTimer timeout;
    QTimer tick;

    explicit Widgets(QZAutoActivationConfirmation* confirmation) : owner(confirmation) {
        timeout.setSingleShot(true);
        // Precise, so that the countdown, read from the timer, says what will happen.
        timeout.setTimerType(Qt::PreciseTimer);
        tick.setInterval(1000);
    }

    bool eventFilter(QObject* watched, QEvent* event) override {
        switch (event->type()) {
        case QEvent::KeyPress:
        case QEvent::KeyRelease:
        case QEvent::MouseButtonPress:
        case QEvent::MouseButtonRelease:
        case QEvent::MouseButtonDblClick:
        case QEvent::MouseMove:
        case QEvent::Enter:
        case QEvent::Leave:
        case QEvent::Wheel:
        // Also what a screen reader's focus action brings.
        case QEvent::FocusIn:
            owner->restartTimeout();
            break;
        default:
            break;
        }
        return QObject::eventFilter(watched, event);
    }
};

QZAutoActivationConfirmation::QZAutoActivationConfirmation(CFDictionaryRef properties)
    : alert_(std::make_unique<QMessageBox>()), widgets_(std::make_unique<Widgets>(this)),
      session_(std::make_unique<QZModalSession>(alert_.get(), QZModalSession::kQuestion)) {
    candidateFonts_ = TCFRetained<CFArrayRef>(
        QZGetTypedValue<CFArrayRef>(properties, kQZUIPropertyCandidateFontURLs));
    request_ = TCFRetained<CFDictionaryRef>(
        QZGetTypedValue<CFDictionaryRef>(properties, kQZUIPropertyRequestDictionary));
    applicationURL_ =
        TCFRetained<CFURLRef>(QZGetTypedValue<CFURLRef>(properties, kQZUIPropertyBundleURL));

    applicationName_ = GetNonEmptyString(properties, kQZUIPropertyApplicationName);
    if (applicationName_.isEmpty())
        applicationName_ = QZApplicationName(applicationURL_);
    if (applicationName_.isEmpty())
        applicationName_ = QZLocalizedString("QZ_CURRENT_APPLICATION");

    fontName_ = GetNonEmptyString(properties, kQZUIPropertyFontName);
    for (CFStringRef key :
         {NSFontNameAttribute, NSFontVisibleNameAttribute, NSFontFamilyAttribute}) {
        if (!fontName_.isEmpty())
            break;
        fontName_ = GetNonEmptyString(request_, key);
    }
    if (fontName_.isEmpty()) {
        if (CFURLRef first = FirstURL(candidateFonts_)) {
            TCFRetained<CFURLRef> absolute(CFURLCopyAbsoluteURL(first), kAdopted);
            TCFRetained<CFStringRef> component(
                absolute ? CFURLCopyLastPathComponent(absolute) : nullptr, kAdopted);
            fontName_ = QZQString(component);
            // The file's name as the file system has it, not as the URL escapes it.
            if (const QString path = QZFilePathOfURL(first); !path.isEmpty())
                fontName_ = QFileInfo(path).fileName();
        }
    }

    volumeName_ = getNonRootVolumeNameForFonts(candidateFonts_);

    QObject::connect(&widgets_->timeout, &QTimer::timeout, widgets_.get(),
                     [this] { session_->End(kQZModalResponseAbort); });
    QObject::connect(&widgets_->tick, &QTimer::timeout, widgets_.get(),
                     [this] { updateCountdown(); });
    setupAlert();
}

QZAutoActivationConfirmation::~QZAutoActivationConfirmation() {
    if (QCoreApplication* application = QApplication::instance())
        application->removeEventFilter(widgets_.get());
    session_.reset();
    const int sampleFontId = widgets_->sampleFontId;
    widgets_.reset();
    alert_.reset();
    // The sample's face was loaded for this alert alone.
    if (sampleFontId >= 0)
        QFontDatabase::removeApplicationFont(sampleFontId);
}

void QZAutoActivationConfirmation::setupAlert() {
    QMessageBox* alert = alert_.get();
    alert->setWindowTitle(QZLocalizedString("QZ_AUTO_ACTIVATION_TITLE"));
    const QIcon icon = QZApplicationIcon(applicationURL_);
    if (!icon.isNull())
        alert->setIconPixmap(icon.pixmap(kIconSize, kIconSize));
    else
        alert->setIcon(QMessageBox::Question);

    // Names come from outside: never read them as markup.
    alert->setTextFormat(Qt::PlainText);
    const QString headline =
        volumeName_.isEmpty() ? QZLocalizedFormat("QZ_HEADLINE_FONT", {applicationName_, fontName_})
                              : QZLocalizedFormat("QZ_HEADLINE_FONT_VOLUME",
                                                  {applicationName_, fontName_, volumeName_});
    // A long name would widen the alert: its texts show it elided, and tell it in full.
    const QFontMetrics metrics = alert->fontMetrics();
    alert->setText(QZElideLongWords(headline, metrics, kMaxWordWidth));
    if (auto* label = alert->findChild<QLabel*>(QStringLiteral("qt_msgbox_label"));
        label && label->text() != headline) {
        label->setToolTip(headline);
        label->setAccessibleDescription(headline);
    }
    alert->setInformativeText(QZLocalizedString("QZ_DETAIL_FONT_NOT_INSTALLED"));

    addAnswerButtons();
    const QString checkBoxText =
        QZLocalizedFormat("QZ_DO_NOT_WARN_APPLICATION", {applicationName_});
    auto* checkBox = new QCheckBox(QZElideLongWords(checkBoxText, metrics, kMaxWordWidth));
    if (checkBox->text() != checkBoxText) {
        checkBox->setToolTip(checkBoxText);
        checkBox->setAccessibleDescription(checkBoxText);
    }
    alert->setCheckBox(checkBox);
    // A screen reader's toggle reaches the box without any key or mouse input.
    QObject::connect(alert->checkBox(), &QCheckBox::toggled, widgets_.get(),
                     [this] { restartTimeout(); });
    addHelpButton();
    addFontSample();

    QZInstallAccessibilityFactory();
    // Named before it has a parent: assistive technologies may ask about it from then on, and
    // the answer is kept.
    widgets_->countdown = new QLabel;
    widgets_->countdown->setObjectName(QLatin1String(kQZStatusRegionObjectName));
    widgets_->countdown->setParent(alert);
    widgets_->countdown->setTextFormat(Qt::PlainText);
    updateCountdown();

    arrangeExtraWidgets();
}

void QZAutoActivationConfirmation::addAnswerButtons() {
    QMessageBox* alert = alert_.get();
    const std::tuple<const char*, int, QMessageBox::ButtonRole> buttons[] = {
        {"QZ_BUTTON_ALLOW", kAllowTag, QMessageBox::AcceptRole},
        {"QZ_BUTTON_DISALLOW", kDisallowTag, QMessageBox::RejectRole},
        {"QZ_BUTTON_SHOW_IN_FINDER", kShowInFileManagerTag, QMessageBox::ActionRole},
    };
    for (const auto& [key, tag, role] : buttons) {
        QPushButton* button = alert->addButton(QZLocalizedString(key), role);
        widgets_->buttons.emplace_back(button, tag);
    }
    alert->setDefaultButton(static_cast<QPushButton*>(widgets_->buttons.front().first));
    alert->setEscapeButton(buttonWithTag(kDisallowTag));
    // A button ends the question with its tag; the box would also close itself, and the session
    // would take that for a cancel if the tag did not come first.
    QObject::connect(alert, &QMessageBox::buttonClicked, widgets_.get(),
                     [this](QAbstractButton* clicked) {
                         for (const auto& [button, tag] : widgets_->buttons)
                             if (button == clicked)
                                 session_->End(tag);
                     });
}

void QZAutoActivationConfirmation::addHelpButton() {
    // The help button must not end the question, but every button of a message box closes it:
    // this one is cut off from the box's handling and opens the help itself. A button of our own
    // rather than the standard Help button, which carries an icon none of the others has.
    widgets_->help = alert_->addButton(QZLocalizedString("Help"), QMessageBox::HelpRole);
    if (auto* box = alert_->findChild<QDialogButtonBox*>())
        QObject::disconnect(widgets_->help, &QAbstractButton::clicked, box, nullptr);
    QObject::connect(widgets_->help, &QAbstractButton::clicked, widgets_.get(),
                     [this] { showHelp(); });
    // Pressed through the accessibility bus, it gets no key or mouse input: it counts all the same.
    QObject::connect(widgets_->help, &QAbstractButton::pressed, widgets_.get(),
                     [this] { restartTimeout(); });
}

void QZAutoActivationConfirmation::addFontSample() {
    // The font's name in its own face, from the candidate file, for display only.
    const QString fontPath = QZFilePathOfURL(FirstURL(candidateFonts_));
    const QFileInfo file(fontPath);
    if (fontPath.isEmpty() || !file.isFile() || file.size() > kMaximumSampleFontFileSize)
        return;
    const int id = QFontDatabase::addApplicationFont(fontPath);
    const QStringList families = QFontDatabase::applicationFontFamilies(id);
    if (id < 0 || families.isEmpty()) {
        if (id >= 0)
            QFontDatabase::removeApplicationFont(id);
        return;
    }
    widgets_->sampleFontId = id;
    QFont face(families.contains(fontName_) ? fontName_ : families.first());
    face.setPointSizeF(alert_->font().pointSizeF() * 1.6);
    widgets_->sample = new QLabel(
        QFontMetrics(face).elidedText(fontName_, Qt::ElideRight, kMaxWordWidth), alert_.get());
    widgets_->sample->setTextFormat(Qt::PlainText);
    widgets_->sample->setFont(face);
    if (widgets_->sample->text() != fontName_)
        widgets_->sample->setToolTip(fontName_);
    widgets_->sample->setAccessibleName(fontName_);
}

/// Places the font sample above the checkbox and the countdown below it, the buttons last.
/// QMessageBox builds its grid once its contents are set, and nothing here changes them later.
void QZAutoActivationConfirmation::arrangeExtraWidgets() {
    auto* grid = qobject_cast<QGridLayout*>(alert_->layout());
    auto* box = alert_->findChild<QDialogButtonBox*>();
    QCheckBox* checkBox = alert_->checkBox();
    if (!grid || !box || !checkBox || grid->indexOf(checkBox) < 0) {
        // An unexpected layout: keep it, and add the extras at the end.
        if (auto* layout = alert_->layout()) {
            if (widgets_->sample)
                layout->addWidget(widgets_->sample);
            layout->addWidget(widgets_->countdown);
        }
        return;
    }
    int row = 0, column = 0, rowSpan = 0, columnSpan = 0;
    grid->getItemPosition(grid->indexOf(checkBox), &row, &column, &rowSpan, &columnSpan);
    const int columns = grid->columnCount();
    grid->removeWidget(checkBox);
    grid->removeWidget(box);
    row = grid->rowCount();
    if (widgets_->sample)
        grid->addWidget(widgets_->sample, row++, column, 1, 1);
    grid->addWidget(checkBox, row++, column, 1, 1, Qt::AlignLeft);
    grid->addWidget(widgets_->countdown, row++, column, 1, 1);
    grid->addWidget(box, row, 0, 1, columns);
}

void QZAutoActivationConfirmation::showAlert() {
    if (answered_)
        return;
    if (withdrawn_) {
        shouldActivate_ = false;
        suppressFurtherAlerts_ = suppressionCheckBox()->isChecked();
        answered_ = true;
        return;
    }
    QApplication::instance()->installEventFilter(widgets_.get());
    for (;;) {
        widgets_->timeout.start(timeout_);
        widgets_->tick.start();
        updateCountdown();
        const int response = session_->Run();
        // Nothing of this showing stays pending once it is over.
        widgets_->timeout.stop();
        widgets_->tick.stop();
        if (response == kShowInFileManagerTag)
            showCandidatesInFinder();
        const bool answered = response == kAllowTag || response == kDisallowTag ||
                              response == kQZModalResponseAbort ||
                              response == kQZModalResponseCancel;
        if (answered || withdrawn_) {
            shouldActivate_ = response == kAllowTag && !withdrawn_;
            suppressFurtherAlerts_ = suppressionCheckBox()->isChecked();
            break;
        }
    }
    QApplication::instance()->removeEventFilter(widgets_.get());
    if (widgets_->helpWindow)
        widgets_->helpWindow->close();
    answered_ = true;
}

void QZAutoActivationConfirmation::withdraw() {
    if (answered_)
        return;
    withdrawn_ = true;
    session_->End(kQZModalResponseAbort);
}

void QZAutoActivationConfirmation::restartTimeout() {
    if (!widgets_->timeout.isActive())
        return;
    widgets_->timeout.start(timeout_);
    updateCountdown();
}

std::chrono::milliseconds QZAutoActivationConfirmation::remainingTime() const {
    return widgets_->timeout.isActive()
               ? std::chrono::milliseconds(std::max(widgets_->timeout.remainingTime(), 0))
               : timeout_;
}

void QZAutoActivationConfirmation::updateCountdown() {
    QLabel* label = widgets_->countdown;
    if (!label)
        return;
    const qint64 seconds = (qint64(remainingTime().count()) + 999) / 1000;
    const QString text = QZLocalizedFormat(kCountdownKey, {MinutesAndSeconds(seconds)});
    if (label->text() != text)
        label->setText(text);

    // The visible text changes every second; what a screen reader hears (the status region's
    // name) changes only as the count passes a mark, and when the timeout was restarted.
    const qint64 previous = std::exchange(widgets_->countdownSeconds, seconds);
    const bool passedMark =
        std::any_of(std::begin(kAnnouncedSeconds), std::end(kAnnouncedSeconds), [&](qint64 mark) {
            return previous >= 0 && seconds <= mark && mark < previous;
        });
    if (!passedMark && previous >= 0 && seconds <= previous)
        return;
    label->setAccessibleName(text);
    label->setAccessibleDescription(text);
    if (passedMark) {
        QAccessibleEvent announcement(label, QAccessible::Alert);
        QAccessible::updateAccessibility(&announcement);
    }
}

QStringList QZAutoActivationConfirmation::CandidateFileURIs(CFArrayRef candidates) {
    QStringList uris;
    const CFIndex count = candidates ? CFArrayGetCount(candidates) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        const void* element = CFArrayGetValueAtIndex(candidates, i);
        if (!element || CFGetTypeID(element) != CFURLGetTypeID())
            continue;
        TCFRetained<CFURLRef> absolute(CFURLCopyAbsoluteURL(static_cast<CFURLRef>(element)),
                                       kAdopted);
        TCFRetained<CFStringRef> scheme(absolute ? CFURLCopyScheme(absolute) : nullptr, kAdopted);
        if (!scheme || CFStringCompare(scheme, CFSTR("file"), kCFCompareCaseInsensitive) != 0)
            continue;
        // A string without a UTF-8 form (a lone surrogate) is left out.
        const std::optional<std::string> text = glyphwell::UTF8String(CFURLGetString(absolute));
        if (!text || text->empty())
            continue;
        uris << QString::fromStdString(*text);
    }
    return uris;
}

void QZAutoActivationConfirmation::showCandidatesInFinder() {
    QZRevealInFileManager(CandidateFileURIs(candidateFonts_));
}

void QZAutoActivationConfirmation::showHelp() {
    InitializeHelpResource();
    if (!widgets_->helpWindow) {
        // A window of the alert's own, so that the alert's modality does not block it.
        auto* browser = new QTextBrowser;
        browser->setObjectName(QLatin1String(kQZDocumentObjectName));
        browser->setParent(alert_.get(), Qt::Dialog);
        browser->setWindowTitle(QZLocalizedString("Help"));
        browser->setAccessibleName(QZLocalizedString("Help"));
        browser->setOpenExternalLinks(true);
        browser->setFixedSize(560, 480);
        widgets_->helpWindow = browser;
    }
    QUrl page(QStringLiteral("qrc:/help/index.html"));
    page.setFragment(QZLocalizedString("QZ_AUTO_ACTIVATION_HELP_ANCHOR"));
    widgets_->helpWindow->setSource(page);
    widgets_->helpWindow->show();
    widgets_->helpWindow->raise();
    widgets_->helpWindow->activateWindow();
}

QAbstractButton* QZAutoActivationConfirmation::buttonWithTag(int tag) const {
    for (const auto& [button, buttonTag] : widgets_->buttons)
        if (buttonTag == tag)
            return button;
    return nullptr;
}

QAbstractButton* QZAutoActivationConfirmation::helpButton() const {
    return widgets_->help;
}
QCheckBox* QZAutoActivationConfirmation::suppressionCheckBox() const {
    return alert_->checkBox();
}
QLabel* QZAutoActivationConfirmation::fontSampleLabel() const {
    return widgets_->sample;
}
QLabel* QZAutoActivationConfirmation::countdownLabel() const {
    return widgets_->countdown;
}
QTextBrowser* QZAutoActivationConfirmation::helpWindow() const {
    return widgets_->helpWindow;
}

QString getNonRootVolumeNameForFonts(CFArrayRef candidateFonts) {
    const QString path = QZFilePathOfURL(FirstURL(candidateFonts));
    if (path.isEmpty())
        return QString();
    const QString name = QZNonRootVolumeName(path);
    return name.isEmpty() ? QString() : name;
}
