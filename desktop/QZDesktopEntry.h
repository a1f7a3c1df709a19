// What the agent shows of a requesting application: its name and its icon. When the application's
// URL names a desktop entry (a .desktop file), they come from the entry's [Desktop Entry] group
// ("Name", "Name[lang]" and "Icon"); otherwise from the file itself (its name and the icon of its
// type).
//
// Localised keys follow the lookup order of the desktop entry format: for a locale
// lang_COUNTRY.ENCODING@MODIFIER, Name[lang_COUNTRY@MODIFIER], Name[lang_COUNTRY],
// Name[lang@MODIFIER], Name[lang], then Name; the encoding is never matched.
#pragma once

#include <QHash>
#include <QIcon>
#include <QString>
#include <optional>

#include "platform/CFURL.h"

class QZDesktopEntry {
public:
    /// Reads the [Desktop Entry] group of the file at `path`. Empty when the file cannot be read,
    /// is larger than 1 MiB, or has no such group. Malformed lines are ignored.
    static std::optional<QZDesktopEntry> Load(const QString& path);
    /// Reads the [Desktop Entry] group of `text` (the contents of a desktop entry file).
    static std::optional<QZDesktopEntry> Parse(const QByteArray& text);

    /// The value of `key` as given, escapes (\s \n \t \r \\) resolved; empty when absent.
    QString value(const QString& key) const { return entries_.value(key); }
    /// The value of the localised `key` for `posixLocale` (lang_COUNTRY.ENCODING@MODIFIER, each
    /// part after lang optional) by the lookup order above; empty when no form of it is present.
    QString localizedValue(const QString& key, const QString& posixLocale) const;
    /// "Name" as given.
    QString name() const { return value(QStringLiteral("Name")); }
    /// "Name" for `posixLocale`.
    QString localizedName(const QString& posixLocale) const {
        return localizedValue(QStringLiteral("Name"), posixLocale);
    }
    /// "Icon": an icon name of the icon theme, or an absolute path.
    QString iconName() const { return value(QStringLiteral("Icon")); }

    /// The POSIX locale name for a BCP 47 language tag: "de-DE" gives de_DE, "zh-Hans-CN"
    /// gives zh_CN (the script is dropped), "fr" gives fr.
    static QString PosixLocaleFromLanguageTag(const QString& tag);

private:
    QHash<QString, QString> entries_;
};

/// The name and icon of the application whose file URL is `url` (a desktop entry or any file).
/// The name is the entry's Name (localised for `posixLocale` when it is not empty, as given
/// otherwise) when `url` names a readable desktop entry with a name, else the file's name with
/// its extension; empty when `url` is null, not a file URL, or names nothing that exists.
QString QZApplicationName(CFURLRef url, const QString& posixLocale = QString());
/// The entry's Icon (a theme icon, or an icon file) when `url` names a desktop entry with one,
/// else the theme icon of the file's type; a null icon when there is none.
QIcon QZApplicationIcon(CFURLRef url);
/// The path of a file URL (its base resolved), or empty for null and other URLs.
QString QZFilePathOfURL(CFURLRef url);
