#include "ModalHelper.h"

#include <QAbstractButton>
#include <QApplication>
#include <QDialog>
#include <QPushButton>
#include <QtTest>

namespace {

QtMessageHandler g_passOn = nullptr;
int g_helpers = 0;

// The offscreen platform cannot hand a window's size limits on and says so
// for every box (a message box fixes its size): a limit of the platform,
// nothing the code under test could change. Everything else passes on.
void dropSizeHintsWarning(QtMsgType type, const QMessageLogContext &context, const QString &message)
{
    if (type == QtWarningMsg && message == QLatin1String("This plugin does not support propagateSizeHints()"))
        return;
    g_passOn(type, context, message);
}

QString plain(QString text)
{
    return text.remove(QLatin1Char('&'));
}

ModalHelper::Seen describe(QWidget *widget)
{
    ModalHelper::Seen seen;
    seen.title = widget->windowTitle();
    seen.parent = widget->parentWidget();
    if (auto *box = qobject_cast<QMessageBox *>(widget)) {
        seen.text = box->text();
        seen.informativeText = box->informativeText();
        seen.detailedText = box->detailedText();
        seen.icon = box->icon();
        for (QAbstractButton *button : box->buttons()) {
            // The box's own "Show Details..." toggle is no answer.
            if (!box->detailedText().isEmpty() && box->buttonRole(button) == QMessageBox::ActionRole)
                continue;
            seen.buttons << plain(button->text());
        }
        if (box->defaultButton())
            seen.defaultButton = plain(box->defaultButton()->text());
        return seen;
    }
    seen.text = seen.title;
    for (QPushButton *button : widget->findChildren<QPushButton *>()) {
        if (!button->isVisibleTo(widget))
            continue;
        seen.buttons << plain(button->text());
        if (button->isDefault())
            seen.defaultButton = plain(button->text());
    }
    return seen;
}

QString summary(const ModalHelper::Seen &seen)
{
    return QLatin1Char('"') + seen.title + QStringLiteral("\" / \"") + seen.text + QLatin1Char('"');
}

bool click(QAbstractButton *button)
{
    if (!button || !button->isEnabled())
        return false;
    button->click();
    return true;
}

// Closes a widget nobody answers, the way the window's close button would.
void dismiss(QWidget *widget)
{
    if (auto *dialog = qobject_cast<QDialog *>(widget))
        dialog->reject();
    else
        widget->close();
}

} // namespace

ModalHelper::ModalHelper(int timeoutMs)
    : m_timeout(timeoutMs)
{
    if (g_helpers++ == 0 && QGuiApplication::platformName() == QLatin1String("offscreen"))
        g_passOn = qInstallMessageHandler(dropSizeHintsWarning);
    connect(&m_timer, &QTimer::timeout, this, &ModalHelper::poll);
    m_timer.start(10);
}

ModalHelper::~ModalHelper()
{
    if (--g_helpers == 0 && g_passOn) {
        qInstallMessageHandler(g_passOn);
        g_passOn = nullptr;
    }
    if (!m_checked && (!m_failures.isEmpty() || !m_expectations.isEmpty()))
        qWarning("ModalHelper not checked: %s", qPrintable(report()));
}

template <typename Button>
ModalHelper &ModalHelper::expectPress(const QString &text, Button button, const QString &name)
{
    const QString what = QStringLiteral("press \"%1\"").arg(name);
    return expect(text, [this, button, what](QWidget *widget) {
        if (!press(widget, button)) {
            fail(QStringLiteral("could not %1 on %2").arg(what, summary(describe(widget))));
            dismiss(widget);
        }
    });
}

ModalHelper &ModalHelper::expect(const QString &text, const QString &button)
{
    return expectPress(text, button, button);
}

ModalHelper &ModalHelper::expect(const QString &text, QDialogButtonBox::StandardButton button)
{
    return expectPress(text, button, QStringLiteral("standard button %1").arg(button));
}

ModalHelper &ModalHelper::expect(const QString &text, Action action)
{
    m_expectations.append({text, QStringLiteral("an action"), std::move(action)});
    return *this;
}

