#pragma once

#include <QList>
#include <QString>
#include <QStringList>

#include <optional>

// Every question the engine asks and every message it shows goes through
// this interface: the GUI answers with message boxes and dialogs, the report
// answers without asking anybody, and tests answer from a script while
// recording each text.
struct ProcessExit
{
    int status;
};

class Interaction
{
public:
    enum class Icon { Information, Question, Warning, Critical };
    enum class Button { Ok, Cancel, Yes, No, Accept };

    struct Message
    {
        Icon icon = Icon::Information;
        QString title;
        QString text;
        QString informativeText;
        QString detailedText;
    };

    struct Question
    {
        Message message;
        QList<Button> buttons;
        // Text of the Accept button, a button in the accept role ("Create").
        QString acceptText;
        std::optional<Button> defaultButton;
    };

    // The three ways out of the PAM configuration problem dialog.
    enum class PamChoice { Skip = 1, Valid = 2, Fix = 3 };

    virtual ~Interaction();

    virtual void show(const Message &message) = 0;
    virtual Button ask(const Question &question) = 0;
    // Picks a new owner among the account names; nothing when cancelled.
    virtual std::optional<QString> chooseOwner(const QStringList &accounts) = 0;
    // Asks for a file path with the given label, prefilled; nothing when
    // cancelled.
    virtual std::optional<QString> askPath(const QString &label, const QString &initial) = 0;
    virtual PamChoice askPamProblem() = 0;
    // Ends the process; never returns. An interaction may throw
    // ProcessExit instead, for its caller to end the process.
    [[noreturn]] virtual void exitProcess(int status) = 0;

    // Shorthands for a box with one OK button.
    void inform(const QString &title, const QString &text);
    void warn(const QString &title, const QString &text);
    void critical(const QString &title, const QString &text);
};
