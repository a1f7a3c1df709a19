#include "desktop/QZQtStrings.h"

QString QZQString(CFStringRef string) {
    if (!string)
        return QString();
    const CFIndex length = CFStringGetLength(string);
    QString text(qsizetype(length), Qt::Uninitialized);
    CFStringGetCharacters(string, CFRangeMake(0, length), reinterpret_cast<UniChar*>(text.data()));
    return text;
}

QString QZQStringIfString(const void* value) {
    if (!value || CFGetTypeID(value) != CFStringGetTypeID())
        return QString();
    return QZQString(static_cast<CFStringRef>(value));
}

CFStringRef QZCreateCFString(const QString& text) {
    return CFStringCreateWithCharacters(
        kCFAllocatorDefault, reinterpret_cast<const UniChar*>(text.utf16()), CFIndex(text.size()));
}