bool ModalHelper::press(QWidget *widget, const QString &button)
{
    const QString wanted = plain(button);
    QList<QAbstractButton *> candidates;
    if (auto *box = qobject_cast<QMessageBox *>(widget))
        candidates = box->buttons();
    else
        candidates = widget->findChildren<QAbstractButton *>();
    for (QAbstractButton *candidate : candidates) {
        if (candidate->isVisibleTo(widget) && plain(candidate->text()).compare(wanted, Qt::CaseInsensitive) == 0)
            return click(candidate);
    }
    return false;
}

bool ModalHelper::press(QWidget *widget, QDialogButtonBox::StandardButton button)
{
    if (auto *box = qobject_cast<QMessageBox *>(widget))
        return click(box->button(static_cast<QMessageBox::StandardButton>(button)));
    for (QDialogButtonBox *buttonBox : widget->findChildren<QDialogButtonBox *>()) {
        if (QPushButton *found = buttonBox->button(button))
            return click(found);
    }
    return false;
}

bool ModalHelper::done()
{
    m_checked = true;
    return m_failures.isEmpty() && m_expectations.isEmpty();
}

QString ModalHelper::report() const
{
    QStringList lines = m_failures;
    for (const Expectation &expectation : m_expectations)
        lines << QStringLiteral("never came up: \"%1\" (%2)").arg(expectation.text, expectation.what);
    return lines.join(QLatin1Char('\n'));
}

QString ModalHelper::shownWindow()
{
    for (QWidget *widget : QApplication::topLevelWidgets()) {
        if (widget->isVisible())
            return widget->windowTitle() + QLatin1Char(' ') + widget->objectName();
    }
    return QString();
}

const QList<ModalHelper::Seen> &ModalHelper::seen() const
{
    return m_seen;
}

void ModalHelper::poll()
{
    QWidget *widget = QApplication::activeModalWidget();
    if (!widget)
        return;
    // A widget answered before is active again when a dialog its action
    // opened has closed: the action is still running and closes it.
    if (widget != m_current && m_answered.contains(widget))
        return;
    if (widget == m_current) {
        if (m_currentSince.elapsed() > m_timeout) {
            fail(QStringLiteral("still open after %1 ms: %2").arg(m_timeout).arg(summary(describe(widget))));
            dismiss(widget);
        }
        return;
    }

    m_current = widget;
    m_answered.append(widget);
    m_currentSince.start();
    // Once hidden it is done with; shown again, it is answered again.
    widget->installEventFilter(this);
    const Seen seen = describe(widget);
    m_seen.append(seen);
    if (m_expectations.isEmpty()) {
        fail(QStringLiteral("unexpected: ") + summary(seen));
        dismiss(widget);
        return;
    }
    const Expectation expectation = m_expectations.takeFirst();
    if (!expectation.text.isNull() && expectation.text != seen.text) {
        fail(QStringLiteral("expected \"%1\", came up: %2").arg(expectation.text, summary(seen)));
        dismiss(widget);
        return;
    }
    // Queued, so that this timer keeps polling while the action runs: a
    // timer does not fire again inside its own slot.
    QPointer<QWidget> target = widget;
    QMetaObject::invokeMethod(
        this,
        [target, action = expectation.action] {
            if (target)
                action(target);
        },
        Qt::QueuedConnection);
}

bool ModalHelper::eventFilter(QObject *watched, QEvent *event)
{
    if (event->type() == QEvent::Hide) {
        m_answered.removeAll(static_cast<QWidget *>(watched));
        m_answered.removeAll(nullptr);
        watched->removeEventFilter(this);
        if (watched == m_current)
            m_current = nullptr;
    }
    return QObject::eventFilter(watched, event);
}

void ModalHelper::fail(const QString &why)
{
    m_failures << why;
    if (QTest::currentTestFunction())
        QTest::qFail(qPrintable(QStringLiteral("ModalHelper: ") + why), __FILE__, __LINE__);
}
