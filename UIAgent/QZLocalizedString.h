// User-visible texts: every text the agent shows goes through QZLocalizedString, which looks the
// key up in the "Localized" translation table for the user's language; a key without a
// translation shows as the key itself.
#pragma once

#include <QLocale>
#include <QString>
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
/// application; called once by main before any text is shown.
void QZInstallTranslations();
