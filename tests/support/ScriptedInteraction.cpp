#include "ScriptedInteraction.h"

void ScriptedInteraction::show(const Message &message)
{
    records.append({QStringLiteral("show"), message, {}, {}, {}});
}

Interaction::Button ScriptedInteraction::ask(const Question &question)
{
    records.append({QStringLiteral("ask"), question.message, question.buttons, question.acceptText, {}});
    if (answers.isEmpty()) {
        ++unexpected;
        return Button::Cancel;
    }
    return answers.takeFirst();
}

std::optional<QString> ScriptedInteraction::chooseOwner(const QStringList &accounts)
{
    records.append({QStringLiteral("owner"), {}, {}, {}, accounts});
    if (owners.isEmpty()) {
        ++unexpected;
        return std::nullopt;
    }
    return owners.takeFirst();
}

std::optional<QString> ScriptedInteraction::askPath(const QString &label, const QString &initial)
{
    Message message;
    message.text = label;
    records.append({QStringLiteral("path"), message, {}, {}, {label, initial}});
    if (paths.isEmpty()) {
        ++unexpected;
        return std::nullopt;
    }
    return paths.takeFirst();
}

Interaction::PamChoice ScriptedInteraction::askPamProblem()
{
    Message message;
    message.title = QStringLiteral("PAM configuration problem");
    records.append({QStringLiteral("pam"), message, {}, {}, {}});
    if (pamChoices.isEmpty()) {
        ++unexpected;
        return PamChoice::Skip;
    }
    return pamChoices.takeFirst();
}

void ScriptedInteraction::exitProcess(int status)
{
    throw ProcessExit{status};
}

QStringList ScriptedInteraction::texts() const
{
    QStringList out;
    for (const Record &record : records) {
        QStringList parts{record.message.title, record.message.text};
        if (!record.message.informativeText.isEmpty() || !record.message.detailedText.isEmpty())
            parts << record.message.informativeText;
        if (!record.message.detailedText.isEmpty())
            parts << record.message.detailedText;
        out << parts.join(QLatin1Char('|'));
    }
    return out;
}

bool ScriptedInteraction::allAnswersUsed() const
{
    return answers.isEmpty() && owners.isEmpty() && paths.isEmpty() && pamChoices.isEmpty();
}
