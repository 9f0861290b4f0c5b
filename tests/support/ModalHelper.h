#pragma once

#include <QDialogButtonBox>
#include <QElapsedTimer>
#include <QList>
#include <QMessageBox>
#include <QObject>
#include <QPointer>
#include <QString>
#include <QStringList>
#include <QTimer>

#include <functional>

// Answers the modal boxes and dialogs that the code under test opens. Made
// before the call that opens them, it polls for
// QApplication::activeModalWidget(), records what each one shows, and
// answers it from a queue of expectations:
//
//     ModalHelper modal;
//     modal.expect(QStringLiteral("Unable to change access status."), QStringLiteral("OK"));
//     view.commitStatus(...);
//     QVERIFY2(modal.done(), qPrintable(modal.report()));
//
// A box that was not expected, or that does not match the next expectation,
// fails the running test and is closed, as is one left open longer than the
// timeout, so that a test fails rather than hangs.
class ModalHelper : public QObject
{
    Q_OBJECT

public:
    // What a modal widget showed when it came up. Message boxes give their
    // texts; for other dialogs text is the window title.
    struct Seen
    {
        QString title;
        QString text;
        QString informativeText;
        QString detailedText;
        QMessageBox::Icon icon = QMessageBox::NoIcon;
        QStringList buttons; // texts without the '&' of the shortcut
        QString defaultButton;
        QPointer<QWidget> parent;
    };
    using Action = std::function<void(QWidget *)>;

    explicit ModalHelper(int timeoutMs = 5000);
    ~ModalHelper() override;

    // text is the box's text, or the title of a dialog other than a message
    // box; a null QString accepts any. The button is named by its text,
    // case and '&' ignored ("Yes", "ok", "Create", "Skip").
    ModalHelper &expect(const QString &text, const QString &button);
    ModalHelper &expect(const QString &text, QDialogButtonBox::StandardButton button);
    // Runs the action on the widget, e.g. fills a line edit and presses OK;
    // it must close the widget. It runs from the event loop of the widget,
    // so it may open further modal widgets that later expectations answer.
    ModalHelper &expect(const QString &text, Action action);

    // Clicks the button of the widget (a message box, or any widget with
    // push buttons or a button box); false when there is no such enabled
    // button.
    static bool press(QWidget *widget, const QString &button);
    static bool press(QWidget *widget, QDialogButtonBox::StandardButton button);

    // Every expectation met and nothing unexpected came up.
    bool done();
    // Why done() is false, one line per problem.
    QString report() const;
    const QList<Seen> &seen() const;
    // The title and object name of a top-level widget still shown, for the
    // cleanup() of a test; nothing when none is.
    static QString shownWindow();

protected:
    bool eventFilter(QObject *watched, QEvent *event) override;

private:
    struct Expectation
    {
        QString text;
        QString what;
        Action action;
    };

    template <typename Button> ModalHelper &expectPress(const QString &text, Button button, const QString &name);
    void poll();
    void fail(const QString &why);

    QList<Expectation> m_expectations;
    QList<Seen> m_seen;
    QStringList m_failures;
    QTimer m_timer;
    QPointer<QWidget> m_current;
    // Answered and still open (their actions may have opened m_current).
    QList<QPointer<QWidget>> m_answered;
    QElapsedTimer m_currentSince;
    int m_timeout;
    bool m_checked = false;
};
