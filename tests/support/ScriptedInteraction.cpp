#include "ScriptedInteraction.h"

#include <QMap>

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

bool ScriptedInteraction::script(const QStringList &words)
{
    static const QMap<QString, Button> buttons{{QStringLiteral("yes"), Button::Yes},
                                               {QStringLiteral("no"), Button::No},
                                               {QStringLiteral("ok"), Button::Ok},
                                               {QStringLiteral("cancel"), Button::Cancel},
                                               {QStringLiteral("accept"), Button::Accept}};
    static const QMap<QString, PamChoice> choices{{QStringLiteral("pam:skip"), PamChoice::Skip},
                                                  {QStringLiteral("pam:valid"), PamChoice::Valid},
                                                  {QStringLiteral("pam:fix"), PamChoice::Fix}};
    for (const QString &word : words) {
        const QString rest = word.section(QLatin1Char(':'), 1);
        const std::optional<QString> named = rest.isEmpty() ? std::nullopt : std::optional<QString>(rest);
        if (buttons.contains(word))
            answers << buttons.value(word);
        else if (choices.contains(word))
            pamChoices << choices.value(word);
        else if (word.startsWith(QLatin1String("owner:")))
            owners << named;
        else if (word.startsWith(QLatin1String("path:")))
            paths << named;
        else
            return false;
    }
    return true;
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
