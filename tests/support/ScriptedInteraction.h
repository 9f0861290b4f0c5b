#pragma once

#include "policy/Interaction.h"

#include <QList>
#include <QString>
#include <QStringList>

#include <optional>

// Answers the engine's questions from a script and records every text it
// was shown, so that tests assert the exact words. A question without a
// scripted answer is recorded as unexpected and answered with Cancel.
class ScriptedInteraction : public Interaction
{
public:
    struct Record
    {
        QString kind; // "show", "ask", "owner", "path", "pam"
        Message message;
        QList<Button> buttons;
        QString acceptText;
        QStringList choices; // the accounts offered, or the label and initial path
    };

    QList<Button> answers;
    QList<std::optional<QString>> owners;
    QList<std::optional<QString>> paths;
    QList<PamChoice> pamChoices;

    QList<Record> records;
    int unexpected = 0;

    void show(const Message &message) override;
    Button ask(const Question &question) override;
    std::optional<QString> chooseOwner(const QStringList &accounts) override;
    std::optional<QString> askPath(const QString &label, const QString &initial) override;
    PamChoice askPamProblem() override;
    [[noreturn]] void exitProcess(int status) override;

    // Queues answers given as words: "yes", "no", "ok", "cancel", "accept",
    // "owner:NAME", "path:PATH" (nothing after the colon: cancelled),
    // "pam:skip", "pam:valid", "pam:fix". False at a word it does not know.
    bool script(const QStringList &words);

    // "title|text|informative|detailed" of every box and question, in order.
    QStringList texts() const;
    bool allAnswersUsed() const;
};
