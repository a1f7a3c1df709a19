// User-visible texts: every text the agent shows goes through QZLocalizedString, which looks the
// key up in the "Localized" translation table for the user's language; a key without a
// translation shows as the key itself.
#pragma once

#include <QFontMetrics>
#include <QLocale>
#include <QString>
#include <QStringList>
#include <initializer_list>

/// The text for `key` in the user's language, or `key` itself.
QString QZLocalizedString(const char* key);

/// The text for `key` with its placeholders filled with `arguments`: "%@" takes the next
/// argument in order, "%N$@" and Qt's "%N" take argument N. Arguments are inserted as they are
/// (a "%@" inside an argument stays). A text without placeholders is returned as is.
QString QZLocalizedFormat(const char* key, std::initializer_list<QString> arguments);

/// The embedded table for the first of `locale`'s languages that has one, else the English
/// table; empty when no table is embedded.
QString QZTranslationFileFor(const QLocale& locale);

/// Loads the translations for the user's languages (QLocale::uiLanguages()) into the
/// application and lays its windows out in the direction of the first language's script (right
/// to left for Arabic, Hebrew, Persian, ... even without a table for it); called once by main
/// before any text is shown.
void QZInstallTranslations();

/// Lays the application's windows out in the direction of QZPreferredLanguages()'s first
/// language (QZLayoutDirectionFor); part of QZInstallTranslations.
void QZApplyLayoutDirection();

/// The user's languages, most preferred first, as BCP 47 tags (QLocale::uiLanguages(), or the
/// list a test set, UIAgent/AgentTesting.h).
QStringList QZPreferredLanguages();

/// `tag` with the script subtag its language is most likely written in, when it has none:
/// "zh-CN" -> "zh-Hans-CN", "zh-TW" and "zh-HK" -> "zh-Hant-...", "ja" -> "ja-Jpan". A tag that
/// has a script, or whose language is unknown, is returned as is ('_' read as '-').
QString QZLanguageWithScript(const QString& tag);

/// The direction of the script of the first of `languages` (left to right when there is none).
Qt::LayoutDirection QZLayoutDirectionFor(const QStringList& languages);

/// A byte count as the agent shows it everywhere: decimal units, the precision growing with the
/// unit ("0 bytes", "757 kB", "1.5 MB", "2.25 GB"); negative counts as 0.
QString QZFormattedByteCount(qint64 bytes);

/// `text` with every piece that a label cannot wrap (the text between two line-break
/// opportunities: a word, or one character of Chinese or Japanese) wider than `maxWidth` pixels
/// in `metrics` elided at its end ("…"), so that one long name cannot widen a window; the rest
/// as it is.
QString QZElideLongWords(const QString& text, const QFontMetrics& metrics, int maxWidth);
