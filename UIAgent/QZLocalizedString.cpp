// The "Localized" table: Qt translations whose context is "Localized" and whose source texts are
// the keys. The compiled tables are embedded under :/translations as Localized_<language>.qm.
#include "UIAgent/QZLocalizedString.h"

#include <QCoreApplication>
#include <QFile>
#include <QFileInfo>
#include <QGuiApplication>
#include <QLibraryInfo>
#include <QLocale>
#include <QPointer>
#include <QTextBoundaryFinder>
#include <QTranslator>
#include <algorithm>
#include <vector>

#include "UIAgent/AgentTesting.h"

QString QZLocalizedString(const char* key) {
    // translate() answers the source text, that is the key, when no table holds it.
    return QCoreApplication::translate("Localized", key);
}

/// Fills the placeholders of `format` in one pass, so that an argument that itself holds a
/// placeholder (an application called "%@") is shown as it is. Placeholders: "%@" takes the next
/// argument; "%N$@" and Qt's "%N" (N from 1 to 99) take argument N; "%%" is a percent sign. A
/// placeholder without an argument, and anything else after a "%", is kept as written.
static QString FillPlaceholders(const QString& format, const std::vector<QString>& arguments) {
    QString result;
    result.reserve(format.size());
    size_t next = 0;
    const qsizetype length = format.size();
    qsizetype i = 0;
    while (i < length) {
        const QChar c = format[i];
        if (c != u'%' || i + 1 == length) {
            result += c;
            ++i;
            continue;
        }
        const QChar d = format[i + 1];
        if (d == u'%') {
            result += u'%';
            i += 2;
            continue;
        }
        if (d == u'@') {
            if (next < arguments.size())
                result += arguments[next++];
            else
                result += QStringLiteral("%@");
            i += 2;
            continue;
        }
        if (d.isDigit() && d != u'0') {
            qsizetype end = i + 1;
            size_t number = 0;
            while (end < length && end < i + 3 && format[end].isDigit()) {
                number = number * 10 + static_cast<size_t>(format[end].digitValue());
                ++end;
            }
            // "%N$@" is the positional object placeholder; a bare "%N" is Qt's.
            if (end + 1 < length && format[end] == u'$' && format[end + 1] == u'@')
                end += 2;
            if (number <= arguments.size())
                result += arguments[number - 1];
            else
                result += format.mid(i, end - i);
            i = end;
            continue;
        }
        result += c;
        ++i;
    }
    return result;
}

QString QZLocalizedFormat(const char* key, std::initializer_list<QString> arguments) {
    return FillPlaceholders(QZLocalizedString(key), std::vector<QString>(arguments));
}

QString QZTranslationFileFor(const QLocale& locale) {
    // QTranslator::load walks the locale's languages in order of preference and, for each, the
    // shorter forms of its name (zh_Hans_CN, zh_Hans, zh), so a probe translator finds the file.
    QTranslator probe;
    if (probe.load(locale, QStringLiteral("Localized"), QStringLiteral("_"),
                   QStringLiteral(":/translations")))
        return probe.filePath();
    // No table for any of the user's languages: English texts rather than bare keys.
    const QString english = QStringLiteral(":/translations/Localized_en.qm");
    return QFile::exists(english) ? english : QString();
}

/// Replaces the translator in `slot` with one loaded from `file`; an empty or unreadable file
/// leaves none.
static void InstallTranslator(QPointer<QTranslator>& slot, const QString& file) {
    if (slot) {
        QCoreApplication::removeTranslator(slot);
        delete slot.data();
    }
    if (file.isEmpty())
        return;
    // Parented to the application, so it goes with it; the pointer notices.
    slot = new QTranslator(QCoreApplication::instance());
    if (slot->load(file))
        QCoreApplication::installTranslator(slot);
}

void QZInstallTranslations() {
    static QPointer<QTranslator> table;
    static QPointer<QTranslator> qtTexts;
    if (!QCoreApplication::instance())
        return;
    const QString file = QZTranslationFileFor(QLocale());
    InstallTranslator(table, file);
    // Qt's own texts (the standard Help button, for one) in the same language as the table.
    const QString language = QFileInfo(file).completeBaseName().mid(int(qstrlen("Localized_")));
    QString qtFile;
    if (!language.isEmpty()) {
        const QString candidate = QLibraryInfo::path(QLibraryInfo::TranslationsPath) +
                                  QStringLiteral("/qtbase_") + language + QStringLiteral(".qm");
        if (QFile::exists(candidate))
            qtFile = candidate;
    }
    InstallTranslator(qtTexts, qtFile);
    QZApplyLayoutDirection();
}

void QZApplyLayoutDirection() {
    // Set explicitly, so that a table (or the lack of one) does not decide the direction.
    QGuiApplication::setLayoutDirection(QZLayoutDirectionFor(QZPreferredLanguages()));
}

static QStringList& PreferredLanguagesOverride() {
    static QStringList languages;
    return languages;
}

QStringList QZPreferredLanguages() {
    if (!PreferredLanguagesOverride().isEmpty())
        return PreferredLanguagesOverride();
    return QLocale().uiLanguages();
}

void QZSetPreferredLanguagesForTesting(const QStringList& languages) {
    PreferredLanguagesOverride() = languages;
}

QString QZLanguageWithScript(const QString& tag) {
    QStringList parts = QString(tag).replace(u'_', u'-').split(u'-');
    // A second subtag of four letters is a script already.
    if (parts.size() > 1 && parts[1].size() == 4)
        return parts.join(u'-');
    const QLocale locale(parts.join(u'-'));
    if (locale.language() == QLocale::C || locale.script() == QLocale::AnyScript)
        return parts.join(u'-');
    parts.insert(1, QLocale::scriptToCode(locale.script()));
    return parts.join(u'-');
}

Qt::LayoutDirection QZLayoutDirectionFor(const QStringList& languages) {
    if (languages.isEmpty())
        return Qt::LeftToRight;
    const QLocale locale(QZLanguageWithScript(languages.first()));
    return locale.language() == QLocale::C ? Qt::LeftToRight : locale.textDirection();
}

QString QZFormattedByteCount(qint64 bytes) {
    bytes = std::max<qint64>(bytes, 0);
    // Whole kilobytes, megabytes to a tenth, larger units to a hundredth.
    const int precision = bytes < 1000 * 1000 ? 0 : bytes < 1000 * 1000 * 1000 ? 1 : 2;
    return QLocale().formattedDataSize(bytes, precision, QLocale::DataSizeSIFormat);
}

QString QZElideLongWords(const QString& text, const QFontMetrics& metrics, int maxWidth) {
    // The pieces are those between line-break opportunities, which a label wraps at: spaces in
    // most scripts, but also between the characters of Chinese and Japanese, whose sentences
    // have no spaces and must not be cut as one long word.
    QString result;
    QTextBoundaryFinder breaks(QTextBoundaryFinder::Line, text);
    qsizetype start = 0;
    while (start < text.size()) {
        qsizetype end = breaks.toNextBoundary();
        if (end <= start)
            end = text.size();
        qsizetype wordEnd = end;
        while (wordEnd > start && text[wordEnd - 1].isSpace())
            --wordEnd;
        const QString word = text.mid(start, wordEnd - start);
        result += metrics.horizontalAdvance(word) > maxWidth
                      ? metrics.elidedText(word, Qt::ElideRight, maxWidth)
                      : word;
        result += text.mid(wordEnd, end - wordEnd);
        start = end;
    }
    return result;
}
