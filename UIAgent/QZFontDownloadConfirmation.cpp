#include "UIAgent/QZFontDownloadConfirmation.h"

#include <QLocale>
#include <QPushButton>
#include <QSet>
#include <limits>
#include <vector>

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

QString& PreferredLanguageOverride() {
    static QString language;
    return language;
}

/// The value of `key` in `dictionary` when it has the type `typeID`, else null. Does not retain.
const void* GetTypedValue(CFDictionaryRef dictionary, CFStringRef key, CFTypeID typeID) {
    if (!dictionary)
        return nullptr;
    const void* value = CFDictionaryGetValue(dictionary, key);
    return value && CFGetTypeID(value) == typeID ? value : nullptr;
}

/// A non-empty string value of `key`, else a null string.
QString GetNonEmptyString(CFDictionaryRef dictionary, CFStringRef key) {
    const QString text =
        QZQString(static_cast<CFStringRef>(GetTypedValue(dictionary, key, CFStringGetTypeID())));
    return text.isEmpty() ? QString() : text;
}

/// The name in `names` (language to name) for `language`, by the rule of DisplayName.
QString LocalizedName(CFDictionaryRef names, const QString& language) {
    const CFIndex count = names ? CFDictionaryGetCount(names) : 0;
    if (count == 0 || language.isEmpty())
        return QString();
    std::vector<const void*> keys(static_cast<size_t>(count)), values(static_cast<size_t>(count));
    CFDictionaryGetKeysAndValues(names, keys.data(), values.data());
    QString best;
    qsizetype bestLength = 0;
    for (size_t i = 0; i < keys.size(); ++i) {
        const QString key = QZQStringIfString(keys[i]);
        const QString name = QZQStringIfString(values[i]);
        if (key.isEmpty() || name.isEmpty() || !language.startsWith(key))
            continue;
        // The exact key is the longest possible prefix, so it wins like any other.
        if (key.size() > bestLength) {
            best = name;
            bestLength = key.size();
        }
    }
    return best;
}

} // namespace

