#include "desktop/QZDesktopEntry.h"

#include <QFile>
#include <QFileInfo>
#include <QList>
#include <QMimeDatabase>
#include <QRegularExpression>
#include <QStringList>
#include <vector>

#include "cfutil/TCFRetained.h"

namespace {

constexpr qint64 kMaximumEntrySize = 1 << 20;

/// A value with the desktop entry escapes resolved; an unknown escape is kept as written, so
/// that list separators ("\;") survive.
QString Unescape(const QString& raw) {
    QString result;
    result.reserve(raw.size());
    for (qsizetype i = 0; i < raw.size(); ++i) {
        const QChar c = raw[i];
        if (c != u'\\' || i + 1 == raw.size()) {
            result += c;
            continue;
        }
        const QChar next = raw[++i];
        switch (next.unicode()) {
        case 's':
            result += u' ';
            break;
        case 'n':
            result += u'\n';
            break;
        case 't':
            result += u'\t';
            break;
        case 'r':
            result += u'\r';
            break;
        case '\\':
            result += u'\\';
            break;
        default:
            result += c;
            result += next;
        }
    }
    return result;
}

} // namespace

std::optional<QZDesktopEntry> QZDesktopEntry::Load(const QString& path) {
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly) || file.size() > kMaximumEntrySize)
        return std::nullopt;
    // read() with a limit, since size() can be 0 for files whose size the kernel does not know.
    const QByteArray text = file.read(kMaximumEntrySize + 1);
    if (text.size() > kMaximumEntrySize)
        return std::nullopt;
    return Parse(text);
}

std::optional<QZDesktopEntry> QZDesktopEntry::Parse(const QByteArray& text) {
    QZDesktopEntry entry;
    bool found = false;
    bool inMainGroup = false;
    for (QByteArray line : text.split('\n')) {
        if (line.endsWith('\r'))
            line.chop(1);
        const QByteArray trimmed = line.trimmed();
        if (trimmed.isEmpty() || trimmed.startsWith('#'))
            continue;
        if (trimmed.startsWith('[')) {
            inMainGroup = trimmed == "[Desktop Entry]";
            found = found || inMainGroup;
            continue;
        }
        if (!inMainGroup)
            continue;
        const qsizetype equals = line.indexOf('=');
        if (equals <= 0)
            continue;
        const QString key = QString::fromUtf8(line.left(equals).trimmed());
        if (key.isEmpty() || entry.entries_.contains(key)) // the first of duplicate keys counts
            continue;
        const QString value = QString::fromUtf8(line.mid(equals + 1)).trimmed();
        entry.entries_.insert(key, Unescape(value));
    }
    if (!found)
        return std::nullopt;
    return entry;
}

QString QZDesktopEntry::localizedValue(const QString& key, const QString& posixLocale) const {
    // lang_COUNTRY.ENCODING@MODIFIER: the encoding takes no part in the match.
    QString locale = posixLocale;
    QString modifier;
    if (const qsizetype at = locale.indexOf(u'@'); at >= 0) {
        modifier = locale.mid(at + 1);
        locale.truncate(at);
    }
    if (const qsizetype dot = locale.indexOf(u'.'); dot >= 0)
        locale.truncate(dot);
    QString language = locale;
    QString country;
    if (const qsizetype underscore = locale.indexOf(u'_'); underscore >= 0) {
        language = locale.left(underscore);
        country = locale.mid(underscore + 1);
    }

    QStringList candidates;
    if (!language.isEmpty()) {
        if (!country.isEmpty() && !modifier.isEmpty())
            candidates << language + u'_' + country + u'@' + modifier;
        if (!country.isEmpty())
            candidates << language + u'_' + country;
        if (!modifier.isEmpty())
            candidates << language + u'@' + modifier;
        candidates << language;
    }
    for (const QString& candidate : candidates) {
        const auto found = entries_.constFind(key + u'[' + candidate + u']');
        if (found != entries_.constEnd())
            return found.value();
    }
    return value(key);
}

QString QZDesktopEntry::PosixLocaleFromLanguageTag(const QString& tag) {
    const QStringList parts = tag.split(QRegularExpression(QStringLiteral("[-_]")));
    if (parts.isEmpty() || parts.first().isEmpty())
        return QString();
    QString result = parts.first();
    for (qsizetype i = 1; i < parts.size(); ++i) {
        const QString& part = parts[i];
        const bool letters = part.size() == 2 && part[0].isLetter() && part[1].isLetter();
        const bool digits =
            part.size() == 3 && part[0].isDigit() && part[1].isDigit() && part[2].isDigit();
        if (letters || digits) {
            result += u'_' + part.toUpper();
            break;
        }
    }
    return result;
}

QString QZFilePathOfURL(CFURLRef url) {
    if (!url)
        return QString();
    TCFRetained<CFURLRef> absolute(CFURLCopyAbsoluteURL(url), kAdopted);
    if (!absolute)
        return QString();
    TCFRetained<CFStringRef> scheme(CFURLCopyScheme(absolute), kAdopted);
    if (!scheme || CFStringCompare(scheme, CFSTR("file"), kCFCompareCaseInsensitive) != 0)
        return QString();
    // The decoded path is never longer than the URL's own bytes.
    const CFIndex length = CFURLGetBytes(absolute, nullptr, 0);
    if (length <= 0)
        return QString();
    std::vector<UInt8> buffer(size_t(length) + 1);
    if (!CFURLGetFileSystemRepresentation(absolute, true, buffer.data(), CFIndex(buffer.size())))
        return QString();
    QString path = QString::fromUtf8(reinterpret_cast<const char*>(buffer.data()));
    while (path.size() > 1 && path.endsWith(u'/'))
        path.chop(1);
    return path;
}

static bool IsDesktopEntryPath(const QFileInfo& info) {
    return info.isFile() && info.fileName().endsWith(QStringLiteral(".desktop"));
}

QString QZApplicationName(CFURLRef url, const QString& posixLocale) {
    const QString path = QZFilePathOfURL(url);
    if (path.isEmpty())
        return QString();
    const QFileInfo info(path);
    if (!info.exists())
        return QString();
    if (IsDesktopEntryPath(info)) {
        if (const auto entry = QZDesktopEntry::Load(path)) {
            const QString name =
                posixLocale.isEmpty() ? entry->name() : entry->localizedName(posixLocale);
            if (!name.isEmpty())
                return name;
        }
    }
    return info.fileName();
}

QIcon QZApplicationIcon(CFURLRef url) {
    const QString path = QZFilePathOfURL(url);
    if (path.isEmpty())
        return QIcon();
    const QFileInfo info(path);
    if (!info.exists())
        return QIcon();
    if (IsDesktopEntryPath(info)) {
        if (const auto entry = QZDesktopEntry::Load(path)) {
            const QString icon = entry->iconName();
            if (icon.startsWith(u'/')) {
                if (QFileInfo::exists(icon))
                    return QIcon(icon);
            } else if (!icon.isEmpty() && QIcon::hasThemeIcon(icon)) {
                return QIcon::fromTheme(icon);
            }
        }
    }
    const QMimeType type = QMimeDatabase().mimeTypeForFile(info);
    return QIcon::fromTheme(type.iconName(), QIcon::fromTheme(type.genericIconName()));
}
