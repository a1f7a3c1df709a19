#include "UIAgent/QZFontDownloadConfirmation.h"

#include <QLabel>
#include <QLocale>
#include <QPushButton>
#include <QSet>
#include <algorithm>
#include <limits>
#include <utility>
#include <vector>

#include "UIAgent/QZDictionaryValue.h"
#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZModalSession.h"
#include "desktop/QZDesktopEntry.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZProcessWatch.h"
#include "desktop/QZQtStrings.h"
#include "platform/CFArray.h"
#include "platform/CFNumber.h"
#include "platform/CFSet.h"
#include "protocol/QZUIProtocol.h"

namespace {

constexpr int kIconSize = 64;
/// The widest a word (a font or application name) may be in the alert's texts, in pixels; a
/// longer one is elided.
constexpr int kMaxNameWidth = 320;

/// A non-empty string value of `key`, else a null string.
QString GetNonEmptyString(CFDictionaryRef dictionary, CFStringRef key) {
    const QString text = QZQString(QZGetTypedValue<CFStringRef>(dictionary, key));
    return text.isEmpty() ? QString() : text;
}

/// The name in `names` (language to name) under the longest key that is a prefix of one of
/// `forms`; empty when none is.
QString LongestPrefixName(CFDictionaryRef names, const QString (&forms)[2]) {
    const CFIndex count = names ? CFDictionaryGetCount(names) : 0;
    std::vector<const void*> keys(static_cast<size_t>(count)), values(static_cast<size_t>(count));
    if (count > 0)
        CFDictionaryGetKeysAndValues(names, keys.data(), values.data());
    QString best;
    qsizetype bestLength = 0;
    for (size_t i = 0; i < keys.size(); ++i) {
        const QString key = QZQStringIfString(keys[i]);
        const QString name = QZQStringIfString(values[i]);
        if (key.isEmpty() || name.isEmpty() || key.size() <= bestLength)
            continue;
        // The exact key is the longest possible prefix, so it wins like any other.
        if (forms[0].startsWith(key) || forms[1].startsWith(key)) {
            best = name;
            bestLength = key.size();
        }
    }
    return best;
}

/// The localised name for `languages` by the rule of DisplayName: the request's names, then the
/// catalog's, for each language in turn.
QString LocalizedName(CFDictionaryRef requestNames, CFDictionaryRef catalogNames,
                      const QStringList& languages) {
    for (const QString& language : languages) {
        const QString forms[] = {QZLanguageWithScript(language), language};
        for (CFDictionaryRef names : {requestNames, catalogNames})
            if (QString name = LongestPrefixName(names, forms); !name.isEmpty())
                return name;
    }
    return QString();
}

/// The catalog's attributes of the font `postScriptName` among `assets`, or null.
CFDictionaryRef CatalogAttributes(CFArrayRef assets, CFStringRef postScriptName) {
    const CFIndex count = assets ? CFArrayGetCount(assets) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        const auto asset = QZGetTypedElement<CFDictionaryRef>(assets, i);
        const auto name = QZGetTypedValue<CFStringRef>(asset, NSFontNameAttribute);
        if (name && CFEqual(name, postScriptName))
            return asset;
    }
    return nullptr;
}

/// The download size of `assets`: each asset (by "LocalID") once, with the size of its first
/// occurrence; saturates rather than wraps. Assets without an identifier cannot be told apart,
/// and cannot be downloaded by identity either: left out.
uint64_t DownloadSize(CFArrayRef assets) {
    TCFRetained<CFMutableSetRef> seen(
        CFSetCreateMutable(kCFAllocatorDefault, 0, &kCFTypeSetCallBacks), kAdopted);
    uint64_t total = 0;
    const CFIndex count = assets ? CFArrayGetCount(assets) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        const auto asset = QZGetTypedElement<CFDictionaryRef>(assets, i);
        const void* identifier = asset ? CFDictionaryGetValue(asset, CFSTR("LocalID")) : nullptr;
        if (!identifier || CFSetContainsValue(seen, identifier))
            continue;
        CFSetAddValue(seen, identifier);
        SInt64 size = 0;
        if (const auto number = QZGetTypedValue<CFNumberRef>(asset, CFSTR("_DownloadSize")))
            CFNumberGetValue(number, kCFNumberSInt64Type, &size);
        if (size > 0)
            total +=
                std::min<uint64_t>(uint64_t(size), std::numeric_limits<uint64_t>::max() - total);
    }
    return total;
}

