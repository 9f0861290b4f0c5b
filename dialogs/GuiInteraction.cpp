#include "GuiInteraction.h"

#include "FileInputDialog.h"
#include "PAMDialog.h"
#include "SelectDirectoryOwnerDialog.h"

#include <QApplication>
#include <QGridLayout>
#include <QMap>
#include <QMessageBox>
#include <QPushButton>
#include <QSpacerItem>
#include <QTextEdit>
#include <QtMath>

#include <cstdio>
#include <cstdlib>
#include <iostream>

namespace {

QMessageBox::Icon boxIcon(Interaction::Icon icon)
{
    switch (icon) {
    case Interaction::Icon::Question:
        return QMessageBox::Question;
    case Interaction::Icon::Warning:
        return QMessageBox::Warning;
    case Interaction::Icon::Critical:
        return QMessageBox::Critical;
    case Interaction::Icon::Information:
        break;
    }
    return QMessageBox::Information;
}

QMessageBox::StandardButton standardButton(Interaction::Button button)
{
    switch (button) {
    case Interaction::Button::Cancel:
        return QMessageBox::Cancel;
    case Interaction::Button::Yes:
        return QMessageBox::Yes;
    case Interaction::Button::No:
        return QMessageBox::No;
    case Interaction::Button::Ok:
    case Interaction::Button::Accept:
        break;
    }
    return QMessageBox::Ok;
}

void fill(QMessageBox &box, const Interaction::Message &message)
{
    box.setIcon(boxIcon(message.icon));
    box.setWindowTitle(message.title);
    // Paths and refusal messages are never markup.
    box.setTextFormat(Qt::PlainText);
    box.setText(message.text);
    box.setInformativeText(message.informativeText);
    box.setDetailedText(message.detailedText);
}

// A box sizes itself to its short main text and squeezes the informative
// and detailed texts (a refusal message, a path, permission letters) into a
// narrow column; a minimum width keeps them readable, and the details get
// the height of their lines and two more (the permission details have
// eight). Done last: each setter of the box rebuilds its layout.
void widen(QMessageBox &box, const QString &detailedText)
{
    if (auto *grid = qobject_cast<QGridLayout *>(box.layout())) {
        grid->addItem(new QSpacerItem(420, 0, QSizePolicy::Minimum, QSizePolicy::Minimum), grid->rowCount(), 0, 1,
                      grid->columnCount());
    }
    auto *details = box.findChild<QTextEdit *>();
    if (!details || detailedText.isEmpty())
        return;
    const int lines = qBound(1, detailedText.count(QLatin1Char('\n')) + 1, 12);
    const int margins = 2 * (details->frameWidth() + qCeil(details->document()->documentMargin()));
    details->setFixedHeight(qMax(details->height(), (lines + 2) * details->fontMetrics().lineSpacing() + margins));
}

} // namespace

GuiInteraction::GuiInteraction(const RootDirectory &root)
    : m_root(root)
{
}

// Every box is parented to the active window so that it stays over the
// window the administrator works in.
void GuiInteraction::show(const Message &message)
{
    QMessageBox box(QApplication::activeWindow());
    fill(box, message);
    box.setStandardButtons(QMessageBox::Ok);
    widen(box, message.detailedText);
    box.exec();
}

Interaction::Button GuiInteraction::ask(const Question &question)
{
    QMessageBox box(QApplication::activeWindow());
    fill(box, question.message);
    QMap<QAbstractButton *, Button> answers;
    QPushButton *defaultButton = nullptr;
    for (const Button button : question.buttons) {
        QPushButton *pushButton = button == Button::Accept && !question.acceptText.isEmpty()
            ? box.addButton(question.acceptText, QMessageBox::AcceptRole)
            : box.addButton(standardButton(button));
        answers.insert(pushButton, button);
        if (question.defaultButton == button)
            defaultButton = pushButton;
    }
    if (defaultButton)
        box.setDefaultButton(defaultButton);
    widen(box, question.message.detailedText);
    box.exec();

    const auto answer = answers.constFind(box.clickedButton());
    if (answer != answers.constEnd())
        return *answer;
    // Closed without a button: the most cautious of the offered answers.
    for (const Button refusal : {Button::Cancel, Button::No}) {
        if (question.buttons.contains(refusal))
            return refusal;
    }
    return Button::Cancel;
}

std::optional<QString> GuiInteraction::chooseOwner(const QStringList &accounts)
{
    SelectDirectoryOwnerDialog dialog(accounts, QApplication::activeWindow());
    if (dialog.exec() != QDialog::Accepted)
        return std::nullopt;
    return dialog.owner();
}

std::optional<QString> GuiInteraction::askPath(const QString &label, const QString &initial)
{
    FileInputDialog dialog(QApplication::activeWindow(), m_root);
    dialog.setLabelText(label);
    dialog.setText(initial);
    if (dialog.exec() != QDialog::Accepted)
        return std::nullopt;
    // The engine ensures the directory itself, with its own message.
    return dialog.text();
}

Interaction::PamChoice GuiInteraction::askPamProblem()
{
    PAMDialog dialog(QApplication::activeWindow());
    switch (dialog.exec()) {
    case static_cast<int>(PamDialogResult::Skip):
        return PamChoice::Skip;
    case static_cast<int>(PamDialogResult::Valid):
        return PamChoice::Valid;
    default:
        // Closing the dialog counts as Fix: the fix asks for a path and
        // can still be cancelled there.
        return PamChoice::Fix;
    }
}

void GuiInteraction::exitProcess(int status)
{
    // The engine asks for the end of the process before the event loop runs
    // (loading at start-up), where QCoreApplication::exit() does nothing,
    // and may ask from inside a slot, where an exception must not cross
    // Qt's event dispatch. So the process ends here, after the report lines
    // written so far have left the buffers.
    std::cout.flush();
    std::cerr.flush();
    std::fflush(nullptr);
    std::exit(status);
}