QZFontDownloadConfirmation::QZFontDownloadConfirmation(CFDictionaryRef properties, QWidget* parent)
    : QMessageBox(parent),
      session_(std::make_unique<QZModalSession>(this, QZModalSession::kQuestion)) {
    setWindowTitle(QZLocalizedString("QZ_DOWNLOAD_CONFIRMATION_TITLE"));
    TCFRetained<CFMutableDictionaryRef> names(
        CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks,
                                  &kCFTypeDictionaryValueCallBacks),
        kAdopted);

    const QString language = PreferredLanguage();
    CFURLRef bundleURL =
        static_cast<CFURLRef>(GetTypedValue(properties, kQZUIPropertyBundleURL, CFURLGetTypeID()));
    applicationName_ = GetNonEmptyString(properties, kQZUIPropertyApplicationName);
    if (applicationName_.isEmpty())
        applicationName_ =
            QZApplicationName(bundleURL, QZDesktopEntry::PosixLocaleFromLanguageTag(language));
    if (applicationName_.isEmpty())
        applicationName_ = QZLocalizedString("QZ_CURRENT_APPLICATION");

    SInt32 pid = 0;
    if (const void* number = GetTypedValue(properties, kQZUIPropertyProcessID, CFNumberGetTypeID()))
        CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberSInt32Type, &pid);
    setTargetAppPID(pid);

    const QIcon icon = QZApplicationIcon(bundleURL);
    if (!icon.isNull())
        setIconPixmap(icon.pixmap(kIconSize, kIconSize));
    else
        setIcon(QMessageBox::Question);

    // Display names, and the set of distinct ones that decides between the texts for one font
    // and for several. A font without a PostScript name cannot be downloaded by name (the
    // dispatcher skips it), so it takes no part.
    CFArrayRef fonts = static_cast<CFArrayRef>(
        GetTypedValue(properties, kQZUIPropertyFontProperties, CFArrayGetTypeID()));
    QSet<QString> distinctNames;
    const CFIndex fontCount = fonts ? CFArrayGetCount(fonts) : 0;
    for (CFIndex i = 0; i < fontCount; ++i) {
        const void* element = CFArrayGetValueAtIndex(fonts, i);
        if (!element || CFGetTypeID(element) != CFDictionaryGetTypeID())
            continue;
        const auto attributes = static_cast<CFDictionaryRef>(element);
        const void* postScriptName =
            GetTypedValue(attributes, NSFontNameAttribute, CFStringGetTypeID());
        if (!postScriptName || CFStringGetLength(static_cast<CFStringRef>(postScriptName)) == 0)
            continue;
        const QString name = DisplayName(attributes, PreferredLanguage());
        distinctNames.insert(name);
        TCFRetained<CFStringRef> value(QZCreateCFString(name), kAdopted);
        CFDictionarySetValue(names, postScriptName, value);
    }
    const QString onlyName = distinctNames.size() == 1 ? *distinctNames.begin() : QString();

    setTextFormat(Qt::PlainText);
    if (!onlyName.isEmpty())
        setText(QZLocalizedFormat("QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME",
                                  {applicationName_, onlyName}));
    else
        setText(QZLocalizedFormat("QZ_HEADLINE_NEEDS_TO_DOWNLOAD", {applicationName_}));

    // The size: each asset once, with the size of its first occurrence. Assets without an
    // identifier cannot be told apart, and cannot be downloaded by identity either: left out.
    TCFRetained<CFArrayRef> assets(QZCopyDownloadableFontAttributesForRequests(fonts), kAdopted);
    TCFRetained<CFMutableSetRef> seen(
        CFSetCreateMutable(kCFAllocatorDefault, 0, &kCFTypeSetCallBacks), kAdopted);
    const CFIndex assetCount = assets ? CFArrayGetCount(assets) : 0;
    for (CFIndex i = 0; i < assetCount; ++i) {
        const void* element = CFArrayGetValueAtIndex(assets, i);
        if (!element || CFGetTypeID(element) != CFDictionaryGetTypeID())
            continue;
        const auto asset = static_cast<CFDictionaryRef>(element);
        const void* identifier = CFDictionaryGetValue(asset, CFSTR("LocalID"));
        if (!identifier || CFSetContainsValue(seen, identifier))
            continue;
        CFSetAddValue(seen, identifier);
        SInt64 size = 0;
        if (const void* number = GetTypedValue(asset, CFSTR("_DownloadSize"), CFNumberGetTypeID()))
            CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberSInt64Type, &size);
        if (size <= 0)
            continue;
        // Saturates rather than wraps: a size beyond any download is still "too large".
        const uint64_t room = std::numeric_limits<uint64_t>::max() - totalDownloadSize_;
        totalDownloadSize_ += std::min<uint64_t>(uint64_t(size), room);
    }

    const QString sizeText = QLocale().formattedDataSize(
        qint64(
            std::min<uint64_t>(totalDownloadSize_, uint64_t(std::numeric_limits<qint64>::max()))),
        2, QLocale::DataSizeSIFormat);
    if (!onlyName.isEmpty())
        setInformativeText(QZLocalizedFormat("QZ_DETAIL_FONT_SIZE", {onlyName, sizeText}));
    else
        setInformativeText(QZLocalizedFormat("QZ_DETAIL_DOWNLOAD_SIZE", {sizeText}));

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

    valid_ = totalDownloadSize_ > 0;
    localizedFontNamesDict_ = TCFRetained<CFDictionaryRef>(names);
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

QString QZFontDownloadConfirmation::PreferredLanguage() {
    if (!PreferredLanguageOverride().isEmpty())
        return PreferredLanguageOverride();
    const QStringList languages = QLocale().uiLanguages();
    return languages.isEmpty() ? QString() : languages.first();
}

void QZFontDownloadConfirmation::SetPreferredLanguageForTesting(const QString& language) {
    PreferredLanguageOverride() = language;
}

QString QZFontDownloadConfirmation::DisplayName(CFDictionaryRef fontAttributes,
                                                const QString& language) {
    const auto localized = static_cast<CFDictionaryRef>(GetTypedValue(
        fontAttributes, NSCTFontLocalizedFamilyNameAttribute, CFDictionaryGetTypeID()));
    QString name = LocalizedName(localized, language);
    if (name.isEmpty())
        name = GetNonEmptyString(fontAttributes, NSFontFamilyAttribute);
    if (name.isEmpty())
        name = GetNonEmptyString(fontAttributes, NSFontNameAttribute);
    return name;
}