/// Shows `text` and `detail` with every word wider than kMaxNameWidth elided (a long font or
/// application name would widen the alert past its fixed width); a label whose text was shortened
/// tells its full text as tooltip and accessible description.
void SetElidedTexts(QMessageBox& alert, const QString& text, const QString& detail) {
    const QFontMetrics metrics = alert.fontMetrics();
    alert.setText(QZElideLongWords(text, metrics, kMaxNameWidth));
    alert.setInformativeText(QZElideLongWords(detail, metrics, kMaxNameWidth));
    for (const auto& [name, full] :
         {std::pair{"qt_msgbox_label", text}, std::pair{"qt_msgbox_informativelabel", detail}})
        if (auto* label = alert.findChild<QLabel*>(QLatin1String(name));
            label && label->text() != full) {
            label->setToolTip(full);
            label->setAccessibleDescription(full);
        }
}

} // namespace

QZFontDownloadConfirmation::QZFontDownloadConfirmation(CFDictionaryRef properties, QWidget* parent)
    : QMessageBox(parent),
      session_(std::make_unique<QZModalSession>(this, QZModalSession::kQuestion)) {
    setWindowTitle(QZLocalizedString("QZ_DOWNLOAD_CONFIRMATION_TITLE"));
    const QStringList languages = QZPreferredLanguages();
    const auto bundleURL = QZGetTypedValue<CFURLRef>(properties, kQZUIPropertyBundleURL);
    applicationName_ = GetNonEmptyString(properties, kQZUIPropertyApplicationName);
    if (applicationName_.isEmpty())
        applicationName_ = QZApplicationName(
            bundleURL, QZDesktopEntry::PosixLocaleFromLanguageTag(languages.value(0)));
    if (applicationName_.isEmpty())
        applicationName_ = QZLocalizedString("QZ_CURRENT_APPLICATION");

    SInt32 pid = 0;
    if (const auto number = QZGetTypedValue<CFNumberRef>(properties, kQZUIPropertyProcessID))
        CFNumberGetValue(number, kCFNumberSInt32Type, &pid);
    setTargetAppPID(pid);

    const QIcon icon = QZApplicationIcon(bundleURL);
    if (!icon.isNull())
        setIconPixmap(icon.pixmap(kIconSize, kIconSize));
    else
        setIcon(QMessageBox::Question);

    const auto fonts = QZGetTypedValue<CFArrayRef>(properties, kQZUIPropertyFontProperties);
    TCFRetained<CFArrayRef> assets(QZCopyDownloadableFontAttributesForRequests(fonts), kAdopted);
    TCFRetained<CFDictionaryRef> names(CreateDisplayNames(fonts, assets), kAdopted);
    totalDownloadSize_ = DownloadSize(assets);

    // The distinct display names decide between the texts for one font and for several: faces
    // of one family that share a name count as one.
    QSet<QString> distinctNames;
    const CFIndex nameCount = CFDictionaryGetCount(names);
    std::vector<const void*> values(static_cast<size_t>(nameCount));
    CFDictionaryGetKeysAndValues(names, nullptr, values.data());
    for (const void* value : values)
        distinctNames.insert(QZQStringIfString(value));
    SetTexts(distinctNames.size() == 1 ? *distinctNames.begin() : QString());
    AddButtons();

    valid_ = totalDownloadSize_ > 0;
    localizedFontNamesDict_ = names;
}

void QZFontDownloadConfirmation::SetTexts(const QString& onlyName) {
    setTextFormat(Qt::PlainText);
    const QString sizeText = QZFormattedByteCount(qint64(
        std::min<uint64_t>(totalDownloadSize_, uint64_t(std::numeric_limits<qint64>::max()))));
    if (onlyName.isEmpty())
        SetElidedTexts(*this,
                       QZLocalizedFormat("QZ_HEADLINE_NEEDS_TO_DOWNLOAD", {applicationName_}),
                       QZLocalizedFormat("QZ_DETAIL_DOWNLOAD_SIZE", {sizeText}));
    else
        SetElidedTexts(*this,
                       QZLocalizedFormat("QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME",
                                         {applicationName_, onlyName}),
                       QZLocalizedFormat("QZ_DETAIL_FONT_SIZE", {onlyName, sizeText}));
}

