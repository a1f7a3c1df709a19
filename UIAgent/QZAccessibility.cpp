#include "UIAgent/QZAccessibility.h"

#include <QAccessible>
#include <QAccessibleWidget>
#include <QLabel>
#include <QScrollBar>
#include <QTextBlock>
#include <QTextBrowser>
#include <QTextCursor>
#include <QTextDocument>
#include <algorithm>

namespace {

/// A read-only text browser as a document: its plain text, caret and selection through the text
/// interface, in characters of the document.
class DocumentAccessible : public QAccessibleWidget, public QAccessibleTextInterface {
public:
    explicit DocumentAccessible(QTextBrowser* browser)
        : QAccessibleWidget(browser, QAccessible::Document) {}

    void* interface_cast(QAccessible::InterfaceType type) override {
        if (type == QAccessible::TextInterface)
            return static_cast<QAccessibleTextInterface*>(this);
        return QAccessibleWidget::interface_cast(type);
    }
    QAccessible::State state() const override {
        QAccessible::State state = QAccessibleWidget::state();
        state.readOnly = true;
        state.multiLine = true;
        return state;
    }

    void selection(int index, int* start, int* end) const override {
        const QTextCursor cursor = Browser()->textCursor();
        *start = index == 0 && cursor.hasSelection() ? cursor.selectionStart() : 0;
        *end = index == 0 && cursor.hasSelection() ? cursor.selectionEnd() : 0;
    }
    int selectionCount() const override { return Browser()->textCursor().hasSelection() ? 1 : 0; }
    void addSelection(int start, int end) override { setSelection(0, start, end); }
    void removeSelection(int index) override {
        if (index != 0)
            return;
        QTextCursor cursor = Browser()->textCursor();
        cursor.clearSelection();
        Browser()->setTextCursor(cursor);
    }
    void setSelection(int index, int start, int end) override {
        if (index != 0)
            return;
        QTextCursor cursor = Browser()->textCursor();
        cursor.setPosition(Clamped(start));
        cursor.setPosition(Clamped(end), QTextCursor::KeepAnchor);
        Browser()->setTextCursor(cursor);
    }
    int cursorPosition() const override { return Browser()->textCursor().position(); }
    void setCursorPosition(int position) override {
        QTextCursor cursor = Browser()->textCursor();
        cursor.setPosition(Clamped(position));
        Browser()->setTextCursor(cursor);
    }
    QString text(QAccessible::Text kind) const override {
        if (kind == QAccessible::Value)
            return Browser()->toPlainText();
        return QAccessibleWidget::text(kind);
    }
    QString text(int start, int end) const override {
        const QString all = Browser()->toPlainText();
        start = std::clamp(start, 0, int(all.size()));
        end = std::clamp(end, start, int(all.size()));
        return all.mid(start, end - start);
    }
    int characterCount() const override { return int(Browser()->toPlainText().size()); }
    QRect characterRect(int offset) const override {
        QTextCursor cursor(Browser()->document());
        cursor.setPosition(Clamped(offset));
        const QRect local = Browser()->cursorRect(cursor);
        return QRect(Browser()->viewport()->mapToGlobal(local.topLeft()), local.size());
    }
    int offsetAtPoint(const QPoint& point) const override {
        const QPoint local = Browser()->viewport()->mapFromGlobal(point);
        return Browser()->cursorForPosition(local).position();
    }
    void scrollToSubstring(int start, int end) override {
        QTextCursor cursor(Browser()->document());
        cursor.setPosition(Clamped(start));
        cursor.setPosition(Clamped(end), QTextCursor::KeepAnchor);
        Browser()->setTextCursor(cursor);
        Browser()->ensureCursorVisible();
    }
    QString attributes(int offset, int* start, int* end) const override {
        // No text attributes are told: the whole text is one run.
        (void)offset;
        *start = 0;
        *end = characterCount();
        return QString();
    }

private:
    QTextBrowser* Browser() const { return static_cast<QTextBrowser*>(widget()); }
    int Clamped(int offset) const { return std::clamp(offset, 0, characterCount()); }
};

QAccessibleInterface* Factory(const QString& className, QObject* object) {
    if (!object)
        return nullptr;
    if (className == QLatin1String("QLabel") &&
        object->objectName() == QLatin1String(kQZStatusRegionObjectName))
        return new QAccessibleWidget(static_cast<QWidget*>(object), QAccessible::StatusBar);
    if (className == QLatin1String("QTextBrowser") &&
        object->objectName() == QLatin1String(kQZDocumentObjectName))
        return new DocumentAccessible(static_cast<QTextBrowser*>(object));
    return nullptr;
}

} // namespace

void QZInstallAccessibilityFactory() {
    static const bool installed = [] {
        QAccessible::installFactory(Factory);
        return true;
    }();
    (void)installed;
}