void QZFontDownloadConfirmation::AddButtons() {
    skipButton_ = addButton(QZLocalizedString("Skip"), QMessageBox::RejectRole);
    downloadButton_ = addButton(QZLocalizedString("Download"), QMessageBox::AcceptRole);
    setDefaultButton(static_cast<QPushButton*>(skipButton_));
    setEscapeButton(skipButton_);
    // A button ends the question with its tag before the box closes itself (see QZModalSession).
    connect(this, &QMessageBox::buttonClicked, this, [this](QAbstractButton* clicked) {
        if (const int tag = clicked == skipButton_       ? kSkipTag
                            : clicked == downloadButton_ ? kDownloadTag
                                                         : 0)
            session_->End(tag);
    });
}

CFDictionaryRef QZFontDownloadConfirmation::CreateDisplayNames(CFArrayRef fonts,
                                                               CFArrayRef assets) {
    CFMutableDictionaryRef names = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    const QStringList languages = QZPreferredLanguages();
    const CFIndex count = fonts ? CFArrayGetCount(fonts) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        const auto attributes = QZGetTypedElement<CFDictionaryRef>(fonts, i);
        const auto postScriptName = QZGetTypedValue<CFStringRef>(attributes, NSFontNameAttribute);
        // A font without a PostScript name cannot be downloaded by name: it takes no part.
        if (!postScriptName || CFStringGetLength(postScriptName) == 0)
            continue;
        const QString name =
            DisplayName(attributes, languages, CatalogAttributes(assets, postScriptName));
        TCFRetained<CFStringRef> value(QZCreateCFString(name), kAdopted);
        CFDictionarySetValue(names, postScriptName, value);
    }
    return names;
}

QZFontDownloadConfirmation::~QZFontDownloadConfirmation() {
    watch_.reset();
    session_.reset();
}

void QZFontDownloadConfirmation::setLocalizedFontNamesDict(CFDictionaryRef names) {
    localizedFontNamesDict_ = TCFRetained<CFDictionaryRef>(names);
}

void QZFontDownloadConfirmation::setTargetAppPID(pid_t pid) {
    targetAppPID_ = pid;
    targetTerminated_ = false;
    watch_ = std::make_unique<QZProcessWatch>(pid);
    connect(watch_.get(), &QZProcessWatch::processExited, this,
            &QZFontDownloadConfirmation::anApplicationDidTerminate);
}

void QZFontDownloadConfirmation::showAlert() {
    int response = kQZModalResponseAbort;
    // An application that ended before its question came up has nobody to ask for.
    if (!targetTerminated_)
        response = session_->Run();
    switch (response) {
    case kDownloadTag:
        shouldDownload_ = true;
        suppressFurtherAlerts_ = false;
        break;
    case kSkipTag:
    case kQZModalResponseAbort:
    case kQZModalResponseCancel:
        shouldDownload_ = false;
        suppressFurtherAlerts_ = false;
        break;
    default:
        break;
    }
}

void QZFontDownloadConfirmation::withdraw() {
    session_->End(kQZModalResponseAbort);
}

void QZFontDownloadConfirmation::anApplicationDidTerminate(pid_t pid) {
    if (pid != targetAppPID_)
        return;
    targetTerminated_ = true;
    emit requestingApplicationTerminated();
    withdraw();
}

QAbstractButton* QZFontDownloadConfirmation::buttonWithTag(int tag) const {
    return tag == kSkipTag ? skipButton_ : tag == kDownloadTag ? downloadButton_ : nullptr;
}

QString QZFontDownloadConfirmation::DisplayName(CFDictionaryRef fontAttributes,
                                                const QStringList& languages,
                                                CFDictionaryRef catalogAttributes) {
    QString name = LocalizedName(
        QZGetTypedValue<CFDictionaryRef>(fontAttributes, NSCTFontLocalizedFamilyNameAttribute),
        QZGetTypedValue<CFDictionaryRef>(catalogAttributes, NSCTFontLocalizedFamilyNameAttribute),
        languages);
    if (name.isEmpty())
        name = GetNonEmptyString(fontAttributes, NSFontFamilyAttribute);
    if (name.isEmpty())
        name = GetNonEmptyString(catalogAttributes, NSFontFamilyAttribute);
    if (name.isEmpty())
        name = GetNonEmptyString(fontAttributes, NSFontNameAttribute);
    return name;
}
